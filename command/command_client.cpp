#include <marubackup/command_client.h>

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "command/frame.h"
#include "command/socket_address.h"
#include "common/log.h"

namespace MARU {
namespace Backup {

struct CommandClientPrivate {
    int fd = -1;
};

namespace {

const char* const LOG_UNIT = "command_client";

bool sendAll(int fd, const void* buffer, std::size_t size) {
    const char* unsent = static_cast<const char*>(buffer);
    while (size > 0) {
        const ssize_t sent = ::send(fd, unsent, size, 0);
        if (sent >= 0) {
            unsent += sent;
            size -= static_cast<std::size_t>(sent);
        } else if (errno == EPIPE) {
            LOG_LOCATED_DEBUG("send failed, %m");
            return false;
        } else if (errno != EINTR) {
            LOG_LOCATED_ERR("send failed, %m");
            return false;
        }
    }
    return true;
}

/**
 * One look for at most `size` bytes; `received` is 0 if there were none. A
 * connection that the daemon has closed counts as one with nothing there yet:
 * an exchange is not given up by itself, applications set a limit around it.
 */
bool recvSome(int fd, void* buffer, std::size_t size, std::size_t& received) {
    const ssize_t result = ::recv(fd, buffer, size, 0);
    received = result > 0 ? static_cast<std::size_t>(result) : 0;
    if (result >= 0 || errno == EINTR) {
        return true;
    }
    if (errno == EPIPE) {
        LOG_LOCATED_DEBUG("recv failed, %m");
    } else {
        LOG_LOCATED_ERR("recv failed, %m");
    }
    return false;
}

bool recvHeader(int fd, FrameHeader& header) {
    std::size_t received = 0;
    for (std::size_t at = 0; at < header.size(); at += received) {
        if (!recvSome(fd, header.data() + at, header.size() - at, received)) {
            return false;
        }
    }
    return true;
}

/** Appends `size` bytes to `payload`, which grows only as they arrive. */
bool recvAll(int fd, std::string& payload, std::size_t size) {
    char buffer[4096] = {};
    while (size > 0) {
        std::size_t received = 0;
        if (!recvSome(fd, buffer, std::min(size, sizeof buffer), received)) {
            return false;
        }
        payload.append(buffer, received);
        size -= received;
    }
    return true;
}

} // namespace

CommandClient::CommandClient() : d(new CommandClientPrivate) {
}

CommandClient::~CommandClient() {
    if (isConnected()) {
        close();
    }
    delete d;
}

bool CommandClient::connect(const std::string& path) {
    SocketAddress address;
    if (!address.setPath(path)) {
        LOG_LOCATED_ERR("addr size not enough");
        return false;
    }
    const int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (fd < 0) {
        LOG_LOCATED_ERR("socket failed: %m");
        return false;
    }
    if (::connect(fd, address.get(), SocketAddress::SIZE) < 0) {
        LOG_LOCATED_DEBUG("connect: %m");
        ::close(fd);
        return false;
    }
    d->fd = fd; // a connection that was open until now is left to the caller
    LOG_LOCATED_DEBUG("connect to [%s]", path.c_str());
    return true;
}

bool CommandClient::isConnected() const {
    return d->fd != -1;
}

void CommandClient::close() {
    if (isConnected()) {
        ::close(d->fd);
        d->fd = -1;
    }
}

std::string CommandClient::send(const std::string& request) {
    FrameHeader header = frameHeader(static_cast<std::uint32_t>(request.size()));
    if (!sendAll(d->fd, header.data(), header.size()) || !sendAll(d->fd, request.data(), request.size())) {
        return std::string();
    }
    std::string reply;
    if (!recvHeader(d->fd, header) || !recvAll(d->fd, reply, frameLength(header))) {
        return std::string();
    }
    return reply;
}

} // namespace Backup
} // namespace MARU
