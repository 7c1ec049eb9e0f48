#include "support/syslog_socket.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <regex>
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

} // namespace

LocatedMessage parseLocated(const std::string& message) {
    static const std::regex form(R"(^\((\d+)\) \[(err|debug)\] ([^ :]+):(\d+) ([^]*)$)");
    LocatedMessage result;
    std::smatch parts;
    if (std::regex_match(message, parts, form)) {
        result.located = true;
        result.pid = std::stoi(parts[1]);
        result.level = parts[2];
        result.unit = parts[3];
        result.line = std::stoi(parts[4]);
        result.text = parts[5];
    }
    return result;
}

SyslogSocket::SyslogSocket() : fd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    std::copy_n(LOG_SOCKET, sizeof "/dev/log", address.sun_path);
    if (fd < 0 || bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) < 0) {
        throw std::system_error(errno, std::generic_category(), LOG_SOCKET);
    }
    const int room = 4 << 20;
    setsockopt(fd, SOL_SOCKET, SO_RCVBUFFORCE, &room, sizeof room);
    closelog(); // this process may have found no socket before
}

SyslogSocket::~SyslogSocket() {
    close(fd);
    unlink(LOG_SOCKET);
}

void SyslogSocket::receive() {
    std::string datagram(1 << 20, '\0');
    while (true) {
        const ssize_t size = recv(fd, &datagram[0], datagram.size(), MSG_DONTWAIT);
        if (size < 0) {
            return;
        }
        received.push_back(parseLine(datagram.substr(0, static_cast<std::size_t>(size))));
        found.push_back(false);
    }
}

const std::vector<SyslogLine>& SyslogSocket::lines() {
    receive();
    return received;
}

SyslogLine SyslogSocket::waitFor(const std::string& text) {
    do {
        receive();
        for (std::size_t at = 0; at < received.size(); ++at) {
            if (!found[at] && received[at].message.find(text) != std::string::npos) {
                found[at] = true;
                return received[at];
            }
        }
    } while (waitReadable(fd));
    ADD_FAILURE() << "never logged: " << text;
    return SyslogLine();
}

int SyslogSocket::count(const std::string& text) {
    receive();
    return static_cast<int>(std::count_if(received.begin(), received.end(), [&text](const SyslogLine& line) {
        return line.message.find(text) != std::string::npos;
    }));
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
