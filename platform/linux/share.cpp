// The share database: the file shares of the Samba configuration, and the facts of a share's
// directory (encryption, recycle bin, snapshots).
#include <fcntl.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <wezo/platform.h>

#include <cerrno>
#include <cstdio>
#include <new>

#include "internal.h"
#include "smb_conf.h"

namespace {

using WEZO::PLATFORM::kErrBadConfig;
using WEZO::PLATFORM::kErrNotFound;
using WEZO::PLATFORM::kErrSystem;
using WEZO::PLATFORM::SmbConf;
using WEZO::PLATFORM::SmbShare;

// Whether `full` is `root` itself or lies below it at a "/" boundary.
bool Holds(const std::string& root, const std::string& full) {
  if (root == "/") {
    return !full.empty() && full[0] == '/';
  }
  return full.compare(0, root.size(), root) == 0 &&
         (full.size() == root.size() || full[root.size()] == '/');
}

// The share with the longest path that holds `full`, or null.
const SmbShare* ShareHolding(const SmbConf& conf, const std::string& full) {
  const SmbShare* best = nullptr;
  for (const SmbShare& share : conf.shares) {
    if (Holds(share.path, full) && (best == nullptr || share.path.size() > best->path.size())) {
      best = &share;
    }
  }
  return best;
}

const SmbShare* ShareNamed(const SmbConf& conf, const char* name) {
  for (const SmbShare& share : conf.shares) {
    if (share.name == name) {
      return &share;
    }
  }
  return nullptr;
}

// Whether `full` is the folder `folder` at the root of the share that holds it, or lies below it.
// Returns -1, with the last error set, when the share database cannot be read.
int InShareFolder(const char* full, const char* folder) {
  if (full == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  const auto conf = WEZO::PLATFORM::LoadSmbConf();
  if (!conf) {
    return -1;
  }
  const SmbShare* share = ShareHolding(*conf, full);
  if (share == nullptr) {
    return 0;
  }
  const std::string root = share->path == "/" ? "" : share->path;
  return Holds(root + "/" + folder, full) ? 1 : 0;
}

// Whether the directory's data is stored encrypted: fscrypt marks it in statx's attributes,
// eCryptfs is a stacked file system of its own.
int DirectoryEncrypted(const WEZOSHARE* pShare, int* pfFlag) {
  if (pShare == nullptr || pfFlag == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  struct statx stx {};
  struct statfs sfs {};
  if (statx(AT_FDCWD, pShare->szPath, 0, STATX_BASIC_STATS, &stx) != 0 ||
      statfs(pShare->szPath, &sfs) != 0) {
    return PLATFORM_FAIL(errno == ENOENT ? kErrNotFound : kErrSystem);
  }
  const bool fscrypt = (stx.stx_attributes_mask & STATX_ATTR_ENCRYPTED) != 0 &&
                       (stx.stx_attributes & STATX_ATTR_ENCRYPTED) != 0;
  *pfFlag = fscrypt || sfs.f_type == ECRYPTFS_SUPER_MAGIC ? 1 : 0;
  return 0;
}

}  // namespace

extern "C" {

int WEZOShareGet(const char* szName, PWEZOSHARE* ppShare) {
  if (szName == nullptr || ppShare == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  const auto conf = WEZO::PLATFORM::LoadSmbConf();
  if (!conf) {
    return -1;
  }
  const SmbShare* share = ShareNamed(*conf, szName);
  if (share == nullptr) {
    return PLATFORM_FAIL(kErrNotFound);
  }
  if (share->name.size() >= WEZO_SHARE_NAME_MAX || share->path.size() >= WEZO_SHARE_PATH_MAX) {
    return PLATFORM_FAIL(kErrBadConfig);
  }
  auto* record = new (std::nothrow) WEZOSHARE();
  if (record == nullptr) {
    return PLATFORM_FAIL(kErrSystem);
  }
  (void)std::snprintf(record->szName, sizeof record->szName, "%s", share->name.c_str());
  (void)std::snprintf(record->szPath, sizeof record->szPath, "%s", share->path.c_str());
  *ppShare = record;
  return 0;
}

void WEZOShareFree(PWEZOSHARE pShare) { delete pShare; }

int WEZOShareNamePathGet(const char* szFullPath, char* szShareName, int cbShareName,
                         char* szSharePath, int cbSharePath) {
  if (szFullPath == nullptr || szShareName == nullptr || szSharePath == nullptr ||
      cbShareName <= 0 || cbSharePath <= 0) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  const auto conf = WEZO::PLATFORM::LoadSmbConf();
  if (!conf) {
    return -1;
  }
  const SmbShare* share = ShareHolding(*conf, szFullPath);
  if (share == nullptr) {
    return PLATFORM_FAIL(kErrNotFound);
  }
  (void)std::snprintf(szShareName, static_cast<size_t>(cbShareName), "%s", share->name.c_str());
  (void)std::snprintf(szSharePath, static_cast<size_t>(cbSharePath), "%s", share->path.c_str());
  return 0;
}

int WLIBShareIsEncryptedGet(const WEZOSHARE* pShare, int* pfEncrypted) {
  return DirectoryEncrypted(pShare, pfEncrypted);
}

// Linux has no encryption setting apart from the directory's state: a directory is set up for
// encryption exactly when its data is stored encrypted.
int WLIBShareIsEncryptionGet(const WEZOSHARE* pShare, int* pfEncryption) {
  return DirectoryEncrypted(pShare, pfEncryption);
}

int WLIBShareIsReadOnlyGet(const WEZOSHARE* pShare, int* pfReadOnly) {
  if (pShare == nullptr || pfReadOnly == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  const auto conf = WEZO::PLATFORM::LoadSmbConf();
  if (!conf) {
    return -1;
  }
  const SmbShare* share = ShareNamed(*conf, pShare->szName);
  if (share == nullptr) {
    return PLATFORM_FAIL(kErrNotFound);
  }
  *pfReadOnly = share->readOnly ? 1 : 0;
  return 0;
}

int WEZOShareIsShareRecycle(const char* szFullPath) {
  return InShareFolder(szFullPath, "#recycle") == 1 ? 1 : 0;
}

int WLIBFhsPathInSnapshot(const char* szPath, int* pfInSnapshot) {
  if (pfInSnapshot == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  const int in = InShareFolder(szPath, "#snapshot");
  if (in < 0) {
    return -1;
  }
  *pfInSnapshot = in;
  return 0;
}

}  // extern "C"
