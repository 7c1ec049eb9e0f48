#include <marubackup/job.h>

#include <cstddef>
#include <ostream>
#include <type_traits>

#include "common/json_text.h"
#include "job/job_record.h"

namespace MARU {
namespace Backup {

namespace {

/** What the text of most jobs fits in. */
const std::size_t ROOM_FOR_MOST = 512;

/**
 * Hands out the members of the JSON form, in the order of their names, which is
 * the order in a text.
 */
template <class Take>
void forEachMember(const JobPrivate& job, const Take& take) {
    take("action", static_cast<int>(job.action));
    take("backend", job.backend);
    if (!job.branch.empty()) {
        take("branch", job.branch);
    }
    if (job.jobId != -1) {
        take("job_id", job.jobId);
    }
    take("param", job.params);
    if (job.pid != -1) {
        take("pid", job.pid);
    }
    take("status", static_cast<int>(job.status));
    take("unique", job.unique);
}

// A member as a value

int asJson(int number) {
    return number;
}

const std::string& asJson(const std::string& text) {
    return text;
}

Json::Value asJson(const JobParams& params) {
    return params.all();
}

// A member as text

void appendMember(std::string& out, int number) {
    appendJsonInteger(out, number);
}

void appendMember(std::string& out, const std::string& text) {
    appendJsonString(out, text);
}

void appendMember(std::string& out, const JobParams& params) {
    params.appendTo(out);
}

} // namespace

void JobPrivate::appendTo(std::string& out) const {
    out.reserve(out.size() + ROOM_FOR_MOST);
    char before = '{';
    forEachMember(*this, [&](const char* name, const auto& member) {
        out += before;
        out += '"';
        out += name;
        out += "\":";
        appendMember(out, member);
        before = ',';
    });
    out += '}';
}

const JobPrivate& recordOf(const Job& job) {
    // A Job is the pointer to its record and nothing else, and the language lets
    // such an object be taken for its one member.
    static_assert(std::is_standard_layout_v<Job> && sizeof(Job) == sizeof(JobPrivate*));
    return **reinterpret_cast<JobPrivate* const*>(&job);
}

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
    return d->params.all();
}

Json::Value Job::getParam(const std::string& name, const Json::Value& defaultValue) const {
    Json::Value value;
    return d->params.get(name, value) ? value : defaultValue;
}

bool Job::hasParam(const std::string& name) const {
    return d->params.has(name);
}

void Job::setParam(const std::string& name, const Json::Value& value) {
    d->params.set(name, value);
}

Json::Value Job::toJson() const {
    Json::Value json(Json::objectValue);
    forEachMember(*d, [&json](const char* name, const auto& member) { json[name] = asJson(member); });
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
    d->params.assign(params);
    return true;
}

std::string Job::toString() const {
    std::string text;
    d->appendTo(text);
    return text;
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
