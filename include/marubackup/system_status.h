#pragma once

#include <string>

#include <marubackup/export.h>

namespace MARU {
namespace Backup {

/**
 * What is going on in the appliance's backup applications. Static functions
 * only; each may be called from several threads at once, and none throws.
 */
class MARUBACKUP_API System {
public:
    /**
     * Whether a restore of `backend` (all backends when empty) runs outside the
     * queue daemon. No application restores outside it: always false.
     */
    static bool isRestoreRunningNotQueued(const std::string& backend);
};

} // namespace Backup
} // namespace MARU
