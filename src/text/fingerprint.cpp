#include "text/fingerprint.h"

#include <emmintrin.h>

#include <algorithm>

namespace Koru {

namespace {

/// Looks at 32 numbers a step. `equal` tells which of eight numbers are looked for, `matches`
/// whether one is.
template <class Equal, class Matches>
std::size_t _find(std::vector<Fingerprint> const& column, std::size_t from, Equal equal,
                  Matches matches) {
    Fingerprint const* const numbers = column.data();
    std::size_t const size = column.size();
    auto const eight = [numbers, equal](std::size_t at) {
        return equal(_mm_loadu_si128(reinterpret_cast<__m128i const*>(numbers + at)));
    };
    std::size_t i = from;
    for (; size - i >= 32; i += 32) {
        __m128i const any = _mm_or_si128(_mm_or_si128(eight(i), eight(i + 8)),
                                         _mm_or_si128(eight(i + 16), eight(i + 24)));
        if (_mm_movemask_epi8(any) != 0) break;
    }
    auto const* const found = std::find_if(numbers + i, numbers + size, matches);
    return found == numbers + size ? NOT_FOUND : static_cast<std::size_t>(found - numbers);
}

__m128i _eightOf(Fingerprint number) { return _mm_set1_epi16(static_cast<short>(number)); }

} // namespace

std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            std::size_t from) {
    __m128i const pattern = _eightOf(wanted);
    return _find(
        column, from, [pattern](__m128i numbers) { return _mm_cmpeq_epi16(numbers, pattern); },
        [wanted](Fingerprint number) { return number == wanted; });
}

std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            Fingerprint orThis, std::size_t from) {
    __m128i const a = _eightOf(wanted);
    __m128i const b = _eightOf(orThis);
    return _find(
        column, from,
        [a, b](__m128i numbers) {
            return _mm_or_si128(_mm_cmpeq_epi16(numbers, a), _mm_cmpeq_epi16(numbers, b));
        },
        [wanted, orThis](Fingerprint number) { return number == wanted || number == orThis; });
}

} // namespace Koru
