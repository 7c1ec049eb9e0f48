#pragma once

namespace MARU {
namespace Backup {

/** Whether the daemon's diary has its debug lines. */
extern bool queueDebugEnabled;

/**
 * Writes one line of the daemon's diary to standard error, as it is: no time,
 * no level, no process id. `level` is a syslog priority and only decides
 * whether the line is written: debug lines (7) need queueDebugEnabled. errno is
 * left as it was.
 */
void queueLog(int level, const char* format, ...) __attribute__((format(printf, 2, 3)));

} // namespace Backup
} // namespace MARU
