#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdint>
#include <ostream>
#include <string>

#include "process_state.h"
#include "server_process.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using MARU::Backup::CommandServer;
using support::cpuTime;
using support::expectLocated;
using support::frame;
using support::openDescriptors;
using support::SocketPeer;

namespace {

/** How long a process is watched that has to sleep. */
const std::chrono::milliseconds WATCH(2000);

/** Whether the process sleeps through WATCH, in which nothing comes on the connection either. */
::testing::AssertionResult rests(pid_t process, const SocketPeer& peer) {
    const auto before = cpuTime(process);
    if (support::waitReadable(peer.descriptor(), WATCH)) {
        return ::testing::AssertionFailure() << "the connection was answered or closed";
    }
    const auto used = cpuTime(process) - before;
    if (used > WATCH / 10) {
        return ::testing::AssertionFailure() << "the server was busy for " << used.count() << " ms";
    }
    return ::testing::AssertionSuccess();
}

/** The header of a frame of this length, with nothing behind it. */
std::string announce(std::uint32_t length) {
    std::string header;
    for (const int shift : {24, 16, 8, 0}) {
        header += static_cast<char>(length >> shift);
    }
    return header;
}

const std::uint32_t SHORTEST_TOO_LONG = 16381;
const std::size_t BUFFER_SIZE = 16384;

/** A request that fills the buffer and is never complete. */
const std::string TOO_LONG = frame(std::string(SHORTEST_TOO_LONG, 'x'));
/** A refused length with the buffer full behind it. */
const std::string REFUSED_AND_FULL = announce(0x80000000) + std::string(BUFFER_SIZE, 'x');

/** A request whose reply is more than a socket takes at once. */
const char* const LARGE = "large";

/** Ways in which clients go away. */
enum Departure {
    CLOSES,
    ENDS_ITS_OUTPUT,
};

void depart(SocketPeer& peer, Departure departure) {
    if (departure == ENDS_ITS_OUTPUT) {
        shutdown(peer.descriptor(), SHUT_WR);
    } else {
        peer.close();
    }
}

class CommandServerConnections : public ServerTest {
protected:
    /** The server with no connection open. */
    int idleDescriptors() {
        EXPECT_TRUE(waitUntilLoopSleeps(server.pid()));
        return openDescriptors(server.pid());
    }

    bool waitForDescriptors(int number) {
        return support::waitUntil([&]() { return openDescriptors(server.pid()) == number; });
    }

    ServerProcess server{path, options()};

private:
    static ServerOptions options() {
        ServerOptions options;
        // As in the daemon, which takes the broken pipe's signal for itself.
        options.setUp = [](CommandServer& running) { running.setSignalHandler(SIGPIPE, [](int) {}); };
        options.handler = [](const char* payload, unsigned int length, CommandServer*) {
            const std::string request(payload, length);
            return request == LARGE ? std::string(5 << 20, 'l') : request;
        };
        return options;
    }
};

/** A client that said something, and then went away without having read anything. */
struct Ending {
    const char* name;
    std::string said;
    bool replied; ///< whether there is something to read
    Departure departure;
};

void PrintTo(const Ending& ending, std::ostream* out) {
    *out << ending.name;
}

class CommandServerConnection : public CommandServerConnections, public testing::WithParamInterface<Ending> {};

} // namespace

TEST_P(CommandServerConnection, IsClosedInTheServerToo) {
    const int before = idleDescriptors();
    SocketPeer peer(path);
    peer.write(GetParam().said);
    ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));
    ASSERT_EQ(before + 1, openDescriptors(server.pid()));
    ASSERT_EQ(GetParam().replied, support::waitReadable(peer.descriptor(), std::chrono::milliseconds(0)));

    depart(peer, GetParam().departure);

    EXPECT_TRUE(waitForDescriptors(before));
    EXPECT_TRUE(waitUntilLoopSleeps(server.pid()));
    EXPECT_EQ("still there", server.ask("still there"));
}

INSTANTIATE_TEST_SUITE_P(
    WhoseClient, CommandServerConnection,
    testing::Values(Ending{"SaysNothing", "", false, CLOSES},
                    Ending{"SaysNothingAndEndsItsOutput", "", false, ENDS_ITS_OUTPUT},
                    Ending{"LeavesInAHeader", std::string("\0\0", 2), false, CLOSES},
                    Ending{"LeavesInARequest", announce(100) + "the beginning", false, CLOSES},
                    Ending{"LeavesAReplyUnread", frame("x"), true, CLOSES},
                    Ending{"LeavesALargeReplyUnread", frame(LARGE), true, CLOSES},
                    Ending{"EndsItsOutputWithALargeReplyUnread", frame(LARGE), true, ENDS_ITS_OUTPUT},
                    Ending{"LeavesAfterARefusedLength", announce(0x80000000), false, CLOSES},
                    Ending{"LeavesAReplyUnreadAfterARefusedLength", frame("x") + announce(0x80000000), true, CLOSES},
                    Ending{"LeavesAfterARequestTooLong", TOO_LONG, false, CLOSES},
                    Ending{"EndsItsOutputAfterARequestTooLong", TOO_LONG, false, ENDS_ITS_OUTPUT},
                    Ending{"LeavesAReplyUnreadAfterARequestTooLong", frame("x") + TOO_LONG, true, CLOSES},
                    Ending{"LeavesALargeReplyUnreadAfterARequestTooLong", frame(LARGE) + TOO_LONG, true, CLOSES},
                    Ending{"LeavesAfterARefusedLengthWithTheBufferFull", REFUSED_AND_FULL, false, CLOSES},
                    Ending{"LeavesAReplyUnreadAfterARefusedLengthWithTheBufferFull", frame("x") + REFUSED_AND_FULL,
                           true, CLOSES}),
    [](const testing::TestParamInfo<Ending>& one) { return std::string(one.param.name); });

TEST_F(CommandServerConnections, StayOpenAfterAReply) {
    SocketPeer peer(path);

    EXPECT_EQ("x", peer.ask("x"));

    EXPECT_TRUE(peer.staysSilent());
    EXPECT_EQ("y", peer.ask("y"));
}

TEST_F(CommandServerConnections, WithARequestTooLongRestUnanswered) {
    SocketPeer peer(path);

    peer.write(TOO_LONG);

    EXPECT_TRUE(rests(server.pid(), peer));
    EXPECT_EQ("served", server.ask("served"));
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(CommandServerConnections, WithALongRequestRestInTheMiddleOfIt) {
    SocketPeer peer(path);

    peer.write(announce(0x7FFFFFFF) + std::string(BUFFER_SIZE, 'x'));

    EXPECT_TRUE(rests(server.pid(), peer));
    EXPECT_EQ("served", server.ask("served"));
}

TEST_F(CommandServerConnections, ThatRestTakeNoMoreBytes) {
    SocketPeer peer(path);
    const std::string bytes(1 << 20, 'x');

    peer.write(TOO_LONG);
    while (send(peer.descriptor(), bytes.data(), bytes.size(), MSG_DONTWAIT) > 0) {
    }
    ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));

    EXPECT_EQ(-1, send(peer.descriptor(), bytes.data(), bytes.size(), MSG_DONTWAIT));
    EXPECT_TRUE(rests(server.pid(), peer));
}

TEST_F(CommandServerConnections, ThatRestStillGetALargeReplyBeforeThatAndAreClosedAfterIt) {
    const int before = idleDescriptors();
    SocketPeer peer(path);

    peer.write(frame(LARGE) + TOO_LONG);
    ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));

    EXPECT_TRUE(std::string(5 << 20, 'l') == peer.readFrame());
    EXPECT_TRUE(rests(server.pid(), peer));
    peer.close();
    EXPECT_TRUE(waitForDescriptors(before));
}

TEST_F(CommandServerConnections, ThatRestStillGetTheRepliesBeforeThat) {
    SocketPeer peer(path);

    peer.write(frame("first") + frame("second") + TOO_LONG);

    EXPECT_EQ("first", peer.readFrame());
    EXPECT_EQ("second", peer.readFrame());
    EXPECT_TRUE(peer.staysSilent());
}

TEST_F(CommandServerConnections, ReportARefusedLengthWithEachArrival) {
    SocketPeer peer(path);
    const int arrivals = 5;

    peer.write(frame("x") + announce(0x80000000));
    EXPECT_EQ("x", peer.readFrame());
    expectLocated(log, LOG_ERR, server.pid(), "command_server", "protocol error");
    for (int number = 1; number < arrivals; ++number) {
        peer.write("x");
        expectLocated(log, LOG_ERR, server.pid(), "command_server", "protocol error");
    }

    EXPECT_TRUE(rests(server.pid(), peer));
    EXPECT_EQ("served", server.ask("served"));
    EXPECT_EQ(arrivals, log.count("protocol error"));
}

TEST_F(CommandServerConnections, RefuseEveryLengthFromTwoGigabytesOn) {
    for (const std::uint32_t length : {0x80000000U, 0x80000001U, 0xFFFFFFFFU}) {
        SocketPeer peer(path);

        peer.write(announce(length));

        expectLocated(log, LOG_ERR, server.pid(), "command_server", "protocol error");
        EXPECT_TRUE(peer.staysSilent()) << length;
    }
}

TEST_F(CommandServerConnections, WithARefusedLengthRestOnceTheBufferIsFull) {
    SocketPeer peer(path);

    peer.write(REFUSED_AND_FULL);
    expectLocated(log, LOG_ERR, server.pid(), "command_server", "protocol error");
    ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));
    const int reported = log.count("protocol error");
    peer.write(std::string(10, 'x'));

    EXPECT_TRUE(rests(server.pid(), peer));
    EXPECT_EQ("served", server.ask("served"));
    EXPECT_EQ(reported, log.count("protocol error"));
}

TEST_F(CommandServerConnections, OfOneClientDoNotDisturbThoseOfAnother) {
    SocketPeer before(path);
    SocketPeer tooLong(path);
    SocketPeer refused(path);
    tooLong.write(TOO_LONG);
    refused.write(REFUSED_AND_FULL);
    SocketPeer after(path);

    EXPECT_EQ("before", before.ask("before"));
    EXPECT_EQ("after", after.ask("after"));
}

using CommandServerLoop = ServerTest;

TEST_F(CommandServerLoop, LeavesTheConnectionsOpenThatItHadWhenItEnded) {
    Hold hold;
    ServerOptions options;
    options.afterRun = [&hold]() {
        report("after run");
        hold.wait();
    };
    ServerProcess server(path, options);
    SocketPeer peer(path);
    peer.ask("x");

    server.signal(SIGTERM);
    server.waitForReport("after run");

    EXPECT_TRUE(peer.staysSilent());
    hold.release();
    EXPECT_EQ(RAN, server.wait());
    EXPECT_TRUE(peer.isClosed());
}

TEST_F(CommandServerLoop, HasNoSocketThatCouldBlockIt) {
    int firstOwn = 0;
    ServerOptions options;
    options.setUp = [&firstOwn](CommandServer&) {
        firstOwn = dup(STDIN_FILENO);
        close(firstOwn);
    };
    options.handler = doing([&firstOwn](CommandServer&) {
        for (int fd = firstOwn; fd < firstOwn + 100; ++fd) {
            struct stat record = {};
            if (fstat(fd, &record) == 0 && S_ISSOCK(record.st_mode)) {
                report((fcntl(fd, F_GETFL) & O_NONBLOCK) != 0 ? "not blocking" : "blocking");
            }
        }
    });
    ServerProcess server(path, options);

    server.ask("x");

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ(0, server.countReports("blocking"));
    EXPECT_LE(2, server.countReports("not blocking")); // the one that listens, and the connection
}
