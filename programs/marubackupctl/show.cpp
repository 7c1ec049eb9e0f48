#include <marubackup/controller.h>

#include "daemon.h"
#include "output.h"
#include "verbs.h"
#include "words.h"

using MARU::Backup::JobController;

namespace {

std::string line(const std::string& name, const std::string& value) {
    return printable(name) + ":" + (value.empty() ? "" : " ") + printable(value) + "\n";
}

std::string asLines(const Job& job) {
    std::string lines = line("job_id", std::to_string(job.getJobId())) + line("action", action2str(job.getAction())) +
                        line("status", statusName(job.getStatus())) +
                        line("pid", job.getPid() > 0 ? std::to_string(job.getPid()) : "") +
                        line("backend", job.getBackend()) + line("branch", job.getCommandBranch()) +
                        line("unique", job.getUniqueString());
    const Json::Value parameters = job.getParams();
    for (const std::string& name : parameters.getMemberNames()) {
        const Json::Value& value = parameters[name];
        lines += line("param." + name, value.isString() ? value.asString() : toLine(value));
    }
    return lines;
}

} // namespace

int run(const ShowVerb& verb, const Globals& globals) {
    Job job;
    const Request request = [&](JobController& controller) { return controller.getJob(verb.jobId, job); };
    const int code = askDaemon(request, globals);
    if (code != CODE_DONE) {
        return reportFailure(code, "job " + std::to_string(verb.jobId), globals);
    }
    putData(globals.json ? toLine(job.toJson()) + "\n" : asLines(job));
    return EXIT_DONE;
}
