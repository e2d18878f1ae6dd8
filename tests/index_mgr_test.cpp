#include <atomic>

#include "config/snapshot.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

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
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NONE) << "the queries set no code";

  // A stored path without a share is logged and skipped.
  WriteFile(FolderConfPath(), R"({"":{},"/video/clips":{}})");
  EXPECT_TRUE(IndexMgr::IsShareIndexed("video"));
  EXPECT_FALSE(IndexMgr::IsShareIndexed("photo"));
  EXPECT_THAT(log.Lines(),
              ::testing::Contains("index_mgr:N Failed to get share name from path: ").Times(2));
}

// Kept answers match a fresh load after each kind of change; some cases keep every read.
TEST_F(QueryTest, KeptSnapshotsAnswerAsAFreshLoadAfterEveryChange) {
  // Each file's new text, "-" removed, or "" saved by another writer (/photo/b for /photo/a).
  const std::string unreadableStatus = "config:N Failed to load json from " + StatusConfPath();
  const struct {
    const char *change, *folders, *status;
    bool keepEveryRead;
    std::vector<std::string> log;
  } cases[] = {
      {"saved by another writer", "", "", true, {}},
      {"rewritten at once", R"({"/photo/b":{}})", R"({"no_space":{"photx":true}})", false, {}},
      {"removed", "-", "-", true, {}},
      {"malformed", "[1]", "{", true, {"folders:N Malformed folders: [1]", unreadableStatus}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.change);
    detail::ForgetConfigSnapshots();
    detail::SetSnapshotSettleTime(c.keepEveryRead ? std::chrono::seconds(0)
                                                  : std::chrono::seconds(2));
    WriteFile(FolderConfPath(), R"({"/photo/a":{}})");
    WriteFile(StatusConfPath(), R"({"no_space":{"photo":true}})");
    ASSERT_TRUE(IndexMgr::IsPathIndexed("/photo/a") && StatusMgr::ShareIsNoSpace("photo"));
    if (*c.folders == '\0') {
      Folders list;
      Json::Value report;
      ASSERT_TRUE(list.Lock(true) && list.Load() &&
                  list.Upsert(report, ParseJson(R"({"path":"/photo/b"})")) &&
                  list.Delete(report, "/photo/a") && list.Save());
      list.Unlock();
      Status status;
      ASSERT_TRUE(status.Lock(true) && status.Load() && status.ShareSetNoSpace("photo", false) &&
                  status.Save());
      status.Unlock();
    }
    for (const auto& [file, text] :
         {std::pair{FolderConfPath(), c.folders}, {StatusConfPath(), c.status}}) {
      if (std::string(text) == "-") std::filesystem::remove(file);
      if (*text != '\0' && std::string(text) != "-") WriteFile(file, text);
    }
    for (int ask = 0; ask < 2; ++ask) {  // a failed read fails again, with its line again
      log.Clear();
      ErrorHandler::SetError(FILEINDEX_ERR_NONE);
      Folders fresh;
      std::vector<Folder> folders;
      const bool listed = fresh.Load() && fresh.List(folders);
      Status freshStatus;
      const bool noSpace = freshStatus.Load() && freshStatus.ShareIsNoSpace("photo");
      const _tag_fileindex_err_ code = ErrorHandler::GetError();
      EXPECT_EQ(log.Lines(), c.log);
      log.Clear();
      ErrorHandler::SetError(FILEINDEX_ERR_NONE);
      for (const char* path : {"/photo/a", "/photo/b/x", "/photo"}) {
        EXPECT_EQ(IndexMgr::IsPathIndexed(path), listed && IndexMgr::IsPathIndexed(path, folders))
            << path;
      }
      EXPECT_EQ(IndexMgr::IsPathContainIndexed("/photo"),
                listed && IndexMgr::IsPathContainIndexed("/photo", folders));
      EXPECT_EQ(IndexMgr::IsFullPathIndexed(volume + "/photo/b"),
                listed && IndexMgr::IsFullPathIndexed(volume + "/photo/b", folders));
      EXPECT_EQ(IndexMgr::IsShareIndexed("photo"), listed && !folders.empty());
      Json::Value page;
      Json::Value freshPage;
      const Json::Value none(Json::arrayValue);
      EXPECT_EQ(IndexMgr::List(page, 0, 9, "", "ASC", none), listed);
      if (listed) fresh.List(freshPage, 0, 9, "", "ASC", none);
      EXPECT_EQ(page, listed ? freshPage : Json::Value());
      EXPECT_EQ(StatusMgr::ShareIsNoSpace("photo"), noSpace);
      EXPECT_EQ(ErrorHandler::GetError(), code);
      std::vector<std::string> expected;
      if (!c.log.empty()) {
        expected.assign(7, c.log[0]);  // one read of the list per folder question
        expected.push_back(c.log[1]);
      }
      EXPECT_EQ(log.Lines(), expected);
    }
  }
  detail::SetSnapshotSettleTime(std::chrono::seconds(2));
}

// Two threads ask while a third saves again and again: each answer is one list's, none fails.
TEST_F(QueryTest, ThreadsAskingWhileAnotherSavesSeeOneListOrTheOther) {
  detail::SetSnapshotSettleTime(std::chrono::seconds(0));
  WriteFile(FolderConfPath(), R"({"/photo/a":{}})");
  std::atomic<bool> saving{true};
  std::atomic<int> wrong{0};
  // Both lists hold a folder in photo and none in video; each holds /photo/a or /photo/b.
  const auto ask = [&] {
    while (saving) {
      wrong += !IndexMgr::IsPathContainIndexed("/photo") || IndexMgr::IsShareIndexed("video") ||
               FILEIDXIsPathIndexed("/photo/c/x") == 1 || !IndexMgr::IsShareIndexed("photo");
    }
  };
  std::thread first(ask);
  std::thread second(ask);
  for (int i = 0; i < 60; ++i) {  // the last save adds /photo/a
    Folders list;
    Json::Value report;
    const std::string add = i % 2 != 0 ? "/photo/a" : "/photo/b";
    EXPECT_TRUE(list.Lock(true) && list.Load() &&
                list.Upsert(report, ParseJson(R"({"path":")" + add + "\"}")) &&
                list.Delete(report, i % 2 != 0 ? "/photo/b" : "/photo/a") && list.Save());
    list.Unlock();
  }
  saving = false;
  first.join();
  second.join();
  detail::SetSnapshotSettleTime(std::chrono::seconds(2));
  EXPECT_EQ(wrong, 0);
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_TRUE(IndexMgr::IsPathIndexed("/photo/a/x"));
}

class MonitorRegistrationTest : public testsupport::LibraryTest {
 protected:
  const std::string queue = volume + "/photo/@eaDir/WEZO@file_index_queue";
};

TEST_F(MonitorRegistrationTest, RegistersEveryFolderOfTheShareInListOrderOrNothing) {
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
  EXPECT_THAT(log.Lines(), IsEmpty());
  // A folder that cannot be placed (its share gone once the queue is found) sends nothing.
  WriteFile(FolderConfPath(), R"({"/photo/a":{},"/photo/b":{}})");
  fake::Get().share_get_fails_after = 1;
  EXPECT_FALSE(IndexMgr::UpsertWEZotifydCfg("photo"));
  EXPECT_EQ(fake::Get().CallsTo("MonitorQueue::Upsert").size(), 2U);
  EXPECT_THAT(log.Lines(), ElementsAre("index_mgr:N GetFullPath failed, path=/photo/a"));
}

}  // namespace
}  // namespace WEZO::FILEINDEX
