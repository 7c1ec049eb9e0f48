#pragma once

#include <ctime>

namespace bench {

/** The monotonic clock, which is the same in all processes, in nanoseconds. */
inline long long now() {
    timespec time = {};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return time.tv_sec * 1000000000LL + time.tv_nsec;
}

} // namespace bench
