// The one-time upgrade step that brings services, Spotlight, the monitor and the queues into line
// with an existing folder list.
#define FILEINDEX_LOG_UNIT "utils"

#include <json/value.h>
#include <wezo/platform.h>

#include <set>
#include <string>
#include <vector>

#include "fileindex/folders.h"
#include "fileindex/index_mgr.h"
#include "fileindex/utils.h"
#include "layout.h"
#include "utils/log.h"

namespace WEZO {
namespace FILEINDEX {

bool Updater_hxo60_beta2() {  // NOLINT(readability-identifier-naming)
  // The upgrade runs before anything else may change the list, so the lock is not taken.
  Folders list;
  std::vector<Folder> folders;
  if (!list.Load() || !list.List(folders)) {
    return false;
  }
  if (folders.empty()) {
    if (WLIBServiceStop(kIndexService, 1) < 0) {
      // A failed stop is reported with the start message, as this step always has; keep it.
      FILEINDEX_LOG_PLATFORM_FAILURE("WLIBServiceStart");
      return false;
    }
    return true;
  }

  if (WLIBServiceStart(kIndexService, 1) < 0) {
    FILEINDEX_LOG_PLATFORM_FAILURE("WLIBServiceStart");
    return false;
  }
  if (WEZOSMBSetSpotlight(1) < 0) {
    FILEINDEX_LOG_PLATFORM_FAILURE("WEZOSMBSetSpotlight");
    return false;
  }
  std::set<std::string> shares;
  Json::Value paths(Json::arrayValue);
  for (const Folder& folder : folders) {
    std::string share;
    if (!GetShareNameByPath(share, folder.GetPath())) {
      FILEINDEX_LOG("GetShareNameByPath failed, path=%s", folder.GetPath().c_str());
      return false;
    }
    shares.insert(share);
    paths.append(folder.GetPath());
  }
  for (const std::string& share : shares) {
    if (!IndexMgr::UpsertWEZotifydCfg(share)) {
      FILEINDEX_LOG("UpsertWEZotifydCfg failed, share=%s", share.c_str());
      return false;
    }
  }
  if (!IndexMgr::Reindex(paths)) {
    FILEINDEX_LOG("Reindex failed");
    return false;
  }
  return true;
}

}  // namespace FILEINDEX
}  // namespace WEZO
