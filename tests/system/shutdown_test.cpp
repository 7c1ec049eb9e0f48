// How the daemon ends, and what becomes of its jobs.

#include <signal.h>
#include <sys/wait.h>

#include <chrono>
#include <cstring>
#include <filesystem>

#include "daemon_test.h"
#include "support/in_child.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using namespace MARU::Backup;
using Clock = std::chrono::steady_clock;

namespace {

class Shutdown : public DaemonTest {
protected:
    Shutdown() {
        start();
    }

    std::string signalLine(int number, const Job& job, int pid) {
        return "send sig[" + std::to_string(number) + "] to job [" + std::to_string(job.getJobId()) + "] pid [" +
               std::to_string(pid) + "]";
    }
};

class ShutdownBySignal : public Shutdown, public testing::WithParamInterface<int> {};

INSTANTIATE_TEST_SUITE_P(Each, ShutdownBySignal, testing::Values(SIGINT, SIGQUIT, SIGABRT, SIGTERM),
                         [](const auto& row) { return std::string(sigabbrev_np(row.param)); });

} // namespace

TEST_P(ShutdownBySignal, JobsThatEndAtOnceAreNotWaitedForLong) {
    support::Gate& gate = newGate();
    const Job running = addGated(Job::ACTION_BACKUP, gate);
    const Job waiting = addGated(Job::ACTION_BACKUP, newGate());
    gate.awaitJob();
    const int pid = pidOf(running);
    const auto begin = Clock::now();

    EXPECT_EQ("exit 0", support::describeStatus(daemon->stop(GetParam())));
    EXPECT_LT(Clock::now() - begin, std::chrono::seconds(5));
    EXPECT_FALSE(std::filesystem::exists(support::DAEMON_SOCKET));
    daemon->waitForLine("got signal: [" + std::to_string(GetParam()) + "]");
    daemon->waitForLine(signalLine(SIGTERM, running, pid));
    daemon->waitForLine("[terminate] check children status");
    daemon->waitForLine("job [1] term by sig(" + std::to_string(pid & 0x7F) + ")");
    daemon->waitForLine("job [1] core dump");
    for (const std::string& line : daemon->diary()) {
        EXPECT_NE(0U, line.rfind("send sig[15] to job [2]", 0)) << "job " << waiting.getJobId() << " had no process";
        EXPECT_NE(0U, line.rfind("send sig[9]", 0)) << line;
    }
}

TEST_P(ShutdownBySignal, AJobThatIgnoresSigtermIsKilledAfterFiveSeconds) {
    support::Gate& stubbornGate = newGate();
    support::Gate& gate = newGate();
    const Job stubborn = addGated(Job::ACTION_BACKUP, stubbornGate, "stubborn");
    addGated(Job::ACTION_COPY_TO, gate); // its end in the meantime shortens nothing
    stubbornGate.awaitJob();
    gate.awaitJob();
    const int pid = pidOf(stubborn);
    const auto begin = Clock::now();

    EXPECT_EQ("exit 0", support::describeStatus(daemon->stop(GetParam())));
    EXPECT_GE(Clock::now() - begin, std::chrono::seconds(5));
    EXPECT_FALSE(std::filesystem::exists(support::DAEMON_SOCKET));
    daemon->waitForLine(signalLine(SIGTERM, stubborn, pid));
    daemon->waitForLine(signalLine(SIGKILL, stubborn, pid));
    EXPECT_EQ(6, daemon->countLines("[terminate] check children status"));
    EXPECT_TRUE(support::waitUntil([pid]() { return kill(pid, 0) != 0; })) << "the job outlived the daemon";
}

TEST_F(Shutdown, ADaemonWithoutJobsEndsAtOnce) {
    EXPECT_EQ("exit 0", support::describeStatus(daemon->stop(SIGTERM)));
    EXPECT_EQ(1, daemon->countLines("[terminate] check children status"));
    EXPECT_FALSE(std::filesystem::exists(support::DAEMON_SOCKET));
}

TEST_F(Shutdown, HangupListsTheJobsAndTheDaemonGoesOn) {
    const Job running = addGated(Job::ACTION_BACKUP, newGate());
    const Job waiting = addGated(Job::ACTION_BACKUP, newGate());
    Job asKept;
    ASSERT_EQ(200, controller.getJob(running.getJobId(), asKept));

    daemon->signal(SIGHUP);
    daemon->waitForLine("  [backup] " + asKept.toString());
    daemon->waitForLine("  [backup] " + waiting.toString());
    daemon->waitForLine("[hup] check children status");
    EXPECT_TRUE(isRunning(running));
}

TEST_F(Shutdown, ASecondDaemonRefusesToStartAndTheFirstGoesOnServing) {
    support::DaemonOptions second;
    second.awaitSocket = false;
    support::Daemon other(second);
    EXPECT_EQ("exit 1", support::describeStatus(other.wait()));
    EXPECT_TRUE(isRunning(addGated(Job::ACTION_BACKUP, newGate())));

    support::SocketPeer peer;
    EXPECT_EQ("{\"code\":404}", peer.ask("{\"op\":\"job_get\",\"job_id\":99}"));
}

TEST_F(Shutdown, ADaemonThatWasKilledIsReplacedByTheNextOne) {
    daemon->stop(SIGKILL);
    EXPECT_TRUE(std::filesystem::exists(support::DAEMON_SOCKET));
    start();
    JobController anew;
    std::list<Job> jobs;
    EXPECT_EQ(200, anew.listJobAll(jobs));
}
