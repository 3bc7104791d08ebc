// Short numbers for names, to reject in bulk what cannot be equal.
#ifndef KORU_TEXT_FINGERPRINT_H
#define KORU_TEXT_FINGERPRINT_H

#include <array>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace Koru {

/// A name's number. Equal for any two names that `compare` finds equal, under whatever locale.
using Fingerprint = std::uint16_t;

constexpr std::size_t NOT_FOUND = static_cast<std::size_t>(-1);

/// The position of the first such number in a column, from a position on, or NOT_FOUND.
std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            std::size_t from);

/// The same for the first of two numbers.
std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            Fingerprint orThis, std::size_t from);

/// What the characters of ASCII count as. Two characters that some locale pairs count as the same:
/// the letters as their lower case, but for those that are paired with characters beyond ASCII (I
/// and i with the Turkish dotted and dotless i, K with the Kelvin sign), which count as one with
/// all that is beyond ASCII.
constexpr std::uint8_t DISPUTED = 0x80;

constexpr std::uint8_t classOf(std::uint32_t c) {
    if (c >= 0x80 || c == 'I' || c == 'i' || c == 'K' || c == 'k') return DISPUTED;
    return static_cast<std::uint8_t>(c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c);
}

constexpr std::array<std::uint8_t, 128> makeClasses() {
    std::array<std::uint8_t, 128> classes{};
    for (std::uint32_t c = 0; c < classes.size(); ++c) classes[c] = classOf(c);
    return classes;
}

/// Mixes the characters of a text into the number of the text before it. A cursor's `next` gives
/// one character after the other and then 0.
template <class Cursor>
std::uint32_t mixFingerprint(std::uint32_t before, Cursor cursor) {
    static constexpr std::array<std::uint8_t, 128> classes = makeClasses();
    std::uint32_t mixed = before;
    while (wchar_t const c = cursor.next()) {
        auto const value = static_cast<std::uint32_t>(c);
        std::uint32_t const counted = value < classes.size() ? classes[value] : DISPUTED;
        mixed = (mixed ^ counted) * 0x01000193U; // FNV-1a
    }
    return mixed * 0x9E3779B1U; // spreads to the high bits and sets the next text apart
}

/// The number that stands in a column, from what was mixed.
inline Fingerprint toFingerprint(std::uint32_t mixed) {
    return static_cast<Fingerprint>(mixed >> 16);
}

} // namespace Koru

#endif
