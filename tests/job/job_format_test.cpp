#include "job/job_format.h"

#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <string>

#include <gtest/gtest.h>
#include <json/value.h>
#include <json/writer.h>

#include <marubackup/job.h>

#include "common/json_text.h"

namespace {

using MARU::Backup::_VarsMapperJob;
using MARU::Backup::fromString;
using MARU::Backup::Job;

/** What the mapper makes of one variable. */
struct Mapped {
    bool known = false;
    std::string value = "untouched";
};

Mapped map(const Job& job, const std::string& name) {
    Mapped result;
    result.known = _VarsMapperJob(&job)(name, result.value);
    return result;
}

void expectValue(const std::string& expected, const Job& job, const std::string& name) {
    const Mapped result = map(job, name);
    EXPECT_TRUE(result.known) << name;
    EXPECT_EQ(expected, result.value) << name;
}

Job jobWithId(int id) {
    Job job;
    job.setJobId(id);
    return job;
}

Job jobWithParam(const std::string& name, const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    Job job("tidebackup", Job::ACTION_BACKUP);
    job.setParam(name, value);
    return job;
}

/** A time zone that no machine has by chance, for the time of the object's life. */
class OddTimeZone {
public:
    OddTimeZone() : hadOld(getenv("TZ") != nullptr), old(hadOld ? getenv("TZ") : "") {
        setenv("TZ", "ODD-11:17:09", 1);
        tzset();
    }
    ~OddTimeZone() {
        if (hadOld) {
            setenv("TZ", old.c_str(), 1);
        } else {
            unsetenv("TZ");
        }
        tzset();
    }
    OddTimeZone(const OddTimeZone&) = delete;
    OddTimeZone& operator=(const OddTimeZone&) = delete;

    /** What a clock on the wall there shows at `moment`. */
    static std::string wallClock(std::time_t moment) {
        const std::time_t there = moment + 11 * 3600 + 17 * 60 + 9;
        std::tm fields = {};
        gmtime_r(&there, &fields);
        char text[64];
        std::snprintf(text, sizeof text, "%04d-%02d-%02d-%02d%02d-%02d", fields.tm_year + 1900, fields.tm_mon + 1,
                      fields.tm_mday, fields.tm_hour, fields.tm_min, fields.tm_sec);
        return text;
    }

private:
    bool hadOld;
    std::string old;
};

TEST(JobVariables, TheJobIdIsOneCharacterOfItsLowEightBits) {
    const struct {
        int id;
        std::string value;
    } TABLE[] = {
        {65, "A"},
        {321, "A"},
        {1, "\x01"},
        {255, "\xff"},
        {256, std::string(1, '\0')},
        {0, std::string(1, '\0')},
        {-1, "\xff"},
        {-191, "A"},
        {0x7fffff41, "A"},
    };
    for (const auto& row : TABLE) {
        expectValue(row.value, jobWithId(row.id), "JOB_ID");
        EXPECT_EQ("<" + row.value + ">", jobWithId(row.id).toFormatString("<{{JOB_ID}}>")) << row.id;
    }
}

TEST(JobVariables, BackendBranchAndUniqueAreTheFields) {
    Job job("tidebackup", Job::ACTION_BACKUP);
    job.setCommandBranch("fast");
    job.setUniqueString("tide.{{BACKEND}}");
    expectValue("tidebackup", job, "BACKEND");
    expectValue("fast", job, "BRANCH");
    expectValue("tide.{{BACKEND}}", job, "UNIQUE");
}

TEST(JobVariables, EmptyFieldsAreEmptyValues) {
    const Job job;
    expectValue("", job, "BACKEND");
    expectValue("", job, "BRANCH");
    expectValue("", job, "UNIQUE");
}

TEST(JobVariables, TheDateIsTheLocalTimeNow) {
    const OddTimeZone zone;
    const std::time_t before = std::time(nullptr);
    const std::string date = Job().toFormatString("{{DATE}}");
    const std::time_t after = std::time(nullptr);

    EXPECT_LE(OddTimeZone::wallClock(before), date);
    EXPECT_GE(OddTimeZone::wallClock(after), date);
    EXPECT_EQ(OddTimeZone::wallClock(before).size(), date.size());
}

TEST(JobVariables, AParameterStandsForItselfOrItsJson) {
    const struct {
        const char* param;
        const char* value;
    } TABLE[] = {
        {"\"text\"", "text"},
        {"\"\"", ""},
        {"\"say \\\"hi\\\"\\n\"", "say \"hi\"\n"},
        {"null", ""},
        {"5", "5"},
        {"-1", "-1"},
        {"18446744073709551615", "18446744073709551615"},
        {"1.5", "1.5"},
        {"true", "true"},
        {"false", "false"},
        {"[]", "[]"},
        {"[1, \"a\", null]", "[1,\"a\",null]"},
        {"{}", "{}"},
        {"{\"b\": \"x y\", \"a\": [true]}", "{\"a\":[true],\"b\":\"x y\"}"},
    };
    for (const auto& row : TABLE) {
        expectValue(row.value, jobWithParam("size", row.param), "size");
    }
}

TEST(JobVariables, AParameterKeepsItsBytes) {
    Job job;
    const std::string value("a\0\xff\xc3", 4);
    job.setParam("bytes", value);
    expectValue(value, job, "bytes");
}

TEST(JobVariables, AParameterNeverStandsForAFixedName) {
    Job job("tidebackup", Job::ACTION_BACKUP);
    job.setJobId(65);
    job.setCommandBranch("fast");
    job.setUniqueString("tide");
    for (const char* name : {"JOB_ID", "BACKEND", "BRANCH", "UNIQUE", "DATE"}) {
        job.setParam(name, "parameter");
        EXPECT_TRUE(map(job, name).known) << name;
        EXPECT_NE("parameter", map(job, name).value) << name;
    }
}

TEST(JobVariables, NamesAreCaseSensitive) {
    Job job("tidebackup", Job::ACTION_BACKUP);
    for (const char* name : {"job_id", "Job_Id", "backend", "Branch", "unique", "date", "BACKEND ", " BACKEND"}) {
        EXPECT_FALSE(map(job, name).known) << name;
        job.setParam(name, "parameter");
        expectValue("parameter", job, name);
    }
}

TEST(JobVariables, AnUnknownNameIsRefusedAndItsValueLeftAlone) {
    const Job job = jobWithParam("size", "5");
    const std::string NAMES[] = {"", "siz", std::string("size\0", 5), "STATUS", "TYPE"};
    for (const std::string& name : NAMES) {
        const Mapped result = map(job, name);
        EXPECT_FALSE(result.known) << name;
        EXPECT_EQ("untouched", result.value) << name;
    }
}

TEST(JobFormat, OfAnEmptyTemplateIsEmpty) {
    EXPECT_EQ("", Job("b", Job::ACTION_BACKUP).toFormatString(""));
}

TEST(JobFormat, OfATextWithoutVariablesIsTheText) {
    EXPECT_EQ("BACKEND {BRANCH} }} {{", Job("b", Job::ACTION_BACKUP).toFormatString("BACKEND {BRANCH} }} {{"));
}

TEST(JobFormat, PutsNothingForAnEmptyBranch) {
    EXPECT_EQ("b-", Job("b", Job::ACTION_BACKUP).toFormatString("{{BACKEND}}-{{BRANCH}}"));
}

TEST(JobFormat, MixesFieldsAndParameters) {
    Job job("tidebackup", Job::ACTION_BACKUP);
    job.setParam("size", 5);
    job.setParam("task", "photos");
    job.setParam("nothing", Json::Value());
    EXPECT_EQ("/vol/tidebackup/photos.5.log", job.toFormatString("/vol/{{BACKEND}}/{{task}}.{{size}}{{nothing}}.log"));
}

TEST(JobFormat, LeavesAVariableWithoutAValueAsItStands) {
    const Job job("tidebackup", Job::ACTION_BACKUP);
    EXPECT_EQ("/vol/{{task}}/tidebackup", job.toFormatString("/vol/{{task}}/{{BACKEND}}"));
}

TEST(JobFormat, DoesNotExpandAnInsertedValueAgain) {
    const Job job = jobWithParam("task", "\"{{BACKEND}}\"");
    EXPECT_EQ("{{BACKEND}} tidebackup", job.toFormatString("{{task}} {{BACKEND}}"));
}

TEST(JobFormat, OfTheDefaultUniqueStringRefersToAParameter) {
    Job job("tidebackup", Job::ACTION_BACKUP);
    job.setJobId(65);
    EXPECT_EQ("_job_id.{{job_id}}", job.toFormatString("_job_id.{{job_id}}"));
    job.setParam("job_id", 12);
    EXPECT_EQ("_job_id.12", job.toFormatString("_job_id.{{job_id}}"));
}

TEST(JobValidity, NeedsABackendAndAnActionThatIsWork) {
    const struct {
        const char* backend;
        int action;
        bool valid;
    } TABLE[] = {
        {"", 0, false},   {"", 1, false},           {"", 0x20000000, false},  {"x", 0, false},          {"x", 1, true},
        {"x", 2, true},   {"x", 4, true},           {"x", 8, true},           {"x", 16, true},          {"x", 32, true},
        {"x", 64, true},  {"x", 0x10000000, false}, {"x", 0x20000000, false}, {"x", 0x40000000, false}, {"x", 3, true},
        {"x", 128, true}, {"x", 0x08000000, true},  {"x", 0x10000001, true},  {"x", 0x60000000, true},  {"x", -1, true},
        {" ", 1, true},   {"../x", 1, true},
    };
    for (const auto& row : TABLE) {
        const Job job(row.backend, static_cast<Job::Action>(row.action));
        EXPECT_EQ(row.valid, Job::isValidToEnqueue(job)) << row.backend << " " << row.action;
    }
    EXPECT_FALSE(Job::isValidToEnqueue(Job()));
}

TEST(JobValidity, DoesNotLookAtTheOtherFields) {
    Job job("x", Job::ACTION_BACKUP);
    job.setJobId(-7);
    job.setStatus(static_cast<Job::Status>(99));
    job.setPid(0);
    job.setParam("x", Json::Value());
    job.setUniqueString("\n");
    job.setCommandBranch("no such branch");
    EXPECT_TRUE(Job::isValidToEnqueue(job));
}

} // namespace
