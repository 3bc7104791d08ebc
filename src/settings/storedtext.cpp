#include "settings/storedtext.h"

#include <emmintrin.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>

#include <koru/string.h>

#include "text/narrow.h"

namespace Koru {

std::wstring StoredText::str() const {
    constexpr std::size_t few = 64; // Widening more of them at a time is worthwhile beyond it.
    if (isWide()) return wideString(wide_->data(), wide_->size());
    if (size_ <= few && isPlain(bytes())) return std::wstring(bytes_, bytes_ + size_);
    return make_wstring(bytes_, size_);
}

namespace {

/// The first byte at which two texts differ, or the size of the shorter one.
std::size_t _difference(std::string_view a, std::string_view b) {
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

/// All else. Apart, so that what mostly decides does without what this takes.
__attribute__((noinline)) int _compareFolded(StoredText const& a, StoredText const& b) {
    return a.withCursor(
        [&b](auto x) { return b.withCursor([&x](auto y) { return compareFolded(x, y); }); });
}

} // namespace

int compare(StoredText const& a, StoredText const& b) {
    if (a.isWide() || b.isWide()) return _compareFolded(a, b);
    std::string_view const x = a.bytes();
    std::string_view const y = b.bytes();
    std::size_t const i = _difference(x, y);
    if (i == y.size()) return i == x.size() ? 0 : 1;
    if (i == x.size()) return -1;
    // Mostly the first two characters that differ decide.
    bool const decided = isUndisputed(x[i]) && isUndisputed(y[i]) && lower(x[i]) != lower(y[i]);
    return decided ? static_cast<int>(lower(x[i]) - lower(y[i])) : _compareFolded(a, b);
}

namespace {

/// Whether two texts of the same size are the same and ASCII.
bool _areSame(char const* a, wchar_t const* b, std::size_t size) {
    auto const same = [](__m128i x, __m128i y) {
        return areAscii(x) && highBits(_mm_cmpeq_epi8(x, y)) == ALL_BYTES;
    };
    if (size == 0) return true;
    if (size <= 16) return same(narrowAll(a, size), narrowAll(b, size));
    for (std::size_t i = 0; i < size - 16; i += 16) {
        if (!same(narrow16(a + i), narrow16(b + i))) return false;
    }
    return same(narrow16(a + size - 16), narrow16(b + size - 16));
}

__attribute__((noinline)) bool _areEqualFolded(StoredText const& a, std::wstring const& b) {
    if (std::wstring const* const wide = a.wide()) return compare(*wide, b) == 0;
    return compareFolded(BytesCursor(a.bytes()), WideCursor(b.c_str())) == 0;
}

} // namespace

bool areEqual(StoredText const& a, std::wstring const& b) {
    // Mostly a name is looked for as it is written.
    if (!a.isWide() && a.bytes().size() == b.size() &&
        _areSame(a.bytes().data(), b.data(), b.size()))
        return true;
    return _areEqualFolded(a, b);
}

bool isPlain(std::string_view bytes) { return isAscii(bytes.data(), bytes.size()); }

bool isCanonical(std::string_view bytes) {
    static constexpr std::array<wchar_t, 5> leastOfSize = {0, 0x01, 0x80, 0x800, 0x10000};
    char const* at = bytes.data();
    char const* const end = at + bytes.size();
    while (at != end) {
        Decoded const c = decodeOne(at, static_cast<std::size_t>(end - at));
        if (c.size > 4 || c.value < leastOfSize[c.size]) return false;
        // A `?` that does not stand there was cut short by the end.
        if (c.size == 1 && c.value != *at) return false;
        for (std::size_t i = 1; i < c.size; ++i) {
            if ((at[i] & 0xC0) != 0x80) return false;
        }
        at += c.size;
    }
    return true;
}

} // namespace Koru
