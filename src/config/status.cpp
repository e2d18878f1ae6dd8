#define FILEINDEX_LOG_UNIT "status"

#include "fileindex/status.h"

#include <json/value.h>

#include <exception>

#include "fileindex/utils.h"
#include "utils/log.h"
#include "paths.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr char kResumeTime[] = "resume_time";
constexpr char kNeedReindex[] = "need_reindex";
constexpr char kNoSpace[] = "no_space";
constexpr long long kNotPaused = -1;

}  // namespace

bool Status::Load() { return LoadJson(); }

bool Status::Save() { return SaveJson(); }

std::string Status::GetLockPath() const { return StatusLockPath(); }

std::string Status::GetPath() const { return StatusConfPath(); }

Json::Value& Status::Root() {
  if (!m_jsRoot.isObject()) {
    m_jsRoot = Json::Value(Json::objectValue);
  }
  return m_jsRoot;
}

Json::Value& Status::FlagSet(const char* key) {
  Json::Value& set = Root()[key];
  // A flag set of another type holds no share; replacing it is the only way to record one.
  if (!set.isObject()) {
    set = Json::Value(Json::objectValue);
  }
  return set;
}

bool Status::HasFlag(const char* key, const std::string& share) const {
  if (!m_jsRoot.isObject()) {
    return false;
  }
  const Json::Value* set = m_jsRoot.find(key, key + std::char_traits<char>::length(key));
  return set != nullptr && set->isObject() && set->isMember(share);
}

bool Status::SetUpdated(const std::string& key) {
  Root()[key] = true;
  return true;
}

bool Status::IsUpdated(const std::string& key) const {
  if (!m_jsRoot.isObject()) {
    return false;
  }
  const Json::Value* marker = m_jsRoot.find(key.data(), key.data() + key.size());
  if (marker == nullptr) {
    return false;
  }
  // Numbers read as booleans the usual way; text and containers have no boolean reading.
  return (marker->isBool() || marker->isNumeric()) && marker->asBool();
}

bool Status::ShareSetNeedReindex(const std::string& share, bool need) {
  Json::Value& set = FlagSet(kNeedReindex);
  if (need) {
    set[share] = true;
  } else {
    set.removeMember(share);
  }
  return true;
}

bool Status::ShareIsNeedReindex(const std::string& share) const {
  return HasFlag(kNeedReindex, share);
}

bool Status::ShareSetNoSpace(const std::string& share, bool noSpace) {
  Json::Value& set = FlagSet(kNoSpace);
  if (!noSpace) {
    set.removeMember(share);
    return true;
  }
  // Only the change from having room to having none is worth telling the administrators about.
  if (!set.isMember(share) && !NotifyNoSpace()) {
    FILEINDEX_LOG("NotifyNoSpace failed");
  }
  set[share] = true;
  return true;
}

bool Status::ShareIsNoSpace(const std::string& share) const { return HasFlag(kNoSpace, share); }

bool Status::GetPauseInfo(long long& resumeTime) const {
  try {
    resumeTime =
        m_jsRoot.get(kResumeTime, Json::Value(static_cast<Json::Int64>(kNotPaused))).asInt64();
  } catch (const std::exception&) {
    FILEINDEX_LOG("json exception");
    return false;
  }
  return true;
}

bool Status::Resume() {
  Root()[kResumeTime] = static_cast<Json::Int64>(kNotPaused);
  return true;
}

bool Status::Pause(long long resumeTime) {
  Root()[kResumeTime] = static_cast<Json::Int64>(resumeTime);
  return true;
}

}  // namespace FILEINDEX
}  // namespace WEZO
