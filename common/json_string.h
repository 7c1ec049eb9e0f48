#pragma once

#include <array>
#include <cstddef>
#include <string_view>

namespace MARU {
namespace Backup {

// How the bytes of a string stand in JSON text.

/** What the escapes of one letter stand for; their letters are in the same order. */
constexpr std::string_view ESCAPED_BYTES = "\"\\/\b\f\n\r\t";
constexpr std::string_view ESCAPE_LETTERS = "\"\\/bfnrt";

/** For each byte, whether it stands for itself within a string. */
constexpr std::array<bool, 256> standingForItself() {
    std::array<bool, 256> table = {};
    for (std::size_t code = 0x20; code < table.size(); ++code) {
        table[code] = code != '"' && code != '\\';
    }
    return table;
}
constexpr std::array<bool, 256> STANDS_FOR_ITSELF = standingForItself();

/** Where the bytes that stand for themselves end, from `at` on. */
inline const char* behindPlainBytes(const char* at, const char* end) {
    while (at != end && STANDS_FOR_ITSELF[static_cast<unsigned char>(*at)]) {
        ++at;
    }
    return at;
}

} // namespace Backup
} // namespace MARU
