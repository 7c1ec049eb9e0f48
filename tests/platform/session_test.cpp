// How a session is made and found.

#include <marubackup-util/session.h>

#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include <gmock/gmock.h>

#include "session_fixture.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/nobody.h"
#include "support/session_areas.h"

namespace fs = std::filesystem;

using MARU::Backup::Session;
using support::describeStatus;
using support::inNewRoot;
using support::isThere;
using support::namesIn;
using support::OUTSIDE;
using support::permissionsOf;
using support::readFile;
using support::runInChild;
using support::sessionRecord;
using support::writeFile;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

TEST_F(ASession, IsAnEmptyDirectoryOfItsOwnersAloneWhateverTheUmask) {
    for (const mode_t mask : {mode_t(0), mode_t(022), mode_t(0777)}) {
        Session session;
        const mode_t before = umask(mask);
        EXPECT_TRUE(session.create());
        umask(before);

        EXPECT_EQ("/tmp/marusession-" + session.getId(), session.getPath());
        EXPECT_EQ(0700U, permissionsOf(session.getPath()));
        EXPECT_THAT(namesIn(session.getPath()), IsEmpty());
    }
}

TEST_F(ASession, HasAnIdThatNoOtherHas) {
    std::set<std::string> ids;
    for (int count = 0; count < 200; ++count) {
        Session session;
        ASSERT_TRUE(session.create());
        EXPECT_THAT(session.getId(), MatchesRegex("[A-Za-z0-9-]+"));
        EXPECT_GE(session.getId().size(), 32U) << "it could be guessed";
        EXPECT_TRUE(ids.insert(session.getId()).second) << session.getId();
    }
}

TEST_F(ASession, HasARecordThatHoldsItsPath) {
    Session session;
    session.create();

    EXPECT_EQ(session.getPath() + "\n", readFile(sessionRecord(session.getId())));
    EXPECT_EQ(0600U, permissionsOf(sessionRecord(session.getId())));
    EXPECT_EQ(0700U, permissionsOf(support::SESSION_RECORDS));
    EXPECT_THAT(namesIn(support::SESSION_RECORDS), ElementsAre(session.getId()));
}

TEST_F(ASession, IsFoundByAnotherProcess) {
    Session session;
    session.create();

    const int status = runInChild([&]() {
        Session found;
        return found.load(session.getId()) && found.getId() == session.getId() &&
                       found.getPath() == session.getPath() && found.destroy()
                   ? 0
                   : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    expectGone(session.getId(), session.getPath());
}

TEST_F(ASession, StaysWhenItsObjectEnds) {
    std::string id;
    {
        Session session;
        session.create();
        id = session.getId();
    }
    EXPECT_TRUE(isThere(Session::getPathById(id)));
}

TEST_F(ASession, IsNoneBeforeItIsMadeOrFound) {
    Session session;

    EXPECT_EQ("", session.getId());
    EXPECT_EQ("", session.getPath());
    EXPECT_FALSE(session.destroy());
}

TEST_F(ASession, GivesWayToAnotherAndStays) {
    Session session;
    session.create();
    const std::string first = session.getId();

    EXPECT_TRUE(session.create());

    EXPECT_NE(first, session.getId());
    expectKept(session);
    EXPECT_TRUE(isThere(Session::getPathById(first)));
    EXPECT_TRUE(session.load(first));
    EXPECT_EQ(first, session.getId());
}

TEST_F(ASession, MayBeMadeByHand) {
    const char* const commands = "set -e\n"
                                 "id=$(cat /proc/sys/kernel/random/uuid)\n"
                                 "mkdir -p -m 700 /var/run/marusession\n"
                                 "echo \"/tmp/marusession-$id\" > \"/var/run/marusession/$id\"\n"
                                 "mkdir -m 700 \"/tmp/marusession-$id\"\n";
    ASSERT_EQ(0, std::system(commands));
    const std::vector<std::string> ids = namesIn(support::SESSION_RECORDS);
    ASSERT_EQ(1U, ids.size());
    Session session;

    EXPECT_TRUE(session.load(ids.front()));

    EXPECT_EQ("/tmp/marusession-" + ids.front(), session.getPath());
    EXPECT_TRUE(session.destroy());
}

TEST_F(ASession, IsNotFoundWithoutADirectory) {
    Session vanished;
    vanished.create();
    fs::remove(vanished.getPath());
    Session replaced;
    replaced.create();
    fs::remove(replaced.getPath());
    fs::create_directory_symlink(OUTSIDE, replaced.getPath());
    Session session;
    session.create();
    const std::string id = session.getId();

    for (const std::string& other : {vanished.getId(), replaced.getId(), std::string("unknown"), std::string()}) {
        EXPECT_FALSE(session.load(other));
        EXPECT_EQ(id, session.getId()) << "the object is as it was";
        expectKept(session);
    }
    EXPECT_EQ(vanished.getPath(), Session::getPathById(vanished.getId())) << "its record is still there";
}

TEST_F(ASession, IsNotMadeWhereThereIsNoPlaceForItOrItsRecord) {
    inNewRoot([]() {
        fs::remove("/tmp");
        EXPECT_FALSE(Session().create());
        writeFile("/tmp", "a file");
        EXPECT_FALSE(Session().create());
        EXPECT_THAT(namesIn(support::SESSION_RECORDS), IsEmpty());
    });
    inNewRoot([]() {
        fs::remove_all(support::SESSION_RECORDS);
        writeFile(support::SESSION_RECORDS, "a file");
        EXPECT_FALSE(Session().create());
        EXPECT_THAT(namesIn("/tmp"), IsEmpty());
        fs::remove(support::SESSION_RECORDS);
    });
}

TEST_F(ASession, LeavesTheObjectAsItWasWhenItCannotBeMade) {
    Session session;
    session.create();
    const std::string id = session.getId();
    fs::rename(support::SESSION_RECORDS, ASIDE);
    writeFile(support::SESSION_RECORDS, "a file");

    EXPECT_FALSE(session.create());

    EXPECT_EQ(id, session.getId());
    EXPECT_TRUE(isThere(session.getPath()));
    fs::remove_all(ASIDE);
}

TEST_F(ASession, IsNotAnOrdinaryUsersToKnowMakeOrDestroy) {
    Session session;
    session.create();

    const int status = runInChild([&]() {
        support::becomeNobody();
        const bool knows = !Session::getPathById(session.getId()).empty() || Session().load(session.getId());
        const bool makes = Session().create();
        const bool destroys = Session::destroyById(session.getId()) || Session::destroyById("unknown");
        return (knows ? 1 : 0) + (makes ? 2 : 0) + (destroys ? 4 : 0);
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    expectKept(session);
}
