// Progress is reported by the status manager and logs under its name.
#define FILEINDEX_LOG_UNIT "status_mgr"

#include "status_mgr/progress.h"

#include <ctime>
#include <set>

#include "fileindex/eligibility.h"
#include "fileindex/status.h"
#include "fileindex/utils.h"
#include "status_mgr/status_change.h"
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

bool ReadPauseInfo(long long& resumeTime) {
  return QueryStatus([&](const Status& s) { return s.GetPauseInfo(resumeTime); });
}

// Indexing runs unless paused without end or until a time still to come.
const char* RunningOrPaused(long long resumeTime) {
  return resumeTime != 0 && static_cast<long long>(time(nullptr)) >= resumeTime ? kProcessing
                                                                                : kPaused;
}

}  // namespace

bool OverallProgress(const std::vector<std::string>& paths, std::string& status) {
  std::set<std::string> shares;
  for (const std::string& path : paths) {
    std::string share;
    if (!GetShareNameByPath(share, path)) {
      FILEINDEX_LOG("Failed to get share name from path: %s", path.c_str());
      return false;
    }
    if (CanPathBeIndexed(path)) {
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
  if (!ReadPauseInfo(resumeTime)) {
    return false;
  }
  status = RunningOrPaused(resumeTime);
  return true;
}

std::string FolderProgress(const std::string& path) {
  if (!CanPathBeIndexed(path)) {
    return kPaused;
  }
  std::string share;
  if (!GetShareNameByPath(share, path)) {
    FILEINDEX_LOG("Failed to get share name from path: %s", path.c_str());
    return kFinished;
  }
  if (QueryStatus([&](const Status& s) { return s.ShareIsNoSpace(share); })) {
    return kNoSpace;
  }
  std::string queue;
  if (!ShareQueuePath(share, queue)) {
    FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
    return kFinished;
  }
  // A pause state that cannot be read counts as not paused.
  long long resumeTime = kNotPaused;
  if (!ReadPauseInfo(resumeTime)) {
    resumeTime = kNotPaused;
  }
  if (!QueueHasFolderEvent(path, queue) && !QueueHasFolderEvent(path, QueueTmpOf(queue))) {
    return kFinished;
  }
  return RunningOrPaused(resumeTime);
}

}  // namespace FILEINDEX
}  // namespace WEZO
