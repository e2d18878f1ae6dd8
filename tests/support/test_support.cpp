#include "test_support.h"

#include <dirent.h>
#include <fcntl.h>
#include <ftw.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <regex>
#include <sstream>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/root.h"
#include "json_io.h"
#include "log.h"

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

LibraryTest::LibraryTest() : volume(sandbox.Path("/volume1")) {
  fake::Reset();
  fake::Get().AddShare("photo", volume + "/photo");
  fake::Get().AddShare("video", volume + "/video");
  WEZO::FILEINDEX::ErrorHandler::SetError(WEZO::FILEINDEX::FILEINDEX_ERR_NONE);
  WEZO::FILEINDEX::LOG_LEVEL = 3;
}

LibraryTest::~LibraryTest() = default;

}  // namespace testsupport
