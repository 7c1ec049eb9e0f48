#pragma once

#include <functional>
#include <string>

#include "verbs.h"

namespace MARU {
namespace Backup {
class JobController;
}
} // namespace MARU

/** One request to the daemon; returns its code. */
using Request = std::function<int(MARU::Backup::JobController& controller)>;

/**
 * Makes `request`, and returns its code. The tool ends here, with a message, if
 * the answer takes longer than --timeout or the daemon goes away meanwhile.
 */
int askDaemon(const Request& request, const Globals& globals);

/** The same, with a time-out in seconds and a message for it of the caller's. */
int askDaemon(const Request& request, const Globals& globals, double seconds, const std::string& lateMessage);

/**
 * Asks `question` of the library, which may ask the daemon if there is one. The
 * tool ends here as it does in askDaemon().
 */
void askLibrary(const std::function<void()>& question, const Globals& globals);

/** "2.5 seconds" */
std::string inSeconds(double seconds);

/**
 * Whether a request with `content`, besides its fixed members, is short enough
 * for the daemon, which never answers a longer one. If not, the user is told.
 */
bool fitsIntoRequest(const std::string& content);
