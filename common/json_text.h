#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace Json {
class Value;
}

namespace MARU {
namespace Backup {

// The library's one reader and one writer of JSON text, and the type tests that
// stand before every read of a value that came from outside.

/** How deep a text may nest. */
constexpr int MAX_NESTING = 64;

/**
 * Reads `text` into `value`. True if the text is exactly one JSON value with
 * nothing but white space around it, nested at most MAX_NESTING levels deep. Bytes are
 * taken as they are, valid UTF-8 or not; of a member given twice the last wins.
 *
 * When it is false, `value` holds what was read up to the mistake, or is
 * unchanged: a caller that must not see half a value parses into a local one.
 */
bool fromString(std::string_view text, Json::Value& value);

/**
 * The text of `value`: compact, members in the order of their names, without a
 * line end. The bytes of a string come out as they are, but for what JSON
 * requires to be escaped.
 */
std::string toString(const Json::Value& value);

// The same, behind what is in `out` already.

void appendJson(std::string& out, const Json::Value& value);
void appendJsonString(std::string& out, std::string_view text);
void appendJsonInteger(std::string& out, std::int64_t number);

/**
 * Whether fromString() brings back exactly `value` from its text. It does not
 * bring back an unsigned type of a small number, a number that is not finite, or
 * what nests too deeply.
 */
bool isReadBack(const Json::Value& value);

/**
 * The text of the member `name` within `object`, the text that toString() made of an
 * object; empty if there is none. It lives as long as `object`.
 */
std::string_view memberText(std::string_view object, std::string_view name);

/** How many levels of arrays and objects `value` has: 0 for a number, 1 for {}. */
int nestingOf(const Json::Value& value);

/** Whether `value` is a JSON integer (not a real like 1.0) of 32 bits. */
bool isInt32(const Json::Value& value);

/** Whether Json::Value::asString() has an answer: not for objects and arrays. */
bool hasTextForm(const Json::Value& value);

/**
 * The member `name` of `object`; null if there is none or `object` is none. The
 * reference lives as long as `object`.
 */
const Json::Value& member(const Json::Value& object, const char* name);

} // namespace Backup
} // namespace MARU
