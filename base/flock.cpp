#include "flock.h"

#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <utility>

namespace WEZO {
namespace FILEINDEX {

FlockResult FlockRetrying(const std::function<UniqueFd()>& open, int operation, UniqueFd& locked) {
  locked.Close();
  for (int attempt = 1;; ++attempt) {
    UniqueFd fd = open();
    if (!fd) {
      return FlockResult::kOpenFailed;
    }
    if (flock(fd.get(), operation | LOCK_NB) == 0) {
      locked = std::move(fd);
      return FlockResult::kLocked;
    }
    const int reason = errno;
    fd.Close();
    errno = reason;
    if (reason != EINTR && reason != EWOULDBLOCK) {
      return FlockResult::kFailed;
    }
    if (attempt == kFlockAttempts) {
      return FlockResult::kBusy;
    }
    usleep(static_cast<useconds_t>(rand() % 10) * 1000);  // NOLINT(cert-msc30-c,cert-msc50-cpp)
  }
}

}  // namespace FILEINDEX
}  // namespace WEZO
