#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <boost/shared_ptr.hpp>

#include <marubackup-util/export.h>

namespace MARU {
namespace Backup {

/**
 * A volume that a session may be made on: a directory /volume<number> that is
 * the root of a mounted file system, and writable.
 */
struct Volume {
    std::string path;        ///< as in "/volume1"
    std::uint64_t freeBytes; ///< for users that are not root
};

/** Chooses the volume for a new session. */
class MARUBACKUP_UTIL_API FilterVolume {
public:
    virtual ~FilterVolume();

    /**
     * Called by Session::create(), on its thread, with the volumes there are in
     * the order of their numbers. Returns the path of one of them, or nothing
     * for the default temporary area; with any other answer no session is made.
     */
    virtual std::string choose(const std::vector<Volume>& volumes) const = 0;
};

/** Where temporary directories go. */
class MARUBACKUP_UTIL_API TempManager {
public:
    /**
     * Chooses the volume with the most free space, of several the first; the
     * default temporary area if there is no volume. Never null.
     */
    static boost::shared_ptr<FilterVolume> maxVolume();
};

} // namespace Backup
} // namespace MARU
