#pragma once

#include <filesystem>
#include <string>

#include "support/files.h"

namespace support {

// What the appliance beside the daemon tells of itself, in the sandbox's own
// files. What cannot be written or removed is an exception.

const char* const TASK_ROOT = "/var/run/marutask";
const char* const SPACE_BUILD_FILE = "/var/run/maruspacebuild";
const char* const SNAPSHOT_TOOL = "/usr/maru/sbin/marusharesnaptool";

/** Removes what an earlier test in the same sandbox has left. */
inline void emptyAppliance() {
    for (const char* const path : {TASK_ROOT, SPACE_BUILD_FILE, SNAPSHOT_TOOL}) {
        std::filesystem::remove_all(path);
    }
}

/** The file of a task. */
inline std::string taskFile(const std::string& owner, const std::string& id) {
    return std::string(TASK_ROOT) + "/" + owner + "/" + id + ".json";
}

/** Makes that file by hand, whatever `text` is. */
inline void writeTaskFile(const std::string& owner, const std::string& id, const std::string& text) {
    std::filesystem::create_directories(std::string(TASK_ROOT) + "/" + owner);
    writeFile(taskFile(owner, id), text);
}

/** Installs a snapshot tool that does what the shell script `body` says. */
inline void installSnapshotTool(const std::string& body) {
    std::filesystem::create_directories(std::filesystem::path(SNAPSHOT_TOOL).parent_path());
    writeFile(SNAPSHOT_TOOL, "#!/bin/sh\n" + body + "\n", 0755);
}

} // namespace support
