#include "daemon_test.h"

#include <algorithm>
#include <filesystem>

#include "support/backend_files.h"
#include "support/socket_peer.h"

using namespace MARU::Backup;

const std::string WAITS_AT_GATE = "command_launch = /bin/sh -c 'read line < \"$0\"' {{gate}}\n";

std::string everyAction(const std::string& lines) {
    std::string text;
    for (const char* action :
         {"backup", "restore", "copy_to", "relink", "remove_version", "remove_task", "target_copy_to"}) {
        text += "[" + std::string(action) + "]\n" + lines;
    }
    return text;
}

std::string exitLine(const Job& job, int status) {
    return "job [" + std::to_string(job.getJobId()) + "] exit(" + std::to_string(status) + ")";
}

DaemonTest::DaemonTest() {
    // What the daemon of an earlier test in the same sandbox has left.
    std::filesystem::remove(support::DAEMON_SOCKET);
    std::filesystem::remove("/var/run/marubackupd.lock");
    support::removeAllBackends();
    const std::string unique = "unique = {{gate}}\n";
    support::writeLocalBackend("gated", everyAction(WAITS_AT_GATE + unique));
    support::writeLocalBackend(
        "stubborn",
        everyAction("command_launch = /bin/sh -c 'trap \"\" TERM; read line < \"$0\"' {{gate}}\n" + unique));
}

void DaemonTest::start(const support::DaemonOptions& options) {
    daemon = std::make_unique<support::Daemon>(options);
}

support::Gate& DaemonTest::newGate() {
    gates.push_back(std::make_unique<support::Gate>(folder.path("gate" + std::to_string(gates.size()))));
    return *gates.back();
}

Job DaemonTest::addGated(Job::Action action, support::Gate& gate, const std::string& backend) {
    Job job(backend, action);
    job.setParam("gate", gate.path());
    return add(job);
}

Job DaemonTest::add(Job job) {
    EXPECT_EQ(200, controller.addJob(job)) << job;
    return job;
}

Job::Status DaemonTest::statusOf(const Job& job) {
    Job found;
    return controller.getJob(job.getJobId(), found) == 200 ? found.getStatus() : Job::STATUS_NONE;
}

int DaemonTest::pidOf(const Job& job) {
    Job found;
    EXPECT_EQ(200, controller.getJob(job.getJobId(), found));
    return found.getPid();
}

bool DaemonTest::isRunning(const Job& job) {
    return statusOf(job) == Job::STATUS_RUNNING;
}

bool DaemonTest::isQueued(const Job& job) {
    return statusOf(job) == Job::STATUS_QUEUED;
}

std::size_t DaemonTest::placeInDiary(const std::string& line) {
    const std::vector<std::string> diary = daemon->diary();
    const auto place = std::find(diary.begin(), diary.end(), line);
    EXPECT_NE(diary.end(), place) << line;
    return static_cast<std::size_t>(place - diary.begin());
}
