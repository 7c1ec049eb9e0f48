#pragma once

#include <signal.h>
#include <sys/time.h>

/** While it lives the signal is handled by doing nothing, and interrupts what can be interrupted. */
class HandledSignal {
public:
    explicit HandledSignal(int handled) : number(handled) {
        struct sigaction action = {};
        action.sa_handler = [](int) {};
        sigaction(number, &action, &old);
    }
    ~HandledSignal() {
        sigaction(number, &old, nullptr);
    }
    HandledSignal(const HandledSignal&) = delete;
    HandledSignal& operator=(const HandledSignal&) = delete;

private:
    int number;
    struct sigaction old = {};
};

/** While it lives a handled signal arrives every few milliseconds. */
class SignalStorm {
public:
    SignalStorm() : handled(SIGALRM) {
        const itimerval often = {{0, 3000}, {0, 3000}};
        setitimer(ITIMER_REAL, &often, nullptr);
    }
    ~SignalStorm() {
        const itimerval never = {};
        setitimer(ITIMER_REAL, &never, nullptr);
    }
    SignalStorm(const SignalStorm&) = delete;
    SignalStorm& operator=(const SignalStorm&) = delete;

private:
    HandledSignal handled;
};
