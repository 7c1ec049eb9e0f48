#include <algorithm>
#include <charconv>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

#include <json/reader.h>
#include <json/value.h>

#include "common/json_string.h"
#include "common/json_text.h"

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

/** jsoncpp's reader: for what it leaves behind after a mistake, and for the rare number that is no integer. */
bool readByJsoncpp(std::string_view text, Json::Value& value) {
    thread_local const std::unique_ptr<Json::CharReader> reader = newReader();
    return reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
}

bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

bool isHighSurrogate(unsigned int code) {
    return code >= 0xD800 && code <= 0xDBFF;
}

bool isLowSurrogate(unsigned int code) {
    return code >= 0xDC00 && code <= 0xDFFF;
}

void appendUtf8(std::string& out, unsigned int code) {
    const auto last = [](unsigned int bits) { return static_cast<char>(0x80 | (bits & 0x3F)); };
    if (code < 0x80) {
        out += static_cast<char>(code);
    } else if (code < 0x800) {
        out += {static_cast<char>(0xC0 | code >> 6), last(code)};
    } else if (code < 0x10000) {
        out += {static_cast<char>(0xE0 | code >> 12), last(code >> 6), last(code)};
    } else {
        out += {static_cast<char>(0xF0 | code >> 18), last(code >> 12), last(code >> 6), last(code)};
    }
}

/**
 * Reads standard JSON and nothing else, in one pass. jsoncpp's reader passes
 * over numbers like 01, 1. and +1, raw control characters in strings, halves of
 * characters, some comments, and what stands behind a NUL.
 */
class StrictReader {
public:
    explicit StrictReader(std::string_view text) : at(text.data()), end(text.data() + text.size()) {
    }

    /** Whether the text was one value. */
    bool read(Json::Value& value) {
        return readValue(value, MAX_NESTING) && peek() == '\0' && at == end;
    }

private:
    /** The next byte that is no white space; NUL at the end. */
    char peek() {
        while (at != end && (*at == ' ' || *at == '\n' || *at == '\r' || *at == '\t')) {
            ++at;
        }
        return at != end ? *at : '\0';
    }

    /** Takes `wanted`, if that is the next byte that is no white space. */
    bool take(char wanted) {
        if (peek() != wanted) {
            return false;
        }
        ++at;
        return true;
    }

    bool readValue(Json::Value& value, int levels) {
        switch (peek()) {
        case '{':
            return levels > 0 && readObject(value, levels - 1);
        case '[':
            return levels > 0 && readArray(value, levels - 1);
        case '"': {
            std::string_view text;
            if (!readString(text)) {
                return false;
            }
            value = Json::Value(text.data(), text.data() + text.size());
            return true;
        }
        case 't':
            return readWord("true", true, value);
        case 'f':
            return readWord("false", false, value);
        case 'n':
            return readWord("null", Json::Value(), value);
        default:
            return readNumber(value);
        }
    }

    bool readObject(Json::Value& object, int levels) {
        object = Json::Value(Json::objectValue);
        ++at;
        if (take('}')) {
            return true;
        }
        do {
            std::string_view name;
            if (peek() != '"' || !readString(name)) {
                return false;
            }
            Json::Value& member = *object.demand(name.data(), name.data() + name.size());
            if (!take(':') || !readValue(member, levels)) {
                return false;
            }
        } while (take(','));
        return take('}');
    }

    bool readArray(Json::Value& array, int levels) {
        array = Json::Value(Json::arrayValue);
        ++at;
        if (take(']')) {
            return true;
        }
        do {
            if (!readValue(array.append(Json::Value()), levels)) {
                return false;
            }
        } while (take(','));
        return take(']');
    }

    bool readWord(std::string_view word, const Json::Value& meaning, Json::Value& value) {
        if (std::string_view(at, static_cast<std::size_t>(end - at)).substr(0, word.size()) != word) {
            return false;
        }
        at += word.size();
        value = meaning;
        return true;
    }

    /** Reads a string. `text` is good until the next one is read. */
    bool readString(std::string_view& text) {
        ++at;
        const char* start = skipPlain();
        if (at != end && *at == '"') {
            text = std::string_view(start, static_cast<std::size_t>(at++ - start));
            return true;
        }
        unescaped.assign(start, at);
        while (at != end && *at == '\\') {
            if (!readEscape()) {
                return false;
            }
            start = skipPlain();
            unescaped.append(start, at);
        }
        text = unescaped;
        return at != end && *at++ == '"';
    }

    /** Passes over bytes that stand for themselves; the first of them. */
    const char* skipPlain() {
        const char* const start = at;
        at = behindPlainBytes(at, end);
        return start;
    }

    bool readEscape() {
        if (++at == end) {
            return false;
        }
        const char letter = *at++;
        if (letter == 'u') {
            return readCodePoint();
        }
        const std::size_t known = ESCAPE_LETTERS.find(letter);
        if (known == std::string_view::npos) {
            return false;
        }
        unescaped += ESCAPED_BYTES[known];
        return true;
    }

    /** Reads what stands behind \u, and the second half of a character if that was the first. */
    bool readCodePoint() {
        unsigned int code = 0;
        if (!readHex(code) || isLowSurrogate(code)) {
            return false;
        }
        if (isHighSurrogate(code)) {
            unsigned int low = 0;
            if (end - at < 2 || *at++ != '\\' || *at++ != 'u' || !readHex(low) || !isLowSurrogate(low)) {
                return false;
            }
            code = 0x10000 + ((code & 0x3FF) << 10) + (low & 0x3FF);
        }
        appendUtf8(unescaped, code);
        return true;
    }

    bool readHex(unsigned int& code) {
        if (end - at < 4 || std::from_chars(at, at + 4, code, 16).ptr != at + 4) {
            return false;
        }
        at += 4;
        return true;
    }

    bool skipDigits() {
        const char* const start = at;
        at = std::find_if_not(at, end, isDigit);
        return at != start;
    }

    bool isAt(char one, char other) const {
        return at != end && (*at == one || *at == other);
    }

    bool readNumber(Json::Value& value) {
        const char* const start = at;
        at += isAt('-', '-') ? 1 : 0;
        const char* const digits = at;
        if (!skipDigits() || (*digits == '0' && at != digits + 1)) {
            return false;
        }
        if (!isAt('.', 'e') && !isAt('E', 'E')) {
            return setInteger(start, value) || setReal(start, value);
        }
        if (isAt('.', '.')) {
            ++at;
            if (!skipDigits()) {
                return false;
            }
        }
        if (isAt('e', 'E')) {
            ++at;
            at += isAt('+', '-') ? 1 : 0;
            if (!skipDigits()) {
                return false;
            }
        }
        return setReal(start, value);
    }

    /** False if no integer of 64 bits holds the digits from `start` up to here. */
    bool setInteger(const char* start, Json::Value& value) const {
        Json::LargestInt number = 0;
        if (std::from_chars(start, at, number).ec == std::errc()) {
            value = number;
            return true;
        }
        Json::LargestUInt large = 0;
        if (*start == '-' || std::from_chars(start, at, large).ec != std::errc()) {
            return false;
        }
        value = large;
        return true;
    }

    /** False if the number from `start` up to here is too large. */
    bool setReal(const char* start, Json::Value& value) const {
        return readByJsoncpp(std::string_view(start, static_cast<std::size_t>(at - start)), value);
    }

    const char* at;
    const char* const end;
    std::string unescaped;
};

} // namespace

bool fromString(std::string_view text, Json::Value& value) {
    try {
        Json::Value whole;
        if (StrictReader(text).read(whole)) {
            value = std::move(whole);
            return true;
        }
        // What jsoncpp's reader leaves behind after a mistake is part of the answer.
        readByJsoncpp(text, value);
    } catch (const Json::Exception&) {
        // nested too deeply
    }
    return false;
}

} // namespace Backup
} // namespace MARU
