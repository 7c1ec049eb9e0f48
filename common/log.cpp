#include "common/log.h"

#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>

namespace MARU {
namespace Backup {

void logLocated(int priority, const char* unit, int line, const char* format, ...) {
    const int callersErrno = errno;

    // Formats are short literals of ours, so this holds any of them; the
    // arguments, which can be of any length, are left to vsyslog.
    char located[256];
    std::snprintf(located, sizeof located, "(%d) [%s] %s:%d %s", static_cast<int>(getpid()),
                  priority == LOG_DEBUG ? "debug" : "err", unit, line, format);

    va_list arguments;
    va_start(arguments, format);
    errno = callersErrno;
    vsyslog(priority, located, arguments);
    va_end(arguments);
    errno = callersErrno;
}

} // namespace Backup
} // namespace MARU
