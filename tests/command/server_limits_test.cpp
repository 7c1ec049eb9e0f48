#include <fcntl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <string>
#include <vector>

#include "server_process.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using MARU::Backup::CommandServer;
using support::expectLocated;
using support::frame;
using support::SocketPeer;

using CommandServerLimits = ServerTest;

namespace {

const rlim_t SOME_DESCRIPTORS = 64;
const int HIGHEST_SERVED = 1024;

void limitDescriptors(rlim_t number) {
    rlimit limit = {};
    getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = number;
    if (setrlimit(RLIMIT_NOFILE, &limit) != 0) {
        report("cannot have so many descriptors");
    }
}

std::vector<int> taken;

/** Takes every free descriptor up to `last`, or as many as there are. */
void takeDescriptors(int last) {
    int fd = 0;
    do {
        fd = open("/dev/null", O_RDONLY);
        if (fd >= 0) {
            taken.push_back(fd);
        }
    } while (fd >= 0 && fd < last);
}

void giveDescriptorsBack() {
    for (const int fd : taken) {
        close(fd);
    }
    taken.clear();
}

/** Lets its process run out of descriptors, or have them back, as the client says. */
std::string takeOrGiveBack(const char* payload, unsigned int length, CommandServer*) {
    const std::string request(payload, length);
    if (request == "take all") {
        takeDescriptors(INT32_MAX);
    } else if (request == "take all below the highest served") {
        takeDescriptors(HIGHEST_SERVED - 1);
    } else if (request == "give back") {
        giveDescriptorsBack();
    }
    return request;
}

ServerOptions withDescriptors(rlim_t number) {
    ServerOptions options;
    options.handler = takeOrGiveBack;
    options.setUp = [number](CommandServer&) { limitDescriptors(number); };
    return options;
}

/** A connection that is made at once, or -1 with errno. */
int connectAtOnce(const std::string& path) {
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) {
        return fd;
    }
    const int error = errno;
    close(fd);
    errno = error;
    return -1;
}

} // namespace

TEST_F(CommandServerLimits, ServeTheDescriptor1024AndCloseThoseAboveItAtOnce) {
    ServerProcess server(path, withDescriptors(HIGHEST_SERVED + 100));
    SocketPeer control(path);
    control.ask("take all below the highest served");

    SocketPeer last(path);
    EXPECT_EQ("served", last.ask("served"));
    SocketPeer above(path);
    EXPECT_TRUE(above.isClosed());
    SocketPeer further(path);
    EXPECT_TRUE(further.isClosed());

    EXPECT_EQ("still served", last.ask("still served"));
    last.close();
    EXPECT_TRUE(support::waitUntil([&]() { return SocketPeer(path).staysSilent(); })) << "1024 did not come free";
    EXPECT_TRUE(log.lines().empty());
    EXPECT_TRUE(server.reports().empty());
}

TEST_F(CommandServerLimits, AreOutlivedWhenThereAreNoMoreDescriptors) {
    ServerProcess server(path, withDescriptors(SOME_DESCRIPTORS));
    SocketPeer control(path);
    control.ask("take all");

    SocketPeer waiting(path);
    waiting.write(frame("served at last"));
    expectLocated(log, LOG_ERR, server.pid(), "command_server", "accept failed: Too many open files");
    control.write(frame("give back"));

    // It goes on reporting, and waits for whoever reads the reports.
    EXPECT_TRUE(support::waitUntil([&]() {
        log.lines();
        return support::waitReadable(waiting.descriptor(), std::chrono::milliseconds(0));
    }));
    EXPECT_EQ("served at last", waiting.readFrame());
    EXPECT_EQ("give back", control.readFrame());
    EXPECT_EQ("another", server.ask("another"));
}

TEST_F(CommandServerLimits, HoldSixteenConnectionsThatWaitToBeAccepted) {
    ServerProcess server(path);
    std::vector<int> connections;
    server.signal(SIGSTOP);

    for (int fd = connectAtOnce(path); fd >= 0; fd = connectAtOnce(path)) {
        connections.push_back(fd);
    }
    EXPECT_EQ(EAGAIN, errno);

    EXPECT_EQ(17U, connections.size()); // Linux lets one more in than it is told
    server.signal(SIGCONT);
    EXPECT_EQ("served", server.ask("served"));
    for (const int fd : connections) {
        close(fd);
    }
}
