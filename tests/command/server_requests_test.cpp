#include <syslog.h>

#include <csignal>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "process_state.h"
#include "refused_drain.h"
#include "server_process.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using MARU::Backup::CommandServer;
using support::expectLocated;
using support::frame;
using support::SocketPeer;

using CommandServerRequests = ServerTest;

namespace {

const std::size_t LONGEST_REQUEST = 16380;

ServerOptions withHandler(const CommandServer::RequestHandler& handler) {
    ServerOptions options;
    options.handler = handler;
    return options;
}

std::string reportLength(const char* payload, unsigned int length, CommandServer*) {
    report("request of " + std::to_string(length));
    return std::string(payload, length);
}

} // namespace

TEST_F(CommandServerRequests, ReachTheHandlerWithTheirPayloadAndTheServer) {
    CommandServer* created = nullptr;
    ServerOptions options;
    options.setUp = [&created](CommandServer& server) { created = &server; };
    options.handler = [&created](const char* payload, unsigned int length, CommandServer* server) {
        report(server == created ? "the server itself" : "another server");
        return "[" + std::string(payload, length) + "]";
    };
    ServerProcess server(path, options);
    const std::string request("with\0zeros\0and \xFF\x80", 17);

    EXPECT_EQ("[" + request + "]", server.ask(request));

    server.waitForReport("the server itself");
}

TEST_F(CommandServerRequests, OfNoBytesReachTheHandlerAndAreAnswered) {
    ServerProcess server(path, withHandler(reportLength));
    SocketPeer peer(path);

    peer.write(std::string("\0\0\0\0", 4));

    EXPECT_EQ(std::string("\0\0\0\0", 4), peer.read(4));
    server.waitForReport("request of 0");
    EXPECT_TRUE(peer.staysSilent());
}

TEST_F(CommandServerRequests, AreAnsweredWithTheLengthAndTheBytesOfTheReply) {
    ServerProcess server(path,
                         withHandler([](const char*, unsigned int, CommandServer*) { return std::string(300, 'r'); }));
    SocketPeer peer(path);

    peer.write(frame("x"));

    EXPECT_EQ(std::string("\0\0\x01\x2C", 4) + std::string(300, 'r'), peer.read(304));
}

TEST_F(CommandServerRequests, MayBeAnsweredWithNothing) {
    ServerProcess server(path, withHandler([](const char*, unsigned int, CommandServer*) { return std::string(); }));
    SocketPeer peer(path);

    peer.write(frame("x"));

    EXPECT_EQ(std::string("\0\0\0\0", 4), peer.read(4));
    EXPECT_TRUE(peer.staysSilent());
}

TEST_F(CommandServerRequests, ThatArriveTogetherAreAnsweredTogetherInOrder) {
    // A timer runs on the loop's next pass, so it tells what one pass has done.
    ServerProcess server(path, withHandler([](const char* payload, unsigned int length, CommandServer* running) {
                             report("request");
                             running->setTimeout(reporting("next pass"), {0, 0}, nullptr);
                             return std::string(payload, length);
                         }));
    SocketPeer peer(path);

    peer.write(frame("first") + frame("") + frame("third"));

    EXPECT_EQ("first", peer.readFrame());
    EXPECT_EQ("", peer.readFrame());
    EXPECT_EQ("third", peer.readFrame());
    server.stop();
    const std::vector<std::string> reports = server.reports();
    ASSERT_LE(3U, reports.size());
    EXPECT_EQ((std::vector<std::string>{"request", "request", "request"}),
              std::vector<std::string>(reports.begin(), reports.begin() + 3));
}

TEST_F(CommandServerRequests, ThatComeByteByByteAreAnsweredWithTheirLastByte) {
    ServerProcess server(path, withHandler(reportLength));
    SocketPeer peer(path);
    const std::string bytes = frame("slow");

    for (const char byte : bytes.substr(0, bytes.size() - 1)) {
        peer.write(std::string(1, byte));
        ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));
    }
    EXPECT_EQ(0, server.countReports("request of 4"));
    EXPECT_TRUE(peer.staysSilent());
    peer.write(bytes.substr(bytes.size() - 1));

    EXPECT_EQ("slow", peer.readFrame());
}

TEST_F(CommandServerRequests, AreAnsweredUpToTheLongestThatFitsTheBuffer) {
    ServerProcess server(path);
    for (const std::size_t size : {std::size_t{1}, std::size_t{4096}, LONGEST_REQUEST - 1, LONGEST_REQUEST}) {
        const std::string request(size, 'q');

        EXPECT_TRUE(request == server.ask(request)) << size;
    }
}

TEST_F(CommandServerRequests, ThatFillTheBufferOneAfterTheOtherAreAllAnswered) {
    ServerProcess server(path);
    SocketPeer peer(path);
    std::string bytes;
    for (int number = 0; number < 20; ++number) {
        bytes += frame(std::string(LONGEST_REQUEST, static_cast<char>('a' + number)));
    }

    peer.write(bytes);

    EXPECT_TRUE(bytes == peer.read(bytes.size()));
}

TEST_F(CommandServerRequests, AreAnsweredWhateverPiecesTheyComeIn) {
    ServerProcess server(path);
    SocketPeer peer(path);
    std::mt19937 random(20);
    std::string bytes;
    for (int number = 0; number < 300; ++number) {
        bytes += frame(std::string(random() % (LONGEST_REQUEST + 1), static_cast<char>(number)));
    }

    std::thread client([&]() {
        for (std::size_t at = 0; at < bytes.size();) {
            const std::size_t piece = 1 + random() % 20000;
            peer.write(bytes.substr(at, piece));
            at += piece;
        }
    });

    EXPECT_TRUE(bytes == peer.read(bytes.size()));
    client.join();
}

TEST_F(CommandServerRequests, MayBeAnsweredWithMegabytesAndInOrder) {
    ServerProcess server(path, withHandler([](const char* payload, unsigned int length, CommandServer*) {
                             const std::string request(payload, length);
                             return request == "large" ? std::string(5 << 20, 'l') : request;
                         }));
    SocketPeer peer(path);

    peer.write(frame("small") + frame("large") + frame("small again"));
    ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));

    EXPECT_EQ("other", server.ask("other")); // while the reply waits for its reader
    EXPECT_EQ("small", peer.readFrame());
    EXPECT_TRUE(std::string(5 << 20, 'l') == peer.readFrame());
    EXPECT_EQ("small again", peer.readFrame());
}

TEST_F(CommandServerRequests, WaitBehindAReplyThatIsNotReadYet) {
    ServerProcess server(path, withHandler([](const char* payload, unsigned int length, CommandServer*) {
                             report("request of " + std::to_string(length));
                             return length == 1 ? std::string(3000000, *payload) : std::string(payload, length);
                         }));
    SocketPeer peer(path);

    peer.write(frame("L"));
    server.waitForReport("request of 1");
    peer.write(frame("second"));
    server.waitForReport("request of 6");

    EXPECT_EQ(std::string(3000000, 'L'), peer.readFrame());
    EXPECT_EQ("second", peer.readFrame());
    EXPECT_EQ("again", peer.ask("again"));
}

TEST_F(CommandServerRequests, OfManyConnectionsAreAnsweredToTheirOwnSenders) {
    ServerProcess server(path);
    std::vector<std::unique_ptr<SocketPeer>> peers;
    for (int number = 0; number < 100; ++number) {
        peers.push_back(std::make_unique<SocketPeer>(path));
        peers.back()->write(frame(std::to_string(number)));
    }

    for (int number = 0; number < 100; ++number) {
        EXPECT_EQ(std::to_string(number), peers[static_cast<std::size_t>(number)]->readFrame());
    }
}

TEST_F(CommandServerRequests, AreHandledToTheirEndBeforeAnythingElse) {
    ServerOptions options;
    options.setUp = [](CommandServer& server) { server.setSignalHandler(SIGHUP, reporting("hangup")); };
    options.handler = doing([](CommandServer& server) {
        report("begin");
        server.setTimeout(reporting("timer"), {0, 0}, nullptr);
        raise(SIGHUP);
        report("end");
    });
    ServerProcess server(path, options);

    server.ask("x");
    server.waitForReport("hangup");
    server.waitForReport("timer");

    const std::vector<std::string> reports = server.reports();
    EXPECT_EQ("begin", reports.at(0));
    EXPECT_EQ("end", reports.at(1));
}

TEST_F(CommandServerRequests, WhoseClientIsGoneBeforeTheReplyHarmNothing) {
    Hold hold;
    ServerOptions options = withHandler(doing([&hold](CommandServer&) {
        report("asked");
        hold.wait();
    }));
    // As in the daemon, which takes the broken pipe's signal for itself.
    options.setUp = [](CommandServer& running) { running.setSignalHandler(SIGPIPE, [](int) {}); };
    ServerProcess server(path, options);
    ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));
    const int before = support::openDescriptors(server.pid());

    for (const std::size_t bytesBehindIt : {0U, 1U}) {
        SocketPeer peer(path);
        peer.write(frame("x") + std::string(bytesBehindIt, '\0'));
        server.waitForReport("asked");
        peer.close();
        hold.release();

        EXPECT_TRUE(support::waitUntil([&]() { return support::openDescriptors(server.pid()) == before; }));
    }
    EXPECT_EQ(RAN, server.stop());
}

TEST_F(CommandServerRequests, AreAnsweredAgainWhereTheirBytesCannotBeDropped) {
    ServerProcess server(path, withHandler([](const char* payload, unsigned int length, CommandServer*) {
                             static int calls = 0;
                             if (++calls == 1) {
                                 refuseNextDrain();
                             }
                             return std::to_string(calls) + std::string(payload, length);
                         }));
    SocketPeer peer(path);

    peer.write(frame("a") + frame("b"));

    EXPECT_EQ("1a", peer.readFrame());
    expectLocated(log, LOG_ERR, server.pid(), "command_server", "evbuffer_drain failed");
    EXPECT_TRUE(peer.staysSilent()); // the rest waits for the next arrival
    peer.write(frame("c"));
    EXPECT_EQ("2a", peer.readFrame());
    EXPECT_EQ("3b", peer.readFrame());
    EXPECT_EQ("4c", peer.readFrame());
}

TEST_F(CommandServerRequests, WhoseHandlerThrowsEndTheLoopWithTheException) {
    ServerProcess server(path, withHandler([](const char*, unsigned int, CommandServer*) -> std::string {
                             throw std::runtime_error("no answer");
                         }));

    SocketPeer peer(path);
    peer.write(frame("x"));

    EXPECT_EQ(THREW, server.wait());
}
