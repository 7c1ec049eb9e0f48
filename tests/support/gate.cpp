#include "support/gate.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

#include <gtest/gtest.h>

#include "support/waiting.h"

namespace support {

Gate::Gate(const std::string& path) : fifo(path) {
    if (mkfifo(path.c_str(), 0600) != 0) {
        throw std::system_error(errno, std::generic_category(), "mkfifo " + path);
    }
}

Gate::~Gate() {
    if (writer >= 0) {
        close(writer);
    }
}

void Gate::awaitJob() {
    // Without a reader such an open is refused.
    const bool came = waitUntil([this]() {
        if (writer < 0) {
            writer = ::open(fifo.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC);
        }
        return writer >= 0;
    });
    EXPECT_TRUE(came) << "no job waits at " << fifo;
}

void Gate::open() {
    awaitJob();
    EXPECT_EQ(1, write(writer, "\n", 1));
    close(writer);
    writer = -1;
}

} // namespace support
