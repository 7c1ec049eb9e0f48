#pragma once

#include <sys/types.h>

#include <deque>
#include <list>
#include <map>
#include <set>
#include <string>
#include <vector>

#include <json/value.h>

#include <marubackup/job.h>

#include "queue/job_queues.h"

/**
 * What the daemon does with its jobs, told by walks over plain lists and nothing
 * else: whatever finds an answer faster has to find this one. It starts, signals
 * and reaps no process itself, but is told what became of the daemon's.
 */
class PlainStore {
public:
    using Job = MARU::Backup::Job;

    // The operations, and what they answer

    std::string enqueue(const Job& candidate);
    std::string get(int id);
    std::string remove(int id);
    /** `request` has the filters, all of the right type. */
    std::string listed(const Json::Value& request);
    void check();
    void scan();
    bool isSameUnique(const std::string& unique);
    bool foreachJob(const MARU::Backup::QueueIterCallback& callback);
    void stopAll();

    // What it works on

    std::map<std::string, std::list<Job>> queues;
    int nextJobId = 1;
    std::set<std::string> backends; ///< all have every action, and "{{name}}" for the unique string

    // What it would have written

    std::vector<std::string> diary;
    std::vector<std::string> located;

    // What the daemon's processes do

    std::deque<pid_t> newProcesses; ///< of the launches to come, in their order
    std::set<pid_t> running;
    std::map<pid_t, int> ended; ///< not reaped yet, with their wait statuses

private:
    bool launch(Job& job);
    void launchNext(const std::string& queueName, bool& busy, int limit);
    bool hasEnded(const Job& job, int status);
    MARU::Backup::QueueIterControl checkJob(Job& job, bool& removeJob);
    MARU::Backup::QueueIterControl stopJob(Job& job, bool& removeJob);
};
