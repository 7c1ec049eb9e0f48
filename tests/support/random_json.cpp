#include "support/random_json.h"

#include <cstdint>
#include <cstring>
#include <limits>

namespace support {

unsigned int RandomJson::below(unsigned int limit) {
    return static_cast<unsigned int>(random() % limit);
}

std::string RandomJson::text() {
    using namespace std::string_literals;
    static const std::string BYTES = "abcABC012 /{}[]:,._-\"\"\\\\\b\f\n\r\t\0\x01\x1f\x7f"s
                                     "\xc3\xa9\xe2\x82\xac\xf0\x9f\x98\x80\x80\xff"s;
    std::string made;
    for (unsigned int left = below(13); left > 0; --left) {
        made += BYTES[below(static_cast<unsigned int>(BYTES.size()))];
    }
    return made;
}

Json::Value RandomJson::number() {
    const std::uint64_t bits = (std::uint64_t{random()} << 32 | random()) >> below(64);
    switch (below(5)) {
    case 0:
        return Json::Value(static_cast<Json::Int64>(bits));
    case 1:
        return Json::Value(static_cast<Json::Int64>(~bits));
    case 2:
        return Json::Value(static_cast<Json::UInt64>(bits));
    case 3:
        return Json::Value(static_cast<double>(static_cast<std::int64_t>(bits)) / 1000);
    default:
        double any = 0;
        std::memcpy(&any, &bits, sizeof any);
        return Json::Value(any);
    }
}

Json::Value RandomJson::array(int levels) {
    Json::Value made(Json::arrayValue);
    for (unsigned int left = below(5); left > 0; --left) {
        made.append(value(levels - 1));
    }
    return made;
}

Json::Value RandomJson::object(int levels) {
    Json::Value made(Json::objectValue);
    for (unsigned int left = below(5); left > 0; --left) {
        const std::string name = text();
        made[name] = value(levels - 1);
    }
    return made;
}

Json::Value RandomJson::value(int levels) {
    switch (below(levels > 0 ? 9 : 6)) {
    case 0:
        return Json::Value();
    case 1:
        return Json::Value(below(2) == 0);
    case 2:
    case 3:
        return number();
    case 4:
    case 5:
        return Json::Value(text());
    case 6:
        return array(levels);
    default:
        return object(levels);
    }
}

} // namespace support
