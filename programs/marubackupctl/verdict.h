#pragma once

#include <string>

#include <json/value.h>

/** How the tool ends. */
enum ExitStatus {
    EXIT_DONE = 0,
    EXIT_OTHER = 1,
    EXIT_USAGE = 2,
    EXIT_NO_SUCH_THING = 3,
    EXIT_REFUSED = 4,
    EXIT_NOT_REACHABLE = 5,
    EXIT_TIMED_OUT = 124,
    EXIT_INTERRUPTED = 130,
};

// Those of the codes of JobController that the tool itself tells apart.
const int CODE_DONE = 200;
const int CODE_NO_SUCH_JOB = 404;
const int CODE_UNREADABLE = 500;
const int CODE_NOT_REACHABLE = 503;

/** What a code of JobController means for the one who runs the tool. */
struct Verdict {
    int code;
    ExitStatus status;
    /** What it means and what to do about it, in words. */
    std::string reason;
};

Verdict verdictOn(int code);

/** The code of the two that is the worse news; on a tie the first. */
int worseOf(int code, int other);

/** {"code": 409, "reason": "…"} */
Json::Value toJson(const Verdict& verdict);
