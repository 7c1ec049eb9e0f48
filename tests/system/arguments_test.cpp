// What clients put into parameters, and what a command gets to see of it.

#include <fcntl.h>
#include <unistd.h>

#include <filesystem>

#include "daemon_test.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/named_rows.h"

using namespace MARU::Backup;

namespace {

/** A backup job of the backend "probe", declared by `lines`, with the path {{folder}}. */
class Arguments : public DaemonTest {
protected:
    Job probe(const std::string& lines) {
        support::writeLocalBackend("probe", "[backup]\n" + lines);
        Job job("probe", Job::ACTION_BACKUP);
        job.setParam("folder", folder.path());
        return job;
    }

    /** How the admitted `job` ends, which has to be by exit status 0. */
    void runs(const Job& job) {
        daemon->waitForLine(exitLine(add(job), 0));
    }

    /** What the job's only argument {{text}} is in the command. */
    std::string received(const std::string& text) {
        Job job =
            probe("command_launch = printf %s {{text}}\npipe_stdout = {{folder}}/received\nunique = {{folder}}\n");
        job.setParam("text", text);
        std::filesystem::remove(folder.path("received"));
        runs(job);
        return support::readFile(folder.path("received"));
    }
};

struct Text {
    const char* name;
    std::string value;
};

class AnArgument : public Arguments, public testing::WithParamInterface<Text> {};

std::string repeated(const std::string& piece, int times) {
    std::string text;
    for (int count = 0; count < times; ++count) {
        text += piece;
    }
    return text;
}

} // namespace

TEST_P(AnArgument, ReachesTheCommandAsItIs) {
    start();
    EXPECT_EQ(GetParam().value, received(GetParam().value));
}

INSTANTIATE_TEST_SUITE_P(
    Holding, AnArgument,
    testing::Values(Text{"Nothing", ""}, Text{"Blanks", "  two  words "}, Text{"Lines", "a\nb\r\n\n"},
                    Text{"SingleQuotes", "'it''s'"}, Text{"DoubleQuotes", "\"a\" \"\""},
                    Text{"Backslashes", "\\a\\\\\\"}, Text{"Braces", "{{text}} {{BACKEND}} {{{ }} }"},
                    Text{"Variables", "$HOME ${HOME} %PATH% ~"}, Text{"Commands", "`id` $(id) ; id & id | id && id"},
                    Text{"Redirections", "> /tmp/x < /dev/zero 2>&1"}, Text{"Patterns", "* ? [a-z] {a,b}"},
                    Text{"AnOption", "--help"}, Text{"Controls", "\x01\x1b[0m\x7f"},
                    Text{"NoUtf8", "\xff\xc0\x80\xed\xa0\x80"}, Text{"SectionsAndComments", "[backup]\n;x\n#y\na = b"},
                    Text{"AsMuchAsARequestCarries", std::string(16000, 'x')}),
    support::NameOfRow());

TEST_F(Arguments, MayBeLongerThanARequestByRepetition) {
    start();
    const std::string piece(10000, 'x');
    Job job =
        probe("command_launch = printf %s " + repeated("{{piece}}", 10) + "\npipe_stdout = {{folder}}/received\n");
    job.setParam("piece", piece);
    runs(job);
    EXPECT_EQ(std::string(100000, 'x'), support::readFile(folder.path("received")));
}

TEST_F(Arguments, ThatTheKernelDoesNotTakeEndTheJobAndSayWhy) {
    start();
    Job tooLong = probe("command_launch = touch {{folder}}/proof " + repeated("{{piece}}", 20) + "\n");
    tooLong.setParam("piece", std::string(10000, 'x'));
    daemon->waitForLine(exitLine(add(tooLong), 127));
    daemon->waitForLine("cannot run [touch]: Argument list too long");
    EXPECT_FALSE(std::filesystem::exists(folder.path("proof")));
}

TEST_F(Arguments, WithANulEndTheJobAndSayWhy) {
    start();
    Job job = probe("command_launch = touch {{folder}}/proof{{text}}\n");
    job.setParam("text", std::string("\0.txt", 5));
    daemon->waitForLine(exitLine(add(job), 127));
    daemon->waitForLine("cannot run [touch]: an argument contains a NUL byte");
    EXPECT_FALSE(std::filesystem::exists(folder.path("proof")));
}

TEST_F(Arguments, OfACheckThatCannotBeRunRefuseTheJobAndSayWhy) {
    start();
    Job job = probe("command_check = test -d {{text}}\ncommand_launch = touch {{folder}}/proof\n");
    job.setParam("text", std::string("/\0tmp", 5));
    EXPECT_EQ(400, controller.addJob(job));
    daemon->waitForLine("cannot run [test]: an argument contains a NUL byte");
    daemon->waitForLine("invalid job");
    EXPECT_FALSE(std::filesystem::exists(folder.path("proof")));
}

TEST_F(Arguments, ThatNameTheProgramCannotPretendToBeALineOfTheDiary) {
    start();
    Job job = probe("command_launch = {{program}}\n");
    job.setParam("program", "x\njob [1] exit(0)\n");
    daemon->waitForLine(exitLine(add(job), 127));
    daemon->waitForLine("cannot run [x?job [1] exit(0)?]: No such file or directory");
    EXPECT_EQ(0, daemon->countLines("job [1] exit(0)"));
}

TEST_F(Arguments, OfTheJobWithTheId256ContainANul) {
    // The id is put in as one character, and that of 256 is NUL.
    start();
    support::writeLocalBackend("quick", everyAction("command_launch = true\nunique = {{n}}\n"));
    for (int id = 1; id < 256; ++id) {
        Job job("quick", Job::ACTION_REMOVE_TASK);
        job.setParam("n", id);
        add(job);
    }
    Job job = probe("command_launch = touch {{folder}}/{{JOB_ID}}\n");
    const Job admitted = add(job);
    EXPECT_EQ(256, admitted.getJobId());
    daemon->waitForLine(exitLine(admitted, 127));
    daemon->waitForLine("cannot run [touch]: an argument contains a NUL byte");
}

TEST_F(Arguments, WithoutAValueNeverShortenAPath) {
    start();
    std::filesystem::create_directories(folder.path("{{target}}/old"));
    std::filesystem::create_directories(folder.path("old"));
    runs(probe("command_launch = rm -r {{folder}}/{{target}}/old\n"));
    EXPECT_FALSE(std::filesystem::exists(folder.path("{{target}}/old")));
    EXPECT_TRUE(std::filesystem::exists(folder.path("old")));
}

TEST_F(Arguments, StayInsideTheirWord) {
    start();
    Job job =
        probe("command_launch = printf [%s] {{text}} 'a {{text}}' x{{text}}y\npipe_stdout = {{folder}}/received\n");
    job.setParam("text", "b c");
    runs(job);
    EXPECT_EQ("[b c][a b c][xb cy]", support::readFile(folder.path("received")));
}

TEST_F(Arguments, AreNeverSeenByAShell) {
    start();
    const std::string proof = folder.path("proof");
    Job job = probe("command_check = true {{text}}\ncommand_launch = true {{text}}\n"
                    "pipe_stdout = {{folder}}/$(touch proof)\npipe_stderr = {{folder}}/`touch proof`\n");
    job.setParam("text", "$(touch " + proof + ") `touch " + proof + "`; touch " + proof + " | touch " + proof);
    runs(job);
    EXPECT_FALSE(std::filesystem::exists(proof));
    EXPECT_TRUE(std::filesystem::exists(folder.path("$(touch proof)")));
    EXPECT_TRUE(std::filesystem::exists(folder.path("`touch proof`")));
}
