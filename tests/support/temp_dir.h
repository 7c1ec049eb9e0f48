#pragma once

#include <stdlib.h>

#include <cerrno>
#include <filesystem>
#include <string>
#include <system_error>

namespace support {

/**
 * A fresh, empty folder below $TMPDIR (or /tmp), mode 0700, removed with all
 * that is in it at the end of the object's life. Its path has no trailing slash.
 */
class TempDir {
public:
    TempDir() : TempDir(usualBase()) {
    }
    /** Below `base`, for a test that needs a certain file system. */
    explicit TempDir(const std::string& base) : folder(base + "/marubackup-test-XXXXXX") {
        if (!mkdtemp(&folder[0])) {
            throw std::system_error(errno, std::generic_category(), "mkdtemp " + folder);
        }
    }
    ~TempDir() {
        std::error_code ignored;
        std::filesystem::remove_all(folder, ignored);
    }
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;

    /** The folder itself. */
    const std::string& path() const {
        return folder;
    }
    /** `name` inside the folder; nothing is made. */
    std::string path(const std::string& name) const {
        return folder + "/" + name;
    }

private:
    static std::string usualBase() {
        const char* const base = getenv("TMPDIR");
        return base && *base ? base : "/tmp";
    }

    std::string folder;
};

} // namespace support
