#include "queue/job_queues.h"

#include <algorithm>
#include <utility>

namespace MARU {
namespace Backup {

std::map<std::string, std::list<Job>> jobQueues;
int nextJobId = 1;

namespace {

/** Stores true behind `arg` when it meets a job with the unique string. */
class _JobCbIsTheSameUnique {
public:
    explicit _JobCbIsTheSameUnique(std::string wanted) : unique(std::move(wanted)) {
    }

    QueueIterControl operator()(const std::string&, Job& job, bool&, void* arg) const {
        if (job.getUniqueString() != unique) {
            return QUEUE_ITER_CONTINUE;
        }
        *static_cast<bool*>(arg) = true;
        return QUEUE_ITER_STOP;
    }

private:
    std::string unique;
};

} // namespace

int queue_take_job_id() {
    const int id = nextJobId;
    // Through unsigned, since a daemon that lives long enough must not run
    // into undefined behaviour.
    nextJobId = static_cast<int>(static_cast<unsigned int>(id) + 1U);
    return id;
}

bool queue_foreach_job(const QueueIterCallback& callback, void* arg) {
    for (auto& entry : jobQueues) {
        std::list<Job>& jobs = entry.second;
        for (auto job = jobs.begin(); job != jobs.end();) {
            bool removeJob = false;
            const QueueIterControl control = callback(entry.first, *job, removeJob, arg);
            job = removeJob ? jobs.erase(job) : std::next(job);
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

bool queue_is_empty(const std::string& queueName) {
    const auto entry = jobQueues.find(queueName);
    return entry == jobQueues.end() || entry->second.empty();
}

bool queue_is_all_empty() {
    return std::all_of(jobQueues.begin(), jobQueues.end(), [](const auto& entry) { return entry.second.empty(); });
}

bool queue_is_same_unique(const Job& job) {
    bool found = false;
    queue_foreach_job(_JobCbIsTheSameUnique(job.getUniqueString()), &found);
    return found;
}

} // namespace Backup
} // namespace MARU
