#define FILEINDEX_LOG_UNIT "utils"

#include "utils/queue_reader.h"

#include <fcntl.h>
#include <json/value.h>
#include <sys/stat.h>
#include <unistd.h>

#if defined(__SSE2__)
#include <emmintrin.h>
#endif

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <new>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "fileindex/queue.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "unique_fd.h"
#include "utils/log.h"
#include "utils/storage.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using detail::LineVerdict;
using detail::ReadOptions;

// The unit under which the folder reader logs: its callers report progress under that name.
constexpr const char* kFolderUnit = "status_mgr";

// Bytes at the start of a queue and just before the point read to that must be unchanged for
// the rest of what was read to count as unchanged.
constexpr size_t kWindow = 4096;
constexpr size_t kBlockSize = size_t{1} << 20;
// Of a malformed line longer than the block, what its log line shows.
constexpr size_t kLogHead = size_t{64} << 10;
// Reindex paths up to this length are remembered; a longer one makes the file's entry go.
constexpr size_t kRememberedPath = 4096;
// Past this many reindex paths, or folders asked about, a file's entry goes.
constexpr size_t kMaxRemembered = 4096;
// Queue files remembered at once; past it, the entry read longest ago goes.
constexpr size_t kMaxFiles = 64;

int LogWidth(size_t size) { return static_cast<int>(std::min<size_t>(size, INT_MAX)); }

// The first of the bytes `a`, `b` and `c` in [p, end), or `end`. Lines are short: a library
// search would spend more on setting up than on searching.
inline const char* FindAny(const char* p, const char* end, char a, char b, char c) {
#if defined(__SSE2__)
  const __m128i va = _mm_set1_epi8(a);
  const __m128i vb = _mm_set1_epi8(b);
  const __m128i vc = _mm_set1_epi8(c);
  const auto hits = [&va, &vb, &vc](const char* at) {
    const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(at));
    const __m128i hit = _mm_or_si128(_mm_or_si128(_mm_cmpeq_epi8(v, va), _mm_cmpeq_epi8(v, vb)),
                                     _mm_cmpeq_epi8(v, vc));
    return static_cast<unsigned int>(_mm_movemask_epi8(hit));
  };
  // 32 bytes a step: most lines end within a step or two.
  while (end - p >= 32) {
    const unsigned int mask = hits(p) | (hits(p + 16) << 16);
    if (mask != 0) {
      return p + __builtin_ctz(mask);
    }
    p += 32;
  }
  if (end - p >= 16) {
    const unsigned int mask = hits(p);
    if (mask != 0) {
      return p + __builtin_ctz(mask);
    }
    p += 16;
  }
#endif
  while (p != end && *p != a && *p != b && *p != c) {
    ++p;
  }
  return p;
}

// The plain readers tell these codes by their digits.
static_assert(kEventMoved == 256 && kEventReindex == 65536, "codes told by their digits");

// How many decimal digits [p, end) begins with, up to 11: more make no code.
inline size_t LeadingDigits(const char* p, const char* end) {
#if defined(__SSE2__)
  if (end - p >= 16) {
    const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p));
    const __m128i digit = _mm_and_si128(_mm_cmpgt_epi8(v, _mm_set1_epi8('0' - 1)),
                                        _mm_cmplt_epi8(v, _mm_set1_epi8('9' + 1)));
    const auto other = ~static_cast<unsigned int>(_mm_movemask_epi8(digit)) | 0x800U;
    return static_cast<size_t>(__builtin_ctz(other));
  }
#endif
  size_t n = 0;
  while (n < 11 && p + n != end && p[n] >= '0' && p[n] <= '9') {
    ++n;
  }
  return n;
}

// Whether the `n` decimal digits at `p` (n <= 10) are the number `text`, a literal without a
// leading zero: leading zeros are read past, as the readers' arithmetic does.
template <size_t N>
bool DigitsAre(const char* p, size_t n, const char (&text)[N]) {
  constexpr size_t kSize = N - 1;
  if (n < kSize || std::memcmp(p + n - kSize, text, kSize) != 0) {
    return false;
  }
  for (size_t i = 0; i + kSize < n; ++i) {
    if (p[i] != '0') {
      return false;
    }
  }
  return true;
}

// Whether the `n` decimal digits at `p` (n <= 10) fit an unsigned int.
bool DigitsFit(const char* p, size_t n) { return n < 10 || std::memcmp(p, "4294967295", 10) <= 0; }

// Whether [p, end) begins with the literal `text`.
template <size_t N>
bool Begins(const char* p, const char* end, const char (&text)[N]) {
  return static_cast<size_t>(end - p) >= N - 1 && std::memcmp(p, text, N - 1) == 0;
}

uint64_t Hash(const char* data, size_t size, uint64_t h = 1469598103934665603ULL) {
  for (size_t i = 0; i < size; ++i) {
    h = (h ^ static_cast<unsigned char>(data[i])) * 1099511628211ULL;
  }
  return h;
}

// ---------------------------------------------------------------------------------------------
// The line scanner.

// The bytes of one line, a window at a time: [p, end) is what is at hand. A line held whole is
// one window; a line longer than the block comes in several.
class LineSource {
 public:
  LineSource(const char* p, const char* end) : p(p), end(end) {}
  virtual ~LineSource() = default;
  LineSource(const LineSource&) = delete;
  LineSource& operator=(const LineSource&) = delete;

  // Brings the next window of the line into [p, end); false at the end of the line.
  virtual bool More() { return false; }

  const char* p;
  const char* end;
};

// Where a decoded string goes: its first `limit` bytes to `out` (when given), its length always,
// and, for names, a hash of all of it.
struct Capture {
  std::string* out = nullptr;
  size_t limit = 0;
  size_t size = 0;
  uint64_t hash = 1469598103934665603ULL;
  bool hashed = false;

  void Append(const char* data, size_t n) {
    if (out != nullptr && out->size() < limit) {
      out->append(data, std::min(n, limit - out->size()));
    }
    if (hashed) {
      hash = Hash(data, n, hash);
    }
    size += n;
  }
};

// Appends the code point `cp` as UTF-8, as the JSON parser does (surrogates included).
void AppendCodePoint(Capture& to, unsigned int cp) {
  char bytes[4];
  size_t n = 0;
  if (cp <= 0x7F) {
    bytes[n++] = static_cast<char>(cp);
  } else if (cp <= 0x7FF) {
    bytes[n++] = static_cast<char>(0xC0 | (cp >> 6));
    bytes[n++] = static_cast<char>(0x80 | (cp & 0x3F));
  } else if (cp <= 0xFFFF) {
    bytes[n++] = static_cast<char>(0xE0 | (cp >> 12));
    bytes[n++] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
    bytes[n++] = static_cast<char>(0x80 | (cp & 0x3F));
  } else {
    bytes[n++] = static_cast<char>(0xF0 | (cp >> 18));
    bytes[n++] = static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
    bytes[n++] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
    bytes[n++] = static_cast<char>(0x80 | (cp & 0x3F));
  }
  to.Append(bytes, n);
}

// A recursive-descent reading of one line that follows the strict parser exactly over a subset of
// JSON: objects, arrays, strings with every escape, true, false, null and plain decimals. Where
// the line leaves that subset it answers kUnsure, never a guess: a wrong answer would hide a
// malformed line from the log or invent an event. It answers kNoEvent only where the parser
// surely fails too: the line ends inside a value, a string holds an escape the parser refuses,
// or the object is complete but lacks the event.
class LineScanner {
 public:
  LineScanner(LineSource& source, size_t limit) : m_src(source), m_limit(limit) {}

  // `pathSize` and `pathOldSize` get the decoded lengths; `out` holds at most `limit` bytes of
  // each path.
  LineVerdict Event(QueueEvent& out, size_t& pathSize, size_t& pathOldSize) {
    out.event = 0;
    out.path.clear();
    out.pathOld.clear();
    m_out = &out;
    SkipSpace();
    Step step = Expect('{');
    if (step == Step::kOk) {
      step = Members(1, true);
    }
    if (step == Step::kOk) {
      SkipSpace();
      // The parser ends the text at a NUL byte; anything after the object is for it to judge.
      step = Avail() ? Step::kUnsure : Step::kOk;
    }
    switch (step) {
      case Step::kOk:
        pathSize = m_pathSize;
        pathOldSize = m_pathOldSize;
        return m_event && m_path ? LineVerdict::kEvent : LineVerdict::kNoEvent;
      case Step::kMalformed:
        return LineVerdict::kNoEvent;
      case Step::kUnsure:
        break;
    }
    return LineVerdict::kUnsure;
  }

 private:
  enum class Step { kOk, kMalformed, kUnsure };

  static constexpr int kMaxDepth = 32;
  static constexpr size_t kMaxKeys = 16;
  // Plain decimals this short are exact integers or ordinary doubles for the parser.
  static constexpr size_t kMaxDigits = 15;
  // The parser cannot hold strings this long.
  static constexpr size_t kMaxString = size_t{1} << 30;

  struct Key {
    size_t size;
    uint64_t hash;
  };

  enum class TopKey { kOther, kEvent, kPath, kPathOld };

  static TopKey Which(const std::string& name) {
    switch (name.size()) {
      case 4:
        return std::memcmp(name.data(), "path", 4) == 0 ? TopKey::kPath : TopKey::kOther;
      case 5:
        return std::memcmp(name.data(), "event", 5) == 0 ? TopKey::kEvent : TopKey::kOther;
      case 8:
        return std::memcmp(name.data(), "path_old", 8) == 0 ? TopKey::kPathOld : TopKey::kOther;
      default:
        return TopKey::kOther;
    }
  }

  bool Avail() { return m_src.p != m_src.end || m_src.More(); }

  // The next byte, taken; false at the end of the line.
  bool Next(char& c) {
    if (!Avail()) {
      return false;
    }
    c = *m_src.p++;
    return true;
  }

  void SkipSpace() {
    while (Avail() && (*m_src.p == ' ' || *m_src.p == '\t' || *m_src.p == '\r')) {
      ++m_src.p;
    }
  }

  // The line ending where a value or a delimiter must follow fails the parser too.
  Step Expect(char c) {
    if (!Avail()) {
      return Step::kMalformed;
    }
    if (*m_src.p != c) {
      return Step::kUnsure;
    }
    ++m_src.p;
    return Step::kOk;
  }

  static int Hex(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
  }

  // Four hex digits after "\u". Whatever else comes there (the closing quote or a backslash
  // included) makes the parser refuse the string.
  Step Hex4(unsigned int& cp) {
    cp = 0;
    for (int i = 0; i < 4; ++i) {
      char c = 0;
      if (!Next(c)) {
        return Step::kMalformed;
      }
      const int digit = Hex(c);
      if (digit < 0) {
        return Step::kMalformed;
      }
      cp = cp * 16 + static_cast<unsigned int>(digit);
    }
    return Step::kOk;
  }

  // After the backslash.
  Step Escape(Capture& to) {
    char c = 0;
    if (!Next(c)) {
      return Step::kMalformed;
    }
    char plain = 0;
    switch (c) {
      case '"':
      case '\\':
      case '/':
        plain = c;
        break;
      case 'b':
        plain = '\b';
        break;
      case 'f':
        plain = '\f';
        break;
      case 'n':
        plain = '\n';
        break;
      case 'r':
        plain = '\r';
        break;
      case 't':
        plain = '\t';
        break;
      case 'u': {
        unsigned int cp = 0;
        Step step = Hex4(cp);
        if (step != Step::kOk) {
          return step;
        }
        if (cp >= 0xD800 && cp <= 0xDBFF) {
          // A high surrogate takes the next "\u" escape as its second half, whatever its value,
          // as the parser does.
          char backslash = 0;
          char u = 0;
          if (!Next(backslash) || backslash != '\\' || !Next(u) || u != 'u') {
            return Step::kMalformed;
          }
          unsigned int low = 0;
          step = Hex4(low);
          if (step != Step::kOk) {
            return step;
          }
          cp = 0x10000 + ((cp & 0x3FF) << 10) + (low & 0x3FF);
        }
        AppendCodePoint(to, cp);
        return Step::kOk;
      }
      default:
        return Step::kMalformed;
    }
    to.Append(&plain, 1);
    return Step::kOk;
  }

  // After the opening quote. Raw bytes, control characters included, are the string's own.
  Step String(Capture& to) {
    for (;;) {
      if (!Avail()) {
        return Step::kMalformed;
      }
      const char* p = m_src.p;
      const auto n = static_cast<size_t>(m_src.end - p);
      const void* quote = std::memchr(p, '"', n);
      const char* stop = quote != nullptr ? static_cast<const char*>(quote) : m_src.end;
      const void* backslash = std::memchr(p, '\\', static_cast<size_t>(stop - p));
      if (backslash != nullptr) {
        stop = static_cast<const char*>(backslash);
      }
      to.Append(p, static_cast<size_t>(stop - p));
      m_src.p = stop;
      if (to.size >= kMaxString) {
        return Step::kUnsure;
      }
      if (stop == m_src.end) {
        continue;
      }
      ++m_src.p;
      if (*stop == '"') {
        return Step::kOk;
      }
      const Step step = Escape(to);
      if (step != Step::kOk) {
        return step;
      }
    }
  }

  Step SkipString() {
    Capture none;
    return String(none);
  }

  size_t Digits() {
    size_t count = 0;
    while (Avail() && *m_src.p >= '0' && *m_src.p <= '9') {
      ++m_src.p;
      ++count;
    }
    return count;
  }

  Step Number() {
    if (*m_src.p == '-') {
      ++m_src.p;
    }
    const size_t digits = Digits();
    if (digits == 0 || digits > kMaxDigits) {
      return Step::kUnsure;
    }
    if (!Avail() || *m_src.p != '.') {
      return Step::kOk;
    }
    ++m_src.p;
    const size_t fraction = Digits();
    return fraction > 0 && fraction <= kMaxDigits - digits ? Step::kOk : Step::kUnsure;
  }

  Step Unsigned(unsigned int& out) {
    uint64_t value = 0;
    size_t digits = 0;
    while (Avail() && *m_src.p >= '0' && *m_src.p <= '9') {
      if (++digits > 10) {
        return Step::kUnsure;
      }
      value = value * 10 + static_cast<uint64_t>(*m_src.p++ - '0');
    }
    if (digits == 0 || value > UINT_MAX) {
      return Step::kUnsure;
    }
    out = static_cast<unsigned int>(value);
    return Step::kOk;
  }

  Step Literal(const char* word) {
    for (const char* w = word; *w != '\0'; ++w) {
      char c = 0;
      if (!Next(c)) {
        return Step::kMalformed;
      }
      if (c != *w) {
        return Step::kUnsure;
      }
    }
    return Step::kOk;
  }

  Step Value(int depth) {
    if (!Avail()) {
      return Step::kMalformed;
    }
    switch (*m_src.p) {
      case '{':
        ++m_src.p;
        return depth < kMaxDepth ? Members(depth + 1, false) : Step::kUnsure;
      case '[':
        ++m_src.p;
        return depth < kMaxDepth ? Elements(depth + 1) : Step::kUnsure;
      case '"':
        ++m_src.p;
        return SkipString();
      case 't':
        return Literal("true");
      case 'f':
        return Literal("false");
      case 'n':
        return Literal("null");
      default:
        return Number();
    }
  }

  // After "[".
  Step Elements(int depth) {
    SkipSpace();
    if (Avail() && *m_src.p == ']') {
      ++m_src.p;
      return Step::kOk;
    }
    for (;;) {
      SkipSpace();
      Step step = Value(depth);
      if (step != Step::kOk) {
        return step;
      }
      SkipSpace();
      if (!Avail()) {
        return Step::kMalformed;
      }
      const char c = *m_src.p++;
      if (c == ']') {
        return Step::kOk;
      }
      if (c != ',') {
        return Step::kUnsure;
      }
    }
  }

  // The value of a top-level "path" or "path_old": a string goes to `to`, anything else is only
  // checked and leaves `isString` false.
  Step PathValue(int depth, Capture& to, bool& isString) {
    isString = false;
    if (!Avail()) {
      return Step::kMalformed;
    }
    if (*m_src.p != '"') {
      return Value(depth);
    }
    ++m_src.p;
    isString = true;
    return String(to);
  }

  // After "{". With `top`, the object is the line's own: "event", "path" and "path_old" go to the
  // event being read.
  Step Members(int depth, bool top) {
    Key keys[kMaxKeys];
    size_t count = 0;
    SkipSpace();
    if (Avail() && *m_src.p == '}') {
      ++m_src.p;
      return Step::kOk;
    }
    for (;;) {
      SkipSpace();
      if (count == kMaxKeys) {
        return Step::kUnsure;
      }
      Step step = Expect('"');
      if (step != Step::kOk) {
        return step;
      }
      std::string name;
      Capture key;
      key.out = &name;
      key.limit = 9;  // the longest name looked for, "path_old", and one more byte
      key.hashed = true;
      step = String(key);
      if (step != Step::kOk) {
        return step;
      }
      for (size_t i = 0; i < count; ++i) {
        if (keys[i].size == key.size && keys[i].hash == key.hash) {
          // Most likely the same name twice, which the parser refuses; it alone can be sure.
          return Step::kUnsure;
        }
      }
      keys[count++] = Key{key.size, key.hash};
      SkipSpace();
      step = Expect(':');
      if (step != Step::kOk) {
        return step;
      }
      SkipSpace();
      const TopKey which = top ? Which(name) : TopKey::kOther;
      if (which == TopKey::kEvent) {
        if (!Avail()) {
          return Step::kMalformed;
        }
        step = Unsigned(m_out->event);
        m_event = step == Step::kOk;
      } else if (which == TopKey::kPath) {
        Capture path;
        path.out = &m_out->path;
        path.limit = m_limit;
        step = PathValue(depth, path, m_path);
        m_pathSize = path.size;
      } else if (which == TopKey::kPathOld) {
        Capture pathOld;
        pathOld.out = &m_out->pathOld;
        pathOld.limit = m_limit;
        bool isString = false;
        step = PathValue(depth, pathOld, isString);
        if (!isString) {
          m_out->pathOld.clear();
        }
        m_pathOldSize = isString ? pathOld.size : 0;
      } else {
        step = Value(depth);
      }
      if (step != Step::kOk) {
        return step;
      }
      SkipSpace();
      if (!Avail()) {
        return Step::kMalformed;
      }
      const char c = *m_src.p++;
      if (c == '}') {
        return Step::kOk;
      }
      if (c != ',') {
        return Step::kUnsure;
      }
    }
  }

  LineSource& m_src;
  size_t m_limit;
  QueueEvent* m_out = nullptr;
  bool m_event = false;
  bool m_path = false;
  size_t m_pathSize = 0;
  size_t m_pathOldSize = 0;
};

// ---------------------------------------------------------------------------------------------
// Reading a queue file line by line.

// One line of the file as the readers use it: the event, if any, with at most the capture limit
// of each path, and where the line lies.
struct ReadLine {
  bool isEvent = false;
  QueueEvent event;       // the code; the paths when they had to be decoded
  std::string_view path;  // at most the capture limit of each path
  std::string_view pathOld;
  size_t pathSize = 0;  // their whole lengths
  size_t pathOldSize = 0;
  off_t start = 0;        // offset of its first byte
  off_t stop = 0;         // offset after its "\n", or of its end when it has none
  bool ended = false;     // ended by "\n"
  std::string_view text;  // for the log: the line, or the start of a line longer than the block
};

// Reads a file from an offset in blocks and hands out its lines. The buffer holds one block and
// `kWindow` bytes more, so the bytes just before the point read to are at hand; it never grows.
class BlockReader {
 public:
  // Lines are handed out from `from`; the `kWindow` bytes before it are read too, so that the
  // window before the point read to is at hand even when little was appended.
  BlockReader(int fd, off_t from, size_t blockSize)
      : m_fd(fd),
        m_size(std::max<size_t>(blockSize, 1) + kWindow),
        m_buffer(new char[m_size]),
        m_base(from - std::min<off_t>(from, static_cast<off_t>(kWindow))),
        m_skip(static_cast<size_t>(from - m_base)) {}

  // Reads the next line into `line`, capturing at most `limit` bytes of each path; false when
  // the file has nothing left. A read error ends the file where it happened.
  bool Next(ReadLine& line, size_t limit) {
    Start();
    char* data = m_buffer.get();
    const char* newline = nullptr;
    size_t searched = m_pos;
    for (;;) {
      const void* found = std::memchr(data + searched, '\n', m_fill - searched);
      if (found != nullptr) {
        newline = static_cast<const char*>(found);
        break;
      }
      searched = m_fill;
      if (m_eof || m_fill - m_pos + kWindow >= m_size) {
        break;  // the whole rest of the file, or a line longer than the block
      }
      const size_t kept = Compact(m_pos);
      searched -= kept;
      data = m_buffer.get();
      Fill();
    }
    if (newline == nullptr && m_pos == m_fill) {
      return false;
    }
    line.start = Offset(m_pos);
    if (newline != nullptr || m_eof) {
      const char* begin = data + m_pos;
      const char* end = newline != nullptr ? newline : data + m_fill;
      m_pos = static_cast<size_t>(end - data) + (newline != nullptr ? 1 : 0);
      line.ended = newline != nullptr;
      line.stop = Offset(m_pos);
      line.text = std::string_view(begin, static_cast<size_t>(end - begin));
      Classify(line, begin, end, limit);
      return true;
    }
    Stream(line, limit);
    return true;
  }

  // What Skim's callback makes of a line.
  enum class Take {
    kSkip,    // done with it, go on
    kStop,    // done with it, and with reading
    kRefuse,  // leave it to Next
  };

  // Hands the lines the buffer already holds, from where reading stands, to
  // `take(begin, fill, newline)` for as long as it takes them: it sets `newline` to the "\n" that
  // ends a line it takes. `end` gets the offset after the last line taken. The line refused, and
  // a line the buffer does not hold whole, are left for Next. False when `take` asked to stop.
  template <class F>
  bool Skim(F&& take, off_t& end) {
    Start();
    const char* data = m_buffer.get();
    const char* p = data + m_pos;
    const char* const fill = data + m_fill;
    bool stop = false;
    while (p < fill) {
      const char* newline = nullptr;
      const Take verdict = take(p, fill, newline);
      if (verdict == Take::kRefuse) {
        break;
      }
      p = newline + 1;
      if (verdict == Take::kStop) {
        stop = true;
        break;
      }
    }
    if (p != data + m_pos) {
      m_pos = static_cast<size_t>(p - data);
      end = Offset(m_pos);
    }
    return !stop;
  }

  // A plain line (see Plain) at `p`, read straight from the buffer that holds bytes up to
  // `fill`: returns the "\n" that ends it, or nullptr when the line is not plain or its end is
  // not at hand.
  static const char* PlainLine(const char* p, const char* fill, bool& moved, std::string_view& path,
                               std::string_view& pathOld) {
    if (Begins(p, fill, R"({"event":)")) {
      p += sizeof R"({"event":)" - 1;
    } else if (Begins(p, fill, R"({"data":null,"event":)")) {
      p += sizeof R"({"data":null,"event":)" - 1;
    } else {
      return nullptr;
    }
    const size_t n = LeadingDigits(p, fill);
    if (n == 0 || n > 10 || !DigitsFit(p, n) || !Begins(p + n, fill, R"(,"path":")")) {
      return nullptr;
    }
    moved = DigitsAre(p, n, "256");
    p += n + sizeof R"(,"path":")" - 1;
    const char* quote = FindAny(p, fill, '"', '\\', '\n');
    if (quote == fill || *quote != '"') {
      return nullptr;
    }
    path = std::string_view(p, static_cast<size_t>(quote - p));
    pathOld = std::string_view();
    if (Begins(quote, fill, R"(","path_old":")")) {
      p = quote + sizeof R"(","path_old":")" - 1;
      quote = FindAny(p, fill, '"', '\\', '\n');
      if (quote == fill || *quote != '"') {
        return nullptr;
      }
      pathOld = std::string_view(p, static_cast<size_t>(quote - p));
    }
    if (fill - quote < 3 || quote[1] != '}' || quote[2] != '\n') {
      return nullptr;
    }
    return quote + 2;
  }

  // The offset just after the last complete line handed out, and the hash of the `kWindow` bytes
  // (or fewer, from the start of the file) before it, when the buffer still holds them.
  bool TailWindow(off_t end, uint64_t& hash, size_t& size) const {
    size = static_cast<size_t>(std::min<off_t>(end, static_cast<off_t>(kWindow)));
    if (end - static_cast<off_t>(size) < m_base || end > Offset(m_fill)) {
      return false;
    }
    const auto at = static_cast<size_t>(end - m_base);
    hash = Hash(m_buffer.get() + at - size, size);
    return true;
  }

  // Lines that cannot be reindex events are then only told apart from them, not read.
  void OnlyReindexEvents() { m_onlyReindex = true; }

  // The first bytes of the file, up to `kWindow`, when this reader started at the file's start.
  const std::string& Head() const { return m_head; }

 private:
  class StreamSource : public LineSource {
   public:
    StreamSource(BlockReader& reader, const char* p, const char* end)
        : LineSource(p, end), m_reader(reader) {}
    bool More() override { return m_reader.MoreOfLine(*this); }

   private:
    BlockReader& m_reader;
  };

  off_t Offset(size_t at) const { return m_base + static_cast<off_t>(at); }

  // Before the first line: the bytes read only for the window are passed over.
  void Start() {
    if (m_skip > 0) {
      while (m_fill < m_skip && !m_eof) {
        Fill();
      }
      m_pos = std::min(m_skip, m_fill);
      m_skip = 0;
    }
  }

  // Moves the bytes from `kWindow` before `from` to the front; returns how far they moved.
  size_t Compact(size_t from) {
    const size_t keep = from > kWindow ? from - kWindow : 0;
    if (keep > 0) {
      std::memmove(m_buffer.get(), m_buffer.get() + keep, m_fill - keep);
      m_fill -= keep;
      m_pos -= std::min(m_pos, keep);
      m_base += static_cast<off_t>(keep);
    }
    return keep;
  }

  void Fill() {
    while (!m_eof && m_fill < m_size) {
      const ssize_t got = pread(m_fd, m_buffer.get() + m_fill, m_size - m_fill, Offset(m_fill));
      if (got < 0 && errno == EINTR) {
        continue;
      }
      if (got <= 0) {
        m_eof = true;
        break;
      }
      if (m_base == 0 && m_head.size() < kWindow) {
        const size_t from = m_fill;
        const size_t upto = std::min(m_fill + static_cast<size_t>(got), kWindow);
        if (from < upto) {
          m_head.append(m_buffer.get() + from, upto - from);
        }
      }
      m_fill += static_cast<size_t>(got);
      return;
    }
  }

  // Brings more of a streamed line into `source`; false at its end.
  bool MoreOfLine(StreamSource& source) {
    if (m_lineEnded) {
      return false;
    }
    m_pos = static_cast<size_t>(source.p - m_buffer.get());
    for (;;) {
      const char* data = m_buffer.get();
      if (m_pos < m_fill) {
        const void* newline = std::memchr(data + m_pos, '\n', m_fill - m_pos);
        source.p = data + m_pos;
        source.end = newline != nullptr ? static_cast<const char*>(newline) : data + m_fill;
        m_lineEnded = newline != nullptr;
        if (m_logHead.size() < kLogHead) {
          m_logHead.append(source.p, std::min(static_cast<size_t>(source.end - source.p),
                                              kLogHead - m_logHead.size()));
        }
        return source.p != source.end;
      }
      if (m_eof) {
        m_lineEnded = true;
        source.p = source.end = data + m_pos;
        return false;
      }
      Compact(m_pos);
      Fill();
    }
  }

 public:
  // The shapes the writers produce most, {"event":N,"path":"P"}, {"event":N,"path":"P",
  // "path_old":"O"} and {"data":null,"event":N,"path":"P"}, with plain decimals and strings
  // without a backslash, are taken straight from the buffer; the parser reads them exactly so.
  static bool Plain(ReadLine& line, const char* p, const char* end) {
    static constexpr char kEvent[] = R"({"event":)";
    static constexpr char kPath[] = R"(,"path":")";
    static constexpr char kPathOld[] = R"(","path_old":")";
    const auto take = [&p, end](const char* text, size_t size) {
      if (static_cast<size_t>(end - p) < size || std::memcmp(p, text, size) != 0) {
        return false;
      }
      p += size;
      return true;
    };
    const auto string = [&p, end](std::string_view& out) {
      const void* quote = std::memchr(p, '"', static_cast<size_t>(end - p));
      if (quote == nullptr) {
        return false;
      }
      const auto size = static_cast<size_t>(static_cast<const char*>(quote) - p);
      if (std::memchr(p, '\\', size) != nullptr) {
        return false;
      }
      out = std::string_view(p, size);
      p += size;
      return true;
    };
    // The library's own reindex events carry a null "data" first.
    static constexpr char kNullData[] = R"({"data":null,"event":)";
    if (!take(kEvent, sizeof kEvent - 1) && !take(kNullData, sizeof kNullData - 1)) {
      return false;
    }
    uint64_t code = 0;
    const char* digits = p;
    while (p != end && *p >= '0' && *p <= '9' && p - digits < 11) {
      code = code * 10 + static_cast<uint64_t>(*p++ - '0');
    }
    if (p == digits || p - digits > 10 || code > UINT_MAX || !take(kPath, sizeof kPath - 1) ||
        !string(line.path)) {
      return false;
    }
    line.pathOld = std::string_view();
    if (end - p == 2 && p[0] == '"' && p[1] == '}') {
      // done
    } else if (!take(kPathOld, sizeof kPathOld - 1) || !string(line.pathOld) || end - p != 2 ||
               p[0] != '"' || p[1] != '}') {
      return false;
    }
    line.isEvent = true;
    line.event.event = static_cast<unsigned int>(code);
    line.pathSize = line.path.size();
    line.pathOldSize = line.pathOld.size();
    return true;
  }

  static void Decoded(ReadLine& line) {
    line.path = line.event.path;
    line.pathOld = line.event.pathOld;
  }

  // Whether a line that is not plain may be a reindex event: its "event" must then be a number
  // whose text holds "65536", or rounds up from "65535.", or has an exponent.
  static bool MayBeReindex(const char* begin, const char* end) {
    const auto at = [end](const char* q, const char* text, size_t size) {
      return static_cast<size_t>(end - q) >= size && std::memcmp(q, text, size) == 0;
    };
    for (const char* q = begin; q < end; ++q) {
      q = static_cast<const char*>(std::memchr(q, '6', static_cast<size_t>(end - q)));
      if (q == nullptr) {
        break;
      }
      if (at(q, "65536", 5) || at(q, "65535.", 6)) {
        return true;
      }
    }
    // An exponent follows a digit or a point.
    for (const char e : {'e', 'E'}) {
      for (const char* q = begin + 1; q < end; ++q) {
        q = static_cast<const char*>(std::memchr(q, e, static_cast<size_t>(end - q)));
        if (q == nullptr) {
          break;
        }
        if (!((q[-1] >= '0' && q[-1] <= '9') || q[-1] == '.')) {
          continue;
        }
        const char* next = q + 1;
        if (next != end && (*next == '+' || *next == '-')) {
          ++next;
        }
        if (next != end && *next >= '0' && *next <= '9') {
          return true;
        }
      }
    }
    return false;
  }

  // Whether a line surely is no reindex event because it begins as a plain line with another
  // code: valid or not, it cannot be one.
  static bool OtherCode(const char* p, const char* end) {
    if (Begins(p, end, R"({"event":)")) {
      p += sizeof R"({"event":)" - 1;
    } else if (Begins(p, end, R"({"data":null,"event":)")) {
      p += sizeof R"({"data":null,"event":)" - 1;
    } else {
      return false;
    }
    const size_t n = LeadingDigits(p, end);
    return n != 0 && n <= 10 && p + n != end && (p[n] == ',' || p[n] == '}') &&
           !DigitsAre(p, n, "65536");
  }

 private:
  void Classify(ReadLine& line, const char* begin, const char* end, size_t limit) const {
    if (m_onlyReindex && OtherCode(begin, end)) {
      line.isEvent = false;
      return;
    }
    if (Plain(line, begin, end)) {
      return;
    }
    if (m_onlyReindex && !MayBeReindex(begin, end)) {
      line.isEvent = false;
      return;
    }
    LineSource source(begin, end);
    switch (LineScanner(source, limit).Event(line.event, line.pathSize, line.pathOldSize)) {
      case LineVerdict::kEvent:
        line.isEvent = true;
        Decoded(line);
        return;
      case LineVerdict::kNoEvent:
        line.isEvent = false;
        return;
      case LineVerdict::kUnsure:
        break;
    }
    line.isEvent = ParseQueueLine(begin, static_cast<size_t>(end - begin), line.event);
    line.pathSize = line.event.path.size();
    line.pathOldSize = line.event.pathOld.size();
    Decoded(line);
  }

  // A line longer than the block: scanned as it streams past, with its start kept for the log.
  void Stream(ReadLine& line, size_t limit) {
    const char* begin = m_buffer.get() + m_pos;
    const auto held = static_cast<size_t>(m_fill - m_pos);
    m_logHead.assign(begin, std::min(held, kLogHead));
    m_lineEnded = false;
    StreamSource source(*this, begin, m_buffer.get() + m_fill);
    const LineVerdict verdict =
        LineScanner(source, limit).Event(line.event, line.pathSize, line.pathOldSize);
    // Up to the end of the line, whatever the scanner left.
    source.p = source.end;
    while (source.More()) {
      source.p = source.end;
    }
    m_pos = static_cast<size_t>(source.p - m_buffer.get());
    line.ended = m_pos < m_fill && m_buffer[m_pos] == '\n';
    if (line.ended) {
      ++m_pos;
    }
    line.stop = Offset(m_pos);
    line.text = m_logHead;
    line.isEvent = verdict == LineVerdict::kEvent;
    Decoded(line);
    if (verdict == LineVerdict::kUnsure) {
      // The one case that needs the whole line at once: the parser reads it a second time.
      // A line the process cannot hold counts as no event, as the parser could not hold it.
      const auto size = static_cast<size_t>(line.stop - line.start - (line.ended ? 1 : 0));
      std::string whole;
      try {
        whole.resize(size);
      } catch (const std::bad_alloc&) {
        line.isEvent = false;
        return;
      }
      size_t got = 0;
      while (got < size) {
        const ssize_t n =
            pread(m_fd, &whole[got], size - got, line.start + static_cast<off_t>(got));
        if (n <= 0 && !(n < 0 && errno == EINTR)) {
          break;
        }
        got += n > 0 ? static_cast<size_t>(n) : 0;
      }
      line.isEvent = got == size && ParseQueueLine(whole.data(), whole.size(), line.event);
      if (line.isEvent) {
        line.pathSize = line.event.path.size();
        line.pathOldSize = line.event.pathOld.size();
        Decoded(line);
      }
    }
  }

  int m_fd;
  size_t m_size;
  std::unique_ptr<char[]> m_buffer;  // left uninitialised: a short file touches little of it
  off_t m_base;                      // the file offset of the buffer's first byte
  size_t m_skip;                     // bytes at the start read only for the window
  size_t m_pos = 0;                  // where the part not yet handed out begins
  size_t m_fill = 0;                 // how much of the buffer holds read bytes
  bool m_eof = false;
  bool m_lineEnded = false;
  bool m_onlyReindex = false;
  std::string m_head;
  std::string m_logHead;
};

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

// Describes what `reader` read, up to the end of the last complete line `end`, of the file at
// `fd`; false when it cannot be described (the bytes before `end` are no longer at hand).
bool Describe(int fd, const BlockReader& reader, off_t end, const FileState* before,
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
  if (!reader.TailWindow(end, out.tailHash, out.tailSize)) {
    return false;
  }
  if (before != nullptr &&
      static_cast<off_t>(before->headSize) == std::min<off_t>(end, static_cast<off_t>(kWindow))) {
    out.headSize = before->headSize;
    out.headHash = before->headHash;
    return true;
  }
  out.headSize = static_cast<size_t>(std::min<off_t>(end, static_cast<off_t>(kWindow)));
  if (reader.Head().size() < out.headSize) {
    return false;
  }
  out.headHash = Hash(reader.Head().data(), out.headSize);
  return true;
}

// True when nothing that could be a queue is at `queueFile`: it is missing, or it is not a regular
// file. Anything else that keeps it from being looked at (a link on the way, no descriptor left)
// is for the open to report.
bool NoQueueAt(const std::string& queueFile) {
  return !LocationFileExists(queueFile) &&
         (errno == ENOENT || errno == ENOTDIR || errno == EISDIR || errno == ENXIO);
}

// ---------------------------------------------------------------------------------------------
// The folder test.

// Folder full paths, looked up by the ancestors of an event's path. A path lies in a folder as
// StringStartWith(path + "/", full + "/") says: byte for byte, except that the comparison ends
// at a NUL byte that both hold, so a folder with a NUL in its path is tested on its own.
class FolderSet {
 public:
  explicit FolderSet(const std::vector<std::string>& fullPaths) : m_paths(fullPaths) {
    for (size_t i = 0; i < m_paths.size(); ++i) {
      const std::string& path = m_paths[i];
      if (path.find('\0') != std::string::npos) {
        m_odd.push_back(i);
        continue;
      }
      m_byPath[path].push_back(i);
      if (m_byPath.size() == 1) {
        m_common = path;
        m_minSize = path.size();
      }
      size_t same = 0;
      while (same < m_common.size() && same < path.size() && m_common[same] == path[same]) {
        ++same;
      }
      m_common.resize(same);
      m_minSize = std::min(m_minSize, path.size());
      m_maxSize = std::max(m_maxSize, path.size());
      if (m_sizes.size() <= path.size()) {
        m_sizes.resize(path.size() + 1, 0);
      }
      m_sizes[path.size()] = 1;
    }
    for (const size_t i : m_odd) {
      m_maxSize = std::max(m_maxSize, m_paths[i].size());
    }
    m_sizes.resize(m_maxSize + 1, 0);
    size_t slots = 8;
    m_shift = 61;
    while (slots < 2 * m_byPath.size()) {
      slots *= 2;
      --m_shift;
    }
    m_table.resize(slots);
    for (const auto& entry : m_byPath) {
      const uint64_t key = Key(entry.first.data(), entry.first.size());
      size_t h = key >> m_shift;
      while (m_table[h].folders != nullptr) {
        h = (h + 1) & (slots - 1);
      }
      m_table[h] = Slot{key, &entry.first, &entry.second};
    }
  }

  // Bytes of an event's path that the test needs.
  size_t Limit() const { return m_maxSize + 1; }
  size_t Size() const { return m_paths.size(); }

  // Marks in `found` the folders that hold the path (its first `path.size()` bytes of
  // `fullSize`); returns how many of those marked anew are `asked`.
  size_t Mark(std::string_view path, size_t fullSize, const std::vector<bool>& asked,
              std::vector<bool>& found, std::vector<size_t>& marks) const {
    size_t marked = 0;
    const size_t upto = std::min(fullSize, m_maxSize);
    // Every folder begins with the folders' common start; then only the ends of the path's
    // components can be folders.
    // Siblings differ near the end of the common start, so its last byte is looked at first.
    const size_t common = m_common.size();
    if (!m_byPath.empty() && fullSize >= m_minSize &&
        (common == 0 || (path[common - 1] == m_common[common - 1] &&
                         std::memcmp(path.data(), m_common.data(), common) == 0))) {
      for (size_t end = m_minSize; end <= upto; ++end) {
        if (m_sizes[end] == 0 || (end != fullSize && path[end] != '/')) {
          continue;
        }
        const uint64_t key = Key(path.data(), end);
        for (size_t h = key >> m_shift; m_table[h].folders != nullptr;
             h = (h + 1) & (m_table.size() - 1)) {
          const Slot& slot = m_table[h];
          if (slot.key != key) {
            continue;
          }
          // A path already found needs no comparing.
          const std::vector<size_t>& folders = *slot.folders;
          if (std::all_of(folders.begin(), folders.end(),
                          [&found](size_t f) { return found[f]; }) ||
              slot.path->size() != end ||
              (end != 0 && std::memcmp(slot.path->data(), path.data(), end) != 0)) {
            continue;
          }
          for (const size_t f : folders) {
            if (!found[f]) {
              found[f] = true;
              marks.push_back(f);
              marked += asked[f] ? 1 : 0;
            }
          }
        }
      }
    }
    for (const size_t f : m_odd) {
      if (!found[f] && HoldsOdd(m_paths[f], path, fullSize)) {
        found[f] = true;
        marks.push_back(f);
        marked += asked[f] ? 1 : 0;
      }
    }
    return marked;
  }

 private:
  // A folder path in the table: its key, the path, the folders with that path.
  struct Slot {
    uint64_t key = 0;
    const std::string_view* path = nullptr;
    const std::vector<size_t>* folders = nullptr;
  };

  // The key of the first `size` bytes at `path`: their length and last eight bytes, mixed.
  static uint64_t Key(const char* path, size_t size) {
    uint64_t last = 0;
    const size_t n = std::min<size_t>(size, sizeof last);
    if (n != 0) {  // an empty path may have no bytes at all
      std::memcpy(&last, path + size - n, n);
    }
    return (last ^ (size * 0x9E3779B97F4A7C15ULL)) * 0xBF58476D1CE4E5B9ULL;
  }

  static bool HoldsOdd(const std::string& folder, std::string_view path, size_t fullSize) {
    if (folder.size() > fullSize) {
      return false;
    }
    for (size_t i = 0; i <= folder.size(); ++i) {
      const char want = i < folder.size() ? folder[i] : '/';
      const char have = i < fullSize ? path[i] : '/';
      if (have != want) {
        return false;
      }
      if (have == '\0') {
        return true;
      }
    }
    return true;
  }

  const std::vector<std::string>& m_paths;
  std::unordered_map<std::string_view, std::vector<size_t>> m_byPath;
  std::vector<size_t> m_odd;
  std::vector<char> m_sizes;  // whether some folder's path is this long
  std::vector<Slot> m_table;  // open addressing on Key; at most half full
  unsigned int m_shift = 61;  // a key's top bits choose its slot
  std::string m_common;       // what all folders without a NUL begin with
  size_t m_minSize = 0;
  size_t m_maxSize = 0;
};

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
  std::vector<size_t> marks;  // folders found in the line read last
  bool lastEnded = true;
  off_t end = from;
  std::unique_ptr<BlockReader> reader;
  if (left > 0) {
    const FolderSet set(wanted);
    reader = std::make_unique<BlockReader>(fd, from, options.blockSize);
    ReadLine line;
    // Plain lines are tested straight from the buffer.
    bool moved = false;
    std::string_view path;
    std::string_view pathOld;
    const auto test = [&](const char* begin, const char* fill, const char*& newline) {
      newline = BlockReader::PlainLine(begin, fill, moved, path, pathOld);
      if (newline == nullptr) {
        return BlockReader::Take::kRefuse;
      }
      marks.clear();
      left -= set.Mark(path, path.size(), asked, wantedFound, marks);
      if (moved) {
        left -= set.Mark(pathOld, pathOld.size(), asked, wantedFound, marks);
      }
      lastEnded = true;
      return left > 0 ? BlockReader::Take::kSkip : BlockReader::Take::kStop;
    };
    while (left > 0 && reader->Skim(test, end) && reader->Next(line, set.Limit())) {
      marks.clear();
      if (!line.isEvent) {
        if (line.stop > quietUpTo) {
          detail::WriteLog(false, kFolderUnit, __LINE__, "Malformed command: %.*s",
                           LogWidth(line.text.size()), line.text.data());
        }
      } else {
        left -= set.Mark(line.path, line.pathSize, asked, wantedFound, marks);
        if (line.event.event == static_cast<unsigned int>(kEventMoved)) {
          left -= set.Mark(line.pathOld, line.pathOldSize, asked, wantedFound, marks);
        }
      }
      lastEnded = line.ended;
      if (line.ended) {
        end = line.stop;
      }
    }
  }
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
  if (reader == nullptr) {
    next.file = entry.file;
  } else if (!Describe(fd, *reader, end, subset ? &entry.file : nullptr, next.file)) {
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

LineVerdict ScanQueueLine(const char* line, size_t size, QueueEvent& out) {
  LineSource source(line, line + size);
  size_t pathSize = 0;
  size_t pathOldSize = 0;
  return LineScanner(source, SIZE_MAX).Event(out, pathSize, pathOldSize);
}

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
  bool keep = options.remember;
  const size_t limit = std::max(path.size() + 1, kRememberedPath);
  BlockReader reader(fd.get(), have ? entry.file.offset : 0, options.blockSize);
  reader.OnlyReindexEvents();
  ReadLine line;
  bool queued = false;
  off_t end = have ? entry.file.offset : 0;
  // Plain lines with another code are passed over in bulk.
  const auto other = [](const char* begin, const char* fill, const char*& newline) {
    if (!BlockReader::OtherCode(begin, fill)) {
      return BlockReader::Take::kRefuse;
    }
    newline = FindAny(begin, fill, '\n', '\n', '\n');
    return newline != fill ? BlockReader::Take::kSkip : BlockReader::Take::kRefuse;
  };
  while (!queued) {
    reader.Skim(other, end);
    if (!reader.Next(line, limit)) {
      break;
    }
    if (!line.isEvent || line.event.event != static_cast<unsigned int>(kEventReindex)) {
      if (line.ended) {
        end = line.stop;
      }
      continue;
    }
    queued = line.pathSize == path.size() && line.path == path;
    if (!line.ended) {
      continue;
    }
    end = line.stop;
    if (keep) {
      keep = line.pathSize <= kRememberedPath && entry.paths.size() < kMaxRemembered;
      if (keep) {
        entry.paths.emplace(line.path);
      }
    }
  }
  FileState state;
  if (keep && Describe(fd.get(), reader, end, have ? &entry.file : nullptr, state)) {
    entry.file = state;
    ReindexMemory().Put(queueFile, std::move(entry));
  }
  return queued;
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
