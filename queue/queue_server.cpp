#include <marubackup/queue_server.h>

#include <sys/inotify.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <iterator>

#include <marubackup-util/process.h>
#include <marubackup/backend_manager.h>
#include <marubackup/command_server.h>
#include <marubackup/job.h>
#include <marubackup/timed_session.h>

#include "backend/start_launch.h"
#include "command/protocol.h"
#include "common/log.h"
#include "job/job_record.h"
#include "queue/child_process.h"
#include "queue/queue_log.h"
#include "queue/queue_server.h"
#include "queue/requests.h"

namespace MARU {
namespace Backup {

namespace {

const char* const LOG_UNIT = "queue_server";

const char* const BACKEND_FOLDER = "/usr/local/share/marubackup";
const std::string BACKEND_SUFFIX = ".conf";
const int SOCKET_MODE = 0660;
const int KILL_WAITS = 5;
const int EXIT_NOT_LAUNCHED = 127;
/** 34 years: as good as for ever, and the loop can add it to its clock where a time has 32 bits. */
const long LONGEST_DELAY = 1L << 30;

/**
 * How many jobs of a queue may have a process at once, in the order of the scan:
 * restores first, since nothing else is started beside one.
 */
struct QueueLimit {
    Job::Action action;
    int limit;
};

// clang-format off
const QueueLimit QUEUE_LIMITS[] = {
    {Job::ACTION_RESTORE, 1},
    {Job::ACTION_BACKUP, 1},
    {Job::ACTION_COPY_TO, 5},
    {Job::ACTION_TARGET_COPY_TO, 5},
    {Job::ACTION_RELINK, 4},
    {Job::ACTION_REMOVE_VERSION, 10},
    {Job::ACTION_REMOVE_TASK, 10},
};
// clang-format on

} // namespace

// Scheduling

namespace {

/** Ends the child in any case: whatever happens in it, it never goes on as a second daemon. */
[[noreturn]] void becomeCommand(const BackendManager& backend, const Job& job) {
    try {
        backend.launch(job);
    } catch (...) {
        // Out of memory: as good as a command that cannot be run.
    }
    _exit(EXIT_NOT_LAUNCHED);
}

/** A child that runs the job's command; negative, with errno set, if none can be made. */
pid_t startCommand(const BackendManager& backend, const Job& job) {
    pid_t pid = startLaunch(backend, job);
    if (pid < 0) {
        pid = forkWithDefaultSignals();
        if (pid == 0) {
            becomeCommand(backend, job);
        }
    }
    return pid;
}

} // namespace

bool do_launch_job(Job& job) {
    queueLog(LOG_INFO, "launch job [%s]", job.toString().c_str());
    BackendManager backend;
    if (!backend.load(job.getBackend(), action2str(job.getAction()))) {
        LOG_LOCATED_ERR("wrong backend [%s]", job.toString().c_str());
        return false;
    }
    const pid_t pid = startCommand(backend, job);
    if (pid < 0) {
        LOG_LOCATED_ERR("fork: %m");
        return false;
    }
    job.setStatus(Job::STATUS_RUNNING);
    job.setPid(pid);
    queueLog(LOG_INFO, "launch job [%d] on pid [%d]", job.getJobId(), static_cast<int>(pid));
    return true;
}

namespace {

/**
 * Whether the job has a process, now or already. A stopping one counts: it
 * holds its slot, and whatever it has locked, until its process has ended.
 */
bool hasOrGetsProcess(JobQueue& jobs, JobQueue::const_iterator job) {
    bool launched = false;
    switch (job->getStatus()) {
    case Job::STATUS_RUNNING:
    case Job::STATUS_STOPPING:
        return true;
    case Job::STATUS_QUEUED:
        jobs.change(job, [&launched](Job& queued) { launched = do_launch_job(queued); });
        return launched;
    default:
        return false;
    }
}

} // namespace

bool queue_launch_next_job(const std::string& queueName, bool& busy, int limit) {
    const auto entry = jobQueues.find(queueName);
    if (entry == jobQueues.end()) {
        return true;
    }
    JobQueue& jobs = entry->second;
    int count = 0;
    for (auto job = jobs.begin(); job != jobs.end() && count < limit;) {
        if (hasOrGetsProcess(jobs, job)) {
            ++count;
            ++job;
        } else {
            LOG_LOCATED_ERR("bad job: [%s]", job->toString().c_str());
            job = jobs.erase(job);
        }
    }
    busy = count > 0;
    return true;
}

bool queue_scan_next_to_launch() {
    queueLog(LOG_DEBUG, "scan to launch");
    for (const QueueLimit& row : QUEUE_LIMITS) {
        bool busy = false;
        queue_launch_next_job(action2str(row.action), busy, row.limit);
        if (busy && row.action == Job::ACTION_RESTORE) {
            break;
        }
    }
    return true;
}

// Supervision

QueueIterControl sendSignalCb(const std::string&, Job& job, bool& removeJob, void* arg) {
    const int signal = arg != nullptr ? *static_cast<int*>(arg) : SIGTERM;
    const int pid = job.getPid();
    if (pid < 0) {
        removeJob = true;
        return QUEUE_ITER_CONTINUE;
    }
    if (signal == SIGTERM && job.getStatus() == Job::STATUS_STOPPING) {
        return QUEUE_ITER_CONTINUE;
    }
    if (kill(pid, signal) < 0 && errno != ESRCH) {
        LOG_LOCATED_ERR("kill(%d) failed, %m", pid);
    }
    queueLog(LOG_INFO, "send sig[%d] to job [%d] pid [%d]", signal, job.getJobId(), pid);
    job.setStatus(Job::STATUS_STOPPING);
    return QUEUE_ITER_CONTINUE;
}

bool jobHasEnded(const Job& job, pid_t reaped, int status) {
    const int id = job.getJobId();
    if (WIFEXITED(status)) {
        queueLog(LOG_INFO, "job [%d] exit(%d)", id, WEXITSTATUS(status));
        return true;
    }
    if (WIFSIGNALED(status)) {
        // The number is the low seven bits of the process id, and the second
        // line always follows: whoever reads these logs goes by their form.
        queueLog(LOG_INFO, "job [%d] term by sig(%d)", id, reaped & 0x7F);
        queueLog(LOG_INFO, "job [%d] core dump", id);
        return true;
    }
    // Not asked for, so the kernel does not report it; a job that is stopped or
    // continued stays where it is.
    if ((reaped & 0xFF) == 0x7F) {
        queueLog(LOG_INFO, "job [%d] stoped by sig(%d)", id, (reaped >> 8) & 0xFF);
        return false;
    }
    if (reaped == 0xFFFF) {
        queueLog(LOG_INFO, "job [%d] continued", id);
        return false;
    }
    queueLog(LOG_INFO, "job [%d] terminateded", id);
    return true;
}

namespace {

QueueIterControl checkChildCb(const std::string&, Job& job, bool& removeJob, void*) {
    const int pid = job.getPid();
    if (job.getStatus() == Job::STATUS_NONE) {
        LOG_LOCATED_ERR("bad job status: [%s]", job.toString().c_str());
        removeJob = true;
    } else if (pid < 0 && job.getStatus() != Job::STATUS_QUEUED) {
        LOG_LOCATED_ERR("bad job pid: [%s]", job.toString().c_str());
        removeJob = true;
    } else if (job.getStatus() != Job::STATUS_QUEUED) {
        int status = 0;
        const pid_t reaped = waitpid(pid, &status, WNOHANG);
        if (reaped == pid) {
            removeJob = jobHasEnded(job, reaped, status);
        } else if (!Process::isAlive(pid) && !Process::isZombie(pid)) {
            // Somebody else reaped it, so how it ended will never be known; the
            // job keeps its slot until an operator has looked.
            queueLog(LOG_ERR, "job [%d] out of control", job.getJobId());
        }
    }
    return QUEUE_ITER_CONTINUE;
}

} // namespace

bool queue_check_children_status(const char* tag) {
    queueLog(LOG_DEBUG, "[%s] check children status", tag != nullptr ? tag : "");
    // All that it does to a waiting job is to leave it alone.
    return queue_foreach_job_not_waiting(checkChildCb, nullptr);
}

bool queue_kill_all_job() {
    queue_foreach_job(sendSignalCb, nullptr);
    queue_check_children_status("terminate");
    for (int waits = 0; waits < KILL_WAITS; ++waits) {
        if (queue_is_all_empty()) {
            return true;
        }
        waitFullSeconds(1);
        queue_check_children_status("terminate");
    }
    if (!queue_is_all_empty()) {
        int signal = SIGKILL;
        queue_foreach_job(sendSignalCb, &signal);
    }
    return true;
}

// Sessions

timeval delayOfSeconds(long seconds) {
    timeval delay = {};
    delay.tv_sec = static_cast<time_t>(std::clamp(seconds, 0L, LONGEST_DELAY));
    return delay;
}

void cleanSessionTimeout(void* argument) {
    auto* const context = static_cast<CleanSessionContext*>(argument);
    const long left = TimedSession::destroyExpired(context->sessionId, context->lifetime, true);
    if (left > 0) {
        if (!context->server->setTimeout(cleanSessionTimeout, delayOfSeconds(left), context)) {
            queueLog(LOG_ERR, "failed to setTimeout for clean session job");
        }
        return;
    }
    if (left < 0) {
        LOG_LOCATED_ERR("failed to destroy expired session[%s][%ld]", context->sessionId.c_str(), context->lifetime);
    }
    delete context;
}

// The daemon

namespace {

void onLoopPass() {
    queue_check_children_status("loop");
    queue_scan_next_to_launch();
}

void onChildSignal(int) {
    queue_check_children_status("sigchild");
    queue_scan_next_to_launch();
}

QueueIterControl dumpJobCb(const std::string& queueName, Job& job, bool&, void*) {
    queueLog(LOG_INFO, "  [%s] %s", queueName.c_str(), job.toString().c_str());
    return QUEUE_ITER_CONTINUE;
}

void onHangup(int) {
    queue_check_children_status("hup");
    queue_scan_next_to_launch();
    queue_foreach_job(dumpJobCb, nullptr);
}

void onTerminateSignal(int signal) {
    queueLog(LOG_INFO, "got signal: [%d]", signal);
    queue_kill_all_job();
}

/** A client that went away shows in its connection; the signal says nothing more. */
void ignoreSignal(int) {
}

/** Stops the jobs of one backend; `arg` points at its name. */
QueueIterControl killBackendJobsCb(const std::string& queueName, Job& job, bool& removeJob, void* arg) {
    if (recordOf(job).backend == *static_cast<std::string*>(arg)) {
        sendSignalCb(queueName, job, removeJob, nullptr);
    }
    return QUEUE_ITER_CONTINUE;
}

/** The backend that an event's file declares. False if it is no backend's file. */
bool backendOfEvent(const inotify_event& event, std::string& backend) {
    const std::string file(event.name, strnlen(event.name, event.len));
    if (file.size() < BACKEND_SUFFIX.size()) {
        return false;
    }
    const std::size_t stem = file.size() - BACKEND_SUFFIX.size();
    if (file.compare(stem, std::string::npos, BACKEND_SUFFIX) != 0) {
        return false;
    }
    backend = file.substr(0, stem);
    return true;
}

void onBackendFolderEvent(inotify_event* event) {
    std::string backend;
    if (!backendOfEvent(*event, backend)) {
        return;
    }
    if ((event->mask & IN_CREATE) != 0) {
        queueLog(LOG_INFO, "new backend [%s]", backend.c_str());
    }
    if ((event->mask & (IN_DELETE | IN_MOVED_FROM)) != 0) {
        queueLog(LOG_INFO, "rm backend [%s]", backend.c_str());
        queue_foreach_job(killBackendJobsCb, &backend);
    }
}

bool registerSignals(CommandServer& server) {
    for (const int signal : {SIGINT, SIGQUIT, SIGABRT, SIGTERM}) {
        if (!server.setSignalHandler(signal, onTerminateSignal)) {
            return false;
        }
    }
    return server.setSignalHandler(SIGHUP, onHangup) && server.setSignalHandler(SIGCHLD, onChildSignal) &&
           server.setSignalHandler(SIGPIPE, ignoreSignal);
}

} // namespace

bool runQueueServer(bool debug) {
    CommandServer server;
    queueDebugEnabled = debug;
    if (!server.setLoopHandler(onLoopPass)) {
        LOG_LOCATED_ERR("set loop handler failed");
        return false;
    }
    if (!registerSignals(server)) {
        LOG_LOCATED_ERR("set signal handler failed");
        return false;
    }
    if (!server.setWatchFolder(BACKEND_FOLDER, onBackendFolderEvent)) {
        LOG_LOCATED_ERR("config folder add watch failed");
    }
    return server.run(dispatchRequest, SOCKET_PATH, SOCKET_MODE);
}

} // namespace Backup
} // namespace MARU
