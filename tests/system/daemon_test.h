#pragma once

#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <marubackup/controller.h>
#include <marubackup/job.h>

#include "support/daemon.h"
#include "support/gate.h"
#include "support/syslog_socket.h"
#include "support/temp_dir.h"

/** The same lines as the section of each action that the daemon knows. */
std::string everyAction(const std::string& lines);

/** A section's lines for jobs that wait at the gate of their parameter "gate". */
extern const std::string WAITS_AT_GATE;

/**
 * A test of the whole daemon: its real program, its real socket, real jobs. Two
 * backends are installed, for every action: the jobs of both wait at their gate;
 * those of "gated" end on SIGTERM, those of "stubborn" ignore it once they wait.
 */
class DaemonTest : public testing::Test {
protected:
    DaemonTest();

    void start(const support::DaemonOptions& options = support::DaemonOptions());

    /** A gate in a file of its own. */
    support::Gate& newGate();
    /** Adds a job that waits at `gate`; it must be admitted. */
    MARU::Backup::Job addGated(MARU::Backup::Job::Action action, support::Gate& gate,
                               const std::string& backend = "gated");
    /** Adds `job`, which must be admitted. */
    MARU::Backup::Job add(MARU::Backup::Job job);

    /** The job's status as the daemon tells it; STATUS_NONE if it has no such job. */
    MARU::Backup::Job::Status statusOf(const MARU::Backup::Job& job);
    int pidOf(const MARU::Backup::Job& job);
    bool isRunning(const MARU::Backup::Job& job);
    bool isQueued(const MARU::Backup::Job& job);

    /** Where in the diary `line` stands; fails the test if it does not. */
    std::size_t placeInDiary(const std::string& line);

    support::TempDir folder;
    support::SyslogSocket log;
    std::unique_ptr<support::Daemon> daemon;
    MARU::Backup::JobController controller;
    std::vector<std::unique_ptr<support::Gate>> gates;
};

/** "job [id] exit(status)" and its like, as the diary has them. */
std::string exitLine(const MARU::Backup::Job& job, int status);
