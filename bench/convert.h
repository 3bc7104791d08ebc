// How the narrow peers come by wide names and values. Our own conversions would not do: whenever
// they became faster, so would the peers.
#ifndef KORU_BENCH_CONVERT_H
#define KORU_BENCH_CONVERT_H

#include <koru/string.h>

#include <algorithm>
#include <string>
#include <string_view>

namespace bench {

/// UTF-8, as one writes it by hand: the short way for ASCII, which is all there is in these files.
inline std::string narrow(std::wstring const& text) {
    auto const isAscii = [](wchar_t c) { return c < 0x80; };
    if (!std::all_of(text.begin(), text.end(), isAscii)) return Koru::make_string(text);
    return std::string(text.begin(), text.end());
}

inline std::wstring widen(std::string_view text) {
    auto const isAscii = [](char c) { return (c & 0x80) == 0; };
    if (!std::all_of(text.begin(), text.end(), isAscii)) {
        return Koru::make_wstring(std::string(text));
    }
    return std::wstring(text.begin(), text.end());
}

} // namespace bench

#endif
