/// \file
/// The list of indexed folders, kept in /usr/wezo/etc/fileindex/folder.conf under the lock file
/// /tmp/fileidx_cfg_folder.lock.
///
/// The file is one JSON object; each member is one folder, named by its share path, whose value is
/// the folder's JSON form (fileindex/folder.h). Members are written in byte order of their names.
/// At most kMaxFolders folders are kept.
///
/// Every operation below except Load and Save works on the list held in memory: the caller locks
/// and loads first, saves when it changed something, and unlocks (fileindex/config.h).
#ifndef FILEINDEX_FOLDERS_H_
#define FILEINDEX_FOLDERS_H_

#include <json/value.h>

#include <map>
#include <string>
#include <vector>

#include "fileindex/config.h"
#include "fileindex/export.h"
#include "fileindex/folder.h"

namespace WEZO {
namespace FILEINDEX {

/// The list of indexed folders, folder.conf: load, save, list, get, upsert and delete.
class FILEINDEX_EXPORT Folders : public Config {
 public:
  /// The most folders the list may hold.
  static constexpr size_t kMaxFolders = 1000;

  Folders() = default;
  ~Folders() override = default;
  Folders(const Folders&) = delete;
  Folders& operator=(const Folders&) = delete;

  /// Reads the file into the list. A missing file is an empty list. A folder whose share cannot be
  /// resolved is kept, with an empty full path, and sets no code. Returns false with
  /// FILEINDEX_ERR_LOAD_JSON when the file cannot be read, or FILEINDEX_ERR_MALFORMED_FOLDERS
  /// (logged, list unchanged) when it does not hold a JSON object.
  bool Load() override;

  /// Replaces the file with the list, in key order, mode 0644. Returns false with
  /// FILEINDEX_ERR_SAVE_JSON when it cannot be written.
  bool Save() override;

  std::string GetLockPath() const override;
  std::string GetPath() const override;

  /// Copies every folder into `out`, replacing its content, in byte order of the share paths.
  /// Never fails.
  bool List(std::vector<Folder>& out) const;

  /// The same for the folders whose share path names the share `share` (compared case-sensitively);
  /// an empty `share` lists every folder.
  bool List(std::vector<Folder>& out, const std::string& share) const;

  /// One page of the list as JSON: {"total": \<folders\>, "offset": `offset`, "folder": [...]},
  /// each folder in its JSON form with the additional values that `additional` names. The folders
  /// are sorted by `sort_by` ("name", "document", "audio", "video", "photo"; anything else sorts by
  /// share path), names and paths without regard to case, folders lacking a kind before those
  /// having it. With `sort_direction` "DESC" the page holds the first entries of the ascending
  /// order in reverse, as many as an ascending page at `offset` would hold; otherwise it holds up
  /// to `limit` entries from `offset` on. An offset past the end gives an empty page. Always true.
  bool List(Json::Value& out, unsigned long offset, unsigned long limit, const std::string& sort_by,
            const std::string& sort_direction, const Json::Value& additional) const;

  /// Stores the JSON form of the folder at share path `path` in `out`. Returns false with
  /// FILEINDEX_ERR_NO_SUCH_FOLDER (logged) when the list has no such folder.
  bool Get(Json::Value& out, const std::string& path) const;

  /// Adds the folder that `request` describes ("path", a share path, and the fields that
  /// Folder::Load reads), or replaces the settings of the folder already at that path with the
  /// request's: a field the request lacks returns to its default (empty name, kind not indexed),
  /// as Folder::Reload does. On success `result` becomes the change report: {"document", "audio",
  /// "video", "photo"}, each true when the setting that applies at the folder's location differs
  /// from the one that applied before. Returns false with FILEINDEX_ERR_BAD_PARAM (logged) when the
  /// request has no string "path" or its share is unknown; with FILEINDEX_ERR_EXCEED_MAX_FOLDER
  /// (logged) when a new folder would make more than kMaxFolders. After a false result the list in
  /// memory may hold the refused folder: do not save it. The path is otherwise taken as it is, so
  /// that stored records move unchanged (a share's rename); a path that a caller hands in is
  /// checked by the index manager (fileindex/index_mgr.h) before it gets here.
  bool Upsert(Json::Value& result, const Json::Value& request);

  /// Removes the folder at `path` (a path not in the list removes nothing). On success `result`
  /// becomes {path: change report} for the folder's location; when the path's share cannot be
  /// resolved, `result` is left as it was. Always true.
  bool Delete(Json::Value& result, const std::string& path);

 private:
  std::map<std::string, Folder> m_folders;
};

/// The JSON form of the folder whose setting applies at `fullPath`: of the folders whose full path
/// is `fullPath` or one of its ancestors, the last in the vector's order (in a list from
/// Folders::List, the deepest one). An empty object when none applies.
FILEINDEX_EXPORT Json::Value GetMostSuitableCfg(std::vector<Folder> folders,
                                                const std::string& fullPath);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_FOLDERS_H_
