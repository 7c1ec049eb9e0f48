#pragma once

#include <syslog.h>

#include <mutex>
#include <string>
#include <vector>

#include "support/descriptor_reader.h"
#include "support/inbox.h"

namespace support {

/** One message as it came through /dev/log. */
struct SyslogLine {
    int priority = -1;   ///< the level alone, without the facility
    int facility = -1;   ///< as in LOG_DAEMON
    std::string ident;   ///< the program
    std::string message; ///< what it said
};

/**
 * What a located message looks like: "(pid) [err] unit:line text", or [debug].
 * Where `located` is false it was none.
 */
struct LocatedMessage {
    bool located = false;
    int pid = 0;
    std::string level;
    std::string unit;
    int line = 0;
    std::string text;
};

LocatedMessage parseLocated(const std::string& message);

/**
 * The sandbox's /dev/log. Make it before the program that logs starts: there is
 * none else, and what is logged without it is lost.
 */
class SyslogSocket {
public:
    SyslogSocket();
    ~SyslogSocket();
    SyslogSocket(const SyslogSocket&) = delete;
    SyslogSocket& operator=(const SyslogSocket&) = delete;

    /** All lines that were logged before the call, without waiting. */
    std::vector<SyslogLine> lines();

    /**
     * Waits for a line whose message holds `text`, and that was not found by an
     * earlier call. Fails the test, and returns an empty line, if none comes.
     */
    SyslogLine waitFor(const std::string& text);

    /** How many of the lines that were logged before the call hold `text`. */
    int count(const std::string& text);

    /**
     * While the result is locked no line is taken out of the socket, and whoever
     * logs has to wait once it is full.
     */
    std::unique_lock<std::mutex> hold();

private:
    void receive();

    int fd;
    std::mutex receiving; ///< the reader takes lines as they come, and lines() those that it has not taken yet
    Inbox<SyslogLine> received;
    DescriptorReader reader; // the last, so that all else is there while it runs
};

/**
 * Waits for a located message of exactly `text`, and expects it from `pid`, at
 * `priority` (LOG_ERR or LOG_DEBUG), from `unit`, with a line number.
 */
void expectLocated(SyslogSocket& log, int priority, int pid, const std::string& unit, const std::string& text);

} // namespace support
