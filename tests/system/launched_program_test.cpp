// What a backend's command finds when it starts.

#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>

#include "daemon_test.h"
#include "support/backend_files.h"
#include "support/files.h"

using namespace MARU::Backup;

namespace {

class LaunchedProgram : public DaemonTest {
protected:
    /** Runs `command` as a backup job with these further lines; what it printed. */
    std::string outputOf(const std::string& command, const std::string& lines = "") {
        const std::string output = folder.path("output");
        support::writeLocalBackend("probe",
                                   "[backup]\ncommand_launch = " + command + "\npipe_stdout = {{output}}\n" + lines);
        Job job("probe", Job::ACTION_BACKUP);
        job.setParam("output", output);
        job.setParam("text", "a \"b\" {{BACKEND}} $HOME `id` \n 'c'");
        daemon->waitForLine(exitLine(add(job), 0));
        return support::readFile(output);
    }
};

/** The value of a line "name:\tvalue" in /proc/self/status. */
std::string statusValue(const std::string& status, const std::string& name) {
    const std::size_t begin = status.find("\n" + name + ":\t") + name.size() + 3;
    return status.substr(begin, status.find('\n', begin) - begin);
}

} // namespace

TEST_F(LaunchedProgram, HasNoDescriptorsButTheFirstThree) {
    start();
    // The listing itself opens one more.
    EXPECT_EQ("0\n1\n2\n3\n", outputOf("ls /proc/self/fd"));
}

TEST_F(LaunchedProgram, HasDefaultSignalsAndTheUmaskOfTheDaemonsStart) {
    support::DaemonOptions options;
    options.beforeStart = []() {
        umask(0026);
        signal(SIGUSR1, SIG_IGN);
    };
    start(options);
    const std::string status = outputOf("cat /proc/self/status");
    EXPECT_EQ("0000000000000000", statusValue(status, "SigBlk"));
    EXPECT_EQ("0000000000000000", statusValue(status, "SigIgn"));
    EXPECT_EQ("0000000000000000", statusValue(status, "SigCgt"));
    EXPECT_EQ("0026", statusValue(status, "Umask"));
}

TEST_F(LaunchedProgram, RunsAtNiceFiveUnlessItsPrioritySaysOtherwise) {
    start();
    EXPECT_EQ("5\n", outputOf("nice"));
    EXPECT_EQ("5\n10\n", outputOf("nice", "priority = 10\n"));
}

TEST_F(LaunchedProgram, GetsItsArgumentsAsTheyAre) {
    start();
    EXPECT_EQ("[a \"b\" {{BACKEND}} $HOME `id` \n 'c'][{{missing}}/x][probe]",
              outputOf("printf [%s] {{text}} {{missing}}/x {{BACKEND}}"));
}

TEST_F(LaunchedProgram, GetsTheJobIdAsOneCharacter) {
    start();
    EXPECT_EQ("\x01", outputOf("printf %s {{JOB_ID}}"));
}

TEST_F(LaunchedProgram, GetsNoVariablesFromAWellFormedEnviron) {
    start();
    EXPECT_EQ("[]", outputOf("/bin/sh -c 'printf [$A]'", "eviron = {\"A\":\"1\"}\n"));
    const support::SyslogLine line = log.waitFor("wrong config: bad env");
    EXPECT_EQ(LOG_ERR, line.priority);
    EXPECT_EQ("backend_manager", support::parseLocated(line.message).unit);
}

TEST_F(LaunchedProgram, GetsTheVariablesThatAMalformedEnvironLeavesBehind) {
    start();
    EXPECT_EQ("[1][probe][{{none}}]",
              outputOf("/bin/sh -c 'printf \"[$A][$B][$C]\"'",
                       "eviron = {\"A\":1,\"B\":\"{{BACKEND}}\",\"C\":\"{{none}}\",\"D\":[]} x\n"));
    EXPECT_EQ(0, log.count("bad env"));
}

TEST_F(LaunchedProgram, MayWriteBothItsStreamsIntoOneFile) {
    start();
    EXPECT_EQ("out\nerr\n", outputOf("/bin/sh -c 'echo out; echo err >&2'", "pipe_stderr = {{output}}\n"));
}

TEST_F(LaunchedProgram, DoesNotStartIfItsOutputFileCannotBeOpened) {
    start();
    support::writeLocalBackend("probe", "[backup]\ncommand_launch = touch {{proof}}\npipe_stdout = /nowhere/file\n");
    Job job("probe", Job::ACTION_BACKUP);
    job.setParam("proof", folder.path("proof"));
    daemon->waitForLine(exitLine(add(job), 127));
    EXPECT_NE(0, access(folder.path("proof").c_str(), F_OK));
}

TEST_F(LaunchedProgram, ThatIsACheckSeesNoMoreOfTheDaemonThanAJob) {
    const std::string proof = folder.path("proof");
    support::writeLocalBackend("probe",
                               "[backup]\ncommand_launch = true\n"
                               "command_check = /bin/sh -c 'ls /proc/self/fd > \"$0\"; cat /proc/self/status >> "
                               "\"$0\"' " +
                                   proof + "\n");
    start();
    add(Job("probe", Job::ACTION_BACKUP));
    const std::string seen = support::readFile(proof);
    EXPECT_EQ(0U, seen.rfind("0\n1\n2\n3\n", 0)) << seen;
    EXPECT_EQ("0000000000000000", statusValue(seen, "SigBlk"));
    EXPECT_EQ("0000000000000000", statusValue(seen, "SigIgn"));
    EXPECT_EQ("0000000000000000", statusValue(seen, "SigCgt"));
}
