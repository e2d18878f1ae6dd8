#define FILEINDEX_LOG_UNIT "utils"

#include "utils/queue_reader.h"

#include <fcntl.h>
#include <json/value.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstring>
#include <vector>

#include "fileindex/queue.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "utils/log.h"
#include "utils/storage.h"
#include "unique_fd.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr size_t kBlockSize = size_t{1} << 20;

// The unit under which the folder test logs: its callers report progress under that name.
constexpr const char* kFolderUnit = "status_mgr";

const Json::Value* Member(const Json::Value& object, const char* key) {
  return object.find(key, key + std::strlen(key));
}

// Hands out a file's lines a run at a time, straight from the read buffer. A run holds whole
// lines, each ended by "\n"; at the end of the file it is the last line when that has no "\n".
// The buffer holds one block, and grows only while a single line does not fit in it.
class LineRuns {
 public:
  LineRuns(int fd, size_t blockSize) : m_fd(fd), m_buffer(std::max<size_t>(blockSize, 1)) {}

  // Stores the next run in [begin, end); false when the file has nothing left. A read error ends
  // the file where it happened.
  bool Next(const char*& begin, const char*& end) {
    char* data = m_buffer.data();
    if (m_start > 0) {
      // The unfinished line of the last run moves to the front, where the next read completes it.
      std::memmove(data, data + m_start, m_fill - m_start);
      m_fill -= m_start;
      m_start = 0;
    }
    while (!m_eof) {
      if (m_fill == m_buffer.size()) {
        m_buffer.resize(m_buffer.size() * 2);
        data = m_buffer.data();
      }
      const ssize_t got = read(m_fd, data + m_fill, m_buffer.size() - m_fill);
      if (got < 0 && errno == EINTR) {
        continue;
      }
      if (got <= 0) {
        m_eof = true;
        break;
      }
      const char* fresh = data + m_fill;
      m_fill += static_cast<size_t>(got);
      const void* newline = memrchr(fresh, '\n', static_cast<size_t>(got));
      if (newline != nullptr) {
        m_start = static_cast<size_t>(static_cast<const char*>(newline) - data) + 1;
        begin = data;
        end = data + m_start;
        return true;
      }
    }
    if (m_fill == 0) {
      return false;
    }
    begin = data;
    end = data + m_fill;
    m_start = m_fill;
    return true;
  }

 private:
  int m_fd;
  std::vector<char> m_buffer;
  size_t m_start = 0;  // where the part not yet handed out begins
  size_t m_fill = 0;   // how much of the buffer holds read bytes
  bool m_eof = false;
};

// A recursive-descent check of one line that accepts only a subset of what the strict parser
// accepts. Whatever falls outside that subset, even when the parser would take it, makes the
// check give up: a wrong "surely" would hide a malformed line from the log or invent an event.
class LineScanner {
 public:
  LineScanner(const char* line, size_t size) : m_p(line), m_end(line + size) {}

  bool Event(detail::ScannedEvent& out) {
    out = detail::ScannedEvent();
    // Without a backslash every string's bytes are its value and end at the next quote.
    if (std::memchr(m_p, '\\', static_cast<size_t>(m_end - m_p)) != nullptr) {
      return false;
    }
    SkipSpace();
    if (!Take('{') || !Members(1, &out)) {
      return false;
    }
    SkipSpace();
    return m_p == m_end;
  }

 private:
  static constexpr int kMaxDepth = 32;
  static constexpr size_t kMaxKeys = 16;
  // Plain decimals this short are exact integers or ordinary doubles for the parser.
  static constexpr int kMaxDigits = 15;
  // The parser throws on names this long and cannot hold strings much longer.
  static constexpr size_t kMaxString = size_t{1} << 30;

  struct Key {
    const char* text;
    size_t size;
  };

  static bool IsKey(const Key& key, const char* name, size_t size) {
    return key.size == size && std::memcmp(key.text, name, size) == 0;
  }

  void SkipSpace() {
    while (m_p != m_end && (*m_p == ' ' || *m_p == '\t' || *m_p == '\r' || *m_p == '\n')) {
      ++m_p;
    }
  }

  bool Take(char c) {
    if (m_p != m_end && *m_p == c) {
      ++m_p;
      return true;
    }
    return false;
  }

  bool String(const char*& text, size_t& size) {
    if (!Take('"')) {
      return false;
    }
    const void* quote = std::memchr(m_p, '"', static_cast<size_t>(m_end - m_p));
    if (quote == nullptr) {
      return false;
    }
    text = m_p;
    m_p = static_cast<const char*>(quote);
    size = static_cast<size_t>(m_p - text);
    ++m_p;
    return size < kMaxString;
  }

  int Digits() {
    const char* start = m_p;
    while (m_p != m_end && *m_p >= '0' && *m_p <= '9') {
      ++m_p;
    }
    return static_cast<int>(std::min<ptrdiff_t>(m_p - start, INT_MAX));
  }

  bool Number() {
    Take('-');
    const int digits = Digits();
    if (digits == 0 || digits > kMaxDigits) {
      return false;
    }
    if (!Take('.')) {
      return true;
    }
    const int fraction = Digits();
    return fraction > 0 && fraction <= kMaxDigits - digits;
  }

  bool Unsigned(unsigned int& out) {
    const char* start = m_p;
    const int digits = Digits();
    if (digits == 0 || digits > 10) {
      return false;
    }
    uint64_t value = 0;
    for (const char* d = start; d != m_p; ++d) {
      value = value * 10 + static_cast<uint64_t>(*d - '0');
    }
    if (value > UINT_MAX) {
      return false;
    }
    out = static_cast<unsigned int>(value);
    return true;
  }

  bool Literal(const char* word, size_t size) {
    if (static_cast<size_t>(m_end - m_p) < size || std::memcmp(m_p, word, size) != 0) {
      return false;
    }
    m_p += size;
    return true;
  }

  bool Value(int depth) {
    if (m_p == m_end) {
      return false;
    }
    switch (*m_p) {
      case '{':
        ++m_p;
        return depth < kMaxDepth && Members(depth + 1, nullptr);
      case '[':
        ++m_p;
        return depth < kMaxDepth && Elements(depth + 1);
      case '"': {
        const char* text = nullptr;
        size_t size = 0;
        return String(text, size);
      }
      case 't':
        return Literal("true", 4);
      case 'f':
        return Literal("false", 5);
      case 'n':
        return Literal("null", 4);
      default:
        return Number();
    }
  }

  // After "[".
  bool Elements(int depth) {
    SkipSpace();
    if (Take(']')) {
      return true;
    }
    for (;;) {
      SkipSpace();
      if (!Value(depth)) {
        return false;
      }
      SkipSpace();
      if (Take(']')) {
        return true;
      }
      if (!Take(',')) {
        return false;
      }
    }
  }

  // After "{". With `top`, the object is the line's own: it must carry an unsigned "event" and a
  // string "path", which go to `top` with a string "path_old".
  bool Members(int depth, detail::ScannedEvent* top) {
    Key keys[kMaxKeys];
    size_t count = 0;
    bool event = false;
    bool path = false;
    SkipSpace();
    if (Take('}')) {
      return top == nullptr;
    }
    for (;;) {
      SkipSpace();
      Key key{};
      if (count == kMaxKeys || !String(key.text, key.size)) {
        return false;
      }
      for (size_t i = 0; i < count; ++i) {
        if (IsKey(keys[i], key.text, key.size)) {
          return false;
        }
      }
      keys[count++] = key;
      SkipSpace();
      if (!Take(':')) {
        return false;
      }
      SkipSpace();
      bool ok = false;
      if (top != nullptr && IsKey(key, "event", 5)) {
        event = Unsigned(top->event);
        ok = event;
      } else if (top != nullptr && IsKey(key, "path", 4)) {
        path = String(top->path, top->pathSize);
        ok = path;
      } else if (top != nullptr && IsKey(key, "path_old", 8) && m_p != m_end && *m_p == '"') {
        ok = String(top->pathOld, top->pathOldSize);
      } else {
        ok = Value(depth);
      }
      if (!ok) {
        return false;
      }
      SkipSpace();
      if (Take('}')) {
        return top == nullptr || (event && path);
      }
      if (!Take(',')) {
        return false;
      }
    }
  }

  const char* m_p;
  const char* m_end;
};

// Whether a line is an event, and which: the quick scan when it is sure, the parser otherwise.
// The event is in `scanned` or in `parsed`, as the answer says.
enum class Line { kMalformed, kScanned, kParsed };

Line ReadLine(const char* line, size_t size, detail::ScannedEvent& scanned, QueueEvent& parsed) {
  if (detail::ScanQueueLine(line, size, scanned)) {
    return Line::kScanned;
  }
  return ParseQueueLine(line, size, parsed) ? Line::kParsed : Line::kMalformed;
}

bool IsReindexOf(const char* line, size_t size, const std::string& path) {
  detail::ScannedEvent scanned;
  QueueEvent parsed;
  switch (ReadLine(line, size, scanned, parsed)) {
    case Line::kScanned:
      return scanned.event == static_cast<unsigned int>(kEventReindex) &&
             scanned.pathSize == path.size() &&
             std::memcmp(scanned.path, path.data(), path.size()) == 0;
    case Line::kParsed:
      return parsed.event == static_cast<unsigned int>(kEventReindex) && parsed.path == path;
    case Line::kMalformed:
      break;
  }
  return false;
}

const char* Find(const char* from, const char* end, const std::string& needle) {
  const void* at = memmem(from, static_cast<size_t>(end - from), needle.data(), needle.size());
  return at != nullptr ? static_cast<const char*>(at) : end;
}

const char* FindByte(const char* from, const char* end, char byte) {
  const void* at = std::memchr(from, byte, static_cast<size_t>(end - from));
  return at != nullptr ? static_cast<const char*>(at) : end;
}

// Whether the lines in [begin, end) hold a reindex of `path`. Only a line that holds `needle`
// (the path as a JSON string without escapes) or a backslash can, so the search skips from one
// such line to the next over the whole run.
bool RunHoldsReindex(const char* begin, const char* end, const std::string& path,
                     const std::string& needle) {
  const char* from = begin;
  const char* needleAt = Find(from, end, needle);
  const char* backslashAt = FindByte(from, end, '\\');
  for (;;) {
    const char* hit = std::min(needleAt, backslashAt);
    if (hit == end) {
      return false;
    }
    const void* newline = memrchr(from, '\n', static_cast<size_t>(hit - from));
    const char* lineStart = newline != nullptr ? static_cast<const char*>(newline) + 1 : from;
    const char* lineEnd = FindByte(hit, end, '\n');
    if (IsReindexOf(lineStart, static_cast<size_t>(lineEnd - lineStart), path)) {
      return true;
    }
    if (lineEnd == end) {
      return false;
    }
    from = lineEnd + 1;
    if (needleAt < from) {
      needleAt = Find(from, end, needle);
    }
    if (backslashAt < from) {
      backslashAt = FindByte(from, end, '\\');
    }
  }
}

// Whether a path lies in a folder as StringStartWith(path + "/", full + "/") says, for a path
// given as bytes and without building the string.
class FolderPrefix {
 public:
  explicit FolderPrefix(const std::string& full)
      : m_prefix(full + "/"), m_plain(full.find('\0') == std::string::npos) {}

  bool Holds(const char* path, size_t size) const {
    if (m_prefix.size() > size + 1) {
      return false;
    }
    if (m_plain) {
      // Without a NUL in the prefix, comparing as C strings is comparing bytes; when the path is
      // one byte shorter than the prefix, the slash after it meets the prefix's last "/".
      return std::memcmp(path, m_prefix.data(), std::min(m_prefix.size(), size)) == 0;
    }
    for (size_t i = 0; i < m_prefix.size(); ++i) {
      const char c = i < size ? path[i] : '/';
      if (c != m_prefix[i]) {
        return false;
      }
      if (c == '\0') {
        return true;
      }
    }
    return true;
  }

  bool HoldsEvent(unsigned int event, const char* path, size_t pathSize, const char* pathOld,
                  size_t pathOldSize) const {
    return Holds(path, pathSize) ||
           (event == static_cast<unsigned int>(kEventMoved) && Holds(pathOld, pathOldSize));
  }

 private:
  std::string m_prefix;
  bool m_plain;
};

int LogWidth(size_t size) { return static_cast<int>(std::min<size_t>(size, INT_MAX)); }

// Handles every line in [begin, end): logs the malformed ones and, until one is found, looks for
// an event inside `folder`.
void ScanRunForFolder(const char* begin, const char* end, const FolderPrefix& folder, bool& found) {
  for (const char* line = begin; line != end;) {
    const char* lineEnd = FindByte(line, end, '\n');
    const auto size = static_cast<size_t>(lineEnd - line);
    detail::ScannedEvent scanned;
    QueueEvent parsed;
    switch (ReadLine(line, size, scanned, parsed)) {
      case Line::kScanned:
        found = found || folder.HoldsEvent(scanned.event, scanned.path, scanned.pathSize,
                                           scanned.pathOld, scanned.pathOldSize);
        break;
      case Line::kParsed:
        found = found || folder.HoldsEvent(parsed.event, parsed.path.data(), parsed.path.size(),
                                           parsed.pathOld.data(), parsed.pathOld.size());
        break;
      case Line::kMalformed:
        detail::WriteLog(false, kFolderUnit, __LINE__, "Malformed command: %.*s", LogWidth(size),
                         line);
        break;
    }
    line = lineEnd == end ? end : lineEnd + 1;
  }
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
  const Json::Value* event = Member(root, "event");
  const Json::Value* path = Member(root, "path");
  if (event == nullptr || path == nullptr || !event->isConvertibleTo(Json::uintValue) ||
      !path->isString()) {
    return false;
  }
  out.event = event->asUInt();
  out.path = path->asString();
  const Json::Value* pathOld = Member(root, "path_old");
  out.pathOld = pathOld != nullptr && pathOld->isString() ? pathOld->asString() : std::string();
  return true;
}

bool IsReindexQueued(const std::string& path, const std::string& queueFile) {
  return detail::IsReindexQueued(path, queueFile, kBlockSize);
}

bool QueueHasFolderEvent(const std::string& folder, const std::string& queueFile) {
  return detail::QueueHasFolderEvent(folder, queueFile, kBlockSize);
}

namespace {

// True when nothing that could be a queue is at `queueFile`: it is missing, or it is not a regular
// file. Anything else that keeps it from being looked at (a link on the way, no descriptor left)
// is for the open to report.
bool NoQueueAt(const std::string& queueFile) {
  return !LocationFileExists(queueFile) &&
         (errno == ENOENT || errno == ENOTDIR || errno == EISDIR || errno == ENXIO);
}

}  // namespace

namespace detail {

bool ScanQueueLine(const char* line, size_t size, ScannedEvent& out) {
  return LineScanner(line, size).Event(out);
}

bool IsReindexQueued(const std::string& path, const std::string& queueFile, size_t blockSize) {
  if (NoQueueAt(queueFile)) {
    return false;
  }
  const UniqueFd fd = OpenLocationFile(queueFile, O_RDONLY);
  if (!fd) {
    FILEINDEX_LOG("Failed to open queue=%s, reason=%s", queueFile.c_str(), ErrnoText().c_str());
    return false;
  }
  const std::string needle = '"' + path + '"';
  LineRuns runs(fd.get(), blockSize);
  const char* begin = nullptr;
  const char* end = nullptr;
  while (runs.Next(begin, end)) {
    if (RunHoldsReindex(begin, end, path, needle)) {
      return true;
    }
  }
  return false;
}

bool QueueHasFolderEvent(const std::string& folder, const std::string& queueFile,
                         size_t blockSize) {
  if (NoQueueAt(queueFile)) {
    return false;
  }
  std::string full;
  if (!GetFullPath(full, folder)) {
    WriteLog(false, kFolderUnit, __LINE__, "Cannot get full path: %s", folder.c_str());
    return false;
  }
  const UniqueFd fd = OpenLocationFile(queueFile, O_RDONLY);
  if (!fd) {
    WriteLog(false, kFolderUnit, __LINE__, "Failed to open queue=%s, reason=%s", queueFile.c_str(),
             ErrnoText().c_str());
    return false;
  }
  // Every malformed line is logged, so the whole file is read even after a match.
  const FolderPrefix prefix(full);
  bool found = false;
  LineRuns runs(fd.get(), blockSize);
  const char* begin = nullptr;
  const char* end = nullptr;
  while (runs.Next(begin, end)) {
    ScanRunForFolder(begin, end, prefix, found);
  }
  return found;
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
