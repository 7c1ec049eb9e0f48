#include "archive_version.h"

#include <cerrno>
#include <cstring>
#include <sstream>

std::string ArchiveVersion::settings() const {
    std::ostringstream text;
    text << "version " << version << "\nincrease " << increaseResult << "\nget " << getResult << '\n';
    if (getResultAfterIncrease) {
        text << "get_after_increase " << *getResultAfterIncrease << '\n';
    }
    return text.str();
}

bool ArchiveVersion::set(const std::string& line) {
    std::istringstream words(line);
    std::string name;
    std::int64_t number = 0;
    if (!(words >> name >> number)) {
        return false;
    }
    if (name == "version") {
        version = static_cast<std::uint32_t>(number);
    } else if (name == "increase") {
        increaseResult = static_cast<int>(number);
    } else if (name == "get") {
        getResult = static_cast<int>(number);
    } else if (name == "get_after_increase") {
        getResultAfterIncrease = static_cast<int>(number);
    } else {
        return false;
    }
    return true;
}

int ArchiveVersion::answer(std::uint32_t request, void* data) {
    switch (request) {
    case GET:
        return get(data);
    case INCREASE:
        return increase();
    default:
        return -ENOTTY;
    }
}

int ArchiveVersion::increase() {
    if (increaseResult < 0) {
        return increaseResult;
    }
    ++version;
    getResult = getResultAfterIncrease.value_or(getResult);
    return increaseResult;
}

/** The caller hands in a zero. */
int ArchiveVersion::get(void* data) const {
    std::uint32_t value = 1;
    if (data != nullptr) {
        std::memcpy(&value, data, sizeof value);
    }
    if (value != 0) {
        return -EINVAL;
    }
    if (getResult >= 0) {
        std::memcpy(data, &version, sizeof version);
    }
    return getResult;
}
