// The status manager's operations, each one step of the status file (status_change.h) or one
// progress report (progress.h).
#include "fileindex/status_mgr.h"

#include <json/value.h>

#include <cstdint>
#include <ctime>
#include <limits>
#include <memory>
#include <string>

#include "config/folder_page.h"
#include "config/snapshot.h"
#include "fileindex/error.h"
#include "fileindex/status.h"
#include "status_mgr/progress.h"
#include "status_mgr/status_change.h"

namespace WEZO {
namespace FILEINDEX {

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

bool StatusMgr::ShareRevive(const std::string& share) { return ReviveShare(share); }

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
  const std::shared_ptr<const FolderSnapshot> snapshot = FolderListSnapshot(&LoadFolderList);
  if (snapshot == nullptr) {
    return false;
  }
  // A load places every folder, and placing one under the empty path logs: a list that holds one
  // and that no load has read yet is read as a load reads it.
  if (!snapshot->HoldsUnnamedFolder() || snapshot->Document() == nullptr) {
    return OverallProgress(snapshot->Paths(), status);
  }
  const std::shared_ptr<const FolderSnapshot> loaded = LoadFolderList();
  return loaded != nullptr && OverallProgress(loaded->Paths(), status);
}

std::string StatusMgr::GetFolderStatus(const std::string& path) {
  return FoldersProgress({path}).front();
}

}  // namespace FILEINDEX
}  // namespace WEZO
