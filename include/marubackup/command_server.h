#pragma once

#include <sys/time.h>

#include <string>

#include <boost/function.hpp>

#include <marubackup/export.h>

struct inotify_event;

namespace MARU {
namespace Backup {

struct CommandServerPrivate;

/**
 * An event loop that serves framed requests on a Unix stream socket, and runs
 * timers, a periodic handler, signal handlers and folder watches beside them.
 *
 * Make one, register the handlers, call run() once. All callbacks run on the
 * thread that called run(), one at a time, to their end: a slow one delays
 * every other connection, timer and signal. Nothing is locked; no member may be
 * called from another thread while run() is running.
 *
 * An exception thrown by a callback is not caught: it leaves through run(), and
 * the server cannot be used afterwards. Calling an empty callback raises
 * boost::bad_function_call.
 */
class MARUBACKUP_API CommandServer {
public:
    /**
     * Answers one request. `payload` points at `length` bytes inside the
     * connection's buffer, without a terminating NUL, valid during the call
     * only; `server` is the server that calls. Returns the payload of the
     * reply, which may be empty.
     */
    using RequestHandler =
        boost::function<std::string(const char* payload, unsigned int length, CommandServer* server)>;
    /** Called by a timer with the argument that was given to setTimeout(). */
    using TimeoutHandler = boost::function<void(void* argument)>;
    /** Called every two seconds while the loop runs. */
    using LoopHandler = boost::function<void()>;
    /**
     * Called on the loop's thread after the signal arrived, never in signal
     * context: it may do whatever any other callback may do.
     */
    using SignalHandler = boost::function<void(int signal)>;
    /**
     * Called for each inotify event of the folder. `event` and its name are
     * valid during the call only; the name need not be NUL-terminated within
     * its `len` bytes.
     */
    using WatchHandler = boost::function<void(inotify_event* event)>;

    CommandServer();
    /** Releases the handlers. Loop, timers and connections are not freed. */
    ~CommandServer();
    CommandServer(const CommandServer&) = delete;
    CommandServer& operator=(const CommandServer&) = delete;

    /**
     * Serves `socketPath` until SIGINT, SIGQUIT, SIGABRT or SIGTERM arrives, if
     * registered, or no event is left. Blocks all that time.
     *
     * Whatever stands at the path is replaced. If `mode` is not 0 the socket
     * gets that mode, and user 0, group 101 as its owners; with 0 it stays as
     * the umask makes it. When the loop ends the socket is removed.
     *
     * True if the loop ran and ended. False if it could not start; the reason
     * goes to syslog at LOG_ERR: an empty handler or path, a path over 107
     * characters, a socket that cannot be made, bound, given its mode and
     * owners or listened to, or no inotify. If mode or owners were the reason,
     * the umask is left at 007.
     *
     * A connection buffers at most 16384 bytes of unread input, so the longest
     * request is 16380 bytes. A longer one, and one whose length has its top bit
     * set, is never answered; its connection stays open and rests. Connections
     * that would get a descriptor above 1024 are closed at once.
     */
    bool run(const RequestHandler& handler, const std::string& socketPath, int mode);

    /**
     * Calls `callback` with `argument` once, after `delay`. Only while the loop
     * runs, from one of its callbacks; false, with a line in syslog, otherwise
     * or if the timer cannot be made. `argument` stays the caller's.
     */
    bool setTimeout(const TimeoutHandler& callback, timeval delay, void* argument);

    // Registrations. Made before run(), which turns them into events; each
    // replaces an earlier one for the same thing, and returns true always.
    // While the loop runs, a loop handler or a signal that was registered
    // before may be given another handler; new ones are never called.

    bool setLoopHandler(const LoopHandler& handler);
    bool setSignalHandler(int signal, const SignalHandler& handler);
    /**
     * Watches the folder `path` for every kind of inotify event. A folder that
     * cannot be watched when run() starts is reported to syslog and passed
     * over; if it is made later it is still not watched.
     */
    bool setWatchFolder(const std::string& path, const WatchHandler& handler);

private:
    CommandServerPrivate* d;
};

} // namespace Backup
} // namespace MARU
