#include "text/fingerprint.h"

#include <immintrin.h>

#include <algorithm>
#include <array>

#include "text/convert.h"
#include "text/narrow.h"

namespace Koru {

namespace {

/// Passes over steps of 64 numbers without the wanted one, with vectors twice as wide, and returns
/// how far it came.
__attribute__((target("avx2"))) std::size_t _pass(Fingerprint const* numbers, std::size_t size,
                                                  Fingerprint wanted, std::size_t from) {
    __m256i const pattern = _mm256_set1_epi16(static_cast<short>(wanted));
    // The second step begins with a line of the cache, so that loads do not cross two.
    std::size_t const behindLine =
        reinterpret_cast<std::uintptr_t>(numbers + from) % 64 / sizeof *numbers;
    std::size_t i = from;
    for (std::size_t step = 64 - behindLine; size - i >= 64; i += step, step = 64) {
        auto const* const at = reinterpret_cast<__m256i const*>(numbers + i);
        __m256i const a = _mm256_cmpeq_epi16(_mm256_loadu_si256(at), pattern);
        __m256i const b = _mm256_cmpeq_epi16(_mm256_loadu_si256(at + 1), pattern);
        __m256i const c = _mm256_cmpeq_epi16(_mm256_loadu_si256(at + 2), pattern);
        __m256i const d = _mm256_cmpeq_epi16(_mm256_loadu_si256(at + 3), pattern);
        __m256i const any = _mm256_or_si256(_mm256_or_si256(a, b), _mm256_or_si256(c, d));
        if (_mm256_movemask_epi8(any) != 0) break;
    }
    return i;
}

/// The position of the first of two numbers. Inlined by force: where they are the same, the
/// compiler drops half of the comparisons.
[[gnu::always_inline]] inline std::size_t _find(std::vector<Fingerprint> const& column,
                                                Fingerprint wanted, Fingerprint orThis,
                                                std::size_t from) {
    Fingerprint const* const numbers = column.data();
    std::size_t const size = column.size();
    __m128i const a = _mm_set1_epi16(static_cast<short>(wanted));
    __m128i const b = _mm_set1_epi16(static_cast<short>(orThis));
    auto const in8 = [numbers, a, b](std::size_t at) {
        __m128i const eight = load16(numbers + at);
        return _mm_or_si128(_mm_cmpeq_epi16(eight, a), _mm_cmpeq_epi16(eight, b));
    };
    auto const in16 = [in8](std::size_t at) { return _mm_or_si128(in8(at), in8(at + 8)); };
    auto const in32 = [in16](std::size_t at) { return _mm_or_si128(in16(at), in16(at + 16)); };
    std::size_t i = from;
    while (size - i >= 64 && highBits(_mm_or_si128(in32(i), in32(i + 32))) == 0) i += 64;
    for (; size - i >= 8; i += 8) {
        std::uint32_t const found = highBits(in8(i));
        if (found != 0) return i + static_cast<std::size_t>(__builtin_ctz(found)) / sizeof *numbers;
    }
    while (i != size && numbers[i] != wanted && numbers[i] != orThis) ++i;
    return i == size ? NOT_FOUND : i;
}

} // namespace

std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            std::size_t from, bool wideVectors) {
    if (wideVectors) from = _pass(column.data(), column.size(), wanted, from);
    return _find(column, wanted, wanted, from);
}

std::size_t findFingerprint(std::vector<Fingerprint> const& column, Fingerprint wanted,
                            Fingerprint orThis, std::size_t from) {
    return _find(column, wanted, orThis, from);
}

namespace {

/// How many characters of a name count. Names that differ only after them share a number, which
/// just costs comparisons.
constexpr std::size_t MOST = 256;

/// `classOf` for sixteen characters of ASCII.
__m128i _classesOf(__m128i characters) {
    __m128i const lower = _mm_or_si128(characters, _mm_set1_epi8(0x20));
    __m128i const isK = _mm_cmpeq_epi8(lower, _mm_set1_epi8(SMALL_K));
    return _mm_xor_si128(lower, _mm_and_si128(isK, _mm_set1_epi8(SMALL_K ^ SMALL_I)));
}

/// The highest bit of each byte tells whether `narrow16` met something other than a character of
/// ASCII, or NUL. There is no NUL in bytes.
__m128i _isOdd(char const*, __m128i narrowed) { return narrowed; }
__m128i _isOdd(wchar_t const*, __m128i narrowed) {
    return _mm_or_si128(narrowed, _mm_cmpeq_epi8(narrowed, _mm_setzero_si128()));
}

/// A number from the classes of characters of ASCII, each with a weight that its place gives it.
/// Inlined by force: the compiler might not do so by itself, and then it takes a quarter longer.
class Sum {
public:
    template <class Char>
    [[gnu::always_inline]] Sum(Char const* name, std::size_t size)
        : size_(static_cast<std::uint32_t>(size)) {
        if (size > 16)
            addLong(name, size);
        else if (size != 0) // GCOVR_EXCL_BR_LINE: bytes begin with a lead byte
            add(name, narrowAll(name, size));
    }

    /// Whether all were characters of ASCII, and not NUL. Otherwise the sum means nothing.
    bool isExact() const { return highBits(odd_) == 0; }

    std::uint32_t mixedInto(std::uint32_t before) const {
        __m128i const two = _mm_add_epi32(sum_, _mm_unpackhi_epi64(sum_, sum_));
        __m128i const one = _mm_add_epi32(two, _mm_srli_epi64(two, 32));
        auto const sum = static_cast<std::uint32_t>(_mm_cvtsi128_si32(one));
        // Odd numbers chosen at random; the last one spreads what differs to the high bits.
        std::uint32_t const mixed = before * 0x85EBCA6BU + size_ * 0xC2B2AE35U + sum;
        return (mixed ^ mixed >> 15) * 0x9E3779B1U;
    }

private:
    /// The last sixteen may overlap with those before.
    template <class Char>
    void addLong(Char const* name, std::size_t size) {
        add(name, narrow16(name));
        for (std::size_t i = 16; i < size - 16; i += 16) addBehind(name, narrow16(name + i));
        addBehind(name, narrow16(name + size - 16));
    }

    /// Shifts the sum first, so that the order of the sixteens counts.
    template <class Char>
    void addBehind(Char const* name, __m128i characters) {
        sum_ = _mm_add_epi32(sum_, _mm_slli_epi32(sum_, 5));
        add(name, characters);
    }

    template <class Char>
    void add(Char const* name, __m128i characters) {
        __m128i const weights =
            _mm_setr_epi16(0x6D2B, 0x4F6D, 0x5BD1, 0x3C6F, 0x2F0B, 0x79B9, 0x1B87, 0x5563);
        odd_ = _mm_or_si128(odd_, _isOdd(name, characters));
        sum_ = _mm_add_epi32(sum_, _mm_madd_epi16(_classesOf(characters), weights));
    }

    std::uint32_t size_;
    __m128i odd_ = _mm_setzero_si128();
    __m128i sum_ = _mm_setzero_si128();
};

bool _continues(char c) { return isContinuation(c); }
bool _continues(wchar_t) { return false; }

/// The number of a name that is not all ASCII or holds a NUL. A function of its own, so that other
/// names do without the memory that it takes.
template <class Char>
[[gnu::noinline]] std::uint32_t _mixClasses(std::uint32_t before, Char const* name,
                                            std::size_t size) {
    std::array<char, MOST> classes;
    std::size_t count = 0;
    for (std::size_t i = 0; i != size && count != MOST && name[i] != 0; ++i) {
        if (_continues(name[i])) continue;
        classes[count++] = static_cast<char>(classOf(static_cast<std::uint32_t>(name[i])));
    }
    return Sum(classes.data(), count).mixedInto(before);
}

template <class Char>
std::uint32_t _mix(std::uint32_t before, Char const* name, std::size_t size) {
    Sum const sum(name, std::min(size, MOST));
    return sum.isExact() ? sum.mixedInto(before) : _mixClasses(before, name, size);
}

} // namespace

std::uint32_t mixFingerprint(std::uint32_t before, char const* name, std::size_t size) {
    return _mix(before, name, size);
}

std::uint32_t mixFingerprint(std::uint32_t before, wchar_t const* name, std::size_t size) {
    return _mix(before, name, size);
}

} // namespace Koru
