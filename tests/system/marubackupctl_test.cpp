// The operator's tool, as a shell sees it: what it prints, and its exit status.

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <memory>

#include <json/reader.h>
#include <json/value.h>

#include "raw_requests.h"
#include "support/backend_files.h"
#include "support/fake_daemon.h"
#include "support/files.h"
#include "support/in_child.h"
#include "support/socket_peer.h"
#include "support/waiting.h"
#include "tool_test.h"

using namespace MARU::Backup;

using Marubackupctl = ToolTest;

namespace {

const std::string NOBODY_ANSWERS = "nobody answers at /var/run/marubackupd.socket: start marubackupd, or, if it runs, "
                                   "ask as root or as a member of the socket's group";

} // namespace

TEST_F(Marubackupctl, AddPrintsTheIdAloneAndHandsTheParametersOver) {
    start();
    support::Gate& gate = newGate();
    const Outcome outcome = run({"add", "gated", "backup", "--branch", "launch", "-p", "gate=" + gate.path(), "-p",
                                 "text=a=b:=c", "-p", "number:=5", "-p", "list:=[1,\"x\"]"});
    EXPECT_EQ("exit 0", outcome.ended);
    EXPECT_EQ("1\n", outcome.out);
    EXPECT_EQ("", outcome.err);

    Job job;
    ASSERT_EQ(200, controller.getJob(1, job));
    EXPECT_EQ("launch", job.getCommandBranch());
    EXPECT_EQ("a=b:=c", job.getParam("text", Json::Value()).asString());
    EXPECT_EQ(Json::Value(5), job.getParam("number", Json::Value()));
    EXPECT_EQ(2U, job.getParam("list", Json::Value()).size());
}

TEST_F(Marubackupctl, AddTakesForJsonWhatTheDaemonDoes) {
    start();
    for (const char* json :
         {R"("\ud83d\u0041")", R"("\ude00")", R"("\ud83d")", "01", "1.", "+1", "1 2", "[1,]", "//\n1", "{a:1}"}) {
        const Outcome outcome = run({"add", "gated", "backup", "-p", std::string("x:=") + json});
        EXPECT_EQ("exit 2", outcome.ended) << json;
        EXPECT_NE(std::string::npos, outcome.err.find("the value of x is not JSON")) << outcome.err;
    }
    const Outcome outcome = run({"add", "gated", "backup", "--json", "-p", "gate=" + newGate().path(), "-p",
                                 R"(whole:="\ud83d\ude00")", "-p", R"(twice:={"a":1,"a":2})"});
    EXPECT_EQ("exit 0", outcome.ended) << outcome.err;
    const Json::Value parameters = parse(outcome.out)["param"];
    EXPECT_EQ("\xF0\x9F\x98\x80", parameters["whole"].asString());
    EXPECT_EQ(2, parameters["twice"]["a"].asInt());
}

TEST_F(Marubackupctl, ListShowsWhatRunsAndWhatWaits) {
    start();
    addHeld(newGate());
    addHeld(newGate());
    Job running;
    ASSERT_EQ(200, controller.getJob(1, running));

    const Outcome table = run({"list"});
    EXPECT_EQ("exit 0", table.ended);
    EXPECT_EQ(0U, table.out.rfind("ID ACTION STATUS  PID", 0)) << table.out;
    EXPECT_NE(std::string::npos, table.out.find("\n1  backup running " + std::to_string(running.getPid())))
        << table.out;
    EXPECT_NE(std::string::npos, table.out.find("\n2  backup queued  -")) << table.out;

    const Json::Value jobs = parse(run({"--json", "list"}).out);
    ASSERT_EQ(2U, jobs.size());
    EXPECT_EQ(running.toJson(), jobs[0]);
}

TEST_F(Marubackupctl, ListTakesOnlyWhatItsFiltersTake) {
    start();
    addHeld(newGate());
    EXPECT_EQ(1U, parse(run({"list", "--json", "--action", "backup"}).out).size());
    EXPECT_EQ(0U, parse(run({"list", "--json", "--action", "relink"}).out).size());
    EXPECT_EQ(0U, parse(run({"list", "--json", "--backend", "other"}).out).size());
    EXPECT_EQ(1U, parse(run({"list", "--json", "--format", "{{BACKEND}}", "--target", "gated"}).out).size());
    EXPECT_EQ(1U, parse(run({"list", "--json", "--unique", gates[0]->path()}).out).size());
}

TEST_F(Marubackupctl, ListLetsNoControlCharacterOfAJobReachTheTerminal) {
    start();
    Job job("gated", Job::ACTION_BACKUP);
    job.setParam("gate", "\x1b[2J");
    addGated(Job::ACTION_BACKUP, newGate());
    add(job);
    const Outcome outcome = run({"list"});
    EXPECT_NE(std::string::npos, outcome.out.find("[2J")) << outcome.out;
    EXPECT_EQ(std::string::npos, outcome.out.find('\x1b')) << outcome.out;
}

TEST_F(Marubackupctl, ShowTellsAJobWithItsParameters) {
    start();
    addHeld(newGate());
    const Outcome text = run({"show", "1"});
    EXPECT_EQ("exit 0", text.ended);
    EXPECT_NE(std::string::npos, text.out.find("status: running\n")) << text.out;
    EXPECT_NE(std::string::npos, text.out.find("param.gate: " + gates[0]->path() + "\n")) << text.out;
    EXPECT_EQ("gated", parse(run({"show", "1", "--json"}).out)["backend"].asString());
}

TEST_F(Marubackupctl, RemoveTakesJobsOutAndReportsTheWorstOutcome) {
    start();
    addHeld(newGate());
    addHeld(newGate());
    EXPECT_EQ("exit 0", run({"remove", "2"}).ended);
    EXPECT_EQ("exit 3", run({"remove", "1", "77"}).ended);
    EXPECT_EQ("exit 3", run({"show", "2"}).ended);
    daemon->waitForLine("job [1] core dump");
}

TEST_F(Marubackupctl, WaitReturnsWhenTheJobsHaveEnded) {
    start();
    support::Gate& gate = newGate();
    const std::string id = addHeld(gate);
    EXPECT_EQ("exit 124", run({"wait", "--for", "0.1", id}).ended);

    const pid_t tool = startTool({"wait", id, "99"});
    gate.open();
    EXPECT_EQ("exit 0", finish(tool).ended);
}

TEST_F(Marubackupctl, BackendsListsTheInstalledOnesByName) {
    start();
    support::writeSystemBackend("zebra", "[restore]\ncommand_launch = true\ndelegate =\n");
    support::writeSystemBackend("ape", "[backup]\n[copy_to]\n");
    const Outcome table = run({"backends"});
    EXPECT_EQ("exit 0", table.ended);
    const std::size_t ape = table.out.find("\nape ");
    const std::size_t zebra = table.out.find("\nzebra ");
    EXPECT_TRUE(ape < zebra && zebra != std::string::npos) << table.out;
    EXPECT_NE(std::string::npos, table.out.find("backup,copy_to")) << table.out;
    EXPECT_EQ(2U, parse(run({"backends", "--json"}).out).size());
}

TEST_F(Marubackupctl, ARefusalIsStatusFourInWordsAndInJson) {
    start();
    addHeld(newGate());
    const Arguments same = {"add", "gated", "backup", "-p", "gate=" + gates[0]->path()};
    const Outcome words = run(same);
    EXPECT_EQ("exit 4", words.ended);
    EXPECT_EQ("", words.out);
    EXPECT_NE(std::string::npos, words.err.find("the same work is waiting or running")) << words.err;

    Arguments inJson = same;
    inJson.push_back("--json");
    const Outcome json = run(inJson);
    EXPECT_EQ("exit 4", json.ended);
    EXPECT_EQ(409, parse(json.out)["code"].asInt());
    EXPECT_EQ("exit 4", run({"add", "unheard-of", "backup"}).ended);
}

TEST_F(Marubackupctl, WrongUsageIsStatusTwo) {
    for (const Arguments& wrong : std::vector<Arguments>{{},
                                                         {"dance"},
                                                         {"add", "gated"},
                                                         {"add", "gated", "sing"},
                                                         {"add", "gated", "backup", "-p", "no-value"},
                                                         {"add", "gated", "backup", "-p", "x:={"},
                                                         {"show", "0"},
                                                         {"show", "x"},
                                                         {"list", "--format", "x"},
                                                         {"list", "--timeout", "0"}}) {
        const Outcome outcome = run(wrong);
        EXPECT_EQ("exit 2", outcome.ended) << outcome.err;
        EXPECT_EQ("", outcome.out);
        EXPECT_NE("", outcome.err);
    }
}

TEST_F(Marubackupctl, TheNameOfAVerbMayBeTheValueOfAnOption) {
    start();
    const Outcome outcome = run({"--json", "list", "--backend", "add"});
    EXPECT_EQ("exit 0", outcome.ended) << outcome.err;
    EXPECT_EQ("[]\n", outcome.out);
}

TEST_F(Marubackupctl, HelpNamesAllVerbsWhateverTheLineDoes) {
    for (const Arguments& line : {Arguments{"--help"}, Arguments{"-h", "--timeout", "3"}}) {
        const Outcome help = run(line);
        EXPECT_EQ("exit 0", help.ended);
        for (const char* verb :
             {"add", "list", "show", "remove", "wait", "backends", "status", "session", "archive-version"}) {
            EXPECT_NE(std::string::npos, help.out.find(std::string("\n  ") + verb + " ")) << verb << help.out;
        }
    }
    const Outcome help = run({"session", "--help"});
    EXPECT_EQ("exit 0", help.ended);
    EXPECT_NE(std::string::npos, help.out.find("\n  create ")) << help.out;
    EXPECT_EQ(std::string::npos, help.out.find("\n  archive-version ")) << help.out;
}

TEST_F(Marubackupctl, NoDaemonIsStatusFiveInTheSameWordsEveryTime) {
    for (int time = 0; time < 20; ++time) {
        const Outcome outcome = run({"list"});
        EXPECT_EQ("exit 5", outcome.ended);
        EXPECT_EQ("marubackupctl: cannot list: " + NOBODY_ANSWERS + " (code 503)\n", outcome.err);
    }
}

TEST_F(Marubackupctl, AStoppedDaemonIsStatus124) {
    start();
    daemon->signal(SIGSTOP);
    const Outcome outcome = run({"list", "--timeout", "0.2"});
    EXPECT_EQ("exit 124", outcome.ended);
    EXPECT_NE(std::string::npos, outcome.err.find("no answer from marubackupd within 0.2 seconds")) << outcome.err;
    daemon->signal(SIGCONT);
}

TEST_F(Marubackupctl, ADaemonThatGoesAwayBeforeItsAnswerIsStatusFive) {
    start();
    daemon->signal(SIGSTOP);
    const pid_t tool = startTool({"list"});
    awaitItsSleep(tool);
    daemon->stop(SIGKILL);
    EXPECT_EQ("exit 5", finish(tool).ended);
}

namespace {

/** The connection over which the tool has asked for a list. Its others only look whether somebody serves. */
std::unique_ptr<support::SocketPeer> acceptList(int listener) {
    const std::string request = support::frame(LIST_REQUEST);
    while (true) {
        auto peer = std::make_unique<support::SocketPeer>(accept(listener, nullptr, nullptr));
        if (peer->read(request.size()) == request) {
            return peer;
        }
    }
}

} // namespace

TEST_F(Marubackupctl, ADaemonThatGoesAwayInTheMiddleOfItsAnswerIsStatusFive) {
    const std::string answer = support::frame("{\"code\":200,\"jobs\":[]}");
    for (const std::size_t sent : {std::size_t{2}, std::size_t{4}, std::size_t{9}, answer.size() - 1}) {
        const int listener = support::listenAt(support::DAEMON_SOCKET);
        const pid_t tool = startTool({"list"});
        acceptList(listener)->write(answer.substr(0, sent));
        close(listener);
        std::filesystem::remove(support::DAEMON_SOCKET);
        const Outcome outcome = finish(tool);
        EXPECT_EQ("exit 5", outcome.ended) << sent;
        EXPECT_EQ("", outcome.out);
        EXPECT_EQ("marubackupctl: the daemon ended meanwhile: " + NOBODY_ANSWERS + "\n", outcome.err);
    }
}

TEST_F(Marubackupctl, AnAnswerThatAnotherDaemonWillNotFinishTimesOut) {
    const int listener = support::listenAt(support::DAEMON_SOCKET); // serves on, as one that was started anew does
    const pid_t tool = startTool({"list", "--timeout", "0.5"});
    acceptList(listener)->write(support::frame("{\"code\":200}").substr(0, 7));
    EXPECT_EQ("exit 124", finish(tool).ended);
    close(listener);
}

TEST_F(Marubackupctl, AnAnswerThatCannotBeReadIsStatusOne) {
    for (const char* answer : {"nonsense", "", "[]", "{}", "{\"code\":\"200\"}", "{\"code\":200}", "{\"code\":999}"}) {
        const support::FakeDaemon strange({answer});
        const Outcome outcome = run({"list"});
        EXPECT_EQ("exit 1", outcome.ended) << answer;
        EXPECT_EQ("", outcome.out) << answer;
        EXPECT_NE(std::string::npos,
                  outcome.err.find("the daemon failed, or its answer cannot be read: see the system log"))
            << answer << ": " << outcome.err;
    }
}

TEST_F(Marubackupctl, AnInterruptedOneIsStatus130) {
    start();
    daemon->signal(SIGSTOP);
    const pid_t tool = startTool({"list"});
    awaitItsSleep(tool);
    kill(tool, SIGINT);
    EXPECT_EQ("exit 130", finish(tool).ended);
    daemon->signal(SIGCONT);
}
