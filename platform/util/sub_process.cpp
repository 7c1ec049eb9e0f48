#include <marubackup-util/sub_process.h>

#include <dirent.h>
#include <fcntl.h>
#include <pthread.h>
#include <signal.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <map>
#include <optional>
#include <vector>

#include <marubackup-util/path.h>

#include "descriptor.h"
#include "shared/spawn_plan.h"

namespace MARU {
namespace Backup {

class SubProcessPrivate {
public:
    std::list<std::string> argv;
    std::map<std::string, std::string> additions;
    std::optional<std::string> stdOutput;
    std::optional<std::string> stdError;
};

namespace {

const char DEFAULT_SEARCH_PATH[] = "/bin:/usr/bin";
const int OUTPUT_FLAGS = O_WRONLY | O_CREAT | O_APPEND | O_NOCTTY;
const mode_t OUTPUT_MODE = 0640;

const std::size_t MAX_SHOWN = 200;
const int EXIT_NOT_RUN = 127;

/** The start of `text` on one line: what a client has put into a name cannot look like a line of its own. */
std::string shown(const std::string& text) {
    std::string line = text.substr(0, MAX_SHOWN);
    std::replace_if(
        line.begin(), line.end(), [](char c) { return static_cast<unsigned char>(c) < ' ' || c == '\x7f'; }, '?');
    return line.size() < text.size() ? line + "..." : line;
}

bool hasNul(const std::string& text) {
    return text.find('\0') != std::string::npos;
}

/** What cannot be handed to the kernel as it is; null if all can. */
const char* malformedPart(const SubProcessPrivate& d) {
    if (d.argv.empty() || d.argv.front().empty()) {
        return "no program is named";
    }
    if (std::any_of(d.argv.begin(), d.argv.end(), hasNul)) {
        return "an argument contains a NUL byte";
    }
    for (const auto& [name, value] : d.additions) {
        if (name.empty() || name.find('=') != std::string::npos || hasNul(name) || hasNul(value)) {
            return "a variable's name is empty or contains \"=\", or one contains a NUL byte";
        }
    }
    if ((d.stdOutput && hasNul(*d.stdOutput)) || (d.stdError && hasNul(*d.stdError))) {
        return "an output file's name contains a NUL byte";
    }
    return nullptr;
}

/** Whether `path` is a program that we may run; if not, errno says why. */
bool isProgram(const std::string& path) {
    struct stat info = {};
    if (stat(path.c_str(), &info) != 0) {
        return false;
    }
    if (!S_ISREG(info.st_mode)) {
        errno = EACCES;
        return false;
    }
    return faccessat(AT_FDCWD, path.c_str(), X_OK, AT_EACCESS) == 0;
}

/** The file to run for `name`; empty, with errno set, if PATH leads to none. */
std::string findProgram(const std::string& name) {
    if (name.find('/') != std::string::npos) {
        return name;
    }
    const char* searchPath = std::getenv("PATH");
    const std::string folders = searchPath ? searchPath : DEFAULT_SEARCH_PATH;
    int problem = ENOENT;
    for (std::size_t start = 0; start <= folders.size();) {
        const std::size_t end = std::min(folders.find(':', start), folders.size());
        // An empty folder is the current one, and adds nothing to the name.
        std::string candidate = Path::join(folders.substr(start, end - start), name);
        if (isProgram(candidate)) {
            return candidate;
        }
        if (errno == EACCES) {
            problem = EACCES;
        }
        start = end + 1;
    }
    errno = problem;
    return std::string();
}

/** Our environment with `additions`, each variable as NAME=value. */
std::vector<std::string> mergedEnvironment(const std::map<std::string, std::string>& additions) {
    std::vector<std::string> variables;
    for (char** inherited = environ; inherited && *inherited; ++inherited) {
        const std::string variable(*inherited);
        if (additions.count(variable.substr(0, variable.find('='))) == 0) {
            variables.push_back(variable);
        }
    }
    for (const auto& [name, value] : additions) {
        variables.push_back(name + "=" + value);
    }
    return variables;
}

/** A list as the kernel takes it, ended by a null; it points into `texts`. */
template <typename Texts>
std::vector<char*> pointersTo(const Texts& texts) {
    std::vector<char*> pointers;
    for (const std::string& text : texts) {
        pointers.push_back(const_cast<char*>(text.c_str()));
    }
    pointers.push_back(nullptr);
    return pointers;
}

/** What execve() takes for a SubProcess, which must outlive it. */
class Program {
public:
    explicit Program(const SubProcessPrivate& d)
        : argv(pointersTo(d.argv)), reportStart("cannot run [" + shown(d.argv.empty() ? "" : d.argv.front()) + "]: ") {
        problem = malformedPart(d);
        if (problem) {
            error = EINVAL;
            return;
        }
        path = findProgram(d.argv.front());
        if (path.empty()) {
            error = errno;
            problem = std::strerror(error);
            return;
        }
        if (!d.additions.empty()) {
            variables = mergedEnvironment(d.additions);
            mergedEnvp = pointersTo(variables);
        }
    }

    /** The program's environment; the caller's own if nothing is added to it. */
    char* const* envp() const {
        return mergedEnvp.empty() ? environ : mergedEnvp.data();
    }

    /** Writes to `descriptor`, if that is open, why the program does not run; leaves errno alone. Allocates nothing. */
    void report(int descriptor, const char* reason) const {
        const int callersErrno = errno;
        const iovec line[] = {partOf(reportStart.c_str()), partOf(reason), partOf("\n")};
        [[maybe_unused]] const ssize_t result = writev(descriptor, line, 3);
        errno = callersErrno;
    }

    std::string path;
    std::vector<char*> argv;
    const char* problem = nullptr; ///< why there is none to run; null if there is
    int error = 0;                 ///< the same as an error number

private:
    static iovec partOf(const char* text) {
        return {const_cast<char*>(text), std::strlen(text)};
    }

    std::string reportStart;
    std::vector<std::string> variables;
    std::vector<char*> mergedEnvp;
};

/** Reports why there is none to run, and sets errno; -1. */
int reportMissing(const Program& program) {
    program.report(STDERR_FILENO, program.problem);
    errno = program.error;
    return -1;
}

/** Has the program write to that file; 0, or an error number. */
int openFile(SpawnPlan& plan, int descriptor, const std::string& path) {
    return posix_spawn_file_actions_addopen(&plan.actions, descriptor, path.c_str(), OUTPUT_FLAGS, OUTPUT_MODE);
}

/** 0, or an error number. */
int setDescriptors(SpawnPlan& plan, const SubProcessPrivate& d) {
    int error = 0;
    if (d.stdOutput) {
        error = openFile(plan, STDOUT_FILENO, *d.stdOutput);
    }
    if (error == 0 && d.stdError) {
        error = d.stdError == d.stdOutput
                    ? posix_spawn_file_actions_adddup2(&plan.actions, STDOUT_FILENO, STDERR_FILENO)
                    : openFile(plan, STDERR_FILENO, *d.stdError);
    }
    return error ? error : plan.closeOtherDescriptors();
}

/** Starts `program`; 0, or an error number. */
int spawn(const SubProcessPrivate& d, const Program& program, pid_t& child) {
    SpawnPlan plan;
    int error = plan.resetSignals(POSIX_SPAWN_SETPGROUP);
    if (error == 0) {
        error = setDescriptors(plan, d);
    }
    if (error == 0) {
        error = posix_spawn(&child, program.path.c_str(), &plan.actions, &plan.attributes, program.argv.data(),
                            program.envp());
    }
    return error;
}

void resetSignalDispositions() {
    // All zero is the default disposition in every layout. Not by sigaction(),
    // which refuses the two signals that glibc keeps to itself; whoever started
    // us may have left those ignored.
    const unsigned long byDefault[8] = {};
    const std::size_t maskSize = _NSIG / 8;
    for (int signalNumber = 1; signalNumber < _NSIG; ++signalNumber) {
        syscall(SYS_rt_sigaction, signalNumber, byDefault, nullptr, maskSize);
    }
}

/** Whether opening an output file may wait, as for the reader of a FIFO. */
enum class Opening { MAY_WAIT, AT_ONCE };

/** Opens `path` as a descriptor from 3 up; it is not open, and errno is set, if that fails. */
Descriptor openOutput(const std::string& path, Opening opening) {
    const int atOnce = opening == Opening::AT_ONCE ? O_NONBLOCK : 0;
    Descriptor opened(open(path.c_str(), OUTPUT_FLAGS | O_CLOEXEC | atOnce, OUTPUT_MODE));
    if (opened.isOpen() && opened.get() < FIRST_OTHER_DESCRIPTOR) {
        // The caller lacks a standard stream, whose place it has taken.
        opened = Descriptor(fcntl(opened.get(), F_DUPFD_CLOEXEC, FIRST_OTHER_DESCRIPTOR));
    }
    if (opened.isOpen() && atOnce) {
        fcntl(opened.get(), F_SETFL, O_APPEND); // writing may wait in any case
    }
    return opened;
}

/** The open output files of a SubProcess, which must outlive this. */
class Outputs {
public:
    Outputs(const SubProcessPrivate& d, Opening opening) : errorsJoinOutput(d.stdError && d.stdError == d.stdOutput) {
        open(d.stdOutput, opening, output);
        if (!errorsJoinOutput && !unopened) {
            open(d.stdError, opening, errors);
        }
    }

    /** Makes them the process' standard streams, by system calls alone; false, with errno set, if that fails. */
    bool putInPlace() const {
        if (output.isOpen() && dup2(output.get(), STDOUT_FILENO) < 0) {
            return false;
        }
        const int forErrors = errorsJoinOutput ? STDOUT_FILENO : errors.get();
        return forErrors < 0 || dup2(forErrors, STDERR_FILENO) >= 0;
    }

    const std::string* unopened = nullptr; ///< the first that cannot be opened, errno being set just afterwards

private:
    void open(const std::optional<std::string>& path, Opening opening, Descriptor& descriptor) {
        if (path) {
            descriptor = openOutput(*path, opening);
            unopened = descriptor.isOpen() ? nullptr : &*path;
        }
    }

    const bool errorsJoinOutput;
    Descriptor output;
    Descriptor errors;
};

/** The same where the kernel is older than 5.11, or a filter of system calls does not know close_range(). */
bool markOneByOne() {
    const Descriptor folder(open("/proc/self/fd", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    alignas(dirent64) char entries[1024];
    ssize_t got = -1;
    while (folder.isOpen() && (got = getdents64(folder.get(), entries, sizeof entries)) > 0) {
        const dirent64* entry = nullptr;
        for (const char* at = entries; at < entries + got; at += entry->d_reclen) {
            entry = reinterpret_cast<const dirent64*>(at);
            const int descriptor = std::atoi(entry->d_name); // 0 for the two dot entries
            if (descriptor >= FIRST_OTHER_DESCRIPTOR && fcntl(descriptor, F_SETFD, FD_CLOEXEC) != 0) {
                return false;
            }
        }
    }
    return got == 0;
}

/**
 * Keeps every descriptor but 0, 1 and 2 from the next program, by system calls
 * alone; false, with errno set, if that fails.
 */
bool markCloseOnExec() {
    return close_range(FIRST_OTHER_DESCRIPTOR, ~0U, CLOSE_RANGE_CLOEXEC) == 0 || markOneByOne();
}

void emptySignalMask() {
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
}

/** What the program does not share with its caller whatever it is. */
void leaveCaller() {
    resetSignalDispositions();
    setpgid(0, 0);
}

/** Becomes the program, by system calls alone. Returns only if that fails: reported, and with errno set. */
void becomeProgram(const Program& program, const Outputs& outputs) {
    // Where the caller reports, also when the program's errors have a file of their own.
    const int reports = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, FIRST_OTHER_DESCRIPTOR);
    if (outputs.putInPlace() && markCloseOnExec()) {
        // Last, so that a signal held back until now finds the defaults in place.
        emptySignalMask();
        execve(program.path.c_str(), program.argv.data(), program.envp());
    }
    const int error = errno;
    program.report(reports, std::strerror(error));
    close(reports);
    errno = error;
}

/** The mask of the calling thread, from which all signals are held back while this lives. */
class HeldSignals {
public:
    HeldSignals() {
        sigset_t all;
        sigfillset(&all);
        pthread_sigmask(SIG_SETMASK, &all, &old);
    }
    ~HeldSignals() {
        pthread_sigmask(SIG_SETMASK, &old, nullptr);
    }
    HeldSignals(const HeldSignals&) = delete;
    HeldSignals& operator=(const HeldSignals&) = delete;

private:
    sigset_t old;
};

/** The life of a child in its caller's memory, of which it changes nothing but its own frames and errno. */
[[noreturn, gnu::noinline]] void liveInCallersMemory(const Program& program, const Outputs& outputs, int priority) {
    leaveCaller();
    setpriority(PRIO_PROCESS, 0, priority);
    becomeProgram(program, outputs);
    _exit(EXIT_NOT_RUN);
}

/**
 * A function of its own, since the child runs on this frame until it has one
 * below: nothing that the caller still needs may be kept in it.
 */
[[gnu::noinline]] pid_t startInCallersMemory(const Program& program, const Outputs& outputs, int priority) {
    const pid_t child = vfork();
    if (child == 0) {
        liveInCallersMemory(program, outputs, priority);
    }
    return child;
}

} // namespace

SubProcess::SubProcess(std::list<std::string> argv) : d(new SubProcessPrivate) {
    d->argv.swap(argv);
}

SubProcess::~SubProcess() {
    delete d;
}

void SubProcess::setEnv(const std::string& name, const std::string& value) {
    d->additions[name] = value;
}

void SubProcess::setStdOutput(const std::string& path, int /*reserved*/) {
    d->stdOutput = path;
}

void SubProcess::setStdError(const std::string& path, int /*reserved*/) {
    d->stdError = path;
}

int SubProcess::call() const {
    const Program program(*d);
    if (program.problem) {
        return reportMissing(program);
    }
    pid_t child = -1;
    const int error = spawn(*d, program, child);
    if (error != 0) {
        program.report(STDERR_FILENO, std::strerror(error));
        errno = error;
        return -1;
    }
    int status = 0;
    while (waitpid(child, &status, 0) < 0) {
        if (errno != EINTR) {
            return -1;
        }
    }
    return status;
}

int SubProcess::exec() const {
    const Program program(*d);
    if (program.problem) {
        return reportMissing(program);
    }
    leaveCaller();
    const Outputs outputs(*d, Opening::MAY_WAIT);
    if (outputs.unopened) {
        const int error = errno;
        const std::string reason = "its output file [" + shown(*outputs.unopened) + "]: " + std::strerror(error);
        program.report(STDERR_FILENO, reason.c_str());
        errno = error;
        return -1;
    }
    becomeProgram(program, outputs);
    return -1;
}

int SubProcess::start(int priority) const {
    const int callersErrno = errno;
    pid_t child = -1;
    const Program program(*d);
    if (!program.problem) {
        const Outputs outputs(*d, Opening::AT_ONCE);
        if (!outputs.unopened) {
            const HeldSignals held;
            child = startInCallersMemory(program, outputs, priority);
        }
    }
    errno = callersErrno;
    return child;
}

} // namespace Backup
} // namespace MARU
