#pragma once

#include <functional>
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

    // Between these calls no reader of the process has a thread, so that what
    // is forked there comes from a process of a single one: in any other the
    // thread sanitizer no longer delivers signals. What arrives meanwhile is
    // read afterwards. The child has no readers.

    static void pauseAll();
    static void resumeAll();
    static void forgetAll();

private:
    void start();
    void end();
    void run();

    int fd;
    int stop;
    std::function<bool()> read;
    std::thread thread;
};

} // namespace support
