// The removal of a session while others are at work in it.

#include <marubackup-util/session.h>

#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "session_fixture.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/session_areas.h"

namespace fs = std::filesystem;

using MARU::Backup::Session;
using support::describeStatus;
using support::isThere;
using support::OUTSIDE;

using SessionRemoval = ASession;

namespace {

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

} // namespace

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
