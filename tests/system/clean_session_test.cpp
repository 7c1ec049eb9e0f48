// Sessions that the daemon cleans up.

#include <sys/stat.h>

#include <chrono>
#include <csignal>
#include <cstdint>
#include <filesystem>
#include <limits>
#include <memory>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include <marubackup/timed_session.h>

#include "daemon_test.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/mount.h"
#include "support/session_areas.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

namespace fs = std::filesystem;

using namespace MARU::Backup;
using support::expectLocated;
using support::isThere;
using support::OUTSIDE;
using support::setTimes;

namespace {

const long LONG_TIME = 100000;

const std::string NO_JOBS = "{\"code\":200,\"jobs\":[]}";

/** A request to clean up a session; both members are JSON. */
std::string cleanUp(const std::string& id, const std::string& lifetime) {
    return "{\"op\":\"clean_session\",\"sess_id\":" + id + ",\"lifetime\":" + lifetime + "}";
}

std::string cleanUp(const std::string& id, long lifetime) {
    return cleanUp("\"" + id + "\"", std::to_string(lifetime));
}

std::string accepted(const std::string& id) {
    return "{\"code\":200,\"sess_id\":\"" + id + "\"}";
}

/** A session as a test looks at it. */
struct Made {
    std::string id;
    std::string path;

    bool isGone() const {
        return !isThere(path) && !isThere(support::sessionRecord(id));
    }
};

/** When somebody, the daemon, read the directory last: seconds and nanoseconds. */
std::pair<time_t, long> lastLook(const std::string& folder) {
    struct stat info = {};
    EXPECT_EQ(0, lstat(folder.c_str(), &info)) << folder;
    return {info.st_atim.tv_sec, info.st_atim.tv_nsec};
}

class SessionCleanUp : private support::SessionAreas, public DaemonTest {
protected:
    SessionCleanUp() {
        start();
        peer = std::make_unique<support::SocketPeer>();
    }
    ~SessionCleanUp() override {
        EXPECT_EQ(NO_JOBS, peer->ask("{\"op\":\"job_list\"}")) << "the daemon serves";
    }

    /** A session that the daemon will not come to. */
    static Made makeSession() {
        TimedSession session;
        EXPECT_TRUE(session.create(TimedSession::TEMP_DEFAULT, LONG_TIME));
        return {session.getId(), session.getPath()};
    }

    void askToCleanUp(const Made& session, const std::string& lifetime) {
        EXPECT_EQ(accepted(session.id), peer->ask(cleanUp("\"" + session.id + "\"", lifetime)));
    }

    void expectCleanedUp(const Made& session) {
        EXPECT_TRUE(support::waitUntil([&session]() { return session.isGone(); })) << session.path;
    }

    void expectReported(const std::string& id, long lifetime) {
        expectLocated(log, LOG_ERR, daemon->pid(), "queue_server",
                      "failed to destroy expired session[" + id + "][" + std::to_string(lifetime) + "]");
    }

    const support::FilesOutside outside;
    std::unique_ptr<support::SocketPeer> peer;
};

} // namespace

// Lifetimes

TEST_F(SessionCleanUp, RemovesASessionWhoseCreatorHasEnded) {
    const int status = support::runInChild([]() {
        TimedSession session;
        if (!session.create(TimedSession::TEMP_DEFAULT, 1)) {
            return 1;
        }
        fs::create_directories(session.getPath() + "/a/b");
        support::writeFile(session.getPath() + "/a/b/file", "content");
        support::writeFile("/run/tmp/creator", session.getId());
        return 0;
    });
    ASSERT_EQ("exit 0", support::describeStatus(status));
    const std::string id = support::readFile("/run/tmp/creator");
    fs::remove("/run/tmp/creator");

    expectCleanedUp({id, "/tmp/marusession-" + id});

    EXPECT_EQ(0, log.count("failed to"));
}

TEST_F(SessionCleanUp, WaitsALifetimeFromTheLastReadingOfAFileOfAnySize) {
    const std::uintmax_t sizes[] = {1, 5ULL << 30}; // the second does not fit 32 bits
    for (const std::uintmax_t size : sizes) {
        const Made session = makeSession();
        const std::string file = session.path + "/file";
        support::writeFile(file, "");
        fs::resize_file(file, size);
        const time_t lastReading = time(nullptr) + 2;
        setTimes(file, lastReading, 0);
        setTimes(session.path, 0, 0);

        askToCleanUp(session, "1");

        expectCleanedUp(session);
        EXPECT_GE(time(nullptr), lastReading + 1);
    }
    EXPECT_EQ(0, log.count("failed to"));
}

TEST_F(SessionCleanUp, WaitsALifetimeFromWhatAnApplicationReallyReads) {
    time_t reading = 0;
    std::unique_ptr<Made> session;
    while (!session) { // until the reading was in time
        const Made candidate = makeSession();
        support::writeFile(candidate.path + "/file", "content");
        askToCleanUp(candidate, "3");
        const time_t start = time(nullptr);
        support::waitUntil([start]() { return time(nullptr) > start; });
        reading = time(nullptr);
        try {
            support::readFile(candidate.path + "/file");
            session = std::make_unique<Made>(candidate);
        } catch (const std::system_error&) {
            EXPECT_GE(time(nullptr), start + 2) << "it went too early";
        }
    }

    expectCleanedUp(*session);

    EXPECT_GE(time(nullptr), reading + 3);
}

TEST_F(SessionCleanUp, WaitsALifetimeFromTheLastChangeOfTheDirectory) {
    const Made session = makeSession();
    const time_t lastChange = time(nullptr) + 2;
    setTimes(session.path, 0, lastChange);

    askToCleanUp(session, "1");

    expectCleanedUp(session);
    EXPECT_GE(time(nullptr), lastChange + 1);
}

TEST_F(SessionCleanUp, CountsTheLow32BitsOfALifetime) {
    // The sessions are new: what counts as more than a few seconds keeps them.
    const char* const atOnce[] = {
        "0",           "-1",          "-2147483648",          "2147483648",
        "4294967295",  "4294967296",  "-4294967296",          "18446744073709551615",
        "-4294967297", "-2147483648", "-9223372036854775808", "9223372036854775807",
    };
    const char* const later[] = {"100000", "2147483647", "4295067296", "-2147483649", "18446744071562067967"};
    std::vector<Made> kept;
    for (const char* const lifetime : later) {
        kept.push_back(makeSession());
        askToCleanUp(kept.back(), lifetime);
    }
    for (const char* const lifetime : atOnce) {
        const Made session = makeSession();
        askToCleanUp(session, lifetime);
        SCOPED_TRACE(lifetime);
        expectCleanedUp(session);
    }
    for (const Made& session : kept) {
        EXPECT_TRUE(isThere(session.path)) << session.path;
    }
}

TEST_F(SessionCleanUp, LooksAtASessionOnceThatHasAnEternityLeft) {
    const Made session = makeSession();
    setTimes(session.path, 0, std::numeric_limits<time_t>::max());
    askToCleanUp(session, "0");
    EXPECT_TRUE(support::waitUntil([&session]() { return lastLook(session.path).first > 0; }));
    const auto firstLook = lastLook(session.path);

    const auto start = std::chrono::steady_clock::now();
    support::waitUntil([start]() { return std::chrono::steady_clock::now() > start + 3 * support::GLANCE; });

    EXPECT_EQ(firstLook, lastLook(session.path));
    EXPECT_TRUE(isThere(session.path));
}

TEST_F(SessionCleanUp, TakesManySessionsAtOnce) {
    std::vector<Made> sessions;
    for (int number = 0; number < 10000; ++number) {
        if (number % 100 == 0) {
            sessions.push_back(makeSession());
            askToCleanUp(sessions.back(), number % 200 == 0 ? "0" : "1");
        } else {
            const std::string id = "session-" + std::to_string(number);
            ASSERT_EQ(accepted(id), peer->ask(cleanUp(id, number % 3)));
        }
    }
    for (const Made& session : sessions) {
        expectCleanedUp(session);
    }
    EXPECT_EQ(0, log.count("failed to"));
}

TEST_F(SessionCleanUp, DoesNotKeepTheDaemonFromEnding) {
    const Made session = makeSession();
    askToCleanUp(session, "1000");

    EXPECT_EQ("exit 0", support::describeStatus(daemon->stop(SIGTERM)));

    EXPECT_TRUE(isThere(session.path));
    start();
    peer = std::make_unique<support::SocketPeer>();
}

// Ids

TEST_F(SessionCleanUp, RefusesARequestThatIsNone) {
    const std::string requests[] = {
        "{\"op\":\"clean_session\"}",
        "{\"op\":\"clean_session\",\"lifetime\":0}",
        "{\"op\":\"clean_session\",\"sess_id\":\"id\"}",
        cleanUp("\"id\"", "\"5\""),
        cleanUp("\"id\"", "5.0"),
        cleanUp("null", "5"),
        cleanUp("[\"id\"]", "5"),
    };
    for (const std::string& request : requests) {
        EXPECT_EQ("{\"code\":400}", peer->ask(request)) << request;
        daemon->waitForLine("get bad sessin clean job request");
    }
}

TEST_F(SessionCleanUp, ReportsIdsThatAreNoneAndTouchesNothing) {
    const std::string ids[] = {"../../etc", "/",    "..",         "",         "../outside",
                               OUTSIDE,     ".new", "%s%n%s%n%s", "\xff\xfe", std::string(4096, 'x')};
    for (const std::string& id : ids) {
        EXPECT_EQ(accepted(id), peer->ask(cleanUp(id, -1)));
        expectReported(id, -1);
    }
    EXPECT_TRUE(fs::is_directory("/etc"));
}

TEST_F(SessionCleanUp, ReportsAnIdWithANul) {
    const Made session = makeSession();

    EXPECT_EQ(accepted(session.id + "\\u0000"), peer->ask(cleanUp(session.id + "\\u0000", -1)));

    expectReported(session.id, -1);
    EXPECT_TRUE(isThere(session.path));
}

TEST_F(SessionCleanUp, TakesANumberForItsText) {
    EXPECT_EQ(accepted("12"), peer->ask(cleanUp("12", "0")));
    EXPECT_EQ(accepted("-5"), peer->ask(cleanUp("-5", "0")));
    EXPECT_EQ(accepted("18446744073709551615"), peer->ask(cleanUp("18446744073709551615", "0")));
    EXPECT_EQ(accepted("1.5"), peer->ask(cleanUp("1.5", "0")));
    expectReported("1.5", 0);
}

TEST_F(SessionCleanUp, HasNothingToSayAboutASessionThatIsGone) {
    const Made vanished = makeSession();
    fs::remove(vanished.path);
    const Made last = makeSession();

    askToCleanUp(vanished, "0");
    EXPECT_EQ(accepted("unknown"), peer->ask(cleanUp("unknown", 0)));
    askToCleanUp(last, "0");

    expectCleanedUp(last);
    expectCleanedUp(vanished);
    EXPECT_EQ(0, log.count("failed to"));
}

// What cannot be removed

TEST_F(SessionCleanUp, ReportsADirectoryThatIsALinkByNow) {
    const Made session = makeSession();
    fs::remove(session.path);
    fs::create_directory_symlink(OUTSIDE, session.path);

    askToCleanUp(session, "-1");

    expectReported(session.id, -1);
    expectLocated(log, LOG_ERR, daemon->pid(), "timed_session",
                  "path[" + session.path + "] is not a session directory");
    expectLocated(log, LOG_ERR, daemon->pid(), "timed_session", "failed to stat session[" + session.id + "]");
    EXPECT_TRUE(fs::is_symlink(session.path));
}

TEST_F(SessionCleanUp, GivesUpWhatItCannotRemoveUntilItIsAskedAgain) {
    const Made session = makeSession();
    fs::create_directory(session.path + "/mounted");
    support::Mount mounted = support::Mount::tmpfs(session.path + "/mounted");
    support::writeFile(session.path + "/mounted/kept", "kept");

    askToCleanUp(session, "-1");
    expectReported(session.id, -1);
    EXPECT_EQ("kept", support::readFile(session.path + "/mounted/kept"));
    mounted.unmount();
    EXPECT_TRUE(isThere(session.path));
    askToCleanUp(session, "-1");

    expectCleanedUp(session);
    EXPECT_EQ(1, log.count("failed to destroy expired session"));
}
