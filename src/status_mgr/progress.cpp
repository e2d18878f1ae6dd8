// Progress is reported by the status manager and logs under its name.
#define FILEINDEX_LOG_UNIT "status_mgr"

#include "status_mgr/progress.h"

#include <ctime>
#include <map>
#include <set>

#include "fileindex/eligibility.h"
#include "fileindex/status.h"
#include "fileindex/utils.h"
#include "status_mgr/status_change.h"
#include "utils/eligibility_pass.h"
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
  EligibilityPass eligibility;
  for (const std::string& path : paths) {
    std::string share;
    if (!GetShareNameByPath(share, path)) {
      FILEINDEX_LOG("Failed to get share name from path: %s", path.c_str());
      return false;
    }
    if (eligibility.CanPathBeIndexed(path)) {
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

std::vector<std::string> FoldersProgress(const std::vector<std::string>& paths,
                                         const std::vector<bool>* indexable) {
  std::vector<std::string> states(paths.size(), kFinished);
  std::map<std::string, std::vector<size_t>> byShare;
  // Also answers the full paths below from one lookup per share.
  EligibilityPass eligibility;
  for (size_t i = 0; i < paths.size(); ++i) {
    if (!(indexable != nullptr ? (*indexable)[i] : eligibility.CanPathBeIndexed(paths[i]))) {
      states[i] = kPaused;
      continue;
    }
    std::string share;
    if (!GetShareNameByPath(share, paths[i])) {
      FILEINDEX_LOG("Failed to get share name from path: %s", paths[i].c_str());
      continue;
    }
    byShare[share].push_back(i);
  }
  if (byShare.empty()) {
    return states;
  }

  // The status file once: the shares' no-space flags and, when some share's queue is to be read,
  // the pause state (one that cannot be read counts as not paused).
  std::map<std::string, std::string> queues;
  long long resumeTime = kNotPaused;
  const auto decide = [&](const Status* status) {
    for (const auto& share : byShare) {
      if (status != nullptr && status->ShareIsNoSpace(share.first)) {
        for (const size_t i : share.second) {
          states[i] = kNoSpace;
        }
        continue;
      }
      std::string queue;
      if (!ShareQueuePath(share.first, queue)) {
        FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.first.c_str());
        continue;
      }
      queues.emplace(share.first, queue);
    }
    if (!queues.empty() && (status == nullptr || !status->GetPauseInfo(resumeTime))) {
      resumeTime = kNotPaused;
    }
  };
  bool loaded = false;
  QueryStatus([&](const Status& status) {
    loaded = true;
    decide(&status);
    return true;
  });
  if (!loaded) {
    decide(nullptr);
  }

  for (const auto& shareQueue : queues) {
    const std::string& queue = shareQueue.second;
    const std::string tmp = QueueTmpOf(queue);
    if (!LocationFileExists(queue) && !LocationFileExists(tmp)) {
      continue;
    }
    std::vector<size_t> folders;
    std::vector<std::string> fullPaths;
    for (const size_t i : byShare[shareQueue.first]) {
      std::string full;
      if (!GetFullPath(full, paths[i])) {
        FILEINDEX_LOG("Cannot get full path: %s", paths[i].c_str());
        continue;
      }
      folders.push_back(i);
      fullPaths.push_back(full);
    }
    // The companion is read only for the folders the queue has nothing for.
    std::vector<bool> found;
    QueueFoldersWithEvents(fullPaths, queue, found);
    std::vector<size_t> rest;
    std::vector<std::string> restPaths;
    for (size_t k = 0; k < folders.size(); ++k) {
      if (found[k]) {
        states[folders[k]] = RunningOrPaused(resumeTime);
      } else {
        rest.push_back(folders[k]);
        restPaths.push_back(fullPaths[k]);
      }
    }
    if (rest.empty()) {
      continue;
    }
    QueueFoldersWithEvents(restPaths, tmp, found);
    for (size_t k = 0; k < rest.size(); ++k) {
      if (found[k]) {
        states[rest[k]] = RunningOrPaused(resumeTime);
      }
    }
  }
  return states;
}

}  // namespace FILEINDEX
}  // namespace WEZO
