#include "test_support.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <utility>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "json_io.h"
#include "paths.h"
#include "utils/log.h"

namespace testsupport {
namespace {

std::vector<std::string>& Captured() {
  static std::vector<std::string> lines;
  return lines;
}

void CaptureSink(int priority, const char* line) {
  Captured().push_back((priority != LOG_ERR ? "priority=" + std::to_string(priority) + " " : "") +
                       line);
}

}  // namespace

LogCapture::LogCapture() {
  Captured().clear();
  WEZO::FILEINDEX::detail::SetLogSink(CaptureSink);
}

LogCapture::~LogCapture() { WEZO::FILEINDEX::detail::SetLogSink(nullptr); }

std::vector<std::string> LogCapture::RawLines() const { return Captured(); }

std::vector<std::string> LogCapture::Lines() const {
  static const std::regex lineNumber("^((?:priority=\\d+ )?[a-z_]+):[1-9][0-9]* ");
  std::vector<std::string> out;
  for (const std::string& line : Captured()) {
    out.push_back(
        std::regex_replace(line, lineNumber, "$1:N ", std::regex_constants::format_first_only));
  }
  return out;
}

void LogCapture::Clear() { Captured().clear(); }

Json::Value ParseJson(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(WEZO::FILEINDEX::JsonFromString(value, text)) << text;
  return value;
}

void WriteFile(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out << text;
  ASSERT_TRUE(out.good()) << "cannot write " << path;
}

std::string ReadFile(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return in ? text.str() : "<missing>";
}

int ModeOf(const std::string& path) {
  struct stat st {};
  return lstat(path.c_str(), &st) == 0 ? static_cast<int>(st.st_mode & 07777) : -1;
}

int OpenDescriptorCount() {
  const auto fds = std::filesystem::directory_iterator("/proc/self/fd");
  return static_cast<int>(std::distance(begin(fds), end(fds))) - 1;  // less the iterator's own
}

LockHolder::LockHolder(const std::string& path, bool exclusive) {
  int ready[2];
  int release[2];
  if (pipe2(ready, O_CLOEXEC) != 0 || pipe2(release, O_CLOEXEC) != 0) {
    ADD_FAILURE() << "pipe failed";
    return;
  }
  m_pid = fork();
  if (m_pid == 0) {
    const int fd = open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
    const char ok = fd >= 0 && flock(fd, exclusive ? LOCK_EX : LOCK_SH) == 0 ? '1' : '0';
    close(release[1]);
    (void)!write(ready[1], &ok, 1);
    char byte;
    while (read(release[0], &byte, 1) > 0) {
    }
    _exit(0);
  }
  close(ready[1]);
  close(release[0]);
  m_release = release[1];
  char ok = '0';
  m_holding = m_pid > 0 && read(ready[0], &ok, 1) == 1 && ok == '1';
  close(ready[0]);
  EXPECT_TRUE(m_holding) << "the other process could not lock " << path;
}

LockHolder::~LockHolder() {
  close(m_release);
  if (m_pid > 0) {
    waitpid(m_pid, nullptr, 0);
  }
}

FakeDaemon::FakeDaemon(Behaviour behaviour)
    : m_path(WEZO::FILEINDEX::DaemonSocketPath()), m_behaviour(behaviour) {
  // A path filling sun_path to its last byte is taken: a test puts a daemon where the library
  // must refuse to look.
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (m_path.size() > sizeof(address.sun_path)) {
    ADD_FAILURE() << "socket path too long: " << m_path;
    return;
  }
  std::memcpy(address.sun_path, m_path.data(), m_path.size());
  const auto* addr = reinterpret_cast<const sockaddr*>(&address);
  const bool hold = behaviour == Behaviour::kHoldConnect;
  unlink(m_path.c_str());
  m_listen = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  // A listener with a backlog of 0 queues one connection; kHoldConnect's own takes the place, so
  // the next client waits in connect().
  if (m_listen < 0 || bind(m_listen, addr, sizeof(address)) != 0 ||
      listen(m_listen, hold ? 0 : SOMAXCONN) != 0 || pipe2(m_wake, O_CLOEXEC | O_NONBLOCK) != 0 ||
      (hold && ((m_dummy = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) < 0 ||
                connect(m_dummy, addr, sizeof(address)) != 0))) {
    ADD_FAILURE() << "cannot listen on " << m_path << ": " << std::strerror(errno);
    return;
  }
  m_thread = std::thread(&FakeDaemon::Serve, this);
}

FakeDaemon::~FakeDaemon() {
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_stopping = true;
  }
  if (m_thread.joinable()) {
    (void)!write(m_wake[1], "x", 1);
    m_thread.join();
  }
  for (int fd : {m_listen, m_wake[0], m_wake[1], m_dummy}) {
    if (fd >= 0) {
      close(fd);
    }
  }
  unlink(m_path.c_str());
}

void FakeDaemon::Release() {
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_behaviour = Behaviour::kRead;
  }
  (void)!write(m_wake[1], "x", 1);
}

bool FakeDaemon::Wait(int fd) {
  for (;;) {
    pollfd fds[2] = {{m_wake[0], POLLIN, 0}, {fd, POLLIN, 0}};
    // The timeout only guards against a lost wake-up.
    if (poll(fds, 2, 1000) < 0 && errno != EINTR) {
      return false;
    }
    char drain[64];
    while (read(m_wake[0], drain, sizeof(drain)) > 0) {
    }
    std::lock_guard<std::mutex> lock(m_mutex);
    if (m_stopping) {
      return false;
    }
    if (fds[1].revents != 0 || (fd < 0 && fds[0].revents != 0)) {
      return true;
    }
  }
}

void FakeDaemon::Serve() {
  std::vector<int> held;                                  // kStopReading's connections
  bool discard = m_behaviour == Behaviour::kHoldConnect;  // the first accepted is m_dummy's
  for (;;) {
    Behaviour behaviour;
    {
      std::lock_guard<std::mutex> lock(m_mutex);
      behaviour = m_behaviour;
    }
    if (!Wait(behaviour == Behaviour::kHoldConnect ? -1 : m_listen)) {
      break;
    }
    const int fd = behaviour == Behaviour::kHoldConnect
                       ? -1
                       : accept4(m_listen, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0 || std::exchange(discard, false) || behaviour == Behaviour::kStopReading) {
      if (fd >= 0) {
        held.push_back(fd);
      }
      continue;
    }
    std::string bytes;
    char buffer[65536];
    ssize_t got = 0;
    while (behaviour == Behaviour::kRead && Wait(fd) &&
           (got = read(fd, buffer, sizeof(buffer))) > 0) {
      bytes.append(buffer, static_cast<size_t>(got));
    }
    close(fd);
    {
      std::lock_guard<std::mutex> lock(m_mutex);
      m_ended.push_back(std::move(bytes));
    }
    m_changed.notify_all();
  }
  for (int fd : held) {
    close(fd);
  }
}

std::vector<std::string> FakeDaemon::Connections(size_t count, std::chrono::milliseconds timeout) {
  std::unique_lock<std::mutex> lock(m_mutex);
  m_changed.wait_for(lock, timeout, [&] { return m_ended.size() >= count; });
  return m_ended;
}

std::vector<Json::Value> FakeDaemon::Commands(size_t count, std::chrono::milliseconds timeout) {
  std::vector<std::string> frames;
  {
    // A connection closed without a byte asked whether the daemon answers; it is no command.
    const auto commands = [this] {
      return static_cast<size_t>(std::count_if(m_ended.begin(), m_ended.end(),
                                               [](const std::string& f) { return !f.empty(); }));
    };
    std::unique_lock<std::mutex> lock(m_mutex);
    m_changed.wait_for(lock, timeout, [&] { return commands() >= count; });
    frames = m_ended;
  }
  std::vector<Json::Value> out;
  for (const std::string& frame : frames) {
    if (frame.empty()) {
      continue;
    }
    uint32_t length = 0;
    std::memcpy(&length, frame.data(), std::min(frame.size(), sizeof(length)));
    if (frame.size() <= sizeof(length) || length != frame.size() - sizeof(length) ||
        frame.find('\0', sizeof(length)) != frame.size() - 1) {
      ADD_FAILURE() << "bad frame of " << frame.size() << " bytes, length field " << length;
      continue;
    }
    out.push_back(ParseJson(frame.substr(sizeof(length), length - 1)));
  }
  return out;
}

LibraryTest::LibraryTest() : volume(At("volume1")) {
  for (const char* dir : {"tmp", "var/run", "usr/wezo/etc/fileindex", "usr/wezo/bin"}) {
    std::filesystem::create_directories(At(dir));
  }
  fake::Reset();
  fake::Get().AddShare("photo", volume + "/photo");
  fake::Get().AddShare("video", volume + "/video");
  WEZO::FILEINDEX::ErrorHandler::SetError(WEZO::FILEINDEX::FILEINDEX_ERR_NONE);
  WEZO::FILEINDEX::LOG_LEVEL = 3;
}

Json::Value LibraryTest::StatusFile() {
  return ParseJson(ReadFile(WEZO::FILEINDEX::StatusConfPath()));
}

}  // namespace testsupport
