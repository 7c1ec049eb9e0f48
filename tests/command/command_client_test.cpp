#include <marubackup/command_client.h>

#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "process_state.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/socket_peer.h"
#include "support/syscall_filter.h"
#include "support/syslog_socket.h"
#include "support/temp_dir.h"
#include "support/waiting.h"

using MARU::Backup::CommandClient;
using support::describeStatus;
using support::expectLocated;
using support::frame;
using support::openDescriptors;
using support::SocketPeer;
using support::startInChild;
using support::waitForChild;

namespace {

const char* const UNIT = "command_client";

/** A client, and somebody who listens at a socket that is nobody else's. */
class CommandClientTest : public testing::Test {
protected:
    CommandClientTest() {
        openlog(nullptr, LOG_NDELAY, 0); // so that a line is not what opens one more descriptor
    }
    ~CommandClientTest() override {
        close(listener);
    }

    /** The other end of the oldest connection that was not yet accepted. */
    SocketPeer accept() const {
        return SocketPeer(::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC));
    }

    /** A path in the folder, made as long as this. */
    std::string pathOfLength(std::size_t length) const {
        const std::string start = folder.path("");
        return start + std::string(length - start.size(), 'p');
    }

    support::SyslogSocket log;
    support::TempDir folder;
    const std::string path = folder.path("socket");
    int listener = support::listenAt(path);
    CommandClient client;
};

using CommandClientConnection = CommandClientTest;
using CommandClientExchange = CommandClientTest;

/** A client in a process of its own, whose request is "request"; what it does before it sends is `prepare`. */
pid_t startClient(const std::string& path, const std::function<void()>& prepare = nullptr,
                  const std::string& request = "request", const std::string& expectedReply = "") {
    return startInChild([&]() {
        CommandClient client;
        client.connect(path);
        if (prepare) {
            prepare();
        }
        return client.send(request) == expectedReply ? 0 : 1;
    });
}

std::string end(pid_t child) {
    return describeStatus(waitForChild(child));
}

/** Kills what is still there of a child at the end of the test. */
class KilledChild {
public:
    explicit KilledChild(pid_t child) : pid(child) {
    }
    ~KilledChild() {
        kill(pid, SIGKILL);
        waitForChild(pid);
    }
    KilledChild(const KilledChild&) = delete;
    KilledChild& operator=(const KilledChild&) = delete;

    const pid_t pid;
};

bool hasEnded(pid_t child) {
    siginfo_t info = {};
    waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOHANG | WNOWAIT);
    return info.si_pid == child;
}

/** Bytes of every value, in no pattern that repeats with a buffer's size. */
std::string manyBytes(std::size_t size) {
    std::string bytes;
    for (std::size_t at = 0; at < size; ++at) {
        bytes += static_cast<char>(at * 31 + at / 251);
    }
    return bytes;
}

} // namespace

TEST_F(CommandClientConnection, IsThereFromConnectUntilClose) {
    EXPECT_FALSE(client.isConnected());
    EXPECT_TRUE(client.connect(path));
    EXPECT_TRUE(client.isConnected());
    SocketPeer peer = accept();

    client.close();

    EXPECT_FALSE(client.isConnected());
    EXPECT_TRUE(peer.isClosed());
}

TEST_F(CommandClientConnection, CanBeMadeAgainAfterClose) {
    client.connect(path);
    SocketPeer first = accept();
    client.close();

    EXPECT_TRUE(client.connect(path));

    SocketPeer second = accept();
    second.write(frame("reply"));
    EXPECT_EQ("reply", client.send("request"));
}

TEST_F(CommandClientConnection, NeedsNoCloseWhereThereIsNone) {
    const int before = openDescriptors(getpid());

    client.close();
    client.close();

    EXPECT_FALSE(client.isConnected());
    EXPECT_EQ(before, openDescriptors(getpid()));
}

TEST_F(CommandClientConnection, EndsWithTheClient) {
    const int before = openDescriptors(getpid());
    auto shortLived = std::make_unique<CommandClient>();
    shortLived->connect(path);
    SocketPeer peer = accept();

    shortLived.reset();

    EXPECT_TRUE(peer.isClosed());
    peer.close();
    EXPECT_EQ(before, openDescriptors(getpid()));
}

TEST_F(CommandClientConnection, IsReportedAtDebugLevelWithItsPath) {
    client.connect(path);

    expectLocated(log, LOG_DEBUG, getpid(), UNIT, "connect to [" + path + "]");
}

TEST_F(CommandClientConnection, ThatWasOpenBeforeIsForgottenButNotClosed) {
    client.connect(path);
    SocketPeer first = accept();
    const int withOne = openDescriptors(getpid());

    EXPECT_TRUE(client.connect(path));
    SocketPeer second = accept();
    const int withTwo = openDescriptors(getpid());
    client.close();

    EXPECT_EQ(withOne + 2, withTwo); // the client's new end, and ours
    EXPECT_EQ(withTwo - 1, openDescriptors(getpid()));
    EXPECT_TRUE(second.isClosed());
    EXPECT_TRUE(first.staysSilent());
}

TEST_F(CommandClientConnection, ThatIsOpenSurvivesAFailedAttemptAtAnother) {
    client.connect(path);
    SocketPeer peer = accept();

    EXPECT_FALSE(client.connect(folder.path("nobody")));

    EXPECT_TRUE(client.isConnected());
    peer.write(frame("reply"));
    EXPECT_EQ("reply", client.send("request"));
}

TEST_F(CommandClientConnection, FailsQuietlyWhereNobodyServes) {
    const std::string stale = folder.path("stale");
    close(support::listenAt(stale));
    const std::string regular = folder.path("regular");
    support::writeFile(regular, "");
    const struct {
        std::string path;
        const char* message;
    } places[] = {
        {folder.path("missing"), "connect: No such file or directory"},
        {folder.path("missing/socket"), "connect: No such file or directory"},
        {stale, "connect: Connection refused"},
        {regular, "connect: Connection refused"},
        {"", "connect: Connection refused"},
    };
    const int before = openDescriptors(getpid());
    for (const auto& place : places) {
        SCOPED_TRACE(place.path);

        EXPECT_FALSE(client.connect(place.path));

        EXPECT_FALSE(client.isConnected());
        expectLocated(log, LOG_DEBUG, getpid(), UNIT, place.message);
    }
    EXPECT_EQ(before, openDescriptors(getpid()));
}

TEST_F(CommandClientConnection, IsMadeToAPathOf107Characters) {
    const std::string longest = pathOfLength(107);
    const int there = support::listenAt(longest);

    EXPECT_TRUE(client.connect(longest));

    expectLocated(log, LOG_DEBUG, getpid(), UNIT, "connect to [" + longest + "]");
    close(there);
}

TEST_F(CommandClientConnection, IsNotTriedToALongerPath) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    // Were the path cut, somebody would be found there.
    const int there = support::listenAt(pathOfLength(107));
    for (const std::size_t length : {108U, 109U, 300U, 70000U}) {
        const pid_t child = startInChild([&]() {
            support::refuseSystemCalls({SYS_socket}, EMFILE);
            CommandClient other;
            return other.connect(pathOfLength(length)) || other.isConnected() ? 1 : 0;
        });

        EXPECT_EQ("exit 0", end(child)) << length;
        expectLocated(log, LOG_ERR, child, UNIT, "addr size not enough");
    }
    EXPECT_EQ(0, log.count("socket failed"));
    close(there);
}

TEST_F(CommandClientConnection, FailsWhereTheProcessMayOpenNoMoreDescriptors) {
    const std::string socket = path;
    const pid_t child = startInChild([&socket]() {
        const rlimit none = {0, 0};
        setrlimit(RLIMIT_NOFILE, &none);
        CommandClient other;
        return other.connect(socket) || other.isConnected() ? 1 : 0;
    });

    EXPECT_EQ("exit 0", end(child));
    expectLocated(log, LOG_ERR, child, UNIT, "socket failed: Too many open files");
}

TEST_F(CommandClientExchange, SendsTheLengthAndTheBytesOfARequest) {
    const struct {
        std::string request;
        std::string header;
    } requests[] = {
        {"", std::string("\0\0\0\0", 4)},
        {std::string("\0", 1), std::string("\0\0\0\1", 4)},
        {manyBytes(300), std::string("\0\0\x01\x2C", 4)},
        {manyBytes(16380), std::string("\0\0\x3F\xFC", 4)},
        {manyBytes(65536), std::string("\0\1\0\0", 4)},
    };
    for (const auto& one : requests) {
        SCOPED_TRACE(one.request.size());
        client.connect(path);
        SocketPeer peer = accept();
        peer.write(frame("reply"));

        EXPECT_EQ("reply", client.send(one.request));

        client.close();
        EXPECT_EQ(one.header + one.request, peer.read(one.request.size() + 1000));
    }
}

TEST_F(CommandClientExchange, GoesThroughWhateverTheSizeOfTheReply) {
    client.connect(path);
    SocketPeer peer = accept();
    for (const std::size_t size : {1U, 4095U, 4096U, 4097U, 8192U, 100000U, 3000000U}) {
        const std::string reply = manyBytes(size);
        std::thread daemon([&]() {
            EXPECT_EQ("request", peer.readFrame());
            peer.write(frame(reply));
        });

        EXPECT_TRUE(reply == client.send("request")) << size;

        daemon.join();
    }
}

TEST_F(CommandClientExchange, ReadsTheReplyAtMost4096BytesAtATime) {
    const KilledChild child(startClient(path, nullptr, "request", manyBytes(5000)));
    SocketPeer peer = accept();
    const std::string reply = frame(manyBytes(5000));
    const struct {
        std::size_t arrived;
        std::size_t asked;
    } steps[] = {{0, 4}, {1, 3}, {3, 1}, {4, 4096}, {104, 4096}, {908, 4096}, {909, 4095}, {5003, 1}};

    EXPECT_EQ("request", peer.readFrame());
    std::size_t sent = 0;
    for (const auto& step : steps) {
        peer.write(reply.substr(sent, step.arrived - sent));
        sent = step.arrived;

        ASSERT_TRUE(waitUntilBlockedIn(child.pid, {SYS_recvfrom}));
        EXPECT_EQ(step.asked, blockedCall(child.pid).size) << "with " << step.arrived << " bytes there";
    }
}

TEST_F(CommandClientExchange, IsOverAtOnceWithAnEmptyReply) {
    client.connect(path);
    SocketPeer peer = accept();
    peer.write(frame("") + frame("the next one"));

    EXPECT_EQ("", client.send("first"));
    EXPECT_EQ("the next one", client.send("second"));

    EXPECT_EQ("first", peer.readFrame());
    EXPECT_EQ("second", peer.readFrame());
}

TEST_F(CommandClientExchange, GetsAReplyThatComesByteByByte) {
    client.connect(path);
    SocketPeer peer = accept();
    std::thread daemon([&]() {
        peer.readFrame();
        for (const char byte : frame("byte by byte")) {
            peer.write(std::string(1, byte));
        }
    });

    EXPECT_EQ("byte by byte", client.send("request"));

    daemon.join();
}

TEST_F(CommandClientExchange, FailsWithoutAConnection) {
    EXPECT_EQ("", client.send("request"));

    expectLocated(log, LOG_ERR, getpid(), UNIT, "send failed, Bad file descriptor");
}

TEST_F(CommandClientExchange, FailsQuietlyAfterTheDaemonHasGone) {
    const pid_t child = startInChild([&]() {
        signal(SIGPIPE, SIG_IGN);
        CommandClient other;
        other.connect(path);
        accept().close();
        const bool failed = other.send("request").empty();
        return failed && other.isConnected() ? 0 : 1;
    });

    EXPECT_EQ("exit 0", end(child));
    expectLocated(log, LOG_DEBUG, child, UNIT, "send failed, Broken pipe");
}

TEST_F(CommandClientExchange, KillsAProcessThatDoesNotIgnoreTheBrokenPipe) {
    const pid_t child = startInChild([&]() {
        signal(SIGPIPE, SIG_DFL);
        CommandClient other;
        other.connect(path);
        accept().close();
        other.send("request");
        return 0;
    });

    EXPECT_EQ("signal " + std::to_string(SIGPIPE), end(child));
}

TEST_F(CommandClientExchange, FailsLoudlyWhenTheDaemonGoesWithTheRequestUnread) {
    const pid_t child = startClient(path);
    {
        SocketPeer peer = accept();
        ASSERT_TRUE(waitUntilBlockedIn(child, {SYS_recvfrom}));
    }

    EXPECT_EQ("exit 0", end(child));
    expectLocated(log, LOG_ERR, child, UNIT, "recv failed, Connection reset by peer");
}

TEST_F(CommandClientExchange, DropsThePartOfAReplyThatCameBeforeAFailure) {
    const pid_t child = startClient(path);
    {
        SocketPeer peer = accept();
        ASSERT_TRUE(waitUntilBlockedIn(child, {SYS_recvfrom}));
        peer.write(frame("all of it").substr(0, 8));
        ASSERT_TRUE(support::waitUntil([&]() { return blockedCall(child).size == 5; }));
    }

    EXPECT_EQ("exit 0", end(child)); // an empty reply
    expectLocated(log, LOG_ERR, child, UNIT, "recv failed, Connection reset by peer");
}

TEST_F(CommandClientExchange, FailsQuietlyWhenReadingFindsABrokenPipe) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    const pid_t child = startClient(path, []() { support::refuseSystemCalls({SYS_recvfrom}, EPIPE); });

    EXPECT_EQ("exit 0", end(child));
    expectLocated(log, LOG_DEBUG, child, UNIT, "recv failed, Broken pipe");
}

namespace {

int caughtPipe[2];

void tellOfSignal(int) {
    if (write(caughtPipe[1], "", 1) != 1) {
        abort();
    }
}

/** The next signal interrupts what it finds the process in, and tells of it through the pipe. */
void catchInterrupts() {
    struct sigaction action = {};
    action.sa_handler = tellOfSignal;
    sigaction(SIGUSR1, &action, nullptr); // without SA_RESTART
}

/** Interrupts the call that `child` waits in, and sees it wait in it again. */
void interrupt(pid_t child, long call) {
    char told = 0;
    ASSERT_TRUE(waitUntilBlockedIn(child, {call}));
    kill(child, SIGUSR1);
    ASSERT_TRUE(support::waitReadable(caughtPipe[0]));
    ASSERT_EQ(1, read(caughtPipe[0], &told, 1));
    ASSERT_TRUE(waitUntilBlockedIn(child, {call}));
}

class InterruptedClient : public CommandClientTest {
protected:
    InterruptedClient() {
        EXPECT_EQ(0, pipe(caughtPipe));
    }
    ~InterruptedClient() override {
        close(caughtPipe[0]);
        close(caughtPipe[1]);
    }
};

} // namespace

TEST_F(InterruptedClient, GoesOnReadingTheReply) {
    const pid_t child = startClient(path, catchInterrupts, "request", "reply");
    SocketPeer peer = accept();
    peer.readFrame();
    for (const std::string& piece :
         {std::string(), std::string("\0\0", 2), std::string("\0\5", 2), std::string("re")}) {
        peer.write(piece);
        interrupt(child, SYS_recvfrom);
        interrupt(child, SYS_recvfrom);
    }
    peer.write("ply");

    EXPECT_EQ("exit 0", end(child));
    EXPECT_EQ(0, log.count("failed"));
}

TEST_F(InterruptedClient, GoesOnWritingTheRequest) {
    const std::string request = manyBytes(4 << 20); // more than the socket takes at once
    const pid_t child = startClient(path, catchInterrupts, request, "reply");
    SocketPeer peer = accept();
    // The first signal ends a call that has written something; the others find one that has not.
    for (int times = 0; times < 3; ++times) {
        interrupt(child, SYS_sendto);
    }

    EXPECT_TRUE(request == peer.readFrame());

    peer.write(frame("reply"));
    EXPECT_EQ("exit 0", end(child));
    EXPECT_EQ(0, log.count("failed"));
}

TEST_F(CommandClientExchange, NeverEndsWhenTheDaemonGoesInTheMiddleOfAReply) {
    for (const std::size_t sent : {0U, 2U, 4U, 7U}) {
        const KilledChild child(startClient(path));
        {
            SocketPeer peer = accept();
            EXPECT_EQ("request", peer.readFrame());
            peer.write(frame("reply").substr(0, sent));
        }

        const bool busy =
            support::waitUntil([&]() { return support::cpuTime(child.pid) >= std::chrono::milliseconds(200); });

        EXPECT_TRUE(busy) << sent;
        EXPECT_FALSE(hasEnded(child.pid)) << sent;
    }
    EXPECT_EQ(0, log.count("failed"));
}
