// The writer of a share's event queue.
#define FILEINDEX_LOG_UNIT "utils"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <string>

#include "file_io.h"
#include "fileindex/queue.h"
#include "flock.h"
#include "json_io.h"
#include "status_mgr/status_change.h"
#include "unique_fd.h"
#include "utils/log.h"
#include "utils/queue_reader.h"
#include "utils/storage.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

// Writes `line` at the end of the locked queue `fd` in one call, line-aligned (file_io.h). False
// when the event is not in the queue whole.
bool WriteLineAligned(int fd, const std::string& line) {
  ssize_t written = 0;
  size_t wanted = 0;
  if (AppendLineAligned(fd, line, written, wanted)) {
    return true;
  }
  if (wanted != 0) {
    FILEINDEX_LOG_DEBUG("write fail, (%ld, %ld)", static_cast<long>(written),
                        static_cast<long>(wanted));
  }
  return false;
}

// Appends `line` under an exclusive lock of the queue file; false when the queue cannot be
// opened or locked or the line not written whole. Contention that outlasts the attempts drops
// the line and still counts as appended: the monitor and the daemon hold the lock only briefly,
// and a caller that is told otherwise flags the whole share for reindexing.
bool AppendLine(const std::string& queuePath, const std::string& line) {
  const auto open = [&queuePath] {
    // Read as well as write: the last byte tells whether the file ends with a whole line.
    return OpenLocationFile(queuePath, O_RDWR | O_CREAT | O_APPEND, 0644);
  };
  UniqueFd fd;
  switch (FlockRetrying(open, LOCK_EX, fd)) {
    case FlockResult::kLocked:
      break;
    case FlockResult::kOpenFailed:
      FILEINDEX_LOG("Failed to open queue=%s, reason=%s", queuePath.c_str(),
                    detail::ErrnoText().c_str());
      return false;
    case FlockResult::kFailed:
      FILEINDEX_LOG_DEBUG("flock fail, path=%s, reason=%s", queuePath.c_str(),
                          detail::ErrnoText().c_str());
      return false;
    case FlockResult::kBusy:
      FILEINDEX_LOG_DEBUG("try lock too many times, path=%s, reason=%s", queuePath.c_str(),
                          detail::ErrnoText().c_str());
      return true;
  }

  // One write on an O_APPEND descriptor under the lock: lines of concurrent writers never
  // interleave.
  const bool written = WriteLineAligned(fd.get(), line);
  flock(fd.get(), LOCK_UN);
  return written;
}

// Appends the event to the share's queue; false, logged, when it cannot be queued.
bool AppendEvent(const std::string& share, int event, const std::string& path,
                 const Json::Value& data) {
  std::string queue;
  if (!ShareQueuePath(share, queue)) {
    FILEINDEX_LOG("FILEIDXQueuePathGet failed, share=%s", share.c_str());
    return false;
  }
  // A queued reindex of the path covers every other event for it.
  if (IsReindexQueued(path, queue) || IsReindexQueued(path, QueueTmpOf(queue))) {
    return true;
  }
  Json::Value entry(Json::objectValue);
  entry["event"] = event;
  entry["path"] = path;
  entry["data"] = data;
  return AppendLine(queue, JsonToString(entry) + "\n");
}

}  // namespace

bool AddCustomEvent(const int& event, const std::string& path, const Json::Value& data) {
  char shareName[WEZO_SHARE_NAME_MAX] = {};
  char sharePath[WEZO_SHARE_PATH_MAX] = {};
  if (WEZOShareNamePathGet(path.c_str(), shareName, sizeof shareName, sharePath, sizeof sharePath) <
      0) {
    FILEINDEX_LOG("WEZOShareNamePathGet failed, path=%s", path.c_str());
  } else if (AppendEvent(shareName, event, path, data)) {
    return true;
  }

  // The event is lost; indexing the whole share again from scratch makes up for it.
  if (!ChangeStatus([&](Status& s) { return s.ShareSetNeedReindex(shareName, true); })) {
    FILEINDEX_LOG("ShareSetNeedReindex failed, share=%s", shareName);
  }
  return false;
}

}  // namespace FILEINDEX
}  // namespace WEZO
