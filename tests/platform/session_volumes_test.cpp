// The volumes that sessions are made on.

#include <marubackup-util/session.h>

#include <sys/mount.h>

#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <marubackup-util/temp_manager.h>

#include "session_fixture.h"
#include "support/files.h"
#include "support/mount.h"
#include "support/session_areas.h"

namespace fs = std::filesystem;

using MARU::Backup::FilterVolume;
using MARU::Backup::Session;
using MARU::Backup::TempManager;
using MARU::Backup::Volume;
using support::inNewRoot;
using support::isThere;
using support::Mount;
using support::namesIn;
using support::newVolume;
using support::permissionsOf;
using support::writeFile;
using testing::IsEmpty;
using testing::StartsWith;

using SessionVolumes = ASession;

namespace {

/** Chooses what the test says, and keeps what it was shown. */
class ChosenVolume : public FilterVolume {
public:
    explicit ChosenVolume(const std::string& answer) : chosen(answer) {
    }
    std::string choose(const std::vector<Volume>& volumes) const override {
        shown = volumes;
        return chosen;
    }

    const std::string chosen;
    mutable std::vector<Volume> shown;
};

} // namespace

TEST_F(SessionVolumes, AreWritableMountsNamedByANumber) {
    inNewRoot([]() {
        const Mount second = newVolume("/volume2", "size=2m");
        const Mount tenth = newVolume("/volume10", "size=1m");
        const Mount readOnly = newVolume("/volume3", "size=8m", MS_RDONLY);
        const Mount unnumbered = newVolume("/volume", "size=8m");
        const Mount otherName = newVolume("/volumes", "size=8m");
        const Mount usb = newVolume("/volume1-usb", "size=8m");
        fs::create_directory("/volume4"); // not mounted
        fs::create_directory_symlink("/volume2", "/volume5");
        writeFile("/volume6", "a file");
        const boost::shared_ptr<ChosenVolume> filter(new ChosenVolume("/volume10"));
        Session session;

        EXPECT_TRUE(session.create(filter));

        ASSERT_EQ(2U, filter->shown.size());
        EXPECT_EQ("/volume2", filter->shown[0].path);
        EXPECT_EQ("/volume10", filter->shown[1].path);
        EXPECT_EQ(1U << 20, filter->shown[1].freeBytes);
        EXPECT_EQ("/volume10/marusession-" + session.getId(), session.getPath());
        EXPECT_EQ(0700U, permissionsOf(session.getPath()));
        expectKept(session);
        EXPECT_TRUE(session.destroy());
    });
}

TEST_F(SessionVolumes, AreChosenByTheirFreeSpace) {
    inNewRoot([]() {
        const Mount first = newVolume("/volume1", "size=2m");
        const Mount second = newVolume("/volume2", "size=4m");
        const Mount third = newVolume("/volume3", "size=4m");
        Session session;

        EXPECT_TRUE(session.create(TempManager::maxVolume()));
        EXPECT_THAT(session.getPath(), StartsWith("/volume2/"));

        writeFile("/volume2/filling", std::string(1 << 20, 'x'));
        EXPECT_TRUE(session.create(TempManager::maxVolume()));
        EXPECT_THAT(session.getPath(), StartsWith("/volume3/"));
    });
}

TEST_F(SessionVolumes, GiveWayToTheDefaultAreaIfThereIsNone) {
    inNewRoot([]() {
        Session session;

        EXPECT_TRUE(session.create(TempManager::maxVolume()));

        EXPECT_THAT(session.getPath(), StartsWith("/tmp/"));
    });
}

TEST_F(SessionVolumes, AreTheOnlyAnswerOfAFilter) {
    inNewRoot([]() {
        const Mount volume = newVolume("/volume1", "size=2m");
        fs::create_directory("/volume2");
        Session session;

        EXPECT_FALSE(session.create(boost::shared_ptr<FilterVolume>()));
        for (const char* const answer : {"/volume2", "/volume3", "/tmp", "/", "/volume1/", "volume1"}) {
            EXPECT_FALSE(session.create(boost::shared_ptr<FilterVolume>(new ChosenVolume(answer)))) << answer;
        }

        EXPECT_EQ("", session.getId());
        EXPECT_THAT(namesIn("/tmp"), IsEmpty());
        EXPECT_THAT(namesIn("/volume1"), IsEmpty());
    });
}

TEST_F(SessionVolumes, MayBeFull) {
    inNewRoot([]() {
        fs::remove_all(support::SESSION_RECORDS);
        const Mount volume = newVolume("/volume1", "size=1m,nr_inodes=1");
        Session session;

        EXPECT_FALSE(session.create(TempManager::maxVolume()));

        EXPECT_EQ("", session.getId());
        EXPECT_THAT(namesIn(support::SESSION_RECORDS), IsEmpty());
    });
}

TEST_F(SessionVolumes, KeepTheirSessionsWhileTheyAreAway) {
    inNewRoot([]() {
        Mount volume = newVolume("/volume1", "size=1m");
        Session session;
        session.create(TempManager::maxVolume());
        const std::string id = session.getId();
        fs::create_directory("/tmp/away");
        const Mount kept = Mount::bind("/volume1", "/tmp/away");
        volume.unmount();

        EXPECT_FALSE(session.destroy());
        EXPECT_EQ(session.getPath(), Session::getPathById(id)) << "it can still be found";

        const Mount back = Mount::bind("/tmp/away", "/volume1");
        EXPECT_TRUE(isThere(session.getPath()));
        EXPECT_TRUE(session.destroy());
        EXPECT_THAT(namesIn("/volume1"), IsEmpty());
    });
}
