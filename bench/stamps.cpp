#include "stamps.h"

#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>
#include <system_error>

namespace bench {

namespace {

const int PATIENCE_MS = 60000;

} // namespace

// Open for writing too, so that the FIFO never ends between two stamps.
Stamps::Stamps(const std::string& fifo) : fd(open(fifo.c_str(), O_RDWR | O_CLOEXEC)) {
    if (fd < 0) {
        throw std::system_error(errno, std::generic_category(), "open " + fifo);
    }
}

Stamps::~Stamps() {
    close(fd);
}

StampRecord Stamps::next() {
    StampRecord record = {};
    pollfd entry = {fd, POLLIN, 0};
    if (poll(&entry, 1, PATIENCE_MS) != 1 || read(fd, &record, sizeof record) != static_cast<ssize_t>(sizeof record)) {
        throw std::runtime_error("the job did not run");
    }
    return record;
}

} // namespace bench
