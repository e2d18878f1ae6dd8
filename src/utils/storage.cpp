// Where each share keeps its index data: the event queue and the index database, both in the
// share's hidden metadata directory.
#define FILEINDEX_LOG_UNIT "utils"

#include "utils/storage.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "fileindex/fileindex_c.h"
#include "utils/log.h"
#include "utils/share_record.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

enum class Item { kQueue, kDatabase };

// Opens the directory `name` in `dir` without following a link. O_NOFOLLOW with O_DIRECTORY
// reports a link as "not a directory"; it is told apart so that the log names the link.
UniqueFd OpenSubdir(int dir, const char* name) {
  UniqueFd fd(openat(dir, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  struct stat st {};
  if (!fd && errno == ENOTDIR && fstatat(dir, name, &st, AT_SYMLINK_NOFOLLOW) == 0 &&
      S_ISLNK(st.st_mode)) {
    errno = ELOOP;
  }
  return fd;
}

// The share's metadata directory, its share's path as given.
UniqueFd OpenMetadataDir(const std::string& sharePath) {
  const UniqueFd share(open(sharePath.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!share) {
    return UniqueFd();
  }
  return OpenSubdir(share.get(), kMetadataDirName);
}

// Makes sure the database directory exists in the metadata directory `metadata`, a directory of
// its own (not a link) that nobody but its owner can write to.
bool MakeDatabaseDir(int metadata) {
  const bool created = mkdirat(metadata, kDatabaseName, kDatabaseMode) == 0;
  if (!created && errno != EEXIST) {
    return false;
  }
  const UniqueFd db = OpenSubdir(metadata, kDatabaseName);
  struct stat st {};
  if (!db || fstat(db.get(), &st) != 0) {
    return false;
  }
  // The umask may have taken bits away; a directory left writable for all by an earlier version
  // loses its group and world write bits.
  const mode_t mode = st.st_mode & 07777;
  const mode_t wanted = created ? kDatabaseMode : mode & ~static_cast<mode_t>(S_IWGRP | S_IWOTH);
  return mode == wanted || fchmod(db.get(), wanted) == 0;
}

// Argument checks log the failed condition's text; the value printed is always 0, which readers
// of the system log have long matched on.
int RefuseArgument(const char* condition, int line) {
  detail::WriteLog(false, FILEINDEX_LOG_UNIT, line, "Invaild Argument (%s)=[%d]\n", condition, 0);
  WLIBCErrSetEx(WLIBC_ERR_BAD_PARAMETERS, FILEINDEX_LOG_UNIT, line);
  return -1;
}

int StoragePathGet(Item item, const char* name, char* out, int outLen) {
  if (name == nullptr) {
    return RefuseArgument("__null != szName", __LINE__);
  }
  if (out == nullptr) {
    return RefuseArgument(
        item == Item::kQueue ? "__null != szOutQueuePath" : "__null != szOutDBPath", __LINE__);
  }
  if (outLen <= 0) {
    return RefuseArgument("cbOutLen > 0", __LINE__);
  }

  ShareRecord share;
  if (LookUpShare(name, share) < 0) {
    FILEINDEX_LOG("WEZOShareGet failed, name=%s, code=%d", name, WLIBCErrGet());
    return -1;
  }
  const std::string sharePath = SharePathOf(*share);

  const std::string metadataDir = MetadataDirOf(sharePath);
  if (WEZOEAMKDir(0, metadataDir.c_str()) < 0) {
    // The caller still gets the location: the daemon or a later call may yet create it.
    FILEINDEX_LOG("WEZOEAMKDir failed, path=%s, code=%d", metadataDir.c_str(), WLIBCErrGet());
  }

  const std::string location = item == Item::kQueue ? QueueOf(sharePath) : DatabaseOf(sharePath);
  (void)std::snprintf(out, static_cast<size_t>(outLen), "%s", location.c_str());
  if (item == Item::kDatabase) {
    const UniqueFd metadata = OpenMetadataDir(sharePath);
    if (!metadata || !MakeDatabaseDir(metadata.get())) {
      FILEINDEX_LOG("mkdir failed, path=%s, reason=%s", out, detail::ErrnoText().c_str());
    }
  }
  return static_cast<int>(std::strlen(out));
}

// Removes `name` in `dir`: a directory with everything below it, `depth` levels down already.
bool RemoveAt(int dir, const char* name, int depth) {
  // unlinkat removes a file or a link itself and refuses a directory.
  if (unlinkat(dir, name, 0) == 0 || errno == ENOENT) {
    return true;
  }
  if (errno != EISDIR) {
    return false;
  }
  if (depth == kMaxRemovalDepth) {
    errno = ENAMETOOLONG;
    return false;
  }
  UniqueFd fd = OpenSubdir(dir, name);
  if (!fd) {
    return errno == ENOENT;
  }
  DIR* entries = fdopendir(fd.get());
  if (entries == nullptr) {
    return false;
  }
  (void)fd.Release();  // closedir closes it
  bool emptied = true;
  for (;;) {
    errno = 0;
    const dirent* entry = readdir(entries);
    if (entry == nullptr) {
      emptied = errno == 0;
      break;
    }
    if (std::strcmp(entry->d_name, ".") != 0 && std::strcmp(entry->d_name, "..") != 0 &&
        !RemoveAt(dirfd(entries), entry->d_name, depth + 1)) {
      emptied = false;
      break;
    }
  }
  const int saved = errno;
  closedir(entries);
  if (!emptied) {
    errno = saved;
    return false;
  }
  return unlinkat(dir, name, AT_REMOVEDIR) == 0 || errno == ENOENT;
}

}  // namespace

bool ShareQueuePath(const std::string& share, std::string& out) {
  char buffer[4096];
  if (StoragePathGet(Item::kQueue, share.c_str(), buffer, sizeof buffer) < 0) {
    return false;
  }
  out = buffer;
  return true;
}

UniqueFd OpenLocationDir(const std::string& location, std::string& name) {
  const size_t slash = location.rfind('/');
  if (slash == std::string::npos || slash + 1 == location.size()) {
    errno = EINVAL;
    return UniqueFd();
  }
  name = location.substr(slash + 1);
  const std::string dir = slash == 0 ? "/" : location.substr(0, slash);
  const std::string metadata = std::string("/") + kMetadataDirName;
  if (dir.size() >= metadata.size() &&
      dir.compare(dir.size() - metadata.size(), metadata.size(), metadata) == 0) {
    const std::string share = dir.substr(0, dir.size() - metadata.size());
    return OpenMetadataDir(share.empty() ? "/" : share);
  }
  return UniqueFd(open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

UniqueFd OpenLocationFile(const std::string& location, int flags, mode_t mode) {
  std::string name;
  const UniqueFd dir = OpenLocationDir(location, name);
  if (!dir) {
    return UniqueFd();
  }
  UniqueFd fd(openat(dir.get(), name.c_str(), flags | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, mode));
  struct stat st {};
  if (!fd) {
    return fd;
  }
  if (fstat(fd.get(), &st) != 0) {
    const int saved = errno;
    fd.Close();
    errno = saved;
    return UniqueFd();
  }
  if (!S_ISREG(st.st_mode)) {
    fd.Close();
    errno = S_ISDIR(st.st_mode) ? EISDIR : ENXIO;
    return UniqueFd();
  }
  return fd;
}

bool LocationFileExists(const std::string& location) {
  std::string name;
  const UniqueFd dir = OpenLocationDir(location, name);
  struct stat st {};
  if (!dir || fstatat(dir.get(), name.c_str(), &st, AT_SYMLINK_NOFOLLOW) != 0) {
    return false;
  }
  if (!S_ISREG(st.st_mode)) {
    errno = S_ISDIR(st.st_mode) ? EISDIR : ENXIO;
    return false;
  }
  return true;
}

bool RemoveLocation(const std::string& location) {
  std::string name;
  const UniqueFd dir = OpenLocationDir(location, name);
  if (!dir) {
    // Without its directory, the location holds nothing.
    return errno == ENOENT;
  }
  return RemoveAt(dir.get(), name.c_str(), 0);
}

}  // namespace FILEINDEX
}  // namespace WEZO

extern "C" {

int FILEIDXQueuePathGet(const char* szName, char* szOutQueuePath, int cbOutLen) {
  return WEZO::FILEINDEX::StoragePathGet(WEZO::FILEINDEX::Item::kQueue, szName, szOutQueuePath,
                                         cbOutLen);
}

int FILEIDXDBPathGet(const char* szName, char* szOutDBPath, int cbOutLen) {
  return WEZO::FILEINDEX::StoragePathGet(WEZO::FILEINDEX::Item::kDatabase, szName, szOutDBPath,
                                         cbOutLen);
}

}  // extern "C"
