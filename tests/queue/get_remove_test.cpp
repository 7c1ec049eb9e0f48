#include "queue/requests.h"

#include <csignal>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/job_queues.h"
#include "queue/queue_server.h"
#include "queue_fixture.h"
#include "support/in_child.h"

using namespace MARU::Backup;
using support::describeStatus;
using support::waitForChild;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::string getRequest(const std::string& id) {
    return R"({"op":"job_get","job_id":)" + id + "}";
}

std::string removeRequest(const std::string& id) {
    return R"({"op":"job_remove","job_id":)" + id + "}";
}

/** What is no id of a job. */
const char* const BAD_IDS[] = {
    "0",   "-1",  "-2147483648", "\"1\"",      "\"\"",
    "1.0", "1.5", "1e0",         "true",       "null",
    "[1]", "{}",  "2147483648",  "4294967297", "18446744073709551617",
};

class GetJob : public QueueTest {};
class RemoveJob : public QueueTest {};

} // namespace

TEST_F(GetJob, RefusesWhatIsNoId) {
    addHeld(Job::ACTION_BACKUP);

    for (const char* const id : BAD_IDS) {
        EXPECT_EQ(R"({"code":400})", ask(getRequest(id))) << id;
        EXPECT_THAT(diary.take(), ElementsAre("bad job get request"));
    }
    EXPECT_EQ(R"({"code":400})", ask(R"({"op":"job_get","job":1})"));
    EXPECT_THAT(diary.take(), ElementsAre("bad job get request"));
}

TEST_F(GetJob, DoesNotFindAnUnknownId) {
    addHeld(Job::ACTION_BACKUP);

    for (const char* const id : {"2", "2147483647"}) {
        EXPECT_EQ(R"({"code":404})", ask(getRequest(id)));
        EXPECT_THAT(diary.take(), IsEmpty());
    }
}

TEST_F(GetJob, ShowsTheJobAsItIs) {
    addHeld(Job::ACTION_RESTORE);
    change(addWithProcess(4711, Job::STATUS_STOPPING), [](Job& job) {
        job.setCommandBranch("verify");
        job.setUniqueString("u");
        job.setParam("name", "n");
    });
    addHeld(Job::ACTION_BACKUP);

    EXPECT_EQ(R"({"code":200,"job":{"action":1,"backend":"held","branch":"verify","job_id":2,"param":{"name":"n"},)"
              R"("pid":4711,"status":3,"unique":"u"}})",
              ask(getRequest("2")));
    EXPECT_EQ(R"({"code":200,"job":{"action":2,"backend":"held","job_id":1,"param":{},"status":1,"unique":""}})",
              ask(getRequest("1")));
    EXPECT_THAT(diary.take(), IsEmpty());
}

TEST_F(GetJob, DoesNotFindAJobWithoutAStatus) {
    addHeld(Job::ACTION_BACKUP, Job::STATUS_NONE);

    EXPECT_EQ(R"({"code":404})", ask(getRequest("1")));
}

TEST_F(RemoveJob, RefusesWhatIsNoId) {
    addHeld(Job::ACTION_BACKUP);

    for (const char* const id : BAD_IDS) {
        EXPECT_EQ(R"({"code":400})", ask(removeRequest(id))) << id;
        EXPECT_THAT(diary.take(), ElementsAre("bad job remove request"));
    }
    EXPECT_EQ(R"({"code":400})", ask(R"({"op":"job_remove"})"));
    EXPECT_THAT(ids("backup"), ElementsAre(1));
}

TEST_F(RemoveJob, DoesNotFindAnUnknownId) {
    addHeld(Job::ACTION_BACKUP);

    EXPECT_EQ(R"({"code":404})", ask(removeRequest("9")));

    EXPECT_THAT(diary.take(), ElementsAre("remove job [9]"));
    EXPECT_THAT(ids("backup"), ElementsAre(1));
}

TEST_F(RemoveJob, TakesAWaitingJobOutOfItsQueue) {
    addHeld(Job::ACTION_BACKUP);
    addHeld(Job::ACTION_BACKUP);
    addHeld(Job::ACTION_RESTORE);

    EXPECT_EQ(R"({"code":200})", ask(removeRequest("1")));

    EXPECT_THAT(diary.take(), ElementsAre("remove job [1]"));
    EXPECT_THAT(ids("backup"), ElementsAre(2));
    EXPECT_THAT(ids("restore"), ElementsAre(3));
    EXPECT_EQ(R"({"code":404})", ask(removeRequest("1")));
}

TEST_F(RemoveJob, StopsARunningJobWhichIsListedUntilItHasEnded) {
    const Job& job = launched(addHeld(Job::ACTION_BACKUP));
    diary.take();

    EXPECT_EQ(R"({"code":200})", ask(removeRequest("1")));

    EXPECT_THAT(diary.take(), ElementsAre("remove job [1]", sent(SIGTERM, job)));
    EXPECT_EQ("{\"code\":200,\"job\":" + job.toString() + "}", ask(getRequest("1")));
    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_STOPPING));

    awaitEnd(job.getPid());
    queue_check_children_status("sigchild");
    EXPECT_EQ(R"({"code":404})", ask(getRequest("1")));
}

TEST_F(RemoveJob, SendsNothingMoreToAJobThatIsStopping) {
    support::Gate gate(folder.path("gate"));
    const Job& job = launched(addScript(Job::ACTION_BACKUP, "read line < " + gate.path() + "; exit 5"));
    setStatus(job, Job::STATUS_STOPPING);
    diary.take();

    EXPECT_EQ(R"({"code":200})", ask(removeRequest("1")));
    EXPECT_EQ(R"({"code":200})", ask(removeRequest("1")));

    EXPECT_THAT(diary.take(), ElementsAre("remove job [1]", "remove job [1]"));
    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_STOPPING));
    gate.open();
    EXPECT_EQ("exit 5", describeStatus(waitForChild(job.getPid())));
}
