#pragma once

#include <stdint.h>

#include <marucore/export.h>

#ifdef __cplusplus
extern "C" {
#endif

/** What the system knows of a file: 30 words, 120 bytes. */
typedef struct MLIBCFileStat {
    uint32_t reserved[28];
    uint32_t archiveVersion; /**< at byte 112; 0 for a file that has none */
    uint32_t reservedToo;
} MLIBCFileStat;

/** All fields. */
#define MLIBC_FILE_STAT_ALL 0xF

/**
 * Fills `record` for the file at `path`; a link is looked at itself, not what it
 * leads to. `flags` says which fields the caller wants, MLIBC_FILE_STAT_ALL for
 * all. This implementation knows the archive version alone, which it fills
 * whatever the flags, and leaves the other words as they are.
 *
 * The archive version is kept in the file's extended attribute
 * "user.maru.archive_version", as a decimal number of up to 32 bits. A file
 * without the attribute, and one on a file system that has none, is at 0.
 *
 * Returns 0. Negative, with the error slot filled and `record` untouched: the
 * file cannot be looked at (MLIBC_ERR_OPEN), its attribute is not of that form
 * (MLIBC_ERR_BAD_FORM), or a pointer is null (MLIBC_ERR_BAD_PARAMETER).
 */
MARUCORE_API int MLIBCFileLStat(const char* path, int flags, MLIBCFileStat* record);

#ifdef __cplusplus
}
#endif
