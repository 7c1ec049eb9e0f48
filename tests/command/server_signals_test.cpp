#include <csignal>
#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "server_process.h"
#include "support/emulation.h"

using MARU::Backup::CommandServer;

using CommandServerSignals = ServerTest;

namespace {

using Reports = std::vector<std::string>;

class CommandServerEndedBySignal : public ServerTest, public testing::WithParamInterface<int> {};

void reportSignal(int number) {
    report("signal " + std::to_string(number));
}

ServerOptions withSignal(int number, const CommandServer::SignalHandler& handler) {
    ServerOptions options;
    options.setUp = [number, handler](CommandServer& server) { server.setSignalHandler(number, handler); };
    return options;
}

} // namespace

TEST_P(CommandServerEndedBySignal, RunsItsHandlerOnceAndRemovesTheSocket) {
    ServerProcess server(path, withSignal(GetParam(), reportSignal));

    server.signal(GetParam());

    EXPECT_EQ(RAN, server.wait());
    EXPECT_EQ(Reports{"signal " + std::to_string(GetParam())}, server.reports());
    EXPECT_FALSE(std::filesystem::exists(path));
}

TEST_P(CommandServerEndedBySignal, EndsEvenIfTheHandlerIsReplacedMeanwhile) {
    ServerOptions options = withSignal(GetParam(), reportSignal);
    options.handler =
        doing([](CommandServer& running) { running.setSignalHandler(GetParam(), reporting("replaced")); });
    ServerProcess server(path, options);

    server.ask("replace");
    server.signal(GetParam());

    EXPECT_EQ(RAN, server.wait());
    EXPECT_EQ(Reports{"replaced"}, server.reports());
}

INSTANTIATE_TEST_SUITE_P(Number, CommandServerEndedBySignal, testing::Values(SIGINT, SIGQUIT, SIGABRT, SIGTERM),
                         testing::PrintToStringParamName());

TEST_F(CommandServerSignals, ThatWouldEndTheLoopButAreNotRegisteredKillTheProcess) {
    ServerProcess server(path);

    server.signal(SIGINT);

    EXPECT_EQ("signal " + std::to_string(SIGINT), server.wait());
    EXPECT_TRUE(std::filesystem::exists(path)); // nobody was there to remove it
}

namespace {

void expectLoopSurvives(const std::string& path, const std::vector<int>& numbers) {
    ServerOptions options;
    options.setUp = [&numbers](CommandServer& server) {
        for (const int number : numbers) {
            server.setSignalHandler(number, reportSignal);
        }
    };
    ServerProcess server(path, options);
    for (const int number : numbers) {
        for (int times = 0; times < 2; ++times) {
            server.signal(number);

            server.waitForReport("signal " + std::to_string(number));
            EXPECT_EQ("served", server.ask("served"));
        }
    }

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ(2 * numbers.size(), server.reports().size());
}

} // namespace

TEST_F(CommandServerSignals, OfAnyOtherKindLeaveTheLoopRunning) {
    expectLoopSurvives(path, {SIGHUP, SIGCHLD, SIGPIPE, SIGUSR1, SIGALRM, SIGRTMIN});
}

TEST_F(CommandServerSignals, OfTheLargestNumberLeaveTheLoopRunning) {
    SKIP_IF_EMULATED("the signals with the largest numbers are not there");
    expectLoopSurvives(path, {SIGRTMAX});
}

TEST_F(CommandServerSignals, RegisteredTwiceKeepTheSecondHandler) {
    ServerOptions options;
    options.setUp = [](CommandServer& server) {
        for (const char* name : {"first", "second"}) {
            report(server.setSignalHandler(SIGHUP, reporting(name)) ? "registered" : "refused");
        }
    };
    ServerProcess server(path, options);

    server.signal(SIGHUP);
    server.waitForReport("second");

    EXPECT_EQ((Reports{"registered", "registered", "second"}), server.reports());
}

TEST_F(CommandServerSignals, MayGetAnotherHandlerWhileTheLoopRuns) {
    ServerOptions options = withSignal(SIGHUP, reporting("old"));
    options.handler = doing([](CommandServer& running) { running.setSignalHandler(SIGHUP, reporting("new")); });
    ServerProcess server(path, options);

    server.signal(SIGHUP);
    server.waitForReport("old");
    server.ask("replace");
    server.signal(SIGHUP);
    server.waitForReport("new");

    EXPECT_EQ((Reports{"old", "new"}), server.reports());
}

TEST_F(CommandServerSignals, MayHaveAHandlerThatReplacesItself) {
    const std::string words = "the old one, whose words are kept as long as it is called";
    ServerOptions options;
    options.setUp = [&words](CommandServer& server) {
        server.setSignalHandler(SIGHUP, [words, &server](int) {
            server.setSignalHandler(SIGHUP, reporting("new"));
            report(words);
        });
    };
    ServerProcess server(path, options);

    server.signal(SIGHUP);
    server.waitForReport(words);
    server.signal(SIGHUP);
    server.waitForReport("new");

    EXPECT_EQ((Reports{words, "new"}), server.reports());
}

TEST_F(CommandServerSignals, WhoseHandlerIsReplacedByNoneEndTheLoopWithAnException) {
    ServerOptions options = withSignal(SIGHUP, reporting("old"));
    options.handler =
        doing([](CommandServer& running) { running.setSignalHandler(SIGHUP, CommandServer::SignalHandler()); });
    ServerProcess server(path, options);

    server.ask("replace");
    server.signal(SIGHUP);

    EXPECT_EQ(EMPTY_CALL, server.wait());
    EXPECT_EQ(Reports{}, server.reports());
}

TEST_F(CommandServerSignals, FirstRegisteredWhileTheLoopRunsAreNeverHandled) {
    ServerOptions options = withSignal(SIGHUP, reporting("hangup"));
    options.handler = doing([](CommandServer& running) {
        report(running.setSignalHandler(SIGWINCH, reporting("window")) ? "registered" : "refused");
    });
    ServerProcess server(path, options);

    server.ask("register");
    server.signal(SIGWINCH); // which a process ignores by itself
    server.signal(SIGHUP);
    server.waitForReport("hangup");

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ((Reports{"registered", "hangup"}), server.reports());
}

TEST_F(CommandServerSignals, ThatDoNotExistOrCannotBeCaughtHarmNothing) {
    for (const int number : {0, -1, -1000000, 65, 9999, INT32_MAX, INT32_MIN, SIGKILL, SIGSTOP}) {
        SCOPED_TRACE(number);
        ServerOptions options = withSignal(SIGHUP, reporting("hangup"));
        const auto setUp = options.setUp;
        options.setUp = [setUp, number](CommandServer& server) {
            report(server.setSignalHandler(number, reporting("handled")) ? "registered" : "refused");
            setUp(server);
        };
        ServerProcess server(path, options);

        server.signal(SIGHUP);
        server.waitForReport("hangup");

        EXPECT_EQ("served", server.ask("served"));
        EXPECT_EQ(RAN, server.stop());
        EXPECT_EQ((Reports{"registered", "hangup"}), server.reports());
    }
}
