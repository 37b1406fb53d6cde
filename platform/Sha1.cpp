#include "platform/Sha1.h"

#include <bit>
#include <cstring>

#if defined(__x86_64__) || defined(__i386__)
#include <cpuid.h>
#include <immintrin.h>
#define KOLVRAND_SHA1_X86 1
#endif

namespace kolvrand::platform::sha1 {

namespace {

uint32_t loadBigEndian(const uint8_t* p) {
  return uint32_t{p[0]} << 24 | uint32_t{p[1]} << 16 | uint32_t{p[2]} << 8 | uint32_t{p[3]};
}

}  // namespace

namespace {

// Twenty rounds with round function F(b, c, d) and constant K, over words
// `first` .. `first` + 19 of the schedule, kept as a ring of sixteen.
template <uint32_t K, class F>
inline void twentyRounds(uint32_t& a, uint32_t& b, uint32_t& c, uint32_t& d, uint32_t& e,
                         uint32_t (&w)[16], int first, F f) {
#pragma GCC unroll 20
  for (int t = first; t < first + 20; ++t) {
    if (t >= 16)
      w[t & 15] = std::rotl(w[(t - 3) & 15] ^ w[(t - 8) & 15] ^ w[(t - 14) & 15] ^ w[t & 15], 1);
    const uint32_t next = std::rotl(a, 5) + f(b, c, d) + e + K + w[t & 15];
    e = d;
    d = c;
    c = std::rotl(b, 30);
    b = a;
    a = next;
  }
}

}  // namespace

void compressPortable(uint32_t state[5], const uint8_t* data, size_t blocks) {
  for (; blocks; --blocks, data += 64) {
    uint32_t w[16];
    for (int t = 0; t < 16; ++t) w[t] = loadBigEndian(data + 4 * t);
    uint32_t a = state[0], b = state[1], c = state[2], d = state[3], e = state[4];
    twentyRounds<0x5a827999>(a, b, c, d, e, w, 0,
                             [](uint32_t x, uint32_t y, uint32_t z) { return z ^ (x & (y ^ z)); });
    twentyRounds<0x6ed9eba1>(a, b, c, d, e, w, 20,
                             [](uint32_t x, uint32_t y, uint32_t z) { return x ^ y ^ z; });
    twentyRounds<0x8f1bbcdc>(a, b, c, d, e, w, 40, [](uint32_t x, uint32_t y, uint32_t z) {
      return (x & y) | (z & (x | y));
    });
    twentyRounds<0xca62c1d6>(a, b, c, d, e, w, 60,
                             [](uint32_t x, uint32_t y, uint32_t z) { return x ^ y ^ z; });
    state[0] += a;
    state[1] += b;
    state[2] += c;
    state[3] += d;
    state[4] += e;
  }
}

#if KOLVRAND_SHA1_X86

bool hasHardware() {
  static const bool has = [] {
    unsigned eax, ebx, ecx, edx;
    if (!__get_cpuid(1, &eax, &ebx, &ecx, &edx)) return false;
    const bool ssse3 = ecx & bit_SSSE3, sse41 = ecx & bit_SSE4_1;
    if (!__get_cpuid_count(7, 0, &eax, &ebx, &ecx, &edx)) return false;
    return ssse3 && sse41 && (ebx & bit_SHA);
  }();
  return has;
}

namespace {

// Four message words in big-endian order, the first in the highest lane.
__attribute__((target("sha,sse4.1"))) inline __m128i loadWords(const uint8_t* p) {
  const __m128i byteOrder = _mm_set_epi64x(0x0001020304050607LL, 0x08090a0b0c0d0e0fLL);
  return _mm_shuffle_epi8(_mm_loadu_si128(reinterpret_cast<const __m128i*>(p)), byteOrder);
}

// The next four words of the message schedule; w0..w3 hold the last four
// groups, oldest first, and move on by one group.
__attribute__((target("sha,sse4.1"))) inline __m128i nextWords(__m128i& w0, __m128i& w1,
                                                               __m128i& w2, __m128i& w3) {
  const __m128i w = _mm_sha1msg2_epu32(_mm_xor_si128(_mm_sha1msg1_epu32(w0, w1), w2), w3);
  w0 = w1;
  w1 = w2;
  w2 = w3;
  w3 = w;
  return w;
}

// Four rounds with function F on message group w; `previous` is the state
// before the last four rounds, from which the instruction derives e.
template <int F>
__attribute__((target("sha,sse4.1"))) inline void rounds(__m128i& abcd, __m128i& previous,
                                                         __m128i w) {
  const __m128i e = _mm_sha1nexte_epu32(previous, w);
  previous = abcd;
  abcd = _mm_sha1rnds4_epu32(abcd, e, F);
}

}  // namespace

__attribute__((target("sha,sse4.1"))) void compressHardware(uint32_t state[5], const uint8_t* data,
                                                            size_t blocks) {
  __m128i abcd = _mm_shuffle_epi32(_mm_loadu_si128(reinterpret_cast<const __m128i*>(state)), 0x1b);
  __m128i e = _mm_set_epi32(static_cast<int>(state[4]), 0, 0, 0);

  for (; blocks; --blocks, data += 64) {
    const __m128i abcdSaved = abcd, eSaved = e;
    __m128i w0 = loadWords(data), w1 = loadWords(data + 16), w2 = loadWords(data + 32),
            w3 = loadWords(data + 48);

    __m128i previous = abcd;
    abcd = _mm_sha1rnds4_epu32(abcd, _mm_add_epi32(e, w0), 0);
    rounds<0>(abcd, previous, w1);
    rounds<0>(abcd, previous, w2);
    rounds<0>(abcd, previous, w3);
    // From here each group of four words follows from the four before it.
    rounds<0>(abcd, previous, nextWords(w0, w1, w2, w3));  // rounds 16-19
    rounds<1>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<1>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<1>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<1>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<1>(abcd, previous, nextWords(w0, w1, w2, w3));  // rounds 36-39
    rounds<2>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<2>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<2>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<2>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<2>(abcd, previous, nextWords(w0, w1, w2, w3));  // rounds 56-59
    rounds<3>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<3>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<3>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<3>(abcd, previous, nextWords(w0, w1, w2, w3));
    rounds<3>(abcd, previous, nextWords(w0, w1, w2, w3));  // rounds 76-79

    e = _mm_sha1nexte_epu32(previous, eSaved);
    abcd = _mm_add_epi32(abcd, abcdSaved);
  }
  _mm_storeu_si128(reinterpret_cast<__m128i*>(state), _mm_shuffle_epi32(abcd, 0x1b));
  state[4] = static_cast<uint32_t>(_mm_extract_epi32(e, 3));
}

#else

bool hasHardware() {
  return false;
}

void compressHardware(uint32_t state[5], const uint8_t* data, size_t blocks) {
  compressPortable(state, data, blocks);
}

#endif

void compress(uint32_t state[5], const uint8_t* data, size_t blocks) {
  if (hasHardware())
    compressHardware(state, data, blocks);
  else
    compressPortable(state, data, blocks);
}

}  // namespace kolvrand::platform::sha1
