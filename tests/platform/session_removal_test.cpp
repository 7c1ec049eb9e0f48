// What the removal of a session takes, and what it leaves.

#include <marubackup-util/session.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include <gmock/gmock.h>

#include "session_fixture.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/mount.h"
#include "support/resource_limit.h"
#include "support/session_areas.h"
#include "support/waiting.h"

namespace fs = std::filesystem;

using MARU::Backup::Session;
using support::describeStatus;
using support::isThere;
using support::Mount;
using support::namesIn;
using support::OUTSIDE;
using support::readFile;
using support::runInChild;
using support::sessionRecord;
using support::writeFile;
using testing::ElementsAre;
using testing::IsEmpty;

using SessionRemoval = ASession;

TEST_F(SessionRemoval, TakesAllThatIsInside) {
    Session session;
    session.create();
    const std::string path = session.getPath();
    fs::create_directories(path + "/a/b/c");
    fs::create_directories(path + "/..hidden/.d");
    fs::create_directory(path + "/closed");
    for (const std::string name :
         {"file", "a/file", "a/b/c/file", "..hidden/.d/.f", "line\nend", "\xff\xfe", "-rf", " ", "closed/file"}) {
        writeFile(path + "/" + name, "x", 0);
    }
    chmod((path + "/closed").c_str(), 0);
    mkfifo((path + "/a/fifo").c_str(), 0600);
    mknod((path + "/a/socket").c_str(), S_IFSOCK | 0600, 0);
    fs::create_hard_link(OUTSIDE + "/kept", OUTSIDE + "/other-name");

    EXPECT_TRUE(session.destroy());

    EXPECT_EQ("", session.getId());
    EXPECT_EQ("", session.getPath());
    EXPECT_THAT(namesIn("/tmp"), ElementsAre("outside"));
    EXPECT_THAT(namesIn(support::SESSION_RECORDS), IsEmpty());
    EXPECT_FALSE(session.destroy()) << "it names none now";
}

TEST_F(SessionRemoval, FollowsNoLink) {
    Session session;
    session.create();
    fs::create_directory(session.getPath() + "/folder");
    for (const std::string name : {"/link", "/folder/link"}) {
        fs::create_directory_symlink(OUTSIDE, session.getPath() + name);
        fs::create_directory_symlink(OUTSIDE + "/deep" + "/", session.getPath() + name + "-deep");
        fs::create_symlink(OUTSIDE + "/kept", session.getPath() + name + "-file");
        fs::create_symlink("/nowhere", session.getPath() + name + "-nowhere");
        fs::create_symlink("..", session.getPath() + name + "-up");
    }

    EXPECT_TRUE(session.destroy());

    EXPECT_THAT(namesIn("/tmp"), ElementsAre("outside"));
}

TEST_F(SessionRemoval, TakesATreeOfAnyDepthWithAFewDescriptors) {
    Session session;
    session.create();
    makeDeepTree(session.getPath(), 5000);

    const int status = runInChild([&]() {
        support::limitTo(RLIMIT_NOFILE, static_cast<rlim_t>(support::openDescriptors(getpid())) + 8);
        support::limitTo(RLIMIT_STACK, 256 * 1024);
        return Session::destroyById(session.getId()) ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    expectGone(session.getId(), session.getPath());
}

TEST_F(SessionRemoval, TakesAWideTree) {
    Session session;
    session.create();
    for (int folder = 0; folder < 1000; ++folder) {
        const std::string path = session.getPath() + "/" + std::to_string(folder);
        fs::create_directory(path);
        writeFile(path + "/file", "");
    }

    EXPECT_TRUE(session.destroy());

    EXPECT_THAT(namesIn("/tmp"), ElementsAre("outside"));
}

TEST_F(SessionRemoval, ClosesWhatItOpens) {
    const int before = support::openDescriptors(getpid());
    Session session;
    session.create();
    fs::create_directories(session.getPath() + "/a/b");

    Session::getPathById(session.getId());
    session.destroy();

    EXPECT_EQ(before, support::openDescriptors(getpid()));
}

TEST_F(SessionRemoval, LeavesWhatIsMountedInsideAndTakesTheRest) {
    Session session;
    session.create();
    const std::string path = session.getPath();
    fs::create_directories(path + "/a/mounted");
    fs::create_directories(path + "/a/folder/b");
    writeFile(path + "/a/file", "");
    writeFile(path + "/file", "");
    Mount mounted = Mount::tmpfs(path + "/a/mounted");
    writeFile(path + "/a/mounted/kept", "kept");

    EXPECT_FALSE(session.destroy());

    expectKept(session);
    EXPECT_THAT(namesIn(path), ElementsAre("a"));
    EXPECT_THAT(namesIn(path + "/a"), ElementsAre("mounted"));
    EXPECT_EQ("kept", readFile(path + "/a/mounted/kept"));

    mounted.unmount();
    const std::string id = session.getId();
    EXPECT_TRUE(session.destroy());
    expectGone(id, path);
}

TEST_F(SessionRemoval, LeavesWhatIsBoundInsideFromTheSameFileSystem) {
    SKIP_IF_EMULATED("what mount a file is on is not shown");
    Session session;
    session.create();
    const std::string path = session.getPath();
    fs::create_directory(path + "/folder");
    writeFile(path + "/file", "");
    fs::create_directory("/tmp/source");
    writeFile("/tmp/source/kept", "kept");
    Mount folder = Mount::bind("/tmp/source", path + "/folder");
    Mount file = Mount::bind("/tmp/source/kept", path + "/file");

    EXPECT_FALSE(session.destroy());

    EXPECT_EQ("kept", readFile("/tmp/source/kept"));
    expectKept(session);

    folder.unmount();
    file.unmount();
    EXPECT_TRUE(session.destroy());
    EXPECT_EQ("kept", readFile("/tmp/source/kept"));
}

TEST_F(SessionRemoval, LeavesADirectoryOnWhichSomethingIsMounted) {
    Session session;
    session.create();
    const Mount mounted = Mount::tmpfs(session.getPath());
    writeFile(session.getPath() + "/kept", "kept");

    EXPECT_FALSE(session.destroy());

    EXPECT_EQ("kept", readFile(session.getPath() + "/kept"));
    expectKept(session);
}

TEST_F(SessionRemoval, LeavesWhatHasReplacedTheDirectory) {
    Session session;
    session.create();
    const std::string id = session.getId();
    const std::string path = session.getPath();
    fs::remove(path);

    fs::create_directory_symlink(OUTSIDE, path);
    EXPECT_FALSE(Session::destroyById(id));
    EXPECT_TRUE(fs::is_symlink(path));
    EXPECT_TRUE(isThere(sessionRecord(id)));

    fs::remove(path);
    writeFile(path, "a file");
    EXPECT_FALSE(Session::destroyById(id));
    EXPECT_EQ("a file", readFile(path));
    EXPECT_TRUE(isThere(sessionRecord(id)));

    fs::remove(path);
    EXPECT_TRUE(session.destroy()) << "it is gone by now";
    expectGone(id, path);
}

TEST_F(SessionRemoval, TakesTheRecordOfADirectoryThatHasVanished) {
    Session session;
    session.create();
    const std::string id = session.getId();
    const std::string path = session.getPath();
    fs::remove(path);
    EXPECT_EQ(path, Session::getPathById(id));

    EXPECT_TRUE(Session::destroyById(id));

    expectGone(id, path);
    EXPECT_TRUE(Session::destroyById(id)) << "once more";
}
