#include <taskmanager/task_mgr.h>

#include <dirent.h>

#include <cstddef>
#include <memory>
#include <set>

#include "task_record.h"

namespace HOS {

class TaskMgrPrivate {
public:
    std::string owner;
};

namespace {

/** The id of the task whose file has that name; empty if it is none's. */
std::string idOf(const std::string& fileName) {
    const std::string suffix = TASK_SUFFIX;
    if (fileName.size() < suffix.size()) {
        return std::string();
    }
    const std::size_t idSize = fileName.size() - suffix.size();
    return fileName.compare(idSize, std::string::npos, suffix) == 0 ? fileName.substr(0, idSize) : std::string();
}

std::set<std::string> idsIn(const std::string& folder) {
    std::set<std::string> ids;
    const std::unique_ptr<DIR, int (*)(DIR*)> entries(opendir(folder.c_str()), closedir);
    while (const dirent* const entry = entries ? readdir(entries.get()) : nullptr) {
        ids.insert(idOf(entry->d_name));
    }
    return ids;
}

} // namespace

TaskMgr::TaskMgr(const std::string& owner) : d(new TaskMgrPrivate{owner}) {
}

TaskMgr::~TaskMgr() {
    delete d;
}

Json::Value TaskMgr::getAllTaskId(const std::string& prefix) {
    Json::Value found(Json::arrayValue);
    if (!isTaskName(d->owner)) {
        return found;
    }
    for (const std::string& id : idsIn(taskFolder(d->owner))) {
        TaskRecord record;
        if (id.compare(0, prefix.size(), prefix) == 0 && readTask(d->owner, id, record)) {
            found.append(id);
        }
    }
    return found;
}

} // namespace HOS
