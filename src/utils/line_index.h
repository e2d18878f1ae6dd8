// A stretch of the read buffer looked at as a whole, 64 bytes at a time, so that the readers
// classify a line without a search of their own: where each "\n" is, or where the bytes that end
// a plain string ('"', '\\' and "\n") are.
#ifndef FILEINDEX_SRC_UTILS_LINE_INDEX_H_
#define FILEINDEX_SRC_UTILS_LINE_INDEX_H_

#include <cstddef>
#include <cstdint>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

class LineIndex {
 public:
  // Bytes looked at at once: the stretch and what is found in it stay in the first-level caches.
  static constexpr size_t kSpan = size_t{16} << 10;

  enum class Kind {
    kNewlines,  // where each "\n" is
    kStops,     // where each '"', '\\' and "\n" is
  };

  // Looks at [begin, end), at most `kSpan` bytes.
  void Build(const char* begin, const char* end, Kind kind);

  const char* Begin() const { return m_begin; }
  const char* End() const { return m_end; }
  Kind Built() const { return m_kind; }

  // kNewlines: the "\n"s found; line `i` ends at the `i`th and begins after the one before (or
  // at Begin).
  size_t Lines() const { return m_lines; }
  const char* Newline(size_t i) const { return m_begin + m_newline[i]; }
  const char* LineStart(size_t i) const {
    return i == 0 ? m_begin : m_begin + m_newline[i - 1] + 1;
  }

  // kStops: the first stop at or after `from`, when the caller knows that there is one before End.
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

  // Room for a few positions written past the last "\n" found, so that a 64-byte chunk's first
  // ones are stored without a test each.
  static constexpr size_t kSlack = 4;

  const char* m_begin = nullptr;
  const char* m_end = nullptr;
  Kind m_kind = Kind::kNewlines;
  size_t m_lines = 0;
  uint16_t m_newline[kSpan + kSlack];
  // kStops: per 64 bytes, which are stops.
  uint64_t m_mask[kSpan / 64];
};

static_assert(LineIndex::kSpan <= 65536, "positions fit 16 bits");

// With `baseline`, every index is built as on a processor without AVX2 (for the tests: both
// builds must find the same).
void UseBaselineLineIndex(bool baseline);

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_LINE_INDEX_H_
