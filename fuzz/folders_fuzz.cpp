// folder.conf as anything a disk or a careless hand may leave: loading it either fails with its
// code or gives a list whose every query and page works, and which saves and loads back to the
// same list.
#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/folders.h"
#include "fileindex/index_mgr.h"
#include "fuzz_support.h"
#include "json_io.h"
#include "paths.h"

namespace {

using WEZO::FILEINDEX::Folder;
using WEZO::FILEINDEX::Folders;
using WEZO::FILEINDEX::IndexMgr;

Json::Value ListAsJson(const std::vector<Folder>& folders) {
  Json::Value out(Json::arrayValue);
  for (const Folder& folder : folders) {
    out.append(folder.asJson());
  }
  return out;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string& root = fuzzsupport::Root();
  fuzzsupport::ResetPlatform(root + "/volume1");
  const std::string path = WEZO::FILEINDEX::FolderConfPath();
  fuzzsupport::WriteBytes(path, data, size);

  Folders list;
  WEZO::FILEINDEX::ErrorHandler::SetError(WEZO::FILEINDEX::FILEINDEX_ERR_NONE);
  if (!list.Load()) {
    const int code = WEZO::FILEINDEX::ErrorHandler::GetError();
    if (code != WEZO::FILEINDEX::FILEINDEX_ERR_LOAD_JSON &&
        code != WEZO::FILEINDEX::FILEINDEX_ERR_MALFORMED_FOLDERS) {
      fuzzsupport::Fail("a failed load set code " + std::to_string(code));
    }
    return 0;
  }
  std::vector<Folder> folders;
  list.List(folders);
  for (const Folder& folder : folders) {
    Json::Value got;
    if (!list.Get(got, folder.GetPath()) || got != folder.asJson()) {
      fuzzsupport::Fail("Get does not give the listed folder " + folder.GetPath());
    }
    if (!IndexMgr::IsPathIndexed(folder.GetPath(), folders) ||
        !IndexMgr::IsPathContainIndexed(folder.GetPath(), folders)) {
      fuzzsupport::Fail("a listed folder is not indexed: " + folder.GetPath());
    }
    if (!folder.GetFullPath().empty() &&
        !IndexMgr::IsFullPathIndexed(folder.GetFullPath(), folders)) {
      fuzzsupport::Fail("a listed folder's full path is not indexed: " + folder.GetFullPath());
    }
  }

  static const char* const kSorts[] = {"name", "document", "photo", "path"};
  Json::Value additional(Json::arrayValue);
  additional.append("is_valid");
  additional.append("full_path");
  Json::Value page;
  if (!list.List(page, size % 3, 1 + size % 4, kSorts[size % 4], size % 2 == 0 ? "DESC" : "ASC",
                 additional) ||
      page["total"].asUInt64() != folders.size() || page["folder"].size() > 1 + size % 4) {
    fuzzsupport::Fail("a page of the list is wrong: " + WEZO::FILEINDEX::JsonToString(page));
  }

  if (!list.Save()) {
    fuzzsupport::Fail("the list does not save");
  }
  Folders again;
  std::vector<Folder> reloaded;
  if (!again.Load() || !again.List(reloaded) || ListAsJson(reloaded) != ListAsJson(folders)) {
    fuzzsupport::Fail("the saved list loads back different: " + fuzzsupport::ReadBytes(path));
  }
  return 0;
}
