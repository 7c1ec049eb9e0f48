// Preloaded where an emulator answers requests to file systems itself: answers the two
// requests for a folder that has a file "control" with the settings of an archive version,
// and for what is in it, as a file system with one does.

#include <fcntl.h>
#include <limits.h>
#include <sys/file.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdint>
#include <sstream>
#include <string>

#include "archive_version.h"

namespace {

std::string pathOf(int fd) {
    char path[PATH_MAX] = "";
    const ssize_t length = readlink(("/proc/self/fd/" + std::to_string(fd)).c_str(), path, sizeof path);
    return std::string(path, length > 0 ? static_cast<std::size_t>(length) : 0);
}

/** The control file beside or in what `fd` is; negative if there is none. */
int openControl(int fd) {
    const std::string path = pathOf(fd);
    for (const std::string& folder : {path, path.substr(0, path.rfind('/'))}) {
        const int control = open((folder + "/control").c_str(), O_RDWR | O_CLOEXEC);
        if (control >= 0) {
            return control;
        }
    }
    return -1;
}

std::string readAll(int fd) {
    char text[1024] = "";
    const ssize_t length = pread(fd, text, sizeof text, 0);
    return std::string(text, length > 0 ? static_cast<std::size_t>(length) : 0);
}

int answerFromControl(int control, std::uint32_t request, void* data) {
    // Until it is closed nobody else answers.
    if (flock(control, LOCK_EX) != 0) {
        return -errno;
    }
    ArchiveVersion archive;
    std::istringstream lines(readAll(control));
    for (std::string line; std::getline(lines, line);) {
        archive.set(line);
    }
    const int result = archive.answer(request, data);
    const std::string settings = archive.settings();
    if (ftruncate(control, 0) != 0 || pwrite(control, settings.data(), settings.size(), 0) < 0) {
        return -errno;
    }
    return result;
}

} // namespace

extern "C" __attribute__((visibility("default"))) int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list arguments;
    va_start(arguments, request);
    void* const data = va_arg(arguments, void*);
    va_end(arguments);

    if (request != ArchiveVersion::GET && request != ArchiveVersion::INCREASE) {
        return static_cast<int>(syscall(SYS_ioctl, fd, request, data));
    }
    const int control = openControl(fd);
    const int result = control < 0 ? -ENOTTY
                                   : answerFromControl(control, static_cast<std::uint32_t>(request),
                                                       request == ArchiveVersion::GET ? data : nullptr);
    if (control >= 0) {
        close(control);
    }
    if (result < 0) {
        errno = -result;
        return -1;
    }
    return result;
}
