#pragma once

#include <fcntl.h>
#include <sched.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <ctime>
#include <filesystem>
#include <string>
#include <system_error>

#include <gtest/gtest.h>

#include "support/files.h"
#include "support/in_child.h"
#include "support/mount.h"
#include "support/temp_dir.h"

namespace support {

/** Where the records of sessions stand. */
const std::string SESSION_RECORDS = "/var/run/marusession";

inline std::string sessionRecord(const std::string& id) {
    return SESSION_RECORDS + "/" + id;
}

/** A place beside the sessions, on their file system. */
const std::string OUTSIDE = "/tmp/outside";

/**
 * No session anywhere, and in place of the host's /tmp an empty one, while the
 * object lives.
 */
class SessionAreas {
public:
    SessionAreas() : area(Mount::tmpfs("/tmp", "mode=1777")) {
        forgetSessions();
    }
    ~SessionAreas() {
        forgetSessions();
    }
    SessionAreas(const SessionAreas&) = delete;
    SessionAreas& operator=(const SessionAreas&) = delete;

private:
    static void forgetSessions() {
        std::error_code ignored;
        std::filesystem::remove_all(SESSION_RECORDS, ignored);
    }

    Mount area;
};

/** Files at OUTSIDE that nobody may take or change: the test fails if one is not as it was when the object ends. */
class FilesOutside {
public:
    FilesOutside() {
        std::filesystem::create_directories(OUTSIDE + "/deep/er");
        for (const std::string& file : files) {
            writeFile(file, "kept");
        }
    }
    ~FilesOutside() {
        expectKept();
    }
    FilesOutside(const FilesOutside&) = delete;
    FilesOutside& operator=(const FilesOutside&) = delete;

    void expectKept() const {
        for (const std::string& file : files) {
            EXPECT_EQ("kept", isThere(file) ? readFile(file) : "taken") << file;
        }
    }

private:
    const std::string files[2] = {OUTSIDE + "/kept", OUTSIDE + "/deep/er/kept"};
};

/** Sets when a file was read and changed last; of a link, its own times. */
inline void setTimes(const std::string& path, time_t access, time_t modification) {
    const timespec times[2] = {{access, 0}, {modification, 0}};
    if (utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW) != 0) {
        throw std::system_error(errno, std::generic_category(), "set the times of " + path);
    }
}

/** Has the calling process see a root of its own: /dev and /run as they are, an empty /tmp, and nothing else. */
inline void enterNewRoot(const std::string& root) {
    const auto check = [](int result, const char* step) {
        if (result != 0) {
            throw std::system_error(errno, std::generic_category(), step);
        }
    };
    check(unshare(CLONE_NEWNS), "unshare");
    // The mounts stay until the process ends.
    static const Mount rootMount = Mount::tmpfs(root);
    for (const char* const folder : {"/dev", "/run"}) {
        check(mkdir((root + folder).c_str(), 0755), folder);
        check(mount(folder, (root + folder).c_str(), nullptr, MS_BIND | MS_REC, nullptr), folder);
    }
    check(mkdir((root + "/tmp").c_str(), 01777), "/tmp");
    check(mkdir((root + "/var").c_str(), 0755), "/var");
    check(symlink("../run", (root + "/var/run").c_str()), "/var/run");
    check(chroot(root.c_str()), "chroot");
    check(chdir("/"), "chdir");
}

/**
 * Runs `body` in a child that sees a root of its own, where it may make volumes
 * or take /tmp away. What it expects in vain fails the test.
 */
template <typename Body>
void inNewRoot(Body body) {
    const TempDir root;
    const int status = runInChild([&]() {
        enterNewRoot(root.path());
        body();
        return testing::Test::HasFailure() ? 1 : 0;
    });
    EXPECT_EQ("exit 0", describeStatus(status));
}

/** The folder `path`, made, with a tmpfs of these options mounted there: a volume, if it is named like one. */
inline Mount newVolume(const std::string& path, const std::string& options, unsigned long flags = 0) {
    if (mkdir(path.c_str(), 0755) != 0) {
        throw std::system_error(errno, std::generic_category(), "mkdir " + path);
    }
    return Mount::tmpfs(path, options, flags);
}

} // namespace support
