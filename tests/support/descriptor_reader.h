#pragma once

#include <functional>
#include <future>
#include <thread>

namespace support {

/**
 * Reads from a descriptor in a thread of its own, so that whoever writes there
 * never waits for the test. Owns the descriptor.
 */
class DescriptorReader {
public:
    /**
     * Calls `read`, in the thread, whenever `fd` can be read or is at its end,
     * until it answers false. All signals are left to the other threads.
     */
    DescriptorReader(int fd, std::function<bool()> read);
    ~DescriptorReader();
    DescriptorReader(const DescriptorReader&) = delete;
    DescriptorReader& operator=(const DescriptorReader&) = delete;

private:
    void run();

    int fd;
    int stop;
    std::function<bool()> read;
    std::promise<void> running;
    std::thread thread;
};

} // namespace support
