// The folder list's records and pages, worked out from a parsed folder.conf or a list of records
// without a Folders object: the listing answers from the per-process snapshot (snapshot.h), which
// the managers read through LoadFolderList when the file cannot be kept.
#ifndef FILEINDEX_SRC_CONFIG_FOLDER_PAGE_H_
#define FILEINDEX_SRC_CONFIG_FOLDER_PAGE_H_

#include <json/value.h>

#include <memory>
#include <string>
#include <vector>

#include "config/snapshot.h"
#include "fileindex/folder.h"

namespace WEZO {
namespace FILEINDEX {

// The records of `document`, a JSON object as folder.conf holds it, in byte order of the paths,
// placed as Folders::Load places them (each share looked up once, the same lines logged, no code
// left by a share that is gone).
std::vector<Folder> FolderRecordsOf(const Json::Value& document);

// The list as Folders::Load reads it, for a folder.conf that the snapshot cannot keep: the loader
// that the managers hand to FolderListSnapshot. Null after a failure that Folders::Load logged.
std::shared_ptr<const FolderSnapshot> LoadFolderList();

// One page of `folders` (in byte order of the paths), as Folders::List gives it.
void FolderPage(const std::vector<Folder>& folders, Json::Value& out, unsigned long offset,
                unsigned long limit, const std::string& sort_by, const std::string& sort_direction,
                const Json::Value& additional);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_CONFIG_FOLDER_PAGE_H_
