#pragma once

#include <functional>
#include <list>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <marubackup-util/sub_process.h>

#include "support/temp_dir.h"

enum class Way { CALL, EXEC, START };

/** The tests of it hold for call(), exec() and start() alike. */
class ARunProgram : public testing::TestWithParam<Way> {
protected:
    using SubProcess = MARU::Backup::SubProcess;
    using Preparation = std::function<void()>;

    /**
     * Runs `process` from a caller of its own, a forked child with the system's
     * PATH that `prepare` has changed before. How the program ended in words,
     * as of describeStatus().
     */
    std::string outcome(
        const SubProcess& process, const Preparation& prepare = [] {});

    /** What `process` writes to its standard output; it must end with 0. */
    std::string outputOf(
        SubProcess& process, const Preparation& prepare = [] {});

    /** What `process`, which does not run, makes its caller report. */
    std::string reportOf(SubProcess& process);

    /** Runs a file that only a shell could make sense of, and that leaves the file `ran`, by its path and by its name. */
    std::vector<std::string> outcomesOfAScriptWithoutInterpreter();

    /** Runs a program that leaves the file `ran`, first its output and then its errors going to `path`. */
    std::vector<std::string> outcomesWithOutputTo(const std::string& path);

    /** What outcome() says of a program that the kernel does not take. */
    static std::string refusal(const std::string& reason);

    const support::TempDir dir;
    const std::string out = dir.path("out");
    const std::string err = dir.path("err");
    const std::string ran = dir.path("ran");
};

std::list<std::string> shell(const std::string& script);

/** The rest of the line of `text` that starts with `label`. */
std::string field(const std::string& text, const std::string& label);

/** Opens descriptors that a program inherits if nobody keeps them from it. */
void openMoreDescriptors();
