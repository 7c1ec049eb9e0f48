#pragma once

#include <chrono>
#include <functional>
#include <string>

namespace support {

/** How long a test waits for an event that has to come. Nothing is ever timed by it. */
const std::chrono::seconds PATIENCE(60);

/** How long a test looks for something that must not come. */
const std::chrono::milliseconds GLANCE(300);

/** Whether `fd` can be read, or is at its end, within `limit`. */
bool waitReadable(int fd, std::chrono::milliseconds limit = PATIENCE);

/**
 * Looks at `condition` again and again until it holds, for what nobody sends an
 * event for (the state of a process in /proc); false after PATIENCE.
 */
bool waitUntil(const std::function<bool()>& condition);

/** Whether the process `pid` is gone, without a trace. */
bool isGone(int pid);

/** The processor time that the process `pid` has used so far. */
std::chrono::milliseconds cpuTime(int pid);

/** How many descriptors the process `pid` has open. */
int openDescriptors(int pid);

} // namespace support
