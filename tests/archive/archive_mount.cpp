#include "archive_mount.h"

#include <fcntl.h>
#include <sys/mount.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <sstream>
#include <stdexcept>
#include <system_error>

#include "archive_version.h"
#include "support/emulation.h"
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

/** Why the machine lets nobody here mount a file system in FUSE on `folder`; empty if it does. */
std::string whyNotAllowed(const std::string& folder) {
    const int device = open("/dev/fuse", O_RDWR | O_CLOEXEC);
    if (device < 0) {
        return "/dev/fuse: " + std::generic_category().message(errno);
    }
    // With nobody behind it yet: only whether it may be is asked.
    const std::string options = "fd=" + std::to_string(device) + ",rootmode=40000,user_id=0,group_id=0";
    const bool mounted = mount("fuse", folder.c_str(), "fuse", MS_NOSUID | MS_NODEV, options.c_str()) == 0;
    const std::string reason = mounted ? "" : "mount: " + std::generic_category().message(errno);
    close(device);
    if (mounted) {
        umount2(folder.c_str(), MNT_DETACH);
    }
    return reason;
}

} // namespace

std::unique_ptr<ArchiveMount> ArchiveMount::make(std::string& reason) {
    std::unique_ptr<ArchiveMount> mount(new ArchiveMount);
    if (support::isEmulated()) {
        setenv("LD_PRELOAD", ARCHIVE_VERSION_SERVED_BY, 1);
        mount->makeFolder();
        return mount;
    }
    const std::string refusal = whyNotAllowed(mount->path());
    if (!refusal.empty()) {
        reason = "no FUSE here: " + refusal;
        return nullptr;
    }
    const std::string said = mount->start();
    if (said != "mounted") {
        throw std::runtime_error("the file system does not come up: " + said);
    }
    return mount;
}

std::string ArchiveMount::start() {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) {
        throw std::system_error(errno, std::generic_category(), "pipe2");
    }
    server = support::startInChild([&]() {
        dup2(ends[1], STDOUT_FILENO);
        dup2(ends[1], STDERR_FILENO);
        execl(ARCHIVE_VERSION_SERVED_BY, ARCHIVE_VERSION_SERVED_BY, "-f", "-s", path().c_str(), nullptr);
        return 126;
    });
    close(ends[1]);
    const std::string said = readLine(ends[0]);
    close(ends[0]);
    return said;
}

void ArchiveMount::makeFolder() const {
    support::writeFile(path("control"), ArchiveVersion().settings());
    support::writeFile(path("file"), "");
    std::filesystem::create_directory(path("folder"));
}

ArchiveMount::~ArchiveMount() {
    if (server < 0) {
        return;
    }
    umount2(path().c_str(), MNT_DETACH);
    // By itself it ends only when nobody has a file of it open any more.
    kill(server, SIGKILL);
    support::waitForChild(server);
}

std::uint32_t ArchiveMount::version() const {
    std::istringstream settings(support::readFile(path("control")));
    std::uint32_t version = 0;
    std::int64_t number = 0;
    for (std::string name; settings >> name >> number;) {
        version = name == "version" ? static_cast<std::uint32_t>(number) : version;
    }
    return version;
}

void ArchiveMount::set(const std::string& name, std::int64_t number) const {
    const std::string line = name + " " + std::to_string(number) + "\n";
    // Of lines for one thing the last counts.
    const std::string earlier = server < 0 ? support::readFile(path("control")) : "";
    support::writeFile(path("control"), earlier + line);
}
