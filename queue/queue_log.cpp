#include "queue/queue_log.h"

#include <syslog.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>

namespace MARU {
namespace Backup {

bool queueDebugEnabled = false;

void queueLog(int level, const char* format, ...) {
    if (level == LOG_DEBUG && !queueDebugEnabled) {
        return;
    }
    const int callersErrno = errno;
    // Standard error is not buffered: a line that is written at one stroke costs
    // one system call, and stays whole beside what the jobs write there. Formats
    // are short literals of ours, so this holds any of them.
    char whole[256];
    std::snprintf(whole, sizeof whole, "%s\n", format);
    va_list arguments;
    va_start(arguments, format);
    std::vfprintf(stderr, whole, arguments);
    va_end(arguments);
    errno = callersErrno;
}

} // namespace Backup
} // namespace MARU
