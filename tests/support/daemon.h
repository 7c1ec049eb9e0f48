#pragma once

#include <sys/types.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "support/line_reader.h"

namespace support {

/** How a test wants its daemon. */
struct DaemonOptions {
    std::vector<std::string> arguments = {"--debug"};
    /** Runs in the daemon's process before the program starts in it. */
    std::function<void()> beforeStart;
    /** False for a daemon that is not expected to come up. */
    bool awaitSocket = true;
};

/**
 * The real daemon, as a child of the test, with its diary (standard error) at
 * hand. What is still there of it at the end of the object's life is killed.
 */
class Daemon {
public:
    explicit Daemon(const DaemonOptions& options = DaemonOptions());
    ~Daemon();
    Daemon(const Daemon&) = delete;
    Daemon& operator=(const Daemon&) = delete;

    pid_t pid() const {
        return child;
    }

    /**
     * Waits for a line of the diary that is `line`, and that was not found by an
     * earlier call. Fails the test if none comes.
     */
    void waitForLine(const std::string& line);
    /** The same for a line that starts with `start`; the whole line. */
    std::string waitForLineStarting(const std::string& start);
    /** How many lines of the diary so far are `line`. */
    int countLines(const std::string& line);
    /** The whole diary so far. */
    std::vector<std::string> diary();

    void signal(int number);
    /** Waits for its end; its wait status. */
    int wait();
    /** Signals it and waits for its end; its wait status. */
    int stop(int number);

private:
    pid_t child = -1;
    std::unique_ptr<LineReader> lines;
};

} // namespace support
