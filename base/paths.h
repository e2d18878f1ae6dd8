// Every fixed location of the library, built in one place from the root prefix
// (fileindex/root.h). Call sites never write these paths themselves.
#ifndef FILEINDEX_BASE_PATHS_H_
#define FILEINDEX_BASE_PATHS_H_

#include <string>

namespace WEZO {
namespace FILEINDEX {

// The locations as they are on the appliance, without the root prefix.
inline constexpr char kFolderConfPath[] = "/usr/wezo/etc/fileindex/folder.conf";
inline constexpr char kStatusConfPath[] = "/usr/wezo/etc/fileindex/status.conf";
inline constexpr char kFolderLockPath[] = "/tmp/fileidx_cfg_folder.lock";
inline constexpr char kStatusLockPath[] = "/tmp/fileidx_cfg_status.lock";
inline constexpr char kDaemonSocketPath[] = "/var/run/fileindexd.sock";
inline constexpr char kNotifyToolPath[] = "/usr/wezo/bin/wezohxonotify";

// `fixedPath` (absolute) under the current root prefix.
std::string RootedPath(const char* fixedPath);

inline std::string FolderConfPath() { return RootedPath(kFolderConfPath); }
inline std::string StatusConfPath() { return RootedPath(kStatusConfPath); }
inline std::string FolderLockPath() { return RootedPath(kFolderLockPath); }
inline std::string StatusLockPath() { return RootedPath(kStatusLockPath); }
inline std::string DaemonSocketPath() { return RootedPath(kDaemonSocketPath); }
inline std::string NotifyToolPath() { return RootedPath(kNotifyToolPath); }

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_BASE_PATHS_H_
