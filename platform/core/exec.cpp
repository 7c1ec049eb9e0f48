#include <marucore/exec.h>

#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <exception>
#include <vector>

#include <marucore/error.h>

namespace {

const char* const UNIT = "exec.cpp";
const int FIRST_OTHER_DESCRIPTOR = STDERR_FILENO + 1;
const int FAILED = -1;

/** What posix_spawn() does in the child between its start and the program. */
class SpawnPlan {
public:
    SpawnPlan() {
        posix_spawn_file_actions_init(&actions);
        posix_spawnattr_init(&attributes);
    }
    ~SpawnPlan() {
        posix_spawnattr_destroy(&attributes);
        posix_spawn_file_actions_destroy(&actions);
    }
    SpawnPlan(const SpawnPlan&) = delete;
    SpawnPlan& operator=(const SpawnPlan&) = delete;

    /** 0, or an error number. */
    int prepare() {
        // sigfillset() leaves out the two signals that glibc keeps to itself,
        // and posix_spawn() would have the program start with those ignored.
        sigset_t all;
        std::memset(&all, 0xff, sizeof all);
        sigset_t none;
        sigemptyset(&none);
        posix_spawnattr_setsigdefault(&attributes, &all);
        posix_spawnattr_setsigmask(&attributes, &none);
        posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
        return posix_spawn_file_actions_addclosefrom_np(&actions, FIRST_OTHER_DESCRIPTOR);
    }

    posix_spawn_file_actions_t actions;
    posix_spawnattr_t attributes;
};

/** Runs the program and waits for it; false if there is no `status` of it. */
bool run(const char* path, const std::vector<char*>& argv, int& status) {
    SpawnPlan plan;
    pid_t child = -1;
    if (plan.prepare() != 0 || posix_spawn(&child, path, &plan.actions, &plan.attributes, argv.data(), environ) != 0) {
        return false;
    }
    while (waitpid(child, &status, 0) < 0) {
        if (errno != EINTR) {
            return false;
        }
    }
    return true;
}

int exitCode(const char* path, const std::vector<char*>& argv) {
    int status = 0;
    if (!run(path, argv, status)) {
        MLIBCErrSetEx(MLIBC_ERR_EXEC, UNIT, __LINE__);
        return FAILED;
    }
    if (!WIFEXITED(status)) {
        MLIBCErrSetEx(MLIBC_ERR_KILLED, UNIT, __LINE__);
        return FAILED;
    }
    return WEXITSTATUS(status);
}

} // namespace

int MLIBCExec(const char* path, ...) {
    if (!path || !*path) {
        MLIBCErrSetEx(MLIBC_ERR_BAD_PARAMETER, UNIT, __LINE__);
        return FAILED;
    }
    int result = FAILED;
    va_list arguments;
    va_start(arguments, path);
    try {
        std::vector<char*> argv = {const_cast<char*>(path)};
        do {
            argv.push_back(va_arg(arguments, char*));
        } while (argv.back());
        result = exitCode(path, argv);
    } catch (const std::exception&) { // no memory for the list; a C caller catches nothing
        MLIBCErrSetEx(MLIBC_ERR_EXEC, UNIT, __LINE__);
    }
    va_end(arguments);
    return result;
}
