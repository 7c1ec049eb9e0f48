#include "instance_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "report.h"
#include "shared/daemon_socket.h"

namespace {

const char LOCK_FILE[] = "/var/run/marubackupd.lock";

/** The process id that the holder wrote; 0 if it has not done so yet. */
int holder(int descriptor) {
    char text[16] = "";
    const ssize_t length = pread(descriptor, text, sizeof text - 1, 0);
    return length > 0 ? std::atoi(text) : 0;
}

void reportHolder(int descriptor) {
    const int pid = holder(descriptor);
    const std::string known = pid > 0 ? " with \"kill " + std::to_string(pid) + "\"" : "";
    report(LOG_ERR, "a daemon serves " MARUBACKUP_SOCKET " already: use that one, or stop it first" + known);
}

} // namespace

InstanceLock::~InstanceLock() {
    if (held) {
        // If this fails the process id stays for readers; the lock goes all the same.
        [[maybe_unused]] const int result = ftruncate(descriptor, 0);
    }
    if (descriptor >= 0) {
        close(descriptor);
    }
}

bool InstanceLock::acquire() {
    // Readable by root only: whoever can open the file can lock it.
    descriptor = open(LOCK_FILE, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
    if (descriptor < 0 || fchmod(descriptor, 0600) != 0) {
        report(LOG_ERR, std::string("cannot open the lock file ") + LOCK_FILE + ": " + std::strerror(errno));
        return false;
    }
    if (flock(descriptor, LOCK_EX | LOCK_NB) != 0) {
        reportHolder(descriptor);
        return false;
    }
    held = true;
    if (isDaemonThere()) {
        report(LOG_ERR, "another program serves " MARUBACKUP_SOCKET " already: stop it first (\"ss -xlp\" names it)");
        return false;
    }
    if (ftruncate(descriptor, 0) != 0 || dprintf(descriptor, "%d\n", static_cast<int>(getpid())) < 0) {
        report(LOG_WARNING, std::string("cannot write the process id to ") + LOCK_FILE + ": " + std::strerror(errno));
    }
    return true;
}
