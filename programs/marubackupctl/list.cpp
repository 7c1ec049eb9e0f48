#include <list>

#include <marubackup/controller.h>

#include "daemon.h"
#include "output.h"
#include "table.h"
#include "verbs.h"
#include "words.h"

using MARU::Backup::JobController;

namespace {

/** Ids and process ids are above 0; the rest stands for none. */
std::string numberCell(int number) {
    return number > 0 ? std::to_string(number) : std::string();
}

std::string asTable(const std::list<Job>& jobs) {
    Table table({"ID", "ACTION", "STATUS", "PID", "BACKEND", "BRANCH", "UNIQUE"});
    for (const Job& job : jobs) {
        table.add({numberCell(job.getJobId()), action2str(job.getAction()), statusName(job.getStatus()),
                   numberCell(job.getPid()), job.getBackend(), job.getCommandBranch(), job.getUniqueString()});
    }
    return table.text();
}

std::string asJson(const std::list<Job>& jobs) {
    Json::Value array(Json::arrayValue);
    for (const Job& job : jobs) {
        array.append(job.toJson());
    }
    return toLine(array) + "\n";
}

} // namespace

int run(const ListVerb& verb, const Globals& globals) {
    const std::string members = R"("action":64,"backend":"","format":"","target":"","unique":"",)";
    if (!fitsIntoRequest(members + verb.backend + verb.format + verb.target + verb.unique)) {
        return EXIT_USAGE;
    }

    std::list<Job> jobs;
    const Request request = [&](JobController& controller) {
        return controller.listJobEx(jobs, actionNamed(verb.action), verb.backend, verb.unique, verb.format,
                                    verb.target);
    };
    const int code = askDaemon(request, globals);
    if (code != CODE_DONE) {
        return reportFailure(code, "cannot list", globals);
    }
    putData(globals.json ? asJson(jobs) : asTable(jobs));
    return EXIT_DONE;
}
