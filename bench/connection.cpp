#include "connection.h"

#include <arpa/inet.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace bench {

namespace {

const std::size_t FIRST_BUFFER = 65536;
const std::size_t HEADER = 4;
const std::string_view LINE_END = "\r\n";

[[noreturn]] void fail(const std::string& what) {
    throw std::system_error(errno, std::generic_category(), what);
}

} // namespace

std::string frame(const std::string& payload) {
    const std::uint32_t length = htonl(static_cast<std::uint32_t>(payload.size()));
    return std::string(reinterpret_cast<const char*>(&length), sizeof length) + payload;
}

Connection::Connection(const std::string& path, Wire form)
    : fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)), wire(form), buffer(FIRST_BUFFER) {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    if (fd < 0 || connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0) {
        fail("connect " + path);
    }
}

Connection::~Connection() {
    if (fd >= 0) {
        close(fd);
    }
}

Connection::Connection(Connection&& other) noexcept
    : fd(std::exchange(other.fd, -1)), wire(other.wire), buffer(std::move(other.buffer)), begin(other.begin),
      end(other.end) {
}

void Connection::send(const std::string& bytes) {
    for (std::size_t at = 0; at < bytes.size();) {
        const ssize_t sent = ::send(fd, bytes.data() + at, bytes.size() - at, MSG_NOSIGNAL);
        if (sent < 0) {
            fail("send");
        }
        at += static_cast<std::size_t>(sent);
    }
}

std::string_view Connection::unread() const {
    return {buffer.data() + begin, end - begin};
}

std::size_t Connection::replySize() const {
    const std::string_view text = unread();
    if (wire == Wire::FRAMES) {
        std::uint32_t length = 0;
        if (text.size() < HEADER) {
            return 0;
        }
        std::memcpy(&length, text.data(), sizeof length);
        return HEADER + ntohl(length);
    }
    const std::size_t line = text.find(LINE_END);
    if (line == std::string_view::npos) {
        return 0;
    }
    const std::size_t body = text.substr(0, 6) == "FOUND " ? text.rfind(' ', line) : line;
    return line + LINE_END.size() + (body < line ? std::strtoul(text.data() + body, nullptr, 10) + LINE_END.size() : 0);
}

void Connection::readMore(std::size_t wanted) {
    if (begin > 0) {
        std::copy(buffer.begin() + static_cast<std::ptrdiff_t>(begin),
                  buffer.begin() + static_cast<std::ptrdiff_t>(end), buffer.begin());
        end -= begin;
        begin = 0;
    }
    if (std::max(wanted, end + 1) > buffer.size()) {
        buffer.resize(std::max(wanted, 2 * buffer.size()));
    }
    const ssize_t got = recv(fd, buffer.data() + end, buffer.size() - end, 0);
    if (got < 0) {
        fail("recv");
    }
    if (got == 0) {
        throw std::runtime_error("the connection was closed");
    }
    end += static_cast<std::size_t>(got);
}

std::string_view Connection::receive() {
    std::size_t size = replySize();
    while (size == 0 || unread().size() < size) {
        readMore(size);
        size = replySize();
    }
    const std::size_t skipped = wire == Wire::FRAMES ? HEADER : 0;
    const std::string_view reply = unread().substr(skipped, size - skipped);
    begin += size;
    if (begin == end) {
        begin = end = 0;
    }
    return reply;
}

} // namespace bench
