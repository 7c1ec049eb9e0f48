#include "queue/queue_server.h"

#include <malloc.h>
#include <pthread.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <ostream>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue_fixture.h"
#include "signals.h"
#include "support/backend_files.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/named_rows.h"
#include "support/syscall_filter.h"
#include "support/vfork.h"

using namespace MARU::Backup;
using support::describeStatus;
using support::expectLocated;
using support::waitForChild;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

bool forked = false;

/** Enough to tell what each leaves behind from what the heap keeps for later. */
const int ROUNDS = 500;
const std::size_t SMALLEST_BLOCK = 16;

class Launch : public QueueTest {
protected:
    /** Declares the backend "probe", whose command for every action is `lines`. */
    static Job probe(const std::string& lines) {
        support::writeLocalBackend("probe", inAllSections(lines));
        return Job("probe", Job::ACTION_BACKUP);
    }

    /** Launches the job in a daemon of its own; "exit 1" if that daemon's memory was duplicated. */
    static std::string launchedUnforked(const Job& job) {
        return describeStatus(support::runInChild([&job] {
            pthread_atfork([] { forked = true; }, nullptr, nullptr);
            if (!launch(job)) {
                return 2;
            }
            waitForChild(job.getPid());
            return forked ? 1 : 0;
        }));
    }
};

/** A section that declares nothing that can be run. */
struct Unrunnable {
    const char* name;
    const char* section;
    const char* branch;
    bool reported; ///< as a launch command that is not there

    friend std::ostream& operator<<(std::ostream& out, const Unrunnable& row) {
        return out << row.name;
    }
};

/** What makes a process, by any of its names on the machine. */
const std::vector<long> MAKE_A_PROCESS = {
    SYS_clone,
    SYS_clone3,
#ifdef SYS_vfork
    SYS_vfork,
#endif
};

class UnrunnableCommand : public Launch, public testing::WithParamInterface<Unrunnable> {};

const Unrunnable UNRUNNABLE[] = {
    {"AMissingProgram", "command_launch = /nonexistent/program", "", false},
    {"AFileThatIsNoProgram", "command_launch = /etc/passwd", "", false},
    {"AnEmptyList", "command_launch =", "", false},
    {"AnEmptyProgram", "command_launch = '' argument", "", false},
    {"AnOutputThatCannotBeOpened", "command_launch = /bin/true\npipe_stdout = /nonexistent/output", "", false},
    {"AnErrorOutputThatCannotBeOpened", "command_launch = /bin/true\npipe_stderr = /nonexistent/output", "", false},
    {"NoCommand", "delegate = yes", "", true},
    {"AnUnclosedQuote", "command_launch = /bin/sh -c 'true", "", true},
    {"NoCommandForTheBranch", "command_launch = /bin/true", "verify", true},
};

INSTANTIATE_TEST_SUITE_P(Of, UnrunnableCommand, testing::ValuesIn(UNRUNNABLE), support::NameOfRow());

} // namespace

TEST_P(UnrunnableCommand, EndsTheJobsProcessWith127) {
    support::writeLocalBackend("broken", inAllSections(GetParam().section));
    Job job("broken", Job::ACTION_BACKUP);
    job.setCommandBranch(GetParam().branch);
    const pid_t child = launched(add(job)).getPid();

    awaitEnd(child);
    diary.take();
    queue_check_children_status("sigchild");

    EXPECT_THAT(diary.take(), ElementsAre("job [1] exit(127)"));
    EXPECT_THAT(ids("backup"), IsEmpty());
    if (GetParam().reported) {
        expectLocated(log, LOG_ERR, child, "backend_manager", "wrong config: launch command not found");
    }
    EXPECT_EQ(GetParam().reported ? 1U : 0U, log.lines().size());
}

TEST_F(Launch, StartsTheJobsProcessAndMarksTheJobRunning) {
    support::Gate gate(folder.path("gate"));
    const Job& job = addScript(Job::ACTION_BACKUP, "read line < " + gate.path() + "; exit 6");
    const std::string queued = job.toString();

    EXPECT_TRUE(launch(job));

    EXPECT_EQ(Job::STATUS_RUNNING, job.getStatus());
    const std::string pid = std::to_string(job.getPid());
    EXPECT_THAT(diary.take(), ElementsAre("launch job [" + queued + "]", "launch job [1] on pid [" + pid + "]"));
    EXPECT_THAT(log.lines(), IsEmpty());
    gate.open();
    EXPECT_EQ("exit 6", describeStatus(waitForChild(job.getPid())));
}

TEST_F(Launch, RunsTheCommandOfTheJobsBranch) {
    support::writeLocalBackend("broken", "[backup]\ncommand_launch = /bin/false\ncommand_verify = /bin/true\n");
    Job job("broken", Job::ACTION_BACKUP);
    job.setCommandBranch("verify");

    launched(add(job));

    EXPECT_EQ("exit 0", describeStatus(waitForChild(jobQueues["backup"].front().getPid())));
}

TEST_F(Launch, OfABackendThatIsGoneStartsNothing) {
    const Job& job = addHeld(Job::ACTION_BACKUP);
    const std::string queued = job.toString();
    support::removeLocalBackend("held");

    EXPECT_FALSE(launch(job));

    EXPECT_THAT(diary.take(), ElementsAre("launch job [" + queued + "]"));
    expectLocated(log, LOG_ERR, getpid(), QUEUE_UNIT, "wrong backend [" + queued + "]");
    EXPECT_EQ(queued, job.toString());
}

TEST_F(Launch, OfABackendWithoutTheActionStartsNothing) {
    support::writeLocalBackend("held", "[restore]\ncommand_launch = /bin/true\n");
    const Job& job = addHeld(Job::ACTION_BACKUP);

    EXPECT_FALSE(launch(job));

    expectLocated(log, LOG_ERR, getpid(), QUEUE_UNIT, "wrong backend [" + job.toString() + "]");
}

TEST_F(Launch, WithoutRoomForAProcessSaysWhy) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    const Job& job = addHeld(Job::ACTION_BACKUP);
    const std::string queued = job.toString();

    const pid_t daemon = support::startInChild([&job]() {
        support::refuseSystemCalls(MAKE_A_PROCESS, EAGAIN);
        return !launch(job) && job.getStatus() == Job::STATUS_QUEUED && job.getPid() == -1 ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(waitForChild(daemon)));
    EXPECT_THAT(diary.take(), ElementsAre("launch job [" + queued + "]"));
    expectLocated(log, LOG_ERR, daemon, QUEUE_UNIT, "fork: Resource temporarily unavailable");
}

TEST_F(Launch, WithoutRoomForAProcessDropsTheJob) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    const Job& job = addHeld(Job::ACTION_BACKUP);
    const std::string queued = job.toString();

    const pid_t daemon = support::startInChild([]() {
        support::refuseSystemCalls(MAKE_A_PROCESS, EAGAIN);
        queue_scan_next_to_launch();
        return queue_is_empty("backup") ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(waitForChild(daemon)));
    expectLocated(log, LOG_ERR, daemon, QUEUE_UNIT, "fork: Resource temporarily unavailable");
    expectLocated(log, LOG_ERR, daemon, QUEUE_UNIT, "bad job: [" + queued + "]");
}

TEST_F(Launch, OfAJobThatIsRemovedAtOnceStartsAProcessThatDies) {
    const HandledSignal term(SIGTERM);

    for (int round = 0; round < 50 && !HasFailure(); ++round) {
        const Job& job = launched(addHeld(Job::ACTION_BACKUP));
        bool removeJob = false;
        change(job, [&removeJob](Job& running) { sendSignalCb("backup", running, removeJob, nullptr); });

        awaitEnd(job.getPid());
        EXPECT_EQ("signal 15", describeStatus(waitForChild(job.getPid()))) << "round " << round;
        jobQueues["backup"].clear();
    }
}

#ifndef VFORK_IS_FORK
TEST_F(Launch, CostsNoCopyOfTheDaemonsMemory) {
    EXPECT_EQ("exit 0", launchedUnforked(addScript(Job::ACTION_BACKUP, "exit 3")));
    EXPECT_EQ("exit 0", launchedUnforked(add(probe("command_launch = /nonexistent/program"))));
    EXPECT_EQ("exit 0", launchedUnforked(add(probe("command_launch = true\npipe_stdout = " + folder.path("out")))));
}
#endif

TEST_F(Launch, ThatHasSomethingToLogLogsItUnderTheProcessOfTheJob) {
    const Job& job = launched(add(probe("command_launch = true\neviron = {\"A\": \"1\"}")));

    EXPECT_EQ("exit 0", describeStatus(waitForChild(job.getPid())));
    expectLocated(log, LOG_ERR, job.getPid(), "backend_manager", "wrong config: bad env");
}

TEST_F(Launch, OfAProgramThatIsNotThereSaysSo) {
    const Job& job = launched(add(probe("command_launch = /nonexistent/program")));

    EXPECT_EQ("exit 127", describeStatus(waitForChild(job.getPid())));

    EXPECT_THAT(diary.take(),
                testing::Contains("cannot run [/nonexistent/program]: No such file or directory").Times(1));
}

TEST_F(Launch, DoesNotWaitForWhoeverReadsTheJobsOutput) {
    const std::string fifo = folder.path("fifo");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));

    const Job& job = launched(add(probe("command_launch = echo written\npipe_stdout = " + fifo)));

    EXPECT_EQ("written\n", support::readFile(fifo));
    EXPECT_EQ("exit 0", describeStatus(waitForChild(job.getPid())));
}

TEST_F(Launch, LeavesNothingOfItInTheDaemonsMemory) {
    const Job& job = add(probe("command_launch = true {{text}}\npipe_stdout = " + folder.path("out")));
    change(job, [](Job& queued) { queued.setParam("text", std::string(1000, 'x')); });
    const auto launchOnce = [&] { EXPECT_EQ("exit 0", describeStatus(waitForChild(launched(job).getPid()))); };
    launchOnce();
    const std::size_t before = mallinfo2().uordblks;

    for (int round = 0; round < ROUNDS && !HasFailure(); ++round) {
        launchOnce();
    }

    EXPECT_LT(mallinfo2().uordblks, before + ROUNDS * SMALLEST_BLOCK) << "every round leaves some";
}

namespace {

volatile sig_atomic_t handledHere = 0;
volatile sig_atomic_t handledElsewhere = 0;
pid_t daemonProcess = 0;

void noteWhereHandled(int) {
    ++(getpid() == daemonProcess ? handledHere : handledElsewhere);
}

/** Signals its process group, which is the daemon's, without a pause. */
[[noreturn]] void signalTheGroup() {
    signal(SIGUSR1, SIG_IGN);
    while (kill(0, SIGUSR1) == 0) {
    }
    _exit(1);
}

} // namespace

TEST_F(Launch, IsNotDisturbedBySignalsAndRunsNoHandlerInTheJobsProcess) {
    const std::string outcomes = folder.path("outcomes");
    const int status = support::runInChild([&] {
        setpgid(0, 0);
        daemonProcess = getpid();
        signal(SIGUSR1, noteWhereHandled);
        const pid_t sender = fork();
        if (sender == 0) {
            signalTheGroup();
        }
        std::string odd;
        for (int round = 0; round < 100 || handledHere == 0; ++round) {
            const std::string outcome =
                describeStatus(waitForChild(launched(addScript(Job::ACTION_BACKUP, "exit 0")).getPid()));
            // Until it leads a group of its own, the job's process is signalled as well.
            if (outcome != "exit 0" && outcome != "signal " + std::to_string(SIGUSR1)) {
                odd += outcome + "\n";
            }
            jobQueues.clear();
        }
        kill(sender, SIGKILL);
        waitForChild(sender);
        support::writeFile(outcomes, odd);
        return handledElsewhere == 0 ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    EXPECT_EQ("", support::readFile(outcomes));
}
