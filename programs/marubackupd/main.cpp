// The queue daemon: prepares the process and hands it to runQueueServer().

#include <syslog.h>
#include <unistd.h>

#include <cstdio>
#include <exception>
#include <iostream>
#include <string>

#include <CLI/CLI.hpp>

#include <marubackup/queue_server.h>

#include "host.h"
#include "instance_lock.h"
#include "report.h"
#include "shared/standard_descriptors.h"

namespace {

enum ExitStatus {
    ENDED_BY_SIGNAL = 0,
    COULD_NOT_SERVE = 1,
    USAGE = 2,
};

int serve(bool debug) {
    if (geteuid() != 0) {
        report(LOG_ERR, "must be started by root: it runs jobs as root, and gives its socket to root");
        return COULD_NOT_SERVE;
    }
    InstanceLock lock;
    if (!lock.acquire()) {
        return COULD_NOT_SERVE;
    }
    unblockSignals();
    raiseDescriptorLimit();
    warnOfSocketGroup();
    try {
        if (MARU::Backup::runQueueServer(debug)) {
            return ENDED_BY_SIGNAL;
        }
        report(LOG_ERR, "cannot serve: the reason is in the system log, just before this line");
    } catch (const std::exception& problem) {
        report(LOG_ERR, std::string("ended by an internal error: ") + problem.what());
    }
    return COULD_NOT_SERVE;
}

} // namespace

int main(int argc, char** argv) {
    openMissingStandardDescriptors();
    // The lines of the diary stay whole, also beside those of jobs that share it.
    std::setvbuf(stderr, nullptr, _IOLBF, BUFSIZ);
    // Connected at once: a lack of descriptors has to be reported too.
    openlog("marubackupd", LOG_PID | LOG_NDELAY, LOG_DAEMON);

    bool debug = false;
    CLI::App app("Queues backup jobs and runs them, in the foreground, until it is told to end by SIGTERM.\n"
                 "Its diary goes to standard error, what needs attention to the system log.");
    app.add_flag("--debug", debug, "write each request and each look at the queues to the diary too");
    app.set_version_flag("--version", "marubackupd " MARUBACKUP_VERSION, "print the version and exit");
    app.get_help_ptr()->description("print this help and exit");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& end) {
        if (end.get_exit_code() == 0) {
            return app.exit(end); // --help or --version
        }
        std::cerr << "marubackupd: " << end.what() << " (see \"marubackupd --help\")\n";
        return USAGE;
    }
    return serve(debug);
}
