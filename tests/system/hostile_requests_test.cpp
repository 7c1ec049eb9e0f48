// What no well-meaning client asks: each request gets the code that it deserves,
// and neither the daemon nor its jobs take harm.

#include <algorithm>
#include <limits>
#include <ostream>
#include <sstream>

#include "hostile_test.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/named_rows.h"

using namespace MARU::Backup;
using support::SocketPeer;

using HostileRequests = HostileTest;

namespace {

/** `head`, as many times `piece` as fit into a request, and `tail`. */
std::string filled(const std::string& piece, const std::string& head = "", const std::string& tail = "") {
    std::string text = head;
    while (text.size() + piece.size() + tail.size() <= MAX_REQUEST) {
        text += piece;
    }
    return text + tail;
}

// Texts

struct Text {
    const char* name;
    std::string request;
    int code;

    friend std::ostream& operator<<(std::ostream& out, const Text& row) {
        return out << row.name;
    }
};

class HostileText : public HostileRequests, public testing::WithParamInterface<Text> {};

const Text TEXTS[] = {
    {"OpenArrays", filled("["), 400},
    {"OpenObjects", filled("{\"a\":"), 400},
    {"OpenBraces", filled("{"), 400},
    {"OpenBoth", filled("[{\"\":"), 400},
    {"ClosingBrackets", filled("]"), 400},
    {"BalancedArrays", std::string(MAX_REQUEST / 2, '[') + std::string(MAX_REQUEST / 2, ']'), 400},
    {"QuotationMarks", filled("\""), 400},
    {"Backslashes", filled("\\", "\""), 400},
    {"Escapes", filled("\\u0000", "\"", "\""), 400},
    {"Digits", filled("9"), 400},
    {"Minuses", filled("-"), 400},
    {"Fraction", filled("9", "0."), 400},
    {"NulBytes", filled(NUL), 400},
    {"BytesOfOnes", filled("\xff"), 400},
    {"Blanks", filled(" "), 400},
    {"Commas", filled("0,", "[", "0]"), 400},
    {"Comment", filled("*", "/*", "*/"), 400},
    {"LongText", filled("a", "\"", "\""), 400},

    {"RequestBehindANul", NUL + LIST_REQUEST, 400},
    {"NulBehindARequest", LIST_REQUEST + NUL, 400},
    {"ByteOrderMark", "\xef\xbb\xbf" + LIST_REQUEST, 400},
    {"TwoRequests", LIST_REQUEST + LIST_REQUEST, 400},
    {"HalfARequest", LIST_REQUEST.substr(0, LIST_REQUEST.size() - 1), 400},
    {"RequestInAnArray", "[" + LIST_REQUEST + "]", 400},

    {"NestedOperation", filled("[", "{\"op\":"), 400},
    {"NestedFilter", filled("[", "{\"op\":\"job_list\",\"backend\":"), 400},
    {"NestedParameter",
     enqueue({{"backend", "\"gated\""},
              {"action", "8"},
              {"status", "0"},
              {"param", "{\"gate\":" + repeated("[", 61) + repeated("]", 61) + "}"}}),
     400},
    {"IdOfManyDigits", filled("1", "{\"op\":\"job_get\",\"job_id\":", "}"), 400},
    {"StatusOfManyDigits", filled("1", "{\"op\":\"job_enqueue\",\"job\":{\"status\":", "}}"), 400},
    {"LongOperation", filled("job_list", "{\"op\":\"", "\"}"), 501},
    {"LongMember", filled("a", "{\"op\":\"job_list\",\"", "\":0}"), 200},
    {"ManyMembers", filled(",\"backend\":\"\"", "{\"op\":\"job_list\"", "}"), 200},
    {"LongFilter", filled("a", "{\"op\":\"job_list\",\"unique\":\"", "\"}"), 200},
    {"ManyVariables", filled("{{BACKEND}}", "{\"op\":\"job_list\",\"target\":\"x\",\"format\":\"", "\"}"), 200},
    {"OpenVariables", filled("{{", "{\"op\":\"job_list\",\"target\":\"x\",\"format\":\"", "\"}"), 200},
};

INSTANTIATE_TEST_SUITE_P(Of, HostileText, testing::ValuesIn(TEXTS), support::NameOfRow());

} // namespace

TEST_P(HostileText, GetsItsCode) {
    const Text& row = GetParam();
    ASSERT_GE(MAX_REQUEST, row.request.size());
    expectCode(row.code, row.request);
    expectUnharmed();
}

// Types

namespace {

/** What a member can be, as far as any rule tells it apart. */
enum class Kind { ABSENT, NOTHING, BOOLEAN, POSITIVE, ZERO, NEGATIVE, OTHER_NUMBER, TEXT, ARRAY, OBJECT, NOT_JSON };

struct Sample {
    Kind kind;
    const char* json;
};

// Integers are those of 32 bits. One written as a real is none.
const Sample SAMPLES[] = {
    {Kind::ABSENT, ""},
    {Kind::NOTHING, "null"},
    {Kind::BOOLEAN, "true"},
    {Kind::BOOLEAN, "false"},
    {Kind::POSITIVE, "7"},
    {Kind::POSITIVE, "2147483647"},
    {Kind::ZERO, "0"},
    {Kind::ZERO, "-0"},
    {Kind::NEGATIVE, "-7"},
    {Kind::NEGATIVE, "-2147483648"},
    {Kind::OTHER_NUMBER, "2147483648"},
    {Kind::OTHER_NUMBER, "-2147483649"},
    {Kind::OTHER_NUMBER, "4294967296"},
    {Kind::OTHER_NUMBER, "4294967297"},
    {Kind::OTHER_NUMBER, "9223372036854775807"},
    {Kind::OTHER_NUMBER, "9223372036854775808"},
    {Kind::OTHER_NUMBER, "-9223372036854775809"},
    {Kind::OTHER_NUMBER, "18446744073709551615"},
    {Kind::OTHER_NUMBER, "18446744073709551616"},
    {Kind::OTHER_NUMBER, "1e308"},
    {Kind::OTHER_NUMBER, "-1e308"},
    {Kind::OTHER_NUMBER, "1e-400"},
    {Kind::OTHER_NUMBER, "1.0"},
    {Kind::OTHER_NUMBER, "1.5"},
    {Kind::OTHER_NUMBER, "1e0"},
    {Kind::OTHER_NUMBER, "-0.0"},
    {Kind::TEXT, "\"no such text\""},
    {Kind::TEXT, "\"1\""},
    {Kind::TEXT, "\"\\u0000\""},
    {Kind::ARRAY, "[]"},
    {Kind::ARRAY, "[1]"},
    {Kind::ARRAY, "[[\"x\"],{}]"},
    {Kind::OBJECT, "{}"},
    {Kind::OBJECT, "{\"0\":1}"},
    {Kind::NOT_JSON, "1e400"},
    {Kind::NOT_JSON, "-1e400"},
    {Kind::NOT_JSON, "01"},
    {Kind::NOT_JSON, "+1"},
    {Kind::NOT_JSON, "0x1"},
    {Kind::NOT_JSON, "NaN"},
};

/** A member of a request, and what it is answered for each kind of value there. */
struct MemberRow {
    const char* name;
    Members request; ///< the rest of the request
    bool ofJob; ///< whether the member is one of the job; the job's others are then those of a job that nobody runs
    const char* member;
    std::map<Kind, int> codes;
    int otherwise;

    std::string requestWith(const Sample& sample) const {
        Members whole = request;
        Members job = {{"backend", "\"unheard-of\""}, {"action", "8"}, {"status", "0"}, {"param", "{}"}};
        Members& place = ofJob ? job : whole;
        place.erase(member);
        if (sample.kind != Kind::ABSENT) {
            place[member] = sample.json;
        }
        if (ofJob) {
            whole["job"] = object(job);
        }
        return object(whole);
    }

    int code(Kind kind) const {
        const auto found = codes.find(kind);
        return kind == Kind::NOT_JSON ? 400 : found != codes.end() ? found->second : otherwise;
    }

    friend std::ostream& operator<<(std::ostream& out, const MemberRow& row) {
        return out << row.name;
    }
};

class HostileMember : public HostileRequests, public testing::WithParamInterface<MemberRow> {};

const Members GET = {{"op", "\"job_get\""}};
const Members REMOVE = {{"op", "\"job_remove\""}};
const Members LISTING = {{"op", "\"job_list\""}};
const Members FORMAT_LISTING = {{"op", "\"job_list\""}, {"format", "\"x\""}, {"target", "\"x\""}};
const Members ENQUEUE = {{"op", "\"job_enqueue\""}};

// A job whose members are all good is refused for its backend, 505.
const MemberRow MEMBERS[] = {
    {"Op", {}, false, "op", {{Kind::TEXT, 501}}, 400},
    {"GetJobId", GET, false, "job_id", {{Kind::POSITIVE, 404}}, 400},
    {"RemoveJobId", REMOVE, false, "job_id", {{Kind::POSITIVE, 404}}, 400},
    {"ListAction",
     LISTING,
     false,
     "action",
     {{Kind::ABSENT, 200}, {Kind::POSITIVE, 200}, {Kind::ZERO, 200}, {Kind::NEGATIVE, 200}},
     400},
    {"ListBackend", LISTING, false, "backend", {{Kind::ABSENT, 200}, {Kind::TEXT, 200}}, 400},
    {"ListUnique", LISTING, false, "unique", {{Kind::ABSENT, 200}, {Kind::TEXT, 200}}, 400},
    {"ListFormat", FORMAT_LISTING, false, "format", {{Kind::ABSENT, 200}, {Kind::TEXT, 200}}, 400},
    {"ListTarget", FORMAT_LISTING, false, "target", {{Kind::ABSENT, 200}, {Kind::TEXT, 200}}, 400},
    {"ListFormatWithoutTarget", LISTING, false, "format", {}, 200},
    {"ListTargetWithoutFormat", LISTING, false, "target", {}, 200},
    {"OfNoMeaning", LISTING, false, "code", {}, 200},
    {"EnqueueJob", ENQUEUE, false, "job", {}, 400},
    {"JobBackend", ENQUEUE, true, "backend", {{Kind::TEXT, 505}}, 400},
    {"JobAction", ENQUEUE, true, "action", {{Kind::POSITIVE, 505}, {Kind::NEGATIVE, 505}}, 400},
    {"JobStatus", ENQUEUE, true, "status", {{Kind::POSITIVE, 505}, {Kind::ZERO, 505}, {Kind::NEGATIVE, 505}}, 400},
    {"JobParam", ENQUEUE, true, "param", {{Kind::OBJECT, 505}}, 400},
    {"JobBranch", ENQUEUE, true, "branch", {}, 505},
    {"JobUnique", ENQUEUE, true, "unique", {}, 505},
    {"JobPid", ENQUEUE, true, "pid", {}, 505},
    {"JobJobId", ENQUEUE, true, "job_id", {}, 505},
};

INSTANTIATE_TEST_SUITE_P(Of, HostileMember, testing::ValuesIn(MEMBERS), support::NameOfRow());

} // namespace

TEST_P(HostileMember, GetsTheCodeOfItsType) {
    for (const Sample& sample : SAMPLES) {
        expectCode(GetParam().code(sample.kind), GetParam().requestWith(sample));
    }
    expectUnharmed();
}

TEST_F(HostileRequests, OptionalMembersOfAnotherTypeAreAsIfTheyWereNotThere) {
    support::writeLocalBackend("plain", everyAction(WAITS_AT_GATE + "unique = daemon's own\n"));
    Members job = jobOf("plain");
    job["action"] = "1"; // it waits
    int id = 3;
    for (const Sample& sample : SAMPLES) {
        if (sample.kind == Kind::NOT_JSON || sample.kind == Kind::ABSENT) {
            continue;
        }
        SCOPED_TRACE(sample.json);
        if (sample.kind != Kind::TEXT) {
            job["branch"] = sample.json;
        }
        for (const char* member : {"unique", "pid", "job_id"}) {
            job[member] = sample.json;
        }
        const std::string number = std::to_string(id);
        EXPECT_EQ("{\"code\":200,\"job\":{\"action\":1,\"backend\":\"plain\",\"job_id\":" + number +
                      ",\"param\":{},\"status\":1,\"unique\":\"daemon's own\"}}",
                  peer->ask(enqueue(job)));
        EXPECT_EQ("{\"code\":200}", peer->ask("{\"op\":\"job_remove\",\"job_id\":" + number + "}"));
        job.erase("branch");
        ++id;
    }
    expectUnharmed();
}

TEST_F(HostileRequests, NumbersOfAnyRangeComeBackAsTheSameNumbers) {
    support::writeLocalBackend("plain", everyAction(WAITS_AT_GATE));
    Members job = jobOf("plain");
    job["action"] = "1";
    const std::vector<std::string> integers = {"2147483648", "-2147483649", "9223372036854775807",
                                               "-9223372036854775808", "18446744073709551615"};
    std::vector<std::string> numbers = {"-0",     "18446744073709551616",   "-9223372036854775809", "1e308", "0.1",
                                        "-1e308", "2.2250738585072014e-308"};
    numbers.insert(numbers.end(), integers.begin(), integers.end());
    int id = 3;
    for (const std::string& number : numbers) {
        job["param"] = object({{"n", number}});
        const std::string reply = peer->ask(enqueue(job));
        const std::string start =
            "{\"code\":200,\"job\":{\"action\":1,\"backend\":\"plain\",\"job_id\":" + std::to_string(id) +
            ",\"param\":{\"n\":";
        ASSERT_EQ(0U, reply.rfind(start, 0)) << reply;
        const std::string text = reply.substr(start.size(), reply.find('}') - start.size());
        EXPECT_EQ(std::stod(number), std::stod(text));
        if (std::count(integers.begin(), integers.end(), number) != 0) {
            EXPECT_EQ(number, text);
        }
        EXPECT_EQ(200, controller.removeJob(id++));
    }
    expectUnharmed();
}

// Bytes of texts

namespace {

/** The inside of a JSON string, as it is sent and as it comes back. */
struct Bytes {
    const char* name;
    std::string sent;
    std::string echo;

    friend std::ostream& operator<<(std::ostream& out, const Bytes& row) {
        return out << row.name;
    }
};

class HostileBytes : public HostileRequests, public testing::WithParamInterface<Bytes> {};

const Bytes ADMITTED_BYTES[] = {
    {"Nul", "\\u0000", "\\u0000"},
    {"NulAmongOthers", "a\\u0000b", "a\\u0000b"},
    {"ByteOfOnes", "\xff", "\xff"},
    {"OverlongNul", "\xc0\x80", "\xc0\x80"},
    {"OverlongSlash", "\xe0\x80\xaf", "\xe0\x80\xaf"},
    {"RawSurrogate", "\xed\xa0\x80", "\xed\xa0\x80"},
    {"RawSurrogatePair", "\xed\xa0\xbd\xed\xb8\x80", "\xed\xa0\xbd\xed\xb8\x80"},
    {"CutSequence", "\xe2\x82", "\xe2\x82"},
    {"LoneContinuation", "\x80", "\x80"},
    {"BeyondUnicode", "\xf5\x80\x80\x80", "\xf5\x80\x80\x80"},
    {"EscapedSurrogatePair", "\\ud83d\\uDE00", "\xf0\x9f\x98\x80"},
    {"NoCharacter", "\\uffff", "\xef\xbf\xbf"},
    {"EveryEscape", "\\\"\\\\\\/\\b\\f\\n\\r\\t\\u001f", "\\\"\\\\/\\b\\f\\n\\r\\t\\u001f"},
    {"Variable", "{{text}}{{", "{{text}}{{"},
    {"PrintfFormats", "%s%n%9999d", "%s%n%9999d"},
};

const Bytes REFUSED_BYTES[] = {
    {"RawNul", NUL, ""},
    {"RawNewLine", "\n", ""},
    {"RawControl", "\x1f", ""},
    {"HalfOfASurrogatePair", "\\ud83d", ""},
    {"HalfOfASurrogatePairAndText", "\\ud83dabcdefgh", ""},
    {"HalfOfASurrogatePairAndAnotherEscape", "\\ud83d\\u0041", ""},
    {"FirstHalfTwice", "\\ud83d\\ud83d", ""},
    {"OtherHalfOfASurrogatePair", "\\ude00", ""},
    {"HalvesInTheWrongOrder", "\\ude00\\ud83d", ""},
    {"CutEscape", "\\u00", ""},
    {"EscapeOfNoDigits", "\\u00g0", ""},
    {"UnknownEscape", "\\x00", ""},
    {"QuotationMark", "\"", ""},
    {"Backslash", "\\", ""},
};

class RefusedBytes : public HostileBytes {};

INSTANTIATE_TEST_SUITE_P(Of, HostileBytes, testing::ValuesIn(ADMITTED_BYTES), support::NameOfRow());
INSTANTIATE_TEST_SUITE_P(Of, RefusedBytes, testing::ValuesIn(REFUSED_BYTES), support::NameOfRow());

/** A request for each place where a text can stand, with the code that well-formed bytes get there. */
std::map<std::string, int> requestsWith(const std::string& bytes) {
    const std::string text = quoted(bytes);
    const Members job = {{"backend", "\"unheard-of\""}, {"action", "8"}, {"status", "0"}, {"param", "{}"}};
    const auto listing = [](const Members& filter) {
        Members members = filter;
        members["op"] = "\"job_list\"";
        return object(members);
    };
    const auto enqueueWith = [&job](const std::string& member, const std::string& json) {
        Members changed = job;
        changed[member] = json;
        return enqueue(changed);
    };
    return {
        {object({{"op", text}}), 501},
        {listing({{"backend", text}}), 200},
        {listing({{"unique", text}}), 200},
        {listing({{"format", text}, {"target", "\"x\""}}), 200},
        {listing({{"format", "\"x\""}, {"target", text}}), 200},
        {listing({{bytes, "0"}, {"backend", "\"x\""}}), 200},
        {enqueueWith("backend", text), 505},
        {enqueueWith("branch", text), 505},
        {enqueueWith("unique", text), 505},
        {enqueueWith("param", "{\"a\":" + text + "}"), 505},
        {enqueueWith("param", "{" + text + ":0}"), 505},
        {enqueueWith(bytes, "0"), 505},
    };
}

} // namespace

TEST_P(HostileBytes, AreTakenForATextOfNoMeaning) {
    for (const auto& [request, code] : requestsWith(GetParam().sent)) {
        if (code == 200) {
            EXPECT_EQ("{\"code\":200,\"jobs\":[]}", peer->ask(request)) << request;
        } else {
            expectCode(code, request);
        }
    }
    expectUnharmed();
}

TEST_P(HostileBytes, OfAnAdmittedJobComeBackAsTheyAre) {
    support::writeLocalBackend("echo", everyAction(WAITS_AT_GATE + "unique = {{text}}\n"));
    const std::string sent = quoted(GetParam().sent);
    const std::string echo = quoted(GetParam().echo);
    const std::string job = "{\"action\":1,\"backend\":\"echo\",\"branch\":" + echo +
                            ",\"job_id\":3,\"param\":{\"names\":{" + echo + ":1},\"text\":" + echo +
                            "},\"status\":1,\"unique\":" + echo + "}";

    EXPECT_EQ("{\"code\":200,\"job\":" + job + "}",
              peer->ask(enqueue({{"backend", "\"echo\""},
                                 {"action", "1"},
                                 {"status", "0"},
                                 {"param", "{\"names\":{" + sent + ":1},\"text\":" + sent + "}"},
                                 {"branch", sent},
                                 {"unique", sent}})));

    EXPECT_EQ("{\"code\":200,\"job\":" + job + "}", peer->ask("{\"op\":\"job_get\",\"job_id\":3}"));
    const std::string list = "{\"code\":200,\"jobs\":[" + job + "]}";
    EXPECT_EQ(list, peer->ask("{\"op\":\"job_list\",\"unique\":" + sent + "}"));
    EXPECT_EQ(list, peer->ask("{\"op\":\"job_list\",\"format\":\"{{BRANCH}}\",\"target\":" + sent + "}"));
    EXPECT_EQ("{\"code\":200}", peer->ask("{\"op\":\"job_remove\",\"job_id\":3}"));
    expectUnharmed();
}

TEST_P(RefusedBytes, AreNoJson) {
    for (const auto& [request, code] : requestsWith(GetParam().sent)) {
        expectCode(400, request);
    }
    expectUnharmed();
}

TEST_F(HostileRequests, ABackendMayHaveANameThatIsNoText) {
    int id = 3;
    for (const char* name : {"\xff", "\xc0\x80", "\xed\xa0\x80", "a\nb", " ", "..."}) {
        support::writeLocalBackend(name, everyAction(WAITS_AT_GATE + "unique = x\n"));
        Job job(name, Job::ACTION_BACKUP);
        EXPECT_EQ(200, controller.addJob(job)) << testing::PrintToString(name);
        EXPECT_EQ(name, job.getBackend());
        EXPECT_EQ(id++, job.getJobId());
        EXPECT_EQ(200, controller.removeJob(job.getJobId()));
    }
    expectUnharmed();
}

TEST_F(HostileRequests, AJobWhoseArgumentsHoldANulEndsWithoutItsProgram) {
    support::writeLocalBackend("probe", everyAction("command_launch = touch {{text}}\n"));
    Job job("probe", Job::ACTION_RELINK);
    job.setParam("text", folder.path("proof") + NUL + "more");

    daemon->waitForLine(exitLine(add(job), 127));

    EXPECT_NE(0, access(folder.path("proof").c_str(), F_OK));
    expectUnharmed(1);
}
