#include "queue/queue_server.h"

#include <syslog.h>
#include <unistd.h>

#include <cstdio>
#include <ostream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/queue_log.h"
#include "queue_fixture.h"
#include "support/backend_files.h"

using namespace MARU::Backup;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

/** `count` statuses, and then `waiting` times STATUS_QUEUED. */
std::vector<int> busyThenQueued(int count, Job::Status busy, int waiting) {
    std::vector<int> expected(static_cast<std::size_t>(count), busy);
    expected.insert(expected.end(), static_cast<std::size_t>(waiting), Job::STATUS_QUEUED);
    return expected;
}

class Scheduling : public QueueTest {
protected:
    Scheduling() {
        queueDebugEnabled = true;
    }

    /** Scans; what was launched, as "queue id", in that order. */
    std::vector<std::string> scan() {
        diary.take();
        EXPECT_TRUE(queue_scan_next_to_launch());
        std::vector<std::string> launches;
        for (const std::string& line : diary.take()) {
            int id = 0;
            int pid = 0;
            if (std::sscanf(line.c_str(), "launch job [%d] on pid [%d]", &id, &pid) == 2) {
                launches.push_back(queueOf(id) + " " + std::to_string(id));
            }
        }
        return launches;
    }

    void expectBadJob(const std::string& job) {
        support::expectLocated(log, LOG_ERR, getpid(), QUEUE_UNIT, "bad job: [" + job + "]");
    }

private:
    static std::string queueOf(int id) {
        for (const auto& entry : jobQueues) {
            for (const Job& job : entry.second) {
                if (job.getJobId() == id) {
                    return entry.first;
                }
            }
        }
        return "no queue";
    }
};

struct Limit {
    Job::Action action;
    int jobs;

    friend std::ostream& operator<<(std::ostream& out, const Limit& row) {
        return out << action2str(row.action) << " " << row.jobs;
    }
};

class QueueLimit : public Scheduling, public testing::WithParamInterface<Limit> {
protected:
    const std::string queueName = action2str(GetParam().action);
    const int limit = GetParam().jobs;

    void addMoreThanTheLimit(Job::Status status) {
        for (int count = 0; count < limit; ++count) {
            addHeld(GetParam().action, status);
        }
        addHeld(GetParam().action);
        addHeld(GetParam().action);
    }
};

INSTANTIATE_TEST_SUITE_P(Of, QueueLimit,
                         testing::Values(Limit{Job::ACTION_RESTORE, 1}, Limit{Job::ACTION_BACKUP, 1},
                                         Limit{Job::ACTION_COPY_TO, 5}, Limit{Job::ACTION_TARGET_COPY_TO, 5},
                                         Limit{Job::ACTION_RELINK, 4}, Limit{Job::ACTION_REMOVE_VERSION, 10},
                                         Limit{Job::ACTION_REMOVE_TASK, 10}),
                         [](const auto& row) { return action2str(row.param.action); });

} // namespace

TEST_P(QueueLimit, IsHowManyJobsHaveAProcess) {
    addMoreThanTheLimit(Job::STATUS_QUEUED);

    EXPECT_THAT(scan(), SizeIs(limit));

    EXPECT_EQ(busyThenQueued(limit, Job::STATUS_RUNNING, 2), statuses(queueName));
    for (const Job& job : jobQueues[queueName]) {
        EXPECT_EQ(job.getStatus() == Job::STATUS_RUNNING, isRunning(job.getPid())) << job;
    }
    EXPECT_THAT(scan(), IsEmpty()) << "a scan that finds nothing to start changes nothing";
}

TEST_P(QueueLimit, CountsStoppingJobs) {
    addMoreThanTheLimit(Job::STATUS_STOPPING);

    EXPECT_THAT(scan(), IsEmpty());

    EXPECT_EQ(busyThenQueued(limit, Job::STATUS_STOPPING, 2), statuses(queueName));
}

TEST_P(QueueLimit, LetsTheNextJobInWhenOneHasEnded) {
    support::Gate gate(folder.path("gate"));
    addScript(GetParam().action, "read line < " + gate.path());
    addMoreThanTheLimit(Job::STATUS_QUEUED);
    scan();
    const int firstWaiting = limit + 1;

    gate.open();
    awaitEnd(jobQueues[queueName].front().getPid());
    queue_check_children_status("sigchild");

    EXPECT_THAT(scan(), ElementsAre(queueName + " " + std::to_string(firstWaiting)));
    EXPECT_EQ(busyThenQueued(limit, Job::STATUS_RUNNING, 2), statuses(queueName));
}

TEST_P(QueueLimit, IsNotTouchedByAJobThatCannotBeLaunched) {
    const std::string lost = add(Job("no such backend", GetParam().action)).toString();
    addMoreThanTheLimit(Job::STATUS_QUEUED);

    scan();

    expectBadJob(lost);
    EXPECT_EQ(busyThenQueued(limit, Job::STATUS_RUNNING, 2), statuses(queueName));
}

TEST_F(Scheduling, SaysThatItScans) {
    queue_scan_next_to_launch();

    EXPECT_THAT(diary.take(), ElementsAre("scan to launch"));
    EXPECT_TRUE(jobQueues.empty());
}

TEST_F(Scheduling, GoesThroughTheQueuesInAFixedOrder) {
    addHeld(Job::ACTION_REMOVE_TASK);
    addHeld(Job::ACTION_REMOVE_VERSION);
    addHeld(Job::ACTION_RELINK);
    addHeld(Job::ACTION_TARGET_COPY_TO);
    addHeld(Job::ACTION_COPY_TO);
    addHeld(Job::ACTION_BACKUP);

    EXPECT_THAT(scan(), ElementsAre("backup 6", "copy_to 5", "target_copy_to 4", "relink 3", "remove_version 2",
                                    "remove_task 1"));
}

TEST_F(Scheduling, StartsARestoreFirstAndNothingBesideIt) {
    for (const Job::Action action : RUNNABLE_ACTIONS) {
        addHeld(action);
    }

    EXPECT_THAT(scan(), ElementsAre("restore 2"));

    EXPECT_THAT(scan(), IsEmpty());
    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_QUEUED));
    EXPECT_THAT(statuses("remove_task"), ElementsAre(Job::STATUS_QUEUED));
}

TEST_F(Scheduling, WaitsForARestoreThatIsStopping) {
    addHeld(Job::ACTION_RESTORE, Job::STATUS_STOPPING);
    addHeld(Job::ACTION_BACKUP);

    EXPECT_THAT(scan(), IsEmpty());

    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_QUEUED));
}

TEST_F(Scheduling, StartsTheOthersWhenTheRestoreHasEnded) {
    addScript(Job::ACTION_RESTORE, "exit 0");
    addHeld(Job::ACTION_BACKUP);
    EXPECT_THAT(scan(), ElementsAre("restore 1"));

    awaitEnd(jobQueues["restore"].front().getPid());
    EXPECT_THAT(scan(), IsEmpty()) << "before its process was looked at";
    queue_check_children_status("sigchild");

    EXPECT_THAT(scan(), ElementsAre("backup 2"));
}

TEST_F(Scheduling, StartsARestoreWhateverElseRunsAndLetsThatGoOn) {
    addHeld(Job::ACTION_BACKUP);
    addHeld(Job::ACTION_COPY_TO);
    scan();
    addHeld(Job::ACTION_RESTORE);

    EXPECT_THAT(scan(), ElementsAre("restore 3"));

    EXPECT_TRUE(isRunning(jobQueues["backup"].front().getPid()));
    EXPECT_TRUE(isRunning(jobQueues["copy_to"].front().getPid()));
    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_RUNNING));
    EXPECT_THAT(statuses("copy_to"), ElementsAre(Job::STATUS_RUNNING));
}

TEST_F(Scheduling, IsNotHeldUpByARestoreThatCannotBeLaunched) {
    add(Job("no such backend", Job::ACTION_RESTORE));
    addHeld(Job::ACTION_BACKUP);

    EXPECT_THAT(scan(), ElementsAre("backup 2"));

    EXPECT_THAT(ids("restore"), IsEmpty());
}

TEST_F(Scheduling, NeverStartsAJobOfAnUnknownAction) {
    const Job::Action unknown = static_cast<Job::Action>(128);
    addHeld(unknown);
    addHeld(Job::ACTION_NONE);

    EXPECT_THAT(scan(), IsEmpty());

    EXPECT_THAT(statuses("none"), ElementsAre(Job::STATUS_QUEUED, Job::STATUS_QUEUED));
}

TEST_F(Scheduling, OfAQueueThatWasNeverUsedChangesNothing) {
    for (const bool before : {false, true}) {
        bool busy = before;

        EXPECT_TRUE(queue_launch_next_job("backup", busy, 1));

        EXPECT_EQ(before, busy);
    }
    EXPECT_TRUE(jobQueues.empty());
}

TEST_F(Scheduling, OfAQueueSaysWhetherItIsBusy) {
    bool busy = true;
    jobQueues["backup"].clear();
    queue_launch_next_job("backup", busy, 1);
    EXPECT_FALSE(busy) << "an empty queue";

    addHeld(Job::ACTION_BACKUP);
    queue_launch_next_job("backup", busy, 1);
    EXPECT_TRUE(busy) << "a job that was just launched";

    busy = false;
    queue_launch_next_job("backup", busy, 1);
    EXPECT_TRUE(busy) << "a job that runs";

    busy = false;
    addHeld(Job::ACTION_RELINK, Job::STATUS_STOPPING);
    queue_launch_next_job("relink", busy, 4);
    EXPECT_TRUE(busy) << "a job that is stopping";

    add(Job("no such backend", Job::ACTION_COPY_TO));
    queue_launch_next_job("copy_to", busy, 5);
    EXPECT_FALSE(busy) << "a job that could not be launched";
}

TEST_F(Scheduling, DropsJobsWithAnImpossibleStatus) {
    for (const int status : {0, 4, 7, -1}) {
        const std::string lost = addHeld(Job::ACTION_BACKUP, static_cast<Job::Status>(status)).toString();
        addHeld(Job::ACTION_BACKUP, Job::STATUS_STOPPING);

        EXPECT_THAT(scan(), IsEmpty());

        expectBadJob(lost);
        EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_STOPPING)) << status;
        jobQueues["backup"].clear();
    }
}

TEST_F(Scheduling, ReachesABadJobOnlyBelowTheLimit) {
    addHeld(Job::ACTION_BACKUP, Job::STATUS_STOPPING);
    addHeld(Job::ACTION_BACKUP, Job::STATUS_NONE);

    scan();

    EXPECT_THAT(ids("backup"), ElementsAre(1, 2));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(Scheduling, ShowsALaunchedJobInTheStore) {
    addHeld(Job::ACTION_BACKUP);

    scan();

    const Job& job = jobQueues["backup"].front();
    EXPECT_EQ("{\"code\":200,\"job\":" + job.toString() + "}", ask(R"({"op":"job_get","job_id":1})"));
    EXPECT_EQ(Job::STATUS_RUNNING, job.getStatus());
    EXPECT_TRUE(isRunning(job.getPid()));
}
