#include <marubackup/command_server.h>

#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <map>
#include <memory>
#include <new>
#include <vector>

#include <event2/buffer.h>
#include <event2/bufferevent.h>
#include <event2/event.h>

#include "command/frame.h"
#include "command/inotify_events.h"
#include "command/socket_address.h"
#include "common/log.h"

namespace MARU {
namespace Backup {

struct CommandServerPrivate {
    CommandServer::RequestHandler requestHandler;
    CommandServer::LoopHandler loopHandler;
    std::map<int, CommandServer::SignalHandler> signalHandlers;
    std::map<std::string, CommandServer::WatchHandler> watchByPath;
    std::map<int, CommandServer::WatchHandler> watchByDescriptor;
    event_base* eventBase = nullptr;

    ~CommandServerPrivate() {
        watchByDescriptor.clear();
        watchByPath.clear();
        signalHandlers.clear();
        loopHandler.clear();
        requestHandler.clear();
    }
};

namespace {

const char* const LOG_UNIT = "command_server";

const std::size_t MAX_UNREAD = 16384;
const int MAX_DESCRIPTOR = 1024;
const int LISTEN_BACKLOG = 16;
const uid_t SOCKET_USER = 0;
const gid_t SOCKET_GROUP = 101;
const timeval LOOP_INTERVAL = {2, 0};

/** What the listening event and every connection know of their server. */
struct ListenContext {
    CommandServer* server;
    CommandServerPrivate* priv;
};

/** One armed timer. */
struct TimeoutRecord {
    CommandServer::TimeoutHandler callback;
    void* argument;
};

/** The events of a loop that is being set up; freed if it never starts. */
class SetUpEvents {
public:
    SetUpEvents() = default;
    SetUpEvents(const SetUpEvents&) = delete;
    SetUpEvents& operator=(const SetUpEvents&) = delete;

    ~SetUpEvents() {
        free();
    }

    void free() {
        for (event* one : events) {
            event_free(one);
        }
        events.clear();
    }

    /** False if there is no such event or it cannot be added. */
    bool add(event* one, const timeval* interval) {
        if (one == nullptr) {
            return false;
        }
        events.push_back(one);
        return event_add(one, interval) == 0;
    }

    /** The loop starts, and keeps its events for good. */
    void keep() {
        events.clear();
    }

private:
    std::vector<event*> events;
};

// Connections

/** A connection that is read no more, and whose end is awaited. */
struct RestingConnection {
    bufferevent* connection;
    event* arrival;

    ~RestingConnection() {
        if (arrival != nullptr) {
            event_free(arrival);
        }
        bufferevent_free(connection);
    }
};

void restingEventCallback(bufferevent*, short, void* resting) {
    delete static_cast<RestingConnection*>(resting);
}

bool hasHungUp(evutil_socket_t fd) {
    pollfd entry = {fd, POLLRDHUP, 0};
    return poll(&entry, 1, 0) > 0;
}

void restingArrivalCallback(evutil_socket_t fd, short, void* resting) {
    if (hasHungUp(fd)) {
        delete static_cast<RestingConnection*>(resting);
    }
}

/** Called when no reply is left to be written. */
void restingDrainedCallback(bufferevent* connection, void* argument) {
    auto* const resting = static_cast<RestingConnection*>(argument);
    // Unread input is there all the time, so only a change of the socket's
    // state is worth waking up for: edge-triggered. libevent does not mix that
    // with the writing of replies, whose failure ends the connection by itself.
    resting->arrival = event_new(bufferevent_get_base(connection), bufferevent_getfd(connection),
                                 EV_READ | EV_PERSIST | EV_ET, restingArrivalCallback, resting);
    if (resting->arrival != nullptr) {
        event_add(resting->arrival, nullptr);
    }
}

/**
 * Leaves a connection open whose input is full and can never be used. libevent
 * 2.1 would go on calling the read callback for it, and the daemon would spin;
 * with reading disabled it costs nothing until its client goes away.
 */
void rest(bufferevent* connection) {
    bufferevent_disable(connection, EV_READ);
    auto* const resting = new RestingConnection{connection, nullptr};
    bufferevent_setcb(connection, nullptr, restingDrainedCallback, restingEventCallback, resting);
    if (evbuffer_get_length(bufferevent_get_output(connection)) == 0) {
        restingDrainedCallback(connection, resting);
    }
}

/**
 * Sends what is in `replies`: at once what the socket takes, so that the loop
 * need not come round again to learn that it is writable; the rest, or all if
 * earlier replies wait, as the client reads. A failure shows when that is tried.
 */
void sendReplies(bufferevent* connection, evbuffer* replies) {
    evbuffer* const output = bufferevent_get_output(connection);
    if (evbuffer_get_length(output) == 0 && evbuffer_get_length(replies) > 0) {
        evbuffer_write(replies, bufferevent_getfd(connection));
    }
    evbuffer_add_buffer(output, replies);
}

/** Answers the complete frame of `length` bytes that the input starts with. */
bool answerFrame(evbuffer* input, std::uint32_t length, evbuffer* replies, const ListenContext& context) {
    const std::size_t frameSize = FrameHeader().size() + length;
    const unsigned char* const frame = evbuffer_pullup(input, static_cast<ev_ssize_t>(frameSize));
    if (frame == nullptr) {
        return false;
    }
    const char* const payload = reinterpret_cast<const char*>(frame) + FrameHeader().size();
    const std::string reply = context.priv->requestHandler(payload, length, context.server);

    const FrameHeader header = frameHeader(static_cast<std::uint32_t>(reply.size()));
    evbuffer_expand(replies, header.size() + reply.size());
    evbuffer_add(replies, header.data(), header.size());
    evbuffer_add(replies, reply.data(), reply.size());
    if (evbuffer_drain(input, frameSize) != 0) {
        LOG_LOCATED_ERR("evbuffer_drain failed");
        return false;
    }
    return true;
}

/** How the frames of an input were worked off. */
enum InputState {
    INPUT_SERVED, ///< whatever more arrives may complete a frame
    INPUT_FULL,   ///< no byte can arrive, and what is there can never be used
};

/** Answers every complete frame that waits in the input, in order. */
InputState answerFrames(evbuffer* input, evbuffer* replies, const ListenContext& context) {
    FrameHeader header;
    while (evbuffer_copyout(input, header.data(), header.size()) == static_cast<ev_ssize_t>(header.size())) {
        const std::size_t waiting = evbuffer_get_length(input);
        const FrameState state = requestState(header, waiting);
        if (state == FRAME_COMPLETE) {
            if (!answerFrame(input, frameLength(header), replies, context)) {
                return INPUT_SERVED;
            }
            continue;
        }
        if (state == FRAME_REFUSED) {
            LOG_LOCATED_ERR("protocol error");
        }
        return waiting >= MAX_UNREAD ? INPUT_FULL : INPUT_SERVED;
    }
    return INPUT_SERVED;
}

void readCallback(bufferevent* connection, void* argument) {
    const ListenContext& context = *static_cast<ListenContext*>(argument);
    const std::unique_ptr<evbuffer, void (*)(evbuffer*)> replies(evbuffer_new(), evbuffer_free);
    if (!replies) {
        throw std::bad_alloc();
    }
    const InputState state = answerFrames(bufferevent_get_input(connection), replies.get(), context);
    sendReplies(connection, replies.get());
    if (state == INPUT_FULL) {
        rest(connection);
    }
}

void eventCallback(bufferevent* connection, short, void*) {
    bufferevent_free(connection);
}

void acceptCallback(evutil_socket_t listener, short, void* argument) {
    const ListenContext& context = *static_cast<ListenContext*>(argument);
    alignas(sockaddr) char address[128] = {};
    socklen_t length = sizeof address;
    const int fd = accept(listener, reinterpret_cast<sockaddr*>(address), &length);
    if (fd < 0) {
        LOG_LOCATED_ERR("accept failed: %m");
        return;
    }
    if (fd > MAX_DESCRIPTOR) {
        close(fd);
        return;
    }
    evutil_make_socket_nonblocking(fd);
    bufferevent* const connection = bufferevent_socket_new(context.priv->eventBase, fd, BEV_OPT_CLOSE_ON_FREE);
    if (connection == nullptr) {
        close(fd);
        return;
    }
    bufferevent_setcb(connection, readCallback, nullptr, eventCallback, argument);
    bufferevent_setwatermark(connection, EV_READ, 0, MAX_UNREAD);
    bufferevent_enable(connection, EV_READ | EV_WRITE);
}

// The socket

/** A bound socket at `path`, in place of whatever was there; -1 on failure. */
int bindSocket(const std::string& path) {
    SocketAddress address;
    const bool fits = address.setPath(path);
    unlink(path.c_str());
    if (!fits) {
        LOG_LOCATED_ERR("socket path too long [%s]", path.c_str());
        return -1;
    }
    const int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (fd < 0) {
        LOG_LOCATED_ERR("socket failed, %m");
        return -1;
    }
    evutil_make_socket_nonblocking(fd);
    if (bind(fd, address.get(), SocketAddress::SIZE) < 0) {
        LOG_LOCATED_ERR("bind [%s] failed, %m", path.c_str());
        close(fd);
        return -1;
    }
    return fd;
}

/** After a failure the umask stays tightened: what the process makes next is for its group at most. */
bool setSocketAccess(const std::string& path, int mode) {
    if (mode == 0) {
        return true;
    }
    const mode_t oldMask = umask(007);
    if (chmod(path.c_str(), static_cast<mode_t>(mode)) < 0) {
        LOG_LOCATED_ERR("chmod [%s] failed, %m", path.c_str());
        return false;
    }
    if (chown(path.c_str(), SOCKET_USER, SOCKET_GROUP) < 0) {
        LOG_LOCATED_ERR("chown %s failed, uid: [%d], gid: [%d], %m", path.c_str(), static_cast<int>(SOCKET_USER),
                        static_cast<int>(SOCKET_GROUP));
        return false;
    }
    umask(oldMask);
    return true;
}

bool startListening(int listener, event_base* base, ListenContext& context, SetUpEvents& events) {
    if (listen(listener, LISTEN_BACKLOG) < 0) {
        LOG_LOCATED_ERR("listen failed, %m");
        return false;
    }
    if (!events.add(event_new(base, listener, EV_READ | EV_PERSIST, acceptCallback, &context), nullptr)) {
        LOG_LOCATED_ERR("add event failed");
        return false;
    }
    return true;
}

// Timers, signals, folders. A handler is copied before it is called, since it
// may put another one into its own place.

void timeoutCallback(evutil_socket_t, short, void* argument) {
    const std::unique_ptr<TimeoutRecord> record(static_cast<TimeoutRecord*>(argument));
    record->callback(record->argument);
}

void loopCallback(evutil_socket_t, short, void* argument) {
    const CommandServer::LoopHandler handler = static_cast<CommandServerPrivate*>(argument)->loopHandler;
    handler();
}

void addLoopTimer(event_base* base, CommandServerPrivate* priv, SetUpEvents& events) {
    if (!priv->loopHandler.empty()) {
        events.add(event_new(base, -1, EV_PERSIST, loopCallback, priv), &LOOP_INTERVAL);
    }
}

bool endsTheLoop(int signal) {
    return signal == SIGINT || signal == SIGQUIT || signal == SIGABRT || signal == SIGTERM;
}

void signalCallback(evutil_socket_t signal, short, void* argument) {
    auto* const priv = static_cast<CommandServerPrivate*>(argument);
    const auto entry = priv->signalHandlers.find(signal);
    if (entry != priv->signalHandlers.end()) {
        const CommandServer::SignalHandler handler = entry->second;
        handler(signal);
    }
    if (endsTheLoop(signal)) {
        event_base_loopexit(priv->eventBase, nullptr);
    }
}

void addSignals(event_base* base, CommandServerPrivate* priv, SetUpEvents& events) {
    for (const auto& entry : priv->signalHandlers) {
        events.add(event_new(base, entry.first, EV_SIGNAL | EV_PERSIST, signalCallback, priv), nullptr);
    }
}

void inotifyCallback(bufferevent* watch, void* argument) {
    auto* const priv = static_cast<CommandServerPrivate*>(argument);
    char buffer[INOTIFY_BUFFER_SIZE] = {};
    const std::size_t size = bufferevent_read(watch, buffer, sizeof buffer);
    walkInotifyEvents(buffer, size, [priv](inotify_event* event) {
        // An event of no folder of ours (the kernel's queue overflowed, and
        // events are lost for good) finds an empty handler here, whose call
        // ends the loop with an exception: better no daemon than one that
        // believes in backends that are gone.
        priv->watchByDescriptor[event->wd](event);
    });
}

bool addFolderWatches(event_base* base, CommandServerPrivate* priv) {
    if (priv->watchByPath.empty()) {
        return true;
    }
    const int inotify = inotify_init();
    if (inotify < 0) {
        LOG_LOCATED_ERR("inotifiy init failed, %m");
        return false;
    }
    evutil_make_socket_nonblocking(inotify);
    for (const auto& entry : priv->watchByPath) {
        const int descriptor = inotify_add_watch(inotify, entry.first.c_str(), IN_ALL_EVENTS);
        if (descriptor < 0) {
            LOG_LOCATED_ERR("add watch to [%s] failed", entry.first.c_str());
            continue;
        }
        priv->watchByDescriptor[descriptor] = entry.second;
    }
    bufferevent* const watch = bufferevent_socket_new(base, inotify, 0);
    if (watch == nullptr) {
        close(inotify);
        return false;
    }
#if LIBEVENT_VERSION_NUMBER >= 0x02010000
    // The kernel hands out whole events only, so what one wake-up takes is what
    // one callback can walk: nothing is cut, and nothing is left lying.
    bufferevent_set_max_single_read(watch, INOTIFY_BUFFER_SIZE);
#endif
    bufferevent_setcb(watch, inotifyCallback, nullptr, nullptr, priv);
    bufferevent_enable(watch, EV_READ);
    return true;
}

} // namespace

CommandServer::CommandServer() : d(new CommandServerPrivate) {
}

CommandServer::~CommandServer() {
    delete d;
}

bool CommandServer::run(const RequestHandler& handler, const std::string& socketPath, int mode) {
    if (handler.empty() || socketPath.empty()) {
        LOG_LOCATED_ERR("bad param");
        return false;
    }
    event_base* const base = event_base_new();
    if (base == nullptr) {
        LOG_LOCATED_ERR("event_base_new failed");
        return false;
    }
    const int listener = bindSocket(socketPath);
    if (listener < 0) {
        event_base_free(base);
        return false;
    }
    ListenContext context = {this, d};
    SetUpEvents events;
    bool ready = setSocketAccess(socketPath, mode) && startListening(listener, base, context, events);
    if (ready) {
        addLoopTimer(base, d, events);
        addSignals(base, d, events);
        ready = addFolderWatches(base, d);
    }
    if (ready) {
        events.keep();
        d->eventBase = base;
        d->requestHandler = handler;
        event_base_dispatch(base);
    }
    unlink(socketPath.c_str());
    close(listener);
    if (!ready) {
        events.free();
        event_base_free(base);
    }
    return ready;
}

bool CommandServer::setTimeout(const TimeoutHandler& callback, timeval delay, void* argument) {
    auto* const record = new TimeoutRecord{callback, argument};
    // Before the loop runs there is no base. libevent refuses that itself only where it was not built for release.
    event* const timer = d->eventBase != nullptr ? event_new(d->eventBase, -1, 0, timeoutCallback, record) : nullptr;
    if (timer != nullptr && event_add(timer, &delay) == 0) {
        return true;
    }
    LOG_LOCATED_ERR("add timeout event failed");
    if (timer != nullptr) {
        event_free(timer);
    }
    return false;
}

bool CommandServer::setLoopHandler(const LoopHandler& handler) {
    d->loopHandler = handler;
    return true;
}

bool CommandServer::setSignalHandler(int signal, const SignalHandler& handler) {
    d->signalHandlers[signal] = handler;
    return true;
}

bool CommandServer::setWatchFolder(const std::string& path, const WatchHandler& handler) {
    d->watchByPath[path] = handler;
    return true;
}

} // namespace Backup
} // namespace MARU
