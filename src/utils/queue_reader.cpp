#define FILEINDEX_LOG_UNIT "utils"

#include "utils/queue_reader.h"

#include <fcntl.h>
#include <json/value.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <string_view>
#include <thread>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "fileindex/queue.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "unique_fd.h"
#include "utils/block_reader.h"
#include "utils/folder_set.h"
#include "utils/log.h"
#include "utils/quiet_thread.h"
#include "utils/scan_bytes.h"
#include "utils/storage.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using detail::BlockReader;
using detail::FolderSet;
using detail::Hash;
using detail::kWindow;
using detail::ReadLine;
using detail::ReadOptions;

// The unit under which the folder reader logs: its callers report progress under that name.
constexpr const char* kFolderUnit = "status_mgr";

constexpr size_t kBlockSize = size_t{1} << 20;
// Reindex paths up to this length are remembered; a longer one makes the file's entry go.
constexpr size_t kRememberedPath = 4096;
// Past this many reindex paths, or folders asked about, a file's entry goes.
constexpr size_t kMaxRemembered = 4096;
// Queue files remembered at once; past it, the entry read longest ago goes.
constexpr size_t kMaxFiles = 64;
// The folder test reads a file in two halves at once when it has this many blocks to read, of at
// least this size.
constexpr off_t kSplitBlocks = 4;
constexpr size_t kSplitMinBlock = size_t{64} << 10;

int LogWidth(size_t size) { return static_cast<int>(std::min<size_t>(size, INT_MAX)); }

// ---------------------------------------------------------------------------------------------
// What each process remembers of the queue files it read.

struct FileState {
  dev_t dev = 0;
  ino_t ino = 0;
  off_t offset = 0;  // the end of the last complete line read
  size_t headSize = 0;
  uint64_t headHash = 0;
  size_t tailSize = 0;
  uint64_t tailHash = 0;
};

struct ReindexEntry {
  FileState file;
  std::unordered_set<std::string> paths;  // every reindex path before `file.offset`
};

struct FolderEntry {
  FileState file;
  std::map<std::string, bool> folders;  // every folder asked about: found before the offset?
  off_t logged = 0;                     // malformed lines that end before this were logged
};

template <typename Entry>
class Remembered {
 public:
  // Takes the entry of `queueFile` out, if there is one.
  bool Take(const std::string& queueFile, Entry& out) {
    const std::lock_guard<std::mutex> lock(m_mutex);
    const auto it = m_entries.find(queueFile);
    if (it == m_entries.end()) {
      return false;
    }
    out = std::move(it->second.second);
    m_entries.erase(it);
    return true;
  }

  void Put(const std::string& queueFile, Entry entry) {
    const std::lock_guard<std::mutex> lock(m_mutex);
    if (m_entries.size() >= kMaxFiles && m_entries.find(queueFile) == m_entries.end()) {
      auto oldest = m_entries.begin();
      for (auto it = m_entries.begin(); it != m_entries.end(); ++it) {
        if (it->second.first < oldest->second.first) {
          oldest = it;
        }
      }
      m_entries.erase(oldest);
    }
    m_entries[queueFile] = std::make_pair(++m_clock, std::move(entry));
  }

  void Clear() {
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_entries.clear();
  }

 private:
  std::mutex m_mutex;
  uint64_t m_clock = 0;
  std::unordered_map<std::string, std::pair<uint64_t, Entry>> m_entries;
};

Remembered<ReindexEntry>& ReindexMemory() {
  static Remembered<ReindexEntry> memory;
  return memory;
}

Remembered<FolderEntry>& FolderMemory() {
  static Remembered<FolderEntry> memory;
  return memory;
}

bool ReadExactly(int fd, off_t at, size_t size, std::string& out) {
  out.resize(size);
  size_t got = 0;
  while (got < size) {
    const ssize_t n = pread(fd, &out[got], size - got, at + static_cast<off_t>(got));
    if (n < 0 && errno == EINTR) {
      continue;
    }
    if (n <= 0) {
      return false;
    }
    got += static_cast<size_t>(n);
  }
  return true;
}

// Whether the file open at `fd` is still the file `state` describes with the same bytes before
// its offset. The daemon replaces a queue by renaming another file over it (a new inode) or
// truncates it; a truncated queue is shorter than the offset, or, once written again, holds
// other events, so other bytes, at its start and just before the offset.
bool StillTheSame(int fd, const FileState& state) {
  struct stat st {};
  if (fstat(fd, &st) != 0 || st.st_dev != state.dev || st.st_ino != state.ino ||
      st.st_size < state.offset) {
    return false;
  }
  std::string bytes;
  return ReadExactly(fd, 0, state.headSize, bytes) &&
         Hash(bytes.data(), bytes.size()) == state.headHash &&
         ReadExactly(fd, state.offset - static_cast<off_t>(state.tailSize), state.tailSize,
                     bytes) &&
         Hash(bytes.data(), bytes.size()) == state.tailHash;
}

// The hash of the `kWindow` bytes (or fewer, from the start of the file) before a point read to,
// when the reader still held them.
struct Tail {
  bool ok = false;
  uint64_t hash = 0;
  size_t size = 0;
};

// Describes what was read, up to the end of the last complete line `end`, of the file at `fd`,
// from the first bytes of the file `head` (when read from its start) and the window before
// `end`; false when it cannot be described (the bytes are no longer at hand).
bool Describe(int fd, const std::string& head, const Tail& tail, off_t end, const FileState* before,
              FileState& out) {
  struct stat st {};
  if (fstat(fd, &st) != 0) {
    return false;
  }
  out.dev = st.st_dev;
  out.ino = st.st_ino;
  out.offset = end;
  if (before != nullptr && before->offset == end) {
    out = *before;
    return true;
  }
  if (!tail.ok) {
    return false;
  }
  out.tailHash = tail.hash;
  out.tailSize = tail.size;
  if (before != nullptr &&
      static_cast<off_t>(before->headSize) == std::min<off_t>(end, static_cast<off_t>(kWindow))) {
    out.headSize = before->headSize;
    out.headHash = before->headHash;
    return true;
  }
  out.headSize = static_cast<size_t>(std::min<off_t>(end, static_cast<off_t>(kWindow)));
  if (head.size() < out.headSize) {
    return false;
  }
  out.headHash = Hash(head.data(), out.headSize);
  return true;
}

// True when nothing that could be a queue is at `queueFile`: it is missing, or it is not a regular
// file. Anything else that keeps it from being looked at (a link on the way, no descriptor left)
// is for the open to report.
bool NoQueueAt(const std::string& queueFile) {
  return !LocationFileExists(queueFile) &&
         (errno == ENOENT || errno == ENOTDIR || errno == EISDIR || errno == ENXIO);
}

// The line after the plain line at `p` when `set` dismisses its paths at once; nullptr for any
// other line.
inline const char* AfterDismissed(const detail::LineIndex& index, const char* p,
                                  const FolderSet& set) {
  bool moved = false;
  std::string_view path;
  std::string_view pathOld;
  const char* const newline = BlockReader::PlainLine(index, p, moved, path, pathOld);
  if (newline == nullptr || !set.Dismisses(path, path.size()) ||
      (moved && !set.Dismisses(pathOld, pathOld.size()))) {
    return nullptr;
  }
  return newline + 1;
}

// PassDismissed's walk from `p`: the stretch is walked from `p` and from its middle at once, and
// the second walk counts only once the first reaches where it began. The common line costs no
// call here, so that the walks stay in registers from one line to the next.
__attribute__((noinline)) const char* WalkDismissed(const detail::LineIndex& index, const char* p,
                                                    const FolderSet& set) {
  const char* const end = index.End();
  const char* mid = end;
  if (end - p >= 1024) {
    const void* newline = std::memchr(p + (end - p) / 2, '\n', static_cast<size_t>(end - p) / 2);
    mid = newline != nullptr ? static_cast<const char*>(newline) + 1 : end;
  }
  const char* second = mid;
  while (p < mid && second < end) {
    const char* const nextFirst = AfterDismissed(index, p, set);
    const char* const nextSecond = AfterDismissed(index, second, set);
    if (nextFirst == nullptr || nextSecond == nullptr) {
      p = nextFirst != nullptr ? nextFirst : p;
      second = nextSecond != nullptr ? nextSecond : second;
      break;
    }
    p = nextFirst;
    second = nextSecond;
  }
  while (p < mid) {
    const char* const next = AfterDismissed(index, p, set);
    if (next == nullptr) {
      return p;
    }
    p = next;
  }
  while (second < end) {
    const char* const next = AfterDismissed(index, second, set);
    if (next == nullptr) {
      break;
    }
    second = next;
  }
  return second;
}

// Passes over the plain lines from `p` in the stretch of `index` whose paths `set` dismisses at
// once, and returns where the first other line begins (or the stretch's end). Where a line ends
// is known only once it is read, so one walk waits on each line before the next: after the
// first line, the rest goes to WalkDismissed. A line that is not dismissed costs one reading here.
__attribute__((noinline)) const char* PassDismissed(const detail::LineIndex& index, const char* p,
                                                    const FolderSet& set) {
  const char* const next = AfterDismissed(index, p, set);
  return next == nullptr ? p : WalkDismissed(index, next, set);
}

// What a reading of lines found of reindex events.
struct ReindexPass {
  bool queued = false;                    // one for the path asked about
  bool keep = false;                      // whether `paths` holds every one read
  std::unordered_set<std::string> paths;  // while kept
  off_t end = 0;                          // after the last complete line read
};

// Reads the lines of `reader` into `pass` until a reindex event of `path` (with at most `limit`
// bytes of each path captured), the end of the file, or `cancel`.
void ReadReindex(BlockReader& reader, const std::string& path, size_t limit, ReindexPass& pass,
                 const std::atomic<bool>* cancel) {
  reader.OnlyReindexEvents();
  ReadLine line;
  while (!pass.queued && (cancel == nullptr || !cancel->load(std::memory_order_relaxed))) {
    // Lines without a hint of a reindex event are passed over in bulk.
    reader.SkipUnhinted(pass.end);
    if (!reader.Next(line, limit)) {
      break;
    }
    if (!line.isEvent || line.event.event != static_cast<unsigned int>(kEventReindex)) {
      if (line.ended) {
        pass.end = line.stop;
      }
      continue;
    }
    pass.queued = line.pathSize == path.size() && line.path == path;
    if (!line.ended) {
      continue;
    }
    pass.end = line.stop;
    if (pass.keep) {
      pass.keep = line.pathSize <= kRememberedPath && pass.paths.size() < kMaxRemembered;
      if (pass.keep) {
        pass.paths.emplace(line.path);
      }
    }
  }
}

// What a pass over lines found of the folders.
struct FolderPass {
  std::vector<bool> found;
  size_t left = 0;            // asked folders not found
  std::vector<size_t> marks;  // folders found in the line read last
  bool lastEnded = true;
  off_t end = 0;  // after the last complete line read
};

// Reads the lines of `reader` into `pass` while asked folders are left. With `quietUpTo` at 0 or
// more, a malformed line that ends after it is logged and read past; below 0 (the second half
// of a file), the pass stops before a malformed line or a last line without "\n", which the
// caller's thread reads, and once `cancel` is set.
void ReadFolders(BlockReader& reader, const std::vector<std::string>& wanted,
                 const std::vector<bool>& asked, FolderPass& pass, off_t quietUpTo,
                 const std::atomic<bool>* cancel) {
  FolderSet set(wanted, pass.found);
  ReadLine line;
  // Plain lines are tested straight from the buffer.
  struct {
    bool moved = false;
    std::string_view path;
    std::string_view pathOld;
  } plain;
  const auto test = [&](const detail::LineIndex& index, const char* begin, const char*& newline) {
    const char* const after = PassDismissed(index, begin, set);
    if (after != begin) {
      newline = after - 1;
      pass.marks.clear();
      pass.lastEnded = true;
      return BlockReader::Take::kSkip;
    }
    newline = BlockReader::PlainLine(index, begin, plain.moved, plain.path, plain.pathOld);
    if (newline == nullptr) {
      return BlockReader::Take::kRefuse;
    }
    pass.marks.clear();
    pass.left -= set.Mark(plain.path, plain.path.size(), asked, pass.found, pass.marks);
    if (plain.moved) {
      pass.left -= set.Mark(plain.pathOld, plain.pathOld.size(), asked, pass.found, pass.marks);
    }
    pass.lastEnded = true;
    return pass.left > 0 && (cancel == nullptr || !cancel->load(std::memory_order_relaxed))
               ? BlockReader::Take::kSkip
               : BlockReader::Take::kStop;
  };
  while (pass.left > 0 && (cancel == nullptr || !cancel->load(std::memory_order_relaxed)) &&
         reader.SkimPlain(test, pass.end) && reader.Next(line, set.Limit())) {
    if (quietUpTo < 0 && (!line.isEvent || !line.ended)) {
      break;
    }
    pass.marks.clear();
    if (!line.isEvent) {
      if (line.stop > quietUpTo) {
        detail::WriteLog(false, kFolderUnit, __LINE__, "Malformed command: %.*s",
                         LogWidth(line.text.size()), line.text.data());
      }
    } else {
      pass.left -= set.Mark(line.path, line.pathSize, asked, pass.found, pass.marks);
      if (line.event.event == static_cast<unsigned int>(kEventMoved)) {
        pass.left -= set.Mark(line.pathOld, line.pathOldSize, asked, pass.found, pass.marks);
      }
    }
    pass.lastEnded = line.ended;
    if (line.ended) {
      pass.end = line.stop;
    }
  }
}

// What the second thread found in the second half of a file. The thread is joined before this
// goes, whatever way the reading ends.
template <class Pass>
struct SecondHalf {
  SecondHalf() = default;
  SecondHalf(const SecondHalf&) = delete;
  SecondHalf& operator=(const SecondHalf&) = delete;
  ~SecondHalf() { Join(true); }

  // Runs `read(reader)` on a second thread over the file at `fd` from `split`, in blocks of
  // `blockSize`; false when no thread could be started.
  template <class F>
  bool Start(int fd, off_t split, size_t blockSize, F&& read) {
    thread = detail::StartQuietThread([this, fd, split, blockSize, read] {
      try {
        BlockReader reader(fd, split, blockSize);
        read(reader);
        tail.ok = reader.TailWindow(pass.end, tail.hash, tail.size);
      } catch (...) {
        failed = true;  // the caller's thread reads the second half itself
      }
    });
    return thread.joinable();
  }

  // Waits for the thread, after telling it to stop at once with `stop`.
  void Join(bool stop) {
    if (thread.joinable()) {
      cancel = stop;
      thread.join();
    }
  }

  Pass pass;
  Tail tail;
  bool failed = false;
  std::atomic<bool> cancel{false};
  std::thread thread;
};

// Where a second thread may begin reading the file at `fd` from `from`: the start of the first
// line that begins in the half block after its middle, or 0 when the file is too small to be worth
// it or no line begins there.
off_t SplitPoint(int fd, off_t from, size_t blockSize) {
  struct stat st {};
  if (blockSize < kSplitMinBlock || fstat(fd, &st) != 0 || !S_ISREG(st.st_mode) ||
      st.st_size - from < kSplitBlocks * static_cast<off_t>(blockSize)) {
    return 0;
  }
  const off_t middle = from + (st.st_size - from) / 2;
  // A few KiB at a time, so that a long line at the middle costs no memory.
  char bytes[kWindow];
  for (off_t at = middle - 1; at < middle - 1 + static_cast<off_t>(blockSize / 2);) {
    const ssize_t got = pread(fd, bytes, sizeof bytes, at);
    if (got < 0 && errno == EINTR) {
      continue;
    }
    if (got <= 0) {
      return 0;
    }
    const void* newline = std::memchr(bytes, '\n', static_cast<size_t>(got));
    if (newline != nullptr) {
      return at + (static_cast<const char*>(newline) - bytes) + 1;
    }
    at += got;
  }
  return 0;
}

// The folder test of one open file, with what the process remembers of it.
void FoldersInFile(int fd, const std::string& queueFile, const std::vector<std::string>& fullPaths,
                   std::vector<bool>& found, const ReadOptions& options) {
  FolderEntry entry;
  const bool have =
      options.remember && FolderMemory().Take(queueFile, entry) && StillTheSame(fd, entry.file);
  // The folders looked for: those asked about now and, while the file stays the same, those asked
  // about before, so that a listing's pages and single folders share one read.
  std::vector<std::string> wanted;
  std::vector<bool> wantedFound;
  std::unordered_map<std::string_view, size_t> index;
  bool subset = have;
  if (have) {
    for (const auto& folder : entry.folders) {
      wanted.push_back(folder.first);
      wantedFound.push_back(folder.second);
    }
  }
  for (const std::string& path : fullPaths) {
    if (!have || entry.folders.count(path) == 0) {
      subset = false;
      wanted.push_back(path);
    }
  }
  if (!subset) {
    // Read again from the start; the lines already read were logged already.
    if (wanted.size() > kMaxRemembered) {
      wanted = fullPaths;
    }
    std::sort(wanted.begin(), wanted.end());
    wanted.erase(std::unique(wanted.begin(), wanted.end()), wanted.end());
    wantedFound.assign(wanted.size(), false);
  }
  for (size_t i = 0; i < wanted.size(); ++i) {
    index.emplace(wanted[i], i);
  }
  std::vector<bool> asked(wanted.size(), false);
  for (const std::string& path : fullPaths) {
    asked[index[path]] = true;
  }
  size_t left = 0;
  for (size_t i = 0; i < wanted.size(); ++i) {
    left += asked[i] && !wantedFound[i] ? 1 : 0;
  }

  const off_t from = subset ? entry.file.offset : 0;
  const off_t quietUpTo = have ? entry.logged : 0;
  FolderPass pass;
  pass.found = std::move(wantedFound);
  pass.left = left;
  pass.end = from;
  Tail tail;
  std::unique_ptr<BlockReader> first;
  std::unique_ptr<BlockReader> last;
  if (pass.left > 0) {
    // A large file is read in two halves at once: this thread reads the first, a second thread
    // the second, as far as it holds nothing but events. This thread then takes over what the
    // second found and reads on from where it stopped.
    const off_t split = SplitPoint(fd, from, options.blockSize);
    SecondHalf<FolderPass> second;
    bool halves = false;
    if (split > 0) {
      second.pass.found = pass.found;
      second.pass.left = pass.left;
      second.pass.end = split;
      halves = second.Start(fd, split, options.blockSize / 2, [&](BlockReader& reader) {
        ReadFolders(reader, wanted, asked, second.pass, -1, &second.cancel);
      });
    }
    first =
        std::make_unique<BlockReader>(fd, from, halves ? options.blockSize / 2 : options.blockSize);
    if (halves) {
      first->StopAt(split);
    }
    ReadFolders(*first, wanted, asked, pass, quietUpTo, nullptr);
    tail.ok = first->TailWindow(pass.end, tail.hash, tail.size);
    if (halves) {
      second.Join(pass.end != split);
      if (pass.end == split && !second.failed) {
        for (size_t i = 0; i < pass.found.size(); ++i) {
          if (second.pass.found[i] && !pass.found[i]) {
            pass.found[i] = true;
            pass.left -= asked[i] ? 1 : 0;
          }
        }
        pass.end = second.pass.end;
        tail = second.tail;
        if (pass.left > 0) {
          last = std::make_unique<BlockReader>(fd, pass.end, options.blockSize);
          ReadFolders(*last, wanted, asked, pass, quietUpTo, nullptr);
          tail.ok = last->TailWindow(pass.end, tail.hash, tail.size);
        }
      }
    }
  }
  wantedFound = std::move(pass.found);
  const off_t end = pass.end;
  const std::vector<size_t>& marks = pass.marks;
  const bool lastEnded = pass.lastEnded;
  // What a last line without "\n" found counts now, but is not remembered.
  std::vector<bool> complete = wantedFound;
  if (!lastEnded) {
    for (const size_t f : marks) {
      complete[f] = false;
    }
  }
  for (size_t i = 0; i < fullPaths.size(); ++i) {
    found[i] = wantedFound[index[fullPaths[i]]];
  }
  if (!options.remember) {
    return;
  }
  FolderEntry next;
  if (first == nullptr) {
    next.file = entry.file;
  } else if (!Describe(fd, first->Head(), tail, end, subset ? &entry.file : nullptr, next.file)) {
    return;
  }
  for (size_t i = 0; i < wanted.size(); ++i) {
    next.folders.emplace(wanted[i], complete[i]);
  }
  next.logged = std::max(quietUpTo, end);
  FolderMemory().Put(queueFile, std::move(next));
}

}  // namespace

bool ParseQueueLine(const char* line, size_t size, QueueEvent& out) {
  Json::Value root;
  if (!JsonFromString(root, line, size)) {
    return false;
  }
  if (!root.isObject()) {
    return false;
  }
  const auto member = [&root](const char* key) { return root.find(key, key + std::strlen(key)); };
  const Json::Value* event = member("event");
  const Json::Value* path = member("path");
  if (event == nullptr || path == nullptr || !event->isConvertibleTo(Json::uintValue) ||
      !path->isString()) {
    return false;
  }
  out.event = event->asUInt();
  out.path = path->asString();
  const Json::Value* pathOld = member("path_old");
  out.pathOld = pathOld != nullptr && pathOld->isString() ? pathOld->asString() : std::string();
  return true;
}

bool IsReindexQueued(const std::string& path, const std::string& queueFile) {
  return detail::IsReindexQueued(path, queueFile, ReadOptions());
}

bool QueueHasFolderEvent(const std::string& folder, const std::string& queueFile) {
  if (NoQueueAt(queueFile)) {
    return false;
  }
  std::string full;
  if (!GetFullPath(full, folder)) {
    detail::WriteLog(false, kFolderUnit, __LINE__, "Cannot get full path: %s", folder.c_str());
    return false;
  }
  std::vector<bool> found;
  return detail::QueueFoldersWithEvents({full}, queueFile, found, ReadOptions{kBlockSize, false}) &&
         found[0];
}

bool QueueFoldersWithEvents(const std::vector<std::string>& fullPaths, const std::string& queueFile,
                            std::vector<bool>& found) {
  return detail::QueueFoldersWithEvents(fullPaths, queueFile, found, ReadOptions());
}

namespace detail {

bool IsReindexQueued(const std::string& path, const std::string& queueFile,
                     const ReadOptions& options) {
  if (NoQueueAt(queueFile)) {
    return false;
  }
  const UniqueFd fd = OpenLocationFile(queueFile, O_RDONLY);
  if (!fd) {
    FILEINDEX_LOG("Failed to open queue=%s, reason=%s", queueFile.c_str(), ErrnoText().c_str());
    return false;
  }
  ReindexEntry entry;
  bool have = options.remember && ReindexMemory().Take(queueFile, entry);
  if (have && !StillTheSame(fd.get(), entry.file)) {
    have = false;
    entry = ReindexEntry();
  }
  if (have && entry.paths.count(path) != 0) {
    ReindexMemory().Put(queueFile, std::move(entry));
    return true;
  }
  // Every reindex path is collected for later questions; one too long to keep, or too many,
  // and the file is not remembered.
  const size_t limit = std::max(path.size() + 1, kRememberedPath);
  const off_t from = have ? entry.file.offset : 0;
  ReindexPass pass;
  pass.keep = options.remember;
  pass.paths = std::move(entry.paths);
  pass.end = from;
  // A large file is read in two halves at once, as by the folder test; this thread takes over
  // what the second found when the first half holds no reindex event of the path.
  const off_t split = SplitPoint(fd.get(), from, options.blockSize);
  SecondHalf<ReindexPass> second;
  bool halves = false;
  if (split > 0) {
    second.pass.keep = pass.keep;
    second.pass.end = split;
    halves = second.Start(fd.get(), split, options.blockSize / 2, [&](BlockReader& reader) {
      ReadReindex(reader, path, limit, second.pass, &second.cancel);
    });
  }
  BlockReader reader(fd.get(), from, halves ? options.blockSize / 2 : options.blockSize);
  if (halves) {
    reader.StopAt(split);
  }
  ReadReindex(reader, path, limit, pass, nullptr);
  Tail tail;
  tail.ok = reader.TailWindow(pass.end, tail.hash, tail.size);
  if (halves) {
    second.Join(pass.queued || pass.end != split);
    if (!pass.queued && pass.end == split && !second.failed) {
      pass.queued = second.pass.queued;
      pass.end = second.pass.end;
      tail = second.tail;
      pass.keep = pass.keep && second.pass.keep;
      if (pass.keep) {
        pass.paths.insert(second.pass.paths.begin(), second.pass.paths.end());
        pass.keep = pass.paths.size() <= kMaxRemembered;
      }
    }
  }
  FileState state;
  if (pass.keep &&
      Describe(fd.get(), reader.Head(), tail, pass.end, have ? &entry.file : nullptr, state)) {
    entry.file = state;
    entry.paths = std::move(pass.paths);
    ReindexMemory().Put(queueFile, std::move(entry));
  }
  return pass.queued;
}

bool QueueFoldersWithEvents(const std::vector<std::string>& fullPaths, const std::string& queueFile,
                            std::vector<bool>& found, const ReadOptions& options) {
  found.assign(fullPaths.size(), false);
  if (NoQueueAt(queueFile)) {
    return false;
  }
  const UniqueFd fd = OpenLocationFile(queueFile, O_RDONLY);
  if (!fd) {
    WriteLog(false, kFolderUnit, __LINE__, "Failed to open queue=%s, reason=%s", queueFile.c_str(),
             ErrnoText().c_str());
    return false;
  }
  if (fullPaths.empty()) {
    return true;
  }
  FoldersInFile(fd.get(), queueFile, fullPaths, found, options);
  return true;
}

void ForgetQueueScans() {
  ReindexMemory().Clear();
  FolderMemory().Clear();
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
