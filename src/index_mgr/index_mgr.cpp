#define FILEINDEX_LOG_UNIT "index_mgr"

#include "fileindex/index_mgr.h"

#include <json/value.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <algorithm>
#include <exception>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "config/folder_page.h"
#include "config/snapshot.h"
#include "config/transaction.h"
#include "fileindex/daemon.h"
#include "fileindex/error.h"
#include "fileindex/fileindex_c.h"
#include "fileindex/folders.h"
#include "fileindex/queue.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "layout.h"
#include "status_mgr/status_change.h"
#include "utils/daemon_probe.h"
#include "utils/log.h"
#include "utils/path_rules.h"
#include "utils/storage.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr int kServiceFlags = 1;
constexpr int kLocationSize = 4096;

void RefuseRequest(int line, const Json::Value& request) {
  detail::WriteLog(false, FILEINDEX_LOG_UNIT, line, "Bad param: %s", JsonToString(request).c_str());
  ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
}

// Runs an operation on the request `request`. jsoncpp throws when a value of one type is read as
// another (an element that is an array where an object is expected, a "path" that is an object);
// such a request is refused like any other malformed one instead of the exception leaving the
// library. Everything the operation holds is released by the unwinding before the refusal.
template <typename Operation>
bool RefuseOnJsonError(const Json::Value& request, Operation operation) {
  try {
    return operation();
  } catch (const Json::Exception&) {
    RefuseRequest(__LINE__, request);
    return false;
  }
}

// Refuses a share operation on `share` unless it is the name of a share: an empty name would reach
// the folder list as "every share", a name with a slash or a NUL byte another share than the one
// named. True when refused.
bool RefuseShareName(const std::string& share) {
  if (IsShareName(share)) {
    return false;
  }
  RefuseRequest(__LINE__, Json::Value(share));
  return true;
}

// Decides whether a share path handed in by a caller may be used. A new path must be clean
// (path_rules.h). A path that already names a folder in the list is taken as it is stored:
// earlier versions stored paths that the rule refuses ("/photo/a/"), and those folders must still
// be changed, reindexed and removed. The list is read only for a path that is not clean.
class PathCheck {
 public:
  // Reads folder.conf without the lock when it is needed.
  PathCheck() = default;
  // Asks `list`, already loaded under the lock.
  explicit PathCheck(const Folders& list) : m_list(&list) {}

  bool Accepts(const std::string& path) {
    if (IsCleanSharePath(path)) {
      return true;
    }
    if (!m_read) {
      m_read = true;
      std::vector<Folder> folders;
      if (m_list != nullptr ? m_list->List(folders) : IndexMgr::List(folders)) {
        for (const Folder& folder : folders) {
          m_stored.insert(folder.GetPath());
        }
      }
    }
    return m_stored.count(path) != 0;
  }

 private:
  const Folders* m_list = nullptr;
  bool m_read = false;
  std::set<std::string> m_stored;
};

// Queues the update event of `path`, a path the operation has already accepted.
bool QueueUpdate(const std::string& path, const Json::Value& data) {
  std::string fullPath;
  if (!GetFullPath(fullPath, path)) {
    FILEINDEX_LOG("GetFullPath failed, path=%s", path.c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_PATH);
    return false;
  }
  if (!AddCustomEvent(kEventUpdate, fullPath, data)) {
    FILEINDEX_LOG("AddCustomEvent failed");
    return false;
  }
  return true;
}

// Spotlight is switched on when it is known to be off; the SMB service reads the setting only
// when it starts. Failures are logged and otherwise ignored: searching over SMB is a convenience
// that must not stop indexing.
void EnableSpotlight() {
  if (WEZOSMBIsEnableSpotlight() != 0) {
    return;
  }
  if (WEZOSMBSetSpotlight(1) < 0) {
    FILEINDEX_LOG_PLATFORM_FAILURE("WEZOSMBSetSpotlight");
  } else if (WLIBServiceRestart(kSmbService) < 0) {
    FILEINDEX_LOG_PLATFORM_FAILURE("WLIBServiceRestart");
  }
}

// The last indexed folder is gone: the daemon is stopped and Spotlight switched off unless it is
// known to be off already. Failures are logged and otherwise ignored.
void StopIndexing() {
  if (WLIBServiceStop(kIndexService, kServiceFlags) < 0) {
    FILEINDEX_LOG_PLATFORM_FAILURE("WLIBServiceStop");
  }
  if (WEZOSMBIsEnableSpotlight() == 0) {
    return;
  }
  if (WEZOSMBSetSpotlight(0) < 0) {
    FILEINDEX_LOG_PLATFORM_FAILURE("WEZOSMBSetSpotlight");
  } else if (WLIBServiceRestart(kSmbService) < 0) {
    FILEINDEX_LOG_PLATFORM_FAILURE("WLIBServiceRestart");
  }
}

bool HoldsNoFolder(const Folders& list) {
  std::vector<Folder> folders;
  list.List(folders);
  return folders.empty();
}

bool TellDaemonOfFolder(const std::string& type, const std::string& path) {
  Json::Value command(Json::objectValue);
  command["folder_path"] = path;
  if (!SendCammandToDaemon(type, command)) {
    FILEINDEX_LOG("SendCammandToDaemon failed");
    return false;
  }
  return true;
}

Json::Value ShareCommand(const std::string& share) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share;
  return data;
}

// Removes the index data at `path`, a file or a whole directory. The metadata directory is
// writable by the share's users, so the removal runs in-process and never follows a link, where
// a removal program given the path would resolve it through any link planted on the way.
bool RemoveTree(const std::string& path) {
  if (RemoveLocation(path)) {
    return true;
  }
  FILEINDEX_LOG("Failed to remove %s, reason=%s", path.c_str(), detail::ErrnoText().c_str());
  return false;
}

// After folders of the share `share` left the list: the monitor goes on watching the share's
// remaining folders, or, with none left, the share's index data is removed and the monitor
// forgets the share.
bool FollowRemovedFolders(const std::string& share) {
  if (IndexMgr::IsShareIndexed(share)) {
    if (!IndexMgr::UpsertWEZotifydCfg(share)) {
      FILEINDEX_LOG("UpsertWEZotifydCfg failed, share=%s", share.c_str());
      return false;
    }
    return true;
  }
  if (!IndexMgr::CleanShareIndexData(share)) {
    FILEINDEX_LOG("CleanShareIndexData failed, share=%s", share.c_str());
    return false;
  }
  if (!IndexMgr::DeleteWEZotifydCfg(share)) {
    FILEINDEX_LOG("DeleteWEZtifydCfg failed, share=%s", share.c_str());
    return false;
  }
  return true;
}

bool ShareQueue(const std::string& share, std::string& queue) {
  if (!ShareQueuePath(share, queue)) {
    FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
    return false;
  }
  return true;
}

// Registers with the monitor, for the queue `queue`, every folder of `list` in the share `share`,
// or none: one folder that cannot be placed fails the registration before the monitor hears of it.
bool RegisterShare(const std::string& share, const std::string& queue, const Folders& list) {
  std::vector<Folder> folders;
  list.List(folders, share);

  Json::Value ignore(Json::arrayValue);
  ignore.append(kMetadataDirName);
  Json::Value config(Json::arrayValue);
  for (const Folder& folder : folders) {
    std::string fullPath;
    // A partial registration would silently stop watching the folders left out.
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

const std::string& PathOf(const Folder& folder) { return folder.GetPath(); }
const std::string& PathOf(const std::string& path) { return path; }

// Adds the share of the share path `path` to `shares`.
bool AddShareOf(const std::string& path, std::set<std::string>& shares) {
  std::string share;
  if (!GetShareNameByPath(share, path)) {
    FILEINDEX_LOG("GetShareNameByPath failed, path=%s", path.c_str());
    return false;
  }
  shares.insert(share);
  return true;
}

// Adds or changes the folders of `request`. The folder list's lock is held for what must follow
// the save in the order of the saves: the monitor's registration (a later writer's must be the one
// that stays), the service and Spotlight (a writer that removes the last folder stops them), and
// the daemon's commands. The update events follow after the lock: the daemon takes the queue in
// its own time and reads the settings from folder.conf when it does.
bool UpsertFolders(const Json::Value& request) {
  if (!request.isArray()) {
    RefuseRequest(__LINE__, request);
    return false;
  }
  std::map<std::string, Json::Value> changed;  // a later element replaces an earlier report
  {
    Folders list;
    ConfigTransaction transaction(list);
    if (!transaction.Begin()) {
      return false;
    }
    // An element without a string "path" is left to Folders::Upsert, which refuses it in its own
    // words.
    PathCheck check(list);
    for (const Json::Value& element : request) {
      std::string path;
      if (RetrieveStringFromJsonObj(path, "path", element) && !check.Accepts(path)) {
        RefuseRequest(__LINE__, request);
        return false;
      }
    }

    std::vector<Folder> before;  // in byte order of the paths
    list.List(before);
    std::set<std::string> added;
    const auto isNew = [&before, &added](const std::string& path) {
      const bool stored =
          std::binary_search(before.begin(), before.end(), path,
                             [](const auto& a, const auto& b) { return PathOf(a) < PathOf(b); });
      return !stored && added.insert(path).second;
    };
    std::vector<std::string> paths;
    std::set<std::string> shares;
    std::set<std::string> grown;  // the shares that gained a folder
    for (const Json::Value& element : request) {
      const std::string path = element.get("path", "").asString();
      Json::Value report;
      if (!list.Upsert(report, element)) {
        FILEINDEX_LOG("Upsert failed, folder=%s", JsonToString(element).c_str());
        return false;
      }
      changed[path] = report;
      if (!AddShareOf(path, shares)) {
        return false;
      }
      if (isNew(path)) {
        AddShareOf(path, grown);
      }
      paths.push_back(path);
    }
    if (!transaction.Commit()) {
      return false;
    }

    // The registration lists the share's folders and nothing of their settings: a share whose
    // folders stay the same keeps the one it has.
    for (const std::string& share : grown) {
      std::string queue;
      if (!ShareQueue(share, queue) || !RegisterShare(share, queue, list)) {
        FILEINDEX_LOG("UpsertWEZtifydCfg failed, share=%s", share.c_str());
        return false;
      }
    }
    // The daemon runs once a folder was listed, unless it stopped: then it is started, as it is
    // for the first folder.
    if ((before.empty() || !DaemonAcceptsConnection()) &&
        WLIBServiceStart(kIndexService, kServiceFlags) < 0) {
      FILEINDEX_LOG_PLATFORM_FAILURE("WLIBServiceStart");
      return false;
    }
    EnableSpotlight();
    for (const std::string& path : paths) {
      if (!TellDaemonOfFolder("upsert_folder_setting", path)) {
        return false;
      }
    }
  }
  return std::all_of(changed.begin(), changed.end(), [](const auto& pathAndReport) {
    return QueueUpdate(pathAndReport.first, pathAndReport.second);
  });
}

bool DeleteFolders(const Json::Value& request) {
  if (!request.isArray() ||
      !std::all_of(request.begin(), request.end(),
                   [](const Json::Value& element) { return element.isString(); })) {
    RefuseRequest(__LINE__, request);
    return false;
  }
  Folders list;
  ConfigTransaction transaction(list);
  if (!transaction.Begin()) {
    return false;
  }
  PathCheck check(list);
  if (!std::all_of(request.begin(), request.end(),
                   [&](const Json::Value& element) { return check.Accepts(element.asString()); })) {
    RefuseRequest(__LINE__, request);
    return false;
  }

  Json::Value lastReport;  // the report of the last path only
  std::set<std::string> shares;
  for (const Json::Value& element : request) {
    const std::string path = element.asString();
    lastReport = Json::Value();
    if (!list.Delete(lastReport, path)) {
      FILEINDEX_LOG("Delete failed, path=%s", path.c_str());
      return false;
    }
    if (!AddShareOf(path, shares)) {
      return false;
    }
  }
  if (!transaction.Commit()) {
    return false;
  }

  if (HoldsNoFolder(list)) {
    StopIndexing();
  } else {
    for (const Json::Value& element : request) {
      if (!TellDaemonOfFolder("delete_folder_setting", element.asString())) {
        return false;
      }
    }
    // Only the setting now in force at the last path is queued as an update; the earlier paths
    // of the batch have had their commands.
    for (const std::string& path : lastReport.getMemberNames()) {
      if (!QueueUpdate(path, lastReport[path])) {
        FILEINDEX_LOG("Update failed");
        return false;
      }
    }
  }

  return std::all_of(shares.begin(), shares.end(), FollowRemovedFolders);
}

bool ReindexPaths(const Json::Value& request) {
  if (!request.isArray()) {
    FILEINDEX_LOG("Malformed jsArrPath: %s", JsonToString(request).c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
    return false;
  }
  // Every element is checked before anything is queued.
  PathCheck check;
  std::set<std::string> noSpace;
  for (const Json::Value& element : request) {
    if (!element.isString() || !check.Accepts(element.asString())) {
      FILEINDEX_LOG("Malformed jsArrPath: %s", JsonToString(element).c_str());
      ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
      return false;
    }
    std::string share;
    if (!GetShareNameByPath(share, element.asString())) {
      FILEINDEX_LOG("Failed to get share name from path: %s", element.asCString());
      return false;
    }
    if (!IndexMgr::IsShareIndexed(share)) {
      return false;
    }
    if (QueryStatus([&](const Status& s) { return s.ShareIsNoSpace(share); })) {
      noSpace.insert(share);
    }
  }
  // A share out of room gets its worker back so that the reindex can run; if that fails the
  // events are queued all the same and wait for the share.
  for (const std::string& share : noSpace) {
    if (!ReviveShare(share)) {
      FILEINDEX_LOG("ShareRevice failed, share=%s", share.c_str());
    }
  }
  for (const Json::Value& element : request) {
    const std::string path = element.asString();
    std::string fullPath;
    if (!GetFullPath(fullPath, path)) {
      FILEINDEX_LOG("GetFullPath failed, path=%s", path.c_str());
      ErrorHandler::SetError(FILEINDEX_ERR_PATH);
      return false;
    }
    if (!AddCustomEvent(kEventReindex, fullPath, Json::Value())) {
      FILEINDEX_LOG("AddCustomEvent failed, path=%s", path.c_str());
      return false;
    }
  }
  return true;
}

// The folder records as a load of the list gives them, built from the kept snapshot's document
// when it has one. False, logged with a code set, when folder.conf cannot be loaded.
bool CurrentRecords(std::vector<Folder>& folders) {
  const std::shared_ptr<const FolderSnapshot> snapshot = FolderListSnapshot(&LoadFolderList);
  if (snapshot == nullptr) {
    return false;
  }
  if (const Json::Value* document = snapshot->Document()) {
    folders = FolderRecordsOf(*document);
    return true;
  }
  Folders list;
  return list.Load() && list.List(folders);
}

}  // namespace

bool IndexMgr::List(std::vector<Folder>& folders) { return CurrentRecords(folders); }

bool IndexMgr::List(Json::Value& result, unsigned long offset, unsigned long limit,
                    const std::string& sortBy, const std::string& sortDirection,
                    const Json::Value& additional) {
  return RefuseOnJsonError(additional, [&] {
    std::vector<Folder> folders;
    if (!CurrentRecords(folders)) {
      return false;
    }
    FolderPage(folders, result, offset, limit, sortBy, sortDirection, additional);
    return true;
  });
}

bool IndexMgr::Get(Json::Value& result, const std::string& path) {
  Folders list;
  ConfigTransaction transaction(list);
  return transaction.Begin() && list.Get(result, path);
}

bool IndexMgr::IsPathIndexed(const std::string& path, const std::vector<Folder>& folders) {
  const std::string target = path + "/";
  return std::any_of(folders.begin(), folders.end(), [&](const Folder& folder) {
    return StringStartWith(target, folder.GetPath() + "/");
  });
}

bool IndexMgr::IsFullPathIndexed(const std::string& fullPath, const std::vector<Folder>& folders) {
  const std::string target = fullPath + "/";
  // A folder whose share is gone holds no full path; its empty one would make "/" a prefix of
  // everything.
  return std::any_of(folders.begin(), folders.end(), [&](const Folder& folder) {
    return folder.HasFullPath() && StringStartWith(target, folder.GetFullPath() + "/");
  });
}

bool IndexMgr::IsPathContainIndexed(const std::string& path, const std::vector<Folder>& folders) {
  const std::string ancestor = path + "/";
  return std::any_of(folders.begin(), folders.end(), [&](const Folder& folder) {
    return StringStartWith(folder.GetPath() + "/", ancestor);
  });
}

bool IndexMgr::IsPathIndexed(const std::string& path) {
  const std::shared_ptr<const FolderSnapshot> list = FolderListSnapshot(&LoadFolderList);
  return list != nullptr && list->IsPathIndexed(path);
}

bool IndexMgr::IsFullPathIndexed(const std::string& fullPath) {
  const std::shared_ptr<const FolderSnapshot> list = FolderListSnapshot(&LoadFolderList);
  return list != nullptr && list->IsFullPathIndexed(fullPath);
}

bool IndexMgr::IsPathContainIndexed(const std::string& path) {
  const std::shared_ptr<const FolderSnapshot> list = FolderListSnapshot(&LoadFolderList);
  return list != nullptr && list->IsPathContainIndexed(path);
}

bool IndexMgr::IsShareIndexed(const std::string& share) {
  const std::shared_ptr<const FolderSnapshot> list = FolderListSnapshot(&LoadFolderList);
  if (list == nullptr) {
    return false;
  }
  // Only the empty path names no share, and it comes first in the list's order: it is met, and
  // logged, before any folder could answer.
  if (list->HoldsUnnamedFolder()) {
    FILEINDEX_LOG("Failed to get share name from path: %s", "");
  }
  return list->HoldsShare(share);
}

bool IndexMgr::Upsert(const Json::Value& folders) {
  return RefuseOnJsonError(folders, [&] { return UpsertFolders(folders); });
}

bool IndexMgr::Set(const Json::Value& folders) { return Upsert(folders); }

bool IndexMgr::Add(const Json::Value& folders) { return Upsert(folders); }

bool IndexMgr::Delete(const Json::Value& paths) {
  return RefuseOnJsonError(paths, [&] { return DeleteFolders(paths); });
}

bool IndexMgr::Reindex(const Json::Value& paths) {
  return RefuseOnJsonError(paths, [&] { return ReindexPaths(paths); });
}

bool IndexMgr::Update(const std::string& path, const Json::Value& data) {
  if (!PathCheck().Accepts(path)) {
    RefuseRequest(__LINE__, Json::Value(path));
    return false;
  }
  return QueueUpdate(path, data);
}

bool IndexMgr::ShareRemove(const std::string& share) {
  if (RefuseShareName(share)) {
    return false;
  }
  Folders list;
  ConfigTransaction transaction(list);
  std::vector<Folder> folders;
  if (!transaction.Begin() || !list.List(folders, share)) {
    return false;
  }
  Json::Value report;
  for (const Folder& folder : folders) {
    if (!list.Delete(report, folder.GetPath())) {
      return false;
    }
  }
  if (!transaction.Commit()) {
    return false;
  }
  if (HoldsNoFolder(list)) {
    StopIndexing();
  }
  return true;
}

bool IndexMgr::ShareRename(const std::string& oldShare, const std::string& newShare) {
  if (!IsShareName(oldShare) || !IsShareName(newShare)) {
    Json::Value names(Json::arrayValue);
    names.append(oldShare);
    names.append(newShare);
    RefuseRequest(__LINE__, names);
    return false;
  }
  Folders list;
  ConfigTransaction transaction(list);
  std::vector<Folder> folders;
  if (!transaction.Begin() || !list.List(folders, oldShare)) {
    return false;
  }
  Json::Value report;
  for (Folder& folder : folders) {
    if (!list.Delete(report, folder.GetPath())) {
      return false;
    }
    // The name and the settings travel with the record; the index data lies inside the share
    // and moves with it. The rest of the path is carried over as stored, even where a request
    // could no longer name it.
    folder.SetPath(ReplaceShareName(folder.GetPath(), newShare));
    if (!list.Upsert(report, folder.asJson())) {
      return false;
    }
  }
  return transaction.Commit();
}

bool IndexMgr::SharePause(const std::string& share) {
  if (RefuseShareName(share)) {
    return false;
  }
  // The worker stops first, so that nothing of the share is indexed once the monitor stops
  // reporting its changes.
  if (!SendCammandToDaemon("delete_share_worker", ShareCommand(share))) {
    return false;
  }
  if (!DeleteWEZotifydCfg(share)) {
    FILEINDEX_LOG("DeleteWEZotifydCfg failed, share=%s", share.c_str());
    return false;
  }
  return true;
}

bool IndexMgr::ShareResume(const std::string& share) {
  if (RefuseShareName(share)) {
    return false;
  }
  // The monitor first, so that no change made while the worker starts is missed.
  if (!UpsertWEZotifydCfg(share)) {
    FILEINDEX_LOG("UpsertWEZotifydCfg failed, share=%s", share.c_str());
    return false;
  }
  return SendCammandToDaemon("revive_share_worker", ShareCommand(share));
}

bool IndexMgr::CleanShareIndexData(const std::string& share) {
  if (RefuseShareName(share)) {
    return false;
  }
  char location[kLocationSize] = {};
  if (FILEIDXQueuePathGet(share.c_str(), location, kLocationSize) < 0) {
    FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
    return false;
  }
  const std::string queue = location;
  // Each location is tried even when another could not be removed.
  bool removed = RemoveTree(queue);
  removed = RemoveTree(QueueTmpOf(queue)) && removed;
  if (FILEIDXDBPathGet(share.c_str(), location, kLocationSize) < 0) {
    FILEINDEX_LOG("FILEIDXDBPathGet failed, share=%s", share.c_str());
    return false;
  }
  return RemoveTree(location) && removed;
}

bool IndexMgr::UpsertWEZotifydCfg(const std::string& share) {
  std::string queue;
  Folders list;
  return ShareQueue(share, queue) && list.Load() && RegisterShare(share, queue, list);
}

bool IndexMgr::DeleteWEZotifydCfg(const std::string& share) {
  std::string queue;
  if (!ShareQueue(share, queue)) {
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
