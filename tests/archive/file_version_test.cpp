// The archive version of a file.

#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <string>

#include <marubackup/maru_archive_version.h>
#include <marucore/error.h>

#include "archive_test.h"
#include "support/attributes.h"
#include "support/files.h"

namespace {

class FileVersion : public ArchiveTest {
protected:
    FileVersion() {
        support::writeFile(file, "data");
    }

    static void expectVersion(unsigned version, const std::string& path) {
        const Answer answer = ask(MARUBackupArchVerGet, path);
        EXPECT_EQ(0, answer.result);
        EXPECT_EQ(version, answer.version);
        expectNoError();
    }

    /** The platform's library says what is wrong, and the function is silent. */
    static void expectFailure(int code, const std::string& path) {
        const Answer answer = ask(MARUBackupArchVerGet, path);
        EXPECT_EQ(-1, answer.result);
        EXPECT_EQ(UNTOUCHED, answer.version);
        EXPECT_EQ(code, MLIBCErrGet());
        EXPECT_STREQ("file_stat.cpp", MLIBCErrorGetFile());
    }

    const std::unique_ptr<support::TempDir> dir = support::makeFolderForAttributes();
    const std::string file = dir->path("file");
};

} // namespace

TEST_F(FileVersion, IsReadFromTheFile) {
    for (const unsigned version : {1U, 0U, 42U, 0x80000000U, 0xFFFFFFFFU}) {
        support::setArchiveVersion(file, std::to_string(version));
        expectVersion(version, file);
    }
}

TEST_F(FileVersion, IsReadFromAFolder) {
    support::setArchiveVersion(dir->path(), "43");
    expectVersion(43, dir->path());
}

TEST_F(FileVersion, IsZeroWhereThereIsNone) {
    expectVersion(0, file);
    expectVersion(0, "/proc/version");
}

TEST_F(FileVersion, OfALinkIsNotTheVersionOfWhatItLeadsTo) {
    support::setArchiveVersion(file, "5");
    ASSERT_EQ(0, symlink("file", dir->path("link").c_str()));
    ASSERT_EQ(0, symlink("nowhere", dir->path("dangling").c_str()));
    expectVersion(0, dir->path("link"));
    expectVersion(0, dir->path("dangling"));
}

TEST_F(FileVersion, OfAFifoIsToldAtOnce) {
    ASSERT_EQ(0, mkfifo(dir->path("fifo").c_str(), 0600));
    expectVersion(0, dir->path("fifo"));
}

TEST_F(FileVersion, ThatThePlatformCannotTellIsReportedByThePlatformAlone) {
    expectFailure(MLIBC_ERR_OPEN, dir->path("missing"));
    expectFailure(MLIBC_ERR_OPEN, file + "/below");
    support::setArchiveVersion(file, "many");
    expectFailure(MLIBC_ERR_BAD_FORM, file);
    support::setArchiveVersion(file, "4294967296");
    expectFailure(MLIBC_ERR_BAD_FORM, file);
}
