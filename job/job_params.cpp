#include "job/job_params.h"

#include <string_view>

#include "common/json_text.h"

namespace MARU {
namespace Backup {

namespace {

std::unique_ptr<Json::Value> copyOf(const std::unique_ptr<Json::Value>& value) {
    return value ? std::make_unique<Json::Value>(*value) : nullptr;
}

/** The value of a text that is known to be one. */
Json::Value valueOf(std::string_view text) {
    Json::Value value;
    fromString(text, value);
    return value;
}

} // namespace

JobParams::JobParams(const JobParams& other) : text(other.text), value(copyOf(other.value)) {
}

JobParams& JobParams::operator=(const JobParams& other) {
    text = other.text;
    value = copyOf(other.value);
    return *this;
}

void JobParams::assign(const Json::Value& object) {
    if (isReadBack(object)) {
        text = toString(object);
        text.shrink_to_fit();
        value.reset();
    } else {
        value = std::make_unique<Json::Value>(object);
    }
}

void JobParams::set(const std::string& name, const Json::Value& newValue) {
    if (!value) {
        value = std::make_unique<Json::Value>(valueOf(text));
    }
    (*value)[name] = newValue;
}

bool JobParams::has(const std::string& name) const {
    return value ? value->isMember(name) : !memberText(text, name).empty();
}

bool JobParams::get(const std::string& name, Json::Value& found) const {
    if (value) {
        if (!value->isMember(name)) {
            return false;
        }
        found = (*value)[name];
        return true;
    }
    const std::string_view member = memberText(text, name);
    return !member.empty() && fromString(member, found);
}

Json::Value JobParams::all() const {
    return value ? *value : valueOf(text);
}

void JobParams::appendTo(std::string& out) const {
    if (value) {
        appendJson(out, *value);
    } else {
        out += text;
    }
}

} // namespace Backup
} // namespace MARU
