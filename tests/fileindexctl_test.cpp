// The admin tool over the shipped library in a sandbox appliance with the stand-in daemon: exit
// statuses and messages, JSON as the library answers, a half-done change, check and repair.
#include <fcntl.h>
#include <json/reader.h>
#include <json/value.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <functional>
#include <tuple>
#include <vector>

#include "fileindex/fileindex.h"
#include "sandbox.h"

namespace fi = WEZO::FILEINDEX;
namespace fs = std::filesystem;
using Args = std::vector<std::string>;

namespace {

struct Result {
  int status = -1;
  std::string out, err;
};

Json::Value Parse(const std::string& text) {
  Json::Value value;
  std::istringstream in(text);
  EXPECT_NO_THROW(in >> value) << text;
  return value;
}

// `value` read back from text, as the tool's JSON is (numbers come back signed).
Json::Value ReadBack(const Json::Value& value) { return Parse(value.toStyledString()); }

class FileindexctlTest : public SandboxTest {
 protected:
  void SetUp() override {
    ASSERT_EQ(Spawn({SANDBOX_APPLIANCE, root_}, nullptr), 0) << "the sandbox appliance";
    StartDaemon();
    const Result added = Run({"add", "--request",
                              R"([{"path": "/photo/2019", "name": "Été", "photo": true},
                 {"path": "/video/movies", "video": true, "document": true}])"});
    ASSERT_EQ(added.status, 0) << added.err;
  }
  void TearDown() override { StopDaemon(); }

  // Runs `args` (output to tool.out, tool.err) to its exit status or -1; with `pid`, in the back.
  int Spawn(Args args, pid_t* pid) const {
    std::vector<char*> argv;
    for (std::string& arg : args) argv.push_back(arg.data());
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    const std::string out = At("tool.out"), err = At("tool.err");
    posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    posix_spawn_file_actions_addopen(&actions, 2, err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
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

  // Starts the stand-in daemon and waits up to five seconds for it to listen.
  void StartDaemon() {
    const size_t seen = Read("records/daemon.log").size();
    ASSERT_EQ(Spawn({FILEINDEXD_STANDIN, "--socket", At("var/run/fileindexd.sock"), "--log",
                     At("records/daemon.log")},
                    &m_daemon),
              0);
    const auto listening = [&] { return Read("records/daemon.log").find("listening on", seen); };
    for (int i = 0; i < 500 && listening() == std::string::npos; ++i) usleep(10000);
    ASSERT_NE(listening(), std::string::npos);
  }
  void StopDaemon() {
    if (m_daemon > 0) {
      kill(m_daemon, SIGTERM);
      waitpid(m_daemon, nullptr, 0);
      m_daemon = -1;
    }
  }

  // Runs the tool on `args`, with `--root <sandbox>` first unless `args` gives its own root.
  Result Run(const Args& args) const {
    Args all = {FILEINDEXCTL};
    if (args.empty() || args[0] != "--root") all.insert(all.end(), {"--root", root_});
    all.insert(all.end(), args.begin(), args.end());
    const int status = Spawn(all, nullptr);
    return {status, Read("tool.out"), Read("tool.err")};
  }
  Json::Value RunJson(Args args) const {
    args.insert(args.begin(), "--json");
    const Result result = Run(args);
    EXPECT_EQ(result.status, 0) << result.err;
    return Parse(result.out);
  }

  pid_t m_daemon = -1;
};

TEST_F(FileindexctlTest, ExitStatusAndMessagesTellWhatHappened) {
  const std::string deep = std::string(2000, '[') + std::string(2000, ']');
  // Arguments, exit status, part of stderr ("": empty) and of stdout (empty unless status 0).
  const std::tuple<Args, int, std::string, std::string> cases[] = {
      // Columns count characters, not bytes.
      {{"list", "--additional", "status", "-a", "is_valid"},
       0,
       "",
       "PATH           NAME  KINDS           STATUS      VALID\n"
       "/photo/2019    Été   photo           processing  yes\n"
       "/video/movies        document,video  processing  yes\n"
       "2 of 2 folder(s)\n"},
      // The library refuses: its code and the code's meaning.
      {{"get", "/photo/none"}, 1, "get /photo/none failed: error 4 (no such indexed folder)", ""},
      {{"reindex", "/music"}, 1, "error 0 (a path lies in a share without indexed folders)", ""},
      {{"storage", "nosuch"}, 1, "storage nosuch failed: error 0 (no share named nosuch)", ""},
      // What the library takes but the user may not expect: a warning, refused under --strict.
      {{"remove", "/photo/none"}, 0, "warning: /photo/none is not in the list", ""},
      {{"--strict", "remove", "/photo/none"}, 1, "remove: not run: --strict and 1 warning(s)", ""},
      {{"reindex", "/photo/2020"}, 0, "/photo/2020 is in no indexed folder and holds none", ""},
      {{"status", "/nosuch"}, 0, "/nosuch is not in the list", ""},
      {{"share", "remove", "nosuch"}, 0, "share nosuch is in the list; nothing dropped", ""},
      {{"add", "/archive/2018", "--photo"}, 0, "the share is read-only (read_only_share)", ""},
      {{"add", "/tv/x"}, 1, "warning: /tv/x: no share named tv", ""},
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
      {{"add", "--request", "[{"}, 2, "--request: not JSON", ""},
      {{"update", "/photo/2019", "--data", deep}, 2, "--data: JSON nested deeper than", ""},
      {{"--root", "relative/dir", "list"}, 2, "--root must be an absolute path", ""},
      {{"--root", At("etc/samba/smb.conf"), "list"}, 2, "must name an existing directory", ""},
  };
  for (const auto& [args, status, err, out] : cases) {
    SCOPED_TRACE(testing::PrintToString(args));
    const Result result = Run(args);
    EXPECT_EQ(result.status, status) << result.err;
    EXPECT_NE(result.err.find(err), std::string::npos) << result.err;
    EXPECT_NE(result.out.find(out), std::string::npos) << result.out;
    EXPECT_TRUE(!err.empty() || result.err.empty()) << result.err;
    EXPECT_TRUE(status == 0 || result.out.empty()) << result.out;
  }
  // Only the add that warned without --strict changed the list.
  EXPECT_EQ(RunJson({"list"})["total"], 3);
}

TEST_F(FileindexctlTest, JsonOutputIsTheLibrarysResultAndNamesEachChange) {
  Json::Value expected;
  ASSERT_TRUE(
      fi::IndexMgr::List(expected, 1, 1, "name", "DESC", Parse(R"(["status", "is_valid"])")));
  EXPECT_EQ(RunJson({"list", "--offset", "1", "--limit", "1", "--sort-by", "name", "--desc",
                     "--additional", "status,is_valid"}),
            ReadBack(expected));
  ASSERT_TRUE(fi::IndexMgr::Get(expected, "/video/movies"));
  EXPECT_EQ(Parse(Run({"get", "/video/movies", "--json"}).out), ReadBack(expected));
  EXPECT_EQ(Parse(Run({"--json", "get", "/photo/none"}).out)["error"]["code"],
            fi::FILEINDEX_ERR_NO_SUCH_FOLDER);

  ASSERT_EQ(Run({"pause", "2"}).status, 0);
  long long resumeTime = 0;
  ASSERT_TRUE(fi::StatusMgr::GetPauseInfo(resumeTime));
  const Json::Value shown = RunJson({"status", "/photo/2019"});
  EXPECT_EQ(shown["status"], "paused");
  EXPECT_EQ(shown["resume_time"].asInt64(), resumeTime);
  EXPECT_EQ(shown["folders"]["/photo/2019"], fi::StatusMgr::GetFolderStatus("/photo/2019"));

  // explain: the deciding rule is the library's, and the folder holding the path.
  const std::tuple<Args, const char*, const char*> explained[] = {
      {{"explain", "/photo/2019/trip"}, "unknown_file_system", "/photo/2019"},
      {{"explain", At("volume1/video/movies"), "--full-path"}, "indexable", "/video/movies"},
      {{"explain", "/photo/2019/"}, "resolves_elsewhere", "/photo/2019"},
      {{"explain", "/photo/latest"}, "resolves_elsewhere", ""},
      {{"explain", "/tv/x"}, "unknown_file_system", ""}};
  for (const auto& [args, rule, holder] : explained) {
    SCOPED_TRACE(args[1]);
    const Json::Value said = RunJson(args);
    EXPECT_EQ(said["rule"], rule);
    EXPECT_EQ(said["folder"], holder);
    EXPECT_EQ(said["rule"], fi::IndexRuleKey(fi::FullPathIndexRule(said["full_path"].asString())));
  }

  const std::pair<Args, const char*> changes[] = {
      {{"share", "rename", "video", "music"},
       R"({"action":"moved","target":"/video/movies","to":"/music/movies"})"},
      {{"remove", "/music/movies", "/photo/none"},
       R"({"action":"removed","target":"/music/movies"})"}};
  for (const auto& [args, change] : changes) {
    SCOPED_TRACE(testing::PrintToString(args));
    const Json::Value said = RunJson(args);
    EXPECT_EQ(said["changes"], Parse(std::string("[") + change + "]"));
    EXPECT_EQ(said["warnings"].size(), args[0] == "remove" ? 1U : 0U);
  }
}

TEST_F(FileindexctlTest, AStepThatFailsAfterTheSaveIsNamedWithWhatWasSavedAndHowToFinish) {
  StopDaemon();
  const Result added = Run({"add", "/photo/2019", "--name", "Again", "--photo"});
  EXPECT_EQ(added.status, 1);
  Json::Value folder;
  ASSERT_TRUE(fi::IndexMgr::Get(folder, "/photo/2019"));
  EXPECT_EQ(folder["name"], "Again");
  const Result down = Run({"status", "/photo/2019"});
  EXPECT_EQ(down.out.find("processing"), std::string::npos) << down.out;
  const Result paused = Run({"--json", "pause", "0"});
  EXPECT_EQ(paused.status, 1);
  const Json::Value report = Parse(paused.out);
  EXPECT_EQ(report["changes"][0]["action"], "paused");
  EXPECT_NE(report["error"]["step"].asString().find("telling the daemon"), std::string::npos);
  // A service that does not start (the daemon is down, so the add starts it) is named.
  Write("usr/bin/systemctl",
        "#!/bin/sh\n[ \"$1\" = is-active ] && echo failed\necho failing >&2\nexit 3\n", 0755);
  const Result unstarted = Run({"add", "/video/movies", "--video"});
  EXPECT_EQ(unstarted.status, 1);
  const std::pair<const std::string*, const char*> said[] = {
      {&added.err, "add failed: error 0 (no code recorded; the library logged: index_mgr:"},
      {&added.err, "saved all the same: updated /photo/2019"},
      {&added.err, "the step that failed: telling the daemon"},
      {&added.err, "not done: queueing the update events"},
      {&added.err, "run the same command again"},
      {&down.out, "indexing: stalled"},
      {&unstarted.err, "saved all the same: updated /video/movies"},
      {&unstarted.err, "the step that failed: starting the service fileindexd"},
      {&unstarted.err, "not done: telling the daemon"},
      {&unstarted.err, "service fileindexd.service: failed"},
      {&unstarted.err, "start the service (systemctl start fileindexd.service)"},
      {&unstarted.err, "failing\n"}};
  for (const auto& [text, part] : said) {
    EXPECT_NE(text->find(part), std::string::npos) << part << " in:\n" << *text;
  }
}

TEST_F(FileindexctlTest, CheckFindsEachDisagreementAndRepairBringsItBackInLine) {
  const std::string config = "usr/wezo/etc/fileindex/";
  // The registration file of `share` below the root: its name is the encoded queue path.
  const auto registration = [&](const std::string& share) {
    for (const auto& entry : fs::directory_iterator(At("var/lib/wezotifyd/fileindex"))) {
      if (entry.path().filename().string().find("%2F" + share + "%2F") != std::string::npos) {
        return entry.path().string().substr(root_.size() + 1);
      }
    }
    return std::string();
  };
  EXPECT_EQ(Run({"check"}).out, "everything agrees with the list of indexed folders\n");
  struct Case {
    std::function<void()> plant;
    std::string kind;
    std::string line;               // expected in check's output
    bool repaired;                  // check --repair leaves everything in agreement
    std::function<void()> after{};  // between the repair and the last check
  };
  const Case cases[] = {
      {[&] { fs::remove(At(registration("photo"))); }, "registration_missing",
       "registration_missing: share photo has 1 indexed folder but no monitor registration", true},
      // Same queue, one folder more than the share has: compared by content, not by presence.
      {[&] {
         Json::Value entry = Parse(Read(registration("video")));
         entry["config"].append(entry["config"][0]);
         entry["config"][1]["path"] = At("volume1/video/other");
         Write(registration("video"), entry.toStyledString());
       },
       "registration_differs", "the monitor registration of share video does not list", true},
      {[&] { Write("var/lib/wezotifyd/fileindex/%2Fgone%2Fqueue.json", "{}"); },
       "registration_extra", "a monitor registration for the queue /gone/queue belongs to no share",
       true},
      {[&] { Write("records/units/fileindexd.service", "inactive\n"); }, "service_stopped",
       "2 folders are indexed, but the service fileindexd.service is inactive", true},
      // The stand-in service manager cannot bring the stand-in daemon back: the test does.
      {[&] { StopDaemon(); }, "daemon_silent",
       "the service is active, but the daemon does not answer on " + At("var/run/fileindexd.sock"),
       false,
       [&] {
         EXPECT_NE(Read("records/services.log").find("restart fileindexd"), std::string::npos);
         StartDaemon();
       }},
      {[&] {
         std::string conf = Read("etc/samba/smb.conf");
         Write("etc/samba/smb.conf",
               conf.replace(conf.find("spotlight = yes"), 15, "spotlight = no"));
       },
       "spotlight", "spotlight: Spotlight over SMB is off, but 2 folders are indexed", true},
      {[&] { Write(config + "status.conf", R"({"need_reindex": {"photo": true, "gone": true}})"); },
       "flag_of_gone_share", "status.conf holds the need_reindex flag of gone, which is no share",
       true, [&] { EXPECT_TRUE(fi::StatusMgr::ShareIsNeedReindex("photo")); }},
      // Only regular files of mkstemp's pattern are temporaries.
      {[&] {
         Write(config + "folder.conf.a1B2c3", "{");
         Write(config + "status.conf.abcdefg", "{");
         fs::create_directory(At(config + "status.conf.Zz9Zz9"));
       },
       "stale_temporary", At(config + "folder.conf.a1B2c3") + " is a temporary file", true,
       [&] {
         EXPECT_TRUE(fs::exists(At(config + "status.conf.abcdefg")) &&
                     fs::exists(At(config + "status.conf.Zz9Zz9")));
       }},
      {[&] { fs::remove_all(At("volume1/video/movies")); }, "no_directory",
       "does not exist; --repair leaves it", false,
       [&] { fs::create_directories(At("volume1/video/movies")); }},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.kind);
    c.plant();
    const Result found = Run({"check"});
    EXPECT_EQ(found.status, 1);
    EXPECT_NE(found.out.find(c.line), std::string::npos) << found.out;
    const Json::Value findings = Parse(Run({"--json", "check"}).out)["findings"];
    EXPECT_EQ(findings.size(), 1U);
    EXPECT_EQ(findings[0]["kind"], c.kind);
    const Result repair = Run({"check", "--repair"});
    EXPECT_EQ(repair.status, c.repaired ? 0 : 1) << repair.out << repair.err;
    EXPECT_EQ(repair.out.find("left: ") != std::string::npos, !c.repaired) << repair.out;
    if (c.after) c.after();
    EXPECT_EQ(Run({"check"}).status, 0);
  }
}
}  // namespace
