#include "support/line_reader.h"

#include <unistd.h>

#include <gtest/gtest.h>

namespace support {

LineReader::LineReader(int pipe) : fd(pipe), reader(pipe, [this]() { return readAvailable(); }) {
}

/** False at the end of the pipe. */
bool LineReader::readAvailable() {
    const std::lock_guard<std::mutex> lock(reading);
    char piece[65536];
    while (waitReadable(fd, std::chrono::milliseconds(0))) {
        const ssize_t size = read(fd, piece, sizeof piece);
        if (size <= 0) {
            return false;
        }
        rest.append(piece, static_cast<std::size_t>(size));
        std::size_t start = 0;
        for (std::size_t end = rest.find('\n'); end != std::string::npos; end = rest.find('\n', start)) {
            lines.put(rest.substr(start, end - start));
            start = end + 1;
        }
        rest.erase(0, start);
    }
    return true;
}

std::string LineReader::waitFor(const std::string& what, const std::function<bool(const std::string&)>& matches) {
    if (const auto line = lines.waitFor(matches)) {
        return *line;
    }
    std::string everything;
    for (const std::string& line : lines.all()) {
        everything += line + '\n';
    }
    ADD_FAILURE() << "never written: " << what << "\nin:\n" << everything;
    return std::string();
}

std::vector<std::string> LineReader::all() {
    readAvailable();
    return lines.all();
}

} // namespace support
