#include <algorithm>
#include <cstdint>
#include <cstring>

#include "text/compress.h"
#include "text/convert.h"
#include "text/narrow.h"
#include "text/utf8.h"

namespace Koru {

namespace {

/// The bytes of the longest encoding of a character.
constexpr std::ptrdiff_t LONGEST = 6;

/// Writes one character and returns the end of what was written.
char* _encodeOne(std::int32_t c, char* to) {
    auto const put = [&to](std::int32_t byte) { *to++ = static_cast<char>(byte); };
    auto const tail = [&put, c](int shift) { put(0x80 | ((c >> shift) & 0x3F)); };
    if (c <= 0x7F) { // Intended: a negative value becomes its low byte.
        put(c & 0xFF);
    } else if (c <= 0x7FF) {
        put(0xC0 | c >> 6), tail(0);
    } else if (c <= 0xFFFF) {
        put(0xE0 | c >> 12), tail(6), tail(0);
    } else if (c <= 0x1FFFFF) {
        put(0xF0 | c >> 18), tail(12), tail(6), tail(0);
    } else if (c <= 0x3FFFFFF) {
        put(0xF8 | c >> 24), tail(18), tail(12), tail(6), tail(0);
    } else {
        put(0xFC | c >> 30), tail(24), tail(18), tail(12), tail(6), tail(0);
    }
    return to;
}

/// Writes four characters as bytes if all are ASCII, and not NUL.
bool _narrow4(wchar_t const* s, char* to) {
    __m128i const bytes = narrow4(s);
    if (!areAscii(bytes)) return false;
    int const four = _mm_cvtsi128_si32(bytes);
    std::memcpy(to, &four, sizeof four);
    return true;
}

using Encoding = Progress<wchar_t, char>;

/// Encodes the characters of one step by the plain rule.
Encoding _encodeStep(Encoding at, wchar_t const* end) {
    wchar_t const* const stop = at.s + std::min(end - at.s, STEP);
    while (at.s != stop) {
        if (stop - at.s >= 4 && _narrow4(at.s, at.to)) {
            at.s += 4, at.to += 4;
            continue;
        }
        char* const lead = at.to;
        at.to = _encodeOne(*at.s++, lead);
        if (*lead == 0) return {end, lead}; // The result ends here.
    }
    return at;
}

/// Encodes whole steps of ASCII while `to` is not beyond `last`.
Encoding _encodeAscii(Encoding at, wchar_t const* end, char const* last) {
    for (; end - at.s >= STEP && at.to <= last; at.s += STEP, at.to += STEP) {
        __m128i const bytes = narrow16(at.s);
        if (!areAscii(bytes)) break;
        store16(at.to, bytes);
    }
    return at;
}

// Encodings of one to four bytes:
//   0xxxxxxx
//   110xxxxx 10xxxxxx
//   1110xxxx 10xxxxxx 10xxxxxx
//   11110xxx 10xxxxxx 10xxxxxx 10xxxxxx
// Each character is spread over as many bytes as the longest of them has; a shorter one begins with
// zeros. Compressing drops the zeros.

/// Writes those of the lower eight bytes that the lowest bits of `keep` select, and returns the end
/// of what was written.
__attribute__((target("ssse3"))) inline char* _compress8(__m128i bytes, std::uint32_t keep,
                                                         char* to) {
    keep &= 0xFF;
    _mm_storel_epi64(reinterpret_cast<__m128i*>(to), _mm_shuffle_epi8(bytes, placesOf(keep)));
    return to + COMPRESSION.kept[keep];
}

/// Writes those of sixteen bytes that are not zero and returns the end of what was written.
__attribute__((target("ssse3"))) inline char* _dropZeros(__m128i bytes, char* to) {
    __m128i const zero = _mm_setzero_si128();
    std::uint32_t const keep = ~highBits(_mm_cmpeq_epi8(bytes, zero));
    to = _compress8(bytes, keep, to);
    return _compress8(_mm_unpackhi_epi64(bytes, zero), keep >> 8, to);
}

/// Spreads the lowest twelve bits of each 16-bit value over its two bytes, the higher six first.
inline __m128i _splitTwelve(__m128i values) {
    return _mm_or_si128(_mm_and_si128(_mm_srli_epi16(values, 6), _mm_set1_epi16(0x003F)),
                        _mm_and_si128(_mm_slli_epi16(values, 8), _mm_set1_epi16(0x3F00)));
}

/// Spreads the bits of four characters below 0x1000000 over four bytes each, the highest six first.
inline __m128i _splitTwentyFour(__m128i c) {
    return _splitTwelve(_mm_or_si128(_mm_srli_epi32(c, 12), _mm_slli_epi32(c, 16)));
}

/// The encodings of eight 16-bit characters below 0x800, in two bytes each.
inline __m128i _formsOfTwo(__m128i c) {
    __m128i const two = _mm_or_si128(_splitTwelve(c), _mm_set1_epi16(static_cast<short>(0x80C0)));
    return either(_mm_cmpgt_epi16(c, _mm_set1_epi16(0x7F)), two, _mm_slli_epi16(c, 8));
}

/// Encodes eight 16-bit characters from 1 to 0x7FF.
__attribute__((target("ssse3"))) inline char* _encodeTwos(__m128i c, char* to) {
    if (highBits(_mm_cmpgt_epi16(c, _mm_set1_epi16(0x7F))) != 0)
        return _dropZeros(_formsOfTwo(c), to);
    _mm_storel_epi64(reinterpret_cast<__m128i*>(to), _mm_packus_epi16(c, c));
    return to + STEP / 2;
}

/// The encodings of four characters below 0x200000, in four bytes each.
inline __m128i _formsOfFour(__m128i c) {
    auto const above = [c](int limit, std::uint32_t marks) {
        return _mm_and_si128(_mm_cmpgt_epi32(c, _mm_set1_epi32(limit)),
                             _mm_set1_epi32(static_cast<int>(marks)));
    };
    // The marks of lead and continuation bytes replace those of the next shorter encoding.
    __m128i const marks = _mm_xor_si128(
        _mm_xor_si128(above(0x7F, 0x80C00000U), above(0x7FF, 0x80C00000U ^ 0x8080E000U)),
        above(0xFFFF, 0x8080E000U ^ 0x808080F0U));
    return either(_mm_cmpgt_epi32(c, _mm_set1_epi32(0x7F)),
                  _mm_or_si128(_splitTwentyFour(c), marks), _mm_slli_epi32(c, 24));
}

/// Encodes four characters of three bytes each. Writes four bytes beyond them, too.
__attribute__((target("ssse3"))) inline char* _encodeThrees(__m128i c, char* to) {
    __m128i const forms =
        _mm_or_si128(_splitTwentyFour(c), _mm_set1_epi32(static_cast<int>(0x8080E000U)));
    __m128i const closeUp = _mm_setr_epi8(1, 2, 3, 5, 6, 7, 9, 10, 11, 13, 14, 15, -1, -1, -1, -1);
    store16(to, _mm_shuffle_epi8(forms, closeUp));
    return to + 12;
}

/// Encodes half a step of characters from 1 to 0x1FFFFF. Returns the end of what was written, or
/// null if there are other characters.
__attribute__((target("ssse3"))) inline char* _encodeHalfStep(__m128i a, __m128i b, char* to) {
    __m128i const zero = _mm_setzero_si128();
    __m128i const all = _mm_packs_epi32(a, b);
    __m128i const aboveZero = _mm_cmpgt_epi16(all, zero);
    __m128i const aboveTwo = _mm_cmpgt_epi16(all, _mm_set1_epi16(0x7FF));
    if (holdsEverywhere(_mm_andnot_si128(aboveTwo, aboveZero))) return _encodeTwos(all, to);
    __m128i const any = _mm_or_si128(a, b);
    __m128i const belowFour = _mm_cmpeq_epi32(_mm_srli_epi32(any, 16), zero);
    if (holdsEverywhere(_mm_and_si128(aboveTwo, belowFour)))
        return _encodeThrees(b, _encodeThrees(a, to));
    __m128i const belowFive = _mm_cmpeq_epi32(_mm_srli_epi32(any, 21), zero);
    if (!holdsEverywhere(_mm_and_si128(aboveZero, belowFive))) return nullptr;
    return _dropZeros(_formsOfFour(b), _dropZeros(_formsOfFour(a), to));
}

/// Encodes half steps of characters from 1 to 0x1FFFFF while `to` is not beyond `last`.
__attribute__((target("ssse3"))) Encoding _encodeMixed(Encoding at, wchar_t const* end,
                                                       char const* last) {
    for (; end - at.s >= STEP / 2 && at.to <= last; at.s += STEP / 2) {
        char* const to = _encodeHalfStep(load16(at.s), load16(at.s + 4), at.to);
        if (to == nullptr) break;
        at.to = to;
    }
    return at;
}

} // namespace

char* encodeBlock(wchar_t const*& s, wchar_t const* end, char* to, bool shuffle) {
    char const* const last = to + BLOCK - STEP * LONGEST;
    Encoding at = {s, to};
    while (at.s != end && at.to <= last) {
        at = _encodeAscii(at, end, last);
        if (shuffle && at.s != end) at = _encodeMixed(at, end, last);
        if (at.to <= last) at = _encodeStep(at, end);
    }
    s = at.s;
    return at.to;
}

namespace {

/// How many bytes more than one each of four characters takes, negated.
__m128i _furtherBytes(__m128i c) {
    auto const above = [c](int limit) { return _mm_cmpgt_epi32(c, _mm_set1_epi32(limit)); };
    return _mm_add_epi32(_mm_add_epi32(_mm_add_epi32(above(0x7F), above(0x7FF)), above(0xFFFF)),
                         _mm_add_epi32(above(0x1FFFFF), above(0x3FFFFFF)));
}

/// The same in a step, summed up in four parts; if all of it is below 0x10000, eight at a time.
__m128i _furtherBytesOfStep(wchar_t const* s) {
    __m128i const a = load16(s);
    __m128i const b = load16(s + 4);
    __m128i const c = load16(s + 8);
    __m128i const d = load16(s + 12);
    __m128i const any = _mm_or_si128(_mm_or_si128(a, b), _mm_or_si128(c, d));
    if (!holdsEverywhere(_mm_cmpeq_epi32(_mm_srli_epi32(any, 16), _mm_setzero_si128()))) {
        return _mm_add_epi32(_mm_add_epi32(_furtherBytes(a), _furtherBytes(b)),
                             _mm_add_epi32(_furtherBytes(c), _furtherBytes(d)));
    }
    auto const further = [](__m128i eight) {
        return _mm_add_epi16(_mm_cmpgt_epi16(eight, _mm_set1_epi16(0x7F)),
                             _mm_cmpgt_epi16(eight, _mm_set1_epi16(0x7FF)));
    };
    __m128i const sixteen =
        _mm_add_epi16(further(_mm_packs_epi32(a, b)), further(_mm_packs_epi32(c, d)));
    return _mm_madd_epi16(sixteen, _mm_set1_epi16(1));
}

/// Whether a step holds a NUL. A negative character is narrowed to 0 as well, but is not one.
bool _holdsNul(wchar_t const* s) {
    bool const may = highBits(_mm_cmpeq_epi8(narrow16(s), _mm_setzero_si128())) != 0;
    return may && std::find(s, s + STEP, L'\0') != s + STEP;
}

} // namespace

// Unlike the conversions, it is also called from frames without a block, which may be misaligned.
[[gnu::force_align_arg_pointer]] std::size_t encodedBound(wchar_t const* s, std::size_t size) {
    wchar_t const* const start = s;
    wchar_t const* const end = s + size;
    // Most texts are ASCII, for which this takes half as long as the loop below.
    while (end - s >= STEP && areAscii(narrow16(s))) s += STEP;
    __m128i further = _mm_setzero_si128();
    for (; end - s >= STEP; s += STEP) {
        if (areAscii(narrow16(s))) continue;
        if (_holdsNul(s)) break;
        further = _mm_sub_epi32(further, _furtherBytesOfStep(s));
    }
    for (; s != end && *s != 0; ++s) {
        further = _mm_sub_epi32(further, _furtherBytes(_mm_cvtsi32_si128(*s)));
    }
    return static_cast<std::size_t>(s - start) + sum4(further);
}

} // namespace Koru
