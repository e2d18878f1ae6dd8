#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include <filesystem>
#include <string>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/fileindex_c.h"
#include "fileindex/index_mgr.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using testsupport::ParseJson;
using testsupport::WriteFile;

using QueryTest = testsupport::LibraryTest;

TEST_F(QueryTest, MembershipHasASlashBoundaryAndNoOtherNormalisation) {
  // The share of "/gone" no longer exists: the folder has no full path and holds none.
  WriteFile(FolderConfPath(), R"({"/gone":{},"/photo":{},"/video/clips":{"video":true}})");
  const struct {
    const char* path;
    bool indexed;   // IsPathIndexed, and IsFullPathIndexed of the path on the volume
    bool contains;  // IsPathContainIndexed
  } cases[] = {
      {"/photo", true, true},
      {"/photo/2016/a.jpg", true, false},
      {"/photos", false, false},
      {"/photo/", true, false},
      {"/Photo", false, false},
      {"/video", false, true},
      {"/video/clips", true, true},
      {"/video/clips/x", true, false},
      {"/video/clip", false, false},
      {"/", false, false},
      {"", false, true},
  };
  std::vector<Folder> folders;
  ASSERT_TRUE(IndexMgr::List(folders));
  for (const auto& c : cases) {
    SCOPED_TRACE(c.path);
    EXPECT_EQ(IndexMgr::IsPathIndexed(c.path), c.indexed);
    EXPECT_EQ(IndexMgr::IsPathIndexed(c.path, folders), c.indexed);
    EXPECT_EQ(IndexMgr::IsFullPathIndexed(volume + c.path), c.indexed && *c.path != '\0');
    EXPECT_EQ(IndexMgr::IsFullPathIndexed(volume + c.path, folders), c.indexed && *c.path != '\0');
    EXPECT_EQ(IndexMgr::IsPathContainIndexed(c.path), c.contains);
    EXPECT_EQ(IndexMgr::IsPathContainIndexed(c.path, folders), c.contains);
    // The C interface answers the same.
    EXPECT_EQ(FILEIDXIsPathIndexed(c.path), c.indexed ? 1 : 0);
    EXPECT_EQ(FILEIDXIsFullPathIndexed((volume + c.path).c_str()), c.indexed && *c.path != '\0');
  }
  EXPECT_FALSE(IndexMgr::IsFullPathIndexed("/photo")) << "a share path is not a full path";
  EXPECT_TRUE(IndexMgr::IsShareIndexed("video"));
  EXPECT_EQ(FILEIDXIsShareIndexed("video"), 1);
  for (const char* share : {"vid", "/video", "", "Video"}) {
    EXPECT_FALSE(IndexMgr::IsShareIndexed(share)) << share;
    EXPECT_EQ(FILEIDXIsShareIndexed(share), 0) << share;
  }
  EXPECT_EQ(FILEIDXIsPathIndexed(nullptr) + FILEIDXIsFullPathIndexed(nullptr) +
                FILEIDXIsShareIndexed(nullptr),
            0);
  EXPECT_THAT(log.Lines(), ::testing::IsEmpty());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NONE) << "the queries set no code";

  // A stored path without a share is logged and skipped.
  WriteFile(FolderConfPath(), R"({"":{},"/video/clips":{}})");
  EXPECT_TRUE(IndexMgr::IsShareIndexed("video"));
  EXPECT_FALSE(IndexMgr::IsShareIndexed("photo"));
  EXPECT_THAT(log.Lines(),
              ::testing::Contains("index_mgr:N Failed to get share name from path: ").Times(2));
  // A list that cannot be read answers no to every question.
  for (const char* text : {"{}", "[1]", "{"}) {
    WriteFile(FolderConfPath(), text);
    EXPECT_EQ(IndexMgr::List(folders), std::string(text) == "{}") << text;
    EXPECT_FALSE(IndexMgr::IsPathIndexed("/photo") || IndexMgr::IsPathContainIndexed("") ||
                 IndexMgr::IsFullPathIndexed(volume + "/photo") ||
                 IndexMgr::IsShareIndexed("photo"))
        << text;
  }
}

class MonitorRegistrationTest : public testsupport::LibraryTest {
 protected:
  MonitorRegistrationTest() { std::filesystem::create_directories(volume + "/photo"); }
  const std::string queue = volume + "/photo/@eaDir/WEZO@file_index_queue";
};

TEST_F(MonitorRegistrationTest, RegistersEveryFolderOfTheShareInListOrderAndDeletesTheShare) {
  WriteFile(FolderConfPath(), R"({"/photo/b":{"photo":true},"/photo/a":{},"/video/c":{}})");
  ASSERT_TRUE(IndexMgr::UpsertWEZotifydCfg("photo"));
  Json::Value expected = ParseJson(R"({"config":[]})");
  expected["queue"] = queue;
  for (const char* folder : {"/photo/a", "/photo/b"}) {
    expected["config"].append(
        ParseJson(R"({"path":")" + volume + folder + R"(","mask":65486,"ignore":["@eaDir"]})"));
  }
  EXPECT_EQ(fake::Get().monitor["fileindex"][queue], expected);
  EXPECT_THAT(fake::Get().CallsTo("MonitorQueue::Upsert")[0].args,
              ElementsAre(::testing::_, "fileindex", "1"));
  EXPECT_EQ(fake::Get().openShareRecords, 0);
  WriteFile(FolderConfPath(), R"({"/video/c":{}})");
  ASSERT_TRUE(IndexMgr::UpsertWEZotifydCfg("photo"));
  EXPECT_EQ(fake::Get().monitor["fileindex"][queue]["config"], Json::Value(Json::arrayValue))
      << "a share without folders is registered with none";

  ASSERT_TRUE(IndexMgr::DeleteWEZotifydCfg("photo"));
  EXPECT_EQ(fake::Get().monitor["fileindex"].count(queue), 0U);
  EXPECT_THAT(fake::Get().CallsTo("MonitorQueue::Delete")[0].args,
              ElementsAre(queue, "fileindex", "1"));
  fake::Get().monitor_delete_fails = true;
  EXPECT_FALSE(IndexMgr::DeleteWEZotifydCfg("photo"));
  EXPECT_FALSE(IndexMgr::DeleteWEZotifydCfg("nosuch"));
  EXPECT_THAT(log.Lines(), ElementsAre("index_mgr:N MonitorQueue::Delete failed",
                                       "utils:N WEZOShareGet failed, name=nosuch, code=3585",
                                       "index_mgr:N FILEIDXQueuePathGet failed, share=nosuch"));
}

TEST_F(MonitorRegistrationTest, NothingReachesTheMonitorWhenAFolderOrTheQueueCannotBePlaced) {
  WriteFile(FolderConfPath(), R"({"/photo/a":{},"/photo/b":{}})");
  const std::pair<void (*)(fake::Platform&), std::vector<std::string>> cases[] = {
      // The share is gone once its queue is found.
      {[](fake::Platform& p) { p.share_get_fails_after = 1; },
       {"index_mgr:N GetFullPath failed, path=/photo/a"}},
      {[](fake::Platform& p) { p.shares.erase("photo"); },
       {"utils:N WEZOShareGet failed, name=photo, code=3585",
        "index_mgr:N FILEIDXQueuePathGet failed, share=photo"}},
      {[](fake::Platform& p) { p.monitor_upsert_fails = true; },
       {"index_mgr:N MonitorQueue::Add failed"}},
  };
  for (const auto& [arrange, lines] : cases) {
    fake::Reset();
    fake::Get().AddShare("photo", volume + "/photo");
    fake::Get().monitor["fileindex"][queue] = "previous";
    log.Clear();
    arrange(fake::Get());
    EXPECT_FALSE(IndexMgr::UpsertWEZotifydCfg("photo")) << lines[0];
    EXPECT_EQ(fake::Get().monitor["fileindex"][queue], "previous") << lines[0];
    EXPECT_EQ(log.Lines(), lines);
  }
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
