#include <marubackup-util/process.h>

#include <signal.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <thread>

#include <gtest/gtest.h>

#include "support/files.h"
#include "support/in_child.h"
#include "support/nobody.h"
#include "support/waiting.h"

using MARU::Backup::Process;
using support::describeStatus;
using support::runInChild;
using support::startInChild;
using support::waitForChild;

namespace {

int waitForever() {
    for (;;) {
        pause();
    }
}

/** A child that has ended and is not waited for yet. */
pid_t startZombie(const char* name) {
    const pid_t child = startInChild([name] { return prctl(PR_SET_NAME, name); });
    siginfo_t info = {};
    EXPECT_EQ(0, waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT));
    return child;
}

} // namespace

TEST(AProcess, IsAliveAndNoZombieWhileItRuns) {
    const pid_t child = startInChild(waitForever);

    EXPECT_TRUE(Process::isAlive(child));
    EXPECT_FALSE(Process::isZombie(child));
    EXPECT_TRUE(Process::isAlive(getpid()));
    EXPECT_FALSE(Process::isZombie(getpid()));

    kill(child, SIGKILL);
    waitForChild(child);
}

TEST(AProcess, IsAliveAndAZombieUntilItIsWaitedFor) {
    const pid_t child = startZombie("zombie");

    EXPECT_TRUE(Process::isAlive(child));
    EXPECT_TRUE(Process::isZombie(child));

    waitForChild(child);
    EXPECT_FALSE(Process::isAlive(child));
    EXPECT_FALSE(Process::isZombie(child));
}

TEST(AProcess, MayHaveANameThatLooksLikeAState) {
    const int running = runInChild([] {
        prctl(PR_SET_NAME, "a) Z 1 (b");
        return Process::isZombie(getpid()) ? 1 : 0;
    });
    const pid_t zombie = startZombie("a) S 1 (\nb");

    EXPECT_EQ("exit 0", describeStatus(running));
    EXPECT_TRUE(Process::isZombie(zombie));

    waitForChild(zombie);
}

TEST(AProcess, IsNoZombieWhileAThreadOutlivesItsFirstOne) {
    const pid_t child = startInChild([] {
        std::thread(waitForever).detach();
        return static_cast<int>(syscall(SYS_exit, 0)); // ends this thread alone
    });
    const auto firstThreadEnded = [child] {
        const std::string status = support::readFile("/proc/" + std::to_string(child) + "/status");
        return status.find("State:\tZ") != std::string::npos;
    };
    EXPECT_TRUE(support::waitUntil(firstThreadEnded));

    EXPECT_FALSE(Process::isZombie(child));

    kill(child, SIGKILL);
    waitForChild(child);
}

TEST(AProcess, IsAliveAlsoIfWeMayNotSignalIt) {
    const int status = runInChild([] {
        if (geteuid() == 0) {
            support::becomeNobody();
        }
        const bool refused = kill(1, 0) == -1 && errno == EPERM;
        return refused && Process::isAlive(1) ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST(AProcess, HasAnIdAboveZero) {
    for (const int pid : {0, -1, -getpgrp(), INT_MIN}) {
        EXPECT_FALSE(Process::isAlive(pid)) << pid;
        EXPECT_FALSE(Process::isZombie(pid)) << pid;
    }
}

TEST(AProcess, IsNotThereBeyondTheLargestId) {
    EXPECT_FALSE(Process::isAlive(INT_MAX));
    EXPECT_FALSE(Process::isZombie(INT_MAX));
}
