#pragma once

#include <marucore/export.h>

#ifdef __cplusplus
extern "C" {
#endif

/*
 * The library's error slot: what failed last, and where. Each thread has a slot
 * of its own, which is empty at first. A call that succeeds leaves it alone.
 */

enum {
    MLIBC_ERR_NONE = 0,
    MLIBC_ERR_OPEN = 0x0900,          /**< a file cannot be opened or looked at */
    MLIBC_ERR_EXEC = 0x0A00,          /**< a program cannot be run */
    MLIBC_ERR_KILLED = 0x0A01,        /**< a program was ended by a signal */
    MLIBC_ERR_BAD_FORM = 0x0B00,      /**< a file holds something else than it should */
    MLIBC_ERR_BAD_PARAMETER = 0x0D00, /**< an argument that cannot be meant */
};

/** The code of the calling thread's last failure; MLIBC_ERR_NONE if there was none. */
MARUCORE_API int MLIBCErrGet(void);

/**
 * The source file that reported it; empty, never null, if there was none. The
 * text belongs to the slot: it is the thread's, and changes with the next
 * failure.
 */
MARUCORE_API const char* MLIBCErrorGetFile(void);

/** The line in that file; 0 if there was none. */
MARUCORE_API int MLIBCErrorGetLine(void);

/** Fills the slot. `file` is copied, its first 255 bytes; null counts as empty. */
MARUCORE_API void MLIBCErrSetEx(int code, const char* file, int line);

#ifdef __cplusplus
}
#endif
