/// \file
/// A JSON configuration file guarded by a lock file of its own.
///
/// Config owns one parsed JSON document, reads it from and writes it to the file that GetPath()
/// names, and takes an advisory flock() on the separate lock file that GetLockPath() names. Derived
/// classes supply the two paths and the translation between the document and their own members.
///
/// An object is meant for one cycle: construct, Lock(true), Load(), read or change, Save(),
/// Unlock(), destroy. Unlock() is always an explicit call, also after a failed Lock() or Load();
/// the destructor neither unlocks nor closes. The lock orders processes against each other; two
/// objects in one process lock independently. Nothing here is thread-safe.
#ifndef FILEINDEX_CONFIG_H_
#define FILEINDEX_CONFIG_H_

#include <json/value.h>

#include <string>

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// The base of the configuration files: one JSON document and its lock; see the file's
/// description.
class FILEINDEX_EXPORT Config {
 public:
  Config();
  virtual ~Config();

  Config(const Config&) = delete;
  Config& operator=(const Config&) = delete;

  /// Reads the file into the derived class's members. Returns false on failure, with a code set.
  virtual bool Load() = 0;
  /// Writes the derived class's members to the file. Returns false on failure, with a code set.
  virtual bool Save() = 0;
  /// The lock file's path, already under the root prefix.
  virtual std::string GetLockPath() const = 0;
  /// The configuration file's path, already under the root prefix.
  virtual std::string GetPath() const = 0;

  /// Fills the document from the file at GetPath(). A missing file, or a symbolic link in its
  /// place, is not an error: the document stays as it is (an empty object for a new object) and
  /// the result is true. Returns false with FILEINDEX_ERR_LOAD_JSON, logged, when the file cannot
  /// be read or parsed.
  bool LoadJson();

  /// Replaces the file at GetPath() with the document, atomically: readers see the old file or the
  /// new one, never a part. The new file has mode 0644. Returns false with
  /// FILEINDEX_ERR_SAVE_JSON, logged, when the file cannot be written (the old file then stays);
  /// a mode that cannot be set is only logged. While this object holds the lock, temporary files
  /// that writers killed in the middle of a save left beside the file are removed first.
  bool SaveJson();

  /// Opens the lock file at GetLockPath() (created, or narrowed, to mode 0600) and takes a shared
  /// or exclusive flock without blocking. A busy lock is tried three times in all, with sleeps of
  /// 0 to 9 ms in between. Returns false with FILEINDEX_ERR_LOCK, logged, when the lock file cannot
  /// be opened (a symbolic link there is refused), is not a regular file of this process's
  /// effective user with a single link (refused with a line of its own), flock fails otherwise,
  /// or all three attempts find it busy.
  bool Lock(bool exclusive);

  /// Releases the lock and closes the lock file. Does nothing when no lock file is open, so a
  /// second call, or a call after a failed Lock(), is harmless.
  void Unlock();

 protected:
  /// The parsed document, read by LoadJson() and written by SaveJson().
  Json::Value m_jsRoot;  // NOLINT(misc-non-private-member-variables-in-classes)

 private:
  int m_lockFd;
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_CONFIG_H_
