#pragma once

#include <string>

namespace MARU {
namespace Backup {

/**
 * Removes the directory `name` of the open directory `folder`, with all that is
 * in it. True if it is gone. What cannot be removed does not keep the rest.
 *
 * Links are removed and never followed, whatever is swapped for what meanwhile.
 * Nothing is entered onto which something is mounted, nor, if it is no
 * directory, is `name` itself touched. A tree may be of any depth.
 */
bool removeTree(int folder, const std::string& name);

} // namespace Backup
} // namespace MARU
