// The read buffer looked at many bytes at a time (AVX2 where the processor has it, chosen at run
// time, SSE2 otherwise, byte by byte on other architectures), so that the readers classify a line
// without a search of their own: for the folder reader, where the bytes that end a plain string
// ('"', '\\' and "\n") are in a stretch; for the reindex reader, where a line may hold the code of
// a reindex event at all.
#ifndef FILEINDEX_SRC_UTILS_LINE_INDEX_H_
#define FILEINDEX_SRC_UTILS_LINE_INDEX_H_

#include <cstddef>
#include <cstdint>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

// The stops of a stretch, 64 bytes a step.
class LineIndex {
 public:
  // Bytes looked at at once: the stretch and what is found in it stay in the first-level caches.
  static constexpr size_t kSpan = size_t{16} << 10;

  // Looks at [begin, end), at most `kSpan` bytes.
  void Build(const char* begin, const char* end);

  const char* Begin() const { return m_begin; }
  const char* End() const { return m_end; }

  // The first stop at or after `from`, when the caller knows that there is one before End.
  const char* NextStop(const char* from) const {
    const auto at = static_cast<size_t>(from - m_begin);
    size_t chunk = at / 64;
    uint64_t mask = m_mask[chunk] & (~uint64_t{0} << (at % 64));
    while (mask == 0) {
      mask = m_mask[++chunk];
    }
    return m_begin + chunk * 64 + static_cast<size_t>(__builtin_ctzll(mask));
  }

 private:
  friend struct LineIndexBuild;

  const char* m_begin = nullptr;
  const char* m_end = nullptr;
  uint64_t m_mask[kSpan / 64];  // per 64 bytes, which are stops
};

// The first byte in [from, end) where the text of a number that reads as 65536 could be: where
// "6553" begins ("65536", "65535." rounding up, or with zeros before it), or an "e" or "E" after
// a run of digits and points that begins where a number can begin (after a space, ":", ",", "[",
// the "/" that ends a comment, or a sign: an exponent; "\u00e9" or "_3e7" are passed over);
// nullptr when there is none. A line without one cannot be a reindex event, whatever else it
// holds. The byte before `from` is read when `from` is not `begin`, the start of what the caller
// holds.
const char* NextReindexHint(const char* begin, const char* from, const char* end);

// With `baseline`, the index and the hints are found as on a processor without AVX2 (for the
// tests: both must find the same).
void UseBaselineLineIndex(bool baseline);

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_LINE_INDEX_H_
