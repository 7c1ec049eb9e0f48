#pragma once

#include <filesystem>
#include <string>

#include "support/files.h"

namespace support {

// The two folders that backends are looked up in: the sandbox's, empty at the
// start of a test. What cannot be written or removed is an exception.

const char* const LOCAL_BACKEND_FOLDER = "/usr/local/share/marubackup";
const char* const SYSTEM_BACKEND_FOLDER = "/usr/maru/share/marubackup";

/** The file in which a backend of that name stands in that folder. */
inline std::string backendFile(const std::string& folder, const std::string& name) {
    return folder + "/" + name + ".conf";
}

/** Declares a backend, or replaces it, in the folder that is searched first. */
inline void writeLocalBackend(const std::string& name, const std::string& text) {
    writeFile(backendFile(LOCAL_BACKEND_FOLDER, name), text);
}

/** Declares a backend, or replaces it, in the folder that is searched second. */
inline void writeSystemBackend(const std::string& name, const std::string& text) {
    writeFile(backendFile(SYSTEM_BACKEND_FOLDER, name), text);
}

inline void removeLocalBackend(const std::string& name) {
    std::filesystem::remove(backendFile(LOCAL_BACKEND_FOLDER, name));
}

inline void removeSystemBackend(const std::string& name) {
    std::filesystem::remove(backendFile(SYSTEM_BACKEND_FOLDER, name));
}

/** Empties both folders. */
inline void removeAllBackends() {
    for (const char* const folder : {LOCAL_BACKEND_FOLDER, SYSTEM_BACKEND_FOLDER}) {
        for (const std::filesystem::directory_entry& entry : std::filesystem::directory_iterator(folder)) {
            std::filesystem::remove_all(entry);
        }
    }
}

} // namespace support
