#pragma once

#include <marubackup/export.h>

#ifdef __cplusplus
extern "C" {
#endif

/*
 * The archive version: a counter of 32 bits that the platform keeps for each file
 * and for each file system. A backup application notes it down when it has
 * archived something; a version that is another one later tells it that there is
 * something to archive again. Behind 4294967295 comes 0: compare for being the
 * same, not for being larger.
 *
 * All four functions may be called from several threads at once. None keeps a
 * descriptor open, also where it fails. A path is the caller's, and is not used
 * after the call. `version` must not be null.
 *
 * A failure that the functions find themselves is put into the calling thread's
 * error slot of the platform's library (MLIBCErrGet() and its like) with the place
 * in "maru_archive_version.c":
 *
 *     0x0D00  the path is null; `version` stays as it was
 *     0x0900  the path cannot be opened, errno says why; `version` stays as it was
 *
 * What a file system answers is not put there: see the result, and errno.
 *
 * The functions other than MARUBackupArchVerGet() open the path for reading, with
 * all that comes with it. A link is followed. The caller needs the right to read.
 * A FIFO that nobody has open for writing blocks the call until somebody does, as
 * it blocks open(2); opening a device does whatever that device does when it is
 * opened. So hand in folders and regular files. A signal whose handler was set up
 * without SA_RESTART ends such a wait: the path then counts as one that cannot be
 * opened, with errno EINTR. What comes after the opening blocks for as long as the
 * file system takes to answer.
 */

/**
 * Reads the archive version of the file or folder at `path` itself. A link is
 * looked at itself, not followed; nothing is opened. A file that has none is at 0.
 *
 * Returns 0, with the version in `*version`. Returns -1, with `*version` as it was:
 * `path` is null, which is also reported to syslog at LOG_ERR; or the platform
 * cannot tell, and then its library has filled the error slot.
 */
MARUBACKUP_API int MARUBackupArchVerGet(const char* path, unsigned int* version);

/**
 * Reads the archive version of the file system that `path` is on: any file or
 * folder of it will do. Logs nothing.
 *
 * Returns 0, with the version in `*version`. Returns -1 with `*version` as it was
 * if `path` is null or cannot be opened. Otherwise returns what the file system's
 * ioctl returned, -1 with errno set (ENOTTY: it has no archive version), or, of
 * a strange file system, a positive number; `*version` is then 0.
 */
MARUBACKUP_API int MARUBackupFSArchVerGet(const char* path, unsigned int* version);

/**
 * Increases the archive version of the file system that `path` is on, and reads
 * the new one. These are two requests: when others increase it at the same time,
 * the version that is read may be theirs already. Logs nothing.
 *
 * Returns 0, with the new version in `*version`; of a strange file system, the
 * positive number that its ioctl returned for the reading. Returns -1 with
 * `*version` as it was if `path` is null or cannot be opened, and -1 with 0 in
 * `*version` and errno set if the file system refuses one of the two requests
 * (ENOTTY: it has no archive version). If that was the reading, the version has
 * been increased all the same.
 */
MARUBACKUP_API int MARUBackupFSArchVerIncrease(const char* path, unsigned int* version);

/**
 * Would set the archive version of the file at `path`, which this platform does
 * not support. It is there so that applications link on every platform.
 *
 * Always returns -1, and changes nothing. `path` is opened and closed again: if it
 * is null or can be opened, a line in syslog at LOG_ERR says what is wrong; if it
 * cannot be opened, only the error slot does.
 */
MARUBACKUP_API int MARUBackupFileArchVerSet(const char* path, unsigned int version);

#ifdef __cplusplus
}
#endif
