// The monitor daemon as a program against the real kernel, each test with its own daemon in its
// own sandbox root; registrations are written through the platform's client API.
#include <fcntl.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <wezo/wezotifyd.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "json_io.h"
#include "sandbox.h"

namespace {

using WEZO::WEZOTIFYD::MonitorQueue;
using WEZO::WEZOTIFYD::QUEUE_TYPE_FILE;

class WezotifydTest : public SandboxTest {
 protected:
  void TearDown() override {
    if (pid_ > 0) {
      kill(pid_, SIGTERM);
      int status = 0;
      waitpid(pid_, &status, 0);
      EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << Read("log");
    }
    SandboxTest::TearDown();
  }

  // A share "s<n>" with its metadata folder and the watched folder "f".
  std::string Queue(int n) const { return At("volume1/s" + std::to_string(n) + "/@eaDir/q"); }
  std::string Folder(int n) const { return At("volume1/s" + std::to_string(n) + "/f"); }
  void Register(int n) {
    std::filesystem::create_directories(Folder(n));
    std::filesystem::create_directories(At("volume1/s" + std::to_string(n) + "/@eaDir"));
    Json::Value entry;
    entry["queue"] = Queue(n);
    entry["config"][0]["path"] = Folder(n);
    entry["config"][0]["mask"] = 0xFFCE;
    entry["config"][0]["ignore"].append("@eaDir");
    ASSERT_TRUE(MonitorQueue::Upsert(MonitorQueue(entry), "fileindex", QUEUE_TYPE_FILE));
  }

  void Start() {
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 2, At("log").c_str(), O_WRONLY | O_CREAT | O_APPEND,
                                     0644);
    const std::string root = root_;
    char* argv[] = {const_cast<char*>(WEZOTIFYD_BIN), const_cast<char*>("--root"),
                    const_cast<char*>(root.c_str()), nullptr};
    ASSERT_EQ(posix_spawn(&pid_, WEZOTIFYD_BIN, &actions, nullptr, argv, environ), 0);
    posix_spawn_file_actions_destroy(&actions);
  }

  // Polls `done` for up to five seconds, so that a lost event fails the test instead of hanging.
  static bool WaitFor(const std::function<bool()>& done) {
    for (int i = 0; i < 500; ++i) {
      if (done()) {
        return true;
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return done();
  }
  bool WaitForLog(const std::string& text) {
    return WaitFor([&] { return Read("log").find(text) != std::string::npos; });
  }
  std::string QueueText(int n) const { return Read(Queue(n).substr(root_.size() + 1)); }

  // The queue line the daemon writes, with paths relative to folder 1.
  std::string Line(int event, const std::string& path, const std::string& old = "") const {
    std::string line = R"({"event":)" + std::to_string(event) + R"(,"path":")" + Folder(1) + path;
    return line + (old.empty() ? "\"}\n" : R"(","path_old":")" + Folder(1) + old + "\"}\n");
  }

  pid_t pid_ = -1;
};

void Move(const char* from, const char* to) { ASSERT_EQ(rename(from, to), 0) << from; }
void Remove(const std::string& path) { ASSERT_EQ(unlink(path.c_str()), 0) << path; }

void Create(const std::string& path) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
  ASSERT_GE(fd, 0);
  ASSERT_EQ(write(fd, "x", 1), 1);
  close(fd);
}

TEST_F(WezotifydTest, WritesOneLinePerChangeInTheQueueFormat) {
  Register(1);
  Start();
  ASSERT_TRUE(WaitForLog("for 1 queues"));
  const std::string f = Folder(1);
  std::filesystem::create_directories(At("outside"));
  const struct {
    const char* what;
    std::function<void()> change;
    std::vector<std::string> lines;
  } cases[] = {
      {"create and write",
       [&] { Create(f + "/a"); },
       {Line(256, "/a"), Line(2, "/a"), Line(8, "/a")}},
      {"rename within",
       [&] { Move((f + "/a").c_str(), (f + "/b").c_str()); },
       {Line(256, "/b", "/a")}},
      {"rename out", [&] { Move((f + "/b").c_str(), At("outside/b").c_str()); }, {Line(64, "/b")}},
      {"rename in", [&] { Move(At("outside/b").c_str(), (f + "/c").c_str()); }, {Line(256, "/c")}},
      {"remove", [&] { Remove(f + "/c"); }, {Line(512, "/c")}},
      {"ignored name",
       [&] {
         mkdir((f + "/@eaDir").c_str(), 0755);
         Create(f + "/@eaDir/z");
       },
       {}},
      {"new folder filled before its watch",
       [&] {
         kill(pid_, SIGSTOP);  // only a scan of the new folder can find what is made in it now
         mkdir((f + "/n").c_str(), 0755);
         mkdir((f + "/n/d").c_str(), 0755);
         Create(f + "/n/d/x");
         kill(pid_, SIGCONT);
       },
       {Line(256, "/n"), Line(256, "/n/d"), Line(256, "/n/d/x")}},
      {"renamed folder keeps its watch",
       [&] {
         Move((f + "/n").c_str(), (f + "/m").c_str());
         Remove(f + "/m/d/x");
       },
       {Line(256, "/m", "/n"), Line(512, "/m/d/x")}},
  };
  size_t seen = 0;
  int mark = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    c.change();
    // A folder made after the change closes its lines: everything before it belongs to the case.
    const std::string marker = "/mark" + std::to_string(++mark);
    mkdir((f + marker).c_str(), 0755);
    ASSERT_TRUE(WaitFor([&] { return QueueText(1).find(Line(256, marker)) != std::string::npos; }))
        << QueueText(1);
    const std::string text = QueueText(1);
    const size_t end = text.find(Line(256, marker));
    const std::string got = text.substr(seen, end - seen);
    seen = end + Line(256, marker).size();
    std::string want;
    for (const std::string& line : c.lines) {
      want += line;
    }
    EXPECT_EQ(got, want);
  }
}

TEST_F(WezotifydTest, StopsWritingToAQueueOnceItsRegistrationIsRemoved) {
  Register(1);
  Register(2);
  Start();
  ASSERT_TRUE(WaitForLog("for 2 queues"));
  ASSERT_TRUE(MonitorQueue::Delete(Queue(1), "fileindex", QUEUE_TYPE_FILE));
  ASSERT_TRUE(WaitForLog("for 1 queues"));
  Create(Folder(1) + "/x");
  Create(Folder(2) + "/y");
  ASSERT_TRUE(WaitFor([&] { return QueueText(2).find(Folder(2) + "/y") != std::string::npos; }));
  EXPECT_FALSE(std::filesystem::exists(Queue(1)));
}

TEST_F(WezotifydTest, WritesToANewQueueWhenTheOneItWaitedForIsTaken) {
  Register(1);
  Start();
  ASSERT_TRUE(WaitForLog("for 1 queues"));
  // The consumer holds the queue's lock while the change comes, then takes the queue away.
  const int taken = open(Queue(1).c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
  ASSERT_EQ(flock(taken, LOCK_EX), 0);
  Create(Folder(1) + "/x");
  std::this_thread::sleep_for(std::chrono::milliseconds(100));  // lets the daemon reach the lock
  ASSERT_EQ(unlink(Queue(1).c_str()), 0);
  close(taken);
  EXPECT_TRUE(WaitFor([&] { return QueueText(1).find(Folder(1) + "/x") != std::string::npos; }));
}

TEST_F(WezotifydTest, FlagsTheShareForAReindexWhenTheKernelDropsEvents) {
  Write("etc/samba/smb.conf", "[s1]\n\tpath = " + At("volume1/s1") + "\n");
  const timespec old[2] = {{time(nullptr) - 10, 0}, {time(nullptr) - 10, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, At("etc/samba/smb.conf").c_str(), old, 0), 0);
  std::filesystem::create_directories(At("tmp"));
  std::filesystem::create_directories(At("usr/wezo/etc/fileindex"));
  Register(1);
  Start();
  ASSERT_TRUE(WaitForLog("for 1 queues"));
  // Writes to two files in turn: the kernel merges only an event equal to the one before it.
  int queued = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> queued;
  const int fds[] = {open((Folder(1) + "/a").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644),
                     open((Folder(1) + "/b").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644)};
  kill(pid_, SIGSTOP);
  for (int i = 0; i <= queued; ++i) {
    ASSERT_EQ(pwrite(fds[i % 2], "x", 1, 0), 1);
  }
  close(fds[0]);
  close(fds[1]);
  kill(pid_, SIGCONT);
  Json::Value status;
  EXPECT_TRUE(WaitFor([&] {
    return WEZO::FILEINDEX::JsonFromFile(status, At("usr/wezo/etc/fileindex/status.conf")) &&
           status["need_reindex"]["s1"] == true;
  })) << Read("log");
}

TEST_F(WezotifydTest, RefusesAQueueThatIsNotARegularFileOfItsOwnFolder) {
  const struct {
    const char* what;
    std::function<void(const std::string& queue, const std::string& target)> plant;
  } cases[] = {
      {"queue is a link",
       [](const std::string& q, const std::string& t) {
         ASSERT_EQ(symlink(t.c_str(), q.c_str()), 0);
       }},
      {"metadata folder is a link",
       [this](const std::string& q, const std::string& t) {
         const std::string meta = q.substr(0, q.rfind('/'));
         std::filesystem::remove(meta);
         std::filesystem::create_directories(At("elsewhere"));
         ASSERT_EQ(symlink(At("elsewhere").c_str(), meta.c_str()), 0);
         ASSERT_EQ(symlink(t.c_str(), At("elsewhere/q").c_str()), 0);
       }},
      {"queue is a FIFO",
       [](const std::string& q, const std::string&) { ASSERT_EQ(mkfifo(q.c_str(), 0644), 0); }},
  };
  for (int n = 1; n <= 3; ++n) {
    Register(n);
    Write("target" + std::to_string(n), "");
    cases[n - 1].plant(Queue(n), At("target" + std::to_string(n)));
  }
  Start();
  ASSERT_TRUE(WaitForLog("for 3 queues"));
  for (int n = 1; n <= 3; ++n) {
    SCOPED_TRACE(cases[n - 1].what);
    Create(Folder(n) + "/x");
    EXPECT_TRUE(WaitForLog("cannot append to queue " + Queue(n))) << Read("log");
    EXPECT_EQ(Read("target" + std::to_string(n)), "");
  }
}

}  // namespace
