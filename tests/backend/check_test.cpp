#include <sys/resource.h>
#include <unistd.h>

#include <ostream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "backend_fixture.h"
#include "support/named_rows.h"

using namespace MARU::Backup;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class BackendCheck : public BackendTest {};

struct Verdict {
    const char* name;
    const char* lines;
    bool accepted;

    friend std::ostream& operator<<(std::ostream& out, const Verdict& row) {
        return out << row.name;
    }
};

class CheckCommand : public BackendCheck, public testing::WithParamInterface<Verdict> {};

const Verdict VERDICTS[] = {
    {"Absent", "command_launch = /bin/false", true},
    {"Exit0", "command_check = /bin/sh -c 'exit 0'", true},
    {"Exit1", "command_check = /bin/sh -c 'exit 1'", false},
    {"Exit255", "command_check = /bin/sh -c 'exit 255'", false},
    {"Killed", "command_check = /bin/sh -c 'kill -KILL $$'", false},
    {"Terminated", "command_check = /bin/sh -c 'kill -TERM $$'", false},
    {"NoProgram", "command_check = /nonexistent/program", false},
    {"NoProgramInThePath", "command_check = no-such-program-anywhere", false},
    {"FileThatIsNoProgram", "command_check = /etc/passwd", false},
    {"EmptyList", "command_check =", false},
    {"EmptyProgram", "command_check = ''", false},
    {"ProgramOfThePath", "command_check = true", true},
    {"TemplateInTheArguments", "command_check = test {{name}} = n", true},
    {"TemplateInTheProgram", "command_check = /bin/{{program}}", true},
    {"MissingTemplateStaysAsItIs", "command_check = test {{missing}} = '{{missing}}'", true},
};

INSTANTIATE_TEST_SUITE_P(Of, CheckCommand, testing::ValuesIn(VERDICTS), support::NameOfRow());

} // namespace

TEST_P(CheckCommand, AcceptsTheJobOnlyByExitStatus0) {
    job.setParam("program", "true");
    load(GetParam().lines);

    EXPECT_EQ(GetParam().accepted, backend.check(job));

    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(BackendCheck, IsWaitedFor) {
    load("command_check = /bin/sh -c 'sleep 0.2; echo done > {{out}}'");

    EXPECT_TRUE(backend.check(job));

    EXPECT_THAT(outLines(), ElementsAre("done"));
}

TEST_F(BackendCheck, IsTheSameForEveryBranch) {
    job.setCommandBranch("verify");
    load("command_check = /bin/false\ncommand_verify = /bin/true");

    EXPECT_FALSE(backend.check(job));
}

TEST_F(BackendCheck, ForABranchOfThatNameIsTheCheckCommandItself) {
    job.setCommandBranch("check");
    load("command_check = /bin/sh -c 'exit 7'");

    EXPECT_EQ("exit 7", launch());
}

TEST_F(BackendCheck, RunsWithTheCallersPriority) {
    load("command_check = /bin/sh -c 'nice > {{out}}'\npriority = 10");

    EXPECT_TRUE(backend.check(job));

    EXPECT_THAT(outLines(), ElementsAre(std::to_string(getpriority(PRIO_PROCESS, 0))));
}

TEST_F(BackendCheck, DoesNotWriteIntoTheFilesOfTheLaunch) {
    load("command_check = /bin/true\npipe_stdout = {{out}}\npipe_stderr = {{out}}");

    EXPECT_TRUE(backend.check(job));

    EXPECT_NE(0, access(out.c_str(), F_OK));
}

TEST_F(BackendCheck, ExpandsEveryArgumentOnItsOwn) {
    job.setParam("name", "two words 'and a quote");
    load("command_check = /bin/sh -c 'printf \"%s\\n\" \"$@\" > {{out}}' sh {{name}} '' <{{name}}>");

    EXPECT_TRUE(backend.check(job));

    EXPECT_THAT(outLines(), ElementsAre("two words 'and a quote", "", "<two words 'and a quote>"));
}
