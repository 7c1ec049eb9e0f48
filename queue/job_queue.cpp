#include "queue/job_queue.h"

#include <algorithm>
#include <iterator>

namespace MARU {
namespace Backup {

void JobQueue::push_back(const Job& job) {
    jobs.push_back(job);
    notWaiting += countOf(job);
}

JobQueue::const_iterator JobQueue::erase(const_iterator job) {
    notWaiting -= countOf(*job);
    return jobs.erase(job);
}

void JobQueue::clear() {
    jobs.clear();
    notWaiting = 0;
}

const Job* JobQueue::withId(int id) const {
    const auto found = jobs.get<ById>().equal_range(id);
    if (found.first == found.second) {
        return nullptr;
    }
    if (std::next(found.first) == found.second) {
        return &*found.first;
    }
    // Which of several came first is so rarely asked that nothing is kept for it.
    return &*std::find_if(begin(), end(), [id](const Job& job) { return job.getJobId() == id; });
}

std::vector<const Job*> JobQueue::withUnique(const std::string& unique) const {
    const auto found = jobs.get<ByUnique>().equal_range(unique);
    if (found.first == found.second) {
        return {};
    }
    if (std::next(found.first) == found.second) {
        return {&*found.first};
    }
    std::vector<const Job*> all;
    for (const Job& job : jobs) {
        if (recordOf(job).unique == unique) {
            all.push_back(&job);
        }
    }
    return all;
}

bool JobQueue::hasUnique(const std::string& unique) const {
    const auto& byUnique = jobs.get<ByUnique>();
    return byUnique.find(unique) != byUnique.end();
}

} // namespace Backup
} // namespace MARU
