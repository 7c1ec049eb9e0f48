#pragma once

#include <string>

namespace MARU {
namespace Backup {

class Job;

/**
 * Gives the variables of a template their values: the job's fields, the date,
 * and the job's parameters. Refers to the job, which must outlive it.
 */
class _VarsMapperJob {
public:
    explicit _VarsMapperJob(const Job* ofJob) : job(ofJob) {
    }

    /** False, with `value` untouched, if the job has no variable `name`. */
    bool operator()(const std::string& name, std::string& value) const;

private:
    const Job* job;
};

} // namespace Backup
} // namespace MARU
