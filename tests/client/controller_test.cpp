#include <marubackup/controller.h>

#include <limits>
#include <list>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "controller_calls.h"
#include "support/fake_daemon.h"

// What the controller asks, and what it makes of the answers that it is meant to get.

namespace {

using MARU::Backup::Job;
using MARU::Backup::JobController;
using support::FakeDaemon;
using testing::ElementsAre;
using testing::IsEmpty;

const char* const OK = "{\"code\":200}";
const char* const OK_NO_JOBS = "{\"code\":200,\"jobs\":[]}";

/** A job as the daemon writes it. */
std::string jobText(const std::string& backend, int id) {
    return "{\"action\":1,\"backend\":\"" + backend + "\",\"job_id\":" + std::to_string(id) +
           ",\"param\":{},\"status\":1,\"unique\":\"" + backend + "." + std::to_string(id) + "\"}";
}

std::vector<std::string> texts(const std::list<Job>& jobs) {
    std::vector<std::string> result;
    for (const Job& job : jobs) {
        result.push_back(job.toString());
    }
    return result;
}

TEST(AddJob, SendsTheWholeJob) {
    FakeDaemon daemon({"{\"code\":200,\"job\":{}}"});
    Job job("tidebackup", Job::ACTION_COPY_TO);
    job.setParam("size", 5);
    job.setCommandBranch("fast");
    job.setUniqueString("mine");
    job.setPid(1);
    job.setJobId(9);

    EXPECT_EQ(200, JobController().addJob(job));

    EXPECT_THAT(daemon.requests(),
                ElementsAre("{\"job\":{\"action\":4,\"backend\":\"tidebackup\",\"branch\":\"fast\",\"job_id\":9,"
                            "\"param\":{\"size\":5},\"pid\":1,\"status\":0,\"unique\":\"mine\"},"
                            "\"op\":\"job_enqueue\"}"));
}

TEST(AddJob, SendsNoMembersThatANewJobDoesNotHave) {
    FakeDaemon daemon({"{\"code\":200,\"job\":{}}"});
    Job job("b", Job::ACTION_BACKUP);

    JobController().addJob(job);

    EXPECT_THAT(daemon.requests(), ElementsAre("{\"job\":{\"action\":1,\"backend\":\"b\",\"param\":{},\"status\":0,"
                                               "\"unique\":\"\"},\"op\":\"job_enqueue\"}"));
}

TEST(AddJob, UpdatesTheJobFromTheReply) {
    const FakeDaemon daemon({"{\"code\":200,\"job\":" + jobText("b", 12) + "}"});
    Job job("b", Job::ACTION_BACKUP);

    EXPECT_EQ(200, JobController().addJob(job));

    EXPECT_EQ(12, job.getJobId());
    EXPECT_EQ(Job::STATUS_QUEUED, job.getStatus());
    EXPECT_EQ("b.12", job.getUniqueString());
    EXPECT_EQ(-1, job.getPid());
}

TEST(AddJob, IsDoneAlsoIfTheAdmittedJobCannotBeRead) {
    ErrorLog log;
    const FakeDaemon daemon({"{\"code\":200,\"job\":{\"job_id\":12}}"});
    Outputs outputs;

    EXPECT_EQ(200, JobController().addJob(outputs.job));

    EXPECT_EQ(OLD_JOB, outputs.job.toString());
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST(GetJob, SendsTheId) {
    FakeDaemon daemon({"{\"code\":404}", "{\"code\":404}"});
    JobController controller;
    Job job;

    controller.getJob(1, job);
    controller.getJob(std::numeric_limits<int>::max(), job);

    EXPECT_THAT(daemon.requests(),
                ElementsAre("{\"job_id\":1,\"op\":\"job_get\"}", "{\"job_id\":2147483647,\"op\":\"job_get\"}"));
}

TEST(GetJob, FillsTheJobFromTheReply) {
    const FakeDaemon daemon({"{\"code\":200,\"job\":{\"action\":2,\"backend\":\"b\",\"branch\":\"fast\",\"job_id\":3,"
                             "\"param\":{\"a\":[1]},\"pid\":99,\"status\":3,\"unique\":\"u\"}}"});
    Outputs outputs;

    EXPECT_EQ(200, JobController().getJob(3, outputs.job));

    EXPECT_EQ("{\"action\":2,\"backend\":\"b\",\"branch\":\"fast\",\"job_id\":3,\"param\":{\"a\":[1]},\"pid\":99,"
              "\"status\":3,\"unique\":\"u\"}",
              outputs.job.toString());
}

TEST(GetJob, KeepsWhatTheReplyDoesNotMention) {
    const FakeDaemon daemon({"{\"code\":200,\"job\":{\"action\":2,\"backend\":\"b\",\"param\":{},\"status\":1}}"});
    Outputs outputs;

    EXPECT_EQ(200, JobController().getJob(77, outputs.job));

    EXPECT_EQ("{\"action\":2,\"backend\":\"b\",\"branch\":\"old\",\"job_id\":77,\"param\":{},\"pid\":4711,"
              "\"status\":1,\"unique\":\"old\"}",
              outputs.job.toString());
}

TEST(GetJob, IsDoneAlsoIfTheFoundJobCannotBeRead) {
    ErrorLog log;
    const FakeDaemon daemon({"{\"code\":200,\"job\":{\"backend\":5}}"});
    Outputs outputs;

    EXPECT_EQ(200, JobController().getJob(1, outputs.job));

    EXPECT_EQ(OLD_JOB, outputs.job.toString());
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST(RemoveJob, SendsTheId) {
    FakeDaemon daemon({OK});

    EXPECT_EQ(200, JobController().removeJob(12));

    EXPECT_THAT(daemon.requests(), ElementsAre("{\"job_id\":12,\"op\":\"job_remove\"}"));
}

TEST(CleanSession, SendsIdAndLifetime) {
    FakeDaemon daemon({OK});

    EXPECT_EQ(200, JobController().cleanSession("a-session", 86400));

    EXPECT_THAT(daemon.requests(),
                ElementsAre("{\"lifetime\":86400,\"op\":\"clean_session\",\"sess_id\":\"a-session\"}"));
}

TEST(CleanSession, SendsAnyLifetimeWhole) {
    FakeDaemon daemon;
    JobController controller;
    for (const long lifetime : {0L, -1L, std::numeric_limits<long>::max(), std::numeric_limits<long>::min()}) {
        daemon.addReply(OK);
        EXPECT_EQ(200, controller.cleanSession("s", lifetime));
        EXPECT_EQ("{\"lifetime\":" + std::to_string(lifetime) + ",\"op\":\"clean_session\",\"sess_id\":\"s\"}",
                  daemon.requests().back());
    }
}

TEST(CleanSession, SendsTheIdByteForByte) {
    FakeDaemon daemon({OK});

    JobController().cleanSession(std::string("a\"\n\0\xff\xc3\xa9", 7), 1);

    EXPECT_THAT(daemon.requests(), ElementsAre("{\"lifetime\":1,\"op\":\"clean_session\",\"sess_id\":"
                                               "\"a\\\"\\n\\u0000\xff\xc3\xa9\"}"));
}

TEST(ListJobEx, SendsTheFiltersThatAreGiven) {
    FakeDaemon daemon;
    JobController controller;
    for (int given = 0; given < 32; ++given) {
        const auto action = (given & 1) != 0 ? Job::ACTION_TARGET_COPY_TO : Job::ACTION_NONE;
        const std::string backend = (given & 2) != 0 ? "b" : "";
        const std::string unique = (given & 4) != 0 ? "u" : "";
        const std::string format = (given & 8) != 0 ? "{{BRANCH}}" : "";
        const std::string target = (given & 16) != 0 ? "t" : "";
        const bool pair = !format.empty() && !target.empty();
        const std::string expected = std::string("{") + (action != Job::ACTION_NONE ? "\"action\":64," : "") +
                                     (!backend.empty() ? "\"backend\":\"b\"," : "") +
                                     (pair ? "\"format\":\"{{BRANCH}}\"," : "") + "\"op\":\"job_list\"" +
                                     (pair ? ",\"target\":\"t\"" : "") + (!unique.empty() ? ",\"unique\":\"u\"" : "") +
                                     "}";
        daemon.addReply(OK_NO_JOBS);
        std::list<Job> jobs;

        EXPECT_EQ(200, controller.listJobEx(jobs, action, backend, unique, format, target));

        EXPECT_EQ(expected, daemon.requests().back()) << given;
    }
}

TEST(ListJobEx, SendsActionsThatHaveNoName) {
    FakeDaemon daemon({OK_NO_JOBS, OK_NO_JOBS});
    JobController controller;
    std::list<Job> jobs;

    controller.listJobEx(jobs, static_cast<Job::Action>(3), "", "", "", "");
    controller.listJobEx(jobs, static_cast<Job::Action>(-1), "", "", "", "");

    EXPECT_THAT(daemon.requests(),
                ElementsAre("{\"action\":3,\"op\":\"job_list\"}", "{\"action\":-1,\"op\":\"job_list\"}"));
}

TEST(ListJobs, SendEachTheFiltersOfTheirNames) {
    FakeDaemon daemon({OK_NO_JOBS, OK_NO_JOBS, OK_NO_JOBS, OK_NO_JOBS, OK_NO_JOBS, OK_NO_JOBS});
    JobController controller;
    std::list<Job> jobs;

    controller.listJobAll(jobs);
    controller.listJobByAction(jobs, Job::ACTION_RELINK, "b");
    controller.listJobByAction(jobs, Job::ACTION_NONE, "");
    controller.listJobByBackend(jobs, "b");
    controller.listJobByBackend(jobs, "");
    controller.listJobByFormatString(jobs, "{{UNIQUE}}", "t");

    EXPECT_THAT(daemon.requests(),
                ElementsAre("{\"op\":\"job_list\"}", "{\"action\":8,\"backend\":\"b\",\"op\":\"job_list\"}",
                            "{\"op\":\"job_list\"}", "{\"backend\":\"b\",\"op\":\"job_list\"}", "{\"op\":\"job_list\"}",
                            "{\"format\":\"{{UNIQUE}}\",\"op\":\"job_list\",\"target\":\"t\"}"));
}

TEST(ListJobByFormatString, ListsEverythingWithoutATargetOrAFormat) {
    FakeDaemon daemon({"{\"code\":200,\"jobs\":[" + jobText("b", 1) + "]}", OK_NO_JOBS});
    JobController controller;
    std::list<Job> jobs;

    controller.listJobByFormatString(jobs, "{{UNIQUE}}", "");
    EXPECT_EQ(1U, jobs.size());
    controller.listJobByFormatString(jobs, "", "t");

    EXPECT_THAT(daemon.requests(), ElementsAre("{\"op\":\"job_list\"}", "{\"op\":\"job_list\"}"));
}

TEST(ListJobs, FillTheListInTheOrderOfTheReply) {
    const std::string first = jobText("z", 9);
    const std::string second = jobText("a", 2);
    const std::string third = jobText("m", 5);
    for (const Call& call : everyCall()) {
        if (call.fillsList) {
            const FakeDaemon daemon({"{\"code\":200,\"jobs\":[" + first + "," + second + "," + third + "]}"});
            JobController controller;
            Outputs outputs;
            EXPECT_EQ(200, call.make(controller, outputs)) << call.name;
            EXPECT_THAT(texts(outputs.jobs), ElementsAre(first, second, third)) << call.name;
        }
    }
}

TEST(ListJobs, AreEmptyWhereThereIsNoJob) {
    const FakeDaemon daemon({OK_NO_JOBS});
    std::list<Job> jobs(3);

    EXPECT_EQ(200, JobController().listJobAll(jobs));

    EXPECT_THAT(jobs, IsEmpty());
}

TEST(ListJobs, HaveAnEmptyJobForEachElementThatCannotBeRead) {
    ErrorLog log;
    const std::string empty = Job().toString();
    const std::string good = jobText("b", 1);
    for (const Call& call : everyCall()) {
        if (call.fillsList) {
            const FakeDaemon daemon({"{\"code\":200,\"jobs\":[" + good +
                                     ",5,1.5,null,true,\"text\",[],[{}],[[[]]],{},"
                                     "{\"backend\":\"b\",\"job_id\":5,\"unique\":\"u\"},"
                                     "{\"action\":1,\"backend\":\"b\",\"job_id\":5,\"param\":[],\"status\":1}]}"});
            JobController controller;
            Outputs outputs;
            EXPECT_EQ(200, call.make(controller, outputs)) << call.name;
            EXPECT_THAT(texts(outputs.jobs),
                        ElementsAre(good, empty, empty, empty, empty, empty, empty, empty, empty, empty, empty, empty))
                << call.name;
        }
    }
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST(ListJobs, TakeALongReplyWhole) {
    std::string elements;
    for (int id = 1; id <= 2000; ++id) {
        elements += (id > 1 ? "," : "") + jobText("backend", id);
    }
    const FakeDaemon daemon({"{\"code\":200,\"jobs\":[" + elements + "]}"});
    std::list<Job> jobs;

    EXPECT_EQ(200, JobController().listJobAll(jobs));

    ASSERT_EQ(2000U, jobs.size());
    EXPECT_EQ(jobText("backend", 2000), jobs.back().toString());
}

TEST(GetJobByUnique, SendsUniqueAndAction) {
    FakeDaemon daemon({OK_NO_JOBS, OK_NO_JOBS});
    JobController controller;
    Job job;

    controller.getJobByUnique(job, "u", Job::ACTION_RESTORE);
    controller.getJobByUnique(job, "u", Job::ACTION_NONE);

    EXPECT_THAT(daemon.requests(), ElementsAre("{\"action\":2,\"op\":\"job_list\",\"unique\":\"u\"}",
                                               "{\"op\":\"job_list\",\"unique\":\"u\"}"));
}

TEST(GetJobByUnique, FillsTheJobThatIsFound) {
    ErrorLog log;
    const FakeDaemon daemon({"{\"code\":200,\"jobs\":[" + jobText("b", 1) + "]}"});
    Outputs outputs;

    EXPECT_EQ(200, JobController().getJobByUnique(outputs.job, "b.1", Job::ACTION_BACKUP));

    EXPECT_EQ(jobText("b", 1), outputs.job.toString()) << "nothing of the old job is left";
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST(GetJobByUnique, FindsAnEmptyJobInAnElementThatCannotBeRead) {
    ErrorLog log;
    for (const char* element : {"5", "1.5", "null", "true", "\"text\"", "[]", "[{}]", "{}", "{\"backend\":\"b\"}"}) {
        const FakeDaemon daemon({"{\"code\":200,\"jobs\":[" + std::string(element) + "]}"});
        Outputs outputs;
        EXPECT_EQ(200, JobController().getJobByUnique(outputs.job, "u", Job::ACTION_BACKUP)) << element;
        EXPECT_EQ(Job().toString(), outputs.job.toString()) << element;
    }
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST(GetJobByUnique, TakesTheFirstOfTwoAndReportsIt) {
    ErrorLog log;
    const FakeDaemon daemon({"{\"code\":200,\"jobs\":[" + jobText("b", 2) + "," + jobText("a", 1) + "]}"});
    Job job;

    EXPECT_EQ(200, JobController().getJobByUnique(job, "100%s", Job::ACTION_BACKUP));

    EXPECT_EQ(jobText("b", 2), job.toString());
    EXPECT_THAT(log.take(), ElementsAre("controller.cpp: job is not unique [100%s]"));
}

TEST(GetJobByUnique, IsNotFoundInAnEmptyList) {
    ErrorLog log;
    const FakeDaemon daemon({OK_NO_JOBS});
    Outputs outputs;

    EXPECT_EQ(404, JobController().getJobByUnique(outputs.job, "u", Job::ACTION_BACKUP));

    EXPECT_EQ(OLD_JOB, outputs.job.toString());
    EXPECT_THAT(log.take(), IsEmpty());
}

} // namespace
