#include <marubackup-util/sub_process.h>

#include <fcntl.h>
#include <malloc.h>
#include <pthread.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <functional>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "support/emulation.h"
#include "support/files.h"
#include "support/gate.h"
#include "support/in_child.h"
#include "support/signals.h"
#include "support/syscall_filter.h"
#include "support/temp_dir.h"
#include "support/vfork.h"
#include "support/waiting.h"

using MARU::Backup::SubProcess;
using support::describeStatus;
using support::permissionsOf;
using support::readFile;
using support::runInChild;
using support::TempDir;
using support::writeFile;
using testing::Each;
using testing::Ne;

namespace {

enum class Way { CALL, EXEC, START };
const char* const WAY_NAMES[] = {"Call", "Exec", "Start"};

/** What a caller reports of a program that it called, or could not replace itself with. */
struct Result {
    int status;
    int error;
};

/** The tests of it hold for call(), exec() and start() alike. */
class ARunProgram : public testing::TestWithParam<Way> {
protected:
    using Preparation = std::function<void()>;

    /**
     * Runs `process` from a caller of its own, a forked child with the system's
     * PATH that `prepare` has changed before. How the program ended in words,
     * as of describeStatus().
     */
    std::string outcome(
        const SubProcess& process, const Preparation& prepare = [] {}) {
        int report[2];
        EXPECT_EQ(0, pipe2(report, O_CLOEXEC));
        const int callerStatus = runInChild([&] {
            setenv("PATH", "/usr/bin:/bin", 1);
            prepare();
            const int status = run(process);
            const Result result = {status, errno};
            return write(report[1], &result, sizeof result) == sizeof result ? 0 : 1;
        });
        close(report[1]);
        Result result = {callerStatus, 0};
        const ssize_t got = read(report[0], &result, sizeof result); // nothing once a program took the caller's place
        close(report[0]);
        EXPECT_TRUE(got == 0 || got == sizeof result);
        errno = result.error;
        return describeStatus(result.status);
    }

    /** What `process` writes to its standard output; it must end with 0. */
    std::string outputOf(
        SubProcess& process, const Preparation& prepare = [] {}) {
        process.setStdOutput(out, 0);
        EXPECT_EQ("exit 0", outcome(process, prepare));
        return readFile(out);
    }

    /** Makes a program in the folder `folder` that writes `text`. */
    std::string makeProgram(const std::string& folder, const std::string& name, const std::string& text) {
        mkdir(folder.c_str(), 0755);
        const std::string program = folder + "/" + name;
        writeFile(program, "#!/bin/sh\necho " + text + "\n", 0755);
        return program;
    }

    /** What `process`, which does not run, makes its caller report. */
    std::string reportOf(SubProcess& process) {
        const std::string report = dir.path("report");
        writeFile(report, "");
        // Its own errors go to another file; why it is not there to write any does not.
        process.setStdError(err, 0);
        outcome(process, [&] { dup2(open(report.c_str(), O_WRONLY), STDERR_FILENO); });
        return readFile(report);
    }

    /** Runs a file that only a shell could make sense of, and that leaves the file `ran`, by its path and by its name. */
    std::vector<std::string> outcomesOfAScriptWithoutInterpreter() {
        const std::string script = dir.path("script");
        writeFile(script, "echo > " + ran + "\n", 0755);
        const auto searchThere = [this] { setenv("PATH", dir.path().c_str(), 1); };
        return {outcome(SubProcess({script})), outcome(SubProcess({"script"}), searchThere)};
    }

    /** Runs a program that leaves the file `ran`, first its output and then its errors going to `path`. */
    std::vector<std::string> outcomesWithOutputTo(const std::string& path) {
        SubProcess output({"touch", ran});
        output.setStdOutput(path, 0);
        SubProcess error({"touch", ran});
        error.setStdError(path, 0);
        return {outcome(output), outcome(error)};
    }

    /** What outcome() says of a program that the kernel does not take. */
    static std::string refusal(const std::string& reason) {
        return GetParam() == Way::START ? "exit 127" : "failed: " + reason;
    }

    const TempDir dir;
    const std::string out = dir.path("out");
    const std::string err = dir.path("err");
    const std::string ran = dir.path("ran");

private:
    static int run(const SubProcess& process) {
        switch (GetParam()) {
        case Way::CALL:
            return process.call();
        case Way::START: {
            const pid_t child = process.start(0);
            return child < 0 ? process.exec() : support::waitForChild(child);
        }
        default:
            return process.exec();
        }
    }
};

INSTANTIATE_TEST_SUITE_P(SubProcess, ARunProgram, testing::Values(Way::CALL, Way::EXEC, Way::START),
                         [](const testing::TestParamInfo<Way>& way) { return WAY_NAMES[static_cast<int>(way.param)]; });

std::list<std::string> shell(const std::string& script) {
    return {"/bin/sh", "-c", script};
}

bool exists(const std::string& path) {
    return access(path.c_str(), F_OK) == 0;
}

/** The rest of the line of `text` that starts with `label`. */
std::string field(const std::string& text, const std::string& label) {
    const std::size_t start = text.find(label);
    if (start == std::string::npos) {
        return "no " + label;
    }
    const std::size_t valueStart = text.find_first_not_of(" \t", start + label.size());
    return text.substr(valueStart, text.find('\n', valueStart) - valueStart);
}

/** Opens descriptors that a program inherits if nobody keeps them from it. */
void openMoreDescriptors() {
    const int null = open("/dev/null", O_RDWR);
    for (const int descriptor : {0, 3, 4, 17, 200}) {
        dup2(null, descriptor);
    }
}

void closeStandardDescriptors() {
    close(0);
    close(1);
    close(2);
}

/** Writes the numbers of the shell's own open descriptors, as far as 9. */
const char LIST_DESCRIPTORS[] = "for n in 0 1 2 3 4 5 6 7 8 9; do if [ -e /proc/$$/fd/$n ]; then echo $n; fi; done";

} // namespace

// How it ends.

TEST_P(ARunProgram, EndsWithItsExitStatus) {
    EXPECT_EQ("exit 0", outcome(SubProcess({"/bin/true"})));
    EXPECT_EQ("exit 7", outcome(SubProcess(shell("exit 7"))));
    EXPECT_EQ("exit 255", outcome(SubProcess(shell("exit 255"))));
}

TEST_P(ARunProgram, EndsWithTheSignalThatKilledIt) {
    EXPECT_EQ("signal 9", outcome(SubProcess(shell("kill -9 $$"))));
    EXPECT_EQ("signal 15", outcome(SubProcess(shell("kill -15 $$"))));
}

// What is run.

TEST_P(ARunProgram, ReceivesItsArgumentsAsTheyAre) {
    SubProcess process({"printf", "[%s]", "a b", "", "*", "$HOME", "'\"\\", "\n", "\xff"});

    EXPECT_EQ("[a b][][*][$HOME]['\"\\][\n][\xff]", outputOf(process));
}

TEST_P(ARunProgram, IsCalledAsTheCallerNamedIt) {
    SubProcess process({"sh", "-c", "echo $0"});

    EXPECT_EQ("sh\n", outputOf(process));
}

TEST_P(ARunProgram, MustBeThere) {
    if (GetParam() == Way::CALL) {
        SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    }
    EXPECT_EQ(refusal("No such file or directory"), outcome(SubProcess({dir.path("missing")})));
    EXPECT_EQ(refusal("Not a directory"), outcome(SubProcess({"/dev/null/program"})));
}

TEST_P(ARunProgram, MustBeInPathIfOnlyItsNameIsGiven) {
    EXPECT_EQ("failed: No such file or directory", outcome(SubProcess({"marubackup-test-no-such-program"})));
}

TEST_P(ARunProgram, MustBeAnExecutableFile) {
    if (GetParam() == Way::CALL) {
        SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    }
    const std::string plain = dir.path("plain");
    writeFile(plain, "#!/bin/sh\n", 0644);

    EXPECT_EQ(refusal("Permission denied"), outcome(SubProcess({plain})));
    EXPECT_EQ(refusal("Permission denied"), outcome(SubProcess({dir.path()})));
}

TEST_P(ARunProgram, MayBeAScriptThatNamesItsInterpreter) {
    SubProcess process({makeProgram(dir.path("bin"), "script", "ran")});

    EXPECT_EQ("ran\n", outputOf(process));
}

TEST_P(ARunProgram, IsNotHandedToAShellIfItIsNoProgram) {
    EXPECT_THAT(outcomesOfAScriptWithoutInterpreter(), Each(Ne("exit 0")));
    EXPECT_FALSE(exists(ran));
}

TEST_P(ARunProgram, IsRefusedIfItIsNoProgram) {
    if (GetParam() == Way::CALL) {
        SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    }
    EXPECT_EQ(std::vector<std::string>(2, refusal("Exec format error")), outcomesOfAScriptWithoutInterpreter());
}

TEST_P(ARunProgram, IsRefusedIfItsArgumentsAreTooLong) {
    if (GetParam() == Way::CALL) {
        SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    }
    EXPECT_EQ(refusal("Argument list too long"), outcome(SubProcess({"true", std::string(16 * 1024 * 1024, 'x')})));
}

TEST_P(ARunProgram, IsRefusedIfATextCannotReachTheKernelWhole) {
    const std::string nul("a\0b", 3);
    std::vector<std::string> outcomes;
    const auto refused = [&](const std::list<std::string>& argv, const std::function<void(SubProcess&)>& change) {
        SubProcess process(argv);
        process.setStdOutput(out, 0);
        change(process);
        outcomes.push_back(outcome(process));
    };
    const auto unchanged = [](SubProcess&) {};

    refused({}, unchanged);
    refused({""}, unchanged);
    refused({"", "argument"}, unchanged);
    refused({nul}, unchanged);
    refused({std::string("/bin/true\0", 10)}, unchanged);
    refused({"true", "argument", nul}, unchanged);
    refused({"true"}, [&](SubProcess& process) { process.setEnv(nul, "value"); });
    refused({"true"}, [&](SubProcess& process) { process.setEnv("NAME", nul); });
    refused({"true"}, [&](SubProcess& process) { process.setEnv("", "value"); });
    refused({"true"}, [&](SubProcess& process) { process.setEnv("NA=ME", "value"); });
    refused({"true"}, [&](SubProcess& process) { process.setStdOutput(out + nul, 0); });
    refused({"true"}, [&](SubProcess& process) { process.setStdError(out + nul, 0); });

    EXPECT_EQ(std::vector<std::string>(12, "failed: Invalid argument"), outcomes);
    EXPECT_FALSE(exists(out)) << "a refused program's output file was made";
}

TEST_P(ARunProgram, IsReportedOnOneLineIfItIsNotFoundOrNoneIsNamed) {
    const std::string longName(300, 'x');
    const std::vector<std::pair<std::list<std::string>, std::string>> rows = {
        {{}, "cannot run []: no program is named\n"},
        {{"missing"}, "cannot run [missing]: No such file or directory\n"},
        {{"true", std::string("\0", 1)}, "cannot run [true]: an argument contains a NUL byte\n"},
        {{"no\nsuch\x1b[1m\x7f"}, "cannot run [no?such?[1m?]: No such file or directory\n"},
        {{longName}, "cannot run [" + longName.substr(0, 200) + "...]: No such file or directory\n"},
    };
    for (const auto& [argv, expected] : rows) {
        SubProcess process(argv);
        EXPECT_EQ(expected, reportOf(process));
    }
    SubProcess named({"true"});
    named.setEnv("", "value");
    EXPECT_EQ("cannot run [true]: a variable's name is empty or contains \"=\", or one contains a NUL byte\n",
              reportOf(named));
    SubProcess split({"true"});
    split.setStdOutput(std::string("\0", 1), 0);
    EXPECT_EQ("cannot run [true]: an output file's name contains a NUL byte\n", reportOf(split));
}

TEST_P(ARunProgram, IsReportedOnOneLineIfTheKernelRefusesIt) {
    if (GetParam() == Way::CALL) {
        SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    }
    SubProcess plainFile({"/etc/passwd"});
    SubProcess tooLong({"true", std::string(1 << 20, 'x')});

    EXPECT_EQ("cannot run [/etc/passwd]: Permission denied\n", reportOf(plainFile));
    EXPECT_EQ("cannot run [true]: Argument list too long\n", reportOf(tooLong));
}

TEST_P(ARunProgram, IsNotReportedIfItRuns) {
    const std::string report = dir.path("report");
    SubProcess process(shell("exit 3"));
    EXPECT_EQ("exit 3", outcome(process, [&] { dup2(open(report.c_str(), O_WRONLY | O_CREAT, 0600), STDERR_FILENO); }));
    EXPECT_EQ("", readFile(report));
}

// Where it is looked for.

TEST_P(ARunProgram, IsTheFirstOfItsNameInPath) {
    makeProgram(dir.path("1"), "other", "wrong");
    makeProgram(dir.path("2"), "program", "second");
    makeProgram(dir.path("3"), "program", "third");
    const std::string path = dir.path("none") + ":" + dir.path("1") + ":" + dir.path("2") + "/:" + dir.path("3");
    SubProcess process({"program"});

    EXPECT_EQ("second\n", outputOf(process, [&] { setenv("PATH", path.c_str(), 1); }));
}

TEST_P(ARunProgram, IsNotAFolderOrAPlainFileInPath) {
    makeProgram(dir.path("1"), "program", "wrong");
    ASSERT_EQ(0, chmod(dir.path("1/program").c_str(), 0644));
    mkdir(dir.path("2").c_str(), 0755);
    mkdir(dir.path("2/program").c_str(), 0755);
    makeProgram(dir.path("3"), "program", "right");
    const std::string path = dir.path("1") + ":" + dir.path("2");
    const auto searchTwo = [&] { setenv("PATH", path.c_str(), 1); };
    const auto searchThree = [&] { setenv("PATH", (path + ":" + dir.path("3")).c_str(), 1); };
    SubProcess process({"program"});

    EXPECT_EQ("failed: Permission denied", outcome(process, searchTwo));
    EXPECT_EQ("right\n", outputOf(process, searchThree));
}

TEST_P(ARunProgram, IsFoundInTheCurrentFolderWherePathHasAnEmptyPart) {
    makeProgram(dir.path("here"), "program", "ran");
    SubProcess process({"program"});

    std::string expected;
    for (const char* path : {"", ":/none", "/none:", "/none::/none"}) {
        expected += "ran\n";
        const auto searchHere = [&] {
            setenv("PATH", path, 1);
            EXPECT_EQ(0, chdir(dir.path("here").c_str()));
        };
        EXPECT_EQ(expected, outputOf(process, searchHere)) << "PATH=" << path;
    }
    const auto searchElsewhere = [&] {
        setenv("PATH", "/none", 1);
        EXPECT_EQ(0, chdir(dir.path("here").c_str()));
    };
    EXPECT_EQ("failed: No such file or directory", outcome(process, searchElsewhere));
}

TEST_P(ARunProgram, IsFoundInTheSystemsFoldersWithoutPath) {
    EXPECT_EQ("exit 0", outcome(SubProcess({"true"}), [] { unsetenv("PATH"); }));
}

TEST_P(ARunProgram, IsLookedForInTheCallersPathAndNotItsOwn) {
    makeProgram(dir.path("bin"), "program", "wrong");
    SubProcess process({"program"});
    process.setEnv("PATH", dir.path("bin"));

    EXPECT_EQ("failed: No such file or directory", outcome(process));
}

// Its environment.

TEST_P(ARunProgram, SeesTheCallersEnvironmentWithTheAdditions) {
    SubProcess process({"/usr/bin/env"});
    process.setEnv("REPLACED", "old");
    process.setEnv("REPLACED", "new");
    process.setEnv("ADDED", "a=b c");
    process.setEnv("EMPTY", "");
    char kept[] = "KEPT=1";
    char once[] = "REPLACED=once";
    char twice[] = "REPLACED=twice";
    char similar[] = "REPLACED_NOT=2";
    char odd[] = "ODD";
    char* variables[] = {once, kept, similar, twice, odd, nullptr};

    EXPECT_EQ("KEPT=1\nREPLACED_NOT=2\nODD\nADDED=a=b c\nEMPTY=\nREPLACED=new\n",
              outputOf(process, [&] { environ = variables; }));
}

TEST_P(ARunProgram, SeesOnlyTheAdditionsOfACallerWithoutEnvironment) {
    SubProcess process({"/usr/bin/env"});
    process.setEnv("ADDED", "1");

    EXPECT_EQ("ADDED=1\n", outputOf(process, [] { environ = nullptr; }));
}

TEST_P(ARunProgram, InheritsTheCallersFolderAndStreams) {
    const auto moveAndRedirect = [this] {
        EXPECT_EQ(0, chdir("/"));
        dup2(open(out.c_str(), O_WRONLY | O_CREAT, 0600), STDOUT_FILENO);
    };

    EXPECT_EQ("exit 0", outcome(SubProcess(shell("pwd")), moveAndRedirect));
    EXPECT_EQ("/\n", readFile(out));
}

// Its output files.

TEST_P(ARunProgram, AppendsToItsOutputFiles) {
    writeFile(out, "before\n");
    SubProcess process(shell("echo out; echo err >&2"));
    process.setStdOutput(out, 0);
    process.setStdError(err, 0);

    EXPECT_EQ("exit 0", outcome(process));
    EXPECT_EQ("exit 0", outcome(process));

    EXPECT_EQ("before\nout\nout\n", readFile(out));
    EXPECT_EQ("err\nerr\n", readFile(err));
}

TEST_P(ARunProgram, MakesOutputFilesForItsOwnerAndGroup) {
    SubProcess open({"true"});
    open.setStdOutput(out, 0);
    open.setStdError(err, 0);
    SubProcess closed({"true"});
    closed.setStdOutput(dir.path("closed"), 0);

    EXPECT_EQ("exit 0", outcome(open, [] { umask(0); }));
    EXPECT_EQ("exit 0", outcome(closed, [] { umask(077); }));

    EXPECT_EQ(mode_t(0640), permissionsOf(out));
    EXPECT_EQ(mode_t(0640), permissionsOf(err));
    EXPECT_EQ(mode_t(0600), permissionsOf(dir.path("closed")));
}

TEST_P(ARunProgram, WritesBothStreamsToOneFileInOrder) {
    const std::string otherName = dir.path("other_name");
    writeFile(out, "");
    ASSERT_EQ(0, link(out.c_str(), otherName.c_str()));
    SubProcess process(shell("echo 1; echo 2 >&2; echo 3"));
    process.setStdOutput(out, 0);

    process.setStdError(out, 0);
    EXPECT_EQ("exit 0", outcome(process));
    EXPECT_EQ("1\n2\n3\n", readFile(out));

    process.setStdError(otherName, 0);
    EXPECT_EQ("exit 0", outcome(process));
    EXPECT_EQ("1\n2\n3\n1\n2\n3\n", readFile(out));
}

TEST_P(ARunProgram, IsNotStartedIfAnOutputFileCannotBeOpened) {
    for (const std::string& path : {dir.path("missing/file"), dir.path(), std::string()}) {
        EXPECT_THAT(outcomesWithOutputTo(path), Each(Ne("exit 0"))) << path;
    }
    EXPECT_FALSE(exists(ran));
}

TEST_P(ARunProgram, FailsForTheReasonThatAnOutputFileCannotBeOpened) {
    if (GetParam() == Way::CALL) {
        SKIP_IF_EMULATED(support::SPAWN_ERRORS);
    }
    const auto failed = [](const std::string& reason) { return std::vector<std::string>(2, "failed: " + reason); };

    EXPECT_EQ(failed("No such file or directory"), outcomesWithOutputTo(dir.path("missing/file")));
    EXPECT_EQ(failed("Is a directory"), outcomesWithOutputTo(dir.path()));
    EXPECT_EQ(failed("No such file or directory"), outcomesWithOutputTo(""));
}

// What it starts with.

TEST_P(ARunProgram, StartsWithDefaultSignalsAndNoneBlocked) {
    SubProcess process({"cat", "/proc/self/status"});

    const std::string status = outputOf(process, support::changeAllSignals);

    EXPECT_EQ("0000000000000000", field(status, "SigBlk:"));
    EXPECT_EQ("0000000000000000", field(status, "SigIgn:"));
    EXPECT_EQ("0000000000000000", field(status, "SigCgt:"));
}

TEST_P(ARunProgram, LeadsAProcessGroupOfItsOwn) {
    SubProcess process(shell("read pid name state parent group rest < /proc/$$/stat; echo $((group - $$))"));
    EXPECT_EQ("0\n", outputOf(process));
}

TEST_P(ARunProgram, HasNoDescriptorButTheStandardOnes) {
    SubProcess process({"ls", "/proc/self/fd"});

    EXPECT_EQ("0\n1\n2\n3\n", outputOf(process, openMoreDescriptors)); // 3 is the folder that ls reads
}

// close_range() came with Linux 5.9, and its close-on-exec flag with 5.11.
TEST_P(ARunProgram, HasNoOtherDescriptorAlsoOnAnOldKernel) {
    SKIP_IF_EMULATED(support::REFUSED_CALLS);
    for (const int answer : {ENOSYS, EINVAL}) {
        SubProcess process({"ls", "/proc/self/fd"});
        const auto runOnOldKernel = [=] {
            openMoreDescriptors();
            support::refuseSystemCalls({SYS_close_range}, answer);
        };

        EXPECT_EQ("0\n1\n2\n3\n", outputOf(process, runOnOldKernel));
        unlink(out.c_str());
    }
}

TEST_P(ARunProgram, HasItsOutputInPlaceIfTheCallerHasNoStandardStreams) {
    SubProcess both(shell("echo out; echo err >&2"));
    both.setStdOutput(out, 0);
    both.setStdError(err, 0);
    EXPECT_EQ("exit 0", outcome(both, closeStandardDescriptors));
    EXPECT_EQ("out\n", readFile(out));
    EXPECT_EQ("err\n", readFile(err));

    SubProcess onlyError(shell("echo more >&2"));
    onlyError.setStdError(err, 0);
    EXPECT_EQ("exit 0", outcome(onlyError, closeStandardDescriptors));
    EXPECT_EQ("err\nmore\n", readFile(err));
}

TEST_P(ARunProgram, HasNoStreamThatTheCallerHasNotUnlessItIsSet) {
    const std::string both = dir.path("both");
    SubProcess shared(shell(LIST_DESCRIPTORS));
    shared.setStdOutput(both, 0);
    shared.setStdError(both, 0);
    SubProcess output(shell(LIST_DESCRIPTORS));
    output.setStdOutput(out, 0);
    SubProcess error(shell("exec 1>&2; " + std::string(LIST_DESCRIPTORS)));
    error.setStdError(err, 0);
    for (const SubProcess* process : {&shared, &output, &error}) {
        EXPECT_EQ("exit 0", outcome(*process, closeStandardDescriptors));
    }

    EXPECT_EQ("1\n2\n", readFile(both));
    EXPECT_EQ("1\n", readFile(out));
    EXPECT_EQ("1\n2\n", readFile(err)); // 1 is the shell's own doing
}

TEST_P(ARunProgram, MayFindOneStandardStreamClosed) {
    for (const int closed : {0, 1, 2}) {
        const std::string file = dir.path("without" + std::to_string(closed));
        SubProcess process(shell("echo out; echo err >&2"));
        process.setStdOutput(file, 0);
        process.setStdError(file, 0);

        EXPECT_EQ("exit 0", outcome(process, [=] { close(closed); }));
        EXPECT_EQ("out\nerr\n", readFile(file)) << closed;
    }
}

// What call() alone promises.

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

// What start() alone promises.

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

// What exec() alone promises.

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
    EXPECT_FALSE(exists(dir.path("ran")));
}
