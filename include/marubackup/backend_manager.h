#pragma once

#include <list>
#include <string>

#include <marubackup/export.h>

namespace MARU {
namespace Backup {

class BackendManagerPrivate;
class Job;

/**
 * What one backend declares for one action, and the commands that it declares.
 *
 * A backend is a file `<name>.conf` with a section for each action that it
 * supports. A file in "/usr/local/share/marubackup" hides the one of the same
 * name in "/usr/maru/share/marubackup" as a whole; their sections are never
 * mixed.
 *
 * Make one, load() a section, then ask. Asked before that, or after a load()
 * that failed, everything reports "backend not loaded" to syslog and answers
 * false or the empty text. One object is used by one thread at a time. No
 * mistake in a file leads to an exception.
 */
class MARUBACKUP_API BackendManager {
public:
    /** A manager with nothing loaded. */
    BackendManager();
    ~BackendManager();
    BackendManager(const BackendManager&) = delete;
    BackendManager& operator=(const BackendManager&) = delete;

    /**
     * Reads the section `action` (a text of action2str()) of the backend's
     * file, in place of whatever was loaded before. False if there is no such
     * backend, file or section, or the file cannot be read or is malformed; a
     * debug line in syslog says which file was tried. A name that cannot be a
     * file's name in the folder (one with a slash or a NUL) is no backend.
     */
    bool load(const std::string& backend, const std::string& action);

    /**
     * Fills `backends` with the names of the backends installed in
     * "/usr/maru/share/marubackup", unsorted. Names of one character are not
     * listed. True with an empty list if the folder does not exist; false with
     * an empty list if it cannot be read.
     */
    static bool listBackend(std::list<std::string>& backends);

    /** Whether the section has the key `delegate`, with whatever value. */
    bool isDelegate() const;
    /**
     * The template of its jobs' unique strings: the key `unique`, also if it is
     * empty, or "_job_id.{{job_id}}" without that key.
     */
    std::string getUniqueFormat() const;
    /** That template, expanded for `job`; empty if the template is. */
    std::string getJobUnique(const Job& job) const;

    /**
     * Runs the section's check command and waits for it, without a time-out.
     * True if it exited with status 0, or if the section has none; false if it
     * exited otherwise, was killed, or could not be run.
     */
    bool check(const Job& job) const;

    /**
     * Replaces the calling process with the section's command for the job:
     * `command_launch`, or `command_<branch>` for a job with a command branch.
     * Its output goes to the files `pipe_stdout` and `pipe_stderr`, and it runs
     * at the nice value `priority`, 5 without that key.
     *
     * Returns only on failure: false if the section has no such command (a line
     * in syslog says so), true if the command cannot be run, for example for
     * want of the program. The process's nice value and signal set-up are
     * changed by then, so call it in a process made for it.
     */
    bool launch(const Job& job) const;

private:
    friend int startLaunch(const BackendManager& backend, const Job& job);

    BackendManagerPrivate* d;
};

} // namespace Backup
} // namespace MARU
