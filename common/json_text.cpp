#include "common/json_text.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstddef>
#include <iterator>

#include <json/value.h>
#include <json/writer.h>

#include "common/json_string.h"

namespace MARU {
namespace Backup {

// The writer

namespace {

void appendEscape(std::string& out, char c) {
    static constexpr std::string_view DIGITS = "0123456789abcdef";
    out += '\\';
    const std::size_t known = ESCAPED_BYTES.find(c);
    if (known != std::string_view::npos) {
        out += ESCAPE_LETTERS[known];
        return;
    }
    out += "u00";
    out += DIGITS[static_cast<unsigned char>(c) >> 4];
    out += DIGITS[static_cast<unsigned char>(c) & 0xF];
}

template <class Integer>
void appendNumber(std::string& out, Integer number) {
    char digits[24];
    out.append(digits, std::to_chars(std::begin(digits), std::end(digits), number).ptr);
}

/** The bytes of a string. */
std::string_view bytesOf(const Json::Value& text) {
    const char* begin = nullptr;
    const char* end = nullptr;
    text.getString(&begin, &end);
    return {begin, static_cast<std::size_t>(end - begin)};
}

/** The name of the member that `entry` is at. */
std::string_view nameOf(const Json::Value::const_iterator& entry) {
    const char* end = nullptr;
    const char* const begin = entry.memberName(&end);
    return {begin, static_cast<std::size_t>(end - begin)};
}

void appendArray(std::string& out, const Json::Value& array) {
    char before = '[';
    for (const Json::Value& element : array) {
        out += before;
        appendJson(out, element);
        before = ',';
    }
    out += array.empty() ? "[]" : "]";
}

void appendObject(std::string& out, const Json::Value& object) {
    char before = '{';
    for (auto entry = object.begin(); entry != object.end(); ++entry) {
        out += before;
        appendJsonString(out, nameOf(entry));
        out += ':';
        appendJson(out, *entry);
        before = ',';
    }
    out += object.empty() ? "{}" : "}";
}

} // namespace

void appendJsonString(std::string& out, std::string_view text) {
    out += '"';
    const char* const end = text.data() + text.size();
    for (const char* at = text.data(); at != end;) {
        const char* const special = behindPlainBytes(at, end);
        out.append(at, special);
        at = special;
        if (at != end) {
            appendEscape(out, *at++);
        }
    }
    out += '"';
}

void appendJsonInteger(std::string& out, std::int64_t number) {
    appendNumber(out, number);
}

void appendJson(std::string& out, const Json::Value& value) {
    switch (value.type()) {
    case Json::nullValue:
        out += "null";
        break;
    case Json::intValue:
        appendNumber(out, value.asLargestInt());
        break;
    case Json::uintValue:
        appendNumber(out, value.asLargestUInt());
        break;
    case Json::realValue:
        out += Json::valueToString(value.asDouble());
        break;
    case Json::stringValue:
        appendJsonString(out, bytesOf(value));
        break;
    case Json::booleanValue:
        out += value.asBool() ? "true" : "false";
        break;
    case Json::arrayValue:
        appendArray(out, value);
        break;
    case Json::objectValue:
        appendObject(out, value);
        break;
    }
}

std::string toString(const Json::Value& value) {
    std::string text;
    appendJson(text, value);
    return text;
}

// Texts that the writer made

namespace {

bool isReadBackBelow(const Json::Value& value, int levels) {
    switch (value.type()) {
    case Json::uintValue:
        return value.asLargestUInt() > static_cast<Json::LargestUInt>(Json::Value::maxLargestInt);
    case Json::realValue:
        return std::isfinite(value.asDouble());
    case Json::arrayValue:
    case Json::objectValue:
        return levels > 0 && std::all_of(value.begin(), value.end(), [levels](const Json::Value& element) {
                   return isReadBackBelow(element, levels - 1);
               });
    default:
        return true;
    }
}

/** Behind the string at `at`. */
std::size_t behindString(std::string_view text, std::size_t at) {
    for (++at; text[at] != '"'; ++at) {
        if (text[at] == '\\') {
            ++at;
        }
    }
    return at + 1;
}

/** Behind the value at `at`, which is a member's. */
std::size_t behindValue(std::string_view text, std::size_t at) {
    int depth = 0;
    while (depth > 0 || (text[at] != ',' && text[at] != '}')) {
        const char c = text[at];
        if (c == '"') {
            at = behindString(text, at);
            continue;
        }
        if (c == '[' || c == '{') {
            ++depth;
        } else if (c == ']' || c == '}') {
            --depth;
        }
        ++at;
    }
    return at;
}

} // namespace

bool isReadBack(const Json::Value& value) {
    return isReadBackBelow(value, MAX_NESTING);
}

std::string_view memberText(std::string_view object, std::string_view name) {
    std::string quoted;
    appendJsonString(quoted, name);
    // Each member but the last has a comma behind it, and the name stands behind that or the first brace.
    for (std::size_t at = 1; at < object.size() && object[at] == '"';) {
        const std::size_t colon = behindString(object, at);
        const std::size_t end = behindValue(object, colon + 1);
        if (object.substr(at, colon - at) == quoted) {
            return object.substr(colon + 1, end - colon - 1);
        }
        at = end + 1;
    }
    return {};
}

// Types

int nestingOf(const Json::Value& value) {
    if (!value.isArray() && !value.isObject()) {
        return 0;
    }
    int deepest = 0;
    for (const Json::Value& element : value) {
        deepest = std::max(deepest, nestingOf(element));
    }
    return deepest + 1;
}

bool isInt32(const Json::Value& value) {
    const bool integer = value.type() == Json::intValue || value.type() == Json::uintValue;
    return integer && value.isInt();
}

bool hasTextForm(const Json::Value& value) {
    return !value.isArray() && !value.isObject();
}

const Json::Value& member(const Json::Value& object, const char* name) {
    return object.isObject() ? object[name] : Json::Value::nullSingleton();
}

} // namespace Backup
} // namespace MARU
