#pragma once

#include <string_view>

namespace MARU {
namespace Backup {

// How the bytes of a string stand in JSON text.

/** What the escapes of one letter stand for; their letters are in the same order. */
constexpr std::string_view ESCAPED_BYTES = "\"\\/\b\f\n\r\t";
constexpr std::string_view ESCAPE_LETTERS = "\"\\/bfnrt";

/** Whether the byte stands for itself within a string. */
constexpr bool standsForItself(char c) {
    return static_cast<unsigned char>(c) >= 0x20 && c != '"' && c != '\\';
}

} // namespace Backup
} // namespace MARU
