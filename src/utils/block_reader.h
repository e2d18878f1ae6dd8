// Reading a queue file line by line, in blocks, from an offset.
#ifndef FILEINDEX_SRC_UTILS_BLOCK_READER_H_
#define FILEINDEX_SRC_UTILS_BLOCK_READER_H_

#include <sys/types.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>

#include "utils/line_index.h"
#include "utils/line_scanner.h"
#include "utils/queue_reader.h"
#include "utils/scan_bytes.h"

namespace WEZO {
namespace FILEINDEX {
namespace detail {

// Bytes at the start of a queue and just before the point read to that must be unchanged for
// the rest of what was read to count as unchanged.
constexpr size_t kWindow = 4096;

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

  // The file ends at `limit` for this reader.
  void StopAt(off_t limit) { m_limit = limit; }

  // Reads the next line into `line`, capturing at most `limit` bytes of each path; false when
  // the file has nothing left. A read error ends the file where it happened.
  bool Next(ReadLine& line, size_t limit);

  // Passes over the lines the buffer holds whole, from where reading stands, that cannot be a
  // reindex event: those without a hint of one (NextReindexHint), and those with a hint that begin
  // as a plain line with another code (OtherCode). Stops at the start of the first other line,
  // left for Next, or after the last line held whole; `end` gets the offset after the last line
  // passed over.
  void SkipUnhinted(off_t& end) {
    Start();
    const char* const data = m_buffer.get();
    const char* const from = data + m_pos;
    const void* last = memrchr(from, '\n', m_fill - m_pos);
    if (last == nullptr) {
      return;
    }
    const char* const whole = static_cast<const char*>(last) + 1;
    const char* p = from;
    const char* to = whole;
    while (const char* hint = NextReindexHint(data, p, whole)) {
      const void* before = memrchr(p, '\n', static_cast<size_t>(hint - p));
      const char* const start = before != nullptr ? static_cast<const char*>(before) + 1 : p;
      const auto* newline =
          static_cast<const char*>(std::memchr(hint, '\n', static_cast<size_t>(whole - hint)));
      if (!OtherCode(start, newline)) {
        to = start;
        break;
      }
      p = newline + 1;
    }
    if (to != from) {
      m_pos = static_cast<size_t>(to - data);
      end = Offset(m_pos);
    }
  }

  // What SkimPlain's callback makes of a line.
  enum class Take {
    kSkip,    // done with it, go on
    kStop,    // done with it, and with reading
    kRefuse,  // leave it to Next
  };

  // Hands the lines the buffer already holds, from where reading stands, to
  // `take(index, begin, newline)`, with `index` built over a stretch that ends with a
  // "\n" after `begin`, for as long as it takes them: it sets `newline` to the "\n" that ends a
  // line it takes. `end` gets the offset after the last line taken. The line refused, and a line
  // the buffer does not hold whole (or one longer than the index's span), are left for Next.
  // False when `take` asked to stop.
  template <class F>
  bool SkimPlain(F&& take, off_t& end) {
    Start();
    const char* const data = m_buffer.get();
    const char* p = data + m_pos;
    const char* const fill = data + m_fill;
    LineIndex& index = Index();
    if (m_indexed && index.Begin() > p) {
      m_indexed = false;
    }
    bool stop = false;
    while (p < fill) {
      if (!m_indexed || p >= index.End()) {
        // Up to the last "\n" of the stretch, so that every stop looked for is found in it.
        const size_t size = std::min<size_t>(fill - p, LineIndex::kSpan);
        const void* last = memrchr(p, '\n', size);
        if (last == nullptr) {
          m_indexed = false;
          break;
        }
        index.Build(p, static_cast<const char*>(last) + 1);
        m_indexed = true;
      }
      const char* newline = nullptr;
      const Take verdict = take(index, p, newline);
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

  // Where the code begins in a line at `p` that begins as the writers begin theirs,
  // {"event": or, the library's reindex events, {"data":null,"event":; nullptr for another line.
  static const char* AfterCodeName(const char* p, const char* end) {
    static constexpr char kEvent[] = R"({"event":)";
    static constexpr char kNullData[] = R"({"data":null,"event":)";
    if (Begins(p, end, kEvent)) {
      return p + sizeof kEvent - 1;
    }
    return Begins(p, end, kNullData) ? p + sizeof kNullData - 1 : nullptr;
  }

  // A plain line (see Plain) at `p`, in the stretch of `index` that holds it:
  // returns the "\n" that ends it, or nullptr when the line is not plain.
  static const char* PlainLine(const LineIndex& index, const char* p, bool& moved,
                               std::string_view& path, std::string_view& pathOld) {
    const char* const end = index.End();
    p = AfterCodeName(p, end);
    if (p == nullptr) {
      return nullptr;
    }
    const size_t n = LeadingDigits(p, end);
    if (n == 0 || n > 10 || !DigitsFit(p, n) || !Begins(p + n, end, R"(,"path":")")) {
      return nullptr;
    }
    moved = DigitsAre(p, n, "256");
    p += n + sizeof R"(,"path":")" - 1;
    // The stretch ends with a "\n": a stop is found, and the byte after a quote is in it.
    const char* quote = index.NextStop(p);
    if (*quote != '"') {
      return nullptr;
    }
    path = std::string_view(p, static_cast<size_t>(quote - p));
    pathOld = std::string_view();
    if (Begins(quote, end, R"(","path_old":")")) {
      p = quote + sizeof R"(","path_old":")" - 1;
      quote = index.NextStop(p);
      if (*quote != '"') {
        return nullptr;
      }
      pathOld = std::string_view(p, static_cast<size_t>(quote - p));
    }
    if (quote[1] != '}' || quote[2] != '\n') {
      return nullptr;
    }
    return quote + 2;
  }

  // The offset just after the last complete line handed out, and the hash of the `kWindow` bytes
  // (or fewer, from the start of the file) before it, when the buffer still holds them.
  bool TailWindow(off_t end, uint64_t& hash, size_t& size) const;

  // Lines that cannot be reindex events are then only told apart from them, not read.
  void OnlyReindexEvents() { m_onlyReindex = true; }

  // The first bytes of the file, up to `kWindow`, when this reader started at the file's start.
  const std::string& Head() const { return m_head; }

  // The shapes the writers produce most, {"event":N,"path":"P"}, {"event":N,"path":"P",
  // "path_old":"O"} and {"data":null,"event":N,"path":"P"}, with plain decimals and strings
  // without a backslash, are taken straight from the buffer; the parser reads them exactly so.
  static bool Plain(ReadLine& line, const char* p, const char* end);

  static void Decoded(ReadLine& line) {
    line.path = line.event.path;
    line.pathOld = line.event.pathOld;
  }

  // Whether a line that is not plain may be a reindex event: its "event" must then be a number
  // whose text holds "65536", or rounds up from "65535.", or has an exponent.
  static bool MayBeReindex(const char* begin, const char* end);

  // Whether a line surely is no reindex event because it begins as a plain line with another
  // code: valid or not, it cannot be one.
  static bool OtherCode(const char* p, const char* end) {
    p = AfterCodeName(p, end);
    if (p == nullptr) {
      return false;
    }
    const size_t n = LeadingDigits(p, end);
    return n != 0 && n <= 10 && p + n != end && (p[n] == ',' || p[n] == '}') &&
           !DigitsAre(p, n, "65536");
  }

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

  LineIndex& Index() {
    if (!m_index) {
      m_index.reset(new LineIndex);  // NOLINT(modernize-make-unique): left uninitialised
    }
    return *m_index;
  }

  // Before the first line: the bytes read only for the window are passed over.
  void Start();
  // Moves the bytes from `kWindow` before `from` to the front; returns how far they moved.
  size_t Compact(size_t from);
  void Fill();
  // Brings more of a streamed line into `source`; false at its end.
  bool MoreOfLine(StreamSource& source);
  void Classify(ReadLine& line, const char* begin, const char* end, size_t limit) const;
  // A line longer than the block: scanned as it streams past, with its start kept for the log.
  void Stream(ReadLine& line, size_t limit);

  int m_fd;
  size_t m_size;
  std::unique_ptr<char[]> m_buffer;  // left uninitialised: a short file touches little of it
  off_t m_base;                      // the file offset of the buffer's first byte
  size_t m_skip;                     // bytes at the start read only for the window
  size_t m_pos = 0;                  // where the part not yet handed out begins
  size_t m_fill = 0;                 // how much of the buffer holds read bytes
  bool m_eof = false;
  off_t m_limit = -1;  // where the file ends for this reader, if set
  bool m_lineEnded = false;
  bool m_onlyReindex = false;
  std::unique_ptr<LineIndex> m_index;  // made at the first skim
  bool m_indexed = false;              // m_index describes the buffer as it is
  std::string m_head;
  std::string m_logHead;
};

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_BLOCK_READER_H_
