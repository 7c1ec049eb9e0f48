// The daemon's answers, as they stand on the wire.

#include <unistd.h>

#include <regex>

#include "daemon_test.h"
#include "support/backend_files.h"
#include "support/socket_peer.h"

using namespace MARU::Backup;

namespace {

/** A request of `size` bytes that asks for a job that is not there. */
std::string requestOfSize(std::size_t size) {
    const std::string request = "{\"op\":\"job_get\",\"job_id\":99}";
    return request + std::string(size - request.size(), ' ');
}

std::string enqueue(const std::string& job) {
    return "{\"op\":\"job_enqueue\",\"job\":" + job + "}";
}

/** The JSON of a job of `backend` and `action`. */
std::string jobText(const std::string& backend, int action, const std::string& params = "{}") {
    return "{\"backend\":\"" + backend + "\",\"action\":" + std::to_string(action) +
           ",\"status\":0,\"param\":" + params + "}";
}

const std::string NOT_FOUND = "{\"code\":404}";

class Replies : public DaemonTest {
protected:
    Replies() {
        support::writeLocalBackend("free", everyAction("command_launch = true\n"));
        support::writeLocalBackend("refusing", everyAction("command_check = false\nunique =\n" + WAITS_AT_GATE));
        support::writeLocalBackend("nameless", everyAction("unique =\n" + WAITS_AT_GATE));
        start();
        peer = std::make_unique<support::SocketPeer>();
    }

    std::string gated(int action) {
        return jobText("gated", action, "{\"gate\":\"" + newGate().path() + "\"}");
    }

    void expectRefusal(const std::string& request, int code, const std::string& line) {
        EXPECT_EQ("{\"code\":" + std::to_string(code) + "}", peer->ask(request)) << request;
        if (!line.empty()) {
            daemon->waitForLine(line);
        }
    }

    std::unique_ptr<support::SocketPeer> peer;
};

} // namespace

// Frames

TEST_F(Replies, AFrameOfNoBytesIsABadCommand) {
    expectRefusal("", 400, "bad command: []");
}

TEST_F(Replies, ARequestOf16380BytesIsAnswered) {
    EXPECT_EQ(NOT_FOUND, peer->ask(requestOfSize(16380)));
}

TEST_F(Replies, TwoRequestsInOneWriteGetTwoReplies) {
    peer->write(support::frame(requestOfSize(40)) + support::frame("{\"op\":\"job_list\"}"));
    EXPECT_EQ(NOT_FOUND, peer->readFrame());
    EXPECT_EQ("{\"code\":200,\"jobs\":[]}", peer->readFrame());
}

TEST_F(Replies, ARequestMayComeByteByByte) {
    for (const char byte : support::frame(requestOfSize(40))) {
        peer->write(std::string(1, byte));
    }
    EXPECT_EQ(NOT_FOUND, peer->readFrame());
}

TEST_F(Replies, AReplyMayBeLargerThanAMebibyte) {
    for (int slot = 0; slot < 4; ++slot) {
        addGated(Job::ACTION_RELINK, newGate()); // the queue's limit: all others wait
    }
    const std::string filling(15000, 'x');
    for (int count = 0; count < 80; ++count) {
        const std::string params = "{\"job_id\":" + std::to_string(count) + ",\"filling\":\"" + filling + "\"}";
        ASSERT_EQ(0U, peer->ask(enqueue(jobText("free", 8, params))).rfind("{\"code\":200", 0));
    }
    EXPECT_GT(peer->ask("{\"op\":\"job_list\"}").size(), std::size_t{1} << 20);

    std::list<Job> jobs;
    EXPECT_EQ(200, controller.listJobAll(jobs));
    ASSERT_EQ(84U, jobs.size());
    EXPECT_EQ(filling, jobs.back().getParam("filling", Json::Value()).asString());
}

// Dispatch

TEST_F(Replies, WhatIsNoRequestGets400AndIsQuoted) {
    for (const char* text :
         {"no json", "[]", "5", "null", "{}", "{\"op\":5}", "{\"op\":null}", "{\"op\":\"job_list\"} x"}) {
        expectRefusal(text, 400, "bad command: [" + std::string(text) + "]");
    }
}

TEST_F(Replies, AnUnknownOperationGets501) {
    expectRefusal("{\"op\":\"job_dance\"}", 501, "handler [job_dance] not found");
    expectRefusal("{\"op\":\"\"}", 501, "handler [] not found");
}

// job_enqueue

TEST_F(Replies, AnAdmittedJobComesBackAsItWasAdmitted) {
    const std::string gate = newGate().path();
    EXPECT_EQ("{\"code\":200,\"job\":{\"action\":1,\"backend\":\"gated\",\"job_id\":1,\"param\":{\"gate\":\"" + gate +
                  "\"},\"status\":1,\"unique\":\"" + gate + "\"}}",
              peer->ask(enqueue(jobText("gated", 1, "{\"gate\":\"" + gate + "\"}"))));
}

TEST_F(Replies, AJobThatIsNoneGets400WithoutAWord) {
    for (const std::string& job :
         {std::string("5"), std::string("{}"), jobText("", 1), jobText("gated", 0), jobText("gated", 0x20000000),
          std::string("{\"backend\":\"gated\",\"action\":1.0,\"status\":0,\"param\":{}}")}) {
        expectRefusal(enqueue(job), 400, "");
    }
    expectRefusal("{\"op\":\"job_enqueue\"}", 400, "");
    const std::regex expected(R"(request \[[^]*|\[loop\] check children status|scan to launch|marubackupd: [^]*)");
    for (const std::string& line : daemon->diary()) {
        EXPECT_TRUE(std::regex_match(line, expected)) << line;
    }
}

TEST_F(Replies, EachRefusalOfAJobHasItsCodeAndItsLine) {
    expectRefusal(enqueue(jobText("unheard-of", 1)), 505, "backend [unheard-of] not support");
    expectRefusal(enqueue(jobText("gated", 3)), 505, "backend [gated] not support");
    expectRefusal(enqueue(jobText("refusing", 1)), 400, "invalid job");
    expectRefusal(enqueue(jobText("nameless", 1)), 505, "backend [nameless] bad unique");

    const std::string job = gated(1);
    EXPECT_EQ(0U, peer->ask(enqueue(job)).rfind("{\"code\":200", 0));
    expectRefusal(enqueue(job), 409, "job unique conflict [" + gates.back()->path() + "]");

    EXPECT_EQ(0U, peer->ask(enqueue(gated(2))).rfind("{\"code\":200", 0));
    expectRefusal(enqueue(gated(4)), 406, "restore queue is not empty");
    expectRefusal(enqueue(gated(2)), 406, "restore queue is not empty");
}

TEST_F(Replies, TheEarlierOfTwoRefusalsWins) {
    EXPECT_EQ(0U, peer->ask(enqueue(gated(2))).rfind("{\"code\":200", 0));
    // Each row is refused by its own reason and by all that stand below it.
    expectRefusal(enqueue(jobText("", 1)), 400, "");
    expectRefusal(enqueue(jobText("unheard-of", 1)), 505, "backend [unheard-of] not support");
    expectRefusal(enqueue(jobText("refusing", 1)), 400, "invalid job");
    expectRefusal(enqueue(jobText("nameless", 1)), 505, "backend [nameless] bad unique");
    const std::string duplicate = jobText("gated", 1, "{\"gate\":\"" + gates.back()->path() + "\"}");
    expectRefusal(enqueue(duplicate), 406, "restore queue is not empty");
}

TEST_F(Replies, AConflictLeavesAGapInTheIds) {
    const std::string job = gated(1);
    peer->ask(enqueue(job));
    expectRefusal(enqueue(job), 409, "");
    EXPECT_NE(std::string::npos, peer->ask(enqueue(gated(1))).find("\"job_id\":3"));
}

TEST_F(Replies, NoOtherRefusalTakesAnId) {
    expectRefusal(enqueue(jobText("refusing", 1)), 400, "");
    expectRefusal(enqueue(jobText("nameless", 1)), 505, "");
    EXPECT_NE(std::string::npos, peer->ask(enqueue(gated(2))).find("\"job_id\":1"));
    expectRefusal(enqueue(gated(1)), 406, "");
}

TEST_F(Replies, AClientCannotGiveAWaitingJobAProcess) {
    // Removing such a job would signal this test.
    std::string job = gated(1);
    peer->ask(enqueue(gated(1)));
    job.insert(job.size() - 1, ",\"pid\":" + std::to_string(getpid()));
    const std::string reply = peer->ask(enqueue(job));
    EXPECT_EQ(std::string::npos, reply.find("\"pid\"")) << reply;
    EXPECT_EQ("{\"code\":200}", peer->ask("{\"op\":\"job_remove\",\"job_id\":2}"));
    expectRefusal("{\"op\":\"job_get\",\"job_id\":2}", 404, "");
}

// job_get and job_remove

TEST_F(Replies, AnIdThatIsNoneGets400) {
    for (const char* id : {"0", "-1", "\"1\"", "1.0", "2147483648", "null", "[]"}) {
        expectRefusal("{\"op\":\"job_get\",\"job_id\":" + std::string(id) + "}", 400, "bad job get request");
        expectRefusal("{\"op\":\"job_remove\",\"job_id\":" + std::string(id) + "}", 400, "bad job remove request");
    }
    expectRefusal("{\"op\":\"job_get\"}", 400, "bad job get request");
    expectRefusal("{\"op\":\"job_remove\"}", 400, "bad job remove request");
}

TEST_F(Replies, AnUnknownIdGets404) {
    expectRefusal("{\"op\":\"job_get\",\"job_id\":7}", 404, "");
    expectRefusal("{\"op\":\"job_remove\",\"job_id\":7}", 404, "remove job [7]");
}

TEST_F(Replies, ARunningJobIsToldWithItsProcess) {
    const Job job = addGated(Job::ACTION_BACKUP, newGate());
    const std::string reply = peer->ask("{\"op\":\"job_get\",\"job_id\":1}");
    EXPECT_NE(std::string::npos, reply.find("\"status\":2")) << reply;
    EXPECT_NE(std::string::npos, reply.find("\"pid\":" + std::to_string(pidOf(job)))) << reply;
}

TEST_F(Replies, RemovingAWaitingJobTakesItOut) {
    addGated(Job::ACTION_BACKUP, newGate());
    const Job waiting = addGated(Job::ACTION_BACKUP, newGate());
    EXPECT_EQ("{\"code\":200}", peer->ask("{\"op\":\"job_remove\",\"job_id\":2}"));
    daemon->waitForLine("remove job [2]");
    EXPECT_EQ(Job::STATUS_NONE, statusOf(waiting));
}

TEST_F(Replies, RemovingARunningJobTwiceSignalsItOnce) {
    support::Gate& gate = newGate();
    const Job job = addGated(Job::ACTION_BACKUP, gate, "stubborn");
    gate.awaitJob();
    const std::string sent = "send sig[15] to job [1] pid [" + std::to_string(pidOf(job)) + "]";

    EXPECT_EQ("{\"code\":200}", peer->ask("{\"op\":\"job_remove\",\"job_id\":1}"));
    EXPECT_EQ(Job::STATUS_STOPPING, statusOf(job));
    EXPECT_EQ("{\"code\":200}", peer->ask("{\"op\":\"job_remove\",\"job_id\":1}"));
    daemon->waitForLine(sent);
    EXPECT_EQ(1, daemon->countLines(sent));
    gate.open();
    daemon->waitForLine(exitLine(job, 0));
    EXPECT_EQ(Job::STATUS_NONE, statusOf(job));
}

// job_list

TEST_F(Replies, AFilterOfAnotherTypeGets400AndIsNamed) {
    expectRefusal("{\"op\":\"job_list\",\"action\":\"1\"}", 400, "bad list param: action");
    expectRefusal("{\"op\":\"job_list\",\"format\":1,\"target\":\"x\"}", 400, "bad list param: format");
    expectRefusal("{\"op\":\"job_list\",\"format\":\"x\",\"target\":1}", 400, "bad list param: format");
    expectRefusal("{\"op\":\"job_list\",\"backend\":1}", 400, "bad list param: backend");
    expectRefusal("{\"op\":\"job_list\",\"unique\":null}", 400, "bad list param: unique");
    expectRefusal("{\"op\":\"job_list\",\"unique\":1,\"backend\":1,\"format\":1,\"target\":1,\"action\":1.5}", 400,
                  "bad list param: action");
}

TEST_F(Replies, AFormatWithoutATargetFiltersNothing) {
    addGated(Job::ACTION_BACKUP, newGate());
    std::list<Job> jobs;
    EXPECT_EQ(200, controller.listJobByFormatString(jobs, "{{BACKEND}}", ""));
    EXPECT_EQ(1U, jobs.size());
    EXPECT_NE(std::string::npos, peer->ask("{\"op\":\"job_list\",\"format\":5}").find("\"job_id\":1"));
    EXPECT_NE(std::string::npos, peer->ask("{\"op\":\"job_list\",\"target\":\"x\"}").find("\"job_id\":1"));
}

TEST_F(Replies, ListsComeByQueueNameAndThenByArrival) {
    const Job relink = addGated(Job::ACTION_RELINK, newGate());
    const Job backup = addGated(Job::ACTION_BACKUP, newGate());
    const Job second = addGated(Job::ACTION_BACKUP, newGate());
    std::list<Job> jobs;
    ASSERT_EQ(200, controller.listJobAll(jobs));
    std::vector<int> ids;
    for (const Job& job : jobs) {
        ids.push_back(job.getJobId());
    }
    EXPECT_EQ((std::vector<int>{backup.getJobId(), second.getJobId(), relink.getJobId()}), ids);
}

TEST_F(Replies, EachFilterTakesItsJobsOnly) {
    const Job backup = addGated(Job::ACTION_BACKUP, newGate());
    const Job relink = addGated(Job::ACTION_RELINK, newGate());
    std::list<Job> jobs;
    EXPECT_EQ(200, controller.listJobByAction(jobs, Job::ACTION_RELINK, ""));
    ASSERT_EQ(1U, jobs.size());
    EXPECT_EQ(relink.getJobId(), jobs.front().getJobId());

    EXPECT_EQ(200, controller.listJobByBackend(jobs, "other"));
    EXPECT_TRUE(jobs.empty());

    EXPECT_EQ(200, controller.listJobByFormatString(jobs, "{{BACKEND}}:{{gate}}", "gated:" + gates[0]->path()));
    ASSERT_EQ(1U, jobs.size());
    EXPECT_EQ(backup.getJobId(), jobs.front().getJobId());

    Job found;
    EXPECT_EQ(200, controller.getJobByUnique(found, gates[1]->path(), Job::ACTION_NONE));
    EXPECT_EQ(relink.getJobId(), found.getJobId());
    EXPECT_EQ(404, controller.getJobByUnique(found, gates[1]->path(), Job::ACTION_BACKUP));
}

TEST_F(Replies, AnActionThatNeverHadAJobListsNothing) {
    EXPECT_EQ("{\"code\":200,\"jobs\":[]}", peer->ask("{\"op\":\"job_list\",\"action\":2}"));
    EXPECT_EQ("{\"code\":200,\"jobs\":[]}", peer->ask("{\"op\":\"job_list\",\"action\":3}"));
}
