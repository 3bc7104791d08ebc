#include "settings/storedtext.h"

#include <emmintrin.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>

#include "text/fingerprint.h"

namespace Koru {

namespace {

/// How many bytes two texts have in common at their start, in whole characters.
std::size_t _commonPrefix(std::string_view a, std::string_view b) {
    std::size_t const most = std::min(a.size(), b.size());
    std::size_t i = 0;
    for (; most - i >= sizeof(std::uint32_t); i += sizeof(std::uint32_t)) {
        std::uint32_t x;
        std::uint32_t y;
        std::memcpy(&x, a.data() + i, sizeof x);
        std::memcpy(&y, b.data() + i, sizeof y);
        if (x != y) break;
    }
    while (i != most && a[i] == b[i]) ++i;
    auto const startsInside = [&i](std::string_view text) {
        return i != text.size() && (text[i] & 0xC0) == 0x80;
    };
    while (i != 0 && (startsInside(a) || startsInside(b))) --i;
    return i;
}

/// Whether towlower leaves a character of ASCII as it is, in every locale.
bool _isItsOwnLower(char c) { return c > 0 && (c < 'A' || c > 'Z'); }

} // namespace

int compare(StoredText const& a, StoredText const& b) {
    if (a.wide() == nullptr && b.wide() == nullptr) {
        std::size_t const common = _commonPrefix(a.bytes(), b.bytes());
        // Mostly the two characters behind it decide.
        if (common < std::min(a.bytes().size(), b.bytes().size())) {
            char const x = a.bytes()[common];
            char const y = b.bytes()[common];
            if (_isItsOwnLower(x) && _isItsOwnLower(y)) return x - y;
        }
        return compareFolded(BytesCursor(a.bytes().substr(common)),
                             BytesCursor(b.bytes().substr(common)));
    }
    return a.withCursor(
        [&b](auto x) { return b.withCursor([&x](auto y) { return compareFolded(x, y); }); });
}

int compare(StoredText const& a, std::wstring const& b) {
    WideCursor const y(b.c_str());
    return a.withCursor([&y](auto x) { return compareFolded(x, y); });
}

namespace {

bool _isPlain16(char const* bytes) {
    __m128i const block = _mm_loadu_si128(reinterpret_cast<__m128i const*>(bytes));
    // Signed, the plain bytes are those above zero.
    return _mm_movemask_epi8(_mm_cmpgt_epi8(block, _mm_setzero_si128())) == 0xFFFF;
}

} // namespace

bool isPlain(std::string_view bytes) {
    char const* at = bytes.data();
    char const* const end = at + bytes.size();
    if (bytes.size() < 16) {
        for (; at != end; ++at) {
            if (static_cast<signed char>(*at) <= 0) return false;
        }
        return true;
    }
    for (; end - at > 16; at += 16) {
        if (!_isPlain16(at)) return false;
    }
    return _isPlain16(end - 16); // overlaps what was looked at already
}

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

std::uint32_t fingerprint(std::uint32_t before, StoredText const& text) {
    return text.withCursor([before](auto cursor) { return mixFingerprint(before, cursor); });
}

std::uint32_t fingerprint(std::uint32_t before, std::wstring const& text) {
    return mixFingerprint(before, WideCursor(text.c_str()));
}

} // namespace Koru
