// The one way the library takes an advisory flock that others hold only briefly: without
// blocking, a few times, with a short random sleep in between. Nothing here logs; the caller
// decides what a lock it did not get means and writes the line. Reentrant.
#ifndef FILEINDEX_BASE_FLOCK_H_
#define FILEINDEX_BASE_FLOCK_H_

#include <functional>

#include "unique_fd.h"

namespace WEZO {
namespace FILEINDEX {

// How many times a busy lock is tried in all.
inline constexpr int kFlockAttempts = 3;

enum class FlockResult {
  kLocked,      // the descriptor holds the lock
  kOpenFailed,  // `open` gave no descriptor
  kFailed,      // flock failed for another reason than a busy lock
  kBusy,        // every attempt found the lock busy
};

// Opens the file with `open` and takes the flock `operation` (LOCK_SH or LOCK_EX; LOCK_NB is
// added) on it. A busy lock (EWOULDBLOCK, or EINTR) closes the descriptor, sleeps 0 to 9 ms and
// opens the file again, kFlockAttempts times in all: a lock file may be replaced while we wait.
// On kLocked, `locked` holds the descriptor; otherwise it is invalid and errno is that of the
// failed open or the last flock.
FlockResult FlockRetrying(const std::function<UniqueFd()>& open, int operation, UniqueFd& locked);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_BASE_FLOCK_H_
