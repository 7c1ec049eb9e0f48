#include "watchdog.h"

#include <pthread.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <mutex>
#include <thread>

#include "shared/daemon_socket.h"

namespace {

using Clock = std::chrono::steady_clock;

/** How soon it is noticed that the daemon has gone. */
const Clock::duration LOOK_EVERY = std::chrono::milliseconds(200);
/** Tells the thread that the guard has changed. */
const int WAKE_UP = SIGALRM;

[[noreturn]] void endWith(const LastWords& words) {
    // Nobody is left to tell if this fails.
    [[maybe_unused]] ssize_t result = write(STDOUT_FILENO, words.data.data(), words.data.size());
    result = write(STDERR_FILENO, words.message.data(), words.message.size());
    _exit(words.status);
}

bool isIgnored(int signal) {
    struct sigaction inherited = {};
    sigaction(signal, nullptr, &inherited);
    return inherited.sa_handler == SIG_IGN;
}

/** The thread that watches, and what it is told. Never destroyed, since the thread lasts as long as the process. */
class Watcher {
public:
    explicit Watcher(const LastWords& onInterrupt) : interrupted(onInterrupt) {
    }

    void guard(double seconds, const LastWords& onLate, const std::optional<LastWords>& onGone) {
        {
            const std::lock_guard<std::mutex> lock(mutex);
            late = onLate;
            gone = onGone;
            const Clock::time_point now = Clock::now();
            deadline = now + std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(seconds));
            // One that is not there to begin with is the call's own answer.
            nextLook = now + LOOK_EVERY;
            guarding = true;
        }
        if (thread.joinable()) {
            pthread_kill(thread.native_handle(), WAKE_UP);
        } else {
            start();
        }
    }

    void leave() {
        const std::lock_guard<std::mutex> lock(mutex);
        guarding = false;
    }

private:
    void start() {
        sigemptyset(&signals);
        sigaddset(&signals, WAKE_UP);
        if (!isIgnored(SIGINT)) {
            sigaddset(&signals, SIGINT);
        }
        // No thread takes them but the one that waits for them.
        pthread_sigmask(SIG_BLOCK, &signals, nullptr);
        thread = std::thread(&Watcher::watch, this);
    }

    [[noreturn]] void watch() {
        while (true) {
            const Clock::duration pause = look();
            const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(pause);
            const timespec rest = {static_cast<time_t>(seconds.count()),
                                   static_cast<long>(std::chrono::nanoseconds(pause - seconds).count())};
            if (sigtimedwait(&signals, nullptr, &rest) == SIGINT) {
                endWith(interrupted);
            }
        }
    }

    /** Ends the process if it is time to; how long until the next look. */
    Clock::duration look() {
        const std::lock_guard<std::mutex> lock(mutex);
        if (!guarding) {
            return LOOK_EVERY;
        }
        const Clock::time_point now = Clock::now();
        if (now >= nextLook) {
            nextLook = now + LOOK_EVERY;
            if (gone && !isDaemonThere()) {
                endWith(*gone);
            }
        }
        if (now >= deadline) {
            endWith(late);
        }
        return std::min(nextLook, deadline) - now;
    }

    const LastWords interrupted;
    sigset_t signals = {};
    std::mutex mutex;
    bool guarding = false;
    LastWords late;
    std::optional<LastWords> gone;
    Clock::time_point deadline;
    Clock::time_point nextLook;
    std::thread thread;
};

Watcher* watcher = nullptr;

} // namespace

void setInterrupted(const LastWords& interrupted) {
    watcher = new Watcher(interrupted);
}

Watchdog::Watchdog(double seconds, const LastWords& late, const std::optional<LastWords>& gone) {
    watcher->guard(seconds, late, gone);
}

Watchdog::~Watchdog() {
    watcher->leave();
}
