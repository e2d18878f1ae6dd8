// The admin tool run as a program, end to end, over the shipped library and its Linux platform in
// a sandbox root of its own: a volume with two shares described in the sandbox's smb.conf, the
// stand-in daemon on the socket, and stand-ins for the service manager and the notification tool.
// The tool's JSON is compared with what the library answers in this process for the same root.
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
#include <fstream>
#include <functional>
#include <memory>
#include <sstream>
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

std::string Slurp(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

// The argv of `args`, which must outlive it.
std::vector<char*> Argv(std::vector<std::string>& args) {
  std::vector<char*> argv;
  argv.reserve(args.size() + 1);
  for (std::string& arg : args) {
    argv.push_back(arg.data());
  }
  argv.push_back(nullptr);
  return argv;
}

Json::Value Parse(const std::string& text) {
  Json::CharReaderBuilder builder;
  std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  EXPECT_TRUE(reader->parse(text.data(), text.data() + text.size(), &value, &errors))
      << errors << " in: " << text;
  return value;
}

// Waits up to five seconds for `text` to appear in the file at `path` at or after the byte
// `from`; returns the file.
std::string WaitFor(const std::string& path, const std::string& text, size_t from = 0) {
  std::string content = Slurp(path);
  for (int i = 0; i < 500 && content.find(text, from) == std::string::npos; ++i) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
    content = Slurp(path);
  }
  return content;
}

// `value` as it reads back from text: the tool's JSON is text, and a number read back is signed
// where the library may have stored it unsigned.
Json::Value ReadBack(const Json::Value& value) { return Parse(value.toStyledString()); }

class FileindexctlTest : public SandboxTest {
 protected:
  void SetUp() override {
    SandboxTest::SetUp();
    // The folder rules compare a path with what it resolves to, so the root must hold no link.
    root_ = fs::canonical(root_).string();
    ASSERT_TRUE(fi::SetRootPrefix(root_));
    for (const char* folder : {"tmp", "var/run", "usr/wezo/etc/fileindex", "volume1/photo/2019",
                               "volume1/video/movies", "volume1/archive/2018"}) {
      fs::create_directories(At(folder));
    }
    Write("etc/samba/smb.conf",
          "[global]\n\tspotlight = no\n[photo]\n\tpath = " + At("volume1/photo") +
              "\n\tread only = no\n[video]\n\tpath = " + At("volume1/video") +
              "\n\tread only = no\n[archive]\n\tpath = " + At("volume1/archive") +
              "\n\tread only = yes\n");
    // The service manager: logs each change and keeps the unit's state for is-active.
    Write("usr/bin/systemctl",
          "#!/bin/sh\ncase \"$1\" in\n"
          "is-active) s=$(cat " +
              At("unit.state") +
              " 2>/dev/null || echo inactive); echo $s; "
              "[ \"$s\" = active ]; exit;;\n"
              "start) echo active > " +
              At("unit.state") +
              ";;\n"
              "stop) echo inactive > " +
              At("unit.state") +
              ";;\nesac\n"
              "echo \"$@\" >> " +
              At("services.log") + "\n",
          0755);
    Write("usr/wezo/bin/wezohxonotify", "#!/bin/sh\necho \"$@\" >> " + At("notify.log") + "\n",
          0755);
    StartDaemon();
  }

  void TearDown() override {
    StopDaemon();
    SandboxTest::TearDown();
  }

  void StartDaemon() {
    const std::string socket = At("var/run/fileindexd.sock");
    const std::string log = At("daemon.log");
    std::vector<std::string> args = {FILEINDEXD_STANDIN, "--socket", socket, "--log", log};
    std::vector<char*> argv = Argv(args);
    const size_t seen = Slurp(log).size();
    ASSERT_EQ(posix_spawn(&m_daemon, argv[0], nullptr, nullptr, argv.data(), environ), 0);
    ASSERT_NE(WaitFor(log, "listening on", seen).find("listening on", seen), std::string::npos)
        << "the stand-in daemon did not start";
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
    std::vector<char*> argv = Argv(all);

    const std::string outPath = At("tool.out");
    const std::string errPath = At("tool.err");
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 1, outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                     0644);
    posix_spawn_file_actions_addopen(&actions, 2, errPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                     0644);
    Result result;
    pid_t pid = -1;
    const int spawned = posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    EXPECT_EQ(spawned, 0);
    int wstatus = 0;
    if (spawned == 0 && waitpid(pid, &wstatus, 0) == pid && WIFEXITED(wstatus)) {
      result.status = WEXITSTATUS(wstatus);
    }
    result.out = Slurp(outPath);
    result.err = Slurp(errPath);
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
                              R"([{"path": "/photo/2019", "name": "Summer", "photo": true},
                 {"path": "/video/movies", "video": true, "document": true}])"});
    ASSERT_EQ(added.status, 0) << added.err;
  }

  pid_t m_daemon = -1;
};

std::string Joined(const std::vector<std::string>& args) {
  std::string line;
  for (const std::string& arg : args) {
    line += " " + arg;
  }
  return line;
}

TEST_F(FileindexctlTest, ExitStatusAndMessagesTellWhatHappened) {
  AddFolders();
  const std::string deep = std::string(2000, '[') + std::string(2000, ']');
  struct Case {
    std::vector<std::string> args;
    int status;
    std::string err;  // expected in stderr; a case expecting "" wants stderr empty
    std::string out;  // expected in stdout
  };
  const std::vector<Case> cases = {
      {{"list"}, 0, "", "2 of 2"},
      {{"share", "no-space", "photo"}, 0, "", "no-space: no"},
      {{"--version"}, 0, "", "fileindexctl 0."},
      // The library refuses: its code and the code's meaning.
      {{"get", "/photo/none"}, 1, "get /photo/none failed: error 4 (no such indexed folder)", ""},
      {{"add", "--request", "{}"}, 1, "add failed: error 1 (bad parameter)", ""},
      {{"add", "/photo/../etc", "--photo"}, 1, "add failed: error 1 (bad parameter)", ""},
      {{"reindex", "/music"},
       1,
       "reindex failed: error 0 (a path lies in a share without indexed folders)",
       ""},
      {{"storage", "music"}, 1, "storage music failed: error 0 (no share named music)", ""},
      {{"pause", "99999999"}, 1, "pause failed: error 1 (bad parameter)", ""},
      // Accepted by the library, but not what the user expects: a warning, or a refusal under
      // --strict before the library is called.
      {{"remove", "/photo/none"}, 0, "warning: /photo/none is not in the list", ""},
      {{"remove", "/photo/2019/x"}, 0, "(it lies in the indexed folder /photo/2019)", ""},
      {{"--strict", "remove", "/photo/none"}, 1, "remove: not run: --strict and 1 warning(s)", ""},
      {{"reindex", "/photo/2020"}, 0, "/photo/2020 is in no indexed folder and holds none", ""},
      {{"status", "/nosuch"}, 0, "/nosuch is not in the list", ""},
      {{"share", "rename", "nosuch", "other"}, 0, "share nosuch is in the list; nothing moved", ""},
      {{"share", "remove", "nosuch"}, 0, "share nosuch is in the list; nothing dropped", ""},
      {{"share", "no-space", "nosuch", "on"}, 0, "warning: no share named nosuch", ""},
      {{"--strict", "share", "pause", "nosuch"}, 1, "not run: --strict", ""},
      {{"--strict", "add", "/archive/2018", "--photo"}, 1, "(read_only_share)", ""},
      {{"add", "/archive/2018", "--photo"}, 0, "the share is read-only (read_only_share)", ""},
      {{"add", "/photo/missingdir"}, 0, "photo/missingdir does not exist", "added /photo/"},
      {{"add", "/music/x"}, 1, "warning: /music/x: no share named music", ""},
      // Questions answered by exit status.
      {{"is-indexed", "-q", "path", "/photo/2019/a.jpg"}, 0, "", ""},
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
    EXPECT_NE(result.err.find(c.err), std::string::npos)
        << Joined(c.args) << "\nstderr: " << result.err;
    EXPECT_NE(result.out.find(c.out), std::string::npos)
        << Joined(c.args) << "\nstdout: " << result.out;
    if (c.err.empty()) {
      EXPECT_EQ(result.err, "") << Joined(c.args);
    }
    if (c.status != 0) {
      EXPECT_EQ(result.out, "") << Joined(c.args);
    }
  }
  // Only the two adds that warned without --strict changed the list.
  EXPECT_EQ(RunJson({"list"})["total"], 4);
}

TEST_F(FileindexctlTest, HelpOnEveryLevel) {
  for (const std::vector<std::string>& args : {std::vector<std::string>{"--help"},
                                               {"share", "--help"},
                                               {"share", "rename", "--help"},
                                               {"is-indexed", "full-path", "--help"},
                                               {"list", "-h"}}) {
    const Result result = Run(args);
    EXPECT_EQ(result.status, 0) << args[0];
    EXPECT_NE(result.out.find("Usage:"), std::string::npos) << result.out;
  }
  EXPECT_NE(Run({"share", "rename", "--help"}).out.find("OLD"), std::string::npos);
}

TEST_F(FileindexctlTest, JsonOutputIsTheLibrarysResult) {
  AddFolders();
  Json::Value additional(Json::arrayValue);
  additional.append("status");
  additional.append("is_valid");
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
}

// The documented shape of what each change command did.
TEST_F(FileindexctlTest, ChangeCommandsPrintWhatChangedAsJson) {
  AddFolders();
  struct Case {
    std::vector<std::string> args;
    const char* changes;
  };
  for (const Case& c : {
           Case{{"add", "/photo/2019", "--photo"},
                R"([{"action": "updated", "target": "/photo/2019"}])"},
           Case{{"pause", "0"},
                R"([{"action": "paused", "target": "indexing", "resume_time": 0}])"},
           Case{{"resume"}, R"([{"action": "resumed", "target": "indexing"}])"},
           Case{{"reindex", "/photo"}, R"([{"action": "reindex_queued", "target": "/photo"}])"},
           Case{{"share", "need-reindex", "video", "on"},
                R"([{"action": "flag_set", "target": "video", "flag": "need_reindex"}])"},
           Case{{"share", "rename", "video", "archive"},
                R"([{"action": "moved", "target": "/video/movies", "to": "/archive/movies"}])"},
           Case{{"remove", "/archive/movies", "/photo/none"},
                R"([{"action": "removed", "target": "/archive/movies"}])"},
       }) {
    const Json::Value shown = RunJson(c.args);
    EXPECT_EQ(shown["changes"], Parse(c.changes)) << Joined(c.args);
    EXPECT_EQ(shown["warnings"].size(), c.args[0] == "remove" ? 1U : 0U) << Joined(c.args);
  }
}

TEST_F(FileindexctlTest, AStepThatFailsAfterTheSaveIsNamedWithWhatWasSavedAndHowToFinish) {
  EXPECT_NE(Run({"status"}).out.find("service fileindexd.service: inactive"), std::string::npos);
  AddFolders();
  const Result up = Run({"status", "/photo/2019"});
  EXPECT_NE(up.out.find("indexing: processing\n"), std::string::npos) << up.out;
  EXPECT_NE(up.out.find("daemon: answers on " + At("var/run/fileindexd.sock")), std::string::npos);
  EXPECT_NE(up.out.find("service fileindexd.service: active"), std::string::npos);

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

  StartDaemon();
  const size_t seen = Read("daemon.log").size();
  EXPECT_EQ(Run({"add", "/photo/2019", "--name", "Again", "--photo"}).status, 0);
  EXPECT_NE(
      WaitFor(At("daemon.log"), "upsert_folder_setting", seen).find("upsert_folder_setting", seen),
      std::string::npos);

  // A service that does not start: named, and nothing after it claimed.
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

TEST_F(FileindexctlTest, OperationsReachTheDaemonServicesAndFiles) {
  const Result added = Run({"add", "--request",
                            R"([{"path": "/photo/2019", "name": "Été", "photo": true},
                 {"path": "/video/movies", "video": true, "document": true}])"});
  ASSERT_EQ(added.status, 0) << added.err;
  EXPECT_EQ(added.out, "added /photo/2019\nadded /video/movies\n");
  // Columns count characters, not bytes.
  EXPECT_EQ(Run({"list", "--additional", "status", "-a", "is_valid"}).out,
            "PATH           NAME  KINDS           STATUS      VALID\n"
            "/photo/2019    Été   photo           processing  yes\n"
            "/video/movies        document,video  processing  yes\n"
            "2 of 2 folder(s)\n");

  ASSERT_EQ(Run({"remove", "/photo/2019", "/video/movies"}).status, 0);
  EXPECT_EQ(Read("services.log"),
            "start fileindexd.service\nreload-or-restart smbd.service\n"
            "stop fileindexd.service\nreload-or-restart smbd.service\n");
  EXPECT_NE(Read("etc/samba/smb.conf").find("spotlight = no"), std::string::npos);
  const std::string daemon = WaitFor(At("daemon.log"), "upsert_folder_setting");
  EXPECT_NE(daemon.find("upsert_folder_setting"), std::string::npos) << daemon;
}

TEST_F(FileindexctlTest, ABusyFolderListFailsWithTheLockCode) {
  const int fd =
      open(At("tmp/fileidx_cfg_folder.lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
  ASSERT_GE(fd, 0);
  ASSERT_EQ(flock(fd, LOCK_EX), 0);
  const Result result = Run({"add", "/photo/2019", "--photo"});
  close(fd);
  EXPECT_EQ(result.status, 1);
  EXPECT_NE(result.err.find("error 9"), std::string::npos) << result.err;
  EXPECT_FALSE(fs::exists(At("usr/wezo/etc/fileindex/folder.conf")));
}

TEST_F(FileindexctlTest, ExplainNamesTheDecidingRule) {
  AddFolders();
  fs::create_directory_symlink(At("volume1/photo/2019"), At("volume1/photo/link"));
  struct Case {
    std::vector<std::string> args;
    const char* rule;
    const char* folder;
  };
  for (const Case& c : {
           Case{{"/photo/2019/trip"}, "unknown_file_system", "/photo/2019"},
           Case{{"/photo/2019"}, "indexable", "/photo/2019"},
           Case{{At("volume1/video/movies"), "--full-path"}, "indexable", "/video/movies"},
           Case{{At("volume1/photo")}, "indexable", ""},
           Case{{"/photo/link"}, "resolves_elsewhere", ""},
           Case{{"/photo/2019/"}, "resolves_elsewhere", "/photo/2019"},
           Case{{"/music/x"}, "unknown_file_system", ""},
       }) {
    std::vector<std::string> args = {"explain"};
    args.insert(args.end(), c.args.begin(), c.args.end());
    const Json::Value shown = RunJson(args);
    EXPECT_EQ(shown["rule"], c.rule) << c.args[0];
    EXPECT_EQ(shown["folder"], c.folder) << c.args[0];
    EXPECT_EQ(shown["rule"],
              fi::IndexRuleKey(fi::FullPathIndexRule(shown["full_path"].asString())));
  }
  EXPECT_EQ(Run({"explain", "/photo/link"}).out,
            "path: /photo/link\nfull path: " + At("volume1/photo/link") + "\nmay be indexed: no, " +
                fi::DescribeIndexRule(fi::IndexRule::kResolvesElsewhere) +
                "\nin an indexed folder: no\n");
}

TEST_F(FileindexctlTest, CheckFindsEachDisagreementAndRepairBringsItBackInLine) {
  AddFolders();
  const std::string registry = At("var/lib/wezotifyd/fileindex");
  const std::string config = "usr/wezo/etc/fileindex/";
  // The registration file of the share `share`: its name is the encoded queue path.
  const auto registration = [&](const std::string& share) {
    for (const auto& entry : fs::directory_iterator(registry)) {
      if (entry.path().filename().string().find("%2F" + share + "%2F") != std::string::npos) {
        return entry.path().string();
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
      {[&] { fs::remove(registration("photo")); }, "registration_missing",
       "registration_missing: share photo has 1 indexed folder but no monitor registration; "
       "--repair would register the share's indexed folders with the monitor again",
       true},
      // Same queue, one folder more than the share has: compared by content, not by presence.
      {[&] {
         Json::Value entry = Parse(Slurp(registration("video")));
         entry["config"].append(entry["config"][0]);
         entry["config"][1]["path"] = At("volume1/video/other");
         std::ofstream(registration("video"), std::ios::trunc) << entry.toStyledString();
       },
       "registration_differs", "the monitor registration of share video does not list", true},
      {[&] { Write("var/lib/wezotifyd/fileindex/%2Fgone%2Fqueue.json", "{}"); },
       "registration_extra",
       "registration_extra: a monitor registration for the queue /gone/queue belongs to no share",
       true},
      {[&] { Write("unit.state", "inactive\n"); }, "service_stopped",
       "2 folders are indexed, but the service fileindexd.service is inactive; --repair would "
       "start",
       true},
      // The stand-in service manager cannot bring the stand-in daemon back: the test does.
      {[&] { StopDaemon(); }, "daemon_silent",
       "daemon_silent: the service is active, but the daemon does not answer on " +
           At("var/run/fileindexd.sock"),
       false,
       [&] {
         EXPECT_NE(Read("services.log").find("restart fileindexd.service"), std::string::npos);
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
