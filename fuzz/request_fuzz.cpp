// Requests of the index manager as any caller may send them, against a folder list of two
// folders: no request crashes, leaks a share record or lets an exception out; a refused request
// leaves folder.conf byte for byte as it was; and what an operation reports done is in the list.
//
// Input: one byte choosing the operation (Upsert, Delete or Reindex), then the request's JSON
// text; text that is not JSON is skipped.
#include <json/value.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/folders.h"
#include "fileindex/index_mgr.h"
#include "fuzz_support.h"
#include "json_io.h"
#include "paths.h"

namespace {

using WEZO::FILEINDEX::ErrorHandler;
using WEZO::FILEINDEX::Folder;
using WEZO::FILEINDEX::IndexMgr;

constexpr char kSeedList[] =
    R"({"/photo/a":{"name":"a","photo":true},"/video/b":{"name":"b","video":true}})";

// Puts the sandbox back as every input finds it: the two-folder list, no status file, no queues.
void ResetSandbox(const std::string& root) {
  fuzzsupport::ResetPlatform(root + "/volume1");
  fuzzsupport::WriteBytes(WEZO::FILEINDEX::FolderConfPath(),
                          reinterpret_cast<const uint8_t*>(kSeedList), sizeof kSeedList - 1);
  unlink(WEZO::FILEINDEX::StatusConfPath().c_str());
  for (const char* share : {"photo", "video"}) {
    const std::string queue = root + "/volume1/" + share + "/@eaDir/WEZO@file_index_queue";
    unlink(queue.c_str());
  }
}

bool Listed(const std::vector<Folder>& folders, const std::string& path) {
  return std::any_of(folders.begin(), folders.end(),
                     [&](const Folder& folder) { return folder.GetPath() == path; });
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1) {
    return 0;
  }
  Json::Value request;
  if (!WEZO::FILEINDEX::JsonFromString(request, reinterpret_cast<const char*>(data) + 1,
                                       size - 1)) {
    return 0;
  }
  const std::string& root = fuzzsupport::Root();
  fuzzsupport::StartDaemon();
  ResetSandbox(root);
  const std::string before = fuzzsupport::ReadBytes(WEZO::FILEINDEX::FolderConfPath());

  ErrorHandler::SetError(WEZO::FILEINDEX::FILEINDEX_ERR_NONE);
  bool ok = false;
  switch (data[0] % 3) {
    case 0:
      ok = IndexMgr::Upsert(request);
      break;
    case 1:
      ok = IndexMgr::Delete(request);
      break;
    default:
      ok = IndexMgr::Reindex(request);
      break;
  }
  const int code = ErrorHandler::GetError();

  if (fake::Get().openShareRecords != 0) {
    fuzzsupport::Fail("a share record was not released");
  }
  if (!ok &&
      (code == WEZO::FILEINDEX::FILEINDEX_ERR_BAD_PARAM ||
       code == WEZO::FILEINDEX::FILEINDEX_ERR_EXCEED_MAX_FOLDER) &&
      fuzzsupport::ReadBytes(WEZO::FILEINDEX::FolderConfPath()) != before) {
    fuzzsupport::Fail("a refused request changed folder.conf (code " + std::to_string(code) + ")");
  }
  std::vector<Folder> folders;
  if (!IndexMgr::List(folders) || folders.size() > WEZO::FILEINDEX::Folders::kMaxFolders) {
    fuzzsupport::Fail("folder.conf no longer loads, or is over full");
  }
  if (ok && data[0] % 3 != 2) {
    for (const Json::Value& element : request) {
      const bool upsert = data[0] % 3 == 0;
      const std::string path = upsert ? element["path"].asString() : element.asString();
      if (Listed(folders, path) != upsert) {
        fuzzsupport::Fail("a done request is not in the list: " + path);
      }
    }
  }
  return 0;
}
