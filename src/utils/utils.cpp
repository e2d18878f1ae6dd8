#define FILEINDEX_LOG_UNIT "utils"

#include "fileindex/utils.h"

#include <sys/stat.h>
#include <wezo/platform.h>

#include <algorithm>
#include <cstring>
#include <optional>
#include <utility>

#include "fileindex/error.h"
#include "paths.h"
#include "utils/log.h"
#include "utils/share_memo.h"
#include "utils/share_record.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

thread_local ShareLookupMemo::Volumes* t_memo = nullptr;

bool LstatTypeIs(const std::string& path, mode_t type) {
  struct stat st {};
  return lstat(path.c_str(), &st) == 0 && (st.st_mode & S_IFMT) == type;
}

bool FullPathOn(const std::optional<std::string>& volume, const std::string& path,
                std::string& fullPath) {
  if (!volume) {
    ErrorHandler::SetError(FILEINDEX_ERR_PATH);
    return false;
  }
  fullPath = *volume + path;
  return true;
}

}  // namespace

ShareLookupMemo::ShareLookupMemo() {
  if (t_memo == nullptr) {
    t_memo = &m_volumes;
    m_installed = true;
  }
}

ShareLookupMemo::~ShareLookupMemo() {
  if (m_installed) {
    t_memo = nullptr;
  }
}

ShareLookupMemo::Volumes* ShareLookupMemo::Current() { return t_memo; }

bool IsDirExist(const std::string& path) { return LstatTypeIs(path, S_IFDIR); }

bool IsFileExist(const std::string& path) { return LstatTypeIs(path, S_IFREG); }

bool RetrieveStringFromJsonObj(std::string& out, const std::string& key, const Json::Value& obj) {
  if (!obj.isObject()) {
    return false;
  }
  const Json::Value* member = obj.find(key.data(), key.data() + key.size());
  if (member == nullptr || !member->isString()) {
    return false;
  }
  std::string value = member->asString();
  out.swap(value);
  return true;
}

bool RetrieveBoolFromJsonObj(bool& out, const std::string& key, const Json::Value& obj) {
  if (!obj.isObject()) {
    return false;
  }
  const Json::Value* member = obj.find(key.data(), key.data() + key.size());
  if (member == nullptr || !member->isBool()) {
    return false;
  }
  out = member->asBool();
  return true;
}

bool StringStartWith(const std::string& str, const std::string& prefix) {
  if (prefix.size() > str.size()) {
    return false;
  }
  return std::strncmp(str.c_str(), prefix.c_str(), prefix.size()) == 0;
}

bool GetShareNameByPath(std::string& shareName, const std::string& path) {
  if (path.empty()) {
    return false;
  }
  // The leading slash is assumed, not checked: callers always pass share paths.
  const size_t slash = path.find('/', 1);
  shareName = path.substr(1, slash == std::string::npos ? std::string::npos : slash - 1);
  return true;
}

bool GetShareNamePathByFullPath(std::string& shareName, std::string& sharePath,
                                const std::string& fullPath) {
  char name[WEZO_SHARE_NAME_MAX] = {};
  char path[WEZO_SHARE_PATH_MAX] = {};
  if (WEZOShareNamePathGet(fullPath.c_str(), name, sizeof name, path, sizeof path) < 0) {
    FILEINDEX_LOG("WEZOShareNamePathGet failed, path=%s", fullPath.c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_PATH);
    return false;
  }
  shareName.assign(name, strnlen(name, sizeof name));
  sharePath.assign(path, strnlen(path, sizeof path));
  return true;
}

bool GetFullPath(std::string& fullPath, const std::string& path) {
  std::string shareName;
  if (!GetShareNameByPath(shareName, path)) {
    FILEINDEX_LOG("GetShareNameByPath failed, path=%s", path.c_str());
    return false;
  }
  ShareLookupMemo::Volumes* const memo = ShareLookupMemo::Current();
  auto known = memo != nullptr ? memo->find(shareName) : ShareLookupMemo::Volumes::iterator();
  if (memo == nullptr || known == memo->end()) {
    ShareRecord share;
    std::optional<std::string> volume;
    if (LookUpShare(shareName, share) >= 0 && share) {
      // The volume comes from where the share really lies: everything before the share's own
      // name.
      const std::string sharePath = SharePathOf(*share);
      volume = sharePath.substr(0, std::min(sharePath.rfind('/'), sharePath.size()));
    }
    if (memo == nullptr) {
      return FullPathOn(volume, path, fullPath);
    }
    known = memo->emplace(shareName, std::move(volume)).first;
  }
  return FullPathOn(known->second, path, fullPath);
}

std::string ReplaceShareName(const std::string& path, const std::string& newShareName) {
  if (path.empty()) {
    return std::string();
  }
  const size_t slash = path.find('/', 1);
  if (slash == std::string::npos) {
    return "/" + newShareName;
  }
  return "/" + newShareName + path.substr(slash);
}

bool NotifyNoSpace() {
  // The link that the notification's text is wrapped in: it opens the file-index page of the
  // administration application.
  static constexpr char kLinkOpen[] =
      "<a data-wezo-app=\"WEZO.RKS.AdminCenter.Application\" "
      "data-wezo-fn=\"WEZO.RKS.AdminCenter.MediaIndex.Main\" data-wezo-tab=\"fileIndex\">";
  const std::string tool = NotifyToolPath();
  const char* const argv[] = {
      tool.c_str(),
      "-e",
      "false",
      "-c",
      "WEZO.RKS.AdminCenter.Application",
      "@administrators",
      "fileindex:fileindex_title",
      "fileindex:notify_no_space",
      kLinkOpen,
      "</a>",
      nullptr,
  };
  return WLIBCExecv(tool.c_str(), argv, 1) == 0;
}

}  // namespace FILEINDEX
}  // namespace WEZO
