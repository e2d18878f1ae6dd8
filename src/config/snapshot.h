// What this process last read of folder.conf and status.conf, kept for the questions that are asked
// all the time ("is this path indexed", "is this share out of space"), so that answering one costs
// a stat() of the file instead of a parse of it.
//
// A snapshot is reused while the file is the very file it was read from: same device, inode, size,
// and modification and change times to the nanosecond. Every save of either file is an atomic
// rename, so each save is a new inode. A file that had changed less than two seconds before it was
// read is never kept, only answered from: an inode number freed by a rename can come back, and a
// file system's timestamps are coarser than the time between two saves, but not coarser than two
// seconds. A missing file is an empty snapshot; a file that cannot be read or is malformed is
// read again (and logged again) at every question, as Folders::Load and Status::Load log it.
//
// Safe to call from several threads: the kept snapshot is a pointer to a constant value, swapped
// under a mutex; a caller copies the pointer and answers without the lock.
#ifndef FILEINDEX_SRC_CONFIG_SNAPSHOT_H_
#define FILEINDEX_SRC_CONFIG_SNAPSHOT_H_

#include <json/value.h>

#include <chrono>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "fileindex/status.h"

namespace WEZO {
namespace FILEINDEX {

// The folder list's share paths, enough for the share-path questions, which never need a full
// path, and the document they were read from, from which the listing builds its records.
class FolderSnapshot {
 public:
  explicit FolderSnapshot(std::vector<std::string> paths);
  // From a parsed folder.conf, a JSON object: its member names and the document itself.
  explicit FolderSnapshot(Json::Value document);

  // The parsed file, or null when this snapshot was made from a list loaded by Folders::Load.
  const Json::Value* Document() const { return m_hasDocument ? &m_document : nullptr; }

  // Whether a folder's path is `path` or one of its ancestors at a "/" boundary.
  bool IsPathIndexed(const std::string& path) const;
  // Whether a folder's path is `path` or lies below it at a "/" boundary.
  bool IsPathContainIndexed(const std::string& path) const;
  // Whether the full path `fullPath` lies in a folder whose share resolves now. Each share that
  // holds folders is looked up once; a share that cannot be resolved holds no full path. Neither
  // logs nor sets a code.
  bool IsFullPathIndexed(const std::string& fullPath) const;
  // Whether a folder's path names the share `share` (GetShareNameByPath).
  bool HoldsShare(const std::string& share) const;
  // Whether a folder is stored under the empty path, which names no share.
  bool HoldsUnnamedFolder() const { return m_unnamed; }
  bool Empty() const { return m_paths.empty(); }
  // The folders' share paths, in byte order, as Folders::List gives them.
  const std::vector<std::string>& Paths() const { return m_paths; }

 private:
  bool Holds(std::string_view path) const;

  std::vector<std::string> m_paths;   // byte order
  std::vector<std::string> m_shares;  // byte order, distinct
  bool m_unnamed = false;
  Json::Value m_document;
  bool m_hasDocument = false;
};

// A reading of folder.conf by the folder list itself, for a file that cannot be kept: the
// snapshot of the list as Folders::Load reads it, or null after a failure that it logged and set
// the code of. Given by the caller, since the folder list stands above this layer.
using FolderListLoader = std::shared_ptr<const FolderSnapshot> (*)();

// The folder list as folder.conf holds it now; null when the file cannot be read or holds no JSON
// object (logged by `load`, with the code that Folders::Load sets).
std::shared_ptr<const FolderSnapshot> FolderListSnapshot(FolderListLoader load);

// The status file as status.conf holds it now; null when it cannot be read (logged, with the code
// that Status::Load sets).
std::shared_ptr<const Status> StatusSnapshot();

namespace detail {

// Drops both kept snapshots; the next question reads the files again.
void ForgetConfigSnapshots();

// How long ago a file must have changed for its snapshot to be kept (two seconds unless set).
// For tests, which cannot wait for a file to age.
void SetSnapshotSettleTime(std::chrono::nanoseconds settle);

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_CONFIG_SNAPSHOT_H_
