#include <marucore/exec.h>

#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <exception>
#include <vector>

#include <marucore/error.h>

#include "shared/spawn_plan.h"

namespace {

const char* const UNIT = "exec.cpp";
const int FAILED = -1;

/** Runs the program and waits for it; false if there is no `status` of it. */
bool run(const char* path, const std::vector<char*>& argv, int& status) {
    SpawnPlan plan;
    pid_t child = -1;
    if (plan.resetSignals() != 0 || plan.closeOtherDescriptors() != 0 ||
        posix_spawn(&child, path, &plan.actions, &plan.attributes, argv.data(), environ) != 0) {
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
