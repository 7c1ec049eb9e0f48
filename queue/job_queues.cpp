#include "queue/job_queues.h"

#include <algorithm>
#include <cstddef>
#include <iterator>

#include "job/job_record.h"

namespace MARU {
namespace Backup {

std::map<std::string, JobQueue> jobQueues;
int nextJobId = 1;

namespace {

/** Lets the callback have a job, and erases it if asked to. `job` is then the next one. */
QueueIterControl visit(const std::string& queueName, JobQueue& jobs, JobQueue::const_iterator& job,
                       const QueueIterCallback& callback, void* arg) {
    QueueIterControl control = QUEUE_ITER_CONTINUE;
    bool removeJob = false;
    jobs.change(job, [&](Job& visited) { control = callback(queueName, visited, removeJob, arg); });
    job = removeJob ? jobs.erase(job) : std::next(job);
    return control;
}

enum Visited { ALL_JOBS, NOT_WAITING };

bool foreachJob(Visited which, const QueueIterCallback& callback, void* arg) {
    for (auto& entry : jobQueues) {
        JobQueue& jobs = entry.second;
        std::size_t left = which == ALL_JOBS ? jobs.size() : jobs.countNotWaiting();
        for (auto job = jobs.begin(); left > 0;) {
            if (which == NOT_WAITING && JobQueue::isWaiting(*job)) {
                ++job;
                continue;
            }
            --left;
            const QueueIterControl control = visit(entry.first, jobs, job, callback, arg);
            if (control == QUEUE_ITER_STOP) {
                return true;
            }
            if (control == QUEUE_ITER_NEXT_QUEUE) {
                break;
            }
        }
    }
    return true;
}

} // namespace

int queue_take_job_id() {
    const int id = nextJobId;
    // Through unsigned, since a daemon that lives long enough must not run
    // into undefined behaviour.
    nextJobId = static_cast<int>(static_cast<unsigned int>(id) + 1U);
    return id;
}

bool queue_foreach_job(const QueueIterCallback& callback, void* arg) {
    return foreachJob(ALL_JOBS, callback, arg);
}

bool queue_foreach_job_not_waiting(const QueueIterCallback& callback, void* arg) {
    return foreachJob(NOT_WAITING, callback, arg);
}

bool queue_visit_job(int id, const QueueIterCallback& callback, void* arg) {
    for (auto& entry : jobQueues) {
        if (const Job* const job = entry.second.withId(id)) {
            auto place = entry.second.placeOf(*job);
            visit(entry.first, entry.second, place, callback, arg);
            return true;
        }
    }
    return false;
}

const Job* queue_find_job(int id) {
    for (const auto& entry : jobQueues) {
        if (const Job* const job = entry.second.withId(id)) {
            return job;
        }
    }
    return nullptr;
}

bool queue_is_empty(const std::string& queueName) {
    const auto entry = jobQueues.find(queueName);
    return entry == jobQueues.end() || entry->second.empty();
}

bool queue_is_all_empty() {
    return std::all_of(jobQueues.begin(), jobQueues.end(), [](const auto& entry) { return entry.second.empty(); });
}

bool queue_is_same_unique(const Job& job) {
    const std::string& unique = recordOf(job).unique;
    return std::any_of(jobQueues.begin(), jobQueues.end(),
                       [&unique](const auto& entry) { return entry.second.hasUnique(unique); });
}

} // namespace Backup
} // namespace MARU
