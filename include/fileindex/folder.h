/// \file
/// One indexed folder: where it is, what the user calls it, and which kinds of files are indexed
/// in it.
///
/// A Folder is one member of the folder list (fileindex/folders.h): the member's name is the
/// folder's share path and its value is the folder's JSON form. A Folder can also compute values
/// on request ("additional" values): whether it may still be indexed, and its indexing status.
/// Objects are plain values; nothing here is shared between threads.
#ifndef FILEINDEX_FOLDER_H_
#define FILEINDEX_FOLDER_H_

#include <json/value.h>

#include <string>

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// One indexed folder of the folder list, as a plain value.
class FILEINDEX_EXPORT Folder {
 public:
  /// An empty folder: empty strings and no kind of file indexed.
  Folder() = default;

  /// Sets the share path to `path`, then takes "name", "document", "audio", "video" and "photo"
  /// from `obj` where they are present with the right type (a missing or wrongly typed member
  /// leaves that field as it was), then derives the full path. Returns false when the share path
  /// cannot be resolved to a full path (the other fields are set all the same).
  bool Load(const std::string& path, const Json::Value& obj);

  /// Resets every field (empty strings, no kind indexed), then Load(path, obj).
  bool Reload(const std::string& path, const Json::Value& obj);

  /// Sets the share path and derives the full path. Returns false when it cannot be resolved.
  bool SetPath(const std::string& path);

  /// The full path ("/volume1/photo/2019"). When it was never derived, derives it now without
  /// storing it; returns "" (logged) when the share path cannot be resolved.
  std::string GetFullPath() const;

  /// True when the full path was derived as the share path was last set. False for a folder whose
  /// share was gone then: it holds no full path, and GetFullPath would try again and log.
  bool HasFullPath() const { return !m_fullPath.empty(); }

  const std::string& GetPath() const { return m_path; }  ///< The share path ("/photo/2019").
  const std::string& GetName() const { return m_name; }  ///< The name the user gave the folder.
  bool GetDocument() const { return m_document; }        ///< Whether documents are indexed.
  bool GetAudio() const { return m_audio; }              ///< Whether audio files are indexed.
  bool GetVideo() const { return m_video; }              ///< Whether videos are indexed.
  bool GetPhoto() const { return m_photo; }              ///< Whether photos are indexed.

  /// The JSON form: an object with exactly "path", "name", "document", "audio", "video", "photo".
  Json::Value asJson() const;

  /// The JSON form plus a member "additional" holding the values that `additional` (an array of
  /// names) asks for, as GetAdditional(out, names) computes them. Always returns the object;
  /// "additional" is an empty object when `additional` is not an array (logged, code 1).
  Json::Value asJson(const Json::Value& additional) const;

  /// Stores the JSON form in the folder-list object `obj` under the share path, replacing a folder
  /// stored there. Returns false, changing nothing, when `obj` is not an object.
  bool AddToJson(Json::Value& obj) const;

  /// One additional value by name: "is_valid" (bool, whether the folder may be indexed) or
  /// "status" (string, the folder's indexing status). Any other name (compared case-sensitively)
  /// logs, sets FILEINDEX_ERR_BAD_PARAM and returns false.
  bool GetAdditional(Json::Value& out, const std::string& name) const;

  /// Several additional values: `out` becomes an object with one member per name of the array
  /// `names`. A name that fails leaves its member null and the others are still computed; the
  /// result is then true with FILEINDEX_ERR_BAD_PARAM set. Returns false with that code when
  /// `names` is not an array or holds a non-string (members computed so far stay in `out`).
  bool GetAdditional(Json::Value& out, const Json::Value& names) const;

 private:
  std::string m_fullPath;
  std::string m_path;
  std::string m_name;
  bool m_document = false;
  bool m_audio = false;
  bool m_video = false;
  bool m_photo = false;
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_FOLDER_H_
