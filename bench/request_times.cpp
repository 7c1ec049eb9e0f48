#include <sys/socket.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>
#include <json/reader.h>
#include <json/value.h>
#include <json/writer.h>

#include "clock.h"
#include "connection.h"
#include "job_text.h"

// Sends requests and tells how long one took. With several connections, each has
// one request under way all the time.

namespace {

using bench::Connection;
using bench::Wire;

const std::size_t SMALL_BATCH = 32;
const std::size_t BATCHES = 10;

double median(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return values.at(values.size() / 2);
}

struct Options {
    std::string socket;
    std::string op;
    int connections = 1;
    int count = 1;
    int id = 1;
    int serial = 1;
    std::string unique;
    std::string slowBackend;
    bench::JobShape shape;
};

/** One kind of request: its text by number, and how a good reply starts. */
struct Op {
    Wire wire;
    std::string goodReply;
    std::function<std::string(int number)> request;
};

std::string listRequest(const std::string& member, const std::string& value) {
    return "{" + (value.empty() ? "" : "\"" + member + "\":\"" + value + "\",") + "\"op\":\"job_list\"}";
}

std::string idRequest(const std::string& op, int id) {
    return "{\"job_id\":" + std::to_string(id) + ",\"op\":\"" + op + "\"}";
}

Op framed(std::function<std::string(int)> payload) {
    return {Wire::FRAMES, "{\"code\":200",
            [payload = std::move(payload)](int number) { return bench::frame(payload(number)); }};
}

Op opOf(const Options& options) {
    const auto enqueue = [&](int number) { return bench::enqueueRequest(options.shape, options.serial + number); };
    if (options.op == "enqueue" || options.op == "record") {
        return framed(enqueue);
    }
    if (options.op == "get") {
        return framed([&](int) { return idRequest("job_get", options.id); });
    }
    if (options.op == "remove") {
        return framed([&](int number) { return idRequest("job_remove", options.id + number); });
    }
    if (options.op == "list") {
        Op list = framed([&](int) { return listRequest("unique", options.unique); });
        list.goodReply += ",\"jobs\":[{"; // found something
        return list;
    }
    if (options.op == "put") {
        return {Wire::LINES, "INSERTED ", [&](int number) {
                    const std::string job = bench::jobText(options.shape, options.serial + number);
                    return "put 0 0 60 " + std::to_string(job.size()) + "\r\n" + job + "\r\n";
                }};
    }
    if (options.op == "delete") {
        return {Wire::LINES, "DELETED",
                [&](int number) { return "delete " + std::to_string(options.id + number) + "\r\n"; }};
    }
    if (options.op == "peek") {
        return {Wire::LINES, "FOUND ", [&](int) { return "peek " + std::to_string(options.id) + "\r\n"; }};
    }
    throw std::invalid_argument("unknown op " + options.op);
}

void check(const Op& op, std::string_view reply) {
    if (reply.substr(0, op.goodReply.size()) != op.goodReply) {
        throw std::runtime_error("refused: " + std::string(reply.substr(0, 200)));
    }
}

std::vector<Connection> connect(const Options& options, Wire wire) {
    std::vector<Connection> connections;
    for (int i = 0; i < options.connections; ++i) {
        connections.emplace_back(options.socket, wire);
    }
    return connections;
}

struct Result {
    double nanoseconds = 0;
    std::string first;
    std::string last;
};

/** Sends requests [from, to), one on each connection at a time, and reads their replies. */
void exchange(std::vector<Connection>& connections, const std::vector<std::string>& requests, std::size_t from,
              std::size_t to, const Op& op, Result& result) {
    for (std::size_t at = from; at < to; at += connections.size()) {
        const std::size_t group = std::min(connections.size(), to - at);
        for (std::size_t i = 0; i < group; ++i) {
            connections[i].send(requests[at + i]);
        }
        for (std::size_t i = 0; i < group; ++i) {
            const std::string_view reply = connections[i].receive();
            check(op, reply);
            if (at + i == 0) {
                result.first = reply;
            }
            if (at + i + 1 == requests.size()) {
                result.last = reply;
            }
        }
    }
}

/**
 * The requests in small batches, and the median of these: other work of the
 * machine, which takes the core for milliseconds, falls on a few of them only.
 */
Result exchange(const Options& options, const Op& op) {
    std::vector<Connection> connections = connect(options, op.wire);
    std::vector<std::string> requests;
    for (int i = 0; i < options.count; ++i) {
        requests.push_back(op.request(i));
    }
    Result result;
    std::vector<double> times;
    const std::size_t batch = std::max(std::min(SMALL_BATCH, requests.size() / BATCHES + 1), connections.size());
    for (std::size_t at = 0; at < requests.size(); at += batch) {
        const std::size_t size = std::min(batch, requests.size() - at);
        const long long start = bench::now();
        exchange(connections, requests, at, at + size, op, result);
        times.push_back(static_cast<double>(bench::now() - start) / static_cast<double>(size));
    }
    result.nanoseconds = median(times);
    return result;
}

/** A client that has asked for all jobs of a backend and takes its time over the reply. */
class SlowReader {
public:
    explicit SlowReader(const Options& options) : connection(options.socket, Wire::FRAMES) {
        connection.send(bench::frame(listRequest("backend", options.slowBackend)));
        char byte = 0;
        ::recv(connection.descriptor(), &byte, 1, 0); // the reply is made, and on its way
        thread = std::thread([this] { read(); });
    }

    ~SlowReader() {
        stopping = true;
        shutdown(connection.descriptor(), SHUT_RD);
        thread.join();
    }

private:
    void read() {
        std::vector<char> piece(16384);
        while (!stopping && ::recv(connection.descriptor(), piece.data(), piece.size(), 0) > 0) {
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        }
    }

    Connection connection;
    std::atomic<bool> stopping = false;
    std::thread thread;
};

/** The number behind `mark` in a reply; 0 if there is none. */
int numberBehind(const std::string& reply, const std::string& mark) {
    const std::size_t at = reply.find(mark);
    return at == std::string::npos ? 0 : std::atoi(reply.c_str() + at + mark.size());
}

void print(const Result& result) {
    const std::string mark = result.first.rfind("INSERTED ", 0) == 0 ? "INSERTED " : "\"job_id\":";
    std::printf("{\"ns\": %.1f, \"first\": %d, \"last\": %d}\n", result.nanoseconds, numberBehind(result.first, mark),
                numberBehind(result.last, mark));
}

/** How long jsoncpp takes to write the array of all jobs that the daemon lists. */
Result rewrite(const Options& options) {
    Connection connection(options.socket, Wire::FRAMES);
    connection.send(bench::frame(listRequest("", "")));
    const std::string_view reply = connection.receive();
    Json::Value root;
    Json::CharReaderBuilder reader;
    Json::StreamWriterBuilder settings;
    settings["indentation"] = "";
    settings["emitUTF8"] = true;
    if (!std::unique_ptr<Json::CharReader>(reader.newCharReader())
             ->parse(reply.data(), reply.data() + reply.size(), &root, nullptr)) {
        throw std::runtime_error("the list cannot be read");
    }
    const std::unique_ptr<Json::StreamWriter> writer(settings.newStreamWriter());
    const Json::Value& jobs = root["jobs"];
    std::vector<double> times;
    for (int i = 0; i < options.count; ++i) {
        const long long start = bench::now();
        std::ostringstream out;
        writer->write(jobs, &out);
        const std::string text = out.str();
        times.push_back(static_cast<double>(bench::now() - start));
        if (text.size() < jobs.size()) {
            throw std::runtime_error("nothing was written");
        }
    }
    Result result;
    result.nanoseconds = median(times);
    return result;
}

/** The same requests many at a time, not for their times. Stops when `seconds` are over. */
Result fill(const Options& options, const Op& op, int seconds) {
    const int width = 32;
    Connection connection(options.socket, op.wire);
    Result result;
    const long long start = bench::now();
    for (int at = 0; at < options.count && bench::now() - start < seconds * 1000000000LL; at += width) {
        const int group = std::min(width, options.count - at);
        std::string requests;
        for (int i = 0; i < group; ++i) {
            requests += op.request(at + i);
        }
        connection.send(requests);
        for (int i = 0; i < group; ++i) {
            const std::string_view reply = connection.receive();
            check(op, reply);
            result.last = reply;
            if (at + i == 0) {
                result.first = reply;
            }
        }
    }
    return result;
}

Result run(const Options& options, int fillSeconds) {
    if (options.op == "rewrite") {
        return rewrite(options);
    }
    const Op op = opOf(options);
    if (fillSeconds > 0) {
        return fill(options, op, fillSeconds);
    }
    if (options.slowBackend.empty()) {
        return exchange(options, op);
    }
    const SlowReader slowReader(options);
    return exchange(options, op);
}

} // namespace

int main(int argc, char** argv) {
    Options options;
    int fillSeconds = 0;
    CLI::App app("Times requests to the daemon, to the floor, or to beanstalkd.");
    app.add_option("--socket", options.socket, "the server's socket")->required();
    app.add_option("--op", options.op, "enqueue, get, remove, list; record (floor); put, peek, delete; rewrite")
        ->required();
    app.add_option("--connections", options.connections, "how many");
    app.add_option("--count", options.count, "how many requests");
    app.add_option("--id", options.id, "the job, or the first one");
    app.add_option("--serial", options.serial, "the first new job's \"name\"");
    app.add_option("--unique", options.unique, "what to list");
    app.add_option("--action", options.shape.action, "of new jobs");
    app.add_option("--backend", options.shape.backend, "of new jobs");
    app.add_option("--branch", options.shape.branch, "of new jobs");
    app.add_option("--gate", options.shape.gate, "of new jobs");
    app.add_option("--size", options.shape.size, "of new jobs' text");
    app.add_option("--fill", fillSeconds, "send many at a time, for at most so many seconds");
    app.add_option("--beside", options.slowBackend, "a slow reader lists this backend's jobs meanwhile");
    CLI11_PARSE(app, argc, argv);
    try {
        print(run(options, fillSeconds));
    } catch (const std::exception& error) {
        std::fprintf(stderr, "request_times: %s\n", error.what());
        return 1;
    }
    return 0;
}
