#include "utils/quiet_thread.h"

#include <pthread.h>
#include <csignal>

#include <system_error>
#include <utility>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

std::thread StartQuietThread(std::function<void()> work) {
  // A new thread inherits the mask of the thread that starts it.
  sigset_t all;
  sigset_t before;
  sigfillset(&all);
  if (pthread_sigmask(SIG_SETMASK, &all, &before) != 0) {
    return std::thread();
  }
  std::thread thread;
  try {
    thread = std::thread(std::move(work));
  } catch (const std::system_error&) {
    thread = std::thread();
  }
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  return thread;
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
