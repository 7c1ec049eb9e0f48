#pragma once

#include <sys/types.h>

#include <list>
#include <ostream>
#include <string>

#include <gtest/gtest.h>

#include <marubackup/system_status.h>

#include "support/syslog_socket.h"

/** What a predicate with a reason says: whether it may start, and the reason afterwards. */
struct Verdict {
    bool allowed;
    int reason;
};

inline bool operator==(const Verdict& one, const Verdict& other) {
    return one.allowed == other.allowed && one.reason == other.reason;
}

inline std::ostream& operator<<(std::ostream& out, const Verdict& verdict) {
    return out << (verdict.allowed ? "allowed, " : "refused, ") << verdict.reason;
}

/** A reason that no predicate gives, so that one left alone can be told. */
const int OWN_REASON = 77;

const Verdict ALLOWED = {true, OWN_REASON};

inline Verdict refusedFor(MARU::Backup::Job::Action reason) {
    return {false, reason};
}

/** Asks a predicate that gives a reason. */
Verdict ask(bool (*predicate)(MARU::Backup::Job::Action&));

/** A daemon's reply that lists one job of that action. */
std::string listing(MARU::Backup::Job::Action action);

extern const std::string EMPTY_LISTING;

/**
 * An appliance on which nothing goes on: no daemon, no task, no space build, and
 * a snapshot tool that answers no.
 */
class SystemStatus : public testing::Test {
protected:
    SystemStatus();
    ~SystemStatus() override;

    /** Installs a snapshot tool that answers `status`, and writes down that it ran. */
    void setSnapshotTool(int status);
    /** How often that tool has run. */
    int snapshotQuestions();

    /** A process that waits for its end, which comes at the end of the test at the latest. */
    pid_t startProcess();
    /** Ends it; it is not waited for before the end of the test. */
    static void leaveAsZombie(pid_t process);
    /** Ends it for good. */
    void endProcess(pid_t process);

    support::SyslogSocket log;

private:
    std::list<pid_t> processes;
};

/** The text of a running task's file. */
std::string runningTask(pid_t pid);
