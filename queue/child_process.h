#pragma once

#include <sys/types.h>

namespace MARU {
namespace Backup {

/**
 * fork(), with nothing of the daemon's signal set-up in the child: it returns
 * there with default dispositions and an empty mask. A signal that arrives in
 * between belongs to the process it was sent to; the child never passes one on
 * to the daemon's loop as the daemon's own.
 */
pid_t forkWithDefaultSignals();

/** Waits that many seconds in full, whatever signals are handled meanwhile. */
void waitFullSeconds(unsigned int seconds);

} // namespace Backup
} // namespace MARU
