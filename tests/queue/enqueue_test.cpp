#include "queue/requests.h"

#include <unistd.h>

#include <ostream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/job_queues.h"
#include "queue_fixture.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/named_rows.h"

using namespace MARU::Backup;
using support::writeLocalBackend;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::string request(const std::string& job) {
    return R"({"op":"job_enqueue","job":)" + job + "}";
}

/** A request for a job of the backend "held". */
std::string heldRequest(Job::Action action, const std::string& name) {
    return request(R"({"backend":"held","action":)" + std::to_string(action) + R"(,"status":0,"param":{"name":")" +
                   name + R"("}})");
}

/** The reply that admits a job whose unique string is its name. */
std::string admission(const std::string& backend, int action, const std::string& name, int id) {
    return R"({"code":200,"job":{"action":)" + std::to_string(action) + R"(,"backend":")" + backend + R"(","job_id":)" +
           std::to_string(id) + R"(,"param":{"name":")" + name + R"("},"status":1,"unique":")" + name + R"("}})";
}

class Enqueue : public QueueTest {};

/** A request that is refused, together with all that would be refused after it. */
struct Refusal {
    const char* name;
    const char* job;
    const char* section; ///< of the backend "picky"
    bool restoreWaits;
    bool sameWorkWaits;
    const char* reply;
    std::vector<std::string> lines;
    int nextId;

    friend std::ostream& operator<<(std::ostream& out, const Refusal& row) {
        return out << row.name;
    }
};

class RefusedJob : public Enqueue, public testing::WithParamInterface<Refusal> {};

const char* const NO_WORK = R"({"backend":"picky","action":0,"status":0,"param":{"name":"n"}})";
const char* const BACKUP = R"({"backend":"picky","action":1,"status":0,"param":{"name":"n"}})";
const char* const RESTORE = R"({"backend":"picky","action":2,"status":0,"param":{"name":"n"}})";

const char* const OTHER_SECTION = "[relink]\ncommand_launch = /bin/true\n";
const char* const UNWILLING = "[backup]\ncommand_check = /bin/false\nunique =\n";
const char* const WITHOUT_UNIQUE = "[backup]\ncommand_check = /bin/true\nunique =\n";
const char* const WILLING = "[backup]\nunique = {{name}}\n[restore]\nunique = {{name}}\n";

const Refusal REFUSALS[] = {
    {"1NoWork", NO_WORK, OTHER_SECTION, true, true, R"({"code":400})", {}, 1},
    {"2NoSection", BACKUP, OTHER_SECTION, true, true, R"({"code":505})", {"backend [picky] not support"}, 1},
    {"3CheckRefuses", BACKUP, UNWILLING, true, true, R"({"code":400})", {"invalid job"}, 1},
    {"4EmptyUnique", BACKUP, WITHOUT_UNIQUE, true, true, R"({"code":505})", {"backend [picky] bad unique"}, 1},
    {"5RestoreWaits", BACKUP, WILLING, true, true, R"({"code":406})", {"restore queue is not empty"}, 1},
    {"5RestoreToo", RESTORE, WILLING, true, true, R"({"code":406})", {"restore queue is not empty"}, 1},
    {"8SameWork", BACKUP, WILLING, false, true, R"({"code":409})", {"job unique conflict [n]"}, 2},
};

INSTANTIATE_TEST_SUITE_P(As, RefusedJob, testing::ValuesIn(REFUSALS), support::NameOfRow());

} // namespace

TEST_P(RefusedJob, IsRefusedByTheFirstReason) {
    writeLocalBackend("picky", GetParam().section);
    if (GetParam().restoreWaits) {
        addHeld(Job::ACTION_RESTORE);
    }
    if (GetParam().sameWorkWaits) {
        addUnique(Job::ACTION_RELINK, "n");
    }
    const std::string before = ask(R"({"op":"job_list"})");
    nextJobId = 1;
    diary.take();

    EXPECT_EQ(GetParam().reply, ask(request(GetParam().job)));

    EXPECT_EQ(GetParam().lines, diary.take());
    EXPECT_EQ(GetParam().nextId, nextJobId);
    EXPECT_EQ(before, ask(R"({"op":"job_list"})"));
    EXPECT_EQ(0U, jobQueues.count("backup"));
}

TEST_F(Enqueue, RefusesARequestWithoutAJobThatCanBeDone) {
    const char* const requests[] = {
        R"({"op":"job_enqueue"})",
        R"({"op":"job_enqueue","job":null})",
        R"({"op":"job_enqueue","job":5})",
        R"({"op":"job_enqueue","job":"held"})",
        R"({"op":"job_enqueue","job":[]})",
        R"({"op":"job_enqueue","job":{}})",
        R"({"op":"job_enqueue","job":{"action":1,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":5,"action":1,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":"backup","status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":1.5,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":4294967297,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":1,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":1,"status":"queued","param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":1,"status":0}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":1,"status":0,"param":null}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":1,"status":0,"param":[]}})",
        R"({"op":"job_enqueue","job":{"backend":"","action":1,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":0,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":268435456,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":536870912,"status":0,"param":{}}})",
        R"({"op":"job_enqueue","job":{"backend":"held","action":1073741824,"status":0,"param":{}}})",
    };
    for (const char* const text : requests) {
        EXPECT_EQ(R"({"code":400})", ask(text)) << text;
    }

    EXPECT_THAT(diary.take(), IsEmpty());
    EXPECT_TRUE(jobQueues.empty());
    EXPECT_EQ(1, nextJobId);
}

TEST_F(Enqueue, RefusesABackendThatIsNotThere) {
    for (const std::string backend : {"unknown", "../marubackup/held", "HELD", "held.conf"}) {
        const std::string job = R"({"backend":")" + backend + R"(","action":1,"status":0,"param":{}})";

        EXPECT_EQ(R"({"code":505})", ask(request(job)));

        EXPECT_THAT(diary.take(), ElementsAre("backend [" + backend + "] not support"));
    }
}

TEST_F(Enqueue, AdmitsEachActionIntoItsQueueAndStartsItsProcessAtOnce) {
    int id = 0;
    for (const Job::Action action : RUNNABLE_ACTIONS) {
        if (action == Job::ACTION_RESTORE) {
            continue; // after which nothing else is admitted
        }
        ++id;
        const std::string name = action2str(action);

        EXPECT_EQ(admission("held", action, name, id), ask(heldRequest(action, name)));

        ASSERT_THAT(ids(name), ElementsAre(id));
        EXPECT_EQ(Job::STATUS_RUNNING, jobQueues[name].front().getStatus());
        EXPECT_TRUE(isRunning(jobQueues[name].front().getPid()));
    }
    EXPECT_EQ(admission("held", Job::ACTION_RESTORE, "r", 7), ask(heldRequest(Job::ACTION_RESTORE, "r")));
    EXPECT_THAT(statuses("restore"), ElementsAre(Job::STATUS_RUNNING));
}

TEST_F(Enqueue, TellsTheDiaryAllAboutIt) {
    ask(heldRequest(Job::ACTION_BACKUP, "n"));

    const std::string job = R"({"action":1,"backend":"held","job_id":1,"param":{"name":"n"},"status":1,"unique":"n"})";
    const std::string pid = std::to_string(jobQueues["backup"].front().getPid());
    EXPECT_THAT(diary.take(), ElementsAre("enqueue job [" + job + "]", "launch job [" + job + "]",
                                          "launch job [1] on pid [" + pid + "]"));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(Enqueue, AppendsAJobThatHasToWait) {
    ask(heldRequest(Job::ACTION_BACKUP, "a"));

    EXPECT_EQ(admission("held", Job::ACTION_BACKUP, "b", 2), ask(heldRequest(Job::ACTION_BACKUP, "b")));
    EXPECT_EQ(admission("held", Job::ACTION_BACKUP, "c", 3), ask(heldRequest(Job::ACTION_BACKUP, "c")));

    EXPECT_THAT(ids("backup"), ElementsAre(1, 2, 3));
    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_RUNNING, Job::STATUS_QUEUED, Job::STATUS_QUEUED));
    EXPECT_EQ(-1, jobQueues["backup"].back().getPid());
}

TEST_F(Enqueue, AdmitsAJobOfAnUnknownActionIfTheBackendWantsIt) {
    writeLocalBackend("picky", "[none]\nunique = {{name}}\n");

    EXPECT_EQ(admission("picky", 3, "n", 1),
              ask(request(R"({"backend":"picky","action":3,"status":0,"param":{"name":"n"}})")));

    EXPECT_THAT(statuses("none"), ElementsAre(Job::STATUS_QUEUED));
}

TEST_F(Enqueue, AdmitsAJobThatThenCannotBeLaunchedAndDropsIt) {
    writeLocalBackend("picky", "[backup]\nunique = {{name}}\ncommand_check = /bin/rm " +
                                   support::backendFile(support::LOCAL_BACKEND_FOLDER, "picky") + "\n");

    EXPECT_EQ(admission("picky", 1, "n", 1), ask(request(BACKUP)));

    EXPECT_THAT(ids("backup"), IsEmpty());
}

TEST_F(Enqueue, TakesNothingFromAClientThatIsTheDaemonsToSay) {
    ask(heldRequest(Job::ACTION_BACKUP, "first"));
    const std::string job = R"({"backend":"held","action":1,"status":3,"param":{"name":"n"},)"
                            R"("pid":1,"job_id":77,"unique":"mine"})";

    EXPECT_EQ(admission("held", Job::ACTION_BACKUP, "n", 2), ask(request(job)));

    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_RUNNING, Job::STATUS_QUEUED));
    EXPECT_EQ(-1, jobQueues["backup"].back().getPid());
}

TEST_F(Enqueue, NeverSignalsAProcessThatAClientNamed) {
    const pid_t witness = launched(addHeld(Job::ACTION_BACKUP)).getPid();
    ask(request(R"({"backend":"held","action":1,"status":0,"param":{"name":"n"},"pid":)" + std::to_string(witness) +
                "}"));
    diary.take();

    EXPECT_EQ(R"({"code":200})", ask(R"({"op":"job_remove","job_id":2})"));

    EXPECT_THAT(diary.take(), ElementsAre("remove job [2]"));
    EXPECT_THAT(ids("backup"), ElementsAre(1));
}

TEST_F(Enqueue, KeepsABranch) {
    ask(heldRequest(Job::ACTION_BACKUP, "first"));

    EXPECT_EQ(R"({"code":200,"job":{"action":1,"backend":"held","branch":"verify","job_id":2,)"
              R"("param":{"name":"n"},"status":1,"unique":"n"}})",
              ask(request(R"({"backend":"held","action":1,"status":0,"param":{"name":"n"},"branch":"verify"})")));
}

TEST_F(Enqueue, LeavesAGapInTheIdsForASecondJobOfTheSameWork) {
    EXPECT_EQ(admission("held", Job::ACTION_BACKUP, "a", 1), ask(heldRequest(Job::ACTION_BACKUP, "a")));
    diary.take();

    EXPECT_EQ(R"({"code":409})", ask(heldRequest(Job::ACTION_BACKUP, "a")));
    EXPECT_THAT(diary.take(), ElementsAre("job unique conflict [a]"));

    EXPECT_EQ(admission("held", Job::ACTION_BACKUP, "b", 3), ask(heldRequest(Job::ACTION_BACKUP, "b")));
}

TEST_F(Enqueue, FindsTheSameWorkAlsoInAnotherQueueAndWhileItStops) {
    addUnique(Job::ACTION_COPY_TO, "n", Job::STATUS_STOPPING);

    EXPECT_EQ(R"({"code":409})", ask(heldRequest(Job::ACTION_BACKUP, "n")));
}

TEST_F(Enqueue, IsClosedWhileARestoreIsThere) {
    for (const Job::Status status : {Job::STATUS_QUEUED, Job::STATUS_RUNNING, Job::STATUS_STOPPING}) {
        addHeld(Job::ACTION_RESTORE, status);

        for (const Job::Action action : RUNNABLE_ACTIONS) {
            EXPECT_EQ(R"({"code":406})", ask(heldRequest(action, "n"))) << action << " " << status;
            EXPECT_THAT(diary.take(), ElementsAre("restore queue is not empty"));
        }
        jobQueues["restore"].clear();
    }
    EXPECT_EQ(200, std::stoi(ask(heldRequest(Job::ACTION_BACKUP, "n")).substr(8)));
}

TEST_F(Enqueue, ExpandsTheUniqueStringWithTheJobsNewId) {
    writeLocalBackend("picky", "[backup]\nunique = {{BACKEND}}/{{JOB_ID}}\n");
    nextJobId = 65 + 256;

    EXPECT_EQ(R"({"code":200,"job":{"action":1,"backend":"picky","job_id":321,"param":{"name":"n"},"status":1,)"
              R"("unique":"picky/A"}})",
              ask(request(BACKUP)));
}

TEST_F(Enqueue, AnswersWithBytesThatAreNoText) {
    writeLocalBackend("picky", "[backup]\nunique = {{JOB_ID}}\n");
    nextJobId = 200;

    EXPECT_THAT(ask(request(BACKUP)), testing::EndsWith("\"unique\":\"\xC8\"}}"));
}

TEST_F(Enqueue, LeavesTheWordToTheBackendsCheck) {
    writeLocalBackend("picky", "[backup]\nunique = {{name}}\ncommand_check = /bin/sh -c 'test {{name}} = good'\n");

    EXPECT_EQ(R"({"code":400})", ask(request(BACKUP)));
    EXPECT_THAT(diary.take(), ElementsAre("invalid job"));

    EXPECT_EQ(admission("picky", 1, "good", 1),
              ask(request(R"({"backend":"picky","action":1,"status":0,"param":{"name":"good"}})")));
}

TEST_F(Enqueue, RunsNoCheckForAnActionThatTheBackendDoesNotHave) {
    writeLocalBackend("picky", "[relink]\ncommand_check = /bin/touch " + folder.path("checked") + "\n");

    EXPECT_EQ(R"({"code":505})", ask(request(BACKUP)));

    EXPECT_NE(0, access(folder.path("checked").c_str(), F_OK));
}
