#include <marubackup/controller.h>

#include "daemon.h"
#include "output.h"
#include "verbs.h"
#include "words.h"

using MARU::Backup::JobController;

int run(const AddVerb& verb, const Globals& globals) {
    Job job(verb.backend, actionNamed(verb.action));
    job.setCommandBranch(verb.branch);
    for (const std::string& name : verb.parameters.getMemberNames()) {
        job.setParam(name, verb.parameters[name]);
    }
    if (!fitsIntoRequest(job.toString())) {
        return EXIT_USAGE;
    }

    const int code = askDaemon([&job](JobController& controller) { return controller.addJob(job); }, globals);
    if (code != CODE_DONE) {
        return reportFailure(code, "not added", globals);
    }
    putData((globals.json ? toLine(job.toJson()) : std::to_string(job.getJobId())) + "\n");
    return EXIT_DONE;
}
