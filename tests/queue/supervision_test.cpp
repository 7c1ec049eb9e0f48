#include "queue/queue_server.h"

#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <csignal>
#include <ostream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "queue/queue_log.h"
#include "queue_fixture.h"
#include "support/in_child.h"
#include "support/named_rows.h"

using namespace MARU::Backup;
using support::expectLocated;
using support::waitForChild;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

using Lines = std::vector<std::string>;

class Supervision : public QueueTest {
protected:
    /** Looks at the children; the lines that this wrote into the diary. */
    Lines check() {
        diary.take();
        EXPECT_TRUE(queue_check_children_status("loop"));
        return diary.take();
    }
};

/** What a status of a process means for its job, and is called in the diary. */
struct Ending {
    const char* name;
    pid_t reaped;
    int status;
    bool ended;
    Lines lines;

    friend std::ostream& operator<<(std::ostream& out, const Ending& row) {
        return out << row.name;
    }
};

class EndOfAJob : public QueueTest, public testing::WithParamInterface<Ending> {};

const int STOPPED = 0x137F; // by signal 19, as waitpid() would say

const Ending ENDINGS[] = {
    {"Exit0", 1234, 0x0000, true, {"job [1] exit(0)"}},
    {"Exit3", 1234, 0x0300, true, {"job [1] exit(3)"}},
    {"Exit255", 1234, 0xFF00, true, {"job [1] exit(255)"}},
    {"Signal9", 1234, 0x0009, true, {"job [1] term by sig(82)", "job [1] core dump"}},
    {"Signal11WithACore", 1234, 0x008B, true, {"job [1] term by sig(82)", "job [1] core dump"}},
    {"SignalOfPid128", 128, 0x000F, true, {"job [1] term by sig(0)", "job [1] core dump"}},
    {"SignalOfPid127", 127, 0x000F, true, {"job [1] term by sig(127)", "job [1] core dump"}},

    // From here on it is the process id that decides.
    {"Pid7F", 0x7F, STOPPED, false, {"job [1] stoped by sig(0)"}},
    {"Pid137F", 0x137F, STOPPED, false, {"job [1] stoped by sig(19)"}},
    {"PidFF7F", 0xFF7F, STOPPED, false, {"job [1] stoped by sig(255)"}},
    {"Pid3137F", 0x3137F, STOPPED, false, {"job [1] stoped by sig(19)"}},
    {"PidFFFF", 0xFFFF, STOPPED, false, {"job [1] continued"}},
    {"Pid1FFFF", 0x1FFFF, STOPPED, true, {"job [1] terminateded"}},
    {"PidFF", 0xFF, STOPPED, true, {"job [1] terminateded"}},
    {"Pid1234", 1234, STOPPED, true, {"job [1] terminateded"}},
    {"Pid1234Continued", 1234, 0xFFFF, true, {"job [1] terminateded"}},
};

INSTANTIATE_TEST_SUITE_P(With, EndOfAJob, testing::ValuesIn(ENDINGS), support::NameOfRow());

/** How a job's script ends, and what the diary makes of that. */
struct ScriptEnding {
    const char* script;
    Lines (*lines)(pid_t pid);
};

Lines linesOfSignal(pid_t pid) {
    return {"job [1] term by sig(" + std::to_string(pid & 127) + ")", "job [1] core dump"};
}

const ScriptEnding SCRIPT_ENDINGS[] = {
    {"exit 0", [](pid_t) { return Lines{"job [1] exit(0)"}; }},
    {"exit 3", [](pid_t) { return Lines{"job [1] exit(3)"}; }},
    {"exit 255", [](pid_t) { return Lines{"job [1] exit(255)"}; }},
    {"kill -KILL $$", linesOfSignal},
    {"kill -TERM $$", linesOfSignal},
};

/** A process that is not the test's own child, but a child of one that never waits for it. */
class ProcessOfAnother {
public:
    enum Kind { RUNNING, ZOMBIE };

    explicit ProcessOfAnother(Kind kind) {
        int report[2];
        EXPECT_EQ(0, pipe(report));
        parent = support::startInChild([&]() { return beParent(kind, report[1]); });
        EXPECT_EQ(static_cast<ssize_t>(sizeof process), read(report[0], &process, sizeof process));
        close(report[0]);
        close(report[1]);
    }
    ~ProcessOfAnother() {
        kill(process, SIGKILL);
        kill(parent, SIGKILL);
        waitForChild(parent);
    }
    ProcessOfAnother(const ProcessOfAnother&) = delete;
    ProcessOfAnother& operator=(const ProcessOfAnother&) = delete;

    pid_t pid() const {
        return process;
    }

private:
    static int beParent(Kind kind, int report) {
        const pid_t child = support::startInChild([kind]() { return kind == RUNNING ? pause() : 0; });
        if (kind == ZOMBIE) {
            siginfo_t info = {};
            waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT);
        }
        return write(report, &child, sizeof child) == sizeof child ? pause() : 1;
    }

    pid_t parent = -1;
    pid_t process = -1;
};

/** The id of a process that has been here and is gone. */
pid_t goneProcess() {
    const pid_t child = support::startInChild([]() { return 0; });
    waitForChild(child);
    return child;
}

} // namespace

TEST_P(EndOfAJob, IsReadFromStatusAndProcessId) {
    const Job& job = addHeld(Job::ACTION_BACKUP);

    EXPECT_EQ(GetParam().ended, jobHasEnded(job, GetParam().reaped, GetParam().status));

    EXPECT_EQ(GetParam().lines, diary.take());
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(Supervision, NamesItsCallerInTheDiary) {
    queueDebugEnabled = true;

    queue_check_children_status("sigchild");
    queue_check_children_status(nullptr);

    EXPECT_THAT(diary.take(), ElementsAre("[sigchild] check children status", "[] check children status"));
}

TEST_F(Supervision, RemovesAJobWhoseProcessHasEndedAndSaysHow) {
    for (const ScriptEnding& row : SCRIPT_ENDINGS) {
        nextJobId = 1;
        const pid_t pid = launched(addScript(Job::ACTION_BACKUP, row.script)).getPid();
        awaitEnd(pid);

        EXPECT_EQ(row.lines(pid), check()) << row.script;

        EXPECT_THAT(ids("backup"), IsEmpty()) << row.script;
        EXPECT_EQ(-1, waitpid(pid, nullptr, WNOHANG)) << "its process is reaped";
    }
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(Supervision, RemovesAStoppingJobWhoseProcessHasEnded) {
    const Job& job = launched(addScript(Job::ACTION_BACKUP, "exit 0"));
    setStatus(job, Job::STATUS_STOPPING);
    awaitEnd(job.getPid());

    EXPECT_THAT(check(), ElementsAre("job [1] exit(0)"));

    EXPECT_THAT(ids("backup"), IsEmpty());
}

TEST_F(Supervision, RemovesAllJobsThatHaveEndedAndNoOthers) {
    const pid_t first = launched(addScript(Job::ACTION_COPY_TO, "exit 0")).getPid();
    launched(addHeld(Job::ACTION_COPY_TO));
    const pid_t third = launched(addScript(Job::ACTION_COPY_TO, "exit 1")).getPid();
    const pid_t fourth = launched(addScript(Job::ACTION_RESTORE, "exit 2")).getPid();
    for (const pid_t child : {first, third, fourth}) {
        awaitEnd(child);
    }

    EXPECT_THAT(check(), ElementsAre("job [1] exit(0)", "job [3] exit(1)", "job [4] exit(2)"));

    EXPECT_THAT(ids("copy_to"), ElementsAre(2));
    EXPECT_THAT(ids("restore"), IsEmpty());
}

TEST_F(Supervision, LeavesWaitingAndRunningJobsAlone) {
    addHeld(Job::ACTION_BACKUP);
    addWithProcess(goneProcess(), Job::STATUS_QUEUED);
    launched(addHeld(Job::ACTION_COPY_TO));

    EXPECT_THAT(check(), IsEmpty());

    EXPECT_THAT(ids("backup"), ElementsAre(1, 2));
    EXPECT_THAT(ids("copy_to"), ElementsAre(3));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(Supervision, LeavesAProcessThatIsHeldByASignalAlone) {
    const Job& job = launched(addHeld(Job::ACTION_BACKUP));
    kill(job.getPid(), SIGSTOP);
    siginfo_t info = {};
    ASSERT_EQ(0, waitid(P_PID, static_cast<id_t>(job.getPid()), &info, WSTOPPED | WNOWAIT));

    EXPECT_THAT(check(), IsEmpty());

    EXPECT_THAT(statuses("backup"), ElementsAre(Job::STATUS_RUNNING));
}

TEST_F(Supervision, DropsAJobWithoutAStatus) {
    for (const pid_t pid : {-1, 1}) {
        const std::string lost = addWithProcess(pid, Job::STATUS_NONE).toString();

        EXPECT_THAT(check(), IsEmpty());

        expectLocated(log, LOG_ERR, getpid(), QUEUE_UNIT, "bad job status: [" + lost + "]");
        EXPECT_THAT(ids("backup"), IsEmpty());
    }
}

TEST_F(Supervision, DropsAJobThatShouldHaveAProcessAndHasNone) {
    for (const int status : {2, 3, 7}) {
        const std::string lost = addWithProcess(-1, static_cast<Job::Status>(status)).toString();

        EXPECT_THAT(check(), IsEmpty());

        expectLocated(log, LOG_ERR, getpid(), QUEUE_UNIT, "bad job pid: [" + lost + "]");
        EXPECT_THAT(ids("backup"), IsEmpty());
    }
}

TEST_F(Supervision, ReportsAJobWhoseProcessIsGoneAgainAndAgainAndKeepsIt) {
    addWithProcess(goneProcess(), Job::STATUS_RUNNING);
    addWithProcess(goneProcess(), Job::STATUS_STOPPING);

    for (int round = 0; round < 3; ++round) {
        EXPECT_THAT(check(), ElementsAre("job [1] out of control", "job [2] out of control"));
        EXPECT_THAT(ids("backup"), ElementsAre(1, 2));
    }
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(Supervision, IsNotAlarmedByAProcessOfAnother) {
    const ProcessOfAnother running(ProcessOfAnother::RUNNING);
    const ProcessOfAnother zombie(ProcessOfAnother::ZOMBIE);
    addWithProcess(running.pid(), Job::STATUS_RUNNING);
    addWithProcess(zombie.pid(), Job::STATUS_RUNNING);

    EXPECT_THAT(check(), IsEmpty());

    EXPECT_THAT(ids("backup"), ElementsAre(1, 2));
}
