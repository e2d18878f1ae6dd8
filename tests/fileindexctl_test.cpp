// The admin tool run as a program over the shipped library and its Linux platform, in a sandbox
// appliance of its own (scripts/sandbox-appliance.sh) with the stand-in daemon on the socket. The
// walk through every operation is the demo's; these tests hold what it does not show: each exit
// status with its message, the JSON output equal to what the library answers in this process for
// the same root, and the report of a change whose later step failed.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <json/reader.h>
#include <json/value.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <climits>
#include <csignal>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "fileindex/fileindex.h"
#include "sandbox.h"

namespace Json {
inline void PrintTo(const Value& value, std::ostream* os) { *os << value.toStyledString(); }
}  // namespace Json

namespace fi = WEZO::FILEINDEX;
namespace fs = std::filesystem;

namespace {

struct Result {
  int status = -1;
  std::string out;
  std::string err;
};

Json::Value Parse(const std::string& text) {
  Json::CharReaderBuilder builder;
  std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  EXPECT_TRUE(reader->parse(text.data(), text.data() + text.size(), &value, &errors))
      << errors << " in: " << text;
  return value;
}

// `value` as it reads back from text: the tool's JSON is text, and a number read back is signed
// where the library may have stored it unsigned.
Json::Value ReadBack(const Json::Value& value) { return Parse(value.toStyledString()); }

std::string Joined(const std::vector<std::string>& args) {
  std::string line;
  for (const std::string& arg : args) {
    line += " " + arg;
  }
  return line;
}

class FileindexctlTest : public SandboxTest {
 protected:
  void SetUp() override {
    ASSERT_EQ(Spawn({SANDBOX_APPLIANCE, root_}, nullptr), 0) << "the sandbox appliance";
    StartDaemon();
  }
  void TearDown() override { StopDaemon(); }

  // Runs `args`, with stdout and stderr to the sandbox's tool.out and tool.err when `pid` is
  // null; the exit status, or -1. With `pid`, leaves it running and answers 0.
  int Spawn(std::vector<std::string> args, pid_t* pid) const {
    std::vector<char*> argv;
    argv.reserve(args.size() + 1);
    for (std::string& arg : args) {
      argv.push_back(arg.data());
    }
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    for (const auto& [fd, name] : {std::pair<int, const char*>{1, "tool.out"}, {2, "tool.err"}}) {
      posix_spawn_file_actions_addopen(&actions, fd, At(name).c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                       0644);
    }
    pid_t child = -1;
    const int spawned = posix_spawn(&child, argv[0], pid != nullptr ? nullptr : &actions, nullptr,
                                    argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (pid != nullptr) {
      *pid = child;
      return spawned == 0 ? 0 : -1;
    }
    int wstatus = 0;
    const bool exited = spawned == 0 && waitpid(child, &wstatus, 0) == child && WIFEXITED(wstatus);
    return exited ? WEXITSTATUS(wstatus) : -1;
  }

  // Waits up to five seconds for `text` in the stand-in daemon's log at or after byte `from`.
  bool DaemonLogged(const std::string& text, size_t from = 0) const {
    for (int i = 0; i < 500 && Read("records/daemon.log").find(text, from) == std::string::npos;
         ++i) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return Read("records/daemon.log").find(text, from) != std::string::npos;
  }

  void StartDaemon() {
    const size_t seen = Read("records/daemon.log").size();
    ASSERT_EQ(Spawn({FILEINDEXD_STANDIN, "--socket", At("var/run/fileindexd.sock"), "--log",
                     At("records/daemon.log")},
                    &m_daemon),
              0);
    ASSERT_TRUE(DaemonLogged("listening on", seen)) << "the stand-in daemon did not start";
  }

  void StopDaemon() {
    if (m_daemon > 0) {
      kill(m_daemon, SIGTERM);
      waitpid(m_daemon, nullptr, 0);
      m_daemon = -1;
    }
  }

  // Runs the tool with `--root <sandbox>` and `args`, collecting its output and exit status.
  Result Run(const std::vector<std::string>& args, bool rooted = true) const {
    std::vector<std::string> all = {FILEINDEXCTL};
    if (rooted) {
      all.insert(all.end(), {"--root", root_});
    }
    all.insert(all.end(), args.begin(), args.end());
    Result result;
    result.status = Spawn(all, nullptr);
    result.out = Read("tool.out");
    result.err = Read("tool.err");
    return result;
  }

  // The tool's --json output of `args`, which must succeed.
  Json::Value RunJson(std::vector<std::string> args) const {
    args.insert(args.begin(), "--json");
    const Result result = Run(args);
    EXPECT_EQ(result.status, 0) << result.err;
    return Parse(result.out);
  }

  void AddFolders() const {
    const Result added = Run({"add", "--request",
                              R"([{"path": "/photo/2019", "name": "Été", "photo": true},
                 {"path": "/video/movies", "video": true, "document": true}])"});
    ASSERT_EQ(added.status, 0) << added.err;
  }

  pid_t m_daemon = -1;
};

TEST_F(FileindexctlTest, ExitStatusAndMessagesTellWhatHappened) {
  {
    const int fd = open(At("tmp/fileidx_cfg_folder.lock").c_str(), O_RDWR | O_CREAT, 0644);
    ASSERT_EQ(flock(fd, LOCK_EX), 0);
    const Result busy = Run({"add", "/photo/2019", "--photo"});
    close(fd);
    EXPECT_EQ(busy.status, 1);
    EXPECT_NE(busy.err.find("add failed: error 9"), std::string::npos) << busy.err;
  }
  AddFolders();
  const std::string deep = std::string(2000, '[') + std::string(2000, ']');
  struct Case {
    std::vector<std::string> args;
    int status;
    std::string err;  // expected in stderr; a case expecting "" wants stderr empty
    std::string out;  // expected in stdout
  };
  const std::vector<Case> cases = {
      // Columns count characters, not bytes.
      {{"list", "--additional", "status", "-a", "is_valid"},
       0,
       "",
       "PATH           NAME  KINDS           STATUS      VALID\n"
       "/photo/2019    Été   photo           processing  yes\n"
       "/video/movies        document,video  processing  yes\n"
       "2 of 2 folder(s)\n"},
      {{"--version"}, 0, "", "fileindexctl 0."},
      {{"--help"}, 0, "", "Usage:"},
      {{"share", "rename", "--help"}, 0, "", "OLD"},
      {{"is-indexed", "full-path", "--help"}, 0, "", "Usage:"},
      {{"list", "-h"}, 0, "", "Usage:"},
      // The library refuses: its code and the code's meaning.
      {{"get", "/photo/none"}, 1, "get /photo/none failed: error 4 (no such indexed folder)", ""},
      {{"add", "--request", "{}"}, 1, "add failed: error 1 (bad parameter)", ""},
      {{"add", "/photo/../etc", "--photo"}, 1, "add failed: error 1 (bad parameter)", ""},
      {{"reindex", "/music"}, 1, "error 0 (a path lies in a share without indexed folders)", ""},
      {{"storage", "nosuch"}, 1, "storage nosuch failed: error 0 (no share named nosuch)", ""},
      {{"pause", "99999999"}, 1, "pause failed: error 1 (bad parameter)", ""},
      // Accepted by the library, but not what the user expects: a warning, or a refusal under
      // --strict before the library is called.
      {{"remove", "/photo/none"}, 0, "warning: /photo/none is not in the list", ""},
      {{"--strict", "remove", "/photo/none"}, 1, "remove: not run: --strict and 1 warning(s)", ""},
      {{"reindex", "/photo/2020"}, 0, "/photo/2020 is in no indexed folder and holds none", ""},
      {{"status", "/nosuch"}, 0, "/nosuch is not in the list", ""},
      {{"share", "rename", "nosuch", "other"}, 0, "share nosuch is in the list; nothing moved", ""},
      {{"share", "remove", "nosuch"}, 0, "share nosuch is in the list; nothing dropped", ""},
      {{"share", "no-space", "nosuch", "on"}, 0, "warning: no share named nosuch", ""},
      {{"--strict", "share", "pause", "nosuch"}, 1, "not run: --strict", ""},
      {{"add", "/archive/2018", "--photo"}, 0, "the share is read-only (read_only_share)", ""},
      {{"add", "/tv/x"}, 1, "warning: /tv/x: no share named tv", ""},
      // Questions answered by exit status.
      {{"is-indexed", "--quiet", "share", "music"}, 1, "", ""},
      // Paths and names are shown escaped, and JSON stays valid UTF-8.
      {{"get", "/photo/a\nb\x1b[2J\\"}, 1, R"(get /photo/a\nb\x1b[2J\\ failed)", ""},
      {{"--json", "share", "no-space", "ph\xff"},
       0,
       "no share named ph\\xff",
       "\"share\" : \"ph\xEF\xBF\xBD\""},
      // Usage errors never reach the library.
      {{}, 2, "A subcommand is required", ""},
      {{"frobnicate"}, 2, "unknown command \"frobnicate\"", ""},
      {{"share", "frob", "x"}, 2, "unknown command \"share frob\"", ""},
      {{"list", "--sort-by", "size"}, 2, "--sort-by", ""},
      {{"list", "--additional", "status,colour"}, 2, "--additional", ""},
      {{"pause", "two"}, 2, "HOURS", ""},
      {{"add"}, 2, "give a share path or --request", ""},
      {{"add", "--request", "[{"}, 2, "--request: not JSON", ""},
      {{"add", "--request", deep}, 2, "--request: JSON nested deeper than", ""},
      {{"update", "/photo/2019", "--data", deep}, 2, "--data: JSON nested deeper than", ""},
      {{"add", "/photo/x", "--request", "[]"}, 2, "excludes", ""},
      {{"add", "--photo"}, 2, "requires PATH", ""},
      {{"update", "/photo/2019", "--data", "nope"}, 2, "--data: not JSON", ""},
      {{"share", "rename", "photo"}, 2, "NEW is required", ""},
      {{"share", "no-space", "photo", "maybe"}, 2, "VALUE", ""},
      {{"is-indexed"}, 2, "A subcommand is required", ""},
      {{"--root", "relative/dir", "list"}, 2, "--root must be an absolute path", ""},
      {{"--root", "/nonexistent/fileindexctl-root", "list"}, 2, "an existing directory", ""},
      {{"--root", At("etc/samba/smb.conf"), "list"}, 2, "must name an existing directory", ""},
  };
  for (const Case& c : cases) {
    const Result result = Run(c.args, c.args.empty() || c.args[0] != "--root");
    EXPECT_EQ(result.status, c.status) << Joined(c.args) << "\n" << result.err;
    EXPECT_NE(result.err.find(c.err), std::string::npos) << Joined(c.args) << "\n" << result.err;
    EXPECT_NE(result.out.find(c.out), std::string::npos) << Joined(c.args) << "\n" << result.out;
    EXPECT_TRUE(!c.err.empty() || result.err.empty()) << Joined(c.args) << "\n" << result.err;
    EXPECT_TRUE(c.status == 0 || result.out.empty()) << Joined(c.args) << "\n" << result.out;
  }
  // Only the add that warned without --strict changed the list.
  EXPECT_EQ(RunJson({"list"})["total"], 3);
}

TEST_F(FileindexctlTest, JsonOutputIsTheLibrarysResult) {
  AddFolders();
  Json::Value additional = Parse(R"(["status", "is_valid"])");
  struct Case {
    std::vector<std::string> args;
    unsigned long offset, limit;
    const char* sortBy;
    const char* direction;
  };
  for (const Case& c : {
           Case{{"list"}, 0, ULONG_MAX, "path", "ASC"},
           Case{{"list", "--sort-by", "name", "--desc"}, 0, ULONG_MAX, "name", "DESC"},
           Case{{"list", "--offset", "1", "--limit", "1", "--sort-by", "video"},
                1,
                1,
                "video",
                "ASC"},
       }) {
    std::vector<std::string> args = c.args;
    args.insert(args.end(), {"--additional", "status,is_valid"});
    Json::Value expected;
    ASSERT_TRUE(fi::IndexMgr::List(expected, c.offset, c.limit, c.sortBy, c.direction, additional));
    EXPECT_EQ(RunJson(args), ReadBack(expected)) << args[1];
  }
  Json::Value folder;
  ASSERT_TRUE(fi::IndexMgr::Get(folder, "/video/movies"));
  // --json may follow the subcommand as well.
  EXPECT_EQ(Parse(Run({"get", "/video/movies", "--json"}).out), ReadBack(folder));

  ASSERT_EQ(Run({"pause", "2"}).status, 0);
  std::string status;
  long long resumeTime = 0;
  ASSERT_TRUE(fi::StatusMgr::GetStatus(status));
  ASSERT_TRUE(fi::StatusMgr::GetPauseInfo(resumeTime));
  const Json::Value shown = RunJson({"status", "/photo/2019"});
  EXPECT_EQ(shown["status"], "paused");
  EXPECT_EQ(shown["status"], status);
  EXPECT_EQ(shown["resume_time"].asInt64(), resumeTime);
  EXPECT_EQ(shown["folders"]["/photo/2019"], fi::StatusMgr::GetFolderStatus("/photo/2019"));
  EXPECT_EQ(shown["daemon"]["answers"], true);
  EXPECT_EQ(shown["service"]["state"], "active");

  const Result failed = Run({"--json", "get", "/photo/none"});
  EXPECT_EQ(failed.status, 1);
  EXPECT_EQ(Parse(failed.out)["error"]["code"], fi::FILEINDEX_ERR_NO_SUCH_FOLDER);

  // explain: the deciding rule is the library's, and the folder holding the path.
  for (const auto& [args, rule, holder] :
       std::vector<std::tuple<std::vector<std::string>, std::string, std::string>>{
           {{"/photo/2019/trip"}, "unknown_file_system", "/photo/2019"},
           {{At("volume1/video/movies"), "--full-path"}, "indexable", "/video/movies"},
           {{At("volume1/photo")}, "indexable", ""},
           {{"/photo/latest"}, "resolves_elsewhere", ""},
           {{"/photo/2019/"}, "resolves_elsewhere", "/photo/2019"},
           {{"/tv/x"}, "unknown_file_system", ""}}) {
    std::vector<std::string> explain = {"explain"};
    explain.insert(explain.end(), args.begin(), args.end());
    const Json::Value said = RunJson(explain);
    EXPECT_EQ(said["rule"], rule) << args[0];
    EXPECT_EQ(said["folder"], holder) << args[0];
    EXPECT_EQ(said["rule"], fi::IndexRuleKey(fi::FullPathIndexRule(said["full_path"].asString())));
  }
  EXPECT_EQ(Run({"explain", "/photo/latest"}).out,
            "path: /photo/latest\nfull path: " + At("volume1/photo/latest") +
                "\nmay be indexed: no, " +
                fi::DescribeIndexRule(fi::IndexRule::kResolvesElsewhere) +
                "\nin an indexed folder: no\n");
}

// The documented shape of what each change command did.
TEST_F(FileindexctlTest, ChangeCommandsPrintWhatChangedAsJson) {
  AddFolders();
  for (const auto& [args, changes] : std::vector<std::pair<std::vector<std::string>, const char*>>{
           {{"add", "/photo/2019", "--photo"}, R"([{"action":"updated","target":"/photo/2019"}])"},
           {{"pause", "0"}, R"([{"action":"paused","target":"indexing","resume_time":0}])"},
           {{"resume"}, R"([{"action":"resumed","target":"indexing"}])"},
           {{"reindex", "/photo"}, R"([{"action":"reindex_queued","target":"/photo"}])"},
           {{"share", "need-reindex", "video", "on"},
            R"([{"action":"flag_set","target":"video","flag":"need_reindex"}])"},
           {{"share", "rename", "video", "music"},
            R"([{"action":"moved","target":"/video/movies","to":"/music/movies"}])"},
           {{"remove", "/music/movies", "/photo/none"},
            R"([{"action":"removed","target":"/music/movies"}])"}}) {
    const Json::Value shown = RunJson(args);
    EXPECT_EQ(shown["changes"], Parse(changes)) << Joined(args);
    EXPECT_EQ(shown["warnings"].size(), args[0] == "remove" ? 1U : 0U) << Joined(args);
  }
}

TEST_F(FileindexctlTest, AStepThatFailsAfterTheSaveIsNamedWithWhatWasSavedAndHowToFinish) {
  AddFolders();
  StopDaemon();
  const Result added = Run({"add", "/photo/2019", "--name", "Again", "--photo"});
  EXPECT_EQ(added.status, 1);
  for (const char* text :
       {"add failed: error 0 (no code recorded; the library logged: index_mgr:",
        "saved all the same: updated /photo/2019", "the step that failed: telling the daemon",
        "SendCammandToDaemon failed", "not done: queueing the update events",
        "the daemon does not answer on", "run the same command again"}) {
    EXPECT_NE(added.err.find(text), std::string::npos) << text << " in:\n" << added.err;
  }
  Json::Value folder;
  ASSERT_TRUE(fi::IndexMgr::Get(folder, "/photo/2019"));
  EXPECT_EQ(folder["name"], "Again");

  const Result down = Run({"status", "/photo/2019"});
  EXPECT_EQ(down.out.find("processing"), std::string::npos) << down.out;
  EXPECT_NE(down.out.find("indexing: stalled"), std::string::npos) << down.out;
  EXPECT_NE(down.out.find("/photo/2019: stalled"), std::string::npos) << down.out;

  const Result paused = Run({"--json", "pause", "0"});
  EXPECT_EQ(paused.status, 1);
  const Json::Value report = Parse(paused.out);
  EXPECT_EQ(report["changes"][0]["action"], "paused");
  EXPECT_NE(report["error"]["step"].asString().find("telling the daemon"), std::string::npos);

  // A service that does not start: named, and nothing after it claimed.
  StartDaemon();
  Write("usr/bin/systemctl",
        "#!/bin/sh\n[ \"$1\" = is-active ] && echo failed\necho failing >&2\nexit 3\n", 0755);
  const Result unstarted = Run({"add", "/video/movies", "--video"});
  EXPECT_EQ(unstarted.status, 1);
  for (const char* text :
       {"saved all the same: updated /video/movies",
        "the step that failed: starting the service fileindexd", "WLIBServiceStart failed",
        "not done: telling the daemon", "service fileindexd.service: failed",
        "start the service (systemctl start fileindexd.service)", "failing\n"}) {
    EXPECT_NE(unstarted.err.find(text), std::string::npos) << text << " in:\n" << unstarted.err;
  }
}

TEST_F(FileindexctlTest, CheckFindsEachDisagreementAndRepairBringsItBackInLine) {
  AddFolders();
  const std::string registry = "var/lib/wezotifyd/fileindex/";
  const std::string config = "usr/wezo/etc/fileindex/";
  // The registration file of the share `share`, below the root: its name is the encoded queue
  // path.
  const auto registration = [&](const std::string& share) {
    for (const auto& entry : fs::directory_iterator(At(registry))) {
      const std::string name = entry.path().filename().string();
      if (name.find("%2F" + share + "%2F") != std::string::npos) {
        return registry + name;
      }
    }
    return std::string();
  };
  const Result agree = Run({"check"});
  EXPECT_EQ(agree.status, 0) << agree.out << agree.err;
  EXPECT_EQ(agree.out, "everything agrees with the list of indexed folders\n");
  ASSERT_FALSE(registration("photo").empty());

  struct Case {
    std::function<void()> plant;
    std::string kind;
    std::string line;               // expected in check's output
    bool repaired;                  // check --repair leaves everything in agreement
    std::function<void()> after{};  // between the repair and the last check
  };
  const std::vector<Case> cases = {
      {[&] { fs::remove(At(registration("photo"))); }, "registration_missing",
       "registration_missing: share photo has 1 indexed folder but no monitor registration; "
       "--repair would register the share's indexed folders with the monitor again",
       true},
      // Same queue, one folder more than the share has: compared by content, not by presence.
      {[&] {
         Json::Value entry = Parse(Read(registration("video")));
         entry["config"].append(entry["config"][0]);
         entry["config"][1]["path"] = At("volume1/video/other");
         Write(registration("video"), entry.toStyledString());
       },
       "registration_differs", "the monitor registration of share video does not list", true},
      {[&] { Write("var/lib/wezotifyd/fileindex/%2Fgone%2Fqueue.json", "{}"); },
       "registration_extra",
       "registration_extra: a monitor registration for the queue /gone/queue belongs to no share",
       true},
      {[&] { Write("records/units/fileindexd.service", "inactive\n"); }, "service_stopped",
       "2 folders are indexed, but the service fileindexd.service is inactive; --repair would "
       "start",
       true},
      // The stand-in service manager cannot bring the stand-in daemon back: the test does.
      {[&] { StopDaemon(); }, "daemon_silent",
       "daemon_silent: the service is active, but the daemon does not answer on " +
           At("var/run/fileindexd.sock"),
       false,
       [&] {
         EXPECT_NE(Read("records/services.log").find("restart fileindexd.service"),
                   std::string::npos);
         StartDaemon();
       }},
      {[&] {
         std::string conf = Read("etc/samba/smb.conf");
         conf.replace(conf.find("spotlight = yes"), 15, "spotlight = no");
         Write("etc/samba/smb.conf", conf);
       },
       "spotlight", "spotlight: Spotlight over SMB is off, but 2 folders are indexed", true},
      {[&] { Write(config + "status.conf", R"({"need_reindex": {"photo": true, "gone": true}})"); },
       "flag_of_gone_share",
       "status.conf holds the need_reindex flag of gone, which is no share; --repair would clear",
       true, [&] { EXPECT_TRUE(fi::StatusMgr::ShareIsNeedReindex("photo")); }},
      // Only regular files of mkstemp's pattern are temporaries.
      {[&] {
         Write(config + "folder.conf.a1B2c3", "{");
         Write(config + "status.conf.abcdefg", "{");
         fs::create_directory(At(config + "status.conf.Zz9Zz9"));
       },
       "stale_temporary",
       At(config + "folder.conf.a1B2c3") + " is a temporary file that a killed writer", true,
       [&] {
         EXPECT_TRUE(fs::exists(At(config + "status.conf.abcdefg")));
         EXPECT_TRUE(fs::exists(At(config + "status.conf.Zz9Zz9")));
       }},
      {[&] { fs::remove_all(At("volume1/video/movies")); }, "no_directory",
       "does not exist; --repair leaves it: create the directory, or stop indexing it", false,
       [&] { fs::create_directories(At("volume1/video/movies")); }},
  };
  for (const Case& c : cases) {
    c.plant();
    const Result found = Run({"check"});
    EXPECT_EQ(found.status, 1) << c.kind;
    EXPECT_NE(found.out.find(c.line), std::string::npos) << c.kind << "\n" << found.out;
    const Result json = Run({"--json", "check"});
    const Json::Value findings = Parse(json.out)["findings"];
    EXPECT_EQ(findings.size(), 1U) << json.out;
    EXPECT_EQ(findings[0]["kind"], c.kind);
    const Result repair = Run({"check", "--repair"});
    EXPECT_EQ(repair.status, c.repaired ? 0 : 1) << c.kind << "\n" << repair.out << repair.err;
    EXPECT_EQ(repair.out.find("left: ") != std::string::npos, !c.repaired) << repair.out;
    if (c.after) {
      c.after();
    }
    const Result last = Run({"check"});
    EXPECT_EQ(last.status, 0) << c.kind << "\n" << last.out << last.err;
  }
}

}  // namespace
