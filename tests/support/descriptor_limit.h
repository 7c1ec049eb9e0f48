#pragma once

#include <sys/resource.h>
#include <sys/types.h>

#include <algorithm>
#include <filesystem>
#include <string>

namespace support {

/** Whether the process has this very descriptor open. */
inline bool hasDescriptor(pid_t process, int fd) {
    const std::string path = "/proc/" + std::to_string(process) + "/fd/" + std::to_string(fd);
    return std::filesystem::is_symlink(std::filesystem::symlink_status(path));
}

/** Limits the descriptors of a process, of this one if it is 0, for as long as the object lives. */
class DescriptorLimit {
public:
    /** `number` is the limit that is felt; the hard one goes up where it is lower. */
    DescriptorLimit(pid_t ofProcess, rlim_t number) : process(ofProcess) {
        rlimit limit = {};
        prlimit(process, RLIMIT_NOFILE, nullptr, &limit);
        limit.rlim_cur = number;
        limit.rlim_max = std::max(limit.rlim_max, number);
        isSet = prlimit(process, RLIMIT_NOFILE, &limit, &before) == 0;
    }
    ~DescriptorLimit() {
        lift();
    }
    DescriptorLimit(const DescriptorLimit&) = delete;
    DescriptorLimit& operator=(const DescriptorLimit&) = delete;

    /** False where only root could have set it. */
    bool holds() const {
        return isSet;
    }
    void lift() {
        if (isSet) {
            prlimit(process, RLIMIT_NOFILE, &before, nullptr);
            isSet = false;
        }
    }

private:
    pid_t process;
    rlimit before = {};
    bool isSet;
};

} // namespace support
