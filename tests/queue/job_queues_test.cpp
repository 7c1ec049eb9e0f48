#include "queue/job_queues.h"

#include <climits>
#include <new>
#include <ostream>

#include <boost/function.hpp>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue_fixture.h"
#include "support/named_rows.h"

using namespace MARU::Backup;
using testing::ElementsAre;

namespace {

class JobQueues : public QueueTest {
protected:
    /** The visits of an iteration in which the callback does this with the job of id 2. */
    std::vector<std::string> visitsWhenTheSecondJobIs(QueueIterControl control, bool removed) {
        std::vector<std::string> visits;
        const auto callback = [&](const std::string& queueName, Job& job, bool& removeJob, void*) {
            visits.push_back(queueName + " " + std::to_string(job.getJobId()));
            const bool second = job.getJobId() == 2;
            removeJob = second && removed;
            return second ? control : QUEUE_ITER_CONTINUE;
        };
        EXPECT_TRUE(queue_foreach_job(callback, nullptr));
        return visits;
    }
};

/** What follows when the callback answers so for job 2 of the backups 1, 2, 3, with a restore, 4, behind them. */
struct ControlRow {
    const char* name;
    QueueIterControl control;
    std::vector<std::string> visits;

    friend std::ostream& operator<<(std::ostream& out, const ControlRow& row) {
        return out << row.name;
    }
};

class JobIteration : public JobQueues, public testing::WithParamInterface<ControlRow> {
protected:
    JobIteration() {
        addHeld(Job::ACTION_BACKUP);
        addHeld(Job::ACTION_BACKUP);
        addHeld(Job::ACTION_BACKUP);
        addHeld(Job::ACTION_RESTORE);
    }
};

const std::vector<std::string> ALL_VISITS = {"backup 1", "backup 2", "backup 3", "restore 4"};

const ControlRow CONTROL_ROWS[] = {
    {"Continue", QUEUE_ITER_CONTINUE, ALL_VISITS},
    {"Stop", QUEUE_ITER_STOP, {"backup 1", "backup 2"}},
    {"NextQueue", QUEUE_ITER_NEXT_QUEUE, {"backup 1", "backup 2", "restore 4"}},
    {"AnUnknownAnswer", static_cast<QueueIterControl>(3), ALL_VISITS},
};

INSTANTIATE_TEST_SUITE_P(All, JobIteration, testing::ValuesIn(CONTROL_ROWS), support::NameOfRow());

} // namespace

TEST_P(JobIteration, GoesOnAsTheCallbackAnswers) {
    const std::vector<std::string> visits = visitsWhenTheSecondJobIs(GetParam().control, false);

    EXPECT_EQ(GetParam().visits, visits);
    EXPECT_THAT(ids("backup"), ElementsAre(1, 2, 3));
    EXPECT_THAT(ids("restore"), ElementsAre(4));
}

TEST_P(JobIteration, ErasesTheJobBeforeItGoesOn) {
    const std::vector<std::string> visits = visitsWhenTheSecondJobIs(GetParam().control, true);

    EXPECT_EQ(GetParam().visits, visits);
    EXPECT_THAT(ids("backup"), ElementsAre(1, 3));
    EXPECT_THAT(ids("restore"), ElementsAre(4));
}

TEST_F(JobQueues, AreVisitedInTheOrderOfTheirNames) {
    for (const Job::Action action : RUNNABLE_ACTIONS) {
        addHeld(action);
    }
    addHeld(Job::ACTION_NONE);

    std::vector<std::string> names;
    queue_foreach_job(
        [&names](const std::string& queueName, Job&, bool&, void*) {
            names.push_back(queueName);
            return QUEUE_ITER_CONTINUE;
        },
        nullptr);

    EXPECT_THAT(names, ElementsAre("backup", "copy_to", "none", "relink", "remove_task", "remove_version", "restore",
                                   "target_copy_to"));
}

TEST_F(JobQueues, AreChangedInPlace) {
    addHeld(Job::ACTION_BACKUP);

    queue_foreach_job(
        [](const std::string&, Job& job, bool&, void*) {
            job.setUniqueString("changed");
            return QUEUE_ITER_CONTINUE;
        },
        nullptr);

    EXPECT_EQ("changed", jobQueues["backup"].front().getUniqueString());
}

TEST_F(JobQueues, HandTheCallersArgumentOn) {
    addHeld(Job::ACTION_BACKUP);
    int caller = 0;

    queue_foreach_job(
        [](const std::string&, Job&, bool&, void* arg) {
            *static_cast<int*>(arg) = 5;
            return QUEUE_ITER_CONTINUE;
        },
        &caller);

    EXPECT_EQ(5, caller);
}

TEST_F(JobQueues, AskAnewForEachJobWhetherToEraseIt) {
    addHeld(Job::ACTION_BACKUP);
    addHeld(Job::ACTION_BACKUP);
    addHeld(Job::ACTION_RESTORE);
    std::vector<bool> asked;

    queue_foreach_job(
        [&asked](const std::string&, Job&, bool& removeJob, void*) {
            asked.push_back(removeJob);
            removeJob = true;
            return QUEUE_ITER_CONTINUE;
        },
        nullptr);

    EXPECT_THAT(asked, ElementsAre(false, false, false));
    EXPECT_TRUE(queue_is_all_empty());
}

TEST_F(JobQueues, ErasingTheLastJobLeavesAnEmptyQueue) {
    addHeld(Job::ACTION_BACKUP);

    queue_foreach_job(
        [](const std::string&, Job&, bool& removeJob, void*) {
            removeJob = true;
            return QUEUE_ITER_CONTINUE;
        },
        nullptr);

    ASSERT_EQ(1U, jobQueues.count("backup"));
    EXPECT_TRUE(jobQueues["backup"].empty());
    EXPECT_TRUE(queue_is_empty("backup"));
}

TEST_F(JobQueues, WithoutAJobNeverCallAnEmptyCallback) {
    EXPECT_NO_THROW(EXPECT_TRUE(queue_foreach_job(QueueIterCallback(), nullptr)));

    jobQueues["backup"].clear();
    EXPECT_NO_THROW(EXPECT_TRUE(queue_foreach_job(QueueIterCallback(), nullptr)));
}

TEST_F(JobQueues, CallingAnEmptyCallbackThrows) {
    addHeld(Job::ACTION_BACKUP);

    EXPECT_THROW(queue_foreach_job(QueueIterCallback(), nullptr), boost::bad_function_call);

    EXPECT_THAT(ids("backup"), ElementsAre(1));
}

TEST_F(JobQueues, FindAJobByWhatACallbackMadeOfItAlsoIfThatThrew) {
    addUnique(Job::ACTION_BACKUP, "before");

    EXPECT_THROW(queue_foreach_job(
                     [](const std::string&, Job& job, bool&, void*) -> QueueIterControl {
                         job.setJobId(7);
                         job.setUniqueString("after");
                         job.setStatus(Job::STATUS_NONE);
                         throw std::bad_alloc();
                     },
                     nullptr),
                 std::bad_alloc);

    ASSERT_NE(nullptr, queue_find_job(7));
    EXPECT_EQ(nullptr, queue_find_job(1));
    EXPECT_EQ("after", queue_find_job(7)->getUniqueString());
    EXPECT_FALSE(queue_is_same_unique(Job()));
    EXPECT_TRUE(queue_is_same_unique(*queue_find_job(7)));
    EXPECT_EQ(1U, jobQueues["backup"].countNotWaiting());
}

TEST_F(JobQueues, VisitTheFirstOfSeveralJobsWithTheSameId) {
    addHeld(Job::ACTION_RESTORE);
    nextJobId = 1;
    addUnique(Job::ACTION_BACKUP, "first");
    nextJobId = 1;
    addUnique(Job::ACTION_BACKUP, "second");
    const auto remove = [](const std::string&, Job&, bool& removeJob, void*) {
        removeJob = true;
        return QUEUE_ITER_CONTINUE;
    };

    EXPECT_TRUE(queue_visit_job(1, remove, nullptr));

    ASSERT_THAT(ids("backup"), ElementsAre(1));
    EXPECT_EQ("second", jobQueues["backup"].front().getUniqueString());
    EXPECT_THAT(ids("restore"), ElementsAre(1));
    EXPECT_FALSE(queue_visit_job(2, remove, nullptr));
}

TEST_F(JobQueues, ThatWereNeverUsedAreEmptyAndStayUnused) {
    EXPECT_TRUE(queue_is_empty("backup"));
    EXPECT_TRUE(queue_is_all_empty());

    EXPECT_TRUE(jobQueues.empty());
}

TEST_F(JobQueues, AreEmptyOrNotOneByOne) {
    addHeld(Job::ACTION_BACKUP);
    jobQueues["restore"].clear();

    EXPECT_FALSE(queue_is_empty("backup"));
    EXPECT_TRUE(queue_is_empty("restore"));
    EXPECT_FALSE(queue_is_all_empty());

    jobQueues["backup"].clear();
    EXPECT_TRUE(queue_is_all_empty());
}

TEST_F(JobQueues, FindTheSameUniqueStringInEveryStatus) {
    Job candidate;
    candidate.setUniqueString("the same");
    const Job& other = addUnique(Job::ACTION_RESTORE, "the same");

    for (const int status : {Job::STATUS_NONE, Job::STATUS_QUEUED, Job::STATUS_RUNNING, Job::STATUS_STOPPING}) {
        setStatus(other, static_cast<Job::Status>(status));
        EXPECT_TRUE(queue_is_same_unique(candidate)) << status;
    }
}

TEST_F(JobQueues, FindTheSameUniqueStringBehindOthers) {
    Job candidate;
    candidate.setUniqueString("c");
    addUnique(Job::ACTION_BACKUP, "a");
    addUnique(Job::ACTION_BACKUP, "b");
    EXPECT_FALSE(queue_is_same_unique(candidate));

    addUnique(Job::ACTION_TARGET_COPY_TO, "c");
    EXPECT_TRUE(queue_is_same_unique(candidate));
}

TEST_F(JobQueues, CompareUniqueStringsByteByByte) {
    addUnique(Job::ACTION_BACKUP, std::string("a\0b", 3));
    Job candidate;

    for (const std::string& other : {std::string("a"), std::string("a\0c", 3), std::string("A\0b", 3), std::string()}) {
        candidate.setUniqueString(other);
        EXPECT_FALSE(queue_is_same_unique(candidate)) << other;
    }
    candidate.setUniqueString(std::string("a\0b", 3));
    EXPECT_TRUE(queue_is_same_unique(candidate));
}

TEST_F(JobQueues, HandOutIdsFromOneUp) {
    EXPECT_EQ(1, queue_take_job_id());
    EXPECT_EQ(2, queue_take_job_id());
    EXPECT_EQ(3, queue_take_job_id());
}

TEST_F(JobQueues, SurviveTheLastId) {
    nextJobId = INT_MAX;

    EXPECT_EQ(INT_MAX, queue_take_job_id());
    EXPECT_EQ(INT_MIN, queue_take_job_id());
}
