/* The library's plain C interface.
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

/* The functions of this interface are declared here as they are added to the library. */

#ifdef __cplusplus
} /* extern "C" */
#endif

#endif /* FILEINDEX_FILEINDEX_C_H_ */
