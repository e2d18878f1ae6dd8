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

  // kNewlines: the chunk at `at` with its "\n"s `nl`, one bit a byte. The first two positions
  // are stored whether or not they exist: lines are rarely shorter than 32 bytes, and a loop per
  // "\n" would cost a mispredicted exit per chunk.
  __attribute__((always_inline)) inline void Newlines(size_t at, uint64_t nl) {
    uint16_t* const pos = ix.m_newline + lines;
    uint64_t rest = nl;
    const auto store = [&](size_t j) {
      // With no bit left, a position past the chunk that nobody reads.
      pos[j] = static_cast<uint16_t>(
          at + static_cast<size_t>(__builtin_ctzll(rest | (uint64_t{1} << 63))));
      rest &= rest - 1;
    };
    store(0);
    store(1);
    const auto count = static_cast<size_t>(__builtin_popcountll(nl));
    for (size_t j = 2; j < count; ++j) {
      store(j);
    }
    lines += count;
  }

  // kStops: the chunk at `at` with its stops `stops`.
  __attribute__((always_inline)) inline void Stops(size_t at, uint64_t stops) {
    ix.m_mask[at / 64] = stops;
  }

  void Finish() { ix.m_lines = lines; }

  LineIndex& ix;
  size_t lines = 0;
};

namespace {

using Kind = LineIndex::Kind;

// One bit a byte of the 64 at `p`: which are "\n", or (kStops) which are stops.
template <Kind kKind>
uint64_t ScalarMask(const char* p) {
  uint64_t mask = 0;
  for (unsigned int i = 0; i < 64; ++i) {
    const bool hit = p[i] == '\n' || (kKind == Kind::kStops && (p[i] == '"' || p[i] == '\\'));
    mask |= static_cast<uint64_t>(hit) << i;
  }
  return mask;
}

#if defined(__SSE2__)
template <Kind kKind>
uint64_t Sse2Mask(const char* p) {
  uint64_t mask = 0;
  for (size_t i = 0; i < 4; ++i) {
    const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 16 * i));
    __m128i hit = _mm_cmpeq_epi8(v, _mm_set1_epi8('\n'));
    if (kKind == Kind::kStops) {
      hit = _mm_or_si128(hit, _mm_or_si128(_mm_cmpeq_epi8(v, _mm_set1_epi8('"')),
                                           _mm_cmpeq_epi8(v, _mm_set1_epi8('\\'))));
    }
    mask |= static_cast<uint64_t>(static_cast<unsigned int>(_mm_movemask_epi8(hit))) << (16 * i);
  }
  return mask;
}
#endif

template <Kind kKind>
__attribute__((always_inline)) inline void Take(LineIndexBuild& build, size_t at, uint64_t mask) {
  if (kKind == Kind::kNewlines) {
    build.Newlines(at, mask);
  } else {
    build.Stops(at, mask);
  }
}

// The baseline build: SSE2 where the architecture has it, byte by byte elsewhere.
template <Kind kKind>
void BuildPlain(LineIndex& index, const char* p, size_t size) {
  LineIndexBuild build(index);
  size_t at = 0;
  for (; at + 64 <= size; at += 64) {
#if defined(__SSE2__)
    Take<kKind>(build, at, Sse2Mask<kKind>(p + at));
#else
    Take<kKind>(build, at, ScalarMask<kKind>(p + at));
#endif
  }
  if (at < size) {
    char pad[64] = {};
    std::memcpy(pad, p + at, size - at);
    Take<kKind>(build, at, ScalarMask<kKind>(pad));
  }
  build.Finish();
}

#if defined(FILEINDEX_LINE_INDEX_X86)
template <Kind kKind>
__attribute__((target("avx2"), always_inline)) inline uint64_t Avx2Mask(const char* p) {
  const __m256i lo = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p));
  const __m256i hi = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p + 32));
  const __m256i nl = _mm256_set1_epi8('\n');
  __m256i hitLo = _mm256_cmpeq_epi8(lo, nl);
  __m256i hitHi = _mm256_cmpeq_epi8(hi, nl);
  if (kKind == Kind::kStops) {
    const __m256i q = _mm256_set1_epi8('"');
    const __m256i b = _mm256_set1_epi8('\\');
    hitLo =
        _mm256_or_si256(hitLo, _mm256_or_si256(_mm256_cmpeq_epi8(lo, q), _mm256_cmpeq_epi8(lo, b)));
    hitHi =
        _mm256_or_si256(hitHi, _mm256_or_si256(_mm256_cmpeq_epi8(hi, q), _mm256_cmpeq_epi8(hi, b)));
  }
  const auto maskLo = static_cast<uint32_t>(_mm256_movemask_epi8(hitLo));
  const auto maskHi = static_cast<uint32_t>(_mm256_movemask_epi8(hitHi));
  return maskLo | (static_cast<uint64_t>(maskHi) << 32);
}

template <Kind kKind>
__attribute__((target("avx2,bmi,popcnt"))) void BuildAvx2(LineIndex& index, const char* p,
                                                          size_t size) {
  LineIndexBuild build(index);
  size_t at = 0;
  for (; at + 64 <= size; at += 64) {
    Take<kKind>(build, at, Avx2Mask<kKind>(p + at));
  }
  if (at < size) {
    char pad[64] = {};
    std::memcpy(pad, p + at, size - at);
    Take<kKind>(build, at, Avx2Mask<kKind>(pad));
  }
  build.Finish();
}

bool HasAvx2() {
  static const bool has = __builtin_cpu_supports("avx2") && __builtin_cpu_supports("bmi") &&
                          __builtin_cpu_supports("popcnt");
  return has;
}
#endif

std::atomic<bool> g_baselineOnly{false};

}  // namespace

void UseBaselineLineIndex(bool baseline) { g_baselineOnly = baseline; }

void LineIndex::Build(const char* begin, const char* end, Kind kind) {
  m_begin = begin;
  m_end = end;
  m_kind = kind;
  const auto size = static_cast<size_t>(end - begin);
#if defined(FILEINDEX_LINE_INDEX_X86)
  if (HasAvx2() && !g_baselineOnly.load(std::memory_order_relaxed)) {
    kind == Kind::kStops ? BuildAvx2<Kind::kStops>(*this, begin, size)
                         : BuildAvx2<Kind::kNewlines>(*this, begin, size);
    return;
  }
#endif
  kind == Kind::kStops ? BuildPlain<Kind::kStops>(*this, begin, size)
                       : BuildPlain<Kind::kNewlines>(*this, begin, size);
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
