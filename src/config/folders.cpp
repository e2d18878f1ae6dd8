#define FILEINDEX_LOG_UNIT "folders"

#include "fileindex/folders.h"

#include <wezo/platform.h>

#include <algorithm>
#include <cstddef>
#include <utility>
#include <vector>

#include "config/folder_additional.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "paths.h"
#include "status_mgr/progress.h"
#include "utils/log.h"
#include "utils/share_memo.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

// The file types of a change report, in the order the report lists them.
constexpr const char* kFileTypes[] = {"document", "audio", "video", "photo"};

// Per file type: true when the setting differs between `before` and `after`, or when either of
// them has no setting for it.
Json::Value ChangeReport(const Json::Value& before, const Json::Value& after) {
  Json::Value report(Json::objectValue);
  for (const char* type : kFileTypes) {
    const bool comparable = before.isMember(type) && after.isMember(type);
    report[type] = !comparable || before[type].asBool() != after[type].asBool();
  }
  return report;
}

using FolderOrder = bool (*)(const Folder&, const Folder&);

FolderOrder OrderBy(const std::string& sortBy) {
  if (sortBy == "name") {
    return [](const Folder& a, const Folder& b) {
      return WLIBCUnicodeUTF8StrCaseCmp(a.GetName().c_str(), b.GetName().c_str()) < 0;
    };
  }
  if (sortBy == "document") {
    return [](const Folder& a, const Folder& b) { return !a.GetDocument() && b.GetDocument(); };
  }
  if (sortBy == "audio") {
    return [](const Folder& a, const Folder& b) { return !a.GetAudio() && b.GetAudio(); };
  }
  if (sortBy == "video") {
    return [](const Folder& a, const Folder& b) { return !a.GetVideo() && b.GetVideo(); };
  }
  if (sortBy == "photo") {
    return [](const Folder& a, const Folder& b) { return !a.GetPhoto() && b.GetPhoto(); };
  }
  return [](const Folder& a, const Folder& b) {
    return WLIBCUnicodeUTF8StrCaseCmp(a.GetPath().c_str(), b.GetPath().c_str()) < 0;
  };
}

// `folders` in the order of `before`, by a bottom-up merge sort. Folders that compare equal keep
// their order in `folders` (the list's byte order of paths), so a page never depends on the
// sort's whims. It also stays within the vector and ends whatever `before` answers: the
// platform's text comparison need not be a strict weak ordering for every byte string, and
// std::sort given one that is not may read past the vector's end.
std::vector<const Folder*> SortedFolders(const std::vector<Folder>& folders, FolderOrder before) {
  std::vector<const Folder*> order;
  order.reserve(folders.size());
  for (const Folder& folder : folders) {
    order.push_back(&folder);
  }
  const size_t size = order.size();
  std::vector<const Folder*> merged;
  merged.reserve(size);
  for (size_t width = 1; width < size; width *= 2) {
    merged.clear();
    for (size_t low = 0; low < size; low += 2 * width) {
      const size_t middle = std::min(low + width, size);
      const size_t high = std::min(middle + width, size);
      size_t left = low;
      size_t right = middle;
      while (left < middle && right < high) {
        merged.push_back(before(*order[right], *order[left]) ? order[right++] : order[left++]);
      }
      merged.insert(merged.end(), order.begin() + static_cast<std::ptrdiff_t>(left),
                    order.begin() + static_cast<std::ptrdiff_t>(middle));
      merged.insert(merged.end(), order.begin() + static_cast<std::ptrdiff_t>(right),
                    order.begin() + static_cast<std::ptrdiff_t>(high));
    }
    order.swap(merged);
  }
  return order;
}

}  // namespace

std::string Folders::GetLockPath() const { return FolderLockPath(); }

std::string Folders::GetPath() const { return FolderConfPath(); }

bool Folders::Load() {
  // Every folder of a share lies on the same volume: the share is looked up once per load.
  const ShareLookupMemo memo;
  if (!LoadJson()) {
    return false;
  }
  if (!m_jsRoot.isObject()) {
    FILEINDEX_LOG("Malformed folders: %s", JsonToString(m_jsRoot).c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_MALFORMED_FOLDERS);
    return false;
  }
  for (auto it = m_jsRoot.begin(); it != m_jsRoot.end(); ++it) {
    // A folder whose share is gone is kept: it reports itself as not valid, and the user removes
    // it. That is no failure of the load, so the code its full path left is not kept either.
    // The stored "path" is ignored; the member's name is the folder's path.
    Folder folder;
    const std::string path = it.name();
    const _tag_fileindex_err_ code = ErrorHandler::GetError();
    if (!folder.Load(path, *it)) {
      ErrorHandler::SetError(code);
    }
    m_folders.emplace(path, std::move(folder));
  }
  return true;
}

bool Folders::Save() {
  m_jsRoot = Json::Value(Json::objectValue);
  for (const auto& entry : m_folders) {
    if (!entry.second.AddToJson(m_jsRoot)) {
      return false;
    }
  }
  return SaveJson();
}

bool Folders::List(std::vector<Folder>& out) const { return List(out, std::string()); }

bool Folders::List(std::vector<Folder>& out, const std::string& share) const {
  out.clear();
  for (const auto& entry : m_folders) {
    if (!share.empty()) {
      std::string name;
      if (!GetShareNameByPath(name, entry.first) || name != share) {
        continue;
      }
    }
    out.push_back(entry.second);
  }
  return true;
}

bool Folders::List(Json::Value& out, unsigned long offset, unsigned long limit,
                   const std::string& sort_by, const std::string& sort_direction,
                   const Json::Value& additional) const {
  std::vector<Folder> folders;
  List(folders);
  const size_t total = folders.size();

  out = Json::Value(Json::objectValue);
  out["total"] = static_cast<Json::UInt>(total);
  out["offset"] = static_cast<Json::UInt64>(offset);

  const std::vector<const Folder*> sorted = SortedFolders(folders, OrderBy(sort_by));

  const size_t count = offset >= total ? 0 : std::min<size_t>(total - offset, limit);
  // A descending page is the start of the ascending order, reversed, whatever the offset; the
  // management interface has always paged this way.
  std::vector<const Folder*> onPage;
  onPage.reserve(count);
  for (size_t i = 0; i < count; ++i) {
    onPage.push_back(sort_direction == "DESC" ? sorted[count - 1 - i] : sorted[offset + i]);
  }

  // The page's additional values in one pass: the names asked for before any that is not a
  // string, as each folder goes through them.
  bool wantStatus = false;
  bool wantValid = false;
  if (additional.isArray()) {
    for (const Json::Value& name : additional) {
      if (!name.isString()) {
        break;
      }
      wantStatus = wantStatus || name.asString() == "status";
      wantValid = wantValid || name.asString() == "is_valid";
    }
  }
  std::vector<bool> valid;
  std::vector<std::string> states;
  std::vector<std::string> paths;
  for (const Folder* folder : onPage) {
    paths.push_back(folder->GetPath());
    if (wantValid) {
      valid.push_back(CanPathBeIndexed(folder->GetPath()));
    }
  }
  if (wantStatus) {
    states = FoldersProgress(paths, wantValid ? &valid : nullptr);
  }

  Json::Value page(Json::arrayValue);
  for (size_t i = 0; i < onPage.size(); ++i) {
    KnownAdditional known;
    const bool isValid = wantValid && valid[i];
    if (wantValid) {
      known.isValid = &isValid;
    }
    if (wantStatus) {
      known.status = &states[i];
    }
    page.append(FolderJsonWith(*onPage[i], additional, known));
  }
  out["folder"] = std::move(page);
  return true;
}

bool Folders::Get(Json::Value& out, const std::string& path) const {
  const auto it = m_folders.find(path);
  if (it == m_folders.end()) {
    FILEINDEX_LOG("No such folder: %s", path.c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_NO_SUCH_FOLDER);
    return false;
  }
  out = it->second.asJson();
  return true;
}

bool Folders::Upsert(Json::Value& result, const Json::Value& request) {
  std::vector<Folder> before;
  if (!List(before)) {
    return false;
  }

  std::string path;
  std::string fullPath;
  if (!RetrieveStringFromJsonObj(path, "path", request) ||
      !WEZO::FILEINDEX::GetFullPath(fullPath, path)) {
    FILEINDEX_LOG("Bad param: %s", JsonToString(request).c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
    return false;
  }

  auto it = m_folders.find(path);
  if (it == m_folders.end()) {
    Folder folder;
    folder.Load(path, request);
    it = m_folders.emplace(path, std::move(folder)).first;
    // Counted after the insertion, so a change to a folder of a full list still goes through.
    if (m_folders.size() > kMaxFolders) {
      FILEINDEX_LOG("Exceed max folder size");
      ErrorHandler::SetError(FILEINDEX_ERR_EXCEED_MAX_FOLDER);
      return false;
    }
  } else {
    Folder changed = it->second;
    changed.Reload(path, request);
    it->second = std::move(changed);
  }

  result = ChangeReport(GetMostSuitableCfg(std::move(before), fullPath), it->second.asJson());
  return true;
}

bool Folders::Delete(Json::Value& result, const std::string& path) {
  std::vector<Folder> before;
  if (!List(before)) {
    return false;
  }
  m_folders.erase(path);
  std::vector<Folder> after;
  if (!List(after)) {
    return false;
  }

  std::string fullPath;
  if (!WEZO::FILEINDEX::GetFullPath(fullPath, path)) {
    return true;
  }
  result = Json::Value(Json::objectValue);
  result[path] = ChangeReport(GetMostSuitableCfg(std::move(before), fullPath),
                              GetMostSuitableCfg(std::move(after), fullPath));
  return true;
}

// NOLINTNEXTLINE(performance-unnecessary-value-param): callers hand over lists they are done with
Json::Value GetMostSuitableCfg(std::vector<Folder> folders, const std::string& fullPath) {
  const std::string target = fullPath + "/";
  const Folder* match = nullptr;
  for (const Folder& folder : folders) {
    // A folder whose share is gone holds no place; asking it for one would log and set a code.
    // The last match wins: in share-path order that is the deepest folder enclosing the target.
    if (folder.HasFullPath() && StringStartWith(target, folder.GetFullPath() + "/")) {
      match = &folder;
    }
  }
  return match != nullptr ? match->asJson() : Json::Value(Json::objectValue);
}

}  // namespace FILEINDEX
}  // namespace WEZO
