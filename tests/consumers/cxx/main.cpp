// Uses the class interface of an installed libfileindex under the root prefix given as the only
// argument: a configuration class through its base (the exported vtable and type information), a
// query that reads the missing folder list, the last-error slot and a JSON reader.
#include <fileindex/fileindex.h>
#include <json/value.h>

#include <cstdio>
#include <memory>
#include <string>
#include <vector>

int main(int argc, char** argv) {
  namespace fi = WEZO::FILEINDEX;
  const std::string root = argc == 2 ? argv[1] : "";
  const std::unique_ptr<fi::Config> config = std::make_unique<fi::Folders>();
  auto* folders = dynamic_cast<fi::Folders*>(config.get());
  std::vector<fi::Folder> list;
  const bool listed = argc == 2 && fi::SetRootPrefix(root) && folders != nullptr &&
                      config->GetPath() == root + "/usr/wezo/etc/fileindex/folder.conf" &&
                      config->Load() && folders->List(list) && list.empty() &&
                      !fi::IndexMgr::IsShareIndexed("photo");
  fi::ErrorHandler::SetError(fi::FILEINDEX_ERR_LOCK);
  Json::Value request(Json::objectValue);
  request["share_name"] = "photo";
  std::string share;
  const bool ok = listed && fi::ErrorHandler::GetError() == fi::FILEINDEX_ERR_LOCK &&
                  fi::RetrieveStringFromJsonObj(share, "share_name", request) && share == "photo";
  std::puts(ok ? "c++ consumer: ok" : "c++ consumer: a call of the class interface answered wrong");
  return ok ? 0 : 1;
}
