// Shared helpers of the library's tests: a sandbox root per test, the captured log, and another
// process that holds a file lock.
#ifndef FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_
#define FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_

#include <gtest/gtest.h>
#include <json/value.h>
#include <sys/types.h>

#include <ostream>
#include <string>
#include <vector>

namespace Json {
// Failed expectations show JSON values as text.
inline void PrintTo(const Value& value, std::ostream* os) { *os << value.toStyledString(); }
}  // namespace Json

namespace testsupport {

// A fresh temporary directory made the library's root prefix, with the directories that exist on
// the appliance (tmp, var/run, usr/wezo/etc/fileindex). Removed with everything in it, and the
// root prefix cleared, on destruction.
class Sandbox {
 public:
  Sandbox();
  ~Sandbox();
  Sandbox(const Sandbox&) = delete;
  Sandbox& operator=(const Sandbox&) = delete;

  const std::string& Root() const { return m_root; }
  // `relative` (absolute on the appliance, "/volume1/photo") inside the sandbox.
  std::string Path(const std::string& relative) const { return m_root + relative; }

 private:
  std::string m_root;
};

// Reads back what the library logged. Lines are returned with their source line number replaced
// by "N" ("config:N Failed to lock folder"), so tests can state them exactly without depending
// on where the statement sits. A line logged at any priority other than LOG_ERR is returned with
// the prefix "priority=<n> " so that a test sees it.
class LogCapture {
 public:
  LogCapture();
  ~LogCapture();
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  std::vector<std::string> Lines() const;
  std::vector<std::string> RawLines() const;
  void Clear();
};

// `text` parsed as JSON. Fails the test when it is not JSON.
Json::Value ParseJson(const std::string& text);

// Writes `text` to `path`, replacing it. Fails the test on error.
void WriteFile(const std::string& path, const std::string& text);
// The file's content, or "<missing>" when it cannot be read.
std::string ReadFile(const std::string& path);
// The permission bits of `path`, or -1.
int ModeOf(const std::string& path);
// How many descriptors this process has open.
int OpenDescriptorCount();

// Another process that holds a flock on `path` (opened, created if need be) until destroyed.
class LockHolder {
 public:
  LockHolder(const std::string& path, bool exclusive);
  ~LockHolder();
  LockHolder(const LockHolder&) = delete;
  LockHolder& operator=(const LockHolder&) = delete;

  bool Holding() const { return m_holding; }

 private:
  pid_t m_pid = -1;
  int m_release = -1;
  bool m_holding = false;
};

// The fixture every library test derives from: its own sandbox root, a fresh fake platform with
// the shares "photo" and "video" on /volume1 of the sandbox, the log captured, the last error
// cleared and LOG_LEVEL back at its initial 3.
class LibraryTest : public ::testing::Test {
 protected:
  LibraryTest();
  ~LibraryTest() override;

  Sandbox sandbox;
  LogCapture log;
  std::string volume;  // the sandbox's /volume1
};

}  // namespace testsupport

#endif  // FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_
