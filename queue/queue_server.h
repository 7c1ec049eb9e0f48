#pragma once

#include <sys/time.h>

#include <string>

#include "queue/job_queues.h"

namespace MARU {
namespace Backup {

class CommandServer;
class Job;

// Scheduling and supervision of the jobs in the store, and what the timers do.

/** Starts whatever may be started now. Always true. */
bool queue_scan_next_to_launch();

/**
 * Starts jobs of one queue, front first, until `limit` of them have a process.
 * Jobs that cannot be started, or that have an impossible status, are erased.
 * `busy` says afterwards whether any job of the queue has a process; it is left
 * alone if there is no such queue. Always true.
 */
bool queue_launch_next_job(const std::string& queueName, bool& busy, int limit);

/** Starts one job's process and marks the job running. False if there is none. */
bool do_launch_job(Job& job);

/**
 * Looks at every job's process without waiting for it; jobs whose process has
 * ended leave the store. `tag` names the caller in the diary. Always true.
 */
bool queue_check_children_status(const char* tag);

/**
 * Whether the job leaves the store now that `reaped` is what waitpid() returned
 * for its process, and `status` what it stored. Writes how the process ended.
 */
bool jobHasEnded(const Job& job, pid_t reaped, int status);

/**
 * Signals one job, as a callback of queue_foreach_job(). `arg` is null for
 * SIGTERM, or points at an int, the signal. A job without a process is removed.
 */
QueueIterControl sendSignalCb(const std::string& queueName, Job& job, bool& removeJob, void* arg);

/**
 * Stops every job: SIGTERM, up to five waits of one second each, and SIGKILL
 * for those that are still there. Always true.
 */
bool queue_kill_all_job();

/** A session that is to be cleaned up. It belongs to its timer. */
struct CleanSessionContext {
    std::string sessionId;
    long lifetime; ///< seconds
    CommandServer* server;
};

/**
 * Destroys a session if it has expired, and otherwise has itself called again
 * when it will have. `context` points at a CleanSessionContext, which is freed
 * unless there is another call to come, or one that could not be arranged.
 */
void cleanSessionTimeout(void* context);

/** The delay that a timer takes for that many seconds: none for what is past. */
timeval delayOfSeconds(long seconds);

} // namespace Backup
} // namespace MARU
