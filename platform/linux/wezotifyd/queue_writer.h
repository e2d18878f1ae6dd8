// Appends event lines to a client's queue file, the way every writer of a queue does: under an
// exclusive flock of the queue file itself, one write per line on an O_APPEND descriptor, each
// line ending in "\n" and never glued to a torn last line.
#ifndef WEZO_WEZOTIFYD_QUEUE_WRITER_H_
#define WEZO_WEZOTIFYD_QUEUE_WRITER_H_

#include <string>
#include <vector>

namespace WEZO {
namespace WEZOTIFYD {

enum class AppendResult {
  kWritten,  // every line is in the queue, whole
  kRefused,  // the queue or its folder is a link, not a regular file, or cannot be opened
  kLost,     // the queue was opened, but some lines could not be written (lock stayed busy, I/O)
};

// Appends `lines` (each ending in "\n") to the queue file at `queuePath`, creating it with mode
// 0644. The queue's folder and the queue itself are opened without following a symbolic link, and
// without blocking on a FIFO. The lock is waited for a bounded time. errno tells why on failure.
AppendResult AppendLines(const std::string& queuePath, const std::vector<std::string>& lines);

}  // namespace WEZOTIFYD
}  // namespace WEZO

#endif  // WEZO_WEZOTIFYD_QUEUE_WRITER_H_
