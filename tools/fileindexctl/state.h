// What fileindexctl finds out around a library call: the lines the library logs during it, whether
// the indexing daemon answers on its socket, and the state of its service. The library reports a
// failure after its save only as false and a log line; these tell the user what that left behind.
#ifndef FILEINDEXCTL_STATE_H_
#define FILEINDEXCTL_STATE_H_

#include <string>
#include <vector>

#include "output.h"

namespace fileindexctl {

// Collects what the library logs between construction and Stop(). The library logs through
// syslog; with LOG_PERROR each line is also written to stderr, which points into a memory file
// for the duration, so that the lines can be read back. Programs the library runs write their
// own stderr there too; Stop() passes that on, and the library's lines as well when `verbose`.
class LibraryCall {
 public:
  explicit LibraryCall(bool verbose);
  ~LibraryCall();
  LibraryCall(const LibraryCall&) = delete;
  LibraryCall& operator=(const LibraryCall&) = delete;

  void Stop();

  // The library's lines, "unit:line message", in the order written.
  const std::vector<std::string>& LogLines() const { return m_lines; }

 private:
  bool m_verbose;
  int m_capture = -1;
  int m_savedStderr = -1;
  std::vector<std::string> m_lines;
};

// The daemon socket under the root prefix.
std::string DaemonSocket();

// Empty when something accepts connections on the daemon socket, otherwise why not
// ("Connection refused"). Connects and closes without sending a frame.
std::string DaemonProblem();

// The state systemctl gives for the daemon's service ("active", "inactive", "failed"), or
// "unknown (...)" when it cannot be asked. Runs <root>/usr/bin/systemctl, as the platform does.
std::string ServiceState();

// The service's systemd unit.
constexpr char kServiceUnit[] = "fileindexd.service";
// How long the status report waits for systemctl to name the service's state.
constexpr int kServiceQuerySeconds = 5;

// The steps a library operation runs after its save, in order, named by key: "monitor",
// "service", "daemon", "queue", "clean", "unregister".
using Steps = std::vector<std::string>;

// The report of a failed call whose save took place: `saved` is what it saved, `steps` the
// operation's later steps; the failing one is the last that the call's log names.
Aftermath Diagnose(const LibraryCall& call, const Steps& steps, std::vector<Change> saved);

}  // namespace fileindexctl

#endif  // FILEINDEXCTL_STATE_H_
