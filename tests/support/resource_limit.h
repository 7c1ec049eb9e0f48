#pragma once

#include <sys/resource.h>

#include <cerrno>
#include <system_error>

namespace support {

/** From here on the calling process gets no more than `most` of something. For children made for a test. */
inline void limitTo(__rlimit_resource resource, rlim_t most) {
    rlimit limit = {};
    getrlimit(resource, &limit);
    limit.rlim_cur = most;
    if (setrlimit(resource, &limit) != 0) {
        throw std::system_error(errno, std::generic_category(), "setrlimit");
    }
}

} // namespace support
