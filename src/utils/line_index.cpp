#include "utils/line_index.h"

#if defined(__x86_64__) || defined(__i386__)
#include <immintrin.h>
#define FILEINDEX_LINE_INDEX_X86 1
#endif

#include <atomic>
#include <cstring>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

// Takes what was found in one 64-byte chunk after another into the index.
struct LineIndexBuild {
  explicit LineIndexBuild(LineIndex& index) : ix(index) {}

  // The chunk at `at` with its stops `stops`, one bit a byte.
  __attribute__((always_inline)) inline void Stops(size_t at, uint64_t stops) {
    ix.m_mask[at / 64] = stops;
  }

  LineIndex& ix;
};

namespace {

// One bit a byte of the 64 at `p`: which are stops.
uint64_t ScalarMask(const char* p) {
  uint64_t mask = 0;
  for (unsigned int i = 0; i < 64; ++i) {
    const bool hit = p[i] == '\n' || p[i] == '"' || p[i] == '\\';
    mask |= static_cast<uint64_t>(hit) << i;
  }
  return mask;
}

#if defined(__SSE2__)
uint64_t Sse2Mask(const char* p) {
  uint64_t mask = 0;
  for (size_t i = 0; i < 4; ++i) {
    const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 16 * i));
    const __m128i hit = _mm_or_si128(_mm_cmpeq_epi8(v, _mm_set1_epi8('\n')),
                                     _mm_or_si128(_mm_cmpeq_epi8(v, _mm_set1_epi8('"')),
                                                  _mm_cmpeq_epi8(v, _mm_set1_epi8('\\'))));
    mask |= static_cast<uint64_t>(static_cast<unsigned int>(_mm_movemask_epi8(hit))) << (16 * i);
  }
  return mask;
}
#endif

// The baseline build: SSE2 where the architecture has it, byte by byte elsewhere.
void BuildPlain(LineIndex& index, const char* p, size_t size) {
  LineIndexBuild build(index);
  size_t at = 0;
  for (; at + 64 <= size; at += 64) {
#if defined(__SSE2__)
    build.Stops(at, Sse2Mask(p + at));
#else
    build.Stops(at, ScalarMask(p + at));
#endif
  }
  if (at < size) {
    char pad[64] = {};
    std::memcpy(pad, p + at, size - at);
    build.Stops(at, ScalarMask(pad));
  }
}

#if defined(FILEINDEX_LINE_INDEX_X86)
__attribute__((target("avx2"), always_inline)) inline uint64_t Avx2Mask(const char* p) {
  const __m256i lo = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p));
  const __m256i hi = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p + 32));
  const __m256i nl = _mm256_set1_epi8('\n');
  const __m256i q = _mm256_set1_epi8('"');
  const __m256i b = _mm256_set1_epi8('\\');
  const __m256i hitLo =
      _mm256_or_si256(_mm256_cmpeq_epi8(lo, nl),
                      _mm256_or_si256(_mm256_cmpeq_epi8(lo, q), _mm256_cmpeq_epi8(lo, b)));
  const __m256i hitHi =
      _mm256_or_si256(_mm256_cmpeq_epi8(hi, nl),
                      _mm256_or_si256(_mm256_cmpeq_epi8(hi, q), _mm256_cmpeq_epi8(hi, b)));
  const auto maskLo = static_cast<uint32_t>(_mm256_movemask_epi8(hitLo));
  const auto maskHi = static_cast<uint32_t>(_mm256_movemask_epi8(hitHi));
  return maskLo | (static_cast<uint64_t>(maskHi) << 32);
}

__attribute__((target("avx2"))) void BuildAvx2(LineIndex& index, const char* p, size_t size) {
  LineIndexBuild build(index);
  size_t at = 0;
  for (; at + 64 <= size; at += 64) {
    build.Stops(at, Avx2Mask(p + at));
  }
  if (at < size) {
    char pad[64] = {};
    std::memcpy(pad, p + at, size - at);
    build.Stops(at, Avx2Mask(pad));
  }
}

bool HasAvx2() {
  static const bool has = __builtin_cpu_supports("avx2");
  return has;
}
#endif

// Whether a hint of NextReindexHint begins at `p` in [begin, end). Called only for the few bytes
// that a step picks out, and kept out of the steps' loops, whose constants then stay in registers.
__attribute__((noinline)) bool IsHint(const char* begin, const char* p, const char* end) {
  if ((*p | 0x20) != 'e') {
    return end - p >= 4 && p[0] == '6' && p[1] == '5' && p[2] == '5' && p[3] == '3';
  }
  const auto numberByte = [](char c) { return (c >= '0' && c <= '9') || c == '.'; };
  const char* q = p;
  while (q != begin && numberByte(q[-1])) {
    --q;
  }
  if (q == p) {
    return false;  // nothing of a number before it
  }
  // What the parser lets come just before a number: a space, the end of a comment, a separator
  // or a sign.
  if (q == begin) {
    return true;
  }
  switch (q[-1]) {
    case ' ':
    case '\t':
    case '\r':
    case '\n':
    case ':':
    case ',':
    case '[':
    case '/':
    case '-':
    case '+':
      return true;
    default:
      return false;
  }
}

const char* ScalarHint(const char* begin, const char* from, const char* end) {
  for (const char* p = from; p < end; ++p) {
    if (IsHint(begin, p, end)) {
      return p;
    }
  }
  return nullptr;
}

// A step of NextReindexHint: its bytes at `p` (the byte before it readable) that may begin a
// hint, one bit a byte: a '6' before a '5', or an "e" or "E" after a digit or a point.
#if defined(__SSE2__)
struct Sse2Step {
  static constexpr size_t kSize = 16;
  static unsigned int Hints(const char* p) {
    const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p));
    const __m128i next = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 1));
    const __m128i before = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p - 1));
    const __m128i sixFive = _mm_and_si128(_mm_cmpeq_epi8(v, _mm_set1_epi8('6')),
                                          _mm_cmpeq_epi8(next, _mm_set1_epi8('5')));
    const __m128i e = _mm_cmpeq_epi8(_mm_or_si128(v, _mm_set1_epi8(0x20)), _mm_set1_epi8('e'));
    const __m128i digit = _mm_sub_epi8(before, _mm_set1_epi8('0'));
    const __m128i number =
        _mm_or_si128(_mm_cmpeq_epi8(_mm_min_epu8(digit, _mm_set1_epi8(9)), digit),
                     _mm_cmpeq_epi8(before, _mm_set1_epi8('.')));
    return static_cast<unsigned int>(
        _mm_movemask_epi8(_mm_or_si128(sixFive, _mm_and_si128(e, number))));
  }
};
#endif

#if defined(FILEINDEX_LINE_INDEX_X86)
struct Avx2Step {
  static constexpr size_t kSize = 32;
  __attribute__((target("avx2"), always_inline)) static inline unsigned int Hints(const char* p) {
    const __m256i v = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p));
    const __m256i next = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p + 1));
    const __m256i before = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p - 1));
    const __m256i sixFive = _mm256_and_si256(_mm256_cmpeq_epi8(v, _mm256_set1_epi8('6')),
                                             _mm256_cmpeq_epi8(next, _mm256_set1_epi8('5')));
    const __m256i e =
        _mm256_cmpeq_epi8(_mm256_or_si256(v, _mm256_set1_epi8(0x20)), _mm256_set1_epi8('e'));
    const __m256i digit = _mm256_sub_epi8(before, _mm256_set1_epi8('0'));
    const __m256i number =
        _mm256_or_si256(_mm256_cmpeq_epi8(_mm256_min_epu8(digit, _mm256_set1_epi8(9)), digit),
                        _mm256_cmpeq_epi8(before, _mm256_set1_epi8('.')));
    return static_cast<unsigned int>(
        _mm256_movemask_epi8(_mm256_or_si256(sixFive, _mm256_and_si256(e, number))));
  }
};
#endif

// The body of a search for hints of the function's arguments `begin`, `from` and `end`, a step of
// `Step` at a time while a whole step and the byte after it lie before `end`, each candidate
// checked by IsHint; the rest byte by byte. The byte before the first step is loaded: a hint at
// `begin` is looked for on its own. A macro rather than a template, because each copy is compiled
// for the instruction set of the function it stands in.
#define FILEINDEX_FIND_HINT(Step)                                           \
  const char* p = from;                                                     \
  if (p == begin && p < end) {                                              \
    if (IsHint(begin, p, end)) {                                            \
      return p;                                                             \
    }                                                                       \
    ++p;                                                                    \
  }                                                                         \
  for (; p + Step::kSize + 1 <= end; p += Step::kSize) {                    \
    for (unsigned int bits = Step::Hints(p); bits != 0; bits &= bits - 1) { \
      const char* at = p + __builtin_ctz(bits);                             \
      if (IsHint(begin, at, end)) {                                         \
        return at;                                                          \
      }                                                                     \
    }                                                                       \
  }                                                                         \
  return ScalarHint(begin, p, end)

#if defined(__SSE2__)
const char* Sse2Hint(const char* begin, const char* from, const char* end) {
  FILEINDEX_FIND_HINT(Sse2Step);
}
#endif

#if defined(FILEINDEX_LINE_INDEX_X86)
__attribute__((target("avx2"))) const char* Avx2Hint(const char* begin, const char* from,
                                                     const char* end) {
  FILEINDEX_FIND_HINT(Avx2Step);
}
#endif

#undef FILEINDEX_FIND_HINT

std::atomic<bool> g_baselineOnly{false};

}  // namespace

void UseBaselineLineIndex(bool baseline) { g_baselineOnly = baseline; }

void LineIndex::Build(const char* begin, const char* end) {
  m_begin = begin;
  m_end = end;
  const auto size = static_cast<size_t>(end - begin);
#if defined(FILEINDEX_LINE_INDEX_X86)
  if (HasAvx2() && !g_baselineOnly.load(std::memory_order_relaxed)) {
    BuildAvx2(*this, begin, size);
    return;
  }
#endif
  BuildPlain(*this, begin, size);
}

const char* NextReindexHint(const char* begin, const char* from, const char* end) {
#if defined(FILEINDEX_LINE_INDEX_X86)
  if (HasAvx2() && !g_baselineOnly.load(std::memory_order_relaxed)) {
    return Avx2Hint(begin, from, end);
  }
#endif
#if defined(__SSE2__)
  return Sse2Hint(begin, from, end);
#else
  return ScalarHint(begin, from, end);
#endif
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
