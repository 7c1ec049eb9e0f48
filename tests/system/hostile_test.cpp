#include "hostile_test.h"

#include <algorithm>

#include "support/files.h"
#include "support/waiting.h"

using namespace MARU::Backup;
using support::SocketPeer;

std::string repeated(const std::string& piece, int times) {
    std::string text;
    for (int count = 0; count < times; ++count) {
        text += piece;
    }
    return text;
}

std::string quoted(const std::string& json) {
    return "\"" + json + "\"";
}

std::string object(const Members& members) {
    std::string text;
    for (const auto& [name, json] : members) {
        text += (text.empty() ? "" : ",") + quoted(name) + ":" + json;
    }
    return "{" + text + "}";
}

std::string enqueue(const Members& job) {
    return object({{"op", "\"job_enqueue\""}, {"job", object(job)}});
}

std::string refusal(int code) {
    return "{\"code\":" + std::to_string(code) + "}";
}

HostileTest::HostileTest() {
    start();
    addGated(Job::ACTION_BACKUP, newGate());
    addGated(Job::ACTION_BACKUP, newGate());
    gates.front()->awaitJob();
    peer = std::make_unique<SocketPeer>();
    // Refused with a line in syslog, to which the daemon is connected from then on.
    EXPECT_EQ(refusal(505), peer->ask(enqueue(jobOf("unheard-of"))));
    queues = peer->ask(LIST_REQUEST);
    children = childrenOfDaemon();
    descriptors = support::openDescriptors(daemon->pid());
    launches = countLaunches();
}

Members HostileTest::jobOf(const std::string& backend) {
    return {{"backend", quoted(backend)}, {"action", "8"}, {"status", "0"}, {"param", "{}"}};
}

void HostileTest::expectCode(int code, const std::string& request) {
    SCOPED_TRACE(testing::PrintToString(request.substr(0, 200)));
    const std::string reply = peer->ask(request);
    if (code == 200) {
        EXPECT_EQ(0U, reply.rfind("{\"code\":200,\"jobs\":[", 0)) << reply;
    } else {
        EXPECT_EQ(refusal(code), reply);
    }
}

void HostileTest::expectUnharmed(int launchedSince) {
    EXPECT_EQ(queues, peer->ask(LIST_REQUEST));
    EXPECT_EQ(queues, SocketPeer().ask(LIST_REQUEST));
    EXPECT_EQ(launches + launchedSince, countLaunches());
    EXPECT_EQ(children, childrenOfDaemon());
    EXPECT_TRUE(support::waitUntil([this]() { return support::openDescriptors(daemon->pid()) == descriptors; }))
        << support::openDescriptors(daemon->pid()) << " descriptors, not " << descriptors;
}

std::string HostileTest::childrenOfDaemon() {
    const std::string pid = std::to_string(daemon->pid());
    return support::readFile("/proc/" + pid + "/task/" + pid + "/children");
}

int HostileTest::countLaunches() {
    const std::vector<std::string> diary = daemon->diary();
    return static_cast<int>(std::count_if(diary.begin(), diary.end(),
                                          [](const std::string& line) { return line.rfind("launch job [{", 0) == 0; }));
}
