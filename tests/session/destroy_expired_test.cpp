#include <marubackup/timed_session.h>

#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <limits>
#include <string>

#include "session_fixture.h"
#include "support/files.h"
#include "support/mount.h"

namespace fs = std::filesystem;

using MARU::Backup::TimedSession;
using support::inNewRoot;
using support::isThere;
using support::OUTSIDE;
using support::readFile;
using support::setTimes;

namespace {

const long LONGEST = std::numeric_limits<long>::max();
const long SHORTEST = std::numeric_limits<long>::min();

class DestroyExpired : public TimedSessionTest {
protected:
    /** What destroyExpired() says to a fresh session whose directory was changed at `stamp`. */
    static long leftAfter(time_t stamp, long lifetime, bool walkFiles) {
        const Made session = makeSession();
        setTimes(session.path, 0, stamp);
        return TimedSession::destroyExpired(session.id, lifetime, walkFiles);
    }

    const support::FilesOutside outside;
};

} // namespace

// Sessions that are gone or were never there

TEST_F(DestroyExpired, FindsAnUnknownSessionDestroyed) {
    for (const std::string& id : {std::string("unknown"), std::string("-"), std::string(64, '9')}) {
        EXPECT_EQ(0, TimedSession::destroyExpired(id, LONG_TIME, true));
        EXPECT_EQ(0, TimedSession::destroyExpired(id, -1, false));
    }
    expectErrors({});
}

TEST_F(DestroyExpired, ReportsWhatIsNoId) {
    EXPECT_EQ(-1, TimedSession::destroyExpired("../../etc", -1, true));
    EXPECT_EQ(-1, TimedSession::destroyExpired("/", LONG_TIME, true));
    EXPECT_EQ(-1, TimedSession::destroyExpired("", 0, false));
    EXPECT_EQ(-1, TimedSession::destroyExpired("%s%n", 0, false));

    expectErrors({"failed to destroy session[../../etc]", "failed to destroy session[/]", "failed to destroy session[]",
                  "failed to destroy session[%s%n]"});
}

TEST_F(DestroyExpired, TakesTheRecordOfAVanishedDirectory) {
    const Made session = makeSession();
    fs::remove(session.path);

    EXPECT_EQ(0, TimedSession::destroyExpired(session.id, LONG_TIME, true)) << "whatever its lifetime";

    expectDestroyed(session);
    expectErrors({});
}

TEST_F(DestroyExpired, ReportsADirectoryThatIsALinkByNow) {
    const Made session = makeSession();
    fs::remove(session.path);
    fs::create_directory_symlink(OUTSIDE, session.path);
    setTimes(session.path, 0, 0);
    setTimes(OUTSIDE, 0, 0);

    EXPECT_EQ(-1, TimedSession::destroyExpired(session.id, 1, true));

    EXPECT_TRUE(fs::is_symlink(session.path));
    expectErrors(
        {"path[" + session.path + "] is not a session directory", "failed to stat session[" + session.id + "]"});
}

TEST_F(DestroyExpired, ReportsADirectoryThatIsAFileByNow) {
    const Made session = makeSession();
    fs::remove(session.path);
    support::writeFile(session.path, "a file");

    EXPECT_EQ(-1, TimedSession::destroyExpired(session.id, LONG_TIME, false));

    EXPECT_EQ("a file", readFile(session.path));
    expectErrors(
        {"path[" + session.path + "] is not a session directory", "failed to stat session[" + session.id + "]"});
}

TEST_F(DestroyExpired, ReportsADirectoryThatCannotBeLookedAt) {
    const Made session = makeSession();
    inNewRoot([&session]() {
        fs::remove("/tmp");
        fs::create_symlink("/tmp", "/tmp"); // a path through it never ends
        EXPECT_EQ(-1, TimedSession::destroyExpired(session.id, 1, true));
    });

    expectKept(session);
    ASSERT_EQ(2U, log.lines().size());
    EXPECT_EQ("failed to lstat session[" + session.path + "]", support::parseLocated(log.lines()[0].message).text);
    EXPECT_EQ("failed to stat session[" + session.id + "]", support::parseLocated(log.lines()[1].message).text);
    EXPECT_EQ(LOG_ERR, log.lines()[0].priority);
    EXPECT_EQ("timed_session", support::parseLocated(log.lines()[0].message).unit);
}

// Time

TEST_F(DestroyExpired, SaysHowManySecondsAreLeft) {
    const Made session = makeSession();
    for (const bool walkFiles : {false, true}) {
        const long left = withinOneSecond([&](time_t now) {
            setTimes(session.path, 0, now - 1000);
            return TimedSession::destroyExpired(session.id, 1010, walkFiles);
        });
        EXPECT_EQ(10, left);
    }
    expectKept(session);
    expectErrors({});
}

TEST_F(DestroyExpired, KeepsASessionForTheLastSecond) {
    const long left = withinOneSecond([](time_t now) { return leftAfter(now - 99, 100, true); });

    EXPECT_EQ(1, left);
}

TEST_F(DestroyExpired, DestroysASessionAtTheVerySecond) {
    for (const bool walkFiles : {false, true}) {
        Made session;
        const long left = withinOneSecond([&](time_t now) {
            session = makeSession();
            addFile(session.path + "/file", now - 100);
            setTimes(session.path, 0, now - 100);
            return TimedSession::destroyExpired(session.id, 100, walkFiles);
        });
        EXPECT_EQ(0, left);
        expectDestroyed(session);
    }
    expectErrors({});
}

TEST_F(DestroyExpired, DestroysASessionThatExpiredLongAgo) {
    const Made session = makeSession();
    fs::create_directories(session.path + "/a/b");
    addFile(session.path + "/a/b/file", 0);
    setTimes(session.path, 0, 0);

    EXPECT_EQ(0, TimedSession::destroyExpired(session.id, 100, true));

    expectDestroyed(session);
}

TEST_F(DestroyExpired, DestroysANewSessionWithoutALifetime) {
    for (const long lifetime : {0L, -1L, SHORTEST}) {
        const Made session = makeSession();
        setTimes(session.path, 0, time(nullptr)); // the file system's own clock may be a tick ahead of this one

        EXPECT_EQ(0, TimedSession::destroyExpired(session.id, lifetime, true));

        expectDestroyed(session);
    }
}

TEST_F(DestroyExpired, ReckonsWithTheLongestLifetimesAndTheOldestDirectories) {
    const std::int64_t longest = LONGEST;
    const time_t newest = std::numeric_limits<time_t>::max();
    const time_t oldest = std::numeric_limits<time_t>::min();
    const auto left = [](time_t stamp, long lifetime) { return leftAfter(stamp, lifetime, false); };
    EXPECT_EQ(longest - 10, withinOneSecond([&](time_t now) { return left(now - 10, LONGEST); }));
    EXPECT_EQ(longest, withinOneSecond([&](time_t now) { return left(now, LONGEST); }));
    EXPECT_EQ(longest, withinOneSecond([&](time_t now) { return left(now + 10, LONGEST); }));
    EXPECT_EQ(longest, left(newest, LONGEST));
    EXPECT_EQ(0, left(newest, SHORTEST));
    EXPECT_EQ(0, left(oldest, SHORTEST));
    EXPECT_EQ(0, left(oldest, LONGEST));
    EXPECT_EQ(0, withinOneSecond([&](time_t now) { return left(now + 10, SHORTEST); }));
    EXPECT_EQ(0, withinOneSecond([&](time_t now) {
                  EXPECT_EQ(newest - now, left(newest, 0));
                  EXPECT_EQ(newest - now - 5, left(newest, -5));
                  return 0;
              }));
    expectErrors({});
}

TEST_F(DestroyExpired, ReckonsWithADirectoryWhoseTimeDoesNotFitIn32Bits) {
    const Made session = makeSession();
    ASSERT_EQ(0, std::system(("touch -d @4102444800 " + session.path).c_str()));

    EXPECT_LT(0, TimedSession::destroyExpired(session.id, 0, true));
    setTimes(session.path, 0, 0);
    EXPECT_EQ(0, TimedSession::destroyExpired(session.id, 0, true));

    expectDestroyed(session);
    expectErrors({});
}

// Removal

TEST_F(DestroyExpired, ReportsWhatCannotBeRemovedAndRemovesItLater) {
    const Made session = makeSession();
    fs::create_directory(session.path + "/mounted");
    addFile(session.path + "/file", 0);
    support::Mount mounted = support::Mount::tmpfs(session.path + "/mounted");
    support::writeFile(session.path + "/mounted/kept", "kept");

    EXPECT_EQ(-1, TimedSession::destroyExpired(session.id, -1, true));

    expectErrors({"failed to destroy session[" + session.id + "]"});
    expectKept(session);
    EXPECT_FALSE(isThere(session.path + "/file")) << "the rest is gone";
    EXPECT_EQ("kept", readFile(session.path + "/mounted/kept"));

    mounted.unmount();
    EXPECT_EQ(0, TimedSession::destroyExpired(session.id, -1, true));
    expectDestroyed(session);
}

TEST_F(DestroyExpired, TouchesNothingBehindALink) {
    const Made session = makeSession();
    fs::create_directory_symlink(OUTSIDE, session.path + "/link");
    setTimes(session.path, 0, 0);

    EXPECT_EQ(0, TimedSession::destroyExpired(session.id, 1, true));

    expectDestroyed(session);
}
