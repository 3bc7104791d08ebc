#include <algorithm>
#include <cstdint>

#include "text/compress.h"
#include "text/convert.h"
#include "text/narrow.h"
#include "text/utf8.h"

namespace Koru {

namespace {

/// Writes eight 16-bit values as characters.
void _widen8(__m128i values, wchar_t* to) {
    __m128i const zero = _mm_setzero_si128();
    store16(to, _mm_unpacklo_epi16(values, zero));
    store16(to + 4, _mm_unpackhi_epi16(values, zero));
}

/// Writes sixteen bytes as characters.
void _widen16(__m128i bytes, wchar_t* to) {
    __m128i const zero = _mm_setzero_si128();
    _widen8(_mm_unpacklo_epi8(bytes, zero), to);
    _widen8(_mm_unpackhi_epi8(bytes, zero), to + 8);
}

/// Writes four bytes as characters if all are ASCII.
bool _widen4(char const* s, wchar_t* to) {
    __m128i const zero = _mm_setzero_si128();
    __m128i const bytes = narrow4(s);
    if (highBits(bytes) != 0) return false;
    store16(to, _mm_unpacklo_epi16(_mm_unpacklo_epi8(bytes, zero), zero));
    return true;
}

using Decoding = Progress<char, wchar_t>;

/// Decodes the characters that begin within one step by the plain rule.
Decoding _decodeStep(Decoding at, char const* end) {
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
Decoding _decodeAscii(Decoding at, char const* end, wchar_t const* full) {
    for (; end - at.s >= STEP && full - at.to >= STEP; at.s += STEP, at.to += STEP) {
        __m128i const bytes = load16(at.s);
        if (highBits(bytes) != 0) break;
        _widen16(bytes, at.to);
    }
    return at;
}

// Characters of one to three bytes:
//   0xxxxxxx
//   110xxxxx 10xxxxxx
//   1110xxxx 10xxxxxx 10xxxxxx
// Every byte of a step is decoded as though a character began there. Then the values of
// continuation bytes are dropped by compressing the others. So nothing branches on the text, and no
// character has to be decoded before the next one is found.

/// Writes those of eight 16-bit values that the lowest bits of `keep` select, and returns the end
/// of what was written.
__attribute__((target("ssse3"))) wchar_t* _compress8(__m128i values, std::uint32_t keep,
                                                     wchar_t* to) {
    keep &= 0xFF;
    // A value at place i consists of the bytes 2 * i and 2 * i + 1.
    __m128i const places = placesOf(keep);
    __m128i const twice = _mm_add_epi8(places, places);
    __m128i const bytes = _mm_or_si128(_mm_unpacklo_epi8(twice, twice), _mm_set1_epi16(0x0100));
    _widen8(_mm_shuffle_epi8(values, bytes), to);
    return to + COMPRESSION.kept[keep];
}

/// The bits of the characters that begin at each of sixteen bytes. The value of a character is
/// top << 12 | middle << 6 | low.
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
    __m128i const lead = _mm_and_si128(bytes, _mm_set1_epi8(0x1F));
    return {_mm_and_si128(three, bytes), _mm_and_si128(several, either(three, second, lead)),
            either(three, third, either(several, second, bytes))};
}

/// Joins the bits of eight characters. The marks of their lead bytes are shifted out at the top.
__attribute__((target("ssse3"))) __m128i _join(__m128i low, __m128i middle, __m128i top) {
    __m128i const weights = _mm_set1_epi16(64 << 8 | 1);
    __m128i const zero = _mm_setzero_si128();
    return _mm_or_si128(_mm_maddubs_epi16(_mm_unpacklo_epi8(low, middle), weights),
                        _mm_slli_epi16(_mm_unpacklo_epi8(zero, top), 4));
}

/// Decodes a step in which characters of up to three bytes begin where the bits of `leads` are set.
/// Returns the end of what was written, or null if one of the characters is zero.
__attribute__((target("ssse3"))) wchar_t* _decodeThrees(char const* s, __m128i bytes,
                                                        std::uint32_t leads, wchar_t* to) {
    __m128i const zero = _mm_setzero_si128();
    Bits const bits = _bits(s, bytes);
    __m128i const first = _join(bits.low, bits.middle, bits.top);
    __m128i const last =
        _join(_mm_unpackhi_epi64(bits.low, zero), _mm_unpackhi_epi64(bits.middle, zero),
              _mm_unpackhi_epi64(bits.top, zero));
    // A continuation byte, decoded as though it were a lead, is not zero either.
    __m128i const zeros = _mm_or_si128(_mm_cmpeq_epi16(first, zero), _mm_cmpeq_epi16(last, zero));
    if (highBits(zeros) != 0) return nullptr;
    to = _compress8(first, leads, to);
    return _compress8(last, leads >> 8, to);
}

/// Decodes a step of four characters of four bytes:
///   11110xxx 10xxxxxx 10xxxxxx 10xxxxxx
/// Returns the end of what was written, or null if one of the characters is zero.
__attribute__((target("ssse3"))) wchar_t* _decodeFours(__m128i bytes, wchar_t* to) {
    __m128i const bits = _mm_and_si128(bytes, _mm_set1_epi32(0x3F3F3F07));
    __m128i const twelves = _mm_maddubs_epi16(bits, _mm_set1_epi16(1 << 8 | 64));
    __m128i const values = _mm_madd_epi16(twelves, _mm_set1_epi32(1 << 16 | 1 << 12));
    if (highBits(_mm_cmpeq_epi32(values, _mm_setzero_si128())) != 0) return nullptr;
    store16(to, values);
    return to + 4;
}

/// Which bytes of a step are lead bytes and which are continuation bytes: bit i is for byte i.
struct Shape {
    explicit Shape(__m128i bytes)
        : continuations(highBits(_mm_cmplt_epi8(bytes, _mm_set1_epi8(-0x40)))),
          leads(highBits(bytes) & ~continuations),
          leadsOfThree(leads & highBits(_mm_slli_epi16(bytes, 2))),
          leadsOfFour(leadsOfThree & highBits(_mm_slli_epi16(bytes, 3))),
          leadsOfMore(leadsOfFour & highBits(_mm_slli_epi16(bytes, 4))) {}

    /// The continuation bytes that the lead bytes ask for, within the step and beyond.
    std::uint32_t asked() const { return leads << 1 | leadsOfThree << 2 | leadsOfFour << 3; }

    std::uint32_t continuations; ///< continuation bytes
    std::uint32_t leads;         ///< of sequences of two bytes and more
    std::uint32_t leadsOfThree;  ///< and more
    std::uint32_t leadsOfFour;   ///< and more
    std::uint32_t leadsOfMore;   ///< of five and six, and the two bytes that are none
};

/// Decodes whole steps of well-formed text while there is room for another.
__attribute__((target("ssse3"))) Decoding _decodeMixed(Decoding at, char const* end,
                                                       wchar_t const* full) {
    constexpr std::uint32_t fours = 0x1111; // the leads of a step of nothing but fours
    // The continuation bytes that characters of the last step still lack: bit i is for byte i.
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
        if ((asked & ALL_BYTES) != shape.continuations || shape.leadsOfMore != 0) break;
        wchar_t* to = nullptr;
        if (shape.leadsOfFour == 0) {
            to = _decodeThrees(at.s, bytes, ~shape.continuations, at.to);
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
    Decoding at = {s, to};
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
    auto const isLead = [](char c) { return !isContinuation(c); };
    return sum4(counts) + static_cast<std::size_t>(std::count_if(s, end, isLead));
}

} // namespace Koru
