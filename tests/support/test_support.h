// The library tests' fixture, captured log, foreign lock and stand-in daemon, with what every
// library test uses: the whole interface, its fixed paths, JSON text and the fake platform.
#ifndef FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_
#define FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <functional>
#include <mutex>
#include <ostream>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "fake_platform.h"
#include "fileindex/fileindex.h"
#include "fileindex/fileindex_c.h"
#include "json_io.h"
#include "paths.h"
#include "sandbox.h"

namespace Json {
// Failed expectations show JSON values as text.
inline void PrintTo(const Value& value, std::ostream* os) { *os << value.toStyledString(); }
}  // namespace Json

namespace testsupport {

// What the library logged; Lines() shows line numbers as N ("config:N Failed to lock folder") and
// prefixes lines not logged at LOG_ERR with "priority=<n> ".
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

Json::Value ParseJson(const std::string& text);  // fails the test when it is not JSON
void WriteFile(const std::string& path, const std::string& text);
std::string ReadFile(const std::string& path);  // "<missing>" when it cannot be read
int ModeOf(const std::string& path);            // the permission bits, or -1
int OpenDescriptorCount();
bool LockHeldElsewhere(const std::string& path);  // some descriptor holds a flock on `path`
std::string Joined(const std::vector<std::string>& parts);  // "a; b; c"

// A flock on `path` (created if need be) through a descriptor of its own: another process's.
// Fails the test when it cannot be had.
class LockHolder {
 public:
  LockHolder(const std::string& path, bool exclusive);
  ~LockHolder();
  LockHolder(const LockHolder&) = delete;
  LockHolder& operator=(const LockHolder&) = delete;

 private:
  int m_fd = -1;
};

// A stand-in for the indexing daemon on the sandbox's socket path, served one connection at a time
// by a thread that never calls into the library. Create it after the root prefix is set.
class FakeDaemon {
 public:
  enum class Behaviour {
    kRead,            // reads each connection to its end
    kAcceptAndClose,  // closes each connection at once without reading
    kStopReading,     // never reads (the connection stays open until destruction)
    kHoldConnect,     // accepts nobody until Release(): its backlog stays full, so a client
                      // blocks in connect()
  };
  explicit FakeDaemon(Behaviour behaviour = Behaviour::kRead);
  ~FakeDaemon();  // stops the thread, closes everything, removes the socket file
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  void Release();  // kHoldConnect: from now on behave as kRead
  // Each ended connection's bytes ("" closed unread), once `count` ended (of those with bytes,
  // with `commands`) or `timeout` passed.
  std::vector<std::string> Connections(size_t count,
                                       std::chrono::milliseconds timeout = std::chrono::seconds(5),
                                       bool commands = false);
  // The commands decoded likewise, empty connections left out; a bad length or zero fails.
  std::vector<Json::Value> Commands(size_t count,
                                    std::chrono::milliseconds timeout = std::chrono::seconds(5));

 private:
  void Serve();

  std::string m_path;
  int m_listen = -1;
  int m_dummy = -1;    // kHoldConnect's own connection that fills the backlog
  int m_serving = -1;  // the connection being read, shut down to stop the thread
  std::thread m_thread;
  std::mutex m_mutex;
  std::condition_variable m_changed;
  Behaviour m_behaviour;
  bool m_stopping = false;
  std::vector<std::string> m_ended;
};

// The appliance's directories in the sandbox, a fresh fake platform with shares "photo" and
// "video" on /volume1, the log captured, no error, LOG_LEVEL 3.
class LibraryTest : public SandboxTest {
 protected:
  LibraryTest();

  void ResetPlatform();  // the constructor's fresh fake platform again, no error, the log cleared
  static Json::Value StatusFile();  // status.conf parsed; fails the test when it is not JSON
  LogCapture log;
  std::string volume;  // the sandbox's /volume1
};

}  // namespace testsupport

// The library's tests live in its namespace and name the helpers they all use unqualified.
namespace WEZO::FILEINDEX {
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testsupport::FakeDaemon;
using testsupport::ParseJson;
using testsupport::ReadFile;
using testsupport::WriteFile;
using Lines = std::vector<std::string>;
}  // namespace WEZO::FILEINDEX

#endif  // FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_
