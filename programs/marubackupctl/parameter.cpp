#include "parameter.h"

#include "common/json_text.h"

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
    if (asJson && !MARU::Backup::fromString(text, value)) {
        return "the value of " + name + " is not JSON: " + text + " (a text needs double quotes, or name=text)";
    }
    parameters[name] = value;
    return std::string();
}
