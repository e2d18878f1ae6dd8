// A folder's JSON form with its additional values, for the folder list's paged listing, which
// works out the page's "status" and "is_valid" values in one pass (progress.h) and hands them in
// here, so that every log line and error code of the additional values stays the folder's own.
#ifndef FILEINDEX_SRC_CONFIG_FOLDER_ADDITIONAL_H_
#define FILEINDEX_SRC_CONFIG_FOLDER_ADDITIONAL_H_

#include <json/value.h>

#include <string>

#include "fileindex/folder.h"

namespace WEZO {
namespace FILEINDEX {

// Values already worked out for one folder; a null pointer means "work it out".
struct KnownAdditional {
  const std::string* status = nullptr;
  const bool* isValid = nullptr;
};

// Folder::asJson(names), taking "status" and "is_valid" from `known` where it has them.
Json::Value FolderJsonWith(const Folder& folder, const Json::Value& names,
                           const KnownAdditional& known);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_CONFIG_FOLDER_ADDITIONAL_H_
