// Processes that die in the wrong instant, jobs and signals by the thousand.

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <iterator>
#include <map>
#include <memory>
#include <ostream>

#include "daemon_test.h"
#include "raw_requests.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/named_rows.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using namespace MARU::Backup;
using support::describeStatus;
using support::frame;
using support::SocketPeer;

namespace {

using Lines = std::vector<std::string>;

const int REMOVALS = 1000;

/** All that still comes before the end of the connection is one whole reply, or nothing. */
void expectCleanEnd(SocketPeer& peer) {
    const std::string rest = peer.read(1 << 20);
    if (!rest.empty()) {
        EXPECT_EQ(frame(rest.substr(4)), rest);
    }
}

class Storms : public DaemonTest {
protected:
    /** Starts a daemon without debug lines in its diary, which will be long enough. */
    void startQuietly(support::DaemonOptions options = support::DaemonOptions()) {
        options.arguments.clear();
        start(options);
        expectNoJobs(); // and the controller has its connection
        descriptors = support::openDescriptors(daemon->pid());
    }

    void expectNoJobs() {
        std::list<Job> jobs;
        EXPECT_EQ(200, controller.listJobAll(jobs));
        EXPECT_EQ(0U, jobs.size());
    }

    /** A daemon as it was before it had any job, but for its diary. */
    void expectNothingLeft() {
        expectNoJobs();
        const std::string pid = std::to_string(daemon->pid());
        EXPECT_EQ("", support::readFile("/proc/" + pid + "/task/" + pid + "/children"));
        EXPECT_TRUE(support::waitUntil([this]() { return support::openDescriptors(daemon->pid()) == descriptors; }));
        EXPECT_EQ(0, countLinesStarting("got signal"));
        EXPECT_EQ(0, log.count("[err]"));
    }

    int countLinesStarting(const std::string& start) {
        const Lines diary = daemon->diary();
        return static_cast<int>(std::count_if(diary.begin(), diary.end(),
                                              [&start](const std::string& line) { return line.rfind(start, 0) == 0; }));
    }

    /** The process that each job got, as the diary has it. */
    std::map<int, int> processes() {
        std::map<int, int> found;
        for (const std::string& line : daemon->diary()) {
            int id = 0;
            int pid = 0;
            if (std::sscanf(line.c_str(), "launch job [%d] on pid [%d]", &id, &pid) == 2) {
                EXPECT_TRUE(found.emplace(id, pid).second) << "launched twice: " << line;
            }
        }
        return found;
    }

    /** What the diary says about each job's end. */
    std::map<int, Lines> ends() {
        std::map<int, Lines> found;
        for (const std::string& line : daemon->diary()) {
            int id = 0;
            if (std::sscanf(line.c_str(), "job [%d]", &id) == 1) {
                found[id].push_back(line);
            }
        }
        return found;
    }

    void expectProcessesGone() {
        for (const auto& [id, pid] : processes()) {
            const int process = pid;
            EXPECT_TRUE(support::waitUntil([process]() { return support::isGone(process); })) << "of job " << id;
        }
    }

    /** Adds jobs like `job`, one after the other, and has each removed by the bytes that follow it. */
    void removeAtOnce(const Job& job) {
        SocketPeer peer;
        for (int id = 1; id <= REMOVALS && !HasFailure(); ++id) {
            peer.write(frame(enqueueRequest(job)) + frame(requestFor("job_remove", id)));
            EXPECT_NE(std::string::npos, peer.readFrame().find("\"job_id\":" + std::to_string(id) + ","));
            EXPECT_EQ("{\"code\":200}", peer.readFrame());
            daemon->waitForLineStarting("job [" + std::to_string(id) + "] ");
            EXPECT_EQ("{\"code\":404}", peer.ask(requestFor("job_get", id)));
        }
    }

private:
    int descriptors = 0;
};

Lines linesOfExit(int id, int status) {
    return {"job [" + std::to_string(id) + "] exit(" + std::to_string(status) + ")"};
}

Lines linesOfSignal(int id, int pid) {
    const std::string job = "job [" + std::to_string(id) + "] ";
    return {job + "term by sig(" + std::to_string(pid & 127) + ")", job + "core dump"};
}

// Many ends at once

/** How one of many jobs ends when it is let go on. */
struct Ending {
    const char* command; ///< null for a job whose program is missing, and which waits for nobody
    int exitStatus;      ///< -1 for one that is killed
};

const Ending ENDINGS[] = {{"exit 0", 0}, {"exit 3", 3}, {"kill -KILL $$", -1}, {"kill -SEGV $$", -1}, {nullptr, 127}};

/** As many jobs of each queue as it runs at once. */
const std::pair<Job::Action, int> BATCH[] = {
    {Job::ACTION_COPY_TO, 5},         {Job::ACTION_TARGET_COPY_TO, 5}, {Job::ACTION_RELINK, 4},
    {Job::ACTION_REMOVE_VERSION, 10}, {Job::ACTION_REMOVE_TASK, 10},
};
const int BATCHES = 60;

class MassEnd : public Storms {
protected:
    MassEnd() : ready(makeFifo("ready")) {
        support::writeLocalBackend("ending", everyAction("unique = {{name}}\n"
                                                         "command_launch = /bin/sh -c {{script}} sh {{gate}} " +
                                                         folder.path("ready") + "\n"));
        support::writeLocalBackend("missing", everyAction("unique = {{name}}\ncommand_launch = /nowhere/program\n"));
    }
    ~MassEnd() override {
        close(ready);
    }

    /** Adds a batch of jobs of all kinds; its gate, and how many of its jobs will stand there. */
    std::pair<std::string, int> addBatch() {
        const std::string gate = "gate" + std::to_string(endings.size());
        close(makeFifo(gate));
        int gated = 0;
        for (const auto& [action, count] : BATCH) {
            for (int job = 0; job < count; ++job) {
                gated += addEnding(action, folder.path(gate)).command != nullptr ? 1 : 0;
            }
        }
        return {folder.path(gate), gated};
    }

    /** Waits until `count` jobs stand at `gate`, and lets all of them go on in the same instant. */
    void release(const std::string& gate, int count) {
        const int held = open(gate.c_str(), O_RDWR | O_CLOEXEC);
        char signs[64];
        while (count > 0) {
            ASSERT_TRUE(support::waitReadable(ready)) << count << " jobs are missing at " << gate;
            count -= static_cast<int>(read(ready, signs, sizeof signs));
        }
        close(held);
    }

    std::map<int, Ending> endings; ///< of each job

private:
    int makeFifo(const std::string& name) {
        EXPECT_EQ(0, mkfifo(folder.path(name).c_str(), 0600));
        return open(folder.path(name).c_str(), O_RDWR | O_CLOEXEC);
    }

    const Ending& addEnding(Job::Action action, const std::string& gate) {
        const Ending& ending = ENDINGS[endings.size() % std::size(ENDINGS)];
        Job job(ending.command != nullptr ? "ending" : "missing", action);
        job.setParam("name", static_cast<int>(endings.size()));
        job.setParam("gate", gate);
        if (ending.command != nullptr) {
            // It says that it is there only when the gate's closing will reach it.
            job.setParam("script", std::string("exec 3<\"$1\"; echo >\"$2\"; read line <&3; ") + ending.command);
        }
        endings[add(job).getJobId()] = ending;
        return ending;
    }

    int ready;
};

// Signals

/** Another process that sends the daemon each of some signals some thousand times, or for as long as it lives. */
class SignalStorm {
public:
    SignalStorm(pid_t target, const std::vector<int>& signals)
        : sender(support::startInChild([&]() { return send(target, signals); })) {
    }
    ~SignalStorm() {
        if (sender > 0) {
            support::waitForChild(sender);
        }
    }
    SignalStorm(const SignalStorm&) = delete;
    SignalStorm& operator=(const SignalStorm&) = delete;

    bool rages() {
        int status = 0;
        if (sender > 0 && waitpid(sender, &status, WNOHANG) == sender) {
            EXPECT_EQ("exit 0", describeStatus(status));
            sender = -1;
        }
        return sender > 0;
    }

private:
    static int send(pid_t target, const std::vector<int>& signals) {
        // Not by its id, which another process may have later.
        const auto process = static_cast<int>(syscall(SYS_pidfd_open, target, 0));
        for (int round = 0; round < 4000; ++round) {
            for (const int signal : signals) {
                if (syscall(SYS_pidfd_send_signal, process, signal, nullptr, 0) != 0) {
                    return errno == ESRCH ? 0 : 1;
                }
            }
            usleep(50); // or most of them would fall together
        }
        return 0;
    }

    pid_t sender;
};

/** What a daemon inherits from whoever starts it. */
struct Inheritance {
    const char* name;
    void (*settle)();

    friend std::ostream& operator<<(std::ostream& out, const Inheritance& row) {
        return out << row.name;
    }
};

void ignoreAllSignals() {
    for (int number = 1; number < SIGRTMIN; ++number) {
        signal(number, SIG_IGN);
    }
}

void blockAllSignals() {
    sigset_t all;
    sigfillset(&all);
    sigprocmask(SIG_SETMASK, &all, nullptr);
}

class InheritedSignals : public Storms, public testing::WithParamInterface<Inheritance> {
protected:
    InheritedSignals() {
        support::DaemonOptions options;
        options.beforeStart = GetParam().settle;
        start(options);
    }

    void expectEndBy(int number) {
        daemon->signal(number);
        daemon->waitForLine("got signal: [" + std::to_string(number) + "]");
        ASSERT_FALSE(HasFailure());
        EXPECT_EQ("exit 0", describeStatus(daemon->wait()));
    }
};

INSTANTIATE_TEST_SUITE_P(Each, InheritedSignals,
                         testing::Values(Inheritance{"Ignored", ignoreAllSignals},
                                         Inheritance{"Blocked", blockAllSignals},
                                         Inheritance{"IgnoredAndBlocked",
                                                     []() {
                                                         ignoreAllSignals();
                                                         blockAllSignals();
                                                     }}),
                         support::NameOfRow());

} // namespace

TEST_F(Storms, AJobRemovedInTheInstantOfItsLaunchDies) {
    startQuietly();
    Job job("gated", Job::ACTION_BACKUP);
    job.setParam("gate", newGate().path());
    removeAtOnce(job);

    const std::map<int, int> launched = processes();
    const std::map<int, Lines> ended = ends();
    EXPECT_EQ(static_cast<std::size_t>(REMOVALS), launched.size());
    EXPECT_EQ(static_cast<std::size_t>(REMOVALS), ended.size());
    for (const auto& [id, lines] : ended) {
        EXPECT_EQ(linesOfSignal(id, launched.at(id)), lines);
    }
    expectNothingLeft();
}

TEST_F(Storms, AJobWithoutAProgramRemovedInTheInstantOfItsLaunchEndsOneWayOrTheOther) {
    support::writeLocalBackend("missing", "[backup]\ncommand_launch = /nowhere/program\n");
    startQuietly();
    removeAtOnce(Job("missing", Job::ACTION_BACKUP));

    const std::map<int, int> launched = processes();
    const std::map<int, Lines> ended = ends();
    EXPECT_EQ(static_cast<std::size_t>(REMOVALS), launched.size());
    EXPECT_EQ(static_cast<std::size_t>(REMOVALS), ended.size());
    for (const auto& [id, lines] : ended) {
        EXPECT_TRUE(lines == linesOfExit(id, 127) || lines == linesOfSignal(id, launched.at(id))) << lines.front();
    }
    expectNothingLeft();
}

TEST_F(MassEnd, EachOfTwoThousandJobsIsReapedAndLoggedOnce) {
    support::DaemonOptions options;
    options.beforeStart = []() {
        // Too little for a core, and for a program that the host would hand it to.
        const rlimit noCores = {1, 1};
        setrlimit(RLIMIT_CORE, &noCores);
    };
    startQuietly(options);
    std::vector<std::pair<std::string, int>> gated;
    for (int batch = 0; batch < BATCHES; ++batch) {
        gated.push_back(addBatch());
    }
    for (const auto& [gate, count] : gated) {
        release(gate, count);
        ASSERT_FALSE(HasFailure());
    }
    EXPECT_TRUE(support::waitUntil([this]() {
        std::list<Job> jobs;
        return controller.listJobAll(jobs) == 200 && jobs.empty();
    }));

    const std::map<int, int> launched = processes();
    EXPECT_EQ(endings.size(), launched.size());
    const std::map<int, Lines> ended = ends();
    EXPECT_EQ(endings.size(), ended.size());
    for (const auto& [id, lines] : ended) {
        const int status = endings.at(id).exitStatus;
        EXPECT_EQ(status < 0 ? linesOfSignal(id, launched.at(id)) : linesOfExit(id, status), lines);
    }
    expectNothingLeft();
}

TEST_F(Storms, AmidThousandsOfSignalsEveryRequestGetsItsAnswer) {
    startQuietly();
    support::Gate& gate = newGate();
    const Job first = addGated(Job::ACTION_BACKUP, gate);
    const Job second = addGated(Job::ACTION_BACKUP, newGate());
    Job running;
    ASSERT_EQ(200, controller.getJob(first.getJobId(), running));
    const std::pair<std::string, std::string> exchanges[] = {
        {requestFor("job_get", 1), "{\"code\":200,\"job\":" + running.toString() + "}"},
        {LIST_REQUEST, "{\"code\":200,\"jobs\":[" + running.toString() + "," + second.toString() + "]}"},
        {requestFor("job_remove", 99), "{\"code\":404}"},
        {"{\"op\":\"dance\"}", "{\"code\":501}"},
        {"nonsense", "{\"code\":400}"},
        {enqueueRequest(first), "{\"code\":409}"},
    };
    std::vector<std::unique_ptr<SocketPeer>> peers;
    for (std::size_t at = 0; at < std::size(exchanges); ++at) {
        peers.push_back(std::make_unique<SocketPeer>());
    }

    for (SignalStorm storm(daemon->pid(), {SIGCHLD, SIGHUP}); storm.rages() && !HasFailure();) {
        for (std::size_t at = 0; at < peers.size(); ++at) {
            peers[at]->write(frame(exchanges[at].first));
        }
        for (std::size_t at = 0; at < peers.size(); ++at) {
            EXPECT_EQ(exchanges[at].second, peers[at]->readFrame());
        }
    }
    EXPECT_GT(daemon->countLines("  [backup] " + running.toString()), 10) << "there was no storm";

    peers.clear();
    gate.open();
    daemon->waitForLine(exitLine(first, 0));
    EXPECT_TRUE(isRunning(second));
    EXPECT_EQ(0, countLinesStarting("got signal"));
}

TEST_F(Storms, SigtermOverAndOverAmidOtherSignalsEndsTheDaemonAndItsJobs) {
    startQuietly();
    support::Gate& stubbornGate = newGate();
    addGated(Job::ACTION_REMOVE_TASK, stubbornGate, "stubborn");
    stubbornGate.awaitJob();
    addGated(Job::ACTION_COPY_TO, newGate());
    addGated(Job::ACTION_BACKUP, newGate());
    addGated(Job::ACTION_BACKUP, newGate());
    EXPECT_EQ(3U, processes().size());
    SocketPeer peers[5];
    for (SocketPeer& peer : peers) {
        peer.write(frame(LIST_REQUEST));
    }

    const SignalStorm storm(daemon->pid(), {SIGCHLD, SIGHUP, SIGTERM});
    EXPECT_EQ("exit 0", describeStatus(daemon->wait()));
    for (SocketPeer& peer : peers) {
        expectCleanEnd(peer);
    }
    EXPECT_EQ(3U, processes().size()) << "the end of a job brought the next one to life";
    expectProcessesGone();
    EXPECT_FALSE(std::filesystem::exists(support::DAEMON_SOCKET));
    EXPECT_EQ(1, countLinesStarting("send sig[9] "));
}

TEST_F(Storms, ASigtermDuringACheckEndsTheDaemonAfterTheCheckAndItsAnswer) {
    support::writeLocalBackend(
        "checked",
        everyAction("command_check = /bin/sh -c 'read line < \"$0\"; echo > \"$0.done\"' {{check}}\n" + WAITS_AT_GATE));
    startQuietly();
    support::Gate& check = newGate();
    Job checked("checked", Job::ACTION_BACKUP);
    checked.setParam("check", check.path());
    checked.setParam("gate", newGate().path());
    Job waiting("gated", Job::ACTION_COPY_TO);
    waiting.setParam("gate", newGate().path());
    addGated(Job::ACTION_RELINK, newGate());
    SocketPeer client;
    SocketPeer other;
    other.ask(LIST_REQUEST);

    client.write(frame(enqueueRequest(checked)));
    check.awaitJob();
    other.write(frame(enqueueRequest(waiting)));
    daemon->signal(SIGTERM);
    EXPECT_TRUE(client.staysSilent());
    check.open();

    EXPECT_EQ("exit 0", describeStatus(daemon->wait()));
    EXPECT_TRUE(std::filesystem::exists(check.path() + ".done"));
    EXPECT_EQ(0U, client.readFrame().find("{\"code\":200,"));
    EXPECT_TRUE(client.isClosed());
    expectCleanEnd(other);
    expectProcessesGone();
    EXPECT_FALSE(std::filesystem::exists(support::DAEMON_SOCKET));
}

TEST_F(Storms, SigpipeDoesNothing) {
    startQuietly();
    const Job job = addGated(Job::ACTION_BACKUP, newGate());
    const Lines before = daemon->diary();
    for (int round = 0; round < 100; ++round) {
        daemon->signal(SIGPIPE);
        EXPECT_TRUE(isRunning(job));
    }
    EXPECT_EQ(before, daemon->diary());
}

TEST_P(InheritedSignals, ChangeNothingAboutTheDaemon) {
    support::Gate& gate = newGate();
    const Job first = addGated(Job::ACTION_BACKUP, gate);
    const Job second = addGated(Job::ACTION_BACKUP, newGate());
    gate.open();
    daemon->waitForLine("[sigchild] check children status");
    daemon->waitForLine(exitLine(first, 0));
    daemon->signal(SIGPIPE);
    EXPECT_TRUE(isRunning(second));
    daemon->signal(SIGHUP);
    daemon->waitForLine("[hup] check children status");

    expectEndBy(SIGTERM);
    expectProcessesGone();
}

TEST_P(InheritedSignals, AreNotPassedOnToJobsAndChecks) {
    const std::string all = "/bin/sh -c 'grep ^Sig[BI] /proc/self/status > \"$0\"' ";
    support::writeLocalBackend("probe", "[backup]\ncommand_check = " + all + folder.path("check") +
                                            "\ncommand_launch = " + all + folder.path("job") + "\n");
    daemon->waitForLine(exitLine(add(Job("probe", Job::ACTION_BACKUP)), 0));

    for (const char* const program : {"check", "job"}) {
        EXPECT_EQ("SigBlk:\t0000000000000000\nSigIgn:\t0000000000000000\n", support::readFile(folder.path(program)))
            << "of the " << program;
    }
    expectEndBy(SIGINT);
}
