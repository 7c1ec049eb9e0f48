#include "queue/requests.h"

#include <sys/time.h>
#include <syslog.h>

#include <cstddef>
#include <cstdint>
#include <list>
#include <string>
#include <string_view>
#include <utility>

#include <json/value.h>

#include <marubackup/backend_manager.h>
#include <marubackup/command_server.h>
#include <marubackup/job.h>
#include <marubackup/system_status.h>

#include "command/protocol.h"
#include "common/json_text.h"
#include "job/job_record.h"
#include "queue/job_queues.h"
#include "queue/queue_log.h"
#include "queue/queue_server.h"

namespace MARU {
namespace Backup {

namespace {

/**
 * The text of a reply: its code, and one other member at most, whose name comes
 * behind "code" in the alphabet as they all do. Until it is refused it says that
 * all is well.
 */
class Reply {
public:
    void refuse(ReplyCode code) {
        text = R"({"code":)" + std::to_string(code);
    }

    /** The text, to which the value of that member is to be added. */
    std::string& with(const char* name) {
        text.reserve(ROOM_FOR_A_JOB);
        return text.append(R"(,")").append(name).append(R"(":)");
    }

    std::string finish() {
        return std::move(text += '}');
    }

private:
    static constexpr std::size_t ROOM_FOR_A_JOB = 512;

    std::string text = R"({"code":)" + std::to_string(CODE_OK);
};

/** The id that a request names; 0, which is no job's, if it names none. */
int requestedJobId(const Json::Value& request) {
    const Json::Value& id = member(request, Member::JOB_ID);
    return isInt32(id) && id.asInt() > 0 ? id.asInt() : 0;
}

// job_enqueue

/** Reads the job that a client wants done. False if there is none worth a look. */
bool readCandidate(const Json::Value& request, Job& job) {
    const Json::Value& json = member(request, Member::JOB);
    if (!json.isObject() || !job.fromJson(json) || !Job::isValidToEnqueue(job)) {
        return false;
    }
    // In a list it stands two levels down. One that no client could read there
    // would spoil the lists of all.
    if (nestingOf(json) > MAX_NESTING - 2) {
        return false;
    }
    // It has no process yet, whatever the client says: removing it while it
    // waits must not signal a process of the client's choosing.
    job.setPid(-1);
    return true;
}

void handleJobEnqueue(const Json::Value& request, Reply& reply, CommandServer*) {
    Job job;
    if (!readCandidate(request, job)) {
        return reply.refuse(CODE_BAD_REQUEST);
    }
    const std::string queueName = action2str(job.getAction());
    BackendManager backend;
    if (!backend.load(job.getBackend(), queueName)) {
        queueLog(LOG_ERR, "backend [%s] not support", job.getBackend().c_str());
        return reply.refuse(CODE_NOT_SUPPORTED);
    }
    if (!backend.check(job)) {
        queueLog(LOG_ERR, "invalid job");
        return reply.refuse(CODE_BAD_REQUEST);
    }
    if (backend.getUniqueFormat().empty()) {
        queueLog(LOG_ERR, "backend [%s] bad unique", job.getBackend().c_str());
        return reply.refuse(CODE_NOT_SUPPORTED);
    }
    if (!queue_is_empty(action2str(Job::ACTION_RESTORE))) {
        queueLog(LOG_ERR, "restore queue is not empty");
        return reply.refuse(CODE_RESTORE_PENDING);
    }
    if (System::isRestoreRunningNotQueued("")) {
        queueLog(LOG_ERR, "restore job running");
        return reply.refuse(CODE_RESTORE_PENDING);
    }
    // A job refused from here on leaves a gap in the ids, so that no id is ever
    // seen on two jobs.
    job.setJobId(queue_take_job_id());
    job.setStatus(Job::STATUS_QUEUED);
    job.setUniqueString(backend.getJobUnique(job));
    if (queue_is_same_unique(job)) {
        queueLog(LOG_ERR, "job unique conflict [%s]", job.getUniqueString().c_str());
        return reply.refuse(CODE_CONFLICT);
    }
    const std::string admitted = job.toString();
    queueLog(LOG_INFO, "enqueue job [%s]", admitted.c_str());
    jobQueues[queueName].push_back(job);
    queue_scan_next_to_launch();
    reply.with(Member::JOB) += admitted;
}

// job_get

void handleJobGet(const Json::Value& request, Reply& reply, CommandServer*) {
    const int id = requestedJobId(request);
    if (id == 0) {
        reply.refuse(CODE_BAD_REQUEST);
        queueLog(LOG_ERR, "bad job get request");
        return;
    }
    const Job* const job = queue_find_job(id);
    if (job == nullptr || job->getStatus() == Job::STATUS_NONE) {
        return reply.refuse(CODE_NOT_FOUND);
    }
    recordOf(*job).appendTo(reply.with(Member::JOB));
}

// job_remove

void handleJobRemove(const Json::Value& request, Reply& reply, CommandServer*) {
    const int id = requestedJobId(request);
    if (id == 0) {
        queueLog(LOG_ERR, "bad job remove request");
        return reply.refuse(CODE_BAD_REQUEST);
    }
    queueLog(LOG_INFO, "remove job [%d]", id);
    if (!queue_visit_job(id, sendSignalCb, nullptr)) {
        reply.refuse(CODE_NOT_FOUND);
    }
}

// job_list

/** Which jobs a client wants listed; an empty text filters nothing. */
struct ListFilter {
    std::list<std::string> queueNames;
    std::string backend;
    std::string unique;
    std::string format;
    std::string target;

    bool takes(const Job& job) const {
        return (backend.empty() || backend == recordOf(job).backend) &&
               (format.empty() || target.empty() || job.toFormatString(format) == target);
    }
};

/** Reads an optional text. False if the member is there and is none. */
bool readText(const Json::Value& request, const char* name, std::string& text) {
    if (!request.isMember(name)) {
        return true;
    }
    const Json::Value& value = member(request, name);
    if (!value.isString()) {
        return false;
    }
    text = value.asString();
    return true;
}

bool readQueueNames(const Json::Value& request, std::list<std::string>& queueNames) {
    if (!request.isMember(Member::ACTION)) {
        for (const auto& entry : jobQueues) {
            queueNames.push_back(entry.first);
        }
        return true;
    }
    const Json::Value& action = member(request, Member::ACTION);
    if (!isInt32(action)) {
        return false;
    }
    queueNames.push_back(action2str(static_cast<Job::Action>(action.asInt())));
    return true;
}

/** Reads the two texts that work as a pair only. */
bool readFormat(const Json::Value& request, ListFilter& filter) {
    if (!request.isMember(Member::FORMAT) || !request.isMember(Member::TARGET)) {
        return true;
    }
    return readText(request, Member::FORMAT, filter.format) && readText(request, Member::TARGET, filter.target);
}

/** The member that cannot be used, or null if the whole filter was read. */
const char* readFilter(const Json::Value& request, ListFilter& filter) {
    if (!readQueueNames(request, filter.queueNames)) {
        return Member::ACTION;
    }
    if (!readFormat(request, filter)) {
        return Member::FORMAT;
    }
    if (!readText(request, Member::BACKEND, filter.backend)) {
        return Member::BACKEND;
    }
    if (!readText(request, Member::UNIQUE, filter.unique)) {
        return Member::UNIQUE;
    }
    return nullptr;
}

/** Adds a job to the text of an array that has been opened. */
void listJob(const Job& job, std::string& jobs) {
    if (jobs.back() != '[') {
        jobs += ',';
    }
    recordOf(job).appendTo(jobs);
}

void listAll(const JobQueue& queue, const ListFilter& filter, std::string& jobs) {
    for (const Job& job : queue) {
        if (filter.takes(job)) {
            listJob(job, jobs);
        }
    }
}

/** A list by unique string ends at the first job that passes. Whether there was one. */
bool listFirst(const JobQueue& queue, const ListFilter& filter, std::string& jobs) {
    for (const Job* const job : queue.withUnique(filter.unique)) {
        if (filter.takes(*job)) {
            listJob(*job, jobs);
            return true;
        }
    }
    return false;
}

void listQueues(const ListFilter& filter, std::string& jobs) {
    for (const std::string& name : filter.queueNames) {
        const JobQueue& queue = jobQueues[name];
        if (filter.unique.empty()) {
            listAll(queue, filter, jobs);
        } else if (listFirst(queue, filter, jobs)) {
            return;
        }
    }
}

void handleJobList(const Json::Value& request, Reply& reply, CommandServer*) {
    ListFilter filter;
    if (const char* bad = readFilter(request, filter)) {
        queueLog(LOG_ERR, "bad list param: %s", bad);
        return reply.refuse(CODE_BAD_REQUEST);
    }
    std::string& jobs = reply.with(Member::JOBS) += '[';
    listQueues(filter, jobs);
    jobs += ']';
}

// clean_session

/** The id as text. False if it is neither text nor a number. */
bool readSessionId(const Json::Value& request, std::string& id) {
    const Json::Value& value = member(request, Member::SESSION_ID);
    if (!value.isString() && !value.isNumeric()) {
        return false;
    }
    id = value.asString();
    return true;
}

/** The low 32 bits of an integer of up to 64, as a signed number. False if it is none. */
bool readLifetime(const Json::Value& request, long& lifetime) {
    const Json::Value& value = member(request, Member::LIFETIME);
    if (value.type() != Json::intValue && value.type() != Json::uintValue) {
        return false;
    }
    const std::uint64_t bits =
        value.type() == Json::intValue ? static_cast<std::uint64_t>(value.asInt64()) : value.asUInt64();
    lifetime = static_cast<std::int32_t>(static_cast<std::uint32_t>(bits));
    return true;
}

void handleCleanSession(const Json::Value& request, Reply& reply, CommandServer* server) {
    std::string id;
    long lifetime = 0;
    if (!readSessionId(request, id) || !readLifetime(request, lifetime)) {
        reply.refuse(CODE_BAD_REQUEST);
        queueLog(LOG_ERR, "get bad sessin clean job request");
        return;
    }
    auto* const context = new CleanSessionContext{id, lifetime, server};
    if (!server->setTimeout(cleanSessionTimeout, delayOfSeconds(lifetime), context)) {
        // The timer that could not be added may hold on to the context, which
        // is left alone.
        reply.refuse(CODE_INTERNAL);
        queueLog(LOG_ERR, "failed to setTimeout for clean session job");
        return;
    }
    appendJsonString(reply.with(Member::SESSION_ID), id);
}

// Dispatch

struct OpHandler {
    const char* op;
    void (*handle)(const Json::Value& request, Reply& reply, CommandServer* server);
};

// clang-format off
const OpHandler opHandlerTable[] = {
    {Op::JOB_ENQUEUE, handleJobEnqueue},
    {Op::JOB_REMOVE, handleJobRemove},
    {Op::JOB_GET, handleJobGet},
    {Op::JOB_LIST, handleJobList},
    {Op::CLEAN_SESSION, handleCleanSession},
};
// clang-format on

const OpHandler* findHandler(const std::string& op) {
    for (const OpHandler& row : opHandlerTable) {
        if (op == row.op) {
            return &row;
        }
    }
    return nullptr;
}

void answer(std::string_view text, Reply& reply, CommandServer* server) {
    Json::Value request;
    const bool parsed = fromString(text, request);
    const Json::Value& op = member(request, Member::OP);
    if (!parsed || !op.isString()) {
        queueLog(LOG_ERR, "bad command: [%s]", std::string(text).c_str());
        return reply.refuse(CODE_BAD_REQUEST);
    }
    const OpHandler* const handler = findHandler(op.asString());
    if (handler == nullptr) {
        queueLog(LOG_ERR, "handler [%s] not found", op.asCString());
        return reply.refuse(CODE_UNKNOWN_OP);
    }
    handler->handle(request, reply, server);
}

} // namespace

std::string dispatchRequest(const char* data, unsigned int length, CommandServer* server) {
    const std::string_view text(data, length);
    if (queueDebugEnabled) {
        queueLog(LOG_DEBUG, "request [%s]", std::string(text).c_str());
    }
    Reply reply;
    answer(text, reply, server);
    return reply.finish();
}

} // namespace Backup
} // namespace MARU
