#include "test_support.h"

#include <sys/file.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <syslog.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <fstream>
#include <regex>
#include <sstream>
#include <utility>

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

bool LockHeldElsewhere(const std::string& path) {
  const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  const bool held = fd >= 0 && flock(fd, LOCK_EX | LOCK_NB) != 0;
  close(fd);
  return held;
}

std::string Joined(const std::vector<std::string>& parts) {
  std::string text;
  for (const std::string& part : parts) text += (text.empty() ? "" : "; ") + part;
  return text;
}

LockHolder::LockHolder(const std::string& path, bool exclusive)
    : m_fd(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644)) {
  EXPECT_TRUE(m_fd >= 0 && flock(m_fd, exclusive ? LOCK_EX : LOCK_SH) == 0)
      << "cannot lock " << path;
}

LockHolder::~LockHolder() {
  if (m_fd >= 0) close(m_fd);
}

namespace {

// A path filling sun_path is taken: a test puts a daemon where the library must not look.
sockaddr_un AddressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.data(), std::min(path.size(), sizeof(address.sun_path)));
  return address;
}

// Connects to `path` (SOCK_NONBLOCK: not waiting on a full backlog); -1 on failure.
int ConnectTo(const std::string& path, int flags = 0) {
  const sockaddr_un address = AddressOf(path);
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | flags, 0);
  if (fd >= 0 && connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
    close(fd);
    return -1;
  }
  return fd;
}

}  // namespace

FakeDaemon::FakeDaemon(Behaviour behaviour)
    : m_path(WEZO::FILEINDEX::DaemonSocketPath()), m_behaviour(behaviour) {
  const sockaddr_un address = AddressOf(m_path);
  if (m_path.size() > sizeof(address.sun_path)) {
    ADD_FAILURE() << "socket path too long: " << m_path;
    return;
  }
  const bool hold = behaviour == Behaviour::kHoldConnect;
  unlink(m_path.c_str());
  m_listen = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  // A listener with a backlog of 0 queues one connection; kHoldConnect's own takes the place, so
  // the next client waits in connect().
  if (m_listen < 0 ||
      bind(m_listen, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0 ||
      listen(m_listen, hold ? 0 : SOMAXCONN) != 0 || (hold && (m_dummy = ConnectTo(m_path)) < 0)) {
    ADD_FAILURE() << "cannot listen on " << m_path << ": ";
    return;
  }
  m_thread = std::thread(&FakeDaemon::Serve, this);
}

FakeDaemon::~FakeDaemon() {
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_stopping = true;
    if (m_serving >= 0) shutdown(m_serving, SHUT_RDWR);
  }
  m_changed.notify_all();
  const int wake = ConnectTo(m_path, SOCK_NONBLOCK);  // ends an accept(); a full backlog does too
  if (m_thread.joinable()) m_thread.join();
  for (int fd : {m_listen, m_dummy, wake})
    if (fd >= 0) close(fd);
  unlink(m_path.c_str());
}

void FakeDaemon::Release() {
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_behaviour = Behaviour::kRead;
  }
  m_changed.notify_all();
}

void FakeDaemon::Serve() {
  std::vector<int> held;  // m_dummy's connection and kStopReading's
  std::unique_lock<std::mutex> lock(m_mutex);
  m_changed.wait(lock, [&] { return m_stopping || m_behaviour != Behaviour::kHoldConnect; });
  for (bool dummy = m_dummy >= 0; !m_stopping;) {
    lock.unlock();
    const int fd = accept4(m_listen, nullptr, nullptr, SOCK_CLOEXEC);
    lock.lock();
    if (fd < 0) continue;
    if (std::exchange(dummy, false) || m_stopping || m_behaviour == Behaviour::kStopReading) {
      held.push_back(fd);
      continue;
    }
    const Behaviour behaviour = m_behaviour;
    m_serving = fd;
    lock.unlock();
    std::string bytes;
    char buffer[65536];
    ssize_t got = 0;
    while (behaviour == Behaviour::kRead && (got = read(fd, buffer, sizeof(buffer))) > 0) {
      bytes.append(buffer, static_cast<size_t>(got));
    }
    lock.lock();
    m_serving = -1;
    close(fd);
    m_ended.push_back(std::move(bytes));
    m_changed.notify_all();
  }
  for (int fd : held) close(fd);
}

std::vector<std::string> FakeDaemon::Connections(size_t count, std::chrono::milliseconds timeout,
                                                 bool commands) {
  // A connection closed without a byte asked whether the daemon answers; it is no command.
  const auto ended = [&] {
    return static_cast<size_t>(std::count_if(
        m_ended.begin(), m_ended.end(), [&](const auto& f) { return !commands || !f.empty(); }));
  };
  std::unique_lock<std::mutex> lock(m_mutex);
  m_changed.wait_for(lock, timeout, [&] { return ended() >= count; });
  return m_ended;
}

std::vector<Json::Value> FakeDaemon::Commands(size_t count, std::chrono::milliseconds timeout) {
  const std::vector<std::string> frames = Connections(count, timeout, true);
  std::vector<Json::Value> out;
  for (const std::string& frame : frames) {
    if (frame.empty()) continue;
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
  for (const char* dir : {"tmp", "var/run", "usr/wezo/etc/fileindex", "usr/wezo/bin",
                          "volume1/photo", "volume1/video"}) {
    std::filesystem::create_directories(At(dir));
  }
  ResetPlatform();
  WEZO::FILEINDEX::LOG_LEVEL = 3;
}

void LibraryTest::ResetPlatform() {
  fake::Reset();
  fake::Get().AddShare("photo", volume + "/photo");
  fake::Get().AddShare("video", volume + "/video");
  WEZO::FILEINDEX::ErrorHandler::SetError(WEZO::FILEINDEX::FILEINDEX_ERR_NONE);
  log.Clear();
}

Json::Value LibraryTest::StatusFile() {
  return ParseJson(ReadFile(WEZO::FILEINDEX::StatusConfPath()));
}

}  // namespace testsupport
