// The index manager: the operations callers use on the list of indexed folders, and the
// registration of each share's indexed folders with the platform's file-change monitor.
//
// Every operation is static and self-contained: it reads folder.conf afresh through a short-lived
// Folders object and keeps nothing between calls. Callable from any process.
#ifndef FILEINDEX_INDEX_MGR_H_
#define FILEINDEX_INDEX_MGR_H_

#include <string>
#include <vector>

#include "fileindex/export.h"
#include "fileindex/folder.h"

namespace WEZO {
namespace FILEINDEX {

class FILEINDEX_EXPORT IndexMgr {
 public:
  IndexMgr() = delete;

  // Stores every indexed folder in `folders`, in byte order of their share paths. Reads without
  // the folder list's lock, so it sees the list as the last complete save left it. Returns false,
  // with the code of Folders::Load, when folder.conf cannot be read.
  static bool List(std::vector<Folder>& folders);

  // Registers the indexed folders of the share `share` with the file-change monitor, replacing
  // the share's previous registration: the monitor then appends the events under each folder
  // (except in the metadata directory "@eaDir") to the share's event queue. A share without
  // indexed folders is registered with none. Returns false, logged and with the previous
  // registration left as it was, when the queue, the folder list or a folder's full path cannot
  // be resolved or the monitor refuses. Sets no error code.
  static bool UpsertWEZotifydCfg(const std::string& share);

  // Removes the share's registration from the file-change monitor; one that does not exist counts
  // as removed. Returns false, logged, when the queue cannot be resolved or the monitor refuses.
  // Sets no error code.
  static bool DeleteWEZotifydCfg(const std::string& share);
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_INDEX_MGR_H_
