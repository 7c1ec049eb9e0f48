#pragma once

#include <string>

namespace HOS {

const char TASK_ROOT[] = "/var/run/marutask"; ///< goes with a reboot, as the tasks do
const char TASK_SUFFIX[] = ".json";
const int NO_PID = -1;

/** What the file of a task says. */
struct TaskRecord {
    int pid = NO_PID;
    bool finished = false;
};

/** Whether `name` can name an owner or a task. */
bool isTaskName(const std::string& name);

/** Whether `pid` can stand in a record. */
bool isRecordPid(int pid);

/** The folder with the tasks of `owner`, whose name must be one. */
std::string taskFolder(const std::string& owner);

/** The file of a task, both of whose names must be some. */
std::string taskPath(const std::string& owner, const std::string& id);

/** Reads the file of a task; false, with `record` untouched, if there is none that is in order. */
bool readTask(const std::string& owner, const std::string& id, TaskRecord& record);

} // namespace HOS
