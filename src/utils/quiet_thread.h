// A thread of the library's own, started inside a call and joined before the call returns.
#ifndef FILEINDEX_SRC_UTILS_QUIET_THREAD_H_
#define FILEINDEX_SRC_UTILS_QUIET_THREAD_H_

#include <functional>
#include <thread>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

// Runs `work` on a new thread that starts with every signal blocked, so that none meant for the
// caller's threads is delivered to it. The thread is not joinable when none could be started
// (the caller then does the work itself).
std::thread StartQuietThread(std::function<void()> work);

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_QUIET_THREAD_H_
