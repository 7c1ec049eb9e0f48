#pragma once

#include <string>

#include <marubackup/job.h>

#include "job/job_params.h"

namespace MARU {
namespace Backup {

/** What a Job holds. The daemon, which looks at many jobs at a time, reads it here without a copy of each text. */
class JobPrivate {
public:
    int jobId = -1;
    std::string backend;
    Job::Action action = Job::ACTION_NONE;
    Job::Status status = Job::STATUS_NONE;
    int pid = -1;
    JobParams params;
    std::string unique;
    std::string branch;

    /** Writes the text of Job::toString() behind `out`. */
    void appendTo(std::string& out) const;
};

/** The record of `job`. It lives as long as the job, which it changes with. */
const JobPrivate& recordOf(const Job& job);

} // namespace Backup
} // namespace MARU
