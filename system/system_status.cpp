#include <marubackup/system_status.h>

#include <exception>
#include <list>

#include <json/value.h>
#include <marubackup-util/process.h>
#include <marucore/error.h>
#include <marucore/exec.h>
#include <marustorage/space_build_file.h>
#include <taskmanager/task.h>
#include <taskmanager/task_mgr.h>

#include <marubackup/controller.h>

#include "common/log.h"

namespace MARU {
namespace Backup {

namespace {

const char* const LOG_UNIT = "system_status";

const char SNAPSHOT_TOOL[] = "/usr/maru/sbin/marusharesnaptool";
const char SNAPSHOT_QUESTION[] = "is-restore-running";
const int SNAPSHOT_RESTORE_RUNS = 1;

const char TASK_OWNER[] = "@administrators";
const char TASK_PREFIX[] = "confbkp_bkp_";
const int NO_PID = -1;

const char CONFIG_BACKUP[] = "configbackup";
const char TIDE_BACKUP[] = "tidebackup";

const int CODE_DONE = 200;

/**
 * What `ask` answers, or no if it throws: callers are promised an answer in
 * every case. Nothing but exceptions is stopped; a thread may still be cancelled
 * while it waits for the daemon.
 */
template <typename Question>
bool answer(Question ask) {
    try {
        return ask();
    } catch (const std::exception&) {
        return false;
    }
}

bool isSpaceBuilt() {
    MARUSpaceBuildFile* record = nullptr;
    const int result = MARUSpaceBuildFileGet(&record);
    const bool built = result >= 0 && record;
    MARUSpaceBuildFileObjFree(record);
    return built;
}

bool isSnapshotRestored() {
    const int result = MLIBCExec(SNAPSHOT_TOOL, SNAPSHOT_QUESTION, nullptr, nullptr, nullptr);
    if (result < 0) {
        LOG_PLAIN_ERR("Failed to exec marusharesnaptool binary with is-restore-running [0x%04X %s:%d]",
                      static_cast<unsigned int>(MLIBCErrGet()), MLIBCErrorGetFile(), MLIBCErrorGetLine());
    }
    return result == SNAPSHOT_RESTORE_RUNS;
}

bool isTaskRunning(const std::string& id) {
    if (!HOS::TaskUtil::checkTaskExists(TASK_OWNER, id)) {
        return false;
    }
    HOS::Task task(TASK_OWNER, id);
    const int pid = task.getCreatePid();
    return pid != NO_PID && !task.isFinished() && Process::isAlive(pid);
}

bool isConfigBackupTaskRunning() {
    HOS::TaskMgr manager(TASK_OWNER);
    const Json::Value ids = manager.getAllTaskId(TASK_PREFIX);
    for (const Json::Value& id : ids) {
        if (id.isString() && isTaskRunning(id.asString())) {
            return true;
        }
    }
    return false;
}

/** Whether the daemon has a job of that action, and of that backend unless it is empty. */
bool isListed(Job::Action action, const std::string& backend) {
    return answer([&]() {
        JobController controller;
        std::list<Job> jobs;
        return controller.listJobByAction(jobs, action, backend) == CODE_DONE && !jobs.empty();
    });
}

/** Whether a restore or a copy-to may start. */
bool canStartAlone(Job::Action& reason) {
    if (!System::canBackup(reason)) {
        return false;
    }
    if (System::isBackupRunning("")) {
        reason = Job::ACTION_BACKUP;
        return false;
    }
    if (System::isCopyToRunning("")) {
        reason = Job::ACTION_COPY_TO;
        return false;
    }
    return true;
}

} // namespace

bool System::canBackup(Job::Action& reason) {
    if (isSpaceBuilt()) {
        reason = Job::ACTION_SPACE_BUILD;
        return false;
    }
    if (isRestoreRunning("")) {
        reason = Job::ACTION_RESTORE;
        return false;
    }
    if (isSnapshotRestored()) {
        reason = Job::ACTION_SHARE_SNAPSHOT_RESTORE;
        return false;
    }
    return true;
}

bool System::canRestore(Job::Action& reason) {
    return canStartAlone(reason);
}

bool System::canCopyTo(Job::Action& reason) {
    return canStartAlone(reason);
}

bool System::canBackup() {
    Job::Action discarded = Job::ACTION_NONE;
    return canBackup(discarded);
}

bool System::canRestore() {
    Job::Action discarded = Job::ACTION_NONE;
    return canRestore(discarded);
}

bool System::canCopyTo() {
    // The weaker question, on purpose: a copy-to may be queued behind others.
    Job::Action discarded = Job::ACTION_NONE;
    return canBackup(discarded);
}

bool System::isBackupRunning(const std::string& backend) {
    return isBackupRunningNotQueued(backend) || isListed(Job::ACTION_BACKUP, backend);
}

bool System::isRestoreRunning(const std::string& backend) {
    return isRestoreRunningNotQueued(backend) || isListed(Job::ACTION_RESTORE, backend);
}

bool System::isCopyToRunning(const std::string& backend) {
    return isCopyToRunningNotQueued(backend) || isListed(Job::ACTION_COPY_TO, backend);
}

bool System::isBackupRunningNotQueued(const std::string& backend) {
    if (!backend.empty() && backend != CONFIG_BACKUP) {
        return false;
    }
    return answer(isConfigBackupTaskRunning);
}

bool System::isRestoreRunningNotQueued(const std::string& /*backend*/) {
    return false;
}

bool System::isCopyToRunningNotQueued(const std::string& backend) {
    if (backend != TIDE_BACKUP) {
        return false;
    }
    // The one application whose copies could run outside of the queue; so far
    // it queues them all.
    return false;
}

} // namespace Backup
} // namespace MARU
