#include "queue/child_process.h"

#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <ctime>

namespace MARU {
namespace Backup {

namespace {

void setDefaultSignals() {
    for (int signal = 1; signal < NSIG; ++signal) {
        std::signal(signal, SIG_DFL); // refused for a few, which are at their default
    }
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
}

} // namespace

pid_t forkWithDefaultSignals() {
    sigset_t all;
    sigset_t old;
    sigfillset(&all);
    sigprocmask(SIG_SETMASK, &all, &old);
    const pid_t pid = fork();
    const int forkErrno = errno;
    if (pid == 0) {
        setDefaultSignals();
    } else {
        sigprocmask(SIG_SETMASK, &old, nullptr);
    }
    errno = forkErrno;
    return pid;
}

void waitFullSeconds(unsigned int seconds) {
    timespec end = {};
    clock_gettime(CLOCK_MONOTONIC, &end);
    end.tv_sec += static_cast<time_t>(seconds);
    while (clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &end, nullptr) == EINTR) {
    }
}

} // namespace Backup
} // namespace MARU
