#include "utils/block_reader.h"

#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>
#include <new>

namespace WEZO {
namespace FILEINDEX {
namespace detail {
namespace {

// Of a malformed line longer than the block, what its log line shows.
constexpr size_t kLogHead = size_t{64} << 10;

}  // namespace

// Reads the next line into `line`, capturing at most `limit` bytes of each path; false when
// the file has nothing left. A read error ends the file where it happened.
bool BlockReader::Next(ReadLine& line, size_t limit) {
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

// The offset just after the last complete line handed out, and the hash of the `kWindow` bytes
// (or fewer, from the start of the file) before it, when the buffer still holds them.
bool BlockReader::TailWindow(off_t end, uint64_t& hash, size_t& size) const {
  size = static_cast<size_t>(std::min<off_t>(end, static_cast<off_t>(kWindow)));
  if (end - static_cast<off_t>(size) < m_base || end > Offset(m_fill)) {
    return false;
  }
  const auto at = static_cast<size_t>(end - m_base);
  hash = Hash(m_buffer.get() + at - size, size);
  return true;
}

// Before the first line: the bytes read only for the window are passed over.
void BlockReader::Start() {
  if (m_skip > 0) {
    while (m_fill < m_skip && !m_eof) {
      Fill();
    }
    m_pos = std::min(m_skip, m_fill);
    m_skip = 0;
  }
}

// Moves the bytes from `kWindow` before `from` to the front; returns how far they moved.
size_t BlockReader::Compact(size_t from) {
  const size_t keep = from > kWindow ? from - kWindow : 0;
  if (keep > 0) {
    m_indexed = false;
    std::memmove(m_buffer.get(), m_buffer.get() + keep, m_fill - keep);
    m_fill -= keep;
    m_pos -= std::min(m_pos, keep);
    m_base += static_cast<off_t>(keep);
  }
  return keep;
}

void BlockReader::Fill() {
  while (!m_eof && m_fill < m_size) {
    size_t want = m_size - m_fill;
    if (m_limit >= 0) {
      want = static_cast<size_t>(
          std::min<off_t>(static_cast<off_t>(want), std::max<off_t>(m_limit - Offset(m_fill), 0)));
    }
    const ssize_t got = want == 0 ? 0 : pread(m_fd, m_buffer.get() + m_fill, want, Offset(m_fill));
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
bool BlockReader::MoreOfLine(StreamSource& source) {
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

// The shapes the writers produce most, {"event":N,"path":"P"}, {"event":N,"path":"P",
// "path_old":"O"} and {"data":null,"event":N,"path":"P"}, with plain decimals and strings
// without a backslash, are taken straight from the buffer; the parser reads them exactly so.
bool BlockReader::Plain(ReadLine& line, const char* p, const char* end) {
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

// Whether a line that is not plain may be a reindex event: its "event" must then be a number
// whose text holds "65536", or rounds up from "65535.", or has an exponent.
bool BlockReader::MayBeReindex(const char* begin, const char* end) {
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

void BlockReader::Classify(ReadLine& line, const char* begin, const char* end, size_t limit) const {
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
  switch (ScanLine(source, limit, line.event, line.pathSize, line.pathOldSize)) {
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
void BlockReader::Stream(ReadLine& line, size_t limit) {
  const char* begin = m_buffer.get() + m_pos;
  const auto held = static_cast<size_t>(m_fill - m_pos);
  m_logHead.assign(begin, std::min(held, kLogHead));
  m_lineEnded = false;
  StreamSource source(*this, begin, m_buffer.get() + m_fill);
  const LineVerdict verdict = ScanLine(source, limit, line.event, line.pathSize, line.pathOldSize);
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
      const ssize_t n = pread(m_fd, &whole[got], size - got, line.start + static_cast<off_t>(got));
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

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
