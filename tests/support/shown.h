// Text, bytes and names for a test's output.
#ifndef KORU_TESTS_SHOWN_H
#define KORU_TESTS_SHOWN_H

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <string>
#include <type_traits>
#include <vector>

namespace test {

/// One character: printable ASCII as it is, anything else as <hexadecimal>.
inline std::string shownCharacter(std::uint32_t c) {
    if (c >= 0x20 && c < 0x7F && c != '<') return std::string(1, static_cast<char>(c));
    char number[sizeof "<ffffffff>"];
    std::snprintf(number, sizeof number, "<%x>", static_cast<unsigned>(c));
    return number;
}

/// The first characters of a sequence, and how many there are if those are not all.
template <class Sequence>
std::string shownStart(Sequence const& sequence, std::size_t most) {
    std::string result;
    for (auto const c : sequence) {
        if (most-- == 0) return result + "... of " + std::to_string(sequence.size());
        result += shownCharacter(static_cast<std::make_unsigned_t<std::decay_t<decltype(c)>>>(c));
    }
    return result;
}

inline std::string shown(std::wstring const& text) { return shownStart(text, text.size()); }
inline std::string shown(std::string const& bytes) { return shownStart(bytes, bytes.size()); }

inline std::string shown(std::vector<std::wstring> const& names) {
    std::string result;
    for (std::wstring const& name : names) result += '"' + shown(name) + "\" ";
    return result;
}

} // namespace test

#endif
