// The index manager's operations end to end: real configuration files, queues and a listening
// daemon socket in the sandbox, the platform faked. Each test states together what an operation
// leaves behind: folder.conf, the platform effects in order, the daemon's frames and the queues.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <optional>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/folders.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;
using testsupport::FakeDaemon;
using testsupport::ParseJson;
using testsupport::ReadFile;
using testsupport::WriteFile;

constexpr char kAllChanged[] = R"({"audio":true,"document":true,"photo":true,"video":true})";

class IndexOpsTest : public testsupport::LibraryTest {
 protected:
  IndexOpsTest() {
    std::filesystem::create_directories(volume + "/photo");
    std::filesystem::create_directories(volume + "/video");
  }

  std::string Relative(const std::string& path) const {
    return path.rfind(volume, 0) == 0 ? path.substr(volume.size()) : path;
  }

  std::string Queue(const std::string& share) const {
    return volume + "/" + share + "/@eaDir/WEZO@file_index_queue";
  }

  // The share's queue, one "<event> <share path> <data>" per line.
  std::vector<std::string> Events(const std::string& share) const {
    std::vector<std::string> events;
    const std::string text = ReadFile(Queue(share));
    std::istringstream lines(text == "<missing>" ? "" : text);
    for (std::string line; std::getline(lines, line);) {
      const Json::Value event = ParseJson(line);
      events.push_back(event["event"].asString() + " " + Relative(event["path"].asString()) + " " +
                       JsonToString(event["data"]));
    }
    return events;
  }

  // What the operation did to the platform, in order: services, Spotlight, monitor, programs.
  std::vector<std::string> Effects() const {
    std::vector<std::string> effects;
    for (const fake::Call& call : fake::Get().calls) {
      const std::string first = call.args.empty() ? "" : call.args[0];
      if (call.op == "WLIBServiceStart" || call.op == "WLIBServiceStop" ||
          call.op == "WLIBServiceRestart") {
        effects.push_back(call.op.substr(11) + " " + first);
      } else if (call.op == "WEZOSMBSetSpotlight") {
        effects.push_back("Spotlight " + first);
      } else if (call.op == "MonitorQueue::Upsert") {
        const Json::Value entry = ParseJson(first);
        std::string text = "watch " + Relative(entry["queue"].asString()).substr(1, 5) + ":";
        for (const Json::Value& dir : entry["config"]) {
          text += " " + Relative(dir["path"].asString());
        }
        effects.push_back(text);
      } else if (call.op == "MonitorQueue::Delete") {
        effects.push_back("unwatch " + Relative(first).substr(1, 5));
      } else if (call.op == "WLIBCExec") {
        std::string text;
        for (const std::string& arg : call.args) {
          text += (text.empty() ? "" : " ") + Relative(arg);
        }
        effects.push_back(text);
      }
    }
    return effects;
  }

  // Each frame the daemon received as "<type> <data>".
  static std::vector<std::string> Frames(FakeDaemon& daemon, size_t expected) {
    std::vector<std::string> frames;
    for (const Json::Value& command : daemon.Commands(expected)) {
      frames.push_back(command["type"].asString() + " " + JsonToString(command["data"]));
    }
    return frames;
  }

  static Json::Value FolderConf() { return ParseJson(ReadFile(FolderConfPath())); }
};

TEST_F(IndexOpsTest, UpsertSavesThenRegistersStartsTellsTheDaemonAndQueuesUpdates) {
  FakeDaemon daemon;
  ASSERT_TRUE(IndexMgr::Upsert(ParseJson(R"([{"path":"/video/c","video":true},
      {"path":"/photo/b","name":"B","photo":true}, {"path":"/photo/a"}])")));

  EXPECT_EQ(FolderConf().getMemberNames(),
            (std::vector<std::string>{"/photo/a", "/photo/b", "/video/c"}));
  EXPECT_EQ(FolderConf()["/photo/b"], ParseJson(R"({"path":"/photo/b","name":"B","document":false,
      "audio":false,"video":false,"photo":true})"));
  EXPECT_THAT(Effects(), ElementsAre("watch photo: /photo/a /photo/b", "watch video: /video/c",
                                     "Start fileindexd", "Spotlight 1", "Restart samba"));
  EXPECT_THAT(Frames(daemon, 3),
              ElementsAre(R"(upsert_folder_setting {"folder_path":"/video/c"})",
                          R"(upsert_folder_setting {"folder_path":"/photo/b"})",
                          R"(upsert_folder_setting {"folder_path":"/photo/a"})"));
  EXPECT_THAT(Events("photo"), ElementsAre(std::string("131072 /photo/a ") + kAllChanged,
                                           std::string("131072 /photo/b ") + kAllChanged));
  EXPECT_THAT(Events("video"), ElementsAre(std::string("131072 /video/c ") + kAllChanged));
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_EQ(fake::Get().openShareRecords, 0);
  Json::Value folder;
  EXPECT_TRUE(IndexMgr::Get(folder, "/photo/a")) << "the lock is released";
}

TEST_F(IndexOpsTest, UpsertOfTheSamePathTwiceTellsTheDaemonTwiceAndQueuesTheLastReport) {
  FakeDaemon daemon;
  ASSERT_TRUE(IndexMgr::Set(ParseJson(R"([{"path":"/photo/a","photo":true},
                                          {"path":"/photo/a","name":"x","photo":false}])")));
  EXPECT_EQ(Frames(daemon, 2).size(), 2U);
  EXPECT_THAT(Events("photo"), ElementsAre(R"(131072 /photo/a {"audio":false,"document":false,)"
                                           R"("photo":true,"video":false})"))
      << "the report of the second element, which switched photo off";

  fake::Reset();
  fake::Get().AddShare("photo", volume + "/photo");
  fake::Get().spotlight = 1;
  const std::string before = ReadFile(FolderConfPath());
  ASSERT_TRUE(IndexMgr::Add(Json::Value(Json::arrayValue)));
  EXPECT_EQ(ReadFile(FolderConfPath()), before);
  EXPECT_THAT(Effects(), ElementsAre("Start fileindexd"))
      << "an empty request still starts the service; Spotlight already on is left alone";
  EXPECT_THAT(daemon.Connections(3, std::chrono::milliseconds(200)), ::testing::SizeIs(2));
}

TEST_F(IndexOpsTest, UpsertFailuresAfterTheSaveKeepTheListAndSkipTheRest) {
  struct Case {
    const char* name;
    std::function<void(fake::Platform&)> arrange;
    bool daemonListens;
    bool result;
    std::vector<std::string> effects;
    size_t frames;
    size_t events;
    std::vector<std::string> lines;  // the start of each expected log line
  } cases[] = {
      {"monitor refuses",
       [](fake::Platform& p) { p.monitor_upsert_fails = true; },
       true,
       false,
       {"watch photo: /photo/a"},
       0,
       0,
       {"index_mgr:N MonitorQueue::Add failed",
        "index_mgr:N UpsertWEZtifydCfg failed, share=photo"}},
      {"service won't start",
       [](fake::Platform& p) { p.service_start_fails = true; },
       true,
       false,
       {"watch photo: /photo/a", "Start fileindexd"},
       0,
       0,
       {"index_mgr:N WLIBServiceStart failed: err=[0x0E01 fake_platform:"}},
      {"Spotlight switch fails",
       [](fake::Platform& p) { p.spotlight_set_fails = true; },
       true,
       true,
       {"watch photo: /photo/a", "Start fileindexd", "Spotlight 1"},
       1,
       1,
       {"index_mgr:N WEZOSMBSetSpotlight failed: err=[0x0E01 fake_platform:"}},
      {"samba restart fails",
       [](fake::Platform& p) { p.service_restart_fails = true; },
       true,
       true,
       {"watch photo: /photo/a", "Start fileindexd", "Spotlight 1", "Restart samba"},
       1,
       1,
       {"index_mgr:N WLIBServiceRestart failed: err=[0x0E01 fake_platform:"}},
      {"Spotlight state unknown",
       [](fake::Platform& p) { p.spotlight_query_fails = true; },
       true,
       true,
       {"watch photo: /photo/a", "Start fileindexd"},
       1,
       1,
       {}},
      {"daemon absent",
       [](fake::Platform&) {},
       false,
       false,
       {"watch photo: /photo/a", "Start fileindexd", "Spotlight 1", "Restart samba"},
       0,
       0,
       {"index_mgr:N SendCammandToDaemon failed"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    fake::Reset();
    fake::Get().AddShare("photo", volume + "/photo");
    std::filesystem::remove_all(volume + "/photo/@eaDir");
    std::filesystem::remove(FolderConfPath());
    log.Clear();
    c.arrange(fake::Get());
    std::optional<FakeDaemon> daemon;
    if (c.daemonListens) {
      daemon.emplace();
    }
    EXPECT_EQ(IndexMgr::Upsert(ParseJson(R"([{"path":"/photo/a"}])")), c.result);
    EXPECT_EQ(FolderConf().getMemberNames(), std::vector<std::string>{"/photo/a"});
    EXPECT_EQ(Effects(), c.effects);
    if (daemon) {
      EXPECT_EQ(Frames(*daemon, c.frames).size(), c.frames);
    }
    EXPECT_EQ(Events("photo").size(), c.events);
    const auto lines = log.Lines();
    ASSERT_EQ(lines.size(), c.lines.size());
    for (size_t i = 0; i < lines.size(); ++i) {
      EXPECT_THAT(lines[i], StartsWith(c.lines[i]));
    }
  }
}

TEST_F(IndexOpsTest, TheDaemonIsToldOfASavedListWhileTheLockIsStillHeld) {
  WriteFile(FolderConfPath(), R"({"/video/v":{}})");
  struct Step {
    std::function<bool()> operation;
    std::vector<std::string> saved;
  } steps[] = {
      {[] { return IndexMgr::Upsert(ParseJson(R"([{"path":"/photo/a"}])")); },
       {"/photo/a", "/video/v"}},
      {[] { return IndexMgr::Delete(ParseJson(R"(["/photo/a"])")); }, {"/video/v"}},
  };
  for (const Step& step : steps) {
    FakeDaemon daemon(FakeDaemon::Behaviour::kHoldConnect);
    bool result = false;
    std::thread caller([&] { result = step.operation(); });
    // The caller blocks in connect until the daemon accepts: by then the list must be saved and
    // its lock still held.
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
    while (FolderConf().getMemberNames() != step.saved &&
           std::chrono::steady_clock::now() < deadline) {
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    EXPECT_EQ(FolderConf().getMemberNames(), step.saved);
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    Json::Value folder;
    EXPECT_FALSE(IndexMgr::Get(folder, "/video/v")) << "the lock is held";
    daemon.Release();
    caller.join();
    EXPECT_TRUE(result);
    EXPECT_EQ(daemon.Commands(1).size(), 1U);
    EXPECT_TRUE(IndexMgr::Get(folder, "/video/v"));
  }
}

TEST_F(IndexOpsTest, AnotherWriterHoldingTheListLockMakesChangesFailWithNothingTouched) {
  FakeDaemon daemon;
  WriteFile(FolderConfPath(), R"({"/photo/a":{},"/video/v":{}})");
  const std::string before = ReadFile(FolderConfPath());
  testsupport::LockHolder holder(FolderLockPath(), true);
  ASSERT_TRUE(holder.Holding());
  const std::function<bool()> operations[] = {
      [] { return IndexMgr::Upsert(ParseJson(R"([{"path":"/photo/b"}])")); },
      [] { return IndexMgr::Delete(ParseJson(R"(["/photo/a"])")); },
      [] { return IndexMgr::ShareRemove("photo"); },
      [] { return IndexMgr::ShareRename("photo", "video"); },
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
  EXPECT_EQ(ReadFile(FolderConfPath()), before);
  EXPECT_THAT(Effects(), IsEmpty());
  EXPECT_THAT(daemon.Connections(1, std::chrono::milliseconds(200)), IsEmpty());
  EXPECT_TRUE(IndexMgr::IsPathIndexed("/photo/a")) << "the queries read without the lock";
}

TEST_F(IndexOpsTest, MalformedRequestsAreRefusedWithACodeAndChangeNothing) {
  FakeDaemon daemon;
  WriteFile(FolderConfPath(), R"({"/photo/a":{"photo":true}})");
  const std::string before = ReadFile(FolderConfPath());
  // Each shape is malformed for every operation below; several make jsoncpp throw when a value
  // is read as a type it does not have.
  const char* shapes[] = {
      "{}",
      R"({"path":"/photo/b"})",
      R"("/photo/a")",
      "1",
      "null",
      "true",
      "[1]",
      "[null]",
      "[true]",
      "[[1]]",
      "[{}]",
      R"([{"path":{}}])",
      R"([{"path":1}])",
      R"([{"path":["/photo/b"]}])",
      R"([{"path":"/photo/b"},"/photo/a"])",
      R"(["/photo/a",{"path":"/photo/b"}])",
      R"([{"path":"/photo/b"},[1]])",
      // Paths that name more than one place, or another place than they seem to, are refused
      // like any other malformed element.
      R"(["/photo/../../../../etc"])",
      R"(["/photo/a","/photo/.."])",
      R"([""])",
      R"(["photo/a"])",
      R"(["/photo/./a"])",
      R"(["/photo//a"])",
      R"(["/photo/a/"])",
      R"(["/photo/a\u0000"])",
      R"([{"path":"/photo/b"},{"path":"/photo/x/../../../etc"}])",
      R"([{"path":"/photo/b\u0000"}])",
  };
  const std::pair<const char*, bool (*)(const Json::Value&)> operations[] = {
      {"Upsert", &IndexMgr::Upsert}, {"Set", &IndexMgr::Set},         {"Add", &IndexMgr::Add},
      {"Delete", &IndexMgr::Delete}, {"Reindex", &IndexMgr::Reindex},
  };
  for (const auto& [name, operation] : operations) {
    for (const char* shape : shapes) {
      SCOPED_TRACE(std::string(name) + " " + shape);
      ErrorHandler::SetError(FILEINDEX_ERR_NONE);
      log.Clear();
      bool result = true;
      EXPECT_NO_THROW(result = operation(ParseJson(shape)));
      EXPECT_FALSE(result);
      EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
      EXPECT_THAT(log.Lines(), ::testing::Contains(::testing::AnyOf(
                                   ::testing::HasSubstr("Bad param: "),
                                   ::testing::HasSubstr("Malformed jsArrPath: "))));
      EXPECT_EQ(ReadFile(FolderConfPath()), before);
    }
  }
  // A share name that is empty, or that no share can have, names no share: the folder list
  // would read "" as every share.
  const std::pair<const char*, std::function<bool()>> shareOperations[] = {
      {"ShareRemove", [] { return IndexMgr::ShareRemove(""); }},
      {"ShareRename old", [] { return IndexMgr::ShareRename("", "video"); }},
      {"ShareRename new", [] { return IndexMgr::ShareRename("photo", ""); }},
      {"ShareRename up", [] { return IndexMgr::ShareRename("photo", ".."); }},
      {"SharePause", [] { return IndexMgr::SharePause(""); }},
      {"SharePause NUL", [] { return IndexMgr::SharePause(std::string("photo\0x", 7)); }},
      {"ShareResume", [] { return IndexMgr::ShareResume(""); }},
      {"CleanShareIndexData", [] { return IndexMgr::CleanShareIndexData(""); }},
  };
  for (const auto& [name, operation] : shareOperations) {
    SCOPED_TRACE(name);
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
    EXPECT_FALSE(operation());
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
    EXPECT_THAT(log.Lines(), ElementsAre(StartsWith("index_mgr:N Bad param: ")));
  }
  EXPECT_EQ(ReadFile(FolderConfPath()), before);

  EXPECT_THAT(Effects(), IsEmpty());
  EXPECT_THAT(Events("photo"), IsEmpty());
  EXPECT_THAT(daemon.Connections(1, std::chrono::milliseconds(200)), IsEmpty());
  Json::Value folder;
  EXPECT_TRUE(IndexMgr::Get(folder, "/photo/a")) << "no refusal left the lock held";

  // The configuration classes take the same shapes, and the elements inside them, without
  // throwing.
  for (const char* shape : shapes) {
    const Json::Value request = ParseJson(shape);
    for (const Json::Value& value : {request, request.isArray() ? request[0] : request}) {
      Folders list;
      Folder folder;
      Json::Value out = value;
      EXPECT_NO_THROW({
        list.Upsert(out, value);
        folder.Load("/photo/a", value);
        folder.Reload("/photo/a", value);
        folder.AddToJson(out);
        folder.GetAdditional(out, value);
        folder.asJson(value);
      }) << shape;
    }
  }

  for (const char* additional : {R"("is_valid")", "[1]", "[[1]]", R"({"a":1})"}) {
    Json::Value page;
    EXPECT_NO_THROW(EXPECT_TRUE(IndexMgr::List(page, 0, 10, "", "", ParseJson(additional))));
    EXPECT_EQ(page["folder"][0]["path"], "/photo/a") << additional;
  }
}

TEST_F(IndexOpsTest, DeletingTheLastFolderStopsTheServiceAndCleansTheShare) {
  struct Case {
    const char* name;
    int spotlight;
    bool stopFails;
    std::vector<std::string> services;
    std::vector<std::string> lines;
  } cases[] = {
      {"Spotlight on", 1, false, {"Stop fileindexd", "Spotlight 0", "Restart samba"}, {}},
      {"Spotlight off", 0, false, {"Stop fileindexd"}, {}},
      {"stop fails", 0, true, {"Stop fileindexd"}, {"index_mgr:N WLIBServiceStop failed"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    FakeDaemon daemon;
    fake::Reset();
    fake::Get().AddShare("photo", volume + "/photo");
    fake::Get().spotlight = c.spotlight;
    fake::Get().service_stop_fails = c.stopFails;
    WriteFile(FolderConfPath(), R"({"/photo/a":{"photo":true}})");
    log.Clear();

    ASSERT_TRUE(IndexMgr::Delete(ParseJson(R"(["/photo/a"])")));
    EXPECT_EQ(FolderConf(), Json::Value(Json::objectValue));
    std::vector<std::string> effects = c.services;
    effects.emplace_back("unwatch photo");
    EXPECT_EQ(Effects(), effects);
    EXPECT_TRUE(std::filesystem::is_empty(volume + "/photo/@eaDir")) << "index data removed";
    EXPECT_THAT(daemon.Connections(1, std::chrono::milliseconds(200)), IsEmpty());
    EXPECT_THAT(Events("photo"), IsEmpty());
    ASSERT_EQ(log.Lines().size(), c.lines.size());
    for (size_t i = 0; i < c.lines.size(); ++i) {
      EXPECT_THAT(log.Lines()[i], StartsWith(c.lines[i]));
    }
  }
}

TEST_F(IndexOpsTest, DeletingSomeFoldersTellsTheDaemonAndQueuesTheLastPathOnly) {
  FakeDaemon daemon;
  WriteFile(FolderConfPath(), R"({"/photo/a":{"photo":true},"/photo/b":{"photo":true},
                                  "/photo/c":{},"/video/v":{}})");
  ASSERT_TRUE(IndexMgr::Delete(ParseJson(R"(["/photo/b","/photo/a"])")));
  EXPECT_EQ(FolderConf().getMemberNames(), (std::vector<std::string>{"/photo/c", "/video/v"}));
  EXPECT_THAT(Frames(daemon, 2),
              ElementsAre(R"(delete_folder_setting {"folder_path":"/photo/b"})",
                          R"(delete_folder_setting {"folder_path":"/photo/a"})"));
  EXPECT_THAT(Events("photo"), ElementsAre(std::string("131072 /photo/a ") + kAllChanged));
  EXPECT_THAT(Effects(), ElementsAre("watch photo: /photo/c")) << "re-registered, not cleaned";

  fake::Get().calls.clear();
  ASSERT_TRUE(IndexMgr::Delete(ParseJson(R"(["/photo/c"])")));
  EXPECT_THAT(Effects(), ElementsAre("unwatch photo")) << "video stays indexed: no service stop";
  EXPECT_TRUE(std::filesystem::is_empty(volume + "/photo/@eaDir")) << "index data removed";
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(IndexOpsTest, DeleteFailuresAfterTheSaveAreLoggedInTheirOwnWords) {
  struct Case {
    const char* name;
    std::function<void(fake::Platform&)> arrange;
    const char* request;
    std::vector<std::string> lines;
  } cases[] = {
      {"monitor renewal",
       [](fake::Platform& p) { p.monitor_upsert_fails = true; },
       R"(["/photo/a"])",
       {"index_mgr:N MonitorQueue::Add failed",
        "index_mgr:N UpsertWEZotifydCfg failed, share=photo"}},
      {"monitor removal",
       [](fake::Platform& p) { p.monitor_delete_fails = true; },
       R"(["/video/v"])",
       {"index_mgr:N MonitorQueue::Delete failed",
        "index_mgr:N DeleteWEZtifydCfg failed, share=video"}},
      {"share gone",
       [](fake::Platform& p) { p.shares.erase("video"); },
       R"(["/video/v"])",
       {"utils:N WEZOShareGet failed, name=video, code=3585",
        "index_mgr:N FILEIDXQueuePathGet failed, share=video",
        "index_mgr:N CleanShareIndexData failed, share=video"}},
  };
  FakeDaemon daemon;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    fake::Reset();
    fake::Get().AddShare("photo", volume + "/photo");
    fake::Get().AddShare("video", volume + "/video");
    WriteFile(FolderConfPath(), R"({"/photo/a":{},"/photo/b":{},"/video/v":{}})");
    log.Clear();
    c.arrange(fake::Get());
    EXPECT_FALSE(IndexMgr::Delete(ParseJson(c.request)));
    EXPECT_EQ(FolderConf().size(), 2U) << "no rollback after the save";
    EXPECT_EQ(log.Lines(), c.lines);
  }
}

TEST_F(IndexOpsTest, ReindexQueuesNothingUnlessEveryElementIsAcceptable) {
  WriteFile(FolderConfPath(), R"({"/photo/2016":{}})");
  struct Case {
    const char* request;
    bool result;
    _tag_fileindex_err_ code;
    std::vector<std::string> events;
    std::vector<std::string> lines;
  } cases[] = {
      {"[]", true, FILEINDEX_ERR_NONE, {}, {}},
      {R"("/photo")",
       false,
       FILEINDEX_ERR_BAD_PARAM,
       {},
       {R"(index_mgr:N Malformed jsArrPath: "/photo")"}},
      {R"(["/photo",3])",
       false,
       FILEINDEX_ERR_BAD_PARAM,
       {},
       {"index_mgr:N Malformed jsArrPath: 3"}},
      {R"(["/photo/x","/music/y"])", false, FILEINDEX_ERR_NONE, {}, {}},
      {R"(["/photo/not-indexed","/photo","/photo/...a/.b"])",
       true,
       FILEINDEX_ERR_NONE,
       {"65536 /photo/not-indexed null", "65536 /photo null", "65536 /photo/...a/.b null"},
       {}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.request);
    std::filesystem::remove_all(volume + "/photo/@eaDir");
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
    EXPECT_EQ(IndexMgr::Reindex(ParseJson(c.request)), c.result);
    EXPECT_EQ(ErrorHandler::GetError(), c.code);
    EXPECT_EQ(Events("photo"), c.events);
    EXPECT_EQ(log.Lines(), c.lines);
  }
}

TEST_F(IndexOpsTest, ReindexRevivesSharesOutOfSpaceFirstAndGoesOnWhenThatFails) {
  WriteFile(FolderConfPath(), R"({"/photo/a":{},"/video/v":{}})");
  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("photo", true));
  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("video", true));
  {
    FakeDaemon daemon;
    ASSERT_TRUE(IndexMgr::Reindex(ParseJson(R"(["/video/v","/photo/a","/video/v"])")));
    EXPECT_THAT(Frames(daemon, 2), ElementsAre(R"(revive_share_worker {"share_name":"photo"})",
                                               R"(revive_share_worker {"share_name":"video"})"));
  }
  EXPECT_FALSE(StatusMgr::ShareIsNoSpace("photo"));
  EXPECT_THAT(Events("video"), ElementsAre("65536 /video/v null")) << "the duplicate is dropped";

  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("photo", true));
  std::filesystem::remove_all(volume + "/photo/@eaDir");
  log.Clear();
  ASSERT_TRUE(IndexMgr::Reindex(ParseJson(R"(["/photo/a"])"))) << "no daemon listens";
  EXPECT_THAT(log.Lines(), ElementsAre("status_mgr:N SendCammandToDaemon failed",
                                       "index_mgr:N ShareRevice failed, share=photo"));
  EXPECT_THAT(Events("photo"), ElementsAre("65536 /photo/a null"));
}

TEST_F(IndexOpsTest, UpdateQueuesOneEventWithThePayload) {
  ASSERT_TRUE(IndexMgr::Update("/photo/a.jpg", ParseJson(R"({"k":1})")));
  EXPECT_THAT(Events("photo"), ElementsAre(R"(131072 /photo/a.jpg {"k":1})"));
  EXPECT_FALSE(IndexMgr::Update("/music/a.mp3", Json::Value()));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_THAT(log.Lines(), ElementsAre("index_mgr:N GetFullPath failed, path=/music/a.mp3"));

  const std::string paths[] = {"/photo/../../etc", "", "photo/a", "/photo/a/",
                               std::string("/photo/a\0/../../etc", 19)};
  for (const std::string& path : paths) {
    SCOPED_TRACE(path);
    log.Clear();
    EXPECT_FALSE(IndexMgr::Update(path, Json::Value()));
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
    EXPECT_THAT(log.Lines(), ElementsAre("index_mgr:N Bad param: " + JsonToString(path)));
  }
  EXPECT_EQ(Events("photo").size(), 1U);
}

TEST_F(IndexOpsTest, ShareRemoveAndRenameChangeOnlyTheList) {
  WriteFile(FolderConfPath(), R"({"/photo":{"name":"P","photo":true},"/photo/2019":{"audio":true},
                                  "/photos":{},"/video/v":{}})");
  fake::Get().AddShare("pictures", volume + "/pictures");
  fake::Get().AddShare("photos", volume + "/photos");
  ASSERT_TRUE(IndexMgr::ShareRename("photo", "pictures"));
  EXPECT_EQ(FolderConf().getMemberNames(),
            (std::vector<std::string>{"/photos", "/pictures", "/pictures/2019", "/video/v"}));
  EXPECT_EQ(FolderConf()["/pictures"], ParseJson(R"({"path":"/pictures","name":"P",
      "document":false,"audio":false,"video":false,"photo":true})"));
  EXPECT_EQ(FolderConf()["/pictures/2019"]["audio"], true);
  ASSERT_TRUE(IndexMgr::ShareRename("music", "songs")) << "a share without folders";

  ASSERT_TRUE(IndexMgr::ShareRemove("pictures"));
  EXPECT_EQ(FolderConf().getMemberNames(), (std::vector<std::string>{"/photos", "/video/v"}));
  EXPECT_THAT(Effects(), IsEmpty()) << "no monitor, service or program while folders remain";

  WriteFile(FolderConfPath(), R"({"/video/v":{}})");
  fake::Get().spotlight = 1;
  ASSERT_TRUE(IndexMgr::ShareRemove("video"));
  EXPECT_EQ(FolderConf(), Json::Value(Json::objectValue));
  EXPECT_THAT(Effects(), ElementsAre("Stop fileindexd", "Spotlight 0", "Restart samba"));
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(IndexOpsTest, FoldersStoredByEarlierVersionsAreTakenAsTheyAre) {
  // Earlier versions stored paths that a request may no longer name, such as a trailing slash.
  FakeDaemon daemon;
  std::filesystem::create_directories(volume + "/pictures");
  fake::Get().AddShare("pictures", volume + "/pictures");
  WriteFile(FolderConfPath(), R"({"/photo/a/":{},"/video/v":{}})");
  const struct {
    const char* name;
    std::function<bool()> operation;
    std::vector<std::string> saved;
  } steps[] = {
      {"migration", Updater_hxo60_beta2, {"/photo/a/", "/video/v"}},
      {"change",
       [] { return IndexMgr::Set(ParseJson(R"([{"path":"/photo/a/","name":"A"}])")); },
       {"/photo/a/", "/video/v"}},
      {"update",
       [] { return IndexMgr::Update("/photo/a/", Json::Value()); },
       {"/photo/a/", "/video/v"}},
      {"rename",
       [] { return IndexMgr::ShareRename("photo", "pictures"); },
       {"/pictures/a/", "/video/v"}},
      {"reindex",
       [] { return IndexMgr::Reindex(ParseJson(R"(["/pictures/a/"])")); },
       {"/pictures/a/", "/video/v"}},
      {"delete", [] { return IndexMgr::Delete(ParseJson(R"(["/pictures/a/"])")); }, {"/video/v"}},
  };
  for (const auto& step : steps) {
    SCOPED_TRACE(step.name);
    EXPECT_TRUE(step.operation());
    EXPECT_EQ(FolderConf().getMemberNames(), step.saved);
    if (step.saved[0] == "/pictures/a/") {
      EXPECT_EQ(FolderConf()["/pictures/a/"]["name"], "A");
    }
  }
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(IndexOpsTest, SharePauseStopsTheWorkerFirstAndResumeRegistersFirst) {
  WriteFile(FolderConfPath(), R"({"/photo/a":{}})");
  {
    FakeDaemon daemon;
    ASSERT_TRUE(IndexMgr::ShareResume("photo"));
    ASSERT_TRUE(IndexMgr::SharePause("photo"));
    EXPECT_THAT(Frames(daemon, 2), ElementsAre(R"(revive_share_worker {"share_name":"photo"})",
                                               R"(delete_share_worker {"share_name":"photo"})"));
    EXPECT_THAT(Effects(), ElementsAre("watch photo: /photo/a", "unwatch photo"));
  }
  EXPECT_FALSE(IndexMgr::ShareResume("photo")) << "no daemon listens";
  EXPECT_FALSE(IndexMgr::SharePause("photo"));
  EXPECT_EQ(fake::Get().CallsTo("MonitorQueue::Delete").size(), 1U) << "registration kept";
  EXPECT_THAT(log.Lines(), IsEmpty());

  fake::Get().monitor_upsert_fails = true;
  EXPECT_FALSE(IndexMgr::ShareResume("photo"));
  EXPECT_THAT(log.Lines(), ElementsAre("index_mgr:N MonitorQueue::Add failed",
                                       "index_mgr:N UpsertWEZotifydCfg failed, share=photo"));
}

TEST_F(IndexOpsTest, TheMigrationBringsServicesMonitorAndQueuesInLineWithTheList) {
  ASSERT_TRUE(Updater_hxo60_beta2()) << "a missing list";
  EXPECT_THAT(Effects(), ElementsAre("Stop fileindexd"));
  fake::Get().service_stop_fails = true;
  EXPECT_FALSE(Updater_hxo60_beta2());
  EXPECT_THAT(log.Lines(), ElementsAre(StartsWith("utils:N WLIBServiceStart failed: err=[0x0E01")));

  fake::Reset();
  fake::Get().AddShare("photo", volume + "/photo");
  fake::Get().AddShare("video", volume + "/video");
  fake::Get().spotlight = 1;
  WriteFile(FolderConfPath(), R"({"/video":{},"/photo/b":{},"/photo/a":{}})");
  ASSERT_TRUE(Updater_hxo60_beta2());
  EXPECT_THAT(Effects(), ElementsAre("Start fileindexd", "Spotlight 1",
                                     "watch photo: /photo/a /photo/b", "watch video: /video"));
  EXPECT_THAT(Events("photo"), ElementsAre("65536 /photo/a null", "65536 /photo/b null"));
  EXPECT_THAT(Events("video"), ElementsAre("65536 /video null"));
  ASSERT_TRUE(Updater_hxo60_beta2()) << "a second run";
  EXPECT_EQ(Events("photo").size(), 2U) << "the queued reindex covers the second";

  WriteFile(FolderConfPath(), R"({"":{},"/photo/a":{}})");
  fake::Get().calls.clear();
  log.Clear();
  EXPECT_FALSE(Updater_hxo60_beta2());
  EXPECT_THAT(Effects(), ElementsAre("Start fileindexd", "Spotlight 1"));
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N GetShareNameByPath failed, path=",
                                       "utils:N GetShareNameByPath failed, path="))
      << "once as the list is read, once by the migration";
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
