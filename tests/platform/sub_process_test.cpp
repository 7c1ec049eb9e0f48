// Which program is run, and how it ends.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <functional>

#include <gmock/gmock.h>

#include "sub_process_fixture.h"
#include "support/emulation.h"
#include "support/files.h"

using support::isThere;
using support::readFile;
using support::writeFile;
using testing::Each;
using testing::Ne;

namespace {

/** Makes a program in the folder `folder` that writes `text`. */
std::string makeProgram(const std::string& folder, const std::string& name, const std::string& text) {
    mkdir(folder.c_str(), 0755);
    const std::string program = folder + "/" + name;
    writeFile(program, "#!/bin/sh\necho " + text + "\n", 0755);
    return program;
}

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
    EXPECT_FALSE(isThere(ran));
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
    EXPECT_FALSE(isThere(out)) << "a refused program's output file was made";
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
