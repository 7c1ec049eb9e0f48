#pragma once

#include <grp.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

namespace support {

/**
 * Takes root's rights from the calling process for good, real ids included:
 * call it in a child made for the test. Whatever the child is to log it logs
 * through a connection made before (openlog() with LOG_NDELAY), since the
 * sandbox's /dev/log is root's.
 */
inline void becomeNobody() {
    const uid_t nobody = 65534;
    if (setgroups(0, nullptr) != 0 || setresgid(nobody, nobody, nobody) != 0 ||
        setresuid(nobody, nobody, nobody) != 0) {
        throw std::system_error(errno, std::generic_category(), "become nobody");
    }
}

} // namespace support
