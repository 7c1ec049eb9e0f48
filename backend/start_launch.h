#pragma once

namespace MARU {
namespace Backup {

class BackendManager;
class Job;

/**
 * Starts a child process that does what `backend.launch(job)` does in a forked
 * one, and exits with 127 if the command cannot be run; its process id. The
 * caller's memory, which may be large, is not duplicated for it.
 *
 * Negative if that cannot be done here: if launch() might have something to
 * log, which it does under the child's process id, or wait for; or no child can
 * be made. Nothing has been logged then, and a forked child is to call launch().
 */
int startLaunch(const BackendManager& backend, const Job& job);

} // namespace Backup
} // namespace MARU
