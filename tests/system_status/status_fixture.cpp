#include "status_fixture.h"

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>

#include "support/appliance.h"
#include "support/in_child.h"

using namespace MARU::Backup;

namespace {

const char* const QUESTIONS = "/run/snapshot_questions";

} // namespace

const std::string EMPTY_LISTING = "{\"code\":200,\"jobs\":[]}";

Verdict ask(bool (*predicate)(Job::Action&)) {
    auto reason = static_cast<Job::Action>(OWN_REASON);
    const bool allowed = predicate(reason);
    return {allowed, reason};
}

std::string listing(Job::Action action) {
    return "{\"code\":200,\"jobs\":[" + Job("anything", action).toString() + "]}";
}

std::string runningTask(pid_t pid) {
    return "{\"pid\": " + std::to_string(pid) + ", \"finished\": false}";
}

SystemStatus::SystemStatus() {
    support::emptyAppliance();
    setSnapshotTool(0);
}

SystemStatus::~SystemStatus() {
    while (!processes.empty()) {
        endProcess(processes.front());
    }
    support::emptyAppliance();
}

void SystemStatus::setSnapshotTool(int status) {
    support::writeFile(QUESTIONS, "");
    support::installSnapshotTool("echo \"$@\" >> " + std::string(QUESTIONS) + "\nexit " + std::to_string(status));
}

int SystemStatus::snapshotQuestions() {
    const std::string questions = support::readFile(QUESTIONS);
    const auto count = std::count(questions.begin(), questions.end(), '\n');
    std::string expected;
    for (auto question = count; question > 0; --question) {
        expected += "is-restore-running\n";
    }
    EXPECT_EQ(expected, questions);
    return static_cast<int>(count);
}

pid_t SystemStatus::startProcess() {
    const pid_t process = support::startInChild([]() -> int {
        for (;;) {
            pause();
        }
    });
    processes.push_back(process);
    return process;
}

void SystemStatus::leaveAsZombie(pid_t process) {
    kill(process, SIGKILL);
    siginfo_t info = {};
    EXPECT_EQ(0, waitid(P_PID, static_cast<id_t>(process), &info, WEXITED | WNOWAIT));
}

void SystemStatus::endProcess(pid_t process) {
    kill(process, SIGKILL);
    support::waitForChild(process);
    processes.remove(process);
}
