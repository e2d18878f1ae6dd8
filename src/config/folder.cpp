#define FILEINDEX_LOG_UNIT "folder"

#include "fileindex/folder.h"

#include "config/folder_additional.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "status_mgr/progress.h"
#include "utils/log.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

bool AdditionalOf(const Folder& folder, Json::Value& out, const std::string& name,
                  const KnownAdditional& known) {
  if (name == "is_valid") {
    out = known.isValid != nullptr ? *known.isValid : CanPathBeIndexed(folder.GetPath());
    return true;
  }
  if (name == "status") {
    out = known.status != nullptr ? *known.status : FoldersProgress({folder.GetPath()}).front();
    return true;
  }
  FILEINDEX_LOG("Unknown additional: %s", name.c_str());
  ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
  return false;
}

bool AdditionalsOf(const Folder& folder, Json::Value& out, const Json::Value& names,
                   const KnownAdditional& known) {
  out = Json::Value(Json::objectValue);
  if (!names.isArray()) {
    FILEINDEX_LOG("Bad param: %s", JsonToString(names).c_str());
    ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
    return false;
  }
  for (const Json::Value& element : names) {
    if (!element.isString()) {
      FILEINDEX_LOG("Bad param: %s", JsonToString(element).c_str());
      ErrorHandler::SetError(FILEINDEX_ERR_BAD_PARAM);
      return false;
    }
    const std::string name = element.asString();
    // A name that fails keeps its member, as null, so the caller sees what was asked.
    if (!AdditionalOf(folder, out[name], name, known)) {
      FILEINDEX_LOG("Failed to get additional: %s", name.c_str());
    }
  }
  return true;
}

}  // namespace

bool Folder::Load(const std::string& path, const Json::Value& obj) {
  m_path = path;
  // Each field is optional: what the object lacks, or holds with another type, stays as it was.
  RetrieveStringFromJsonObj(m_name, "name", obj);
  RetrieveBoolFromJsonObj(m_document, "document", obj);
  RetrieveBoolFromJsonObj(m_audio, "audio", obj);
  RetrieveBoolFromJsonObj(m_video, "video", obj);
  RetrieveBoolFromJsonObj(m_photo, "photo", obj);
  return WEZO::FILEINDEX::GetFullPath(m_fullPath, m_path);
}

bool Folder::Reload(const std::string& path, const Json::Value& obj) {
  *this = Folder();
  return Load(path, obj);
}

bool Folder::SetPath(const std::string& path) {
  m_path = path;
  return WEZO::FILEINDEX::GetFullPath(m_fullPath, m_path);
}

std::string Folder::GetFullPath() const {
  if (!m_fullPath.empty()) {
    return m_fullPath;
  }
  std::string fullPath;
  if (!WEZO::FILEINDEX::GetFullPath(fullPath, m_path)) {
    FILEINDEX_LOG("Failed to get full path from %s", m_path.c_str());
    return std::string();
  }
  return fullPath;
}

Json::Value Folder::asJson() const {
  Json::Value obj(Json::objectValue);
  obj["path"] = m_path;
  obj["name"] = m_name;
  obj["document"] = m_document;
  obj["audio"] = m_audio;
  obj["video"] = m_video;
  obj["photo"] = m_photo;
  return obj;
}

Json::Value Folder::asJson(const Json::Value& additional) const {
  return FolderJsonWith(*this, additional, KnownAdditional());
}

bool Folder::AddToJson(Json::Value& obj) const {
  if (!obj.isObject()) {
    return false;
  }
  obj[m_path] = asJson();
  return true;
}

bool Folder::GetAdditional(Json::Value& out, const std::string& name) const {
  return AdditionalOf(*this, out, name, KnownAdditional());
}

bool Folder::GetAdditional(Json::Value& out, const Json::Value& names) const {
  return AdditionalsOf(*this, out, names, KnownAdditional());
}

Json::Value FolderJsonWith(const Folder& folder, const Json::Value& names,
                           const KnownAdditional& known) {
  Json::Value obj = folder.asJson();
  if (!AdditionalsOf(folder, obj["additional"], names, known)) {
    FILEINDEX_LOG("GetAdditional failed");
  }
  return obj;
}

}  // namespace FILEINDEX
}  // namespace WEZO
