#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <gmock/gmock.h>

#include "status_fixture.h"
#include "support/appliance.h"
#include "support/fake_daemon.h"
#include "support/named_rows.h"
#include "support/waiting.h"

// What runs, or is queued: the three rows of one procedure.

using namespace MARU::Backup;
using support::FakeDaemon;
using support::writeTaskFile;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

const std::string OWNER = "@administrators";
const std::string TASK = "confbkp_bkp_20240305";

struct Row {
    const char* name;
    bool (*isRunning)(const std::string& backend);
    Job::Action action;
};

class Running : public SystemStatus, public testing::WithParamInterface<Row> {};

INSTANTIATE_TEST_SUITE_P(Queued, Running,
                         testing::Values(Row{"Backup", System::isBackupRunning, Job::ACTION_BACKUP},
                                         Row{"Restore", System::isRestoreRunning, Job::ACTION_RESTORE},
                                         Row{"CopyTo", System::isCopyToRunning, Job::ACTION_COPY_TO}),
                         support::NameOfRow());

using ConfigurationTask = SystemStatus;
using OutsideOfTheQueue = SystemStatus;

} // namespace

TEST_P(Running, IsWhatTheDaemonLists) {
    FakeDaemon daemon({listing(GetParam().action), EMPTY_LISTING, listing(GetParam().action), EMPTY_LISTING});

    EXPECT_TRUE(GetParam().isRunning(""));
    EXPECT_FALSE(GetParam().isRunning(""));
    EXPECT_TRUE(GetParam().isRunning("tidebackup"));
    EXPECT_FALSE(GetParam().isRunning("configbackup"));

    const std::string action = "{\"action\":" + std::to_string(GetParam().action) + ",";
    EXPECT_THAT(daemon.requests(), ElementsAre(action + "\"op\":\"job_list\"}", action + "\"op\":\"job_list\"}",
                                               action + "\"backend\":\"tidebackup\",\"op\":\"job_list\"}",
                                               action + "\"backend\":\"configbackup\",\"op\":\"job_list\"}"));
}

TEST_P(Running, IsAskedOverAConnectionOfItsOwn) {
    FakeDaemon daemon({EMPTY_LISTING, EMPTY_LISTING});

    GetParam().isRunning("");
    GetParam().isRunning("");

    EXPECT_EQ(2, daemon.connections());
    EXPECT_TRUE(support::waitUntil([&daemon] { return daemon.openConnections() == 0; }));
}

TEST_P(Running, IsNotWithoutADaemon) {
    EXPECT_FALSE(GetParam().isRunning(""));
    EXPECT_FALSE(GetParam().isRunning("tidebackup"));
    EXPECT_EQ(0, log.count("system_status"));
}

TEST_P(Running, IsNotIfTheDaemonGivesNoList) {
    const std::string deep(100000, '[');
    const std::vector<support::CannedReply> replies = {"{\"code\":400,\"jobs\":[{}]}",
                                                       "{\"code\":500,\"jobs\":[{}]}",
                                                       "{\"code\":\"200\",\"jobs\":[{}]}",
                                                       "{\"code\":200.5,\"jobs\":[{}]}",
                                                       "{\"jobs\":[{}]}",
                                                       "{\"code\":200}",
                                                       "{\"code\":200,\"jobs\":{\"a\":1}}",
                                                       "{\"code\":200,\"jobs\":null}",
                                                       "[]",
                                                       "null",
                                                       "no JSON",
                                                       deep,
                                                       support::CannedReply("", support::CannedReply::HANG_UP),
                                                       support::CannedReply("", support::CannedReply::RESET)};
    FakeDaemon daemon(replies);

    for (std::size_t reply = 0; reply < replies.size(); ++reply) {
        EXPECT_FALSE(GetParam().isRunning("")) << reply;
    }
    EXPECT_EQ(static_cast<int>(replies.size()), daemon.connections());
}

// The daemon's filter decides, and its answer is counted and not looked into.
TEST_P(Running, IsWhateverStandsInTheList) {
    FakeDaemon daemon({"{\"code\":200,\"jobs\":[null]}", "{\"code\":200,\"jobs\":[{\"action\":64}]}"});

    EXPECT_TRUE(GetParam().isRunning(""));
    EXPECT_TRUE(GetParam().isRunning("tidebackup"));
}

TEST_P(Running, AsksTheDaemonUnlessATaskHasAnsweredAlready) {
    writeTaskFile(OWNER, TASK, runningTask(startProcess()));
    const bool isBackup = GetParam().action == Job::ACTION_BACKUP;
    FakeDaemon daemon;
    if (!isBackup) {
        daemon.addReply(EMPTY_LISTING);
    }

    EXPECT_EQ(isBackup, GetParam().isRunning(""));

    EXPECT_EQ(isBackup ? 0U : 1U, daemon.requests().size());
}

TEST_F(ConfigurationTask, IsABackupOfAllBackendsAndOfItsOwn) {
    writeTaskFile(OWNER, TASK, runningTask(startProcess()));

    EXPECT_TRUE(System::isBackupRunning(""));
    EXPECT_TRUE(System::isBackupRunning("configbackup"));
    EXPECT_FALSE(System::isBackupRunning("tidebackup"));
    EXPECT_TRUE(System::isBackupRunningNotQueued(""));
    EXPECT_TRUE(System::isBackupRunningNotQueued("configbackup"));
    for (const std::string backend : {"tidebackup", "configbackup ", "Configbackup", "config"}) {
        EXPECT_FALSE(System::isBackupRunningNotQueued(backend)) << backend;
    }
    EXPECT_FALSE(System::isBackupRunningNotQueued(std::string("configbackup\0", 13)));
}

TEST_F(ConfigurationTask, DoesNotKeepTheDaemonFromListingAnotherBackend) {
    writeTaskFile(OWNER, TASK, runningTask(startProcess()));
    FakeDaemon daemon({listing(Job::ACTION_BACKUP)});

    EXPECT_TRUE(System::isBackupRunning("tidebackup"));
}

TEST_F(ConfigurationTask, IsNeitherARestoreNorACopy) {
    writeTaskFile(OWNER, TASK, runningTask(startProcess()));

    for (const char* backend : {"", "configbackup", "tidebackup"}) {
        EXPECT_FALSE(System::isRestoreRunning(backend)) << backend;
        EXPECT_FALSE(System::isCopyToRunning(backend)) << backend;
    }
}

TEST_F(ConfigurationTask, CountsWhileItsProcessIsThere) {
    const pid_t process = startProcess();
    writeTaskFile(OWNER, TASK, runningTask(process));
    EXPECT_TRUE(System::isBackupRunning(""));

    leaveAsZombie(process); // which is there as long as nobody has waited for it
    EXPECT_TRUE(System::isBackupRunning(""));

    endProcess(process);
    EXPECT_FALSE(System::isBackupRunning(""));
}

TEST_F(ConfigurationTask, DoesNotCountOnceItIsFinishedOrRemoved) {
    const pid_t process = startProcess();
    writeTaskFile(OWNER, TASK, "{\"pid\": " + std::to_string(process) + ", \"finished\": true}");
    EXPECT_FALSE(System::isBackupRunning(""));

    writeTaskFile(OWNER, TASK, runningTask(process));
    EXPECT_TRUE(System::isBackupRunning(""));

    unlink(support::taskFile(OWNER, TASK).c_str());
    EXPECT_FALSE(System::isBackupRunning(""));
}

TEST_F(ConfigurationTask, DoesNotCountIfNobodyKnowsItsProcess) {
    writeTaskFile(OWNER, TASK, "{\"pid\": -1, \"finished\": false}");
    EXPECT_FALSE(System::isBackupRunning(""));
}

TEST_F(ConfigurationTask, IsOneOfTheAdministratorsWithTheRightId) {
    const std::string running = runningTask(startProcess());
    writeTaskFile("administrators", TASK, running);
    writeTaskFile("admin", TASK, running);
    for (const char* id : {"confbkp_bkp", "confbkp_rst_1", "Confbkp_bkp_1", "a_confbkp_bkp_1", "1"}) {
        writeTaskFile(OWNER, id, running);
    }
    EXPECT_FALSE(System::isBackupRunning(""));

    writeTaskFile(OWNER, "confbkp_bkp_", running);
    EXPECT_TRUE(System::isBackupRunning(""));
}

TEST_F(ConfigurationTask, IsNotHiddenByOthersThatDoNotRun) {
    writeTaskFile(OWNER, "confbkp_bkp_1", "{\"pid\": -1}");
    writeTaskFile(OWNER, "confbkp_bkp_2", "{\"pid\": 4");
    writeTaskFile(OWNER, "confbkp_bkp_3", "{\"pid\": 2147483647}");
    ASSERT_EQ(0, symlink("/nowhere", support::taskFile(OWNER, "confbkp_bkp_4").c_str()));
    EXPECT_FALSE(System::isBackupRunning(""));

    writeTaskFile(OWNER, "confbkp_bkp_5", runningTask(startProcess()));
    EXPECT_TRUE(System::isBackupRunning(""));
}

TEST_F(ConfigurationTask, CannotBeToldFromAFileThatIsNoTask) {
    const std::string pid = std::to_string(startProcess());
    for (const std::string& text :
         {std::string(), "{\"pid\": " + pid, "{\"pid\": \"" + pid + "\"}", pid, "[" + pid + "]",
          "{\"pid\": [" + pid + "]}", "{\"pid\": " + pid + ", \"finished\": \"no\"}", std::string(100000, '['),
          std::string(10, '\0')}) {
        writeTaskFile(OWNER, TASK, text);
        EXPECT_FALSE(System::isBackupRunning("")) << text.substr(0, 80);
    }
    unlink(support::taskFile(OWNER, TASK).c_str());
    ASSERT_EQ(0, mkfifo(support::taskFile(OWNER, TASK).c_str(), 0644));
    EXPECT_FALSE(System::isBackupRunning("")); // and nobody waits for a writer
}

TEST_F(OutsideOfTheQueue, NothingIsRestoredOrCopied) {
    writeTaskFile(OWNER, TASK, runningTask(startProcess()));
    FakeDaemon daemon; // which must not be asked

    for (const char* backend : {"", "tidebackup", "configbackup", "anything"}) {
        EXPECT_FALSE(System::isRestoreRunningNotQueued(backend)) << backend;
        EXPECT_FALSE(System::isCopyToRunningNotQueued(backend)) << backend;
    }
    EXPECT_THAT(daemon.requests(), IsEmpty());
}

TEST_F(OutsideOfTheQueue, ABackupIsToldWithoutTheDaemon) {
    FakeDaemon daemon;

    EXPECT_FALSE(System::isBackupRunningNotQueued(""));

    EXPECT_THAT(daemon.requests(), IsEmpty());
}
