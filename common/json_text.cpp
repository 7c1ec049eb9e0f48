#include "common/json_text.h"

#include <algorithm>
#include <charconv>
#include <cstddef>
#include <memory>
#include <sstream>

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

std::unique_ptr<Json::StreamWriter> newWriter() {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["commentStyle"] = "None";
    builder["emitUTF8"] = true;
    return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
}

bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

/** Advances `at` behind the digits there; false if there are none. */
bool skipDigits(const std::string& text, std::size_t& at) {
    const std::size_t start = at;
    while (at < text.size() && isDigit(text[at])) {
        ++at;
    }
    return at > start;
}

/** Advances `at` behind the number there; false if it is not a JSON number. */
bool skipNumber(const std::string& text, std::size_t& at) {
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
int escapedNumber(const std::string& text, std::size_t at) {
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
bool skipEscape(const std::string& text, std::size_t& at) {
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
bool skipString(const std::string& text, std::size_t& at) {
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
bool hasOnlyStandardTokens(const std::string& text) {
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

bool fromString(const std::string& text, Json::Value& value) {
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

std::string toString(const Json::Value& value) {
    thread_local const std::unique_ptr<Json::StreamWriter> writer = newWriter();
    std::ostringstream out;
    writer->write(value, &out);
    return out.str();
}

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
