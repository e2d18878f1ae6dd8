#define FILEINDEX_LOG_UNIT "folders"

#include "fileindex/folders.h"

#include <wezo/platform.h>

#include <algorithm>
#include <cstddef>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "config/folder_additional.h"
#include "config/folder_page.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "paths.h"
#include "status_mgr/progress.h"
#include "utils/eligibility_pass.h"
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

// Whether a folder placed at `folderFull` holds `fullPath`: the same place or an ancestor.
bool Encloses(const std::string& folderFull, const std::string& fullPath) {
  return fullPath.size() >= folderFull.size() &&
         fullPath.compare(0, folderFull.size(), folderFull) == 0 &&
         (fullPath.size() == folderFull.size() || fullPath[folderFull.size()] == '/');
}

const Folder& RecordOf(const Folder& folder) { return folder; }
const Folder& RecordOf(const std::pair<const std::string, Folder>& entry) { return entry.second; }

// The JSON form of the folder whose setting applies at `fullPath` among `folders` (records or
// path -> record entries, in share-path order); an empty object when none applies.
template <typename Records>
Json::Value SettingAt(const Records& folders, const std::string& fullPath) {
  const Folder* match = nullptr;
  for (const auto& element : folders) {
    const Folder& folder = RecordOf(element);
    // A folder whose share is gone holds no place; asking it for one would log and set a code.
    // The last match wins: in share-path order that is the deepest folder enclosing the target.
    if (folder.HasFullPath() && Encloses(folder.GetFullPath(), fullPath)) {
      match = &folder;
    }
  }
  return match != nullptr ? match->asJson() : Json::Value(Json::objectValue);
}

// Whether `stored`, a member of the document loaded, is exactly the JSON form of `folder`.
bool HoldsJsonOf(const Json::Value& stored, const Folder& folder) {
  constexpr size_t kMembers = 6;  // path, name and the four kinds
  if (!stored.isObject() || stored.size() != kMembers) {
    return false;
  }
  const auto text = [&stored](const char* key, const std::string& want) {
    const Json::Value* value = stored.find(key, key + std::char_traits<char>::length(key));
    const char* begin = nullptr;
    const char* end = nullptr;
    return value != nullptr && value->isString() && value->getString(&begin, &end) &&
           want.compare(0, std::string::npos, begin, static_cast<size_t>(end - begin)) == 0;
  };
  const auto flag = [&stored](const char* key, bool want) {
    const Json::Value* value = stored.find(key, key + std::char_traits<char>::length(key));
    return value != nullptr && value->isBool() && value->asBool() == want;
  };
  return text("path", folder.GetPath()) && text("name", folder.GetName()) &&
         flag("document", folder.GetDocument()) && flag("audio", folder.GetAudio()) &&
         flag("video", folder.GetVideo()) && flag("photo", folder.GetPhoto());
}

// The order of `sortBy` over `folders`, by index: true when folder `a` sorts before folder `b`.
// Names and paths compare without regard to case through the platform, always: how a platform
// orders texts without regard to case (lowered or raised letters, a locale's collation) is its
// own, and a shortcut here could sort a page otherwise than the appliance does.
class FolderOrder {
 public:
  FolderOrder(const std::vector<Folder>& folders, std::string sortBy)
      : m_folders(folders), m_sortBy(std::move(sortBy)) {
    if (m_sortBy != "name") {
      m_sortBy = IsKind(m_sortBy) ? m_sortBy : "path";
    }
  }

  bool operator()(size_t a, size_t b) const {
    if (m_sortBy == "name" || m_sortBy == "path") {
      return WLIBCUnicodeUTF8StrCaseCmp(TextOf(m_folders[a]).c_str(),
                                        TextOf(m_folders[b]).c_str()) < 0;
    }
    // Folders lacking the kind before those having it.
    return !KindOf(m_folders[a]) && KindOf(m_folders[b]);
  }

 private:
  static bool IsKind(const std::string& name) {
    return name == "document" || name == "audio" || name == "video" || name == "photo";
  }

  const std::string& TextOf(const Folder& folder) const {
    return m_sortBy == "name" ? folder.GetName() : folder.GetPath();
  }

  bool KindOf(const Folder& folder) const {
    if (m_sortBy == "document") {
      return folder.GetDocument();
    }
    if (m_sortBy == "audio") {
      return folder.GetAudio();
    }
    return m_sortBy == "video" ? folder.GetVideo() : folder.GetPhoto();
  }

  const std::vector<Folder>& m_folders;
  std::string m_sortBy;
};

// `folders` in the order of `before`, by a bottom-up merge sort. Folders that compare equal keep
// their order in `folders` (the list's byte order of paths), so a page never depends on the
// sort's whims. It also stays within the vector and ends whatever `before` answers: the
// platform's text comparison need not be a strict weak ordering for every byte string, and
// std::sort given one that is not may read past the vector's end.
std::vector<const Folder*> SortedFolders(const std::vector<Folder>& folders,
                                         const FolderOrder& before) {
  const size_t size = folders.size();
  std::vector<size_t> order(size);
  for (size_t i = 0; i < size; ++i) {
    order[i] = i;
  }
  std::vector<size_t> merged;
  merged.reserve(size);
  for (size_t width = 1; width < size; width *= 2) {
    merged.clear();
    for (size_t low = 0; low < size; low += 2 * width) {
      const size_t middle = std::min(low + width, size);
      const size_t high = std::min(middle + width, size);
      size_t left = low;
      size_t right = middle;
      while (left < middle && right < high) {
        merged.push_back(before(order[right], order[left]) ? order[right++] : order[left++]);
      }
      merged.insert(merged.end(), order.begin() + static_cast<std::ptrdiff_t>(left),
                    order.begin() + static_cast<std::ptrdiff_t>(middle));
      merged.insert(merged.end(), order.begin() + static_cast<std::ptrdiff_t>(right),
                    order.begin() + static_cast<std::ptrdiff_t>(high));
    }
    order.swap(merged);
  }
  std::vector<const Folder*> sorted;
  sorted.reserve(size);
  for (const size_t i : order) {
    sorted.push_back(&folders[i]);
  }
  return sorted;
}

}  // namespace

std::string Folders::GetLockPath() const { return FolderLockPath(); }

std::string Folders::GetPath() const { return FolderConfPath(); }

std::vector<Folder> FolderRecordsOf(const Json::Value& document) {
  // Every folder of a share lies on the same volume: the share is looked up once per load.
  const ShareLookupMemo memo;
  std::vector<Folder> records;
  records.reserve(document.size());
  for (auto it = document.begin(); it != document.end(); ++it) {
    // A folder whose share is gone is kept: it reports itself as not valid, and the user removes
    // it. That is no failure of the load, so the code its full path left is not kept either.
    // The stored "path" is ignored; the member's name is the folder's path.
    records.emplace_back();
    const _tag_fileindex_err_ code = ErrorHandler::GetError();
    if (!records.back().Load(it.name(), *it)) {
      ErrorHandler::SetError(code);
    }
  }
  return records;
}

std::shared_ptr<const FolderSnapshot> LoadFolderList() {
  Folders list;
  std::vector<Folder> folders;
  if (!list.Load() || !list.List(folders)) {
    return nullptr;
  }
  std::vector<std::string> paths;
  paths.reserve(folders.size());
  for (const Folder& folder : folders) {
    paths.push_back(folder.GetPath());
  }
  return std::make_shared<const FolderSnapshot>(std::move(paths));
}

bool Folders::Load() {
  if (!LoadJson()) {
    return false;
  }
  if (!m_jsRoot.isObject()) {
    FILEINDEX_LOG("Malformed folders: %s", JsonToString(m_jsRoot).c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_MALFORMED_FOLDERS);
    return false;
  }
  for (Folder& folder : FolderRecordsOf(m_jsRoot)) {
    std::string path = folder.GetPath();
    m_folders.emplace(std::move(path), std::move(folder));
  }
  return true;
}

bool Folders::Save() {
  // The document loaded is brought in line with the records: a member that already holds its
  // record's JSON form stays as it is, so a change of one folder rebuilds one member, not the list.
  if (!m_jsRoot.isObject()) {
    m_jsRoot = Json::Value(Json::objectValue);
  }
  std::vector<std::string> gone;
  size_t kept = 0;
  for (auto member = m_jsRoot.begin(); member != m_jsRoot.end(); ++member) {
    std::string path = member.name();
    const auto record = m_folders.find(path);
    if (record == m_folders.end()) {
      gone.push_back(std::move(path));
      continue;
    }
    ++kept;
    if (!HoldsJsonOf(*member, record->second)) {
      *member = record->second.asJson();
    }
  }
  for (const std::string& path : gone) {
    m_jsRoot.removeMember(path);
  }
  if (kept != m_folders.size()) {
    for (const auto& entry : m_folders) {
      if (m_jsRoot.find(entry.first.data(), entry.first.data() + entry.first.size()) == nullptr &&
          !entry.second.AddToJson(m_jsRoot)) {
        return false;
      }
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
  FolderPage(folders, out, offset, limit, sort_by, sort_direction, additional);
  return true;
}

void FolderPage(const std::vector<Folder>& folders, Json::Value& out, unsigned long offset,
                unsigned long limit, const std::string& sort_by, const std::string& sort_direction,
                const Json::Value& additional) {
  const size_t total = folders.size();

  out = Json::Value(Json::objectValue);
  out["total"] = static_cast<Json::UInt>(total);
  out["offset"] = static_cast<Json::UInt64>(offset);

  const std::vector<const Folder*> sorted = SortedFolders(folders, FolderOrder(folders, sort_by));

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
  EligibilityPass eligibility;
  for (const Folder* folder : onPage) {
    paths.push_back(folder->GetPath());
    if (wantValid) {
      valid.push_back(eligibility.CanPathBeIndexed(folder->GetPath()));
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
  std::string path;
  std::string fullPath;
  if (!RetrieveStringFromJsonObj(path, "path", request) ||
      !WEZO::FILEINDEX::GetFullPath(fullPath, path)) {
    FILEINDEX_LOG("Bad param: %s", JsonToString(request).c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
    return false;
  }

  // Taken before the change: the setting in force may be the changed folder's own.
  const Json::Value before = SettingAt(m_folders, fullPath);
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

  result = ChangeReport(before, it->second.asJson());
  return true;
}

bool Folders::Delete(Json::Value& result, const std::string& path) {
  std::string fullPath;
  const bool placed = WEZO::FILEINDEX::GetFullPath(fullPath, path);
  if (!placed) {
    m_folders.erase(path);
    return true;
  }
  const Json::Value before = SettingAt(m_folders, fullPath);
  m_folders.erase(path);
  result = Json::Value(Json::objectValue);
  result[path] = ChangeReport(before, SettingAt(m_folders, fullPath));
  return true;
}

// NOLINTNEXTLINE(performance-unnecessary-value-param): callers hand over lists they are done with
Json::Value GetMostSuitableCfg(std::vector<Folder> folders, const std::string& fullPath) {
  return SettingAt(folders, fullPath);
}

}  // namespace FILEINDEX
}  // namespace WEZO
