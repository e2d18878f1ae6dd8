/// \file
/// What may be indexed: whether a share may hold indexed folders, whether a folder may be added to
/// the folder list, whether an item met while crawling is skipped, and whether a share's volume
/// still has room for index data.
///
/// Plain predicates over the platform's share database and file-system queries; none changes any
/// state, and a failing platform query answers "no" unless a comment says otherwise. Reentrant.
#ifndef FILEINDEX_ELIGIBILITY_H_
#define FILEINDEX_ELIGIBILITY_H_

#include <string>

#include "fileindex/export.h"

/// A share record of the platform's share database (wezo/platform.h).
struct _tag_WEZOSHARE;  // NOLINT(bugprone-reserved-identifier,cert-dcl37-c,cert-dcl51-cpp)

namespace WEZO {
namespace FILEINDEX {

/// True when the share may hold indexed folders: not one of the excluded shares ("surveillance",
/// "NetBackup", case-sensitive), not encrypted and not read-only. False for a null share or when
/// the platform cannot answer.
FILEINDEX_EXPORT bool CanShareBeIndexed(_tag_WEZOSHARE* share);

/// True when the single name `name` is never indexed: the platform's hidden metadata directory,
/// the index's own database and queue, and a few system files (compared case-sensitively).
FILEINDEX_EXPORT bool IsSystemPreservedFileName(const std::string& name);

/// True when the item at `fullPath`, met while crawling, is to be skipped: a string without "/",
/// a never-indexed name, something in a recycle bin or snapshot, or on a network, image or
/// never-indexed file system. An item whose file-system type is unknown is not skipped.
FILEINDEX_EXPORT bool IsSkipIndex(const std::string& fullPath);

/// The rule that decides whether a folder may be added to the folder list, as
/// CanFullPathBeIndexed applies them, in that order.
enum class IndexRule {
  kIndexable = 0,           ///< every rule lets the folder through
  kRecycleBin,              ///< in a share's recycle bin
  kSnapshot,                ///< in a snapshot
  kUnknownFileSystem,       ///< file-system type cannot be told (also: the path does not exist)
  kRemoteFileSystem,        ///< network file system
  kImageFileSystem,         ///< disk-image file system
  kNeverIndexedFileSystem,  ///< a file system that is never indexed (type 12)
  kNoShare,                 ///< no share holds the path
  kShareUnreadable,         ///< the share database gave no record for the share
  kExcludedShare,           ///< one of the excluded shares
  kShareStateUnknown,       ///< the share's encrypted or read-only state could not be read
  kEncryptedShare,
  kReadOnlyShare,
  kMountPoint,         ///< a mount point on a share not set up for encryption
  kResolvesElsewhere,  ///< realpath fails or differs (link, trailing slash, ".", "..", "//",
                       ///< missing)
};

/// The first rule that refuses the folder at `fullPath`, or kIndexable when none does. Asks the
/// platform exactly what CanFullPathBeIndexed asks and logs the same lines; a share that is both
/// encrypted and read-only gives kEncryptedShare. Sets FILEINDEX_ERR_PATH only with kNoShare
/// (GetShareNamePathByFullPath).
FILEINDEX_EXPORT IndexRule FullPathIndexRule(const std::string& fullPath);

/// The stable lower-case key of `rule`, for scripts: "indexable", "recycle_bin", "snapshot",
/// "unknown_file_system", "remote_file_system", "image_file_system", "never_indexed_file_system",
/// "no_share", "share_unreadable", "excluded_share", "share_state_unknown", "encrypted_share",
/// "read_only_share", "mount_point", "resolves_elsewhere"; "unknown" for a value outside the
/// enumeration. Never null; the text is static.
FILEINDEX_EXPORT const char* IndexRuleKey(IndexRule rule);

/// A short English explanation of `rule` ("the share is read-only"), for people. Never null; the
/// text is static and may change between versions, unlike the key.
FILEINDEX_EXPORT const char* DescribeIndexRule(IndexRule rule);

/// True when the folder at `fullPath` may be added to the folder list: FullPathIndexRule gives
/// kIndexable. That is: not in a recycle bin or snapshot, on a known local file system, in a share
/// that may be indexed, not a mount point (unless the share is set up for encryption), and
/// `fullPath` is exactly what it resolves to (no symbolic link, trailing slash, "." or ".."
/// component; the folder exists). Sets FILEINDEX_ERR_PATH only when no share holds `fullPath`.
FILEINDEX_EXPORT bool CanFullPathBeIndexed(const std::string& fullPath);

/// CanFullPathBeIndexed for the share path `path`. Returns false with FILEINDEX_ERR_PATH (logged)
/// when the share path cannot be resolved.
FILEINDEX_EXPORT bool CanPathBeIndexed(const std::string& path);

/// True when the volume of the share `shareName` has room for 10 MiB of index data. Only a definite
/// "no space" or "over quota" answer of the platform gives false; an unknown share gives false too.
FILEINDEX_EXPORT bool IsShareSpaceEnough(const std::string& shareName);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_ELIGIBILITY_H_
