// Requests and replies as they have to stay on the wire, byte for byte, whatever
// processor writes or reads them. The file holds whole frames: a request of the
// client's, the daemon's reply, the next request, and so on.

#include <sys/socket.h>
#include <unistd.h>

#include <future>
#include <list>
#include <string>
#include <vector>

#include "daemon_test.h"
#include "support/backend_files.h"
#include "support/files.h"
#include "support/socket_peer.h"

using namespace MARU::Backup;

namespace {

const std::size_t HEADER_SIZE = 4;
const std::string ODD_NAME = "/volume1/\xC3\xA9\xFF \"x\"";

std::size_t payloadSize(const std::string& header) {
    std::size_t size = 0;
    for (const char byte : header) {
        size = size << 8 | static_cast<unsigned char>(byte);
    }
    return size;
}

std::vector<std::string> goldenFrames() {
    const std::string bytes = support::readFile(GOLDEN_FRAMES);
    std::vector<std::string> frames;
    for (std::size_t at = 0; at < bytes.size(); at += frames.back().size()) {
        frames.push_back(bytes.substr(at, HEADER_SIZE + payloadSize(bytes.substr(at, HEADER_SIZE))));
    }
    return frames;
}

/** The next frame that comes in, header included. */
std::string readWhole(support::SocketPeer& peer) {
    const std::string header = peer.read(HEADER_SIZE);
    return header + peer.read(payloadSize(header));
}

/** Every operation, once, as an application asks for it; each must come to what the golden replies say. */
void askEverything() {
    JobController controller;
    Job first("golden", Job::ACTION_BACKUP);
    first.setParam("source", "/volume1/photos");
    EXPECT_EQ(200, controller.addJob(first));
    EXPECT_EQ(1, first.getJobId());

    Job second("golden", Job::ACTION_BACKUP);
    second.setParam("source", ODD_NAME);
    second.setParam("size", Json::Int64(5000000000));
    EXPECT_EQ(200, controller.addJob(second));
    EXPECT_EQ(2, second.getJobId());
    EXPECT_EQ("golden:" + ODD_NAME, second.getUniqueString());

    Job found;
    EXPECT_EQ(200, controller.getJob(2, found));
    EXPECT_EQ(ODD_NAME, found.getParam("source", Json::Value()).asString());
    EXPECT_EQ(5000000000, found.getParam("size", Json::Value()).asInt64());
    EXPECT_EQ(Job::STATUS_QUEUED, found.getStatus());

    std::list<Job> jobs;
    EXPECT_EQ(200, controller.listJobEx(jobs, Job::ACTION_BACKUP, "golden", "golden:" + ODD_NAME, "", ""));
    EXPECT_EQ(1U, jobs.size());
    EXPECT_EQ(200, controller.removeJob(2));
    EXPECT_EQ(404, controller.getJob(2147483647, found));
    EXPECT_EQ(200, controller.cleanSession("golden", 2147483647));
}

class GoldenFrames : public DaemonTest {};

} // namespace

TEST_F(GoldenFrames, AreWhatTheDaemonAnswers) {
    support::writeLocalBackend("golden", "[backup]\ncommand_launch = sleep 100000\nunique = {{BACKEND}}:{{source}}\n");
    start();
    support::SocketPeer peer;
    const std::vector<std::string> frames = goldenFrames();
    ASSERT_EQ(14U, frames.size());
    for (std::size_t at = 0; at < frames.size(); at += 2) {
        peer.write(frames[at]);
        EXPECT_EQ(frames[at + 1], readWhole(peer));
    }
}

TEST_F(GoldenFrames, AreWhatAnApplicationSendsAndReads) {
    const int listener = support::listenAt(support::DAEMON_SOCKET);
    std::future<void> application = std::async(std::launch::async, askEverything);
    support::SocketPeer peer(accept(listener, nullptr, nullptr));
    const std::vector<std::string> frames = goldenFrames();
    ASSERT_EQ(14U, frames.size());
    for (std::size_t at = 0; at < frames.size(); at += 2) {
        EXPECT_EQ(frames[at], readWhole(peer));
        peer.write(frames[at + 1]);
    }
    application.get();
    close(listener);
}
