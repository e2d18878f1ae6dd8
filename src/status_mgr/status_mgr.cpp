#define FILEINDEX_LOG_UNIT "status_mgr"

#include "fileindex/status_mgr.h"

#include <json/value.h>

#include <cstdint>
#include <ctime>
#include <limits>
#include <set>
#include <vector>

#include "fileindex/daemon.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status.h"
#include "fileindex/utils.h"
#include "utils/log.h"
#include "utils/queue_reader.h"
#include "utils/storage.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr long long kNotPaused = -1;
constexpr char kFinished[] = "finished";
constexpr char kProcessing[] = "processing";
constexpr char kPaused[] = "paused";
constexpr char kNoSpace[] = "err_no_space";

// A daemon command to send once the change is saved; an empty type sends nothing.
struct Command {
  std::string type;
  Json::Value data;
};

// Lock, load, change, save, tell the daemon, unlock. The daemon hears of the change only after it
// is on disk and before other writers may change it again.
template <typename Change>
bool ChangeStatus(Change change, const Command& command = {}) {
  Status status;
  bool ok = status.Lock(true) && status.Load() && change(status) && status.Save();
  if (ok && !command.type.empty() && !SendCammandToDaemon(command.type, command.data)) {
    FILEINDEX_LOG("SendCammandToDaemon failed");
    ok = false;
  }
  status.Unlock();
  return ok;
}

template <typename Query>
bool QueryStatus(Query query) {
  Status status;
  return status.Load() && query(status);
}

// Indexing runs unless paused without end or until a time still to come.
const char* RunningOrPaused(long long resumeTime) {
  return resumeTime != 0 && static_cast<long long>(time(nullptr)) >= resumeTime ? kProcessing
                                                                                : kPaused;
}

}  // namespace

bool StatusMgr::SetUpdated(const std::string& key) {
  return ChangeStatus([&](Status& s) { return s.SetUpdated(key); });
}

bool StatusMgr::IsUpdated(const std::string& key) {
  return QueryStatus([&](const Status& s) { return s.IsUpdated(key); });
}

bool StatusMgr::ShareSetNeedReindex(const std::string& share, bool need) {
  return ChangeStatus([&](Status& s) { return s.ShareSetNeedReindex(share, need); });
}

bool StatusMgr::ShareIsNeedReindex(const std::string& share) {
  return QueryStatus([&](const Status& s) { return s.ShareIsNeedReindex(share); });
}

bool StatusMgr::ShareSetNoSpace(const std::string& share, bool noSpace) {
  return ChangeStatus([&](Status& s) { return s.ShareSetNoSpace(share, noSpace); });
}

bool StatusMgr::ShareIsNoSpace(const std::string& share) {
  return QueryStatus([&](const Status& s) { return s.ShareIsNoSpace(share); });
}

bool StatusMgr::ShareRevive(const std::string& share) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share;
  return ChangeStatus([&](Status& s) { return s.ShareSetNoSpace(share, false); },
                      {"revive_share_worker", data});
}

bool StatusMgr::GetPauseInfo(long long& resumeTime) {
  return QueryStatus([&](const Status& s) { return s.GetPauseInfo(resumeTime); });
}

bool StatusMgr::Resume() {
  return ChangeStatus([](Status& s) { return s.Resume(); },
                      {"resume", Json::Value(Json::objectValue)});
}

bool StatusMgr::Pause(const int& hours) {
  if (hours < 0) {
    ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
    return false;
  }
  long long resumeTime = 0;
  if (hours > 0) {
    // The daemon keeps the end as a signed 32-bit count of seconds; an end it cannot hold is
    // refused rather than wrapped into the past.
    resumeTime = static_cast<long long>(time(nullptr)) + static_cast<long long>(hours) * 3600;
    if (resumeTime > std::numeric_limits<int32_t>::max()) {
      ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
      return false;
    }
  }
  Json::Value data(Json::objectValue);
  data["resume_time"] = static_cast<Json::Int64>(resumeTime);
  return ChangeStatus([&](Status& s) { return s.Pause(resumeTime); }, {"pause", data});
}

bool StatusMgr::GetStatus(std::string& status) {
  std::vector<Folder> folders;
  if (!IndexMgr::List(folders)) {
    return false;
  }
  std::set<std::string> shares;
  for (const Folder& folder : folders) {
    std::string share;
    if (!GetShareNameByPath(share, folder.GetPath())) {
      FILEINDEX_LOG("Failed to get share name from path: %s", folder.GetPath().c_str());
      return false;
    }
    if (CanPathBeIndexed(folder.GetPath())) {
      shares.insert(share);
    }
  }

  bool pending = false;
  for (const std::string& share : shares) {
    std::string queue;
    if (!ShareQueuePath(share, queue)) {
      FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
      return false;
    }
    // Existence alone counts: the daemon removes a queue it has worked through.
    if (LocationFileExists(queue) || LocationFileExists(QueueTmpOf(queue))) {
      pending = true;
      break;
    }
  }
  if (!pending) {
    status = kFinished;
    return true;
  }

  long long resumeTime = kNotPaused;
  if (!GetPauseInfo(resumeTime)) {
    return false;
  }
  status = RunningOrPaused(resumeTime);
  return true;
}

std::string StatusMgr::GetFolderStatus(const std::string& path) {
  if (!CanPathBeIndexed(path)) {
    return kPaused;
  }
  std::string share;
  if (!GetShareNameByPath(share, path)) {
    FILEINDEX_LOG("Failed to get share name from path: %s", path.c_str());
    return kFinished;
  }
  if (ShareIsNoSpace(share)) {
    return kNoSpace;
  }
  std::string queue;
  if (!ShareQueuePath(share, queue)) {
    FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
    return kFinished;
  }
  // A pause state that cannot be read counts as not paused.
  long long resumeTime = kNotPaused;
  if (!GetPauseInfo(resumeTime)) {
    resumeTime = kNotPaused;
  }
  if (!QueueHasFolderEvent(path, queue) && !QueueHasFolderEvent(path, QueueTmpOf(queue))) {
    return kFinished;
  }
  return RunningOrPaused(resumeTime);
}

}  // namespace FILEINDEX
}  // namespace WEZO
