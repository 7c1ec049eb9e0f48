// Backends that come and go while the daemon runs.

#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <filesystem>

#include "daemon_test.h"
#include "raw_requests.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/socket_peer.h"

using namespace MARU::Backup;

namespace {

const std::string LOCAL_FOLDER = "/usr/local/share/marubackup/";

class BackendFolderTest : public DaemonTest {
protected:
    /** Everything that happened in the folder so far has been seen when this returns. */
    void settle() {
        support::writeLocalBackend("settled", "");
        daemon->waitForLine("new backend [settled]");
    }

    /** The diary's lines that start with `start`, in order, but for those of settle(). */
    std::vector<std::string> linesAbout(const std::string& start) {
        std::vector<std::string> found;
        for (const std::string& line : daemon->diary()) {
            if (line.rfind(start, 0) == 0 && line.find("[settled]") == std::string::npos) {
                found.push_back(line);
            }
        }
        return found;
    }

    /** Runs a job of a backend of that name, which is declared first. */
    void use(const std::string& backend) {
        support::writeLocalBackend(backend, everyAction("command_launch = true\n"));
        daemon->waitForLine(exitLine(add(Job(backend, Job::ACTION_BACKUP)), 0));
    }
};

class BackendFolder : public BackendFolderTest {
protected:
    BackendFolder() {
        start();
    }
};

/** Made anew, the folder can be removed and moved: it is no mount point. Each test starts its daemon. */
class MovableBackendFolder : public BackendFolderTest {
protected:
    MovableBackendFolder() {
        umount2(support::LOCAL_BACKEND_FOLDER, MNT_DETACH); // fails where an earlier test has done it
        std::filesystem::remove_all(support::LOCAL_BACKEND_FOLDER);
        std::filesystem::create_directory(support::LOCAL_BACKEND_FOLDER);
    }

    ~MovableBackendFolder() override {
        std::filesystem::remove_all(support::LOCAL_BACKEND_FOLDER); // or the link in its place
        std::filesystem::remove_all(std::string(support::LOCAL_BACKEND_FOLDER) + ".moved");
        std::filesystem::create_directory(support::LOCAL_BACKEND_FOLDER);
    }
};

std::vector<std::string> manyNames(int count, const std::string& start = "n") {
    std::vector<std::string> names;
    for (int number = 0; number < count; ++number) {
        names.push_back(start + std::to_string(1000 + number));
    }
    return names;
}

std::vector<std::string> linesOf(const std::string& start, const std::vector<std::string>& names) {
    std::vector<std::string> lines;
    for (const std::string& name : names) {
        lines.push_back(start + " [" + name + "]");
    }
    return lines;
}

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
    EXPECT_EQ(std::vector<std::string>(), linesAbout("new backend"));
}

TEST_F(BackendFolder, AFolderAndANameThatIsOnlyTheEndingCountToo) {
    ASSERT_EQ(0, mkdir((LOCAL_FOLDER + "folder.conf").c_str(), 0755));
    daemon->waitForLine("new backend [folder]");
    support::writeFile(LOCAL_FOLDER + ".conf", "");
    daemon->waitForLine("new backend []");
}

TEST_F(BackendFolder, EachOfAThousandFilesAtOnceIsReportedOnce) {
    const std::vector<std::string> names = manyNames(1000);
    for (const std::string& name : names) {
        support::writeLocalBackend(name, everyAction("command_launch = true\n"));
    }
    settle();
    EXPECT_EQ(linesOf("new backend", names), linesAbout("new backend"));

    for (const std::string& name : names) {
        support::removeLocalBackend(name);
    }
    support::removeLocalBackend("settled");
    daemon->waitForLine("rm backend [settled]");
    EXPECT_EQ(linesOf("rm backend", names), linesAbout("rm backend"));
}

TEST_F(BackendFolder, WhatComesWhileTheDaemonIsBusyIsReportedAfterwards) {
    support::Gate& gate = newGate();
    support::writeLocalBackend("slow", "[backup]\ncommand_launch = true\ncommand_check = /bin/sh -c 'read line < "
                                       "\"$0\"' " +
                                           gate.path() + "\n");
    daemon->waitForLine("new backend [slow]");
    support::SocketPeer peer;
    peer.write(support::frame(enqueueRequest(Job("slow", Job::ACTION_BACKUP))));
    gate.awaitJob();
    const std::vector<std::string> names = manyNames(1000);
    for (const std::string& name : names) {
        support::writeLocalBackend(name, "");
    }
    gate.open();
    peer.readFrame();
    settle();
    EXPECT_EQ(linesOf("new backend", names), linesAbout("new backend [n"));
}

TEST_F(BackendFolder, TheLongestNamesAreReportedWholeAndCanBeUsed) {
    const std::vector<std::string> names = manyNames(100, std::string(246, 'x'));
    ASSERT_EQ(255U, (names.front() + ".conf").size());
    for (const std::string& name : names) {
        support::writeLocalBackend(name, "");
    }
    settle();
    EXPECT_EQ(linesOf("new backend", names), linesAbout("new backend"));
    use(names.back());
}

TEST_F(MovableBackendFolder, MadeAgainIsSearchedButNoLongerWatched) {
    start();
    std::filesystem::remove_all(support::LOCAL_BACKEND_FOLDER);
    std::filesystem::create_directory(support::LOCAL_BACKEND_FOLDER);
    use("fresh");
    EXPECT_EQ(std::vector<std::string>(), linesAbout("new backend"));
}

TEST_F(MovableBackendFolder, RemovedWithItsFilesStopsTheirJobs) {
    start();
    support::writeLocalBackend("leaving", everyAction(WAITS_AT_GATE));
    support::Gate& gate = newGate();
    const Job job = addGated(Job::ACTION_BACKUP, gate, "leaving");
    gate.awaitJob();
    std::filesystem::remove_all(support::LOCAL_BACKEND_FOLDER);
    daemon->waitForLine("rm backend [leaving]");
    daemon->waitForLineStarting("job [" + std::to_string(job.getJobId()) + "] term by sig(");
    Job next("leaving", Job::ACTION_BACKUP);
    EXPECT_EQ(505, controller.addJob(next));
}

TEST_F(MovableBackendFolder, ReplacedByALinkIsSearchedBehindTheLink) {
    start();
    const std::string other = folder.path("other");
    std::filesystem::create_directory(other);
    std::filesystem::rename(support::LOCAL_BACKEND_FOLDER, std::string(support::LOCAL_BACKEND_FOLDER) + ".moved");
    std::filesystem::create_directory_symlink(other, support::LOCAL_BACKEND_FOLDER);
    use("fresh");
    EXPECT_TRUE(std::filesystem::exists(other + "/fresh.conf"));
    EXPECT_EQ(std::vector<std::string>(), linesAbout("new backend"));
}

TEST_F(MovableBackendFolder, ThatIsALinkFromTheStartIsWatchedBehindTheLink) {
    const std::string other = folder.path("other");
    std::filesystem::create_directory(other);
    std::filesystem::remove(support::LOCAL_BACKEND_FOLDER);
    std::filesystem::create_directory_symlink(other, support::LOCAL_BACKEND_FOLDER);
    start();
    use("fresh");
    daemon->waitForLine("new backend [fresh]");
}
