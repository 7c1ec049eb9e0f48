#pragma once

#include <string>
#include <vector>

#include <marubackup-util/temp_manager.h>

namespace MARU {
namespace Backup {

// The places that sessions stand on.

constexpr char DEFAULT_AREA[] = "/tmp";

/** Whether sessions may ever stand on `path`: the default area or what is named like a volume. */
bool isArea(const std::string& path);

/** Whether `path` is there now: a volume that is not mounted has an empty directory in its place. */
bool isAreaPresent(const std::string& path);

/** The volumes that can be written to, in the order of their numbers. */
std::vector<Volume> writableVolumes();

} // namespace Backup
} // namespace MARU
