#define _POSIX_C_SOURCE 200809L // for O_CLOEXEC

#include <marubackup/maru_archive_version.h>

#include <errno.h>
#include <fcntl.h>
#include <stddef.h>
#include <stdint.h>
#include <sys/ioctl.h>
#include <syslog.h>
#include <unistd.h>

#include <marucore/error.h>
#include <marucore/file_stat.h>

// The host's library may be another than the one that this was built with.
_Static_assert(sizeof(MLIBCFileStat) == 120, "the library fills as many bytes");
_Static_assert(offsetof(MLIBCFileStat, archiveVersion) == 112, "the library puts the version there");

// The requests have these values on every machine: file systems know them as the
// appliance's own processor encodes them, so this machine's _IO macros, which may
// encode otherwise, have no part in them.
static const unsigned long GET_ARCHIVE_VERSION = 0xC0047879;
static const unsigned long INCREASE_ARCHIVE_VERSION = 0x2000787B;

static const int FAILED = -1;

#define LOG_UNIT "maru_archive_version"
#define LOG_PLAIN_ERR(text) syslog(LOG_ERR, "%s:%d " text, LOG_UNIT, __LINE__)
#define SET_ERROR(code) MLIBCErrSetEx(code, LOG_UNIT ".c", __LINE__)

/** A descriptor; negative, with the error slot filled, if there is none (errno says why the path has none). */
static int openForRequests(const char* path) {
    if (path == NULL) {
        SET_ERROR(MLIBC_ERR_BAD_PARAMETER);
        return FAILED;
    }
    // Without O_CLOEXEC a program that another thread starts meanwhile would
    // inherit the descriptor, and hold the file system busy.
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        const int error = errno;
        SET_ERROR(MLIBC_ERR_OPEN);
        errno = error;
    }
    return fd;
}

/** Leaves errno to what failed before. */
static void closeAfterRequests(int fd) {
    const int error = errno;
    close(fd);
    errno = error;
}

int MARUBackupArchVerGet(const char* path, unsigned int* version) {
    if (path == NULL) {
        LOG_PLAIN_ERR("Input bad parameter.");
        SET_ERROR(MLIBC_ERR_BAD_PARAMETER);
        return FAILED;
    }
    MLIBCFileStat record = {0};
    if (MLIBCFileLStat(path, MLIBC_FILE_STAT_ALL, &record) < 0) {
        return FAILED;
    }
    *version = record.archiveVersion;
    return 0;
}

int MARUBackupFSArchVerGet(const char* path, unsigned int* version) {
    const int fd = openForRequests(path);
    if (fd < 0) {
        return FAILED;
    }
    uint32_t value = 0;
    const int result = ioctl(fd, GET_ARCHIVE_VERSION, &value);
    *version = result == 0 ? value : 0;
    closeAfterRequests(fd);
    return result;
}

int MARUBackupFSArchVerIncrease(const char* path, unsigned int* version) {
    const int fd = openForRequests(path);
    if (fd < 0) {
        return FAILED;
    }
    uint32_t value = 0;
    int result = ioctl(fd, INCREASE_ARCHIVE_VERSION, NULL);
    if (result >= 0) {
        result = ioctl(fd, GET_ARCHIVE_VERSION, &value);
    }
    *version = result >= 0 ? value : 0;
    closeAfterRequests(fd);
    return result;
}

int MARUBackupFileArchVerSet(const char* path, unsigned int version) {
    (void)version; // this platform has no use for it
    if (path == NULL) {
        LOG_PLAIN_ERR("Input bad parameter.");
    }
    const int fd = openForRequests(path);
    if (fd < 0) {
        return FAILED;
    }
    LOG_PLAIN_ERR("Not support the command in the platform.");
    closeAfterRequests(fd);
    return FAILED;
}
