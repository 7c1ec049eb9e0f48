#include <marubackup/controller.h>

#include <json/value.h>

#include <marubackup/command_client.h>

#include "command/protocol.h"
#include "common/json_text.h"
#include "common/log.h"

namespace MARU {
namespace Backup {

class JobControllerPrivate : public CommandClient {
public:
    /** Whether there is a connection; makes one if there is none. */
    bool checkAndConnect();
};

namespace {

// With its extension, unlike every other unit: monitors match on this text.
const char* const LOG_UNIT = "controller.cpp";

Json::Value newRequest(const char* op) {
    Json::Value request(Json::objectValue);
    request[Member::OP] = op;
    return request;
}

/** One reply: its text, and what it says. */
struct Reply {
    std::string text;
    Json::Value json;
    bool parsed = false;

    /** Whether the daemon's answer can be understood at all. */
    bool hasCode() const {
        return parsed && isInt32(member(json, Member::CODE));
    }

    int code() const {
        return json[Member::CODE].asInt();
    }
};

Reply exchange(CommandClient& client, const Json::Value& request) {
    Reply reply;
    reply.text = client.send(toString(request));
    if (reply.text.empty()) {
        // The stream may be in the middle of a frame, or the daemon is a new
        // one by now: the next request connects anew.
        client.close();
    }
    reply.parsed = fromString(reply.text, reply.json);
    return reply;
}

int unreadable(const Reply& reply) {
    LOG_LOCATED_ERR("parse response failed, %s", reply.text.c_str());
    return CODE_INTERNAL;
}

} // namespace

bool JobControllerPrivate::checkAndConnect() {
    return isConnected() || connect(SOCKET_PATH);
}

JobController::JobController() : d(new JobControllerPrivate) {
}

JobController::~JobController() {
    delete d;
}

int JobController::addJob(Job& job) {
    if (!Job::isValidToEnqueue(job)) {
        LOG_LOCATED_ERR("addJob failed: invalid job.");
        return CODE_BAD_REQUEST;
    }
    if (!d->checkAndConnect()) {
        LOG_LOCATED_ERR("addJob failed: connect failed.");
        return CODE_UNREACHABLE;
    }
    Json::Value request = newRequest(Op::JOB_ENQUEUE);
    request[Member::JOB] = job.toJson();
    const Reply reply = exchange(*d, request);
    if (!reply.parsed) {
        LOG_LOCATED_ERR("parse response failed");
        return CODE_INTERNAL;
    }
    if (reply.hasCode() && reply.code() != CODE_OK) {
        LOG_LOCATED_ERR("addJob failed. errno: [%d]", reply.code());
        return reply.code();
    }
    const Json::Value& admitted = member(reply.json, Member::JOB);
    if (!reply.hasCode() || !admitted.isObject()) {
        LOG_LOCATED_ERR("addJob failed.");
        return CODE_INTERNAL;
    }
    job.fromJson(admitted);
    return CODE_OK;
}

int JobController::getJob(int jobId, Job& job) {
    if (jobId < 1) {
        return CODE_BAD_REQUEST;
    }
    if (!d->checkAndConnect()) {
        return CODE_UNREACHABLE;
    }
    Json::Value request = newRequest(Op::JOB_GET);
    request[Member::JOB_ID] = jobId;
    const Reply reply = exchange(*d, request);
    if (!reply.hasCode()) {
        return unreadable(reply);
    }
    if (reply.code() != CODE_OK) {
        return reply.code();
    }
    const Json::Value& found = member(reply.json, Member::JOB);
    if (!found.isObject()) {
        return CODE_INTERNAL;
    }
    job.fromJson(found);
    return CODE_OK;
}

int JobController::removeJob(int jobId) {
    if (jobId < 1) {
        return CODE_BAD_REQUEST;
    }
    if (!d->checkAndConnect()) {
        return CODE_UNREACHABLE;
    }
    Json::Value request = newRequest(Op::JOB_REMOVE);
    request[Member::JOB_ID] = jobId;
    const Reply reply = exchange(*d, request);
    if (!reply.hasCode()) {
        return unreadable(reply);
    }
    return reply.code();
}

int JobController::cleanSession(const std::string& sessId, long lifetime) {
    if (sessId.empty()) {
        return CODE_BAD_REQUEST;
    }
    if (!d->checkAndConnect()) {
        return CODE_UNREACHABLE;
    }
    Json::Value request = newRequest(Op::CLEAN_SESSION);
    request[Member::SESSION_ID] = sessId;
    request[Member::LIFETIME] = static_cast<Json::Int64>(lifetime);
    const Reply reply = exchange(*d, request);
    if (!reply.hasCode()) {
        LOG_LOCATED_ERR("parse response failed");
        return CODE_INTERNAL;
    }
    return reply.code();
}

int JobController::listJobEx(std::list<Job>& jobs, Job::Action action, const std::string& backend,
                             const std::string& unique, const std::string& format, const std::string& target) {
    jobs.clear();
    if (!d->checkAndConnect()) {
        return CODE_UNREACHABLE;
    }
    Json::Value request = newRequest(Op::JOB_LIST);
    if (action != Job::ACTION_NONE) {
        request[Member::ACTION] = static_cast<int>(action);
    }
    if (!backend.empty()) {
        request[Member::BACKEND] = backend;
    }
    if (!unique.empty()) {
        request[Member::UNIQUE] = unique;
    }
    if (!format.empty() && !target.empty()) {
        request[Member::FORMAT] = format;
        request[Member::TARGET] = target;
    }
    const Reply reply = exchange(*d, request);
    if (!reply.hasCode()) {
        return unreadable(reply);
    }
    if (reply.code() != CODE_OK) {
        return reply.code();
    }
    const Json::Value& listed = member(reply.json, Member::JOBS);
    if (!listed.isArray()) {
        return unreadable(reply);
    }
    for (const Json::Value& element : listed) {
        Job job;
        job.fromJson(element);
        jobs.push_back(job);
    }
    return CODE_OK;
}

int JobController::listJobAll(std::list<Job>& jobs) {
    return listJobEx(jobs, Job::ACTION_NONE, "", "", "", "");
}

int JobController::listJobByAction(std::list<Job>& jobs, Job::Action action, const std::string& backend) {
    return listJobEx(jobs, action, backend, "", "", "");
}

int JobController::listJobByBackend(std::list<Job>& jobs, const std::string& backend) {
    return listJobEx(jobs, Job::ACTION_NONE, backend, "", "", "");
}

int JobController::listJobByFormatString(std::list<Job>& jobs, const std::string& format, const std::string& target) {
    return listJobEx(jobs, Job::ACTION_NONE, "", "", format, target);
}

int JobController::getJobByUnique(Job& job, const std::string& unique, Job::Action action) {
    std::list<Job> jobs;
    const int code = listJobEx(jobs, action, "", unique, "", "");
    if (code != CODE_OK) {
        return code;
    }
    if (jobs.empty()) {
        return CODE_NOT_FOUND;
    }
    if (jobs.size() > 1) {
        LOG_LOCATED_ERR("job is not unique [%s]", unique.c_str());
    }
    job = jobs.front();
    return CODE_OK;
}

} // namespace Backup
} // namespace MARU
