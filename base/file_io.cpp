#include "file_io.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <ctime>

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

// mkstemp's suffix: as many letters and digits as the template has X's.
constexpr char kTemporarySuffix[] = ".XXXXXX";
constexpr size_t kRandomLength = sizeof(kTemporarySuffix) - 2;

bool IsTemporaryName(const std::string& name, const std::string& base) {
  if (name.size() != base.size() + 1 + kRandomLength || name.compare(0, base.size(), base) != 0 ||
      name[base.size()] != '.') {
    return false;
  }
  for (size_t i = base.size() + 1; i < name.size(); ++i) {
    const char c = name[i];
    if (!((c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9'))) {
      return false;
    }
  }
  return true;
}

}  // namespace

void RemoveStaleTemporaries(const std::string& path, time_t minAgeSeconds) {
  const size_t slash = path.rfind('/');
  const std::string base = slash == std::string::npos ? path : path.substr(slash + 1);
  const int dirFd = open(DirectoryOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (dirFd < 0) {
    return;
  }
  DIR* dir = fdopendir(dirFd);  // takes the descriptor
  if (dir == nullptr) {
    close(dirFd);
    return;
  }
  const time_t now = time(nullptr);
  while (const dirent* entry = readdir(dir)) {
    const std::string name = entry->d_name;
    struct stat st {};
    if (!IsTemporaryName(name, base) ||
        fstatat(dirFd, name.c_str(), &st, AT_SYMLINK_NOFOLLOW) != 0 || !S_ISREG(st.st_mode) ||
        (minAgeSeconds > 0 && now - st.st_mtime < minAgeSeconds)) {
      continue;
    }
    // Should a link have taken the name since, unlinkat removes the link, never its target.
    (void)unlinkat(dirFd, name.c_str(), 0);
  }
  closedir(dir);
}

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
  std::string tmpPath = path + kTemporarySuffix;
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

bool AppendLineAligned(int fd, const std::string& line, ssize_t& written, size_t& wanted) {
  written = 0;
  wanted = 0;
  struct stat st {};
  if (fstat(fd, &st) != 0) {
    return false;
  }
  char last = '\n';
  if (st.st_size > 0 && pread(fd, &last, 1, st.st_size - 1) != 1) {
    return false;
  }
  const std::string data = last == '\n' ? line : '\n' + line;
  wanted = data.size();
  written = write(fd, data.data(), data.size());
  if (written == static_cast<ssize_t>(data.size())) {
    return true;
  }
  if (written > 0) {
    (void)ftruncate(fd, st.st_size);
  }
  return false;
}

}  // namespace FILEINDEX
}  // namespace WEZO
