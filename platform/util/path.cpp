#include <marubackup-util/path.h>

namespace MARU {
namespace Backup {

std::string Path::join(const std::string& folder, const std::string& name) {
    if (folder.empty() || name.empty()) {
        return folder + name;
    }
    const std::size_t folderEnd = folder.find_last_not_of('/') + 1; // 0 if all of it is slashes
    const std::size_t nameStart = name.find_first_not_of('/');
    const std::string rest = nameStart == std::string::npos ? std::string() : name.substr(nameStart);
    return folder.substr(0, folderEnd) + '/' + rest;
}

} // namespace Backup
} // namespace MARU
