#pragma once

#include <vector>

namespace support {

/**
 * From here on the kernel refuses these system calls (SYS_listen and the like)
 * to the calling process, with `error` as errno: what a machine at its limits,
 * or one with other rights, would answer. It cannot be undone, and is passed on
 * to children and through exec: call it in a child made for the test.
 */
void refuseSystemCalls(const std::vector<long>& numbers, int error);

} // namespace support
