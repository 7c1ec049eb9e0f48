#include "queue/child_process.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "signals.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/syscall_filter.h"
#include "support/temp_dir.h"
#include "support/waiting.h"

using MARU::Backup::forkWithDefaultSignals;
using MARU::Backup::waitFullSeconds;
using support::describeStatus;
using support::runInChild;
using support::waitForChild;

namespace {

/** Signals 32 and 33, which glibc keeps to itself: nobody can set them up, and threads come with one. */
const unsigned long long KEPT_BY_GLIBC = 3ULL << 31;

/** The kernel's record of which signals this process blocks, ignores and handles, as bits. */
std::string signalSetUp() {
    std::istringstream status(support::readFile("/proc/self/status"));
    std::ostringstream setUp;
    for (std::string key, value; status >> key && std::getline(status, value);) {
        if (key == "SigBlk:" || key == "SigIgn:" || key == "SigCgt:") {
            setUp << key << std::hex << (std::stoull(value, nullptr, 16) & ~KEPT_BY_GLIBC) << " ";
        }
    }
    return setUp.str();
}

const char* const NOTHING_SET_UP = "SigBlk:0 SigIgn:0 SigCgt:0 ";

/** A daemon's signals: some handled, some ignored, some blocked. Call it in a child made for the test. */
void setUpSignals() {
    for (const int handled : {SIGTERM, SIGCHLD, SIGUSR1, SIGRTMIN}) {
        signal(handled, [](int) {});
    }
    for (const int ignored : {SIGPIPE, SIGHUP, SIGRTMAX}) {
        signal(ignored, SIG_IGN);
    }
    sigset_t blocked;
    sigemptyset(&blocked);
    sigaddset(&blocked, SIGINT);
    sigaddset(&blocked, SIGTERM);
    sigprocmask(SIG_BLOCK, &blocked, nullptr);
}

/** Where a handler reports that it ran, in whatever process. */
int handlerReports[2];

void reportSignal(int) {
    const char byte = 0;
    static_cast<void>(!write(handlerReports[1], &byte, 1));
}

/** Waits for a signal's default action; if none comes, the process ends by itself. */
[[noreturn]] void waitToBeKilled() {
    poll(nullptr, 0, static_cast<int>(std::chrono::milliseconds(support::PATIENCE).count()));
    _exit(1);
}

} // namespace

TEST(ForkWithDefaultSignals, LeavesNothingOfTheDaemonsSetUpInTheChild) {
    SKIP_IF_EMULATED("the process's own signals are the emulator's");
    const support::TempDir folder;

    const int status = runInChild([&]() {
        setUpSignals();
        const pid_t child = forkWithDefaultSignals();
        if (child == 0) {
            support::writeFile(folder.path("set-up"), signalSetUp());
            _exit(0);
        }
        return waitForChild(child);
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    EXPECT_EQ(NOTHING_SET_UP, support::readFile(folder.path("set-up")));
}

TEST(ForkWithDefaultSignals, LeavesTheDaemonsSetUpAlone) {
    const int status = runInChild([]() {
        setUpSignals();
        const std::string before = signalSetUp();
        const pid_t child = forkWithDefaultSignals();
        if (child == 0) {
            _exit(0);
        }
        waitForChild(child);
        return before != NOTHING_SET_UP && before == signalSetUp() ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST(ForkWithDefaultSignals, SaysWhyThereIsNoChildAndUnblocksSignalsAgain) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    const int status = runInChild([]() {
        const std::string before = signalSetUp();
        support::refuseSystemCalls({SYS_clone, SYS_clone3}, EAGAIN);
        const pid_t child = forkWithDefaultSignals();
        const int error = errno;
        return child == -1 && error == EAGAIN && before == signalSetUp() ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST(ForkWithDefaultSignals, ASignalToTheChildAtOnceKillsItAndNeverReachesTheDaemonsHandler) {
    ASSERT_EQ(0, pipe2(handlerReports, O_CLOEXEC | O_NONBLOCK));
    struct sigaction action = {};
    struct sigaction old = {};
    action.sa_handler = reportSignal;
    sigaction(SIGTERM, &action, &old);

    for (int round = 0; round < 500 && !HasFailure(); ++round) {
        const pid_t child = forkWithDefaultSignals();
        if (child == 0) {
            waitToBeKilled();
        }
        kill(child, SIGTERM);
        EXPECT_EQ("signal 15", describeStatus(waitForChild(child))) << "round " << round;
    }

    char byte = 0;
    EXPECT_EQ(-1, read(handlerReports[0], &byte, 1)) << "a handler of the daemon ran";
    sigaction(SIGTERM, &old, nullptr);
    close(handlerReports[0]);
    close(handlerReports[1]);
}

TEST(WaitFullSeconds, LastsThatLongWhateverSignalsArrive) {
    const SignalStorm storm;
    const auto start = std::chrono::steady_clock::now();

    waitFullSeconds(1);

    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::seconds(1));
}
