// Short numbers for names, to reject in bulk what cannot be equal.
#ifndef KORU_TEXT_FINGERPRINT_H
#define KORU_TEXT_FINGERPRINT_H

#include <cstddef>
#include <cstdint>
#include <vector>

#include "text/fold.h"
#include "text/processor.h"

namespace Koru {

/// A name's number. Equal for any two names that `compare` finds equal, under whatever locale.
using Fingerprint = std::uint16_t;

constexpr std::size_t NOT_FOUND = static_cast<std::size_t>(-1);

/// The position of the first such number in a column, from a position on, or NOT_FOUND.
std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            std::size_t from, bool wideVectors = HAS_WIDE_VECTORS);

/// The same for the first of two numbers.
std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            Fingerprint orThis, std::size_t from);

/// What a character other than NUL counts as. Two that some locale pairs count as the same: the
/// letters of ASCII as their lower case, but those that are paired with characters beyond ASCII
/// (see DisputedLetter) as one with all of these. Some other characters of ASCII count as the same,
/// too, which only costs comparisons.
constexpr std::uint32_t classOf(std::uint32_t c) {
    return c >= 0x80 || (c | 0x20) == SMALL_K ? std::uint32_t{SMALL_I} : c | 0x20;
}

/// Mixes a name into the number of the name before it. Bytes are well-formed UTF-8 without a NUL;
/// wide text ends at its first NUL. A name has the same number as bytes and as wide text.
std::uint32_t mixFingerprint(std::uint32_t before, char const* name, std::size_t size);
std::uint32_t mixFingerprint(std::uint32_t before, wchar_t const* name, std::size_t size);

/// The number for a column, from what was mixed.
inline Fingerprint toFingerprint(std::uint32_t mixed) {
    return static_cast<Fingerprint>(mixed >> 16);
}

} // namespace Koru

#endif
