#include "daemon.h"

#include <cstddef>
#include <sstream>

#include <marubackup/controller.h>

#include "output.h"
#include "shared/daemon_socket.h"
#include "verdict.h"
#include "watchdog.h"

namespace {

const std::size_t LONGEST_REQUEST = 16380;
/** What the longest request, that to add a job, has besides its content. */
const std::string FRAME_OF_REQUEST = R"({"job":,"op":"job_enqueue"})";

const std::string NO_ANSWER_WITHIN = "no answer from marubackupd within ";
const std::string GIVE_IT_LONGER = ": it may be busy with a backend's check command; give it longer with --timeout";

LastWords late(const std::string& message) {
    return {std::string(), sayLine(message), EXIT_TIMED_OUT};
}

LastWords gone(const Globals& globals) {
    const Verdict verdict = verdictOn(CODE_NOT_REACHABLE);
    return {failureData(verdict, globals), sayLine("the daemon ended meanwhile: " + verdict.reason), verdict.status};
}

} // namespace

std::string inSeconds(double seconds) {
    std::ostringstream text;
    text << seconds << (seconds == 1 ? " second" : " seconds");
    return text.str();
}

int askDaemon(const Request& request, const Globals& globals, double seconds, const std::string& lateMessage) {
    const Watchdog watchdog(seconds, late(lateMessage), gone(globals));
    // One for each request: a connection kept over a pause may be one to a daemon that has gone since.
    MARU::Backup::JobController controller;
    const int code = request(controller);
    return code == CODE_UNREADABLE && !isDaemonThere() ? CODE_NOT_REACHABLE : code;
}

int askDaemon(const Request& request, const Globals& globals) {
    return askDaemon(request, globals, globals.timeout,
                     NO_ANSWER_WITHIN + inSeconds(globals.timeout) +
                         ": it may be busy with a backend's check command, and do this later; look with "
                         "\"marubackupctl list\", or give it longer with --timeout");
}

void askLibrary(const std::function<void()>& question, const Globals& globals) {
    const auto ifThere = isDaemonThere() ? std::make_optional(gone(globals)) : std::nullopt;
    const Watchdog watchdog(globals.timeout, late(NO_ANSWER_WITHIN + inSeconds(globals.timeout) + GIVE_IT_LONGER),
                            ifThere);
    question();
}

bool fitsIntoRequest(const std::string& content) {
    const std::size_t size = content.size() + FRAME_OF_REQUEST.size();
    if (size > LONGEST_REQUEST) {
        say("these arguments are too long: the daemon takes requests of " + std::to_string(LONGEST_REQUEST) +
            " bytes, and this would be one of " + std::to_string(size));
    }
    return size <= LONGEST_REQUEST;
}
