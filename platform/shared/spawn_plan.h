#pragma once

#include <signal.h>
#include <spawn.h>
#include <unistd.h>

#include <cstring>

/** The first descriptor that a program does not get. */
const int FIRST_OTHER_DESCRIPTOR = STDERR_FILENO + 1;

/**
 * What posix_spawn() does in the child between its start and the program. Each
 * operation returns 0, or an error number.
 */
class SpawnPlan {
public:
    SpawnPlan() {
        posix_spawn_file_actions_init(&actions);
        posix_spawnattr_init(&attributes);
    }
    ~SpawnPlan() {
        posix_spawnattr_destroy(&attributes);
        posix_spawn_file_actions_destroy(&actions);
    }
    SpawnPlan(const SpawnPlan&) = delete;
    SpawnPlan& operator=(const SpawnPlan&) = delete;

    /** Signals as they are by default; and what else the flags say. */
    int resetSignals(short otherFlags = 0) {
        // sigfillset() leaves out the two signals that glibc keeps to itself,
        // and posix_spawn() would have the program start with those ignored.
        sigset_t all;
        std::memset(&all, 0xff, sizeof all);
        sigset_t none;
        sigemptyset(&none);
        posix_spawnattr_setsigdefault(&attributes, &all);
        posix_spawnattr_setsigmask(&attributes, &none);
        const int flags = POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK | otherFlags;
        return posix_spawnattr_setflags(&attributes, static_cast<short>(flags));
    }

    /** Closes all descriptors but 0, 1 and 2; after whatever else is done to descriptors. */
    int closeOtherDescriptors() {
        return posix_spawn_file_actions_addclosefrom_np(&actions, FIRST_OTHER_DESCRIPTOR);
    }

    posix_spawn_file_actions_t actions;
    posix_spawnattr_t attributes;
};
