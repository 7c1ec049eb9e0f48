#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <list>
#include <stdexcept>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <marubackup/controller.h>
#include <marubackup/job.h>

#include "children.h"
#include "clock.h"
#include "stamps.h"

// Tells how long it takes until a job's first instruction: from the call or
// command that asks for it, or from the end of the job before.

namespace {

using MARU::Backup::Job;
using MARU::Backup::JobController;

const int CODE_OK = 200;

struct Options {
    std::string fifo;
    std::string gate;
    int count = 1;
    int serial = 1;
    std::vector<std::string> command;
    std::string settle;
};

/** The lower quartile: other work of the machine only ever makes a launch slower, and some of them much slower. */
double typical(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return values.at(values.size() / 4);
}

/** From `ask` to the first instruction of the stamp that it causes; `settle` waits for quiet. */
double firstInstruction(const Options& options, const std::function<void(int)>& ask,
                        const std::function<void(int)>& settle) {
    bench::Stamps stamps(options.fifo);
    std::vector<double> times;
    for (int i = 0; i < options.count; ++i) {
        const long long start = bench::now();
        ask(i);
        times.push_back(static_cast<double>(stamps.next().begin - start));
        settle(i);
    }
    return typical(times);
}

void emptyQueue(JobController& controller) {
    std::list<Job> jobs;
    while (controller.listJobByBackend(jobs, "bench") != CODE_OK || !jobs.empty()) {
        jobs.clear();
    }
}

double timeSpawn(const Options& options) {
    pid_t child = -1;
    return firstInstruction(
        options, [&](int) { child = bench::start(options.command); }, [&](int) { bench::await(child); });
}

double timeAdd(const Options& options) {
    JobController controller;
    emptyQueue(controller);
    const auto add = [&](int number) {
        Job job("bench", Job::ACTION_BACKUP);
        job.setCommandBranch("stamp");
        job.setParam("name", options.serial + number);
        if (controller.addJob(job) != CODE_OK) {
            throw std::runtime_error("the job was refused");
        }
    };
    return firstInstruction(options, add, [&](int) { emptyQueue(controller); });
}

/** `@` in the command stands for the job's number. */
double timeCommand(const Options& options) {
    JobController controller;
    pid_t child = -1;
    const auto ask = [&](int number) {
        std::vector<std::string> command = options.command;
        for (std::string& word : command) {
            const std::size_t at = word.find('@');
            if (at != std::string::npos) {
                word.replace(at, 1, std::to_string(options.serial + number));
            }
        }
        child = bench::start(command);
    };
    const auto settle = [&](int) {
        bench::await(child);
        if (options.settle == "queue") {
            emptyQueue(controller);
        } else if (!options.settle.empty()) {
            bench::await(bench::start(CLI::detail::split_up(options.settle)));
        }
    };
    return firstInstruction(options, ask, settle);
}

/** Lets the stamp at the gate go, and looks at how fast each of those behind it followed. */
double timeGaps(const Options& options) {
    bench::Stamps stamps(options.fifo);
    const int gate = open(options.gate.c_str(), O_RDWR | O_CLOEXEC);
    if (gate < 0 || write(gate, "", 1) != 1) {
        throw std::runtime_error("the gate cannot be opened");
    }
    bench::StampRecord before = stamps.next();
    std::vector<double> times;
    for (int i = 0; i < options.count; ++i) {
        const bench::StampRecord record = stamps.next();
        times.push_back(static_cast<double>(record.begin - before.end));
        before = record;
    }
    close(gate);
    return typical(times);
}

} // namespace

int main(int argc, char** argv) {
    Options options;
    std::function<double(const Options&)> measure;
    CLI::App app("Times how soon jobs start.");
    app.require_subcommand(1);
    app.add_option("--fifo", options.fifo, "where the stamps write to")->required();
    app.add_option("--gate", options.gate, "where the first stamp waits");
    app.add_option("--count", options.count, "how many jobs");
    app.add_option("--serial", options.serial, "the first job's number");
    app.add_option("--settle", options.settle, "\"queue\", or a command that waits until the job is done");
    app.add_subcommand("spawn", "posix_spawn of the command")->callback([&] { measure = timeSpawn; });
    app.add_subcommand("add", "JobController::addJob")->callback([&] { measure = timeAdd; });
    app.add_subcommand("command", "a command that adds a job")->callback([&] { measure = timeCommand; });
    app.add_subcommand("gaps", "the jobs behind the gate")->callback([&] { measure = timeGaps; });
    for (CLI::App* const verb : app.get_subcommands({})) {
        verb->add_option("command", options.command);
    }
    CLI11_PARSE(app, argc, argv);
    try {
        std::printf("{\"ns\": %.1f}\n", measure(options));
    } catch (const std::exception& error) {
        std::fprintf(stderr, "launch_times: %s\n", error.what());
        return 1;
    }
    return 0;
}
