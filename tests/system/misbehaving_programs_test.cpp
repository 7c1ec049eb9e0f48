// Backends' programs that hang, flood, fork away, stop, change sides and shoot around.

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <ostream>

#include "daemon_test.h"
#include "raw_requests.h"
#include "support/backend_files.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/named_rows.h"
#include "support/socket_peer.h"
#include "support/syscall_filter.h"
#include "support/waiting.h"

using namespace MARU::Backup;
using support::describeStatus;
using support::frame;
using support::SocketPeer;
using Clock = std::chrono::steady_clock;

namespace {

const std::string WAIT = "read line < \"$1\"; ";

/** A line that is written often, and how often. */
const int FLOOD = 200000;
const std::string FLOOD_LINE = "a line of a flood";
const std::string FLOOD_COMMAND = "yes '" + FLOOD_LINE + "' | head -n " + std::to_string(FLOOD);
const std::uintmax_t FLOOD_SIZE = FLOOD * (FLOOD_LINE.size() + 1);

char stateOf(int pid) {
    const std::string stat = support::readFile("/proc/" + std::to_string(pid) + "/stat");
    return stat.at(stat.rfind(')') + 2);
}

bool comesToState(int pid, char state) {
    return support::waitUntil([pid, state]() { return stateOf(pid) == state; });
}

/**
 * Two backends run the shell script in the job's parameter "script", whose first
 * argument is the parameter "gate": "script" as the job itself, "checked" as its
 * check, before a job that waits at its second gate, in the parameter "held".
 */
class Misbehaving : public DaemonTest {
protected:
    Misbehaving() {
        const std::string program = "/bin/sh -c {{script}} sh {{gate}} " + folder.path("proof") + "\n";
        support::writeLocalBackend("script", everyAction("unique = {{name}}\ncommand_launch = " + program));
        support::writeLocalBackend("into_file", everyAction("unique = {{name}}\npipe_stdout = " +
                                                            folder.path("output") + "\ncommand_launch = " + program));
        support::writeLocalBackend("checked",
                                   everyAction("unique = {{name}}\ncommand_check = " + program +
                                               "command_launch = /bin/sh -c 'read line < \"$0\"' {{held}}\n"));
    }

    Job scripted(const std::string& script, Job::Action action = Job::ACTION_BACKUP,
                 const std::string& backend = "script") {
        Job job(backend, action);
        job.setParam("script", script);
        job.setParam("gate", newGate().path());
        job.setParam("name", gates.back()->path());
        job.setParam("held", folder.path("held"));
        return job;
    }

    Job addScript(const std::string& script) {
        return add(scripted(script));
    }

    /** The gate of the job that was made last. */
    support::Gate& itsGate() {
        return *gates.back();
    }

    void waitForEndBySignal(const Job& job, int pid) {
        const std::string start = "job [" + std::to_string(job.getJobId()) + "] ";
        daemon->waitForLine(start + "term by sig(" + std::to_string(pid & 127) + ")");
        daemon->waitForLine(start + "core dump");
        EXPECT_EQ(Job::STATUS_NONE, statusOf(job));
    }

    /** The daemon does not believe that it was told anything. */
    void expectDaemonUnmoved() {
        std::list<Job> jobs;
        EXPECT_EQ(200, controller.listJobAll(jobs));
        for (const std::string& line : daemon->diary()) {
            EXPECT_NE(0U, line.rfind("got signal", 0)) << line;
        }
    }

    /** A daemon whose process group is not that of the tests, for those who join it or shoot at it. */
    void startInItsOwnGroup() {
        support::DaemonOptions options;
        options.beforeStart = []() { setpgid(0, 0); };
        start(options);
    }

    /** A daemon that has `output` as its standard output, and writes nothing into its diary while a job runs. */
    void startWithOutput(int output) {
        support::DaemonOptions options;
        options.arguments.clear();
        options.beforeStart = [output]() { dup2(output, STDOUT_FILENO); };
        start(options);
        close(output);
    }
};

// Checks

class MisbehavingCheck : public Misbehaving {
protected:
    MisbehavingCheck() : held(folder.path("held")) {
    }

    Job checked(const std::string& script) {
        return scripted(script, Job::ACTION_BACKUP, "checked");
    }

    /** What a check has written into the file of its second argument, once it has done so. */
    int pidInProof() {
        int pid = 0;
        EXPECT_TRUE(support::waitUntil([&]() {
            std::ifstream(folder.path("proof")) >> pid;
            return pid > 0;
        }));
        return pid;
    }

    support::Gate held;
};

/** A script that shoots at its process group, or at itself. */
struct Script {
    const char* name;
    const char* text;

    friend std::ostream& operator<<(std::ostream& out, const Script& row) {
        return out << row.name;
    }
};

class ShootingProgram : public Misbehaving, public testing::WithParamInterface<Script> {};

INSTANTIATE_TEST_SUITE_P(Each, ShootingProgram,
                         testing::Values(Script{"TermForTheGroup", "kill -TERM 0; exit 0"},
                                         Script{"KillForTheGroup", "kill -KILL 0; exit 0"},
                                         Script{"HupForTheGroup", "kill -HUP 0; exit 0"},
                                         Script{"IntForTheGroupFromAChild", "(kill -INT 0) & wait; exit 0"},
                                         Script{"KillForItself", "kill -KILL $$; exit 0"}),
                         support::NameOfRow());

/** A job that leaves the process group that it was started in, and waits at its gate. */
struct Departure {
    const char* name;
    const char* command;
    bool ofSession;

    friend std::ostream& operator<<(std::ostream& out, const Departure& row) {
        return out << row.name;
    }
};

class DepartingJob : public Misbehaving, public testing::WithParamInterface<Departure> {
protected:
    DepartingJob() {
        support::writeLocalBackend("departing", std::string("[backup]\ncommand_launch = perl -MPOSIX -e '") +
                                                    GetParam().command +
                                                    "; open(G, \"<\", $ARGV[0]); <G>; exit 3' {{gate}}\n");
    }

    Job addDeparting() {
        Job job("departing", Job::ACTION_BACKUP);
        job.setParam("gate", newGate().path());
        return add(job);
    }
};

INSTANTIATE_TEST_SUITE_P(Each, DepartingJob,
                         testing::Values(Departure{"IntoTheDaemonsProcessGroup", "setpgrp(0, getpgrp(getppid))", false},
                                         Departure{"IntoASessionOfItsOwn",
                                                   "setpgrp(0, getpgrp(getppid)); POSIX::setsid()", true}),
                         support::NameOfRow());

/** A job that ends and leaves a process at its gate. */
class JobThatLeavesAProcess : public Misbehaving, public testing::WithParamInterface<Script> {};

INSTANTIATE_TEST_SUITE_P(Each, JobThatLeavesAProcess,
                         testing::Values(Script{"InTheBackground", "(read line < \"$1\") & exit 0"},
                                         Script{"InASessionOfItsOwn", "exec setsid sh -c 'read line < \"$0\"' \"$1\""}),
                         support::NameOfRow());

} // namespace

TEST_F(MisbehavingCheck, ThatHangsKeepsAllClientsWaitingAndLosesNone) {
    start();
    support::Gate& runningGate = newGate();
    const Job running = addGated(Job::ACTION_COPY_TO, runningGate);
    runningGate.awaitJob();
    SocketPeer first;
    SocketPeer others[3];
    first.write(frame(enqueueRequest(checked(WAIT))));
    support::Gate& check = itsGate();
    check.awaitJob();
    Job second("gated", Job::ACTION_RELINK);
    second.setParam("gate", newGate().path());

    others[0].write(frame(enqueueRequest(second)));
    others[1].write(frame("nonsense"));
    others[2].write(frame(LIST_REQUEST));
    others[2].close();
    SocketPeer late;
    late.write(frame(requestFor("job_get", running.getJobId())) + frame("{\"op\":\"dance\"}"));
    runningGate.open();
    EXPECT_TRUE(others[0].staysSilent());
    EXPECT_TRUE(late.staysSilent());
    EXPECT_EQ(0, daemon->countLines(exitLine(running, 0)));
    check.open();

    EXPECT_EQ(0U, first.readFrame().find("{\"code\":200,"));
    EXPECT_EQ(0U, others[0].readFrame().find("{\"code\":200,"));
    EXPECT_EQ("{\"code\":400}", others[1].readFrame());
    const std::string found = late.readFrame(); // unless it was reaped before
    EXPECT_TRUE(found.find("\"job_id\":1,") != std::string::npos || found == "{\"code\":404}") << found;
    EXPECT_EQ("{\"code\":501}", late.readFrame());
    daemon->waitForLine(exitLine(running, 0));
}

TEST_F(MisbehavingCheck, ThatFloodsItsOutputsIsAnsweredAndNothingIsLost) {
    startWithOutput(open(folder.path("stdout").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    const Job job = add(checked(FLOOD_COMMAND + "; " + FLOOD_COMMAND + " >&2"));
    EXPECT_TRUE(isRunning(job));
    EXPECT_EQ(FLOOD_SIZE, std::filesystem::file_size(folder.path("stdout")));
    EXPECT_EQ(FLOOD, daemon->countLines(FLOOD_LINE));
}

TEST_F(MisbehavingCheck, ThatLeavesAProcessBehindIsAnsweredAtItsOwnEnd) {
    start();
    add(checked("(read line < \"$1\"; echo > \"$2\") & exit 0"));
    EXPECT_FALSE(std::filesystem::exists(folder.path("proof")));
    itsGate().open();
    EXPECT_TRUE(support::waitUntil([this]() { return std::filesystem::exists(folder.path("proof")); }));
    expectDaemonUnmoved();
}

TEST_F(MisbehavingCheck, ThatStopsItselfIsAnsweredWhenItIsContinued) {
    start();
    SocketPeer client;
    client.write(frame(enqueueRequest(checked("echo $$ > \"$2\"; kill -STOP $$; exit 0"))));
    const int pid = pidInProof();
    EXPECT_TRUE(comesToState(pid, 'T'));
    EXPECT_TRUE(client.staysSilent());
    kill(pid, SIGCONT);
    EXPECT_EQ(0U, client.readFrame().find("{\"code\":200,"));
}

TEST_F(MisbehavingCheck, ThatIsKilledWhileItIsStoppedRefusesItsJob) {
    start();
    SocketPeer client;
    client.write(frame(enqueueRequest(checked("echo $$ > \"$2\"; kill -STOP $$; exit 0"))));
    const int pid = pidInProof();
    EXPECT_TRUE(comesToState(pid, 'T'));
    kill(pid, SIGKILL);
    EXPECT_EQ("{\"code\":400}", client.readFrame());
    daemon->waitForLine("invalid job");
}

TEST_F(MisbehavingCheck, FindsDefaultSignalsAndTheUmaskOfTheDaemonsStart) {
    support::DaemonOptions options;
    options.beforeStart = []() {
        umask(0026);
        signal(SIGUSR1, SIG_IGN);
        sigset_t blocked;
        sigemptyset(&blocked);
        sigaddset(&blocked, SIGUSR2);
        sigprocmask(SIG_BLOCK, &blocked, nullptr);
    };
    start(options);
    add(checked("grep -e ^Umask -e '^Sig[BI]' /proc/self/status > \"$2\""));
    EXPECT_EQ("Umask:\t0026\nSigBlk:\t0000000000000000\nSigIgn:\t0000000000000000\n",
              support::readFile(folder.path("proof")));
}

TEST_F(MisbehavingCheck, ThatClosesAllItsDescriptorsIsAnswered) {
    start();
    EXPECT_TRUE(isRunning(add(checked("exec 0<&- 1>&- 2>&-; exit 0"))));
}

TEST_P(ShootingProgram, HitsNothingButItselfAsACheck) {
    startInItsOwnGroup();
    support::Gate& gate = newGate();
    const Job running = addGated(Job::ACTION_COPY_TO, gate);
    gate.awaitJob();
    const Job refused = scripted(GetParam().text, Job::ACTION_BACKUP, "checked");
    EXPECT_EQ("{\"code\":400}", SocketPeer().ask(enqueueRequest(refused)));
    daemon->waitForLine("invalid job");
    EXPECT_TRUE(isRunning(running));
    expectDaemonUnmoved();
}

TEST_P(ShootingProgram, HitsNothingButItselfAsAJob) {
    startInItsOwnGroup();
    support::Gate& gate = newGate();
    const Job running = addGated(Job::ACTION_COPY_TO, gate);
    gate.awaitJob();
    const Job job = addScript(WAIT + GetParam().text);
    const int pid = pidOf(job);
    itsGate().open();
    waitForEndBySignal(job, pid);
    EXPECT_TRUE(isRunning(running));
    expectDaemonUnmoved();
}

TEST_P(DepartingJob, IsReapedLikeAnyOther) {
    startInItsOwnGroup();
    const Job job = addDeparting();
    itsGate().awaitJob();
    const int pid = pidOf(job);
    EXPECT_EQ(GetParam().ofSession ? pid : getpgid(daemon->pid()), getpgid(pid));
    EXPECT_EQ(GetParam().ofSession ? pid : getsid(daemon->pid()), getsid(pid));
    EXPECT_TRUE(isRunning(job));
    itsGate().open();
    daemon->waitForLine(exitLine(job, 3));
    EXPECT_EQ(Job::STATUS_NONE, statusOf(job));
}

TEST_P(DepartingJob, IsRemovedLikeAnyOther) {
    startInItsOwnGroup();
    const Job job = addDeparting();
    itsGate().awaitJob();
    const int pid = pidOf(job);
    EXPECT_EQ(200, controller.removeJob(job.getJobId()));
    waitForEndBySignal(job, pid);
    expectDaemonUnmoved();
}

TEST_P(JobThatLeavesAProcess, FreesItsSlotAtItsOwnEnd) {
    start();
    const Job job = addScript(GetParam().text);
    support::Gate& gate = itsGate();
    daemon->waitForLine(exitLine(job, 0));
    EXPECT_TRUE(isRunning(addGated(Job::ACTION_BACKUP, newGate())));
    gate.open(); // where the process still waits
    expectDaemonUnmoved();
}

TEST_F(Misbehaving, AJobThatStopsItselfGoesOnRunningForTheDaemon) {
    start();
    const Job job = addScript("kill -STOP $$; exit 4");
    const Job next = addGated(Job::ACTION_BACKUP, newGate());
    const int pid = pidOf(job);
    EXPECT_TRUE(comesToState(pid, 'T'));
    daemon->signal(SIGHUP);
    daemon->waitForLine("[hup] check children status");
    EXPECT_TRUE(isRunning(job));
    EXPECT_TRUE(isQueued(next));

    kill(pid, SIGCONT);
    daemon->waitForLine(exitLine(job, 4));
    EXPECT_TRUE(isRunning(next));
}

TEST_F(Misbehaving, AJobStoppedAndContinuedFromOutsideGoesOn) {
    start();
    const Job job = addScript(WAIT + "exit 4");
    itsGate().awaitJob();
    const int pid = pidOf(job);
    for (int round = 0; round < 20; ++round) {
        kill(pid, SIGSTOP);
        EXPECT_TRUE(comesToState(pid, 'T'));
        EXPECT_TRUE(isRunning(job));
        kill(pid, SIGCONT);
        EXPECT_TRUE(comesToState(pid, 'S'));
    }
    EXPECT_TRUE(isRunning(job));
    itsGate().open();
    daemon->waitForLine(exitLine(job, 4));
}

TEST_F(Misbehaving, AStoppedJobThatIsRemovedIsStoppingUntilItIsContinued) {
    start();
    const Job job = addScript("kill -STOP $$; exit 4");
    const Job next = addGated(Job::ACTION_BACKUP, newGate());
    const int pid = pidOf(job);
    EXPECT_TRUE(comesToState(pid, 'T'));
    EXPECT_EQ(200, controller.removeJob(job.getJobId()));
    daemon->signal(SIGHUP);
    daemon->waitForLine("[hup] check children status");
    EXPECT_EQ(Job::STATUS_STOPPING, statusOf(job));
    EXPECT_EQ('T', stateOf(pid));
    EXPECT_TRUE(isQueued(next));

    kill(pid, SIGCONT);
    waitForEndBySignal(job, pid);
    EXPECT_TRUE(isRunning(next));
}

TEST_F(Misbehaving, AStoppedJobIsKilledAtTheDaemonsEndAfterFiveSeconds) {
    start();
    const Job job = addScript("kill -STOP $$; exit 4");
    const int pid = pidOf(job);
    EXPECT_TRUE(comesToState(pid, 'T'));
    const auto begin = Clock::now();
    EXPECT_EQ("exit 0", describeStatus(daemon->stop(SIGTERM)));
    EXPECT_GE(Clock::now() - begin, std::chrono::seconds(5));
    EXPECT_TRUE(support::waitUntil([pid]() { return support::isGone(pid); }));
    daemon->waitForLine("send sig[9] to job [1] pid [" + std::to_string(pid) + "]");
}

TEST_F(Misbehaving, AJobThatClosesAllItsDescriptorsIsReapedLikeAnyOther) {
    start();
    const Job job = addScript("exec 0<&- 1>&- 2>&-; read line < \"$1\"; exit 5");
    itsGate().awaitJob();
    EXPECT_TRUE(isRunning(job));
    itsGate().open();
    daemon->waitForLine(exitLine(job, 5));
}

TEST_F(Misbehaving, AJobMayFloodItsOutputFile) {
    start();
    const Job job = add(scripted(FLOOD_COMMAND, Job::ACTION_BACKUP, "into_file"));
    daemon->waitForLine(exitLine(job, 0));
    EXPECT_EQ(FLOOD_SIZE, std::filesystem::file_size(folder.path("output")));
}

TEST_F(Misbehaving, AJobWithoutOutputFilesFloodsThoseOfTheDaemon) {
    startWithOutput(open(folder.path("stdout").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    const Job job = addScript(WAIT + FLOOD_COMMAND + "; " + FLOOD_COMMAND + " >&2");
    itsGate().open();
    daemon->waitForLine(exitLine(job, 0));
    EXPECT_EQ(FLOOD_SIZE, std::filesystem::file_size(folder.path("stdout")));
    EXPECT_EQ(FLOOD, daemon->countLines(FLOOD_LINE));
}

TEST_F(Misbehaving, AJobWhoseOutputNobodyReadsDiesOfItAlone) {
    int ends[2];
    ASSERT_EQ(0, pipe2(ends, O_CLOEXEC));
    close(ends[0]);
    startWithOutput(ends[1]);
    const Job job = addScript(WAIT + "exec yes");
    const int pid = pidOf(job);
    itsGate().open();
    waitForEndBySignal(job, pid);
    expectDaemonUnmoved();
}

TEST_F(Misbehaving, AJobThatCannotBeReapedKeepsItsSlotInSilence) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    support::DaemonOptions options;
    options.beforeStart = []() { support::refuseSystemCalls({SYS_wait4, SYS_waitid}, EPERM); };
    start(options);
    const Job job = addScript("exit 0");
    const Job next = addGated(Job::ACTION_BACKUP, newGate());
    EXPECT_TRUE(comesToState(pidOf(job), 'Z'));
    for (int round = 0; round < 3; ++round) {
        daemon->signal(SIGHUP);
        daemon->waitForLine("[hup] check children status");
    }
    EXPECT_TRUE(isRunning(job));
    EXPECT_TRUE(isQueued(next));
    for (const std::string& line : daemon->diary()) {
        EXPECT_NE(0U, line.rfind("job [1] ", 0)) << line;
    }
    EXPECT_EQ(0, log.count("[err]"));
}

TEST_F(Misbehaving, AJobThatWasReapedBehindTheDaemonsBackIsReportedAtEveryLook) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    support::DaemonOptions options;
    options.beforeStart = []() {
        // With SIGCHLD ignored the kernel reaps children itself. The daemon is
        // kept from handling it, and its sanitizers from needing a handler.
        signal(SIGCHLD, SIG_IGN);
        for (const char* const name : {"ASAN_OPTIONS", "TSAN_OPTIONS"}) {
            setenv(name, "handle_segv=0:handle_sigbus=0:handle_sigfpe=0:handle_sigill=0:handle_abort=0", 1);
        }
        support::refuseSystemCalls({SYS_rt_sigaction}, EPERM);
    };
    start(options);
    const Job job = addScript("exit 0");
    const Job next = addGated(Job::ACTION_BACKUP, newGate());
    for (int look = 0; look < 2; ++look) {
        daemon->waitForLine("job [1] out of control");
    }
    EXPECT_TRUE(support::isGone(pidOf(job)));
    EXPECT_TRUE(isRunning(job));
    EXPECT_TRUE(isQueued(next));
    EXPECT_EQ(200, controller.removeJob(job.getJobId()));
    EXPECT_EQ(Job::STATUS_STOPPING, statusOf(job));
    daemon->waitForLine("job [1] out of control");
}
