#include <marubackup-util/temp_manager.h>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <memory>

#include "temp_areas.h"

namespace MARU {
namespace Backup {

namespace {

const std::string VOLUME_PREFIX = "/volume";
const std::size_t MAX_NUMBER_LENGTH = 9;

bool isVolumeName(const std::string& path) {
    const std::size_t start = VOLUME_PREFIX.size();
    return path.compare(0, start, VOLUME_PREFIX) == 0 && path.size() > start &&
           path.size() <= start + MAX_NUMBER_LENGTH && path.find_first_not_of("0123456789", start) == std::string::npos;
}

/** Whether another file system than the root's is mounted there. */
bool isMounted(const std::string& path) {
    struct stat root = {};
    struct stat info = {};
    return stat("/", &root) == 0 && lstat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode) &&
           info.st_dev != root.st_dev;
}

bool isWritable(const std::string& path) {
    return faccessat(AT_FDCWD, path.c_str(), W_OK | X_OK, AT_EACCESS) == 0;
}

int numberOf(const Volume& volume) {
    return std::stoi(volume.path.substr(VOLUME_PREFIX.size()));
}

class MostFreeSpace : public FilterVolume {
public:
    std::string choose(const std::vector<Volume>& volumes) const override {
        const auto best = std::max_element(volumes.begin(), volumes.end(), [](const Volume& one, const Volume& other) {
            return one.freeBytes < other.freeBytes;
        });
        return best == volumes.end() ? std::string() : best->path;
    }
};

} // namespace

bool isArea(const std::string& path) {
    return path == DEFAULT_AREA || isVolumeName(path);
}

bool isAreaPresent(const std::string& path) {
    return path == DEFAULT_AREA || (isVolumeName(path) && isMounted(path));
}

std::vector<Volume> writableVolumes() {
    std::vector<Volume> volumes;
    const std::unique_ptr<DIR, int (*)(DIR*)> root(opendir("/"), closedir);
    while (const dirent* entry = root ? readdir(root.get()) : nullptr) {
        const std::string path = "/" + std::string(entry->d_name);
        struct statvfs info = {};
        if (isVolumeName(path) && isMounted(path) && isWritable(path) && statvfs(path.c_str(), &info) == 0) {
            volumes.push_back({path, std::uint64_t(info.f_bavail) * info.f_frsize});
        }
    }
    std::sort(volumes.begin(), volumes.end(),
              [](const Volume& one, const Volume& other) { return numberOf(one) < numberOf(other); });
    return volumes;
}

FilterVolume::~FilterVolume() = default;

boost::shared_ptr<FilterVolume> TempManager::maxVolume() {
    return boost::shared_ptr<FilterVolume>(new MostFreeSpace);
}

} // namespace Backup
} // namespace MARU
