#include "plain_store.h"

#include <sys/wait.h>

#include <csignal>
#include <iterator>

#include "common/json_text.h"

using namespace MARU::Backup;

namespace {

std::string textOf(int number) {
    return std::to_string(number);
}

std::string replyOf(int code) {
    return "{\"code\":" + textOf(code) + "}";
}

std::string replyWith(const Job& job) {
    return "{\"code\":200,\"job\":" + job.toString() + "}";
}

bool takes(const Json::Value& request, const Job& job) {
    const std::string unique = member(request, "unique").asString();
    const std::string backend = member(request, "backend").asString();
    const std::string format = member(request, "format").asString();
    const std::string target = member(request, "target").asString();
    return (unique.empty() || unique == job.getUniqueString()) && (backend.empty() || backend == job.getBackend()) &&
           (format.empty() || target.empty() || job.toFormatString(format) == target);
}

} // namespace

bool PlainStore::foreachJob(const QueueIterCallback& callback) {
    for (auto& entry : queues) {
        for (auto job = entry.second.begin(); job != entry.second.end();) {
            bool removeJob = false;
            const QueueIterControl control = callback(entry.first, *job, removeJob, nullptr);
            job = removeJob ? entry.second.erase(job) : std::next(job);
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

bool PlainStore::isSameUnique(const std::string& unique) {
    bool found = false;
    foreachJob([&](const std::string&, Job& job, bool&, void*) {
        found = job.getUniqueString() == unique;
        return found ? QUEUE_ITER_STOP : QUEUE_ITER_CONTINUE;
    });
    return found;
}

std::string PlainStore::enqueue(const Job& candidate) {
    const auto restores = queues.find("restore");
    if (restores != queues.end() && !restores->second.empty()) {
        diary.push_back("restore queue is not empty");
        return replyOf(406);
    }
    Job job = candidate;
    job.setJobId(nextJobId++);
    job.setStatus(Job::STATUS_QUEUED);
    job.setUniqueString(job.toFormatString("{{name}}"));
    if (isSameUnique(job.getUniqueString())) {
        diary.push_back("job unique conflict [" + job.getUniqueString() + "]");
        return replyOf(409);
    }
    diary.push_back("enqueue job [" + job.toString() + "]");
    queues[action2str(job.getAction())].push_back(job);
    scan();
    return replyWith(job);
}

std::string PlainStore::get(int id) {
    Job wanted;
    foreachJob([&](const std::string&, Job& job, bool&, void*) {
        if (job.getJobId() != id) {
            return QUEUE_ITER_CONTINUE;
        }
        wanted = job;
        return QUEUE_ITER_STOP;
    });
    return wanted.getStatus() == Job::STATUS_NONE ? replyOf(404) : replyWith(wanted);
}

std::string PlainStore::remove(int id) {
    diary.push_back("remove job [" + textOf(id) + "]");
    bool found = false;
    foreachJob([&](const std::string&, Job& job, bool& removeJob, void*) {
        found = job.getJobId() == id;
        if (found) {
            stopJob(job, removeJob);
        }
        return found ? QUEUE_ITER_STOP : QUEUE_ITER_CONTINUE;
    });
    return replyOf(found ? 200 : 404);
}

std::string PlainStore::listed(const Json::Value& request) {
    std::vector<std::string> names;
    for (const auto& entry : queues) {
        names.push_back(entry.first);
    }
    if (request.isMember("action")) {
        names = {action2str(static_cast<Job::Action>(request["action"].asInt()))};
    }
    std::string jobs;
    bool done = false;
    for (auto name = names.begin(); name != names.end() && !done; ++name) {
        for (auto job = queues[*name].begin(); job != queues[*name].end() && !done; ++job) {
            if (takes(request, *job)) {
                jobs += (jobs.empty() ? "" : ",") + job->toString();
                done = !member(request, "unique").asString().empty();
            }
        }
    }
    return "{\"code\":200,\"jobs\":[" + jobs + "]}";
}

bool PlainStore::launch(Job& job) {
    diary.push_back("launch job [" + job.toString() + "]");
    if (backends.count(job.getBackend()) == 0) {
        located.push_back("wrong backend [" + job.toString() + "]");
        return false;
    }
    pid_t pid = -1;
    if (!newProcesses.empty()) {
        pid = newProcesses.front();
        newProcesses.pop_front();
    }
    job.setStatus(Job::STATUS_RUNNING);
    job.setPid(pid);
    diary.push_back("launch job [" + textOf(job.getJobId()) + "] on pid [" + textOf(pid) + "]");
    return true;
}

void PlainStore::launchNext(const std::string& queueName, bool& busy, int limit) {
    const auto entry = queues.find(queueName);
    if (entry == queues.end()) {
        return;
    }
    int count = 0;
    for (auto job = entry->second.begin(); job != entry->second.end() && count < limit;) {
        const Job::Status status = job->getStatus();
        const bool hasProcess = status == Job::STATUS_RUNNING || status == Job::STATUS_STOPPING;
        if (hasProcess || (status == Job::STATUS_QUEUED && launch(*job))) {
            ++count;
            ++job;
        } else {
            located.push_back("bad job: [" + job->toString() + "]");
            job = entry->second.erase(job);
        }
    }
    busy = count > 0;
}

void PlainStore::scan() {
    bool busy = false;
    launchNext("restore", busy, 1);
    if (busy) {
        return;
    }
    launchNext("backup", busy, 1);
    launchNext("copy_to", busy, 5);
    launchNext("target_copy_to", busy, 5);
    launchNext("relink", busy, 4);
    launchNext("remove_version", busy, 10);
    launchNext("remove_task", busy, 10);
}

bool PlainStore::hasEnded(const Job& job, int status) {
    const std::string line = "job [" + textOf(job.getJobId()) + "] ";
    if (WIFEXITED(status)) {
        diary.push_back(line + "exit(" + textOf(WEXITSTATUS(status)) + ")");
    } else {
        diary.push_back(line + "term by sig(" + textOf(job.getPid() & 0x7F) + ")");
        diary.push_back(line + "core dump");
    }
    return true;
}

QueueIterControl PlainStore::checkJob(Job& job, bool& removeJob) {
    if (job.getStatus() == Job::STATUS_NONE) {
        located.push_back("bad job status: [" + job.toString() + "]");
        removeJob = true;
    } else if (job.getPid() < 0 && job.getStatus() != Job::STATUS_QUEUED) {
        located.push_back("bad job pid: [" + job.toString() + "]");
        removeJob = true;
    } else if (job.getStatus() != Job::STATUS_QUEUED) {
        const auto end = ended.find(job.getPid());
        if (end != ended.end()) {
            removeJob = hasEnded(job, end->second);
            ended.erase(end);
        } else if (running.count(job.getPid()) == 0) {
            diary.push_back("job [" + textOf(job.getJobId()) + "] out of control");
        }
    }
    return QUEUE_ITER_CONTINUE;
}

void PlainStore::check() {
    foreachJob([this](const std::string&, Job& job, bool& removeJob, void*) { return checkJob(job, removeJob); });
}

QueueIterControl PlainStore::stopJob(Job& job, bool& removeJob) {
    if (job.getPid() < 0) {
        removeJob = true;
    } else if (job.getStatus() != Job::STATUS_STOPPING) {
        diary.push_back("send sig[" + textOf(SIGTERM) + "] to job [" + textOf(job.getJobId()) + "] pid [" +
                        textOf(job.getPid()) + "]");
        job.setStatus(Job::STATUS_STOPPING);
    }
    return QUEUE_ITER_CONTINUE;
}

void PlainStore::stopAll() {
    foreachJob([this](const std::string&, Job& job, bool& removeJob, void*) { return stopJob(job, removeJob); });
}
