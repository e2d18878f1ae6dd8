#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <functional>
#include <future>
#include <sstream>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/queue.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testsupport::ParseJson;
using testsupport::ReadFile;
using testsupport::WriteFile;

class EventQueueTest : public testsupport::LibraryTest {
 protected:
  EventQueueTest()
      : folder(volume + "/photo/a"), queue(volume + "/photo/@eaDir/WEZO@file_index_queue") {
    std::filesystem::create_directories(volume + "/photo/@eaDir");
  }

  static std::string Line(int event, const std::string& path, const std::string& data = "null") {
    return R"({"data":)" + data + R"(,"event":)" + std::to_string(event) + R"(,"path":")" + path +
           "\"}\n";
  }

  std::string folder;
  std::string queue;
};

TEST_F(EventQueueTest, AppendsOneCompactLinePerEventToANewFileOfMode0644) {
  const mode_t oldMask = umask(022);
  ASSERT_TRUE(AddCustomEvent(kEventUpdate, folder + "/é x", ParseJson(R"({"k":["v"]})")));
  ASSERT_TRUE(AddCustomEvent(kEventReindex, folder, Json::Value()));
  umask(oldMask);
  EXPECT_EQ(ReadFile(queue),
            Line(kEventUpdate, folder + "/é x", R"({"k":["v"]})") + Line(kEventReindex, folder));
  EXPECT_EQ(testsupport::ModeOf(queue), 0644);
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_FALSE(std::filesystem::exists(StatusConfPath()));
}

TEST_F(EventQueueTest, AQueuedReindexOfExactlyThePathCoversEveryEvent) {
  struct Case {
    const char* name;
    std::string inQueue;
    std::string inTmp;
    int event;
    bool written;
  } cases[] = {
      {"reindex queued", Line(kEventReindex, folder), "", kEventUpdate, false},
      {"reindex queued, same event", Line(kEventReindex, folder), "", kEventReindex, false},
      {"other code behind it", Line(kEventReindex, folder), "", 2, false},
      {"only in the .tmp file", "", Line(kEventReindex, folder), kEventUpdate, false},
      {"trailing slash differs", Line(kEventReindex, folder + "/"), "", kEventUpdate, true},
      {"an update does not cover", Line(kEventUpdate, folder), "", kEventUpdate, true},
      {"a parent's reindex does not", Line(kEventReindex, volume + "/photo"), "", kEventUpdate,
       true},
  };
  for (const Case& c : cases) {
    WriteFile(queue, c.inQueue);
    WriteFile(queue + ".tmp", c.inTmp);
    ASSERT_TRUE(AddCustomEvent(c.event, folder, Json::Value())) << c.name;
    EXPECT_EQ(ReadFile(queue), c.inQueue + (c.written ? Line(c.event, folder) : "")) << c.name;
    EXPECT_EQ(ReadFile(queue + ".tmp"), c.inTmp) << c.name;
  }
}

TEST_F(EventQueueTest, LinesOfWritersInSeveralProcessesNeverInterleave) {
  constexpr int kWriters = 4;
  constexpr int kEvents = 150;
  const std::string payload(3000, 'x');  // several pages per line
  pid_t children[kWriters];
  for (int w = 0; w < kWriters; ++w) {
    children[w] = fork();
    ASSERT_GE(children[w], 0);
    if (children[w] == 0) {
      for (int i = 0; i < kEvents; ++i) {
        AddCustomEvent(kEventUpdate, folder + "/" + std::to_string(w), Json::Value(payload));
      }
      _exit(0);
    }
  }
  for (const pid_t child : children) {
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
  }
  std::istringstream lines(ReadFile(queue));
  int count = 0;
  for (std::string line; std::getline(lines, line); ++count) {
    const Json::Value event = ParseJson(line);
    EXPECT_EQ(event["data"].asString(), payload);
  }
  // A writer that finds the queue busy three times running drops its event, so some may be
  // missing; none may be torn.
  EXPECT_GT(count, 0);
  EXPECT_LE(count, kWriters * kEvents);
}

TEST_F(EventQueueTest, AQueueKeptLockedByAnotherProcessDropsTheEventAndSucceeds) {
  WriteFile(queue, Line(kEventUpdate, folder + "/b"));
  testsupport::LockHolder holder(queue, true);
  ASSERT_TRUE(holder.Holding());
  LOG_LEVEL = 7;
  EXPECT_TRUE(AddCustomEvent(kEventUpdate, folder, Json::Value()));
  EXPECT_EQ(ReadFile(queue), Line(kEventUpdate, folder + "/b"));
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N try lock too many times, path=" + queue +
                                       ", reason=Resource temporarily unavailable"));
  EXPECT_FALSE(std::filesystem::exists(StatusConfPath())) << "nothing flagged";
}

// AddCustomEvent on a thread, waited for at most 5 s. A call still blocked then fails the test;
// opening the queue for reading releases a writer stuck on a FIFO, so the thread can end.
bool AddWithinBound(const std::string& path, const std::string& queue) {
  std::packaged_task<bool()> task(
      [&] { return AddCustomEvent(kEventUpdate, path, Json::Value()); });
  std::future<bool> done = task.get_future();
  std::thread thread(std::move(task));
  if (done.wait_for(std::chrono::seconds(5)) != std::future_status::ready) {
    ADD_FAILURE() << "still blocked after 5 s";
    const int reader = open(queue.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    thread.join();
    close(reader);
  } else {
    thread.join();
  }
  return done.get();
}

TEST_F(EventQueueTest, AnEventThatCannotBeQueuedFlagsItsShareForAFullReindex) {
  const std::string target = volume + "/photo/victim";
  WriteFile(target, "keep");
  int reader = -1;
  const std::string video = volume + "/video/@eaDir/WEZO@file_index_queue";
  const std::string refused = "utils:N Failed to open queue=" + queue + ", reason=";
  struct Case {
    const char* name;
    std::string path;
    std::function<void()> arrange;
    const char* share;
    std::vector<std::string> lines;
  } cases[] = {
      {"outside every share",
       "/elsewhere/x",
       [] {},
       "",
       {"utils:N WEZOShareNamePathGet failed, path=/elsewhere/x"}},
      {"a symbolic link planted as the queue",
       folder,
       [&] { std::filesystem::create_symlink(target, queue); },
       "photo",
       {refused + "Too many levels of symbolic links"}},
      {"the metadata directory is missing",
       volume + "/video/a",
       [] { fake::Get().ea_mkdir_fails = true; },
       "video",
       {"utils:N WEZOEAMKDir failed, path=" + volume + "/video/@eaDir, code=3585",
        "utils:N Failed to open queue=" + video + ", reason=No such file or directory"}},
      {"a FIFO that nobody reads",
       folder,
       [&] { mkfifo(queue.c_str(), 0644); },
       "photo",
       {refused + "No such device or address"}},
      {"a FIFO with a reader",
       folder,
       [&] {
         mkfifo(queue.c_str(), 0644);
         reader = open(queue.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
       },
       "photo",
       {refused + "No such device or address"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::filesystem::remove(StatusConfPath());
    std::filesystem::remove(queue);
    log.Clear();
    c.arrange();
    EXPECT_FALSE(AddWithinBound(c.path, queue));
    fake::Get().ea_mkdir_fails = false;
    if (reader >= 0) {
      close(std::exchange(reader, -1));
    }
    Json::Value flagged(Json::objectValue);
    flagged[c.share] = true;
    EXPECT_EQ(StatusFile()["need_reindex"], flagged);
    EXPECT_EQ(log.Lines(), c.lines);
  }
  EXPECT_EQ(ReadFile(target), "keep");
}

TEST_F(EventQueueTest, TheQueueStaysLineAlignedWhenAWriteFallsShort) {
  const std::string line = Line(kEventUpdate, folder);
  // Long enough that the status file, written by the same process, stays below the limit.
  const std::string whole = std::string(4000, 'x') + "\n";
  struct Case {
    const char* name;
    std::string before;
    rlim_t sizeLimit;  // 0: none
    bool result;
    std::string after;
  } cases[] = {
      {"another writer's partial line is ended first", R"({"event":655)", 0, true,
       std::string(R"({"event":655)") + "\n" + line},
      {"a short write is cut off again and flags the share", whole, whole.size() + line.size() / 2,
       false, whole},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::filesystem::remove(StatusConfPath());
    WriteFile(queue, c.before);
    // The size limit binds the writing process, so the write runs in a child.
    const pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
      (void)signal(SIGXFSZ, SIG_IGN);
      const rlimit limit{c.sizeLimit, c.sizeLimit};
      if (c.sizeLimit != 0 && setrlimit(RLIMIT_FSIZE, &limit) != 0) {
        _exit(2);
      }
      _exit(AddCustomEvent(kEventUpdate, folder, Json::Value()) ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), c.result ? 0 : 1);
    EXPECT_EQ(ReadFile(queue), c.after);
    EXPECT_EQ(std::filesystem::exists(StatusConfPath()), !c.result);
    if (!c.result) {
      EXPECT_EQ(StatusFile()["need_reindex"], ParseJson(R"({"photo":true})"));
    }
  }
}

TEST_F(EventQueueTest, AFlagThatCannotBeSetIsLogged) {
  testsupport::LockHolder holder(StatusLockPath(), true);
  ASSERT_TRUE(holder.Holding());
  EXPECT_FALSE(AddCustomEvent(kEventUpdate, "/elsewhere/x", Json::Value()));
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N WEZOShareNamePathGet failed, path=/elsewhere/x",
                                       "config:N Failed to lock folder",
                                       "utils:N ShareSetNeedReindex failed, share="));
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
