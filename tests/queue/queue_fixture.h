#pragma once

#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <marubackup/job.h>

#include "support/gate.h"
#include "support/syslog_socket.h"
#include "support/temp_dir.h"

#include "diary.h"

/** The unit that the daemon's located lines name. */
const char* const QUEUE_UNIT = "queue_server";

const MARU::Backup::Job::Action RUNNABLE_ACTIONS[] = {
    MARU::Backup::Job::ACTION_BACKUP,         MARU::Backup::Job::ACTION_RESTORE,
    MARU::Backup::Job::ACTION_COPY_TO,        MARU::Backup::Job::ACTION_RELINK,
    MARU::Backup::Job::ACTION_REMOVE_VERSION, MARU::Backup::Job::ACTION_REMOVE_TASK,
    MARU::Backup::Job::ACTION_TARGET_COPY_TO,
};

/** A backend's file in which the section of every runnable action has these lines. */
std::string inAllSections(const std::string& lines);

/** The diary's line about a signal that was sent to the job. */
std::string sent(int signal, const MARU::Backup::Job& job);

/** Waits until the child has ended. It is not reaped. */
void awaitEnd(pid_t child);

/** Whether the process runs: it is there, and is not just waiting to be reaped. */
bool isRunning(pid_t process);

/**
 * The daemon's store, empty and with its ids at 1, with syslog and the diary at
 * hand, and two backends: "shell" runs the parameter "script" as a shell script,
 * "held" waits at a gate that never opens. The template of their jobs' unique
 * strings is "{{name}}". What is still running at the end is killed.
 */
class QueueTest : public testing::Test {
protected:
    QueueTest();
    ~QueueTest() override;

    /** Appends a job with the next id to the queue of its action. */
    const MARU::Backup::Job& add(const MARU::Backup::Job& job,
                                 MARU::Backup::Job::Status status = MARU::Backup::Job::STATUS_QUEUED);
    /** The same for a job of the backend "held". */
    const MARU::Backup::Job& addHeld(MARU::Backup::Job::Action action,
                                     MARU::Backup::Job::Status status = MARU::Backup::Job::STATUS_QUEUED);
    /** The same with that unique string. */
    const MARU::Backup::Job& addUnique(MARU::Backup::Job::Action action, const std::string& unique,
                                       MARU::Backup::Job::Status status = MARU::Backup::Job::STATUS_QUEUED);
    /** The same for a job of the backend "shell". */
    const MARU::Backup::Job& addScript(MARU::Backup::Job::Action action, const std::string& script);
    /** The same for one that has that process, whoever's it is. */
    const MARU::Backup::Job& addWithProcess(pid_t pid, MARU::Backup::Job::Status status);

    /** Calls change(Job&) for a job of the store. */
    static void change(const MARU::Backup::Job& job, const std::function<void(MARU::Backup::Job&)>& change);
    static void setStatus(const MARU::Backup::Job& job, MARU::Backup::Job::Status status);

    /** Starts the process of a job of the store, which is a child of the test's. Whether there is one. */
    static bool launch(const MARU::Backup::Job& job);
    /** The same where there must be one. */
    const MARU::Backup::Job& launched(const MARU::Backup::Job& job);

    /** The ids of the jobs in a queue. */
    static std::vector<int> ids(const std::string& queueName);
    /** The statuses of the jobs in a queue. */
    static std::vector<int> statuses(const std::string& queueName);

    /** Sends a request to the dispatcher; the reply. */
    static std::string ask(const std::string& request);

    support::TempDir folder;
    support::SyslogSocket log;
    Diary diary;

private:
    support::Gate closedGate;
};
