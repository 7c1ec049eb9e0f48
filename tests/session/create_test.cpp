#include <marubackup/timed_session.h>

#include <unistd.h>

#include <filesystem>
#include <limits>
#include <string>

#include <gmock/gmock.h>

#include "session_fixture.h"
#include "support/fake_daemon.h"
#include "support/files.h"
#include "support/mount.h"

namespace fs = std::filesystem;

using MARU::Backup::TimedSession;
using support::FakeDaemon;
using support::inNewRoot;
using support::isThere;
using support::newVolume;
using testing::ElementsAre;
using testing::StartsWith;

namespace {

const char* const OK = "{\"code\":200,\"sess_id\":\"\"}";

std::string request(const std::string& id, long lifetime) {
    return "{\"lifetime\":" + std::to_string(lifetime) + ",\"op\":\"clean_session\",\"sess_id\":\"" + id + "\"}";
}

std::string complaint(const std::string& id, long lifetime) {
    return "failed to add clean session event[" + id + "][" + std::to_string(lifetime) + "]";
}

using CreatingATimedSession = TimedSessionTest;
using ATimedSession = TimedSessionTest;

} // namespace

TEST_F(CreatingATimedSession, MakesADirectoryAndTellsTheDaemon) {
    FakeDaemon daemon({OK});
    TimedSession session;

    EXPECT_TRUE(session.create(TimedSession::TEMP_DEFAULT, 3600));

    EXPECT_TRUE(fs::is_directory(session.getPath()));
    EXPECT_THAT(session.getPath(), StartsWith("/tmp/"));
    EXPECT_THAT(daemon.requests(), ElementsAre(request(session.getId(), 3600)));
    expectErrors({});
}

TEST_F(CreatingATimedSession, RegistersAtMost72Hours) {
    struct Row {
        long lifetime;
        long registered;
    };
    const Row rows[] = {
        {259199, 259199},
        {259200, 259200},
        {259201, 259200},
        {400000, 259200},
        {std::numeric_limits<long>::max(), 259200},
        {0, 0},
        {-1, -1},
        {std::numeric_limits<long>::min(), std::numeric_limits<long>::min()},
    };
    FakeDaemon daemon;
    for (const Row& row : rows) {
        daemon.addReply(OK);
        TimedSession session;

        EXPECT_TRUE(session.create(TimedSession::TEMP_DEFAULT, row.lifetime));

        EXPECT_EQ(request(session.getId(), row.registered), daemon.requests().back());
    }
}

TEST_F(CreatingATimedSession, KeepsTheSessionThatTheDaemonRefuses) {
    for (const int code : {400, 500, 501, 0, -1, 201}) {
        FakeDaemon daemon({"{\"code\":" + std::to_string(code) + "}"});
        TimedSession session;

        EXPECT_FALSE(session.create(TimedSession::TEMP_DEFAULT, 400000)) << code;

        EXPECT_THAT(daemon.requests(), ElementsAre(request(session.getId(), 259200)));
        EXPECT_TRUE(fs::is_directory(session.getPath()));
        support::expectLocated(log, LOG_ERR, getpid(), "timed_session", complaint(session.getId(), 400000));
        EXPECT_TRUE(session.destroy());
    }
}

TEST_F(CreatingATimedSession, KeepsTheSessionThatNoDaemonHearsOf) {
    TimedSession session;

    EXPECT_FALSE(session.create(TimedSession::TEMP_DEFAULT, -7));

    EXPECT_TRUE(fs::is_directory(session.getPath()));
    expectErrors({complaint(session.getId(), -7)});
}

TEST_F(CreatingATimedSession, KeepsTheSessionIfTheReplyCannotBeRead) {
    const FakeDaemon daemon({"{}"});
    TimedSession session;

    EXPECT_FALSE(session.create(TimedSession::TEMP_DEFAULT, 5));

    EXPECT_TRUE(fs::is_directory(session.getPath()));
    support::expectLocated(log, LOG_ERR, getpid(), "controller.cpp", "parse response failed");
    support::expectLocated(log, LOG_ERR, getpid(), "timed_session", complaint(session.getId(), 5));
}

TEST_F(CreatingATimedSession, RegistersNothingThatCannotBeMade) {
    FakeDaemon daemon;
    inNewRoot([]() {
        fs::remove("/tmp");
        for (const auto type : {TimedSession::TEMP_DEFAULT, TimedSession::TEMP_MAX_VOLUME}) {
            TimedSession session;
            EXPECT_FALSE(session.create(type, 60));
            EXPECT_EQ("", session.getId());
        }
    });

    EXPECT_EQ(0, daemon.connections());
    expectErrors({});
}

TEST_F(CreatingATimedSession, TakesTheVolumeWithTheMostSpaceIfAsked) {
    FakeDaemon daemon({OK});
    inNewRoot([]() {
        const support::Mount small = newVolume("/volume1", "size=1m");
        const support::Mount large = newVolume("/volume2", "size=2m");
        TimedSession session;

        EXPECT_TRUE(session.create(TimedSession::TEMP_MAX_VOLUME, 60));

        EXPECT_EQ("/volume2/marusession-" + session.getId(), session.getPath());
        EXPECT_TRUE(fs::is_directory(session.getPath()));
        support::writeFile("/run/tmp/id", session.getId());
    });

    EXPECT_THAT(daemon.requests(), ElementsAre(request(support::readFile("/run/tmp/id"), 60)));
    fs::remove("/run/tmp/id");
}

TEST_F(CreatingATimedSession, OfAnotherTypeMakesNoneAndRegistersTheOneThereIs) {
    for (const int type : {2, -1, std::numeric_limits<int>::max()}) {
        const Made made = makeSession();
        FakeDaemon daemon({OK});
        TimedSession session;
        ASSERT_TRUE(session.load(made.id));

        EXPECT_TRUE(session.create(static_cast<TimedSession::TempType>(type), 400000)) << type;

        EXPECT_EQ(made.id, session.getId());
        EXPECT_THAT(daemon.requests(), ElementsAre(request(made.id, 259200)));
        EXPECT_TRUE(session.destroy());
    }
    expectErrors({});
}

TEST_F(CreatingATimedSession, OfAnotherTypeRegistersEvenNone) {
    FakeDaemon daemon;
    TimedSession session;

    EXPECT_FALSE(session.create(static_cast<TimedSession::TempType>(2), 60)) << "an id of nothing is refused at once";

    EXPECT_EQ("", session.getId());
    EXPECT_EQ(0, daemon.connections());
    EXPECT_FALSE(isThere(support::SESSION_RECORDS));
    expectErrors({complaint("", 60)});
}

TEST_F(ATimedSession, IsFoundByItsId) {
    const Made made = makeSession();
    TimedSession session;
    EXPECT_EQ("", session.getId());
    EXPECT_EQ("", session.getPath());

    EXPECT_FALSE(session.load("unknown"));
    EXPECT_FALSE(session.load("../" + made.id));
    EXPECT_TRUE(session.load(made.id));

    EXPECT_EQ(made.id, session.getId());
    EXPECT_EQ(made.path, session.getPath());
}

TEST_F(ATimedSession, StaysWhenItsObjectEnds) {
    const Made made = makeSession();
    {
        TimedSession session;
        session.load(made.id);
    }
    expectKept(made);
}

TEST_F(ATimedSession, IsGoneWithAllThatIsInItWhenItIsDestroyed) {
    const Made made = makeSession();
    fs::create_directories(made.path + "/a/b");
    addFile(made.path + "/a/b/file", 0);
    TimedSession session;
    session.load(made.id);

    EXPECT_TRUE(session.destroy());

    expectDestroyed(made);
    EXPECT_FALSE(session.destroy());
    expectErrors({});
}
