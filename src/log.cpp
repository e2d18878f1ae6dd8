#include "log.h"

#include <syslog.h>

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

  std::string text(256, '\0');
  const int prefix = std::snprintf(text.data(), text.size(), "%s:%d ", unit, line);
  if (prefix < 0) {
    errno = savedErrno;
    return;
  }
  std::va_list args;
  va_start(args, format);
  std::va_list again;
  va_copy(again, args);
  int body = std::vsnprintf(text.data() + prefix, text.size() - prefix, format, args);
  if (body >= 0 && static_cast<size_t>(prefix + body) >= text.size()) {
    text.resize(static_cast<size_t>(prefix + body) + 1);
    body = std::vsnprintf(text.data() + prefix, text.size() - prefix, format, again);
  }
  va_end(again);
  va_end(args);
  if (body >= 0) {
    text.resize(static_cast<size_t>(prefix + body));
    g_sink(LOG_ERR, text.c_str());
  }
  errno = savedErrno;
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
