// The status file read and changed as one step each, for everything that needs a share flag or
// the pause state: the status manager's operations, the index manager and the queue writer. It
// stands below both managers, so that neither calls the other. Logs under "status_mgr".
// One thread per call; processes are ordered by the status file's lock.
#ifndef FILEINDEX_SRC_STATUS_MGR_STATUS_CHANGE_H_
#define FILEINDEX_SRC_STATUS_MGR_STATUS_CHANGE_H_

#include <json/value.h>

#include <functional>
#include <string>

#include "fileindex/status.h"

namespace WEZO {
namespace FILEINDEX {

// A daemon command to send once a change is saved; an empty type sends nothing.
struct DaemonCommand {
  std::string type;
  Json::Value data;
};

// Lock, load, `change`, save, send `command`, unlock (config/transaction.h). True when every step
// succeeded. A failed step is logged by the step (a failed send here); the daemon hears nothing of
// a change that was not saved.
bool ChangeStatus(const std::function<bool(Status&)>& change, const DaemonCommand& command = {});

// Answers `query` on the status file as it is now, read without the lock (config/snapshot.h: a
// file unchanged since this process last read it is not read again); false when the file cannot
// be loaded.
bool QueryStatus(const std::function<bool(const Status&)>& query);

// Clears the share's "no_space" flag and tells the daemon to give the share its worker back.
bool ReviveShare(const std::string& share);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_STATUS_MGR_STATUS_CHANGE_H_
