#pragma once

#include <string>

/** Tells the operator: one line to standard error, and to syslog at `priority`. */
void report(int priority, const std::string& text);
