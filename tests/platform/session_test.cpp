#include <marubackup-util/session.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <marubackup-util/temp_manager.h>

#include "support/emulation.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/mount.h"
#include "support/nobody.h"
#include "support/resource_limit.h"
#include "support/session_areas.h"
#include "support/waiting.h"

namespace fs = std::filesystem;

using MARU::Backup::FilterVolume;
using MARU::Backup::Session;
using MARU::Backup::TempManager;
using MARU::Backup::Volume;
using support::describeStatus;
using support::inNewRoot;
using support::isThere;
using support::Mount;
using support::namesIn;
using support::newVolume;
using support::OUTSIDE;
using support::permissionsOf;
using support::readFile;
using support::runInChild;
using support::sessionRecord;
using support::writeFile;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::StartsWith;

namespace {

/** Where tests put records away for a while. */
const std::string ASIDE = "/var/run/aside";

/** Sessions in a /tmp of their own, and a folder outside of all of them in which nothing may ever be missing. */
class ASession : public testing::Test {
protected:
    const support::SessionAreas areas;
    const support::FilesOutside outside;
};

using SessionRemoval = ASession;
using SessionVolumes = ASession;

void expectGone(const std::string& id, const std::string& path) {
    EXPECT_FALSE(isThere(path)) << path;
    EXPECT_FALSE(isThere(sessionRecord(id))) << id;
    EXPECT_EQ("", Session::getPathById(id));
}

void expectKept(const Session& session) {
    EXPECT_TRUE(isThere(session.getPath()));
    EXPECT_EQ(session.getPath(), Session::getPathById(session.getId()));
}

/** Makes a chain of folders that is too long to be named by one path, with a file in each. */
void makeDeepTree(const std::string& folder, int depth) {
    int current = open(folder.c_str(), O_DIRECTORY | O_RDONLY | O_CLOEXEC);
    for (int level = 0; level < depth; ++level) {
        ASSERT_EQ(0, mkdirat(current, "folder", 0755)) << level;
        close(openat(current, "file", O_CREAT | O_WRONLY | O_CLOEXEC, 0644));
        const int next = openat(current, "folder", O_DIRECTORY | O_RDONLY | O_CLOEXEC);
        close(current);
        current = next;
    }
    close(current);
}

/** Does something again and again on a thread of its own. */
class Meanwhile {
public:
    template <typename Work>
    explicit Meanwhile(Work work)
        : thread([this, work]() {
              while (!ended) {
                  work();
              }
          }) {
    }
    ~Meanwhile() {
        end();
    }
    Meanwhile(const Meanwhile&) = delete;
    Meanwhile& operator=(const Meanwhile&) = delete;

    void end() {
        ended = true;
        if (thread.joinable()) {
            thread.join();
        }
    }

private:
    std::atomic<bool> ended = false;
    std::thread thread;
};

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

// Making and finding

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

// Ids and records

TEST_F(ASession, IsNotNamedByAnythingButLettersDigitsAndDashes) {
    Session session;
    session.create();
    const std::string id = session.getId();
    const std::string others[] = {
        "",
        "/",
        ".",
        "..",
        "../../etc",
        "../marusession-" + id,
        "/tmp/marusession-" + id,
        id + "/",
        id + "/.",
        id + ".new",
        " " + id,
        id + "\n",
        id + std::string(1, '\0'),
        std::string(1, '\0'),
        "a_b",
        "a*",
        "%s%n",
        "\xc3\xa4",
        "\xff",
        std::string(65, 'a'),
        std::string(4096, 'a'),
        std::string(1 << 20, '/'),
    };
    for (const std::string& other : others) {
        EXPECT_EQ("", Session::getPathById(other)) << other;
        EXPECT_FALSE(Session::destroyById(other)) << other;
        EXPECT_FALSE(Session().load(other)) << other;
    }
    expectKept(session);
}

TEST_F(ASession, IsGoneIfItsIdIsWellFormedAndUnknown) {
    for (const bool anyRecords : {false, true}) {
        if (anyRecords) {
            Session().create();
        }
        for (const std::string& id : {std::string("a"), std::string("0"), std::string("-"), std::string(64, 'Z')}) {
            EXPECT_EQ("", Session::getPathById(id));
            EXPECT_TRUE(Session::destroyById(id));
        }
    }
}

TEST_F(ASession, IsNotNamedByARecordThatIsTornOrLeadsElsewhere) {
    Session session;
    session.create();
    const std::string id = session.getId();
    Session other;
    other.create();
    fs::create_directory(OUTSIDE + "/marusession-" + id);
    const std::string name = "/marusession-" + id;
    const std::string texts[] = {
        "",
        "\n",
        "/tmp" + name,
        "/tmp" + name.substr(0, 20),
        "/tmp" + name + "\n\n",
        "/tmp" + name + "\n/etc\n",
        "/tmp" + name + std::string("\0\n", 2),
        "/tmp/" + name + "\n",
        "/tmp/." + name + "\n",
        "tmp" + name + "\n",
        name + "\n",
        other.getPath() + "\n",
        "/etc\n",
        "/\n",
        "/tmp\n",
        "/tmp/..\n",
        "/tmp/../etc\n",
        OUTSIDE + name + "\n",
        OUTSIDE + "\n",
        "/volume" + name + "\n",
        "/volume1/.." + name + "\n",
        "/volumes" + name + "\n",
        "/volume-1" + name + "\n",
        "/volume1234567890" + name + "\n",
        std::string(5000, '/'),
    };
    for (const std::string& text : texts) {
        writeFile(sessionRecord(id), text);

        EXPECT_EQ("", Session::getPathById(id)) << text;
        EXPECT_FALSE(Session().load(id)) << text;
        EXPECT_FALSE(Session::destroyById(id)) << text;

        EXPECT_EQ(text, readFile(sessionRecord(id))) << "whoever looks into it finds it as it is";
    }
    EXPECT_TRUE(isThere(session.getPath()));
    EXPECT_TRUE(isThere(OUTSIDE + "/marusession-" + id));
    expectKept(other);
}

TEST_F(ASession, IsNotNamedByARecordThatIsNoFileOfRootsAlone) {
    Session session;
    session.create();
    const std::string record = sessionRecord(session.getId());
    const auto expectUnusable = [&](const char* why) {
        EXPECT_EQ("", Session::getPathById(session.getId())) << why;
        EXPECT_FALSE(Session::destroyById(session.getId())) << why;
        EXPECT_TRUE(isThere(session.getPath())) << why;
    };

    chmod(record.c_str(), 0666);
    expectUnusable("anybody may have written it");
    chmod(record.c_str(), 0600);
    ASSERT_EQ(0, chown(record.c_str(), 65534, 65534));
    expectUnusable("nobody's");
    ASSERT_EQ(0, chown(record.c_str(), 0, 0));
    expectKept(session);

    fs::rename(record, ASIDE);
    fs::create_symlink(ASIDE, record);
    expectUnusable("a link");
    fs::remove(record);
    fs::create_directory(record);
    expectUnusable("a folder");
    fs::remove(record);
    ASSERT_EQ(0, mkfifo(record.c_str(), 0600));
    expectUnusable("a FIFO");
    fs::remove(record);
    fs::rename(ASIDE, record);

    chmod(support::SESSION_RECORDS.c_str(), 0777);
    expectUnusable("anybody may have put it there");
    EXPECT_FALSE(Session().create());
    chmod(support::SESSION_RECORDS.c_str(), 0700);
    fs::rename(support::SESSION_RECORDS, ASIDE);
    fs::create_directory_symlink(ASIDE, support::SESSION_RECORDS);
    expectUnusable("a link to the records");
    EXPECT_FALSE(Session().create());
    fs::remove(support::SESSION_RECORDS);
    fs::rename(ASIDE, support::SESSION_RECORDS);
    expectKept(session);
}

// Removal

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

TEST_F(SessionRemoval, MayBeDoneBySeveralProcessesAtOnce) {
    for (int round = 0; round < 10; ++round) {
        Session session;
        session.create();
        makeDeepTree(session.getPath(), 100);
        for (int folder = 0; folder < 50; ++folder) {
            fs::create_directories(session.getPath() + "/" + std::to_string(folder) + "/a/b");
        }
        std::vector<pid_t> children;
        for (int count = 0; count < 4; ++count) {
            children.push_back(support::startInChild([&]() { return Session::destroyById(session.getId()) ? 0 : 1; }));
        }
        for (const pid_t child : children) {
            EXPECT_EQ("exit 0", describeStatus(support::waitForChild(child)));
        }
        expectGone(session.getId(), session.getPath());
    }
}

TEST_F(SessionRemoval, TouchesNothingOutsideWhenAFolderIsSwappedForALinkMeanwhile) {
    for (int round = 0; round < 50; ++round) {
        Session session;
        session.create();
        std::vector<std::string> folders;
        for (int folder = 0; folder < 50; ++folder) {
            folders.push_back(session.getPath() + "/" + std::to_string(folder));
            fs::create_directories(folders.back() + "/deep/er");
        }
        fs::create_directory_symlink(OUTSIDE, "/tmp/link");
        Meanwhile swapping([&folders]() {
            for (const std::string& folder : folders) {
                renameat2(AT_FDCWD, "/tmp/link", AT_FDCWD, folder.c_str(), RENAME_EXCHANGE);
                renameat2(AT_FDCWD, "/tmp/link", AT_FDCWD, folder.c_str(), RENAME_EXCHANGE);
            }
        });

        Session::destroyById(session.getId());

        swapping.end();
        fs::remove_all("/tmp/link");
        outside.expectKept();
        EXPECT_TRUE(session.destroy()) << "nobody is in the way now";
    }
}

TEST_F(SessionRemoval, TouchesNothingOutsideWhenAFolderIsMovedOutMeanwhile) {
    // They are called like what stands inside, and empty: easily removed by who
    // goes up from where the folder is by then.
    const std::string candidates[] = {OUTSIDE + "/b", "/tmp/a"};
    for (const std::string& candidate : candidates) {
        fs::create_directory(candidate);
    }
    for (int round = 0; round < 50; ++round) {
        Session session;
        session.create();
        const std::string path = session.getPath();
        fs::create_directories(path + "/a/b");
        makeDeepTree(path + "/a/b", 100);
        Meanwhile moving([&path]() {
            rename((path + "/a/b").c_str(), (OUTSIDE + "/moved").c_str());
            rename((OUTSIDE + "/moved").c_str(), (path + "/a/b").c_str());
        });

        Session::destroyById(session.getId());

        moving.end();
        for (const std::string& candidate : candidates) {
            EXPECT_TRUE(isThere(candidate)) << candidate;
        }
        fs::remove_all(OUTSIDE + "/moved");
        EXPECT_TRUE(session.destroy()) << "nobody is in the way now";
    }
}

// Volumes

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
