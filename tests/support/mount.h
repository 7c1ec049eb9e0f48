#pragma once

#include <sys/mount.h>

#include <cerrno>
#include <string>
#include <system_error>

namespace support {

/**
 * Something mounted on a file or folder of the sandbox, which stays there until
 * the end of the object's life or unmount(). A tmpfs keeps the time of every
 * reading, as not all file systems do.
 */
class Mount {
public:
    /** A tmpfs with these options ("size=1m"). */
    static Mount tmpfs(const std::string& at, const std::string& options = "mode=0755", unsigned long flags = 0) {
        return Mount("tmpfs", at, "tmpfs", MS_NOSUID | MS_NODEV | MS_STRICTATIME | flags, options);
    }
    /** What is at `from`, and all that is mounted below it. */
    static Mount bind(const std::string& from, const std::string& at) {
        return Mount(from, at, "none", MS_BIND | MS_REC, "");
    }

    ~Mount() {
        if (!target.empty()) {
            umount2(target.c_str(), MNT_DETACH);
        }
    }
    Mount(Mount&& other) noexcept {
        target.swap(other.target);
    }
    Mount& operator=(Mount&&) = delete;

    void unmount() {
        if (umount2(target.c_str(), MNT_DETACH) != 0) {
            throw std::system_error(errno, std::generic_category(), "unmount " + target);
        }
        target.clear();
    }

private:
    Mount(const std::string& source, const std::string& at, const char* type, unsigned long flags,
          const std::string& options)
        : target(at) {
        if (mount(source.c_str(), at.c_str(), type, flags, options.c_str()) != 0) {
            throw std::system_error(errno, std::generic_category(), "mount on " + at);
        }
    }

    std::string target;
};

} // namespace support
