#include "tree_removal.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

#include "descriptor.h"

namespace MARU {
namespace Backup {

namespace {

using Names = std::vector<std::string>;

/** Which directory it is, by whatever way it was reached. */
struct Identity {
    std::uint64_t mount = 0; ///< 0 before Linux 5.8, which shows other file systems as mounted, but no bind mounts
    std::uint32_t deviceMajor = 0;
    std::uint32_t deviceMinor = 0;
    std::uint64_t inode = 0;

    bool isOnMountOf(const Identity& other) const {
        return mount == other.mount && deviceMajor == other.deviceMajor && deviceMinor == other.deviceMinor;
    }
    bool operator==(const Identity& other) const {
        return isOnMountOf(other) && inode == other.inode;
    }
};

bool identify(const Descriptor& folder, Identity& identity) {
    struct statx info = {};
    if (statx(folder.get(), "", AT_EMPTY_PATH, STATX_INO | STATX_MNT_ID, &info) != 0) {
        return false;
    }
    identity.mount = (info.stx_mask & STATX_MNT_ID) != 0 ? info.stx_mnt_id : 0;
    identity.deviceMajor = info.stx_dev_major;
    identity.deviceMinor = info.stx_dev_minor;
    identity.inode = info.stx_ino;
    return true;
}

Descriptor openFolder(int parent, const std::string& name) {
    return Descriptor(openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

/** What is in the open directory; all of it at once, since some file systems skip entries when others are removed. */
Names entriesOf(const Descriptor& folder) {
    Names names;
    Descriptor own = openFolder(folder.get(), ".");
    const std::unique_ptr<DIR, int (*)(DIR*)> stream(own.isOpen() ? fdopendir(own.get()) : nullptr, closedir);
    if (!stream) {
        return names;
    }
    own.release(); // closed with the stream
    while (const dirent* entry = readdir(stream.get())) {
        const std::string name(entry->d_name);
        if (name != "." && name != "..") {
            names.push_back(name);
        }
    }
    return names;
}

/** Removes what is no directory from the open one; the names of the directories in it. */
Names removeFiles(const Descriptor& folder) {
    Names folders;
    for (std::string& name : entriesOf(folder)) {
        if (unlinkat(folder.get(), name.c_str(), 0) != 0 && errno == EISDIR) {
            folders.push_back(std::move(name));
        }
    }
    return folders;
}

/** A directory on the way from the top to the one that is being emptied. */
struct Level {
    std::string name;
    Identity identity;
    Names folders; ///< those in it that are still to be removed
};

/**
 * Goes through a tree with one directory open at a time. What is left inside a
 * directory shows when it is removed itself: the kernel keeps it then.
 */
class TreeRemoval {
public:
    /** False if `folder` cannot be used. */
    bool start(int folder) {
        levels.emplace_back();
        current = openFolder(folder, ".");
        return current.isOpen() && identify(current, levels.back().identity);
    }

    /** Whether `name` of the first directory is gone afterwards. */
    bool remove(const std::string& name) {
        if (!descend(name)) {
            return errno == ENOENT;
        }
        bool gone = false;
        while (levels.size() > 1) {
            Names& folders = levels.back().folders;
            if (!folders.empty()) {
                const std::string next = std::move(folders.back());
                folders.pop_back();
                descend(next);
            } else if (!ascend(gone)) {
                return false;
            }
        }
        return gone;
    }

private:
    /** Goes into `name` and removes the files there. False, with errno set, if it is not to be entered. */
    bool descend(const std::string& name) {
        Descriptor child = openFolder(current.get(), name);
        Level level;
        if (!child.isOpen() || !identify(child, level.identity)) {
            return false;
        }
        if (!level.identity.isOnMountOf(levels.back().identity)) {
            errno = EXDEV;
            return false;
        }
        level.name = name;
        level.folders = removeFiles(child);
        levels.push_back(std::move(level));
        current = std::move(child);
        return true;
    }

    /**
     * Goes back up and removes the directory that it comes from. False if that
     * was moved meanwhile: up there is somebody else's place then.
     */
    bool ascend(bool& gone) {
        Descriptor parent = openFolder(current.get(), "..");
        Identity identity;
        if (!parent.isOpen() || !identify(parent, identity) || !(identity == levels[levels.size() - 2].identity)) {
            return false;
        }
        gone = unlinkat(parent.get(), levels.back().name.c_str(), AT_REMOVEDIR) == 0 || errno == ENOENT;
        levels.pop_back();
        current = std::move(parent);
        return true;
    }

    std::vector<Level> levels; ///< the first is where the tree stands
    Descriptor current;        ///< the last level's directory
};

} // namespace

bool removeTree(int folder, const std::string& name) {
    TreeRemoval removal;
    return removal.start(folder) && removal.remove(name);
}

} // namespace Backup
} // namespace MARU
