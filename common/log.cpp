#include "common/log.h"

#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>

namespace MARU {
namespace Backup {

namespace {

/** Logs behind `prefix`, which has no percent sign; `error` is what "%m" stands for, and errno afterwards. */
void logBehind(const char* prefix, int error, int priority, const char* unit, int line, const char* format,
               va_list arguments) {
    // Prefixes, units and formats are short literals of ours, so this holds any
    // of them; the arguments, which can be of any length, are left to vsyslog.
    char whole[256];
    std::snprintf(whole, sizeof whole, "%s%s:%d %s", prefix, unit, line, format);
    errno = error;
    vsyslog(priority, whole, arguments);
    errno = error;
}

} // namespace

void logLocated(int priority, const char* unit, int line, const char* format, ...) {
    const int callersErrno = errno;
    char prefix[32];
    std::snprintf(prefix, sizeof prefix, "(%d) [%s] ", static_cast<int>(getpid()),
                  priority == LOG_DEBUG ? "debug" : "err");
    va_list arguments;
    va_start(arguments, format);
    logBehind(prefix, callersErrno, priority, unit, line, format, arguments);
    va_end(arguments);
}

void logPlain(int priority, const char* unit, int line, const char* format, ...) {
    const int callersErrno = errno;
    va_list arguments;
    va_start(arguments, format);
    logBehind("", callersErrno, priority, unit, line, format, arguments);
    va_end(arguments);
}

} // namespace Backup
} // namespace MARU
