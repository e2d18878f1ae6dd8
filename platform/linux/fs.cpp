// File-system facts: type codes, mount points, the hidden metadata folder and free space.
#include <fcntl.h>
#include <linux/fs.h>
#include <linux/magic.h>
#include <linux/quota.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <sys/sysmacros.h>
#include <sys/vfs.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <string>
#include <vector>

#include "file_io.h"
#include "internal.h"
#include "layout.h"
#include "unique_fd.h"

namespace {

using WEZO::PLATFORM::kErrNotFound;
using WEZO::PLATFORM::kErrSystem;

// The type codes of WEZOGetFSType. docs/platform.md lists them; keep the two in step.
enum FsCode : int {
  kExt = 1,
  kBtrfs = 2,
  kXfs = 3,
  kZfs = 4,
  kF2fs = 5,
  kFat = 6,
  kExfat = 7,
  kNtfs = 8,
  kHfs = 9,
  kTmpfs = 10,
  kOverlay = 11,
  kPseudo = WEZO_FSTYPE_NEVER_INDEXED,
  kEcryptfs = 13,
  kNfs = 14,
  kSmb = 15,
  k9p = 16,
  kCeph = 17,
  kFuseRemote = 18,
  kFuseLocal = 19,
  kIso9660 = 20,
  kUdf = 21,
  kSquashfs = 22,
  kErofs = 23,
  kBcachefs = 24,
};

struct MagicCode {
  unsigned long magic;
  int code;
};

constexpr unsigned long kNtfsMagic = 0x5346544eUL;
constexpr unsigned long kHfsMagic = 0x4244UL;
constexpr unsigned long kHfsPlusMagic = 0x482bUL;
constexpr unsigned long kZfsMagic = 0x2fc12fc1UL;
constexpr unsigned long kBcachefsMagic = 0xca451a4eUL;
constexpr unsigned long kConfigfsMagic = 0x62656570UL;
constexpr unsigned long kMqueueMagic = 0x19800202UL;
constexpr unsigned long kFuseCtlMagic = 0x65735543UL;

constexpr MagicCode kMagicCodes[] = {
    {EXT4_SUPER_MAGIC, kExt},
    {BTRFS_SUPER_MAGIC, kBtrfs},
    {XFS_SUPER_MAGIC, kXfs},
    {kZfsMagic, kZfs},
    {F2FS_SUPER_MAGIC, kF2fs},
    {MSDOS_SUPER_MAGIC, kFat},
    {EXFAT_SUPER_MAGIC, kExfat},
    {kNtfsMagic, kNtfs},
    {kHfsMagic, kHfs},
    {kHfsPlusMagic, kHfs},
    {TMPFS_MAGIC, kTmpfs},
    {RAMFS_MAGIC, kTmpfs},
    {OVERLAYFS_SUPER_MAGIC, kOverlay},
    {ECRYPTFS_SUPER_MAGIC, kEcryptfs},
    {kBcachefsMagic, kBcachefs},
    // Kernel interfaces that look like file systems: never indexed.
    {PROC_SUPER_MAGIC, kPseudo},
    {SYSFS_MAGIC, kPseudo},
    {DEVPTS_SUPER_MAGIC, kPseudo},
    {CGROUP_SUPER_MAGIC, kPseudo},
    {CGROUP2_SUPER_MAGIC, kPseudo},
    {DEBUGFS_MAGIC, kPseudo},
    {TRACEFS_MAGIC, kPseudo},
    {SECURITYFS_MAGIC, kPseudo},
    {PSTOREFS_MAGIC, kPseudo},
    {BPF_FS_MAGIC, kPseudo},
    {kConfigfsMagic, kPseudo},
    {kMqueueMagic, kPseudo},
    {HUGETLBFS_MAGIC, kPseudo},
    {AUTOFS_SUPER_MAGIC, kPseudo},
    {BINFMTFS_MAGIC, kPseudo},
    {EFIVARFS_MAGIC, kPseudo},
    {kFuseCtlMagic, kPseudo},
    {NSFS_MAGIC, kPseudo},
    {SELINUX_MAGIC, kPseudo},
    // Network file systems.
    {NFS_SUPER_MAGIC, kNfs},
    {SMB_SUPER_MAGIC, kSmb},
    {CIFS_SUPER_MAGIC, kSmb},
    {SMB2_SUPER_MAGIC, kSmb},
    {V9FS_MAGIC, k9p},
    {CEPH_SUPER_MAGIC, kCeph},
    // Disk images.
    {ISOFS_SUPER_MAGIC, kIso9660},
    {UDF_SUPER_MAGIC, kUdf},
    {SQUASHFS_MAGIC, kSquashfs},
    {EROFS_SUPER_MAGIC_V1, kErofs},
    {CRAMFS_MAGIC, kErofs},
};

// FUSE file systems whose data lives on another machine, by their mount table subtype.
constexpr const char* kRemoteFuseTypes[] = {
    "sshfs",    "rclone", "s3fs",   "gcsfuse", "glusterfs", "ceph-fuse", "curlftpfs",
    "smbnetfs", "davfs",  "goofys", "juicefs", "afpfs",     "webdavfs",
};

bool IsOctal(char c) { return c >= '0' && c <= '7'; }

// Undoes the mount table's octal escapes ("\040" is a space).
std::string Unescape(const std::string& field) {
  std::string out;
  for (size_t i = 0; i < field.size(); ++i) {
    if (field[i] == '\\' && i + 3 < field.size() && IsOctal(field[i + 1]) &&
        IsOctal(field[i + 2]) && IsOctal(field[i + 3])) {
      out += static_cast<char>(((field[i + 1] - '0') << 6) | ((field[i + 2] - '0') << 3) |
                               (field[i + 3] - '0'));
      i += 3;
    } else {
      out += field[i];
    }
  }
  return out;
}

struct Mount {
  dev_t dev;
  std::string mountPoint;
  std::string type;
};

// The mount table of this process, read from proc/self/mountinfo under the root prefix.
bool ReadMounts(std::vector<Mount>& mounts) {
  std::string text;
  if (!WEZO::FILEINDEX::ReadWholeFile(WEZO::PLATFORM::Rooted("/proc/self/mountinfo"), text)) {
    return false;
  }
  std::istringstream lines(text);
  std::string line;
  while (std::getline(lines, line)) {
    std::istringstream fields(line);
    std::string id;
    std::string parent;
    std::string devField;
    std::string root;
    std::string mountPoint;
    std::string field;
    fields >> id >> parent >> devField >> root >> mountPoint;
    while (fields >> field && field != "-") {
    }
    std::string type;
    fields >> type;
    char* colon = nullptr;
    const unsigned long major = std::strtoul(devField.c_str(), &colon, 10);
    if (type.empty() || *colon != ':') {
      continue;
    }
    const unsigned long minor = std::strtoul(colon + 1, nullptr, 10);
    mounts.push_back(Mount{makedev(major, minor), Unescape(mountPoint), type});
  }
  return true;
}

int FuseCode(const char* path) {
  struct stat st {};
  std::vector<Mount> mounts;
  if (stat(path, &st) != 0 || !ReadMounts(mounts)) {
    return WEZO_FSTYPE_UNKNOWN;
  }
  for (const Mount& m : mounts) {
    if (m.dev != st.st_dev) {
      continue;
    }
    const std::string subtype = m.type.rfind("fuse.", 0) == 0 ? m.type.substr(5) : "";
    for (const char* remote : kRemoteFuseTypes) {
      if (subtype == remote) {
        return kFuseRemote;
      }
    }
    return kFuseLocal;
  }
  return WEZO_FSTYPE_UNKNOWN;
}

// Bytes the project quota of the folder's project still allows, or -1 when no project quota
// applies (no project, quotas off, or a kernel without quotactl_fd). Only the project quota
// counts: the index data is written by root, whose user quota is never enforced.
long long ProjectQuotaRoom(const char* path) {
#ifndef SYS_quotactl_fd
  (void)path;
  return -1;
#else
  WEZO::FILEINDEX::UniqueFd fd(open(path, O_RDONLY | O_CLOEXEC));
  struct fsxattr attr {};
  if (!fd || ioctl(fd.get(), FS_IOC_FSGETXATTR, &attr) != 0 || attr.fsx_projid == 0) {
    return -1;
  }
  struct if_dqblk quota {};
  if (syscall(SYS_quotactl_fd, fd.get(), QCMD(Q_GETQUOTA, PRJQUOTA), attr.fsx_projid, &quota) !=
          0 ||
      (quota.dqb_valid & QIF_BLIMITS) == 0 || quota.dqb_bhardlimit == 0) {
    return -1;
  }
  const unsigned long long limit = quota.dqb_bhardlimit * QIF_DQBLKSIZE;
  return quota.dqb_curspace >= limit ? 0 : static_cast<long long>(limit - quota.dqb_curspace);
#endif
}

}  // namespace

extern "C" {

int WEZOGetFSType(const char* szPath, int /*flags*/) {
  struct statfs sfs {};
  if (szPath == nullptr || statfs(szPath, &sfs) != 0) {
    PLATFORM_FAIL(szPath == nullptr ? WLIBC_ERR_BAD_PARAMETERS : kErrNotFound);
    return WEZO_FSTYPE_UNKNOWN;
  }
  const auto magic = static_cast<unsigned long>(sfs.f_type);
  if (magic == FUSE_SUPER_MAGIC) {
    return FuseCode(szPath);
  }
  for (const MagicCode& entry : kMagicCodes) {
    if (entry.magic == magic) {
      return entry.code;
    }
  }
  return WEZO_FSTYPE_UNKNOWN;
}

int WEZOFSIsRemoteFS(int fsType) {
  return fsType == kNfs || fsType == kSmb || fsType == k9p || fsType == kCeph ||
         fsType == kFuseRemote;
}

int WEZOFSIsImageFS(int fsType) {
  return fsType == kIso9660 || fsType == kUdf || fsType == kSquashfs || fsType == kErofs;
}

int WEZOFSDirIsMntPoint(const char* szPath) {
  struct statx stx {};
  if (szPath == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  if (statx(AT_FDCWD, szPath, AT_SYMLINK_NOFOLLOW, STATX_TYPE | STATX_INO, &stx) != 0) {
    return PLATFORM_FAIL(errno == ENOENT ? kErrNotFound : kErrSystem);
  }
  if (!S_ISDIR(stx.stx_mode)) {
    return 0;
  }
  if ((stx.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT) != 0) {
    return (stx.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0 ? 1 : 0;
  }
  // Older kernels: a device change against the parent, or the mount table for bind mounts.
  struct stat self {};
  struct stat parent {};
  if (stat(szPath, &self) != 0 || stat((std::string(szPath) + "/..").c_str(), &parent) != 0) {
    return PLATFORM_FAIL(kErrSystem);
  }
  if (self.st_dev != parent.st_dev || self.st_ino == parent.st_ino) {
    return 1;
  }
  char resolved[PATH_MAX];
  std::vector<Mount> mounts;
  if (realpath(szPath, resolved) == nullptr || !ReadMounts(mounts)) {
    return 0;
  }
  for (const Mount& m : mounts) {
    if (m.mountPoint == resolved) {
      return 1;
    }
  }
  return 0;
}

int WEZOEAIsHiddenDir(const char* szName) {
  return szName != nullptr && std::strcmp(szName, WEZO::FILEINDEX::kMetadataDirName) == 0 ? 1 : 0;
}

// The folder belongs to root with mode 0755: the platform's services write it, everyone reads.
int WEZOEAMKDir(int /*flags*/, const char* szPath) {
  if (szPath == nullptr || szPath[0] == '\0') {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  const bool created = mkdir(szPath, 0755) == 0;
  if (!created && errno != EEXIST) {
    return PLATFORM_FAIL(errno == ENOENT ? kErrNotFound : kErrSystem);
  }
  // A share is user-writable: a symbolic link planted in the folder's place is refused.
  WEZO::FILEINDEX::UniqueFd fd(open(szPath, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!fd || (created && fchmod(fd.get(), 0755) != 0)) {
    return PLATFORM_FAIL(kErrSystem);
  }
  return 0;
}

int WEZOQuotaIsEnough(int /*flags*/, const char* szPath, unsigned long long cbNeeded) {
  struct statvfs vfs {};
  if (szPath == nullptr) {
    PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
    return 0;
  }
  if (statvfs(szPath, &vfs) != 0) {
    PLATFORM_FAIL(errno == ENOENT ? kErrNotFound : kErrSystem);
    return 0;
  }
  const unsigned long long blocks = vfs.f_bavail;
  const unsigned long long blockSize = vfs.f_frsize;
  const bool overflows = blockSize != 0 && blocks > ULLONG_MAX / blockSize;
  if (!overflows && blocks * blockSize < cbNeeded) {
    PLATFORM_FAIL(WLIBC_ERR_NO_SPACE);
    return 0;
  }
  const long long room = ProjectQuotaRoom(szPath);
  if (room >= 0 && static_cast<unsigned long long>(room) < cbNeeded) {
    PLATFORM_FAIL(WLIBC_ERR_OVER_QUOTA);
    return 0;
  }
  return 1;
}

}  // extern "C"
