#include "support/line_reader.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "support/waiting.h"

namespace support {

LineReader::LineReader(int pipe) : fd(pipe), stop(eventfd(0, EFD_CLOEXEC)), thread(&LineReader::run, this) {
}

LineReader::~LineReader() {
    eventfd_write(stop, 1);
    thread.join();
    close(stop);
    close(fd);
}

void LineReader::run() {
    char piece[65536];
    while (true) {
        pollfd entries[] = {{fd, POLLIN, 0}, {stop, POLLIN, 0}};
        if (poll(entries, 2, -1) < 0) {
            continue;
        }
        if (entries[1].revents != 0) {
            return;
        }
        const ssize_t size = read(fd, piece, sizeof piece);
        if (size <= 0) {
            return;
        }
        take(std::string(piece, static_cast<std::size_t>(size)));
    }
}

void LineReader::take(const std::string& piece) {
    const std::lock_guard<std::mutex> lock(mutex);
    rest += piece;
    std::size_t start = 0;
    for (std::size_t end = rest.find('\n'); end != std::string::npos; end = rest.find('\n', start)) {
        lines.push_back(rest.substr(start, end - start));
        found.push_back(false);
        start = end + 1;
    }
    rest.erase(0, start);
    arrived.notify_all();
}

std::string LineReader::waitFor(const std::string& what, const std::function<bool(const std::string&)>& matches) {
    std::unique_lock<std::mutex> lock(mutex);
    const auto end = std::chrono::steady_clock::now() + PATIENCE;
    std::size_t at = 0;
    do {
        for (; at < lines.size(); ++at) {
            if (!found[at] && matches(lines[at])) {
                found[at] = true;
                return lines[at];
            }
        }
    } while (arrived.wait_until(lock, end) == std::cv_status::no_timeout);
    std::string everything;
    for (const std::string& line : lines) {
        everything += line + '\n';
    }
    ADD_FAILURE() << "never written: " << what << "\nin:\n" << everything;
    return std::string();
}

std::vector<std::string> LineReader::all() {
    const std::lock_guard<std::mutex> lock(mutex);
    return lines;
}

} // namespace support
