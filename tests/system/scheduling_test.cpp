// Which jobs run when.

#include <unistd.h>

#include <cstdio>

#include "daemon_test.h"
#include "support/backend_files.h"

using namespace MARU::Backup;

namespace {

class Scheduling : public DaemonTest {
protected:
    Scheduling() {
        start();
    }
};

struct Limit {
    Job::Action action;
    int limit;
};

class SchedulingLimit : public Scheduling, public testing::WithParamInterface<Limit> {};

} // namespace

TEST_F(Scheduling, TheSecondBackupWaitsForTheReapingOfTheFirst) {
    support::Gate& gate = newGate();
    const Job first = addGated(Job::ACTION_BACKUP, gate);
    const Job second = addGated(Job::ACTION_BACKUP, newGate());
    EXPECT_TRUE(isRunning(first));
    EXPECT_TRUE(isQueued(second));

    gate.open();
    daemon->waitForLine("launch job [" + second.toString() + "]");
    EXPECT_EQ(Job::STATUS_NONE, statusOf(first));
    EXPECT_TRUE(isRunning(second));
    EXPECT_LT(placeInDiary(exitLine(first, 0)), placeInDiary("launch job [" + second.toString() + "]"));
}

TEST_P(SchedulingLimit, AQueueStartsNoMoreThanItsLimit) {
    std::vector<Job> jobs;
    std::vector<support::Gate*> waiting;
    for (int count = 0; count < GetParam().limit + 2; ++count) {
        waiting.push_back(&newGate());
        jobs.push_back(addGated(GetParam().action, *waiting.back()));
    }
    const auto limit = static_cast<std::size_t>(GetParam().limit);
    for (std::size_t at = 0; at < jobs.size(); ++at) {
        EXPECT_EQ(at < limit ? Job::STATUS_RUNNING : Job::STATUS_QUEUED, statusOf(jobs[at])) << jobs[at];
    }

    waiting[0]->open();
    daemon->waitForLine("launch job [" + jobs[limit].toString() + "]");
    EXPECT_TRUE(isRunning(jobs[limit]));
    EXPECT_TRUE(isQueued(jobs[limit + 1]));
}

INSTANTIATE_TEST_SUITE_P(EachQueue, SchedulingLimit,
                         testing::Values(Limit{Job::ACTION_BACKUP, 1}, Limit{Job::ACTION_COPY_TO, 5},
                                         Limit{Job::ACTION_TARGET_COPY_TO, 5}, Limit{Job::ACTION_RELINK, 4},
                                         Limit{Job::ACTION_REMOVE_VERSION, 10}, Limit{Job::ACTION_REMOVE_TASK, 10}),
                         [](const auto& row) { return action2str(row.param.action); });

TEST_F(Scheduling, QueuesDoNotBlockOneAnother) {
    EXPECT_TRUE(isRunning(addGated(Job::ACTION_BACKUP, newGate())));
    EXPECT_TRUE(isRunning(addGated(Job::ACTION_COPY_TO, newGate())));
    EXPECT_TRUE(isRunning(addGated(Job::ACTION_REMOVE_TASK, newGate())));
}

TEST_F(Scheduling, ARestoreStartsBesideABackupAndHoldsBackEverythingElse) {
    support::Gate& backupGate = newGate();
    support::Gate& restoreGate = newGate();
    const Job running = addGated(Job::ACTION_BACKUP, backupGate);
    const Job waiting = addGated(Job::ACTION_BACKUP, newGate());
    const Job restore = addGated(Job::ACTION_RESTORE, restoreGate);
    EXPECT_TRUE(isRunning(running));
    EXPECT_TRUE(isRunning(restore));

    backupGate.open();
    daemon->waitForLine(exitLine(running, 0));
    EXPECT_TRUE(isQueued(waiting)) << "a backup was started beside a restore";

    restoreGate.open();
    daemon->waitForLine(exitLine(restore, 0));
    EXPECT_TRUE(isRunning(waiting));
}

TEST_F(Scheduling, AStoppingRestoreStillHoldsBackEverythingElse) {
    support::Gate& backupGate = newGate();
    support::Gate& restoreGate = newGate();
    const Job running = addGated(Job::ACTION_BACKUP, backupGate);
    const Job waiting = addGated(Job::ACTION_BACKUP, newGate());
    const Job restore = addGated(Job::ACTION_RESTORE, restoreGate, "stubborn");
    restoreGate.awaitJob();

    EXPECT_EQ(200, controller.removeJob(restore.getJobId()));
    EXPECT_EQ(Job::STATUS_STOPPING, statusOf(restore));
    backupGate.open();
    daemon->waitForLine(exitLine(running, 0));
    EXPECT_TRUE(isQueued(waiting));
    restoreGate.open();
    daemon->waitForLine(exitLine(restore, 0));
    EXPECT_TRUE(isRunning(waiting));
}

TEST_F(Scheduling, AJobWhoseConfigurationVanishedIsDroppedWithTwoMessages) {
    support::writeSystemBackend("vanishing", everyAction(WAITS_AT_GATE));
    support::Gate& gate = newGate();
    const Job first = addGated(Job::ACTION_BACKUP, gate);
    const Job dropped = add(Job("vanishing", Job::ACTION_BACKUP));
    const Job next = addGated(Job::ACTION_BACKUP, newGate());
    support::removeSystemBackend("vanishing");

    gate.open();
    daemon->waitForLine(exitLine(first, 0));
    support::expectLocated(log, LOG_ERR, daemon->pid(), "queue_server", "wrong backend [" + dropped.toString() + "]");
    support::expectLocated(log, LOG_ERR, daemon->pid(), "queue_server", "bad job: [" + dropped.toString() + "]");
    EXPECT_EQ(Job::STATUS_NONE, statusOf(dropped));
    EXPECT_TRUE(isRunning(next)) << "a failed launch took the slot";
}

TEST_F(Scheduling, AMissingProgramEndsTheJobWith127) {
    support::writeLocalBackend("broken", everyAction("command_launch = /nowhere/program\n"));
    const Job job = add(Job("broken", Job::ACTION_BACKUP));
    daemon->waitForLine(exitLine(job, 127));
    EXPECT_EQ(Job::STATUS_NONE, statusOf(job));
}

TEST_F(Scheduling, ABranchWithoutACommandEndsTheJobWith127AndSaysSo) {
    Job job("gated", Job::ACTION_BACKUP);
    job.setCommandBranch("verify");
    job = add(job);
    daemon->waitForLine(exitLine(job, 127));

    const std::string launched = daemon->waitForLineStarting("launch job [1] on pid [");
    int pid = 0;
    ASSERT_EQ(1, std::sscanf(launched.c_str(), "launch job [1] on pid [%d]", &pid));
    support::expectLocated(log, LOG_ERR, pid, "backend_manager", "wrong config: launch command not found");
}

TEST_F(Scheduling, AJobOfAnUnknownActionWaitsUntilItIsRemoved) {
    support::writeLocalBackend("odd", "[none]\n" + WAITS_AT_GATE);
    const Job job = add(Job("odd", static_cast<Job::Action>(3)));
    daemon->signal(SIGHUP);
    daemon->waitForLine("  [none] " + job.toString());
    EXPECT_TRUE(isQueued(job));

    EXPECT_EQ(200, controller.removeJob(job.getJobId()));
    EXPECT_EQ(Job::STATUS_NONE, statusOf(job));
}
