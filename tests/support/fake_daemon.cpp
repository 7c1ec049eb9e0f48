#include "support/fake_daemon.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <system_error>

#include <gtest/gtest.h>

namespace support {

namespace {

const std::size_t HEADER_SIZE = 4;

/** The size of the whole frame that starts with `received`, as far as that is known. */
std::size_t frameSize(const std::string& received) {
    if (received.size() < HEADER_SIZE) {
        return HEADER_SIZE;
    }
    std::uint32_t length = 0;
    std::memcpy(&length, received.data(), sizeof length);
    return HEADER_SIZE + ntohl(length);
}

} // namespace

FakeDaemon::FakeDaemon(const std::vector<CannedReply>& replies)
    : listener(listenAt(DAEMON_SOCKET)), wakeUp(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    fcntl(listener, F_SETFL, O_NONBLOCK);
    for (const CannedReply& canned : replies) {
        toCome.push(canned);
    }
    thread = std::thread(&FakeDaemon::run, this);
}

FakeDaemon::~FakeDaemon() {
    {
        const std::lock_guard<std::mutex> lock(mutex);
        ending = true;
    }
    eventfd_write(wakeUp, 1);
    thread.join();
    close(wakeUp);
    close(listener);
    unlink(DAEMON_SOCKET);
}

void FakeDaemon::addReply(const CannedReply& canned) {
    const std::lock_guard<std::mutex> lock(mutex);
    toCome.push(canned);
}

std::vector<std::string> FakeDaemon::requests() {
    const std::lock_guard<std::mutex> lock(mutex);
    return seen;
}

int FakeDaemon::connections() {
    const std::lock_guard<std::mutex> lock(mutex);
    acceptWaiting(); // the thread may not have come to them yet
    eventfd_write(wakeUp, 1);
    return accepted;
}

int FakeDaemon::openConnections() {
    connections();
    const std::lock_guard<std::mutex> lock(mutex);
    return static_cast<int>(open.size());
}

void FakeDaemon::run() {
    while (true) {
        std::vector<pollfd> entries;
        for (const int fd : awaited()) {
            entries.push_back({fd, POLLIN, 0});
        }
        poll(entries.data(), entries.size(), -1);

        const std::lock_guard<std::mutex> lock(mutex);
        if (ending) {
            return;
        }
        eventfd_t calls = 0;
        eventfd_read(wakeUp, &calls);
        acceptWaiting();
        for (const pollfd& entry : entries) {
            const auto connection = open.find(entry.fd);
            if (entry.revents != 0 && connection != open.end() && !serve(connection->second)) {
                open.erase(connection);
            }
        }
    }
}

std::vector<int> FakeDaemon::awaited() {
    const std::lock_guard<std::mutex> lock(mutex);
    std::vector<int> descriptors = {wakeUp, listener};
    for (const auto& [fd, connection] : open) {
        descriptors.push_back(fd);
    }
    return descriptors;
}

void FakeDaemon::acceptWaiting() {
    for (int fd = 0; (fd = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC)) >= 0; ++accepted) {
        open[fd].peer = std::make_unique<SocketPeer>(fd);
    }
}

/** Reads some more of a frame, never beyond its end; false if the connection is over. */
bool FakeDaemon::serve(Connection& connection) {
    const bool headerCame = connection.received.size() >= HEADER_SIZE;
    if (headerCame && !toCome.empty() && toCome.front().end == CannedReply::RESET) {
        toCome.pop();
        return false;
    }
    std::string piece(frameSize(connection.received) - connection.received.size(), '\0');
    const ssize_t size = recv(connection.peer->descriptor(), &piece[0], piece.size(), 0);
    if (size <= 0) {
        return false;
    }
    connection.received.append(piece, 0, static_cast<std::size_t>(size));
    return connection.received.size() < frameSize(connection.received) || reply(connection);
}

/** Answers the frame that has come; false if the connection is over. */
bool FakeDaemon::reply(Connection& connection) {
    const std::string request = connection.received.substr(HEADER_SIZE);
    connection.received.clear();
    seen.push_back(request);
    if (toCome.empty()) {
        ADD_FAILURE() << "a request that nobody reckoned with: " << request;
        return false;
    }
    const CannedReply canned = toCome.front();
    toCome.pop();
    try {
        connection.peer->write(frame(canned.payload));
    } catch (const std::system_error&) {
        return false; // the client is gone
    }
    return canned.end == CannedReply::STAY;
}

} // namespace support
