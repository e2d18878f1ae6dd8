#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include <filesystem>
#include <string>

#include "fake_platform.h"
#include "fileindex/index_mgr.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testsupport::ParseJson;

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
