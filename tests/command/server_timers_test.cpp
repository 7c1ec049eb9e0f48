#include <syslog.h>

#include <chrono>
#include <csignal>
#include <string>
#include <vector>

#include "process_state.h"
#include "server_process.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using MARU::Backup::CommandServer;
using support::expectLocated;
using support::SocketPeer;

using CommandServerTimers = ServerTest;
using CommandServerLoopHandler = ServerTest;

namespace {

const timeval AT_ONCE = {0, 0};
const timeval IN_DAYS = {1000000, 0};

/** Something that happens about every two seconds would happen in this time. */
const std::chrono::milliseconds MORE_THAN_AN_INTERVAL(2500);

/** What the loop's clock, which is coarse, may be early by. */
const long CLOCK_STEP = 100;

timeval milliseconds(long number) {
    return {number / 1000, static_cast<suseconds_t>(number % 1000 * 1000)};
}

ServerOptions onRequest(const std::function<void(CommandServer&)>& work) {
    ServerOptions options;
    options.handler = doing(work);
    return options;
}

ServerOptions withLoopHandler(const std::function<void(CommandServer&)>& handler) {
    ServerOptions options;
    options.setUp = [handler](CommandServer& server) {
        EXPECT_TRUE(server.setLoopHandler([handler, &server]() { handler(server); }));
    };
    return options;
}

void reportTime(const std::string& what) {
    report(what + " at " + std::to_string(monotonicMilliseconds()));
}

/** The time of the next such report. */
long timeOf(ServerProcess& server, const std::string& what) {
    const std::string start = what + " at ";
    const std::string line = server.waitForReport(start);
    return line.empty() ? 0 : std::stol(line.substr(start.size()));
}

using Reports = std::vector<std::string>;

} // namespace

TEST_F(CommandServerTimers, FireOnceWithTheirArgument) {
    static int argument = 0;
    ServerProcess server(path, onRequest([](CommandServer& running) {
                             const auto callback = [](void* given) {
                                 report(given == &argument ? "fired" : "another argument");
                             };
                             report(running.setTimeout(callback, AT_ONCE, &argument) ? "armed" : "not armed");
                         }));

    server.ask("x");
    server.waitForReport("fired");
    for (int times = 0; times < 5; ++times) {
        server.awaitPass();
    }

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ((Reports{"armed", "fired"}), server.reports());
}

TEST_F(CommandServerTimers, DoNotFireBeforeTheCallbackThatArmedThemEnds) {
    ServerProcess server(path, onRequest([](CommandServer& running) {
                             running.setTimeout(reporting("fired"), AT_ONCE, nullptr);
                             report("armed");
                         }));

    server.ask("x");
    server.waitForReport("fired");

    EXPECT_EQ((Reports{"armed", "fired"}), server.reports());
}

TEST_F(CommandServerTimers, FireNoEarlierThanTheirDelay) {
    const long delay = 500;
    ServerProcess server(path, onRequest([](CommandServer& running) {
                             reportTime("armed");
                             running.setTimeout([](void*) { reportTime("fired"); }, milliseconds(delay), nullptr);
                         }));

    server.ask("x");

    const long armed = timeOf(server, "armed");
    EXPECT_LE(armed + delay - CLOCK_STEP, timeOf(server, "fired"));
}

TEST_F(CommandServerTimers, FireInTheOrderOfTheirTimes) {
    ServerProcess server(path, onRequest([](CommandServer& running) {
                             running.setTimeout(reporting("last"), milliseconds(600), nullptr);
                             running.setTimeout(reporting("first"), AT_ONCE, nullptr);
                             running.setTimeout(reporting("second"), milliseconds(300), nullptr);
                             running.setTimeout(reporting("never"), IN_DAYS, nullptr);
                         }));

    server.ask("x");
    server.waitForReport("last");

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ((Reports{"first", "second", "last"}), server.reports());
}

namespace {

void countDown(CommandServer& server, int left) {
    report(std::to_string(left));
    if (left > 0) {
        server.setTimeout([&server, left](void*) { countDown(server, left - 1); }, AT_ONCE, nullptr);
    }
}

} // namespace

TEST_F(CommandServerTimers, MayBeArmedByTimers) {
    ServerProcess server(path, onRequest([](CommandServer& running) { countDown(running, 3); }));

    server.ask("x");
    server.waitForReport("0");

    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ((Reports{"3", "2", "1", "0"}), server.reports());
}

TEST_F(CommandServerTimers, MayBeArmedBySignalHandlers) {
    ServerOptions options;
    options.setUp = [](CommandServer& server) {
        server.setSignalHandler(SIGHUP, [&server](int) { server.setTimeout(reporting("fired"), AT_ONCE, nullptr); });
    };
    ServerProcess server(path, options);

    server.signal(SIGHUP);

    server.waitForReport("fired");
}

TEST_F(CommandServerTimers, MayBeMany) {
    const int number = 1000;
    ServerProcess server(path, onRequest([](CommandServer& running) {
                             static std::vector<int> fired;
                             for (int index = 0; index < number; ++index) {
                                 running.setTimeout(
                                     [index](void*) {
                                         fired.push_back(index);
                                         if (fired.size() == number) {
                                             report("all");
                                         }
                                     },
                                     AT_ONCE, nullptr);
                             }
                         }));

    server.ask("x");

    server.waitForReport("all");
}

TEST_F(CommandServerTimers, CannotBeArmedBeforeTheLoopRuns) {
    ServerOptions options;
    options.setUp = [](CommandServer& server) {
        report(server.setTimeout(reporting("fired"), AT_ONCE, nullptr) ? "armed" : "not armed");
    };
    ServerProcess server(path, options);
    const pid_t pid = server.pid();
    server.awaitPass();

    EXPECT_EQ(RAN, server.stop());

    expectLocated(log, LOG_ERR, pid, "command_server", "add timeout event failed");
    EXPECT_EQ(Reports{"not armed"}, server.reports());
}

TEST_F(CommandServerTimers, WithoutACallbackEndTheLoopWithAnException) {
    ServerProcess server(
        path, onRequest([](CommandServer& running) {
            report(running.setTimeout(CommandServer::TimeoutHandler(), AT_ONCE, nullptr) ? "armed" : "not armed");
        }));

    server.ask("x");

    EXPECT_EQ(EMPTY_CALL, server.wait());
    EXPECT_EQ(Reports{"armed"}, server.reports());
}

TEST_F(CommandServerLoopHandler, IsCalledEveryTwoSeconds) {
    ServerOptions options = withLoopHandler([](CommandServer& running) {
        static bool first = true;
        reportTime("called");
        if (first) {
            running.setTimeout(reporting("three seconds after the first call"), {3, 0}, nullptr);
            first = false;
        }
    });
    const auto setUp = options.setUp;
    options.setUp = [setUp](CommandServer& server) {
        setUp(server);
        reportTime("started");
    };
    ServerProcess server(path, options);

    const long started = timeOf(server, "started");
    const long first = timeOf(server, "called");
    const long second = timeOf(server, "called");
    server.waitForReport("three seconds after the first call");

    // A late call does not delay the next one, so each is measured from the start.
    EXPECT_LE(started + 2000 - CLOCK_STEP, first);
    EXPECT_LE(started + 4000 - CLOCK_STEP, second);
    EXPECT_EQ(0U, server.reports().at(2).find("called")) << "three seconds without a call";
}

TEST_F(CommandServerLoopHandler, MayBeReplacedWhileTheLoopRuns) {
    ServerOptions options = withLoopHandler([](CommandServer&) { report("old"); });
    options.handler = doing([](CommandServer& running) { EXPECT_TRUE(running.setLoopHandler(reporting("new"))); });
    ServerProcess server(path, options);

    server.ask("replace");
    server.waitForReport("new");

    EXPECT_EQ(0, server.countReports("old"));
}

TEST_F(CommandServerLoopHandler, MayReplaceItself) {
    const std::string words = "the old one, whose words are kept as long as it is called";
    ServerProcess server(path, withLoopHandler([words](CommandServer& running) {
                             running.setLoopHandler(reporting("new"));
                             report(words);
                         }));

    server.waitForReport(words);
    server.waitForReport("new");

    EXPECT_EQ(1, server.countReports(words));
}

TEST_F(CommandServerLoopHandler, OfTwoIsTheSecond) {
    ServerOptions options;
    options.setUp = [](CommandServer& server) {
        server.setLoopHandler(reporting("first"));
        server.setLoopHandler(reporting("second"));
    };
    ServerProcess server(path, options);

    server.waitForReport("second");

    EXPECT_EQ(0, server.countReports("first"));
}

TEST_F(CommandServerLoopHandler, ReplacedByNoneEndsTheLoopWithAnException) {
    ServerOptions options = withLoopHandler([](CommandServer&) {});
    options.handler = doing([](CommandServer& running) {
        report(running.setLoopHandler(CommandServer::LoopHandler()) ? "replaced" : "not replaced");
    });
    ServerProcess server(path, options);

    server.ask("replace");

    EXPECT_EQ(EMPTY_CALL, server.wait());
    EXPECT_EQ(Reports{"replaced"}, server.reports());
}

TEST_F(CommandServerLoopHandler, ThatIsNotThereBeforeTheLoopRunsIsNeverCalled) {
    ServerProcess server(path, onRequest([](CommandServer& running) { running.setLoopHandler(reporting("called")); }));
    SocketPeer peer(path);
    peer.ask("set it");
    ASSERT_TRUE(waitUntilLoopSleeps(server.pid()));
    const long slept = timesSlept(server.pid());

    EXPECT_FALSE(support::waitReadable(peer.descriptor(), MORE_THAN_AN_INTERVAL));

    EXPECT_EQ(slept, timesSlept(server.pid())) << "something woke the loop";
    EXPECT_EQ(RAN, server.stop());
    EXPECT_EQ(Reports{}, server.reports());
}
