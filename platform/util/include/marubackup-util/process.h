#pragma once

#include <marubackup-util/export.h>

namespace MARU {
namespace Backup {

/** What the kernel knows of a process. No pid below 1 is ever a process. */
class MARUBACKUP_UTIL_API Process {
public:
    /**
     * Whether there is a process with this id, also one that we may not signal,
     * and also one that has ended and was not waited for yet.
     */
    static bool isAlive(int pid);
    /** Whether that process has ended and was not waited for yet. */
    static bool isZombie(int pid);
};

} // namespace Backup
} // namespace MARU
