#pragma once

#include <sys/types.h>

#include <cstddef>
#include <vector>

/** What a process sleeps in. */
struct BlockedCall {
    long number = -1;     ///< as in SYS_recvfrom; -1 for a process that does not sleep
    std::size_t size = 0; ///< its third argument, which is the size in calls that read or write
};

/** What `pid` sleeps in at this moment. */
BlockedCall blockedCall(pid_t pid);

/** Waits until `pid` sleeps in one of these system calls; false if it never does. */
bool waitUntilBlockedIn(pid_t pid, const std::vector<long>& numbers);

/**
 * Waits until the event loop in `pid` has done what there is to do, and sleeps.
 * What was written to it before counts: a write wakes its reader before it
 * returns.
 */
bool waitUntilLoopSleeps(pid_t pid);

/** How often `pid` has gone to sleep so far. */
long timesSlept(pid_t pid);
