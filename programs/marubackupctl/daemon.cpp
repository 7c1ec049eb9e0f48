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

} // namespace

std::string inSeconds(double seconds) {
    std::ostringstream text;
    text << seconds << (seconds == 1 ? " second" : " seconds");
    return text.str();
}

int askDaemon(const Request& request, const Globals& globals, double seconds, const std::string& lateMessage) {
    const Verdict gone = verdictOn(CODE_NOT_REACHABLE);
    const Watchdog watchdog(
        seconds, {std::string(), sayLine(lateMessage), EXIT_TIMED_OUT},
        {failureData(gone, globals), sayLine("the daemon ended meanwhile: " + gone.reason), gone.status});
    // One for each request: a connection kept over a pause may be one to a daemon that has gone since.
    MARU::Backup::JobController controller;
    const int code = request(controller);
    return code == CODE_UNREADABLE && !isDaemonThere() ? CODE_NOT_REACHABLE : code;
}

int askDaemon(const Request& request, const Globals& globals) {
    return askDaemon(request, globals, globals.timeout,
                     "no answer from marubackupd within " + inSeconds(globals.timeout) +
                         ": it may be busy with a backend's check command, and do this later; look with "
                         "\"marubackupctl list\", or give it longer with --timeout");
}

bool fitsIntoRequest(const std::string& content) {
    const std::size_t size = content.size() + FRAME_OF_REQUEST.size();
    if (size > LONGEST_REQUEST) {
        say("these arguments are too long: the daemon takes requests of " + std::to_string(LONGEST_REQUEST) +
            " bytes, and this would be one of " + std::to_string(size));
    }
    return size <= LONGEST_REQUEST;
}
