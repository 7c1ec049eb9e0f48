#include <sys/wait.h>
#include <unistd.h>

#include <climits>
#include <csignal>
#include <cstdio>
#include <random>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "common/json_text.h"
#include "plain_store.h"
#include "queue/job_queues.h"
#include "queue/queue_server.h"
#include "queue_fixture.h"
#include "support/backend_files.h"
#include "support/in_child.h"

using namespace MARU::Backup;

namespace {

const int STEPS = 3000;

/** No process ever has this id. */
const pid_t NOBODY = INT_MAX;

/** What runs until it is told to end, and what ends at once. */
const char* const HELD = "held";
const char* const QUICK = "quick";

/**
 * Anything that can happen to the jobs, and much that cannot, in an order that
 * the seed decides, done to the daemon's store and to the plain one.
 */
class History : public QueueTest, public testing::WithParamInterface<unsigned int> {
protected:
    History() : chance(GetParam()) {
        support::writeLocalBackend(QUICK, inAllSections("unique = {{name}}\ncommand_launch = /bin/true"));
        plain.backends = {HELD, QUICK};
        const auto before = signal(SIGTERM, SIG_IGN); // which the child inherits
        stranger = support::startInChild(pause);
        signal(SIGTERM, before);
        plain.running.insert(stranger);
    }

    ~History() override {
        processes.push_back(stranger);
        for (const pid_t process : processes) {
            siginfo_t info = {};
            if (waitid(P_PID, static_cast<id_t>(process), &info, WEXITED | WNOHANG | WNOWAIT) == 0) {
                kill(process, SIGKILL);
                support::waitForChild(process);
            }
        }
    }

    void step() {
        struct Kind {
            int weight;
            void (History::*happen)();
        };
        const Kind kinds[] = {
            {250, &History::enqueue}, {200, &History::append}, {40, &History::edit},    {150, &History::get},
            {150, &History::list},    {100, &History::remove}, {60, &History::check},   {60, &History::scan},
            {60, &History::compare},  {2, &History::stopAll},  {4, &History::clearOne},
        };
        int sum = 0;
        for (const Kind& kind : kinds) {
            sum += kind.weight;
        }
        int drawn = below(sum);
        for (const Kind& kind : kinds) {
            drawn -= kind.weight;
            if (drawn < 0) {
                return (this->*kind.happen)();
            }
        }
    }

    /** Both stores hold the same jobs in the same order, and have said the same. */
    void expectSame() {
        EXPECT_EQ(textOf(plain.queues), textOf(jobQueues));
        EXPECT_EQ(plain.diary, said);
        EXPECT_EQ(plain.nextJobId, nextJobId);
        plain.diary.clear();
        said.clear();
    }

    /** The same for the system's log, at the end. */
    void expectSameLog() {
        std::vector<std::string> located;
        for (const support::SyslogLine& line : log.lines()) {
            const support::LocatedMessage message = support::parseLocated(line.message);
            if (message.unit == QUEUE_UNIT) {
                located.push_back(message.text);
            }
        }
        EXPECT_EQ(plain.located, located);
    }

private:
    // What is drawn

    int below(int end) {
        return std::uniform_int_distribution<int>(0, end - 1)(chance);
    }

    template <typename T>
    T oneOf(const std::vector<T>& all) {
        return all[static_cast<std::size_t>(below(static_cast<int>(all.size())))];
    }

    /** Few enough to be met again. */
    std::string anyUnique() {
        return below(8) == 0 ? "" : "u" + std::to_string(below(120));
    }

    Job::Action anyAction() {
        // Restores hold up everything else, so they are rare.
        return below(25) == 0
                   ? Job::ACTION_RESTORE
                   : oneOf<Job::Action>({Job::ACTION_BACKUP, Job::ACTION_COPY_TO, Job::ACTION_TARGET_COPY_TO,
                                         Job::ACTION_RELINK, Job::ACTION_REMOVE_VERSION, Job::ACTION_REMOVE_TASK});
    }

    int anyId() {
        return below(30) == 0 ? INT_MAX : 1 + below(nextJobId + 2);
    }

    Job::Status anyStatus() {
        return static_cast<Job::Status>(oneOf<int>({1, 1, 1, 1, 1, 1, 1, 1, 2, 2, 3, 3, 0, 4, -1}));
    }

    pid_t anyPid() {
        return below(8) != 0 ? -1 : oneOf<pid_t>({-7, NOBODY, stranger});
    }

    // What happens: to the daemon's store first, since only that has processes

    void enqueue() {
        Job job(oneOf<std::string>({HELD, QUICK}), anyAction());
        job.setParam("name", anyUnique());
        const std::string reply = ask(R"({"op":"job_enqueue","job":)" + job.toString() + "}");
        look();
        EXPECT_EQ(plain.enqueue(job), reply);
    }

    void append() {
        Job job(oneOf<std::string>({HELD, HELD, "lost"}), below(12) == 0 ? Job::ACTION_NONE : anyAction());
        job.setUniqueString(anyUnique());
        job.setStatus(anyStatus());
        job.setPid(anyPid());
        job.setJobId(anyId());
        jobQueues[action2str(job.getAction())].push_back(job);
        plain.queues[action2str(job.getAction())].push_back(job);
    }

    /** A callback that changes, removes, and ends as it likes, and does so again for a copy of itself. */
    struct Editor {
        History* history;
        std::mt19937 chance;

        QueueIterControl operator()(const std::string&, Job& job, bool& removeJob, void*) {
            std::swap(chance, history->chance);
            edit(job, removeJob);
            const auto control = static_cast<QueueIterControl>(history->oneOf<int>({0, 0, 0, 0, 0, 0, 0, 1, 2, 3}));
            std::swap(chance, history->chance);
            return control;
        }

        void edit(Job& job, bool& removeJob) const {
            switch (history->below(10)) {
            case 0:
                return job.setUniqueString(history->anyUnique());
            case 1:
                return job.setStatus(history->anyStatus());
            case 2:
                return job.setPid(history->anyPid());
            case 3:
                return job.setJobId(history->anyId());
            case 4:
                removeJob = true;
                return job.setUniqueString("removed");
            default:
                return;
            }
        }
    };

    void edit() {
        const Editor editor = {this, std::mt19937(chance())};
        EXPECT_TRUE(queue_foreach_job(editor, nullptr));
        plain.foreachJob(editor);
    }

    void get() {
        const int id = anyId();
        EXPECT_EQ(plain.get(id), ask(R"({"op":"job_get","job_id":)" + std::to_string(id) + "}"));
    }

    void list() {
        Json::Value request(Json::objectValue);
        request["op"] = "job_list";
        if (below(3) == 0) {
            request["action"] = below(6) == 0 ? 3 : static_cast<int>(anyAction());
        }
        if (below(3) != 0) {
            request["unique"] = anyUnique();
        }
        if (below(3) == 0) {
            request["backend"] = oneOf<std::string>({HELD, QUICK, "lost"});
        }
        if (below(4) == 0) {
            request["format"] = "{{BACKEND}} {{UNIQUE}}";
            request["target"] = oneOf<std::string>({HELD, QUICK}) + " " + anyUnique();
        }
        EXPECT_EQ(plain.listed(request), ask(toString(request)));
    }

    void remove() {
        const int id = anyId();
        const std::string reply = ask(R"({"op":"job_remove","job_id":)" + std::to_string(id) + "}");
        look();
        EXPECT_EQ(plain.remove(id), reply);
    }

    void check() {
        queue_check_children_status("loop");
        look();
        plain.check();
    }

    void scan() {
        queue_scan_next_to_launch();
        look();
        plain.scan();
    }

    void compare() {
        Job candidate;
        candidate.setUniqueString(anyUnique());
        EXPECT_EQ(plain.isSameUnique(candidate.getUniqueString()), queue_is_same_unique(candidate));
        const std::string name = action2str(anyAction());
        const auto entry = plain.queues.find(name);
        EXPECT_EQ(entry == plain.queues.end() || entry->second.empty(), queue_is_empty(name));
    }

    void stopAll() {
        queue_foreach_job(sendSignalCb, nullptr);
        look();
        plain.stopAll();
    }

    void clearOne() {
        const std::string name = action2str(anyAction());
        jobQueues[name].clear();
        plain.queues[name].clear();
    }

    /** Reads the diary, and waits until the processes that it tells of have ended if they will. */
    void look() {
        for (const std::string& line : diary.take()) {
            said.push_back(line);
            int signal = 0;
            int id = 0;
            pid_t pid = 0;
            if (std::sscanf(line.c_str(), "launch job [%d] on pid [%d]", &id, &pid) == 2) {
                plain.newProcesses.push_back(pid);
                plain.running.insert(pid);
                processes.push_back(pid);
                if (backendOf(pid) == QUICK) {
                    expectEnd(pid, 0);
                }
            } else if (std::sscanf(line.c_str(), "send sig[%d] to job [%d] pid [%d]", &signal, &id, &pid) == 3) {
                if (pid != stranger && plain.running.count(pid) != 0) {
                    expectEnd(pid, signal);
                }
            }
        }
    }

    void expectEnd(pid_t process, int status) {
        awaitEnd(process);
        plain.running.erase(process);
        plain.ended[process] = status;
    }

    static std::string backendOf(pid_t pid) {
        for (const auto& entry : jobQueues) {
            for (const Job& job : entry.second) {
                if (job.getPid() == pid) {
                    return job.getBackend();
                }
            }
        }
        return std::string();
    }

    template <typename Queues>
    static std::string textOf(const Queues& queues) {
        std::string text;
        for (const auto& entry : queues) {
            text += entry.first + ":\n";
            for (const Job& job : entry.second) {
                text += "  " + job.toString() + "\n";
            }
        }
        return text;
    }

    std::mt19937 chance;
    PlainStore plain;
    std::vector<std::string> said;
    pid_t stranger = -1; ///< runs, and does not end when told to
    std::vector<pid_t> processes;
};

INSTANTIATE_TEST_SUITE_P(OfSeed, History, testing::Values(1U, 2U, 3U, 4U));

} // namespace

TEST_P(History, IsTheSameHoweverTheJobsAreFound) {
    for (int number = 0; number < STEPS && !HasFailure(); ++number) {
        SCOPED_TRACE("seed " + std::to_string(GetParam()) + ", step " + std::to_string(number));
        step();
        expectSame();
    }
    expectSameLog();
}
