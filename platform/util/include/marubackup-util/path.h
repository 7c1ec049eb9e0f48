#pragma once

#include <string>

#include <marubackup-util/export.h>

namespace MARU {
namespace Backup {

/** Names of files. */
class MARUBACKUP_UTIL_API Path {
public:
    /**
     * `name` inside `folder`, with exactly one slash between them. Nothing else
     * is changed, and the disk is not looked at. An empty part adds nothing.
     */
    static std::string join(const std::string& folder, const std::string& name);
};

} // namespace Backup
} // namespace MARU
