#pragma once

namespace support {

/**
 * The program is one of another processor's, under an emulator of user programs,
 * which answers some of the kernel's part itself: it shows its own memory, threads,
 * descriptors and signal handlers where the program's are asked for, does not let
 * filters for system calls through, and knows no requests of a file system's own.
 */
bool isEmulated();

// What several tests ask for in vain there.

const char* const SPAWN_ERRORS = "posix_spawn() says nothing of a program that cannot be run";
const char* const REFUSED_CALLS = "system calls cannot be refused";

} // namespace support

/** Skips a test that asks for what no emulator shows; `what` says for what, as in "the process's signal masks". */
#define SKIP_IF_EMULATED(what)                  \
    if (support::isEmulated()) {                \
        GTEST_SKIP() << "emulated: " << (what); \
    }                                           \
    static_assert(true, "")
