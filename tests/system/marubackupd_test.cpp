// What the daemon's program adds to the library: its command line, the lock that
// keeps a second one out, its limits and its warnings.

#include <fcntl.h>
#include <linux/capability.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "daemon_test.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/resource_limit.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using namespace MARU::Backup;

namespace {

const char* const LOCK_FILE = "/var/run/marubackupd.lock";

/** Another user, who can still start the program if the checkout is in a folder of root's own. */
void becomeNobodyWhoReadsEverything() {
    __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct sets[2] = {};
    sets[0].effective = sets[0].permitted = sets[0].inheritable = 1U << CAP_DAC_READ_SEARCH;
    if (prctl(PR_SET_KEEPCAPS, 1) != 0 || setgid(65534) != 0 || setuid(65534) != 0 ||
        syscall(SYS_capset, &header, sets) != 0 ||
        prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_RAISE, CAP_DAC_READ_SEARCH, 0, 0) != 0) {
        _exit(99);
    }
}

class Marubackupd : public DaemonTest {
protected:
    /** How a daemon ends that is not expected to come up. */
    std::string endOf(const std::vector<std::string>& arguments, const std::function<void()>& before = nullptr) {
        support::DaemonOptions options;
        options.arguments = arguments;
        options.beforeStart = before;
        options.awaitSocket = false;
        support::Daemon other(options);
        const std::string ended = support::describeStatus(other.wait());
        diary = other.diary();
        return ended;
    }

    /** What the last of them wrote. */
    std::vector<std::string> diary;
};

} // namespace

TEST_F(Marubackupd, TellsItsVersionAndItsUsage) {
    EXPECT_EQ("exit 0", endOf({"--version"}));
    EXPECT_EQ("exit 0", endOf({"--help"}));
    EXPECT_EQ("exit 2", endOf({"--dance"}));
    EXPECT_EQ("exit 2", endOf({"argument"}));
}

TEST_F(Marubackupd, KeepsASecondOneOutAndNamesItself) {
    start();
    EXPECT_EQ("exit 1", endOf({}));
    ASSERT_FALSE(diary.empty());
    EXPECT_NE(std::string::npos, diary[0].find("kill " + std::to_string(daemon->pid()))) << diary[0];
    EXPECT_EQ(LOG_ERR, log.waitFor("a daemon serves").priority);
}

TEST_F(Marubackupd, KeepsASecondOneOutAlsoWithoutItsLockFile) {
    start();
    std::filesystem::remove(LOCK_FILE);
    EXPECT_EQ("exit 1", endOf({}));
    EXPECT_EQ("{\"code\":200,\"jobs\":[]}", support::SocketPeer().ask("{\"op\":\"job_list\"}"));
}

TEST_F(Marubackupd, FollowsNoLinkToAnotherFile) {
    support::writeFile(folder.path("precious"), "content");
    std::filesystem::create_symlink(folder.path("precious"), LOCK_FILE);
    EXPECT_EQ("exit 1", endOf({}));
    EXPECT_EQ("content", support::readFile(folder.path("precious")));
}

TEST_F(Marubackupd, RefusesToRunWithoutRoot) {
    EXPECT_EQ("exit 1", endOf({}, becomeNobodyWhoReadsEverything));
    EXPECT_NE(std::string::npos, diary.at(0).find("must be started by root"));
}

TEST_F(Marubackupd, RefusesToRunWithoutTheFolderOfItsSocket) {
    const auto hideVar = []() {
        if (unshare(CLONE_NEWNS) != 0 || mount("tmpfs", "/var", "tmpfs", 0, nullptr) != 0) {
            _exit(99);
        }
    };
    EXPECT_EQ("exit 1", endOf({}, hideVar));
    EXPECT_EQ("marubackupd: cannot open the lock file /var/run/marubackupd.lock: No such file or directory",
              diary.at(0));
}

TEST_F(Marubackupd, ServesWithoutSyslog) {
    std::filesystem::remove("/dev/log");
    start();
    support::writeLocalBackend("quick", everyAction("command_launch = true\n"));
    daemon->waitForLine(exitLine(add(Job("quick", Job::ACTION_BACKUP)), 0));
    Job unknown("unknown", Job::ACTION_BACKUP);
    EXPECT_EQ(505, controller.addJob(unknown));
    EXPECT_EQ("exit 0", support::describeStatus(daemon->stop(SIGTERM)));
}

TEST_F(Marubackupd, WritesEachLineOfItsDiaryAtOnce) {
    // Otherwise what a job writes to the same place would end up in the middle of it.
    int diaryEnds[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, diaryEnds));
    support::DaemonOptions options;
    options.beforeStart = [&diaryEnds]() { dup2(diaryEnds[1], STDERR_FILENO); };
    start(options);
    close(diaryEnds[1]);
    const Job job = addGated(Job::ACTION_BACKUP, newGate());
    daemon->stop(SIGTERM);

    int lines = 0;
    char piece[65536];
    for (ssize_t size = 0; (size = recv(diaryEnds[0], piece, sizeof piece, 0)) > 0; ++lines) {
        const std::string line(piece, static_cast<std::size_t>(size));
        EXPECT_EQ(line.size() - 1, line.find('\n')) << line;
    }
    EXPECT_LT(4, lines);
    close(diaryEnds[0]);
}

TEST_F(Marubackupd, RaisesItsDescriptorLimitAboveTheServersOwn) {
    support::DaemonOptions options;
    options.beforeStart = []() { support::limitTo(RLIMIT_NOFILE, 64); };
    start(options);
    rlimit limit = {};
    ASSERT_EQ(0, prlimit(daemon->pid(), RLIMIT_NOFILE, nullptr, &limit));
    EXPECT_GT(limit.rlim_cur, 1024U);
}

TEST_F(Marubackupd, SurvivesBeingStartedWithoutStandardDescriptors) {
    support::DaemonOptions options;
    options.beforeStart = []() {
        close(STDIN_FILENO);
        close(STDOUT_FILENO);
        close(STDERR_FILENO);
    };
    start(options);
    support::writeLocalBackend("probe", "[backup]\ncommand_launch = ls /proc/self/fd\npipe_stdout = {{output}}\n");
    Job job("probe", Job::ACTION_BACKUP);
    job.setParam("output", folder.path("output"));
    job = add(job);
    EXPECT_TRUE(support::waitUntil([this, &job]() { return statusOf(job) == Job::STATUS_NONE; }));
    EXPECT_EQ("0\n1\n2\n3\n", support::readFile(folder.path("output")));
}

TEST_F(Marubackupd, WarnsIfGroup101IsNotTheAdministrators) {
    struct Row {
        const char* groups;
        bool warns;
    };
    support::writeFile(folder.path("group"), "");
    ASSERT_EQ(0, mount(folder.path("group").c_str(), "/etc/group", nullptr, MS_BIND, nullptr));
    for (const Row& row : {Row{"root:x:0:\nadministrators:x:101:\n", false}, Row{"root:x:0:\nstaff:x:101:\n", true},
                           Row{"root:x:0:\n", true}}) {
        support::writeFile("/etc/group", row.groups);
        const int before = log.count("group 101");
        start();
        daemon->stop(SIGTERM);
        EXPECT_EQ(row.warns ? 1 : 0, log.count("group 101") - before) << row.groups;
    }
    const support::SyslogLine line = log.waitFor("group 101");
    EXPECT_EQ(LOG_WARNING, line.priority);
    EXPECT_EQ(LOG_DAEMON, line.facility);
}

TEST_F(Marubackupd, EndsWithStatusOneIfTheKernelHasLostEventsOfTheBackendFolder) {
    start();
    daemon->signal(SIGSTOP);
    for (int events = 0; events < 20000; ++events) {
        support::writeLocalBackend("x" + std::to_string(events % 2), "");
    }
    daemon->signal(SIGCONT);
    EXPECT_EQ("exit 1", support::describeStatus(daemon->wait()));
    EXPECT_EQ(LOG_ERR, log.waitFor("ended by an internal error").priority);
}
