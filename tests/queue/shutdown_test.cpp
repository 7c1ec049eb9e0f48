#include "queue/queue_server.h"

#include <algorithm>
#include <chrono>
#include <csignal>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/queue_log.h"
#include "queue_fixture.h"
#include "signals.h"
#include "support/in_child.h"

using namespace MARU::Backup;
using support::describeStatus;
using support::waitForChild;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

namespace {

const char* const CHECK = "[terminate] check children status";

/** SIGCHLD is handled, as it is in the daemon, and cuts short what it can. */
class Shutdown : public QueueTest {
protected:
    Shutdown() : childSignal(SIGCHLD) {
        queueDebugEnabled = true;
    }

    /** Stops all jobs; the diary of that. */
    std::vector<std::string> killAll() {
        diary.take();
        EXPECT_TRUE(queue_kill_all_job());
        return diary.take();
    }

private:
    HandledSignal childSignal;
};

} // namespace

TEST_F(Shutdown, WithoutJobsDoesNotWait) {
    EXPECT_THAT(killAll(), ElementsAre(CHECK));
}

TEST_F(Shutdown, DropsWaitingJobsAndDoesNotWaitForThem) {
    addHeld(Job::ACTION_BACKUP);
    addHeld(Job::ACTION_COPY_TO);

    EXPECT_THAT(killAll(), ElementsAre(CHECK));

    EXPECT_THAT(ids("backup"), IsEmpty());
    EXPECT_THAT(ids("copy_to"), IsEmpty());
}

TEST_F(Shutdown, EndsAsSoonAsAllJobsHaveEnded) {
    const Job job = launched(addHeld(Job::ACTION_BACKUP));
    addHeld(Job::ACTION_BACKUP);

    const std::vector<std::string> lines = killAll();

    EXPECT_THAT(lines, Contains(sent(15, job)));
    EXPECT_THAT(lines, Contains("job [1] term by sig(" + std::to_string(job.getPid() & 127) + ")"));
    EXPECT_THAT(lines, Not(Contains(StartsWith("send sig[9]"))));
    EXPECT_LE(std::count(lines.begin(), lines.end(), CHECK), 5) << "waited although there was nothing to wait for";
    EXPECT_TRUE(queue_is_all_empty());
}

TEST_F(Shutdown, KillsAJobThatIgnoresSigtermAfterFiveFullSecondsWhateverElseEnds) {
    support::Gate gate(folder.path("gate"));
    const std::string deaf = "trap '' TERM; read line < " + gate.path();
    const pid_t stubborn = launched(addScript(Job::ACTION_BACKUP, deaf)).getPid();
    gate.awaitJob();
    for (const char* const end : {"0.5", "1.5", "2.5", "3.5"}) {
        support::Gate ready(folder.path(end));
        launched(addScript(Job::ACTION_COPY_TO, "trap '' TERM; read line < " + ready.path() + "; sleep " + end));
        ready.open();
    }
    const Job before = jobQueues["backup"].front();
    const auto start = std::chrono::steady_clock::now();

    const std::vector<std::string> lines = killAll();

    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
    EXPECT_EQ(sent(15, before), lines.front());
    EXPECT_EQ(sent(9, before), lines.back());
    EXPECT_EQ(6, std::count(lines.begin(), lines.end(), CHECK));
    for (const int id : {2, 3, 4, 5}) {
        EXPECT_THAT(lines, Contains("job [" + std::to_string(id) + "] exit(0)"));
    }
    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_STOPPING)) << "it is left to a later check";
    EXPECT_EQ("signal 9", describeStatus(waitForChild(stubborn)));
}

TEST_F(Shutdown, KillsAStoppingJobWithoutAnotherSigterm) {
    const Job& job = launched(addHeld(Job::ACTION_BACKUP));
    setStatus(job, Job::STATUS_STOPPING);

    const std::vector<std::string> lines = killAll();

    EXPECT_THAT(lines, ElementsAre(CHECK, CHECK, CHECK, CHECK, CHECK, CHECK, sent(9, job)));
    EXPECT_EQ("signal 9", describeStatus(waitForChild(job.getPid())));
}
