// Sixteen bytes of memory at any address, and bits of a register's bytes.
#ifndef KORU_TEXT_SIMD_H
#define KORU_TEXT_SIMD_H

#include <emmintrin.h>

#include <array>
#include <cstddef>
#include <cstdint>

namespace Koru {

inline __m128i load16(void const* from) {
    return _mm_loadu_si128(static_cast<__m128i const*>(from));
}

inline void store16(void* to, __m128i value) { _mm_storeu_si128(static_cast<__m128i*>(to), value); }

/// The highest bit of each byte, that of the first byte lowest.
inline std::uint32_t highBits(__m128i bytes) {
    return static_cast<std::uint32_t>(_mm_movemask_epi8(bytes));
}

constexpr std::uint32_t ALL_BYTES = 0xFFFF;

/// Whether all bits of a comparison's result are set.
inline bool holdsEverywhere(__m128i condition) { return highBits(condition) == ALL_BYTES; }

/// The bits of `yes` where those of the condition are set, and elsewhere those of `no`.
inline __m128i either(__m128i condition, __m128i yes, __m128i no) {
    return _mm_or_si128(_mm_and_si128(condition, yes), _mm_andnot_si128(condition, no));
}

/// The sum of four 32-bit values.
inline std::size_t sum4(__m128i values) {
    std::array<std::uint32_t, 4> four;
    store16(four.data(), values);
    return std::size_t{four[0]} + four[1] + four[2] + four[3];
}

} // namespace Koru

#endif
