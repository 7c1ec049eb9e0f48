// What applications are told by System, with the real daemon, real jobs, real
// tasks and a real snapshot tool behind the answers.

#include <marubackup/system_status.h>

#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "daemon_test.h"
#include "support/appliance.h"
#include "support/backend_files.h"
#include "support/emulation.h"
#include "support/in_child.h"
#include "support/waiting.h"

using namespace MARU::Backup;

namespace {

const Job::Action UNTOUCHED = Job::ACTION_RESERVED_BLOCKER;

/** The reason that `predicate` gives; UNTOUCHED if it says yes. */
Job::Action reasonOf(bool (*predicate)(Job::Action&)) {
    Job::Action reason = UNTOUCHED;
    const bool allowed = predicate(reason);
    EXPECT_EQ(allowed, reason == UNTOUCHED);
    return reason;
}

/** A process that takes on a configuration backup, and makes its task visible as the appliance's does. */
class ConfigurationBackup {
public:
    ConfigurationBackup()
        : process(support::startInChild([]() -> int {
              for (;;) {
                  pause();
              }
          })) {
        support::writeTaskFile("@administrators", "confbkp_bkp_7",
                               "{\"pid\": " + std::to_string(process) + ", \"finished\": false}\n");
    }
    ~ConfigurationBackup() {
        if (process > 0) {
            die();
        }
    }
    ConfigurationBackup(const ConfigurationBackup&) = delete;
    ConfigurationBackup& operator=(const ConfigurationBackup&) = delete;

    /** Ends without a word to the task manager. */
    void die() {
        kill(process, SIGKILL);
        support::waitForChild(process);
        process = -1;
    }

private:
    pid_t process;
};

class SystemStatus : public DaemonTest {
protected:
    SystemStatus() {
        support::emptyAppliance();
        support::installSnapshotTool("exit 0");
    }
    ~SystemStatus() override {
        support::emptyAppliance();
    }

    /** What the three predicates say, in one. */
    static void expectReasons(Job::Action backup, Job::Action restore, Job::Action copyTo) {
        EXPECT_EQ(backup, reasonOf(System::canBackup));
        EXPECT_EQ(restore, reasonOf(System::canRestore));
        EXPECT_EQ(copyTo, reasonOf(System::canCopyTo));
        EXPECT_EQ(backup == UNTOUCHED, System::canBackup());
        EXPECT_EQ(restore == UNTOUCHED, System::canRestore());
    }

    /** What runs, of all backends. */
    static void expectRunning(bool backup, bool restore, bool copyTo) {
        EXPECT_EQ(backup, System::isBackupRunning(""));
        EXPECT_EQ(restore, System::isRestoreRunning(""));
        EXPECT_EQ(copyTo, System::isCopyToRunning(""));
    }

    /** That the snapshot tool's answer is lost, which lets a backup start, and that the log tells so, with `code`. */
    void expectComplaint(const std::string& code) {
        EXPECT_EQ(UNTOUCHED, reasonOf(System::canBackup));

        const support::SyslogLine line = log.waitFor("Failed to exec");
        EXPECT_EQ(LOG_ERR, line.priority);
        EXPECT_EQ(0U, line.message.rfind("system_status:", 0)) << line.message;
        const std::string complaint = " Failed to exec marusharesnaptool binary with is-restore-running [" + code + " ";
        EXPECT_NE(std::string::npos, line.message.find(complaint)) << line.message;
    }

    /** Waits for the job's end, and until the daemon has forgotten it. */
    void awaitEnd(const Job& job) {
        EXPECT_TRUE(support::waitUntil([&] { return statusOf(job) == Job::STATUS_NONE; }));
    }
};

} // namespace

TEST_F(SystemStatus, WithoutADaemonEverythingMayStart) {
    expectReasons(UNTOUCHED, UNTOUCHED, UNTOUCHED);
    EXPECT_TRUE(System::canCopyTo());
    expectRunning(false, false, false);
}

TEST_F(SystemStatus, WithAnIdleDaemonEverythingMayStart) {
    start();
    expectReasons(UNTOUCHED, UNTOUCHED, UNTOUCHED);
    EXPECT_TRUE(System::canCopyTo());
    expectRunning(false, false, false);
}

TEST_F(SystemStatus, ABackupHoldsBackWhatNeedsTheApplianceAlone) {
    start();
    const Job job = addGated(Job::ACTION_BACKUP, newGate());

    expectReasons(UNTOUCHED, Job::ACTION_BACKUP, Job::ACTION_BACKUP);
    expectRunning(true, false, false);

    gates.back()->open();
    awaitEnd(job);
    expectReasons(UNTOUCHED, UNTOUCHED, UNTOUCHED);
    expectRunning(false, false, false);
}

TEST_F(SystemStatus, ARestoreHoldsBackEverything) {
    start();
    addGated(Job::ACTION_RESTORE, newGate());

    expectReasons(Job::ACTION_RESTORE, Job::ACTION_RESTORE, Job::ACTION_RESTORE);
    EXPECT_FALSE(System::canCopyTo());
    expectRunning(false, true, false);
}

TEST_F(SystemStatus, ACopyToHoldsBackAnotherOnlyIfItIsAskedForItsReason) {
    start();
    for (int running = 0; running < 5; ++running) {
        addGated(Job::ACTION_COPY_TO, newGate());
    }
    const Job waiting = addGated(Job::ACTION_COPY_TO, newGate());
    EXPECT_TRUE(isQueued(waiting));

    expectReasons(UNTOUCHED, Job::ACTION_COPY_TO, Job::ACTION_COPY_TO);
    EXPECT_TRUE(System::canCopyTo());
    expectRunning(false, false, true);
}

TEST_F(SystemStatus, OtherWorkHoldsNothingBack) {
    start();
    for (const Job::Action action :
         {Job::ACTION_RELINK, Job::ACTION_REMOVE_VERSION, Job::ACTION_REMOVE_TASK, Job::ACTION_TARGET_COPY_TO}) {
        addGated(action, newGate());
    }

    expectReasons(UNTOUCHED, UNTOUCHED, UNTOUCHED);
    expectRunning(false, false, false);
}

TEST_F(SystemStatus, AQueuedJobCountsAsOneThatRuns) {
    start();
    addGated(Job::ACTION_BACKUP, newGate(), "gated");
    const Job waiting = addGated(Job::ACTION_BACKUP, newGate(), "stubborn");
    EXPECT_TRUE(isQueued(waiting));

    EXPECT_TRUE(System::isBackupRunning("stubborn"));

    EXPECT_EQ(200, controller.removeJob(waiting.getJobId()));
    EXPECT_FALSE(System::isBackupRunning("stubborn"));
}

TEST_F(SystemStatus, AJobRunsForItsOwnBackendAlone) {
    start();
    addGated(Job::ACTION_BACKUP, newGate(), "gated");
    addGated(Job::ACTION_COPY_TO, newGate(), "stubborn");

    EXPECT_TRUE(System::isBackupRunning("gated"));
    EXPECT_FALSE(System::isBackupRunning("stubborn"));
    EXPECT_FALSE(System::isCopyToRunning("gated"));
    EXPECT_TRUE(System::isCopyToRunning("stubborn"));
    EXPECT_FALSE(System::isBackupRunning("missing"));
    expectRunning(true, false, true);
}

TEST_F(SystemStatus, AConfigurationBackupHoldsBackWhatNeedsTheApplianceAlone) {
    start();
    ConfigurationBackup outside;

    expectReasons(UNTOUCHED, Job::ACTION_BACKUP, Job::ACTION_BACKUP);
    EXPECT_TRUE(System::canCopyTo());
    EXPECT_TRUE(System::isBackupRunning(""));
    EXPECT_TRUE(System::isBackupRunning("configbackup"));
    EXPECT_FALSE(System::isBackupRunning("tidebackup"));
    EXPECT_FALSE(System::isBackupRunning("gated"));

    outside.die();
    expectReasons(UNTOUCHED, UNTOUCHED, UNTOUCHED);
    expectRunning(false, false, false);
}

TEST_F(SystemStatus, AConfigurationBackupDoesNotHideAJobOfAnotherBackend) {
    support::writeLocalBackend("tidebackup", everyAction(WAITS_AT_GATE));
    start();
    const ConfigurationBackup outside;
    EXPECT_FALSE(System::isBackupRunning("tidebackup"));

    addGated(Job::ACTION_BACKUP, newGate(), "tidebackup");

    EXPECT_TRUE(System::isBackupRunning("tidebackup"));
}

TEST_F(SystemStatus, ASpaceBuildHoldsBackEverythingAndIsNamedFirst) {
    start();
    addGated(Job::ACTION_RESTORE, newGate());
    support::writeFile(support::SPACE_BUILD_FILE, "");

    expectReasons(Job::ACTION_SPACE_BUILD, Job::ACTION_SPACE_BUILD, Job::ACTION_SPACE_BUILD);
    EXPECT_FALSE(System::canCopyTo());

    unlink(support::SPACE_BUILD_FILE);
    expectReasons(Job::ACTION_RESTORE, Job::ACTION_RESTORE, Job::ACTION_RESTORE);
}

TEST_F(SystemStatus, ASnapshotRestoreHoldsBackEverythingAndIsNamedBeforeABackup) {
    start();
    addGated(Job::ACTION_BACKUP, newGate());
    support::installSnapshotTool("test \"$*\" = is-restore-running");
    expectReasons(UNTOUCHED, Job::ACTION_BACKUP, Job::ACTION_BACKUP);

    support::installSnapshotTool("test \"$*\" != is-restore-running");
    expectReasons(Job::ACTION_SHARE_SNAPSHOT_RESTORE, Job::ACTION_SHARE_SNAPSHOT_RESTORE,
                  Job::ACTION_SHARE_SNAPSHOT_RESTORE);
    EXPECT_FALSE(System::canCopyTo());
}

TEST_F(SystemStatus, AToolThatIsKilledIsToldToTheLogWithoutTheProcess) {
    support::installSnapshotTool("kill -KILL $$");

    expectComplaint("0x0A01");
}

TEST_F(SystemStatus, AToolThatCannotBeRunIsToldToTheLogWithoutTheProcess) {
    SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    std::filesystem::remove(support::SNAPSHOT_TOOL);

    expectComplaint("0x0A00");
}

TEST_F(SystemStatus, ADaemonThatHasEndedHoldsNothingBack) {
    start();
    addGated(Job::ACTION_BACKUP, newGate());
    expectRunning(true, false, false);

    daemon->stop(SIGTERM);

    expectReasons(UNTOUCHED, UNTOUCHED, UNTOUCHED);
    expectRunning(false, false, false);
}

TEST_F(SystemStatus, IsToldToSeveralThreadsAtOnce) {
    start();
    const ConfigurationBackup outside;
    addGated(Job::ACTION_COPY_TO, newGate());
    std::vector<std::thread> threads;
    for (int number = 0; number < 6; ++number) {
        threads.emplace_back([] {
            for (int round = 0; round < 5; ++round) {
                expectReasons(UNTOUCHED, Job::ACTION_BACKUP, Job::ACTION_BACKUP);
                EXPECT_TRUE(System::canCopyTo());
                expectRunning(true, false, true);
                EXPECT_FALSE(System::isBackupRunning("tidebackup"));
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}
