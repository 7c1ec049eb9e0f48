#include <taskmanager/task_file.h>

#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdio>

#include "task_record.h"

namespace HOS {

namespace {

const mode_t FOLDER_MODE = 0755;
const mode_t FILE_MODE = 0644;

bool refuse(int error) {
    errno = error;
    return false;
}

bool makeFolder(const std::string& path) {
    return mkdir(path.c_str(), FOLDER_MODE) == 0 || errno == EEXIST;
}

bool writeAll(int fd, const std::string& text) {
    for (std::size_t at = 0; at < text.size();) {
        const ssize_t written = write(fd, text.data() + at, text.size() - at);
        if (written < 0 && errno != EINTR) {
            return false;
        }
        at += written > 0 ? static_cast<std::size_t>(written) : 0;
    }
    return true;
}

/** Replaces the file `path`, in `folder`, at one stroke. */
bool replaceFile(const std::string& folder, const std::string& path, const std::string& text) {
    std::string unfinished = folder + "/.unfinished-XXXXXX"; // without the suffix of a task
    const int fd = mkostemp(&unfinished[0], O_CLOEXEC);
    if (fd < 0) {
        return false;
    }
    const bool written = writeAll(fd, text) && fchmod(fd, FILE_MODE) == 0;
    const bool done = written && std::rename(unfinished.c_str(), path.c_str()) == 0;
    const int error = errno;
    close(fd);
    if (!done) {
        unlink(unfinished.c_str());
    }
    errno = error;
    return done;
}

bool writeTask(const std::string& owner, const std::string& id, const TaskRecord& record) {
    const std::string finished = record.finished ? "true" : "false";
    const std::string text = "{\"pid\": " + std::to_string(record.pid) + ", \"finished\": " + finished + "}\n";
    return replaceFile(taskFolder(owner), taskPath(owner, id), text);
}

} // namespace

bool TaskFile::create(const std::string& owner, const std::string& id, int pid) {
    if (!isTaskName(owner) || !isTaskName(id) || !isRecordPid(pid)) {
        return refuse(EINVAL);
    }
    TaskRecord record;
    record.pid = pid;
    return makeFolder(TASK_ROOT) && makeFolder(taskFolder(owner)) && writeTask(owner, id, record);
}

bool TaskFile::finish(const std::string& owner, const std::string& id) {
    if (!isTaskName(owner) || !isTaskName(id)) {
        return refuse(EINVAL);
    }
    TaskRecord record;
    if (!readTask(owner, id, record)) {
        return refuse(ENOENT);
    }
    record.finished = true;
    return writeTask(owner, id, record);
}

bool TaskFile::remove(const std::string& owner, const std::string& id) {
    if (!isTaskName(owner) || !isTaskName(id)) {
        return refuse(EINVAL);
    }
    return unlink(taskPath(owner, id).c_str()) == 0;
}

} // namespace HOS
