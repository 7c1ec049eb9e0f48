#pragma once

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <marubackup/backend_manager.h>
#include <marubackup/job.h>

#include "support/syslog_socket.h"
#include "support/temp_dir.h"

/** The unit that a backend's located lines name. */
const char* const BACKEND_UNIT = "backend_manager";

/**
 * Two empty folders of backends, syslog, and a job of the backend "b" with the
 * parameters "name", which is "n", and "out", which is the path of a file that
 * is not there yet.
 */
class BackendTest : public testing::Test {
protected:
    BackendTest();
    ~BackendTest() override;

    /** Declares the backend "b", which supports backups, and loads it. */
    void load(const std::string& lines);

    /**
     * Launches the command of the loaded section in a child of its own. How that
     * ended in words: "exit 3" or "signal 9" of the command, or what launch()
     * returned, as LAUNCH_FAILED or LAUNCH_MISCONFIGURED.
     */
    std::string launch();
    /** The same; `child` is the process id. */
    std::string launch(pid_t& child);

    /** The lines of the file "out". */
    std::vector<std::string> outLines() const;

    support::TempDir folder;
    const std::string out = folder.path("out");
    support::SyslogSocket log;
    MARU::Backup::BackendManager backend;
    MARU::Backup::Job job;
};

const char* const LAUNCH_FAILED = "exit 101";        // it returned true
const char* const LAUNCH_MISCONFIGURED = "exit 102"; // it returned false
