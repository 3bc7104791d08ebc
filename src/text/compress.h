// Compressing eight values of a register: those that a mask keeps move together to the front.
#ifndef KORU_TEXT_COMPRESS_H
#define KORU_TEXT_COMPRESS_H

#include <tmmintrin.h>

#include <array>
#include <cstddef>
#include <cstdint>

namespace Koru {

/// For each mask of eight bits, the places of its set bits, lowest first, and their number.
struct Compression {
    std::array<std::array<std::uint8_t, 8>, 256> places{};
    std::array<std::uint8_t, 256> kept{};
};

constexpr Compression makeCompression() {
    Compression compression;
    for (std::size_t mask = 0; mask < 256; ++mask) {
        std::uint8_t& kept = compression.kept[mask];
        for (std::uint8_t place = 0; place < 8; ++place) {
            if ((mask >> place & 1) != 0) compression.places[mask][kept++] = place;
        }
    }
    return compression;
}

inline constexpr Compression COMPRESSION = makeCompression();

/// The places of the bits of a mask in the lower eight bytes of a register.
inline __m128i placesOf(std::uint32_t mask) {
    auto const* const places = COMPRESSION.places[mask].data();
    return _mm_loadl_epi64(reinterpret_cast<__m128i const*>(places));
}

} // namespace Koru

#endif
