// Any text is read or refused, and what was read is written back as a text that
// reads the same.

#include <cstdint>
#include <cstdlib>
#include <string>

#include <json/value.h>

#include "common/json_text.h"

using namespace MARU::Backup;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    Json::Value value;
    if (!fromString(std::string(reinterpret_cast<const char*>(data), size), value)) {
        return 0;
    }
    const std::string text = toString(value);
    Json::Value again;
    if (!fromString(text, again) || toString(again) != text) {
        std::abort();
    }
    return 0;
}
