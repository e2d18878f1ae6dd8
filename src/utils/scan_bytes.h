// Byte-level helpers of the queue readers: decimal codes told by their digits, and the hash that
// checks a file's bytes are unchanged.
#ifndef FILEINDEX_SRC_UTILS_SCAN_BYTES_H_
#define FILEINDEX_SRC_UTILS_SCAN_BYTES_H_

#if defined(__SSE2__)
#include <emmintrin.h>
#endif

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "fileindex/queue.h"

namespace WEZO {
namespace FILEINDEX {
namespace detail {

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
inline bool DigitsFit(const char* p, size_t n) {
  return n < 10 || std::memcmp(p, "4294967295", 10) <= 0;
}

// Whether [p, end) begins with the literal `text`.
template <size_t N>
bool Begins(const char* p, const char* end, const char (&text)[N]) {
  return static_cast<size_t>(end - p) >= N - 1 && std::memcmp(p, text, N - 1) == 0;
}

inline uint64_t Hash(const char* data, size_t size, uint64_t h = 1469598103934665603ULL) {
  for (size_t i = 0; i < size; ++i) {
    h = (h ^ static_cast<unsigned char>(data[i])) * 1099511628211ULL;
  }
  return h;
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_SCAN_BYTES_H_
