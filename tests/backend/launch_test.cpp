#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdio>
#include <ostream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backend_fixture.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/named_rows.h"

using namespace MARU::Backup;
using support::expectLocated;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class BackendLaunch : public BackendTest {};

struct Command {
    const char* name;
    const char* branch;
    const char* lines;
    const char* outcome;

    friend std::ostream& operator<<(std::ostream& out, const Command& row) {
        return out << row.name;
    }
};

class LaunchCommand : public BackendLaunch, public testing::WithParamInterface<Command> {};

const Command COMMANDS[] = {
    {"Default", "", "command_launch = /bin/sh -c 'exit 3'\ncommand_verify = /bin/sh -c 'exit 4'", "exit 3"},
    {"Branch", "verify", "command_launch = /bin/sh -c 'exit 3'\ncommand_verify = /bin/sh -c 'exit 4'", "exit 4"},
    {"BranchNamedLaunch", "launch", "command_launch = /bin/sh -c 'exit 3'", "exit 3"},
    {"TemplateInTheProgram", "", "command_launch = /bin/{{program}} -c 'exit 3'", "exit 3"},
    {"ProgramOfThePath", "", "command_launch = sh -c 'exit 3'", "exit 3"},
    {"Killed", "", "command_launch = /bin/sh -c 'kill -KILL $$'", "signal 9"},

    {"MissingDefault", "", "command_verify = /bin/true", LAUNCH_MISCONFIGURED},
    {"MissingBranch", "verify", "command_launch = /bin/true", LAUNCH_MISCONFIGURED},
    {"BranchOfAnotherCase", "Verify", "command_verify = /bin/true", LAUNCH_MISCONFIGURED},
    {"BranchIsNoTemplate", "{{program}}", "command_sh = /bin/true", LAUNCH_MISCONFIGURED},
    {"UnclosedQuote", "", "command_launch = /bin/sh -c 'exit 3", LAUNCH_MISCONFIGURED},

    {"NoProgram", "", "command_launch = /nonexistent/program", LAUNCH_FAILED},
    {"EmptyList", "", "command_launch =", LAUNCH_FAILED},
    {"OutputThatCannotBeOpened", "", "command_launch = /bin/true\npipe_stdout = /nonexistent/out", LAUNCH_FAILED},
    {"ErrorOutputThatCannotBeOpened", "", "command_launch = /bin/true\npipe_stderr = /nonexistent/out", LAUNCH_FAILED},
    {"OutputWithoutAName", "", "command_launch = /bin/true\npipe_stdout =", LAUNCH_FAILED},
};

INSTANTIATE_TEST_SUITE_P(Of, LaunchCommand, testing::ValuesIn(COMMANDS), support::NameOfRow());

struct Priority {
    const char* name;
    const char* line;
    const char* nice;

    friend std::ostream& operator<<(std::ostream& out, const Priority& row) {
        return out << row.name;
    }
};

class LaunchPriority : public BackendLaunch, public testing::WithParamInterface<Priority> {};

const Priority PRIORITIES[] = {
    {"Absent", "", "5"},
    {"Set", "priority = 10", "10"},
    {"Lowest", "priority = 19", "19"},
    {"BeyondTheLowest", "priority = 1000", "19"},
    {"NoNumber", "priority = x", "5"},
    {"NumberAndMore", "priority = 10 x", "5"},
    {"Real", "priority = 10.5", "5"},
    {"Empty", "priority =", "5"},
    {"TooLarge", "priority = 99999999999", "5"},
    {"Template", "priority = {{priority}}", "5"},
};

INSTANTIATE_TEST_SUITE_P(Of, LaunchPriority, testing::ValuesIn(PRIORITIES), support::NameOfRow());

} // namespace

TEST_P(LaunchCommand, IsRunInPlaceOfTheCaller) {
    job.setCommandBranch(GetParam().branch);
    job.setParam("program", "sh");
    load(GetParam().lines);
    pid_t child = -1;

    EXPECT_EQ(GetParam().outcome, launch(child));

    if (GetParam().outcome == std::string(LAUNCH_MISCONFIGURED)) {
        expectLocated(log, LOG_ERR, child, BACKEND_UNIT, "wrong config: launch command not found");
        EXPECT_EQ(1U, log.lines().size());
    } else {
        EXPECT_THAT(log.lines(), IsEmpty());
    }
}

TEST_P(LaunchPriority, IsTheCommandsNiceValue) {
    job.setParam("priority", 10);
    load(std::string("command_launch = nice\npipe_stdout = {{out}}\n") + GetParam().line);

    EXPECT_EQ("exit 0", launch());

    EXPECT_THAT(outLines(), ElementsAre(GetParam().nice));
}

TEST_F(BackendLaunch, ExpandsEveryArgumentOnItsOwn) {
    job.setParam("name", "two words 'and a quote");
    job.setParam("size", 5);
    job.setParam("brackets", "{{name}}");
    load("command_launch = printf '<%s>\\n' {{name}} '' a{{size}}b {{BACKEND}} {{missing}} {{brackets}}\n"
         "pipe_stdout = {{out}}");

    EXPECT_EQ("exit 0", launch());

    EXPECT_THAT(outLines(),
                ElementsAre("<two words 'and a quote>", "<>", "<a5b>", "<b>", "<{{missing}}>", "<{{name}}>"));
}

TEST_F(BackendLaunch, SplitsTheOutputsByTheFilesNamedInTemplates) {
    load("command_launch = /bin/sh -c 'echo output; echo error >&2'\n"
         "pipe_stdout = " +
         folder.path("{{name}}.out") +
         "\n"
         "pipe_stderr = " +
         folder.path("{{name}}.err"));

    EXPECT_EQ("exit 0", launch());

    EXPECT_EQ("output\n", support::readFile(folder.path("n.out")));
    EXPECT_EQ("error\n", support::readFile(folder.path("n.err")));
}

TEST_F(BackendLaunch, MayWriteBothOutputsIntoOneFile) {
    load("command_launch = /bin/sh -c 'echo output; echo error >&2; echo output'\n"
         "pipe_stdout = {{out}}\npipe_stderr = {{out}}");

    EXPECT_EQ("exit 0", launch());

    EXPECT_THAT(outLines(), ElementsAre("output", "error", "output"));
}

TEST_F(BackendLaunch, AppendsToAnOutputThatIsThere) {
    support::writeFile(out, "before\n");
    load("command_launch = echo after\npipe_stdout = {{out}}");

    EXPECT_EQ("exit 0", launch());

    EXPECT_THAT(outLines(), ElementsAre("before", "after"));
}

TEST_F(BackendLaunch, LeavesAnOutputThatIsNotNamedAsItIs) {
    load("command_launch = echo inherited\npipe_stderr = /dev/null");

    const int status = support::runInChild(
        [this]() { return std::freopen(out.c_str(), "w", stdout) != nullptr && backend.launch(job) ? 1 : 2; });

    EXPECT_EQ("exit 0", support::describeStatus(status));
    EXPECT_THAT(outLines(), ElementsAre("inherited"));
}
