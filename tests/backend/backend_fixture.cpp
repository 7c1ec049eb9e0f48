#include "backend_fixture.h"

#include <sstream>

#include "support/backend_files.h"
#include "support/in_child.h"

using MARU::Backup::Job;

BackendTest::BackendTest() : job("b", Job::ACTION_BACKUP) {
    job.setParam("name", "n");
    job.setParam("out", out);
}

BackendTest::~BackendTest() {
    support::removeAllBackends();
}

void BackendTest::load(const std::string& lines) {
    support::writeLocalBackend("b", "[backup]\n" + lines + "\n");
    EXPECT_TRUE(backend.load("b", "backup"));
}

std::string BackendTest::launch() {
    pid_t ignored = -1;
    return launch(ignored);
}

std::string BackendTest::launch(pid_t& child) {
    child = support::startInChild([this]() { return backend.launch(job) ? 101 : 102; });
    return support::describeStatus(support::waitForChild(child));
}

std::vector<std::string> BackendTest::outLines() const {
    std::vector<std::string> lines;
    std::istringstream text(support::readFile(out));
    for (std::string line; std::getline(text, line);) {
        lines.push_back(line);
    }
    return lines;
}
