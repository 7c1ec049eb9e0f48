#include "watchdog.h"

#include <signal.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <system_error>

#include "shared/daemon_socket.h"

namespace {

const std::int64_t NANOSECONDS = 1000000000;
/** How soon it is noticed that the daemon has gone. */
const std::int64_t LOOK_EVERY = NANOSECONDS / 5;

// What the handlers use. They run on the one thread there is, between set-up
// and the end, while nobody else touches it.
LastWords lateWords;
LastWords goneWords;
LastWords interruptWords;
std::int64_t deadline = 0;
timer_t timer;

[[noreturn]] void endWith(const LastWords& words) {
    // Nobody is left to tell if this fails.
    [[maybe_unused]] ssize_t result = write(STDOUT_FILENO, words.data.data(), words.data.size());
    result = write(STDERR_FILENO, words.message.data(), words.message.size());
    _exit(words.status);
}

std::int64_t now() {
    timespec time = {};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return time.tv_sec * NANOSECONDS + time.tv_nsec;
}

void startTimer() {
    const std::int64_t pause = std::clamp<std::int64_t>(deadline - now(), 1, LOOK_EVERY);
    itimerspec once = {};
    once.it_value.tv_sec = pause / NANOSECONDS;
    once.it_value.tv_nsec = pause % NANOSECONDS;
    timer_settime(timer, 0, &once, nullptr);
}

// The handlers, and what they call above, use only what is safe in a handler.

void look(int) {
    const int callersErrno = errno;
    if (!isDaemonThere()) {
        endWith(goneWords);
    }
    if (now() >= deadline) {
        endWith(lateWords);
    }
    startTimer();
    errno = callersErrno;
}

void interrupted(int) {
    endWith(interruptWords);
}

void handle(int signal, void (*handler)(int)) {
    struct sigaction action = {};
    action.sa_handler = handler;
    action.sa_flags = SA_RESTART;
    sigaction(signal, &action, nullptr);
    sigset_t unblocked;
    sigemptyset(&unblocked);
    sigaddset(&unblocked, signal);
    sigprocmask(SIG_UNBLOCK, &unblocked, nullptr);
}

} // namespace

Watchdog::Watchdog(double seconds, const LastWords& late, const LastWords& gone) {
    lateWords = late;
    goneWords = gone;
    deadline = now() + static_cast<std::int64_t>(seconds * static_cast<double>(NANOSECONDS));
    handle(SIGALRM, look);
    if (timer_create(CLOCK_MONOTONIC, nullptr, &timer) != 0) {
        throw std::system_error(errno, std::generic_category(), "cannot make a timer");
    }
    startTimer();
}

Watchdog::~Watchdog() {
    handle(SIGALRM, SIG_IGN);
    timer_delete(timer);
}

void endOnInterrupt(const LastWords& words) {
    struct sigaction inherited = {};
    sigaction(SIGINT, nullptr, &inherited);
    if (inherited.sa_handler != SIG_IGN) {
        interruptWords = words;
        handle(SIGINT, interrupted);
    }
}
