// The last-error slot, one per thread, and the root prefix of the platform's own files.
#include <wezo/platform.h>

#include <cstdio>

#include "fileindex/root.h"
#include "internal.h"

namespace {

thread_local int t_code = 0;
thread_local int t_line = 0;
thread_local char t_file[128] = "";

}  // namespace

namespace WEZO {
namespace PLATFORM {

int Fail(int code, const char* file, int line) {
  WLIBCErrSetEx(code, file, line);
  return -1;
}

std::string Rooted(const char* fixedPath) { return FILEINDEX::GetRootPrefix() + fixedPath; }

}  // namespace PLATFORM
}  // namespace WEZO

extern "C" {

int WLIBCErrGet(void) { return t_code; }

const char* WLIBCErrorGetFile(void) { return t_file; }

int WLIBCErrorGetLine(void) { return t_line; }

void WLIBCErrSetEx(int code, const char* szFile, int line) {
  t_code = code;
  t_line = line;
  (void)std::snprintf(t_file, sizeof t_file, "%s", szFile != nullptr ? szFile : "");
}

}  // extern "C"
