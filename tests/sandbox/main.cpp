// Runs a command where the fixed paths of the daemon are private and empty, so
// that the real daemon can be run beside others, and without touching the host.
//
//     launcher        waits; passes signals and the exit status on
//     └── init        the first process of the namespaces: whatever else is in
//         │           them dies with it, and it dies with the launcher
//         └── command

#include <fcntl.h>
#include <linux/sched.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <optional>

#include "id_map.h"
#include "private_view.h"
#include "setup_error.h"

namespace {

const char USAGE[] = "usage: marubackup-sandbox COMMAND [ARGUMENT...]\n";

enum ExitStatus {
    EXIT_USAGE = 2,
    EXIT_NO_SANDBOX = 77, // what CTest counts as skipped
    EXIT_CANNOT_RUN = 126,
    EXIT_NOT_FOUND = 127,
    EXIT_SIGNAL_BASE = 128,
};

const int PASSED_ON[] = {SIGTERM, SIGINT, SIGHUP, SIGQUIT};

sigset_t awaitedSignals() {
    sigset_t awaited;
    sigemptyset(&awaited);
    sigaddset(&awaited, SIGCHLD);
    for (int number : PASSED_ON) {
        sigaddset(&awaited, number);
    }
    return awaited;
}

/** Blocks the signals that are waited for; the command gets the caller's settings back. */
class HeldSignals {
public:
    HeldSignals() {
        const sigset_t awaited = awaitedSignals();
        sigprocmask(SIG_BLOCK, &awaited, &callersMask_);
        // Where SIGCHLD is ignored, children leave no status behind.
        struct sigaction standard = {};
        standard.sa_handler = SIG_DFL;
        sigaction(SIGCHLD, &standard, &callersChildAction_);
    }

    void restore() const {
        sigaction(SIGCHLD, &callersChildAction_, nullptr);
        sigprocmask(SIG_SETMASK, &callersMask_, nullptr);
    }

private:
    sigset_t callersMask_ = {};
    struct sigaction callersChildAction_ = {};
};

/** Init reads from it when it may begin, and the launcher's end is open as long as the launcher lives. */
struct Lifeline {
    int initsEnd;
    int launchersEnd;
};

Lifeline makeLifeline() {
    int ends[2];
    check(pipe2(ends, O_CLOEXEC), "make a pipe");
    return {ends[0], ends[1]};
}

/** Forks into new namespaces; 0 in the child, which is the first process there. */
pid_t forkIntoNamespaces(bool ofUsersToo) {
    clone_args arguments = {};
    arguments.flags = CLONE_NEWNS | CLONE_NEWPID;
    if (ofUsersToo) {
        arguments.flags |= CLONE_NEWUSER;
    }
    arguments.exit_signal = SIGCHLD;
    const auto child = static_cast<pid_t>(syscall(SYS_clone3, &arguments, sizeof arguments));
    return check(child, "make namespaces");
}

/** Ties init's life to the launcher's, and returns when the launcher has done its part. */
void joinLauncher(const Lifeline& lifeline) {
    close(lifeline.launchersEnd);
    check(prctl(PR_SET_PDEATHSIG, SIGKILL), "follow the launcher's death");
    char begin = 0;
    if (read(lifeline.initsEnd, &begin, 1) != 1) {
        _exit(EXIT_NO_SANDBOX);
    }
    // A launcher that died before the prctl sent no signal.
    pollfd end = {lifeline.initsEnd, POLLIN, 0};
    if (poll(&end, 1, 0) > 0 && (end.revents & POLLHUP) != 0) {
        _exit(EXIT_NO_SANDBOX);
    }
}

/**
 * Whoever waits for the command to close its output, or to stop reading its
 * input, waits for the command alone. -1 keeps none.
 */
void closeDescriptorsBut(int kept) {
    if (kept > 0) {
        close_range(0, static_cast<unsigned>(kept - 1), 0);
    }
    close_range(static_cast<unsigned>(kept + 1), ~0U, 0);
}

/** Reaps what has ended; the exit status of `child` if it was among them. */
std::optional<int> reap(pid_t child) {
    std::optional<int> ended;
    int status = 0;
    for (pid_t pid; (pid = waitpid(-1, &status, WNOHANG)) > 0;) {
        if (pid == child) {
            ended = WIFSIGNALED(status) ? EXIT_SIGNAL_BASE + WTERMSIG(status) : WEXITSTATUS(status);
        }
    }
    return ended;
}

/** Passes signals on to `child` until it has ended; its exit status. */
int passSignalsUntilEnd(pid_t child) {
    const sigset_t awaited = awaitedSignals();
    for (;;) {
        siginfo_t info = {};
        const int number = sigwaitinfo(&awaited, &info);
        if (number == SIGCHLD) {
            if (const std::optional<int> status = reap(child)) {
                return *status;
            }
        } else if (number > 0 && info.si_code != SI_KERNEL) {
            // The terminal's signals, which are the kernel's, have reached the command already.
            kill(child, number);
        }
    }
}

[[noreturn]] void execute(char** command, const HeldSignals& signals) {
    setenv("TMPDIR", "/run/tmp", 1);
    setenv("MARUBACKUP_SANDBOX", "1", 1);
    signals.restore();
    execvp(command[0], command);
    const int error = errno;
    std::fprintf(stderr, "marubackup-sandbox: %s: %s\n", command[0], std::strerror(error));
    _exit(error == ENOENT ? EXIT_NOT_FOUND : EXIT_CANNOT_RUN);
}

int runInit(const Lifeline& lifeline, char** command, const HeldSignals& signals) {
    joinLauncher(lifeline);
    makePrivateView();
    const pid_t child = check(fork(), "fork");
    if (child == 0) {
        execute(command, signals);
    }
    // A signal to the caller's process group reaches the command directly, not through init as well.
    setpgid(0, 0);
    closeDescriptorsBut(-1);
    return passSignalsUntilEnd(child);
}

int runLauncher(pid_t init, const Lifeline& lifeline, const std::optional<IdRanges>& granted) {
    close(lifeline.initsEnd);
    if (granted) {
        mapIds(init, *granted);
    }
    const char begin = 1;
    check(write(lifeline.launchersEnd, &begin, 1), "start the sandbox");
    closeDescriptorsBut(lifeline.launchersEnd);
    return passSignalsUntilEnd(init);
}

int run(char** command) {
    const HeldSignals signals;
    const bool asRoot = geteuid() == 0;
    const std::optional<IdRanges> granted = asRoot ? std::nullopt : std::optional(grantedIds());
    const Lifeline lifeline = makeLifeline();
    const pid_t init = forkIntoNamespaces(!asRoot);
    return init == 0 ? runInit(lifeline, command, signals) : runLauncher(init, lifeline, granted);
}

} // namespace

int main(int argc, char** argv) {
    if (argc < 2 || argv[1][0] == '-') {
        std::fputs(USAGE, stderr);
        return EXIT_USAGE;
    }
    try {
        return run(argv + 1);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "marubackup-sandbox: no sandbox here: %s\n", error.what());
        return EXIT_NO_SANDBOX;
    }
}
