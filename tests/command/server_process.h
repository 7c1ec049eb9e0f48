#pragma once

#include <sys/types.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <marubackup/command_server.h>

#include "support/line_reader.h"
#include "support/syslog_socket.h"
#include "support/temp_dir.h"

/** Says a line to the test, from the server's process. */
void report(const std::string& line);

/** Milliseconds of CLOCK_MONOTONIC, which is the same for all processes. */
long monotonicMilliseconds();

/** A request handler that answers with the request. */
std::string echo(const char* payload, unsigned int length, MARU::Backup::CommandServer* server);

/** A request handler that does `work` whatever the request is, and answers "done". */
MARU::Backup::CommandServer::RequestHandler doing(const std::function<void(MARU::Backup::CommandServer&)>& work);

/** A handler of any kind of callback that reports `line`. */
inline auto reporting(const std::string& line) {
    return [line](auto&&...) { report(line); };
}

/** Holds the server's process at some point until the test lets it go on. Make it before the process. */
class Hold {
public:
    Hold();
    ~Hold();
    Hold(const Hold&) = delete;
    Hold& operator=(const Hold&) = delete;

    /** In the server's process: waits for release(). */
    void wait() const;
    void release() const;

private:
    int ends[2];
};

/** How a test wants its server. */
struct ServerOptions {
    MARU::Backup::CommandServer::RequestHandler handler = echo;
    int mode = 0;
    /**
     * Runs in the server's process before run(), to register handlers or to make
     * run() fail. SIGTERM has a handler that does nothing, unless another is set
     * here. The umask is 022.
     */
    std::function<void(MARU::Backup::CommandServer&)> setUp;
    /** Runs in the server's process after run(). */
    std::function<void()> afterRun;
    /** False for a server that is not expected to serve. */
    bool awaitLoop = true;
};

// How run() ended.
const char* const RAN = "run returned true";
const char* const DID_NOT_RUN = "run returned false";
const char* const EMPTY_CALL = "boost::bad_function_call left run";
const char* const THREW = "another exception left run";

/**
 * A CommandServer in a process of its own, as it is in the daemon: signals,
 * umask and descriptors are its alone. What is still there of it at the end of
 * the object's life is killed.
 */
class ServerProcess {
public:
    explicit ServerProcess(const std::string& socketPath, const ServerOptions& options = ServerOptions());
    ~ServerProcess();
    ServerProcess(const ServerProcess&) = delete;
    ServerProcess& operator=(const ServerProcess&) = delete;

    pid_t pid() const {
        return child;
    }

    /** Sends a request on a connection of its own; the reply. */
    std::string ask(const std::string& request) const;
    /** Waits until the loop has made a pass; the test's handler does not see it. */
    void awaitPass() const;
    void signal(int number) const;
    /** Waits for the process's end: one of the constants above, or the wait status in words. */
    std::string wait();
    /** Sends SIGTERM and waits. */
    std::string stop();

    /** Waits for a report that starts with `start` and that was not found by an earlier call; all of it. */
    std::string waitForReport(const std::string& start);
    /** The reports so far; after wait(), all of them. */
    std::vector<std::string> reports();
    int countReports(const std::string& line);

private:
    void awaitLoop() const;

    std::string path;
    pid_t child = -1;
    std::unique_ptr<support::LineReader> lines;
};

/** What a test of the server stands on. */
class ServerTest : public testing::Test {
protected:
    support::SyslogSocket log;
    support::TempDir folder;
    const std::string path = folder.path("socket");
};
