#pragma once

#include <string>

namespace support {

/**
 * A FIFO that a job waits at, so that a test decides when it goes on. The job
 * reads a line from it: `read line < FIFO`.
 */
class Gate {
public:
    /** Makes the FIFO at `path`. */
    explicit Gate(const std::string& path);
    ~Gate();
    Gate(const Gate&) = delete;
    Gate& operator=(const Gate&) = delete;

    const std::string& path() const {
        return fifo;
    }

    /** Waits until somebody waits at the gate. */
    void awaitJob();
    /** Waits for somebody there, and lets them through. */
    void open();

private:
    std::string fifo;
    int writer = -1;
};

} // namespace support
