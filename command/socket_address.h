#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include <cstdio>
#include <string>

namespace MARU {
namespace Backup {

/** The address of a Unix socket. It is always passed to the kernel in its whole length. */
struct SocketAddress {
    sockaddr_un un = {};

    /** False if `path` is longer than the 107 characters that an address holds. */
    bool setPath(const std::string& path) {
        un.sun_family = AF_UNIX;
        const int length = std::snprintf(un.sun_path, sizeof un.sun_path, "%s", path.c_str());
        return length >= 0 && static_cast<std::size_t>(length) < sizeof un.sun_path;
    }

    const sockaddr* get() const {
        return reinterpret_cast<const sockaddr*>(&un);
    }

    static constexpr socklen_t SIZE = sizeof(sockaddr_un);
};

} // namespace Backup
} // namespace MARU
