// Clients that are broken, malicious, slow or gone, and a daemon that runs out
// of descriptors.

#include <poll.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <syslog.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <memory>
#include <ostream>
#include <set>
#include <string>
#include <system_error>
#include <vector>

#include <json/json.h>

#include "daemon_test.h"
#include "raw_requests.h"
#include "support/descriptor_limit.h"
#include "support/files.h"
#include "support/named_rows.h"
#include "support/resource_limit.h"
#include "support/socket_peer.h"
#include "support/waiting.h"

using namespace MARU::Backup;
using support::DescriptorLimit;
using support::frame;
using support::hasDescriptor;
using support::SocketPeer;

namespace {

using Peers = std::vector<std::unique_ptr<SocketPeer>>;

/** How long a daemon is watched that has to sleep: its two-second look at its queues is among that. */
const std::chrono::milliseconds WATCH(2000);

const std::size_t BUFFER_SIZE = 16384;
const std::string REFUSED_LENGTH("\x80\0\0\0", 4);
const int HIGHEST_SERVED = 1024;

const std::string UNKNOWN_JOB = "{\"op\":\"job_get\",\"job_id\":99999}";
const std::string NOT_FOUND = "{\"code\":404}";
const std::string BAD_REQUEST = "{\"code\":400}";

/** A request that is one byte longer than the daemon can take. */
std::string tooLong() {
    return frame(UNKNOWN_JOB + std::string(BUFFER_SIZE - 3 - UNKNOWN_JOB.size(), ' '));
}

std::string getJob(int id) {
    return requestFor("job_get", id);
}

Peers connect(int number) {
    Peers peers;
    for (int count = 0; count < number; ++count) {
        peers.push_back(std::make_unique<SocketPeer>());
    }
    return peers;
}

Json::Value parse(const std::string& text) {
    Json::Value value;
    std::string problem;
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    EXPECT_TRUE(reader->parse(text.data(), text.data() + text.size(), &value, &problem)) << problem;
    return value;
}

/** Whether any of the descriptors can be read, or is at its end, within `limit`. */
bool isAnyReadable(const std::vector<int>& descriptors, std::chrono::milliseconds limit) {
    std::vector<pollfd> entries;
    for (const int fd : descriptors) {
        entries.push_back({fd, POLLIN, 0});
    }
    const int ready = poll(entries.data(), entries.size(), static_cast<int>(limit.count()));
    EXPECT_LE(0, ready);
    return ready != 0;
}

std::vector<int> descriptorsOf(const Peers& peers) {
    std::vector<int> descriptors;
    for (const auto& peer : peers) {
        descriptors.push_back(peer->descriptor());
    }
    return descriptors;
}

class ConnectionTest : public DaemonTest {
protected:
    /** Starts the daemon, and a client that behaves. */
    void serve(const support::DaemonOptions& options = support::DaemonOptions()) {
        start(options);
        other = std::make_unique<SocketPeer>();
        EXPECT_TRUE(othersAreServed());
        linesBefore = linesOfDaemon();
    }

    /** Asks on a connection that was there before, and on a new one. */
    bool othersAreServed() {
        return other->ask(UNKNOWN_JOB) == NOT_FOUND && SocketPeer().ask(UNKNOWN_JOB) == NOT_FOUND;
    }

    /**
     * How many descriptors the daemon has open. Clients that closed their
     * connection before the call are not among them: the daemon answers in a
     * later pass of its loop than the one in which it notices that.
     */
    int settledDescriptors() {
        EXPECT_EQ(NOT_FOUND, other->ask(UNKNOWN_JOB));
        EXPECT_EQ(NOT_FOUND, other->ask(UNKNOWN_JOB));
        return support::openDescriptors(daemon->pid());
    }

    bool waitForDescriptors(int number) {
        return support::waitUntil([&]() { return support::openDescriptors(daemon->pid()) == number; });
    }

    /** Whether the daemon sleeps through WATCH, in which none of the clients hears anything from it. */
    testing::AssertionResult rests(const std::vector<int>& clients) {
        const auto before = support::cpuTime(daemon->pid());
        if (isAnyReadable(clients, WATCH)) {
            return testing::AssertionFailure() << "a connection was answered or closed";
        }
        const auto used = support::cpuTime(daemon->pid()) - before;
        if (used >= WATCH / 20) {
            return testing::AssertionFailure() << "the daemon was busy for " << used.count() << " ms";
        }
        return testing::AssertionSuccess();
    }

    /** Whether the daemon has logged nothing since it serves. */
    testing::AssertionResult loggedNothing() {
        if (linesOfDaemon() > linesBefore) {
            return testing::AssertionFailure() << log.lines().back().message;
        }
        return testing::AssertionSuccess();
    }

    /** Has `number` jobs wait behind one that runs, all with this text in them. Their ids are 1 to `number` + 1. */
    void fillQueue(int number, const std::string& filling = std::string()) {
        addGated(Job::ACTION_BACKUP, newGate());
        for (int count = 0; count < number; ++count) {
            Job job("gated", Job::ACTION_BACKUP);
            job.setParam("gate", std::to_string(count));
            job.setParam("filling", filling);
            ASSERT_EQ(count + 2, add(job).getJobId());
        }
    }

    /** Jobs whose list is far more than a socket takes at once; the size of that list. */
    std::size_t fillQueueWithMegabytes() {
        fillQueue(200, std::string(15000, 'x'));
        const std::size_t size = other->ask(LIST_REQUEST).size();
        EXPECT_LT(std::size_t{200} * 15000, size);
        return size;
    }

    std::unique_ptr<SocketPeer> other;

private:
    std::ptrdiff_t linesOfDaemon() {
        const std::vector<support::SyslogLine> lines = log.lines();
        return std::count_if(lines.begin(), lines.end(),
                             [](const support::SyslogLine& line) { return line.ident.rfind("marubackupd", 0) == 0; });
    }

    std::ptrdiff_t linesBefore = 0;
};

class Connections : public ConnectionTest {
protected:
    Connections() {
        serve();
    }
};

// Ways to go away in the middle of a reply

void closeWithBytesUnread(SocketPeer& peer, pid_t) {
    peer.close();
}

void endOutput(SocketPeer& peer, pid_t) {
    shutdown(peer.descriptor(), SHUT_WR);
}

/** While the daemon stands still, so that it has more to write and finds nobody there. */
void closeWithAllRead(SocketPeer& peer, pid_t daemon) {
    kill(daemon, SIGSTOP);
    int status = 0;
    ASSERT_EQ(daemon, waitpid(daemon, &status, WUNTRACED));
    ASSERT_TRUE(WIFSTOPPED(status));
    char piece[65536];
    while (recv(peer.descriptor(), piece, sizeof piece, MSG_DONTWAIT) > 0) {
    }
    EXPECT_EQ(EAGAIN, errno);
    peer.close();
    kill(daemon, SIGCONT);
}

/** A client that goes away before it has the whole of a large reply. */
struct Departure {
    const char* name;
    std::string said; ///< behind the request
    void (*leave)(SocketPeer& peer, pid_t daemon);
};

void PrintTo(const Departure& departure, std::ostream* out) {
    *out << departure.name;
}

class ConnectionInMidReply : public Connections, public testing::WithParamInterface<Departure> {};

/** A daemon that was started with the descriptors that a login gives, and a test that has more. */
class CrowdedDaemon : public ConnectionTest {
protected:
    void SetUp() override {
        if (!limit.holds()) {
            GTEST_SKIP() << "this user may open too few files";
        }
        support::DaemonOptions options;
        options.beforeStart = []() { support::limitTo(RLIMIT_NOFILE, 1024); };
        serve(options);
    }

    /** Connects clients, all of which are served, until the highest descriptor is taken. */
    Peers connectAll() {
        Peers peers;
        while (!hasDescriptor(daemon->pid(), HIGHEST_SERVED) && peers.size() < HIGHEST_SERVED) {
            peers.push_back(std::make_unique<SocketPeer>());
            EXPECT_EQ(NOT_FOUND, peers.back()->ask(UNKNOWN_JOB)) << peers.size();
        }
        EXPECT_TRUE(hasDescriptor(daemon->pid(), HIGHEST_SERVED));
        return peers;
    }

private:
    DescriptorLimit limit{0, HIGHEST_SERVED + 200};
};

/** A daemon on a well-kept host: it finds nothing to log before it serves. */
class QuietDaemon : public ConnectionTest {
protected:
    QuietDaemon() {
        const std::string groups = folder.path("group");
        support::writeFile(groups, "root:x:0:\nadministrators:x:101:\n");
        support::DaemonOptions options;
        options.beforeStart = [groups]() {
            if (unshare(CLONE_NEWNS) != 0 || mount(groups.c_str(), "/etc/group", nullptr, MS_BIND, nullptr) != 0) {
                throw std::system_error(errno, std::generic_category(), "mount " + groups);
            }
        };
        serve(options);
        EXPECT_EQ(0, log.count("group 101"));
    }

    /** The lowest descriptor that the daemon has not open. */
    rlim_t freeDescriptor() {
        settledDescriptors();
        int free = 0;
        while (hasDescriptor(daemon->pid(), free)) {
            ++free;
        }
        return static_cast<rlim_t>(free);
    }
};

} // namespace

// Broken and malicious

TEST_F(Connections, ARequestOf16381BytesWaitsForGoodAndCostsNothing) {
    SocketPeer peer;

    peer.write(tooLong());

    EXPECT_TRUE(rests({peer.descriptor()}));
    EXPECT_TRUE(othersAreServed());
    EXPECT_TRUE(peer.staysSilent());
    EXPECT_TRUE(loggedNothing());
}

TEST_F(Connections, ARefusedLengthIsReportedWithEachArrivalUntilTheBufferIsFull) {
    const auto expectReport = [this]() {
        support::expectLocated(log, LOG_ERR, daemon->pid(), "command_server", "protocol error");
    };
    const int before = settledDescriptors();
    SocketPeer peer;
    const std::string piece(3000, 'x');

    peer.write(REFUSED_LENGTH);
    expectReport();
    int arrivals = 1;
    for (std::size_t size = REFUSED_LENGTH.size(); size < BUFFER_SIZE; size += piece.size()) {
        peer.write(piece);
        expectReport();
        ++arrivals;
    }
    peer.write(piece);
    peer.write(piece);

    EXPECT_TRUE(rests({peer.descriptor()}));
    EXPECT_TRUE(othersAreServed());
    EXPECT_EQ(arrivals, log.count("protocol error"));
    peer.close();
    EXPECT_TRUE(waitForDescriptors(before));
    EXPECT_EQ(arrivals, log.count("protocol error"));
}

TEST_F(Connections, GarbageBetweenRequestsIsAnsweredInItsPlace) {
    addGated(Job::ACTION_BACKUP, newGate());
    SocketPeer peer;

    peer.write(frame(getJob(1)) + frame("\xFF garbage \x80") + frame("") + frame(LIST_REQUEST) +
               frame(std::string(1000, '\0')) + frame("{\"op\":\"job_dance\"}") + frame(UNKNOWN_JOB));

    EXPECT_EQ(0U, peer.readFrame().rfind("{\"code\":200,\"job\":{", 0));
    EXPECT_EQ(BAD_REQUEST, peer.readFrame());
    EXPECT_EQ(BAD_REQUEST, peer.readFrame());
    EXPECT_EQ(0U, peer.readFrame().rfind("{\"code\":200,\"jobs\":[{", 0));
    EXPECT_EQ(BAD_REQUEST, peer.readFrame());
    EXPECT_EQ("{\"code\":501}", peer.readFrame());
    EXPECT_EQ(NOT_FOUND, peer.readFrame());
    EXPECT_TRUE(peer.staysSilent());
}

// Slow

TEST_F(Connections, OfAClientThatWritesByteByByteDoNotHoldUpTheOthers) {
    SocketPeer slow;

    for (const char byte : frame(UNKNOWN_JOB)) {
        EXPECT_FALSE(support::waitReadable(slow.descriptor(), std::chrono::milliseconds(0)));
        slow.write(std::string(1, byte));
        ASSERT_TRUE(othersAreServed());
    }

    EXPECT_EQ(NOT_FOUND, slow.readFrame());
}

TEST_F(Connections, OfAClientThatLeavesTenMegabytesUnreadDoNotHoldUpTheOthers) {
    const int jobs = 700;
    fillQueue(jobs, std::string(15000, 'x'));
    const std::string list = other->ask(LIST_REQUEST);
    EXPECT_LT(std::size_t{10} << 20, list.size());
    SocketPeer slow;

    slow.write(frame(LIST_REQUEST));
    ASSERT_TRUE(support::waitReadable(slow.descriptor()));
    for (int count = 0; count < 20; ++count) {
        EXPECT_TRUE(othersAreServed());
    }
    EXPECT_EQ(200, controller.removeJob(jobs + 1)); // from the queue, not from the reply

    EXPECT_TRUE(frame(list) == slow.read(frame(list).size()));
    const Json::Value reply = parse(list);
    std::set<int> ids;
    for (const Json::Value& job : reply["jobs"]) {
        ids.insert(job["job_id"].asInt());
    }
    EXPECT_EQ(jobs + 1U, ids.size());
    EXPECT_EQ(NOT_FOUND, slow.ask(getJob(jobs + 1)));
}

TEST_F(Connections, ThatStaySilentCostNothing) {
    const int before = settledDescriptors();
    const Peers peers = connect(100);
    ASSERT_TRUE(waitForDescriptors(before + 100));

    EXPECT_TRUE(rests(descriptorsOf(peers)));

    for (const auto& peer : peers) {
        EXPECT_EQ(NOT_FOUND, peer->ask(UNKNOWN_JOB));
    }
}

// Gone

TEST_F(Connections, ThatEndInTheMiddleOfARequestLeaveNothingBehind) {
    const std::string request = frame(UNKNOWN_JOB);
    const int before = settledDescriptors();
    for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{3}, std::size_t{4}, std::size_t{5},
                                   request.size() / 2, request.size() - 1}) {
        for (const std::string& answered : {std::string(), request}) {
            SCOPED_TRACE(std::to_string(answered.size()) + " + " + std::to_string(size) + " bytes");
            SocketPeer peer;
            peer.write(answered + request.substr(0, size));
            ASSERT_TRUE(waitForDescriptors(before + 1));

            peer.close();

            ASSERT_TRUE(waitForDescriptors(before));
            ASSERT_TRUE(othersAreServed());
        }
    }
    EXPECT_TRUE(loggedNothing());
}

TEST_P(ConnectionInMidReply, LeavesNothingBehindWhenItsClientGoes) {
    const std::size_t size = fillQueueWithMegabytes();
    const int before = settledDescriptors();
    SocketPeer peer;
    peer.write(frame(LIST_REQUEST) + GetParam().said);
    EXPECT_EQ(size / 10, peer.read(size / 10).size());

    GetParam().leave(peer, daemon->pid());

    EXPECT_TRUE(waitForDescriptors(before));
    EXPECT_TRUE(othersAreServed());
    EXPECT_TRUE(loggedNothing());
}

INSTANTIATE_TEST_SUITE_P(
    HowItsClient, ConnectionInMidReply,
    testing::Values(Departure{"ClosesWithBytesUnread", "", closeWithBytesUnread},
                    Departure{"ClosesWithAllRead", "", closeWithAllRead}, Departure{"EndsItsOutput", "", endOutput},
                    Departure{"ClosesWithASecondReplyToCome", frame(LIST_REQUEST), closeWithAllRead},
                    Departure{"ClosesAfterARequestTooLong", tooLong(), closeWithBytesUnread},
                    Departure{"ClosesWithAllReadAfterARequestTooLong", tooLong(), closeWithAllRead}),
    support::NameOfRow());

TEST_F(Connections, WhoseClientTakesNoRepliesAreClosed) {
    const int before = settledDescriptors();
    SocketPeer peer;
    shutdown(peer.descriptor(), SHUT_RD);
    ASSERT_TRUE(waitForDescriptors(before + 1));

    peer.write(frame(UNKNOWN_JOB)); // whose reply is a broken pipe

    EXPECT_TRUE(waitForDescriptors(before));
    EXPECT_TRUE(othersAreServed());
    EXPECT_TRUE(loggedNothing());
}

// Many

TEST_F(Connections, TwoHundredAtOnceEachGetTheirOwnAnswersInOrder) {
    const int number = 200;
    fillQueue(number);
    const int before = settledDescriptors();
    Peers peers = connect(number);

    for (int count = 0; count < number; ++count) {
        peers[static_cast<std::size_t>(count)]->write(frame(getJob(count + 2)) + frame("garbage") +
                                                      frame(getJob(number + 1 - count)) + frame(UNKNOWN_JOB));
    }

    for (int count = 0; count < number; ++count) {
        SocketPeer& peer = *peers[static_cast<std::size_t>(count)];
        EXPECT_EQ(count + 2, parse(peer.readFrame())["job"]["job_id"].asInt());
        EXPECT_EQ(BAD_REQUEST, peer.readFrame());
        EXPECT_EQ(number + 1 - count, parse(peer.readFrame())["job"]["job_id"].asInt());
        EXPECT_EQ(NOT_FOUND, peer.readFrame());
    }
    EXPECT_EQ(before + number, support::openDescriptors(daemon->pid()));
    peers.clear();
    EXPECT_TRUE(waitForDescriptors(before));
}

TEST_F(CrowdedDaemon, ClosesWhatComesAboveDescriptor1024AndServesTheRest) {
    std::list<Job> none;
    EXPECT_EQ(200, controller.listJobAll(none));
    const int before = settledDescriptors();
    Peers peers = connectAll();

    for (int count = 0; count < 20; ++count) {
        ASSERT_TRUE(SocketPeer().isClosed());
    }
    for (const auto& peer : peers) {
        EXPECT_EQ(NOT_FOUND, peer->ask(UNKNOWN_JOB));
    }
    EXPECT_TRUE(isRunning(addGated(Job::ACTION_BACKUP, newGate())));
    EXPECT_TRUE(loggedNothing());

    const int all = support::openDescriptors(daemon->pid());
    peers.resize(peers.size() - 10);
    ASSERT_TRUE(waitForDescriptors(all - 10));
    EXPECT_TRUE(othersAreServed());
    peers.clear();
    EXPECT_TRUE(waitForDescriptors(before));
}

TEST_F(QuietDaemon, LetsConnectionsWaitAndReportsThatWhileItHasNoDescriptorLeft) {
    DescriptorLimit noneLeft(daemon->pid(), freeDescriptor());
    ASSERT_TRUE(noneLeft.holds());

    SocketPeer waiting;
    waiting.write(frame(UNKNOWN_JOB));
    // The first thing that it logs, for which it takes no descriptor any more.
    support::expectLocated(log, LOG_ERR, daemon->pid(), "command_server", "accept failed: Too many open files");
    ASSERT_FALSE(HasFailure());
    for (int count = 0; count < 10; ++count) {
        EXPECT_EQ(NOT_FOUND, other->ask(UNKNOWN_JOB));
    }
    log.waitFor("accept failed"); // it tries again and again
    EXPECT_FALSE(isAnyReadable({waiting.descriptor()}, std::chrono::milliseconds(0)));

    noneLeft.lift();
    EXPECT_EQ(NOT_FOUND, waiting.readFrame());
    const int reports = log.count("accept failed");
    EXPECT_TRUE(othersAreServed());
    EXPECT_TRUE(rests({waiting.descriptor()}));
    EXPECT_EQ(reports, log.count("accept failed"));
}
