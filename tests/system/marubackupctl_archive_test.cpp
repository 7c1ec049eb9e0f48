// What the operator's tool tells of archive versions.

#include <sys/stat.h>

#include <cerrno>
#include <memory>

#include "archive_mount.h"
#include "support/attributes.h"
#include "support/emulation.h"
#include "support/files.h"
#include "tool_test.h"

namespace {

const char* const REQUESTS = "nothing can answer for a file system within a static program";

class MarubackupctlArchiveVersion : public ToolTest {
protected:
    Outcome archiveVersion(const std::string& verb, const std::string& path, const Arguments& more = {}) {
        Arguments arguments = {"archive-version", verb, path};
        arguments.insert(arguments.end(), more.begin(), more.end());
        return run(arguments);
    }

    void expectPrinted(const std::string& line, const Outcome& outcome) {
        EXPECT_EQ("exit 0", outcome.ended);
        EXPECT_EQ(line + "\n", outcome.out);
        EXPECT_EQ("", outcome.err);
    }

    /** It fails, and says `message` about `path`. */
    void expectSaid(const std::string& path, const std::string& message, const Outcome& outcome) {
        EXPECT_EQ("exit 1", outcome.ended);
        EXPECT_EQ("", outcome.out);
        EXPECT_EQ("marubackupctl: " + path + ": " + message + "\n", outcome.err);
    }
};

class MarubackupctlArchiveVersionOfAFileSystem : public MarubackupctlArchiveVersion {
protected:
    void SetUp() override {
        SKIP_IF_EMULATED(REQUESTS);
        std::string reason;
        mount = ArchiveMount::make(reason);
        if (!mount) {
            GTEST_SKIP() << reason;
        }
    }

    std::unique_ptr<ArchiveMount> mount;
};

} // namespace

TEST_F(MarubackupctlArchiveVersion, OfAFileIsPrinted) {
    const std::unique_ptr<support::TempDir> dir = support::makeFolderForAttributes();
    const std::string file = dir->path("file");
    support::writeFile(file, "data");
    expectPrinted("0", archiveVersion("get", file));
    support::setArchiveVersion(file, "4294967295");
    expectPrinted("4294967295", archiveVersion("get", file));
    expectPrinted("{\"path\":\"" + file + "\",\"version\":4294967295}", archiveVersion("get", file, {"--json"}));
}

TEST_F(MarubackupctlArchiveVersion, OfAFileThatIsNoNumberIsToBeSetAnew) {
    const std::unique_ptr<support::TempDir> dir = support::makeFolderForAttributes();
    const std::string file = dir->path("file");
    support::writeFile(file, "data");
    for (const char* const text : {"many", "99999999999999"}) {
        support::setArchiveVersion(file, text);
        expectSaid(file,
                   "cannot read its archive version: what is kept as one is no number of 32 bits: set it anew, or "
                   "remove it",
                   archiveVersion("get", file));
    }
}

TEST_F(MarubackupctlArchiveVersion, OfAFileThatIsNotThereIsTheUsersMistake) {
    const std::string path = folder.path("missing");
    expectSaid(path, "cannot read its archive version: No such file or directory: see that the path is right",
               archiveVersion("get", path));
    expectSaid(path,
               "cannot read the archive version of its file system: No such file or directory: see that the path is "
               "right",
               archiveVersion("fs-get", path));
    expectSaid(path,
               "cannot increase the archive version of its file system and read it: No such file or directory: see "
               "that the path is right",
               archiveVersion("fs-increase", path));
}

TEST_F(MarubackupctlArchiveVersion, OfAFileSystemWithoutOneIsExplained) {
    SKIP_IF_EMULATED(REQUESTS);
    const std::string none = "its file system keeps none; name a path on a volume that does";
    expectSaid(folder.path(), "cannot read the archive version of its file system: " + none,
               archiveVersion("fs-get", folder.path()));
    expectSaid(folder.path(), "cannot increase the archive version of its file system and read it: " + none,
               archiveVersion("fs-increase", folder.path(), {"--json"}));
}

TEST_F(MarubackupctlArchiveVersion, OfAFifoThatNobodyWritesTimesOut) {
    const std::string fifo = folder.path("fifo\n");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));
    const Outcome outcome = archiveVersion("fs-get", fifo, {"--timeout", "0.2"});
    EXPECT_EQ("exit 124", outcome.ended);
    EXPECT_EQ(0U, outcome.err.find("marubackupctl: " + folder.path("fifo\\012") + ": no answer within 0.2 seconds"));
    expectPrinted("0", archiveVersion("get", fifo));
}

TEST_F(MarubackupctlArchiveVersion, NeedsAVerbAndAPath) {
    EXPECT_EQ("exit 2", run({"archive-version"}).ended);
    EXPECT_EQ("exit 2", run({"archive-version", "set", "/"}).ended);
    EXPECT_EQ("exit 2", run({"archive-version", "get"}).ended);
    EXPECT_EQ("exit 2", run({"archive-version", "get", ""}).ended);
    EXPECT_EQ("exit 2", run({"archive-version", "get", "/", "/"}).ended);
}

TEST_F(MarubackupctlArchiveVersionOfAFileSystem, IsReadAndIncreased) {
    mount->set("version", 0x7FFFFFFF);
    expectPrinted("2147483647", archiveVersion("fs-get", mount->path()));
    expectPrinted("2147483648", archiveVersion("fs-increase", mount->path("folder")));
    expectPrinted("{\"path\":\"" + mount->path("file") + "\",\"version\":2147483648}",
                  archiveVersion("fs-get", mount->path("file"), {"--json"}));
    expectPrinted("{\"path\":\"" + mount->path() + "\",\"version\":2147483649}",
                  archiveVersion("fs-increase", mount->path(), {"--json"}));
}

TEST_F(MarubackupctlArchiveVersionOfAFileSystem, ThatFailsIsToldWithItsReason) {
    mount->set("get", -EIO);
    expectSaid(mount->path(), "cannot read the archive version of its file system: Input/output error",
               archiveVersion("fs-get", mount->path()));
    mount->set("increase", -EPERM);
    expectSaid(mount->path(),
               "cannot increase the archive version of its file system and read it: Operation not permitted: ask as "
               "root, or as somebody who may read it",
               archiveVersion("fs-increase", mount->path()));
    mount->set("get", 3);
    expectSaid(mount->path(),
               "cannot read the archive version of its file system: its file system answers something that is none",
               archiveVersion("fs-get", mount->path()));
}
