#include "fake_platform.h"

#include <strings.h>
#include <sys/stat.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include <json/writer.h>

namespace fake {
namespace {

Platform* g_platform = new Platform();  // never destroyed: outlives every static user

std::string OneLine(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  return Json::writeString(builder, value);
}

std::string Str(const char* s) { return s != nullptr ? std::string(s) : std::string("(null)"); }

void Record(const std::string& op, std::vector<std::string> args) {
  Get().calls.push_back(Call{op, std::move(args)});
}

int Fail(int line) {
  WLIBCErrSetEx(kInjectedError, "fake_platform", line);
  return -1;
}

const PathFacts& FactsOf(const char* path) {
  const Platform& p = Get();
  auto it = path != nullptr ? p.facts.find(path) : p.facts.end();
  return it != p.facts.end() ? it->second : p.defaultFacts;
}

const Share* ShareOf(const WEZOSHARE* record) {
  if (record == nullptr) return nullptr;
  auto it = Get().shares.find(record->szName);
  return it != Get().shares.end() ? &it->second : nullptr;
}

int FlagQuery(const char* op, const WEZOSHARE* record, int* flag, bool fails, bool Share::*field) {
  Record(op, {record != nullptr ? record->szName : "(null)"});
  const Share* share = ShareOf(record);
  if (fails || share == nullptr || flag == nullptr) return Fail(__LINE__);
  *flag = share->*field ? 1 : 0;
  return 0;
}

int ServiceCall(const char* op, const char* service, bool fails, bool running, int flags = 0) {
  Record(op, {Str(service), std::to_string(flags)});
  if (fails || service == nullptr) return Fail(__LINE__);
  Get().running[service] = running;
  return 0;
}

}  // namespace

Platform& Get() { return *g_platform; }

void Reset() { *g_platform = Platform(); }

void Platform::AddShare(const std::string& name, const std::string& path) {
  shares[name] = Share{name, path};
}

std::vector<Call> Platform::CallsTo(const std::string& op) const {
  std::vector<Call> out;
  for (const Call& c : calls)
    if (c.op == op) out.push_back(c);
  return out;
}

}  // namespace fake

using fake::Get;
using fake::Record;
using fake::Str;

extern "C" {

int WEZOShareGet(const char* szName, PWEZOSHARE* ppShare) {
  Record("WEZOShareGet", {Str(szName)});
  if (Get().share_get_fails || szName == nullptr || ppShare == nullptr) return fake::Fail(__LINE__);
  auto it = Get().shares.find(szName);
  if (it == Get().shares.end() || Get().share_get_fails_after == 0) return fake::Fail(__LINE__);
  if (Get().share_get_fails_after > 0) --Get().share_get_fails_after;
  auto* record = new WEZOSHARE();
  (void)std::snprintf(record->szName, sizeof record->szName, "%s", it->second.name.c_str());
  (void)std::snprintf(record->szPath, sizeof record->szPath, "%s", it->second.path.c_str());
  *ppShare = record;
  ++Get().openShareRecords;
  return 0;
}

void WEZOShareFree(PWEZOSHARE pShare) {
  if (pShare != nullptr) {
    --Get().openShareRecords;
    delete pShare;
  }
}

int WEZOShareNamePathGet(const char* szFullPath, char* szShareName, int cbShareName,
                         char* szSharePath, int cbSharePath) {
  Record("WEZOShareNamePathGet", {Str(szFullPath)});
  if (Get().share_name_path_get_fails || szFullPath == nullptr || szShareName == nullptr ||
      szSharePath == nullptr || cbShareName <= 0 || cbSharePath <= 0) {
    return fake::Fail(__LINE__);
  }
  // The deepest share whose own path is the path or one of its ancestors.
  const fake::Share* best = nullptr;
  const std::string full = szFullPath;
  for (const auto& [name, share] : Get().shares) {
    const bool inside = full == share.path || full.rfind(share.path + "/", 0) == 0;
    if (inside && (best == nullptr || share.path.size() > best->path.size())) best = &share;
  }
  if (best == nullptr) return fake::Fail(__LINE__);
  (void)std::snprintf(szShareName, static_cast<size_t>(cbShareName), "%s", best->name.c_str());
  (void)std::snprintf(szSharePath, static_cast<size_t>(cbSharePath), "%s", best->path.c_str());
  return 0;
}

int WLIBShareIsEncryptedGet(const WEZOSHARE* pShare, int* pfEncrypted) {
  return fake::FlagQuery("WLIBShareIsEncryptedGet", pShare, pfEncrypted,
                         Get().encrypted_query_fails, &fake::Share::encrypted);
}

int WLIBShareIsEncryptionGet(const WEZOSHARE* pShare, int* pfEncryption) {
  return fake::FlagQuery("WLIBShareIsEncryptionGet", pShare, pfEncryption,
                         Get().encryption_query_fails, &fake::Share::encryption);
}

int WLIBShareIsReadOnlyGet(const WEZOSHARE* pShare, int* pfReadOnly) {
  return fake::FlagQuery("WLIBShareIsReadOnlyGet", pShare, pfReadOnly, Get().read_only_query_fails,
                         &fake::Share::readOnly);
}

int WEZOShareIsShareRecycle(const char* szFullPath) {
  Record("WEZOShareIsShareRecycle", {Str(szFullPath)});
  return fake::FactsOf(szFullPath).recycle ? 1 : 0;
}

int WEZOGetFSType(const char* szPath, int flags) {
  Record("WEZOGetFSType", {Str(szPath), std::to_string(flags)});
  return fake::FactsOf(szPath).fsType;
}

int WEZOFSIsRemoteFS(int fsType) {
  Record("WEZOFSIsRemoteFS", {std::to_string(fsType)});
  return fsType == fake::kRemoteFs ? 1 : 0;
}

int WEZOFSIsImageFS(int fsType) {
  Record("WEZOFSIsImageFS", {std::to_string(fsType)});
  return fsType == fake::kImageFs ? 1 : 0;
}

int WEZOFSDirIsMntPoint(const char* szPath) {
  Record("WEZOFSDirIsMntPoint", {Str(szPath)});
  return fake::FactsOf(szPath).mountPoint;
}

int WLIBFhsPathInSnapshot(const char* szPath, int* pfInSnapshot) {
  Record("WLIBFhsPathInSnapshot", {Str(szPath)});
  if (Get().snapshot_query_fails || pfInSnapshot == nullptr) return fake::Fail(__LINE__);
  *pfInSnapshot = fake::FactsOf(szPath).snapshot ? 1 : 0;
  return 0;
}

int WEZOEAIsHiddenDir(const char* szName) {
  Record("WEZOEAIsHiddenDir", {Str(szName)});
  return szName != nullptr && std::strcmp(szName, "@eaDir") == 0 ? 1 : 0;
}

int WEZOEAMKDir(int flags, const char* szPath) {
  Record("WEZOEAMKDir", {std::to_string(flags), Str(szPath)});
  if (Get().ea_mkdir_fails || szPath == nullptr) return fake::Fail(__LINE__);
  struct stat st {};
  // As on the appliance, a symbolic link in the directory's place is not the directory.
  if ((mkdir(szPath, 0755) != 0 && errno != EEXIST) || lstat(szPath, &st) != 0 ||
      !S_ISDIR(st.st_mode)) {
    return fake::Fail(__LINE__);
  }
  return 0;
}

int WEZOQuotaIsEnough(int flags, const char* szPath, unsigned long long cbNeeded) {
  Record("WEZOQuotaIsEnough", {std::to_string(flags), Str(szPath), std::to_string(cbNeeded)});
  if (!Get().quotaEnough) {
    WLIBCErrSetEx(Get().quotaError, "fake_platform", __LINE__);
    return 0;
  }
  return 1;
}

int WLIBCErrGet(void) { return Get().errCode; }

const char* WLIBCErrorGetFile(void) { return Get().errFile.c_str(); }

int WLIBCErrorGetLine(void) { return Get().errLine; }

void WLIBCErrSetEx(int code, const char* szFile, int line) {
  Get().errCode = code;
  Get().errFile = szFile != nullptr ? szFile : "";
  Get().errLine = line;
}

int WLIBCExecv(const char* szPath, const char* const argv[], int flags) {
  std::vector<std::string> args{Str(szPath)};
  for (size_t i = 0; argv != nullptr && argv[i] != nullptr; ++i) args.emplace_back(argv[i]);
  args.push_back(std::to_string(flags));
  Record("WLIBCExecv", std::move(args));
  return Get().execResult;
}

int WLIBServiceStart(const char* szService, int flags) {
  return fake::ServiceCall("WLIBServiceStart", szService, Get().service_start_fails, true, flags);
}

int WLIBServiceStop(const char* szService, int flags) {
  return fake::ServiceCall("WLIBServiceStop", szService, Get().service_stop_fails, false, flags);
}

int WLIBServiceRestart(const char* szService) {
  return fake::ServiceCall("WLIBServiceRestart", szService, Get().service_restart_fails, true);
}

int WEZOSMBIsEnableSpotlight(void) {
  Record("WEZOSMBIsEnableSpotlight", {});
  if (Get().spotlight_query_fails) return fake::Fail(__LINE__);
  return Get().spotlight;
}

int WEZOSMBSetSpotlight(int fEnable) {
  Record("WEZOSMBSetSpotlight", {std::to_string(fEnable)});
  if (Get().spotlight_set_fails) return fake::Fail(__LINE__);
  Get().spotlight = fEnable != 0 ? 1 : 0;
  return 0;
}

int WLIBCUnicodeUTF8StrCaseCmp(const char* szA, const char* szB) { return strcasecmp(szA, szB); }

}  // extern "C"

namespace WEZO {
namespace WEZOTIFYD {

bool MonitorQueue::Upsert(const MonitorQueue& entry, const std::string& client, QueueType type) {
  Record("MonitorQueue::Upsert", {fake::OneLine(entry.Entry()), client, std::to_string(type)});
  if (Get().monitor_upsert_fails) {
    fake::Fail(__LINE__);
    return false;
  }
  Get().monitor[client][entry.QueuePath()] = entry.Entry();
  return true;
}

bool MonitorQueue::Delete(const std::string& queuePath, const std::string& client, QueueType type) {
  Record("MonitorQueue::Delete", {queuePath, client, std::to_string(type)});
  if (Get().monitor_delete_fails) {
    fake::Fail(__LINE__);
    return false;
  }
  Get().monitor[client].erase(queuePath);
  return true;
}

}  // namespace WEZOTIFYD
}  // namespace WEZO
