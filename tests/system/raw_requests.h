#pragma once

#include <string>

#include <marubackup/job.h>

// Requests as they go over the wire, for tests that send them by hand.

/** Asks for all jobs. */
const std::string LIST_REQUEST = "{\"op\":\"job_list\"}";

/** A request about the job of that id. */
inline std::string requestFor(const std::string& op, int id) {
    return "{\"op\":\"" + op + "\",\"job_id\":" + std::to_string(id) + "}";
}

inline std::string enqueueRequest(const MARU::Backup::Job& job) {
    return "{\"op\":\"job_enqueue\",\"job\":" + job.toString() + "}";
}
