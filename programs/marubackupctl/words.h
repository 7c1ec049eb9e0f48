#pragma once

#include <array>
#include <string>
#include <vector>

#include <json/value.h>

#include <marubackup/job.h>

// How things are written for people and for programs.

/** The actions that a backend may have. */
extern const std::array<MARU::Backup::Job::Action, 7> ACTIONS;
/** The action of that name; ACTION_NONE if there is none. */
MARU::Backup::Job::Action actionNamed(const std::string& name);

/** "queued" and so on; the number of a status that has no name. */
std::string statusName(MARU::Backup::Job::Status status);

/**
 * `text` as it may be shown on a terminal: what is no visible character of the
 * locale is written as a backslash with its octal digits, and a backslash twice.
 */
std::string printable(const std::string& text);

/** The texts in a row, with `separator` between them. */
std::string joined(const std::vector<std::string>& texts, const std::string& separator);

/** One line of JSON in ASCII. */
std::string toLine(const Json::Value& json);
