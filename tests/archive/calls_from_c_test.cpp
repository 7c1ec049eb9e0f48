// An application in C, with the library as it is installed.

#include <cstdio>
#include <memory>
#include <string>

#include "archive_mount.h"
#include "archive_test.h"
#include "support/attributes.h"
#include "support/files.h"

namespace {

class CallsFromC : public ArchiveTest {
protected:
    /** What the application prints: the result and the version. */
    static std::string call(const std::string& function, const std::string& path) {
        std::FILE* const output = popen((ARCHIVE_CALLS " " + function + " " + path).c_str(), "re");
        char line[64] = "";
        EXPECT_NE(nullptr, std::fgets(line, sizeof line, output));
        EXPECT_EQ(0, pclose(output));
        return line;
    }
};

} // namespace

TEST_F(CallsFromC, ReadAFilesVersionAndAreRefusedToSetIt) {
    const std::unique_ptr<support::TempDir> dir = support::makeFolderForAttributes();
    support::writeFile(dir->path("file"), "data");
    support::setArchiveVersion(dir->path("file"), "42");
    EXPECT_EQ("0 42\n", call("get", dir->path("file")));
    EXPECT_EQ("-1 4711\n", call("get", dir->path("missing")));
    EXPECT_EQ("-1 4711\n", call("set", dir->path("file")));
    expectLogged("Not support the command in the platform\\.");
}

TEST_F(CallsFromC, AreToldThatAFileSystemHasNoVersion) {
    EXPECT_EQ("-1 0\n", call("fs-get", folder.path()));
    EXPECT_EQ("-1 0\n", call("fs-increase", folder.path()));
}

TEST_F(CallsFromC, ReadAndIncreaseAFileSystemsVersion) {
    std::string reason;
    const std::unique_ptr<ArchiveMount> mount = ArchiveMount::make(reason);
    if (!mount) {
        GTEST_SKIP() << reason;
    }
    EXPECT_EQ("0 1\n", call("fs-increase", mount->path()));
    EXPECT_EQ("0 1\n", call("fs-get", mount->path("file")));
}
