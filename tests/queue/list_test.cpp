#include "queue/requests.h"

#include <ostream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/job_queues.h"
#include "queue_fixture.h"
#include "support/named_rows.h"

using namespace MARU::Backup;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

/** Four jobs in three queues. */
class ListJobs : public QueueTest {
protected:
    ListJobs() {
        addNamed("held", Job::ACTION_RESTORE, "a", 5);
        addNamed("held", Job::ACTION_BACKUP, "b", 5);
        addNamed("shell", Job::ACTION_BACKUP, "a", 7);
        addNamed("shell", Job::ACTION_COPY_TO, "c", 5);
    }

    static std::string list(const std::string& filter) {
        return ask(R"({"op":"job_list")" + (filter.empty() ? "" : "," + filter) + "}");
    }

    /** The reply that lists these jobs. */
    static std::string replyWith(const std::vector<int>& wanted) {
        std::string jobs;
        for (const int id : wanted) {
            jobs += (jobs.empty() ? "" : ",") + textOf(id);
        }
        return R"({"code":200,"jobs":[)" + jobs + "]}";
    }

private:
    void addNamed(const std::string& backend, Job::Action action, const std::string& unique, int size) {
        Job job(backend, action);
        job.setUniqueString(unique);
        job.setParam("size", size);
        add(job);
    }

    static std::string textOf(int id) {
        for (const auto& entry : jobQueues) {
            for (const Job& job : entry.second) {
                if (job.getJobId() == id) {
                    return job.toString();
                }
            }
        }
        return "no such job";
    }
};

struct FilterRow {
    const char* name;
    const char* filter;
    std::vector<int> jobs;

    friend std::ostream& operator<<(std::ostream& out, const FilterRow& row) {
        return out << row.name;
    }
};

class ListFilter : public ListJobs, public testing::WithParamInterface<FilterRow> {};

const FilterRow FILTERS[] = {
    {"None", "", {2, 3, 4, 1}},
    {"Action", R"("action":1)", {2, 3}},
    {"AnotherAction", R"("action":2)", {1}},
    {"AnUnusedAction", R"("action":8)", {}},
    {"Backend", R"("backend":"shell")", {3, 4}},
    {"AnUnknownBackend", R"("backend":"shel")", {}},
    {"AnEmptyBackend", R"("backend":"")", {2, 3, 4, 1}},
    {"UniqueOnce", R"("unique":"b")", {2}},
    {"UniqueTwiceEndsAtTheFirst", R"("unique":"a")", {3}},
    {"AnUnknownUnique", R"("unique":"A")", {}},
    {"AnEmptyUnique", R"("unique":"")", {2, 3, 4, 1}},
    {"Format", R"("format":"{{size}}","target":"5")", {2, 4, 1}},
    {"FormatOfSeveralNames", R"("format":"{{BACKEND}}-{{size}}","target":"shell-7")", {3}},
    {"FormatThatNothingMatches", R"("format":"{{size}}","target":"6")", {}},
    {"FormatWithoutTarget", R"("format":"{{size}}")", {2, 3, 4, 1}},
    {"FormatOfAnyTypeWithoutTarget", R"("format":5)", {2, 3, 4, 1}},
    {"TargetWithoutFormat", R"("target":"5")", {2, 3, 4, 1}},
    {"TargetOfAnyTypeWithoutFormat", R"("target":5)", {2, 3, 4, 1}},
    {"AnEmptyFormat", R"("format":"","target":"5")", {2, 3, 4, 1}},
    {"AnEmptyTarget", R"("format":"{{size}}","target":"")", {2, 3, 4, 1}},
    {"ActionAndBackend", R"("action":1,"backend":"shell")", {3}},
    {"ActionAndUnique", R"("action":2,"unique":"a")", {1}},
    {"BackendAndUnique", R"("backend":"held","unique":"a")", {1}},
    {"FormatAndBackend", R"("format":"{{size}}","target":"5","backend":"held")", {2, 1}},
    {"FormatAndUnique", R"("format":"{{size}}","target":"5","unique":"a")", {1}},
    {"All", R"("action":4,"backend":"shell","unique":"c","format":"{{size}}","target":"5")", {4}},
    {"AllButOne", R"("action":4,"backend":"shell","unique":"c","format":"{{size}}","target":"7")", {}},
};

INSTANTIATE_TEST_SUITE_P(By, ListFilter, testing::ValuesIn(FILTERS), support::NameOfRow());

struct BadFilterRow {
    const char* name;
    const char* filter;
    const char* reported;

    friend std::ostream& operator<<(std::ostream& out, const BadFilterRow& row) {
        return out << row.name;
    }
};

class BadListFilter : public ListJobs, public testing::WithParamInterface<BadFilterRow> {};

const BadFilterRow BAD_FILTERS[] = {
    {"ActionOfText", R"("action":"backup")", "action"},
    {"ActionThatIsReal", R"("action":1.0)", "action"},
    {"ActionThatIsTooLarge", R"("action":4294967297)", "action"},
    {"ActionNull", R"("action":null)", "action"},
    {"FormatOfANumber", R"("format":5,"target":"5")", "format"},
    {"TargetOfANumber", R"("format":"{{size}}","target":5)", "format"},
    {"FormatNull", R"("format":null,"target":"5")", "format"},
    {"BackendOfANumber", R"("backend":5)", "backend"},
    {"BackendNull", R"("backend":null)", "backend"},
    {"UniqueOfANumber", R"("unique":5)", "unique"},
    {"UniqueOfAnArray", R"("unique":["a"])", "unique"},
    {"ActionBeforeAllElse", R"("unique":5,"backend":5,"format":5,"target":5,"action":"")", "action"},
    {"FormatBeforeBackendAndUnique", R"("unique":5,"backend":5,"format":5,"target":5)", "format"},
    {"BackendBeforeUnique", R"("unique":5,"backend":5)", "backend"},
};

INSTANTIATE_TEST_SUITE_P(Of, BadListFilter, testing::ValuesIn(BAD_FILTERS), support::NameOfRow());

} // namespace

TEST_P(ListFilter, LetsTheRightJobsThroughInTheRightOrder) {
    EXPECT_EQ(replyWith(GetParam().jobs), list(GetParam().filter));

    EXPECT_THAT(diary.take(), IsEmpty());
}

TEST_P(BadListFilter, IsRefusedByName) {
    EXPECT_EQ(R"({"code":400})", list(GetParam().filter));

    EXPECT_THAT(diary.take(), ElementsAre(std::string("bad list param: ") + GetParam().reported));
}

TEST_F(ListJobs, ShowsProcessesAndStatuses) {
    change(jobQueues["restore"].front(), [](Job& job) {
        job.setStatus(Job::STATUS_STOPPING);
        job.setPid(4711);
    });

    EXPECT_EQ(R"({"code":200,"jobs":[{"action":2,"backend":"held","job_id":1,"param":{"size":5},"pid":4711,)"
              R"("status":3,"unique":"a"}]})",
              list(R"("action":2)"));
}

TEST_F(ListJobs, OfAnActionLeavesItsQueueBehind) {
    jobQueues.clear();

    EXPECT_EQ(R"({"code":200,"jobs":[]})", list(R"("action":2)"));

    ASSERT_EQ(1U, jobQueues.size());
    EXPECT_EQ(1U, jobQueues.count("restore"));
    EXPECT_TRUE(queue_is_empty("restore"));
    EXPECT_TRUE(queue_is_all_empty());
}

TEST_F(ListJobs, OfAnUnknownActionListsTheJobsOfAllSuchActions) {
    EXPECT_EQ(R"({"code":200,"jobs":[]})", list(R"("action":3)"));
    ASSERT_EQ(1U, jobQueues.count("none"));

    const Job& job = addHeld(static_cast<Job::Action>(128));
    EXPECT_EQ(R"({"code":200,"jobs":[)" + job.toString() + "]}", list(R"("action":3)"));
    EXPECT_EQ(R"({"code":200,"jobs":[)" + job.toString() + "]}", list(R"("action":-1)"));
}

TEST_F(ListJobs, WithoutAFilterMakesNoQueue) {
    jobQueues.clear();

    EXPECT_EQ(R"({"code":200,"jobs":[]})", list(""));

    EXPECT_TRUE(jobQueues.empty());
}

TEST_F(ListJobs, RefusedMakesNoQueue) {
    jobQueues.clear();

    list(R"("action":2,"backend":5)");

    EXPECT_TRUE(jobQueues.empty());
}
