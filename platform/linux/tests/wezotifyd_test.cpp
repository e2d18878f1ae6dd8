// The monitor daemon against the real kernel, one daemon per sandbox, registered through the API.
#include <fcntl.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>
#include <wezo/wezotifyd.h>

#include <chrono>
#include <functional>
#include <thread>
#include <tuple>
#include <vector>

#include "json_io.h"
#include "sandbox.h"

namespace {

using WEZO::WEZOTIFYD::MonitorQueue;
using WEZO::WEZOTIFYD::QUEUE_TYPE_FILE;
namespace fs = std::filesystem;

// Polls `done` for up to five seconds, so that a lost event fails the test instead of hanging.
bool WaitFor(const std::function<bool()>& done) {
  for (int i = 0; i < 500 && !done(); ++i) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return done();
}

// Creates, writes and closes `path`: three changes.
void Create(const std::string& path) { std::ofstream(path) << "x"; }

class WezotifydTest : public SandboxTest {
 protected:
  void TearDown() override {
    if (pid_ > 0) {
      kill(pid_, SIGTERM);
      int status = 0;
      waitpid(pid_, &status, 0);
      EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << Read("log");
    }
  }

  // Share "s<n>" holds the metadata folder with its queue and the watched folder "f".
  std::string Queue(int n) const { return At("volume1/s" + std::to_string(n) + "/@eaDir/q"); }
  std::string Folder(int n) const { return At("volume1/s" + std::to_string(n) + "/f"); }
  std::string QueueText(int n) const { return Read(Queue(n).substr(root_.size() + 1)); }
  bool Logged(const std::string& text) const {
    return WaitFor([&] { return Read("log").find(text) != std::string::npos; });
  }

  // Registers shares 1..`shares`, runs `plant`, and starts the daemon.
  void Start(
      int shares, const std::function<void()>& plant = [] {}) {
    for (int n = 1; n <= shares; ++n) {
      fs::create_directories(Folder(n)), fs::create_directories(Folder(n) + "/../@eaDir");
      Json::Value entry;
      ASSERT_TRUE(WEZO::FILEINDEX::JsonFromString(
          entry, R"({"queue":")" + Queue(n) + R"(","config":[{"path":")" + Folder(n) +
                     R"(","mask":65486,"ignore":["@eaDir"]}]})"));
      ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(entry), "fileindex", QUEUE_TYPE_FILE));
    }
    plant();
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 2, At("log").c_str(), O_WRONLY | O_CREAT, 0644);
    std::string root = root_;
    char* argv[] = {const_cast<char*>(WEZOTIFYD_BIN), const_cast<char*>("--root"), root.data(),
                    nullptr};
    ASSERT_EQ(posix_spawn(&pid_, WEZOTIFYD_BIN, &actions, nullptr, argv, environ), 0);
    posix_spawn_file_actions_destroy(&actions);
    ASSERT_TRUE(Logged("for " + std::to_string(shares) + " queues")) << Read("log");
  }

  pid_t pid_ = -1;
};

TEST_F(WezotifydTest, WritesOneLinePerChangeAndNoneForARemovedRegistration) {
  Start(2);
  ASSERT_TRUE(MonitorQueue::Delete(Queue(2), "fileindex", QUEUE_TYPE_FILE));
  ASSERT_TRUE(Logged("for 1 queues"));
  Create(Folder(2) + "/y");
  const std::string f = Folder(1);
  fs::create_directories(At("outside"));
  const auto line = [&](int event, const std::string& path, const std::string& old = "") {
    const std::string head = R"({"event":)" + std::to_string(event) + R"(,"path":")" + f + path;
    return head + (old.empty() ? "\"}\n" : R"(","path_old":")" + f + old + "\"}\n");
  };
  const std::tuple<const char*, std::function<void()>, std::string> cases[] = {
      {"create and write", [&] { Create(f + "/a"); },
       line(256, "/a") + line(2, "/a") + line(8, "/a")},
      {"rename within", [&] { fs::rename(f + "/a", f + "/b"); }, line(256, "/b", "/a")},
      {"rename out", [&] { fs::rename(f + "/b", At("outside/b")); }, line(64, "/b")},
      {"rename in", [&] { fs::rename(At("outside/b"), f + "/c"); }, line(256, "/c")},
      {"remove", [&] { fs::remove(f + "/c"); }, line(512, "/c")},
      {"ignored name", [&] { fs::create_directory(f + "/@eaDir"), Create(f + "/@eaDir/z"); }, ""},
      {"new folder filled before its watch",
       [&] {
         kill(pid_, SIGSTOP);  // only a scan of the new folder can find what is made in it now
         fs::create_directories(f + "/n/d");
         Create(f + "/n/d/x");
         kill(pid_, SIGCONT);
       },
       line(256, "/n") + line(256, "/n/d") + line(256, "/n/d/x")},
      {"renamed folder keeps its watch",
       [&] { fs::rename(f + "/n", f + "/m"), fs::remove(f + "/m/d/x"); },
       line(256, "/m", "/n") + line(512, "/m/d/x")},
  };
  size_t seen = 0;
  int mark = 0;
  for (const auto& [what, change, lines] : cases) {
    SCOPED_TRACE(what);
    change();
    // A folder made after the change closes its lines: everything before it belongs to the case.
    const std::string marker = line(256, "/mark" + std::to_string(++mark));
    mkdir((f + "/mark" + std::to_string(mark)).c_str(), 0755);
    ASSERT_TRUE(WaitFor([&] { return QueueText(1).find(marker) != std::string::npos; }));
    const size_t end = QueueText(1).find(marker);
    EXPECT_EQ(QueueText(1).substr(seen, end - seen), lines);
    seen = end + marker.size();
  }
  EXPECT_FALSE(fs::exists(Queue(2)));
}

TEST_F(WezotifydTest, FlagsTheShareForAReindexWhenTheKernelDropsEvents) {
  Start(1, [&] {
    Write("etc/samba/smb.conf", "[s1]\n\tpath = " + At("volume1/s1") + "\n");
    const timespec old[2] = {{time(nullptr) - 10, 0}, {time(nullptr) - 10, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, At("etc/samba/smb.conf").c_str(), old, 0), 0);
    fs::create_directories(At("tmp")), fs::create_directories(At("usr/wezo/etc/fileindex"));
  });
  // Writes to two files in turn: the kernel merges only an event equal to the one before it.
  int queued = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> queued;
  std::ofstream files[] = {std::ofstream(Folder(1) + "/a"), std::ofstream(Folder(1) + "/b")};
  kill(pid_, SIGSTOP);
  for (int i = 0; i <= queued; ++i) files[i % 2] << 'x' << std::flush;
  kill(pid_, SIGCONT);
  Json::Value status;
  EXPECT_TRUE(WaitFor([&] {
    return WEZO::FILEINDEX::JsonFromFile(status, At("usr/wezo/etc/fileindex/status.conf")) &&
           status["need_reindex"]["s1"] == true;
  })) << Read("log");
}

// The consumer takes a queue by removing it under its lock: a change made meanwhile goes anew.
TEST_F(WezotifydTest, WritesToANewQueueWhenTheOneItWaitedForIsTaken) {
  Start(1);
  const int taken = open(Queue(1).c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
  ASSERT_EQ(flock(taken, LOCK_EX), 0);
  Create(Folder(1) + "/x");
  std::this_thread::sleep_for(std::chrono::milliseconds(100));  // lets the daemon reach the lock
  ASSERT_EQ(unlink(Queue(1).c_str()), 0);
  close(taken);
  EXPECT_TRUE(WaitFor([&] { return QueueText(1).find(Folder(1) + "/x") != std::string::npos; }));
}

TEST_F(WezotifydTest, RefusesAQueueThatIsNotARegularFileOfItsOwnFolder) {
  Start(3, [&] {
    Write("target1", ""), Write("target2", ""), Write("elsewhere/x", "");
    EXPECT_EQ(symlink(At("target1").c_str(), Queue(1).c_str()), 0);    // the queue is a link
    const std::string meta = Queue(2).substr(0, Queue(2).rfind('/'));  // its folder is a link
    fs::remove(meta);
    EXPECT_EQ(symlink(At("elsewhere").c_str(), meta.c_str()), 0);
    EXPECT_EQ(symlink(At("target2").c_str(), At("elsewhere/q").c_str()), 0);
    EXPECT_EQ(mkfifo(Queue(3).c_str(), 0644), 0);  // the queue is a FIFO
  });
  for (int n = 1; n <= 3; ++n) {
    SCOPED_TRACE(n);
    Create(Folder(n) + "/x");
    EXPECT_TRUE(Logged("cannot append to queue " + Queue(n))) << Read("log");
    EXPECT_EQ(Read("target" + std::to_string(n)), "");
  }
}

}  // namespace
