// How far indexing has come, read straight from the status file and the shares' event queues:
// for the folder list's "status" additional (Folder::GetAdditional) and for the status manager.
// It reads the folder list nowhere, so the list can ask it about its folders. Logs under
// "status_mgr". Takes no lock; reentrant.
#ifndef FILEINDEX_SRC_STATUS_MGR_PROGRESS_H_
#define FILEINDEX_SRC_STATUS_MGR_PROGRESS_H_

#include <string>
#include <vector>

namespace WEZO {
namespace FILEINDEX {

// The state of indexing over the indexed folders at the share paths `paths`: "finished" when no
// share of an indexable folder has a queue or a queue companion (existence alone counts),
// otherwise "processing" or "paused" after the pause state. False, logged, when a share name or
// a queue path cannot be had or the pause state cannot be read.
bool OverallProgress(const std::vector<std::string>& paths, std::string& status);

// The state of the folder at the share path `path`: "paused" when it cannot be indexed,
// "err_no_space" when its share ran out of room, "finished" when no queued event lies inside it
// (or its share or queue cannot be had, logged), otherwise "processing" or "paused" after the
// pause state (one that cannot be read counts as not paused).
std::string FolderProgress(const std::string& path);

// The states of the folders at the share paths `paths`, in their order, each exactly as
// FolderProgress gives it, in one pass: eligibility once per folder (taken from `indexable`, one
// entry per path, when the caller has it already) and each share's facts once (eligibility_pass.h),
// the status file once, each share's queue path once and each share's queue and companion read
// once for all of its folders.
std::vector<std::string> FoldersProgress(const std::vector<std::string>& paths,
                                         const std::vector<bool>* indexable = nullptr);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_STATUS_MGR_PROGRESS_H_
