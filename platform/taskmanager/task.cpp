#include <taskmanager/task.h>

#include "task_record.h"

namespace HOS {

class TaskPrivate {
public:
    TaskRecord record;
};

bool TaskUtil::checkTaskExists(const std::string& owner, const std::string& id) {
    TaskRecord record;
    return readTask(owner, id, record);
}

Task::Task(const std::string& owner, const std::string& id) : d(new TaskPrivate) {
    d->record.finished = true;
    readTask(owner, id, d->record);
}

Task::~Task() {
    delete d;
}

int Task::getCreatePid() {
    return d->record.pid;
}

bool Task::isFinished() {
    return d->record.finished;
}

} // namespace HOS
