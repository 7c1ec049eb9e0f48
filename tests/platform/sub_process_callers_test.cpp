// What call(), start() and exec() each promise their caller.

#include <fcntl.h>
#include <malloc.h>
#include <pthread.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "sub_process_fixture.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/gate.h"
#include "support/in_child.h"
#include "support/signals.h"
#include "support/temp_dir.h"
#include "support/vfork.h"
#include "support/waiting.h"

using MARU::Backup::SubProcess;
using support::describeStatus;
using support::isThere;
using support::readFile;
using support::runInChild;
using support::TempDir;

// call()

namespace {

int announcedTicks = 0;
int tickListener = -1;

/** Counts the ticks, and writes a line to the listener at the hundredth. */
void countTick(int) {
    const int problem = errno;
    if (++announcedTicks == 100 && write(tickListener, "\n", 1) != 1) {
        _exit(2);
    }
    errno = problem;
}

bool forked = false;

} // namespace

TEST(ACaller, WaitsForTheProgramWhateverSignalsArrive) {
    const TempDir dir;
    const std::string fifo = dir.path("fifo");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));

    const int status = runInChild([&] {
        tickListener = open(fifo.c_str(), O_RDWR | O_CLOEXEC);
        support::handleSignal(SIGALRM, countTick);
        const itimerval everyMillisecond = {{0, 1000}, {0, 1000}};
        setitimer(ITIMER_REAL, &everyMillisecond, nullptr);
        const int result = SubProcess(shell("read line < " + fifo + "; exit 5")).call();
        return WIFEXITED(result) ? WEXITSTATUS(result) : 1;
    });

    EXPECT_EQ("exit 5", describeStatus(status));
}

TEST(ACaller, IsToldIfItKeepsNoStatusOfItsChildren) {
    const int status = runInChild([] {
        support::handleSignal(SIGCHLD, SIG_IGN);
        return SubProcess({"true"}).call() == -1 && errno == ECHILD ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST(ACaller, IsNotForked) {
    const int status = runInChild([] {
        pthread_atfork([] { forked = true; }, nullptr, nullptr);
        const int result = SubProcess({"true"}).call();
        return result == 0 && !forked ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
}

TEST(ACaller, KeepsItsSignalsItsDescriptorsAndItsEnvironment) {
    const TempDir dir;
    const int status = runInChild([&] {
        sigset_t blocked;
        sigemptyset(&blocked);
        sigaddset(&blocked, SIGUSR1);
        sigprocmask(SIG_SETMASK, &blocked, nullptr);
        support::handleSignal(SIGPIPE, SIG_IGN);
        openMoreDescriptors();
        setenv("NAME", "ours", 1);
        const std::string before = readFile("/proc/self/status");
        SubProcess process({"true"});
        process.setEnv("NAME", "its");
        process.setStdOutput(dir.path("out"), 0);
        if (process.call() != 0) {
            return 1;
        }
        const std::string after = readFile("/proc/self/status");
        const bool signalsKept =
            field(before, "SigBlk:") == field(after, "SigBlk:") && field(before, "SigIgn:") == field(after, "SigIgn:");
        const bool descriptorsKept = fcntl(200, F_GETFD) == 0 && write(STDOUT_FILENO, "", 0) == 0;
        return signalsKept && descriptorsKept && getenv("NAME") == std::string("ours") ? 0 : 2;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    EXPECT_EQ("", readFile(dir.path("out")));
}

namespace {

/** Calls `program` from a child made for it, which ends with 0 if the call's result is that and nothing is left of it. */
int callAndLookForRemains(const SubProcess& program, int result) {
    return runInChild([&] {
        const int before = dup(STDOUT_FILENO);
        close(before);
        if (program.call() != result) {
            return 1;
        }
        return dup(STDOUT_FILENO) == before && waitpid(-1, nullptr, WNOHANG) == -1 && errno == ECHILD ? 0 : 2;
    });
}

} // namespace

TEST(ACaller, LeavesNoChildAndNoDescriptorBehind) {
    const TempDir dir;
    SubProcess process({"true"});
    process.setStdOutput(dir.path("out"), 0);

    EXPECT_EQ("exit 0", describeStatus(callAndLookForRemains(process, 0)));
}

TEST(ACaller, LeavesNoChildAndNoDescriptorBehindOfWhatCannotBeRun) {
    SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    const TempDir dir;
    SubProcess failing({"true"});
    failing.setStdOutput(dir.path("missing/out"), 0);

    EXPECT_EQ("exit 0", describeStatus(callAndLookForRemains(failing, -1)));
}

// start()

namespace {

/** Enough to tell what each leaves behind from what the heap keeps for later. */
const int ROUNDS = 500;
const std::size_t SMALLEST_BLOCK = 16;

} // namespace

TEST(AStartedProgram, RunsBesideItsCallerAtThatNiceValue) {
    const TempDir dir;
    support::Gate gate(dir.path("gate"));
    SubProcess process(shell("read line < " + gate.path() + "; nice"));
    process.setStdOutput(dir.path("out"), 0);

    const pid_t child = process.start(7);

    ASSERT_GT(child, 0);
    gate.open();
    EXPECT_EQ("exit 0", describeStatus(support::waitForChild(child)));
    EXPECT_EQ("7\n", readFile(dir.path("out")));
    EXPECT_EQ(0, getpriority(PRIO_PROCESS, 0));
}

#ifndef VFORK_IS_FORK
TEST(AStartedProgram, CostsNoCopyOfItsCallersMemory) {
    const int status = runInChild([] {
        pthread_atfork([] { forked = true; }, nullptr, nullptr);
        const pid_t child = SubProcess({"true"}).start(0);
        return child > 0 && support::waitForChild(child) == 0 && !forked ? 0 : 1;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
}
#endif

TEST(AStartedProgram, LeavesNoMemoryAndNoDescriptorBehind) {
    const TempDir dir;
    SubProcess process({"true", std::string(1000, 'x')});
    process.setEnv("NAME", "value");
    process.setStdOutput(dir.path("out"), 0);
    process.setStdError(dir.path("err"), 0);
    const auto run = [&] { EXPECT_EQ("exit 0", describeStatus(support::waitForChild(process.start(0)))); };
    run();
    const std::size_t before = mallinfo2().uordblks;
    const int descriptors = support::openDescriptors(getpid());

    for (int round = 0; round < ROUNDS && !testing::Test::HasFailure(); ++round) {
        run();
    }

    EXPECT_LT(mallinfo2().uordblks, before + ROUNDS * SMALLEST_BLOCK) << "every round leaves some";
    EXPECT_EQ(descriptors, support::openDescriptors(getpid()));
}

TEST(AStartedProgram, LeavesItsCallersSignalsErrnoAndStreamsAlone) {
    const TempDir dir;
    const int status = runInChild([&] {
        support::changeAllSignals();
        openMoreDescriptors();
        const std::string before = readFile("/proc/self/status");
        SubProcess process({"true"});
        process.setStdOutput(dir.path("out"), 0);
        errno = EXDEV;
        const pid_t child = process.start(0);
        const int error = errno;
        if (child < 0 || support::waitForChild(child) != 0 || error != EXDEV) {
            return 1;
        }
        const std::string after = readFile("/proc/self/status");
        for (const char* const label : {"SigBlk:", "SigIgn:", "SigCgt:"}) {
            if (field(before, label) != field(after, label)) {
                return 2;
            }
        }
        const bool descriptorsKept = fcntl(200, F_GETFD) == 0 && write(STDOUT_FILENO, "", 0) == 0;
        return descriptorsKept && getpgrp() != child ? 0 : 3;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    EXPECT_EQ("", readFile(dir.path("out")));
}

TEST(AStartedProgram, WritesToAFifoThatIsRead) {
    const TempDir dir;
    const std::string fifo = dir.path("fifo");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));
    const int reader = open(fifo.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    SubProcess process(shell("cat /proc/self/fdinfo/1"));
    process.setStdOutput(fifo, 0);

    const pid_t child = process.start(0);

    ASSERT_GT(child, 0);
    EXPECT_EQ("exit 0", describeStatus(support::waitForChild(child)));
    char text[256] = {};
    EXPECT_GT(read(reader, text, sizeof text - 1), 0);
    const unsigned long flags = std::stoul(field(text, "flags:"), nullptr, 8);
    EXPECT_EQ(0U, flags & O_NONBLOCK) << "its writes do not wait";
    close(reader);
}

TEST(ANotStartedProgram, IsOneThatExecWouldReportOrWaitFor) {
    const TempDir dir;
    const std::string fifo = dir.path("fifo");
    const std::string report = dir.path("report");
    ASSERT_EQ(0, mkfifo(fifo.c_str(), 0600));
    SubProcess missing({"marubackup-test-no-such-program"});
    SubProcess unreadFifo({"true"});
    unreadFifo.setStdOutput(fifo, 0);
    SubProcess unreadErrorFifo({"true"});
    unreadErrorFifo.setStdError(fifo, 0);
    SubProcess unopened({"true"});
    unopened.setStdOutput(dir.path("missing/out"), 0);
    SubProcess unnamed({});

    const int status = runInChild([&] {
        dup2(open(report.c_str(), O_WRONLY | O_CREAT, 0600), STDERR_FILENO);
        errno = EXDEV;
        for (const SubProcess* process : {&missing, &unreadFifo, &unreadErrorFifo, &unopened, &unnamed}) {
            if (process->start(0) != -1 || errno != EXDEV) {
                return 1;
            }
        }
        return waitpid(-1, nullptr, WNOHANG) == -1 && errno == ECHILD ? 0 : 2;
    });

    EXPECT_EQ("exit 0", describeStatus(status));
    EXPECT_EQ("", readFile(report));
}

// exec()

TEST(AReplacedProcess, IsToldWhichOutputFileCannotBeOpened) {
    const TempDir dir;
    const std::string report = dir.path("report");
    SubProcess process({"true"});
    process.setStdOutput("/nowhere/out", 0);
    runInChild([&] {
        dup2(open(report.c_str(), O_WRONLY | O_CREAT, 0600), STDERR_FILENO);
        return process.exec() == -1 && errno == ENOENT ? 0 : 1;
    });
    EXPECT_EQ("cannot run [true]: its output file [/nowhere/out]: No such file or directory\n", readFile(report));
}

TEST(AReplacedProcess, KeepsItsId) {
    const TempDir dir;
    SubProcess process(shell("echo $$"));
    process.setStdOutput(dir.path("out"), 0);
    const pid_t child = support::startInChild([&] { return process.exec(); });

    EXPECT_EQ("exit 0", describeStatus(support::waitForChild(child)));
    EXPECT_EQ(std::to_string(child) + "\n", readFile(dir.path("out")));
}

TEST(AReplacedProcess, EndsBySignalsThatWereHeldBack) {
    const TempDir dir;
    const int status = runInChild([&] {
        support::handleSignal(SIGTERM, [](int) {});
        sigset_t blocked;
        sigemptyset(&blocked);
        sigaddset(&blocked, SIGTERM);
        sigprocmask(SIG_BLOCK, &blocked, nullptr);
        raise(SIGTERM);
        return SubProcess({"touch", dir.path("ran")}).exec();
    });

    EXPECT_EQ("signal 15", describeStatus(status));
    EXPECT_FALSE(isThere(dir.path("ran")));
}
