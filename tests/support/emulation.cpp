#include "support/emulation.h"

#include <fcntl.h>
#include <unistd.h>

#include <climits>
#include <string>

namespace support {

bool isEmulated() {
    // An emulator answers for "/proc/self/exe" as a whole, with the program's own name.
    const int self = open("/proc/self", O_PATH | O_DIRECTORY | O_CLOEXEC);
    char target[PATH_MAX] = "";
    const ssize_t length = readlinkat(self, "exe", target, sizeof target);
    close(self);
    const std::string running(target, length > 0 ? static_cast<std::size_t>(length) : 0);
    const std::string name = running.substr(running.rfind('/') + 1);
    return name.rfind("qemu-", 0) == 0;
}

} // namespace support
