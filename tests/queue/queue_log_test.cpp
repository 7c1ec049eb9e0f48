#include "queue/queue_log.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue_fixture.h"
#include "support/in_child.h"

using namespace MARU::Backup;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class TheDiary : public QueueTest {};

} // namespace

TEST_F(TheDiary, HasErrorsAndInformationAlways) {
    for (const bool debug : {false, true}) {
        queueDebugEnabled = debug;

        queueLog(LOG_ERR, "handler [%s] not found", "x");
        queueLog(LOG_INFO, "remove job [%d]", 3);

        EXPECT_THAT(diary.take(), ElementsAre("handler [x] not found", "remove job [3]"));
    }
}

TEST_F(TheDiary, HasDebugLinesOnlyIfTheyAreWanted) {
    queueLog(LOG_DEBUG, "scan to launch");
    EXPECT_THAT(diary.take(), IsEmpty());

    queueDebugEnabled = true;
    queueLog(LOG_DEBUG, "scan to launch");
    EXPECT_THAT(diary.take(), ElementsAre("scan to launch"));
}

TEST_F(TheDiary, HasNothingToDoWithSyslog) {
    queueLog(LOG_ERR, "invalid job");

    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(TheDiary, LeavesErrnoAloneAlsoWhenItCannotBeWritten) {
    const int status = support::runInChild([]() {
        const int full = open("/dev/full", O_WRONLY | O_CLOEXEC);
        if (full < 0 || dup2(full, STDERR_FILENO) < 0) {
            return 1;
        }
        errno = EXDEV;
        queueLog(LOG_ERR, "invalid job");
        return errno == EXDEV ? 0 : 2;
    });

    EXPECT_EQ("exit 0", support::describeStatus(status));
}

TEST_F(TheDiary, IsWrittenALineAtAStroke) {
    int packets[2]; // each read gets one write
    ASSERT_EQ(0, pipe2(packets, O_CLOEXEC | O_DIRECT));

    support::runInChild([&packets]() {
        dup2(packets[1], STDERR_FILENO);
        queueLog(LOG_INFO, "remove job [%d]", 3);
        return 0;
    });

    char packet[100];
    const ssize_t size = read(packets[0], packet, sizeof packet);
    EXPECT_EQ("remove job [3]\n", std::string(packet, size > 0 ? static_cast<std::size_t>(size) : 0));
    close(packets[0]);
    close(packets[1]);
}

TEST_F(TheDiary, SwallowsNothingOfALongLine) {
    const std::string text(100000, 'x');

    queueLog(LOG_INFO, "enqueue job [%s]", text.c_str());

    EXPECT_THAT(diary.take(), ElementsAre("enqueue job [" + text + "]"));
}
