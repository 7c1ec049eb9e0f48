#include "common/log.h"

#include <unistd.h>

#include <cerrno>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "support/in_child.h"
#include "support/syslog_socket.h"

namespace {

const char* const LOG_UNIT = "log_test";

std::string located(int pid, const std::string& level, int line, const std::string& text) {
    return "(" + std::to_string(pid) + ") [" + level + "] log_test:" + std::to_string(line) + " " + text;
}

TEST(LocatedLog, AnErrorNamesProcessUnitAndLine) {
    support::SyslogSocket log;

    LOG_LOCATED_ERR("no room for [%s], %d left", "job", 7);
    const int line = __LINE__ - 1;

    ASSERT_EQ(1U, log.lines().size());
    EXPECT_EQ(LOG_ERR, log.lines()[0].priority);
    EXPECT_EQ(located(getpid(), "err", line, "no room for [job], 7 left"), log.lines()[0].message);
}

TEST(LocatedLog, ADebugLineHasItsOwnPriorityAndMark) {
    support::SyslogSocket log;

    LOG_LOCATED_DEBUG("connect to [%s]", "somewhere");
    const int line = __LINE__ - 1;

    ASSERT_EQ(1U, log.lines().size());
    EXPECT_EQ(LOG_DEBUG, log.lines()[0].priority);
    EXPECT_EQ(located(getpid(), "debug", line, "connect to [somewhere]"), log.lines()[0].message);
}

TEST(PlainLog, AnErrorNamesUnitAndLineAlone) {
    support::SyslogSocket log;

    errno = EACCES;
    LOG_PLAIN_ERR("no room for [%s], %d left: %m", "job%d", 7);
    const int line = __LINE__ - 1;

    EXPECT_EQ(EACCES, errno);
    ASSERT_EQ(1U, log.lines().size());
    EXPECT_EQ(LOG_ERR, log.lines()[0].priority);
    EXPECT_EQ("log_test:" + std::to_string(line) + " no room for [job%d], 7 left: Permission denied",
              log.lines()[0].message);
}

TEST(LocatedLog, TakesUnitAndLineFromACallerThatGivesThem) {
    support::SyslogSocket log;

    MARU::Backup::logLocated(LOG_ERR, "controller.cpp", 4711, "told");

    ASSERT_EQ(1U, log.lines().size());
    EXPECT_EQ("(" + std::to_string(getpid()) + ") [err] controller.cpp:4711 told", log.lines()[0].message);
}

TEST(LocatedLog, SpeaksOfTheCallersErrno) {
    support::SyslogSocket log;

    errno = EACCES;
    LOG_LOCATED_ERR("open [%s]: %m", "/etc/shadow");
    errno = ENOTDIR;
    LOG_LOCATED_DEBUG("connect: %m");

    support::expectLocated(log, LOG_ERR, getpid(), LOG_UNIT, "open [/etc/shadow]: Permission denied");
    support::expectLocated(log, LOG_DEBUG, getpid(), LOG_UNIT, "connect: Not a directory");
}

TEST(LocatedLog, LeavesErrnoAsItWas) {
    support::SyslogSocket log;
    for (const int number : {0, EACCES, EINTR}) {
        errno = number;
        LOG_LOCATED_ERR("problem: %m");
        EXPECT_EQ(number, errno);
    }
    EXPECT_EQ(3, log.count("problem"));
}

TEST(LocatedLog, LeavesErrnoAsItWasWhereNobodyListens) {
    const int status = support::runInChild([]() {
        closelog();
        errno = EACCES;
        LOG_LOCATED_ERR("lost: %m");
        return errno == EACCES ? 0 : 1;
    });
    EXPECT_EQ("exit 0", support::describeStatus(status));
}

TEST(LocatedLog, LeavesErrnoAsItWasWhenALineIsTooLongToBeSent) {
    support::SyslogSocket log;
    const std::string text(4 << 20, 'x');

    errno = EACCES;
    LOG_LOCATED_ERR("lost: %s", text.c_str());

    EXPECT_EQ(EACCES, errno);
    EXPECT_TRUE(log.lines().empty());
}

TEST(LocatedLog, NamesTheProcessThatLogs) {
    support::SyslogSocket log;

    const pid_t child = support::startInChild([]() {
        LOG_LOCATED_ERR("from the child");
        return 0;
    });
    support::waitForChild(child);
    LOG_LOCATED_ERR("from the parent");

    support::expectLocated(log, LOG_ERR, child, LOG_UNIT, "from the child");
    support::expectLocated(log, LOG_ERR, getpid(), LOG_UNIT, "from the parent");
}

TEST(LocatedLog, TakesPercentSignsOfAnArgumentAsText) {
    support::SyslogSocket log;

    LOG_LOCATED_ERR("bad text [%s]", "%s %n %m 100%");

    support::expectLocated(log, LOG_ERR, getpid(), LOG_UNIT, "bad text [%s %n %m 100%]");
}

TEST(LocatedLog, KeepsALongArgumentWhole) {
    support::SyslogSocket log;
    const std::string text(16380, 'x');

    LOG_LOCATED_ERR("bad text [%s]", text.c_str());
    const int line = __LINE__ - 1;

    ASSERT_EQ(1U, log.lines().size());
    EXPECT_EQ(located(getpid(), "err", line, "bad text [" + text + "]"), log.lines()[0].message);
}

TEST(LocatedLog, KeepsTheLinesOfSeveralThreadsApart) {
    support::SyslogSocket log;
    std::vector<std::thread> threads;
    for (int number = 0; number < 4; ++number) {
        threads.emplace_back([number]() {
            errno = number == 0 ? EACCES : ENOENT;
            LOG_LOCATED_ERR("thread %d: %m", number);
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }

    support::expectLocated(log, LOG_ERR, getpid(), LOG_UNIT, "thread 0: Permission denied");
    for (const char* number : {"1", "2", "3"}) {
        const std::string text = "thread " + std::string(number) + ": No such file or directory";
        support::expectLocated(log, LOG_ERR, getpid(), LOG_UNIT, text);
    }
}

} // namespace
