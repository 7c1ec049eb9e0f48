#include "archive_mount.h"

#include <sys/mount.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <sstream>
#include <system_error>

#include "support/files.h"
#include "support/in_child.h"

namespace {

/** The first line that comes out of `fd`, or all if none is whole. */
std::string readLine(int fd) {
    std::string text;
    char byte = 0;
    while (read(fd, &byte, 1) == 1 && byte != '\n') {
        text += byte;
    }
    return text;
}

} // namespace

std::unique_ptr<ArchiveMount> ArchiveMount::make(std::string& reason) {
    std::unique_ptr<ArchiveMount> mount(new ArchiveMount);
    const std::string said = mount->start();
    if (said == "mounted") {
        return mount;
    }
    reason = "no file system can be mounted here: " + said;
    return nullptr;
}

std::string ArchiveMount::start() {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) {
        throw std::system_error(errno, std::generic_category(), "pipe2");
    }
    server = support::startInChild([&]() {
        dup2(ends[1], STDOUT_FILENO);
        dup2(ends[1], STDERR_FILENO);
        execl(ARCHIVE_VERSION_FS, ARCHIVE_VERSION_FS, "-f", "-s", path().c_str(), nullptr);
        return 126;
    });
    close(ends[1]);
    const std::string said = readLine(ends[0]);
    close(ends[0]);
    return said;
}

ArchiveMount::~ArchiveMount() {
    umount2(path().c_str(), MNT_DETACH);
    // By itself it ends only when nobody has a file of it open any more.
    kill(server, SIGKILL);
    support::waitForChild(server);
}

std::uint32_t ArchiveMount::version() const {
    std::istringstream settings(support::readFile(path("control")));
    std::string name;
    std::uint32_t version = 0;
    settings >> name >> version;
    return version;
}

void ArchiveMount::set(const std::string& name, std::int64_t number) const {
    support::writeFile(path("control"), name + " " + std::to_string(number));
}
