#pragma once

#include <unistd.h>

#include <utility>

namespace MARU {
namespace Backup {

/** Owns an open descriptor, or none, and closes it in the end. */
class Descriptor {
public:
    explicit Descriptor(int opened = -1) : fd(opened) {
    }
    ~Descriptor() {
        if (fd >= 0) {
            close(fd);
        }
    }
    Descriptor(Descriptor&& other) noexcept : fd(other.release()) {
    }
    Descriptor& operator=(Descriptor&& other) noexcept {
        std::swap(fd, other.fd);
        return *this;
    }

    bool isOpen() const {
        return fd >= 0;
    }
    int get() const {
        return fd;
    }
    /** The caller owns it from now on. */
    int release() {
        return std::exchange(fd, -1);
    }

private:
    int fd;
};

} // namespace Backup
} // namespace MARU
