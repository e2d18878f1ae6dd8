// Whether the indexing daemon is up, asked of its command socket.
#ifndef FILEINDEX_SRC_UTILS_DAEMON_PROBE_H_
#define FILEINDEX_SRC_UTILS_DAEMON_PROBE_H_

namespace WEZO {
namespace FILEINDEX {

// True when a connection to the daemon's socket is accepted (waiting at most a second for room in
// a full backlog); the connection is closed at once without a command, which the daemon takes as
// a connection that ended before its frame. Neither logs nor sets a code.
bool DaemonAcceptsConnection();

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_DAEMON_PROBE_H_
