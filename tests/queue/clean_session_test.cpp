#include <marubackup/command_server.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <limits>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/queue_server.h"
#include "queue/requests.h"
#include "queue_fixture.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/session_areas.h"

using namespace MARU::Backup;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

/** A session's record, and its directory if it has one. */
void makeSession(const std::string& id, bool withDirectory) {
    const std::string path = "/tmp/marusession-" + id;
    std::filesystem::create_directory(support::SESSION_RECORDS);
    chmod(support::SESSION_RECORDS.c_str(), 0700);
    support::writeFile(support::sessionRecord(id), path + "\n", 0600);
    if (withDirectory) {
        std::filesystem::create_directory(path);
    }
}

/** Requests to a daemon whose loop does not run, so that no timer can be set. */
class CleanSessionRequests : public QueueTest {
protected:
    std::string askServer(const std::string& request) {
        return dispatchRequest(request.data(), static_cast<unsigned int>(request.size()), &server);
    }

    CleanSessionContext* newContext(const std::string& id, long lifetime) {
        return new CleanSessionContext{id, lifetime, &server};
    }

    /**
     * `work` answers true, and is told that there is no timer for it. In a child,
     * which takes what that leaves behind with it.
     */
    template <typename Work>
    void expectNoTimer(Work work) {
        const pid_t child = support::startInChild([&work]() { return work() ? 0 : 1; });
        EXPECT_EQ("exit 0", support::describeStatus(support::waitForChild(child)));
        support::expectLocated(log, LOG_ERR, child, "command_server", "add timeout event failed");
        EXPECT_THAT(diary.take(), ElementsAre("failed to setTimeout for clean session job"));
    }

    void expectRefused(const std::string& request) {
        EXPECT_EQ(R"({"code":400})", ask(request)) << request;
        EXPECT_THAT(diary.take(), ElementsAre("get bad sessin clean job request")) << request;
    }

    support::SessionAreas areas;
    CommandServer server;
};

} // namespace

TEST_F(CleanSessionRequests, RefusesWhatNamesNoSession) {
    const std::string lifetime = R"("op":"clean_session","lifetime":0)";
    for (const std::string id : {"null", "true", "false", "[]", R"(["id"])", "{}", R"({"id":"id"})"}) {
        expectRefused("{" + lifetime + R"(,"sess_id":)" + id + "}");
    }
    expectRefused("{" + lifetime + "}");
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(CleanSessionRequests, RefusesALifetimeThatIsNoIntegerOf64Bits) {
    const std::string id = R"("op":"clean_session","sess_id":"id")";
    const std::string lifetimes[] = {R"("5")",
                                     R"("")",
                                     "5.0",
                                     "1e2",
                                     "0.5",
                                     "null",
                                     "true",
                                     "[]",
                                     "[5]",
                                     "{}",
                                     "18446744073709551616",
                                     "-9223372036854775809"};
    for (const std::string& lifetime : lifetimes) {
        expectRefused("{" + id + R"(,"lifetime":)" + lifetime + "}");
    }
    expectRefused("{" + id + "}");
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(CleanSessionRequests, FailsIfTheTimerCannotBeSet) {
    expectNoTimer(
        [this]() { return askServer(R"({"op":"clean_session","sess_id":"id","lifetime":0})") == R"({"code":500})"; });
}

TEST_F(CleanSessionRequests, IsDoneOnceTheSessionIsGone) {
    makeSession("expired", true);
    makeSession("vanished", false);

    cleanSessionTimeout(newContext("expired", -1));
    cleanSessionTimeout(newContext("vanished", 1000));
    cleanSessionTimeout(newContext("unknown", 1000));

    EXPECT_FALSE(support::isThere("/tmp/marusession-expired"));
    EXPECT_FALSE(support::isThere(support::sessionRecord("vanished")));
    EXPECT_THAT(diary.take(), IsEmpty());
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(CleanSessionRequests, ReportsASessionThatCannotBeDestroyed) {
    cleanSessionTimeout(newContext("../../etc", -5));

    support::expectLocated(log, LOG_ERR, getpid(), "timed_session", "failed to destroy session[../../etc]");
    support::expectLocated(log, LOG_ERR, getpid(), QUEUE_UNIT, "failed to destroy expired session[../../etc][-5]");
    EXPECT_THAT(diary.take(), IsEmpty());
}

TEST_F(CleanSessionRequests, KeepsItsContextIfTheNextTimerCannotBeSet) {
    makeSession("used", true);

    expectNoTimer([this]() {
        CleanSessionContext* const context = newContext("used", 1000);
        cleanSessionTimeout(context);
        return context->sessionId == "used" && context->lifetime == 1000;
    });

    EXPECT_TRUE(support::isThere("/tmp/marusession-used"));
}

TEST_F(CleanSessionRequests, WaitsForAsLongAsItCan) {
    struct Row {
        long seconds;
        long delay;
    };
    const long longest = 1L << 30;
    const Row rows[] = {
        {0, 0},
        {1, 1},
        {259200, 259200},
        {-1, 0},
        {std::numeric_limits<long>::min(), 0},
        {longest, longest},
        {longest + 1, longest},
        {std::numeric_limits<long>::max(), longest},
    };
    for (const Row& row : rows) {
        EXPECT_EQ(row.delay, delayOfSeconds(row.seconds).tv_sec) << row.seconds;
        EXPECT_EQ(0, delayOfSeconds(row.seconds).tv_usec);
    }
}
