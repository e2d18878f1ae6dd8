// The index manager's operations end to end, the platform faked: what each leaves behind in
// folder.conf, the platform effects in order, the daemon's frames and the queues.
#include <optional>
#include <regex>

#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using testsupport::Joined;
using Ms = std::chrono::milliseconds;

const std::string kAllChanged = R"({"audio":true,"document":true,"photo":true,"video":true})";

// folder.conf's paths, or status.conf's resume_time.
std::string Stored(bool status) {
  Json::Value stored;
  JsonFromString(stored, ReadFile(status ? StatusConfPath() : FolderConfPath()));
  return status ? JsonToString(stored["resume_time"]) : Joined(stored.getMemberNames());
}

class IndexOpsTest : public testsupport::LibraryTest {
 protected:
  std::string Relative(const std::string& path) const {
    return path.rfind(volume, 0) == 0 ? path.substr(volume.size()) : path;
  }

  // The share's queue, "<event> <share path> <data>" per line, joined by "; ".
  std::string Events(const std::string& share) const {
    std::vector<std::string> events;
    std::istringstream lines(ReadFile(volume + "/" + share + "/@eaDir/WEZO@file_index_queue"));
    for (std::string line; std::getline(lines, line) && line != "<missing>";) {
      const Json::Value event = ParseJson(line);
      events.push_back(event["event"].asString() + " " + Relative(event["path"].asString()) + " " +
                       JsonToString(event["data"]));
    }
    return Joined(events);
  }

  // What the operations did to the platform, in order: services, Spotlight, monitor, programs.
  std::string Effects() const {
    std::vector<std::string> effects;
    for (const fake::Call& call : fake::Get().calls) {
      const std::string first = call.args.empty() ? "" : call.args[0];
      if (call.op.rfind("WLIBService", 0) == 0) effects.push_back(call.op.substr(11) + " " + first);
      if (call.op == "WEZOSMBSetSpotlight") effects.push_back("Spotlight " + first);
      if (call.op == "MonitorQueue::Delete")
        effects.push_back("unwatch " + Relative(first).substr(1, 5));
      if (call.op != "MonitorQueue::Upsert") continue;
      const Json::Value entry = ParseJson(first);
      std::string text = "watch " + Relative(entry["queue"].asString()).substr(1, 5) + ":";
      for (const Json::Value& dir : entry["config"]) text += " " + Relative(dir["path"].asString());
      effects.push_back(text);
    }
    return Joined(effects);
  }

  // The log, with the fake platform's source line numbers as N.
  std::string Log() const {
    static const std::regex line("fake_platform:[0-9]+");
    return std::regex_replace(Joined(log.Lines()), line, "fake_platform:N");
  }

  // Each frame the daemon received as "<type> <data>".
  static std::string Frames(FakeDaemon& daemon, size_t expected) {
    std::vector<std::string> frames;
    for (const Json::Value& command : daemon.Commands(expected)) {
      frames.push_back(command["type"].asString() + " " + JsonToString(command["data"]));
    }
    return Joined(frames);
  }

  static std::string Saved() { return Stored(false); }
};

TEST_F(IndexOpsTest, UpsertSavesThenRegistersStartsTellsTheDaemonAndQueuesUpdates) {
  FakeDaemon daemon;
  ASSERT_TRUE(IndexMgr::Upsert(ParseJson(R"([{"path":"/video/c","video":true},
      {"path":"/photo/b","name":"B","photo":true}, {"path":"/photo/a"}])")));
  EXPECT_EQ(Saved(), "/photo/a; /photo/b; /video/c");
  EXPECT_EQ(Effects(),
            "watch photo: /photo/a /photo/b; watch video: /video/c; Start fileindexd; "
            "Spotlight 1; Restart samba");
  EXPECT_EQ(Frames(daemon, 3), R"(upsert_folder_setting {"folder_path":"/video/c"}; )"
                               R"(upsert_folder_setting {"folder_path":"/photo/b"}; )"
                               R"(upsert_folder_setting {"folder_path":"/photo/a"})");
  EXPECT_EQ(Events("photo"), "131072 /photo/a " + kAllChanged + "; 131072 /photo/b " + kAllChanged);
  EXPECT_EQ(Events("video"), "131072 /video/c " + kAllChanged);
  EXPECT_EQ(Log(), "");
  EXPECT_EQ(fake::Get().openShareRecords, 0);

  // The same path twice: the daemon hears twice, the queue holds the last report.
  ResetPlatform();
  std::filesystem::remove_all(volume + "/photo/@eaDir");
  ASSERT_TRUE(IndexMgr::Set(ParseJson(R"([{"path":"/photo/a","photo":true},
                                          {"path":"/photo/a","name":"x","photo":false}])")));
  EXPECT_EQ(daemon.Commands(5).size(), 5U);
  EXPECT_EQ(Events("photo"),
            R"(131072 /photo/a {"audio":false,"document":false,"photo":true,"video":false})")
      << "the report of the second element, which switched photo off";
}

// From the list `stored` (none: no file): a share is registered with its folders only, and the
// service runs once a folder is listed unless the daemon stopped answering.
TEST_F(IndexOpsTest, UpsertsRegisterAndStartWhatTheyNeedAndFailuresAfterTheSaveSkipTheRest) {
  const std::string watch = "watch photo: /photo/a", start = "; Start fileindexd",
                    spotlight = "; Spotlight 1; Restart samba", kept = R"({"/photo/a":{}})";
  const struct {
    bool fake::Platform::*fails;  // null: none
    bool daemonListens, result;
    std::string effects;
    size_t queued;  // frames and events
    std::string log;
    std::string stored{}, request = R"([{"path":"/photo/a"}])";
  } cases[] = {
      {&fake::Platform::monitor_upsert_fails, true, false, watch, 0,
       "index_mgr:N MonitorQueue::Add failed; index_mgr:N UpsertWEZtifydCfg failed, share=photo"},
      {&fake::Platform::service_start_fails, true, false, watch + start, 0,
       "index_mgr:N WLIBServiceStart failed: err=[0x0E01 fake_platform:N]"},
      {&fake::Platform::spotlight_set_fails, true, true, watch + start + "; Spotlight 1", 1,
       "index_mgr:N WEZOSMBSetSpotlight failed: err=[0x0E01 fake_platform:N]"},
      {&fake::Platform::service_restart_fails, true, true, watch + start + spotlight, 1,
       "index_mgr:N WLIBServiceRestart failed: err=[0x0E01 fake_platform:N]"},
      {&fake::Platform::spotlight_query_fails, true, true, watch + start, 1, ""},
      {nullptr, false, false, watch + start + spotlight, 0,
       "index_mgr:N SendCammandToDaemon failed"},
      // A change of settings only: registered already, and the daemon answers.
      {nullptr, true, true, spotlight.substr(2), 1, "", kept},
      {nullptr, false, false, start.substr(2) + spotlight, 0,
       "index_mgr:N SendCammandToDaemon failed", kept},
      {nullptr, true, true, "watch video: /video/v" + spotlight, 2, "", kept,
       R"([{"path":"/photo/a","photo":true},{"path":"/video/v"}])"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.log + " " + c.request);
    ResetPlatform();
    std::filesystem::remove_all(volume + "/photo/@eaDir");
    std::filesystem::remove(FolderConfPath());
    if (!c.stored.empty()) WriteFile(FolderConfPath(), c.stored);
    if (c.fails != nullptr) fake::Get().*c.fails = true;
    std::optional<FakeDaemon> daemon;
    if (c.daemonListens) daemon.emplace();
    EXPECT_EQ(IndexMgr::Upsert(ParseJson(c.request)), c.result);
    EXPECT_EQ(Saved().substr(0, 8), "/photo/a");
    EXPECT_EQ(Effects(), c.effects);
    EXPECT_TRUE(!daemon ||
                daemon->Commands(c.queued, Ms(c.queued * 5000 + 100)).size() == c.queued);
    EXPECT_EQ(Events("photo").empty(), c.queued == 0);
    EXPECT_EQ(Log(), c.log);
  }
}

// The caller blocks in connect until the daemon accepts: the change is saved, the lock held.
TEST_F(IndexOpsTest, TheDaemonIsToldOfASavedChangeWhileTheLockIsStillHeld) {
  WriteFile(FolderConfPath(), R"({"/video/v":{}})");
  const struct {
    std::function<bool()> operation;
    bool status;  // status.conf's resume_time, else folder.conf's paths
    std::string stored;
  } steps[] = {
      {[] { return IndexMgr::Upsert(ParseJson(R"([{"path":"/photo/a"}])")); }, false,
       "/photo/a; /video/v"},
      {[] { return IndexMgr::Delete(ParseJson(R"(["/photo/a"])")); }, false, "/video/v"},
      {[] { return StatusMgr::Pause(0); }, true, "0"},
  };
  for (const auto& step : steps) {
    SCOPED_TRACE(step.stored);
    const std::string lock = step.status ? StatusLockPath() : FolderLockPath();
    FakeDaemon daemon(FakeDaemon::Behaviour::kHoldConnect);
    bool result = false;
    std::thread caller([&] { result = step.operation(); });
    for (int i = 0; i < 5000 && Stored(step.status) != step.stored; ++i) {
      std::this_thread::sleep_for(Ms(1));
    }
    EXPECT_EQ(Stored(step.status), step.stored);
    std::this_thread::sleep_for(Ms(50));
    EXPECT_TRUE(testsupport::LockHeldElsewhere(lock));
    daemon.Release();
    caller.join();
    EXPECT_TRUE(result);
    EXPECT_EQ(daemon.Commands(1).size(), 1U);
    EXPECT_FALSE(testsupport::LockHeldElsewhere(lock));
  }
}

// Another process holds both locks: changes fail touching nothing; queries read without them.
TEST_F(IndexOpsTest, AnotherWriterHoldingTheLocksMakesChangesFailWithNothingTouched) {
  FakeDaemon daemon;
  WriteFile(FolderConfPath(), R"({"/photo/a":{},"/video/v":{}})");
  WriteFile(StatusConfPath(), R"({"resume_time":0,"need_reindex":{"photo":true},"done":true})");
  const std::string before = ReadFile(FolderConfPath()) + ReadFile(StatusConfPath());
  testsupport::LockHolder holder(FolderLockPath(), true);
  testsupport::LockHolder status(StatusLockPath(), true);
  const std::function<bool()> operations[] = {
      [] { return IndexMgr::Upsert(ParseJson(R"([{"path":"/photo/b"}])")); },
      [] { return IndexMgr::Delete(ParseJson(R"(["/photo/a"])")); },
      [] { return IndexMgr::ShareRemove("photo"); },
      [] { return IndexMgr::ShareRename("photo", "video"); },
      [] { return StatusMgr::SetUpdated("other") || StatusMgr::Pause(0); },
      [] {
        Json::Value out;
        return IndexMgr::Get(out, "/photo/a");
      },
  };
  for (const auto& operation : operations) {
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    EXPECT_FALSE(operation());
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOCK);
  }
  EXPECT_EQ(ReadFile(FolderConfPath()) + ReadFile(StatusConfPath()), before);
  EXPECT_EQ(Effects(), "");
  EXPECT_TRUE(daemon.Connections(1, Ms(200)).empty());
  long long resumeTime = -1;
  EXPECT_TRUE(IndexMgr::IsPathIndexed("/photo/a") && StatusMgr::GetPauseInfo(resumeTime) &&
              StatusMgr::ShareIsNeedReindex("photo") && !StatusMgr::ShareIsNoSpace("photo") &&
              StatusMgr::IsUpdated("done"));
  EXPECT_EQ(resumeTime, 0);
}

TEST_F(IndexOpsTest, MalformedRequestsAreRefusedWithACodeAndChangeNothing) {
  FakeDaemon daemon;
  WriteFile(FolderConfPath(), R"({"/photo/a":{"photo":true}})");
  const std::string before = ReadFile(FolderConfPath());
  // Malformed for every operation (some make jsoncpp throw), paths naming another place too.
  const Json::Value shapes = ParseJson(R"([{}, {"path":"/photo/b"}, "/photo/a", 1, null, true,
      [1], [null], [true], [[1]], [{}], [{"path":{}}], [{"path":1}], [{"path":["/photo/b"]}],
      [{"path":"/photo/b"},"/photo/a"], ["/photo/a",{"path":"/photo/b"}], [{"path":"/photo/b"},[1]],
      ["/photo/../../../../etc"], ["/photo/a","/photo/.."], [""], ["photo/a"], ["/photo/./a"],
      ["/photo//a"], ["/photo/a/"], ["/photo/a\u0000"], [{"path":"/photo/b\u0000"}],
      [{"path":"/photo/b"},{"path":"/photo/x/../../../etc"}]])");
  const std::pair<const char*, bool (*)(const Json::Value&)> operations[] = {
      {"Upsert", &IndexMgr::Upsert}, {"Set", &IndexMgr::Set},         {"Add", &IndexMgr::Add},
      {"Delete", &IndexMgr::Delete}, {"Reindex", &IndexMgr::Reindex},
  };
  for (const auto& [name, operation] : operations) {
    for (const Json::Value& shape : shapes) {
      SCOPED_TRACE(std::string(name) + " " + JsonToString(shape));
      ErrorHandler::SetError(FILEINDEX_ERR_NONE);
      log.Clear();
      bool result = true;
      EXPECT_NO_THROW(result = operation(shape));
      EXPECT_FALSE(result);
      EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
      EXPECT_THAT(Log(), ::testing::ContainsRegex("(Bad param|Malformed jsArrPath): "));
      EXPECT_EQ(ReadFile(FolderConfPath()), before);
    }
  }
  // A share name empty or impossible names no share ("" would read as every share).
  const std::function<bool()> shareOperations[] = {
      [] { return IndexMgr::Update("/photo/../../etc", Json::Value()); },
      [] { return IndexMgr::Update(std::string("/photo/a\0/../../etc", 19), Json::Value()); },
      [] { return IndexMgr::ShareRemove(""); },
      [] { return IndexMgr::ShareRename("photo", ".."); },
      [] { return IndexMgr::SharePause(std::string("photo\0x", 7)); },
      [] { return IndexMgr::ShareResume(""); },
      [] { return IndexMgr::CleanShareIndexData(""); },
  };
  for (const auto& operation : shareOperations) {
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
    EXPECT_FALSE(operation());
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
    EXPECT_THAT(Log(), ::testing::MatchesRegex("index_mgr:N Bad param: [^;]*"));
  }
  log.Clear();
  EXPECT_FALSE(IndexMgr::ShareRename("..", "photo"));  // the line names both shares
  EXPECT_EQ(Log(), R"(index_mgr:N Bad param: ["..","photo"])");
  EXPECT_EQ(ReadFile(FolderConfPath()), before);
  EXPECT_EQ(Effects(), "");
  EXPECT_EQ(Events("photo"), "");
  EXPECT_TRUE(daemon.Connections(1, Ms(200)).empty());
  Json::Value folder;
  EXPECT_TRUE(IndexMgr::Get(folder, "/photo/a")) << "no refusal left the lock held";
}

TEST_F(IndexOpsTest, DeletingFoldersTellsTheDaemonQueuesTheLastPathAndCleansAnEmptiedShare) {
  FakeDaemon daemon;
  WriteFile(FolderConfPath(), R"({"/photo/a":{"photo":true},"/photo/b":{"photo":true},
                                  "/photo/c":{},"/video/v":{}})");
  ASSERT_TRUE(IndexMgr::Delete(ParseJson(R"(["/photo/b","/photo/a"])")));
  EXPECT_EQ(Saved(), "/photo/c; /video/v");
  EXPECT_EQ(Frames(daemon, 2), R"(delete_folder_setting {"folder_path":"/photo/b"}; )"
                               R"(delete_folder_setting {"folder_path":"/photo/a"})");
  EXPECT_EQ(Events("photo"), "131072 /photo/a " + kAllChanged);
  EXPECT_EQ(Effects(), "watch photo: /photo/c") << "re-registered, not cleaned";
  ResetPlatform();
  ASSERT_TRUE(IndexMgr::Delete(ParseJson(R"(["/photo/c"])")));
  EXPECT_EQ(Effects(), "unwatch photo") << "video stays indexed: no service stop";
  EXPECT_TRUE(std::filesystem::is_empty(volume + "/photo/@eaDir")) << "index data removed";
  EXPECT_EQ(Log(), "");

  // The last folder stops the service and Spotlight; a later failing step leaves the save.
  const struct {
    void (*arrange)(fake::Platform&);
    const char *stored, *request;
    bool result;
    std::string saved, effects, log;
  } cases[] = {
      {[](fake::Platform& p) { p.spotlight = 1; }, "", "/video/v", true, "",
       "Stop fileindexd; Spotlight 0; Restart samba; unwatch video", ""},
      {[](fake::Platform&) {}, "", "/video/v", true, "", "Stop fileindexd; unwatch video", ""},
      {[](fake::Platform& p) { p.service_stop_fails = true; }, "", "/video/v", true, "",
       "Stop fileindexd; unwatch video",
       "index_mgr:N WLIBServiceStop failed: err=[0x0E01 fake_platform:N]"},
      {[](fake::Platform& p) { p.monitor_upsert_fails = true; }, R"("/photo/a":{},"/photo/b":{},)",
       "/photo/a", false, "/photo/b; /video/v", "watch photo: /photo/b",
       "index_mgr:N MonitorQueue::Add failed; index_mgr:N UpsertWEZotifydCfg failed, share=photo"},
      {[](fake::Platform& p) { p.monitor_delete_fails = true; }, R"("/photo/a":{},)", "/video/v",
       false, "/photo/a", "unwatch video",
       "index_mgr:N MonitorQueue::Delete failed; index_mgr:N DeleteWEZtifydCfg failed, "
       "share=video"},
      // The share is gone once the list is loaded: the update cannot be queued.
      {[](fake::Platform& p) { p.share_get_fails_after = 3; }, R"("/photo/a":{},"/photo/b":{},)",
       "/photo/a", false, "/photo/b; /video/v", "",
       "index_mgr:N GetFullPath failed, path=/photo/a; index_mgr:N Update failed"},
      {[](fake::Platform& p) { p.shares.erase("video"); }, R"("/photo/a":{},)", "/video/v", false,
       "/photo/a", "",
       "utils:N WEZOShareGet failed, name=video, code=3585; index_mgr:N FILEIDXQueuePathGet "
       "failed, share=video; index_mgr:N CleanShareIndexData failed, share=video"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.log);
    ResetPlatform();
    c.arrange(fake::Get());
    WriteFile(FolderConfPath(), std::string("{") + c.stored + R"("/video/v":{"photo":true}})");
    std::filesystem::create_directories(volume + "/video/@eaDir");
    WriteFile(volume + "/video/@eaDir/WEZO@file_index_queue", "");
    EXPECT_EQ(IndexMgr::Delete(ParseJson("[\"" + std::string(c.request) + "\"]")), c.result);
    EXPECT_EQ(Saved(), c.saved) << "no rollback after the save";
    EXPECT_EQ(Effects(), c.effects);
    EXPECT_TRUE(!c.saved.empty() || std::filesystem::is_empty(volume + "/video/@eaDir"));
    EXPECT_EQ(Log(), c.log);
  }
  EXPECT_EQ(daemon.Connections(9, Ms(200)).size(), 7U) << "nobody told of the last";
}

TEST_F(IndexOpsTest, ReindexQueuesNothingUnlessEveryElementIsAcceptable) {
  WriteFile(FolderConfPath(), R"({"/photo/2016":{},"/photo/a":{},"/video/v":{}})");
  const struct {
    const char* request;
    bool result;
    _tag_fileindex_err_ code;
    std::string events, log;
  } cases[] = {
      {"[]", true, FILEINDEX_ERR_NONE, "", ""},
      {R"("/photo")", false, FILEINDEX_ERR_BAD_PARAM, "",
       R"(index_mgr:N Malformed jsArrPath: "/photo")"},
      {R"(["/photo",3])", false, FILEINDEX_ERR_BAD_PARAM, "", "index_mgr:N Malformed jsArrPath: 3"},
      {R"(["/photo/x","/music/y"])", false, FILEINDEX_ERR_NONE, "", ""},
      {R"(["/photo/not-indexed","/photo","/photo/...a/.b"])", true, FILEINDEX_ERR_NONE,
       "65536 /photo/not-indexed null; 65536 /photo null; 65536 /photo/...a/.b null", ""},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.request);
    std::filesystem::remove_all(volume + "/photo/@eaDir");
    ResetPlatform();
    EXPECT_EQ(IndexMgr::Reindex(ParseJson(c.request)), c.result);
    EXPECT_EQ(ErrorHandler::GetError(), c.code);
    EXPECT_EQ(Events("photo"), c.events);
    EXPECT_EQ(Log(), c.log);
  }

  // Shares out of space are revived first, once each; a revival that fails does not stop it.
  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("photo", true));
  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("video", true) &&
              StatusMgr::ShareSetNeedReindex("video", true));
  {
    FakeDaemon daemon;
    ASSERT_TRUE(IndexMgr::Reindex(ParseJson(R"(["/video/v","/photo/a","/video/v"])")));
    EXPECT_EQ(Frames(daemon, 2), R"(revive_share_worker {"share_name":"photo"}; )"
                                 R"(revive_share_worker {"share_name":"video"})");
  }
  EXPECT_FALSE(StatusMgr::ShareIsNoSpace("photo"));
  EXPECT_TRUE(StatusMgr::ShareIsNeedReindex("video")) << "reviving leaves a reindex pending";
  EXPECT_EQ(Events("video"), "65536 /video/v null") << "the duplicate is dropped";
  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("photo", true));
  std::filesystem::remove_all(volume + "/photo/@eaDir");
  ResetPlatform();
  ASSERT_TRUE(IndexMgr::Reindex(ParseJson(R"(["/photo/a"])"))) << "no daemon listens";
  EXPECT_EQ(Log(),
            "status_mgr:N SendCammandToDaemon failed; "
            "index_mgr:N ShareRevice failed, share=photo");
  EXPECT_FALSE(StatusMgr::ShareIsNoSpace("photo")) << "cleared although the daemon was not told";
  EXPECT_EQ(Events("photo"), "65536 /photo/a null");
}

TEST_F(IndexOpsTest, UpdateQueuesOneEventWithThePayload) {
  ASSERT_TRUE(IndexMgr::Update("/photo/a.jpg", ParseJson(R"({"k":1})")));
  EXPECT_EQ(Events("photo"), R"(131072 /photo/a.jpg {"k":1})");
  EXPECT_FALSE(IndexMgr::Update("/music/a.mp3", Json::Value()));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_EQ(Log(), "index_mgr:N GetFullPath failed, path=/music/a.mp3");
}

// Paths stored by earlier versions (a trailing slash) are taken as they are; a share change
// leaves a share it prefixes alone.
TEST_F(IndexOpsTest, FoldersStoredByEarlierVersionsAreTakenAsTheyAre) {
  FakeDaemon daemon;
  for (const char* share : {"pictures", "photos"}) {
    std::filesystem::create_directories(volume + "/" + share);
    fake::Get().AddShare(share, volume + "/" + share);
  }
  WriteFile(FolderConfPath(), R"({"/photo/a/":{},"/photo/b":{"audio":true},"/photos/x":{}})");
  const std::string before = "/photo/a/; /photo/b; /photos/x", after = "/photos/x; /pictures/a/";
  const std::pair<std::function<bool()>, std::string> steps[] = {
      {Updater_hxo60_beta2, before},
      {[] { return IndexMgr::Set(ParseJson(R"([{"path":"/photo/a/","name":"A"}])")); }, before},
      {[] { return IndexMgr::Update("/photo/a/", Json::Value()); }, before},
      {[] { return IndexMgr::ShareRename("photo", "pictures"); }, after + "; /pictures/b"},
      {[] { return IndexMgr::ShareRename("music", "songs"); }, after + "; /pictures/b"},
      {[] { return IndexMgr::Reindex(ParseJson(R"(["/pictures/a/"])")); }, after + "; /pictures/b"},
      {[] { return IndexMgr::Delete(ParseJson(R"(["/pictures/b"])")); }, after},
      {[] { return IndexMgr::ShareRemove("pictures"); }, "/photos/x"},
  };
  for (const auto& [operation, saved] : steps) {
    EXPECT_TRUE(operation()) << saved;
    EXPECT_EQ(Saved(), saved);
  }
  EXPECT_EQ(Log(), "");
  WriteFile(FolderConfPath(), R"({"/photo/a/":{"name":"A"},"/photo/b":{"audio":true}})");
  ASSERT_TRUE(IndexMgr::ShareRename("photo", "pictures"));
  EXPECT_EQ(ParseJson(ReadFile(FolderConfPath())),
            ParseJson(R"({"/pictures/a/":{"path":"/pictures/a/","name":"A","document":false,
                "audio":false,"video":false,"photo":false},"/pictures/b":{"path":"/pictures/b",
                "name":"","document":false,"audio":true,"video":false,"photo":false}})"));
}

TEST_F(IndexOpsTest, SharePauseStopsTheWorkerFirstAndResumeRegistersFirst) {
  WriteFile(FolderConfPath(), R"({"/photo/a":{}})");
  {
    FakeDaemon daemon;
    ASSERT_TRUE(IndexMgr::ShareResume("photo"));
    ASSERT_TRUE(IndexMgr::SharePause("photo"));
    EXPECT_EQ(Frames(daemon, 2), R"(revive_share_worker {"share_name":"photo"}; )"
                                 R"(delete_share_worker {"share_name":"photo"})");
    EXPECT_EQ(Effects(), "watch photo: /photo/a; unwatch photo");
  }
  EXPECT_FALSE(IndexMgr::ShareResume("photo")) << "no daemon listens";
  EXPECT_FALSE(IndexMgr::SharePause("photo"));
  EXPECT_EQ(fake::Get().CallsTo("MonitorQueue::Delete").size(), 1U) << "registration kept";
  EXPECT_EQ(Log(), "");
  fake::Get().monitor_upsert_fails = true;
  EXPECT_FALSE(IndexMgr::ShareResume("photo"));
  EXPECT_EQ(Log(),
            "index_mgr:N MonitorQueue::Add failed; "
            "index_mgr:N UpsertWEZotifydCfg failed, share=photo");
}

TEST_F(IndexOpsTest, TheMigrationBringsServicesMonitorAndQueuesInLineWithTheList) {
  ASSERT_TRUE(Updater_hxo60_beta2()) << "a missing list";
  EXPECT_EQ(Effects(), "Stop fileindexd");
  EXPECT_EQ(fake::Get().calls[0].args[1], "1") << "the flags of the stop";
  fake::Get().service_stop_fails = true;
  EXPECT_FALSE(Updater_hxo60_beta2());
  EXPECT_EQ(Log(), "utils:N WLIBServiceStart failed: err=[0x0E01 fake_platform:N]");

  ResetPlatform();
  fake::Get().spotlight = 1;
  WriteFile(FolderConfPath(), R"({"/video":{},"/photo/b":{},"/photo/a":{}})");
  ASSERT_TRUE(Updater_hxo60_beta2());
  EXPECT_EQ(Effects(),
            "Start fileindexd; Spotlight 1; watch photo: /photo/a /photo/b; "
            "watch video: /video");
  EXPECT_EQ(Events("photo"), "65536 /photo/a null; 65536 /photo/b null");
  EXPECT_EQ(Events("video"), "65536 /video null");
  EXPECT_EQ(fake::Get().CallsTo("WLIBServiceStart")[0].args[1], "1");

  WriteFile(FolderConfPath(), R"({"":{},"/photo/a":{}})");
  ResetPlatform();
  EXPECT_FALSE(Updater_hxo60_beta2());
  EXPECT_EQ(Effects(), "Start fileindexd; Spotlight 1");
  EXPECT_EQ(Log(),
            "utils:N GetShareNameByPath failed, path=; "
            "utils:N GetShareNameByPath failed, path=")
      << "once as the list is read, once by the migration";
  ResetPlatform();
  fake::Get().spotlight_set_fails = true;
  EXPECT_FALSE(Updater_hxo60_beta2());
  EXPECT_EQ(Log(),
            "utils:N GetShareNameByPath failed, path=; "
            "utils:N WEZOSMBSetSpotlight failed: err=[0x0E01 fake_platform:N]");
}

}  // namespace
}  // namespace WEZO::FILEINDEX
