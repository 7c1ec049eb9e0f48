#include "support/syslog_socket.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <system_error>

#include <gtest/gtest.h>

#include "support/waiting.h"

namespace support {

namespace {

const char* const LOG_SOCKET = "/dev/log";

/** "<priority>Mon dd hh:mm:ss ident: message", the ident perhaps with "[pid]". */
SyslogLine parseLine(const std::string& datagram) {
    SyslogLine line;
    const std::size_t priorityEnd = datagram.find('>');
    const std::size_t ident = priorityEnd + 1 + 16;
    const std::size_t identEnd = datagram.find(": ", ident);
    if (priorityEnd == std::string::npos || identEnd == std::string::npos) {
        ADD_FAILURE() << "not a syslog line: " << datagram;
        return line;
    }
    const int priority = std::atoi(datagram.c_str() + 1);
    line.priority = LOG_PRI(priority);
    line.facility = priority & LOG_FACMASK;
    line.ident = datagram.substr(ident, identEnd - ident);
    line.message = datagram.substr(identEnd + 2);
    return line;
}

int bindLogSocket() {
    const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, LOG_SOCKET);
    if (fd < 0 || bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) < 0) {
        throw std::system_error(errno, std::generic_category(), LOG_SOCKET);
    }
    return fd;
}

} // namespace

LocatedMessage parseLocated(const std::string& message) {
    LocatedMessage result;
    char level[8] = {};
    char unit[32] = {};
    int textAt = -1;
    const int read =
        std::sscanf(message.c_str(), "(%d) [%7[a-z]] %31[^ :]:%d%n", &result.pid, level, unit, &result.line, &textAt);
    const auto at = static_cast<std::size_t>(textAt);
    if (read == 4 && textAt > 0 && at < message.size() && message[at] == ' ') {
        result.located = true;
        result.level = level;
        result.unit = unit;
        result.text = message.substr(at + 1);
    }
    return result;
}

SyslogSocket::SyslogSocket()
    : fd(bindLogSocket()), reader(fd, [this]() {
          const std::unique_lock<std::mutex> lock(receiving, std::try_to_lock);
          if (lock) { // not on hold
              receive();
          }
          return true;
      }) {
    closelog(); // this process may have found no socket before
}

SyslogSocket::~SyslogSocket() {
    unlink(LOG_SOCKET);
}

void SyslogSocket::receive() {
    static thread_local std::string datagram(1 << 18, '\0');
    while (true) {
        const ssize_t size = recv(fd, &datagram[0], datagram.size(), MSG_DONTWAIT);
        if (size < 0) {
            return;
        }
        received.put(parseLine(datagram.substr(0, static_cast<std::size_t>(size))));
    }
}

std::vector<SyslogLine> SyslogSocket::lines() {
    const std::lock_guard<std::mutex> lock(receiving);
    receive();
    return received.all();
}

SyslogLine SyslogSocket::waitFor(const std::string& text) {
    const auto line =
        received.waitFor([&text](const SyslogLine& one) { return one.message.find(text) != std::string::npos; });
    if (!line) {
        ADD_FAILURE() << "never logged: " << text;
        return SyslogLine();
    }
    return *line;
}

int SyslogSocket::count(const std::string& text) {
    const std::vector<SyslogLine> all = lines();
    return static_cast<int>(std::count_if(all.begin(), all.end(), [&text](const SyslogLine& line) {
        return line.message.find(text) != std::string::npos;
    }));
}

std::unique_lock<std::mutex> SyslogSocket::hold() {
    return std::unique_lock<std::mutex>(receiving);
}

void expectLocated(SyslogSocket& log, int priority, int pid, const std::string& unit, const std::string& text) {
    const SyslogLine line = log.waitFor(text);
    const LocatedMessage message = parseLocated(line.message);
    EXPECT_TRUE(message.located) << line.message;
    EXPECT_EQ(priority, line.priority) << line.message;
    EXPECT_EQ(pid, message.pid) << line.message;
    EXPECT_EQ(priority == LOG_DEBUG ? "debug" : "err", message.level);
    EXPECT_EQ(unit, message.unit);
    EXPECT_GT(message.line, 0);
    EXPECT_EQ(text, message.text);
}

} // namespace support
