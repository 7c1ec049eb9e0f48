#include <atomic>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "status_fixture.h"
#include "support/appliance.h"
#include "support/fake_daemon.h"

using namespace MARU::Backup;

namespace {

const int THREADS = 8;
const int ROUNDS = 5;

using SeveralThreads = SystemStatus;

/** Runs `body` in several threads at once. */
template <typename Body>
void inThreads(Body body) {
    std::vector<std::thread> threads;
    for (int number = 0; number < THREADS; ++number) {
        threads.emplace_back([body] {
            for (int round = 0; round < ROUNDS; ++round) {
                body();
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}

} // namespace

TEST_F(SeveralThreads, AreToldTheSameByTaskAndTool) {
    support::writeTaskFile("@administrators", "confbkp_bkp_1", runningTask(startProcess()));

    inThreads([] {
        EXPECT_EQ(ALLOWED, ask(System::canBackup));
        EXPECT_EQ(refusedFor(Job::ACTION_BACKUP), ask(System::canRestore));
        EXPECT_TRUE(System::isBackupRunning("configbackup"));
        EXPECT_FALSE(System::isBackupRunning("tidebackup"));
    });

    EXPECT_EQ(2 * THREADS * ROUNDS, snapshotQuestions());
}

TEST_F(SeveralThreads, AskTheDaemonSideBySide) {
    support::FakeDaemon daemon;
    for (int reply = 0; reply < THREADS * ROUNDS; ++reply) {
        daemon.addReply(listing(Job::ACTION_COPY_TO));
    }

    inThreads([] { EXPECT_TRUE(System::isCopyToRunning("")); });

    EXPECT_EQ(THREADS * ROUNDS, daemon.connections());
}

TEST_F(SeveralThreads, ComplainEachOfTheirOwnFailure) {
    support::installSnapshotTool("kill -KILL $$");

    inThreads([] { EXPECT_TRUE(System::canBackup()); });

    EXPECT_EQ(THREADS * ROUNDS, log.count("is-restore-running [0x0A01 exec.cpp:"));
}

TEST_F(SeveralThreads, SeeATaskThatComesAndGoes) {
    const std::string running = runningTask(startProcess());
    std::atomic<bool> done(false);
    std::thread operatorsThread([&] {
        while (!done) {
            support::writeTaskFile("@administrators", "confbkp_bkp_1", running);
            std::filesystem::remove_all(support::TASK_ROOT);
        }
    });

    inThreads([] {
        System::isBackupRunning("");
        EXPECT_FALSE(System::isBackupRunning("tidebackup"));
    });

    done = true;
    operatorsThread.join();
    EXPECT_FALSE(System::isBackupRunning(""));
    support::writeTaskFile("@administrators", "confbkp_bkp_1", running);
    EXPECT_TRUE(System::isBackupRunning(""));
}
