#include "common/json_text.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstddef>
#include <iterator>
#include <memory>

#include <json/reader.h>
#include <json/value.h>
#include <json/writer.h>

namespace MARU {
namespace Backup {

namespace {

std::unique_ptr<Json::CharReader> newReader() {
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["strictRoot"] = false;
    builder["rejectDupKeys"] = false;
    builder["skipBom"] = false;
    builder["collectComments"] = false;
    // It counts the innermost value as a level of its own.
    builder["stackLimit"] = MAX_NESTING + 1;
    return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

/** Advances `at` behind the digits there; false if there are none. */
bool skipDigits(std::string_view text, std::size_t& at) {
    const std::size_t start = at;
    while (at < text.size() && isDigit(text[at])) {
        ++at;
    }
    return at > start;
}

/** Advances `at` behind the number there; false if it is not a JSON number. */
bool skipNumber(std::string_view text, std::size_t& at) {
    const auto next = [&](const char* any) {
        return at < text.size() && std::string(any).find(text[at]) != std::string::npos;
    };
    if (next("-")) {
        ++at;
    }
    const std::size_t integer = at;
    if (!skipDigits(text, at) || (text[integer] == '0' && at > integer + 1)) {
        return false;
    }
    if (next(".")) {
        ++at;
        if (!skipDigits(text, at)) {
            return false;
        }
    }
    if (next("eE")) {
        ++at;
        if (next("+-")) {
            ++at;
        }
        return skipDigits(text, at);
    }
    return true;
}

/** The number in the escape \uXXXX at `at`; -1 if there is none. */
int escapedNumber(std::string_view text, std::size_t at) {
    if (at + 6 > text.size() || text.compare(at, 2, "\\u") != 0) {
        return -1;
    }
    int number = 0;
    const char* const end = text.data() + at + 6;
    return std::from_chars(text.data() + at + 2, end, number, 16).ptr == end ? number : -1;
}

bool isHighSurrogate(int number) {
    return number >= 0xD800 && number <= 0xDBFF;
}

bool isLowSurrogate(int number) {
    return number >= 0xDC00 && number <= 0xDFFF;
}

/** Advances `at` behind the escape there; false if it is half a character alone. */
bool skipEscape(std::string_view text, std::size_t& at) {
    const int number = escapedNumber(text, at);
    at += number < 0 ? 2 : 6;
    if (!isHighSurrogate(number)) {
        return !isLowSurrogate(number);
    }
    const bool whole = isLowSurrogate(escapedNumber(text, at));
    at += 6;
    return whole;
}

/** Advances `at` behind the string there; false if it has a raw control character or half a character. */
bool skipString(std::string_view text, std::size_t& at) {
    for (++at; at < text.size() && text[at] != '"';) {
        if (static_cast<unsigned char>(text[at]) < 0x20) {
            return false;
        }
        if (text[at] != '\\') {
            ++at;
        } else if (!skipEscape(text, at)) {
            return false;
        }
    }
    ++at;
    return true;
}

/** Follows the brackets outside of strings; false at one that opens a level too many. */
bool countNesting(char c, int& depth) {
    if (c == '[' || c == '{') {
        ++depth;
    } else if (c == ']' || c == '}') {
        --depth;
    }
    return depth <= MAX_NESTING;
}

/**
 * jsoncpp reads numbers like 01, 1. and +1, raw control characters in strings,
 * comments in some places also where they are not allowed, makes one character
 * of any two escapes of which the first is a high surrogate, and takes a NUL for
 * the end of the text. This finds what it lets pass; the structure is the
 * reader's to judge.
 */
bool hasOnlyStandardTokens(std::string_view text) {
    int depth = 0;
    for (std::size_t at = 0; at < text.size();) {
        const char c = text[at];
        if (c == '\0' || c == '/' || !countNesting(c, depth)) {
            return false;
        }
        if (c == '"') {
            if (!skipString(text, at)) {
                return false;
            }
        } else if (isDigit(c) || c == '-' || c == '+') {
            if (!skipNumber(text, at)) {
                return false;
            }
        } else {
            ++at;
        }
    }
    return true;
}

} // namespace

bool fromString(std::string_view text, Json::Value& value) {
    thread_local const std::unique_ptr<Json::CharReader> reader = newReader();
    try {
        // The reader always runs: what it leaves behind after a mistake is part
        // of the answer.
        const bool read = reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
        return read && hasOnlyStandardTokens(text);
    } catch (const Json::Exception&) {
        return false; // nested too deeply
    }
}

// The writer

namespace {

/** Whether the byte stands for itself within a string. */
bool isPlain(char c) {
    return static_cast<unsigned char>(c) >= 0x20 && c != '"' && c != '\\';
}

void appendEscape(std::string& out, char c) {
    // The letter that follows the backslash, for those that have one.
    static constexpr std::string_view SPECIAL = "\"\\\b\f\n\r\t";
    static constexpr std::string_view LETTERS = "\"\\bfnrt";
    static constexpr std::string_view DIGITS = "0123456789abcdef";
    out += '\\';
    const std::size_t letter = SPECIAL.find(c);
    if (letter != std::string_view::npos) {
        out += LETTERS[letter];
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
    for (auto at = text.begin(); at != text.end();) {
        const auto special = std::find_if_not(at, text.end(), isPlain);
        out.append(at, special);
        at = special;
        if (at != text.end()) {
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
