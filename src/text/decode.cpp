#include <tmmintrin.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>

#include "text/convert.h"
#include "text/simd.h"
#include "text/utf8.h"

namespace Koru {

namespace {

/// Widens sixteen bytes.
void _widen16(__m128i bytes, wchar_t* to) {
    __m128i const zero = _mm_setzero_si128();
    __m128i const low = _mm_unpacklo_epi8(bytes, zero);
    __m128i const high = _mm_unpackhi_epi8(bytes, zero);
    store16(to, _mm_unpacklo_epi16(low, zero));
    store16(to + 4, _mm_unpackhi_epi16(low, zero));
    store16(to + 8, _mm_unpacklo_epi16(high, zero));
    store16(to + 12, _mm_unpackhi_epi16(high, zero));
}

/// Widens four bytes if all are ASCII.
bool _widen4(char const* s, wchar_t* to) {
    std::uint32_t bytes;
    std::memcpy(&bytes, s, sizeof bytes);
    if ((bytes & 0x80808080U) != 0) return false;
    __m128i const zero = _mm_setzero_si128();
    __m128i const low = _mm_unpacklo_epi8(_mm_cvtsi32_si128(static_cast<int>(bytes)), zero);
    store16(to, _mm_unpacklo_epi16(low, zero));
    return true;
}

/// How far a decoding has come. Taken and returned by value, which keeps it in registers.
struct Progress {
    char const* s;
    wchar_t* to;
};

/// Decodes the characters that begin within one step by the plain rule.
Progress _decodeStep(Progress at, char const* end) {
    char const* const stop = at.s + std::min(end - at.s, STEP);
    while (at.s < stop) {
        if (stop - at.s >= 4 && _widen4(at.s, at.to)) {
            at.s += 4, at.to += 4;
            continue;
        }
        Decoded const c = decodeOne(at.s, static_cast<std::size_t>(end - at.s));
        if (c.value == 0) return {end, at.to}; // The result ends here.
        at.s += c.size;
        *at.to++ = c.value;
    }
    return at;
}

/// Decodes whole steps of ASCII while there is room for another.
Progress _decodeAscii(Progress at, char const* end, wchar_t const* full) {
    for (; end - at.s >= STEP && full - at.to >= STEP; at.s += STEP, at.to += STEP) {
        __m128i const bytes = load16(at.s);
        if (highBits(bytes) != 0) break;
        _widen16(bytes, at.to);
    }
    return at;
}

// Sequences of two and three bytes. Every byte of a step is decoded as though a character began
// there; then those where none begins are squeezed out. That takes no branch on the text and no
// look at one character before the next can be found.

/// The shuffle that moves those of four 16-bit values that a mask keeps to the front and widens
/// them; for the values of the register's lower and of its upper half.
struct Squeeze {
    alignas(16) std::array<std::array<std::array<std::int8_t, 16>, 16>, 2> shuffles{};
    std::array<std::uint8_t, 16> kept{};
};

constexpr Squeeze _makeSqueeze() {
    constexpr std::int8_t zero = -1;
    Squeeze squeeze;
    for (std::size_t half = 0; half < 2; ++half) {
        for (std::size_t mask = 0; mask < 16; ++mask) {
            auto& shuffle = squeeze.shuffles[half][mask];
            for (auto& from : shuffle) from = zero;
            std::size_t kept = 0;
            for (std::size_t i = 0; i < 4; ++i) {
                if ((mask >> i & 1) == 0) continue;
                shuffle[4 * kept] = static_cast<std::int8_t>(8 * half + 2 * i);
                shuffle[4 * kept + 1] = static_cast<std::int8_t>(8 * half + 2 * i + 1);
                ++kept;
            }
            squeeze.kept[mask] = static_cast<std::uint8_t>(kept);
        }
    }
    return squeeze;
}

constexpr Squeeze SQUEEZE = _makeSqueeze();

/// Writes those of four 16-bit values that the lowest bits of `keep` tell and returns the end of
/// what was written.
template <std::size_t half>
__attribute__((target("ssse3"))) wchar_t* _squeeze4(__m128i values, std::uint32_t keep,
                                                    wchar_t* to) {
    keep &= 0xF;
    store16(to, _mm_shuffle_epi8(values, load16(SQUEEZE.shuffles[half][keep].data())));
    return to + SQUEEZE.kept[keep];
}

/// What the sixteen bytes mean where a character begins: its value is top << 12 | middle << 6 |
/// low.
struct Bits {
    __m128i top;
    __m128i middle;
    __m128i low;
};

/// The bits of characters of up to three bytes that begin in a step and may end beyond.
Bits _bits(char const* s, __m128i bytes) {
    __m128i const six = _mm_set1_epi8(0x3F);
    __m128i const second = _mm_and_si128(load16(s + 1), six);
    __m128i const third = _mm_and_si128(load16(s + 2), six);
    auto const atLeast = [bytes](int least) {
        __m128i const bound = _mm_set1_epi8(static_cast<char>(least));
        return _mm_cmpeq_epi8(_mm_max_epu8(bytes, bound), bytes);
    };
    __m128i const several = atLeast(0xC0);
    __m128i const three = atLeast(0xE0);
    auto const either = [](__m128i condition, __m128i yes, __m128i no) {
        return _mm_or_si128(_mm_and_si128(condition, yes), _mm_andnot_si128(condition, no));
    };
    __m128i const lead = _mm_and_si128(bytes, _mm_set1_epi8(0x1F));
    return {_mm_and_si128(three, bytes), _mm_and_si128(several, either(three, second, lead)),
            either(three, third, either(several, second, bytes))};
}

/// Puts the bits of eight characters together; the lead's high bits fall out at the top.
__attribute__((target("ssse3"))) __m128i _join(__m128i low, __m128i middle, __m128i top) {
    __m128i const weights = _mm_set1_epi16(64 << 8 | 1);
    __m128i const zero = _mm_setzero_si128();
    return _mm_or_si128(_mm_maddubs_epi16(_mm_unpacklo_epi8(low, middle), weights),
                        _mm_slli_epi16(_mm_unpacklo_epi8(zero, top), 4));
}

/// Decodes a step in which characters of up to three bytes begin where `leads` tells and returns
/// the end of what was written; null if one of them is zero.
__attribute__((target("ssse3"))) wchar_t* _decodeThrees(char const* s, __m128i bytes,
                                                        std::uint32_t leads, wchar_t* to) {
    __m128i const zero = _mm_setzero_si128();
    Bits const bits = _bits(s, bytes);
    __m128i const first = _join(bits.low, bits.middle, bits.top);
    __m128i const last =
        _join(_mm_unpackhi_epi64(bits.low, zero), _mm_unpackhi_epi64(bits.middle, zero),
              _mm_unpackhi_epi64(bits.top, zero));
    // What stands where no character begins is not zero either: it is a continuation byte.
    __m128i const zeros = _mm_or_si128(_mm_cmpeq_epi16(first, zero), _mm_cmpeq_epi16(last, zero));
    if (highBits(zeros) != 0) return nullptr;
    to = _squeeze4<0>(first, leads, to);
    to = _squeeze4<1>(first, leads >> 4, to);
    to = _squeeze4<0>(last, leads >> 8, to);
    return _squeeze4<1>(last, leads >> 12, to);
}

/// Decodes a step of four characters of four bytes and returns the end of what was written; null if
/// one of them is zero.
__attribute__((target("ssse3"))) wchar_t* _decodeFours(__m128i bytes, wchar_t* to) {
    __m128i const bits = _mm_and_si128(bytes, _mm_set1_epi32(0x3F3F3F07));
    __m128i const twelves = _mm_maddubs_epi16(bits, _mm_set1_epi16(1 << 8 | 64));
    __m128i const values = _mm_madd_epi16(twelves, _mm_set1_epi32(1 << 16 | 1 << 12));
    if (highBits(_mm_cmpeq_epi32(values, _mm_setzero_si128())) != 0) return nullptr;
    store16(to, values);
    return to + 4;
}

/// Which bytes of a step are what; bit i stands for byte i.
struct Shape {
    explicit Shape(__m128i bytes)
        : tails(highBits(_mm_cmplt_epi8(bytes, _mm_set1_epi8(-0x40)))),
          leads(highBits(bytes) & ~tails), leadsOfThree(leads & highBits(_mm_slli_epi16(bytes, 2))),
          leadsOfFour(leadsOfThree & highBits(_mm_slli_epi16(bytes, 3))),
          leadsOfMore(leadsOfFour & highBits(_mm_slli_epi16(bytes, 4))) {}

    /// The continuation bytes that the leads ask for, within the step and beyond.
    std::uint32_t asked() const { return leads << 1 | leadsOfThree << 2 | leadsOfFour << 3; }

    std::uint32_t tails;        ///< continuation bytes
    std::uint32_t leads;        ///< of sequences of two bytes and more
    std::uint32_t leadsOfThree; ///< and more
    std::uint32_t leadsOfFour;  ///< and more
    std::uint32_t leadsOfMore;  ///< of five and six, and the two bytes that are none
};

/// Decodes whole steps of well-formed text while there is room for another.
__attribute__((target("ssse3"))) Progress _decodeMixed(Progress at, char const* end,
                                                       wchar_t const* full) {
    constexpr std::uint32_t fours = 0x1111; // the leads of a step of nothing but fours
    // The continuation bytes that the last characters still own: bit i for byte i from here.
    std::uint32_t owed = 0;
    for (; end - at.s >= STEP + 2 && full - at.to >= STEP; at.s += STEP) {
        __m128i const bytes = load16(at.s);
        if (owed == 0 && highBits(bytes) == 0) {
            _widen16(bytes, at.to);
            at.to += STEP;
            continue;
        }
        Shape const shape(bytes);
        std::uint32_t const asked = owed | shape.asked();
        if ((asked & ALL_BYTES) != shape.tails || shape.leadsOfMore != 0) break;
        wchar_t* to = nullptr;
        if (shape.leadsOfFour == 0) {
            to = _decodeThrees(at.s, bytes, ~shape.tails, at.to);
        } else if (shape.leadsOfFour == fours) {
            to = _decodeFours(bytes, at.to);
        }
        if (to == nullptr) break;
        at.to = to;
        owed = asked >> STEP;
    }
    for (; owed != 0; owed >>= 1) ++at.s;
    return at;
}

} // namespace

wchar_t* decodeBlock(char const*& s, char const* end, wchar_t* to, bool shuffle) {
    wchar_t const* const full = to + BLOCK;
    Progress at = {s, to};
    while (at.s != end && full - at.to >= STEP) {
        at = _decodeAscii(at, end, full);
        if (shuffle && end - at.s > STEP) at = _decodeMixed(at, end, full);
        if (full - at.to >= STEP) at = _decodeStep(at, end);
    }
    s = at.s;
    return at.to;
}

std::size_t countLeads(char const* s, std::size_t size) {
    char const* const end = s + size;
    __m128i const zero = _mm_setzero_si128();
    __m128i counts = zero;
    for (; end - s >= STEP; s += STEP) {
        __m128i const leads = _mm_cmpgt_epi8(load16(s), _mm_set1_epi8(-0x41));
        counts = _mm_add_epi32(counts, _mm_sad_epu8(_mm_sub_epi8(zero, leads), zero));
    }
    auto const low = static_cast<std::uint32_t>(_mm_cvtsi128_si32(counts));
    auto const high = static_cast<std::uint32_t>(_mm_cvtsi128_si32(_mm_srli_si128(counts, 8)));
    return std::size_t{low} + high + static_cast<std::size_t>(std::count_if(s, end, [](char c) {
               return static_cast<signed char>(c) >= -0x40;
           }));
}

} // namespace Koru
