#include <marubackup-util/session.h>

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <vector>

#include <marubackup-util/temp_manager.h>

#include "descriptor.h"
#include "session_record.h"
#include "temp_areas.h"
#include "tree_removal.h"

namespace MARU {
namespace Backup {

class SessionPrivate {
public:
    bool createOn(const std::string& area);

    std::string id;
    std::string path;
};

namespace {

const mode_t DIRECTORY_MODE = 0700;

/** Four groups of eight hexadecimal digits, all by chance; empty if the kernel has none to give. */
std::string newSessionId() {
    std::array<unsigned char, 16> bytes;
    ssize_t size = -1;
    do {
        size = getrandom(bytes.data(), bytes.size(), 0);
    } while (size < 0 && errno == EINTR);
    std::string id;
    if (size != static_cast<ssize_t>(bytes.size())) {
        return id;
    }
    for (std::size_t at = 0; at < bytes.size(); ++at) {
        const char digits[] = "0123456789abcdef";
        id.append(at > 0 && at % 4 == 0 ? "-" : "");
        id += digits[bytes[at] >> 4];
        id += digits[bytes[at] & 0xF];
    }
    return id;
}

/** Makes a directory with that mode whatever the umask; false if it cannot, or if something is there already. */
bool makeDirectory(const SessionPlace& place) {
    if (mkdir(place.path().c_str(), DIRECTORY_MODE) != 0) {
        return false;
    }
    const Descriptor made(open(place.path().c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (made.isOpen() && fchmod(made.get(), DIRECTORY_MODE) == 0) {
        return true;
    }
    rmdir(place.path().c_str());
    return false;
}

/** Removes the directory; true if it is gone. */
bool removeDirectory(const SessionPlace& place) {
    if (!isAreaPresent(place.area)) {
        return false;
    }
    const Descriptor area(open(place.area.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return area.isOpen() && removeTree(area.get(), place.name);
}

bool holds(const std::vector<Volume>& volumes, const std::string& path) {
    return std::any_of(volumes.begin(), volumes.end(), [&path](const Volume& volume) { return volume.path == path; });
}

} // namespace

bool SessionPrivate::createOn(const std::string& area) {
    const std::string newId = newSessionId();
    if (newId.empty()) {
        return false;
    }
    // The record first: a directory without one would never be found again.
    const SessionPlace place = sessionPlace(newId, area);
    if (!writeRecord(newId, place)) {
        return false;
    }
    if (!makeDirectory(place)) {
        removeRecord(newId);
        return false;
    }
    id = newId;
    path = place.path();
    return true;
}

Session::Session() : d(new SessionPrivate) {
}

Session::~Session() {
    delete d;
}

bool Session::create() {
    return d->createOn(DEFAULT_AREA);
}

bool Session::create(boost::shared_ptr<FilterVolume> filter) {
    if (!filter) {
        return false;
    }
    const std::vector<Volume> volumes = writableVolumes();
    const std::string chosen = filter->choose(volumes);
    if (chosen.empty()) {
        return create();
    }
    return holds(volumes, chosen) && d->createOn(chosen);
}

bool Session::load(const std::string& id) {
    const std::string path = getPathById(id);
    struct stat info = {};
    if (path.empty() || lstat(path.c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) {
        return false;
    }
    d->id = id;
    d->path = path;
    return true;
}

std::string Session::getId() const {
    return d->id;
}

std::string Session::getPath() const {
    return d->path;
}

bool Session::destroy() {
    if (!destroyById(d->id)) {
        return false;
    }
    d->id.clear();
    d->path.clear();
    return true;
}

std::string Session::getPathById(const std::string& id) {
    SessionPlace place;
    return isSessionId(id) && readRecord(id, place) == RecordState::FOUND ? place.path() : std::string();
}

bool Session::destroyById(const std::string& id) {
    if (!isSessionId(id)) {
        return false;
    }
    SessionPlace place;
    switch (readRecord(id, place)) {
    case RecordState::FOUND:
        return removeDirectory(place) && removeRecord(id);
    case RecordState::MISSING:
        return true;
    case RecordState::UNUSABLE:
        return false;
    }
    return false;
}

} // namespace Backup
} // namespace MARU
