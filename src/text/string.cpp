#include <koru/string.h>

#include <strings.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <cwchar>
#include <new>
#include <ostream>
#include <stdexcept>
#include <type_traits>

#include "text/convert.h"
#include "text/fold.h"
#include "text/insert.h"
#include "text/narrow.h"
#include "text/processor.h"
#include "text/utf8.h"

namespace Koru {

// Constructed before all other objects of the library, since any of these may ask for them.
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
        disputed = _mm_and_si128(_mm_cmpeq_epi32(lowered, _mm_set1_epi32(SMALL_I)), difference);
    }

    __m128i same;     ///< all bits where equal but for the case of an ASCII letter, and not NUL
    __m128i disputed; ///< not zero where I and i meet, among those that are the same
};

/// Compares texts whose first characters differ. A function of its own, since most comparisons end
/// before it and then do without its stack.
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
    if (!agreed && !isPairOfI()) i = 0;
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

// Text too long for any string counts as a lack of memory: callers have one failure to know.
std::wstring wideString(wchar_t const* s, std::size_t size) try {
    constexpr std::size_t worthwhile = 128; // Beyond it, filling the string first takes longer.
    if (size > worthwhile) return std::wstring(s, size);
    std::wstring result(size, L'\0');
    std::copy(s, s + size, result.begin());
    return result;
} catch (std::length_error const&) {
    throw std::bad_alloc();
}

namespace {

std::string _toString(char const* s, std::size_t size) { return std::string(s, size); }
std::wstring _toString(wchar_t const* s, std::size_t size) { return wideString(s, size); }

template <class Char>
std::basic_string<Char> _copy(Char const* s, std::basic_string<Char> const& nothing) try {
    return length(s) == 0 ? nothing : std::basic_string<Char>(s);
} catch (std::length_error const&) {
    throw std::bad_alloc();
}

/// Converts a text. ASCII of no more than `direct` units needs no block: the string is filled while
/// it is constructed. `convertBlock` is decodeBlock or encodeBlock; `bound` tells how many units are
/// to be reserved. Inlined by force: short texts would suffer from a further call.
template <class Out, class In, class ConvertBlock, class Bound>
[[gnu::always_inline]] inline std::basic_string<Out>
_convert(In const* s, std::size_t size, std::size_t direct, ConvertBlock convertBlock,
         Bound bound) try {
    if (size <= direct && isAscii(s, size)) {
        // Without a sign, they take less to widen.
        auto const* const units = reinterpret_cast<std::make_unsigned_t<In> const*>(s);
        return std::basic_string<Out>(units, units + size);
    }
    In const* const end = s + size;
    alignas(BLOCK_ALIGNMENT) Out block[BLOCK];
    auto const fill = [&] {
        return static_cast<std::size_t>(convertBlock(s, end, block, CAN_SHUFFLE) - block);
    };
    std::size_t filled = fill();
    if (s == end) return _toString(block, filled);
    std::basic_string<Out> result;
    result.reserve(filled + bound(s, static_cast<std::size_t>(end - s)));
    result.append(block, filled);
    while (s != end) {
        filled = fill();
        result.append(block, filled);
    }
    return result;
} catch (std::length_error const&) {
    throw std::bad_alloc();
}

std::wstring _decode(char const* s, std::size_t size) {
    return _convert<wchar_t>(s, size, size, decodeBlock, countLeads);
}

} // namespace

std::string make_string(char const* s) { return _copy(s, _null_string); }

std::wstring make_wstring(wchar_t const* s) { return _copy(s, _null_wstring); }

std::string make_string(wchar_t const* s) { return make_string(make_wstring(s)); }

std::string make_string(std::wstring const& s) {
    constexpr std::size_t direct = 256; // Beyond it, a look at each character first takes longer.
    return _convert<char>(s.data(), s.size(), direct, encodeBlock, encodedBound);
}

std::wstring make_wstring(char const* s) { return _decode(s, length(s)); }

std::wstring make_wstring(std::string const& s) { return _decode(s.data(), length(s)); }

std::wstring make_wstring(char const* s, std::size_t size) {
    return _decode(s, ::strnlen(s, size));
}

char* encode(wchar_t const* s, std::size_t size, char* to) {
    alignas(BLOCK_ALIGNMENT) char block[BLOCK];
    for (wchar_t const* const end = s + size; s != end;) {
        to = std::copy(block, encodeBlock(s, end, block, CAN_SHUFFLE), to);
    }
    return to;
}

std::ostream& operator<<(std::ostream& os, std::wstring const& s) {
    char block[BLOCK];
    for (std::size_t done = 0; done != s.size();) {
        std::size_t const size = std::min(s.size() - done, BLOCK);
        narrow(s.data() + done, size, block);
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
