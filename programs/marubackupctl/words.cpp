#include "words.h"

#include <cstdio>
#include <cwchar>
#include <cwctype>

#include <json/writer.h>

using MARU::Backup::Job;

const std::array<Job::Action, 7> ACTIONS = {
    Job::ACTION_BACKUP,         Job::ACTION_RESTORE,     Job::ACTION_COPY_TO,        Job::ACTION_RELINK,
    Job::ACTION_REMOVE_VERSION, Job::ACTION_REMOVE_TASK, Job::ACTION_TARGET_COPY_TO,
};

Job::Action actionNamed(const std::string& name) {
    for (const Job::Action action : ACTIONS) {
        if (action2str(action) == name) {
            return action;
        }
    }
    return Job::ACTION_NONE;
}

std::string statusName(Job::Status status) {
    switch (status) {
    case Job::STATUS_NONE:
        return "none";
    case Job::STATUS_QUEUED:
        return "queued";
    case Job::STATUS_RUNNING:
        return "running";
    case Job::STATUS_STOPPING:
        return "stopping";
    }
    return std::to_string(static_cast<int>(status));
}

namespace {

std::string octal(const std::string& bytes) {
    std::string escaped;
    for (const char byte : bytes) {
        char digits[5];
        std::snprintf(digits, sizeof digits, "\\%03o", static_cast<unsigned>(static_cast<unsigned char>(byte)));
        escaped += digits;
    }
    return escaped;
}

} // namespace

std::string printable(const std::string& text) {
    std::string shown;
    std::mbstate_t state = {};
    for (std::size_t at = 0; at < text.size();) {
        wchar_t character = 0;
        std::size_t length = std::mbrtowc(&character, text.data() + at, text.size() - at, &state);
        const bool valid = length != 0 && length <= text.size() - at;
        if (!valid) {
            length = 1;
            state = {};
        }
        const std::string bytes = text.substr(at, length);
        const bool visible = valid && std::iswprint(static_cast<std::wint_t>(character)) != 0;
        shown += bytes == "\\" ? "\\\\" : visible ? bytes : octal(bytes);
        at += length;
    }
    return shown;
}

std::string joined(const std::vector<std::string>& texts, const std::string& separator) {
    std::string row;
    for (const std::string& text : texts) {
        row += (row.empty() ? "" : separator) + text;
    }
    return row;
}

std::string toLine(const Json::Value& json) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, json);
}
