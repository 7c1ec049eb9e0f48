#pragma once

#include <optional>
#include <string>

/** What to write, and the exit status, when the process is ended at an unforeseen point. */
struct LastWords {
    std::string data;    ///< to standard output
    std::string message; ///< to standard error
    int status = 0;
};

/**
 * Has the process end with `interrupted` on SIGINT, from the first Watchdog on, unless
 * whoever started the program ignores that signal. Before that, SIGINT ends it as it
 * ends any program. Once.
 */
void setInterrupted(const LastWords& interrupted);

/**
 * Guards a call into the library, which has no time-out: as long as the object
 * lives, the process is ended when `seconds` have passed, with `late`, or when
 * the daemon has gone, with `gone` if that is given. (A call whose daemon went
 * away in the middle of it would not return.) One at a time, after setInterrupted();
 * the first starts the thread that watches.
 */
class Watchdog {
public:
    Watchdog(double seconds, const LastWords& late, const std::optional<LastWords>& gone);
    ~Watchdog();
    Watchdog(const Watchdog&) = delete;
    Watchdog& operator=(const Watchdog&) = delete;
};
