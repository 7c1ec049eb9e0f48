#include <marucore/file_stat.h>

#include <sys/xattr.h>

#include <cerrno>
#include <charconv>
#include <cstddef>
#include <system_error>

#include <marucore/error.h>

static_assert(sizeof(MLIBCFileStat) == 120, "its callers were built for this size");
static_assert(offsetof(MLIBCFileStat, archiveVersion) == 112, "its callers look there");

namespace {

const char* const UNIT = "file_stat.cpp";
const char ATTRIBUTE[] = "user.maru.archive_version";
const std::size_t MAX_DIGITS = 10;
const int FAILED = -1;

bool isAbsence(int error) {
    return error == ENODATA || error == EOPNOTSUPP;
}

} // namespace

int MLIBCFileLStat(const char* path, int /*flags*/, MLIBCFileStat* record) {
    if (!path || !record) {
        MLIBCErrSetEx(MLIBC_ERR_BAD_PARAMETER, UNIT, __LINE__);
        return FAILED;
    }
    char text[MAX_DIGITS];
    const ssize_t size = lgetxattr(path, ATTRIBUTE, text, sizeof text);
    if (size < 0 && isAbsence(errno)) {
        record->archiveVersion = 0;
        return 0;
    }
    if (size < 0 && errno != ERANGE) {
        MLIBCErrSetEx(MLIBC_ERR_OPEN, UNIT, __LINE__);
        return FAILED;
    }
    uint32_t version = 0;
    const char* const end = text + (size < 0 ? 0 : size);
    const std::from_chars_result result = std::from_chars(text, end, version);
    if (result.ec != std::errc() || result.ptr != end) {
        MLIBCErrSetEx(MLIBC_ERR_BAD_FORM, UNIT, __LINE__);
        return FAILED;
    }
    record->archiveVersion = version;
    return 0;
}
