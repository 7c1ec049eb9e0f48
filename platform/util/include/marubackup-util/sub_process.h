#pragma once

#include <list>
#include <string>

#include <marubackup-util/export.h>

namespace MARU {
namespace Backup {

class SubProcessPrivate;

/**
 * A program to be run, with its arguments, additions to its environment, and
 * files for its output. No shell is involved anywhere.
 *
 * A program named without a slash is searched for in the caller's PATH. It
 * starts with default signal dispositions, an empty signal mask, and no open
 * descriptor but 0, 1 and 2, and leads a process group of its own: a program
 * that signals its group does not reach the caller. What is not set here it
 * inherits from the caller.
 *
 * Nothing can be run if the list or the program's name is empty, if a variable
 * has no name or one with a "=", or if an argument, a variable or a file name
 * contains a NUL. Why a program could not be run is written to the caller's
 * standard error, as "cannot run [program]: reason" on one line. Nothing throws
 * but a failed allocation.
 */
class MARUBACKUP_UTIL_API SubProcess {
public:
    /** The program, and then its arguments. */
    explicit SubProcess(std::list<std::string> argv);
    ~SubProcess();
    SubProcess(const SubProcess&) = delete;
    SubProcess& operator=(const SubProcess&) = delete;

    /** Adds a variable to the program's environment, or replaces one there. */
    void setEnv(const std::string& name, const std::string& value);

    // Output files. Made with mode 0640 (less the umask) if missing, and
    // appended to, never truncated. Both streams may go to one file. A file
    // that cannot be opened keeps the program from starting. The last argument
    // is reserved; pass 0.

    void setStdOutput(const std::string& path, int reserved);
    void setStdError(const std::string& path, int reserved);

    /**
     * Runs the program and waits until it has ended, whatever signals arrive
     * meanwhile. Returns its wait status, to be read with WIFEXITED() and its
     * like; negative, with errno set, if it could not be run, and also if the
     * caller ignores SIGCHLD, since then the kernel keeps no status. The
     * caller's memory is not duplicated for it.
     */
    int call() const;

    /**
     * Replaces the calling process with the program. Returns only if that
     * cannot be done: -1, with errno set. By then the caller's signal
     * dispositions and mask may be reset, its output redirected, and its
     * descriptors from 3 up marked close-on-exec.
     */
    int exec() const;

    /**
     * Starts the program in a child process at the nice value `priority`, and
     * does not wait for its end; the child's process id. It does there what
     * exec() does, up to the report of a program that the kernel does not take,
     * after which the child exits with 127. The caller's memory is not
     * duplicated: the child uses it, changing nothing, until it is the program,
     * and the caller stands still for so long.
     *
     * Negative if that cannot be done: if no child can be made, or exec() would
     * report something before it turns to the kernel, or an output file is one
     * whose opening might wait. Nothing is reported, and exec() in a forked
     * child is the way. errno is left alone.
     *
     * An appliance's own library may lack it.
     */
    int start(int priority) const;

private:
    SubProcessPrivate* d;
};

} // namespace Backup
} // namespace MARU
