// The last-error slot, one per thread, and the file helpers of internal.h.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <cerrno>
#include <cstdio>

#include "fileindex/root.h"
#include "internal.h"
#include "unique_fd.h"

namespace {

thread_local int t_code = 0;
thread_local int t_line = 0;
thread_local char t_file[128] = "";

bool WriteAll(int fd, const std::string& data) {
  size_t done = 0;
  while (done < data.size()) {
    const ssize_t n = write(fd, data.data() + done, data.size() - done);
    if (n < 0) {
      if (errno == EINTR) {
        continue;
      }
      return false;
    }
    done += static_cast<size_t>(n);
  }
  return true;
}

std::string DirectoryOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  if (slash == std::string::npos) {
    return ".";
  }
  return slash == 0 ? "/" : path.substr(0, slash);
}

}  // namespace

namespace WEZO {
namespace PLATFORM {

int Fail(int code, const char* file, int line) {
  WLIBCErrSetEx(code, file, line);
  return -1;
}

std::string Rooted(const char* fixedPath) { return FILEINDEX::GetRootPrefix() + fixedPath; }

bool ReadWholeFile(const std::string& path, std::string& out) {
  FILEINDEX::UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd) {
    return false;
  }
  std::string data;
  char buffer[16384];
  for (;;) {
    const ssize_t n = read(fd.get(), buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) {
      continue;
    }
    if (n < 0) {
      return false;
    }
    if (n == 0) {
      break;
    }
    data.append(buffer, static_cast<size_t>(n));
  }
  out.swap(data);
  return true;
}

bool ReplaceFile(const std::string& path, const std::string& data, mode_t mode) {
  std::string tmpPath = path + ".XXXXXX";
  FILEINDEX::UniqueFd fd(mkostemp(tmpPath.data(), O_CLOEXEC));
  if (!fd) {
    return false;
  }
  if (fchmod(fd.get(), mode) != 0 || !WriteAll(fd.get(), data) || fsync(fd.get()) != 0 ||
      fd.Close() != 0 || rename(tmpPath.c_str(), path.c_str()) != 0) {
    const int saved = errno;
    unlink(tmpPath.c_str());
    errno = saved;
    return false;
  }
  // The rename is durable only once the directory entry is on disk too.
  FILEINDEX::UniqueFd dir(open(DirectoryOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (dir) {
    fsync(dir.get());
  }
  return true;
}

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
