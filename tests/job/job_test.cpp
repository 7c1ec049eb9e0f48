#include <marubackup/job.h>

#include <limits>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <json/value.h>
#include <json/writer.h>

#include "common/json_text.h"

namespace {

using MARU::Backup::action2str;
using MARU::Backup::fromString;
using MARU::Backup::Job;

Json::Value parsed(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    return value;
}

/** A job with a value of its own in every field. */
Job fullJob() {
    Job job("configbackup", Job::ACTION_COPY_TO);
    job.setJobId(7);
    job.setStatus(Job::STATUS_RUNNING);
    job.setPid(4711);
    job.setParam("size", 5);
    job.setUniqueString("conf.7");
    job.setCommandBranch("fast");
    return job;
}

const char* const FULL_TEXT = "{\"action\":4,\"backend\":\"configbackup\",\"branch\":\"fast\",\"job_id\":7,"
                              "\"param\":{\"size\":5},\"pid\":4711,\"status\":2,\"unique\":\"conf.7\"}";

TEST(Job, StartsEmpty) {
    const Job job;
    EXPECT_EQ(-1, job.getJobId());
    EXPECT_EQ("", job.getBackend());
    EXPECT_EQ(Job::ACTION_NONE, job.getAction());
    EXPECT_EQ(Job::STATUS_NONE, job.getStatus());
    EXPECT_EQ(-1, job.getPid());
    EXPECT_EQ(Json::objectValue, job.getParams().type());
    EXPECT_TRUE(job.getParams().empty());
    EXPECT_EQ("", job.getUniqueString());
    EXPECT_EQ("", job.getCommandBranch());
}

TEST(Job, OfABackendAndAnActionIsOtherwiseEmpty) {
    const Job job("tidebackup", Job::ACTION_RESTORE);
    EXPECT_EQ("{\"action\":2,\"backend\":\"tidebackup\",\"param\":{},\"status\":0,\"unique\":\"\"}", job.toString());
    EXPECT_EQ("", job.getCommandBranch());
    EXPECT_EQ(-1, job.getJobId());
    EXPECT_EQ(-1, job.getPid());
}

TEST(Job, KeepsWhatIsSet) {
    const Job job = fullJob();
    EXPECT_EQ(7, job.getJobId());
    EXPECT_EQ("configbackup", job.getBackend());
    EXPECT_EQ(Job::ACTION_COPY_TO, job.getAction());
    EXPECT_EQ(Job::STATUS_RUNNING, job.getStatus());
    EXPECT_EQ(4711, job.getPid());
    EXPECT_EQ(parsed("{\"size\":5}"), job.getParams());
    EXPECT_EQ("conf.7", job.getUniqueString());
    EXPECT_EQ("fast", job.getCommandBranch());
}

TEST(Job, ReplacesWhatIsSetAgain) {
    Job job = fullJob();
    job.setJobId(-1);
    job.setBackend("");
    job.setAction(Job::ACTION_NONE);
    job.setStatus(Job::STATUS_NONE);
    job.setPid(-1);
    job.setParam("size", "large");
    job.setUniqueString("");
    job.setCommandBranch("");
    EXPECT_EQ("{\"action\":0,\"backend\":\"\",\"param\":{\"size\":\"large\"},\"status\":0,\"unique\":\"\"}",
              job.toString());
}

TEST(JobParams, HoldAnyJson) {
    const char* const TABLE[] = {"null", "true", "5", "0.5", "\"text\"", "[1,[2]]", "{\"a\":{\"b\":null}}"};
    for (const char* text : TABLE) {
        Job job;
        job.setParam("it", parsed(text));
        EXPECT_TRUE(job.hasParam("it"));
        EXPECT_EQ(parsed(text), job.getParam("it", "default"));
        EXPECT_EQ(parsed("{\"it\":" + std::string(text) + "}"), job.getParams());
    }
}

TEST(JobParams, AMissingOneIsTheDefault) {
    Job job;
    job.setParam("Size", 5);
    EXPECT_FALSE(job.hasParam("size"));
    EXPECT_EQ(Json::Value("default"), job.getParam("size", "default"));
    EXPECT_EQ(parsed("{\"a\":[1]}"), job.getParam("size", parsed("{\"a\":[1]}")));
    EXPECT_FALSE(job.hasParam("size")) << "asking adds none";
}

TEST(JobParams, ANullOneIsNullAndNotTheDefault) {
    Job job;
    job.setParam("size", Json::Value());
    EXPECT_TRUE(job.hasParam("size"));
    EXPECT_TRUE(job.getParam("size", "default").isNull());
}

TEST(JobParams, AreCopiedInAndOut) {
    Job job;
    Json::Value given = parsed("{\"a\":1}");
    job.setParam("it", given);
    given["a"] = 2;
    job.getParams()["it"]["a"] = 3;
    job.getParam("it", Json::Value())["a"] = 4;
    EXPECT_EQ(parsed("{\"it\":{\"a\":1}}"), job.getParams());
}

TEST(JobParams, MayHaveAnyName) {
    Job job;
    const std::string withNul("a\0b", 3);
    job.setParam("", 1);
    job.setParam(withNul, 2);
    EXPECT_EQ(Json::Value(1), job.getParam("", 0));
    EXPECT_EQ(Json::Value(2), job.getParam(withNul, 0));
    EXPECT_FALSE(job.hasParam("a"));
}

/** Changes every field of `job`. */
void change(Job& job) {
    job.setJobId(8);
    job.setBackend("other");
    job.setAction(Job::ACTION_BACKUP);
    job.setStatus(Job::STATUS_QUEUED);
    job.setPid(1);
    job.setParam("size", 6);
    job.setUniqueString("other");
    job.setCommandBranch("slow");
}

TEST(JobCopies, AreDeep) {
    const Job original = fullJob();
    Job copy(original);
    EXPECT_EQ(FULL_TEXT, copy.toString());
    change(copy);
    EXPECT_EQ(FULL_TEXT, original.toString());
}

TEST(JobCopies, AssignedOnesAreDeepToo) {
    const Job original = fullJob();
    Job copy("other", Job::ACTION_BACKUP);
    copy.setParam("old", 1);
    EXPECT_EQ(&copy, &(copy = original));
    EXPECT_EQ(FULL_TEXT, copy.toString());
    change(copy);
    EXPECT_EQ(FULL_TEXT, original.toString());
}

TEST(JobCopies, OutliveTheirOriginal) {
    Job copy;
    {
        const Job original = fullJob();
        copy = original;
    }
    EXPECT_EQ(FULL_TEXT, copy.toString());
}

TEST(JobCopies, OfAJobToItselfChangeNothing) {
    Job job = fullJob();
    const Job& same = job;
    job = same;
    EXPECT_EQ(FULL_TEXT, job.toString());
}

TEST(JobToJson, OfAnEmptyJobHasFiveMembers) {
    const Json::Value json = Job().toJson();
    const std::vector<std::string> names = {"action", "backend", "param", "status", "unique"};
    EXPECT_EQ(names, json.getMemberNames());
    EXPECT_EQ(Json::Value(""), json["backend"]);
    EXPECT_EQ(Json::Value(0), json["action"]);
    EXPECT_EQ(Json::Value(0), json["status"]);
    EXPECT_EQ(Json::Value(Json::objectValue), json["param"]);
    EXPECT_EQ(Json::Value(""), json["unique"]);
}

TEST(JobToJson, HasABranchUnlessItIsEmpty) {
    Job job;
    job.setCommandBranch("fast");
    EXPECT_EQ(Json::Value("fast"), job.toJson()["branch"]);
    job.setCommandBranch("");
    EXPECT_FALSE(job.toJson().isMember("branch"));
}

TEST(JobToJson, HasIdAndPidUnlessTheyAreMinusOne) {
    Job job;
    for (const int number : {0, 1, -2, std::numeric_limits<int>::max(), std::numeric_limits<int>::min()}) {
        job.setJobId(number);
        job.setPid(number);
        EXPECT_EQ(Json::Value(number), job.toJson()["job_id"]);
        EXPECT_EQ(Json::Value(number), job.toJson()["pid"]);
    }
    job.setJobId(-1);
    EXPECT_FALSE(job.toJson().isMember("job_id"));
    EXPECT_TRUE(job.toJson().isMember("pid"));
    job.setPid(-1);
    EXPECT_FALSE(job.toJson().isMember("pid"));
}

TEST(JobToJson, WritesActionsAndStatusesThatHaveNoNameAsNumbers) {
    Job job;
    job.setAction(static_cast<Job::Action>(-3));
    job.setStatus(static_cast<Job::Status>(99));
    EXPECT_EQ(Json::Value(-3), job.toJson()["action"]);
    EXPECT_EQ(Json::Value(99), job.toJson()["status"]);
}

TEST(JobToJson, IsACopy) {
    const Job job = fullJob();
    Json::Value json = job.toJson();
    json["param"]["size"] = 6;
    json["backend"] = "other";
    EXPECT_EQ(FULL_TEXT, job.toString());
}

TEST(JobText, IsItsJsonOnOneLine) {
    EXPECT_EQ("{\"action\":0,\"backend\":\"\",\"param\":{},\"status\":0,\"unique\":\"\"}", Job().toString());
    EXPECT_EQ(FULL_TEXT, fullJob().toString());
}

TEST(JobText, KeepsTheBytesOfItsStrings) {
    Job job("b\xc3\xa9\xff", Job::ACTION_BACKUP);
    job.setUniqueString("two\nlines");
    EXPECT_EQ("{\"action\":1,\"backend\":\"b\xc3\xa9\xff\",\"param\":{},\"status\":0,\"unique\":\"two\\nlines\"}",
              job.toString());
}

TEST(JobText, IsAllThatIsWrittenToAStream) {
    std::ostringstream out;
    std::ostream& returned = out << fullJob();
    EXPECT_EQ(&out, &returned);
    EXPECT_EQ(FULL_TEXT, out.str());
}

/** The smallest object that a job can be read from, with `member` given `value`. */
Json::Value minimalWith(const char* member, const Json::Value& value) {
    Json::Value json = parsed("{\"backend\":\"b\",\"action\":1,\"status\":1,\"param\":{}}");
    json[member] = value;
    return json;
}

TEST(JobFromJson, BringsBackEveryFieldOfToJson) {
    Job job;
    EXPECT_TRUE(job.fromJson(fullJob().toJson()));
    EXPECT_EQ(FULL_TEXT, job.toString());
}

TEST(JobFromJson, BringsBackAnEmptyJob) {
    Job job;
    EXPECT_TRUE(job.fromJson(Job().toJson()));
    EXPECT_EQ(Job().toString(), job.toString());
}

TEST(JobFromJson, NeedsFourMembers) {
    Job job;
    EXPECT_TRUE(job.fromJson(minimalWith("backend", "b")));
    for (const char* required : {"backend", "action", "status", "param"}) {
        Json::Value json = fullJob().toJson();
        json.removeMember(required);
        EXPECT_FALSE(job.fromJson(json)) << required;
    }
}

TEST(JobFromJson, RefusesAMemberOfAnotherTypeAndChangesNothing) {
    const struct {
        const char* member;
        std::vector<const char*> values;
    } TABLE[] = {
        {"backend", {"null", "true", "5", "0.5", "[]", "[\"b\"]", "{}"}},
        {"action", {"null", "true", "\"1\"", "1.0", "2147483648", "-2147483649", "[]", "[1]", "{}"}},
        {"status", {"null", "false", "\"1\"", "1.0", "4294967297", "1e3", "[]", "[1]", "{}"}},
        {"param", {"null", "true", "5", "\"{}\"", "[]", "[{}]"}},
    };
    for (const auto& row : TABLE) {
        for (const char* value : row.values) {
            Job job = fullJob();
            Json::Value json = parsed("{\"backend\":\"b\",\"action\":1,\"status\":1,\"param\":{\"new\":1},"
                                      "\"branch\":\"new\",\"job_id\":1,\"pid\":1,\"unique\":\"new\"}");
            json[row.member] = parsed(value);
            EXPECT_FALSE(job.fromJson(json)) << row.member << " " << value;
            EXPECT_EQ(FULL_TEXT, job.toString()) << row.member << " " << value;
        }
    }
}

TEST(JobFromJson, RefusesWhatIsNoObject) {
    for (const char* text : {"null", "true", "5", "0.5", "\"backend\"", "[]", "[\"backend\",1,1,{}]", "{}"}) {
        Job job = fullJob();
        EXPECT_FALSE(job.fromJson(parsed(text))) << text;
        EXPECT_EQ(FULL_TEXT, job.toString()) << text;
    }
}

TEST(JobFromJson, TakesActionsAndStatusesAsTheyAre) {
    for (const int number : {3, 128, -1, std::numeric_limits<int>::max(), std::numeric_limits<int>::min()}) {
        Job job;
        EXPECT_TRUE(job.fromJson(minimalWith("action", number)));
        EXPECT_EQ(number, job.getAction());
        EXPECT_TRUE(job.fromJson(minimalWith("status", number)));
        EXPECT_EQ(number, job.getStatus());
    }
}

TEST(JobFromJson, KeepsOldValuesOfOptionalMembersThatAreAbsent) {
    Job job = fullJob();
    EXPECT_TRUE(job.fromJson(minimalWith("backend", "new")));
    EXPECT_EQ("{\"action\":1,\"backend\":\"new\",\"branch\":\"fast\",\"job_id\":7,"
              "\"param\":{},\"pid\":4711,\"status\":1,\"unique\":\"conf.7\"}",
              job.toString());
}

TEST(JobFromJson, KeepsOldValuesOfOptionalMembersOfAnotherType) {
    const struct {
        const char* member;
        std::vector<const char*> values;
    } TABLE[] = {
        {"branch", {"null", "true", "5", "[]", "{}"}},
        {"job_id", {"null", "true", "\"8\"", "8.0", "2147483648", "-2147483649", "[8]", "{}"}},
        {"pid", {"null", "true", "\"8\"", "8.0", "4294967304", "[8]", "{}"}},
        {"unique", {"null", "true", "5", "[]", "{}"}},
    };
    for (const auto& row : TABLE) {
        for (const char* value : row.values) {
            Job job = fullJob();
            EXPECT_TRUE(job.fromJson(minimalWith(row.member, parsed(value)))) << row.member << " " << value;
            EXPECT_EQ(fullJob().toJson()[row.member], job.toJson()[row.member]) << row.member << " " << value;
        }
    }
}

TEST(JobFromJson, TakesOptionalMembersThatEqualTheDefaults) {
    Job job = fullJob();
    EXPECT_TRUE(job.fromJson(parsed("{\"backend\":\"\",\"action\":0,\"status\":0,\"param\":{},"
                                    "\"branch\":\"\",\"job_id\":-1,\"pid\":-1,\"unique\":\"\"}")));
    EXPECT_EQ(Job().toString(), job.toString());
}

TEST(JobFromJson, ReplacesTheParametersAsAWhole) {
    Job job = fullJob();
    EXPECT_TRUE(job.fromJson(minimalWith("param", parsed("{\"other\":[null]}"))));
    EXPECT_EQ(parsed("{\"other\":[null]}"), job.getParams());
}

TEST(JobFromJson, CopiesTheParameters) {
    Json::Value json = minimalWith("param", parsed("{\"a\":1}"));
    Job job;
    ASSERT_TRUE(job.fromJson(json));
    json["param"]["a"] = 2;
    EXPECT_EQ(parsed("{\"a\":1}"), job.getParams());
}

TEST(JobFromJson, PassesOverMembersThatItDoesNotKnow) {
    Job job;
    EXPECT_TRUE(job.fromJson(minimalWith("code", 200)));
    EXPECT_FALSE(job.toJson().isMember("code"));
}

TEST(ActionNames, AreThoseOfQueuesAndSections) {
    const struct {
        int action;
        const char* name;
    } TABLE[] = {
        {0, "none"},
        {1, "backup"},
        {2, "restore"},
        {4, "copy_to"},
        {8, "relink"},
        {16, "remove_version"},
        {32, "remove_task"},
        {64, "target_copy_to"},
        {0x10000000, "none"},
        {0x20000000, "none"},
        {0x40000000, "none"},
        {3, "none"},
        {65, "none"},
        {127, "none"},
        {128, "none"},
        {-1, "none"},
        {std::numeric_limits<int>::max(), "none"},
        {std::numeric_limits<int>::min(), "none"},
    };
    for (const auto& row : TABLE) {
        EXPECT_EQ(row.name, action2str(static_cast<Job::Action>(row.action))) << row.action;
    }
}

TEST(ActionNames, EveryEnumeratorHasItsNumber) {
    EXPECT_EQ(0, Job::ACTION_NONE);
    EXPECT_EQ(1, Job::ACTION_BACKUP);
    EXPECT_EQ(2, Job::ACTION_RESTORE);
    EXPECT_EQ(4, Job::ACTION_COPY_TO);
    EXPECT_EQ(8, Job::ACTION_RELINK);
    EXPECT_EQ(16, Job::ACTION_REMOVE_VERSION);
    EXPECT_EQ(32, Job::ACTION_REMOVE_TASK);
    EXPECT_EQ(64, Job::ACTION_TARGET_COPY_TO);
    EXPECT_EQ(268435456, Job::ACTION_SHARE_SNAPSHOT_RESTORE);
    EXPECT_EQ(536870912, Job::ACTION_SPACE_BUILD);
    EXPECT_EQ(1073741824, Job::ACTION_RESERVED_BLOCKER);
}

TEST(StatusNames, EveryEnumeratorHasItsNumber) {
    EXPECT_EQ(0, Job::STATUS_NONE);
    EXPECT_EQ(1, Job::STATUS_QUEUED);
    EXPECT_EQ(2, Job::STATUS_RUNNING);
    EXPECT_EQ(3, Job::STATUS_STOPPING);
}

} // namespace
