#pragma once

#include <list>
#include <string>

#include <marubackup/export.h>
#include <marubackup/job.h>

namespace MARU {
namespace Backup {

class JobControllerPrivate;

/**
 * An application's view of the queue daemon: adds, finds, lists and removes
 * jobs.
 *
 * A controller connects to "/var/run/marubackupd.socket" with its first request
 * and keeps that connection for the next ones; after an exchange that failed it
 * connects anew. It is used by one thread at a
 * time; different threads use different controllers. Every request blocks until
 * the daemon has answered, without a time-out; see CommandClient for what
 * happens when the daemon goes away in the middle of it.
 *
 * Every request returns a code:
 *
 *     200  done
 *     400  bad argument, or the daemon or the backend's check refuses the job
 *     404  no such job
 *     406  refused: a restore waits or runs
 *     409  refused: the same work is queued already
 *     500  the reply cannot be read
 *     503  the daemon cannot be reached
 *     505  the backend does not support the action
 *
 * or another code that the daemon gave. Outputs are written on 200 only, but
 * for lists, which are emptied first in every case.
 */
class MARUBACKUP_API JobController {
public:
    JobController();
    ~JobController();
    JobController(const JobController&) = delete;
    JobController& operator=(const JobController&) = delete;

    /**
     * Hands `job` to the daemon. On 200 it has its job id, its unique string
     * and status queued; it may be running by then. A job that is not
     * Job::isValidToEnqueue() is not sent and gives 400. Every refusal is
     * reported to syslog at LOG_ERR.
     */
    int addJob(Job& job);
    /** Fills `job` with the job of that id; 400 for an id below 1. */
    int getJob(int jobId, Job& job);
    /**
     * Removes the job of that id; 400 for an id below 1. A waiting job is gone
     * when the call returns. A running one is sent SIGTERM and is listed as
     * stopping until its process has ended; asking again changes nothing.
     */
    int removeJob(int jobId);
    /**
     * Has the daemon remove the session directory `sessId` when it has not been
     * used for `lifetime` seconds; 400 for an empty id.
     */
    int cleanSession(const std::string& sessId, long lifetime);

    /**
     * Lists the jobs that pass all given filters, queue by queue in the order
     * of their names, each in the order of arrival. `action` 0 and empty texts
     * filter nothing. `format` and `target` work as a pair: only jobs whose
     * Job::toFormatString(format) is `target`; one without the other is
     * ignored. With a `unique` there is at most one job.
     */
    int listJobEx(std::list<Job>& jobs, Job::Action action, const std::string& backend, const std::string& unique,
                  const std::string& format, const std::string& target);
    int listJobAll(std::list<Job>& jobs);
    int listJobByAction(std::list<Job>& jobs, Job::Action action, const std::string& backend);
    int listJobByBackend(std::list<Job>& jobs, const std::string& backend);
    int listJobByFormatString(std::list<Job>& jobs, const std::string& format, const std::string& target);

    /**
     * Fills `job` with the job of that action (0: any) and unique string; 404
     * if there is none. If there are more, the first one, and a line in syslog.
     */
    int getJobByUnique(Job& job, const std::string& unique, Job::Action action);

private:
    JobControllerPrivate* d;
};

} // namespace Backup
} // namespace MARU
