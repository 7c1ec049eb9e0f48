#include <filesystem>
#include <string>

#include <gmock/gmock.h>

#include "status_fixture.h"
#include "support/appliance.h"
#include "support/fake_daemon.h"
#include "support/named_rows.h"

// What may start, and why not: in which order the sources are asked, and up to which one.

using namespace MARU::Backup;
using support::FakeDaemon;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

const std::string LIST_BACKUPS = "{\"action\":1,\"op\":\"job_list\"}";
const std::string LIST_RESTORES = "{\"action\":2,\"op\":\"job_list\"}";
const std::string LIST_COPIES = "{\"action\":4,\"op\":\"job_list\"}";

struct Predicate {
    const char* name;
    bool (*withReason)(Job::Action&);
    bool (*withoutReason)();
};

const Predicate BACKUP = {"Backup", System::canBackup, System::canBackup};
const Predicate RESTORE = {"Restore", System::canRestore, System::canRestore};
const Predicate COPY_TO = {"CopyTo", System::canCopyTo, System::canCopyTo};

/** Holds for a backup, a restore and a copy-to alike. */
class Any : public SystemStatus, public testing::WithParamInterface<Predicate> {};
INSTANTIATE_TEST_SUITE_P(Start, Any, testing::Values(BACKUP, RESTORE, COPY_TO), support::NameOfRow());

/** Holds for a restore and a copy-to, as long as they are asked for their reasons. */
class Alone : public SystemStatus, public testing::WithParamInterface<Predicate> {};
INSTANTIATE_TEST_SUITE_P(Start, Alone, testing::Values(RESTORE, COPY_TO), support::NameOfRow());

using ABackup = SystemStatus;
using ARestore = SystemStatus;
using ACopyTo = SystemStatus;

void writeRunningTask(pid_t process) {
    support::writeTaskFile("@administrators", "confbkp_bkp_1", runningTask(process));
}

} // namespace

TEST_P(Any, MayStartWhereNothingGoesOnAndNoDaemonAnswers) {
    EXPECT_EQ(ALLOWED, ask(GetParam().withReason));
    EXPECT_TRUE(GetParam().withoutReason());

    EXPECT_EQ(2, snapshotQuestions());
    EXPECT_THAT(log.lines(), testing::Each(testing::Field(&support::SyslogLine::priority, LOG_DEBUG)));
}

TEST_P(Any, WaitsForASpaceBuildBeforeAllElse) {
    support::writeFile(support::SPACE_BUILD_FILE, "");
    setSnapshotTool(1);
    writeRunningTask(startProcess());
    FakeDaemon daemon; // which must not be asked

    EXPECT_EQ(refusedFor(Job::ACTION_SPACE_BUILD), ask(GetParam().withReason));
    EXPECT_FALSE(GetParam().withoutReason());

    EXPECT_THAT(daemon.requests(), IsEmpty());
    EXPECT_EQ(0, snapshotQuestions());
}

TEST_P(Any, DoesNotWaitForASpaceBuildThatCannotBeTold) {
    std::filesystem::create_directory(support::SPACE_BUILD_FILE);

    EXPECT_EQ(ALLOWED, ask(GetParam().withReason));
    EXPECT_TRUE(GetParam().withoutReason());
}

TEST_P(Any, WaitsForARestoreBeforeTheSnapshotToolIsRun) {
    setSnapshotTool(1);
    writeRunningTask(startProcess());
    FakeDaemon daemon({listing(Job::ACTION_RESTORE), listing(Job::ACTION_RESTORE)});

    EXPECT_EQ(refusedFor(Job::ACTION_RESTORE), ask(GetParam().withReason));
    EXPECT_FALSE(GetParam().withoutReason());

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES, LIST_RESTORES));
    EXPECT_EQ(0, snapshotQuestions());
}

TEST_P(Any, WaitsForASnapshotThatIsBeingRestored) {
    setSnapshotTool(1);
    writeRunningTask(startProcess());
    FakeDaemon daemon({EMPTY_LISTING, EMPTY_LISTING});

    EXPECT_EQ(refusedFor(Job::ACTION_SHARE_SNAPSHOT_RESTORE), ask(GetParam().withReason));
    EXPECT_FALSE(GetParam().withoutReason());

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES, LIST_RESTORES));
    EXPECT_EQ(2, snapshotQuestions());
}

TEST_F(ABackup, MayStartBesideOtherBackupsAndCopies) {
    writeRunningTask(startProcess());
    FakeDaemon daemon({EMPTY_LISTING, EMPTY_LISTING}); // for its only question

    EXPECT_EQ(ALLOWED, ask(System::canBackup));
    EXPECT_TRUE(System::canBackup());

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES, LIST_RESTORES));
}

TEST_P(Alone, MayStartWhereTheDaemonHasNothing) {
    FakeDaemon daemon({EMPTY_LISTING, EMPTY_LISTING, EMPTY_LISTING});

    EXPECT_EQ(ALLOWED, ask(GetParam().withReason));

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES, LIST_BACKUPS, LIST_COPIES));
    EXPECT_EQ(1, snapshotQuestions());
}

TEST_P(Alone, WaitsForABackupBeforeCopiesAreLookedAt) {
    FakeDaemon daemon({EMPTY_LISTING, listing(Job::ACTION_BACKUP)});

    EXPECT_EQ(refusedFor(Job::ACTION_BACKUP), ask(GetParam().withReason));

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES, LIST_BACKUPS));
}

TEST_P(Alone, WaitsForACopy) {
    FakeDaemon daemon({EMPTY_LISTING, EMPTY_LISTING, listing(Job::ACTION_COPY_TO)});

    EXPECT_EQ(refusedFor(Job::ACTION_COPY_TO), ask(GetParam().withReason));

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES, LIST_BACKUPS, LIST_COPIES));
}

TEST_P(Alone, WaitsForAConfigurationTaskAlsoWithoutADaemon) {
    writeRunningTask(startProcess());
    EXPECT_EQ(refusedFor(Job::ACTION_BACKUP), ask(GetParam().withReason));
}

TEST_P(Alone, DoesNotAskTheDaemonForBackupsWhereATaskHasAnswered) {
    writeRunningTask(startProcess());
    FakeDaemon daemon({EMPTY_LISTING});

    EXPECT_EQ(refusedFor(Job::ACTION_BACKUP), ask(GetParam().withReason));

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES));
}

TEST_F(ARestore, WithoutAReasonIsHeldBackTheSame) {
    writeRunningTask(startProcess());
    EXPECT_FALSE(System::canRestore());

    support::emptyAppliance();
    FakeDaemon daemon({EMPTY_LISTING, EMPTY_LISTING, listing(Job::ACTION_COPY_TO)});
    EXPECT_FALSE(System::canRestore());
}

// Applications offer a copy-to that will have to wait for others.
TEST_F(ACopyTo, WithoutAReasonIsHeldBackOnlyByWhatHoldsABackupBack) {
    writeRunningTask(startProcess());
    FakeDaemon daemon({EMPTY_LISTING});

    EXPECT_TRUE(System::canCopyTo());

    EXPECT_THAT(daemon.requests(), ElementsAre(LIST_RESTORES));
    EXPECT_EQ(refusedFor(Job::ACTION_BACKUP), (daemon.addReply(EMPTY_LISTING), ask(System::canCopyTo)));
}
