#include <koru/string.h>

#include <emmintrin.h>
#include <strings.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <cwchar>
#include <ostream>

#include "text/convert.h"
#include "text/fold.h"

namespace Koru {

// First of all objects of the library, since every other one may ask for them.
__attribute__((init_priority(101))) std::string const _null_string;
__attribute__((init_priority(101))) std::wstring const _null_wstring;

namespace {

// Text is converted block by block in a buffer on the stack, so that a string is allocated once and
// no memory is written twice.
constexpr std::size_t BLOCK = 512;

__m128i _load(void const* from) { return _mm_loadu_si128(static_cast<__m128i const*>(from)); }

void _store(void* to, __m128i value) { _mm_storeu_si128(static_cast<__m128i*>(to), value); }

/// Widens the ASCII characters that the text begins with, up to `end`. Moves both pointers on.
void _widenAscii(char const*& s, char const* end, wchar_t*& to) {
    __m128i const zero = _mm_setzero_si128();
    for (; end - s >= 16; s += 16, to += 16) {
        __m128i const bytes = _load(s);
        if (_mm_movemask_epi8(bytes) != 0) break;
        __m128i const low = _mm_unpacklo_epi8(bytes, zero);
        __m128i const high = _mm_unpackhi_epi8(bytes, zero);
        _store(to, _mm_unpacklo_epi16(low, zero));
        _store(to + 4, _mm_unpackhi_epi16(low, zero));
        _store(to + 8, _mm_unpacklo_epi16(high, zero));
        _store(to + 12, _mm_unpackhi_epi16(high, zero));
    }
    for (; s != end && static_cast<signed char>(*s) >= 0; ++s) *to++ = *s;
}

/// Narrows the characters from 0 to 127 that the text begins with. Moves both pointers on.
void _narrowAscii(wchar_t const*& s, wchar_t const* end, char*& to) {
    __m128i const beyond = _mm_set1_epi32(~0x7F);
    for (; end - s >= 16; s += 16, to += 16) {
        __m128i const a = _load(s);
        __m128i const b = _load(s + 4);
        __m128i const c = _load(s + 8);
        __m128i const d = _load(s + 12);
        __m128i const any =
            _mm_and_si128(_mm_or_si128(_mm_or_si128(a, b), _mm_or_si128(c, d)), beyond);
        if (_mm_movemask_epi8(_mm_cmpeq_epi32(any, _mm_setzero_si128())) != 0xFFFF) break;
        _store(to, _mm_packus_epi16(_mm_packs_epi32(a, b), _mm_packs_epi32(c, d)));
    }
    for (; s != end && static_cast<std::uint32_t>(*s) < 0x80; ++s) *to++ = static_cast<char>(*s);
}

} // namespace

std::size_t length(char const* s) { return s == nullptr ? 0 : std::strlen(s); }

std::size_t length(std::string const& s) { return ::strnlen(s.data(), s.size()); }

std::size_t length(wchar_t const* s) { return s == nullptr ? 0 : std::wcslen(s); }

std::size_t length(std::wstring const& s) { return ::wcsnlen(s.data(), s.size()); }

int compare(char const* a, char const* b) { return ::strcasecmp(a, b); }

int compare(std::string const& a, std::string const& b) { return compare(a.c_str(), b.c_str()); }

int compare(wchar_t const* a, wchar_t const* b) {
    return compareFolded(WideCursor(a), WideCursor(b));
}

int compare(std::wstring const& a, std::wstring const& b) { return compare(a.c_str(), b.c_str()); }

std::string make_string(char const* s) { return length(s) == 0 ? _null_string : std::string(s); }

std::wstring make_wstring(wchar_t const* s) {
    return length(s) == 0 ? _null_wstring : std::wstring(s);
}

std::string make_string(wchar_t const* s) { return make_string(make_wstring(s)); }

std::wstring make_wstring(char const* s) { return make_wstring(s, length(s)); }

std::wstring make_wstring(std::string const& s) { return make_wstring(s.data(), s.size()); }

namespace {

/// Decodes characters to a block of `BLOCK` until it is full, the text ends or a zero comes out.
/// Moves `s` on and returns the end of what was written.
wchar_t* _decodeBlock(char const*& s, char const* end, wchar_t* to) {
    wchar_t const* const full = to + BLOCK;
    while (s != end && to != full) {
        _widenAscii(s, s + std::min(end - s, full - to), to);
        if (s == end || to == full) break;
        Decoded const c = decodeOne(s, static_cast<std::size_t>(end - s));
        if (c.value == 0) {
            s = end; // The result ends here.
            break;
        }
        s += c.size;
        *to++ = c.value;
    }
    return to;
}

/// The number of bytes that are not continuation bytes: the number of characters, if the text is
/// well-formed.
std::size_t _countLeads(char const* s, std::size_t size) {
    return static_cast<std::size_t>(
        std::count_if(s, s + size, [](char c) { return static_cast<signed char>(c) >= -0x40; }));
}

} // namespace

std::wstring make_wstring(char const* s, std::size_t size) {
    char const* const end = s + ::strnlen(s, size);
    if (s == end) return _null_wstring;
    wchar_t block[BLOCK];
    wchar_t* filled = _decodeBlock(s, end, block);
    if (s == end) return std::wstring(block, filled);
    std::wstring result;
    result.reserve(static_cast<std::size_t>(filled - block) +
                   _countLeads(s, static_cast<std::size_t>(end - s)));
    result.append(block, filled);
    while (s != end) {
        filled = _decodeBlock(s, end, block);
        result.append(block, filled);
    }
    return result;
}

namespace {

constexpr std::size_t LONGEST_FORM = 6;

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

/// Encodes characters until fewer than `LONGEST_FORM` bytes are free before `full`, the text ends
/// or a zero byte would come out. Moves `s` on and returns the end of what was written.
char* _encodeSome(wchar_t const*& s, wchar_t const* end, char* to, char const* full) {
    while (s != end && full - to >= static_cast<std::ptrdiff_t>(LONGEST_FORM)) {
        _narrowAscii(s, s + std::min<std::ptrdiff_t>(end - s, full - to), to);
        if (s == end || full - to < static_cast<std::ptrdiff_t>(LONGEST_FORM)) break;
        if (*s < 0 && (*s & 0xFF) == 0) {
            s = end; // The result ends here.
            break;
        }
        to = _encodeOne(*s++, to);
    }
    return to;
}

} // namespace

std::size_t encodedBound(wchar_t const* s, std::size_t size) {
    std::size_t bytes = 0;
    for (wchar_t const* const end = s + size; s != end; ++s) {
        bytes +=
            1U + (*s > 0x7F) + (*s > 0x7FF) + (*s > 0xFFFF) + (*s > 0x1FFFFF) + (*s > 0x3FFFFFF);
    }
    return bytes;
}

char* encode(wchar_t const* s, std::size_t size, char* to) {
    wchar_t const* const end = s + ::wcsnlen(s, size);
    char block[BLOCK];
    while (s != end) {
        std::size_t const bytes =
            static_cast<std::size_t>(_encodeSome(s, end, block, block + BLOCK) - block);
        std::memcpy(to, block, bytes);
        to += bytes;
    }
    return to;
}

std::string make_string(std::wstring const& text) {
    wchar_t const* s = text.data();
    wchar_t const* const end = s + length(text);
    if (s == end) return _null_string;
    char block[BLOCK];
    char* filled = _encodeSome(s, end, block, block + BLOCK);
    if (s == end) return std::string(block, filled);
    std::string result;
    result.reserve(static_cast<std::size_t>(filled - block) +
                   encodedBound(s, static_cast<std::size_t>(end - s)));
    result.append(block, filled);
    while (s != end) {
        filled = _encodeSome(s, end, block, block + BLOCK);
        result.append(block, filled);
    }
    return result;
}

namespace {

/// Whether a block written at once looks like its characters inserted one by one: with a width the
/// first one is padded, with unitbuf each one is flushed.
bool _takesBlocks(std::ostream const& os) {
    return os.width() == 0 && (os.flags() & std::ios::unitbuf) == 0;
}

/// Inserts characters one by one, as formatted output.
void _insertEach(std::ostream& os, char const* s, std::size_t size) {
    for (char const* const end = s + size; s != end; ++s) os << *s;
}

void _insert(std::ostream& os, char const* s, std::size_t size) {
    if (size != 0 && _takesBlocks(os))
        os.write(s, static_cast<std::streamsize>(size));
    else
        _insertEach(os, s, size);
}

} // namespace

std::ostream& operator<<(std::ostream& os, std::wstring const& s) {
    char block[BLOCK];
    for (std::size_t done = 0; done != s.size();) {
        std::size_t const size = std::min(s.size() - done, BLOCK);
        std::transform(s.data() + done, s.data() + done + size, block,
                       [](wchar_t c) { return static_cast<char>(c); });
        _insert(os, block, size);
        done += size;
    }
    return os;
}

std::ostream& operator<<(std::ostream& os, std::string const& s) {
    // Intended: an 8-bit signed count.
    auto const count = static_cast<std::int8_t>(s.size() & 0xFF);
    if (count > 0) _insert(os, s.data(), static_cast<std::size_t>(count));
    return os;
}

} // namespace Koru
