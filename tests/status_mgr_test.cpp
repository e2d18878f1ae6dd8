#include <climits>
#include <ctime>

#include "status_mgr/progress.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using StatusMgrTest = testsupport::LibraryTest;

TEST_F(StatusMgrTest, PauseAndResumeStoreTheStateThenTellTheDaemon) {
  // Nobody listening: the call fails, the change stays (a missing file loaded as empty).
  EXPECT_FALSE(StatusMgr::Resume());
  EXPECT_EQ(StatusFile(), ParseJson(R"({"resume_time":-1})"));
  EXPECT_FALSE(testsupport::LockHeldElsewhere(StatusLockPath()));
  EXPECT_THAT(log.Lines(), ElementsAre("status_mgr:N SendCammandToDaemon failed"));
  log.Clear();
  FakeDaemon daemon;
  // Refused: negative, or ending past what the daemon can hold.
  const int lastHour = static_cast<int>((INT_MAX - time(nullptr)) / 3600) - 1;
  for (const int hours : {-1, INT_MIN, lastHour + 2, INT_MAX}) {
    EXPECT_FALSE(StatusMgr::Pause(hours)) << hours;
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM) << hours;
  }
  ASSERT_TRUE(StatusMgr::Resume());
  ASSERT_TRUE(StatusMgr::Pause(0));
  EXPECT_EQ(StatusFile(), ParseJson(R"({"resume_time":0})"));
  const long long before = time(nullptr);
  ASSERT_TRUE(StatusMgr::Pause(2));
  const long long end = StatusFile()["resume_time"].asInt64();
  EXPECT_GE(end, before + 7200);
  EXPECT_LE(end, time(nullptr) + 7200);
  EXPECT_TRUE(StatusMgr::Pause(lastHour));
  EXPECT_THAT(daemon.Commands(4),
              ElementsAre(ParseJson(R"({"type":"resume","data":{}})"),
                          ParseJson(R"({"type":"pause","data":{"resume_time":0}})"),
                          ParseJson(R"({"type":"pause","data":{"resume_time":)" +
                                    std::to_string(end) + "}}"),
                          ::testing::_));
  EXPECT_THAT(log.Lines(), IsEmpty());
}

using ProgressTest = testsupport::LibraryTest;

TEST_F(ProgressTest, TheServiceIsFinishedWhenNoIndexableShareHasAQueueFile) {
  for (const char* dir : {"/photo/a", "/photo/ab", "/photo/@eaDir"}) {
    std::filesystem::create_directories(volume + dir);
  }
  WriteFile(FolderConfPath(), R"({"/photo/a":{"name":"a","photo":true}})");
  const std::string queue = volume + "/photo/@eaDir/WEZO@file_index_queue";
  // The queue and its .tmp file as given ("-": none), and status.conf.
  const auto Arrange = [&](const std::string& queueText, const std::string& tmpText,
                           const std::string& status) {
    for (const auto& [path, text] : {std::pair{queue, queueText}, {queue + ".tmp", tmpText}}) {
      std::filesystem::remove(path);
      if (text != "-") WriteFile(path, text);
    }
    WriteFile(StatusConfPath(), status);
  };
  const auto Event = [&](const std::string& path) {
    return R"({"event":2,"path":")" + volume + path + "\"}\n";
  };
  const long long now = time(nullptr);
  const std::string event = Event("/photo/a/x.jpg");
  const struct {
    std::string queue, tmp, status;
    const char* service;  // "" when GetStatus fails
    const char* folder;
  } cases[] = {
      {event, "-", "{}", "processing", "processing"},
      {Event("/photo/ab/x"), "-", "{}", "processing", "finished"},  // a sibling's events
      {Event("/photo/ab"), Event("/photo/a/y"), "{}", "processing", "processing"},
      {event, "-", R"({"resume_time":-1})", "processing", "processing"},
      {event, "-", R"({"resume_time":0})", "paused", "paused"},
      {event, "-", R"({"resume_time":)" + std::to_string(now - 60) + "}", "processing",
       "processing"},
      {event, "-", R"({"resume_time":)" + std::to_string(now + 3600) + "}", "paused", "paused"},
      // An unreadable pause counts as not paused for the folder; the service report fails.
      {event, "-", R"({"resume_time":"soon"})", "", "processing"},
      {"-", "-", R"({"resume_time":0})", "finished", "finished"},
      {"-", "", R"({"resume_time":0})", "paused", "finished"},  // an empty .tmp: pending work
      // No space outranks the pause and an empty queue; the service report ignores the flags.
      {"-", "-", R"({"resume_time":0,"no_space":{"photo":true}})", "finished", "err_no_space"},
  };
  for (const auto& c : cases) {
    Arrange(c.queue, c.tmp, c.status);
    std::string word = "kept";
    EXPECT_EQ(StatusMgr::GetStatus(word), *c.service != '\0') << c.status;
    EXPECT_EQ(word, *c.service != '\0' ? c.service : "kept") << c.status;
    EXPECT_EQ(StatusMgr::GetFolderStatus("/photo/a"), c.folder) << c.status;
    // One read per queue for several folders and shares answers as folder by folder.
    const std::vector<std::string> paths = {"/photo/ab", "/photo/a", "/video/a", "/photo/gone"};
    std::vector<std::string> plain;
    for (const std::string& path : paths) plain.push_back(FolderProgress(path));
    EXPECT_EQ(FoldersProgress(paths), plain) << c.status;
  }
  // A queue reached only through a link planted as the metadata directory is not the share's.
  Arrange(event, "-", R"({"resume_time":0})");
  std::filesystem::rename(volume + "/photo/@eaDir", volume + "/out");
  std::filesystem::create_directory_symlink(volume + "/out", volume + "/photo/@eaDir");
  std::string word;
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished");
  std::filesystem::remove(volume + "/photo/@eaDir");
  std::filesystem::rename(volume + "/out", volume + "/photo/@eaDir");
  // A folder that cannot be indexed does not count.
  std::filesystem::remove(volume + "/photo/a");
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished");
  EXPECT_EQ(StatusMgr::GetFolderStatus("/photo/a"), "paused");
  std::filesystem::remove(FolderConfPath());
  ASSERT_TRUE(StatusMgr::GetStatus(word));
  EXPECT_EQ(word, "finished");
  // A folder under the empty path is placed, and refused, with the lines of a load of the list.
  WriteFile(FolderConfPath(), R"({"":{},"/photo/a":{}})");
  log.Clear();
  EXPECT_FALSE(StatusMgr::GetStatus(word));
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N GetShareNameByPath failed, path=",
                                       "status_mgr:N Failed to get share name from path: "));
}

}  // namespace
}  // namespace WEZO::FILEINDEX
