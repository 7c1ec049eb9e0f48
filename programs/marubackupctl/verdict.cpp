#include "verdict.h"

#include <algorithm>
#include <array>
#include <cstddef>

#include "shared/daemon_socket.h"

namespace {

struct Row {
    int code;
    ExitStatus status;
    const char* reason;
};

// From the best news to the worst.
const std::array<Row, 9> VERDICTS = {{
    {CODE_DONE, EXIT_DONE, "done"},
    {CODE_NO_SUCH_JOB, EXIT_NO_SUCH_THING, "no such job is waiting or running: it has ended, or never was"},
    {409, EXIT_REFUSED,
     "the same work is waiting or running already: wait for that job or remove it (\"marubackupctl list\" shows it)"},
    {406, EXIT_REFUSED, "a restore is waiting or running: nothing can be added until it has ended"},
    {400, EXIT_REFUSED,
     "the job is refused, most often by its backend's check command: see that the parameters are what the backend "
     "asks for, and name things that exist"},
    {505, EXIT_REFUSED,
     "the backend is not installed, or its file has no usable section for this action (\"marubackupctl backends\" "
     "shows what there is)"},
    {501, EXIT_REFUSED, "this daemon does not know the request: it is older or newer than marubackupctl"},
    {CODE_UNREADABLE, EXIT_OTHER, "the daemon failed, or its answer cannot be read: see the system log"},
    {CODE_NOT_REACHABLE, EXIT_NOT_REACHABLE,
     "nobody answers at " MARUBACKUP_SOCKET ": start marubackupd, or, if it runs, ask as root or as a member of the "
     "socket's group"},
}};

/** An unknown code stands where an unreadable answer does. */
std::size_t rowOf(int code) {
    const auto byCode = [](int wanted) {
        return std::find_if(VERDICTS.begin(), VERDICTS.end(), [wanted](const Row& row) { return row.code == wanted; });
    };
    const auto found = byCode(code);
    return static_cast<std::size_t>((found != VERDICTS.end() ? found : byCode(CODE_UNREADABLE)) - VERDICTS.begin());
}

} // namespace

Verdict verdictOn(int code) {
    const Row& row = VERDICTS[rowOf(code)];
    return {code, row.status, row.reason};
}

int worseOf(int code, int other) {
    return rowOf(other) > rowOf(code) ? other : code;
}

Json::Value toJson(const Verdict& verdict) {
    Json::Value json(Json::objectValue);
    json["code"] = verdict.code;
    json["reason"] = verdict.reason;
    return json;
}
