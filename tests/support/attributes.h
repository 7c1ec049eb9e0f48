#pragma once

#include <sys/xattr.h>

#include <cerrno>
#include <memory>
#include <string>
#include <system_error>

#include "support/temp_dir.h"

namespace support {

/** The extended attribute that a file's archive version is kept in. */
const char* const ARCHIVE_VERSION_ATTRIBUTE = "user.maru.archive_version";

/** A folder whose files can have attributes: those of a tmpfs can only since Linux 6.6. */
inline std::unique_ptr<TempDir> makeFolderForAttributes() {
    for (const char* const base : {"/run", "/var/tmp", "."}) {
        auto folder = std::make_unique<TempDir>(base);
        if (setxattr(folder->path().c_str(), "user.probe", "", 0, 0) == 0) {
            return folder;
        }
    }
    throw std::system_error(errno, std::generic_category(), "no folder for files with attributes");
}

/** Gives a file what it has as its archive version. */
inline void setArchiveVersion(const std::string& path, const std::string& text) {
    if (setxattr(path.c_str(), ARCHIVE_VERSION_ATTRIBUTE, text.data(), text.size(), 0) != 0) {
        throw std::system_error(errno, std::generic_category(), "setxattr " + path);
    }
}

} // namespace support
