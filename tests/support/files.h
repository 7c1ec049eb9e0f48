#pragma once

#include <sys/stat.h>

#include <cerrno>
#include <fstream>
#include <iterator>
#include <string>
#include <system_error>

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

} // namespace support
