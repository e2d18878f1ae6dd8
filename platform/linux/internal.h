// Helpers shared by the generic-Linux platform's units.
//
// Nothing here logs: each helper returns a result and the platform operation that called it
// records the failure in the last-error slot. Every function may be called from any thread.
#ifndef WEZO_PLATFORM_LINUX_INTERNAL_H_
#define WEZO_PLATFORM_LINUX_INTERNAL_H_

#include <sys/types.h>

#include <string>

namespace WEZO {
namespace PLATFORM {

// Error numbers of this platform besides the three of wezo/platform.h.
constexpr int kErrNotFound = 0x0E00;   // no such share, or no share holds the path
constexpr int kErrSystem = 0x0F00;     // a system call failed
constexpr int kErrBadConfig = 0x1000;  // the SMB configuration holds a value that is not valid
constexpr int kErrProgram = 0x1100;    // a program could not run or did not exit with status 0

// The source file's name without its directories, for the last-error slot.
constexpr const char* BaseName(const char* path) {
  const char* base = path;
  for (const char* p = path; *p != '\0'; ++p) {
    if (*p == '/') {
      base = p + 1;
    }
  }
  return base;
}

// Records `code` as the last error and returns -1.
int Fail(int code, const char* file, int line);

// The fixed absolute path `fixedPath` under the library's root prefix.
std::string Rooted(const char* fixedPath);

}  // namespace PLATFORM
}  // namespace WEZO

#define PLATFORM_FAIL(code) \
  ::WEZO::PLATFORM::Fail((code), ::WEZO::PLATFORM::BaseName(__FILE__), __LINE__)

#endif  // WEZO_PLATFORM_LINUX_INTERNAL_H_
