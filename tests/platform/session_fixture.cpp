#include "session_fixture.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "support/files.h"

using MARU::Backup::Session;
using support::isThere;

void ASession::expectKept(const Session& session) {
    EXPECT_TRUE(isThere(session.getPath()));
    EXPECT_EQ(session.getPath(), Session::getPathById(session.getId()));
}

void ASession::expectGone(const std::string& id, const std::string& path) {
    EXPECT_FALSE(isThere(path)) << path;
    EXPECT_FALSE(isThere(support::sessionRecord(id))) << id;
    EXPECT_EQ("", Session::getPathById(id));
}

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
