#include "fileindex/daemon.h"

#include "utils/daemon_probe.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>

#include "json_io.h"
#include "paths.h"
#include "unique_fd.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

// The frame goes out in pieces of at most this size; the daemon reads the stream whole, so the
// piece size is not part of the frame.
constexpr size_t kWriteChunk = 1024;

// With a one-second send timeout, three interrupted or timed-out writes bound the time a daemon
// that stopped reading can hold the caller to about three seconds.
constexpr int kInterruptedWritesAllowed = 3;

// How long a connect waits for room in a busy daemon's backlog, and each send for room in the
// socket's buffer.
constexpr timeval kSendTimeout{1, 0};

// Writes all `count` bytes of `buffer` to `fd`. `interruptionsLeft` is shared by every write of
// one command, so the whole frame, not each part of it, has the bounded number of retries.
bool WriteAll(int fd, size_t count, const char* buffer, int& interruptionsLeft) {
  size_t done = 0;
  while (done < count) {
    // A daemon that goes away while the frame is being written must cost the caller a failed
    // call (EPIPE), not its process; the flag spares the host process a SIGPIPE disposition of
    // the library's choosing.
    const ssize_t written =
        send(fd, buffer + done, std::min(count - done, kWriteChunk), MSG_NOSIGNAL);
    if (written > 0) {
      done += static_cast<size_t>(written);
      continue;
    }
    const bool interrupted =
        written < 0 && (errno == EINTR || errno == EAGAIN || errno == EWOULDBLOCK);
    // Anything else (the daemon closed the connection, the connection was reset, nothing could
    // be written) will not get better by trying again.
    if (!interrupted || --interruptionsLeft <= 0) {
      return false;
    }
  }
  return true;
}

// Connects `sock` to the daemon's socket. False when the path does not fit or nobody accepts.
bool ConnectToDaemon(const UniqueFd& sock) {
  if (!sock) {
    return false;
  }
  const std::string path = DaemonSocketPath();
  sockaddr_un address{};
  // A truncated path would name another socket; better not to reach the daemon at all.
  if (path.size() + 1 > sizeof(address.sun_path)) {
    return false;
  }
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  // Set before connecting: a local stream connect waits for room in the daemon's backlog for as
  // long as the send timeout allows (then EAGAIN), and without one it waits for good, with the
  // caller's configuration lock held.
  return setsockopt(sock.get(), SOL_SOCKET, SO_SNDTIMEO, &kSendTimeout, sizeof(kSendTimeout)) ==
             0 &&
         connect(sock.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
}

}  // namespace

bool DaemonAcceptsConnection() {
  const UniqueFd sock(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return ConnectToDaemon(sock);
}

bool SendCammandToDaemon(const std::string& type, const Json::Value& data) {
  const UniqueFd sock(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!ConnectToDaemon(sock)) {
    return false;
  }

  Json::Value command(Json::objectValue);
  command["type"] = type;
  command["data"] = data;
  const std::string text = JsonToString(command);
  if (text.size() >= UINT32_MAX) {
    return false;  // the length field cannot describe it
  }

  // The length counts the terminating zero, which is sent too: c_str() provides it.
  const auto length = static_cast<uint32_t>(text.size() + 1);
  int interruptionsLeft = kInterruptedWritesAllowed;
  const bool sent = WriteAll(sock.get(), sizeof(length), reinterpret_cast<const char*>(&length),
                             interruptionsLeft) &&
                    WriteAll(sock.get(), text.size() + 1, text.c_str(), interruptionsLeft);
  return sent;
}

}  // namespace FILEINDEX
}  // namespace WEZO
