/// \file
/// The status file /usr/wezo/etc/fileindex/status.conf, shared with the indexing daemon and guarded
/// by the lock file /tmp/fileidx_cfg_status.lock.
///
/// The file is one JSON object, every member optional:
///   "resume_time"   integer; -1 (or absent) not paused, 0 paused without end, otherwise paused
///                   until that time (seconds since the Unix epoch)
///   "need_reindex"  object; one member (value true) per share to index again from scratch
///   "no_space"      object; one member (value true) per share whose volume ran out of room
///   any other key   true; a one-time marker set by SetUpdated
///
/// The accessors only read and change the document in memory; the caller locks, loads, saves and
/// unlocks (fileindex/config.h). Callers normally go through the status manager.
#ifndef FILEINDEX_STATUS_H_
#define FILEINDEX_STATUS_H_

#include <string>

#include "fileindex/config.h"
#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// The status file, status.conf: pause state, per-share flags and one-time markers.
class FILEINDEX_EXPORT Status : public Config {
 public:
  Status() = default;
  ~Status() override = default;
  Status(const Status&) = delete;
  Status& operator=(const Status&) = delete;

  /// Config::LoadJson and Config::SaveJson, results unchanged.
  bool Load() override;
  bool Save() override;
  std::string GetLockPath() const override;
  std::string GetPath() const override;

  /// Sets the marker `key` to true. Always true.
  bool SetUpdated(const std::string& key);
  /// False when the marker `key` is absent; otherwise its value read as a boolean (a non-zero
  /// number reads true; a string, array or object reads false).
  bool IsUpdated(const std::string& key) const;

  /// Adds the share to, or removes it from, "need_reindex". Always true.
  bool ShareSetNeedReindex(const std::string& share, bool need);
  /// True when the share is listed in "need_reindex".
  bool ShareIsNeedReindex(const std::string& share) const;

  /// Adds the share to, or removes it from, "no_space". Adding a share that is not yet listed first
  /// notifies the administrators (NotifyNoSpace); a failed notification is logged and the flag is
  /// set all the same. Always true.
  bool ShareSetNoSpace(const std::string& share, bool noSpace);
  /// True when the share is listed in "no_space".
  bool ShareIsNoSpace(const std::string& share) const;

  /// Stores the pause state in `resumeTime` (-1 when absent). Returns false, logged and with
  /// `resumeTime` untouched, when "resume_time" is not a 64-bit integer.
  bool GetPauseInfo(long long& resumeTime) const;
  /// Sets the pause state to -1 (not paused). Always true.
  bool Resume();
  /// Sets the pause state to `resumeTime` (0: without end). Always true.
  bool Pause(long long resumeTime);

 private:
  /// The document as an object: a document of another type is replaced by an empty object,
  /// since nothing in it could be read as status.
  Json::Value& Root();
  /// The flag set `key` ("need_reindex", "no_space"), made an empty object when it is missing or
  /// not an object.
  Json::Value& FlagSet(const char* key);
  bool HasFlag(const char* key, const std::string& share) const;
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_STATUS_H_
