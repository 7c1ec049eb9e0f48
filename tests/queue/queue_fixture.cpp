#include "queue_fixture.h"

#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

#include <marubackup-util/process.h>

#include "queue/job_queues.h"
#include "queue/queue_log.h"
#include "queue/queue_server.h"
#include "queue/requests.h"
#include "support/backend_files.h"
#include "support/in_child.h"
#include "support/waiting.h"

using MARU::Backup::Job;
using MARU::Backup::jobQueues;
using support::writeLocalBackend;

namespace {

bool isOurChild(pid_t pid) {
    siginfo_t info = {};
    return pid > 0 && waitid(P_PID, static_cast<id_t>(pid), &info, WEXITED | WNOHANG | WNOWAIT) == 0;
}

void clearStore() {
    jobQueues.clear();
    MARU::Backup::nextJobId = 1;
    MARU::Backup::queueDebugEnabled = false;
}

} // namespace

std::string inAllSections(const std::string& lines) {
    std::string text;
    for (const Job::Action action : RUNNABLE_ACTIONS) {
        text += "[" + MARU::Backup::action2str(action) + "]\n" + lines + "\n";
    }
    return text;
}

std::string sent(int signal, const Job& job) {
    return "send sig[" + std::to_string(signal) + "] to job [" + std::to_string(job.getJobId()) + "] pid [" +
           std::to_string(job.getPid()) + "]";
}

void awaitEnd(pid_t child) {
    const int fd = static_cast<int>(syscall(SYS_pidfd_open, child, 0));
    ASSERT_GE(fd, 0) << "there is no process " << child;
    EXPECT_TRUE(support::waitReadable(fd)) << "the process " << child << " does not end";
    close(fd);
}

bool isRunning(pid_t process) {
    return MARU::Backup::Process::isAlive(process) && !MARU::Backup::Process::isZombie(process);
}

QueueTest::QueueTest() : closedGate(folder.path("closed")) {
    clearStore();
    writeLocalBackend("shell", inAllSections("unique = {{name}}\ncommand_launch = /bin/sh -c {{script}}"));
    writeLocalBackend("held", inAllSections("unique = {{name}}\ncommand_launch = /bin/sh -c 'read line < " +
                                            closedGate.path() + "'"));
}

QueueTest::~QueueTest() {
    for (const auto& entry : jobQueues) {
        for (const Job& job : entry.second) {
            if (isOurChild(job.getPid())) {
                kill(job.getPid(), SIGKILL);
                support::waitForChild(job.getPid());
            }
        }
    }
    clearStore();
    support::removeAllBackends();
}

const Job& QueueTest::add(const Job& job, Job::Status status) {
    Job admitted = job;
    admitted.setJobId(MARU::Backup::queue_take_job_id());
    admitted.setStatus(status);
    MARU::Backup::JobQueue& queue = jobQueues[MARU::Backup::action2str(job.getAction())];
    queue.push_back(admitted);
    return queue.back();
}

const Job& QueueTest::addHeld(Job::Action action, Job::Status status) {
    return add(Job("held", action), status);
}

const Job& QueueTest::addUnique(Job::Action action, const std::string& unique, Job::Status status) {
    Job job("held", action);
    job.setUniqueString(unique);
    return add(job, status);
}

const Job& QueueTest::addScript(Job::Action action, const std::string& script) {
    Job job("shell", action);
    job.setParam("script", script);
    return add(job);
}

const Job& QueueTest::addWithProcess(pid_t pid, Job::Status status) {
    Job job("held", Job::ACTION_BACKUP);
    job.setPid(pid);
    return add(job, status);
}

void QueueTest::change(const Job& job, const std::function<void(Job&)>& change) {
    MARU::Backup::JobQueue& queue = jobQueues.at(MARU::Backup::action2str(job.getAction()));
    queue.change(queue.placeOf(job), change);
}

void QueueTest::setStatus(const Job& job, Job::Status status) {
    change(job, [status](Job& changed) { changed.setStatus(status); });
}

bool QueueTest::launch(const Job& job) {
    bool hasProcess = false;
    change(job, [&hasProcess](Job& queued) { hasProcess = MARU::Backup::do_launch_job(queued); });
    return hasProcess;
}

const Job& QueueTest::launched(const Job& job) {
    EXPECT_TRUE(launch(job));
    return job;
}

std::vector<int> QueueTest::ids(const std::string& queueName) {
    std::vector<int> found;
    for (const Job& job : jobQueues.at(queueName)) {
        found.push_back(job.getJobId());
    }
    return found;
}

std::vector<int> QueueTest::statuses(const std::string& queueName) {
    std::vector<int> found;
    for (const Job& job : jobQueues.at(queueName)) {
        found.push_back(job.getStatus());
    }
    return found;
}

std::string QueueTest::ask(const std::string& request) {
    return MARU::Backup::dispatchRequest(request.data(), static_cast<unsigned int>(request.size()), nullptr);
}
