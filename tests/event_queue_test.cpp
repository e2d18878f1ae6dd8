#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <sstream>
#include <string>

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

TEST_F(EventQueueTest, AnEventThatCannotBeQueuedFlagsItsShareForAFullReindex) {
  const std::string target = volume + "/photo/victim";
  WriteFile(target, "keep");
  struct Case {
    const char* name;
    std::string path;
    void (*arrange)(const std::string& queue, const std::string& target);
    const char* share;
    std::string line;
  } cases[] = {
      {"outside every share", "/elsewhere/x", nullptr, "",
       "utils:N WEZOShareNamePathGet failed, path=/elsewhere/x"},
      {"a symbolic link planted as the queue", folder,
       [](const std::string& q, const std::string& t) { std::filesystem::create_symlink(t, q); },
       "photo", ""},
      {"the metadata directory is missing", volume + "/video/a", nullptr, "video", ""},
  };
  for (const Case& c : cases) {
    std::filesystem::remove(StatusConfPath());
    log.Clear();
    if (c.arrange != nullptr) {
      c.arrange(queue, target);
    }
    if (std::string(c.share) == "video") {
      fake::Get().ea_mkdir_fails = true;
    }
    EXPECT_FALSE(AddCustomEvent(kEventUpdate, c.path, Json::Value())) << c.name;
    fake::Get().ea_mkdir_fails = false;
    Json::Value flagged(Json::objectValue);
    flagged[c.share] = true;
    EXPECT_EQ(StatusFile()["need_reindex"], flagged) << c.name;
    if (!c.line.empty()) {
      EXPECT_THAT(log.Lines(), ElementsAre(c.line)) << c.name;
    }
  }
  EXPECT_EQ(ReadFile(target), "keep");
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
