#include "support/socket_peer.h"

#include <arpa/inet.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <system_error>

#include <gtest/gtest.h>

#include "support/waiting.h"

namespace support {

namespace {

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    return address;
}

int newSocket() {
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        throw std::system_error(errno, std::generic_category(), "socket");
    }
    return fd;
}

} // namespace

std::string frame(const std::string& payload) {
    const std::uint32_t length = htonl(static_cast<std::uint32_t>(payload.size()));
    return std::string(reinterpret_cast<const char*>(&length), sizeof length) + payload;
}

SocketPeer::SocketPeer(const std::string& path) : fd(newSocket()) {
    const sockaddr_un address = addressOf(path);
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0) {
        const int error = errno;
        ::close(fd);
        throw std::system_error(error, std::generic_category(), "connect " + path);
    }
}

SocketPeer::SocketPeer(int connected) : fd(connected) {
}

SocketPeer::~SocketPeer() {
    close();
}

void SocketPeer::write(const std::string& bytes) {
    for (std::size_t at = 0; at < bytes.size();) {
        const ssize_t sent = send(fd, bytes.data() + at, bytes.size() - at, MSG_NOSIGNAL);
        if (sent < 0 && errno != EINTR) {
            throw std::system_error(errno, std::generic_category(), "send");
        }
        at += sent > 0 ? static_cast<std::size_t>(sent) : 0;
    }
}

std::string SocketPeer::read(std::size_t size) {
    std::string bytes;
    char piece[65536];
    while (bytes.size() < size) {
        if (!waitReadable(fd)) {
            ADD_FAILURE() << "no answer: " << bytes.size() << " of " << size << " bytes came";
            break;
        }
        const ssize_t got = recv(fd, piece, std::min(sizeof piece, size - bytes.size()), 0);
        if (got <= 0) {
            break;
        }
        bytes.append(piece, static_cast<std::size_t>(got));
    }
    return bytes;
}

std::string SocketPeer::readFrame() {
    const std::string header = read(4);
    if (header.size() < 4) {
        ADD_FAILURE() << "the connection ended before a frame";
        return std::string();
    }
    std::uint32_t length = 0;
    std::memcpy(&length, header.data(), sizeof length);
    return read(ntohl(length));
}

std::string SocketPeer::ask(const std::string& payload) {
    write(frame(payload));
    return readFrame();
}

bool SocketPeer::isClosed() {
    char byte = 0;
    return waitReadable(fd) && recv(fd, &byte, 1, MSG_PEEK) <= 0;
}

bool SocketPeer::staysSilent() {
    return !waitReadable(fd, GLANCE);
}

void SocketPeer::close() {
    if (fd >= 0) {
        ::close(fd);
        fd = -1;
    }
}

int listenAt(const std::string& path) {
    const int fd = newSocket();
    const sockaddr_un address = addressOf(path);
    if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0 || listen(fd, 16) < 0) {
        const int error = errno;
        ::close(fd);
        throw std::system_error(error, std::generic_category(), "listen " + path);
    }
    return fd;
}

} // namespace support
