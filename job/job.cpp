#include <marubackup/job.h>

#include <ostream>

#include "common/json_text.h"

namespace MARU {
namespace Backup {

class JobPrivate {
public:
    int jobId = -1;
    std::string backend;
    Job::Action action = Job::ACTION_NONE;
    Job::Status status = Job::STATUS_NONE;
    int pid = -1;
    Json::Value params = Json::Value(Json::objectValue);
    std::string unique;
    std::string branch;
};

Job::Job() : d(new JobPrivate) {
}

Job::Job(const std::string& backend, Action action) : Job() {
    setBackend(backend);
    setAction(action);
}

Job::Job(const Job& other) : d(new JobPrivate(*other.d)) {
}

Job& Job::operator=(const Job& other) {
    *d = *other.d;
    return *this;
}

Job::~Job() {
    delete d;
}

int Job::getJobId() const {
    return d->jobId;
}

void Job::setJobId(int jobId) {
    d->jobId = jobId;
}

std::string Job::getUniqueString() const {
    return d->unique;
}

void Job::setUniqueString(const std::string& unique) {
    d->unique = unique;
}

std::string Job::getBackend() const {
    return d->backend;
}

void Job::setBackend(const std::string& backend) {
    d->backend = backend;
}

Job::Action Job::getAction() const {
    return d->action;
}

void Job::setAction(Action action) {
    d->action = action;
}

std::string Job::getCommandBranch() const {
    return d->branch;
}

void Job::setCommandBranch(const std::string& branch) {
    d->branch = branch;
}

Job::Status Job::getStatus() const {
    return d->status;
}

void Job::setStatus(Status status) {
    d->status = status;
}

int Job::getPid() const {
    return d->pid;
}

void Job::setPid(int pid) {
    d->pid = pid;
}

Json::Value Job::getParams() const {
    return d->params;
}

Json::Value Job::getParam(const std::string& name, const Json::Value& defaultValue) const {
    return hasParam(name) ? d->params[name] : defaultValue;
}

bool Job::hasParam(const std::string& name) const {
    return d->params.isMember(name);
}

void Job::setParam(const std::string& name, const Json::Value& value) {
    d->params[name] = value;
}

Json::Value Job::toJson() const {
    Json::Value json(Json::objectValue);
    json["backend"] = d->backend;
    json["action"] = static_cast<int>(d->action);
    json["status"] = static_cast<int>(d->status);
    json["param"] = d->params;
    json["unique"] = d->unique;
    if (!d->branch.empty()) {
        json["branch"] = d->branch;
    }
    if (d->pid != -1) {
        json["pid"] = d->pid;
    }
    if (d->jobId != -1) {
        json["job_id"] = d->jobId;
    }
    return json;
}

bool Job::fromJson(const Json::Value& json) {
    const Json::Value& backend = member(json, "backend");
    const Json::Value& action = member(json, "action");
    const Json::Value& status = member(json, "status");
    const Json::Value& params = member(json, "param");
    if (!backend.isString() || !isInt32(action) || !isInt32(status) || !params.isObject()) {
        return false;
    }
    d->backend = backend.asString();
    d->action = static_cast<Action>(action.asInt());
    d->status = static_cast<Status>(status.asInt());

    const Json::Value& branch = member(json, "branch");
    if (branch.isString()) {
        d->branch = branch.asString();
    }
    const Json::Value& jobId = member(json, "job_id");
    if (isInt32(jobId)) {
        d->jobId = jobId.asInt();
    }
    const Json::Value& pid = member(json, "pid");
    if (isInt32(pid)) {
        d->pid = pid.asInt();
    }
    const Json::Value& unique = member(json, "unique");
    if (unique.isString()) {
        d->unique = unique.asString();
    }
    d->params = params;
    return true;
}

std::string Job::toString() const {
    return Backup::toString(toJson());
}

std::ostream& operator<<(std::ostream& out, const Job& job) {
    return out << job.toString();
}

std::string action2str(Job::Action action) {
    switch (action) {
    case Job::ACTION_BACKUP:
        return "backup";
    case Job::ACTION_RESTORE:
        return "restore";
    case Job::ACTION_COPY_TO:
        return "copy_to";
    case Job::ACTION_RELINK:
        return "relink";
    case Job::ACTION_REMOVE_VERSION:
        return "remove_version";
    case Job::ACTION_REMOVE_TASK:
        return "remove_task";
    case Job::ACTION_TARGET_COPY_TO:
        return "target_copy_to";
    default:
        return "none";
    }
}

} // namespace Backup
} // namespace MARU
