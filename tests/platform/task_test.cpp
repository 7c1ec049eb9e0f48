#include <taskmanager/task.h>

#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <taskmanager/task_mgr.h>

#include "support/appliance.h"
#include "support/in_child.h"
#include "support/nobody.h"

// Tasks as an operator writes them, and whatever else may stand in their place.

using HOS::Task;
using HOS::TaskMgr;
using HOS::TaskUtil;
using support::taskFile;
using support::writeTaskFile;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

const std::string OWNER = "@administrators";

std::vector<std::string> idsOf(const std::string& owner, const std::string& prefix) {
    std::vector<std::string> ids;
    const Json::Value found = TaskMgr(owner).getAllTaskId(prefix);
    EXPECT_TRUE(found.isArray());
    for (const Json::Value& id : found) {
        ids.push_back(id.asString());
    }
    return ids;
}

/** Whether a task is seen nowhere, and asking about it does no harm. */
void expectNoTask(const std::string& owner, const std::string& id) {
    EXPECT_FALSE(TaskUtil::checkTaskExists(owner, id)) << owner << "/" << id;
    EXPECT_EQ(-1, Task(owner, id).getCreatePid()) << owner << "/" << id;
    EXPECT_TRUE(Task(owner, id).isFinished()) << owner << "/" << id;
    EXPECT_THAT(idsOf(owner, ""), IsEmpty()) << owner << "/" << id;
}

class Tasks : public testing::Test {
protected:
    Tasks() {
        support::emptyAppliance();
        std::filesystem::create_directories(std::string(support::TASK_ROOT) + "/" + OWNER);
    }
};

} // namespace

TEST_F(Tasks, AreWhatTheirFilesSay) {
    struct {
        const char* text;
        int pid;
        bool finished;
    } const ROWS[] = {
        {"{\"pid\": 4711}", 4711, false},
        {"{\"pid\": 4711, \"finished\": false}\n", 4711, false},
        {"\n { \"finished\" : true, \"pid\" : 1 } \n", 1, true},
        {"{\"pid\": -1}", -1, false},
        {"{\"pid\": 2147483647}", INT_MAX, false},
        {"{\"pid\": 2, \"title\": [\"anything\", {}]}", 2, false},
    };
    for (const auto& row : ROWS) {
        writeTaskFile(OWNER, "task", row.text);

        EXPECT_TRUE(TaskUtil::checkTaskExists(OWNER, "task")) << row.text;
        EXPECT_EQ(row.pid, Task(OWNER, "task").getCreatePid()) << row.text;
        EXPECT_EQ(row.finished, Task(OWNER, "task").isFinished()) << row.text;
        EXPECT_THAT(idsOf(OWNER, ""), ElementsAre("task")) << row.text;
    }
}

TEST_F(Tasks, AreListedByTheStartOfTheirIdsInOrder) {
    for (const char* id : {"confbkp_bkp_2", "confbkp_bkp_10", "confbkp_bkp_", "confbkp_bkp", "confbkp_rst_1", "x"}) {
        writeTaskFile(OWNER, id, "{\"pid\": 1}");
    }
    writeTaskFile("admin", "confbkp_bkp_other", "{\"pid\": 1}");

    EXPECT_THAT(idsOf(OWNER, "confbkp_bkp_"), ElementsAre("confbkp_bkp_", "confbkp_bkp_10", "confbkp_bkp_2"));
    EXPECT_THAT(idsOf(OWNER, "x"), ElementsAre("x"));
    EXPECT_THAT(idsOf(OWNER, "bkp_"), IsEmpty());
    EXPECT_THAT(idsOf(OWNER, "x.json"), IsEmpty());
    EXPECT_THAT(idsOf(OWNER, std::string("x\0", 2)), IsEmpty());
    EXPECT_THAT(idsOf("admin", ""), ElementsAre("confbkp_bkp_other"));
    EXPECT_EQ(6U, idsOf(OWNER, "").size());
}

TEST_F(Tasks, MayHaveAnyOtherName) {
    for (const std::string id : {" ", "...", ".hidden", "-rf", "a.json", "\xff\n\"", "{{id}}"}) {
        writeTaskFile(OWNER, id, "{\"pid\": 7}");

        EXPECT_THAT(idsOf(OWNER, ""), ElementsAre(id));
        EXPECT_EQ(7, Task(OWNER, id).getCreatePid());

        unlink(taskFile(OWNER, id).c_str());
    }
}

TEST_F(Tasks, AreNotMadeByFilesOfAnotherForm) {
    const std::string deep = "{\"pid\": 1, \"a\": " + std::string(100000, '[');
    const std::string large = "{\"pid\": 1}" + std::string(100 * 1024, ' ');
    const std::vector<std::string> texts = {"",
                                            "\n",
                                            "{",
                                            "{\"pid\": 47",
                                            "{\"pid\": 4711",
                                            "{\"pid\": 4711}}",
                                            "{\"pid\": 1} {\"pid\": 1}",
                                            "4711",
                                            "null",
                                            "[]",
                                            "[{\"pid\": 1}]",
                                            "\"pid\"",
                                            "{}",
                                            "{\"finished\": false}",
                                            "{\"PID\": 1}",
                                            "{\"pid\": null}",
                                            "{\"pid\": \"1\"}",
                                            "{\"pid\": 1.0}",
                                            "{\"pid\": true}",
                                            "{\"pid\": [1]}",
                                            "{\"pid\": 0}",
                                            "{\"pid\": -2}",
                                            "{\"pid\": 2147483648}",
                                            "{\"pid\": 4294967295}",
                                            "{\"pid\": 99999999999999999999999}",
                                            "{\"pid\": 1e999}",
                                            "{\"pid\": 1, \"finished\": null}",
                                            "{\"pid\": 1, \"finished\": 0}",
                                            "{\"pid\": 1, \"finished\": \"false\"}",
                                            "{\"pid\": 1} // made by hand",
                                            "pid = 1\n",
                                            std::string("{\"pid\": 1}\0", 11),
                                            deep,
                                            large,
                                            std::string(4096, '\0'),
                                            "\xff\xfe{"};
    for (const std::string& text : texts) {
        SCOPED_TRACE(text.substr(0, 80));
        writeTaskFile(OWNER, "task", text);
        expectNoTask(OWNER, "task");
    }
}

TEST_F(Tasks, AreNotMadeByAnythingElseInTheFolder) {
    const std::string path = taskFile(OWNER, "task");

    ASSERT_EQ(0, mkfifo(path.c_str(), 0644));
    expectNoTask(OWNER, "task"); // and nobody waits for a writer
    ASSERT_EQ(0, unlink(path.c_str()));

    ASSERT_EQ(0, mkdir(path.c_str(), 0755));
    expectNoTask(OWNER, "task");
    ASSERT_EQ(0, rmdir(path.c_str()));

    ASSERT_EQ(0, symlink("/dev/zero", path.c_str()));
    expectNoTask(OWNER, "task");
    ASSERT_EQ(0, unlink(path.c_str()));

    support::writeFile(std::string(support::TASK_ROOT) + "/" + OWNER + "/task", "{\"pid\": 1}");
    support::writeFile(std::string(support::TASK_ROOT) + "/" + OWNER + "/.json", "{\"pid\": 1}");
    expectNoTask(OWNER, "task");
}

// As a link to nothing is: it is there when the folder is read, and not when the file is opened.
TEST_F(Tasks, MayDisappearWhileTheyAreListed) {
    writeTaskFile(OWNER, "here", "{\"pid\": 1}");
    ASSERT_EQ(0, symlink("/nowhere", taskFile(OWNER, "gone").c_str()));

    EXPECT_THAT(idsOf(OWNER, ""), ElementsAre("here"));
}

TEST_F(Tasks, AreNotNamedByPaths) {
    writeTaskFile(OWNER, "task", "{\"pid\": 1}");
    writeTaskFile("", "task", "{\"pid\": 1}");
    support::writeFile("/var/run/task.json", "{\"pid\": 1}");
    const std::string nul("task\0", 5);

    for (const std::string& id : {std::string(), std::string("."), std::string(".."), OWNER + "/task", nul,
                                  "../" + OWNER + "/task", std::string(300, 'x')}) {
        EXPECT_FALSE(TaskUtil::checkTaskExists(OWNER, id)) << id;
        EXPECT_EQ(-1, Task(OWNER, id).getCreatePid()) << id;
    }
    for (const std::string& owner : {std::string(), std::string("."), std::string(".."), OWNER + "/", "./" + OWNER,
                                     OWNER + std::string("\0", 1), std::string(300, 'x')}) {
        expectNoTask(owner, "task");
    }
    unlink("/var/run/task.json");
}

TEST_F(Tasks, AreNoneWithoutTheirFolder) {
    expectNoTask("nobody", "task");
    std::filesystem::remove_all(support::TASK_ROOT);
    expectNoTask(OWNER, "task");
    support::writeFile(support::TASK_ROOT, "no folder");
    expectNoTask(OWNER, "task");
}

TEST_F(Tasks, AreNoneWhereWeMayNotLook) {
    writeTaskFile(OWNER, "task", "{\"pid\": 1}");
    const auto looksAsNobody = [] {
        return support::runInChild([] {
            support::becomeNobody();
            const bool seen = TaskUtil::checkTaskExists(OWNER, "task") || !TaskMgr(OWNER).getAllTaskId("").empty();
            return seen ? 1 : 0;
        });
    };

    EXPECT_EQ("exit 1", support::describeStatus(looksAsNobody()));
    ASSERT_EQ(0, chmod(taskFile(OWNER, "task").c_str(), 0600));
    EXPECT_EQ("exit 0", support::describeStatus(looksAsNobody()));
}

TEST_F(Tasks, AreOpenedAsTheyAreThen) {
    writeTaskFile(OWNER, "task", "{\"pid\": 1}");
    Task opened(OWNER, "task");
    writeTaskFile(OWNER, "task", "{\"pid\": 2, \"finished\": true}");

    EXPECT_EQ(1, opened.getCreatePid());
    EXPECT_FALSE(opened.isFinished());
    EXPECT_EQ(2, Task(OWNER, "task").getCreatePid());
}
