#include "task_record.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <memory>

#include <json/reader.h>
#include <json/value.h>

namespace HOS {

namespace {

const std::size_t MAX_FILE_SIZE = 64 * 1024;
const int MAX_NESTING = 64;

/** Reads all of `fd`; false if that fails, or if it is more than a task's file ever holds. */
bool readAll(int fd, std::string& text) {
    char buffer[4096];
    for (;;) {
        const ssize_t got = read(fd, buffer, sizeof buffer);
        if (got == 0) {
            return true;
        }
        if (got < 0 && errno != EINTR) {
            return false;
        }
        if (got > 0) {
            text.append(buffer, static_cast<std::size_t>(got));
        }
        if (text.size() > MAX_FILE_SIZE) {
            return false;
        }
    }
}

bool readRegularFile(const std::string& path, std::string& text) {
    // Anything may stand in the folder; a FIFO must not make us wait for its writer.
    const int fd = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
    if (fd < 0) {
        return false;
    }
    struct stat info = {};
    const bool done = fstat(fd, &info) == 0 && S_ISREG(info.st_mode) && readAll(fd, text);
    close(fd);
    return done;
}

bool parse(const std::string& text, Json::Value& value) {
    if (text.find('\0') != std::string::npos) { // the reader would take it for the end
        return false;
    }
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["stackLimit"] = MAX_NESTING;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    try {
        return reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
    } catch (const Json::Exception&) {
        return false; // nested too deeply
    }
}

bool isPid(const Json::Value& value) {
    const bool integer = value.type() == Json::intValue || value.type() == Json::uintValue;
    return integer && value.isInt() && isRecordPid(value.asInt());
}

} // namespace

bool isTaskName(const std::string& name) {
    return !name.empty() && name != "." && name != ".." && name.find('/') == std::string::npos &&
           name.find('\0') == std::string::npos;
}

bool isRecordPid(int pid) {
    return pid > 0 || pid == NO_PID;
}

std::string taskFolder(const std::string& owner) {
    return std::string(TASK_ROOT) + "/" + owner;
}

std::string taskPath(const std::string& owner, const std::string& id) {
    return taskFolder(owner) + "/" + id + TASK_SUFFIX;
}

bool readTask(const std::string& owner, const std::string& id, TaskRecord& record) {
    std::string text;
    Json::Value json;
    if (!isTaskName(owner) || !isTaskName(id) || !readRegularFile(taskPath(owner, id), text) || !parse(text, json) ||
        !json.isObject()) {
        return false;
    }
    const Json::Value& pid = json["pid"];
    const Json::Value finished = json.get("finished", false);
    if (!isPid(pid) || !finished.isBool()) {
        return false;
    }
    record.pid = pid.asInt();
    record.finished = finished.asBool();
    return true;
}

} // namespace HOS
