#include "server_process.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <exception>
#include <system_error>

#include <boost/function.hpp>

#include "support/in_child.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using MARU::Backup::CommandServer;
using support::SocketPeer;

namespace {

const char* const ARE_YOU_THERE = "are you there?";
const char* const LAST_REPORT = "the end";

enum EndStatus {
    END_RAN,
    END_DID_NOT_RUN,
    END_EMPTY_CALL,
    END_THREW,
    ENDS,
};

int reportPipe = -1;

/** Answers the fixture's own question, and leaves all others to `handler`. */
CommandServer::RequestHandler withOwnQuestion(const CommandServer::RequestHandler& handler) {
    if (handler.empty()) {
        return handler;
    }
    return [handler](const char* payload, unsigned int length, CommandServer* server) {
        const bool ours = std::string(payload, length) == ARE_YOU_THERE;
        return ours ? std::string("yes") : handler(payload, length, server);
    };
}

EndStatus run(CommandServer& server, const std::string& path, const ServerOptions& options) {
    try {
        return server.run(withOwnQuestion(options.handler), path, options.mode) ? END_RAN : END_DID_NOT_RUN;
    } catch (const boost::bad_function_call&) {
        return END_EMPTY_CALL;
    } catch (const std::exception&) {
        return END_THREW;
    }
}

int serve(const std::string& path, const ServerOptions& options) {
    openlog(nullptr, LOG_NDELAY, 0); // what a test does to sockets or descriptors is not to hit syslog's own
    umask(022);
    CommandServer server;
    server.setSignalHandler(SIGTERM, [](int) {});
    if (options.setUp) {
        options.setUp(server);
    }
    const EndStatus status = run(server, path, options);
    if (options.afterRun) {
        options.afterRun();
    }
    report(LAST_REPORT);
    return status;
}

void makePipe(int* ends) {
    if (pipe2(ends, O_CLOEXEC) != 0) {
        throw std::system_error(errno, std::generic_category(), "pipe");
    }
}

} // namespace

void report(const std::string& line) {
    const std::string text = line + '\n';
    if (write(reportPipe, text.data(), text.size()) != static_cast<ssize_t>(text.size())) {
        throw std::system_error(errno, std::generic_category(), "report");
    }
}

long monotonicMilliseconds() {
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    return static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(now).count());
}

std::string echo(const char* payload, unsigned int length, CommandServer*) {
    return std::string(payload, length);
}

CommandServer::RequestHandler doing(const std::function<void(CommandServer&)>& work) {
    return [work](const char*, unsigned int, CommandServer* server) {
        work(*server);
        return std::string("done");
    };
}

Hold::Hold() {
    makePipe(ends);
}

Hold::~Hold() {
    close(ends[0]);
    close(ends[1]);
}

void Hold::wait() const {
    char token = 0;
    while (read(ends[0], &token, 1) < 0 && errno == EINTR) {
    }
}

void Hold::release() const {
    EXPECT_EQ(1, write(ends[1], "", 1));
}

ServerProcess::ServerProcess(const std::string& socketPath, const ServerOptions& options) : path(socketPath) {
    int ends[2];
    makePipe(ends);
    child = support::startInChild([&]() {
        reportPipe = ends[1];
        return static_cast<int>(serve(path, options));
    });
    close(ends[1]);
    lines = std::make_unique<support::LineReader>(ends[0]);
    if (options.awaitLoop) {
        awaitLoop();
    }
}

ServerProcess::~ServerProcess() {
    if (child > 0) {
        kill(child, SIGKILL);
        support::waitForChild(child);
    }
}

void ServerProcess::awaitLoop() const {
    const bool answered = support::waitUntil([this]() {
        try {
            return ask(ARE_YOU_THERE) == "yes";
        } catch (const std::system_error&) {
            return false;
        }
    });
    EXPECT_TRUE(answered) << "the server does not serve";
}

std::string ServerProcess::ask(const std::string& request) const {
    return SocketPeer(path).ask(request);
}

void ServerProcess::awaitPass() const {
    EXPECT_EQ("yes", ask(ARE_YOU_THERE));
}

void ServerProcess::signal(int number) const {
    kill(child, number);
}

std::string ServerProcess::wait() {
    int status = 0;
    if (!support::waitUntil([&]() { return waitpid(child, &status, WNOHANG) == child; })) {
        return "still running";
    }
    child = -1;
    if (!WIFEXITED(status) || WEXITSTATUS(status) >= ENDS) {
        return support::describeStatus(status);
    }
    waitForReport(LAST_REPORT);
    const char* const words[] = {RAN, DID_NOT_RUN, EMPTY_CALL, THREW};
    return words[WEXITSTATUS(status)];
}

std::string ServerProcess::stop() {
    signal(SIGTERM);
    return wait();
}

std::string ServerProcess::waitForReport(const std::string& start) {
    return lines->waitFor(start, [&start](const std::string& line) { return line.rfind(start, 0) == 0; });
}

std::vector<std::string> ServerProcess::reports() {
    std::vector<std::string> all = lines->all();
    if (!all.empty() && all.back() == LAST_REPORT) {
        all.pop_back();
    }
    return all;
}

int ServerProcess::countReports(const std::string& line) {
    const std::vector<std::string> all = reports();
    return static_cast<int>(std::count(all.begin(), all.end(), line));
}
