/** \file
 * The library's plain C interface.
 *
 * Programs that only need the storage locations of a share's index data, or to ask whether a
 * path or a share is indexed, use these functions; everything else is in the class interface
 * (fileindex/fileindex.h). All names carry the prefix FILEIDX. The header compiles as C99 and as
 * C++. The functions are safe to call from any process; they are not meant for several threads
 * at once.
 */
#ifndef FILEINDEX_FILEINDEX_C_H_
#define FILEINDEX_FILEINDEX_C_H_

#include "fileindex/export.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Where the share named szName keeps its event queue: writes the queue file's full path
 * ("<share path>/@eaDir/WEZO@file_index_queue") into szOutQueuePath, creating the share's
 * metadata directory "@eaDir" when it is missing (the queue file itself is not created). The
 * output is cut to cbOutLen bytes, terminating zero included, as snprintf cuts it.
 * Returns the length of what was written (strlen of the output) on success. Returns -1 when
 * szName or szOutQueuePath is null or cbOutLen is not positive (the platform's last error is then
 * 0xD00) or when no share has that name. A metadata directory that cannot be created is logged
 * and does not fail the call. */
FILEINDEX_EXPORT int FILEIDXQueuePathGet(const char* szName, char* szOutQueuePath, int cbOutLen);

/** Where the share named szName keeps its index database: writes the database directory's full
 * path ("<share path>/@eaDir/WEZO@.fileindexdb") into szOutDBPath and creates the directory
 * with mode 0755, whatever the process umask, when it is missing (an existing one loses any
 * group or world write bit). A symbolic link in the place of "@eaDir" or of the directory is not
 * followed: the directory then counts as one that cannot be created. Results, truncation and
 * failures as FILEIDXQueuePathGet; a directory that cannot be created is logged and does not
 * fail the call. */
FILEINDEX_EXPORT int FILEIDXDBPathGet(const char* szName, char* szOutDBPath, int cbOutLen);

/* The questions whether something is indexed. Each reads the folder list afresh and answers 1 or
 * 0, never anything else; a folder list that cannot be read, and a null argument, give 0. Paths
 * are compared byte for byte with "/" as the boundary: "/photo/2019" lies in the indexed folder
 * "/photo", "/photos" and "/photo/" do not. None of them logs or changes the last error code. */

/** 1 when the full path fullPath ("/volume1/photo/2019") is an indexed folder or lies in one. */
FILEINDEX_EXPORT int FILEIDXIsFullPathIndexed(const char* fullPath);

/** 1 when the share path path ("/photo/2019") is an indexed folder or lies in one. */
FILEINDEX_EXPORT int FILEIDXIsPathIndexed(const char* path);

/** 1 when at least one indexed folder lies in the share named shareName ("photo"). */
FILEINDEX_EXPORT int FILEIDXIsShareIndexed(const char* shareName);

#ifdef __cplusplus
} /* extern "C" */
#endif

#endif /* FILEINDEX_FILEINDEX_C_H_ */
