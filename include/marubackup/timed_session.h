#pragma once

#include <string>

#include <marubackup/export.h>

namespace MARU {
namespace Backup {

class TimedSessionPrivate;

/**
 * A temporary directory that goes away when it has not been used for a lifetime,
 * also if the application that made it has ended by then: the queue daemon sees
 * to it. A session is known by its id, to any process of root's.
 *
 * An object names one session, or none. Its end leaves the session as it is. An
 * object is used by one thread at a time. Nothing throws but a failed
 * allocation.
 */
class MARUBACKUP_API TimedSession {
public:
    /** Where a session is made. */
    enum TempType : int {
        TEMP_DEFAULT = 0,    ///< on the default temporary area
        TEMP_MAX_VOLUME = 1, ///< on the volume with the most free space
    };

    /** Names no session. */
    TimedSession();
    ~TimedSession();
    TimedSession(const TimedSession&) = delete;
    TimedSession& operator=(const TimedSession&) = delete;

    /**
     * Makes a session, which the object names from then on, and has the daemon
     * destroy it when it has not been used for `lifetime` seconds; more than
     * 259200, 72 hours, count as that. With 0 or less that is at once. Blocks
     * until the daemon has answered; see JobController.
     *
     * True if both is done. If no session can be made nothing is asked of the
     * daemon. If the daemon refuses or cannot be reached, that is reported to
     * syslog at LOG_ERR, and the session stays: it is the caller's to destroy.
     *
     * With any other `type` nothing is made, and the daemon is asked for the
     * session that the object names already.
     */
    bool create(TempType type, long lifetime);

    /** Names the session of that id. False, with nothing changed, if there is none. */
    bool load(const std::string& id);

    /** The session's id; empty if the object names none. */
    std::string getId() const;
    /** The session's directory; empty if the object names none. */
    std::string getPath() const;

    /**
     * Removes the session with all that is in its directory; the object names
     * none then. False if it names none, or if something is left.
     */
    bool destroy();

    /**
     * Destroys the session of that id if it has expired, as the daemon does when
     * its timer fires. It expires `lifetime` seconds after its last use: at that
     * very second. That use is the last change to the directory itself (its
     * st_mtime) or, if `walkFiles`, also the last reading of any file below it
     * (st_atime), whichever is later. Files behind symbolic links or on a file
     * system that is mounted inside do not count.
     *
     * Returns how many seconds are left, 0 if the session is gone, also if it
     * was before, and -1 if it cannot be destroyed or is no directory; the
     * reason goes to syslog at LOG_ERR.
     *
     * With `walkFiles` it must not run on two threads at once.
     */
    static long destroyExpired(const std::string& id, long lifetime, bool walkFiles);

private:
    TimedSessionPrivate* d;
};

} // namespace Backup
} // namespace MARU
