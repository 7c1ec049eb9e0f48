#include "job/job_format.h"

#include <ctime>

#include <boost/function.hpp>
#include <json/value.h>

#include <marubackup-util/mustache.h>
#include <marubackup/job.h>

#include "common/json_text.h"
#include "job/job_record.h"

namespace MARU {
namespace Backup {

namespace {

std::string localTimeNow() {
    const std::time_t now = std::time(nullptr);
    std::tm local = {};
    localtime_r(&now, &local);
    char text[32] = {};
    std::strftime(text, sizeof text, "%F-%H%M-%S", &local);
    return text;
}

/** A string stands for itself, null for nothing, anything else for its JSON. */
std::string paramText(const Json::Value& param) {
    if (param.isNull()) {
        return std::string();
    }
    return param.isString() ? param.asString() : toString(param);
}

} // namespace

bool _VarsMapperJob::operator()(const std::string& name, std::string& value) const {
    const JobPrivate& record = recordOf(*job);
    if (name == "JOB_ID") {
        // One character, not the digits: installed backends name files and
        // variables after it, and must go on to find them.
        value = static_cast<char>(record.jobId);
    } else if (name == "BACKEND") {
        value = record.backend;
    } else if (name == "BRANCH") {
        value = record.branch;
    } else if (name == "UNIQUE") {
        value = record.unique;
    } else if (name == "DATE") {
        value = localTimeNow();
    } else {
        Json::Value param;
        if (!record.params.get(name, param)) {
            return false;
        }
        value = paramText(param);
    }
    return true;
}

std::string Job::toFormatString(const std::string& format) const {
    const boost::function<bool(const std::string&, std::string&)> mapper = _VarsMapperJob(this);
    return replaceMustache(format, mapper);
}

bool Job::isValidToEnqueue(const Job& job) {
    if (recordOf(job).backend.empty()) {
        return false;
    }
    switch (job.getAction()) {
    case ACTION_NONE:
    case ACTION_SHARE_SNAPSHOT_RESTORE:
    case ACTION_SPACE_BUILD:
    case ACTION_RESERVED_BLOCKER:
        return false;
    default:
        return true;
    }
}

} // namespace Backup
} // namespace MARU
