#include "utils/line_scanner.h"

#include <algorithm>
#include <climits>
#include <cstdint>
#include <cstring>
#include <string>

#include "utils/scan_bytes.h"

namespace WEZO {
namespace FILEINDEX {
namespace detail {
namespace {

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

  // After a member or an element: "," (kOk, `closed` false) or `close` (kOk, `closed` true).
  Step Separator(char close, bool& closed) {
    SkipSpace();
    if (!Avail()) {
      return Step::kMalformed;
    }
    const char c = *m_src.p++;
    closed = c == close;
    return closed || c == ',' ? Step::kOk : Step::kUnsure;
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
      bool closed = false;
      if (step == Step::kOk) {
        step = Separator(']', closed);
      }
      if (step != Step::kOk || closed) {
        return step;
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
      bool closed = false;
      if (step == Step::kOk) {
        step = Separator('}', closed);
      }
      if (step != Step::kOk || closed) {
        return step;
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

}  // namespace

LineVerdict ScanLine(LineSource& source, size_t limit, QueueEvent& out, size_t& pathSize,
                     size_t& pathOldSize) {
  return LineScanner(source, limit).Event(out, pathSize, pathOldSize);
}

LineVerdict ScanQueueLine(const char* line, size_t size, QueueEvent& out) {
  LineSource source(line, line + size);
  size_t pathSize = 0;
  size_t pathOldSize = 0;
  return ScanLine(source, SIZE_MAX, out, pathSize, pathOldSize);
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
