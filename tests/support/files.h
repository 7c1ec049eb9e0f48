#pragma once

#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <system_error>
#include <vector>

namespace support {

// All of these throw std::system_error, which fails a test, with the file's
// name in its text.

/** All bytes of a file, also of one in /proc whose size is not known before. */
inline std::string readFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    if (!file) {
        throw std::system_error(errno, std::generic_category(), "read " + path);
    }
    return std::string(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

/** Makes a file that holds `content`, or replaces what a file there held. */
inline void writeFile(const std::string& path, const std::string& content) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file << content << std::flush;
    if (!file) {
        throw std::system_error(errno, std::generic_category(), "write " + path);
    }
}

/** The same for a file with exactly these permissions, whatever the umask. */
inline void writeFile(const std::string& path, const std::string& content, mode_t mode) {
    writeFile(path, content);
    if (chmod(path.c_str(), mode) != 0) {
        throw std::system_error(errno, std::generic_category(), "chmod " + path);
    }
}

/** Whether something stands there, a link that leads nowhere included. */
inline bool isThere(const std::string& path) {
    return std::filesystem::exists(std::filesystem::symlink_status(path));
}

/** The names of what is in a folder, in no order. */
inline std::vector<std::string> namesIn(const std::string& folder) {
    std::vector<std::string> names;
    for (const std::filesystem::directory_entry& entry : std::filesystem::directory_iterator(folder)) {
        names.push_back(entry.path().filename());
    }
    return names;
}

/** Who may do what with a file, set-user-id and its like included; of a link, its own. */
inline mode_t permissionsOf(const std::string& path) {
    struct stat info = {};
    if (lstat(path.c_str(), &info) != 0) {
        throw std::system_error(errno, std::generic_category(), "look at " + path);
    }
    return info.st_mode & 07777;
}

} // namespace support
