#include <marubackup-util/sub_process.h>

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <map>
#include <memory>
#include <optional>
#include <vector>

#include <marubackup-util/path.h>

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

/** The start of `text` on one line: what a client has put into a name cannot look like a line of its own. */
std::string shown(const std::string& text) {
    std::string line = text.substr(0, MAX_SHOWN);
    std::replace_if(
        line.begin(), line.end(), [](char c) { return static_cast<unsigned char>(c) < ' ' || c == '\x7f'; }, '?');
    return line.size() < text.size() ? line + "..." : line;
}

/** Writes why a program does not run to `descriptor`, if that is open; leaves errno alone. */
void report(int descriptor, const SubProcessPrivate& d, const std::string& reason) {
    const int error = errno;
    const std::string name = d.argv.empty() ? std::string() : d.argv.front();
    const std::string line = "cannot run [" + shown(name) + "]: " + reason + "\n";
    [[maybe_unused]] const ssize_t result = write(descriptor, line.data(), line.size());
    errno = error;
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
    explicit Program(const SubProcessPrivate& d) : argv(pointersTo(d.argv)) {
        if (const char* const part = malformedPart(d)) {
            errno = EINVAL;
            report(STDERR_FILENO, d, part);
            return;
        }
        variables = mergedEnvironment(d.additions);
        envp = pointersTo(variables);
        path = findProgram(d.argv.front());
        if (path.empty()) {
            report(STDERR_FILENO, d, std::strerror(errno));
        }
    }

    /** False, reported, and with errno set just after the construction, if there is none to run. */
    bool isFound() const {
        return !path.empty();
    }

    std::string path;
    std::vector<char*> argv;
    std::vector<char*> envp;

private:
    std::vector<std::string> variables;
};

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
                            program.envp.data());
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

/** Makes `descriptor` append to the file `path`; false, with errno set, if it cannot be opened. */
bool openOutput(int descriptor, const std::string& path) {
    const int opened = open(path.c_str(), OUTPUT_FLAGS, OUTPUT_MODE);
    if (opened < 0 || opened == descriptor) {
        return opened == descriptor;
    }
    const bool done = dup2(opened, descriptor) == descriptor;
    const int problem = errno;
    close(opened);
    errno = problem;
    return done;
}

/** Puts the output files in place; the one that cannot be opened, with errno set, or null. */
const std::string* redirectOutput(const SubProcessPrivate& d) {
    if (d.stdOutput && !openOutput(STDOUT_FILENO, *d.stdOutput)) {
        return &*d.stdOutput;
    }
    if (!d.stdError) {
        return nullptr;
    }
    const bool done = d.stdError == d.stdOutput ? dup2(STDOUT_FILENO, STDERR_FILENO) == STDERR_FILENO
                                                : openOutput(STDERR_FILENO, *d.stdError);
    return done ? nullptr : &*d.stdError;
}

/** Keeps every descriptor but 0, 1 and 2 from the next program; false, with errno set, if that fails. */
bool markCloseOnExec() {
    if (close_range(FIRST_OTHER_DESCRIPTOR, ~0U, CLOSE_RANGE_CLOEXEC) == 0) {
        return true;
    }
    // A kernel older than 5.11, or a filter of system calls that does not know it.
    const std::unique_ptr<DIR, int (*)(DIR*)> folder(opendir("/proc/self/fd"), closedir);
    if (!folder) {
        return false;
    }
    while (const dirent* entry = readdir(folder.get())) {
        const int descriptor = std::atoi(entry->d_name); // 0 for the two dot entries
        if (descriptor >= FIRST_OTHER_DESCRIPTOR && fcntl(descriptor, F_SETFD, FD_CLOEXEC) != 0) {
            return false;
        }
    }
    return true;
}

void emptySignalMask() {
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
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
    if (!program.isFound()) {
        return -1;
    }
    pid_t child = -1;
    const int error = spawn(*d, program, child);
    if (error != 0) {
        errno = error;
        report(STDERR_FILENO, *d, std::strerror(error));
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
    if (!program.isFound()) {
        return -1;
    }
    // Where the caller reports, also when the program's errors have a file of their own.
    const int reports = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, FIRST_OTHER_DESCRIPTOR);
    resetSignalDispositions();
    setpgid(0, 0);
    const std::string* const unopened = redirectOutput(*d);
    if (!unopened && markCloseOnExec()) {
        // Last, so that a signal held back until now finds the defaults in place.
        emptySignalMask();
        execve(program.path.c_str(), program.argv.data(), program.envp.data());
    }
    const int error = errno;
    report(reports, *d, (unopened ? "its output file [" + shown(*unopened) + "]: " : "") + std::strerror(error));
    close(reports);
    errno = error;
    return -1;
}

} // namespace Backup
} // namespace MARU
