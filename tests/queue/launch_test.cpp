#include "queue/queue_server.h"

#include <sys/syscall.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <ostream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue_fixture.h"
#include "signals.h"
#include "support/backend_files.h"
#include "support/emulation.h"
#include "support/in_child.h"
#include "support/named_rows.h"
#include "support/syscall_filter.h"

using namespace MARU::Backup;
using support::describeStatus;
using support::expectLocated;
using support::waitForChild;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class Launch : public QueueTest {};

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
        support::refuseSystemCalls({SYS_clone, SYS_clone3}, EAGAIN);
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
        support::refuseSystemCalls({SYS_clone, SYS_clone3}, EAGAIN);
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
