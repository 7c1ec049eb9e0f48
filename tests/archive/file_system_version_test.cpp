// The archive version of a file system, asked of one that has one.

#include <unistd.h>

#include <cerrno>
#include <future>
#include <memory>
#include <string>
#include <system_error>
#include <vector>

#include <marubackup/maru_archive_version.h>

#include "archive_mount.h"
#include "archive_test.h"

namespace {

const unsigned LARGEST = 0xFFFFFFFF;

class FileSystemVersion : public ArchiveTest {
protected:
    void SetUp() override {
        std::string reason;
        mount = ArchiveMount::make(reason);
        ArchiveTest::SetUp();
        if (!mount) {
            GTEST_SKIP() << reason;
        }
    }

    /** A file, a folder, the root, and a link from elsewhere. */
    std::vector<std::string> placesInIt() {
        const std::string link = folder.path("link");
        if (symlink(mount->path("file").c_str(), link.c_str()) != 0) {
            throw std::system_error(errno, std::generic_category(), "symlink");
        }
        return {mount->path("file"), mount->path("folder"), mount->path(), link};
    }

    static void expectAnswer(int result, unsigned version, const Answer& answer) {
        EXPECT_EQ(result, answer.result);
        EXPECT_EQ(version, answer.version);
        expectNoError();
    }
    static void expectRefused(int error, const Answer& answer) {
        expectAnswer(-1, 0, answer);
        EXPECT_EQ(error, answer.error);
    }

    Answer get() {
        return ask(MARUBackupFSArchVerGet, mount->path());
    }
    Answer increase() {
        return ask(MARUBackupFSArchVerIncrease, mount->path());
    }

    std::unique_ptr<ArchiveMount> mount;
};

} // namespace

TEST_F(FileSystemVersion, IsReadAtAnyPlaceInIt) {
    for (const unsigned version : {0U, 258U, 0x80000000U, LARGEST}) {
        mount->set("version", version);
        expectAnswer(0, version, get());
    }
    for (const std::string& place : placesInIt()) {
        SCOPED_TRACE(place);
        expectAnswer(0, LARGEST, ask(MARUBackupFSArchVerGet, place));
    }
    EXPECT_EQ(LARGEST, mount->version());
}

TEST_F(FileSystemVersion, IsIncreasedAtAnyPlaceInIt) {
    mount->set("version", 41);
    unsigned version = 41;
    for (const std::string& place : placesInIt()) {
        SCOPED_TRACE(place);
        expectAnswer(0, ++version, ask(MARUBackupFSArchVerIncrease, place));
        EXPECT_EQ(version, mount->version());
    }
    expectAnswer(0, version, get());
}

TEST_F(FileSystemVersion, BeginsAnewBehindTheLargest) {
    mount->set("version", LARGEST - 1);
    expectAnswer(0, LARGEST, increase());
    expectAnswer(0, 0, increase());
    expectAnswer(0, 1, increase());
}

TEST_F(FileSystemVersion, BelongsToOneFileSystem) {
    std::string reason;
    const std::unique_ptr<ArchiveMount> other = ArchiveMount::make(reason);
    ASSERT_NE(nullptr, other) << reason;
    other->set("version", 100);
    expectAnswer(0, 1, increase());
    expectAnswer(0, 100, ask(MARUBackupFSArchVerGet, other->path()));
}

TEST_F(FileSystemVersion, ThatIsNotGivenIsZero) {
    mount->set("version", 7);
    for (const int error : {EIO, ENOTTY, EPERM}) {
        mount->set("get", -error);
        expectRefused(error, get());
    }
}

TEST_F(FileSystemVersion, ThatCannotBeIncreasedIsZeroAndStays) {
    mount->set("version", 7);
    for (const int error : {EROFS, ENOTTY, EPERM}) {
        mount->set("increase", -error);
        expectRefused(error, increase());
    }
    EXPECT_EQ(7U, mount->version());
}

TEST_F(FileSystemVersion, ThatIsNotGivenAfterItsIncreaseIsZeroAndIncreased) {
    mount->set("version", 7);
    mount->set("get_after_increase", -EIO);
    expectAnswer(0, 7, get());
    expectRefused(EIO, increase());
    EXPECT_EQ(8U, mount->version());
}

TEST_F(FileSystemVersion, WithAPositiveResultIsGoodEnoughAfterAnIncreaseOnly) {
    mount->set("version", 7);
    mount->set("get", 3);
    expectAnswer(3, 0, get());
    expectAnswer(3, 8, increase());
    mount->set("get", 0);
    mount->set("increase", 5);
    expectAnswer(0, 9, increase());
}

TEST_F(FileSystemVersion, IsNotLostWhenManyIncreaseItAtOnce) {
    const unsigned threads = 4;
    const unsigned times = 25;
    std::vector<std::future<void>> all;
    for (unsigned thread = 0; thread < threads; ++thread) {
        all.push_back(std::async(std::launch::async, [this]() {
            for (unsigned time = 0; time < times; ++time) {
                EXPECT_EQ(0, increase().result);
            }
        }));
    }
    for (std::future<void>& one : all) {
        one.get();
    }
    expectAnswer(0, threads * times, get());
}

TEST_F(FileSystemVersion, CannotBeSetThroughAFile) {
    mount->set("version", 7);
    EXPECT_EQ(-1, MARUBackupFileArchVerSet(mount->path("file").c_str(), 8));
    expectLogged("Not support the command in the platform\\.");
    EXPECT_EQ(7U, mount->version());
}
