#pragma once

#include <stdexcept>
#include <string>

#include "verbs.h"
#include "verdict.h"

/** Thrown when data cannot be written to standard output: a full disk, for example. */
class OutputError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

/**
 * Writes lines of data to standard output. A reader that has gone (as "| head"
 * does) has all that it wanted: that is no failure.
 */
void putData(const std::string& lines);
/** Says something to the user, on standard error: one line. */
void say(const std::string& text);

/** Says what was not done, and why. */
void sayVerdict(const std::string& subject, const Verdict& verdict);
/**
 * Reports the code of a request that failed: says it and, with --json, writes it as
 * data. The exit status.
 */
int reportFailure(int code, const std::string& subject, const Globals& globals);

// The same as bytes, for those who cannot call these.

/** The line that say() writes, with its end. */
std::string sayLine(const std::string& text);
/** What reportFailure() writes to standard output. */
std::string failureData(const Verdict& verdict, const Globals& globals);
