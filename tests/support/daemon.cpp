#include "support/daemon.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <system_error>

#include <gtest/gtest.h>

#include "support/in_child.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

namespace support {

namespace {

/** Returns only if the program cannot be run. */
int becomeDaemon(const DaemonOptions& options, int diary) {
    dup2(diary, STDERR_FILENO);
    if (options.beforeStart) {
        options.beforeStart();
    }
    std::vector<char*> argv = {const_cast<char*>(MARUBACKUPD)};
    for (const std::string& argument : options.arguments) {
        argv.push_back(const_cast<char*>(argument.c_str()));
    }
    argv.push_back(nullptr);
    execv(MARUBACKUPD, argv.data());
    return 126;
}

/** Answered, it has set up everything else too: it listens before it watches its folder. */
bool answers() {
    try {
        SocketPeer().ask("{\"op\":\"job_list\"}");
        return true;
    } catch (const std::system_error&) {
        return false;
    }
}

} // namespace

Daemon::Daemon(const DaemonOptions& options) {
    int diary[2];
    if (pipe2(diary, O_CLOEXEC) != 0) {
        throw std::system_error(errno, std::generic_category(), "pipe");
    }
    child = startInChild([&]() { return becomeDaemon(options, diary[1]); });
    ::close(diary[1]);
    lines = std::make_unique<LineReader>(diary[0]);
    if (options.awaitSocket) {
        EXPECT_TRUE(waitUntil(answers)) << "the daemon does not answer";
    }
}

Daemon::~Daemon() {
    if (child > 0) {
        kill(child, SIGKILL);
        waitForChild(child);
    }
}

void Daemon::waitForLine(const std::string& line) {
    lines->waitFor(line, [&line](const std::string& other) { return other == line; });
}

std::string Daemon::waitForLineStarting(const std::string& start) {
    return lines->waitFor(start, [&start](const std::string& line) { return line.rfind(start, 0) == 0; });
}

int Daemon::countLines(const std::string& line) {
    const std::vector<std::string> all = lines->all();
    return static_cast<int>(std::count(all.begin(), all.end(), line));
}

std::vector<std::string> Daemon::diary() {
    return lines->all();
}

void Daemon::signal(int number) {
    kill(child, number);
}

int Daemon::wait() {
    const int status = waitForChild(child);
    child = -1;
    return status;
}

int Daemon::stop(int number) {
    signal(number);
    return wait();
}

} // namespace support
