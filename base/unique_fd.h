// A file descriptor that closes itself.
#ifndef FILEINDEX_BASE_UNIQUE_FD_H_
#define FILEINDEX_BASE_UNIQUE_FD_H_

#include <unistd.h>

#include <utility>

namespace WEZO {
namespace FILEINDEX {

class UniqueFd {
 public:
  UniqueFd() = default;
  explicit UniqueFd(int fd) : m_fd(fd) {}
  ~UniqueFd() { Close(); }

  UniqueFd(UniqueFd&& other) noexcept : m_fd(std::exchange(other.m_fd, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    if (this != &other) {
      Close();
      m_fd = std::exchange(other.m_fd, -1);
    }
    return *this;
  }
  UniqueFd(const UniqueFd&) = delete;
  UniqueFd& operator=(const UniqueFd&) = delete;

  int get() const { return m_fd; }
  explicit operator bool() const { return m_fd >= 0; }

  // Gives the descriptor up without closing it; the caller owns it from now on.
  int Release() { return std::exchange(m_fd, -1); }

  // Closes now; returns close()'s result, 0 when nothing was open.
  int Close() {
    if (m_fd < 0) {
      return 0;
    }
    return close(std::exchange(m_fd, -1));
  }

 private:
  int m_fd = -1;
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_BASE_UNIQUE_FD_H_
