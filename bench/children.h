#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace bench {

/** Starts a program, looked up in PATH, with its output thrown away; its failure is an exception. */
pid_t start(const std::vector<std::string>& command);

/** Waits for the end of a child, any with -1; which it was. A status other than 0 is an exception. */
pid_t await(pid_t child);

} // namespace bench
