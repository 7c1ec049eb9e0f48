#include <marubackup/controller.h>

#include "daemon.h"
#include "output.h"
#include "verbs.h"
#include "words.h"

using MARU::Backup::JobController;

int run(const RemoveVerb& verb, const Globals& globals) {
    int worst = CODE_DONE;
    Json::Value results(Json::arrayValue);
    for (const int jobId : verb.jobIds) {
        const Request request = [jobId](JobController& controller) { return controller.removeJob(jobId); };
        const Verdict verdict = verdictOn(askDaemon(request, globals));
        Json::Value result = toJson(verdict);
        result["job_id"] = jobId;
        results.append(result);
        if (verdict.code != CODE_DONE) {
            sayVerdict("job " + std::to_string(jobId), verdict);
        }
        worst = worseOf(worst, verdict.code);
    }
    if (globals.json) {
        putData(toLine(results) + "\n");
    }
    return verdictOn(worst).status;
}
