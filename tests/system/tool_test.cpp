#include "tool_test.h"

#include <fcntl.h>
#include <unistd.h>

#include <memory>

#include <json/reader.h>
#include <json/value.h>

#include "support/files.h"
#include "support/in_child.h"
#include "support/waiting.h"

pid_t ToolTest::startTool(const Arguments& arguments) {
    return support::startInChild([&]() {
        redirect(STDOUT_FILENO, "out");
        redirect(STDERR_FILENO, "err");
        std::vector<char*> argv = {const_cast<char*>("marubackupctl")};
        for (const std::string& argument : arguments) {
            argv.push_back(const_cast<char*>(argument.c_str()));
        }
        argv.push_back(nullptr);
        execv(MARUBACKUPCTL, argv.data());
        return 126;
    });
}

Outcome ToolTest::finish(pid_t tool) {
    const std::string ended = support::describeStatus(support::waitForChild(tool));
    return {ended, support::readFile(folder.path("out")), support::readFile(folder.path("err"))};
}

Outcome ToolTest::run(const Arguments& arguments) {
    return finish(startTool(arguments));
}

void ToolTest::awaitItsSleep(pid_t tool) {
    const std::string process = "/proc/" + std::to_string(tool);
    EXPECT_TRUE(support::waitUntil([&process]() {
        return support::readFile(process + "/comm") == "marubackupctl\n" &&
               support::readFile(process + "/status").find("State:\tS") != std::string::npos;
    }));
}

std::string ToolTest::addHeld(support::Gate& gate) {
    const Outcome outcome = run({"add", "gated", "backup", "-p", "gate=" + gate.path()});
    EXPECT_EQ("exit 0", outcome.ended) << outcome.err;
    return outcome.out.substr(0, outcome.out.find('\n'));
}

Json::Value ToolTest::parse(const std::string& text) {
    Json::Value value;
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    EXPECT_TRUE(reader->parse(text.data(), text.data() + text.size(), &value, nullptr)) << text;
    return value;
}

void ToolTest::redirect(int descriptor, const std::string& name) {
    dup2(open(folder.path(name).c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600), descriptor);
}
