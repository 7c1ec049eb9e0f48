#include "sub_process_fixture.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "support/files.h"
#include "support/in_child.h"
#include "support/waiting.h"

using MARU::Backup::SubProcess;
using support::readFile;
using support::writeFile;

namespace {

const char* const WAY_NAMES[] = {"Call", "Exec", "Start"};

/** What a caller reports of a program that it called, or could not replace itself with. */
struct Result {
    int status;
    int error;
};

int run(const SubProcess& process, Way way) {
    switch (way) {
    case Way::CALL:
        return process.call();
    case Way::START: {
        const pid_t child = process.start(0);
        return child < 0 ? process.exec() : support::waitForChild(child);
    }
    default:
        return process.exec();
    }
}

} // namespace

INSTANTIATE_TEST_SUITE_P(SubProcess, ARunProgram, testing::Values(Way::CALL, Way::EXEC, Way::START),
                         [](const testing::TestParamInfo<Way>& way) { return WAY_NAMES[static_cast<int>(way.param)]; });

std::string ARunProgram::outcome(const SubProcess& process, const Preparation& prepare) {
    int report[2];
    EXPECT_EQ(0, pipe2(report, O_CLOEXEC));
    const int callerStatus = support::runInChild([&] {
        setenv("PATH", "/usr/bin:/bin", 1);
        prepare();
        const int status = run(process, GetParam());
        const Result result = {status, errno};
        return write(report[1], &result, sizeof result) == sizeof result ? 0 : 1;
    });
    close(report[1]);
    Result result = {callerStatus, 0};
    const ssize_t got = read(report[0], &result, sizeof result); // nothing once a program took the caller's place
    close(report[0]);
    EXPECT_TRUE(got == 0 || got == sizeof result);
    errno = result.error;
    return support::describeStatus(result.status);
}

std::string ARunProgram::outputOf(SubProcess& process, const Preparation& prepare) {
    process.setStdOutput(out, 0);
    EXPECT_EQ("exit 0", outcome(process, prepare));
    return readFile(out);
}

std::string ARunProgram::reportOf(SubProcess& process) {
    const std::string report = dir.path("report");
    writeFile(report, "");
    // Its own errors go to another file; why it is not there to write any does not.
    process.setStdError(err, 0);
    outcome(process, [&] { dup2(open(report.c_str(), O_WRONLY), STDERR_FILENO); });
    return readFile(report);
}

std::vector<std::string> ARunProgram::outcomesOfAScriptWithoutInterpreter() {
    const std::string script = dir.path("script");
    writeFile(script, "echo > " + ran + "\n", 0755);
    const auto searchThere = [this] { setenv("PATH", dir.path().c_str(), 1); };
    return {outcome(SubProcess({script})), outcome(SubProcess({"script"}), searchThere)};
}

std::vector<std::string> ARunProgram::outcomesWithOutputTo(const std::string& path) {
    SubProcess output({"touch", ran});
    output.setStdOutput(path, 0);
    SubProcess error({"touch", ran});
    error.setStdError(path, 0);
    return {outcome(output), outcome(error)};
}

std::string ARunProgram::refusal(const std::string& reason) {
    return GetParam() == Way::START ? "exit 127" : "failed: " + reason;
}

std::list<std::string> shell(const std::string& script) {
    return {"/bin/sh", "-c", script};
}

std::string field(const std::string& text, const std::string& label) {
    const std::size_t start = text.find(label);
    if (start == std::string::npos) {
        return "no " + label;
    }
    const std::size_t valueStart = text.find_first_not_of(" \t", start + label.size());
    return text.substr(valueStart, text.find('\n', valueStart) - valueStart);
}

void openMoreDescriptors() {
    const int null = open("/dev/null", O_RDWR);
    for (const int descriptor : {0, 3, 4, 17, 200}) {
        dup2(null, descriptor);
    }
}
