#pragma once

#include <string>

#include <marubackup/export.h>

namespace MARU {
namespace Backup {

struct CommandClientPrivate;

/**
 * The client's end of the command channel: sends one request frame over a Unix
 * stream socket and waits for the reply frame. A frame is its length, four
 * bytes, most significant first, and that many bytes of payload.
 *
 * The daemon takes requests of at most 16380 bytes of payload; a longer one is
 * never answered. Replies may be of any size.
 *
 * All calls block the calling thread, without any time-out, and survive being
 * interrupted by signals. One client is used by one thread at a time. Writing
 * to a connection that the daemon has closed raises SIGPIPE: a program that
 * wants to outlive the daemon ignores that signal. Failures go to syslog:
 * those to expect (no daemon there) at debug level, others at error level.
 */
class MARUBACKUP_API CommandClient {
public:
    /** A client that is not connected. */
    CommandClient();
    /** Closes the connection if there is one. */
    ~CommandClient();
    CommandClient(const CommandClient&) = delete;
    CommandClient& operator=(const CommandClient&) = delete;

    /**
     * Connects to the socket at `path`, at most 107 characters. False if the
     * path is longer or nobody serves it. Call it only when isConnected() is
     * false: an earlier connection is forgotten without being closed.
     */
    bool connect(const std::string& path);
    /** Whether there is a connection. Says nothing about the daemon's health. */
    bool isConnected() const;
    /** Closes the connection; without one, does nothing. */
    void close();

    /**
     * Sends `request` and returns the payload of the reply. Empty if anything
     * failed, and also if the reply was empty. After a failure the stream may
     * be in the middle of a frame: close() and connect() before going on.
     *
     * If the daemon goes away while the reply is awaited, the call does not
     * return. A caller that cannot accept this guards it from outside (an
     * alarm, a watchdog).
     */
    std::string send(const std::string& request);

private:
    CommandClientPrivate* d;
};

} // namespace Backup
} // namespace MARU
