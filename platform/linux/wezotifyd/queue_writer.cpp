#include "queue_writer.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "file_io.h"
#include "unique_fd.h"

namespace WEZO {
namespace WEZOTIFYD {
namespace {

using FILEINDEX::UniqueFd;

// The indexing daemon and the library hold a queue's lock for one write at a time; a lock that
// stays busy this long belongs to a stuck process, and the caller flags the share instead.
constexpr int kLockAttempts = 200;
constexpr useconds_t kLockPause = 5000;

// Opens `dir`/`name` relative to `at` without following a link in the last component.
UniqueFd OpenNoFollow(int at, const std::string& name, int flags, mode_t mode = 0) {
  return UniqueFd(openat(at, name.c_str(), flags | O_NOFOLLOW | O_CLOEXEC, mode));
}

// The queue's own file, opened for reading and appending. Only the last two components (the
// metadata folder and the queue) lie in a place that users can write to; the share above them
// is the administrator's.
UniqueFd OpenQueue(const std::string& queuePath) {
  const size_t slash = queuePath.rfind('/');
  if (slash == std::string::npos || slash == 0 || slash + 1 == queuePath.size()) {
    errno = EINVAL;
    return UniqueFd();
  }
  const std::string folder = queuePath.substr(0, slash);
  const size_t folderSlash = folder.rfind('/');
  const std::string share = folderSlash == 0 ? "/" : folder.substr(0, folderSlash);
  const UniqueFd shareFd(open(share.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!shareFd) {
    return UniqueFd();
  }
  const UniqueFd folderFd =
      OpenNoFollow(shareFd.get(), folder.substr(folderSlash + 1), O_RDONLY | O_DIRECTORY);
  if (!folderFd) {
    return UniqueFd();
  }
  UniqueFd fd = OpenNoFollow(folderFd.get(), queuePath.substr(slash + 1),
                             O_RDWR | O_CREAT | O_APPEND | O_NONBLOCK, 0644);
  struct stat st {};
  if (fd && (fstat(fd.get(), &st) != 0 || !S_ISREG(st.st_mode))) {
    fd.Close();
    errno = ENXIO;
  }
  return fd;
}

bool Lock(int fd) {
  for (int attempt = 0; attempt < kLockAttempts; ++attempt) {
    if (flock(fd, LOCK_EX | LOCK_NB) == 0) {
      return true;
    }
    if (errno != EINTR && errno != EWOULDBLOCK) {
      return false;
    }
    usleep(kLockPause);
  }
  return false;
}

}  // namespace

AppendResult AppendLines(const std::string& queuePath, const std::vector<std::string>& lines) {
  UniqueFd fd;
  for (int attempt = 0;; ++attempt) {
    fd = OpenQueue(queuePath);
    if (!fd) {
      return AppendResult::kRefused;
    }
    if (!Lock(fd.get())) {
      return AppendResult::kLost;
    }
    // The daemon takes a queue by removing it under the lock; lines written to the file it took
    // would never be read.
    struct stat st {};
    if (fstat(fd.get(), &st) == 0 && st.st_nlink > 0) {
      break;
    }
    if (attempt == 3) {
      errno = ESTALE;
      return AppendResult::kLost;
    }
  }
  bool whole = true;
  for (const std::string& line : lines) {
    ssize_t written = 0;
    size_t wanted = 0;
    whole = FILEINDEX::AppendLineAligned(fd.get(), line, written, wanted) && whole;
  }
  flock(fd.get(), LOCK_UN);
  return whole ? AppendResult::kWritten : AppendResult::kLost;
}

}  // namespace WEZOTIFYD
}  // namespace WEZO
