#include <marubackup/system_status.h>

namespace MARU {
namespace Backup {

bool System::isRestoreRunningNotQueued(const std::string&) {
    return false;
}

} // namespace Backup
} // namespace MARU
