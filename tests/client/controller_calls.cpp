#include "controller_calls.h"

#include <syslog.h>
#include <unistd.h>

#include <gtest/gtest.h>

using MARU::Backup::Job;
using MARU::Backup::JobController;

const char* const OLD_JOB = "{\"action\":1,\"backend\":\"old\",\"branch\":\"old\",\"job_id\":77,"
                            "\"param\":{\"old\":true},\"pid\":4711,\"status\":2,\"unique\":\"old\"}";

Outputs::Outputs() : job("old", Job::ACTION_BACKUP), jobs(2) {
    job.setCommandBranch("old");
    job.setJobId(77);
    job.setParam("old", true);
    job.setPid(4711);
    job.setStatus(Job::STATUS_RUNNING);
    job.setUniqueString("old");
}

const std::vector<Call>& everyCall() {
    static const std::vector<Call> calls = {
        {"addJob", [](JobController& controller, Outputs& outputs) { return controller.addJob(outputs.job); },
         Complaint::OF_ADDING, false},
        {"getJob", [](JobController& controller, Outputs& outputs) { return controller.getJob(1, outputs.job); },
         Complaint::WITH_TEXT, false},
        {"removeJob", [](JobController& controller, Outputs&) { return controller.removeJob(1); }, Complaint::WITH_TEXT,
         false},
        {"cleanSession", [](JobController& controller, Outputs&) { return controller.cleanSession("session", 60); },
         Complaint::WITHOUT_TEXT, false},
        {"listJobEx",
         [](JobController& controller, Outputs& outputs) {
             return controller.listJobEx(outputs.jobs, Job::ACTION_BACKUP, "b", "u", "{{BRANCH}}", "t");
         },
         Complaint::WITH_TEXT, true},
        {"listJobAll", [](JobController& controller, Outputs& outputs) { return controller.listJobAll(outputs.jobs); },
         Complaint::WITH_TEXT, true},
        {"listJobByAction",
         [](JobController& controller, Outputs& outputs) {
             return controller.listJobByAction(outputs.jobs, Job::ACTION_BACKUP, "b");
         },
         Complaint::WITH_TEXT, true},
        {"listJobByBackend",
         [](JobController& controller, Outputs& outputs) { return controller.listJobByBackend(outputs.jobs, "b"); },
         Complaint::WITH_TEXT, true},
        {"listJobByFormatString",
         [](JobController& controller, Outputs& outputs) {
             return controller.listJobByFormatString(outputs.jobs, "{{BRANCH}}", "t");
         },
         Complaint::WITH_TEXT, true},
        {"getJobByUnique",
         [](JobController& controller, Outputs& outputs) {
             return controller.getJobByUnique(outputs.job, "u", Job::ACTION_BACKUP);
         },
         Complaint::WITH_TEXT, false},
    };
    return calls;
}

std::vector<std::string> ErrorLog::take() {
    std::vector<std::string> errors;
    const std::vector<support::SyslogLine>& lines = socket.lines();
    for (; taken < lines.size(); ++taken) {
        if (lines[taken].priority == LOG_DEBUG) {
            continue;
        }
        const support::LocatedMessage message = support::parseLocated(lines[taken].message);
        EXPECT_TRUE(message.located) << lines[taken].message;
        EXPECT_EQ(LOG_ERR, lines[taken].priority);
        EXPECT_EQ("err", message.level);
        EXPECT_EQ(getpid(), message.pid);
        EXPECT_GT(message.line, 0);
        errors.push_back(message.unit + ": " + message.text);
    }
    return errors;
}
