#include <sys/resource.h>
#include <sys/wait.h>

#include <csignal>
#include <future>

#include "fileindex/error.h"
#include "fileindex/queue.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

class EventQueueTest : public testsupport::LibraryTest {
 protected:
  EventQueueTest() { std::filesystem::create_directories(volume + "/photo/@eaDir"); }

  static std::string Line(int event, const std::string& path, const std::string& data = "null") {
    return R"({"data":)" + data + R"(,"event":)" + std::to_string(event) + R"(,"path":")" + path +
           "\"}\n";
  }
  // Runs `add` in a child (under a file size limit if set); Exit() gives 0 when it returned true.
  static pid_t Spawn(const std::function<bool()>& add, rlim_t sizeLimit = 0) {
    const pid_t child = fork();
    if (child == 0) {
      (void)signal(SIGXFSZ, SIG_IGN);
      const rlimit limit{sizeLimit, sizeLimit};
      _exit(sizeLimit != 0 && setrlimit(RLIMIT_FSIZE, &limit) != 0 ? 2 : add() ? 0 : 1);
    }
    return child;
  }
  static int Exit(pid_t child) {
    int status = -1;
    return child > 0 && waitpid(child, &status, 0) == child && WIFEXITED(status)
               ? WEXITSTATUS(status)
               : -1;
  }

  std::string folder = volume + "/photo/a";
  std::string queue = volume + "/photo/@eaDir/WEZO@file_index_queue";
};

TEST_F(EventQueueTest, AppendsOneCompactLinePerEventToANewFileOfMode0644) {
  const mode_t oldMask = umask(022);
  ASSERT_TRUE(AddCustomEvent(kEventUpdate, folder + "/é x", ParseJson(R"({"k":["v"]})")));
  ASSERT_TRUE(AddCustomEvent(kEventReindex, folder, Json::Value()));
  // The process read the queue before; it must still see the reindex it just appended.
  ASSERT_TRUE(AddCustomEvent(kEventUpdate, folder, Json::Value()));
  umask(oldMask);
  EXPECT_EQ(ReadFile(queue),
            Line(kEventUpdate, folder + "/é x", R"({"k":["v"]})") + Line(kEventReindex, folder));
  EXPECT_EQ(testsupport::ModeOf(queue), 0644);
  EXPECT_TRUE(log.Lines().empty());
  EXPECT_FALSE(std::filesystem::exists(StatusConfPath()));
}

// Only a reindex of exactly the path, in the queue itself, makes a new event redundant.
TEST_F(EventQueueTest, AQueuedReindexOfExactlyThePathCoversEveryEvent) {
  const struct {
    std::string inQueue, inTmp;
    int event;
  } cases[] = {{Line(kEventReindex, folder), "", 2},
               {"", Line(kEventReindex, folder), kEventUpdate},
               {Line(kEventReindex, folder + "/"), "", kEventUpdate},
               {Line(kEventUpdate, folder), "", kEventUpdate},
               {Line(kEventReindex, volume + "/photo"), "", kEventUpdate}};
  for (const auto& c : cases) {
    WriteFile(queue, c.inQueue);
    WriteFile(queue + ".tmp", c.inTmp);
    ASSERT_TRUE(AddCustomEvent(c.event, folder, Json::Value()));
    const bool covered = &c - cases < 2;
    EXPECT_EQ(ReadFile(queue), c.inQueue + (covered ? "" : Line(c.event, folder))) << c.inQueue;
    EXPECT_EQ(ReadFile(queue + ".tmp"), c.inTmp);
  }
}

// A writer finding the queue busy three times drops its event: lines may be missing, never torn.
TEST_F(EventQueueTest, LinesOfWritersInSeveralProcessesNeverInterleave) {
  const std::string payload(3000, 'x');  // several pages per line
  std::vector<pid_t> writers;
  writers.reserve(4);
  for (int w = 0; w < 4; ++w) {
    writers.push_back(Spawn([&] {
      for (int i = 0; i < 150; ++i) AddCustomEvent(kEventUpdate, folder, Json::Value(payload));
      return true;
    }));
  }
  for (const pid_t writer : writers) ASSERT_EQ(Exit(writer), 0);
  std::istringstream lines(ReadFile(queue));
  int count = 0;
  for (std::string line; std::getline(lines, line); ++count) {
    EXPECT_EQ(ParseJson(line)["data"].asString(), payload);
  }
  EXPECT_GT(count, 0);
}

TEST_F(EventQueueTest, AnEventThatCannotBeQueuedFlagsItsShareForAFullReindex) {
  const std::string target = volume + "/photo/victim";
  WriteFile(target, "keep");
  const std::string refused = "utils:N Failed to open queue=" + queue + ", reason=";
  const std::string noDir = volume + "/video/@eaDir";
  const struct {
    std::string what;  // outside every share; a link or a FIFO as the queue; no metadata folder
    std::string path;
    const char* share;
    std::vector<std::string> lines;
  } cases[] = {
      {"outside", "/elsewhere/x", "", {"utils:N WEZOShareNamePathGet failed, path=/elsewhere/x"}},
      {"link", folder, "photo", {refused + "Too many levels of symbolic links"}},
      {"fifo", folder, "photo", {refused + "No such device or address"}},
      {"no metadata folder",
       volume + "/video/a",
       "video",
       {"utils:N WEZOEAMKDir failed, path=" + noDir + ", code=3585",
        "utils:N Failed to open queue=" + noDir +
            "/WEZO@file_index_queue, reason=No such file or directory"}}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    std::filesystem::remove(StatusConfPath());
    std::filesystem::remove(queue);
    log.Clear();
    if (c.what == "link") std::filesystem::create_symlink(target, queue);
    if (c.what == "fifo") mkfifo(queue.c_str(), 0644);
    fake::Get().ea_mkdir_fails = c.what == "no metadata folder";
    // Bounded: opening the queue for reading releases a writer stuck on a FIFO.
    std::future<bool> added = std::async(
        std::launch::async, [&] { return AddCustomEvent(kEventUpdate, c.path, Json::Value()); });
    if (added.wait_for(std::chrono::seconds(5)) != std::future_status::ready) {
      ADD_FAILURE() << "still blocked after 5 s";
      close(open(queue.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    }
    EXPECT_FALSE(added.get());
    Json::Value flagged(Json::objectValue);
    flagged[c.share] = true;
    EXPECT_EQ(StatusFile()["need_reindex"], flagged);
    EXPECT_EQ(log.Lines(), c.lines);
  }
  EXPECT_EQ(ReadFile(target), "keep");
}

TEST_F(EventQueueTest, TheQueueStaysLineAlignedWhenAWriteFallsShort) {
  const std::string line = Line(kEventUpdate, folder);
  const auto add = [&] { return AddCustomEvent(kEventUpdate, folder, Json::Value()); };
  WriteFile(queue, "{\"event\":655");  // another writer's partial line is ended first
  EXPECT_EQ(Exit(Spawn(add)), 0);
  EXPECT_EQ(ReadFile(queue), "{\"event\":655\n" + line);
  EXPECT_FALSE(std::filesystem::exists(StatusConfPath()));

  // A short write is cut off again and flags the share (status.conf stays below the limit).
  const std::string whole = std::string(4000, 'x') + "\n";
  WriteFile(queue, whole);
  EXPECT_EQ(Exit(Spawn(add, whole.size() + line.size() / 2)), 1);
  EXPECT_EQ(ReadFile(queue), whole);
  EXPECT_EQ(StatusFile()["need_reindex"], ParseJson(R"({"photo":true})"));
}

// Another process's lock on the queue drops the event (the call succeeds); one on status.conf
// keeps the share from being flagged, which is logged.
TEST_F(EventQueueTest, LocksHeldElsewhereDropTheEventOrTheFlag) {
  WriteFile(queue, Line(kEventUpdate, folder + "/b"));
  {
    testsupport::LockHolder holder(queue, true);
    LOG_LEVEL = 7;
    EXPECT_TRUE(AddCustomEvent(kEventUpdate, folder, Json::Value()));
  }
  EXPECT_EQ(ReadFile(queue), Line(kEventUpdate, folder + "/b"));
  EXPECT_FALSE(std::filesystem::exists(StatusConfPath()));
  testsupport::LockHolder holder(StatusLockPath(), true);
  EXPECT_FALSE(AddCustomEvent(kEventUpdate, "/elsewhere/x", Json::Value()));
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N try lock too many times, path=" + queue +
                                           ", reason=Resource temporarily unavailable",
                                       "utils:N WEZOShareNamePathGet failed, path=/elsewhere/x",
                                       "config:N Failed to lock folder",
                                       "utils:N ShareSetNeedReindex failed, share="));
}

}  // namespace
}  // namespace WEZO::FILEINDEX
