#pragma once

#include <marubackup/export.h>

namespace MARU {
namespace Backup {

/**
 * The whole queue daemon: serves "/var/run/marubackupd.socket", admits, queues,
 * launches, supervises and removes jobs until it is told to end.
 *
 * Call it once per process, as root, from a process without other threads. It
 * takes over SIGINT, SIGQUIT, SIGABRT, SIGTERM, SIGHUP, SIGCHLD and SIGPIPE,
 * reports to syslog, and writes its diary to standard error: one line an event,
 * with `debug` also one for each request and each look at the queues.
 *
 * Blocks until one of the first four signals arrives. Then every job is sent
 * SIGTERM, is given five seconds, and is sent SIGKILL; the socket is removed,
 * and the result is true. False if the daemon could not start to serve; the
 * reason is in syslog. It does not look whether another daemon serves the
 * socket already: it takes the path over, so the hosting program has to look.
 *
 * SIGHUP writes the list of all jobs to standard error.
 */
MARUBACKUP_API bool runQueueServer(bool debug);

} // namespace Backup
} // namespace MARU
