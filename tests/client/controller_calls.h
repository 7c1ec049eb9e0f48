#pragma once

#include <list>
#include <string>
#include <vector>

#include <marubackup/controller.h>

#include "support/syslog_socket.h"

// What the controller's test files share: each request in one table, since most
// rules hold for all of them.

/** What a request can write to. Both hold something before, so that a change shows. */
struct Outputs {
    Outputs();

    MARU::Backup::Job job;
    std::list<MARU::Backup::Job> jobs;
};

/** The job of fresh Outputs, which is valid to be added, as text. */
extern const char* const OLD_JOB;

/** What a request logs about a reply that cannot be read. */
enum class Complaint {
    OF_ADDING,    ///< "addJob failed." once the reply is JSON
    WITHOUT_TEXT, ///< "parse response failed"
    WITH_TEXT,    ///< the same and the reply
};

/** One of the controller's requests, with arguments that are sent. */
struct Call {
    const char* name;
    int (*make)(MARU::Backup::JobController& controller, Outputs& outputs);
    Complaint complaint;
    bool fillsList;
};

const std::vector<Call>& everyCall();

/** /dev/log with a view to errors. */
class ErrorLog {
public:
    /**
     * The errors since the last call, "unit: text" each. Fails the test if one
     * is not located, or not in this process.
     */
    std::vector<std::string> take();

private:
    support::SyslogSocket socket;
    std::size_t taken = 0;
};
