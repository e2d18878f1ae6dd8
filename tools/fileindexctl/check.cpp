// check [--repair]: whether what derives from the folder list agrees with it — the monitor's
// registrations, the service and its daemon, the Spotlight switch, the per-share flags, the
// configuration's temporary files and the folders' directories — and, with --repair, bringing it
// back in line through the library's and the platform's own operations.
#include <dirent.h>
#include <fileindex/fileindex_c.h>
#include <fileindex/root.h>
#include <json/reader.h>
#include <json/writer.h>
#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cctype>
#include <chrono>
#include <climits>
#include <fstream>
#include <functional>
#include <iostream>
#include <map>
#include <memory>
#include <set>
#include <thread>

#include "commands.h"
#include "layout.h"

namespace fi = WEZO::FILEINDEX;
namespace monitor = WEZO::WEZOTIFYD;

namespace fileindexctl {

namespace {

using fi::kMetadataDirName;
using fi::kMonitorClient;
using fi::kMonitorMask;
// The generic-Linux monitor keeps one file per client and queue here, under the root prefix.
constexpr char kRegistry[] = "/var/lib/wezotifyd/";
// How long the second look waits for a daemon whose service the repair started.
constexpr int kDaemonStartSeconds = 3;

struct CheckArgs {
  bool repair = false;
};

// One disagreement: what is wrong, and what --repair does about it (`fix` empty: nothing; then
// `repair` says what the administrator can do).
struct Finding {
  std::string kind;
  std::string subject;
  std::string problem;
  std::string repair;
  std::function<bool()> fix;
};

using Findings = std::vector<Finding>;

std::string Count(size_t n, const std::string& what) {
  return std::to_string(n) + " " + what + (n == 1 ? "" : "s");
}

// "1 folder is indexed", "2 folders are indexed".
std::string Indexed(size_t n) {
  return Count(n, "folder") + (n == 1 ? " is" : " are") + " indexed";
}

// `value` as compact text with its object members in key order and each "config" array sorted,
// so that two entries compare by content.
std::string Canonical(Json::Value value) {
  if (value.isObject() && value["config"].isArray()) {
    std::vector<std::string> dirs;
    for (const Json::Value& dir : value["config"]) {
      dirs.push_back(Canonical(dir));
    }
    std::sort(dirs.begin(), dirs.end());
    value["config"] = StringArray(dirs);
  }
  Json::StreamWriterBuilder writer;
  writer["indentation"] = "";
  return Json::writeString(writer, value);
}

// A registration file's name back to its queue path ("%2Fvolume1%2F..." to "/volume1/...").
std::string DecodeName(const std::string& name) {
  std::string out;
  for (size_t i = 0; i < name.size(); ++i) {
    if (name[i] == '%' && i + 2 < name.size() &&
        std::isxdigit(static_cast<unsigned char>(name[i + 1])) != 0 &&
        std::isxdigit(static_cast<unsigned char>(name[i + 2])) != 0) {
      out += static_cast<char>(std::stoi(name.substr(i + 1, 2), nullptr, 16));
      i += 2;
    } else {
      out += name[i];
    }
  }
  return out;
}

// The library's registrations by queue path: the parsed entry, or null when the file does not
// parse.
std::map<std::string, Json::Value> ReadRegistrations() {
  std::map<std::string, Json::Value> entries;
  const std::string dir = fi::GetRootPrefix() + kRegistry + kMonitorClient;
  DIR* stream = opendir(dir.c_str());
  if (stream == nullptr) {
    return entries;
  }
  const std::string prefix = dir + "/";
  const std::string suffix = ".json";
  while (const dirent* entry = readdir(stream)) {
    const std::string name = entry->d_name;
    const std::string path = prefix + name;
    struct stat st {};
    if (name.size() <= suffix.size() ||
        name.compare(name.size() - suffix.size(), suffix.size(), suffix) != 0 ||
        lstat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
      continue;
    }
    Json::Value value;
    Json::CharReaderBuilder builder;
    std::string errors;
    std::ifstream in(path, std::ios::binary);
    if (!Json::parseFromStream(builder, in, &value, &errors)) {
      value = Json::Value();
    }
    entries[DecodeName(name.substr(0, name.size() - suffix.size()))] = value;
  }
  closedir(stream);
  return entries;
}

bool IsShare(const std::string& share) {
  std::string fullPath;
  return !share.empty() && share.find('/') == std::string::npos &&
         fi::GetFullPath(fullPath, "/" + share);
}

// The status file's document, read as the library reads it, without the lock.
class StatusDocument : public fi::Status {
 public:
  const Json::Value& Document() const { return m_jsRoot; }
};

void CheckFolders(const std::vector<fi::Folder>& folders, Findings& found) {
  for (const fi::Folder& folder : folders) {
    const std::string& path = folder.GetPath();
    const std::string leave =
        "--repair leaves it: create the directory, or stop indexing it "
        "(fileindexctl remove " +
        Printable(path) + ")";
    std::string fullPath;
    if (!fi::GetFullPath(fullPath, path)) {
      found.push_back({"no_share", path, Printable(path) + " lies in no share", leave, {}});
      continue;
    }
    struct stat st {};
    if (stat(fullPath.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) {
      found.push_back(
          {"no_directory",
           path,
           Printable(path) + ": the directory " + Printable(fullPath) + " does not exist",
           leave,
           {}});
      continue;
    }
    const fi::IndexRule rule = fi::FullPathIndexRule(fullPath);
    if (rule != fi::IndexRule::kIndexable) {
      found.push_back(
          {"not_indexable",
           path,
           Printable(path) + " cannot be indexed: " + fi::DescribeIndexRule(rule) + " (" +
               fi::IndexRuleKey(rule) + ")",
           "--repair leaves it: stop indexing it (fileindexctl remove " + Printable(path) + ")",
           {}});
    }
  }
}

void CheckRegistrations(const std::vector<fi::Folder>& folders, Findings& found) {
  std::map<std::string, std::vector<std::string>> byShare;  // share -> full paths
  std::set<std::string> unplaced;
  for (const fi::Folder& folder : folders) {
    std::string share;
    std::string fullPath;
    (void)fi::GetShareNameByPath(share, folder.GetPath());
    if (fi::GetFullPath(fullPath, folder.GetPath())) {
      byShare[share].push_back(fullPath);
    } else {
      unplaced.insert(share);  // the library registers no share with a folder it cannot place
    }
  }
  std::map<std::string, Json::Value> registered = ReadRegistrations();
  for (const auto& [share, paths] : byShare) {
    char location[PATH_MAX];
    if (unplaced.count(share) != 0 ||
        FILEIDXQueuePathGet(share.c_str(), location, sizeof location) < 0) {
      continue;
    }
    const std::string queue = location;
    Json::Value expected(Json::objectValue);
    expected["queue"] = queue;
    expected["config"] = Json::Value(Json::arrayValue);
    for (const std::string& path : paths) {
      Json::Value dir(Json::objectValue);
      dir["path"] = path;
      dir["mask"] = kMonitorMask;
      dir["ignore"].append(kMetadataDirName);
      expected["config"].append(dir);
    }
    const auto entry = registered.find(queue);
    const auto fix = [share = share] { return fi::IndexMgr::UpsertWEZotifydCfg(share); };
    const std::string again = "register the share's indexed folders with the monitor again";
    if (entry == registered.end()) {
      found.push_back({"registration_missing", share,
                       "share " + Printable(share) + " has " +
                           Count(paths.size(), "indexed folder") + " but no monitor registration",
                       again, fix});
    } else if (Canonical(entry->second) != Canonical(expected)) {
      found.push_back({"registration_differs", share,
                       "the monitor registration of share " + Printable(share) +
                           " does not list exactly its indexed folders and its queue",
                       again, fix});
    }
    if (entry != registered.end()) {
      registered.erase(entry);
    }
  }
  for (const auto& [queue, entry] : registered) {
    found.push_back({"registration_extra", queue,
                     "a monitor registration for the queue " + Printable(queue) +
                         " belongs to no share with indexed folders",
                     "remove the registration", [queue = queue] {
                       return monitor::MonitorQueue::Delete(queue, kMonitorClient,
                                                            monitor::QUEUE_TYPE_FILE);
                     }});
  }
}

void CheckService(const std::vector<fi::Folder>& folders, Findings& found) {
  if (folders.empty()) {
    return;
  }
  const std::string service = ServiceState();
  if (service != "active") {
    found.push_back({"service_stopped", kServiceUnit,
                     Indexed(folders.size()) + ", but the service " + kServiceUnit + " is " +
                         Printable(service),
                     "start the service", [] { return WLIBServiceStart("fileindexd", 1) == 0; }});
    return;
  }
  const std::string problem = DaemonProblem();
  if (!problem.empty()) {
    found.push_back({"daemon_silent", DaemonSocket(),
                     "the service is active, but the daemon does not answer on " +
                         Printable(DaemonSocket()) + " (" + problem + ")",
                     "restart the service", [] { return WLIBServiceRestart("fileindexd") == 0; }});
  }
}

void CheckSpotlight(const std::vector<fi::Folder>& folders, Findings& found) {
  const int spotlight = WEZOSMBIsEnableSpotlight();
  const bool wanted = !folders.empty();
  if (spotlight < 0) {
    found.push_back({"spotlight_unknown",
                     "spotlight",
                     "whether Spotlight over SMB is on cannot be told (the SMB configuration "
                     "cannot be read)",
                     "--repair leaves it: fix the SMB configuration",
                     {}});
  } else if ((spotlight == 1) != wanted) {
    found.push_back(
        {"spotlight", "spotlight",
         std::string("Spotlight over SMB is ") + (wanted ? "off, but " : "on, but ") +
             Indexed(folders.size()),
         std::string("switch it ") + (wanted ? "on" : "off") + " and restart the SMB service",
         [wanted] {
           return WEZOSMBSetSpotlight(wanted ? 1 : 0) == 0 && WLIBServiceRestart("samba") == 0;
         }});
  }
}

void CheckFlags(Findings& found) {
  StatusDocument status;
  if (!status.Load()) {
    found.push_back({"status_unreadable",
                     status.GetPath(),
                     Printable(status.GetPath()) + " cannot be read",
                     "--repair leaves it: fix or remove the file",
                     {}});
    return;
  }
  const Json::Value& document = status.Document();
  for (const char* key : {"no_space", "need_reindex"}) {
    if (!document.isObject() || !document[key].isObject()) {
      continue;
    }
    const std::string flag = key;
    for (const std::string& share : document[key].getMemberNames()) {
      if (IsShare(share)) {
        continue;
      }
      found.push_back(
          {"flag_of_gone_share", share,
           "status.conf holds the " + flag + " flag of " + Printable(share) + ", which is no share",
           "clear the flag", [flag, share] {
             return flag == "no_space" ? fi::StatusMgr::ShareSetNoSpace(share, false)
                                       : fi::StatusMgr::ShareSetNeedReindex(share, false);
           }});
    }
  }
}

// True when `name` is `file` followed by "." and mkstemp's six letters or digits.
bool IsTemporaryOf(const std::string& name, const std::string& file) {
  return name.size() == file.size() + 7 && name.compare(0, file.size(), file) == 0 &&
         name[file.size()] == '.' &&
         std::all_of(name.begin() + static_cast<long>(file.size()) + 1, name.end(),
                     [](char c) { return std::isalnum(static_cast<unsigned char>(c)) != 0; });
}

// Removes the temporary `path` of `config`'s file while holding its lock: every writer saves
// under the lock, so none can be between writing and renaming it.
bool RemoveTemporary(fi::Config& config, const std::string& path) {
  if (!config.Lock(false)) {
    return false;
  }
  struct stat st {};
  const bool removed =
      lstat(path.c_str(), &st) != 0 || (S_ISREG(st.st_mode) && unlink(path.c_str()) == 0);
  config.Unlock();
  return removed;
}

void CheckTemporaries(Findings& found) {
  for (const std::shared_ptr<fi::Config>& config :
       {std::shared_ptr<fi::Config>(std::make_shared<fi::Folders>()),
        std::shared_ptr<fi::Config>(std::make_shared<fi::Status>())}) {
    const std::string path = config->GetPath();
    const std::string dir = path.substr(0, path.rfind('/'));
    const std::string file = path.substr(path.rfind('/') + 1);
    if (!config->Lock(false)) {
      found.push_back({"lock_busy",
                       file,
                       "the lock of " + file +
                           " cannot be taken (busy, or its file unusable); its temporary files "
                           "were not looked at",
                       "--repair leaves it: run the check again",
                       {}});
      continue;
    }
    if (DIR* stream = opendir(dir.c_str())) {
      const std::string prefix = dir + "/";
      while (const dirent* entry = readdir(stream)) {
        const std::string name = entry->d_name;
        const std::string temporary = prefix + name;
        struct stat st {};
        if (IsTemporaryOf(name, file) && lstat(temporary.c_str(), &st) == 0 &&
            S_ISREG(st.st_mode)) {
          found.push_back({"stale_temporary", temporary,
                           Printable(temporary) + " is a temporary file that a killed writer of " +
                               file + " left",
                           "remove it",
                           [config, temporary] { return RemoveTemporary(*config, temporary); }});
        }
      }
      closedir(stream);
    }
    config->Unlock();
  }
}

// Everything that does not agree, or false when the folder list cannot be read.
bool Check(Findings& found) {
  std::vector<fi::Folder> folders;
  if (!fi::IndexMgr::List(folders)) {
    return false;
  }
  CheckFolders(folders, found);
  CheckRegistrations(folders, found);
  CheckService(folders, found);
  CheckSpotlight(folders, found);
  CheckFlags(found);
  CheckTemporaries(found);
  return true;
}

Json::Value ToJson(const Finding& finding) {
  Json::Value value(Json::objectValue);
  value["kind"] = finding.kind;
  value["subject"] = finding.subject;
  value["problem"] = finding.problem;
  value["repair"] = finding.fix ? finding.repair : "";
  value["advice"] = finding.fix ? "" : finding.repair;
  return value;
}

std::string Line(const Finding& finding, const std::string& outcome) {
  return finding.kind + ": " + finding.problem + "; " + outcome;
}

int RunCheck(const Context& ctx, const CheckArgs& args) {
  Findings found;
  if (!Check(found)) {
    return ctx.out.Fail("check");
  }
  Json::Value result(Json::objectValue);
  result["findings"] = Json::Value(Json::arrayValue);
  Findings left;
  bool restarted = false;
  for (const Finding& finding : found) {
    Json::Value value = ToJson(finding);
    std::string outcome = finding.fix ? "--repair would " + finding.repair : finding.repair;
    if (args.repair && finding.fix) {
      const bool ok = finding.fix();
      restarted = restarted ||
                  (ok && (finding.kind == "service_stopped" || finding.kind == "daemon_silent"));
      value["repaired"] = ok;
      outcome = ok ? "repaired: " + finding.repair : "repair failed: " + finding.repair;
    } else if (args.repair) {
      value["repaired"] = false;
    }
    result["findings"].append(value);
    if (!ctx.out.Json()) {
      std::cout << Line(finding, outcome) << '\n';
    }
  }
  const Findings* remaining = &found;
  if (args.repair) {
    // A second look says what is left; a daemon whose service was just started gets a moment.
    const auto deadline = std::chrono::steady_clock::now() +
                          std::chrono::seconds(restarted ? kDaemonStartSeconds : 0);
    while (restarted && !DaemonProblem().empty() && std::chrono::steady_clock::now() < deadline) {
      std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    if (!Check(left)) {
      return ctx.out.Fail("check");
    }
    remaining = &left;
    result["left"] = Json::Value(Json::arrayValue);
    for (const Finding& finding : left) {
      result["left"].append(ToJson(finding));
      if (!ctx.out.Json()) {
        std::cout << "left: " << finding.kind << ": " << finding.problem << '\n';
      }
    }
  }
  result["agree"] = remaining->empty();
  if (ctx.out.Json()) {
    PrintJson(result);
  } else if (found.empty()) {
    std::cout << "everything agrees with the list of indexed folders\n";
  } else if (remaining->empty()) {
    std::cout << "everything agrees now\n";
  }
  return remaining->empty() ? 0 : kExitFailed;
}

}  // namespace

void AddCheckCommand(CLI::App& app, Context& ctx) {
  const auto args = std::make_shared<CheckArgs>();
  CLI::App* check = AddCommand(
      app, ctx, "check",
      "check that what derives from the folder list agrees with it: the monitor's registrations, "
      "the service, Spotlight, share flags, temporary files, the folders' directories",
      [&ctx, args] { return RunCheck(ctx, *args); });
  check->add_flag("--repair", args->repair,
                  "bring what disagrees back in line and say what changed; exit 1 when "
                  "something is left");
}

}  // namespace fileindexctl
