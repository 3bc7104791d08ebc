// The characters of narrow or wide text, in a byte each, several at a time.
#ifndef KORU_TEXT_NARROW_H
#define KORU_TEXT_NARROW_H

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <type_traits>

#include "text/simd.h"

namespace Koru {

/// Sixteen characters. Those of wide text that are not ASCII come out as bytes that are not above
/// zero.
inline __m128i narrow16(char const* s) { return load16(s); }
inline __m128i narrow16(wchar_t const* s) {
    __m128i const low = _mm_packs_epi32(load16(s), load16(s + 4));
    __m128i const high = _mm_packs_epi32(load16(s + 8), load16(s + 12));
    return _mm_packus_epi16(low, high);
}

/// Eight or four characters, lowest in the register.
inline __m128i narrow8(char const* s) {
    return _mm_loadl_epi64(reinterpret_cast<__m128i const*>(s));
}
inline __m128i narrow8(wchar_t const* s) {
    __m128i const eight = _mm_packs_epi32(load16(s), load16(s + 4));
    return _mm_packus_epi16(eight, eight);
}
inline __m128i narrow4(char const* s) {
    int four;
    std::memcpy(&four, s, sizeof four);
    return _mm_cvtsi32_si128(four);
}
inline __m128i narrow4(wchar_t const* s) {
    __m128i const four = _mm_packs_epi32(load16(s), load16(s));
    return _mm_packus_epi16(four, four);
}

/// All of one to sixteen characters, at places that only their number decides, some more than once.
template <class Char>
[[gnu::always_inline]] inline __m128i narrowAll(Char const* s, std::size_t size) {
    if (size >= 8) return _mm_unpacklo_epi64(narrow8(s), narrow8(s + size - 8));
    if (size >= 4) {
        __m128i const eight = _mm_unpacklo_epi32(narrow4(s), narrow4(s + size - 4));
        return _mm_unpacklo_epi64(eight, eight);
    }
    auto const unit = [s](std::size_t i) {
        return static_cast<int>(static_cast<std::make_unsigned_t<Char>>(s[i]));
    };
    __m128i const few = _mm_setr_epi32(unit(0), unit(size / 2), unit(size - 1), unit(0));
    __m128i const pairs = _mm_packs_epi32(few, few);
    return _mm_packus_epi16(pairs, pairs);
}

/// Whether all bytes of a register are characters of ASCII, and not NUL.
inline bool areAscii(__m128i bytes) {
    return holdsEverywhere(_mm_cmpgt_epi8(bytes, _mm_setzero_si128()));
}

/// Whether a text is ASCII without a NUL.
template <class Char>
bool isAscii(Char const* s, std::size_t size) {
    if (size <= 16) return size == 0 || areAscii(narrowAll(s, size));
    for (std::size_t i = 0; i < size - 16; i += 16) {
        if (!areAscii(narrow16(s + i))) return false;
    }
    return areAscii(narrow16(s + size - 16)); // Some of these were tested before.
}

/// Whether two texts of the same size are the same and ASCII.
inline bool areSameAscii(char const* a, wchar_t const* b, std::size_t size) {
    auto const same = [](__m128i x, __m128i y) {
        return areAscii(x) && holdsEverywhere(_mm_cmpeq_epi8(x, y));
    };
    if (size == 0) return true;
    if (size <= 16) return same(narrowAll(a, size), narrowAll(b, size));
    for (std::size_t i = 0; i < size - 16; i += 16) {
        if (!same(narrow16(a + i), narrow16(b + i))) return false;
    }
    return same(narrow16(a + size - 16), narrow16(b + size - 16));
}

/// The first byte at which two texts differ, or the size of the shorter one.
inline std::size_t firstDifference(std::string_view a, std::string_view b) {
    std::size_t const size = std::min(a.size(), b.size());
    std::size_t i = 0;
    for (; size - i >= 16; i += 16) {
        std::uint32_t const same =
            highBits(_mm_cmpeq_epi8(load16(a.data() + i), load16(b.data() + i)));
        if (same != ALL_BYTES) return i + static_cast<std::size_t>(__builtin_ctz(~same));
    }
    for (; size - i >= 4; i += 4) {
        std::uint32_t x;
        std::uint32_t y;
        std::memcpy(&x, a.data() + i, sizeof x);
        std::memcpy(&y, b.data() + i, sizeof y);
        if (x != y) return i + static_cast<std::size_t>(__builtin_ctz(x ^ y)) / 8;
    }
    while (i != size && a[i] == b[i]) ++i;
    return i;
}

/// Writes the low 8 bits of each character, which are all of it in ASCII, and returns the end of
/// what was written.
inline char* narrow(wchar_t const* s, std::size_t size, char* to) {
    __m128i const byte = _mm_set1_epi32(0xFF);
    auto const four = [s, byte](std::size_t i) { return _mm_and_si128(load16(s + i), byte); };
    auto const eight = [four](std::size_t i) { return _mm_packs_epi32(four(i), four(i + 4)); };
    std::size_t i = 0;
    for (; size - i >= 16; i += 16) store16(to + i, _mm_packus_epi16(eight(i), eight(i + 8)));
    for (; i != size; ++i) to[i] = static_cast<char>(s[i]);
    return to + size;
}

} // namespace Koru

#endif
