#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <functional>
#include <regex>
#include <string>

#include "status_fixture.h"
#include "support/appliance.h"
#include "support/emulation.h"
#include "support/in_child.h"

// The tool that knows whether a snapshot of a shared folder is being restored.

using namespace MARU::Backup;

namespace {

class SnapshotTool : public SystemStatus {
protected:
    /** That the tool's answer is lost, which lets a backup start, and that one line tells so. */
    void expectComplaint(const std::string& code) {
        EXPECT_EQ(ALLOWED, ask(System::canBackup));

        const support::SyslogLine line = log.waitFor("Failed to exec");
        const std::regex form("system_status:[1-9][0-9]* Failed to exec marusharesnaptool binary with "
                              "is-restore-running \\[" +
                              code + " exec\\.cpp:[1-9][0-9]*\\]");
        EXPECT_TRUE(std::regex_match(line.message, form)) << line.message;
        EXPECT_EQ(LOG_ERR, line.priority);
        EXPECT_EQ(++complaints, log.count("Failed to exec"));
    }

private:
    int complaints = 0;
};

const char* const CANNOT_BE_RUN = "0x0A00";
const char* const KILLED = "0x0A01";

/** Each follows the one before it. */
const std::function<void()> WAYS_TO_BE_USELESS[] = {
    [] { EXPECT_EQ(0, chmod(support::SNAPSHOT_TOOL, 0644)); },
    [] { support::writeFile(support::SNAPSHOT_TOOL, "exit 1\n", 0755); },
    [] {
        std::filesystem::remove(support::SNAPSHOT_TOOL);
        std::filesystem::create_directory(support::SNAPSHOT_TOOL);
    },
    [] { std::filesystem::remove(support::SNAPSHOT_TOOL); },
    [] { std::filesystem::remove_all(std::filesystem::path(support::SNAPSHOT_TOOL).parent_path()); },
};

} // namespace

TEST_F(SnapshotTool, HoldsABackupBackByOneAlone) {
    for (const int status : {0, 1, 2, 3, 127, 255}) {
        setSnapshotTool(status);
        EXPECT_EQ(status == 1 ? refusedFor(Job::ACTION_SHARE_SNAPSHOT_RESTORE) : ALLOWED, ask(System::canBackup))
            << status;
        EXPECT_EQ(status != 1, System::canBackup()) << status;
        EXPECT_EQ(status != 1, System::canRestore()) << status;
        EXPECT_EQ(status != 1, System::canCopyTo()) << status;
        EXPECT_EQ(4, snapshotQuestions());
    }
    EXPECT_EQ(0, log.count("Failed to exec"));
}

TEST_F(SnapshotTool, HoldsNothingBackIfItCannotBeRun) {
    for (const auto& makeUseless : WAYS_TO_BE_USELESS) {
        makeUseless();
        EXPECT_EQ(ALLOWED, ask(System::canBackup));
    }
}

TEST_F(SnapshotTool, IsComplainedOfIfItCannotBeRun) {
    SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    for (const auto& makeUseless : WAYS_TO_BE_USELESS) {
        makeUseless();
        expectComplaint(CANNOT_BE_RUN);
    }
}

TEST_F(SnapshotTool, MayBeEndedByASignal) {
    support::installSnapshotTool("kill -KILL $$");
    expectComplaint(KILLED);

    support::installSnapshotTool("kill -HUP $$"); // signal 1 is no exit status 1
    expectComplaint(KILLED);
}

TEST_F(SnapshotTool, IsComplainedOfOnceAPredicate) {
    support::installSnapshotTool("kill -KILL $$");

    EXPECT_EQ(ALLOWED, ask(System::canRestore));
    EXPECT_EQ(1, log.count("Failed to exec"));
    EXPECT_EQ(ALLOWED, ask(System::canCopyTo));
    EXPECT_EQ(2, log.count("Failed to exec"));
    EXPECT_TRUE(System::canCopyTo());
    EXPECT_EQ(3, log.count("Failed to exec"));
}

TEST_F(SnapshotTool, IsNotRunByWhatOnlyAsksWhatRuns) {
    for (const char* backend : {"", "configbackup", "tidebackup"}) {
        System::isBackupRunning(backend);
        System::isRestoreRunning(backend);
        System::isCopyToRunning(backend);
    }
    EXPECT_EQ(0, snapshotQuestions());
}

TEST_F(SnapshotTool, HasNoAnswerForACallerThatIgnoresItsChildren) {
    setSnapshotTool(1);
    const int status = support::runInChild([] {
        signal(SIGCHLD, SIG_IGN);
        return System::canBackup() ? 0 : 1;
    });

    EXPECT_EQ("exit 0", support::describeStatus(status));
    EXPECT_EQ(1, log.count("Failed to exec"));
}
