// Shared helpers of the library's tests: the fixture with its sandbox root, the captured log,
// another process that holds a file lock, and a stand-in daemon on the socket.
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
#include <vector>

#include "sandbox.h"

namespace Json {
// Failed expectations show JSON values as text.
inline void PrintTo(const Value& value, std::ostream* os) { *os << value.toStyledString(); }
}  // namespace Json

namespace testsupport {

// Reads back what the library logged. Lines() replaces each line's source line number by "N"
// ("config:N Failed to lock folder") and prefixes a line logged at any priority but LOG_ERR with
// "priority=<n> ".
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

// A stand-in for the indexing daemon: a listening Unix socket at the sandbox's daemon socket
// path, served one connection at a time by a thread that never calls into the library. Create
// it after the root prefix is set.
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

  // For kHoldConnect: from now on behave as kRead.
  void Release();
  // The bytes received on each ended connection, in order (length field included; empty for a
  // connection closed unread), once `count` have ended or `timeout` passed.
  std::vector<std::string> Connections(size_t count,
                                       std::chrono::milliseconds timeout = std::chrono::seconds(5));
  // The same, each decoded: fails the test on a bad frame (a length field that is not the rest's
  // size, no single terminating zero) and parses the JSON text.
  std::vector<Json::Value> Commands(size_t count,
                                    std::chrono::milliseconds timeout = std::chrono::seconds(5));

 private:
  void Serve();
  bool Wait(int fd);  // until `fd` is readable (true) or the daemon stops (false)

  std::string m_path;
  int m_listen = -1;
  int m_wake[2] = {-1, -1};
  int m_dummy = -1;  // kHoldConnect's own connection that fills the backlog
  std::thread m_thread;
  std::mutex m_mutex;
  std::condition_variable m_changed;
  Behaviour m_behaviour;
  bool m_stopping = false;
  std::vector<std::string> m_ended;
};

// The fixture of every library test: its own sandbox root with the appliance's directories, a
// fresh fake platform with the shares "photo" and "video" on /volume1 of the sandbox, the log
// captured, the last error cleared and LOG_LEVEL back at its initial 3.
class LibraryTest : public SandboxTest {
 protected:
  LibraryTest();

  // The sandbox's status.conf, parsed. Fails the test when it is missing or not JSON.
  static Json::Value StatusFile();

  // The sandbox as the tests written before SandboxTest name it: Path("/x"), Root().
  struct Paths {
    const std::string& root;
    std::string Path(const std::string& relative) const { return root + relative; }
    const std::string& Root() const { return root; }
  } sandbox{root_};
  LogCapture log;
  std::string volume;  // the sandbox's /volume1
};

}  // namespace testsupport

#endif  // FILEINDEX_TESTS_SUPPORT_TEST_SUPPORT_H_
