#pragma once

#include <string>

#include <taskmanager/export.h>

namespace HOS {

class TaskPrivate;

// One task, named by its owner and its id. An owner or an id that is empty, "."
// or "..", or that holds "/" or NUL, names no task. Nothing blocks, and nothing
// throws but a failed allocation.

/** Questions about tasks that are not opened. May be asked from several threads at once. */
class TASKMANAGER_API TaskUtil {
public:
    /** Whether `owner` has a task `id`, finished or not. */
    static bool checkTaskExists(const std::string& owner, const std::string& id);
};

/**
 * One task as it was when the object was made. What is not there counts as
 * finished, by nobody known. Different threads use different objects.
 */
class TASKMANAGER_API Task {
public:
    Task(const std::string& owner, const std::string& id);
    ~Task();
    Task(const Task&) = delete;
    Task& operator=(const Task&) = delete;

    /** The process that made the task, alive or not; -1 if that is not known. */
    int getCreatePid();
    bool isFinished();

private:
    TaskPrivate* d;
};

} // namespace HOS
