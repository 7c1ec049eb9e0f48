#include "shared/daemon_socket.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>

bool isDaemonThere() {
    const int callersErrno = errno;
    const int probe = socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    bool there = true;
    if (probe >= 0) {
        const sockaddr_un address = {AF_UNIX, MARUBACKUP_SOCKET};
        const int result = connect(probe, reinterpret_cast<const sockaddr*>(&address), sizeof address);
        there = result == 0 || (errno != ENOENT && errno != ECONNREFUSED);
        close(probe);
    }
    errno = callersErrno;
    return there;
}
