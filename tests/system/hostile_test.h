#pragma once

#include <map>
#include <memory>
#include <string>

#include "daemon_test.h"
#include "raw_requests.h"
#include "support/socket_peer.h"

// Requests written by hand, and a daemon at work that they are sent to.

/** The longest request that the daemon can take. */
const std::size_t MAX_REQUEST = 16380;

/** One byte of zero. */
const std::string NUL(1, '\0');

std::string repeated(const std::string& piece, int times);

std::string quoted(const std::string& json);

/** The names and the JSON texts of an object's members. */
using Members = std::map<std::string, std::string>;

std::string object(const Members& members);

std::string enqueue(const Members& job);

std::string refusal(int code);

/** A test whose daemon has a job that runs and one that waits behind it, both of the backup queue. */
class HostileTest : public DaemonTest {
protected:
    HostileTest();

    /** The members of a job for `backend`, which are all good. */
    static Members jobOf(const std::string& backend);

    /** Expects a refusal, or for a `code` of 200 a list. */
    void expectCode(int code, const std::string& request);
    /** Expects that all is as it was at the start, but for so many jobs that came and went. */
    void expectUnharmed(int launchedSince = 0);

    std::unique_ptr<support::SocketPeer> peer;

private:
    /** The processes, dead ones that nobody has waited for included. */
    std::string childrenOfDaemon();
    int countLaunches();

    std::string queues;
    std::string children;
    int descriptors = 0;
    int launches = 0;
};
