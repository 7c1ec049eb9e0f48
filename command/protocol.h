#pragma once

namespace MARU {
namespace Backup {

// What client and daemon agree on. A request is one JSON object with an "op", a
// reply is one JSON object with a "code".

constexpr char SOCKET_PATH[] = "/var/run/marubackupd.socket";

/** The operations. */
namespace Op {
constexpr char JOB_ENQUEUE[] = "job_enqueue";
constexpr char JOB_REMOVE[] = "job_remove";
constexpr char JOB_GET[] = "job_get";
constexpr char JOB_LIST[] = "job_list";
constexpr char CLEAN_SESSION[] = "clean_session";
} // namespace Op

/** The members of requests and replies. */
namespace Member {
constexpr char OP[] = "op";
constexpr char CODE[] = "code";
constexpr char JOB[] = "job";
constexpr char JOBS[] = "jobs";
constexpr char JOB_ID[] = "job_id";
constexpr char ACTION[] = "action";
constexpr char BACKEND[] = "backend";
constexpr char UNIQUE[] = "unique";
constexpr char FORMAT[] = "format";
constexpr char TARGET[] = "target";
constexpr char SESSION_ID[] = "sess_id";
constexpr char LIFETIME[] = "lifetime";
} // namespace Member

enum ReplyCode {
    CODE_OK = 200,
    CODE_BAD_REQUEST = 400,
    CODE_NOT_FOUND = 404,
    CODE_RESTORE_PENDING = 406,
    CODE_CONFLICT = 409,
    CODE_INTERNAL = 500, ///< from the client: the reply cannot be read
    CODE_UNKNOWN_OP = 501,
    CODE_UNREACHABLE = 503, ///< from the client only
    CODE_NOT_SUPPORTED = 505,
};

} // namespace Backup
} // namespace MARU
