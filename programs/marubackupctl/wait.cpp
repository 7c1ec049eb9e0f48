#include <algorithm>
#include <chrono>
#include <thread>

#include <marubackup/controller.h>

#include "daemon.h"
#include "output.h"
#include "verbs.h"

using MARU::Backup::JobController;

namespace {

using Clock = std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;

// A job that takes a moment is noticed at once; one that takes hours is not
// asked about all the time.
const Seconds FIRST_PAUSE(0.05);
const Seconds LONGEST_PAUSE(0.5);
/** What the last look gets when the time is up. */
const Seconds LAST_LOOK(0.2);

/** How long the whole wait may still take. */
class Allowance {
public:
    explicit Allowance(const std::optional<double>& seconds) {
        if (seconds) {
            end = Clock::now() + std::chrono::duration_cast<Clock::duration>(Seconds(*seconds));
        }
    }

    Seconds left() const {
        return std::max(Seconds(end - Clock::now()), Seconds(0));
    }

private:
    Clock::time_point end = Clock::time_point::max();
};

std::string stillThere(const std::vector<int>& jobIds) {
    std::string text = "not ended yet:";
    for (const int jobId : jobIds) {
        text += " " + std::to_string(jobId);
    }
    return text;
}

/** Takes the jobs that have ended out of `jobIds`; done, or the code of the request that failed. */
int dropEnded(std::vector<int>& jobIds, const Allowance& allowance, const Globals& globals) {
    const std::string late = stillThere(jobIds);
    for (auto jobId = jobIds.begin(); jobId != jobIds.end();) {
        Job job;
        const Request request = [&](JobController& controller) { return controller.getJob(*jobId, job); };
        const double left = std::max(allowance.left(), LAST_LOOK).count();
        const int code = left < globals.timeout ? askDaemon(request, globals, left, late) : askDaemon(request, globals);
        if (code != CODE_DONE && code != CODE_NO_SUCH_JOB) {
            return code;
        }
        jobId = code == CODE_NO_SUCH_JOB ? jobIds.erase(jobId) : jobId + 1;
    }
    return CODE_DONE;
}

} // namespace

int run(const WaitVerb& verb, const Globals& globals) {
    std::vector<int> waitedFor = verb.jobIds;
    const Allowance allowance(verb.longest);
    for (Seconds pause = FIRST_PAUSE;; pause = std::min(2 * pause, LONGEST_PAUSE)) {
        const bool last = allowance.left() == Seconds(0);
        const int code = dropEnded(waitedFor, allowance, globals);
        if (code != CODE_DONE) {
            return reportFailure(code, "cannot wait", globals);
        }
        if (waitedFor.empty()) {
            return EXIT_DONE;
        }
        if (last) {
            say(stillThere(waitedFor));
            return EXIT_TIMED_OUT;
        }
        std::this_thread::sleep_for(std::min(pause, allowance.left()));
    }
}
