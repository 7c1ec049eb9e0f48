#include "session_fixture.h"

#include <unistd.h>

#include <algorithm>

#include "support/files.h"

TimedSessionTest::Made TimedSessionTest::makeSession() {
    MARU::Backup::Session session;
    EXPECT_TRUE(session.create());
    return {session.getId(), session.getPath()};
}

std::string TimedSessionTest::addFile(const std::string& path, time_t lastReading) {
    support::writeFile(path, "content");
    support::setTimes(path, lastReading, time(nullptr));
    return path;
}

void TimedSessionTest::expectKept(const Made& session) {
    EXPECT_TRUE(support::isThere(session.path)) << session.path;
    EXPECT_TRUE(support::isThere(support::sessionRecord(session.id))) << session.id;
}

void TimedSessionTest::expectDestroyed(const Made& session) {
    EXPECT_FALSE(support::isThere(session.path)) << session.path;
    EXPECT_FALSE(support::isThere(support::sessionRecord(session.id))) << session.id;
}

void TimedSessionTest::expectErrors(const std::vector<std::string>& texts) {
    std::vector<support::SyslogLine> lines = log.lines();
    lines.erase(std::remove_if(lines.begin(), lines.end(),
                               [](const support::SyslogLine& line) { return line.priority == LOG_DEBUG; }),
                lines.end());
    ASSERT_EQ(texts.size(), lines.size());
    for (std::size_t at = 0; at < texts.size(); ++at) {
        const support::LocatedMessage message = support::parseLocated(lines[at].message);
        EXPECT_EQ(LOG_ERR, lines[at].priority);
        EXPECT_EQ("err", message.level);
        EXPECT_EQ("timed_session", message.unit);
        EXPECT_EQ(getpid(), message.pid);
        EXPECT_GT(message.line, 0);
        EXPECT_EQ(texts[at], message.text);
    }
}
