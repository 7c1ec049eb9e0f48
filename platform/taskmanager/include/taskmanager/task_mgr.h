#pragma once

#include <string>

#include <json/value.h>

#include <taskmanager/export.h>

namespace HOS {

class TaskMgrPrivate;

/**
 * All tasks of one owner (a user, or a group as in "@administrators"). A task is
 * work that some process of the appliance has taken on; `docs/platform.md` says
 * what makes one visible.
 *
 * Different threads use different objects. Nothing is kept between calls: each
 * looks at the tasks as they are then. Nothing blocks, and nothing throws but a
 * failed allocation.
 */
class TASKMANAGER_API TaskMgr {
public:
    explicit TaskMgr(const std::string& owner);
    ~TaskMgr();
    TaskMgr(const TaskMgr&) = delete;
    TaskMgr& operator=(const TaskMgr&) = delete;

    /**
     * The ids of the owner's tasks that begin with `prefix`, finished ones
     * included: a JSON array of strings, sorted by their bytes. Empty if there
     * is none, or if the owner's tasks cannot be read.
     */
    Json::Value getAllTaskId(const std::string& prefix);

private:
    TaskMgrPrivate* d;
};

} // namespace HOS
