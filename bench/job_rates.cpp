#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <functional>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <marubackup/controller.h>
#include <marubackup/job.h>

#include "children.h"
#include "clock.h"
#include "stamps.h"

// Tells how long many trivial jobs take, each way of running so many at a time.
// The last jobs are stamps, which tell that all before them have been started.

namespace {

using MARU::Backup::Job;
using MARU::Backup::JobController;

struct Options {
    std::string fifo;
    std::string job;
    std::string stamp;
    std::vector<std::string> folders;
    int count = 1;
    int width = 5;
};

void addJob(JobController& controller, const std::string& branch, int number) {
    Job job("bench", Job::ACTION_COPY_TO);
    job.setCommandBranch(branch);
    job.setParam("name", number);
    if (controller.addJob(job) != 200) {
        throw std::runtime_error("the job was refused");
    }
}

/** Through the daemon's queue of copies, which runs five at a time. */
void throughQueue(const Options& options) {
    JobController controller;
    bench::Stamps stamps(options.fifo);
    for (int i = 1; i < options.count; ++i) {
        addJob(controller, "", i);
    }
    addJob(controller, "stamp", options.count);
    stamps.next();
}

/** The limit of what can be had: so many children at once, and nothing else done. */
void bareLoop(const Options& options) {
    for (int running = 0, started = 0; started < options.count || running > 0;) {
        if (started < options.count && running < options.width) {
            bench::start({options.job});
            ++started;
            ++running;
        } else {
            bench::await(-1);
            --running;
        }
    }
}

void throughTaskSpooler(const Options& options) {
    bench::Stamps stamps(options.fifo);
    for (int i = 1; i < options.count; ++i) {
        bench::await(bench::start({"tsp", "-n", options.job}));
    }
    bench::await(bench::start({"tsp", "-n", options.stamp, options.fifo}));
    stamps.next();
}

/** nq runs one job at a time in a folder: as many folders as jobs are to run at once. */
void throughNq(const Options& options) {
    bench::Stamps stamps(options.fifo);
    const std::size_t width = options.folders.size();
    const std::size_t count = static_cast<std::size_t>(options.count);
    for (std::size_t i = 0; i < count; ++i) {
        setenv("NQDIR", options.folders[i % width].c_str(), 1);
        if (i + width < count) {
            bench::await(bench::start({"nq", "-q", options.job}));
        } else {
            bench::await(bench::start({"nq", "-q", options.stamp, options.fifo}));
        }
    }
    for (std::size_t i = 0; i < width; ++i) {
        stamps.next();
    }
}

} // namespace

int main(int argc, char** argv) {
    Options options;
    std::function<void()> run;
    CLI::App app("Times many trivial jobs.");
    app.require_subcommand(1);
    app.add_option("--fifo", options.fifo, "where the stamps write to")->required();
    app.add_option("--job", options.job, "the trivial program")->required();
    app.add_option("--stamp", options.stamp, "the stamp's program")->required();
    app.add_option("--count", options.count, "how many jobs");
    app.add_option("--folder", options.folders, "nq's folders");
    app.add_subcommand("queue", "through the daemon")->callback([&] { run = [&] { throughQueue(options); }; });
    app.add_subcommand("loop", "as children")->callback([&] { run = [&] { bareLoop(options); }; });
    app.add_subcommand("tsp", "through task-spooler")->callback([&] { run = [&] { throughTaskSpooler(options); }; });
    app.add_subcommand("nq", "through nq")->callback([&] { run = [&] { throughNq(options); }; });
    CLI11_PARSE(app, argc, argv);
    try {
        const long long start = bench::now();
        run();
        std::printf("{\"ns\": %.1f}\n", static_cast<double>(bench::now() - start) / options.count);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "job_rates: %s\n", error.what());
        return 1;
    }
    return 0;
}
