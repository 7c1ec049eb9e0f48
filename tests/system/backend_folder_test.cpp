// Backends that come and go while the daemon runs.

#include <sys/stat.h>

#include <csignal>
#include <cstdio>

#include "daemon_test.h"
#include "support/backend_files.h"
#include "support/files.h"

using namespace MARU::Backup;

namespace {

const std::string LOCAL_FOLDER = "/usr/local/share/marubackup/";

class BackendFolder : public DaemonTest {
protected:
    BackendFolder() {
        start();
    }

    /** Everything that happened in the folder so far has been seen when this returns. */
    void settle() {
        support::writeLocalBackend("settled", "");
        daemon->waitForLine("new backend [settled]");
    }
};

} // namespace

TEST_F(BackendFolder, ANewFileIsReportedAndCanBeUsedAtOnce) {
    support::writeLocalBackend("fresh", everyAction("command_launch = true\n"));
    daemon->waitForLine("new backend [fresh]");
    daemon->waitForLine(exitLine(add(Job("fresh", Job::ACTION_BACKUP)), 0));
}

TEST_F(BackendFolder, RemovingAFileStopsTheJobsOfThatBackendAndNoOthers) {
    support::writeLocalBackend("leaving", everyAction(WAITS_AT_GATE));
    support::Gate& gate = newGate();
    Job running("leaving", Job::ACTION_BACKUP);
    running.setParam("gate", gate.path());
    running = add(running);
    Job waiting("leaving", Job::ACTION_BACKUP);
    waiting.setParam("job_id", "2");
    waiting = add(waiting);
    const Job other = addGated(Job::ACTION_COPY_TO, newGate());
    gate.awaitJob();
    const std::string pid = std::to_string(pidOf(running));

    support::removeLocalBackend("leaving");
    daemon->waitForLine("rm backend [leaving]");
    daemon->waitForLine("send sig[15] to job [1] pid [" + pid + "]");
    daemon->waitForLine("job [1] term by sig(" + std::to_string(std::stoi(pid) & 0x7F) + ")");
    EXPECT_EQ(Job::STATUS_NONE, statusOf(waiting));
    EXPECT_TRUE(isRunning(other));
}

TEST_F(BackendFolder, AFileThatIsMovedAwayCountsAsRemoved) {
    ASSERT_EQ(0, std::rename((LOCAL_FOLDER + "gated.conf").c_str(), (LOCAL_FOLDER + "gated.off").c_str()));
    daemon->waitForLine("rm backend [gated]");
}

TEST_F(BackendFolder, AFileThatIsChangedIsLeftAlone) {
    const Job running = addGated(Job::ACTION_BACKUP, newGate());
    support::writeLocalBackend("gated", "# now empty\n");
    settle();
    EXPECT_EQ(0, daemon->countLines("rm backend [gated]"));
    EXPECT_EQ(0, daemon->countLines("new backend [gated]"));
    EXPECT_TRUE(isRunning(running));
}

TEST_F(BackendFolder, OnlyNamesThatEndInConfCount) {
    for (const char* name : {"x.conf.bak", "y.CONF", "zconf", "a.con"}) {
        support::writeFile(LOCAL_FOLDER + name, "");
    }
    settle();
    for (const std::string& line : daemon->diary()) {
        EXPECT_TRUE(line.rfind("new backend", 0) != 0 || line == "new backend [settled]") << line;
    }
}

TEST_F(BackendFolder, AFolderAndANameThatIsOnlyTheEndingCountToo) {
    ASSERT_EQ(0, mkdir((LOCAL_FOLDER + "folder.conf").c_str(), 0755));
    daemon->waitForLine("new backend [folder]");
    support::writeFile(LOCAL_FOLDER + ".conf", "");
    daemon->waitForLine("new backend []");
}
