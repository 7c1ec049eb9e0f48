#pragma once

#include <cstdint>
#include <iosfwd>
#include <string>

#include <json/value.h>

#include <marubackup/export.h>

namespace MARU {
namespace Backup {

class JobPrivate;

/**
 * One piece of work for the queue daemon: which backend does what, with which
 * parameters, and, once the daemon has admitted it, where it stands.
 *
 * An application fills a job in (backend, action, parameters, perhaps a command
 * branch) and hands it to JobController::addJob(). The daemon gives it a job
 * id, a status, a unique string and, while it runs, a process id; the
 * application reads these and never sets them.
 *
 * A job is a value: every object owns its own record, copies are deep, and no
 * object refers to another. Different threads may use different jobs at once;
 * one job is used by one thread at a time. No operation blocks or logs. The
 * only exception that passes out of one is that of a failed allocation.
 */
class MARUBACKUP_API Job {
public:
    /**
     * What the job does. Each value is a single bit, but a job has exactly one
     * of them: values are compared for equality and never combined. A job may
     * carry a number that is not listed here, since actions that come over the
     * wire are stored unchecked; such a job can be queued and is never run.
     */
    enum Action : std::int32_t {
        ACTION_NONE = 0,
        ACTION_BACKUP = 1,
        ACTION_RESTORE = 2,
        ACTION_COPY_TO = 4,
        ACTION_RELINK = 8,
        ACTION_REMOVE_VERSION = 16,
        ACTION_REMOVE_TASK = 32,
        ACTION_TARGET_COPY_TO = 64,

        // Not kinds of work, but reasons why a backup may not start. A job
        // with one of them is refused by isValidToEnqueue().
        ACTION_SHARE_SNAPSHOT_RESTORE = 0x10000000,
        ACTION_SPACE_BUILD = 0x20000000,
        ACTION_RESERVED_BLOCKER = 0x40000000,
    };

    /** Where the job stands in its life. Only the daemon changes it. */
    enum Status : std::int32_t {
        STATUS_NONE = 0,     ///< built by an application, not admitted
        STATUS_QUEUED = 1,   ///< admitted, waits for its turn
        STATUS_RUNNING = 2,  ///< its process was started
        STATUS_STOPPING = 3, ///< its process was sent a signal and has not ended yet
    };

    /**
     * An empty job: job id -1 (not admitted), pid -1 (no process), action and
     * status none, parameters an empty JSON object, all texts empty.
     */
    Job();
    /** An empty job but for its backend and its action. */
    Job(const std::string& backend, Action action);
    Job(const Job& other);
    Job& operator=(const Job& other);
    ~Job();

    // Fields. A getter returns a copy, a setter replaces the field.

    /** The number that the daemon gave the job, from 1 up; -1 before that. */
    int getJobId() const;
    void setJobId(int jobId);

    /**
     * The text by which the daemon finds the same work queued twice. The
     * daemon makes it from the template in the backend's file.
     */
    std::string getUniqueString() const;
    void setUniqueString(const std::string& unique);

    /** The name of the backend that does the work: its file without ".conf". */
    std::string getBackend() const;
    void setBackend(const std::string& backend);

    Action getAction() const;
    void setAction(Action action);

    /**
     * Which of the backend's commands runs the job: `command_<branch>` of its
     * file; empty for `command_launch`.
     */
    std::string getCommandBranch() const;
    void setCommandBranch(const std::string& branch);

    Status getStatus() const;
    void setStatus(Status status);

    /** The process id of the running job; -1 while there is none. */
    int getPid() const;
    void setPid(int pid);

    // Parameters: a JSON object that the backend's templates refer to by name.

    /** All parameters: a JSON object, empty if there are none. */
    Json::Value getParams() const;
    /**
     * The parameter `name`, or `defaultValue` if there is none of that name. A
     * parameter that is present and null is returned as null.
     */
    Json::Value getParam(const std::string& name, const Json::Value& defaultValue) const;
    bool hasParam(const std::string& name) const;
    /** Stores a copy of `value` as the parameter `name`, new or replaced. */
    void setParam(const std::string& name, const Json::Value& value);

    // JSON form

    /**
     * The job as a JSON object: always "backend", "action", "status", "param"
     * and "unique"; "branch" if it is not empty; "pid" and "job_id" if they are
     * not -1.
     */
    Json::Value toJson() const;
    /**
     * Reads what toJson() writes. Required are a string "backend", 32-bit
     * integers "action" and "status", and an object "param": without them the
     * result is false and the job is unchanged. Actions and statuses are taken
     * as they are. The other members are optional; one that is absent or of
     * another type leaves its field as it was, so read into a new Job where
     * old values must not remain.
     */
    bool fromJson(const Json::Value& json);
    /** The text of toJson(): one line, no white space between its elements. */
    std::string toString() const;

    // Templates and admission

    /**
     * Expands the variables of `format`, each a name between double braces.
     *
     * - `{{BACKEND}}`, `{{BRANCH}}`, `{{UNIQUE}}`: the fields of those names.
     * - `{{JOB_ID}}`: one single character whose code is the low 8 bits of the
     *   job id, not its digits: job 65 gives "A".
     * - `{{DATE}}`: the local time now, as in 2024-03-05-1412-09.
     * - any other name: the parameter of that name. A string stands for itself,
     *   null for nothing, anything else for its JSON text.
     *
     * Names are case-sensitive, and a parameter with one of the five fixed
     * names is never reached. A name that is neither stays in the text as it
     * was written, braces included. Inserted values are not expanded again.
     */
    std::string toFormatString(const std::string& format) const;
    /**
     * Whether a job may be sent to the daemon at all: it names a backend, and
     * its action is neither 0 nor one of the three reasons. The daemon has
     * further rules of its own.
     */
    static bool isValidToEnqueue(const Job& job);

private:
    JobPrivate* d;
};

/** Writes exactly the text of Job::toString(), without a line end. */
MARUBACKUP_API std::ostream& operator<<(std::ostream& out, const Job& job);

/**
 * The name of an action: "backup", "restore", "copy_to", "relink",
 * "remove_version", "remove_task", "target_copy_to"; "none" for every other
 * value. It names the action's queue in the daemon and its section in the
 * backend's file.
 */
MARUBACKUP_API std::string action2str(Job::Action action);

} // namespace Backup
} // namespace MARU
