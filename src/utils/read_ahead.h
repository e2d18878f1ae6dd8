// The next block of a file read on a second thread while the reader works on the one it holds.
//
// A scan of a large queue costs a copy of each block out of the page cache and the reader's own
// pass over it. With the copy made ahead, on another processor, the scan costs little more than
// the pass. The thread lives as long as the ReadAhead, starts with every signal blocked, and
// only ever reads the file into the buffer it was given; when it cannot be started, the reader
// reads for itself.
#ifndef FILEINDEX_SRC_UTILS_READ_AHEAD_H_
#define FILEINDEX_SRC_UTILS_READ_AHEAD_H_

#include <sys/types.h>

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <thread>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

class ReadAhead {
 public:
  // A thread that reads `fd` when asked; null when none could be started.
  static std::unique_ptr<ReadAhead> Start(int fd);
  // Waits for a read still running.
  ~ReadAhead();
  ReadAhead(const ReadAhead&) = delete;
  ReadAhead& operator=(const ReadAhead&) = delete;

  // Reads up to `size` bytes from `at` into `to` on the thread, and with `stops`, finds their
  // stops into it (LineIndex::Mark): both are the thread's until Wait returns. A read asked
  // before is waited for first.
  void Ask(off_t at, char* to, size_t size, uint64_t* stops);
  // Where the read asked last begins, or -1 once it was waited for.
  off_t Asked() const { return m_asked; }
  // Waits for the read asked last: the bytes read, 0 at the end of the file, -1 on a read error.
  ssize_t Wait();

 private:
  explicit ReadAhead(int fd) : m_fd(fd) {}
  void Run();

  const int m_fd;
  off_t m_asked = -1;  // the reader's own record
  std::mutex m_mutex;
  std::condition_variable m_changed;
  // Under m_mutex: the read wanted or running, and its answer.
  bool m_pending = false;
  bool m_done = false;
  bool m_quit = false;
  off_t m_at = 0;
  char* m_to = nullptr;
  size_t m_size = 0;
  uint64_t* m_stops = nullptr;
  ssize_t m_got = 0;
  std::thread m_thread;  // last: it starts once the rest is there
};

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_READ_AHEAD_H_
