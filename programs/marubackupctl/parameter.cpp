#include "parameter.h"

#include <cctype>
#include <memory>

#include <json/reader.h>

namespace {

const int MAX_NESTING = 64;

bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

/** Of what the reader takes for a number, whether it is written as JSON has it: not 01, 1., +1 or -. */
bool isStandardNumber(const std::string& number) {
    const std::size_t start = number[0] == '-' ? 1 : 0;
    const std::size_t point = number.find('.');
    return isDigit(number[start]) && !(number[start] == '0' && isDigit(number[start + 1])) &&
           (point == std::string::npos || isDigit(number[point + 1]));
}

/** Whether the reader was stricter than to take numbers and control characters that JSON does not have. */
bool hasStandardTokens(const std::string& text) {
    bool inString = false;
    for (std::size_t at = 0; at < text.size(); ++at) {
        const char c = text[at];
        if (inString) {
            if (static_cast<unsigned char>(c) < 0x20) {
                return false;
            }
            at += c == '\\' ? 1 : 0;
            inString = c != '"';
        } else if (c == '"') {
            inString = true;
        } else if (isDigit(c) || c == '-' || c == '+') {
            const std::size_t end = text.find_first_not_of("0123456789+-.eE", at);
            if (!isStandardNumber(text.substr(at, end - at))) {
                return false;
            }
            at = (end == std::string::npos ? text.size() : end) - 1;
        }
    }
    return true;
}

bool readJson(const std::string& text, Json::Value& value) {
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["strictRoot"] = false; // a number is a value too
    builder["skipBom"] = false;
    builder["stackLimit"] = MAX_NESTING;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    try {
        return reader->parse(text.data(), text.data() + text.size(), &value, nullptr) && hasStandardTokens(text);
    } catch (const Json::Exception&) {
        return false; // nested too deeply
    }
}

} // namespace

std::string readParameter(const std::string& argument, Json::Value& parameters) {
    const std::size_t sign = argument.find('=');
    if (sign == std::string::npos) {
        return "\"" + argument + "\" is neither name=text nor name:=json";
    }
    const bool asJson = sign > 0 && argument[sign - 1] == ':';
    const std::string name = argument.substr(0, asJson ? sign - 1 : sign);
    if (name.empty()) {
        return "\"" + argument + "\" has no name before the sign";
    }
    const std::string text = argument.substr(sign + 1);
    Json::Value value(text);
    if (asJson && !readJson(text, value)) {
        return "the value of " + name + " is not JSON: " + text + " (a text needs double quotes, or name=text)";
    }
    parameters[name] = value;
    return std::string();
}
