// Uses the class interface of an installed libfileindex under the root prefix given as the only
// argument: a configuration class through its base (the exported vtable and type information), a
// query that reads the missing folder list, the last-error slot and a JSON reader.
#include <fileindex/fileindex.h>
#include <json/value.h>

#include <cstdio>
#include <memory>
#include <string>
#include <vector>

namespace {

int failures = 0;

void Check(bool ok, const char* what) {
  if (!ok) {
    std::fprintf(stderr, "failed: %s\n", what);
    ++failures;
  }
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: %s ROOT\n", argv[0]);
    return 2;
  }
  namespace fi = WEZO::FILEINDEX;
  const std::string root = argv[1];
  Check(fi::SetRootPrefix(root), "SetRootPrefix");
  Check(fi::GetRootPrefix() == root, "GetRootPrefix");

  const std::unique_ptr<fi::Config> config = std::make_unique<fi::Folders>();
  auto* folders = dynamic_cast<fi::Folders*>(config.get());
  Check(folders != nullptr, "dynamic_cast to Folders");
  Check(config->GetPath() == root + "/usr/wezo/etc/fileindex/folder.conf", "Folders::GetPath");
  Check(config->Load(), "Folders::Load of a missing file");
  std::vector<fi::Folder> list;
  Check(folders != nullptr && folders->List(list) && list.empty(), "Folders::List");

  Check(!fi::IndexMgr::IsShareIndexed("photo"), "IsShareIndexed");
  fi::ErrorHandler::SetError(fi::FILEINDEX_ERR_LOCK);
  Check(fi::ErrorHandler::GetError() == fi::FILEINDEX_ERR_LOCK, "ErrorHandler");

  Json::Value request(Json::objectValue);
  request["share_name"] = "photo";
  std::string share;
  Check(fi::RetrieveStringFromJsonObj(share, "share_name", request) && share == "photo",
        "RetrieveStringFromJsonObj");

  if (failures == 0) {
    std::puts("c++ consumer: ok");
  }
  return failures == 0 ? 0 : 1;
}
