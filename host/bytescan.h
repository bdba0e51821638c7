// Word-at-a-time scans over bytes for the record hot path: trimming blanks
// and finding the characters that make a CSV value need quotes. Eight bytes
// are tested per step; loads go through memcpy, so alignment doesn't matter.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>

#if defined(__SSE2__)
#include <emmintrin.h>
#endif

namespace bytescan {

constexpr uint64_t kOnes = 0x0101010101010101ULL;
constexpr uint64_t kHighs = 0x8080808080808080ULL;

inline uint64_t Load64(const char* p) {
  uint64_t v;
  memcpy(&v, p, 8);
  return v;
}

// Non-zero when some byte of `v` is zero.
inline uint64_t HasZero(uint64_t v) { return (v - kOnes) & ~v & kHighs; }
// Non-zero when some byte of `v` equals `c`.
inline uint64_t HasByte(uint64_t v, uint8_t c) { return HasZero(v ^ (kOnes * c)); }

// Length of `p[0..n)` without its trailing `c` bytes.
inline size_t TrimRight(const char* p, size_t n, char c) {
#if defined(__SSE2__)
  const __m128i all16 = _mm_set1_epi8(c);
  while (n >= 16) {
    __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + n - 16));
    unsigned mask = unsigned(_mm_movemask_epi8(_mm_cmpeq_epi8(v, all16)));
    if (mask != 0xFFFF) {
      // The highest byte that isn't `c` ends the text.
      unsigned other = ~mask & 0xFFFF;
      return n - 16 + (31 - size_t(__builtin_clz(other))) + 1;
    }
    n -= 16;
  }
#endif
  const uint64_t all = kOnes * uint8_t(c);
  while (n >= 8 && Load64(p + n - 8) == all) n -= 8;
  while (n > 0 && p[n - 1] == c) --n;
  return n;
}

// Count of leading `c` bytes of `p[0..n)`.
inline size_t SkipLeft(const char* p, size_t n, char c) {
  const uint64_t all = kOnes * uint8_t(c);
  size_t i = 0;
  while (i + 8 <= n && Load64(p + i) == all) i += 8;
  while (i < n && p[i] == c) ++i;
  return i;
}

// True when `p[0..n)` holds a comma, a double quote, CR or LF.
inline bool HasCsvSpecial(const char* p, size_t n) {
  size_t i = 0;
#if defined(__SSE2__)
  const __m128i comma = _mm_set1_epi8(','), quote = _mm_set1_epi8('"');
  const __m128i lf = _mm_set1_epi8('\n'), cr = _mm_set1_epi8('\r');
  for (; i + 16 <= n; i += 16) {
    __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + i));
    __m128i hit = _mm_or_si128(_mm_or_si128(_mm_cmpeq_epi8(v, comma), _mm_cmpeq_epi8(v, quote)),
                               _mm_or_si128(_mm_cmpeq_epi8(v, lf), _mm_cmpeq_epi8(v, cr)));
    if (_mm_movemask_epi8(hit) != 0) return true;
  }
#endif
  // Short tails byte by byte through a table: cheaper than word tricks for
  // the few bytes most values have.
  static constexpr struct Table {
    bool special[256];
    constexpr Table() : special() {
      special[uint8_t(',')] = special[uint8_t('"')] = special[uint8_t('\n')] = special[uint8_t('\r')] = true;
    }
  } kTable;
  bool hit = false;
  for (; i < n; ++i) hit |= kTable.special[uint8_t(p[i])];
  return hit;
}

// HasCsvSpecial for a buffer at least 16 bytes long from `p` (whatever `n`
// says): one masked load for short values. Reading the value itself rather
// than a copy just made avoids waiting on the copy's stores.
inline bool HasCsvSpecialWide(const char* p, size_t n) {
#if defined(__SSE2__)
  const __m128i comma = _mm_set1_epi8(','), quote = _mm_set1_epi8('"');
  const __m128i lf = _mm_set1_epi8('\n'), cr = _mm_set1_epi8('\r');
  auto hits = [&](size_t at) {
    __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + at));
    __m128i hit = _mm_or_si128(_mm_or_si128(_mm_cmpeq_epi8(v, comma), _mm_cmpeq_epi8(v, quote)),
                               _mm_or_si128(_mm_cmpeq_epi8(v, lf), _mm_cmpeq_epi8(v, cr)));
    return unsigned(_mm_movemask_epi8(hit));
  };
  if (n < 16) return (hits(0) & ((1u << n) - 1)) != 0;
  for (size_t i = 0; i + 16 <= n; i += 16)
    if (hits(i)) return true;
  return (n & 15) != 0 && hits(n - 16) != 0;  // the last bytes, overlapping
#else
  return HasCsvSpecial(p, n);
#endif
}

// True when some byte of `p[0..n)` has its high bit set (is not ASCII).
inline bool HasHighBit(const char* p, size_t n) {
  size_t i = 0;
  uint64_t acc = 0;
  for (; i + 8 <= n; i += 8) acc |= Load64(p + i);
  for (; i < n; ++i) acc |= uint8_t(p[i]);
  return (acc & kHighs) != 0;
}

// The two below read 16 bytes from `p` whatever `n` says: the caller's
// buffer has that much room behind any value (the bytes there are ignored).

// TrimRight of ' ' for such a buffer.
inline size_t TrimRightWide(const char* p, size_t n) {
#if defined(__SSE2__)
  if (n <= 16) {
    __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p));
    unsigned other = ~unsigned(_mm_movemask_epi8(_mm_cmpeq_epi8(v, _mm_set1_epi8(' ')))) & ((1u << n) - 1);
    return other ? size_t(32 - __builtin_clz(other)) : 0;
  }
#endif
  return TrimRight(p, n, ' ');
}

// HasHighBit for such a buffer.
inline bool HasHighBitWide(const char* p, size_t n) {
#if defined(__SSE2__)
  if (n < 16) {
    unsigned m = unsigned(_mm_movemask_epi8(_mm_loadu_si128(reinterpret_cast<const __m128i*>(p))));
    return (m & ((1u << n) - 1)) != 0;
  }
  for (size_t i = 0; i + 16 <= n; i += 16)
    if (_mm_movemask_epi8(_mm_loadu_si128(reinterpret_cast<const __m128i*>(p + i))) != 0) return true;
  return (n & 15) != 0 && _mm_movemask_epi8(_mm_loadu_si128(reinterpret_cast<const __m128i*>(p + n - 16))) != 0;
#else
  return HasHighBit(p, n);
#endif
}

}  // namespace bytescan
