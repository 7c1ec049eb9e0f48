#include <marucore/exec.h>

#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include <marucore/error.h>

#include "support/emulation.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/signals.h"
#include "support/temp_dir.h"

using support::describeStatus;
using support::readFile;
using support::runInChild;

namespace {

int runShell(const std::string& script) {
    return MLIBCExec("/bin/sh", "-c", script.c_str(), nullptr);
}

/** That `result` is a failure, and the error slot says `code` and where. */
void expectFailure(int code, int result) {
    EXPECT_LT(result, 0);
    EXPECT_EQ(code, MLIBCErrGet());
    EXPECT_STREQ("exec.cpp", MLIBCErrorGetFile());
    EXPECT_GT(MLIBCErrorGetLine(), 0);
    MLIBCErrSetEx(MLIBC_ERR_NONE, nullptr, 0);
}

/** For children made for a test. */
void writeOutputTo(const std::string& path) {
    dup2(open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600), STDOUT_FILENO);
}

class AnExecutedProgram : public testing::Test {
protected:
    AnExecutedProgram() {
        MLIBCErrSetEx(MLIBC_ERR_NONE, nullptr, 0);
    }

    /** Calls by its name alone, from another folder, a program that PATH leads to, and that leaves the file `out`. */
    int callNamedInPath() const {
        std::filesystem::create_directory(dir.path("bin"));
        support::writeFile(dir.path("bin/program"), "#!/bin/sh\necho > " + out + "\n", 0755);
        setenv("PATH", dir.path("bin").c_str(), 1);
        std::filesystem::current_path(dir.path());
        return MLIBCExec("program", nullptr);
    }

    const support::TempDir dir;
    const std::string out = dir.path("out");
};

} // namespace

TEST_F(AnExecutedProgram, GivesItsExitStatus) {
    for (const int status : {0, 1, 2, 126, 127, 128, 255}) {
        EXPECT_EQ(status, runShell("exit " + std::to_string(status)));
    }
    EXPECT_EQ(MLIBC_ERR_NONE, MLIBCErrGet());
}

TEST_F(AnExecutedProgram, GetsItsArgumentsUpToTheFirstNull) {
    const char* const script = "printf '[%s]' \"$@\" > \"$0\"";

    EXPECT_EQ(0,
              MLIBCExec("/bin/sh", "-c", script, out.c_str(), "a b", "", "*", "$HOME", nullptr, "not this", nullptr));

    EXPECT_EQ("[a b][][*][$HOME]", readFile(out));
}

TEST_F(AnExecutedProgram, MayHaveNoArgumentsAndKnowsItsPath) {
    support::writeFile(dir.path("program"), "#!/bin/sh\necho $# $0 > " + out + "\n", 0755);

    EXPECT_EQ(0, MLIBCExec(dir.path("program").c_str(), nullptr, nullptr, nullptr));

    EXPECT_EQ("0 " + dir.path("program") + "\n", readFile(out));
}

TEST_F(AnExecutedProgram, MustBeOneThatCanBeRun) {
    SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    support::writeFile(dir.path("plain"), "#!/bin/sh\nexit 0\n", 0644);
    support::writeFile(dir.path("no_program"), "exit 0\n", 0755);
    support::writeFile(dir.path("no_interpreter"), "#!/nowhere\n", 0755);

    for (const char* name : {"missing", "plain", "no_program", "no_interpreter", "plain/below", "", "."}) {
        SCOPED_TRACE(name);
        expectFailure(MLIBC_ERR_EXEC, MLIBCExec(dir.path(name).c_str(), nullptr));
    }
}

TEST_F(AnExecutedProgram, IsNotLookedForInPath) {
    const int status = runInChild([this] { return callNamedInPath() != 0 ? 0 : 1; });

    EXPECT_EQ("exit 0", describeStatus(status));
    EXPECT_FALSE(std::filesystem::exists(out));
}

TEST_F(AnExecutedProgram, CannotBeRunIfOnlyPathLeadsToIt) {
    SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    const int status = runInChild([this] { return callNamedInPath() < 0 && MLIBCErrGet() == MLIBC_ERR_EXEC ? 0 : 1; });

    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST_F(AnExecutedProgram, MustBeNamed) {
    expectFailure(MLIBC_ERR_BAD_PARAMETER, MLIBCExec(nullptr, nullptr));
    expectFailure(MLIBC_ERR_BAD_PARAMETER, MLIBCExec("", nullptr));
}

TEST_F(AnExecutedProgram, HasNoExitStatusIfASignalEndedIt) {
    expectFailure(MLIBC_ERR_KILLED, runShell("kill -KILL $$"));
    expectFailure(MLIBC_ERR_KILLED, runShell("kill -TERM $$"));
}

TEST_F(AnExecutedProgram, StartsWithDefaultSignalsAndNoneBlocked) {
    const int status = runInChild([this] {
        support::changeAllSignals();
        writeOutputTo(out);
        return MLIBCExec("/bin/cat", "/proc/self/status", nullptr);
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    const std::string fields = readFile(out);
    for (const std::string field : {"SigBlk", "SigIgn", "SigCgt"}) {
        EXPECT_NE(std::string::npos, fields.find("\n" + field + ":\t0000000000000000\n")) << fields;
    }
}

TEST_F(AnExecutedProgram, HasNoDescriptorButTheStandardOnes) {
    const int status = runInChild([this] {
        writeOutputTo(out);
        for (const int descriptor : {0, 3, 17, 200}) {
            dup2(STDOUT_FILENO, descriptor);
        }
        return MLIBCExec("/bin/ls", "/proc/self/fd", nullptr);
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    EXPECT_EQ("0\n1\n2\n3\n", readFile(out)); // 3 is the folder that ls reads
}

TEST_F(AnExecutedProgram, SharesTheCallersEnvironmentFolderAndGroup) {
    const int status = runInChild([this] {
        setenv("NAME", "a value", 1);
        const std::string script = "read pid name state parent group rest < /proc/$$/stat; "
                                   "echo \"$NAME, $PWD, $group\" > " +
                                   out;
        return chdir("/usr") == 0 && setpgid(0, 0) == 0 && runShell(script) == 0 &&
                       readFile(out) == "a value, /usr, " + std::to_string(getpid()) + "\n"
                   ? 0
                   : 1;
    });
    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST_F(AnExecutedProgram, IsWaitedForWhateverSignalsArrive) {
    const std::string fifo = dir.path("fifo");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));
    static int ticks;
    static int listener;
    const auto countTick = [](int) {
        const int error = errno;
        if (++ticks == 100 && write(listener, "\n", 1) != 1) {
            _exit(2);
        }
        errno = error;
    };

    const int status = runInChild([&] {
        listener = open(fifo.c_str(), O_RDWR | O_CLOEXEC);
        support::handleSignal(SIGALRM, countTick);
        const itimerval everyMillisecond = {{0, 1000}, {0, 1000}};
        setitimer(ITIMER_REAL, &everyMillisecond, nullptr);
        return runShell("read line < " + fifo + "; exit 5");
    });

    EXPECT_EQ("exit 5", describeStatus(status));
}

TEST_F(AnExecutedProgram, HasNoExitStatusIfItsCallerKeepsNone) {
    const int status = runInChild([] {
        support::handleSignal(SIGCHLD, SIG_IGN);
        return runShell("exit 1") < 0 && MLIBCErrGet() == MLIBC_ERR_EXEC ? 0 : 1;
    });
    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST_F(AnExecutedProgram, IsNoLongerAChildAfterwards) {
    const int status = runInChild([] {
        const bool ran = runShell("exit 0") == 0 && runShell("kill -KILL $$") < 0;
        return ran && waitpid(-1, nullptr, WNOHANG) == -1 && errno == ECHILD ? 0 : 1;
    });
    EXPECT_EQ("exit 0", describeStatus(status));
}

namespace {

/** Has several threads ask at once; every other one of them is refused at last, by `refused` and with `code`. */
void askInThreads(int code, int (*refused)()) {
    std::vector<std::thread> threads;
    for (int number = 0; number < 8; ++number) {
        threads.emplace_back([=] {
            for (int round = 0; round < 5; ++round) {
                EXPECT_EQ(number, runShell("exit " + std::to_string(number)));
            }
            expectFailure(number % 2 ? MLIBC_ERR_KILLED : code, number % 2 ? runShell("kill -KILL $$") : refused());
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}

} // namespace

TEST_F(AnExecutedProgram, AnswersTheThreadThatAsked) {
    askInThreads(MLIBC_ERR_BAD_PARAMETER, [] { return MLIBCExec("", nullptr); });
}

TEST_F(AnExecutedProgram, ThatCannotBeRunFailsForTheThreadThatAsked) {
    SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    askInThreads(MLIBC_ERR_EXEC, [] { return MLIBCExec("/nowhere", nullptr); });
}
