#include "utils/log.h"

#include <syslog.h>
#include <wezo/platform.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string>

#include "fileindex/error.h"

namespace WEZO {
namespace FILEINDEX {
namespace detail {
namespace {

void SyslogSink(int priority, const char* line) { syslog(priority, "%s", line); }

LogSink g_sink = SyslogSink;

}  // namespace

std::string ErrnoText() {
  const int saved = errno;
  char buffer[256];
  // The GNU strerror_r returns the text, which need not be in `buffer`.
  std::string text = strerror_r(saved, buffer, sizeof buffer);
  errno = saved;
  return text;
}

void SetLogSink(LogSink sink) { g_sink = sink != nullptr ? sink : SyslogSink; }

void WriteLog(bool debugOnly, const char* unit, int line, const char* format, ...) {
  if (debugOnly && LOG_LEVEL != LOG_DEBUG) {
    return;
  }
  const int savedErrno = errno;

  va_list args;
  va_start(args, format);
  char buffer[1024];
  const int length = std::vsnprintf(buffer, sizeof buffer, format, args);
  va_end(args);
  if (length < 0) {
    errno = savedErrno;
    return;
  }
  std::string message;
  if (static_cast<size_t>(length) < sizeof buffer) {
    message.assign(buffer, static_cast<size_t>(length));
  } else {
    // Too long for the stack: format again into a buffer of the right size.
    message.resize(static_cast<size_t>(length) + 1);
    va_start(args, format);
    (void)std::vsnprintf(message.data(), message.size(), format, args);
    va_end(args);
    message.resize(static_cast<size_t>(length));
  }
  const std::string text = std::string(unit) + ":" + std::to_string(line) + " " + message;
  g_sink(LOG_ERR, text.c_str());
  errno = savedErrno;
}

void WritePlatformFailure(const char* unit, int line, const char* what) {
  const char* file = WLIBCErrorGetFile();
  WriteLog(false, unit, line, "%s failed: err=[0x%04X %s:%d]", what,
           static_cast<unsigned>(WLIBCErrGet()), file != nullptr ? file : "", WLIBCErrorGetLine());
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
