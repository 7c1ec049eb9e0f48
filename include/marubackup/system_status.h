#pragma once

#include <string>

#include <marubackup/export.h>
#include <marubackup/job.h>

namespace MARU {
namespace Backup {

/**
 * What is going on in the appliance's backup applications: whether one of them
 * may start its work now, and whether one is at work.
 *
 * The answers join four sources:
 *
 * - the queue daemon's list of jobs, queued and running, asked over its socket.
 *   A daemon that cannot be reached, or gives no list, has no jobs.
 * - the tasks of "@administrators" whose id begins with "confbkp_bkp_", each a
 *   backup of the configuration outside of the queue. One counts while it is not
 *   finished and the process that made it is there, ended and not waited for
 *   included.
 * - the space-build file: whether a storage space is being built. If that cannot
 *   be told, none is.
 * - the tool "/usr/maru/sbin/marusharesnaptool is-restore-running": exit status
 *   1 means that a snapshot of a shared folder is being restored, any other that
 *   none is. A tool that cannot be run, or is ended by a signal, must not keep
 *   backups from starting: none is, and a line in syslog at LOG_ERR says so.
 *
 * An answer is as good as the moment it was given in: what may start now may be
 * refused by the daemon a moment later.
 *
 * Static functions only. Each makes its own connection, so they may be called
 * from several threads at once. Nothing throws; whatever fails turns into one of
 * the answers above. A function that asks the daemon blocks until it has
 * answered, without a time-out; one that runs the tool blocks for as long as the
 * tool takes. The tool is a child of the calling process: where SIGCHLD is
 * ignored, or another thread waits for any child, its answer is lost and it
 * counts as one that cannot be run.
 */
class MARUBACKUP_API System {
public:
    // May it start now? If not, `reason` is why: one of ACTION_BACKUP,
    // ACTION_RESTORE and ACTION_COPY_TO (it runs or is queued),
    // ACTION_SHARE_SNAPSHOT_RESTORE or ACTION_SPACE_BUILD. If it may, `reason`
    // stays as it was.

    /**
     * Whether a backup may start: no storage space is being built, the daemon
     * has no restore, and no snapshot is being restored, looked at in that
     * order up to the first that stands in the way. Other backups do not. Asks
     * the daemon and runs the tool.
     */
    static bool canBackup(Job::Action& reason);
    /**
     * Whether a restore may start: what canBackup() asks, and then that no
     * backup and no copy-to runs or is queued. Asks the daemon up to three
     * times, runs the tool, and looks at the tasks.
     */
    static bool canRestore(Job::Action& reason);
    /** Whether a copy-to may start: the same questions as canRestore(reason). */
    static bool canCopyTo(Job::Action& reason);

    // The same without the reason, with one exception.

    static bool canBackup();
    static bool canRestore();
    /**
     * Not canCopyTo(reason), but canBackup(reason): true also while backups and
     * other copy-tos run or are queued. Applications use it to offer a copy-to
     * that may have to wait.
     */
    static bool canCopyTo();

    // Does it run, or is it queued? `backend` is the one that is asked about;
    // empty for all. Each asks the daemon, unless the function of the next group
    // has said yes already.

    static bool isBackupRunning(const std::string& backend);
    static bool isRestoreRunning(const std::string& backend);
    static bool isCopyToRunning(const std::string& backend);

    // Does it run outside of the queue? None of these asks the daemon or blocks.

    /**
     * Whether the configuration is being backed up, which the backend
     * "configbackup" does. False for every other backend. Looks at the tasks.
     */
    static bool isBackupRunningNotQueued(const std::string& backend);
    /** Always false: no application restores outside of the queue. */
    static bool isRestoreRunningNotQueued(const std::string& backend);
    /** Always false: no application copies outside of the queue. */
    static bool isCopyToRunningNotQueued(const std::string& backend);
};

} // namespace Backup
} // namespace MARU
