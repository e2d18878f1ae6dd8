#define FILEINDEX_LOG_UNIT "config"

#include "fileindex/config.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "file_io.h"
#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "flock.h"
#include "json_io.h"
#include "unique_fd.h"
#include "utils/log.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr mode_t kFileMode = 0644;
// Only the library's user may open a lock file: flock needs no more than a read-only descriptor,
// so a lock file that others can read is one that any local user can hold to block every change.
constexpr mode_t kLockFileMode = 0600;

// Whether the open lock file `fd` is one that only this user can hold: a regular file of ours
// with no other name (a second name could make the mode fix below change another file's mode).
// Narrows its mode to kLockFileMode when an earlier version or the umask left it wider.
enum class LockFileCheck { kPrivate, kForeign, kFailed };
LockFileCheck MakePrivate(int fd) {
  struct stat st {};
  if (fstat(fd, &st) != 0) {
    return LockFileCheck::kFailed;
  }
  if (!S_ISREG(st.st_mode) || st.st_uid != geteuid() || st.st_nlink != 1) {
    return LockFileCheck::kForeign;
  }
  if ((st.st_mode & 07777) != kLockFileMode && fchmod(fd, kLockFileMode) != 0) {
    return LockFileCheck::kFailed;
  }
  return LockFileCheck::kPrivate;
}

}  // namespace

Config::Config() : m_jsRoot(Json::objectValue), m_lockFd(-1) {}

// Releasing the lock is always the owner's explicit Unlock(); see the class comment.
Config::~Config() = default;

bool Config::LoadJson() {
  const std::string path = GetPath();
  // A missing file is an empty configuration; so is a symbolic link in its place, which is
  // never followed.
  if (!IsFileExist(path)) {
    return true;
  }
  if (!JsonFromFile(m_jsRoot, path)) {
    FILEINDEX_LOG("Failed to load json from %s", path.c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_LOAD_JSON);
    return false;
  }
  return true;
}

bool Config::SaveJson() {
  const std::string path = GetPath();
  // Every writer of the file saves under its lock, so while this object holds it, a temporary
  // file beside the configuration belongs to a writer that died before its rename.
  if (m_lockFd >= 0) {
    RemoveStaleTemporaries(path, 0);
  }
  switch (JsonToFile(m_jsRoot, path, kFileMode)) {
    case JsonSaveResult::kReplaced:
      return true;
    case JsonSaveResult::kReplacedModeNotSet:
      FILEINDEX_LOG("chmod failed, path=%s", path.c_str());
      return true;
    case JsonSaveResult::kFailed:
      break;
  }
  FILEINDEX_LOG("Failed to save json to %s", path.c_str());
  ErrorHandler::SetError(FILEINDEX_ERR_SAVE_JSON);
  return false;
}

bool Config::Lock(bool exclusive) {
  const std::string path = GetLockPath();
  const auto open = [&path] {
    // The lock files live in world-writable /tmp: never follow a link planted there.
    UniqueFd fd(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, kLockFileMode));
    if (!fd) {
      return fd;
    }
    const LockFileCheck check = MakePrivate(fd.get());
    if (check != LockFileCheck::kPrivate) {
      fd.Close();
      if (check == LockFileCheck::kForeign) {
        FILEINDEX_LOG("Lock file refused, not a regular file of uid %u with one link, path=%s",
                      static_cast<unsigned>(geteuid()), path.c_str());
      }
    }
    return fd;
  };
  UniqueFd locked;
  if (FlockRetrying(open, exclusive ? LOCK_EX : LOCK_SH, locked) == FlockResult::kLocked) {
    m_lockFd = locked.Release();
    return true;
  }
  FILEINDEX_LOG("Failed to lock folder");
  ErrorHandler::SetError(FILEINDEX_ERR_LOCK);
  return false;
}

void Config::Unlock() {
  if (m_lockFd < 0) {
    return;
  }
  flock(m_lockFd, LOCK_UN);
  close(m_lockFd);
  m_lockFd = -1;
}

}  // namespace FILEINDEX
}  // namespace WEZO
