// The eligibility rules log as part of the library's utilities.
#define FILEINDEX_LOG_UNIT "utils"

#include "fileindex/eligibility.h"

#include <wezo/platform.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdlib>

#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "log.h"
#include "share_record.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

// Names that are never indexed: the index's own database and queue, and system clutter.
const std::array<std::string, 5> kSkipNames = {".TemporaryItems", "WEZO@.fileindexdb",
                                               "WEZO@file_index_queue", ".WEZOPPSDB", ".DS_Store"};
// Shares whose contents belong to other services and are never indexed.
const std::array<std::string, 2> kExcludedShares = {"surveillance", "NetBackup"};

template <size_t N>
bool IsListed(const std::array<std::string, N>& list, const std::string& name) {
  return std::find(list.begin(), list.end(), name) != list.end();
}

bool Contains(const std::string& text, const char* part) {
  return text.find(part) != std::string::npos;
}

bool InRecycleBin(const std::string& fullPath) {
  return Contains(fullPath, "#recycle") && WEZOShareIsShareRecycle(fullPath.c_str()) != 0;
}

bool InSnapshot(const std::string& fullPath) {
  if (!Contains(fullPath, "#snapshot")) {
    return false;
  }
  int inSnapshot = 0;
  return WLIBFhsPathInSnapshot(fullPath.c_str(), &inSnapshot) == 0 && inSnapshot == 1;
}

bool IsNeverIndexedType(int fsType) {
  return WEZOFSIsRemoteFS(fsType) != 0 || WEZOFSIsImageFS(fsType) != 0 ||
         fsType == WEZO_FSTYPE_NEVER_INDEXED;
}

}  // namespace

bool CanShareBeIndexed(_tag_WEZOSHARE* share) {
  if (share == nullptr) {
    return false;
  }
  const std::string name(share->szName, strnlen(share->szName, sizeof share->szName));
  if (IsListed(kExcludedShares, name)) {
    return false;
  }
  int encrypted = 0;
  if (WLIBShareIsEncryptedGet(share, &encrypted) < 0) {
    return false;
  }
  int readOnly = 0;
  if (WLIBShareIsReadOnlyGet(share, &readOnly) < 0) {
    return false;
  }
  return encrypted == 0 && readOnly == 0;
}

bool IsSystemPreservedFileName(const std::string& name) {
  return WEZOEAIsHiddenDir(name.c_str()) == 1 || IsListed(kSkipNames, name);
}

bool IsSkipIndex(const std::string& fullPath) {
  const int fsType = WEZOGetFSType(fullPath.c_str(), 0);
  const size_t slash = fullPath.rfind('/');
  if (slash == std::string::npos) {
    return true;
  }
  if (IsSystemPreservedFileName(fullPath.substr(slash + 1)) || InRecycleBin(fullPath) ||
      InSnapshot(fullPath)) {
    return true;
  }
  // An item whose file system cannot be told is crawled all the same; only a folder is refused
  // for it (CanFullPathBeIndexed).
  if (fsType == WEZO_FSTYPE_UNKNOWN) {
    return false;
  }
  return IsNeverIndexedType(fsType);
}

bool CanFullPathBeIndexed(const std::string& fullPath) {
  if (InRecycleBin(fullPath) || InSnapshot(fullPath)) {
    return false;
  }
  const int fsType = WEZOGetFSType(fullPath.c_str(), 0);
  if (fsType == WEZO_FSTYPE_UNKNOWN || IsNeverIndexedType(fsType)) {
    return false;
  }

  std::string shareName;
  std::string sharePath;
  if (!GetShareNamePathByFullPath(shareName, sharePath, fullPath)) {
    FILEINDEX_LOG("GetShareNamePathByFullPath failed, path=%s", fullPath.c_str());
    return false;
  }
  ShareRecord share;
  if (LookUpShare(shareName, share) < 0 || !share) {
    FILEINDEX_LOG("WEZOShareGet failed, share=%s", shareName.c_str());
    return false;
  }
  if (!CanShareBeIndexed(share.get())) {
    return false;
  }

  // A volume mounted inside a share is refused, except on a share set up for encryption, whose
  // own directory is such a mount.
  if (WEZOFSDirIsMntPoint(fullPath.c_str()) == 1) {
    int encryption = 0;
    if (WLIBShareIsEncryptionGet(share.get(), &encryption) == 0 && encryption == 0) {
      FILEINDEX_LOG("Mount point[%s] is not allowed to be indexed", fullPath.c_str());
      return false;
    }
  }

  // The folder must be exactly where it says: no symbolic link on the way, no trailing slash, no
  // "." or ".." and no doubled slash; and it must exist.
  char resolved[PATH_MAX];
  if (realpath(fullPath.c_str(), resolved) == nullptr || fullPath != resolved) {
    FILEINDEX_LOG("check realpath failed, path=%s", fullPath.c_str());
    return false;
  }
  return true;
}

bool CanPathBeIndexed(const std::string& path) {
  std::string fullPath;
  if (!GetFullPath(fullPath, path)) {
    FILEINDEX_LOG("GetFullPath failed, path=%s", path.c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_PATH);
    return false;
  }
  return CanFullPathBeIndexed(fullPath);
}

bool IsShareSpaceEnough(const std::string& shareName) {
  ShareRecord share;
  if (LookUpShare(shareName, share) < 0 || !share) {
    FILEINDEX_LOG("WEZOShareGet failed, share=%s", shareName.c_str());
    return false;
  }
  constexpr unsigned long long kIndexRoom = 10ULL * 1024 * 1024;
  if (WEZOQuotaIsEnough(0, SharePathOf(*share).c_str(), kIndexRoom) != 0) {
    return true;
  }
  // Only a definite "no room" stops indexing; a quota question that could not be answered does
  // not.
  const int err = WLIBCErrGet();
  return err != WLIBC_ERR_NO_SPACE && err != WLIBC_ERR_OVER_QUOTA;
}

}  // namespace FILEINDEX
}  // namespace WEZO
