// What counts as the use of a session.

#include <marubackup/timed_session.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <limits>
#include <string>
#include <vector>

#include "session_fixture.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/mount.h"
#include "support/resource_limit.h"

namespace fs = std::filesystem;

using MARU::Backup::TimedSession;
using support::OUTSIDE;
using support::setTimes;

namespace {

/** A session whose directory was last changed long before its lifetime began. */
class SessionWalk : public TimedSessionTest {
protected:
    SessionWalk() {
        forgetUse();
    }

    /** Files may be made without that being a use. */
    void forgetUse() {
        setTimes(session.path, time(nullptr), 0);
    }

    bool isExpired(bool walkFiles = true) {
        forgetUse();
        return TimedSession::destroyExpired(session.id, LONG_TIME, walkFiles) == 0;
    }

    /** What it says about a session that has files which were never read, one of them now. */
    void expectUseFoundAmong(int files) {
        std::string last;
        for (int file = 0; file < files; ++file) {
            last = session.path + "/" + std::to_string(file);
            const int made = open(last.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600);
            const timespec never[2] = {{0, 0}, {0, 0}};
            ASSERT_EQ(0, futimens(made, never));
            close(made);
        }
        const long left = withinOneSecond([&](time_t now) {
            setTimes(last, now - 10, now);
            forgetUse();
            return TimedSession::destroyExpired(session.id, LONG_TIME, true);
        });
        EXPECT_EQ(LONG_TIME - 10, left);
        setTimes(last, 0, 0);
        EXPECT_TRUE(isExpired());
        expectDestroyed(session);
    }

    const Made session = makeSession();
};

/** Leaves the process exactly this many descriptors to open. */
void leaveDescriptors(std::size_t number) {
    support::limitTo(RLIMIT_NOFILE, 200);
    std::vector<int> opened;
    for (int fd = 0; (fd = open("/dev/null", O_RDONLY | O_CLOEXEC)) >= 0;) {
        opened.push_back(fd);
    }
    for (std::size_t at = 0; at < number; ++at) {
        close(opened.at(at));
    }
}

} // namespace

TEST_F(SessionWalk, CountsTheReadingOfAFile) {
    const std::string file = addFile(session.path + "/file", 0);

    EXPECT_EQ(LONG_TIME - 10, withinOneSecond([&](time_t now) {
                  setTimes(file, now - 10, 0);
                  forgetUse();
                  return TimedSession::destroyExpired(session.id, LONG_TIME, true);
              }));
    EXPECT_TRUE(isExpired(false)) << "not without the walk";
    expectDestroyed(session);
    expectErrors({});
}

TEST_F(SessionWalk, CountsWhatAnApplicationReallyReads) {
    const std::string file = addFile(session.path + "/file", 0);
    const time_t before = time(nullptr);

    support::readFile(file);

    struct stat info = {};
    ASSERT_EQ(0, stat(file.c_str(), &info));
    EXPECT_GE(info.st_atime, before);
    // Reckoned from the file's own stamp: the file system's clock may be a tick ahead of this one.
    EXPECT_EQ(LONG_TIME, withinOneSecond([&](time_t now) {
                  forgetUse();
                  return TimedSession::destroyExpired(session.id, LONG_TIME, true) + (now - info.st_atime);
              }));
}

TEST_F(SessionWalk, CountsTheLaterOfDirectoryAndFiles) {
    const std::string file = addFile(session.path + "/file", 0);
    const auto left = [&](time_t fileRead, time_t directoryChanged) {
        setTimes(file, fileRead, 0);
        setTimes(session.path, 0, directoryChanged);
        return TimedSession::destroyExpired(session.id, 100, true);
    };

    EXPECT_EQ(60, withinOneSecond([&](time_t now) { return left(now - 40, now - 50); }));
    EXPECT_EQ(60, withinOneSecond([&](time_t now) { return left(now - 50, now - 40); }));
}

TEST_F(SessionWalk, CountsTheLatestReadingOfAllFilesAtAnyDepth) {
    const time_t now = time(nullptr);
    fs::create_directories(session.path + "/a/b/.c");
    addFile(session.path + "/file", now - 30);
    addFile(session.path + "/a/.hidden", now - 20);
    addFile(session.path + "/a/b/.c/file", now - 10);
    addFile(session.path + "/a/b/file", now - 40);
    forgetUse();

    const long left = TimedSession::destroyExpired(session.id, LONG_TIME, true);

    EXPECT_LE(left, LONG_TIME - 10);
    EXPECT_GT(left, LONG_TIME - 20);
}

TEST_F(SessionWalk, CountsTheReadingOfAFileOver2GiB) {
    const std::string file = addFile(session.path + "/file", 0);
    fs::resize_file(file, 5ULL << 30);

    EXPECT_EQ(LONG_TIME - 10, withinOneSecond([&](time_t now) {
                  setTimes(file, now - 10, 0);
                  forgetUse();
                  return TimedSession::destroyExpired(session.id, LONG_TIME, true);
              }));
    setTimes(file, 0, 0);
    EXPECT_TRUE(isExpired());
    expectDestroyed(session);
    expectErrors({});
}

TEST_F(SessionWalk, CountsAReadingThatDoesNotFitIn32Bits) {
    const std::int64_t in2100 = 4102444800;
    addFile(session.path + "/file", 0);
    // By a program, since a time may have 32 bits here.
    ASSERT_EQ(0, std::system(("touch -a -d @4102444800 " + session.path + "/file").c_str()));
    forgetUse();

    const std::int64_t left = TimedSession::destroyExpired(session.id, 0, true);

    const std::int64_t longest = std::numeric_limits<long>::max();
    EXPECT_LE(left, std::min(in2100 - time(nullptr) + 10, longest));
    EXPECT_GE(left, std::min(in2100 - time(nullptr) - 10, longest));
    expectErrors({});
}

TEST_F(SessionWalk, CountsAReadingInTheFuture) {
    const time_t now = time(nullptr);
    addFile(session.path + "/file", now + 1000);
    forgetUse();

    EXPECT_GT(TimedSession::destroyExpired(session.id, 1, true), 900);
}

TEST_F(SessionWalk, CountsNeitherChangesOfFilesNorTheUseOfFolders) {
    const std::string file = addFile(session.path + "/file", 0);
    fs::create_directory(session.path + "/folder");
    setTimes(session.path + "/folder", time(nullptr), time(nullptr));
    setTimes(file, 0, time(nullptr));

    EXPECT_TRUE(isExpired());
}

TEST_F(SessionWalk, CountsEveryKindOfFileThatIsNoLink) {
    const std::string fifo = session.path + "/fifo";
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));
    setTimes(fifo, time(nullptr), 0);

    EXPECT_FALSE(isExpired());
}

TEST_F(SessionWalk, CountsNoLinkAndNothingBehindOne) {
    fs::create_directory(OUTSIDE);
    addFile(OUTSIDE + "/file", time(nullptr));
    fs::create_directory_symlink(OUTSIDE, session.path + "/folder-link");
    fs::create_symlink(OUTSIDE + "/file", session.path + "/link");
    for (const std::string name : {"/folder-link", "/link"}) {
        setTimes(session.path + name, time(nullptr), time(nullptr));
    }

    EXPECT_TRUE(isExpired());

    expectDestroyed(session);
    EXPECT_TRUE(support::isThere(OUTSIDE + "/file"));
}

TEST_F(SessionWalk, CountsNothingOnAnotherMountedFileSystem) {
    fs::create_directory(session.path + "/mounted");
    support::Mount mounted = support::Mount::tmpfs(session.path + "/mounted");
    addFile(session.path + "/mounted/file", time(nullptr));
    forgetUse();

    EXPECT_EQ(-1, TimedSession::destroyExpired(session.id, LONG_TIME, true)) << "expired, but it cannot be removed";

    EXPECT_TRUE(support::isThere(session.path + "/mounted/file"));
    mounted.unmount();
    EXPECT_TRUE(isExpired());
}

TEST_F(SessionWalk, StartsAnewForEachSession) {
    const Made used = makeSession();
    addFile(used.path + "/file", time(nullptr));
    addFile(session.path + "/file", 0);
    setTimes(used.path, 0, 0);

    EXPECT_GT(TimedSession::destroyExpired(used.id, LONG_TIME, true), 0);

    EXPECT_TRUE(isExpired());
    expectKept(used);
}

TEST_F(SessionWalk, TakesNothingForOlderThanTheEpoch) {
    addFile(session.path + "/file", -1000);
    const auto left = [&](bool walkFiles) {
        return withinOneSecond([&](time_t now) {
            setTimes(session.path, 0, -1000);
            return TimedSession::destroyExpired(session.id, now + 10, walkFiles);
        });
    };

    EXPECT_EQ(10, left(true));
    EXPECT_EQ(0, left(false));
}

TEST_F(SessionWalk, LooksAtFilesOfMoreThanTwoGigabytes) {
    const std::string file = addFile(session.path + "/file", 0);
    ASSERT_EQ(0, truncate(file.c_str(), off_t(5) << 30));
    setTimes(file, time(nullptr), 0);

    EXPECT_FALSE(isExpired());
    setTimes(file, 0, 0);
    EXPECT_TRUE(isExpired());
}

TEST_F(SessionWalk, NeedsNoMoreThanTwentyDescriptors) {
    std::string folder = session.path;
    for (int level = 0; level < 100; ++level) {
        folder += "/folder";
        fs::create_directory(folder);
        addFile(folder + "/file", 0);
    }
    addFile(folder + "/used", time(nullptr));
    forgetUse();

    const int status = support::runInChild([&]() {
        leaveDescriptors(20);
        return TimedSession::destroyExpired(session.id, LONG_TIME, true) > 0 ? 0 : 1;
    });

    EXPECT_EQ("exit 0", support::describeStatus(status));
    setTimes(folder + "/used", 0, 0);
    EXPECT_TRUE(isExpired());
}

TEST_F(SessionWalk, FindsTheUseOfASingleFile) {
    expectUseFoundAmong(1);
}

TEST_F(SessionWalk, FindsTheUseOfOneInAThousandFiles) {
    expectUseFoundAmong(1000);
}

TEST_F(SessionWalk, FindsTheUseOfOneInAHundredThousandFiles) {
    expectUseFoundAmong(100000);
}
