#pragma once
// Lane moves shared by the AVX2 loops of conversions and blurs: the bytes of 32-bit lanes to floats and back,
// narrowing, and the transposes between pixels and planes. Only shuffles and conversions of whole values, so
// they keep every bit. For functions built with RT_TARGET_AVX2.

#include "host/kernel/Simd.h"

#if RT_AVX2_BUILD
#include <immintrin.h>

namespace RasterTools::Avx2Lanes {

// Byte Index of every 32-bit lane, as a float.
template <int Index>
RT_TARGET_AVX2 inline __m256 Byte(__m256i words) noexcept {
    return _mm256_cvtepi32_ps(_mm256_and_si256(_mm256_srli_epi32(words, 8 * Index), _mm256_set1_epi32(0xff)));
}
// Four lanes of whole bytes to one lane of four bytes, b0 lowest.
RT_TARGET_AVX2 inline __m256i Pack(__m256i b0, __m256i b1, __m256i b2, __m256i b3) noexcept {
    return _mm256_or_si256(_mm256_or_si256(b0, _mm256_slli_epi32(b1, 8)),
                           _mm256_or_si256(_mm256_slli_epi32(b2, 16), _mm256_slli_epi32(b3, 24)));
}
// Eight 32-bit lanes of values up to 65535 to eight 16-bit ones.
RT_TARGET_AVX2 inline __m128i NarrowToWords(__m256i lanes) noexcept {
    return _mm_packus_epi32(_mm256_castsi256_si128(lanes), _mm256_extracti128_si256(lanes, 1));
}

// Rows of four floats to columns, in each 128-bit half on its own.
RT_TARGET_AVX2 inline void Transpose(__m256& v0, __m256& v1, __m256& v2, __m256& v3) noexcept {
    const __m256 low01 = _mm256_unpacklo_ps(v0, v1), high01 = _mm256_unpackhi_ps(v0, v1);
    const __m256 low23 = _mm256_unpacklo_ps(v2, v3), high23 = _mm256_unpackhi_ps(v2, v3);
    v0 = _mm256_shuffle_ps(low01, low23, 0x44);
    v1 = _mm256_shuffle_ps(low01, low23, 0xee);
    v2 = _mm256_shuffle_ps(high01, high23, 0x44);
    v3 = _mm256_shuffle_ps(high01, high23, 0xee);
}

// Stores eight 8-byte pixels, pixel i being the words first[i] then second[i], as 64 bytes from out.
RT_TARGET_AVX2 inline void StorePairs(__m256i first, __m256i second, void* out) noexcept {
    // The unpacks give pixels 0, 1 | 4, 5 and 2, 3 | 6, 7.
    const __m256i low = _mm256_unpacklo_epi32(first, second), high = _mm256_unpackhi_epi32(first, second);
    auto* bytes = static_cast<unsigned char*>(out);
    _mm256_storeu_si256(reinterpret_cast<__m256i*>(bytes), _mm256_permute2x128_si256(low, high, 0x20));
    _mm256_storeu_si256(reinterpret_cast<__m256i*>(bytes + 32), _mm256_permute2x128_si256(low, high, 0x31));
}

} // namespace RasterTools::Avx2Lanes

#endif
