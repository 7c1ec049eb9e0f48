#include "queue/requests.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/job_queues.h"
#include "queue/queue_log.h"
#include "queue_fixture.h"

using namespace MARU::Backup;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class Dispatch : public QueueTest {};

} // namespace

TEST_F(Dispatch, RefusesWhatIsNoCommand) {
    const std::string requests[] = {
        "",
        " ",
        "not JSON",
        R"({"op":"job_list")",
        R"({"op":"job_list"}x)",
        "null",
        "5",
        R"("job_list")",
        R"(["job_list"])",
        R"([{"op":"job_list"}])",
        "{}",
        R"({"op":5})",
        R"({"op":null})",
        R"({"op":true})",
        R"({"op":["job_list"]})",
        R"({"op":{"op":"job_list"}})",
        R"({"OP":"job_list"})",
        std::string(100, '[') + std::string(100, ']'),
    };
    for (const std::string& request : requests) {
        EXPECT_EQ(R"({"code":400})", ask(request)) << request;

        EXPECT_THAT(diary.take(), ElementsAre("bad command: [" + request + "]"));
    }
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(Dispatch, RefusesACommandBehindWhichThereIsANul) {
    EXPECT_EQ(R"({"code":400})", ask(std::string("{\"op\":\"job_list\"}\0", 18)));

    EXPECT_THAT(diary.take(), ElementsAre(R"(bad command: [{"op":"job_list"}])"));
}

TEST_F(Dispatch, RefusesACommandOfDeepNestingWhateverItIsFor) {
    const std::string deep = std::string(4000, '[') + std::string(4000, ']');

    EXPECT_EQ(R"({"code":400})", ask(R"({"op":"job_list","deep":)" + deep + "}"));
}

TEST_F(Dispatch, DoesNotKnowOtherOperations) {
    for (const std::string op : {"", "job", "JOB_LIST", "job_list ", "job_lists", "%s%n"}) {
        EXPECT_EQ(R"({"code":501})", ask("{\"op\":\"" + op + "\"}")) << op;

        EXPECT_THAT(diary.take(), ElementsAre("handler [" + op + "] not found"));
    }
}

TEST_F(Dispatch, ComparesAnOperationsNameToItsEnd) {
    EXPECT_EQ(R"({"code":501})", ask(R"({"op":"job_list\u0000"})"));

    EXPECT_THAT(diary.take(), ElementsAre("handler [job_list] not found"));
}

TEST_F(Dispatch, FindsTheHandlerOfEachOperation) {
    EXPECT_EQ(R"({"code":400})", ask(R"({"op":"job_enqueue"})"));
    EXPECT_THAT(diary.take(), IsEmpty());

    EXPECT_EQ(R"({"code":400})", ask(R"({"op":"job_remove"})"));
    EXPECT_THAT(diary.take(), ElementsAre("bad job remove request"));

    EXPECT_EQ(R"({"code":400})", ask(R"({"op":"job_get"})"));
    EXPECT_THAT(diary.take(), ElementsAre("bad job get request"));

    EXPECT_EQ(R"({"code":200,"jobs":[]})", ask(R"({"op":"job_list"})"));
    EXPECT_THAT(diary.take(), IsEmpty());
}

TEST_F(Dispatch, TakesTheLastOfAMemberThatIsGivenTwice) {
    EXPECT_EQ(R"({"code":200,"jobs":[]})", ask(R"({"op":"job_get","op":"job_list"})"));
}

TEST_F(Dispatch, TakesAllWhiteSpaceAroundARequest) {
    EXPECT_EQ(R"({"code":200,"jobs":[]})", ask("\r\n\t {\"op\" : \"job_list\"} \n"));
}

TEST_F(Dispatch, IgnoresOtherMembers) {
    EXPECT_EQ(R"({"code":200,"jobs":[]})", ask(R"({"op":"job_list","code":500,"jobs":5,"job":{}})"));
}

TEST_F(Dispatch, ReadsNoFurtherThanTheRequestIsLong) {
    const std::string request = R"({"op":"job_list"})";
    const std::string buffer = request + R"(,"more")";

    EXPECT_EQ(R"({"code":200,"jobs":[]})",
              dispatchRequest(buffer.data(), static_cast<unsigned int>(request.size()), nullptr));
}

TEST_F(Dispatch, WritesEachRequestIntoTheDiaryIfThatIsWanted) {
    queueDebugEnabled = true;

    ask(R"({"op":"job_list"})");
    ask("rubbish");

    EXPECT_THAT(diary.take(),
                ElementsAre(R"(request [{"op":"job_list"}])", "request [rubbish]", "bad command: [rubbish]"));
}
