#include "session_record.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>

#include "descriptor.h"
#include "temp_areas.h"

namespace MARU {
namespace Backup {

namespace {

const char RECORD_FOLDER[] = "/var/run/marusession";
const std::string DIRECTORY_PREFIX = "marusession-";
const char UNFINISHED_SUFFIX[] = ".new"; // no id has a dot
const std::size_t MAX_ID_LENGTH = 64;
const std::size_t MAX_RECORD_SIZE = 256;
const char ID_CHARACTERS[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-";
const uid_t ROOT = 0;

/** Whether nobody but root can have written it. */
bool isRootsAlone(const struct stat& info) {
    return info.st_uid == ROOT && (info.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

/** The records' folder; none, with errno set, if there is none that can be relied on. */
Descriptor openRecordFolder() {
    Descriptor folder(open(RECORD_FOLDER, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat info = {};
    if (folder.isOpen() && (fstat(folder.get(), &info) != 0 || !isRootsAlone(info))) {
        errno = EPERM;
        return Descriptor();
    }
    return folder;
}

bool writeAll(const Descriptor& file, const std::string& text) {
    for (std::size_t written = 0; written < text.size();) {
        const ssize_t size = write(file.get(), text.data() + written, text.size() - written);
        if (size >= 0) {
            written += static_cast<std::size_t>(size);
        } else if (errno != EINTR) {
            return false;
        }
    }
    return true;
}

/** What is in the regular file of root's, up to one byte more than a record may have. */
bool readOwn(const Descriptor& file, std::string& text) {
    struct stat info = {};
    if (fstat(file.get(), &info) != 0 || !S_ISREG(info.st_mode) || !isRootsAlone(info)) {
        return false;
    }
    std::array<char, MAX_RECORD_SIZE + 1> buffer;
    const ssize_t size = pread(file.get(), buffer.data(), buffer.size(), 0);
    text.assign(buffer.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
    return size > 0;
}

/** Understands a record's text. False unless it names the one directory, on some area, that it may name. */
bool parseRecord(const std::string& text, const std::string& id, SessionPlace& place) {
    const std::size_t areaEnd = text.rfind('/');
    if (areaEnd == std::string::npos || !isArea(text.substr(0, areaEnd))) {
        return false;
    }
    const SessionPlace own = sessionPlace(id, text.substr(0, areaEnd));
    if (text != own.path() + "\n") {
        return false;
    }
    place = own;
    return true;
}

} // namespace

bool isSessionId(const std::string& id) {
    return !id.empty() && id.size() <= MAX_ID_LENGTH && id.find_first_not_of(ID_CHARACTERS) == std::string::npos;
}

SessionPlace sessionPlace(const std::string& id, const std::string& area) {
    return {area, DIRECTORY_PREFIX + id};
}

bool writeRecord(const std::string& id, const SessionPlace& place) {
    mkdir(RECORD_FOLDER, 0700); // perhaps it is there
    const Descriptor folder = openRecordFolder();
    const std::string unfinished = id + UNFINISHED_SUFFIX;
    const Descriptor file(
        openat(folder.get(), unfinished.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file.isOpen()) {
        return false;
    }
    if (writeAll(file, place.path() + "\n") &&
        renameat(folder.get(), unfinished.c_str(), folder.get(), id.c_str()) == 0) {
        return true;
    }
    unlinkat(folder.get(), unfinished.c_str(), 0);
    return false;
}

RecordState readRecord(const std::string& id, SessionPlace& place) {
    const Descriptor folder = openRecordFolder();
    if (!folder.isOpen()) {
        return errno == ENOENT ? RecordState::MISSING : RecordState::UNUSABLE;
    }
    const Descriptor file(openat(folder.get(), id.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (!file.isOpen()) {
        return errno == ENOENT ? RecordState::MISSING : RecordState::UNUSABLE;
    }
    std::string text;
    return readOwn(file, text) && parseRecord(text, id, place) ? RecordState::FOUND : RecordState::UNUSABLE;
}

bool removeRecord(const std::string& id) {
    const Descriptor folder = openRecordFolder();
    if (!folder.isOpen()) {
        return errno == ENOENT;
    }
    return unlinkat(folder.get(), id.c_str(), 0) == 0 || errno == ENOENT;
}

} // namespace Backup
} // namespace MARU
