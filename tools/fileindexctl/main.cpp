// fileindexctl: the administrators' command-line face of the file-index library.
//
// Every subcommand is one library operation, run against the appliance (or against a sandbox
// root given with --root). The tool decides nothing itself: it turns arguments into the library's
// requests and the library's results into text, so that what it says is what the library did.
//
// Exit status: 0 when the operation succeeded, 1 when the library refused or failed it (the
// message names the library's error code and its meaning), 2 for a usage error.
#include <fileindex/fileindex.h>
#include <fileindex/fileindex_c.h>
#include <json/reader.h>
#include <json/value.h>
#include <json/writer.h>
#include <syslog.h>

#include <CLI/CLI.hpp>
#include <climits>
#include <cstdio>
#include <ctime>
#include <functional>
#include <iostream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

namespace fi = WEZO::FILEINDEX;

namespace {

constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;
// What a failure says when the failing call set no error code.
constexpr char kNoCodeRecorded[] = "no code recorded; -v shows the library's log";

void PrintJson(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  std::cout << Json::writeString(builder, value) << '\n';
}

// Where results go: text for people, or the library's JSON for scripts.
class Output {
 public:
  explicit Output(const bool& json) : m_json(json) {}

  bool Json() const { return m_json; }

  // Reports a failed operation `what` with the library's last error code; `detail` stands in for
  // the code's description when the failing call set no code of its own.
  int Fail(const std::string& what, const std::string& detail = kNoCodeRecorded) const {
    const int code = fi::ErrorHandler::GetError();
    const std::string description =
        code == fi::FILEINDEX_ERR_NONE ? detail : fi::ErrorHandler::Describe(code);
    std::cerr << "fileindexctl: " << what << " failed: error " << code << " (" << description
              << ")\n";
    if (m_json) {
      Json::Value error(Json::objectValue);
      error["error"]["code"] = code;
      error["error"]["description"] = description;
      PrintJson(error);
    }
    return kExitFailed;
  }

 private:
  const bool& m_json;
};

std::string YesNo(bool value) { return value ? "yes" : "no"; }

std::string Kinds(const Json::Value& folder) {
  std::string kinds;
  for (const char* kind : {"document", "audio", "video", "photo"}) {
    if (folder[kind].isBool() && folder[kind].asBool()) {
      kinds += kinds.empty() ? kind : std::string(",") + kind;
    }
  }
  return kinds.empty() ? "-" : kinds;
}

// A Unix time as "2026-11-21 14:00:00 UTC".
std::string UtcTime(long long seconds) {
  const auto t = static_cast<std::time_t>(seconds);
  std::tm parts{};
  char text[64];
  if (gmtime_r(&t, &parts) == nullptr ||
      std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S UTC", &parts) == 0) {
    return std::to_string(seconds);
  }
  return text;
}

std::string PauseText(long long resumeTime) {
  if (resumeTime < 0) {
    return "no";
  }
  if (resumeTime == 0) {
    return "until resumed";
  }
  return "until " + UtcTime(resumeTime) + " (" + std::to_string(resumeTime) + ")";
}

// Parses a JSON argument strictly; a malformed one is a usage error, reported by CLI11.
Json::Value ParseJsonArgument(const std::string& option, const std::string& text) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
    throw CLI::ValidationError(option, "not JSON: " + errors);
  }
  return value;
}

Json::Value StringArray(const std::vector<std::string>& items) {
  Json::Value array(Json::arrayValue);
  for (const std::string& item : items) {
    array.append(item);
  }
  return array;
}

// ---- folder list ----

struct ListArgs {
  unsigned long offset = 0;
  unsigned long limit = ULONG_MAX;
  std::string sortBy = "path";
  bool descending = false;
  std::vector<std::string> additional;
};

int RunList(const Output& out, const ListArgs& args) {
  Json::Value page;
  if (!fi::IndexMgr::List(page, args.offset, args.limit, args.sortBy,
                          args.descending ? "DESC" : "ASC", StringArray(args.additional))) {
    return out.Fail("list");
  }
  if (out.Json()) {
    PrintJson(page);
    return 0;
  }
  std::vector<std::vector<std::string>> rows;
  std::vector<std::string> header = {"PATH", "NAME", "KINDS"};
  for (const std::string& name : args.additional) {
    header.push_back(name == "is_valid" ? "VALID" : name == "status" ? "STATUS" : name);
  }
  rows.push_back(header);
  for (const Json::Value& folder : page["folder"]) {
    std::vector<std::string> row = {folder["path"].asString(), folder["name"].asString(),
                                    Kinds(folder)};
    for (const std::string& name : args.additional) {
      const Json::Value& value = folder["additional"][name];
      row.push_back(value.isBool()     ? YesNo(value.asBool())
                    : value.isString() ? value.asString()
                                       : "?");
    }
    rows.push_back(row);
  }
  std::vector<size_t> widths(header.size(), 0);
  for (const auto& row : rows) {
    for (size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], row[i].size());
    }
  }
  for (const auto& row : rows) {
    std::string line;
    for (size_t i = 0; i < row.size(); ++i) {
      line += row[i];
      if (i + 1 < row.size()) {
        line += std::string(widths[i] - row[i].size() + 2, ' ');
      }
    }
    std::cout << line << '\n';
  }
  std::cout << page["folder"].size() << " of " << page["total"].asUInt() << " folder(s)\n";
  return 0;
}

int RunGet(const Output& out, const std::string& path) {
  Json::Value folder;
  if (!fi::IndexMgr::Get(folder, path)) {
    return out.Fail("get " + path);
  }
  if (out.Json()) {
    PrintJson(folder);
    return 0;
  }
  std::cout << "path: " << folder["path"].asString() << "\nname: " << folder["name"].asString()
            << "\nkinds: " << Kinds(folder) << '\n';
  return 0;
}

struct AddArgs {
  std::string path;
  std::string name;
  bool document = false;
  bool audio = false;
  bool video = false;
  bool photo = false;
  std::string request;
};

int RunAdd(const Output& out, const AddArgs& args) {
  Json::Value request;
  if (args.path.empty() && args.request.empty()) {
    throw CLI::ValidationError("PATH", "give a share path or --request");
  }
  if (!args.request.empty()) {
    request = ParseJsonArgument("--request", args.request);
  } else {
    Json::Value folder(Json::objectValue);
    folder["path"] = args.path;
    folder["name"] = args.name;
    folder["document"] = args.document;
    folder["audio"] = args.audio;
    folder["video"] = args.video;
    folder["photo"] = args.photo;
    request.append(folder);
  }
  if (!fi::IndexMgr::Upsert(request)) {
    return out.Fail("add");
  }
  if (!out.Json() && request.isArray()) {
    for (const Json::Value& folder : request) {
      std::cout << "added or changed " << folder["path"].asString() << '\n';
    }
  }
  return 0;
}

// An operation on an array of share paths; `done` is told of each path on success, and
// `noCode` explains a failure that sets no code.
int RunOnPaths(const Output& out, const std::string& what, bool (*operation)(const Json::Value&),
               const std::vector<std::string>& paths, const std::string& done,
               const std::string& noCode) {
  if (!operation(StringArray(paths))) {
    return out.Fail(what, noCode);
  }
  if (!out.Json()) {
    for (const std::string& path : paths) {
      std::cout << done << path << '\n';
    }
  }
  return 0;
}

int RunUpdate(const Output& out, const std::string& path, const std::string& data) {
  if (!fi::IndexMgr::Update(path, ParseJsonArgument("--data", data))) {
    return out.Fail("update " + path);
  }
  if (!out.Json()) {
    std::cout << "queued an update of " << path << '\n';
  }
  return 0;
}

// ---- service state ----

int RunStatus(const Output& out, const std::vector<std::string>& paths) {
  std::string status;
  if (!fi::StatusMgr::GetStatus(status)) {
    return out.Fail("status");
  }
  long long resumeTime = -1;
  if (!fi::StatusMgr::GetPauseInfo(resumeTime)) {
    return out.Fail("status");
  }
  if (out.Json()) {
    Json::Value result(Json::objectValue);
    result["status"] = status;
    result["resume_time"] = static_cast<Json::Int64>(resumeTime);
    result["folders"] = Json::Value(Json::objectValue);
    for (const std::string& path : paths) {
      result["folders"][path] = fi::StatusMgr::GetFolderStatus(path);
    }
    PrintJson(result);
    return 0;
  }
  std::cout << "indexing: " << status << "\npaused: " << PauseText(resumeTime) << '\n';
  for (const std::string& path : paths) {
    std::cout << path << ": " << fi::StatusMgr::GetFolderStatus(path) << '\n';
  }
  return 0;
}

int RunPause(const Output& out, int hours) {
  if (!fi::StatusMgr::Pause(hours)) {
    return out.Fail("pause");
  }
  long long resumeTime = -1;
  if (!out.Json() && fi::StatusMgr::GetPauseInfo(resumeTime)) {
    std::cout << "paused " << PauseText(resumeTime) << '\n';
  }
  return 0;
}

// A bool-returning operation whose success is told with `done`.
int RunSimple(const Output& out, const std::string& what, const std::function<bool()>& operation,
              const std::string& done) {
  if (!operation()) {
    return out.Fail(what);
  }
  if (!out.Json()) {
    std::cout << done << '\n';
  }
  return 0;
}

// A per-share flag of the status file, as the tool names it and as its JSON names it.
struct ShareFlag {
  const char* name;
  const char* key;
  bool (*set)(const std::string&, bool);
  bool (*get)(const std::string&);
};

// Shows the flag of `share` when `value` is empty, otherwise sets it ("on") or clears it ("off").
int RunShareFlag(const Output& out, const ShareFlag& flag, const std::string& share,
                 const std::string& value) {
  const std::string name = flag.name;
  if (value.empty()) {
    const bool isSet = flag.get(share);
    if (out.Json()) {
      Json::Value result(Json::objectValue);
      result[flag.key] = isSet;
      PrintJson(result);
    } else {
      std::cout << name << ": " << YesNo(isSet) << '\n';
    }
    return 0;
  }
  return RunSimple(
      out, "share " + name + " " + share, [&] { return flag.set(share, value == "on"); },
      share + ": " + name + " " + value);
}

// ---- questions ----

int RunIsIndexed(const Output& out, const char* function, int (*question)(const char*),
                 const std::string& argument) {
  const int answer = question(argument.c_str());
  if (out.Json()) {
    Json::Value result(Json::objectValue);
    result["indexed"] = answer == 1;
    PrintJson(result);
  } else {
    std::cout << function << "(\"" << argument << "\") = " << answer << "  ("
              << (answer == 1 ? "indexed" : "not indexed") << ")\n";
  }
  return 0;
}

int RunStorage(const Output& out, const std::string& share) {
  char queue[PATH_MAX];
  char database[PATH_MAX];
  if (FILEIDXQueuePathGet(share.c_str(), queue, sizeof queue) < 0 ||
      FILEIDXDBPathGet(share.c_str(), database, sizeof database) < 0) {
    return out.Fail("storage " + share, "no share named " + share);
  }
  if (out.Json()) {
    Json::Value result(Json::objectValue);
    result["queue"] = queue;
    result["database"] = database;
    PrintJson(result);
  } else {
    std::cout << "queue: " << queue << "\ndatabase: " << database << '\n';
  }
  return 0;
}

// The share path and full path that `path` names: a share path ("/photo/2019") when its first
// component is a share and `fullPathGiven` is false, otherwise a full path.
void ResolveBoth(const std::string& path, bool fullPathGiven, std::string& sharePath,
                 std::string& fullPath) {
  if (!fullPathGiven && fi::GetFullPath(fullPath, path)) {
    sharePath = path;
    return;
  }
  fullPath = path;
  std::string shareName;
  std::string shareRoot;
  if (fi::GetShareNamePathByFullPath(shareName, shareRoot, path)) {
    sharePath = "/" + shareName + path.substr(shareRoot.size());
  }
}

int RunExplain(const Output& out, const std::string& path, bool fullPathGiven) {
  std::string sharePath;
  std::string fullPath;
  ResolveBoth(path, fullPathGiven, sharePath, fullPath);
  const fi::IndexRule rule = fi::FullPathIndexRule(fullPath);

  // The indexed folder that holds the path, asked one folder at a time so that the membership
  // rule stays the library's.
  std::vector<fi::Folder> folders;
  if (!fi::IndexMgr::List(folders)) {
    return out.Fail("explain " + path);
  }
  std::string holder;
  for (const fi::Folder& folder : folders) {
    if (fi::IndexMgr::IsFullPathIndexed(fullPath, {folder})) {
      holder = folder.GetPath();
      break;
    }
  }

  if (out.Json()) {
    Json::Value result(Json::objectValue);
    result["path"] = sharePath;
    result["full_path"] = fullPath;
    result["indexable"] = rule == fi::IndexRule::kIndexable;
    result["rule"] = fi::IndexRuleKey(rule);
    result["reason"] = fi::DescribeIndexRule(rule);
    result["indexed"] = !holder.empty();
    result["folder"] = holder;
    PrintJson(result);
    return 0;
  }
  std::cout << "path: " << (sharePath.empty() ? "(in no share)" : sharePath)
            << "\nfull path: " << fullPath << "\nmay be indexed: "
            << (rule == fi::IndexRule::kIndexable
                    ? std::string("yes")
                    : std::string("no, ") + fi::DescribeIndexRule(rule))
            << "\nin an indexed folder: " << (holder.empty() ? "no" : "yes (" + holder + ")")
            << '\n';
  return 0;
}

// ---- command line ----

class Tool {
 public:
  Tool() : m_out(m_json) { Build(); }

  int Main(int argc, char** argv) {
    try {
      m_app.parse(argc, argv);
    } catch (const CLI::ParseError& e) {
      const int status = m_app.exit(e);
      return status == static_cast<int>(CLI::ExitCodes::Success) ? 0 : kExitUsage;
    }
    if (!fi::SetRootPrefix(m_root)) {
      std::cerr << "fileindexctl: --root must be an absolute path: " << m_root << '\n';
      return kExitUsage;
    }
    if (m_verbose) {
      // The library logs through syslog; LOG_PERROR copies each line to stderr.
      openlog("fileindexctl", LOG_PERROR, LOG_USER);
    }
    fi::ErrorHandler::SetError(fi::FILEINDEX_ERR_NONE);
    try {
      return m_run();
    } catch (const CLI::ValidationError& e) {
      (void)m_app.exit(e);
      return kExitUsage;
    }
  }

 private:
  // Registers a subcommand of `parent` whose run is `run`.
  CLI::App* Command(CLI::App& parent, const std::string& name, const std::string& description,
                    std::function<int()> run) {
    CLI::App* command = parent.add_subcommand(name, description);
    command->callback([this, run = std::move(run)] { m_run = run; });
    return command;
  }

  void Build() {
    m_app.description(
        "Administer the file-index service: indexed folders, pausing, share flags and "
        "questions.");
    m_app.require_subcommand(1);
    // Subcommands pass the options they do not know to the tool, so --json may follow them.
    m_app.fallthrough();
    m_app.add_option("--root", m_root, "run against the sandbox root DIR (absolute path)")
        ->option_text("DIR");
    m_app.add_flag("--json", m_json, "print the library's JSON results for scripts");
    m_app.add_flag("-v,--verbose", m_verbose, "also write the library's log lines to stderr");

    BuildFolderCommands();
    BuildServiceCommands();
    BuildShareCommands();
    BuildQuestions();
  }

  void BuildFolderCommands() {
    CLI::App* list = Command(m_app, "list", "list the indexed folders, one page at a time",
                             [this] { return RunList(m_out, m_list); });
    list->add_option("--offset", m_list.offset, "skip this many folders")->capture_default_str();
    list->add_option("--limit", m_list.limit, "show at most this many folders (default: all)");
    list->add_option("--sort-by", m_list.sortBy, "sort key")
        ->check(CLI::IsMember({"path", "name", "document", "audio", "video", "photo"}))
        ->capture_default_str();
    list->add_flag("--desc", m_list.descending,
                   "descending: the ascending page at offset 0, reversed (the library's paging)");
    list->add_option("-a,--additional", m_list.additional, "add a value per folder")
        ->check(CLI::IsMember({"status", "is_valid"}))
        ->delimiter(',');

    CLI::App* get =
        Command(m_app, "get", "show one indexed folder", [this] { return RunGet(m_out, m_path); });
    get->add_option("PATH", m_path, "share path of the folder (/photo/2019)")->required();

    CLI::App* add = Command(
        m_app, "add",
        "add a folder, or change a listed one (settings not given return to their defaults)",
        [this] { return RunAdd(m_out, m_add); });
    add->alias("set");
    CLI::Option* path = add->add_option("PATH", m_add.path, "share path of the folder");
    CLI::Option* request = add->add_option("--request", m_add.request,
                                           "a JSON array of folder descriptions instead of PATH");
    path->excludes(request);
    add->add_option("--name", m_add.name, "display name")->needs(path);
    for (auto [flag, value] :
         {std::pair{"--document", &m_add.document}, std::pair{"--audio", &m_add.audio},
          std::pair{"--video", &m_add.video}, std::pair{"--photo", &m_add.photo}}) {
      add->add_flag(flag, *value, std::string("index ") + (flag + 2) + " files")->needs(path);
    }

    CLI::App* remove = Command(m_app, "remove", "stop indexing folders", [this] {
      return RunOnPaths(m_out, "remove", fi::IndexMgr::Delete, m_paths, "removed ",
                        kNoCodeRecorded);
    });
    remove->add_option("PATH", m_paths, "share paths of the folders")->required();

    CLI::App* reindex = Command(m_app, "reindex", "queue a full reindex of paths", [this] {
      return RunOnPaths(m_out, "reindex", fi::IndexMgr::Reindex, m_paths,
                        "queued a full reindex of ",
                        "a path lies in a share without indexed folders");
    });
    reindex->add_option("PATH", m_paths, "share paths in indexed shares")->required();

    CLI::App* update = Command(m_app, "update", "queue an update event for a path",
                               [this] { return RunUpdate(m_out, m_path, m_data); });
    update->add_option("PATH", m_path, "share path")->required();
    update->add_option("--data", m_data, "the event's JSON payload")->capture_default_str();
  }

  void BuildServiceCommands() {
    CLI::App* status =
        Command(m_app, "status", "show the indexing status, and that of the folders given",
                [this] { return RunStatus(m_out, m_paths); });
    status->add_option("PATH", m_paths, "share paths of indexed folders");

    CLI::App* pause =
        Command(m_app, "pause", "pause indexing", [this] { return RunPause(m_out, m_hours); });
    pause->add_option("HOURS", m_hours, "resume by itself after this many hours (0: never)")
        ->capture_default_str();

    Command(m_app, "resume", "resume indexing",
            [this] { return RunSimple(m_out, "resume", fi::StatusMgr::Resume, "resumed"); });

    Command(
        m_app, "migrate", "run the upgrade step that brings everything in line with the list",
        [this] { return RunSimple(m_out, "migrate", fi::Updater_hxo60_beta2, "migration done"); });
  }

  void BuildShareCommands() {
    CLI::App* share = m_app.add_subcommand("share", "share lifecycle and per-share flags");
    share->require_subcommand(1);

    struct Lifecycle {
      const char* name;
      const char* description;
      bool (*operation)(const std::string&);
      const char* done;
    };
    for (const Lifecycle& entry : {
             Lifecycle{"remove", "the share was removed: drop its folders",
                       fi::IndexMgr::ShareRemove, "folders dropped"},
             Lifecycle{"pause", "the share went offline", fi::IndexMgr::SharePause, "paused"},
             Lifecycle{"resume", "the share is back", fi::IndexMgr::ShareResume, "resumed"},
             Lifecycle{"clean", "remove the share's queue and index database",
                       fi::IndexMgr::CleanShareIndexData, "index data removed"},
             Lifecycle{"revive", "clear the no-space flag and restart the share's worker",
                       fi::StatusMgr::ShareRevive, "revived"},
         }) {
      CLI::App* command = Command(*share, entry.name, entry.description, [this, entry] {
        return RunSimple(
            m_out, std::string("share ") + entry.name + " " + m_share,
            [&] { return entry.operation(m_share); }, m_share + ": " + entry.done);
      });
      command->add_option("NAME", m_share, "share name")->required();
    }

    CLI::App* rename = Command(
        *share, "rename",
        "the share was renamed: move its folders (only the list changes; pause the share before "
        "the rename and resume it under its new name)",
        [this] {
          return RunSimple(
              m_out, "share rename " + m_share,
              [this] { return fi::IndexMgr::ShareRename(m_share, m_newShare); },
              m_share + ": renamed to " + m_newShare);
        });
    rename->add_option("OLD", m_share, "old share name")->required();
    rename->add_option("NEW", m_newShare, "new share name")->required();

    for (const ShareFlag& flag : {
             ShareFlag{"no-space", "no_space", fi::StatusMgr::ShareSetNoSpace,
                       fi::StatusMgr::ShareIsNoSpace},
             ShareFlag{"need-reindex", "need_reindex", fi::StatusMgr::ShareSetNeedReindex,
                       fi::StatusMgr::ShareIsNeedReindex},
         }) {
      CLI::App* command =
          Command(*share, flag.name, "show, set (on) or clear (off) the flag",
                  [this, flag] { return RunShareFlag(m_out, flag, m_share, m_flag); });
      command->add_option("NAME", m_share, "share name")->required();
      command->add_option("VALUE", m_flag, "on or off")->check(CLI::IsMember({"on", "off"}));
    }
  }

  void BuildQuestions() {
    CLI::App* isIndexed = m_app.add_subcommand("is-indexed", "ask the C interface what is indexed");
    isIndexed->require_subcommand(1);
    struct Question {
      const char* name;
      const char* argument;
      const char* function;
      int (*question)(const char*);
    };
    for (const Question& entry : {
             Question{"path", "share path (/photo/2019)", "FILEIDXIsPathIndexed",
                      FILEIDXIsPathIndexed},
             Question{"full-path", "full path (/volume1/photo/2019)", "FILEIDXIsFullPathIndexed",
                      FILEIDXIsFullPathIndexed},
             Question{"share", "share name (photo)", "FILEIDXIsShareIndexed",
                      FILEIDXIsShareIndexed},
         }) {
      CLI::App* command = Command(
          *isIndexed, entry.name, std::string("is this ") + entry.argument + " indexed",
          [this, entry] { return RunIsIndexed(m_out, entry.function, entry.question, m_path); });
      command->add_option("ARG", m_path, entry.argument)->required();
    }

    CLI::App* storage = Command(m_app, "storage", "show where a share keeps its queue and index",
                                [this] { return RunStorage(m_out, m_share); });
    storage->add_option("NAME", m_share, "share name")->required();

    CLI::App* explain = Command(m_app, "explain",
                                "say whether a path may be indexed, which rule decides, "
                                "and whether an indexed folder holds it",
                                [this] { return RunExplain(m_out, m_path, m_fullPath); });
    explain->add_option("PATH", m_path, "share path, or full path")->required();
    explain->add_flag("--full-path", m_fullPath, "PATH is a full path");
  }

  CLI::App m_app{"", "fileindexctl"};
  std::function<int()> m_run;
  bool m_json = false;
  bool m_verbose = false;
  std::string m_root;
  Output m_out;

  ListArgs m_list;
  AddArgs m_add;
  std::string m_path;
  std::vector<std::string> m_paths;
  std::string m_data = "{}";
  int m_hours = 0;
  std::string m_share;
  std::string m_newShare;
  std::string m_flag;
  bool m_fullPath = false;
};

}  // namespace

int main(int argc, char** argv) {
  try {
    Tool tool;
    return tool.Main(argc, argv);
  } catch (const std::exception& e) {
    std::cerr << "fileindexctl: " << e.what() << '\n';
    return kExitFailed;
  }
}
