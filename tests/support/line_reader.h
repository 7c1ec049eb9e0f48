#pragma once

#include <condition_variable>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace support {

/**
 * Collects the lines that come out of a pipe, as they come, so that whoever
 * writes them never waits for the test. Owns the descriptor.
 */
class LineReader {
public:
    explicit LineReader(int fd);
    ~LineReader();
    LineReader(const LineReader&) = delete;
    LineReader& operator=(const LineReader&) = delete;

    /**
     * Waits for a line that `matches` and that was not found by an earlier
     * call. Fails the test with `what`, and returns an empty line, if none
     * comes.
     */
    std::string waitFor(const std::string& what, const std::function<bool(const std::string&)>& matches);
    /** All lines so far. */
    std::vector<std::string> all();

private:
    void run();
    void take(const std::string& piece);

    int fd;
    int stop;
    std::mutex mutex;
    std::condition_variable arrived;
    std::string rest;
    std::vector<std::string> lines;
    std::vector<bool> found;
    std::thread thread;
};

} // namespace support
