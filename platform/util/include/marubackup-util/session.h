#pragma once

#include <string>

#include <boost/shared_ptr.hpp>

#include <marubackup-util/export.h>

namespace MARU {
namespace Backup {

class FilterVolume;
class SessionPrivate;

/**
 * A temporary directory that any process finds by its id, until somebody
 * destroys it. An object names one session or none; its end leaves the session
 * as it is.
 *
 * The directory has mode 0700 and is called "marusession-" and the id. It stands
 * on the default temporary area, which is /tmp, or on a volume. Which one, tells
 * a record: the file /var/run/marusession/<id>, which holds the directory's path
 * and a line end. Sessions belong to root; to other users no id is known.
 *
 * An id is 1 to 64 letters, digits and dashes; those that create() makes cannot
 * be guessed. Anything else names nothing. Nor does a record that is torn, or
 * that names any other path than that of its id's directory on one of those
 * areas: no record can have something else removed.
 *
 * An object is used by one thread at a time; the static functions may be called
 * from several threads and processes at once, for one session too. Nothing
 * throws but a failed allocation.
 */
class MARUBACKUP_UTIL_API Session {
public:
    Session();
    ~Session();
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    // Making and finding. True if there is such a session; the object then names
    // it, and no longer the one that it named before, which stays. When it is
    // false the object is as it was, and nothing new is left on disk.

    /** Makes one on the default temporary area. */
    bool create();
    /** Makes one on the volume that `filter` chooses. False without a filter. */
    bool create(boost::shared_ptr<FilterVolume> filter);
    /** Finds the one of that id; false also if its directory is gone. */
    bool load(const std::string& id);

    /** Its id; empty if the object names no session. */
    std::string getId() const;
    /** Its directory, without a slash at the end; empty if the object names no session. */
    std::string getPath() const;

    /**
     * As destroyById() for the session that the object names, and then it names
     * none. False if it names none or that fails.
     */
    bool destroy();

    /**
     * The directory of the session of that id, whether it is still there or not;
     * empty if there is no record of one.
     */
    static std::string getPathById(const std::string& id);

    /**
     * Removes the session's directory with all that is in it, and then its
     * record. True if both are gone, also if they were before: an id that is
     * well-formed and unknown is a session that was destroyed already. Two
     * processes may do it at once.
     *
     * False if something of it is left, which can be removed by a later call:
     * as much as possible is removed all the same, and the record stays. Nothing
     * outside of the directory is ever touched: links are removed and not
     * followed, and what is mounted inside is left with all that is in it, as is
     * what has replaced the directory itself. False also for an id that is none,
     * for one whose record cannot be used, and while the volume of the session
     * is not mounted.
     */
    static bool destroyById(const std::string& id);

private:
    SessionPrivate* d;
};

} // namespace Backup
} // namespace MARU
