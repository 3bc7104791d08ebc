#include <koru/string.h>

#include <strings.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <cwchar>
#include <new>
#include <ostream>
#include <stdexcept>

#include "text/convert.h"
#include "text/fold.h"
#include "text/insert.h"
#include "text/simd.h"
#include "text/utf8.h"

namespace Koru {

// First of all objects of the library, since every other one may ask for them.
__attribute__((init_priority(101))) std::string const _null_string;
__attribute__((init_priority(101))) std::wstring const _null_wstring;

std::size_t length(char const* s) { return s == nullptr ? 0 : std::strlen(s); }

std::size_t length(std::string const& s) { return ::strnlen(s.data(), s.size()); }

std::size_t length(wchar_t const* s) { return s == nullptr ? 0 : std::wcslen(s); }

std::size_t length(std::wstring const& s) { return ::wcsnlen(s.data(), s.size()); }

int compare(char const* a, char const* b) { return ::strcasecmp(a, b); }

int compare(std::string const& a, std::string const& b) {
    return ::strcasecmp(a.c_str(), b.c_str());
}

int compare(wchar_t const* a, wchar_t const* b) {
    return compareFolded(WideCursor(a), WideCursor(b));
}

namespace {

/// Whether four characters are the same, and not NUL.
bool _areSame(__m128i a, __m128i b) {
    __m128i const isNul = _mm_cmpeq_epi32(a, _mm_setzero_si128());
    return highBits(_mm_andnot_si128(isNul, _mm_cmpeq_epi32(a, b))) == ALL_BYTES;
}

/// How four pairs of characters compare.
struct FourPairs {
    FourPairs(__m128i a, __m128i b) {
        __m128i const zero = _mm_setzero_si128();
        __m128i const caseBit = _mm_set1_epi32(0x20);
        __m128i const difference = _mm_xor_si128(a, b);
        __m128i const lowered = _mm_or_si128(a, caseBit);
        __m128i const place = _mm_sub_epi32(lowered, _mm_set1_epi32('a'));
        __m128i const behindZ = _mm_subs_epu16(place, _mm_set1_epi32('z' - 'a'));
        __m128i const ignored = _mm_and_si128(_mm_cmpeq_epi32(behindZ, zero), caseBit);
        __m128i const isEqual = _mm_cmpeq_epi32(_mm_andnot_si128(ignored, difference), zero);
        same = _mm_andnot_si128(_mm_cmpeq_epi32(a, zero), isEqual);
        disputed = _mm_and_si128(_mm_cmpeq_epi32(lowered, _mm_set1_epi32('i')), difference);
    }

    __m128i same;     ///< all bits where equal but for the case of an ASCII letter, and not NUL
    __m128i disputed; ///< not zero where I and i meet, among those that are the same
};

/// Compares texts whose first characters differ. Apart, since most comparisons end before and then
/// do without the stack that this takes.
[[gnu::noinline]] int _compareCases(wchar_t const* a, wchar_t const* b, std::size_t size) {
    __m128i const zero = _mm_setzero_si128();
    __m128i disputed = zero;
    std::size_t i = 0;
    for (; size - i >= 4; i += 4) {
        FourPairs const pairs(load16(a + i), load16(b + i));
        if (highBits(pairs.same) != ALL_BYTES) break;
        disputed = _mm_or_si128(disputed, pairs.disputed);
    }
    bool const agreed = highBits(_mm_cmpeq_epi32(disputed, zero)) == ALL_BYTES;
    if (!agreed && lower(L'I') != L'i') i = 0;
    return compareFolded(WideCursor(a + i), WideCursor(b + i));
}

} // namespace

int compare(std::wstring const& a, std::wstring const& b) {
    wchar_t const* const x = a.c_str();
    wchar_t const* const y = b.c_str();
    std::size_t const size = std::min(a.size(), b.size());
    std::size_t i = 0;
    if (x[0] == y[0]) {
        while (size - i >= 4 && _areSame(load16(x + i), load16(y + i))) i += 4;
    }
    for (; x[i] == y[i]; ++i) {
        if (x[i] == 0) return 0;
    }
    // Mostly the first two characters that differ decide.
    if (isUndisputed(x[i]) && isUndisputed(y[i]) && lower(x[i]) != lower(y[i]))
        return static_cast<int>(lower(x[i]) - lower(y[i]));
    return _compareCases(x + i, y + i, size - i);
}

// What is too long for any string is want of memory too: callers have one failure to know.
std::string make_string(char const* s) try {
    return length(s) == 0 ? _null_string : std::string(s);
} catch (std::length_error const&) {
    throw std::bad_alloc();
}

std::wstring make_wstring(wchar_t const* s) try {
    return length(s) == 0 ? _null_wstring : std::wstring(s);
} catch (std::length_error const&) {
    throw std::bad_alloc();
}

std::string make_string(wchar_t const* s) { return make_string(make_wstring(s)); }

namespace {

std::wstring _fillAndCopy(wchar_t const* s, std::size_t size) {
    std::wstring result(size, L'\0');
    std::copy(s, s + size, result.begin());
    return result;
}

} // namespace

std::wstring wideString(wchar_t const* s, std::size_t size) {
    constexpr std::size_t worthwhile = 128; // Beyond it, to fill the string first takes longer.
    return size <= worthwhile ? _fillAndCopy(s, size) : std::wstring(s, size);
}

namespace {

/// Whether a text is ASCII without a NUL and no longer than most names. For that a block is not
/// worth its while.
template <class Char>
bool _isPlainName(Char const* s, Char const* end) {
    return end - s < 16 && std::all_of(s, end, [](Char c) { return c > 0 && c <= 0x7F; });
}

/// Decodes text without zero bytes.
std::wstring _decode(char const* s, char const* end) try {
    if (s == end) return _null_wstring;
    if (_isPlainName(s, end)) return std::wstring(s, end);
    bool const shuffle = canShuffle();
    alignas(BLOCK_ALIGNMENT) wchar_t block[BLOCK];
    wchar_t* filled = decodeBlock(s, end, block, shuffle);
    if (s == end) return wideString(block, static_cast<std::size_t>(filled - block));
    std::wstring result;
    result.reserve(static_cast<std::size_t>(filled - block) +
                   countLeads(s, static_cast<std::size_t>(end - s)));
    for (result.append(block, filled); s != end; result.append(block, filled)) {
        filled = decodeBlock(s, end, block, shuffle);
    }
    return result;
} catch (std::length_error const&) {
    throw std::bad_alloc();
}

} // namespace

std::wstring make_wstring(char const* s) { return _decode(s, s + length(s)); }

std::wstring make_wstring(std::string const& s) {
    return _decode(s.data(), s.data() + ::strnlen(s.data(), s.size()));
}

std::wstring make_wstring(char const* s, std::size_t size) {
    return _decode(s, s + ::strnlen(s, size));
}

std::string make_string(std::wstring const& text) try {
    wchar_t const* s = text.data();
    wchar_t const* const end = s + text.size();
    if (s == end) return _null_string;
    if (_isPlainName(s, end)) return std::string(s, end);
    bool const shuffle = canShuffle();
    alignas(BLOCK_ALIGNMENT) char block[BLOCK];
    char* filled = encodeBlock(s, end, block, shuffle);
    if (s == end) return std::string(block, filled);
    std::string result;
    result.reserve(static_cast<std::size_t>(filled - block) +
                   encodedBound(s, static_cast<std::size_t>(end - s)));
    for (result.append(block, filled); s != end; result.append(block, filled)) {
        filled = encodeBlock(s, end, block, shuffle);
    }
    return result;
} catch (std::length_error const&) {
    throw std::bad_alloc();
}

char* encode(wchar_t const* s, std::size_t size, char* to) {
    bool const shuffle = canShuffle();
    alignas(BLOCK_ALIGNMENT) char block[BLOCK];
    for (wchar_t const* const end = s + size; s != end;) {
        auto const bytes = static_cast<std::size_t>(encodeBlock(s, end, block, shuffle) - block);
        std::memcpy(to, block, bytes);
        to += bytes;
    }
    return to;
}

namespace {

/// Writes the low 8 bits of each character to `to`.
void _lowBytes(wchar_t const* s, std::size_t size, char* to) {
    __m128i const byte = _mm_set1_epi32(0xFF);
    auto const four = [s, byte](std::size_t i) { return _mm_and_si128(load16(s + i), byte); };
    std::size_t i = 0;
    for (; size - i >= 16; i += 16) {
        store16(to + i, _mm_packus_epi16(_mm_packs_epi32(four(i), four(i + 4)),
                                         _mm_packs_epi32(four(i + 8), four(i + 12))));
    }
    for (; i != size; ++i) to[i] = static_cast<char>(s[i]);
}

} // namespace

std::ostream& operator<<(std::ostream& os, std::wstring const& s) {
    char block[BLOCK];
    for (std::size_t done = 0; done != s.size();) {
        std::size_t const size = std::min(s.size() - done, BLOCK);
        _lowBytes(s.data() + done, size, block);
        insert(os, block, size);
        done += size;
    }
    return os;
}

std::ostream& operator<<(std::ostream& os, std::string const& s) {
    // Intended: an 8-bit signed count.
    auto const count = static_cast<std::int8_t>(s.size() & 0xFF);
    if (count > 0) insert(os, s.data(), static_cast<std::size_t>(count));
    return os;
}

} // namespace Koru
