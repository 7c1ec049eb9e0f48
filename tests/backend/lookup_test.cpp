#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backend_fixture.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/nobody.h"

using namespace MARU::Backup;
using support::backendFile;
using support::expectLocated;
using support::LOCAL_BACKEND_FOLDER;
using support::SYSTEM_BACKEND_FOLDER;
using support::writeLocalBackend;
using support::writeSystemBackend;
using testing::IsEmpty;

namespace {

class BackendLookup : public BackendTest {
protected:
    void expectFailedLoad(const std::string& name, const std::string& path) {
        EXPECT_FALSE(backend.load(name, "backup"));
        expectLocated(log, LOG_DEBUG, getpid(), BACKEND_UNIT,
                      "load backend [" + name + "] action [backup] from [" + path + "] failed");
        EXPECT_EQ(1U, log.lines().size());
    }

    /** What nobody finds of the backend "b": its unique template; empty if it cannot be loaded. */
    std::string uniqueSeenByNobody() {
        support::writeFile(out, "", 0666);
        chmod(folder.path().c_str(), 0755);
        const int status = support::runInChild([this]() {
            openlog(nullptr, LOG_NDELAY, 0);
            support::becomeNobody();
            support::writeFile(out, backend.load("b", "backup") ? backend.getUniqueFormat() : "");
            return 0;
        });
        EXPECT_EQ("exit 0", support::describeStatus(status));
        return support::readFile(out);
    }
};

const char* const LOCAL_TEXT = "[backup]\nunique = local\n";
const char* const SYSTEM_TEXT = "[backup]\nunique = system\n[restore]\nunique = system restore\n";

} // namespace

TEST_F(BackendLookup, FindsABackendInTheLocalFolder) {
    writeLocalBackend("b", LOCAL_TEXT);

    EXPECT_TRUE(backend.load("b", "backup"));

    EXPECT_EQ("local", backend.getUniqueFormat());
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(BackendLookup, FindsABackendInTheSystemFolder) {
    writeSystemBackend("b", SYSTEM_TEXT);

    EXPECT_TRUE(backend.load("b", "backup"));

    EXPECT_EQ("system", backend.getUniqueFormat());
}

TEST_F(BackendLookup, PrefersTheLocalFile) {
    writeLocalBackend("b", LOCAL_TEXT);
    writeSystemBackend("b", SYSTEM_TEXT);

    EXPECT_TRUE(backend.load("b", "backup"));

    EXPECT_EQ("local", backend.getUniqueFormat());
}

TEST_F(BackendLookup, DoesNotLookForASectionThatTheLocalFileLacksElsewhere) {
    writeLocalBackend("b", "[relink]\nunique = local\n");
    writeSystemBackend("b", SYSTEM_TEXT);

    expectFailedLoad("b", backendFile(LOCAL_BACKEND_FOLDER, "b"));
}

TEST_F(BackendLookup, DoesNotMixTheSectionsOfTwoFiles) {
    writeLocalBackend("b", "[backup]\ndelegate = yes\n");
    writeSystemBackend("b", SYSTEM_TEXT);

    EXPECT_TRUE(backend.load("b", "backup"));

    EXPECT_EQ("_job_id.{{job_id}}", backend.getUniqueFormat());
}

TEST_F(BackendLookup, DoesNotLookElsewhereForAMalformedLocalFile) {
    writeLocalBackend("b", "[backup]\nunique = local\nrubbish\n");
    writeSystemBackend("b", SYSTEM_TEXT);

    expectFailedLoad("b", backendFile(LOCAL_BACKEND_FOLDER, "b"));
}

TEST_F(BackendLookup, PassesALocalFileOverThatMayNotBeRead) {
    writeLocalBackend("b", LOCAL_TEXT);
    writeSystemBackend("b", SYSTEM_TEXT);
    ASSERT_EQ(0, chmod(backendFile(LOCAL_BACKEND_FOLDER, "b").c_str(), 0600));
    ASSERT_EQ(0, chmod(backendFile(SYSTEM_BACKEND_FOLDER, "b").c_str(), 0644));

    EXPECT_EQ("system", uniqueSeenByNobody());
}

TEST_F(BackendLookup, NamesTheSystemFileIfNeitherMayBeRead) {
    writeLocalBackend("b", LOCAL_TEXT);
    writeSystemBackend("b", SYSTEM_TEXT);
    ASSERT_EQ(0, chmod(backendFile(LOCAL_BACKEND_FOLDER, "b").c_str(), 0600));
    ASSERT_EQ(0, chmod(backendFile(SYSTEM_BACKEND_FOLDER, "b").c_str(), 0600));

    EXPECT_EQ("", uniqueSeenByNobody());

    log.waitFor("load backend [b] action [backup] from [" + backendFile(SYSTEM_BACKEND_FOLDER, "b") + "] failed");
}

TEST_F(BackendLookup, SaysAtDebugLevelWhereItLookedForAnUnknownBackend) {
    expectFailedLoad("unknown", backendFile(SYSTEM_BACKEND_FOLDER, "unknown"));
}

TEST_F(BackendLookup, TakesNamesLiterally) {
    const std::string names[] = {"", "..", ".", "b c", "%s%n", "b.conf", "\xFF", "*", "-"};
    for (const std::string& name : names) {
        writeLocalBackend(name, LOCAL_TEXT);

        EXPECT_TRUE(backend.load(name, "backup")) << name;

        support::removeLocalBackend(name);
        EXPECT_FALSE(backend.load(name, "backup")) << name;
    }
}

TEST_F(BackendLookup, LeavesTheTwoFoldersForNobody) {
    support::writeFile(folder.path("evil.conf"), LOCAL_TEXT);
    const std::string name = "../../../.." + folder.path("evil");
    ASSERT_EQ(0, access(backendFile(LOCAL_BACKEND_FOLDER, name).c_str(), R_OK));

    expectFailedLoad(name, backendFile(LOCAL_BACKEND_FOLDER, name));
}

TEST_F(BackendLookup, DoesNotEnterFoldersBelow) {
    ASSERT_EQ(0, mkdir((std::string(LOCAL_BACKEND_FOLDER) + "/sub").c_str(), 0755));
    writeLocalBackend("sub/b", LOCAL_TEXT);

    expectFailedLoad("sub/b", backendFile(LOCAL_BACKEND_FOLDER, "sub/b"));
}

TEST_F(BackendLookup, DoesNotCutANameAtANul) {
    const std::string file = std::string(LOCAL_BACKEND_FOLDER) + "/b";
    support::writeFile(file, LOCAL_TEXT);

    EXPECT_FALSE(backend.load(std::string("b\0", 2), "backup"));

    expectLocated(log, LOG_DEBUG, getpid(), BACKEND_UNIT,
                  "load backend [b] action [backup] from [" + file + "] failed");
}

TEST_F(BackendLookup, SurvivesANameThatIsTooLongForAFile) {
    const std::string name(4096, 'x');

    EXPECT_FALSE(backend.load(name, "backup"));

    const support::SyslogLine line = log.waitFor("load backend [" + name + "] action [backup] from [" +
                                                 backendFile(SYSTEM_BACKEND_FOLDER, name) + "] failed");
    EXPECT_EQ(LOG_DEBUG, line.priority);
}

TEST_F(BackendLookup, ReadsNoFolderAndNoFifoAsAFile) {
    ASSERT_EQ(0, mkdir(backendFile(LOCAL_BACKEND_FOLDER, "folder").c_str(), 0755));
    ASSERT_EQ(0, mkfifo(backendFile(LOCAL_BACKEND_FOLDER, "fifo").c_str(), 0644));

    EXPECT_FALSE(backend.load("folder", "backup"));
    EXPECT_FALSE(backend.load("fifo", "backup"));
}
