#include "config/snapshot.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <ctime>
#include <mutex>
#include <utility>

#include "fileindex/utils.h"
#include "json_io.h"
#include "paths.h"
#include "unique_fd.h"
#include "utils/share_record.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr long long kNanosPerSecond = 1000000000LL;

std::atomic<long long> g_settleNanos{2 * kNanosPerSecond};

// What tells one file from another at a path: a save renames a new inode into place, and a
// change in place moves the size or the times.
struct FileStamp {
  dev_t dev = 0;
  ino_t ino = 0;
  off_t size = 0;
  timespec mtime{};
  timespec ctime{};
};

long long Nanos(const timespec& t) {
  return static_cast<long long>(t.tv_sec) * kNanosPerSecond + t.tv_nsec;
}

bool operator==(const FileStamp& a, const FileStamp& b) {
  return a.dev == b.dev && a.ino == b.ino && a.size == b.size && Nanos(a.mtime) == Nanos(b.mtime) &&
         Nanos(a.ctime) == Nanos(b.ctime);
}

FileStamp StampOf(const struct stat& st) {
  return {st.st_dev, st.st_ino, st.st_size, st.st_mtim, st.st_ctim};
}

// Whether every later change of the file will show in its times: it last changed long enough ago
// that a write now gets a later timestamp however coarse the file system's clock.
bool Settled(const FileStamp& stamp) {
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  return Nanos(now) - std::max(Nanos(stamp.mtime), Nanos(stamp.ctime)) >= g_settleNanos.load();
}

// One snapshot kept per file; the pointer is swapped under the mutex, the value never changes.
template <typename T>
class Keeper {
 public:
  std::shared_ptr<const T> Find(const std::string& path, const FileStamp& stamp) const {
    std::shared_ptr<const Kept> kept;
    {
      std::lock_guard<std::mutex> lock(m_mutex);
      kept = m_kept;
    }
    if (kept != nullptr && kept->stamp == stamp && kept->path == path) {
      return kept->value;
    }
    return nullptr;
  }

  void Keep(const std::string& path, const FileStamp& stamp, std::shared_ptr<const T> value) {
    auto kept = std::make_shared<const Kept>(Kept{path, stamp, std::move(value)});
    std::lock_guard<std::mutex> lock(m_mutex);
    m_kept = std::move(kept);
  }

  void Forget() {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_kept.reset();
  }

 private:
  struct Kept {
    std::string path;
    FileStamp stamp;
    std::shared_ptr<const T> value;
  };
  mutable std::mutex m_mutex;
  std::shared_ptr<const Kept> m_kept;
};

Keeper<FolderSnapshot>& FolderKeeper() {
  static Keeper<FolderSnapshot> keeper;
  return keeper;
}

Keeper<Status>& StatusKeeper() {
  static Keeper<Status> keeper;
  return keeper;
}

// The whole regular file at `path`, never through a link, with its stamp taken after the read: a
// change made while it was read shows as a recent change, and such a snapshot is not kept.
bool ReadStamped(const std::string& path, std::string& text, FileStamp& stamp) {
  const UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  struct stat st {};
  if (!fd || fstat(fd.get(), &st) != 0 || !S_ISREG(st.st_mode)) {
    return false;
  }
  text.resize(static_cast<size_t>(st.st_size) + 1);
  size_t done = 0;
  for (;;) {
    if (done == text.size()) {
      text.resize(text.size() * 2);
    }
    const ssize_t got = read(fd.get(), &text[done], text.size() - done);
    if (got == 0) {
      break;
    }
    if (got < 0) {
      if (errno == EINTR) {
        continue;
      }
      return false;
    }
    done += static_cast<size_t>(got);
  }
  text.resize(done);
  if (fstat(fd.get(), &st) != 0) {
    return false;
  }
  stamp = StampOf(st);
  return true;
}

// The snapshot of the file at `path`. `make` builds one from the parsed document, which it may
// take over, or null when
// the document will not do; `load` reads the file as its class does, which logs and sets the code
// of a failure, and also serves a file that was replaced while it was read here.
template <typename T, typename Make, typename Load>
std::shared_ptr<const T> Acquire(Keeper<T>& keeper, const std::string& path,
                                 const std::shared_ptr<const T>& none, Make make, Load load) {
  struct stat st {};
  // As Config::LoadJson: anything but a regular file, a link included, is no file.
  if (lstat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) {
    return none;
  }
  if (auto kept = keeper.Find(path, StampOf(st))) {
    return kept;
  }
  std::string text;
  FileStamp stamp;
  Json::Value document;
  std::shared_ptr<const T> value;
  if (ReadStamped(path, text, stamp) && JsonFromString(document, text)) {
    value = make(document);
  }
  if (value == nullptr) {
    return load();
  }
  if (Settled(stamp)) {
    keeper.Keep(path, stamp, value);
  }
  return value;
}

// A status file answered from a document parsed here.
class StatusImage final : public Status {
 public:
  explicit StatusImage(Json::Value root) { m_jsRoot = std::move(root); }
};

bool PathLess(std::string_view a, std::string_view b) { return a < b; }

}  // namespace

FolderSnapshot::FolderSnapshot(std::vector<std::string> paths) : m_paths(std::move(paths)) {
  std::sort(m_paths.begin(), m_paths.end());
  for (const std::string& path : m_paths) {
    std::string share;
    if (GetShareNameByPath(share, path)) {
      m_shares.push_back(std::move(share));
    } else {
      m_unnamed = true;
    }
  }
  std::sort(m_shares.begin(), m_shares.end());
  m_shares.erase(std::unique(m_shares.begin(), m_shares.end()), m_shares.end());
}

FolderSnapshot::FolderSnapshot(Json::Value document) : FolderSnapshot(document.getMemberNames()) {
  m_document = std::move(document);
  m_hasDocument = true;
}

bool FolderSnapshot::Holds(std::string_view path) const {
  return std::binary_search(m_paths.begin(), m_paths.end(), path, PathLess);
}

bool FolderSnapshot::IsPathIndexed(const std::string& path) const {
  // A folder holds the path when the folder's path followed by "/" begins the path followed by
  // "/": the folder is one of the path's prefixes that end before a "/".
  const std::string target = path + "/";
  const std::string_view view(target);
  for (size_t slash = view.find('/'); slash != std::string_view::npos;
       slash = view.find('/', slash + 1)) {
    if (Holds(view.substr(0, slash))) {
      return true;
    }
  }
  return false;
}

bool FolderSnapshot::IsPathContainIndexed(const std::string& path) const {
  if (Holds(path)) {
    return true;
  }
  // The folders below the path are the contiguous run of paths that begin with it and a "/".
  const std::string below = path + "/";
  const auto first = std::lower_bound(m_paths.begin(), m_paths.end(), below, PathLess);
  return first != m_paths.end() && first->compare(0, below.size(), below) == 0;
}

bool FolderSnapshot::IsFullPathIndexed(const std::string& fullPath) const {
  const std::string target = fullPath + "/";
  const std::string_view view(target);
  for (const std::string& share : m_shares) {
    // A folder's full path is its share's volume followed by the folder's share path, as
    // GetFullPath forms it; the share is asked now, as a load of the list would.
    ShareRecord record;
    if (LookUpShare(share, record) < 0 || !record) {
      continue;
    }
    const std::string sharePath = SharePathOf(*record);
    const size_t slash = sharePath.rfind('/');
    const std::string_view volume = std::string_view(sharePath).substr(
        0, slash == std::string::npos ? sharePath.size() : slash);
    if (view.substr(0, volume.size()) != volume) {
      continue;
    }
    const std::string_view rest = view.substr(volume.size());
    for (size_t end = rest.find('/'); end != std::string_view::npos;
         end = rest.find('/', end + 1)) {
      const std::string_view candidate = rest.substr(0, end);
      std::string owner;
      if (Holds(candidate) && GetShareNameByPath(owner, std::string(candidate)) && owner == share) {
        return true;
      }
    }
  }
  return false;
}

bool FolderSnapshot::HoldsShare(const std::string& share) const {
  return std::binary_search(m_shares.begin(), m_shares.end(), share);
}

std::shared_ptr<const FolderSnapshot> FolderListSnapshot(FolderListLoader load) {
  static const auto kNone = std::make_shared<const FolderSnapshot>(std::vector<std::string>());
  return Acquire<FolderSnapshot>(
      FolderKeeper(), FolderConfPath(), kNone,
      [](Json::Value& document) -> std::shared_ptr<const FolderSnapshot> {
        if (!document.isObject()) {
          return nullptr;
        }
        return std::make_shared<const FolderSnapshot>(std::move(document));
      },
      load);
}

std::shared_ptr<const Status> StatusSnapshot() {
  static const std::shared_ptr<const Status> kNone = std::make_shared<const Status>();
  return Acquire<Status>(
      StatusKeeper(), StatusConfPath(), kNone,
      [](Json::Value& document) -> std::shared_ptr<const Status> {
        return std::make_shared<const StatusImage>(std::move(document));
      },
      []() -> std::shared_ptr<const Status> {
        auto status = std::make_shared<Status>();
        if (!status->Load()) {
          return nullptr;
        }
        return status;
      });
}

namespace detail {

void ForgetConfigSnapshots() {
  FolderKeeper().Forget();
  StatusKeeper().Forget();
}

void SetSnapshotSettleTime(std::chrono::nanoseconds settle) {
  g_settleNanos.store(static_cast<long long>(settle.count()));
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
