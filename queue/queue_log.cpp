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
    va_list arguments;
    va_start(arguments, format);
    std::vfprintf(stderr, format, arguments);
    va_end(arguments);
    std::fputc('\n', stderr);
    errno = callersErrno;
}

} // namespace Backup
} // namespace MARU
