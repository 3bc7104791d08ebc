#include <koru/uuid.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstring>

#include "text/insert.h"
#include "text/simd.h"

namespace Koru {

namespace {

constexpr std::size_t TEXT_SIZE = 36;

using Text = std::array<char, TEXT_SIZE>;

/// The digits of sixteen values from 0 to 15.
__m128i _toDigits(__m128i values) {
    __m128i const letters = _mm_cmpgt_epi8(values, _mm_set1_epi8(9));
    return _mm_add_epi8(_mm_add_epi8(values, _mm_set1_epi8('0')),
                        _mm_and_si128(letters, _mm_set1_epi8('a' - '0' - 10)));
}

Text _format(unsigned char const (&bytes)[16]) {
    __m128i const all = load16(bytes);
    __m128i const high = _mm_and_si128(_mm_srli_epi16(all, 4), _mm_set1_epi8(0x0F));
    __m128i const low = _mm_and_si128(all, _mm_set1_epi8(0x0F));
    std::array<char, 32> digits;
    store16(digits.data(), _toDigits(_mm_unpacklo_epi8(high, low)));
    store16(digits.data() + 16, _toDigits(_mm_unpackhi_epi8(high, low)));
    Text text;
    text[8] = text[13] = text[18] = text[23] = '-';
    std::memcpy(&text[0], &digits[0], 8);
    std::memcpy(&text[9], &digits[8], 4);
    std::memcpy(&text[14], &digits[12], 4);
    std::memcpy(&text[19], &digits[16], 4);
    std::memcpy(&text[24], &digits[20], 12);
    return text;
}

/// All bits of each character from `first` to `last`, none of the others.
__m128i _areFrom(char first, char last, __m128i c) {
    return _mm_and_si128(_mm_cmpgt_epi8(c, _mm_set1_epi8(static_cast<char>(first - 1))),
                         _mm_cmplt_epi8(c, _mm_set1_epi8(static_cast<char>(last + 1))));
}

/// Reads sixteen digits as eight bytes; false if they are not all digits.
bool _read(__m128i c, unsigned char* to) {
    __m128i const letters = _areFrom('a', 'f', _mm_or_si128(c, _mm_set1_epi8('a' ^ 'A')));
    if (highBits(_mm_or_si128(_areFrom('0', '9', c), letters)) != ALL_BYTES) return false;
    __m128i const values = _mm_add_epi8(_mm_and_si128(c, _mm_set1_epi8(0x0F)),
                                        _mm_and_si128(letters, _mm_set1_epi8(9)));
    __m128i const pairs = _mm_or_si128(_mm_slli_epi16(values, 4), _mm_srli_epi16(values, 8));
    __m128i const bytes = _mm_and_si128(pairs, _mm_set1_epi16(0x00FF));
    _mm_storel_epi64(reinterpret_cast<__m128i*>(to), _mm_packus_epi16(bytes, bytes));
    return true;
}

/// Reads text with the hyphens in their usual places.
bool _readUsual(char const* text, unsigned char* to) {
    if (text[8] != '-' || text[13] != '-' || text[18] != '-' || text[23] != '-') return false;
    auto const four = [text](std::size_t place) {
        int digits;
        std::memcpy(&digits, text + place, sizeof digits);
        return digits;
    };
    return _read(_mm_setr_epi32(four(0), four(4), four(9), four(14)), to) &&
           _read(_mm_setr_epi32(four(19), four(24), four(28), four(32)), to + 8);
}

/// Reads text with hyphens anywhere. Intended: the other characters move up into their places, and
/// what remains at the end has to be digits too.
bool _readAnyhow(char const* text, unsigned char* to) {
    Text digits;
    std::copy_n(text, TEXT_SIZE, digits.data());
    static_cast<void>(std::remove(digits.begin(), digits.end(), '-'));
    std::array<unsigned char, 8> last;
    return _read(load16(digits.data()), to) && _read(load16(digits.data() + 16), to + 8) &&
           _read(load16(digits.data() + TEXT_SIZE - 16), last.data());
}

} // namespace

Uuid::Uuid() : bytes_() {}

Uuid::Uuid(unsigned char const (&bytes)[16]) { std::copy_n(bytes, 16, bytes_); }

Uuid::Uuid(std::vector<unsigned char> const& bytes) : bytes_() {
    if (bytes.size() == 16) std::copy_n(bytes.data(), 16, bytes_);
}

Uuid::Uuid(std::string const& text) : bytes_() {
    // A NUL within the 36 characters is not a digit, so it needs no check here.
    if (text.size() < TEXT_SIZE || text.c_str()[TEXT_SIZE] != '\0') return;
    std::array<unsigned char, 16> bytes;
    if (_readUsual(text.data(), bytes.data()) || _readAnyhow(text.data(), bytes.data())) {
        std::copy_n(bytes.data(), 16, bytes_);
    }
}

Uuid::operator std::vector<unsigned char>() const {
    return std::vector<unsigned char>(bytes_, bytes_ + 16);
}

Uuid::operator std::string() const {
    Text const text = _format(bytes_);
    return std::string(text.data(), text.size());
}

bool operator==(Uuid const& a, Uuid const& b) { return std::memcmp(a.bytes_, b.bytes_, 16) == 0; }

bool operator!=(Uuid const& a, Uuid const& b) { return !(a == b); }

std::ostream& operator<<(std::ostream& os, Uuid const& uuid) {
    Text const text = _format(uuid.bytes_);
    insert(os, text.data(), text.size());
    return os;
}

} // namespace Koru
