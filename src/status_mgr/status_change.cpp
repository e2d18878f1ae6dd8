#define FILEINDEX_LOG_UNIT "status_mgr"

#include "status_mgr/status_change.h"

#include "config/snapshot.h"
#include "config/transaction.h"
#include "fileindex/daemon.h"
#include "utils/log.h"

namespace WEZO {
namespace FILEINDEX {

bool ChangeStatus(const std::function<bool(Status&)>& change, const DaemonCommand& command) {
  Status status;
  ConfigTransaction transaction(status);
  if (!transaction.Begin() || !change(status) || !transaction.Commit()) {
    return false;
  }
  if (!command.type.empty() && !SendCammandToDaemon(command.type, command.data)) {
    FILEINDEX_LOG("SendCammandToDaemon failed");
    return false;
  }
  return true;
}

bool QueryStatus(const std::function<bool(const Status&)>& query) {
  const std::shared_ptr<const Status> status = StatusSnapshot();
  return status != nullptr && query(*status);
}

bool ReviveShare(const std::string& share) {
  Json::Value data(Json::objectValue);
  data["share_name"] = share;
  return ChangeStatus([&](Status& s) { return s.ShareSetNoSpace(share, false); },
                      {"revive_share_worker", data});
}

}  // namespace FILEINDEX
}  // namespace WEZO
