// Sixteen bytes of memory at any address, and bits of a register's bytes.
#ifndef KORU_TEXT_SIMD_H
#define KORU_TEXT_SIMD_H

#include <emmintrin.h>

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

} // namespace Koru

#endif
