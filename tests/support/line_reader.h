#pragma once

#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "support/descriptor_reader.h"
#include "support/inbox.h"

namespace support {

/** Collects the lines that come out of a pipe, as they come. Owns the descriptor. */
class LineReader {
public:
    explicit LineReader(int fd);

    /**
     * Waits for a line that `matches` and that was not found by an earlier
     * call. Fails the test with `what`, and returns an empty line, if none
     * comes.
     */
    std::string waitFor(const std::string& what, const std::function<bool(const std::string&)>& matches);
    /** All lines that were written before the call. */
    std::vector<std::string> all();

private:
    bool readAvailable();

    int fd;
    std::mutex reading; ///< the reader takes lines as they come, and all() those that it has not taken yet
    std::string rest;   ///< of a line that is not complete yet
    Inbox<std::string> lines;
    DescriptorReader reader; // the last, so that all else is there while it runs
};

} // namespace support
