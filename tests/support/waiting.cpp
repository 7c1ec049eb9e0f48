#include "support/waiting.h"

#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <filesystem>
#include <iterator>
#include <sstream>
#include <system_error>
#include <thread>

#include "support/files.h"

namespace support {

using Clock = std::chrono::steady_clock;

bool waitReadable(int fd, std::chrono::milliseconds limit) {
    const auto end = Clock::now() + limit;
    while (true) {
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - Clock::now());
        pollfd entry = {fd, POLLIN, 0};
        const int ready = poll(&entry, 1, left.count() > 0 ? static_cast<int>(left.count()) : 0);
        if (ready >= 0) {
            return ready > 0;
        }
        if (errno != EINTR) {
            throw std::system_error(errno, std::generic_category(), "poll");
        }
    }
}

bool waitUntil(const std::function<bool()>& condition) {
    const auto end = Clock::now() + PATIENCE;
    while (!condition()) {
        if (Clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return true;
}

bool isGone(int pid) {
    return kill(pid, 0) != 0;
}

std::chrono::milliseconds cpuTime(int pid) {
    const std::string stat = readFile("/proc/" + std::to_string(pid) + "/stat");
    std::istringstream fields(stat.substr(stat.rfind(')') + 2));
    std::string skipped;
    for (int field = 3; field < 14; ++field) {
        fields >> skipped;
    }
    long user = 0;
    long kernel = 0;
    fields >> user >> kernel;
    return std::chrono::milliseconds((user + kernel) * 1000 / sysconf(_SC_CLK_TCK));
}

int openDescriptors(int pid) {
    const std::filesystem::directory_iterator open("/proc/" + std::to_string(pid) + "/fd");
    return static_cast<int>(std::distance(begin(open), end(open)));
}

} // namespace support
