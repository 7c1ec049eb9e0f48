// The record behind a job, and its parameters as text and as a value.

#include "job/job_record.h"

#include <limits>
#include <string>

#include <gtest/gtest.h>
#include <json/value.h>

#include <marubackup/job.h>

#include "common/json_text.h"
#include "support/random_json.h"

namespace {

using MARU::Backup::Job;
using MARU::Backup::JobParams;
using MARU::Backup::recordOf;
using MARU::Backup::toString;

Job::Action actionOf(unsigned int number) {
    return static_cast<Job::Action>(number);
}

/** A job with some of its fields set, to anything. */
Job randomJob(support::RandomJson& random) {
    Job job(random.text(), actionOf(random.below(130)));
    job.setStatus(static_cast<Job::Status>(random.below(5)));
    job.setJobId(static_cast<int>(random.below(4)) - 2);
    job.setPid(static_cast<int>(random.below(4)) - 2);
    job.setUniqueString(random.text());
    job.setCommandBranch(random.text());
    return job;
}

std::string textOf(const JobParams& params) {
    std::string text;
    params.appendTo(text);
    return text;
}

TEST(JobRecord, IsThatOfTheJob) {
    Job job("configbackup", Job::ACTION_RELINK);
    EXPECT_EQ("configbackup", recordOf(job).backend);
    job.setUniqueString("other");
    EXPECT_EQ("other", recordOf(job).unique);
    const Job copy = job;
    EXPECT_NE(&recordOf(job), &recordOf(copy));
}

TEST(JobRecord, IsWrittenBehindWhatIsThere) {
    std::string text = "x";
    recordOf(Job()).appendTo(text);
    EXPECT_EQ("x{\"action\":0,\"backend\":\"\",\"param\":{},\"status\":0,\"unique\":\"\"}", text);
}

TEST(JobRecord, IsWrittenAsItsJsonIs) {
    support::RandomJson random(1);
    for (int round = 0; round < 2000; ++round) {
        Job job = randomJob(random);
        job.setParam(random.text(), random.value(3));
        ASSERT_EQ(toString(job.toJson()), job.toString());
        ASSERT_TRUE(job.fromJson(job.toJson()));
        ASSERT_EQ(toString(job.toJson()), job.toString());
    }
}

TEST(JobParameters, AreWhatTheyWereAssigned) {
    support::RandomJson random(2);
    for (int round = 0; round < 5000; ++round) {
        const Json::Value object = random.object(4);
        JobParams params;
        params.set("old", 1);
        params.assign(object);
        // Two numbers that are none differ, so their text is compared.
        ASSERT_EQ(toString(object), toString(params.all()));
        ASSERT_EQ(toString(object), textOf(params));
        for (const std::string& name : object.getMemberNames()) {
            Json::Value value;
            ASSERT_TRUE(params.has(name));
            ASSERT_TRUE(params.get(name, value));
            ASSERT_EQ(toString(object[name]), toString(value));
            ASSERT_EQ(object[name].type(), value.type());
        }
        const std::string other = random.text();
        Json::Value untouched = "untouched";
        ASSERT_EQ(object.isMember(other), params.has(other));
        ASSERT_EQ(object.isMember(other), params.get(other, untouched));
    }
}

TEST(JobParameters, OfAnyHistoryAreThoseOfAJsonObject) {
    support::RandomJson random(3);
    JobParams params;
    Json::Value expected(Json::objectValue);
    for (int step = 0; step < 5000; ++step) {
        if (random.below(8) == 0) {
            expected = random.object(3);
            params.assign(expected);
        } else if (random.below(2) == 0) {
            const std::string name = random.text();
            const Json::Value value = random.value(2);
            expected[name] = value;
            params.set(name, value);
        } else {
            JobParams copy = params;
            params = JobParams(copy);
            copy.set("only", "the copy's");
        }
        ASSERT_EQ(toString(expected), textOf(params));
        ASSERT_EQ(toString(expected), toString(params.all()));
    }
}

TEST(JobParameters, KeepWhatTheirTextWouldNotBringBack) {
    Json::Value object;
    object["unsigned"] = 7U;
    object["infinite"] = std::numeric_limits<double>::infinity();
    JobParams params;
    params.assign(object);
    EXPECT_EQ(object, params.all());
    const JobParams copy = params;
    EXPECT_EQ(object, copy.all());
}

} // namespace
