/// \file
/// Small helpers of the whole library: file tests, typed readers of JSON object members, a prefix
/// test, and the conversions between share names, share paths and full paths.
///
/// A share path names a place from the root of the shared folders and starts with a slash
/// ("/photo/2019"); a full path is the location in the file system ("/volume1/photo/2019").
/// All functions are reentrant; the path conversions ask the platform's share database.
#ifndef FILEINDEX_UTILS_H_
#define FILEINDEX_UTILS_H_

#include <json/value.h>

#include <string>

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// True exactly when lstat() of `path` succeeds and it is a directory. A symbolic link is never a
/// directory here, even when it points at one.
FILEINDEX_EXPORT bool IsDirExist(const std::string& path);

/// True exactly when lstat() of `path` succeeds and it is a regular file. A symbolic link is never
/// a file here, even when it points at one.
FILEINDEX_EXPORT bool IsFileExist(const std::string& path);

/// When `obj` is an object whose member `key` is a JSON string, stores it in `out` and returns
/// true. Otherwise (not an object, no such member, a member of another type) returns false and
/// leaves `out` as it was; nothing is converted.
FILEINDEX_EXPORT bool RetrieveStringFromJsonObj(std::string& out, const std::string& key,
                                                const Json::Value& obj);

/// The same for a JSON bool member: a string "true" or the number 1 does not count.
FILEINDEX_EXPORT bool RetrieveBoolFromJsonObj(bool& out, const std::string& key,
                                              const Json::Value& obj);

/// True when `str` begins with `prefix`, compared as C strings: false when `prefix` is longer than
/// `str`, true for an empty prefix; bytes after an embedded NUL are not compared.
FILEINDEX_EXPORT bool StringStartWith(const std::string& str, const std::string& prefix);

/// Stores in `shareName` the first component of the share path `path` ("/photo/2019" gives
/// "photo", "/" gives ""). The first character is taken to be the leading slash and never
/// examined, so "photo/2019" gives "hoto". Returns false, leaving `shareName` as it was, only when
/// `path` is empty. Never logs.
FILEINDEX_EXPORT bool GetShareNameByPath(std::string& shareName, const std::string& path);

/// Asks the share database which share holds the full path `fullPath` and stores that share's name
/// and its own full path ("/volume1/photo"). On failure logs, sets FILEINDEX_ERR_PATH, returns
/// false and leaves both outputs as they were.
FILEINDEX_EXPORT bool GetShareNamePathByFullPath(std::string& shareName, std::string& sharePath,
                                                 const std::string& fullPath);

/// Stores in `fullPath` the full path of the share path `path`: the volume on which the share
/// really lies followed by `path` unchanged ("/photo/2019/" gives "/volume1/photo/2019/").
/// Returns false when `path` is empty (logged, no code) or its share is unknown
/// (FILEINDEX_ERR_PATH, not logged); `fullPath` is then left as it was.
FILEINDEX_EXPORT bool GetFullPath(std::string& fullPath, const std::string& path);

/// Returns the share path `path` with its first component replaced by `newShareName`
/// ("/photo/2019" with "pictures" gives "/pictures/2019"); an empty `path` gives "". Pure string
/// work: nothing is checked against the share database.
FILEINDEX_EXPORT std::string ReplaceShareName(const std::string& path,
                                              const std::string& newShareName);

/// Tells the administrators, with a desktop notification that links to the file-index settings,
/// that a share has no room left for its index. Runs the platform's notification tool and returns
/// true when it ran and succeeded. Neither logs nor sets a code.
FILEINDEX_EXPORT bool NotifyNoSpace();

/// The upgrade step of release hxo60 beta 2, run once by the upgrade procedure: brings what derives
/// from the folder list into line with it. With no indexed folder, the service fileindexd is
/// stopped and nothing else is touched. Otherwise the service is started, Spotlight over SMB
/// switched on (the SMB service is not restarted), every share with indexed folders registered
/// again with the file-change monitor, and every indexed folder queued for a full reindex
/// (IndexMgr::Reindex). Reads the folder list without its lock; writes no configuration file.
/// Running it again repeats the same steps. False at the first failure, logged, with the code of
/// the failing step; what was done before it stays done.
FILEINDEX_EXPORT bool Updater_hxo60_beta2();  // NOLINT(readability-identifier-naming)

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_UTILS_H_
