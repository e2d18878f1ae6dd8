#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>
#include <sys/file.h>
#include <unistd.h>

#include <chrono>
#include <climits>
#include <ctime>
#include <filesystem>
#include <string>
#include <thread>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/status_mgr.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testsupport::FakeDaemon;
using testsupport::ParseJson;
using testsupport::ReadFile;
using testsupport::WriteFile;

class StatusMgrTest : public testsupport::LibraryTest {
 protected:
  // True while some process holds the status lock.
  static bool StatusLockHeld() {
    const int fd = open(StatusLockPath().c_str(), O_RDONLY | O_CLOEXEC);
    const bool held = fd >= 0 && flock(fd, LOCK_EX | LOCK_NB) != 0;
    if (fd >= 0) {
      close(fd);
    }
    return held;
  }
};

TEST_F(StatusMgrTest, PauseAndResumeStoreTheStateThenTellTheDaemon) {
  FakeDaemon daemon;
  ASSERT_TRUE(StatusMgr::Resume()) << "a missing status file loads as empty";
  EXPECT_EQ(StatusFile(), ParseJson(R"({"resume_time":-1})"));

  ASSERT_TRUE(StatusMgr::Pause(0));
  EXPECT_EQ(StatusFile(), ParseJson(R"({"resume_time":0})"));

  const long long before = time(nullptr);
  ASSERT_TRUE(StatusMgr::Pause(2));
  const long long after = time(nullptr);
  const long long end = StatusFile()["resume_time"].asInt64();
  EXPECT_GE(end, before + 7200);
  EXPECT_LE(end, after + 7200);
  long long stored = 0;
  ASSERT_TRUE(StatusMgr::GetPauseInfo(stored));
  EXPECT_EQ(stored, end);

  EXPECT_THAT(daemon.Commands(3),
              ElementsAre(ParseJson(R"({"type":"resume","data":{}})"),
                          ParseJson(R"({"type":"pause","data":{"resume_time":0}})"),
                          ParseJson(R"({"type":"pause","data":{"resume_time":)" +
                                    std::to_string(end) + "}}")));
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(StatusMgrTest, RefusesAPauseThatIsNegativeOrEndsPastWhatTheDaemonCanHold) {
  FakeDaemon daemon;
  const long long now = time(nullptr);
  const int lastHour = static_cast<int>((INT_MAX - now) / 3600) - 1;
  for (const int hours : {-1, INT_MIN, lastHour + 2, INT_MAX}) {
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    EXPECT_FALSE(StatusMgr::Pause(hours)) << hours;
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM) << hours;
  }
  EXPECT_FALSE(std::filesystem::exists(StatusConfPath()));
  EXPECT_TRUE(StatusMgr::Pause(lastHour));
  EXPECT_EQ(daemon.Commands(1).size(), 1U);
}

TEST_F(StatusMgrTest, TheDaemonIsToldAfterTheSaveWhileTheLockIsStillHeld) {
  FakeDaemon daemon(FakeDaemon::Behaviour::kHoldConnect);
  bool paused = false;
  std::thread caller([&] { paused = StatusMgr::Pause(0); });
  // The caller blocks in connect until the daemon accepts; by then the file must say paused and
  // the lock must still be held.
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
  while (ReadFile(StatusConfPath()) == "<missing>" && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  EXPECT_EQ(StatusFile(), ParseJson(R"({"resume_time":0})"));
  for (int i = 0; i < 20; ++i) {
    EXPECT_TRUE(StatusLockHeld());
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  daemon.Release();
  caller.join();
  EXPECT_TRUE(paused);
  EXPECT_EQ(daemon.Commands(1).size(), 1U);
  EXPECT_FALSE(StatusLockHeld());
}

TEST_F(StatusMgrTest, AnUnreachableDaemonFailsTheCallButTheChangeStays) {
  EXPECT_FALSE(StatusMgr::Resume());
  EXPECT_EQ(StatusFile(), ParseJson(R"({"resume_time":-1})"));
  EXPECT_FALSE(StatusMgr::ShareRevive("photo"));
  EXPECT_THAT(log.Lines(), ElementsAre("status_mgr:N SendCammandToDaemon failed",
                                       "status_mgr:N SendCammandToDaemon failed"));
  EXPECT_FALSE(StatusLockHeld());
}

TEST_F(StatusMgrTest, FlagsPersistAndTheAdministratorsHearOfTheFirstNoSpaceOnly) {
  FakeDaemon daemon;
  ASSERT_TRUE(StatusMgr::ShareSetNeedReindex("photo", true));
  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("photo", true));
  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("photo", true));
  EXPECT_EQ(fake::Get().CallsTo("WLIBCExecv").size(), 1U);
  EXPECT_TRUE(StatusMgr::ShareIsNoSpace("photo"));

  ASSERT_TRUE(StatusMgr::ShareRevive("photo"));
  ASSERT_TRUE(StatusMgr::ShareRevive("video")) << "a share that never ran out is revived too";
  EXPECT_FALSE(StatusMgr::ShareIsNoSpace("photo"));
  EXPECT_TRUE(StatusMgr::ShareIsNeedReindex("photo")) << "reviving leaves the reindex pending";
  EXPECT_THAT(
      daemon.Commands(2),
      ElementsAre(ParseJson(R"({"type":"revive_share_worker","data":{"share_name":"photo"}})"),
                  ParseJson(R"({"type":"revive_share_worker","data":{"share_name":"video"}})")));

  ASSERT_TRUE(StatusMgr::ShareSetNoSpace("photo", true));
  EXPECT_EQ(fake::Get().CallsTo("WLIBCExecv").size(), 2U) << "a new transition, a new notice";
}

TEST_F(StatusMgrTest, QueriesAnswerWhileAnotherProcessHoldsTheLockAndChangesGiveUp) {
  WriteFile(StatusConfPath(), R"({"resume_time":0,"need_reindex":{"photo":true},"done":true})");
  testsupport::LockHolder holder(StatusLockPath(), true);
  ASSERT_TRUE(holder.Holding());
  long long resumeTime = -1;
  EXPECT_TRUE(StatusMgr::GetPauseInfo(resumeTime));
  EXPECT_EQ(resumeTime, 0);
  EXPECT_TRUE(StatusMgr::ShareIsNeedReindex("photo"));
  EXPECT_FALSE(StatusMgr::ShareIsNoSpace("photo"));
  EXPECT_TRUE(StatusMgr::IsUpdated("done"));

  EXPECT_FALSE(StatusMgr::SetUpdated("other"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOCK);
  EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to lock folder"));
}

// Progress reports, against the clock and the queue files.
class ProgressTest : public StatusMgrTest {
 protected:
  ProgressTest() : queue(volume + "/photo/@eaDir/WEZO@file_index_queue") {
    std::filesystem::create_directories(volume + "/photo/a");
    std::filesystem::create_directories(volume + "/photo/ab");
    std::filesystem::create_directories(volume + "/photo/@eaDir");
    WriteFile(FolderConfPath(), R"({"/photo/a":{"name":"a","photo":true}})");
  }

  static void SetPause(const std::string& resumeTime) {
    WriteFile(StatusConfPath(),
              resumeTime.empty() ? "{}" : R"({"resume_time":)" + resumeTime + "}");
  }

  static std::string Event(const std::string& path) {
    return R"({"event":2,"path":")" + path + "\"}\n";
  }

  std::string queue;
};

TEST_F(ProgressTest, PendingWorkIsProcessingUnlessPausedUntilResumedOrUntilALaterTime) {
  const long long now = time(nullptr);
  struct Case {
    std::string resumeTime;  // "" for none
    const char* word;
  } cases[] = {
      {"", "processing"},
      {"-1", "processing"},
      {"0", "paused"},
      {std::to_string(now - 60), "processing"},
      {std::to_string(now + 3600), "paused"},
  };
  WriteFile(queue, Event(volume + "/photo/a/x.jpg"));
  for (const Case& c : cases) {
    SetPause(c.resumeTime);
    std::string word;
    ASSERT_TRUE(StatusMgr::GetStatus(word)) << c.resumeTime;
    EXPECT_EQ(word, c.word) << c.resumeTime;
    EXPECT_EQ(StatusMgr::GetFolderStatus("/photo/a"), c.word) << c.resumeTime;
  }
  SetPause(R"("soon")");
  std::string word = "kept";
  EXPECT_FALSE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "kept");
  EXPECT_EQ(StatusMgr::GetFolderStatus("/photo/a"), "processing")
      << "an unreadable pause counts as not paused";
}

TEST_F(ProgressTest, TheServiceIsFinishedWhenNoIndexableShareHasAQueueFile) {
  SetPause("0");
  std::string word;
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished");

  WriteFile(queue + ".tmp", "");
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "paused") << "an empty .tmp file is pending work";

  // A queue reached only through a link planted as the metadata directory is not the share's.
  const std::string metadata = volume + "/photo/@eaDir";
  std::filesystem::rename(metadata, volume + "/out");
  std::filesystem::create_directory_symlink(volume + "/out", metadata);
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished");
  std::filesystem::remove(metadata);
  std::filesystem::rename(volume + "/out", metadata);

  std::filesystem::remove(volume + "/photo/a");
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished") << "a folder that cannot be indexed does not count";
  EXPECT_EQ(StatusMgr::GetFolderStatus("/photo/a"), "paused");

  std::filesystem::remove(FolderConfPath());
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished");
}

TEST_F(ProgressTest, AFolderReportsOnlyTheEventsAtOrBelowIt) {
  struct Case {
    const char* name;
    std::string queueText;
    std::string tmpText;
    const char* word;
  } cases[] = {
      {"no queue", "", "", "finished"},
      {"a sibling's events", Event(volume + "/photo/ab/x"), "", "finished"},
      {"the folder itself", Event(volume + "/photo/a"), "", "processing"},
      {"only in .tmp", Event(volume + "/photo/ab"), Event(volume + "/photo/a/y"), "processing"},
      {"moved away from it",
       R"({"event":256,"path":")" + volume + R"(/video/z","path_old":")" + volume +
           "/photo/a/y\"}\n",
       "", "processing"},
  };
  for (const Case& c : cases) {
    std::filesystem::remove(queue);
    std::filesystem::remove(queue + ".tmp");
    if (!c.queueText.empty()) {
      WriteFile(queue, c.queueText);
    }
    if (!c.tmpText.empty()) {
      WriteFile(queue + ".tmp", c.tmpText);
    }
    EXPECT_EQ(StatusMgr::GetFolderStatus("/photo/a"), c.word) << c.name;
  }

  Folder folder;
  ASSERT_TRUE(folder.Load("/photo/a", ParseJson("{}")));
  Json::Value additional;
  ASSERT_TRUE(folder.GetAdditional(additional, ParseJson(R"(["status","is_valid"])")));
  EXPECT_EQ(additional, ParseJson(R"({"status":"processing","is_valid":true})"));
}

TEST_F(ProgressTest, NoSpaceOutranksThePauseAndAnEmptyQueue) {
  WriteFile(StatusConfPath(), R"({"resume_time":0,"no_space":{"photo":true}})");
  EXPECT_EQ(StatusMgr::GetFolderStatus("/photo/a"), "err_no_space");
  std::string word;
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished") << "the service report ignores the flags";
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
