/// \file
/// The status manager: pausing and resuming indexing, the per-share flags, and progress reports.
///
/// Every operation is a self-contained transaction on the status file (fileindex/status.h). A
/// change takes the status lock, loads, changes, saves, tells the indexing daemon where it needs
/// to know, and unlocks; the daemon is told after the save, while the lock is still held, so it
/// never reads an older state than the command announces. A query loads without the lock and so
/// answers while another process holds it. Callable from any process; no state is kept between
/// calls. Failures return false with a code set by the status file (fileindex/config.h), except
/// where a comment says otherwise.
#ifndef FILEINDEX_STATUS_MGR_H_
#define FILEINDEX_STATUS_MGR_H_

#include <string>

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// The status manager's operations, all static; see the file's description.
class FILEINDEX_EXPORT StatusMgr {
 public:
  StatusMgr() = delete;

  /// Sets the one-time marker `key`.
  static bool SetUpdated(const std::string& key);
  /// True when the marker `key` is set; false also when the status file cannot be read.
  static bool IsUpdated(const std::string& key);

  /// Flags the share `share` for, or clears it of, a full reindex.
  static bool ShareSetNeedReindex(const std::string& share, bool need);
  /// True when the share `share` is flagged for a full reindex; false also when the status file
  /// cannot be read.
  static bool ShareIsNeedReindex(const std::string& share);

  /// Flags the share `share` as out of room, or clears the flag. The first time a share is flagged
  /// the administrators are notified.
  static bool ShareSetNoSpace(const std::string& share, bool noSpace);
  /// True when the share `share` is flagged as out of room; false also when the status file
  /// cannot be read.
  static bool ShareIsNoSpace(const std::string& share);

  /// Clears the share's no-space flag and tells the daemon to start the share's worker again.
  /// Leaves a pending full reindex flagged. False also when the daemon could not be told; the
  /// flag is cleared all the same.
  static bool ShareRevive(const std::string& share);

  /// Stores in `resumeTime` -1 (not paused), 0 (paused until resumed) or the Unix time at which
  /// indexing resumes by itself. False, with `resumeTime` untouched, when the status file cannot
  /// be read or holds a malformed time.
  static bool GetPauseInfo(long long& resumeTime);

  /// Ends a pause and tells the daemon. False also when the daemon could not be told; the status
  /// file says "not paused" all the same.
  static bool Resume();

  /// Pauses indexing for `hours` hours from now, or until resumed when `hours` is 0, and tells the
  /// daemon; pausing while paused replaces the end. Refuses, with FILEINDEX_ERR_BAD_PARAM and
  /// nothing changed, a negative `hours` and one whose end would lie past 2^31 - 1 seconds since
  /// the epoch: the daemon keeps the end as a signed 32-bit count. False also when the daemon could
  /// not be told; the pause is stored all the same.
  static bool Pause(const int& hours);

  /// Stores in `status` "finished" when no share holding indexable folders has pending events,
  /// otherwise "processing", or "paused" while indexing is paused. Returns false, with `status`
  /// untouched, when the folder list, a share or the pause state cannot be read.
  static bool GetStatus(std::string& status);

  /// The progress of the indexed folder `path` (a share path as stored in the folder list):
  /// "paused" when the folder may not be indexed at the moment, "err_no_space" when its share is
  /// out of room, "finished" when no pending event concerns the folder, otherwise "processing" or
  /// "paused" as for GetStatus. Never fails: a folder whose share or queue cannot be resolved
  /// reports "finished" (logged).
  static std::string GetFolderStatus(const std::string& path);
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_STATUS_MGR_H_
