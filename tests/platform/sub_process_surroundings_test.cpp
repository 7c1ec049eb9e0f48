// What a program finds when it starts: its environment, its output files, its signals and descriptors.

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include <gmock/gmock.h>

#include "sub_process_fixture.h"
#include "support/emulation.h"
#include "support/files.h"
#include "support/signals.h"
#include "support/syscall_filter.h"

using support::isThere;
using support::permissionsOf;
using support::readFile;
using support::writeFile;
using testing::Each;
using testing::Ne;

namespace {

void closeStandardDescriptors() {
    close(0);
    close(1);
    close(2);
}

/** Writes the numbers of the shell's own open descriptors, as far as 9. */
const char LIST_DESCRIPTORS[] = "for n in 0 1 2 3 4 5 6 7 8 9; do if [ -e /proc/$$/fd/$n ]; then echo $n; fi; done";

} // namespace

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
    EXPECT_FALSE(isThere(ran));
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
