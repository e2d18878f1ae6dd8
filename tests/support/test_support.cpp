#include "test_support.h"

#include <dirent.h>
#include <fcntl.h>
#include <ftw.h>
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
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <regex>
#include <sstream>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/root.h"
#include "json_io.h"
#include "utils/log.h"
#include "paths.h"

namespace testsupport {
namespace {

std::vector<std::string>& Captured() {
  static std::vector<std::string> lines;
  return lines;
}

void CaptureSink(int priority, const char* line) {
  std::string entry = line;
  if (priority != LOG_ERR) {
    entry = "priority=" + std::to_string(priority) + " " + entry;
  }
  Captured().push_back(entry);
}

int RemoveEntry(const char* path, const struct stat* /*st*/, int /*flag*/, struct FTW* /*ftw*/) {
  (void)remove(path);  // best effort: a leftover only wastes space in the temporary directory
  return 0;
}

void MakeDirs(const std::string& path) {
  for (size_t pos = 1; pos != std::string::npos;) {
    pos = path.find('/', pos + 1);
    mkdir(path.substr(0, pos).c_str(), 0755);
  }
}

}  // namespace

Sandbox::Sandbox() {
  const char* tmp = std::getenv("TMPDIR");
  std::string pattern =
      std::string(tmp != nullptr && *tmp != '\0' ? tmp : "/tmp") + "/fileindex-test.XXXXXX";
  if (mkdtemp(pattern.data()) == nullptr) {
    ADD_FAILURE() << "mkdtemp failed";
    return;
  }
  m_root = pattern;
  for (const char* dir : {"/tmp", "/var/run", "/usr/wezo/etc/fileindex", "/usr/wezo/bin"}) {
    MakeDirs(m_root + dir);
  }
  EXPECT_TRUE(WEZO::FILEINDEX::SetRootPrefix(m_root));
}

Sandbox::~Sandbox() {
  WEZO::FILEINDEX::SetRootPrefix("");
  if (!m_root.empty()) {
    nftw(m_root.c_str(), RemoveEntry, 16, FTW_DEPTH | FTW_PHYS);
  }
}

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
  if (!in) {
    return "<missing>";
  }
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

int ModeOf(const std::string& path) {
  struct stat st {};
  return lstat(path.c_str(), &st) == 0 ? static_cast<int>(st.st_mode & 07777) : -1;
}

int OpenDescriptorCount() {
  int count = 0;
  DIR* dir = opendir("/proc/self/fd");
  if (dir == nullptr) {
    return -1;
  }
  while (readdir(dir) != nullptr) {
    ++count;
  }
  closedir(dir);
  return count - 3;  // ".", ".." and the directory's own descriptor
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
    close(ready[0]);
    close(release[1]);
    const int fd = open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
    const char ok = fd >= 0 && flock(fd, exclusive ? LOCK_EX : LOCK_SH) == 0 ? '1' : '0';
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
  if (m_release >= 0) {
    close(m_release);
  }
  if (m_pid > 0) {
    int status = 0;
    waitpid(m_pid, &status, 0);
  }
}

namespace {

// The daemon's socket address for `path`. A path that fills sun_path to its last byte is still
// taken, so that tests can put a daemon where the library must refuse to look.
bool SocketAddress(const std::string& path, sockaddr_un& address) {
  address = sockaddr_un{};
  address.sun_family = AF_UNIX;
  if (path.size() > sizeof(address.sun_path)) {
    return false;
  }
  std::memcpy(address.sun_path, path.data(), path.size());
  return true;
}

}  // namespace

FakeDaemon::FakeDaemon(Behaviour behaviour)
    : m_path(WEZO::FILEINDEX::DaemonSocketPath()), m_behaviour(behaviour) {
  sockaddr_un address{};
  if (!SocketAddress(m_path, address)) {
    ADD_FAILURE() << "socket path too long: " << m_path;
    return;
  }
  const auto* addr = reinterpret_cast<const sockaddr*>(&address);
  const bool hold = behaviour == Behaviour::kHoldConnect;
  unlink(m_path.c_str());
  m_listen = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (m_listen < 0 || bind(m_listen, addr, sizeof(address)) != 0 ||
      listen(m_listen, hold ? 0 : SOMAXCONN) != 0 || pipe2(m_wake, O_CLOEXEC | O_NONBLOCK) != 0) {
    ADD_FAILURE() << "cannot listen on " << m_path << ": " << std::strerror(errno);
    return;
  }
  if (hold) {
    // A listener with a backlog of 0 queues one connection; this one takes the place, so the
    // next client waits in connect().
    m_dummy = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (m_dummy < 0 || connect(m_dummy, addr, sizeof(address)) != 0) {
      ADD_FAILURE() << "cannot fill the backlog: " << std::strerror(errno);
      return;
    }
    m_discardNext = true;
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

void FakeDaemon::Serve() {
  std::vector<Connection> reading;
  std::vector<int> held;  // kStopReading's connections
  std::vector<pollfd> fds;
  for (;;) {
    bool accepting = false;
    {
      std::lock_guard<std::mutex> lock(m_mutex);
      if (m_stopping) {
        break;
      }
      accepting = m_behaviour != Behaviour::kHoldConnect;
    }
    fds.assign({{m_wake[0], POLLIN, 0}, {accepting ? m_listen : -1, POLLIN, 0}});
    for (const Connection& connection : reading) {
      fds.push_back({connection.fd, POLLIN, 0});
    }
    // The timeout only guards against a lost wake-up; the pipe ends every wait that matters.
    if (poll(fds.data(), fds.size(), 1000) < 0 && errno != EINTR) {
      ADD_FAILURE() << "fake daemon: poll failed: " << std::strerror(errno);
      break;
    }
    char drain[64];
    while (read(m_wake[0], drain, sizeof(drain)) > 0) {
    }
    for (size_t i = reading.size(); i-- > 0;) {
      if (fds[i + 2].revents == 0) {
        continue;
      }
      char buffer[65536];
      const ssize_t got = read(reading[i].fd, buffer, sizeof(buffer));
      if (got > 0) {
        reading[i].bytes.append(buffer, static_cast<size_t>(got));
      } else if (got == 0 || (errno != EAGAIN && errno != EINTR)) {
        Finish(reading[i]);
        reading.erase(reading.begin() + static_cast<std::ptrdiff_t>(i));
      }
    }
    while (accepting && AcceptOne(reading, held)) {
    }
  }
  for (const Connection& connection : reading) {
    close(connection.fd);
  }
  for (int fd : held) {
    close(fd);
  }
}

bool FakeDaemon::AcceptOne(std::vector<Connection>& reading, std::vector<int>& held) {
  const int fd = accept4(m_listen, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
  if (fd < 0) {
    return false;
  }
  Connection connection{fd, 0, {}};
  Behaviour behaviour = Behaviour::kRead;
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    if (std::exchange(m_discardNext, false)) {
      close(fd);
      return true;
    }
    connection.index = m_accepted++;
    behaviour = m_behaviour;
  }
  switch (behaviour) {
    case Behaviour::kAcceptAndClose:
      Finish(connection);
      break;
    case Behaviour::kStopReading:
      held.push_back(fd);
      break;
    default:
      reading.push_back(std::move(connection));
      break;
  }
  return true;
}

void FakeDaemon::Finish(Connection& connection) {
  close(connection.fd);
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_ended.emplace_back(connection.index, std::move(connection.bytes));
  }
  m_changed.notify_all();
}

std::vector<std::string> FakeDaemon::Connections(size_t count, std::chrono::milliseconds timeout) {
  std::vector<std::pair<size_t, std::string>> ended;
  {
    std::unique_lock<std::mutex> lock(m_mutex);
    m_changed.wait_for(lock, timeout, [&] { return m_ended.size() >= count; });
    ended = m_ended;
  }
  std::sort(ended.begin(), ended.end());
  std::vector<std::string> out;
  out.reserve(ended.size());
  for (auto& entry : ended) {
    out.push_back(std::move(entry.second));
  }
  return out;
}

std::vector<Json::Value> FakeDaemon::Commands(size_t count, std::chrono::milliseconds timeout) {
  std::vector<Json::Value> out;
  for (const std::string& frame : Connections(count, timeout)) {
    uint32_t length = 0;
    if (frame.size() >= sizeof(length)) {
      std::memcpy(&length, frame.data(), sizeof(length));
    }
    const size_t textEnd = frame.size() - 1;
    if (frame.size() <= sizeof(length) || length != frame.size() - sizeof(length) ||
        frame.find('\0', sizeof(length)) != textEnd) {
      ADD_FAILURE() << "bad frame of " << frame.size() << " bytes, length field " << length;
      continue;
    }
    out.push_back(ParseJson(frame.substr(sizeof(length), textEnd - sizeof(length))));
  }
  return out;
}

LibraryTest::LibraryTest() : volume(sandbox.Path("/volume1")) {
  fake::Reset();
  fake::Get().AddShare("photo", volume + "/photo");
  fake::Get().AddShare("video", volume + "/video");
  WEZO::FILEINDEX::ErrorHandler::SetError(WEZO::FILEINDEX::FILEINDEX_ERR_NONE);
  WEZO::FILEINDEX::LOG_LEVEL = 3;
}

LibraryTest::~LibraryTest() = default;

Json::Value LibraryTest::StatusFile() {
  return ParseJson(ReadFile(WEZO::FILEINDEX::StatusConfPath()));
}

}  // namespace testsupport
