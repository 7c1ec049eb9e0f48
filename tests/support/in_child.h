#pragma once

#include <sys/types.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>
#include <string>
#include <system_error>

#include "support/descriptor_reader.h"

namespace support {

/** What runInChild() ends its child with after an exception. */
const int CHILD_THREW = 125;

/**
 * Starts `body`, a callable that returns the exit status, in a forked child. It
 * has the whole process to itself: it may close descriptors, change signals, or
 * replace the process. An assertion that fails in it is lost, so it reports by
 * its exit status or through a file.
 */
template <typename Body>
pid_t startInChild(Body body) {
    std::fflush(nullptr);
    DescriptorReader::pauseAll();
    const pid_t child = fork();
    const int error = errno;
    if (child != 0) {
        DescriptorReader::resumeAll();
    }
    if (child < 0) {
        throw std::system_error(error, std::generic_category(), "fork");
    }
    if (child == 0) {
        DescriptorReader::forgetAll();
        int status = CHILD_THREW;
        try {
            status = body();
        } catch (const std::exception& problem) {
            std::fprintf(stderr, "exception in the child: %s\n", problem.what());
        }
        std::fflush(nullptr);
        _exit(status);
    }
    return child;
}

/** Waits for the end of `child`, whatever signals arrive; its wait status. */
inline int waitForChild(pid_t child) {
    int status = 0;
    while (waitpid(child, &status, 0) < 0) {
        if (errno != EINTR) {
            throw std::system_error(errno, std::generic_category(), "waitpid");
        }
    }
    return status;
}

/** Runs `body` as startInChild() does, and waits for it; its wait status. */
template <typename Body>
int runInChild(Body body) {
    return waitForChild(startInChild(body));
}

/** A wait status in words: "exit 3", "signal 9", or "failed: No such file…" for a negative one, from errno. */
inline std::string describeStatus(int status) {
    if (status < 0) {
        return std::string("failed: ") + std::strerror(errno);
    }
    if (WIFEXITED(status)) {
        return "exit " + std::to_string(WEXITSTATUS(status));
    }
    if (WIFSIGNALED(status)) {
        return "signal " + std::to_string(WTERMSIG(status));
    }
    return "status " + std::to_string(status);
}

} // namespace support
