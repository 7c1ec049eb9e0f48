#pragma once

#include <marucore/export.h>

#ifdef __cplusplus
extern "C" {
#endif

/**
 * Runs the program at `path` (a file's path: no PATH, no shell) and waits until
 * it has ended, whatever signals arrive meanwhile and without a time-out. The
 * arguments that follow are strings, up to the first null pointer; the program
 * gets `path` as its name before them.
 *
 * It starts with default signal dispositions, an empty signal mask, and no open
 * descriptor but 0, 1 and 2. Environment, folder and process group are the
 * caller's.
 *
 * Returns its exit status, 0 to 255. Negative, with the error slot filled: it
 * cannot be run (MLIBC_ERR_EXEC), was ended by a signal (MLIBC_ERR_KILLED), or
 * `path` is null or empty (MLIBC_ERR_BAD_PARAMETER). Also MLIBC_ERR_EXEC, after
 * the program's end, if the caller ignores SIGCHLD or waits for any child in
 * another thread: its exit status is then lost.
 *
 * May be called from several threads at once.
 */
MARUCORE_API int MLIBCExec(const char* path, ...) __attribute__((sentinel));

#ifdef __cplusplus
}
#endif
