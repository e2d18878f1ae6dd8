// The eligibility rules log as part of the library's utilities.
#define FILEINDEX_LOG_UNIT "utils"

#include "fileindex/eligibility.h"

#include <sys/stat.h>
#include <wezo/platform.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdlib>
#include <map>

#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "layout.h"
#include "utils/eligibility_pass.h"
#include "utils/log.h"
#include "utils/share_record.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

// Names that are never indexed: the index's own database and queue, and system clutter.
const std::array<std::string, 5> kSkipNames = {".TemporaryItems", kDatabaseName, kQueueName,
                                               ".WEZOPPSDB", ".DS_Store"};
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

// The rule that refuses whatever lies on a file system of type `fsType`, or kIndexable. An unknown
// type asks the platform nothing more.
IndexRule FileSystemRule(int fsType) {
  if (fsType == WEZO_FSTYPE_UNKNOWN) {
    return IndexRule::kUnknownFileSystem;
  }
  if (WEZOFSIsRemoteFS(fsType) != 0) {
    return IndexRule::kRemoteFileSystem;
  }
  if (WEZOFSIsImageFS(fsType) != 0) {
    return IndexRule::kImageFileSystem;
  }
  if (fsType == WEZO_FSTYPE_NEVER_INDEXED) {
    return IndexRule::kNeverIndexedFileSystem;
  }
  return IndexRule::kIndexable;
}

// The rule that refuses indexed folders in `share`, or kIndexable. Both states are read before
// either decides, and a share that is encrypted and read-only counts as encrypted.
IndexRule ShareIndexRule(_tag_WEZOSHARE* share) {
  if (share == nullptr) {
    return IndexRule::kShareUnreadable;
  }
  const std::string name(share->szName, strnlen(share->szName, sizeof share->szName));
  if (IsListed(kExcludedShares, name)) {
    return IndexRule::kExcludedShare;
  }
  int encrypted = 0;
  if (WLIBShareIsEncryptedGet(share, &encrypted) < 0) {
    return IndexRule::kShareStateUnknown;
  }
  int readOnly = 0;
  if (WLIBShareIsReadOnlyGet(share, &readOnly) < 0) {
    return IndexRule::kShareStateUnknown;
  }
  if (encrypted != 0) {
    return IndexRule::kEncryptedShare;
  }
  if (readOnly != 0) {
    return IndexRule::kReadOnlyShare;
  }
  return IndexRule::kIndexable;
}

struct RuleText {
  IndexRule rule;
  const char* key;
  const char* description;
};
// One line per rule, in the order of the enumeration.
constexpr std::array<RuleText, 15> kRuleTexts = {{
    {IndexRule::kIndexable, "indexable", "the folder may be indexed"},
    {IndexRule::kRecycleBin, "recycle_bin", "the folder is in a share's recycle bin"},
    {IndexRule::kSnapshot, "snapshot", "the folder is in a snapshot"},
    {IndexRule::kUnknownFileSystem, "unknown_file_system",
     "the folder's file system cannot be told (or the folder does not exist)"},
    {IndexRule::kRemoteFileSystem, "remote_file_system", "the folder is on a network file system"},
    {IndexRule::kImageFileSystem, "image_file_system", "the folder is on a disk-image file system"},
    {IndexRule::kNeverIndexedFileSystem, "never_indexed_file_system",
     "the folder is on a file system that is never indexed"},
    {IndexRule::kNoShare, "no_share", "no share holds the folder"},
    {IndexRule::kShareUnreadable, "share_unreadable",
     "the share database gave no record for the share"},
    {IndexRule::kExcludedShare, "excluded_share", "the share is one that is never indexed"},
    {IndexRule::kShareStateUnknown, "share_state_unknown",
     "whether the share is encrypted or read-only cannot be told"},
    {IndexRule::kEncryptedShare, "encrypted_share", "the share is encrypted"},
    {IndexRule::kReadOnlyShare, "read_only_share", "the share is read-only"},
    {IndexRule::kMountPoint, "mount_point",
     "the folder is a mount point on a share not set up for encryption"},
    {IndexRule::kResolvesElsewhere, "resolves_elsewhere",
     "the path is not exactly the folder it resolves to (link, trailing slash, \".\", \"..\", "
     "doubled slash) or the folder does not exist"},
}};

const RuleText* FindRuleText(IndexRule rule) {
  for (const RuleText& text : kRuleTexts) {
    if (text.rule == rule) {
      return &text;
    }
  }
  return nullptr;
}

// What the folder rules ask of a share: looked up once per folder, or once per pass.
struct ShareFacts {
  ShareRecord record;  // null when the lookup failed
  IndexRule rule = IndexRule::kShareUnreadable;
  bool mountRuleKnown = false;
  bool refusesMountPoint = false;
};

ShareFacts LookedUp(const std::string& name) {
  ShareFacts facts;
  if (LookUpShare(name, facts.record) < 0 || !facts.record) {
    FILEINDEX_LOG("WEZOShareGet failed, share=%s", name.c_str());
    facts.record.reset();
    return facts;
  }
  facts.rule = ShareIndexRule(facts.record.get());
  return facts;
}

// A volume mounted inside a share is refused, except on a share set up for encryption, whose own
// directory is such a mount. A share whose encryption setting cannot be read lets it through.
bool RefusesMountPoint(ShareFacts& share) {
  if (!share.mountRuleKnown) {
    int encryption = 0;
    share.refusesMountPoint =
        WLIBShareIsEncryptionGet(share.record.get(), &encryption) == 0 && encryption == 0;
    share.mountRuleKnown = true;
  }
  return share.refusesMountPoint;
}

// The folder must be exactly where it says: no symbolic link on the way, no trailing slash, no
// "." or ".." and no doubled slash; and it must exist.
bool ResolvesToItself(const std::string& path) {
  char resolved[PATH_MAX];
  return realpath(path.c_str(), resolved) != nullptr && path == resolved;
}

// ResolvesToItself(path), with the answers for directories kept in `dirs`. A resolved path is
// clean, exists and has no symbolic link in it, so a path resolves to itself exactly when its
// directory does and its last name is a clean one that exists and is no symbolic link: one lstat
// per directory of the pass and per folder, where realpath reads every component of every path.
// NOLINTNEXTLINE(misc-no-recursion): one level per component of a path shorter than PATH_MAX
bool ResolvesToItselfIn(const std::string& path, std::map<std::string, bool>& dirs) {
  // No resolved path is as long as PATH_MAX.
  if (path.size() >= PATH_MAX) {
    return false;
  }
  const size_t slash = path.rfind('/');
  if (slash == std::string::npos || slash == 0) {
    return ResolvesToItself(path);
  }
  const std::string name = path.substr(slash + 1);
  if (name.empty() || name == "." || name == ".." || path.find('\0') != std::string::npos) {
    return false;
  }
  std::string dir = path.substr(0, slash);
  auto known = dirs.find(dir);
  if (known == dirs.end()) {
    const bool resolves = ResolvesToItselfIn(dir, dirs);
    known = dirs.emplace(std::move(dir), resolves).first;
  }
  struct stat st {};
  return known->second && lstat(path.c_str(), &st) == 0 && !S_ISLNK(st.st_mode);
}

}  // namespace

struct EligibilityPass::Memo {
  std::map<std::string, ShareFacts> shares;  // by share name
  std::map<std::string, bool> dirs;          // whether the directory resolves to itself
};

namespace {

// The folder rules in their order, with share facts and directories kept in `memo` if given.
IndexRule RuleOf(const std::string& fullPath, EligibilityPass::Memo* memo) {
  if (InRecycleBin(fullPath)) {
    return IndexRule::kRecycleBin;
  }
  if (InSnapshot(fullPath)) {
    return IndexRule::kSnapshot;
  }
  const IndexRule fileSystem = FileSystemRule(WEZOGetFSType(fullPath.c_str(), 0));
  if (fileSystem != IndexRule::kIndexable) {
    return fileSystem;
  }

  std::string shareName;
  std::string sharePath;
  if (!GetShareNamePathByFullPath(shareName, sharePath, fullPath)) {
    FILEINDEX_LOG("GetShareNamePathByFullPath failed, path=%s", fullPath.c_str());
    return IndexRule::kNoShare;
  }
  ShareFacts own;
  ShareFacts* share = &own;
  if (memo != nullptr) {
    auto known = memo->shares.find(shareName);
    if (known == memo->shares.end()) {
      known = memo->shares.emplace(shareName, LookedUp(shareName)).first;
    }
    share = &known->second;
  } else {
    own = LookedUp(shareName);
  }
  if (share->rule != IndexRule::kIndexable) {
    return share->rule;
  }

  if (WEZOFSDirIsMntPoint(fullPath.c_str()) == 1 && RefusesMountPoint(*share)) {
    FILEINDEX_LOG("Mount point[%s] is not allowed to be indexed", fullPath.c_str());
    return IndexRule::kMountPoint;
  }
  if (!(memo != nullptr ? ResolvesToItselfIn(fullPath, memo->dirs) : ResolvesToItself(fullPath))) {
    FILEINDEX_LOG("check realpath failed, path=%s", fullPath.c_str());
    return IndexRule::kResolvesElsewhere;
  }
  return IndexRule::kIndexable;
}

}  // namespace

EligibilityPass::EligibilityPass() : m_memo(std::make_unique<Memo>()) {}

EligibilityPass::~EligibilityPass() = default;

IndexRule EligibilityPass::FullPathRule(const std::string& fullPath) {
  return RuleOf(fullPath, m_memo.get());
}

bool EligibilityPass::CanPathBeIndexed(const std::string& path) {
  std::string fullPath;
  if (!GetFullPath(fullPath, path)) {
    FILEINDEX_LOG("GetFullPath failed, path=%s", path.c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_PATH);
    return false;
  }
  return FullPathRule(fullPath) == IndexRule::kIndexable;
}

bool CanShareBeIndexed(_tag_WEZOSHARE* share) {
  return ShareIndexRule(share) == IndexRule::kIndexable;
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
  const IndexRule rule = FileSystemRule(fsType);
  return rule != IndexRule::kIndexable && rule != IndexRule::kUnknownFileSystem;
}

IndexRule FullPathIndexRule(const std::string& fullPath) { return RuleOf(fullPath, nullptr); }

bool CanFullPathBeIndexed(const std::string& fullPath) {
  return FullPathIndexRule(fullPath) == IndexRule::kIndexable;
}

const char* IndexRuleKey(IndexRule rule) {
  const RuleText* text = FindRuleText(rule);
  return text != nullptr ? text->key : "unknown";
}

const char* DescribeIndexRule(IndexRule rule) {
  const RuleText* text = FindRuleText(rule);
  return text != nullptr ? text->description : "no rule of the folder check";
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
