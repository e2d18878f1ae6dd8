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

// The stops of a stretch, 64 bytes a step. On its own, the index keeps the stops of the stretch
// it looks at; attached to a buffer, it keeps them in the buffer's words, one per 64 bytes from
// the buffer's start, where a thread that read the buffer may have found them already.
class LineIndex {
 public:
  // Bytes looked at at once: the stretch and what is found in it stay in the first-level caches.
  static constexpr size_t kSpan = size_t{16} << 10;

  // The stops of the `size` bytes at `p`, one word per 64 bytes into `masks` (the last word
  // for the bytes there are).
  static void Mark(const char* p, size_t size, uint64_t* masks);

  // From now on the stops of the buffer at `base` are kept in `masks`, those of its 64-byte
  // chunks [from, to) already found.
  void Attach(const char* base, uint64_t* masks, size_t from, size_t to) {
    m_base = base;
    m_masks = masks;
    m_readyFrom = from;
    m_readyTo = to;
    m_attached = true;
  }

  // Looks at [begin, end), at most `kSpan` bytes.
  void Build(const char* begin, const char* end);

  const char* Begin() const { return m_begin; }
  const char* End() const { return m_end; }

  // The first stop at or after `from`, when the caller knows that there is one before End.
  const char* NextStop(const char* from) const {
    const auto at = static_cast<size_t>(from - m_base);
    size_t chunk = at / 64;
    uint64_t mask = m_masks[chunk] & (~uint64_t{0} << (at % 64));
    while (mask == 0) {
      mask = m_masks[++chunk];
    }
    return m_base + chunk * 64 + static_cast<size_t>(__builtin_ctzll(mask));
  }

 private:
  // Finds the stops of the whole chunks [from, to) of the buffer attached.
  void MarkChunks(size_t from, size_t to) {
    if (from < to) {
      Mark(m_base + from * 64, (to - from) * 64, m_masks + from);
    }
  }

  const char* m_begin = nullptr;
  const char* m_end = nullptr;
  const char* m_base = nullptr;  // where the chunks begin
  uint64_t* m_masks = nullptr;   // per 64 bytes from m_base, which are stops
  bool m_attached = false;
  size_t m_readyFrom = 0;  // attached: the chunks whose stops are known
  size_t m_readyTo = 0;
  uint64_t m_own[kSpan / 64];  // on its own
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
