#include <marubackup/timed_session.h>

#include <ftw.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <ctime>
#include <limits>

#include <marubackup-util/session.h>
#include <marubackup-util/temp_manager.h>
#include <marubackup/controller.h>

#include "command/protocol.h"
#include "common/log.h"

namespace MARU {
namespace Backup {

class TimedSessionPrivate {
public:
    Session session;
};

namespace {

const char* const LOG_UNIT = "timed_session";

const long MAX_LIFETIME = 72 * 60 * 60;
const int MAX_WALK_DESCRIPTORS = 20;

/** False only if a session was to be made and could not. */
bool makeSession(Session& session, TimedSession::TempType type) {
    switch (type) {
    case TimedSession::TEMP_DEFAULT:
        return session.create();
    case TimedSession::TEMP_MAX_VOLUME:
        return session.create(TempManager::maxVolume());
    }
    // Nothing to make: the session is the one that the application has loaded.
    return true;
}

/** What stands where a session's directory should. */
enum class Finding { DIRECTORY, NOTHING, UNUSABLE };

Finding lookAt(const std::string& path, struct stat& info) {
    if (lstat(path.c_str(), &info) != 0) {
        if (errno == ENOENT) {
            return Finding::NOTHING;
        }
        LOG_LOCATED_ERR("failed to lstat session[%s]", path.c_str());
        return Finding::UNUSABLE;
    }
    if (!S_ISDIR(info.st_mode)) {
        LOG_LOCATED_ERR("path[%s] is not a session directory", path.c_str());
        return Finding::UNUSABLE;
    }
    return Finding::DIRECTORY;
}

/** The maximum of the walk that is going on: nftw() hands its callback nothing of ours. */
time_t latestAccess = 0;

int raiseLatestAccess(const char*, const struct stat* info, int type, FTW*) {
    if (type == FTW_F) {
        latestAccess = std::max(latestAccess, info->st_atime);
    }
    return 0;
}

/** When any file below `path` was read last. */
time_t latestAccessBelow(const std::string& path) {
    latestAccess = 0;
    nftw(path.c_str(), raiseLatestAccess, MAX_WALK_DESCRIPTORS, FTW_PHYS | FTW_MOUNT | FTW_DEPTH);
    return latestAccess;
}

/** The nearest 64-bit number to the sum. */
std::int64_t saturatedSum(std::int64_t one, std::int64_t other) {
    std::int64_t sum = 0;
    if (__builtin_add_overflow(one, other, &sum)) {
        return one < 0 ? std::numeric_limits<std::int64_t>::min() : std::numeric_limits<std::int64_t>::max();
    }
    return sum;
}

/** How many seconds after `now` the time `stamp` is `lifetime` seconds ago; 0 if it is already. */
long secondsLeft(std::int64_t stamp, std::int64_t lifetime, std::int64_t now) {
    // In this order nothing is lost: what does not fit below is in the past
    // whatever the lifetime, and what does not fit above is for ever.
    const std::int64_t left = saturatedSum(saturatedSum(stamp, -now), lifetime);
    const std::int64_t longest = std::numeric_limits<long>::max();
    return static_cast<long>(std::clamp(left, std::int64_t(0), longest));
}

} // namespace

TimedSession::TimedSession() : d(new TimedSessionPrivate) {
}

TimedSession::~TimedSession() {
    delete d;
}

bool TimedSession::create(TempType type, long lifetime) {
    if (!makeSession(d->session, type)) {
        return false;
    }
    JobController controller;
    if (controller.cleanSession(getId(), std::min(lifetime, MAX_LIFETIME)) != CODE_OK) {
        LOG_LOCATED_ERR("failed to add clean session event[%s][%ld]", getId().c_str(), lifetime);
        return false;
    }
    return true;
}

bool TimedSession::load(const std::string& id) {
    return d->session.load(id);
}

std::string TimedSession::getId() const {
    return d->session.getId();
}

std::string TimedSession::getPath() const {
    return d->session.getPath();
}

bool TimedSession::destroy() {
    return d->session.destroy();
}

long TimedSession::destroyExpired(const std::string& id, long lifetime, bool walkFiles) {
    const std::string path = Session::getPathById(id);
    struct stat info = {};
    const Finding finding = path.empty() ? Finding::NOTHING : lookAt(path, info);
    if (finding == Finding::UNUSABLE) {
        LOG_LOCATED_ERR("failed to stat session[%s]", id.c_str());
        return -1;
    }
    if (finding == Finding::DIRECTORY) {
        const time_t stamp = walkFiles ? std::max(info.st_mtime, latestAccessBelow(path)) : info.st_mtime;
        const long left = secondsLeft(stamp, lifetime, time(nullptr));
        if (left > 0) {
            return left;
        }
    }
    if (!Session::destroyById(id)) {
        LOG_LOCATED_ERR("failed to destroy session[%s]", id.c_str());
        return -1;
    }
    return 0;
}

} // namespace Backup
} // namespace MARU
