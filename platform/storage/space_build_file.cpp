#include <marustorage/space_build_file.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <new>

struct MARUSpaceBuildFile {};

namespace {

const char SPACE_BUILD_FILE[] = "/var/run/maruspacebuild";
const int FAILED = -1;

} // namespace

int MARUSpaceBuildFileGet(MARUSpaceBuildFile** obj) {
    if (!obj) {
        return FAILED;
    }
    *obj = nullptr;
    // Anything may stand there; a FIFO must not make us wait for its writer.
    const int fd = open(SPACE_BUILD_FILE, O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
    if (fd < 0) {
        return errno == ENOENT ? 0 : FAILED;
    }
    struct stat info = {};
    const bool isFile = fstat(fd, &info) == 0 && S_ISREG(info.st_mode);
    close(fd);
    if (isFile) {
        *obj = new (std::nothrow) MARUSpaceBuildFile;
    }
    return *obj ? 0 : FAILED;
}

void MARUSpaceBuildFileObjFree(MARUSpaceBuildFile* obj) {
    delete obj;
}
