// The operator's and script writer's tool: reads the command line, and does the verb.

#include <syslog.h>

#include <clocale>
#include <csignal>
#include <exception>
#include <variant>

#include "options.h"
#include "output.h"
#include "shared/standard_descriptors.h"
#include "watchdog.h"

namespace {

int runTool(int argc, char** argv) {
    Options options;
    if (const std::optional<int> ended = readOptions(argc, argv, options)) {
        return *ended;
    }
    return std::visit([&options](const auto& verb) { return run(verb, options.globals); }, options.verb);
}

} // namespace

int main(int argc, char** argv) {
    openMissingStandardDescriptors();
    // Which bytes are visible characters. Numbers stay as JSON and scripts have them.
    std::setlocale(LC_CTYPE, "");
    openlog("marubackupctl", LOG_PID, LOG_USER);
    // A daemon or a reader of ours that goes away is an answer, not our end.
    std::signal(SIGPIPE, SIG_IGN);
    setInterrupted({std::string(), sayLine("interrupted"), EXIT_INTERRUPTED});
    try {
        return runTool(argc, argv);
    } catch (const std::exception& problem) {
        say(problem.what());
        return EXIT_OTHER;
    }
}
