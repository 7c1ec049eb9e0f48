// A daemon that cannot be set up.

#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "daemon_test.h"
#include "support/in_child.h"
#include "support/socket_peer.h"

using namespace MARU::Backup;

namespace {

class StartUp : public DaemonTest {
protected:
    /** Starts a daemon with `standIn` before the library, which reads `wish`. */
    void startWith(const std::string& standIn, const std::string& wish, bool comesUp) {
        support::DaemonOptions options;
        options.awaitSocket = comesUp;
        options.beforeStart = [standIn, wish]() {
            setenv("LD_PRELOAD", standIn.c_str(), 1);
            setenv("ASAN_OPTIONS", "verify_asan_link_order=0", 0); // its library is loaded after ours
            setenv("REFUSED_REGISTRATION", wish.c_str(), 1);
        };
        start(options);
    }

    /** Starts a daemon whose server refuses one kind of registration. */
    void startRefusing(const std::string& registration, bool comesUp) {
        startWith(REFUSED_REGISTRATION, registration, comesUp);
    }
};

} // namespace

TEST_F(StartUp, WithoutALoopHandlerThereIsNoDaemon) {
    startRefusing("loop", false);
    support::expectLocated(log, LOG_ERR, daemon->pid(), "queue_server", "set loop handler failed");
    EXPECT_EQ("exit 1", support::describeStatus(daemon->wait()));
    EXPECT_FALSE(std::filesystem::exists(support::DAEMON_SOCKET));
}

TEST_F(StartUp, WithoutASignalHandlerThereIsNoDaemon) {
    startRefusing("signal", false);
    support::expectLocated(log, LOG_ERR, daemon->pid(), "queue_server", "set signal handler failed");
    EXPECT_EQ("exit 1", support::describeStatus(daemon->wait()));
    EXPECT_FALSE(std::filesystem::exists(support::DAEMON_SOCKET));
}

TEST_F(StartUp, WithoutAFolderWatchTheDaemonServes) {
    startRefusing("watch", true);
    support::expectLocated(log, LOG_ERR, daemon->pid(), "queue_server", "config folder add watch failed");
    EXPECT_EQ("{\"code\":200,\"jobs\":[]}", support::SocketPeer().ask("{\"op\":\"job_list\"}"));
}

TEST_F(StartUp, WhileARestoreRunsElsewhereNoJobIsAdmitted) {
    startWith(RESTORE_ELSEWHERE, "", true);
    Job job("gated", Job::ACTION_BACKUP);
    EXPECT_EQ(406, controller.addJob(job));
    daemon->waitForLine("restore job running");
    EXPECT_EQ(404, controller.getJob(1, job));
}

TEST_F(StartUp, TheSocketIsForRootAndTheAdministratorsGroup) {
    start();
    struct stat info = {};
    ASSERT_EQ(0, stat(support::DAEMON_SOCKET, &info));
    EXPECT_EQ(0660U, info.st_mode & 07777);
    EXPECT_EQ(0U, info.st_uid);
    EXPECT_EQ(101U, info.st_gid);
}

TEST_F(StartUp, ASocketThatCannotBeMadeIsStatusOne) {
    std::filesystem::create_directory(support::DAEMON_SOCKET);
    support::DaemonOptions options;
    options.awaitSocket = false;
    start(options);
    EXPECT_EQ("exit 1", support::describeStatus(daemon->wait()));
    EXPECT_EQ(1, log.count("bind [/var/run/marubackupd.socket] failed, Address already in use"));
}
