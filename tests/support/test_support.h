// Shared helpers of the library's tests: a sandbox root per test, the captured log, and another
// process that holds a file lock.
#ifndef FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_
#define FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_

#include <gtest/gtest.h>
#include <json/value.h>
#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>
#include <ostream>
#include <string>
#include <thread>
#include <utility>
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

// A stand-in for the indexing daemon: a real listening Unix socket at the sandbox's daemon socket
// path, served by a thread of the test process. Create it after the root prefix is set. It never
// calls into the library from its thread, so it can run beside a test that captures the log.
class FakeDaemon {
 public:
  enum class Behaviour {
    kRead,            // accepts each connection and reads it to its end
    kAcceptAndClose,  // accepts each connection and closes it at once without reading
    kStopReading,     // accepts and never reads (the connection stays open until destruction)
    kHoldConnect,     // accepts nobody until Release(): its backlog is kept full, so a client
                      // blocks in connect()
  };
  explicit FakeDaemon(Behaviour behaviour = Behaviour::kRead);
  ~FakeDaemon();  // stops the thread, closes everything, removes the socket file
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  // For kHoldConnect: from now on behave as kRead (accept the queued connections and read them).
  void Release();
  // The bytes received on each connection that has ended, in order of acceptance (length field
  // included; empty for a connection closed without reading). Waits until at least `count`
  // connections have ended or `timeout` passes; returns what it has.
  std::vector<std::string> Connections(size_t count,
                                       std::chrono::milliseconds timeout = std::chrono::seconds(5));
  // The same, each decoded: fails the test on a bad frame (a length field that is not the rest's
  // size, no single terminating zero) and parses the JSON text.
  std::vector<Json::Value> Commands(size_t count,
                                    std::chrono::milliseconds timeout = std::chrono::seconds(5));

 private:
  struct Connection {
    int fd;
    size_t index;  // order of acceptance
    std::string bytes;
  };

  void Serve();
  bool AcceptOne(std::vector<Connection>& reading, std::vector<int>& held);
  void Finish(Connection& connection);

  std::string m_path;
  int m_listen = -1;
  int m_wake[2] = {-1, -1};
  int m_dummy = -1;  // kHoldConnect's own connection that fills the backlog
  std::thread m_thread;

  std::mutex m_mutex;
  std::condition_variable m_changed;
  Behaviour m_behaviour;
  bool m_discardNext = false;  // the next accepted connection is m_dummy's
  bool m_stopping = false;
  size_t m_accepted = 0;
  std::vector<std::pair<size_t, std::string>> m_ended;
};

// The fixture every library test derives from: its own sandbox root, a fresh fake platform with
// the shares "photo" and "video" on /volume1 of the sandbox, the log captured, the last error
// cleared and LOG_LEVEL back at its initial 3.
class LibraryTest : public ::testing::Test {
 protected:
  LibraryTest();
  ~LibraryTest() override;

  // The sandbox's status.conf, parsed. Fails the test when it is missing or not JSON.
  static Json::Value StatusFile();

  Sandbox sandbox;
  LogCapture log;
  std::string volume;  // the sandbox's /volume1
};

}  // namespace testsupport

#endif  // FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_
