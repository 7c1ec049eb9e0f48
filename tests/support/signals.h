#pragma once

#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace support {

/** Has `signalNumber` interrupt what it finds the process in. */
inline void handleSignal(int signalNumber, void (*handler)(int)) {
    struct sigaction action = {};
    action.sa_handler = handler; // and not SA_RESTART
    sigaction(signalNumber, &action, nullptr);
}

/**
 * Blocks all signals, and ignores or handles all but SIGCHLD, also those that
 * glibc keeps to itself. For children made for a test.
 */
inline void changeAllSignals() {
    const unsigned long ignored[8] = {1};
    const std::size_t maskSize = _NSIG / 8;
    for (int signalNumber = 1; signalNumber < _NSIG; ++signalNumber) {
        if (signalNumber != SIGCHLD) {
            syscall(SYS_rt_sigaction, signalNumber, ignored, nullptr, maskSize);
        }
    }
    handleSignal(SIGTERM, [](int) {});
    sigset_t all;
    sigfillset(&all);
    sigprocmask(SIG_SETMASK, &all, nullptr);
}

} // namespace support
