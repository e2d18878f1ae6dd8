// The library's one way of writing a log line.
//
// Every line goes to the system log at LOG_ERR as "<unit>:<line> <message>", where <unit> is the
// source file's name without extension, or the name of its folder for a file that serves that
// unit (src/status_mgr/progress.cpp logs as "status_mgr"). A source file defines
// FILEINDEX_LOG_UNIT before including this header. Lines written with FILEINDEX_LOG_DEBUG appear
// only while LOG_LEVEL is exactly 7; all others appear whatever LOG_LEVEL holds. Logging never
// changes errno.
//
// Formats are checked at compile time, which refuses syslog's %m; a line that names the reason
// of a failed call writes "reason=%s" with ErrnoText(), which prints what %m would.
#ifndef FILEINDEX_SRC_UTILS_LOG_H_
#define FILEINDEX_SRC_UTILS_LOG_H_

#include <string>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

// Where finished lines go: the system log unless a sink is installed. The tests install one to
// read the lines back.
using LogSink = void (*)(int priority, const char* line);

// Installs `sink` for every later line; nullptr restores the system log. Not thread-safe.
void SetLogSink(LogSink sink);

// The text of errno, as %m of syslog would print it. Leaves errno as it was.
std::string ErrnoText();

// Formats `format` (printf conventions) and writes
// "<unit>:<line> <formatted text>" at LOG_ERR. With `debugOnly`, writes only when LOG_LEVEL is 7.
void WriteLog(bool debugOnly, const char* unit, int line, const char* format, ...)
    __attribute__((format(gnu_printf, 4, 5)));

// Writes "<unit>:<line> <what> failed: err=[0x<code> <file>:<line>]" with the platform's last
// error: its code in four hex digits and the platform source place that set it.
void WritePlatformFailure(const char* unit, int line, const char* what);

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#define FILEINDEX_LOG(...) \
  ::WEZO::FILEINDEX::detail::WriteLog(false, FILEINDEX_LOG_UNIT, __LINE__, __VA_ARGS__)
#define FILEINDEX_LOG_DEBUG(...) \
  ::WEZO::FILEINDEX::detail::WriteLog(true, FILEINDEX_LOG_UNIT, __LINE__, __VA_ARGS__)

#define FILEINDEX_LOG_PLATFORM_FAILURE(what) \
  ::WEZO::FILEINDEX::detail::WritePlatformFailure(FILEINDEX_LOG_UNIT, __LINE__, what)

#endif  // FILEINDEX_SRC_UTILS_LOG_H_
