#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>

#include "support/temp_dir.h"

/**
 * A file system with an archive version, mounted in the sandbox for as long as the
 * object lives. archive_version_fs.cpp tells what is in it. Under an emulator it is a
 * folder with the same things in it, for requests_stand_in.cpp, which answers in the
 * test itself and in the programs that share their libraries.
 */
class ArchiveMount {
public:
    /**
     * None, with the reason in `reason`, where the machine does not let one be
     * mounted; where it does, a file system that does not come up is an exception.
     */
    static std::unique_ptr<ArchiveMount> make(std::string& reason);

    ~ArchiveMount();
    ArchiveMount(const ArchiveMount&) = delete;
    ArchiveMount& operator=(const ArchiveMount&) = delete;

    /** Its root. */
    const std::string& path() const {
        return folder.path();
    }
    /** `name` in it. */
    std::string path(const std::string& name) const {
        return folder.path(name);
    }

    /** The version as the file system itself has it. */
    std::uint32_t version() const;
    /** Sets one of the things that its control file knows. */
    void set(const std::string& name, std::int64_t number) const;

private:
    ArchiveMount() = default;
    void makeFolder() const;
    /** What it says before it is mounted, or instead. */
    std::string start();

    support::TempDir folder;
    pid_t server = -1;
};
