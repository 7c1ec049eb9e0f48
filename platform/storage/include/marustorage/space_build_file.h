#pragma once

#include <marustorage/export.h>

#ifdef __cplusplus
extern "C" {
#endif

/** A storage space that is being built. What it holds is the library's own. */
typedef struct MARUSpaceBuildFile MARUSpaceBuildFile;

/**
 * Tells whether a storage space is being built, which is as long as the file
 * "/var/run/maruspacebuild" exists, whatever it holds.
 *
 * Returns 0 with a new record in *obj, which the caller frees by
 * MARUSpaceBuildFileObjFree(); 0 with null in it if none is being built.
 * Negative, with null in it, if that cannot be told: something that is no file
 * stands there, it may not be read, or there is no memory. Negative also for a
 * null `obj`. Does not block, and may be called from several threads at once.
 */
MARUSTORAGE_API int MARUSpaceBuildFileGet(MARUSpaceBuildFile** obj);

/** Frees a record; null is allowed. */
MARUSTORAGE_API void MARUSpaceBuildFileObjFree(MARUSpaceBuildFile* obj);

#ifdef __cplusplus
}
#endif
