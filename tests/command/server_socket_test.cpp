#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <ostream>
#include <string>
#include <system_error>

#include "process_state.h"
#include "server_process.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/socket_peer.h"
#include "support/syscall_filter.h"
#include "support/waiting.h"

namespace fs = std::filesystem;

using MARU::Backup::CommandServer;
using support::expectLocated;
using support::isThere;
using support::refuseSystemCalls;
using support::SocketPeer;

using CommandServerSocket = ServerTest;

namespace {

const char* const UNIT = "command_server";

struct stat statOf(const std::string& path) {
    struct stat record = {};
    EXPECT_EQ(0, lstat(path.c_str(), &record)) << path;
    return record;
}

mode_t currentUmask() {
    const mode_t mask = umask(0);
    umask(mask);
    return mask;
}

void reportUmask() {
    report("umask " + std::to_string(currentUmask()));
}

std::string umaskReport(mode_t mask) {
    return "umask " + std::to_string(mask);
}

void reportDescriptors(const std::string& when) {
    report(when + std::to_string(support::openDescriptors(getpid())));
}

/** What is after `start` in the server's report. */
std::string told(ServerProcess& server, const std::string& start) {
    const std::string line = server.waitForReport(start);
    return line.substr(std::min(start.size(), line.size()));
}

/** A server that is expected to fail; `cause` sees to it in its process. */
ServerOptions failing(const std::function<void()>& cause, int mode = 0) {
    ServerOptions options;
    options.mode = mode;
    options.awaitLoop = false;
    options.setUp = [cause](CommandServer& server) {
        server.setSignalHandler(SIGHUP, [](int) {});
        server.setLoopHandler([]() {});
        cause();
        reportDescriptors("before: ");
    };
    options.afterRun = []() {
        reportDescriptors("after: ");
        reportUmask();
    };
    return options;
}

void refuseInotify() {
    refuseSystemCalls(
        {
#ifdef SYS_inotify_init
            SYS_inotify_init,
#endif
            SYS_inotify_init1},
        EMFILE);
}

void refuseChmod() {
    refuseSystemCalls(
        {
#ifdef SYS_chmod
            SYS_chmod,
#endif
            SYS_fchmodat},
        EPERM);
}

void refuseChown() {
    refuseSystemCalls(
        {
#ifdef SYS_chown
            SYS_chown,
#endif
            SYS_fchownat},
        EPERM);
}

void disableEveryEventMechanism() {
    for (const char* name : {"EVENT_NOEPOLL", "EVENT_NOPOLL", "EVENT_NOSELECT"}) {
        setenv(name, "1", 1);
    }
}

/** Why run() could not start, and what it left behind. */
struct Failure {
    const char* name;
    std::function<void()> cause;
    int mode;
    std::string message; ///< "PATH" in it stands for the socket's path
    bool oldFileStays;   ///< what stood at the path before
    mode_t maskAfter;
};

void PrintTo(const Failure& failure, std::ostream* out) {
    *out << failure.name;
}

std::string withPath(std::string message, const std::string& path) {
    const std::size_t at = message.find("PATH");
    return at == std::string::npos ? message : message.replace(at, 4, path);
}

class CommandServerThatFails : public ServerTest, public testing::WithParamInterface<Failure> {};

/** Whoever logs next waits until the log is read. */
void fillLog() {
    const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    const sockaddr address = {AF_UNIX, "/dev/log"};
    const std::string line = "<15>Jan  1 00:00:00 filler: filler";
    while (sendto(fd, line.data(), line.size(), 0, &address, sizeof address) > 0) {
    }
    EXPECT_EQ(EAGAIN, errno);
    close(fd);
}

} // namespace

TEST_P(CommandServerThatFails, SaysWhyAndLeavesNothingBehind) {
    const Failure& failure = GetParam();
    if (std::string(failure.name) != "WantOfAnEventMechanism") {
        SKIP_IF_EMULATED(support::REFUSED_CALLS);
    }
    support::writeFile(path, "stale");

    ServerOptions options = failing(failure.cause, failure.mode);
    const auto setUp = options.setUp;
    options.setUp = [this, setUp](CommandServer& server) {
        server.setWatchFolder(folder.path(), [](inotify_event*) {});
        setUp(server);
    };
    ServerProcess server(path, options);
    const pid_t pid = server.pid();

    EXPECT_EQ(DID_NOT_RUN, server.wait());

    expectLocated(log, LOG_ERR, pid, UNIT, withPath(failure.message, path));
    EXPECT_EQ(1U, log.lines().size());
    EXPECT_EQ(failure.oldFileStays, isThere(path));
    EXPECT_EQ(told(server, "before: "), told(server, "after: "));
    EXPECT_EQ(umaskReport(failure.maskAfter), server.waitForReport("umask"));
}

INSTANTIATE_TEST_SUITE_P(
    For, CommandServerThatFails,
    testing::Values(
        Failure{"WantOfAnEventMechanism", disableEveryEventMechanism, 0660, "event_base_new failed", true, 022},
        Failure{"WantOfASocket", []() { refuseSystemCalls({SYS_socket}, EMFILE); }, 0660,
                "socket failed, Too many open files", false, 022},
        Failure{"WantOfAnAddress", []() { refuseSystemCalls({SYS_bind}, EACCES); }, 0660,
                "bind [PATH] failed, Permission denied", false, 022},
        Failure{"WantOfTheMode", refuseChmod, 0660, "chmod [PATH] failed, Operation not permitted", false, 007},
        Failure{"WantOfTheOwners", refuseChown, 0660,
                "chown PATH failed, uid: [0], gid: [101], Operation not permitted", false, 007},
        Failure{"WantOfAListener", []() { refuseSystemCalls({SYS_listen}, EADDRINUSE); }, 0660,
                "listen failed, Address already in use", false, 022},
        Failure{"WantOfAListenerWithoutMode", []() { refuseSystemCalls({SYS_listen}, EADDRINUSE); }, 0,
                "listen failed, Address already in use", false, 022},
        Failure{"WantOfAnEvent", []() { refuseSystemCalls({SYS_epoll_ctl}, ENOSPC); }, 0660, "add event failed", false,
                022},
        Failure{"WantOfInotify", refuseInotify, 0660, "inotifiy init failed, Too many open files", false, 022}),
    [](const testing::TestParamInfo<Failure>& one) { return std::string(one.param.name); });

TEST_F(CommandServerSocket, IsNotMadeForAnEmptyHandler) {
    support::writeFile(path, "old");
    ServerOptions options = failing([]() {});
    options.handler = CommandServer::RequestHandler();
    ServerProcess server(path, options);
    const pid_t pid = server.pid();

    EXPECT_EQ(DID_NOT_RUN, server.wait());

    expectLocated(log, LOG_ERR, pid, UNIT, "bad param");
    EXPECT_EQ("old", support::readFile(path));
}

TEST_F(CommandServerSocket, IsNotMadeAtAnEmptyPath) {
    ServerProcess server("", failing([]() {}));
    const pid_t pid = server.pid();

    EXPECT_EQ(DID_NOT_RUN, server.wait());

    expectLocated(log, LOG_ERR, pid, UNIT, "bad param");
}

TEST_F(CommandServerSocket, IsMadeAtAPathOf107Characters) {
    const std::string longest = folder.path(std::string(107 - folder.path("").size(), 'p'));
    ServerProcess server(longest);

    EXPECT_EQ("x", server.ask("x"));

    EXPECT_EQ(RAN, server.stop());
    EXPECT_FALSE(isThere(longest));
}

TEST_F(CommandServerSocket, IsNotMadeAtALongerPathButTheFileThereIsRemoved) {
    for (const std::size_t length : {108U, 109U, 250U}) {
        SCOPED_TRACE(length);
        const std::string tooLong = folder.path(std::string(length - folder.path("").size(), 'p'));
        const std::string itsBeginning = tooLong.substr(0, 107);
        support::writeFile(tooLong, "");
        support::writeFile(itsBeginning, "");
        ServerProcess server(tooLong, failing([]() {}, 0660));
        const pid_t pid = server.pid();

        EXPECT_EQ(DID_NOT_RUN, server.wait());

        expectLocated(log, LOG_ERR, pid, UNIT, "socket path too long [" + tooLong + "]");
        EXPECT_FALSE(isThere(tooLong));
        EXPECT_TRUE(isThere(itsBeginning));
        EXPECT_EQ(told(server, "before: "), told(server, "after: "));
        EXPECT_EQ(umaskReport(022), server.waitForReport("umask"));
    }
}

TEST_F(CommandServerSocket, IsNotMadeInAFolderThatIsMissing) {
    const std::string nowhere = folder.path("missing/socket");
    ServerProcess server(nowhere, failing([]() {}));
    const pid_t pid = server.pid();

    EXPECT_EQ(DID_NOT_RUN, server.wait());

    expectLocated(log, LOG_ERR, pid, UNIT, "bind [" + nowhere + "] failed, No such file or directory");
}

TEST_F(CommandServerSocket, DoesNotReplaceAFolder) {
    fs::create_directory(path);
    ServerProcess server(path, failing([]() {}));
    const pid_t pid = server.pid();

    EXPECT_EQ(DID_NOT_RUN, server.wait());

    expectLocated(log, LOG_ERR, pid, UNIT, "bind [" + path + "] failed, Address already in use");
    EXPECT_TRUE(fs::is_directory(path));
}

TEST_F(CommandServerSocket, ThatCannotBeBoundLeavesWhatOthersPutThereMeanwhile) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    std::unique_lock<std::mutex> held = log.hold();
    fillLog();
    ServerProcess server(path, failing([]() { refuseSystemCalls({SYS_bind}, EADDRINUSE); }));
    ASSERT_TRUE(waitUntilBlockedIn(server.pid(), {SYS_sendto})); // it has failed, and is about to say so

    support::writeFile(path, "of another daemon");
    held.unlock();
    log.waitFor("bind [" + path + "] failed");

    EXPECT_EQ(DID_NOT_RUN, server.wait());
    EXPECT_EQ("of another daemon", support::readFile(path));
}

TEST_F(CommandServerSocket, ReplacesWhateverFileIsThere) {
    const std::string target = folder.path("target");
    support::writeFile(target, "kept");
    const std::function<void()> files[] = {
        [this]() { close(support::listenAt(path)); }, // of a daemon that was killed
        [this]() { support::writeFile(path, "regular"); },
        [this, &target]() { fs::create_symlink(target, path); },
        [this]() { fs::create_symlink(folder.path("missing"), path); },
        [this]() { EXPECT_EQ(0, mkfifo(path.c_str(), 0600)); },
    };
    for (const auto& make : files) {
        make();

        ServerProcess server(path);

        EXPECT_TRUE(S_ISSOCK(statOf(path).st_mode));
        EXPECT_EQ("x", server.ask("x"));
        EXPECT_EQ(RAN, server.stop());
        EXPECT_FALSE(isThere(path));
    }
    EXPECT_EQ("kept", support::readFile(target));
}

TEST_F(CommandServerSocket, StaysAsTheUmaskMakesItWithMode0) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    ServerOptions options;
    options.setUp = [](CommandServer&) {
        umask(027);
        refuseChmod();
        refuseChown();
    };
    options.afterRun = reportUmask;
    ServerProcess server(path, options);

    const struct stat record = statOf(path);

    EXPECT_EQ(0750U, record.st_mode & 07777U);
    EXPECT_EQ(geteuid(), record.st_uid);
    EXPECT_EQ(getegid(), record.st_gid);
    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ(umaskReport(027), server.waitForReport("umask"));
}

TEST_F(CommandServerSocket, GetsTheModeAndTheAdministratorsGroupAndTheUmaskIsRestored) {
    for (const mode_t mode : {0660U, 0600U, 0777U}) {
        ServerOptions options;
        options.mode = static_cast<int>(mode);
        options.handler = doing([](CommandServer&) { reportUmask(); });
        ServerProcess server(path, options);

        const struct stat record = statOf(path);

        EXPECT_EQ(mode, record.st_mode & 07777U);
        EXPECT_EQ(0U, record.st_uid);
        EXPECT_EQ(101U, record.st_gid);
        server.ask("x");
        EXPECT_EQ(umaskReport(022), server.waitForReport("umask"));
        EXPECT_EQ(RAN, server.stop());
    }
}

TEST_F(CommandServerSocket, IsGoneWhenTheLoopHasEnded) {
    ServerProcess server(path);
    ASSERT_TRUE(isThere(path));

    EXPECT_EQ(RAN, server.stop());

    EXPECT_FALSE(isThere(path));
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(CommandServerSocket, IsNoLongerListenedToWhenTheLoopHasEnded) {
    Hold hold;
    ServerOptions options;
    options.afterRun = [&hold]() {
        report("after run");
        hold.wait();
    };
    ServerProcess server(path, options);
    fs::create_hard_link(path, folder.path("other name"));

    server.signal(SIGTERM);
    server.waitForReport("after run");

    EXPECT_FALSE(isThere(path));
    EXPECT_THROW(SocketPeer(folder.path("other name")), std::system_error);
    hold.release();
    EXPECT_EQ(RAN, server.wait());
}
