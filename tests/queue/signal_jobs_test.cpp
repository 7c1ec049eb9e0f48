#include "queue/queue_server.h"

#include <sys/syscall.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue_fixture.h"
#include "support/emulation.h"
#include "support/in_child.h"
#include "support/nobody.h"
#include "support/syscall_filter.h"

using namespace MARU::Backup;
using support::describeStatus;
using support::expectLocated;
using support::waitForChild;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class SignalToAJob : public QueueTest {
protected:
    /** Sends it; whether the job has to be removed now. No signal is SIGTERM. */
    bool send(const Job& job, const int* signal = nullptr) {
        diary.take();
        bool removeJob = false;
        int number = signal != nullptr ? *signal : 0;
        change(job, [&](Job& signalled) {
            EXPECT_EQ(QUEUE_ITER_CONTINUE,
                      sendSignalCb("backup", signalled, removeJob, signal != nullptr ? &number : nullptr));
        });
        return removeJob;
    }
};

const int TERM = SIGTERM;
const int KILL = SIGKILL;

} // namespace

TEST_F(SignalToAJob, ThatWasNeverLaunchedRemovesItWithoutAWord) {
    for (const int status : {Job::STATUS_QUEUED, Job::STATUS_RUNNING, Job::STATUS_STOPPING}) {
        const Job& job = addHeld(Job::ACTION_BACKUP, static_cast<Job::Status>(status));

        EXPECT_TRUE(send(job)) << status;

        EXPECT_THAT(diary.take(), IsEmpty());
        EXPECT_EQ(status, job.getStatus());
    }
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(SignalToAJob, IsSigtermIfNoneIsGiven) {
    const Job& job = launched(addHeld(Job::ACTION_BACKUP));

    EXPECT_FALSE(send(job));

    EXPECT_THAT(diary.take(), ElementsAre(sent(15, job)));
    EXPECT_EQ(Job::STATUS_STOPPING, job.getStatus());
    EXPECT_EQ("signal 15", describeStatus(waitForChild(job.getPid())));
}

TEST_F(SignalToAJob, IsTheOneThatIsGiven) {
    for (const int signal : {SIGTERM, SIGKILL, SIGUSR1}) {
        const Job& job = launched(addHeld(Job::ACTION_COPY_TO));

        EXPECT_FALSE(send(job, &signal));

        EXPECT_THAT(diary.take(), ElementsAre(sent(signal, job)));
        EXPECT_EQ(Job::STATUS_STOPPING, job.getStatus());
        EXPECT_EQ("signal " + std::to_string(signal), describeStatus(waitForChild(job.getPid())));
    }
}

TEST_F(SignalToAJob, ThatIsStoppingIsNotAnotherSigterm) {
    support::Gate gate(folder.path("gate"));
    const Job& job = launched(addScript(Job::ACTION_BACKUP, "read line < " + gate.path() + "; exit 4"));
    setStatus(job, Job::STATUS_STOPPING);

    EXPECT_FALSE(send(job));
    EXPECT_THAT(diary.take(), IsEmpty());
    EXPECT_FALSE(send(job, &TERM));
    EXPECT_THAT(diary.take(), IsEmpty());

    gate.open();
    EXPECT_EQ("exit 4", describeStatus(waitForChild(job.getPid())));
}

TEST_F(SignalToAJob, ThatIsStoppingIsStillAnyOtherSignal) {
    const Job& job = launched(addHeld(Job::ACTION_BACKUP));
    setStatus(job, Job::STATUS_STOPPING);

    EXPECT_FALSE(send(job, &KILL));

    EXPECT_THAT(diary.take(), ElementsAre(sent(9, job)));
    EXPECT_EQ("signal 9", describeStatus(waitForChild(job.getPid())));
}

TEST_F(SignalToAJob, WhoseProcessIsGoneIsNoMistake) {
    const Job& job = launched(addScript(Job::ACTION_BACKUP, "exit 0"));
    waitForChild(job.getPid());

    EXPECT_FALSE(send(job));

    EXPECT_THAT(diary.take(), ElementsAre(sent(15, job)));
    EXPECT_EQ(Job::STATUS_STOPPING, job.getStatus());
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(SignalToAJob, ThatMayNotBeSentIsReportedAndCountsAsSent) {
    const Job& job = addWithProcess(1, Job::STATUS_RUNNING);

    const pid_t daemon = support::startInChild([&]() {
        openlog(nullptr, LOG_NDELAY, 0);
        support::becomeNobody();
        return !send(job) && job.getStatus() == Job::STATUS_STOPPING ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(waitForChild(daemon)));
    expectLocated(log, LOG_ERR, daemon, QUEUE_UNIT, "kill(1) failed, Operation not permitted");
    EXPECT_THAT(diary.take(), ElementsAre(sent(15, job)));
}

TEST_F(SignalToAJob, ThatTheKernelRefusesIsReportedForEachSignal) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    const Job& job = addWithProcess(getpid(), Job::STATUS_RUNNING);

    const pid_t daemon = support::startInChild([&]() {
        support::refuseSystemCalls({SYS_kill}, EINVAL);
        return !send(job, &KILL) && !send(job, &KILL) ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(waitForChild(daemon)));
    const std::string message = "kill(" + std::to_string(getpid()) + ") failed, Invalid argument";
    expectLocated(log, LOG_ERR, daemon, QUEUE_UNIT, message);
    expectLocated(log, LOG_ERR, daemon, QUEUE_UNIT, message);
}
