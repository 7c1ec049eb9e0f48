#pragma once

#include <syslog.h>

namespace MARU {
namespace Backup {

/**
 * Writes one line to syslog: "(pid) [err] unit:line message", or "[debug]" at
 * LOG_DEBUG. A "%m" in `format` stands for the caller's errno, which is left
 * as it was.
 */
void logLocated(int priority, const char* unit, int line, const char* format, ...)
    __attribute__((format(printf, 4, 5)));

/** The same without process id and level: "unit:line message". */
void logPlain(int priority, const char* unit, int line, const char* format, ...) __attribute__((format(printf, 4, 5)));

} // namespace Backup
} // namespace MARU

// A file that logs names itself once, as LOG_UNIT; the line is the statement's own.
// "%m" is one of syslog's extensions, hence __extension__.
#define LOG_LOCATED_ERR(...) __extension__ ::MARU::Backup::logLocated(LOG_ERR, LOG_UNIT, __LINE__, __VA_ARGS__)
#define LOG_LOCATED_DEBUG(...) __extension__ ::MARU::Backup::logLocated(LOG_DEBUG, LOG_UNIT, __LINE__, __VA_ARGS__)
#define LOG_PLAIN_ERR(...) __extension__ ::MARU::Backup::logPlain(LOG_ERR, LOG_UNIT, __LINE__, __VA_ARGS__)
