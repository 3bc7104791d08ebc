// Whether bytes may be kept in place of the characters they decode to.
#ifndef KORU_TEXT_WELLFORMED_H
#define KORU_TEXT_WELLFORMED_H

#include <array>
#include <cstddef>
#include <string_view>

#include "text/convert.h"
#include "text/narrow.h"

namespace Koru {

/// Whether the bytes are ASCII without a NUL.
inline bool isPlain(std::string_view bytes) { return isAscii(bytes.data(), bytes.size()); }

/// Whether make_string gives these bytes for what make_wstring makes of them. May be false for
/// characters of more than four bytes, which no real text has.
inline bool isCanonical(std::string_view bytes) {
    constexpr std::array<wchar_t, 5> leastOfSize = {0, 0x01, 0x80, 0x800, 0x10000};
    char const* at = bytes.data();
    char const* const end = at + bytes.size();
    while (at != end) {
        Decoded const c = decodeOne(at, static_cast<std::size_t>(end - at));
        if (c.size > 4 || c.value < leastOfSize[c.size]) return false;
        // A `?` that is not in the text comes from a lead byte that the end cuts short.
        if (c.size == 1 && c.value != *at) return false;
        for (std::size_t i = 1; i < c.size; ++i) {
            if (!isContinuation(at[i])) return false;
        }
        at += c.size;
    }
    return true;
}

} // namespace Koru

#endif
