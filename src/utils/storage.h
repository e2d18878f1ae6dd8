// The storage locations of a share's index data, for the library's own callers, and the one way
// the library opens, creates and removes anything there.
//
// A share's metadata directory lies in space that the share's users can write to, while the
// library runs with root's rights: a symbolic link planted there must never carry an open, a
// mkdir or a removal outside the share. The share's own full path comes from the platform and is
// trusted; every component below it is walked with openat and O_NOFOLLOW. Nothing here logs;
// on failure errno says why (ELOOP for a link in the way). Reentrant.
#ifndef FILEINDEX_SRC_UTILS_STORAGE_H_
#define FILEINDEX_SRC_UTILS_STORAGE_H_

#include <sys/types.h>

#include <string>

#include "layout.h"  // the names of the places below a share
#include "unique_fd.h"

namespace WEZO {
namespace FILEINDEX {

// The mode the database directory is given, whatever the umask: only the daemon, as root,
// writes in it.
constexpr mode_t kDatabaseMode = 0755;

// How many directory levels RemoveLocation descends at most; each level holds a descriptor.
constexpr int kMaxRemovalDepth = 64;

// Stores in `out` the full path of the event queue of the share `share` (FILEIDXQueuePathGet,
// which logs its own failures). Returns false, `out` untouched, when the share is unknown; the
// caller writes the line that says what the failure meant to it.
bool ShareQueuePath(const std::string& share, std::string& out);

// Opens the directory that holds `location` and stores the location's last component in
// `name`. `location` is a place in a share's metadata directory as the path getters build it
// ("<share>/@eaDir/<name>"): the share's path is opened as given, "@eaDir" without following a
// link. A location whose directory is not a metadata directory (a test's file) has its whole
// directory trusted. Returns an invalid descriptor, errno set, on failure.
UniqueFd OpenLocationDir(const std::string& location, std::string& name);

// Opens the file at `location` (as for OpenLocationDir) with `flags`, creating it with `mode`
// when `flags` holds O_CREAT. Never follows a link (ELOOP), never blocks on a FIFO, and refuses
// whatever is not a regular file: a directory (EISDIR), a FIFO, socket or device (ENXIO). The
// descriptor is close-on-exec and non-blocking.
UniqueFd OpenLocationFile(const std::string& location, int flags, mode_t mode = 0);

// True when `location` (as for OpenLocationDir) is a regular file, reached without following a
// link. Sets errno when it is not.
bool LocationFileExists(const std::string& location);

// Removes `location` (as for OpenLocationDir), a directory with everything below it. A link
// anywhere is removed itself, never what it points to. True when nothing is left, also when
// nothing was there; false, errno set, when something could not be removed or a tree is
// deeper than kMaxRemovalDepth levels (ENAMETOOLONG).
bool RemoveLocation(const std::string& location);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_STORAGE_H_
