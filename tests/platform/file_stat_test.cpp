#include <marucore/file_stat.h>

#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <memory>
#include <string>

#include <gtest/gtest.h>

#include <marucore/error.h>

#include "support/attributes.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/nobody.h"

namespace {

const std::uint32_t UNTOUCHED = 0xA5A5A5A5;

/** A record none of whose words is what a file would have. */
MLIBCFileStat dirtyRecord() {
    MLIBCFileStat record;
    std::memset(&record, 0xA5, sizeof record);
    return record;
}

class FileStat : public testing::Test {
protected:
    FileStat() {
        support::writeFile(file, "data");
        MLIBCErrSetEx(MLIBC_ERR_NONE, nullptr, 0);
    }

    void setVersion(const std::string& text) {
        support::setArchiveVersion(file, text);
    }

    void expectVersion(std::uint32_t version, const std::string& path) {
        MLIBCFileStat record = dirtyRecord();
        EXPECT_EQ(0, MLIBCFileLStat(path.c_str(), MLIBC_FILE_STAT_ALL, &record));
        EXPECT_EQ(version, record.archiveVersion);
    }

    void expectFailure(int code, const std::string& path) {
        MLIBCFileStat record = dirtyRecord();
        EXPECT_LT(MLIBCFileLStat(path.c_str(), MLIBC_FILE_STAT_ALL, &record), 0);
        EXPECT_EQ(UNTOUCHED, record.archiveVersion);
        EXPECT_EQ(code, MLIBCErrGet());
        EXPECT_STREQ("file_stat.cpp", MLIBCErrorGetFile());
        EXPECT_GT(MLIBCErrorGetLine(), 0);
    }

    const std::unique_ptr<support::TempDir> dir = support::makeFolderForAttributes();
    const std::string file = dir->path("file");
};

} // namespace

TEST_F(FileStat, KnowsAFilesArchiveVersion) {
    for (const auto& [text, version] : {std::pair("1", 1U), std::pair("0", 0U), std::pair("42", 42U),
                                        std::pair("007", 7U), std::pair("4294967295", 4294967295U)}) {
        setVersion(text);
        expectVersion(version, file);
    }
    EXPECT_EQ(MLIBC_ERR_NONE, MLIBCErrGet());
}

TEST_F(FileStat, PutsTheVersionAtByte112Of120AndNothingElsewhere) {
    setVersion("258");
    unsigned char bytes[120 + 8];
    std::memset(bytes, 0xA5, sizeof bytes);

    ASSERT_EQ(0, MLIBCFileLStat(file.c_str(), 15, reinterpret_cast<MLIBCFileStat*>(bytes)));

    std::uint32_t word = 0;
    std::memcpy(&word, bytes + 112, sizeof word);
    EXPECT_EQ(258U, word);
    for (std::size_t at = 0; at < sizeof bytes; ++at) {
        if (at < 112 || at >= 116) {
            EXPECT_EQ(0xA5, bytes[at]) << at;
        }
    }
}

TEST_F(FileStat, GivesTheVersionWhateverTheFlags) {
    setVersion("9");
    for (const int flags : {0, 1, 8, 15, -1}) {
        MLIBCFileStat record = dirtyRecord();
        EXPECT_EQ(0, MLIBCFileLStat(file.c_str(), flags, &record)) << flags;
        EXPECT_EQ(9U, record.archiveVersion) << flags;
    }
}

TEST_F(FileStat, TakesAFileWithoutVersionForOneAtZero) {
    expectVersion(0, file);
    expectVersion(0, dir->path());
    expectVersion(0, "/proc/version"); // whose file system has no attributes
}

TEST_F(FileStat, LooksAtALinkItself) {
    setVersion("5");
    ASSERT_EQ(0, symlink(file.c_str(), dir->path("link").c_str()));
    ASSERT_EQ(0, symlink("/nowhere", dir->path("dangling").c_str()));

    expectVersion(0, dir->path("link"));
    expectVersion(0, dir->path("dangling"));
}

TEST_F(FileStat, DoesNotWaitAtAFifo) {
    ASSERT_EQ(0, mkfifo(dir->path("fifo").c_str(), 0600));
    expectVersion(0, dir->path("fifo"));
}

TEST_F(FileStat, RefusesAVersionOfAnotherForm) {
    for (const std::string text : {"", " 1", "1 ", "1\n", "-1", "+1", "0x10", "1.0", "one", "4294967296", "99999999999",
                                   "0000000000000000000000001"}) {
        SCOPED_TRACE("[" + text + "]");
        setVersion(text);
        expectFailure(MLIBC_ERR_BAD_FORM, file);
    }
    setVersion(std::string("1\0", 2));
    expectFailure(MLIBC_ERR_BAD_FORM, file);
}

TEST_F(FileStat, RefusesAFileThatCannotBeLookedAt) {
    expectFailure(MLIBC_ERR_OPEN, dir->path("missing"));
    expectFailure(MLIBC_ERR_OPEN, file + "/below");
    expectFailure(MLIBC_ERR_OPEN, "");
    expectFailure(MLIBC_ERR_OPEN, std::string(5000, 'x'));
}

TEST_F(FileStat, RefusesAFileInAFolderThatIsNotOurs) {
    setVersion("5");
    const int status = support::runInChild([this] {
        support::becomeNobody();
        MLIBCFileStat record = dirtyRecord();
        const bool refused = MLIBCFileLStat(file.c_str(), MLIBC_FILE_STAT_ALL, &record) < 0;
        return refused && MLIBCErrGet() == MLIBC_ERR_OPEN && record.archiveVersion == UNTOUCHED ? 0 : 1;
    });
    EXPECT_EQ("exit 0", support::describeStatus(status));
}

TEST_F(FileStat, NeedsAPathAndARecord) {
    MLIBCFileStat record = dirtyRecord();
    EXPECT_LT(MLIBCFileLStat(nullptr, MLIBC_FILE_STAT_ALL, &record), 0);
    EXPECT_EQ(MLIBC_ERR_BAD_PARAMETER, MLIBCErrGet());

    MLIBCErrSetEx(MLIBC_ERR_NONE, nullptr, 0);
    EXPECT_LT(MLIBCFileLStat(file.c_str(), MLIBC_FILE_STAT_ALL, nullptr), 0);
    EXPECT_EQ(MLIBC_ERR_BAD_PARAMETER, MLIBCErrGet());
}
