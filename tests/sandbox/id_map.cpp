#include "id_map.h"

#include <pwd.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "setup_error.h"

namespace {

// Below this are the system's own accounts, which programs change to.
const unsigned long FEWEST_IDS = 1000;
const unsigned long MOST_IDS = 65535;

std::string userName() {
    const passwd* entry = getpwuid(getuid());
    return entry != nullptr ? entry->pw_name : std::to_string(getuid());
}

/** The largest range that a line "name:first:count" of `file` grants the caller. */
IdRange grantedRange(const std::string& file) {
    const std::string name = userName();
    const std::string number = std::to_string(getuid());
    IdRange largest{0, 0};

    std::ifstream lines(file);
    for (std::string line; std::getline(lines, line);) {
        std::istringstream fields(line);
        std::string owner;
        IdRange range{0, 0};
        char colon = 0;
        if (std::getline(fields, owner, ':') && (owner == name || owner == number) &&
            fields >> range.first >> colon >> range.count && range.count > largest.count) {
            largest = range;
        }
    }
    if (largest.count < FEWEST_IDS) {
        throw SetupError(file + " grants " + name + " no range of ids; as root, add \"" + name + ":FIRST:65536\" to " +
                         "/etc/subuid and /etc/subgid, FIRST behind all other ranges");
    }
    return {largest.first, std::min(largest.count, MOST_IDS)};
}

int waitForStatus(pid_t child) {
    int status = 0;
    while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
    }
    return status;
}

/** Runs newuidmap or newgidmap, which may do what the user itself may not. */
void runMapper(const std::string& program, pid_t process, unsigned long own, const IdRange& range) {
    std::vector<std::string> words = {program,
                                      std::to_string(process),
                                      "0",
                                      std::to_string(own),
                                      "1",
                                      "1",
                                      std::to_string(range.first),
                                      std::to_string(range.count)};
    std::vector<char*> argv;
    for (std::string& word : words) {
        argv.push_back(word.data());
    }
    argv.push_back(nullptr);

    pid_t child = 0;
    const int error = posix_spawnp(&child, program.c_str(), nullptr, nullptr, argv.data(), environ);
    if (error == ENOENT) {
        throw SetupError("there is no " + program + "; as root: apt-get install uidmap");
    }
    if (error != 0) {
        fail("run " + program, error);
    }
    if (waitForStatus(child) != 0) {
        throw SetupError(program + " was not allowed to map the ids; run it as root instead");
    }
}

} // namespace

IdRanges grantedIds() {
    return {grantedRange("/etc/subuid"), grantedRange("/etc/subgid")};
}

void mapIds(pid_t process, const IdRanges& granted) {
    runMapper("newuidmap", process, getuid(), granted.users);
    runMapper("newgidmap", process, getgid(), granted.groups);
}
