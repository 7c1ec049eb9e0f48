// What the operator's tool tells of the system, and what it does with sessions.

#include <sys/mount.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "support/appliance.h"
#include "support/fake_daemon.h"
#include "support/files.h"
#include "support/waiting.h"
#include "tool_test.h"

using namespace MARU::Backup;

namespace {

class MarubackupctlStatus : public ToolTest {
protected:
    MarubackupctlStatus() {
        support::emptyAppliance();
        support::installSnapshotTool("exit 0");
    }
    ~MarubackupctlStatus() override {
        support::emptyAppliance();
    }

    Json::Value status(const Arguments& more = {}) {
        Arguments arguments = {"status", "--json"};
        arguments.insert(arguments.end(), more.begin(), more.end());
        const Outcome outcome = run(arguments);
        EXPECT_EQ("exit 0", outcome.ended);
        return parse(outcome.out);
    }

    /** Why it may not start; "yes" if it may. */
    static std::string reason(const Json::Value& status, const std::string& predicate) {
        const Json::Value& entry = status[predicate];
        EXPECT_EQ(entry["answer"].asBool(), !entry.isMember("reason")) << predicate;
        return entry["answer"].asBool() ? "yes" : entry["reason"].asString();
    }
};

class MarubackupctlSession : public ToolTest {
protected:
    /** Makes one by the tool, with the daemon up; its id. */
    std::string create(const std::string& lifetime) {
        const Outcome outcome = run({"session", "create", "--lifetime", lifetime});
        EXPECT_EQ("exit 0", outcome.ended) << outcome.err;
        return outcome.out.substr(0, outcome.out.find('\n'));
    }

    std::string pathOf(const std::string& id) {
        const Outcome outcome = run({"session", "path", id});
        EXPECT_EQ("exit 0", outcome.ended) << outcome.err;
        return outcome.out.substr(0, outcome.out.find('\n'));
    }

    /** How many sessions there are. */
    static std::size_t count() {
        std::error_code none;
        const std::filesystem::directory_iterator records("/var/run/marusession", none);
        return static_cast<std::size_t>(std::distance(begin(records), end(records)));
    }
};

} // namespace

TEST_F(MarubackupctlStatus, TellsWhatMayStartAndWhatIsAtWork) {
    start();
    EXPECT_EQ("WHETHER                             ANSWER BECAUSE\n"
              "a backup may start                  yes    -\n"
              "a restore may start                 yes    -\n"
              "a copy-to may start                 yes    -\n"
              "a copy-to may be queued             yes    -\n"
              "a backup runs or is queued          no     -\n"
              "a restore runs or is queued         no     -\n"
              "a copy-to runs or is queued         no     -\n"
              "a backup runs outside of the queue  no     -\n"
              "a restore runs outside of the queue no     -\n"
              "a copy-to runs outside of the queue no     -\n",
              run({"status"}).out);
}

TEST_F(MarubackupctlStatus, GivesTheReasonInWordsAndByName) {
    start();
    addGated(Job::ACTION_COPY_TO, newGate());
    const Json::Value told = status();
    EXPECT_EQ("yes", reason(told, "can_backup"));
    EXPECT_EQ("copy_to", reason(told, "can_restore"));
    EXPECT_EQ("copy_to", reason(told, "can_copy_to"));
    EXPECT_EQ("yes", reason(told, "can_queue_copy_to"));
    EXPECT_EQ("a copy-to runs or is queued", told["can_restore"]["words"].asString());
    EXPECT_TRUE(told["copy_to_running"]["answer"].asBool());
    EXPECT_FALSE(told["copy_to_running_not_queued"]["answer"].asBool());
    EXPECT_NE(std::string::npos, run({"status"})
                                     .out.find("a restore may start                 no     a copy-to runs "
                                               "or is queued\n"));
}

TEST_F(MarubackupctlStatus, KnowsEachReason) {
    start();
    support::installSnapshotTool("exit 1");
    EXPECT_EQ("share_snapshot_restore", reason(status(), "can_backup"));
    addGated(Job::ACTION_BACKUP, newGate());
    support::installSnapshotTool("exit 0");
    EXPECT_EQ("backup", reason(status(), "can_restore"));
    addGated(Job::ACTION_RESTORE, newGate());
    EXPECT_EQ("restore", reason(status(), "can_backup"));
    support::writeFile(support::SPACE_BUILD_FILE, "");
    EXPECT_EQ("space_build", reason(status(), "can_backup"));
}

TEST_F(MarubackupctlStatus, MayAskAboutOneBackend) {
    start();
    addGated(Job::ACTION_BACKUP, newGate());
    EXPECT_TRUE(status({"--backend", "gated"})["backup_running"]["answer"].asBool());
    EXPECT_FALSE(status({"--backend", "other"})["backup_running"]["answer"].asBool());
}

TEST_F(MarubackupctlStatus, WithoutADaemonKnowsOfNoJobAndSaysSo) {
    const Outcome outcome = run({"status"});
    EXPECT_EQ("exit 0", outcome.ended);
    EXPECT_EQ("marubackupctl: nobody answers at /var/run/marubackupd.socket: no job is known of\n", outcome.err);
    EXPECT_NE(std::string::npos, outcome.out.find("a backup may start                  yes"));
}

TEST_F(MarubackupctlStatus, OfADaemonThatIsStoppedTimesOut) {
    start();
    daemon->signal(SIGSTOP);
    EXPECT_EQ("exit 124", run({"status", "--timeout", "0.2"}).ended);
    daemon->signal(SIGCONT);
}

TEST_F(MarubackupctlStatus, OfADaemonThatGoesAwayMeanwhileIsStatusFive) {
    start();
    daemon->signal(SIGSTOP);
    const pid_t tool = startTool({"status"});
    awaitItsSleep(tool);
    daemon->stop(SIGKILL);
    EXPECT_EQ("exit 5", finish(tool).ended);
}

TEST_F(MarubackupctlSession, IsMadeAndFoundAndRemoved) {
    start();
    const std::string id = create("3600");
    const std::string path = pathOf(id);
    EXPECT_EQ(0700U, support::permissionsOf(path));

    EXPECT_EQ("exit 0", run({"session", "destroy", id}).ended);
    EXPECT_NE(0, access(path.c_str(), F_OK));
    EXPECT_EQ("exit 3", run({"session", "path", id}).ended);
    EXPECT_EQ("exit 3", run({"session", "destroy", id}).ended);
}

TEST_F(MarubackupctlSession, IsToldInJsonToo) {
    start();
    const Json::Value made = parse(run({"session", "create", "--lifetime", "3600", "--json"}).out);
    const std::string id = made["sess_id"].asString();
    EXPECT_EQ(made, parse(run({"session", "path", id, "--json"}).out));
    EXPECT_EQ(made["path"].asString(), pathOf(id));
    const Json::Value left = parse(run({"session", "expire", id, "--lifetime", "3600", "--json"}).out);
    EXPECT_EQ(id, left["sess_id"].asString());
    EXPECT_LT(3500, left["seconds_left"].asInt());
    EXPECT_EQ("exit 0", run({"session", "destroy", id}).ended);
}

TEST_F(MarubackupctlSession, IsGoneAfterItsLifetime) {
    start();
    const std::string path = parse(run({"session", "create", "--lifetime", "1", "--json"}).out)["path"].asString();
    EXPECT_TRUE(support::waitUntil([&path]() { return access(path.c_str(), F_OK) != 0; }));
    EXPECT_TRUE(support::waitUntil([]() { return count() == 0; }));
}

TEST_F(MarubackupctlSession, ExpiresWhenItIsTime) {
    start();
    const std::string id = create("3600");
    const std::string path = pathOf(id);
    support::writeFile(path + "/read a moment ago", "");
    const timespec longAgo[2] = {{1000, 0}, {1000, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, path.c_str(), longAgo, 0));

    const Outcome kept = run({"session", "expire", id, "--lifetime", "100"});
    EXPECT_EQ("exit 0", kept.ended);
    EXPECT_LT(50, std::stoi(kept.out));
    EXPECT_EQ("0\n", run({"session", "expire", id, "--lifetime", "100", "--ignore-files"}).out);
    EXPECT_NE(0, access(path.c_str(), F_OK));
    EXPECT_EQ("0\n", run({"session", "expire", id, "--lifetime", "100"}).out) << "it is gone already";
}

TEST_F(MarubackupctlSession, ThatCannotBeRemovedIsReported) {
    start();
    const std::string id = create("3600");
    const std::string path = pathOf(id);
    std::filesystem::create_directory(path + "/mounted");
    ASSERT_EQ(0, mount("tmpfs", (path + "/mounted").c_str(), "tmpfs", 0, nullptr));
    EXPECT_EQ("exit 1", run({"session", "destroy", id}).ended);
    EXPECT_EQ("exit 1", run({"session", "expire", id, "--lifetime", "0"}).ended);
    ASSERT_EQ(0, umount((path + "/mounted").c_str()));
    EXPECT_EQ("exit 0", run({"session", "destroy", id}).ended);
}

TEST_F(MarubackupctlSession, ThatNobodyWouldRemoveIsNotMade) {
    const std::size_t before = count();
    const Outcome unreachable = run({"session", "create", "--lifetime", "5"});
    EXPECT_EQ("exit 5", unreachable.ended);
    EXPECT_EQ("", unreachable.out);
    EXPECT_EQ(before, count());

    const support::FakeDaemon refusing({"{\"code\":500}"});
    EXPECT_EQ("exit 1", run({"session", "create", "--lifetime", "5"}).ended);
    EXPECT_EQ(before, count());
}

TEST_F(MarubackupctlSession, NeedsAVerbAndALifetime) {
    EXPECT_EQ("exit 2", run({"session"}).ended);
    EXPECT_EQ("exit 2", run({"session", "create"}).ended);
    EXPECT_EQ("exit 2", run({"session", "create", "--lifetime", "1.5"}).ended);
    EXPECT_EQ("exit 2", run({"session", "create", "--lifetime", "9223372036854775808"}).ended);
    EXPECT_EQ("exit 2", run({"session", "path", ""}).ended);
    EXPECT_EQ("exit 3", run({"session", "path", "../../etc"}).ended);
    EXPECT_EQ("exit 1", run({"session", "expire", "../../etc", "--lifetime", "0"}).ended);
}
