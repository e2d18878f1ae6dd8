#include "utils/read_ahead.h"

#include <pthread.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

#include "utils/line_index.h"

namespace WEZO {
namespace FILEINDEX {
namespace detail {

std::unique_ptr<ReadAhead> ReadAhead::Start(int fd) {
  std::unique_ptr<ReadAhead> ahead(new ReadAhead(fd));
  // The thread inherits the mask: with every signal blocked, none meant for the caller's threads
  // is delivered to it.
  sigset_t all;
  sigset_t before;
  sigfillset(&all);
  if (pthread_sigmask(SIG_SETMASK, &all, &before) != 0) {
    return nullptr;
  }
  try {
    ahead->m_thread = std::thread(&ReadAhead::Run, ahead.get());
  } catch (const std::system_error&) {
    ahead.reset();
  }
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  return ahead;
}

ReadAhead::~ReadAhead() {
  if (!m_thread.joinable()) {
    return;
  }
  {
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_quit = true;
  }
  m_changed.notify_all();
  m_thread.join();
}

void ReadAhead::Ask(off_t at, char* to, size_t size, uint64_t* stops) {
  {
    std::unique_lock<std::mutex> lock(m_mutex);
    m_changed.wait(lock, [this] { return !m_pending || m_done; });
    m_pending = true;
    m_done = false;
    m_at = at;
    m_to = to;
    m_size = size;
    m_stops = stops;
  }
  m_asked = at;
  m_changed.notify_all();
}

ssize_t ReadAhead::Wait() {
  std::unique_lock<std::mutex> lock(m_mutex);
  m_changed.wait(lock, [this] { return !m_pending || m_done; });
  m_asked = -1;
  const ssize_t got = m_pending ? m_got : 0;
  m_pending = false;
  return got;
}

void ReadAhead::Run() {
  std::unique_lock<std::mutex> lock(m_mutex);
  for (;;) {
    m_changed.wait(lock, [this] { return m_quit || (m_pending && !m_done); });
    if (m_quit) {
      return;
    }
    const off_t at = m_at;
    char* const to = m_to;
    const size_t size = m_size;
    uint64_t* const stops = m_stops;
    lock.unlock();
    size_t got = 0;
    bool failed = false;
    while (got < size) {
      const ssize_t n = pread(m_fd, to + got, size - got, at + static_cast<off_t>(got));
      if (n < 0 && errno == EINTR) {
        continue;
      }
      failed = n < 0;
      if (n <= 0) {
        break;
      }
      got += static_cast<size_t>(n);
    }
    if (stops != nullptr && got > 0) {
      LineIndex::Mark(to, got, stops);
    }
    lock.lock();
    m_got = got > 0 || !failed ? static_cast<ssize_t>(got) : -1;
    m_done = true;
    m_changed.notify_all();
  }
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
