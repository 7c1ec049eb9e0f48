#include <syslog.h>
#include <unistd.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backend_fixture.h"
#include "support/backend_files.h"

using namespace MARU::Backup;
using support::expectLocated;
using testing::IsEmpty;

namespace {

class BackendConfiguration : public BackendTest {
protected:
    /** Each query and command answers with nothing, and says why. */
    void expectNotLoaded() {
        const std::function<void()> questions[] = {
            [this]() { EXPECT_FALSE(backend.isDelegate()); },
            [this]() { EXPECT_EQ("", backend.getUniqueFormat()); },
            [this]() { EXPECT_EQ("", backend.getJobUnique(job)); },
            [this]() { EXPECT_FALSE(backend.check(job)); },
            [this]() { EXPECT_FALSE(backend.launch(job)); },
        };
        for (const std::function<void()>& ask : questions) {
            ask();
            expectLocated(log, LOG_ERR, getpid(), BACKEND_UNIT, "backend not loaded");
        }
        EXPECT_EQ(5, log.count("backend not loaded"));
    }
};

const char* const EVERYTHING = "delegate = yes\n"
                               "unique = u\n"
                               "command_check = /bin/true\n"
                               "command_launch = /bin/true";

} // namespace

TEST_F(BackendConfiguration, IsNotThereBeforeALoad) {
    expectNotLoaded();
}

TEST_F(BackendConfiguration, IsNotThereAfterAFailedLoad) {
    EXPECT_FALSE(backend.load("unknown", "backup"));

    expectNotLoaded();
}

TEST_F(BackendConfiguration, IsGoneAfterAFailedLoad) {
    load(EVERYTHING);

    EXPECT_FALSE(backend.load("b", "restore"));

    expectNotLoaded();
}

TEST_F(BackendConfiguration, IsBackWithTheNextLoad) {
    EXPECT_FALSE(backend.load("b", "backup"));

    load(EVERYTHING);

    EXPECT_TRUE(backend.isDelegate());
    EXPECT_EQ("u", backend.getUniqueFormat());
    EXPECT_TRUE(backend.check(job));
}

TEST_F(BackendConfiguration, IsThatOfTheLastLoad) {
    load(EVERYTHING);
    support::writeLocalBackend("b", "[backup]\ncommand_check = /bin/false\n[restore]\nunique = r\n");

    EXPECT_TRUE(backend.load("b", "restore"));

    EXPECT_FALSE(backend.isDelegate());
    EXPECT_EQ("r", backend.getUniqueFormat());
    EXPECT_TRUE(backend.check(job));
}

TEST_F(BackendConfiguration, IsNotReadAgainBetweenLoads) {
    load("unique = before");
    support::writeLocalBackend("b", "[backup]\nunique = after\n");

    EXPECT_EQ("before", backend.getUniqueFormat());
}

TEST_F(BackendConfiguration, DeclaresADelegateByTheKeyAlone) {
    for (const std::string value : {"yes", "no", "0", "false", ""}) {
        load("delegate = " + value);
        EXPECT_TRUE(backend.isDelegate()) << value;
    }
    load("unique = u");
    EXPECT_FALSE(backend.isDelegate());
}

TEST_F(BackendConfiguration, DeclaresTheUniqueString) {
    struct Row {
        const char* lines;
        const char* format;
        const char* unique;
    };
    const Row rows[] = {
        {"unique = fixed", "fixed", "fixed"},
        {"unique = {{BACKEND}}-{{name}}", "{{BACKEND}}-{{name}}", "b-n"},
        {"unique = {{JOB_ID}}", "{{JOB_ID}}", "A"},
        {"unique = {{missing}}", "{{missing}}", "{{missing}}"},
        {"unique =", "", ""},
        {"delegate = yes", "_job_id.{{job_id}}", "_job_id.{{job_id}}"},
    };
    job.setJobId(65);
    for (const Row& row : rows) {
        load(row.lines);
        EXPECT_EQ(row.format, backend.getUniqueFormat()) << row.lines;
        EXPECT_EQ(row.unique, backend.getJobUnique(job)) << row.lines;
    }
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(BackendConfiguration, ExpandsTheDefaultUniqueStringByAParameter) {
    job.setParam("job_id", "77");
    load("delegate = yes");

    EXPECT_EQ("_job_id.77", backend.getJobUnique(job));
}
