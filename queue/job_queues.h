#pragma once

#include <map>
#include <string>

#include <boost/function.hpp>

#include <marubackup/job.h>

#include "queue/job_queue.h"

namespace MARU {
namespace Backup {

// The daemon's store: every admitted job, in the queue of its action. It lives
// in memory only, and on the daemon's one thread; nothing is locked.

/**
 * The queues by name, which is action2str() of their jobs. A queue holds its
 * jobs in the order of their arrival; once there it stays, also when empty.
 */
extern std::map<std::string, JobQueue> jobQueues;

/** The id of the next job. Ids begin at 1 with each start of the daemon. */
extern int nextJobId;

/** Hands out the next id. */
int queue_take_job_id();

enum QueueIterControl {
    QUEUE_ITER_CONTINUE = 0,   ///< go on with the next job
    QUEUE_ITER_STOP = 1,       ///< end the whole iteration
    QUEUE_ITER_NEXT_QUEUE = 2, ///< pass over the rest of this queue
};

/**
 * Called for one job, which it may change in place. If it sets `removeJob`, the
 * job is erased before anything else happens. `arg` is the caller's.
 */
using QueueIterCallback =
    boost::function<QueueIterControl(const std::string& queueName, Job& job, bool& removeJob, void* arg)>;

/**
 * Visits all jobs: the queues in the order of their names, each from its front.
 * Always true. The callback must not add or remove jobs by itself.
 */
bool queue_foreach_job(const QueueIterCallback& callback, void* arg);

/**
 * The same for those jobs whose status is another than queued, without a look
 * at the jobs that wait.
 */
bool queue_foreach_job_not_waiting(const QueueIterCallback& callback, void* arg);

/**
 * The same for one job: the first that has this id. False if there is none.
 * What the callback answers does not matter.
 */
bool queue_visit_job(int id, const QueueIterCallback& callback, void* arg);

/** The first job, in the order of queue_foreach_job(), that has this id; null if there is none. */
const Job* queue_find_job(int id);

/** Whether no job is in that queue; also if there is no such queue. */
bool queue_is_empty(const std::string& queueName);
bool queue_is_all_empty();

/** Whether any job, in whatever status, has the same unique string as `job`. */
bool queue_is_same_unique(const Job& job);

} // namespace Backup
} // namespace MARU
