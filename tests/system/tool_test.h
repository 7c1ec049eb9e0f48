#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include <json/value.h>

#include "daemon_test.h"

using Arguments = std::vector<std::string>;

/** What the tool printed and how it ended. */
struct Outcome {
    std::string ended;
    std::string out;
    std::string err;
};

/** A test of marubackupctl, as a shell sees it. One at a time: what they print goes to the same files. */
class ToolTest : public DaemonTest {
protected:
    /** Starts the tool in the background. */
    pid_t startTool(const Arguments& arguments);
    Outcome finish(pid_t tool);
    Outcome run(const Arguments& arguments);

    /** Waits until the tool sleeps in the kernel, as it does when the daemon does not answer. */
    static void awaitItsSleep(pid_t tool);

    /** Adds, by the tool, a backup that waits at `gate`; the id that it printed. */
    std::string addHeld(support::Gate& gate);

    static Json::Value parse(const std::string& text);

private:
    void redirect(int descriptor, const std::string& name);
};
