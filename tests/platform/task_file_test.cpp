#include <taskmanager/task_file.h>

#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <climits>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include <taskmanager/task.h>
#include <taskmanager/task_mgr.h>

#include "support/appliance.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/nobody.h"

using HOS::Task;
using HOS::TaskFile;
using HOS::TaskMgr;
using HOS::TaskUtil;
using support::taskFile;

namespace {

const std::string OWNER = "@administrators";

class ATaskFile : public testing::Test {
protected:
    ATaskFile() {
        support::emptyAppliance();
    }

    static std::size_t filesOfOwner() {
        const std::filesystem::directory_iterator files(std::string(support::TASK_ROOT) + "/" + OWNER);
        return static_cast<std::size_t>(std::distance(begin(files), end(files)));
    }
};

} // namespace

TEST_F(ATaskFile, GoesThroughATasksLife) {
    EXPECT_FALSE(TaskUtil::checkTaskExists(OWNER, "task"));

    ASSERT_TRUE(TaskFile::create(OWNER, "task", getpid()));
    EXPECT_EQ(getpid(), Task(OWNER, "task").getCreatePid());
    EXPECT_FALSE(Task(OWNER, "task").isFinished());

    ASSERT_TRUE(TaskFile::finish(OWNER, "task"));
    EXPECT_EQ(getpid(), Task(OWNER, "task").getCreatePid());
    EXPECT_TRUE(Task(OWNER, "task").isFinished());

    ASSERT_TRUE(TaskFile::remove(OWNER, "task"));
    EXPECT_FALSE(TaskUtil::checkTaskExists(OWNER, "task"));
    EXPECT_EQ(0U, filesOfOwner());
}

TEST_F(ATaskFile, HasTheDocumentedForm) {
    TaskFile::create(OWNER, "confbkp_bkp_1", 4711);
    EXPECT_EQ("{\"pid\": 4711, \"finished\": false}\n",
              support::readFile("/var/run/marutask/@administrators/confbkp_bkp_1.json"));
}

TEST_F(ATaskFile, CanBeReadByAllAndWrittenByItsOwnerAlone) {
    const mode_t before = umask(0077);
    TaskFile::create(OWNER, "task", 1);
    umask(before);

    EXPECT_EQ(0644U, support::permissionsOf(taskFile(OWNER, "task")));
}

TEST_F(ATaskFile, IsReplacedByANewTaskOfThatId) {
    TaskFile::create(OWNER, "task", 1);
    TaskFile::finish(OWNER, "task");

    EXPECT_TRUE(TaskFile::create(OWNER, "task", -1));

    EXPECT_EQ(-1, Task(OWNER, "task").getCreatePid());
    EXPECT_FALSE(Task(OWNER, "task").isFinished());
    EXPECT_EQ(1U, filesOfOwner());
}

TEST_F(ATaskFile, IsNotThereToBeFinishedOrRemoved) {
    EXPECT_FALSE(TaskFile::finish(OWNER, "task"));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_FALSE(TaskFile::remove(OWNER, "task"));
    EXPECT_EQ(ENOENT, errno);
    EXPECT_FALSE(std::filesystem::exists(support::TASK_ROOT));
}

TEST_F(ATaskFile, ThatIsNoneCannotBeFinishedButRemoved) {
    support::writeTaskFile(OWNER, "torn", "{\"pid\": 4");

    EXPECT_FALSE(TaskFile::finish(OWNER, "torn"));
    EXPECT_EQ("{\"pid\": 4", support::readFile(taskFile(OWNER, "torn")));
    EXPECT_TRUE(TaskFile::remove(OWNER, "torn"));
}

TEST_F(ATaskFile, IsRefusedWithoutAProperNameOrPid) {
    const std::vector<std::string> names = {"", ".", "..", "a/b", "/", std::string("a\0b", 3)};
    for (const std::string& name : names) {
        for (const auto& [owner, id] : {std::pair(OWNER, name), std::pair(name, std::string("task"))}) {
            EXPECT_FALSE(TaskFile::create(owner, id, 1)) << name;
            EXPECT_EQ(EINVAL, errno);
            EXPECT_FALSE(TaskFile::finish(owner, id)) << name;
            EXPECT_EQ(EINVAL, errno);
            EXPECT_FALSE(TaskFile::remove(owner, id)) << name;
            EXPECT_EQ(EINVAL, errno);
        }
    }
    for (const int pid : {0, -2, INT_MIN}) {
        EXPECT_FALSE(TaskFile::create(OWNER, "task", pid)) << pid;
        EXPECT_EQ(EINVAL, errno);
    }
    EXPECT_FALSE(std::filesystem::exists(support::TASK_ROOT));
}

TEST_F(ATaskFile, ThatCannotBeWrittenLeavesNothingBehind) {
    EXPECT_FALSE(TaskFile::create(OWNER, std::string(300, 'x'), 1));
    EXPECT_EQ(ENAMETOOLONG, errno);
    EXPECT_EQ(0U, filesOfOwner());

    std::filesystem::create_directory(taskFile(OWNER, "folder"));
    EXPECT_FALSE(TaskFile::create(OWNER, "folder", 1));
    EXPECT_EQ(EISDIR, errno);
    EXPECT_EQ(1U, filesOfOwner());

    EXPECT_FALSE(TaskFile::create(std::string(300, 'x'), "task", 1));
    EXPECT_EQ(ENAMETOOLONG, errno);
}

TEST_F(ATaskFile, IsNotForEverybodyToWrite) {
    TaskFile::create(OWNER, "task", 1);

    const int status = support::runInChild([] {
        support::becomeNobody();
        const bool changed = TaskFile::create(OWNER, "task", 2) || TaskFile::create(OWNER, "more", 2) ||
                             TaskFile::create("nobody", "task", 2) || TaskFile::finish(OWNER, "task") ||
                             TaskFile::remove(OWNER, "task");
        return changed ? 1 : 0;
    });

    EXPECT_EQ("exit 0", support::describeStatus(status));
    EXPECT_EQ(1, Task(OWNER, "task").getCreatePid());
    EXPECT_EQ(1U, filesOfOwner());
}

TEST_F(ATaskFile, IsSeenWholeWhileSeveralReplaceIt) {
    TaskFile::create(OWNER, "task", 1);
    std::atomic<bool> done(false);
    std::vector<std::thread> writers;
    for (int number = 1; number <= 2; ++number) {
        writers.emplace_back([&done, number] {
            while (!done) {
                EXPECT_TRUE(TaskFile::create(OWNER, "task", number));
                EXPECT_TRUE(TaskFile::finish(OWNER, "task"));
            }
        });
    }

    for (int look = 0; look < 1000; ++look) {
        Task task(OWNER, "task");
        EXPECT_TRUE(task.getCreatePid() == 1 || task.getCreatePid() == 2);
        EXPECT_EQ(1U, TaskMgr(OWNER).getAllTaskId("").size());
    }

    done = true;
    for (std::thread& writer : writers) {
        writer.join();
    }
    EXPECT_EQ(1U, filesOfOwner());
}
