#include <marubackup/controller.h>

#include <unistd.h>

#include <atomic>
#include <csignal>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "controller_calls.h"
#include "support/fake_daemon.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

// When the controller connects, what it keeps, and what it does where nobody is there.

namespace {

using MARU::Backup::Job;
using MARU::Backup::JobController;
using support::CannedReply;
using support::FakeDaemon;
using testing::ElementsAre;

/** A reply that every request takes for a success; getJobByUnique() finds the one job. */
const char* const GOOD_REPLY = "{\"code\":200,\"job\":{},\"jobs\":[{}]}";

/** A client that means to outlive its daemon, for the time of the object's life. */
class IgnoredSigpipe {
public:
    IgnoredSigpipe() : old(std::signal(SIGPIPE, SIG_IGN)) {
    }
    ~IgnoredSigpipe() {
        std::signal(SIGPIPE, old);
    }
    IgnoredSigpipe(const IgnoredSigpipe&) = delete;
    IgnoredSigpipe& operator=(const IgnoredSigpipe&) = delete;

private:
    void (*old)(int);
};

/** The socket's file as a daemon leaves it that was killed. */
class StaleSocket {
public:
    StaleSocket() {
        close(support::listenAt(support::DAEMON_SOCKET));
    }
    ~StaleSocket() {
        unlink(support::DAEMON_SOCKET);
    }
    StaleSocket(const StaleSocket&) = delete;
    StaleSocket& operator=(const StaleSocket&) = delete;
};

/** Makes every request where nobody serves, and expects each to say so. */
void expectUnreachable() {
    ErrorLog log;
    JobController controller;
    for (const Call& call : everyCall()) {
        SCOPED_TRACE(call.name);
        Outputs outputs;
        EXPECT_EQ(503, call.make(controller, outputs));
        EXPECT_EQ(OLD_JOB, outputs.job.toString());
        EXPECT_EQ(call.fillsList ? 0U : 2U, outputs.jobs.size());
        std::vector<std::string> expected;
        if (call.complaint == Complaint::OF_ADDING) {
            expected = {"controller.cpp: addJob failed: connect failed."};
        }
        EXPECT_EQ(expected, log.take());
    }
}

TEST(Unreachable, IsADaemonThatWasNeverStarted) {
    expectUnreachable();
}

TEST(Unreachable, IsADaemonThatLeftItsSocketBehind) {
    const StaleSocket socket;
    expectUnreachable();
}

TEST(Unreachable, IsNoDaemonForEver) {
    JobController controller;
    EXPECT_EQ(503, controller.removeJob(1));
    const FakeDaemon daemon({GOOD_REPLY});
    EXPECT_EQ(200, controller.removeJob(1));
}

TEST(Connection, IsMadeByTheFirstRequest) {
    FakeDaemon daemon({GOOD_REPLY});
    JobController controller;
    EXPECT_EQ(0, daemon.connections());
    EXPECT_EQ(200, controller.removeJob(1));
    EXPECT_EQ(1, daemon.connections());
}

TEST(Connection, IsKeptForAllRequests) {
    FakeDaemon daemon;
    JobController controller;
    for (const Call& call : everyCall()) {
        daemon.addReply(GOOD_REPLY);
        Outputs outputs;
        EXPECT_EQ(200, call.make(controller, outputs)) << call.name;
    }
    EXPECT_EQ(everyCall().size(), daemon.requests().size());
    EXPECT_EQ(1, daemon.connections());
}

TEST(Connection, IsKeptAfterARefusalAndAfterAReplyThatCannotBeRead) {
    FakeDaemon daemon({"{\"code\":404}", "pong", "[]", GOOD_REPLY});
    JobController controller;
    EXPECT_EQ(404, controller.removeJob(1));
    EXPECT_EQ(500, controller.removeJob(1));
    EXPECT_EQ(500, controller.removeJob(1));
    EXPECT_EQ(200, controller.removeJob(1));
    EXPECT_EQ(1, daemon.connections());
}

TEST(Connection, BelongsToOneController) {
    FakeDaemon daemon({GOOD_REPLY, GOOD_REPLY, GOOD_REPLY});
    JobController first;
    JobController second;
    EXPECT_EQ(200, first.removeJob(1));
    EXPECT_EQ(200, second.removeJob(1));
    EXPECT_EQ(200, first.removeJob(1));
    EXPECT_EQ(2, daemon.connections());
}

TEST(Connection, IsClosedAtTheControllersEnd) {
    FakeDaemon daemon({GOOD_REPLY});
    {
        JobController controller;
        EXPECT_EQ(200, controller.removeJob(1));
        EXPECT_EQ(1, daemon.openConnections());
    }
    EXPECT_TRUE(support::waitUntil([&daemon]() { return daemon.openConnections() == 0; }));
}

TEST(Connection, IsMadeAnewAfterAnEmptyReply) {
    for (const Call& call : everyCall()) {
        SCOPED_TRACE(call.name);
        FakeDaemon daemon({"", GOOD_REPLY});
        JobController controller;
        Outputs outputs;
        EXPECT_EQ(500, call.make(controller, outputs));
        EXPECT_EQ(200, call.make(controller, outputs));
        EXPECT_EQ(2, daemon.connections());
    }
}

TEST(Connection, IsMadeAnewAfterItWasReset) {
    ErrorLog log;
    FakeDaemon daemon({CannedReply("", CannedReply::RESET), GOOD_REPLY});
    JobController controller;

    EXPECT_EQ(500, controller.removeJob(1));
    EXPECT_THAT(log.take(), ElementsAre("command_client: recv failed, Connection reset by peer",
                                        "controller.cpp: parse response failed, "));
    EXPECT_EQ(200, controller.removeJob(1));
    EXPECT_EQ(2, daemon.connections());
}

TEST(Connection, IsMadeAnewAfterTheDaemonHungUp) {
    const IgnoredSigpipe ignored;
    ErrorLog log;
    FakeDaemon daemon({CannedReply(GOOD_REPLY, CannedReply::HANG_UP), GOOD_REPLY});
    JobController controller;
    EXPECT_EQ(200, controller.removeJob(1));
    EXPECT_EQ(1U, daemon.requests().size()); // it has hung up by now

    EXPECT_EQ(500, controller.removeJob(1));
    EXPECT_THAT(log.take(), ElementsAre("controller.cpp: parse response failed, "));
    EXPECT_EQ(200, controller.removeJob(1));
    EXPECT_EQ(2, daemon.connections());
}

TEST(Connection, IsMadeAnewToADaemonThatWasStartedAgain) {
    const IgnoredSigpipe ignored;
    auto daemon = std::make_unique<FakeDaemon>(std::vector<CannedReply>{GOOD_REPLY});
    JobController controller;
    EXPECT_EQ(200, controller.removeJob(1));
    daemon.reset();
    daemon = std::make_unique<FakeDaemon>(std::vector<CannedReply>{GOOD_REPLY});

    EXPECT_EQ(500, controller.removeJob(1));
    EXPECT_EQ(200, controller.removeJob(1));
}

TEST(Connection, ThatIsLostForGoodMakesTheDaemonUnreachable) {
    const IgnoredSigpipe ignored;
    auto daemon = std::make_unique<FakeDaemon>(std::vector<CannedReply>{GOOD_REPLY});
    JobController controller;
    EXPECT_EQ(200, controller.removeJob(1));
    daemon.reset();

    EXPECT_EQ(500, controller.removeJob(1));
    EXPECT_EQ(503, controller.removeJob(1));
}

TEST(Controllers, OfSeveralThreadsDoNotMeet) {
    const int REQUESTS = 25;
    FakeDaemon daemon(std::vector<CannedReply>(4 * REQUESTS, GOOD_REPLY));
    std::atomic<int> done{0};
    std::vector<std::thread> threads;
    for (int number = 0; number < 4; ++number) {
        threads.emplace_back([&done]() {
            JobController controller;
            for (int i = 0; i < REQUESTS; ++i) {
                Outputs outputs;
                done += controller.getJob(1, outputs.job) == 200;
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(4 * REQUESTS, done);
    EXPECT_EQ(4, daemon.connections());
}

} // namespace
