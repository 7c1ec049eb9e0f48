#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <queue>
#include <string>
#include <thread>
#include <vector>

#include "support/socket_peer.h"

namespace support {

/** What the fake daemon does about one request. A text is the payload of its reply. */
struct CannedReply {
    enum End {
        STAY,    ///< replies and goes on
        HANG_UP, ///< replies and closes the connection
        RESET,   ///< closes the connection before the request is read, so that the client's read fails
    };

    CannedReply(const char* replyPayload, End how = STAY) : payload(replyPayload), end(how) {
    }
    CannedReply(const std::string& replyPayload, End how = STAY) : payload(replyPayload), end(how) {
    }

    std::string payload;
    End end;
};

/**
 * A daemon that knows its lines and nothing else: it listens at DAEMON_SOCKET
 * from construction on and answers each request, whatever it is and whichever
 * connection it comes over, with the next of its replies. A request beyond the
 * last one fails the test.
 */
class FakeDaemon {
public:
    explicit FakeDaemon(const std::vector<CannedReply>& replies = {});
    /** Closes all connections and removes the socket. */
    ~FakeDaemon();
    FakeDaemon(const FakeDaemon&) = delete;
    FakeDaemon& operator=(const FakeDaemon&) = delete;

    /** Adds a reply to the end of the list. */
    void addReply(const CannedReply& reply);

    /** The payloads of all requests that were read so far. */
    std::vector<std::string> requests();
    /** How many connections were made so far, those over which nothing came included. */
    int connections();
    /** How many of them neither side has closed. */
    int openConnections();

private:
    struct Connection {
        std::unique_ptr<SocketPeer> peer;
        std::string received; ///< of the frame that is being read
    };

    void run();
    /** The descriptors that the thread waits for: the wake-up call, the listener, the connections. */
    std::vector<int> awaited();
    // Called with the lock held.
    void acceptWaiting();
    bool serve(Connection& connection);
    bool reply(Connection& connection);

    std::mutex mutex;
    std::queue<CannedReply> toCome;
    std::vector<std::string> seen;
    std::map<int, Connection> open;
    int accepted = 0;
    bool ending = false;

    int listener;
    int wakeUp;
    std::thread thread;
};

} // namespace support
