#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include <filesystem>
#include <string>

#include "c_queries_check.h"
#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/index_mgr.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testsupport::ParseJson;

class QueryTest : public testsupport::LibraryTest {
 protected:
  QueryTest() {
    testsupport::WriteFile(FolderConfPath(), R"({"/photo":{},"/video/clips":{"video":true}})");
  }
};

TEST_F(QueryTest, MembershipHasASlashBoundaryAndNoOtherNormalisation) {
  // The share of "/gone" no longer exists: the folder has no full path and holds none.
  testsupport::WriteFile(FolderConfPath(),
                         R"({"/gone":{},"/photo":{},"/video/clips":{"video":true}})");
  struct Case {
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
  for (const Case& c : cases) {
    SCOPED_TRACE(c.path);
    EXPECT_EQ(IndexMgr::IsPathIndexed(c.path), c.indexed);
    EXPECT_EQ(IndexMgr::IsPathIndexed(c.path, folders), c.indexed);
    EXPECT_EQ(IndexMgr::IsFullPathIndexed(volume + c.path), c.indexed && *c.path != '\0');
    EXPECT_EQ(IndexMgr::IsFullPathIndexed(volume + c.path, folders), c.indexed && *c.path != '\0');
    EXPECT_EQ(IndexMgr::IsPathContainIndexed(c.path), c.contains);
    EXPECT_EQ(IndexMgr::IsPathContainIndexed(c.path, folders), c.contains);
  }
  EXPECT_FALSE(IndexMgr::IsFullPathIndexed("/photo")) << "a share path is not a full path";
  EXPECT_FALSE(IndexMgr::IsFullPathIndexed("/etc/passwd"));
  EXPECT_TRUE(IndexMgr::IsShareIndexed("video"));
  for (const char* share : {"vid", "/video", "", "Video"}) {
    EXPECT_FALSE(IndexMgr::IsShareIndexed(share)) << share;
  }
  EXPECT_EQ(CheckCQueries(volume.c_str()), 0) << "the C interface answers the same";
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NONE) << "the queries set no code";
}

TEST_F(QueryTest, AListThatCannotBeReadAnswersNoToEveryQuestion) {
  for (const char* text : {"{}", "[1]", "{"}) {
    SCOPED_TRACE(text);
    testsupport::WriteFile(FolderConfPath(), text);
    std::vector<Folder> folders;
    EXPECT_EQ(IndexMgr::List(folders), std::string(text) == "{}");
    EXPECT_FALSE(IndexMgr::IsPathIndexed("/photo"));
    EXPECT_FALSE(IndexMgr::IsFullPathIndexed(volume + "/photo"));
    EXPECT_FALSE(IndexMgr::IsPathContainIndexed(""));
    EXPECT_FALSE(IndexMgr::IsShareIndexed("photo"));
  }
}

TEST_F(QueryTest, AStoredPathWithoutAShareIsLoggedAndSkipped) {
  testsupport::WriteFile(FolderConfPath(), R"({"":{},"/video/clips":{}})");
  log.Clear();
  EXPECT_TRUE(IndexMgr::IsShareIndexed("video"));
  EXPECT_FALSE(IndexMgr::IsShareIndexed("photo"));
  EXPECT_THAT(log.Lines(),
              ::testing::Contains("index_mgr:N Failed to get share name from path: ").Times(2));
}

TEST_F(QueryTest, ListPagesAndGetReadsOneFolder) {
  Json::Value page;
  ASSERT_TRUE(IndexMgr::List(page, 1, 5, "name", "ASC", ParseJson(R"(["is_valid"])")));
  EXPECT_EQ(page["total"].asInt(), 2);
  ASSERT_EQ(page["folder"].size(), 1U);
  EXPECT_EQ(page["folder"][0]["path"], "/video/clips");
  EXPECT_TRUE(page["folder"][0]["additional"].isMember("is_valid"));

  Json::Value folder;
  ASSERT_TRUE(IndexMgr::Get(folder, "/video/clips"));
  EXPECT_EQ(folder["video"], true);
  EXPECT_FALSE(IndexMgr::Get(folder, "/video"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NO_SUCH_FOLDER);
}

class MonitorRegistrationTest : public testsupport::LibraryTest {
 protected:
  MonitorRegistrationTest() : queue(volume + "/photo/@eaDir/WEZO@file_index_queue") {
    std::filesystem::create_directories(volume + "/photo");
    testsupport::WriteFile(FolderConfPath(), R"({"/photo/b":{"photo":true},"/photo/a":{},
                                                 "/video/c":{"video":true}})");
  }

  Json::Value Dir(const std::string& path) const {
    return ParseJson(R"({"path":")" + volume + path + R"(","mask":65486,"ignore":["@eaDir"]})");
  }

  std::string queue;
};

TEST_F(MonitorRegistrationTest, RegistersEveryFolderOfTheShareInListOrder) {
  ASSERT_TRUE(IndexMgr::UpsertWEZotifydCfg("photo"));
  Json::Value expected(Json::objectValue);
  expected["queue"] = queue;
  expected["config"].append(Dir("/photo/a"));
  expected["config"].append(Dir("/photo/b"));
  EXPECT_EQ(fake::Get().monitor["fileindex"][queue], expected);
  const auto upserts = fake::Get().CallsTo("MonitorQueue::Upsert");
  ASSERT_EQ(upserts.size(), 1U);
  EXPECT_THAT(upserts[0].args, ElementsAre(::testing::_, "fileindex", "1"));
  EXPECT_EQ(fake::Get().openShareRecords, 0);

  testsupport::WriteFile(FolderConfPath(), R"({"/video/c":{}})");
  ASSERT_TRUE(IndexMgr::UpsertWEZotifydCfg("photo"));
  EXPECT_EQ(fake::Get().monitor["fileindex"][queue]["config"], Json::Value(Json::arrayValue))
      << "a share without folders is registered with none";
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(MonitorRegistrationTest, NothingReachesTheMonitorWhenAFolderOrTheQueueCannotBePlaced) {
  testsupport::WriteFile(FolderConfPath(), R"({"/photo/a":{},"/photo/b":{}})");
  struct Case {
    const char* name;
    void (*arrange)(fake::Platform&);
    std::vector<std::string> lines;
  } cases[] = {
      {"the share is gone once its queue is found",
       [](fake::Platform& p) { p.share_get_fails_after = 1; },
       {"index_mgr:N GetFullPath failed, path=/photo/a"}},
      {"unknown share",
       [](fake::Platform& p) { p.shares.erase("photo"); },
       {"utils:N WEZOShareGet failed, name=photo, code=3585",
        "index_mgr:N FILEIDXQueuePathGet failed, share=photo"}},
      {"monitor refuses",
       [](fake::Platform& p) { p.monitor_upsert_fails = true; },
       {"index_mgr:N MonitorQueue::Add failed"}},
  };
  for (const Case& c : cases) {
    fake::Reset();
    fake::Get().AddShare("photo", volume + "/photo");
    fake::Get().monitor["fileindex"][queue] = "previous";
    log.Clear();
    c.arrange(fake::Get());
    EXPECT_FALSE(IndexMgr::UpsertWEZotifydCfg("photo")) << c.name;
    EXPECT_EQ(fake::Get().monitor["fileindex"][queue], "previous") << c.name;
    EXPECT_EQ(log.Lines(), c.lines) << c.name;
  }
}

TEST_F(MonitorRegistrationTest, DeleteRemovesTheShareRegistration) {
  ASSERT_TRUE(IndexMgr::UpsertWEZotifydCfg("photo"));
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

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
