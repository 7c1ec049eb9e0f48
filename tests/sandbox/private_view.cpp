#include "private_view.h"

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "setup_error.h"

namespace fs = std::filesystem;

namespace {

const char* const DEVICES[] = {"null", "zero", "full", "random", "urandom", "tty", "fuse", "shm"};

void keepMountsFromTheHost() {
    check(mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), "make the mounts private");
}

void mountTmpfs(const std::string& path) {
    check(mount("tmpfs", path.c_str(), "tmpfs", MS_NOSUID | MS_NODEV, "mode=0755"), "mount a tmpfs on ", path);
}

/** Makes a folder with exactly `mode`. One that is there is left alone: it may be the host's. */
void makeFolder(const std::string& path, mode_t mode = 0755) {
    if (mkdir(path.c_str(), mode) == 0) {
        check(chmod(path.c_str(), mode), "chmod ", path);
    } else if (errno != EEXIST) {
        check(-1, "make the folder ", path);
    }
}

void makeFile(const std::string& path) {
    close(check(open(path.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC, 0600), "make the file ", path));
}

/** Makes `name` of the working folder appear in `folder`. */
void bindEntry(const fs::path& name, const fs::path& folder) {
    const fs::path target = folder / name;
    if (fs::is_symlink(name)) {
        fs::copy_symlink(name, target);
        return;
    }
    if (fs::is_directory(name)) {
        makeFolder(target);
    } else {
        makeFile(target);
    }
    // A user namespace binds nothing without the mounts below it.
    check(mount(name.c_str(), target.c_str(), nullptr, MS_BIND | MS_REC, nullptr), "bind ", target);
}

/** Covers `folder` with a tmpfs; what it covers is then reached as the working folder. */
void coverFolder(const std::string& folder) {
    check(chdir(folder.c_str()), "enter ", folder);
    mountTmpfs(folder);
}

/**
 * Replaces `folder` by a tmpfs with the same entries, so that others can be made
 * beside them. An overlay asks more of the kernel, and would hide what the host
 * has mounted below the folder.
 */
void openFolder(const std::string& folder) {
    makeFolder(folder);
    coverFolder(folder);
    for (const fs::directory_entry& entry : fs::directory_iterator(".")) {
        bindEntry(entry.path().filename(), folder);
    }
}

void mountProc() {
    check(mount("proc", "/proc", "proc", MS_NOSUID | MS_NODEV | MS_NOEXEC, nullptr), "mount a new /proc");
}

void mountRun() {
    mountTmpfs("/run");
    makeFolder("/run/lock", 01777);
    makeFolder("/run/tmp", 01777);
}

/** Of what the host's /tmp holds there is only what `workingFolder` stands in, if it stands there. */
void mountTmp(const fs::path& workingFolder) {
    const fs::path inside = workingFolder.lexically_relative("/tmp");
    coverFolder("/tmp");
    check(chmod("/tmp", 01777), "chmod /tmp");
    if (!inside.empty() && *inside.begin() != ".." && *inside.begin() != ".") {
        bindEntry(*inside.begin(), "/tmp");
    }
}

/** A terminal made inside is made here: the host's devpts often lets only the host's root make one. */
void mountPts() {
    makeFolder("/dev/pts");
    check(mount("devpts", "/dev/pts", "devpts", MS_NOSUID | MS_NOEXEC, "newinstance,ptmxmode=0666,mode=0620,gid=5"),
          "mount a devpts on /dev/pts");
    fs::create_symlink("pts/ptmx", "/dev/ptmx");
}

void mountDev() {
    coverFolder("/dev");
    for (const char* device : DEVICES) {
        if (fs::exists(fs::symlink_status(device))) {
            bindEntry(device, "/dev");
        }
    }
    mountPts();
    fs::create_symlink("/proc/self/fd", "/dev/fd");
    fs::create_symlink("/proc/self/fd/0", "/dev/stdin");
    fs::create_symlink("/proc/self/fd/1", "/dev/stdout");
    fs::create_symlink("/proc/self/fd/2", "/dev/stderr");
}

/** The product's folders in /usr. They need not be on the host, where they are never made. */
void mountProductFolders() {
    openFolder("/usr");
    makeFolder("/usr/maru");
    mountTmpfs("/usr/maru");
    makeFolder("/usr/maru/sbin");
    makeFolder("/usr/maru/share");
    makeFolder("/usr/maru/share/marubackup");

    openFolder("/usr/local");
    openFolder("/usr/local/share");
    makeFolder("/usr/local/share/marubackup");
    mountTmpfs("/usr/local/share/marubackup");
}

} // namespace

void makePrivateView() {
    const fs::path workingFolder = fs::current_path();
    keepMountsFromTheHost();
    mountProc();
    mountRun();
    mountTmp(workingFolder);
    mountDev();
    mountProductFolders();
    check(chdir(workingFolder.c_str()), "stay, inside, in ", workingFolder);
}
