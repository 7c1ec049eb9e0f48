#include "common/json_text.h"

#include <atomic>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>
#include <json/reader.h>
#include <json/value.h>
#include <json/writer.h>

#include "support/random_json.h"

namespace {

using MARU::Backup::appendJson;
using MARU::Backup::appendJsonInteger;
using MARU::Backup::appendJsonString;
using MARU::Backup::fromString;
using MARU::Backup::hasTextForm;
using MARU::Backup::isInt32;
using MARU::Backup::isReadBack;
using MARU::Backup::MAX_NESTING;
using MARU::Backup::member;
using MARU::Backup::memberText;
using MARU::Backup::nestingOf;
using MARU::Backup::toString;

/** A text that may hold NUL bytes, from a literal. */
template <std::size_t SIZE>
std::string bytes(const char (&literal)[SIZE]) {
    return std::string(literal, SIZE - 1);
}

std::string repeated(const std::string& piece, int times) {
    std::string text;
    for (int i = 0; i < times; ++i) {
        text += piece;
    }
    return text;
}

/** `core` inside so many arrays. */
std::string nested(int arrays, const std::string& core) {
    return repeated("[", arrays) + core + repeated("]", arrays);
}

/** The value of a text that is read without a mistake. */
Json::Value parsed(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    return value;
}

std::string everyByte() {
    std::string text;
    for (int code = 0; code < 256; ++code) {
        text += static_cast<char>(code);
    }
    return text;
}

TEST(JsonReader, TakesEveryFormOfStandardJson) {
    const struct {
        std::string text;
        std::string meaning; // as the writer puts it
    } TABLE[] = {
        {"null", "null"},
        {"true", "true"},
        {"false", "false"},
        {"0", "0"},
        {"-1", "-1"},
        {"10", "10"},
        {"9223372036854775807", "9223372036854775807"},
        {"-9223372036854775808", "-9223372036854775808"},
        {"18446744073709551615", "18446744073709551615"},
        {"1.5", "1.5"},
        {"-0.5", "-0.5"},
        {"5e-1", "0.5"},
        {"15E-1", "1.5"},
        {"0.15e+1", "1.5"},
        {"0e0", "0.0"},
        {"\"\"", "\"\""},
        {"\"text\"", "\"text\""},
        {"\"01 +1 1. NaN // no\"", "\"01 +1 1. NaN // no\""},
        {"\"\\\"\\\\\\/\\b\\f\\n\\r\\t\"", "\"\\\"\\\\/\\b\\f\\n\\r\\t\""},
        {"\"\\u0041\\u00e9\\u20AC\"", "\"A\xc3\xa9\xe2\x82\xac\""},
        {"\"\\ud83d\\ude00\"", "\"\xf0\x9f\x98\x80\""},
        {"\"\\u0000\"", "\"\\u0000\""},
        {"[]", "[]"},
        {"{}", "{}"},
        {"[1,[2,{}],\"3\"]", "[1,[2,{}],\"3\"]"},
        {"{\"\":{\"a\":[null,true]}}", "{\"\":{\"a\":[null,true]}}"},
        {" \t\r\n{ \"a\" :\n[ 1 ,\t2 ]\r} \t\r\n", "{\"a\":[1,2]}"},
    };
    for (const auto& row : TABLE) {
        Json::Value value;
        EXPECT_TRUE(fromString(row.text, value)) << row.text;
        EXPECT_EQ(row.meaning, toString(value)) << row.text;
    }
}

TEST(JsonReader, RefusesWhatIsNotStandardJson) {
    const std::string TABLE[] = {
        // nothing, or not all of it
        "", " ", "\n", "{", "[", "\"", "\"abc", "[1", "[1,", "{\"a\"", "{\"a\":", "{\"a\":1", "{\"a\":1,", "tru", "nul",
        // more than one value
        "1 2", "{}{}", "{} x", "[]]", "{}}", "null null", "nullnull", "1,", "\"a\"\"b\"", "{};",
        // commas, colons and brackets in the wrong places
        "}", "]", ",", ":", "[1,]", "[,1]", "[,]", "[1,,2]", "[1 2]", "[1:2]", "[1}", "{\"a\":1]", "{\"a\":1,}",
        "{,\"a\":1}", "{\"a\" 1}", "{\"a\":}", "{:1}", "{\"a\"}", "{\"\":1,}", "{\"a\":1 \"b\":2}", "{\"a\":1:2}",
        // other languages' literals and names
        "True", "NULL", "None", "undefined", "NaN", "Infinity", "-Infinity", "[NaN]", "'a'", "{'a':1}", "{a:1}",
        "{1:2}", "{null:1}", "`a`", "a",
        // numbers
        "01", "-01", "00", "-00", "+1", "+0", ".5", "-.5", "1.", "1.e1", "-", "--1", "1-", "1-2", "1+1", "1e", "1e+",
        "1E-", "0e", "1e1.5", "1.2.3", "0x10", "1_000", "1a", "[01]", "{\"a\":1.}", "{\"a\":+1}",
        // strings
        "\"\\x41\"", "\"\\a\"", "\"\\\"", "\"\\u\"", "\"\\u12\"", "\"\\u12g4\"", "\"\\ud83dx\"", "\"\\ud83d\\u0041\"",
        "\"\\ud83d\\ud83d\"", "\"\\ude00\"", "{\"\\ude00\":1}", "\"a\nb\"", "\"a\tb\"", "\"\x01\"", "\"\x1f\"",
        "{\"a\nb\":1}",
        // other white space, a byte order mark
        "\v1", "1\f", "\u00a01", "\ufeff1", "\ufeff{}"};
    for (const std::string& text : TABLE) {
        Json::Value value;
        EXPECT_FALSE(fromString(text, value)) << text;
    }
}

TEST(JsonReader, RefusesCommentsAnywhere) {
    const char* const TABLE[] = {
        // around the value, or without one
        "/", "/*", "//", "/**/", "// c\n1", "/* c */ 1", "1 // c", "1 // c\n", "1 /* c */", "{} /* c */",
        // in an array
        "[/* c */]", "[// c\n]", "[/* c */ 1]", "[1 /* c */]", "[1 // c\n]", "[1 /* c */, 2]", "[1, /* c */ 2]",
        // in an object
        "{/* c */}", "{// c\n}", "{/* c */ \"a\": 1}", "{\"a\" /* c */: 1}", "{\"a\": /* c */ 1}", "{\"a\": 1 /* c */}",
        "{\"a\": 1 // c\n}", "{\"a\": 1 /* c */, \"b\": 2}", "{\"a\": 1, /* c */ \"b\": 2}"};
    for (const char* text : TABLE) {
        Json::Value value;
        EXPECT_FALSE(fromString(text, value)) << text;
    }
}

TEST(JsonReader, RefusesARawNulByteAnywhere) {
    const std::string TABLE[] = {bytes("\0"),       bytes("\0{}"),        bytes("{}\0"),     bytes("{}\0junk"),
                                 bytes("{}\0{}"),   bytes("{\0}"),        bytes("[1,\0 2]"), bytes("1\0"),
                                 bytes("\"a\0b\""), bytes("{\"a\0\":1}"), bytes("\"\\\0\""), bytes("{} \0 ")};
    for (const std::string& text : TABLE) {
        Json::Value value;
        EXPECT_FALSE(fromString(text, value)) << testing::PrintToString(text);
    }
}

TEST(JsonReader, RefusesANumberThatNoDoubleHolds) {
    for (const char* text : {"1e309", "-1e309", "1e18446744073709551616", "[1e400]"}) {
        Json::Value value;
        EXPECT_FALSE(fromString(text, value)) << text;
    }
}

TEST(JsonReader, ReadsSixtyFourLevelsAndNoMore) {
    Json::Value value;
    EXPECT_TRUE(fromString(nested(64, ""), value));
    EXPECT_FALSE(fromString(nested(65, ""), value));
    EXPECT_TRUE(fromString(repeated("{\"a\":", 63) + "{}" + repeated("}", 63), value));
    EXPECT_FALSE(fromString(repeated("{\"a\":", 64) + "{}" + repeated("}", 64), value));
}

TEST(JsonReader, CountsArraysAndObjectsAsLevelsAndNothingElse) {
    Json::Value value;
    EXPECT_TRUE(fromString(nested(64, "1"), value));
    EXPECT_FALSE(fromString(nested(65, "1"), value));
}

TEST(JsonReader, RefusesARequestFullOfOpeningBracketsWithoutAnException) {
    const std::string TABLE[] = {repeated("[", 16380), repeated("{\"\":", 4095), repeated("[{\"a\":", 2730),
                                 nested(8190, "")};
    for (const std::string& text : TABLE) {
        Json::Value value;
        EXPECT_NO_THROW(EXPECT_FALSE(fromString(text, value)));
    }
}

TEST(JsonReader, ReadsTheNextTextAfterOneThatWasNestedTooDeeply) {
    Json::Value value;
    ASSERT_FALSE(fromString(repeated("[", 1000), value));
    EXPECT_TRUE(fromString("{\"a\":1}", value));
    EXPECT_EQ("{\"a\":1}", toString(value));
}

TEST(JsonReader, TakesTheLastOfAMemberGivenTwice) {
    const Json::Value value = parsed("{\"a\":1,\"b\":[2],\"a\":\"three\",\"c\":{\"d\":4,\"d\":null}}");
    EXPECT_EQ("{\"a\":\"three\",\"b\":[2],\"c\":{\"d\":null}}", toString(value));
}

TEST(JsonReader, ReplacesAnOldValueAsAWhole) {
    Json::Value value = parsed("{\"old\":1,\"both\":2}");
    ASSERT_TRUE(fromString("{\"both\":3}", value));
    EXPECT_EQ("{\"both\":3}", toString(value));
}

TEST(JsonReader, LeavesWhatItReadUpToTheMistake) {
    const struct {
        const char* text;
        const char* left;
    } TABLE[] = {
        {"", "\"old\""},
        {"x", "\"old\""},
        {"// comment", "\"old\""},
        {"1 x", "1"},
        {"{\"a\":1} {", "{\"a\":1}"},
        {"[1,2", "[1,2]"},
        {"{\"a\":1,\"b\"", "{\"a\":1}"},
        {"{\"a\":1,\"b\":2", "{\"a\":1,\"b\":2}"},
        {"{\"a\":01}", "{\"a\":1}"},
    };
    for (const auto& row : TABLE) {
        Json::Value value = "old";
        EXPECT_FALSE(fromString(row.text, value)) << row.text;
        EXPECT_EQ(row.left, toString(value)) << row.text;
    }
}

/** Replaces, removes or inserts a byte somewhere. */
void damage(std::string& text, support::RandomJson& random) {
    const std::size_t at = random.below(static_cast<unsigned int>(text.size()));
    const char byte = "{}[]:,\"\\/ \n019-+.eEutn\x01\xff"[random.below(25)];
    switch (random.below(3)) {
    case 0:
        text[at] = byte;
        break;
    case 1:
        text.erase(at, 1);
        break;
    default:
        text.insert(at, 1, byte);
    }
}

TEST(JsonReader, ReadsAsJsoncppDoesWhatItTakes) {
    const std::unique_ptr<Json::CharReader> reference(Json::CharReaderBuilder().newCharReader());
    support::RandomJson random(4);
    int taken = 0;
    for (int round = 0; round < 10000; ++round) {
        std::string text = random.value(4).toStyledString();
        damage(text, random);
        Json::Value value;
        if (fromString(text, value)) {
            Json::Value expected;
            ASSERT_TRUE(reference->parse(text.data(), text.data() + text.size(), &expected, nullptr)) << text;
            ASSERT_EQ(expected, value) << text;
            ++taken;
        }
    }
    EXPECT_LT(1000, taken);
}

TEST(JsonReader, TakesTheBytesOfAStringAsTheyAre) {
    for (int code = 0x20; code < 256; ++code) {
        const std::string byte(1, static_cast<char>(code));
        if (byte != "\"" && byte != "\\") {
            EXPECT_EQ("<" + byte + ">", parsed("\"<" + byte + ">\"").asString()) << code;
        }
    }
}

TEST(JsonReader, ServesSeveralThreadsAtOnce) {
    std::atomic<int> right{0};
    std::vector<std::thread> threads;
    for (int number = 0; number < 4; ++number) {
        threads.emplace_back([number, &right]() {
            const std::string text = "{\"number\":" + std::to_string(number) + "}";
            for (int i = 0; i < 100; ++i) {
                Json::Value value;
                right += fromString(text, value) && toString(value) == text;
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(400, right);
}

TEST(JsonWriter, IsCompactWithMembersInTheOrderOfTheirNames) {
    const Json::Value value = parsed("{ \"b\" : [ 1 , 2.5 , null ] , \"a\" : { } , \"B\" : \"x y\" , \"ab\" : [ ] }");
    EXPECT_EQ("{\"B\":\"x y\",\"a\":{},\"ab\":[],\"b\":[1,2.5,null]}", toString(value));
}

TEST(JsonWriter, WritesNoLineEnd) {
    const char* const TABLE[] = {"null", "1", "\"a\"", "[]", "{}", "{\"a\":[1]}"};
    for (const char* text : TABLE) {
        EXPECT_EQ(text, toString(parsed(text)));
    }
}

TEST(JsonWriter, EscapesOnlyWhatJsonRequires) {
    EXPECT_EQ("\"\\\"\\\\\\b\\f\\n\\r\\t\\u0000\\u0001\\u001f\"", toString(bytes("\"\\\b\f\n\r\t\0\x01\x1f")));
    EXPECT_EQ("\"a/b\x7f\"", toString("a/b\x7f"));
    EXPECT_EQ("\"\xc3\xa9\xe2\x82\xac\xf0\x9f\x98\x80\"", toString("\xc3\xa9\xe2\x82\xac\xf0\x9f\x98\x80"));
    EXPECT_EQ("\"\x80\xff\xc3\xed\xa0\x80\"", toString("\x80\xff\xc3\xed\xa0\x80"));
    EXPECT_EQ("{\"\\n\xff\":1}", toString(parsed("{\"\\n\xff\":1}")));
}

/** What jsoncpp writes, set up like ours. */
std::string referenceText(const Json::Value& value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["commentStyle"] = "None";
    builder["emitUTF8"] = true;
    return Json::writeString(builder, value);
}

TEST(JsonWriter, WritesAnyValueAsJsoncppDoes) {
    support::RandomJson random(1);
    for (int round = 0; round < 5000; ++round) {
        const Json::Value value = random.value(5);
        ASSERT_EQ(referenceText(value), toString(value));
    }
    const double NUMBERS[] = {0.0,
                              -0.0,
                              1e16,
                              1e17,
                              1e-5,
                              std::numeric_limits<double>::denorm_min(),
                              std::numeric_limits<double>::infinity(),
                              -std::numeric_limits<double>::infinity(),
                              std::numeric_limits<double>::quiet_NaN()};
    for (const double number : NUMBERS) {
        EXPECT_EQ(referenceText(number), toString(number));
    }
}

TEST(JsonWriter, AppendsBehindWhatIsThere) {
    std::string text = "[";
    appendJson(text, parsed("{\"a\":[]}"));
    text += ',';
    appendJsonString(text, "a\nb");
    text += ',';
    appendJsonInteger(text, std::numeric_limits<std::int64_t>::min());
    EXPECT_EQ("[{\"a\":[]},\"a\\nb\",-9223372036854775808", text);
}

TEST(JsonText, IsReadBackExactlyWhereItIsSaidToBe) {
    support::RandomJson random(2);
    for (int round = 0; round < 5000; ++round) {
        const Json::Value value = random.value(4);
        Json::Value back;
        const bool same = fromString(toString(value), back) && back == value;
        ASSERT_EQ(same, isReadBack(value)) << toString(value);
    }
    EXPECT_TRUE(isReadBack(parsed(nested(MAX_NESTING, ""))));
    Json::Value tooDeep;
    tooDeep.append(parsed(nested(MAX_NESTING, "")));
    EXPECT_FALSE(isReadBack(tooDeep));
}

TEST(JsonText, HasEachMemberWhereItIsLookedFor) {
    support::RandomJson random(3);
    for (int round = 0; round < 5000; ++round) {
        const Json::Value object = random.object(4);
        const std::string text = toString(object);
        for (const std::string& name : object.getMemberNames()) {
            ASSERT_EQ(toString(object[name]), memberText(text, name)) << text;
        }
        const std::string other = random.text();
        ASSERT_EQ(object.isMember(other), !memberText(text, other).empty()) << text;
    }
}

TEST(JsonText, BringsBackEveryByteOfAString) {
    const std::string all = everyByte();
    EXPECT_EQ(all, parsed(toString(all)).asString());
    for (const char byte : all) {
        const std::string alone(1, byte);
        EXPECT_EQ(alone, parsed(toString(alone)).asString()) << static_cast<int>(byte);
    }
}

TEST(JsonText, BringsBackEveryByteOfAMembersName) {
    Json::Value object;
    object[everyByte()] = 1;
    const Json::Value back = parsed(toString(object));
    EXPECT_EQ(std::vector<std::string>{everyByte()}, back.getMemberNames());
}

TEST(JsonText, BringsBackNumbersExactly) {
    const Json::Value NUMBERS[] = {
        std::numeric_limits<Json::Int64>::min(),
        std::numeric_limits<Json::Int64>::max(),
        std::numeric_limits<Json::UInt64>::max(),
        0.1,
        1.0,
        1.0 / 3,
        std::numeric_limits<double>::max(),
        std::numeric_limits<double>::min(),
    };
    for (const Json::Value& number : NUMBERS) {
        const Json::Value back = parsed(toString(number));
        EXPECT_EQ(number, back);
        EXPECT_EQ(number.type() == Json::realValue, back.type() == Json::realValue) << number;
    }
}

TEST(JsonText, IsReadBackUnlessItsNestingIsTooDeep) {
    for (const Json::Value& core : {Json::Value(1), Json::Value(Json::arrayValue), Json::Value(Json::objectValue)}) {
        Json::Value value = core;
        for (int level = 0; level < 70; ++level) {
            Json::Value back;
            EXPECT_EQ(nestingOf(value) <= MAX_NESTING, fromString(toString(value), back)) << toString(value);
            Json::Value around;
            (level % 2 == 0 ? around.append(Json::Value()) : around["a"]) = value;
            value = around;
        }
    }
}

TEST(JsonTypes, OnlyIntegersOfThirtyTwoBitsAreInt32) {
    const struct {
        const char* text;
        bool expected;
    } TABLE[] = {
        {"0", true},
        {"1", true},
        {"-1", true},
        {"2147483647", true},
        {"-2147483648", true},
        {"2147483648", false},
        {"-2147483649", false},
        {"4294967295", false},
        {"4294967297", false},
        {"9223372036854775807", false},
        {"18446744073709551615", false},
        {"1.0", false},
        {"0.5", false},
        {"1e2", false},
        {"true", false},
        {"null", false},
        {"\"1\"", false},
        {"[1]", false},
        {"{\"1\":1}", false},
    };
    for (const auto& row : TABLE) {
        EXPECT_EQ(row.expected, isInt32(parsed(row.text))) << row.text;
    }
}

TEST(JsonTypes, AnUnsignedIntegerIsInt32IfItFits) {
    EXPECT_TRUE(isInt32(Json::Value(7U)));
    EXPECT_TRUE(isInt32(Json::Value(Json::UInt64(2147483647))));
    EXPECT_FALSE(isInt32(Json::Value(2147483648U)));
}

TEST(JsonTypes, AllButObjectsAndArraysHaveATextForm) {
    const struct {
        const char* text;
        bool expected;
    } TABLE[] = {
        {"null", true},  {"true", true}, {"5", true},    {"0.5", true}, {"\"\"", true},
        {"\"a\"", true}, {"[]", false},  {"[1]", false}, {"{}", false}, {"{\"a\":1}", false},
    };
    for (const auto& row : TABLE) {
        const Json::Value value = parsed(row.text);
        EXPECT_EQ(row.expected, hasTextForm(value)) << row.text;
        if (row.expected) {
            EXPECT_NO_THROW(value.asString()) << row.text;
        }
    }
}

TEST(JsonTypes, MemberFindsTheMemberOfAnObject) {
    const Json::Value object = parsed("{\"a\":{\"b\":5},\"nothing\":null}");
    EXPECT_EQ(&object["a"], &member(object, "a"));
    EXPECT_EQ(5, member(member(object, "a"), "b").asInt());
    EXPECT_TRUE(member(object, "nothing").isNull());
}

TEST(JsonTypes, MemberOfAnythingElseIsNull) {
    const char* const TABLE[] = {"{}",  "{\"A\":1}", "{\"a\\u0000\":1}", "null", "[]", "[1]", "\"a\"", "5",
                                 "0.5", "true"};
    for (const char* text : TABLE) {
        EXPECT_TRUE(member(parsed(text), "a").isNull()) << text;
    }
}

} // namespace
