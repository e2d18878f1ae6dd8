#define FILEINDEX_LOG_UNIT "index_mgr"

#include "fileindex/index_mgr.h"

#include <json/value.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <exception>
#include <memory>

#include "fileindex/folders.h"
#include "fileindex/utils.h"
#include "log.h"
#include "storage.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr char kMonitorClient[] = "fileindex";
// Every event class of the monitor except three that indexing has no use for (0x0001, 0x0010
// and 0x0020).
constexpr int kMonitorMask = 0xFFCE;
constexpr char kMetadataDir[] = "@eaDir";

}  // namespace

bool IndexMgr::List(std::vector<Folder>& folders) {
  Folders list;
  return list.Load() && list.List(folders);
}

bool IndexMgr::UpsertWEZotifydCfg(const std::string& share) {
  std::string queue;
  if (!ShareQueuePath(share, queue)) {
    FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
    return false;
  }
  Folders list;
  std::vector<Folder> folders;
  if (!list.Load() || !list.List(folders, share)) {
    return false;
  }

  Json::Value ignore(Json::arrayValue);
  ignore.append(kMetadataDir);
  Json::Value config(Json::arrayValue);
  for (const Folder& folder : folders) {
    std::string fullPath;
    // One folder that cannot be placed blocks the whole registration: a partial one would
    // silently stop watching the folders left out.
    if (!GetFullPath(fullPath, folder.GetPath())) {
      FILEINDEX_LOG("GetFullPath failed, path=%s", folder.GetPath().c_str());
      return false;
    }
    Json::Value dir(Json::objectValue);
    dir["path"] = fullPath;
    dir["mask"] = kMonitorMask;
    dir["ignore"] = ignore;
    config.append(dir);
  }
  Json::Value entry(Json::objectValue);
  entry["queue"] = queue;
  entry["config"] = config;

  std::unique_ptr<WEZOTIFYD::MonitorQueue> monitorQueue;
  try {
    monitorQueue = std::make_unique<WEZOTIFYD::MonitorQueue>(entry);
  } catch (const std::exception&) {
    return false;
  }
  if (!WEZOTIFYD::MonitorQueue::Upsert(*monitorQueue, kMonitorClient, WEZOTIFYD::QUEUE_TYPE_FILE)) {
    FILEINDEX_LOG("MonitorQueue::Add failed");
    return false;
  }
  return true;
}

bool IndexMgr::DeleteWEZotifydCfg(const std::string& share) {
  std::string queue;
  if (!ShareQueuePath(share, queue)) {
    FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
    return false;
  }
  if (!WEZOTIFYD::MonitorQueue::Delete(queue, kMonitorClient, WEZOTIFYD::QUEUE_TYPE_FILE)) {
    FILEINDEX_LOG("MonitorQueue::Delete failed");
    return false;
  }
  return true;
}

}  // namespace FILEINDEX
}  // namespace WEZO
