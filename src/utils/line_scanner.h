// The queue readers' own reading of one line: JSON string escapes decoded as the JSON parser
// decodes them, an answer only where the parser would give the same one.
#ifndef FILEINDEX_SRC_UTILS_LINE_SCANNER_H_
#define FILEINDEX_SRC_UTILS_LINE_SCANNER_H_

#include <cstddef>

#include "utils/queue_reader.h"

namespace WEZO {
namespace FILEINDEX {
namespace detail {

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

// Reads the line `source` brings as the parser would: kEvent with the event in `out` (at most
// `limit` bytes of each path; `pathSize` and `pathOldSize` get their whole decoded lengths),
// kNoEvent where the parser surely finds none, kUnsure where only the parser can tell.
LineVerdict ScanLine(LineSource& source, size_t limit, QueueEvent& out, size_t& pathSize,
                     size_t& pathOldSize);

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_LINE_SCANNER_H_
