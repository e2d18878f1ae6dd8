/// \file
/// The index manager: the operations callers use on the list of indexed folders, the questions
/// whether something is indexed, the share lifecycle, and the registration of each share's indexed
/// folders with the platform's file-change monitor.
///
/// Every operation is static and self-contained: it reads folder.conf afresh through a short-lived
/// Folders object and keeps nothing between calls. Callable from any process. Operations that
/// change the folder list hold its exclusive lock from the load to the end, so the daemon and the
/// monitor are told of a list that is already saved; one that meets another writer holding the
/// lock fails with FILEINDEX_ERR_LOCK instead of waiting. Batches are not transactional: once the
/// list is saved, a later failure (of the monitor, the service, the daemon or a queue) returns
/// false and leaves what was done in place.
///
/// Requests are JSON values. A request of the wrong shape is refused with FILEINDEX_ERR_BAD_PARAM
/// and a "Bad param" log line, the folder list left as it was; no exception leaves these
/// operations. Every share path a request names must be clean: it starts with "/", has no empty,
/// "." or ".." component (so no doubled or trailing slash) and holds no NUL byte. A path that is
/// already the key of a folder in the list is taken as it is stored, since earlier versions stored
/// paths that this rule refuses. Every share name must be the name a share can have: not empty,
/// no "/", no NUL byte, not "." or "..".
#ifndef FILEINDEX_INDEX_MGR_H_
#define FILEINDEX_INDEX_MGR_H_

#include <json/value.h>

#include <string>
#include <vector>

#include "fileindex/export.h"
#include "fileindex/folder.h"

namespace WEZO {
namespace FILEINDEX {

/// The index manager's operations, all static; see the file's description.
class FILEINDEX_EXPORT IndexMgr {
 public:
  IndexMgr() = delete;

  /// Stores every indexed folder in `folders`, in byte order of their share paths. Reads without
  /// the folder list's lock, so it sees the list as the last complete save left it. Returns false,
  /// with the code of Folders::Load, when folder.conf cannot be read.
  static bool List(std::vector<Folder>& folders);

  /// One page of the folder list as JSON, exactly as Folders::List (fileindex/folders.h) builds it
  /// from the same arguments. Reads without the lock. False when folder.conf cannot be read.
  static bool List(Json::Value& result, unsigned long offset, unsigned long limit,
                   const std::string& sortBy, const std::string& sortDirection,
                   const Json::Value& additional);

  /// Stores the JSON form of the indexed folder at share path `path` in `result`. Unlike the other
  /// queries it takes the folder list's lock, so it fails (FILEINDEX_ERR_LOCK) while another
  /// process changes the list. False with FILEINDEX_ERR_NO_SUCH_FOLDER when `path` is not indexed.
  static bool Get(Json::Value& result, const std::string& path);

  /// The membership questions. A path lies in a folder when it is the folder or below it, with
  /// "/" as the boundary ("/photo/2016" lies in "/photo", "/photos" does not). Paths are compared
  /// byte for byte, with no other normalisation: a trailing slash or another case makes another
  /// path. The forms that take `folders` ask a list the caller already read; the others read
  /// folder.conf without the lock and answer false when it cannot be read. None sets a code.
  ///
  /// True when the share path `path` is an indexed folder or lies in one.
  static bool IsPathIndexed(const std::string& path, const std::vector<Folder>& folders);
  /// The same, reading folder.conf without the lock.
  static bool IsPathIndexed(const std::string& path);
  /// The same for a full path ("/volume1/photo/2016"), compared with each folder's full path. A
  /// folder whose share is gone holds no full path and is passed over without a log line.
  static bool IsFullPathIndexed(const std::string& fullPath, const std::vector<Folder>& folders);
  /// The same, reading folder.conf without the lock.
  static bool IsFullPathIndexed(const std::string& fullPath);
  /// True when an indexed folder is the share path `path` or lies below it ("/photo" asks whether
  /// anything in the share is indexed; "" matches every folder, "/" none).
  static bool IsPathContainIndexed(const std::string& path, const std::vector<Folder>& folders);
  /// The same, reading folder.conf without the lock.
  static bool IsPathContainIndexed(const std::string& path);
  /// True when at least one indexed folder lies in the share named `share` (a name, no slashes).
  static bool IsShareIndexed(const std::string& share);

  /// Adds folders to the list or changes their settings. `folders` is an array of folder
  /// descriptions, each {"path": \<share path\>, "name": ..., "document": ..., "audio": ...,
  /// "video": ..., "photo": ...} as Folders::Upsert takes it (a listed folder takes the element's
  /// settings, with the ones it lacks at their defaults). In order: the list is saved; each
  /// share concerned is registered again with the monitor (ascending by name); the service
  /// fileindexd is started; Spotlight over SMB is switched on, and the SMB service restarted,
  /// when it was off (a failure there is only logged); the daemon gets one "upsert_folder_setting"
  /// command per element; and each distinct path gets one update event, carrying its change
  /// report, in its share's queue (ascending by path). An empty array still starts the service.
  /// False with FILEINDEX_ERR_BAD_PARAM when `folders` is not an array, an element's path is not
  /// clean (see above) or an element is refused by Folders::Upsert,
  /// FILEINDEX_ERR_EXCEED_MAX_FOLDER when the list would grow past Folders::kMaxFolders (nothing
  /// saved in both cases), FILEINDEX_ERR_PATH when a full path cannot be formed for an event;
  /// otherwise with the code of the step that failed.
  static bool Upsert(const Json::Value& folders);
  /// Another name of Upsert.
  static bool Set(const Json::Value& folders);
  /// Another name of Upsert.
  static bool Add(const Json::Value& folders);

  /// Removes folders from the list. `paths` is an array of share paths as JSON strings; a path
  /// that is not in the list removes nothing. After the save: when no folder is left at all, the
  /// service fileindexd is stopped and Spotlight switched off (failures only logged) and the
  /// daemon is told nothing; otherwise the daemon gets one "delete_folder_setting" command per
  /// element, and the setting that now applies at the last path is queued as its update event.
  /// Then each share concerned is registered again with its remaining folders, or, when it has
  /// none left, has its index data removed (CleanShareIndexData) and its registration dropped.
  /// False with FILEINDEX_ERR_BAD_PARAM, nothing changed, when `paths` is not an array of strings
  /// or one of them is not clean (see above); otherwise with the code of the step that failed.
  static bool Delete(const Json::Value& paths);

  /// Queues a full reindex (kEventReindex) of each share path of the array `paths`, in order.
  /// Nothing is queued unless every element is a string in a share that has at least one indexed
  /// folder (the path itself need not be indexed). Shares flagged out of space are revived first;
  /// a revive that fails is logged and does not stop the reindex. False with
  /// FILEINDEX_ERR_BAD_PARAM, nothing queued, for a non-array, or an element that is not a string or
  /// not clean (see above); FILEINDEX_ERR_PATH when a full path cannot be formed; events queued for
  /// earlier elements then stay queued.
  static bool Reindex(const Json::Value& paths);

  /// Queues an update event (kEventUpdate) of the share path `path` with `data` as its payload.
  /// False with FILEINDEX_ERR_BAD_PARAM, nothing queued, when `path` is not clean (see above); with
  /// FILEINDEX_ERR_PATH when the path's full path cannot be formed, or when the queue refuses the
  /// event (logged by the queue).
  static bool Update(const std::string& path, const Json::Value& data);

  /// The share lifecycle. Each takes share names, not paths. A name that no share can have (see
  /// above; "" in particular, which the folder list reads as every share) is refused with
  /// FILEINDEX_ERR_BAD_PARAM and a "Bad param" line before anything is touched. Otherwise they set
  /// no code of their own: after a failure the code is the failing step's.
  ///
  /// The share was removed: its folders leave the list. When the list becomes empty, the service
  /// fileindexd is stopped and Spotlight switched off (failures only logged). The monitor
  /// registration, the index data and the daemon are left alone.
  static bool ShareRemove(const std::string& share);
  /// The share was renamed: each of its folders moves to the same place under `newShare`, with
  /// its name and settings and the rest of its path as stored. Only the list changes.
  static bool ShareRename(const std::string& oldShare, const std::string& newShare);
  /// The share went offline: the daemon stops the share's worker ("delete_share_worker"), then the
  /// share's monitor registration is removed. False, with the registration kept, when the daemon
  /// cannot be told.
  static bool SharePause(const std::string& share);
  /// The share is back: its monitor registration is restored, then the daemon revives the share's
  /// worker ("revive_share_worker").
  static bool ShareResume(const std::string& share);
  /// Removes the share's event queue, its ".tmp" companion and its index database directory with
  /// everything in it. A symbolic link on the way is never followed; a link in one of their places
  /// is removed itself. What is already missing counts as removed. False when the share's storage
  /// locations cannot be formed, or when a location could not be removed (each such location is
  /// logged, and the others are still removed).
  static bool CleanShareIndexData(const std::string& share);

  /// Registers the indexed folders of the share `share` with the file-change monitor, replacing
  /// the share's previous registration: the monitor then appends the events under each folder
  /// (except in the metadata directory "@eaDir") to the share's event queue. A share without
  /// indexed folders is registered with none. Returns false, logged and with the previous
  /// registration left as it was, when the queue, the folder list or a folder's full path cannot
  /// be resolved or the monitor refuses. Sets no error code.
  static bool UpsertWEZotifydCfg(const std::string& share);

  /// Removes the share's registration from the file-change monitor; one that does not exist counts
  /// as removed. Returns false, logged, when the queue cannot be resolved or the monitor refuses.
  /// Sets no error code.
  static bool DeleteWEZotifydCfg(const std::string& share);
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_INDEX_MGR_H_
