// An in-memory platform for the library's tests: every operation the library calls answers from
// the state below, is recorded with its arguments and fails on request. WEZOEAMKDir really makes
// the directory, as files, locks, queues and sockets are real under the sandbox root.
#ifndef FILEINDEX_TESTS_SUPPORT_FAKE_PLATFORM_H_
#define FILEINDEX_TESTS_SUPPORT_FAKE_PLATFORM_H_

#include <json/value.h>

#include <map>
#include <string>
#include <vector>

namespace fake {

// File-system type codes that the fake answers with; only these two are remote or image ones.
constexpr int kLocalFs = 1;
constexpr int kRemoteFs = 20;
constexpr int kImageFs = 30;

// The platform error number that an injected failure leaves in the last-error slot.
constexpr int kInjectedError = 0x0E01;

struct Share {
  std::string name;
  std::string path;  // the share's own full path
  bool encrypted = false, encryption = false, readOnly = false;
};

// What the file-system queries answer for one full path.
struct PathFacts {
  int fsType = kLocalFs;
  int mountPoint = 0;  // WEZOFSDirIsMntPoint's answer
  bool recycle = false, snapshot = false;
};

struct Call {
  std::string op;
  std::vector<std::string> args;
};

struct Platform {
  std::map<std::string, Share> shares;     // by name
  std::map<std::string, PathFacts> facts;  // by exact full path
  PathFacts defaultFacts;                  // for every other path
  bool quotaEnough = true;
  int quotaError = 0;                   // last error left by a "not enough" answer
  std::map<std::string, bool> running;  // services by name
  int spotlight = 0;                    // 1 on, 0 off
  int execResult = 0;                   // what WLIBCExecv returns
  // Monitor registrations by client, then queue path.
  std::map<std::string, std::map<std::string, Json::Value>> monitor;

  bool share_get_fails = false, share_name_path_get_fails = false;
  int share_get_fails_after = -1;  // when >= 0, share lookups after that many successes fail
  bool encrypted_query_fails = false, encryption_query_fails = false;
  bool read_only_query_fails = false, snapshot_query_fails = false, ea_mkdir_fails = false;
  bool service_start_fails = false, service_stop_fails = false, service_restart_fails = false;
  bool spotlight_query_fails = false, spotlight_set_fails = false;
  bool monitor_upsert_fails = false, monitor_delete_fails = false;

  std::vector<Call> calls;   // every call but the string comparison, in order
  int openShareRecords = 0;  // records handed out by WEZOShareGet and not yet freed
  int errCode = 0;
  std::string errFile;
  int errLine = 0;

  void AddShare(const std::string& name, const std::string& path);
  std::vector<Call> CallsTo(const std::string& op) const;
};

// The process's fake platform; Reset() makes it fresh: no shares, calls, failures or error.
Platform& Get();
void Reset();

}  // namespace fake

#endif  // FILEINDEX_TESTS_SUPPORT_FAKE_PLATFORM_H_
