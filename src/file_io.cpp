#include "file_io.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "unique_fd.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

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

bool ReadWholeFile(const std::string& path, std::string& out) {
  UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd) {
    return false;
  }
  std::string data;
  char buffer[65536];
  for (;;) {
    const ssize_t n = read(fd.get(), buffer, sizeof buffer);
    if (n < 0) {
      if (errno == EINTR) {
        continue;
      }
      const int saved = errno;
      fd.Close();
      errno = saved;
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

ReplaceResult ReplaceFile(const std::string& path, const std::string& data, mode_t mode) {
  std::string tmpPath = path + ".XXXXXX";
  UniqueFd fd(mkostemp(tmpPath.data(), O_CLOEXEC));
  if (!fd) {
    return ReplaceResult::kFailed;
  }
  const bool modeSet = fchmod(fd.get(), mode) == 0;
  if (!WriteAll(fd.get(), data) || fsync(fd.get()) != 0 || fd.Close() != 0 ||
      rename(tmpPath.c_str(), path.c_str()) != 0) {
    const int saved = errno;
    unlink(tmpPath.c_str());
    errno = saved;
    return ReplaceResult::kFailed;
  }
  // The rename is durable only once the directory entry is on disk too.
  UniqueFd dir(open(DirectoryOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (dir) {
    fsync(dir.get());
  }
  return modeSet ? ReplaceResult::kReplaced : ReplaceResult::kReplacedModeNotSet;
}

}  // namespace FILEINDEX
}  // namespace WEZO
