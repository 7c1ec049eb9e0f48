#include <marubackup/controller.h>

#include <limits>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "controller_calls.h"
#include "support/fake_daemon.h"

// What the controller refuses to send, and what it makes of refusals and of replies that no daemon should give.

namespace {

using MARU::Backup::Job;
using MARU::Backup::JobController;
using support::FakeDaemon;
using testing::ElementsAre;
using testing::IsEmpty;

/** Makes a request that fails with `code`, and expects that its outputs are as a failure leaves them. */
void expectFailure(int code, const Call& call, JobController& controller) {
    Outputs outputs;
    EXPECT_EQ(code, call.make(controller, outputs));
    EXPECT_EQ(OLD_JOB, outputs.job.toString());
    EXPECT_EQ(call.fillsList ? 0U : 2U, outputs.jobs.size());
}

/** The line in the log about a reply that is not JSON. */
std::string complaintOfNoJson(const Call& call, const std::string& reply) {
    return "controller.cpp: parse response failed" + (call.complaint == Complaint::WITH_TEXT ? ", " + reply : "");
}

/** The line in the log about a reply that is JSON and has no code. */
std::string complaintOfNoCode(const Call& call, const std::string& reply) {
    return call.complaint == Complaint::OF_ADDING ? "controller.cpp: addJob failed." : complaintOfNoJson(call, reply);
}

/** A reply whose member "job" holds a job with so many arrays in one another; itself it is two levels more. */
std::string replyWithNesting(std::size_t arrays) {
    return "{\"code\":200,\"job\":{\"action\":1,\"backend\":\"b\",\"param\":{\"a\":" + std::string(arrays, '[') +
           std::string(arrays, ']') + "},\"status\":1},\"jobs\":[]}";
}

/** Members "job" that are none, each with the comma before it. */
const char* const JOBS_THAT_ARE_NONE[] = {"",
                                          ",\"job\":null",
                                          ",\"job\":true",
                                          ",\"job\":7",
                                          ",\"job\":1.5",
                                          ",\"job\":\"\"",
                                          ",\"job\":\"{}\"",
                                          ",\"job\":[]",
                                          ",\"job\":[{}]",
                                          ",\"jobs\":[{}]"};

TEST(BadArguments, AJobThatCannotBeEnqueuedIsNotSent) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    const Job JOBS[] = {
        Job(),
        Job("", Job::ACTION_BACKUP),
        Job("b", Job::ACTION_NONE),
        Job("b", Job::ACTION_SHARE_SNAPSHOT_RESTORE),
        Job("b", Job::ACTION_SPACE_BUILD),
        Job("b", Job::ACTION_RESERVED_BLOCKER),
    };
    for (const Job& invalid : JOBS) {
        Job job = invalid;
        EXPECT_EQ(400, controller.addJob(job));
        EXPECT_EQ(invalid.toString(), job.toString());
        EXPECT_THAT(log.take(), ElementsAre("controller.cpp: addJob failed: invalid job."));
    }
    EXPECT_EQ(0, daemon.connections());
}

TEST(BadArguments, AnIdBelowOneIsNotSent) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    for (const int id : {0, -1, -5, std::numeric_limits<int>::min()}) {
        Outputs outputs;
        EXPECT_EQ(400, controller.getJob(id, outputs.job));
        EXPECT_EQ(OLD_JOB, outputs.job.toString());
        EXPECT_EQ(400, controller.removeJob(id));
    }
    EXPECT_THAT(log.take(), IsEmpty());
    EXPECT_EQ(0, daemon.connections());
}

TEST(BadArguments, AnEmptySessionIdIsNotSent) {
    ErrorLog log;
    FakeDaemon daemon;
    EXPECT_EQ(400, JobController().cleanSession("", 60));
    EXPECT_THAT(log.take(), IsEmpty());
    EXPECT_EQ(0, daemon.connections());
}

TEST(BadArguments, AreRefusedAlsoWhereNobodyServes) {
    JobController controller;
    Job job;
    EXPECT_EQ(400, controller.addJob(job));
    EXPECT_EQ(400, controller.getJob(0, job));
    EXPECT_EQ(400, controller.removeJob(-5));
    EXPECT_EQ(400, controller.cleanSession("", 60));
}

TEST(UnreadableReplies, TextThatIsNotJsonIsAnInternalError) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    const std::string REPLIES[] = {"pong",
                                   "{\"code\":200",
                                   "{\"code\":200}x",
                                   "{\"code\":200}{\"code\":200}",
                                   "{\"code\":200,}",
                                   "{\"code\":0200}",
                                   "{\"code\":1e400}",
                                   "{\"code\":-1e400}",
                                   "{\"code\":NaN}",
                                   "{code:200}",
                                   "{\"code\":200,\"\\ud83d\":0}",
                                   "{\"code\":200,\"x\":\"\\ude00\"}",
                                   "\xef\xbb\xbf{\"code\":200}",
                                   "\xff",
                                   "100%s %n",
                                   " ",
                                   std::string(5000, '['),
                                   std::string(5000, '"'),
                                   std::string(5000, '9'),
                                   std::string(5000, '\xff'),
                                   "[" + std::string(2500, '[') + std::string(2500, ']') + "]",
                                   replyWithNesting(62)};
    for (const Call& call : everyCall()) {
        for (const std::string& reply : REPLIES) {
            SCOPED_TRACE(call.name + (" " + reply));
            daemon.addReply(reply);
            expectFailure(500, call, controller);
            EXPECT_THAT(log.take(), ElementsAre(complaintOfNoJson(call, reply)));
        }
    }
}

TEST(UnreadableReplies, AReplyIsReadUpToTheLimitOfNesting) {
    const FakeDaemon daemon({replyWithNesting(61), replyWithNesting(62)});
    JobController controller;
    Outputs outputs;
    EXPECT_EQ(200, controller.getJob(1, outputs.job));
    EXPECT_EQ("b", outputs.job.getBackend());
    EXPECT_EQ(500, controller.getJob(1, outputs.job));
}

TEST(UnreadableReplies, AnEmptyReplyIsAnInternalError) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    for (const Call& call : everyCall()) {
        SCOPED_TRACE(call.name);
        daemon.addReply("");
        expectFailure(500, call, controller);
        EXPECT_THAT(log.take(), ElementsAre(complaintOfNoJson(call, "")));
    }
}

TEST(UnreadableReplies, TextWithANulIsAnInternalErrorAndLoggedUpToIt) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    const struct {
        std::string before;
        std::string behind;
    } REPLIES[] = {{"{\"code\":200}", "{}"},          {"{\"code\":200}", ""},       {"", "{\"code\":200}"}, {"", ""},
                   {"{\"code\":200,\"x\":\"", "\"}"}, {"", std::string(5000, '\0')}};
    for (const Call& call : everyCall()) {
        for (const auto& reply : REPLIES) {
            SCOPED_TRACE(call.name + (" " + reply.before));
            daemon.addReply(reply.before + '\0' + reply.behind);
            expectFailure(500, call, controller);
            EXPECT_THAT(log.take(), ElementsAre(complaintOfNoJson(call, reply.before)));
        }
    }
}

TEST(UnreadableReplies, AReplyTooLongForTheLogIsAnInternalError) {
    FakeDaemon daemon;
    JobController controller;
    for (const Call& call : everyCall()) {
        SCOPED_TRACE(call.name);
        daemon.addReply(std::string(2000000, 'x'));
        expectFailure(500, call, controller);
    }
}

TEST(UnreadableReplies, AReplyWithoutAnIntegerCodeIsAnInternalError) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    const std::string REPLIES[] = {
        // no object at all
        "null", "true", "false", "200", "0.5", "\"200\"", "\"\"", "[]", "[200]", "[{\"code\":200}]",
        std::string(64, '[') + std::string(64, ']'),
        // no code
        "{}", "{\"Code\":200}", "{\"code\\u0000\":200}", "{\"reply\":{\"code\":200}}", "{\"job\":{},\"jobs\":[]}",
        // a code of another type
        "{\"code\":null}", "{\"code\":true}", "{\"code\":false}", "{\"code\":200.0}", "{\"code\":200.5}",
        "{\"code\":2e2}", "{\"code\":\"200\"}", "{\"code\":\"\"}", "{\"code\":[]}", "{\"code\":[200]}", "{\"code\":{}}",
        "{\"code\":{\"code\":200}}", "{\"code\":200,\"code\":\"200\"}", "{\"code\":\"200\",\"job\":{},\"jobs\":[]}",
        // a code that is no int
        "{\"code\":2147483648}", "{\"code\":-2147483649}", "{\"code\":4294967496}", "{\"code\":-4294967096}",
        "{\"code\":9223372036854775808}", "{\"code\":18446744073709551615}", "{\"code\":18446744073709551816}",
        "{\"code\":1e308}", "{\"code\":-1e308}", "{\"code\":4294967496,\"job\":{},\"jobs\":[]}"};
    for (const Call& call : everyCall()) {
        for (const std::string& reply : REPLIES) {
            SCOPED_TRACE(call.name + (" " + reply));
            daemon.addReply(reply);
            expectFailure(500, call, controller);
            EXPECT_THAT(log.take(), ElementsAre(complaintOfNoCode(call, reply)));
        }
    }
}

TEST(UnreadableReplies, AnAdmittedJobThatIsNoObjectIsAnInternalError) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    for (const char* member : JOBS_THAT_ARE_NONE) {
        SCOPED_TRACE(member);
        daemon.addReply("{\"code\":200" + std::string(member) + "}");
        Outputs outputs;
        EXPECT_EQ(500, controller.addJob(outputs.job));
        EXPECT_EQ(OLD_JOB, outputs.job.toString());
        EXPECT_THAT(log.take(), ElementsAre("controller.cpp: addJob failed."));
    }
}

TEST(UnreadableReplies, AFoundJobThatIsNoObjectIsAnInternalErrorAndNotLogged) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    for (const char* member : JOBS_THAT_ARE_NONE) {
        SCOPED_TRACE(member);
        daemon.addReply("{\"code\":200" + std::string(member) + "}");
        Outputs outputs;
        EXPECT_EQ(500, controller.getJob(1, outputs.job));
        EXPECT_EQ(OLD_JOB, outputs.job.toString());
        EXPECT_THAT(log.take(), IsEmpty());
    }
}

TEST(UnreadableReplies, AListThatIsNoArrayIsAnInternalErrorAndNoEmptyList) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    const std::string REPLIES[] = {"{\"code\":200}",
                                   "{\"code\":200,\"jobs\":null}",
                                   "{\"code\":200,\"jobs\":{}}",
                                   "{\"code\":200,\"jobs\":{\"0\":{}}}",
                                   "{\"code\":200,\"jobs\":\"[]\"}",
                                   "{\"code\":200,\"jobs\":\"\"}",
                                   "{\"code\":200,\"jobs\":1}",
                                   "{\"code\":200,\"jobs\":1.5}",
                                   "{\"code\":200,\"jobs\":true}",
                                   "{\"code\":200,\"jobs\":[{}],\"jobs\":{}}",
                                   "{\"code\":200,\"job\":[]}"};
    for (const Call& call : everyCall()) {
        if (!call.fillsList && call.name != std::string("getJobByUnique")) {
            continue;
        }
        for (const std::string& reply : REPLIES) {
            SCOPED_TRACE(call.name + (" " + reply));
            daemon.addReply(reply);
            expectFailure(500, call, controller);
            EXPECT_THAT(log.take(), ElementsAre("controller.cpp: parse response failed, " + reply));
        }
    }
}

TEST(OtherCodes, ArePassedOnAndLoggedByAddJobAlone) {
    ErrorLog log;
    FakeDaemon daemon;
    JobController controller;
    const int CODES[] = {400, 404, 406, 409, 500, 501, 503, 505, 199, 201, 0, -1, 2147483647, -2147483647 - 1};
    for (const Call& call : everyCall()) {
        for (const int code : CODES) {
            SCOPED_TRACE(call.name + (" " + std::to_string(code)));
            daemon.addReply("{\"code\":" + std::to_string(code) + "}");
            expectFailure(code, call, controller);
            std::vector<std::string> expected;
            if (call.complaint == Complaint::OF_ADDING) {
                expected = {"controller.cpp: addJob failed. errno: [" + std::to_string(code) + "]"};
            }
            EXPECT_EQ(expected, log.take());
        }
    }
}

TEST(OtherCodes, LetNothingOfTheReplyIntoTheOutputs) {
    FakeDaemon daemon;
    JobController controller;
    const std::string job = "{\"action\":2,\"backend\":\"new\",\"job_id\":5,\"param\":{},\"status\":1}";
    for (const Call& call : everyCall()) {
        SCOPED_TRACE(call.name);
        daemon.addReply("{\"code\":409,\"job\":" + job + ",\"jobs\":[" + job + "]}");
        expectFailure(409, call, controller);
    }
}

TEST(OtherCodes, ComeFromRemoveJobAndCleanSessionWhateverElseTheReplyHolds) {
    const FakeDaemon daemon({"{\"code\":200,\"job\":5}", "{\"code\":200,\"sess_id\":[]}"});
    JobController controller;
    EXPECT_EQ(200, controller.removeJob(1));
    EXPECT_EQ(200, controller.cleanSession("s", 1));
}

} // namespace
