#include "host.h"

#include <grp.h>
#include <sys/resource.h>
#include <syslog.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <string>

#include "report.h"

namespace {

// The server closes connections whose descriptor is above 1024. The rest is for
// the daemon's own files at that moment. No more than this: jobs inherit the
// soft limit, and those that use select() work with descriptors below 1024 only.
const rlim_t WANTED_DESCRIPTORS = 1024 + 64;

const gid_t SOCKET_GROUP = 101;
const std::array<const char*, 6> ADMINISTRATORS = {"administrators", "admin", "adm", "sudo", "wheel", "root"};

} // namespace

void unblockSignals() {
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
}

void raiseDescriptorLimit() {
    rlimit limit = {};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur >= WANTED_DESCRIPTORS) {
        return;
    }
    limit.rlim_cur = std::min(WANTED_DESCRIPTORS, limit.rlim_max);
    if (setrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_cur < WANTED_DESCRIPTORS) {
        report(LOG_WARNING, "may open " + std::to_string(limit.rlim_cur) + " files only: with many connections, " +
                                "further ones will wait without an answer; raise the hard limit (\"ulimit -Hn\")");
    }
}

void warnOfSocketGroup() {
    const group* entry = getgrgid(SOCKET_GROUP);
    if (entry == nullptr) {
        report(LOG_WARNING, "the host has no group 101: the members of a group that gets this number will be able "
                            "to have programs run as root, through the daemon's socket");
        return;
    }
    const std::string name = entry->gr_name;
    if (std::find(ADMINISTRATORS.begin(), ADMINISTRATORS.end(), name) == ADMINISTRATORS.end()) {
        report(LOG_WARNING, "group 101 of the host is \"" + name + "\", not one of administrators: its members can " +
                                "have programs run as root, through the daemon's socket");
    }
}
