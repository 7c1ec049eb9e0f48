#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <functional>
#include <memory>
#include <set>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backend_fixture.h"
#include "support/backend_files.h"
#include "support/files.h"

using namespace MARU::Backup;
using support::LOCAL_BACKEND_FOLDER;
using support::SYSTEM_BACKEND_FOLDER;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class BackendList : public BackendTest {
protected:
    /** The list, which had something in it before. */
    static std::list<std::string> listed(bool expected = true) {
        std::list<std::string> backends = {"left", "over"};
        EXPECT_EQ(expected, BackendManager::listBackend(backends));
        return backends;
    }
};

/** While it lives the system's folder is not where it was. */
class SystemFolderAway {
public:
    SystemFolderAway() {
        EXPECT_EQ(0, std::rename(SYSTEM_BACKEND_FOLDER, AWAY));
    }
    ~SystemFolderAway() {
        unlink(SYSTEM_BACKEND_FOLDER); // what may be in its place
        EXPECT_EQ(0, std::rename(AWAY, SYSTEM_BACKEND_FOLDER));
    }
    SystemFolderAway(const SystemFolderAway&) = delete;
    SystemFolderAway& operator=(const SystemFolderAway&) = delete;

private:
    static constexpr const char* AWAY = "/usr/maru/share/marubackup.away";
};

/** The names in the system's folder that `wanted` holds, without ".conf", in the folder's own order. */
std::list<std::string> inFolderOrder(const std::set<std::string>& wanted) {
    std::list<std::string> names;
    const std::shared_ptr<DIR> folder(opendir(SYSTEM_BACKEND_FOLDER), closedir);
    while (const dirent* entry = readdir(folder.get())) {
        const std::string name = entry->d_name;
        if (wanted.count(name) != 0) {
            names.push_back(name.substr(0, name.size() - 5));
        }
    }
    return names;
}

void makeInSystemFolder(const std::string& name) {
    support::writeFile(SYSTEM_BACKEND_FOLDER + ("/" + name), "");
}

} // namespace

TEST_F(BackendList, IsEmptyWithoutBackends) {
    EXPECT_THAT(listed(), IsEmpty());
}

TEST_F(BackendList, HasTheNamesThatEndInConfAndHaveMoreThanOneCharacterBeforeIt) {
    for (const char* const name : {"a.conf", "ab.conf", "x.conf.bak", "y.CONF", "yy.CONF", ".conf", "..conf", "...conf",
                                   "xxconf", "conf", "no-dot-conf", "with blank.conf", "zz.confx", "%s.conf"}) {
        makeInSystemFolder(name);
    }
    ASSERT_EQ(0, mkdir((SYSTEM_BACKEND_FOLDER + std::string("/z.conf")).c_str(), 0755));
    ASSERT_EQ(0, mkdir((SYSTEM_BACKEND_FOLDER + std::string("/zz.conf")).c_str(), 0755));
    ASSERT_EQ(0, symlink("/nonexistent", (SYSTEM_BACKEND_FOLDER + std::string("/dangling.conf")).c_str()));

    EXPECT_EQ(inFolderOrder({"ab.conf", "...conf", "with blank.conf", "%s.conf", "zz.conf", "dangling.conf"}),
              listed());
}

TEST_F(BackendList, IsInTheOrderOfTheFolder) {
    std::set<std::string> names;
    for (int number = 0; number < 100; ++number) {
        names.insert("backend" + std::to_string(number * 37 % 100) + ".conf");
    }
    for (const std::string& name : names) {
        makeInSystemFolder(name);
    }

    const std::list<std::string> backends = listed();

    EXPECT_EQ(100U, backends.size());
    EXPECT_EQ(inFolderOrder(names), backends);
}

TEST_F(BackendList, HasNothingOfTheLocalFolder) {
    support::writeLocalBackend("local", "[backup]\n");
    support::writeSystemBackend("system", "[backup]\n");

    EXPECT_THAT(listed(), ElementsAre("system"));
}

TEST_F(BackendList, IsEmptyWithoutTheFolder) {
    const SystemFolderAway away;

    EXPECT_THAT(listed(), IsEmpty());

    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(BackendList, FailsWithoutNamesIfTheFolderCannotBeRead) {
    const SystemFolderAway away;
    support::writeFile(SYSTEM_BACKEND_FOLDER, "a file");

    EXPECT_THAT(listed(false), IsEmpty());

    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(BackendList, LeavesNoDescriptorOpen) {
    listed();
    const int before = dup(STDOUT_FILENO);
    close(before);

    listed();

    const int after = dup(STDOUT_FILENO);
    close(after);
    EXPECT_EQ(before, after);
}
