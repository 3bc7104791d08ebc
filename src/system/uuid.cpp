#include <koru/uuid.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <ostream>

#include <koru/string.h>

#include "text/insert.h"

namespace Koru {

namespace {

constexpr std::size_t TEXT_SIZE = 36;
constexpr char DIGITS[] = "0123456789abcdef";

using Text = std::array<char, TEXT_SIZE>;

constexpr std::uint8_t NO_DIGIT = 0xFF;

constexpr std::array<std::uint8_t, 256> _makeValues() {
    std::array<std::uint8_t, 256> values{};
    for (auto& value : values) value = NO_DIGIT;
    for (std::uint8_t i = 0; i < 10; ++i) values['0' + i] = i;
    for (std::uint8_t i = 0; i < 6; ++i) {
        values['a' + i] = values['A' + i] = static_cast<std::uint8_t>(10 + i);
    }
    return values;
}

/// The value of every hexadecimal digit.
constexpr std::array<std::uint8_t, 256> VALUES = _makeValues();

Text _format(unsigned char const (&bytes)[16]) {
    Text text;
    std::size_t at = 0;
    for (std::size_t i = 0; i < 16; ++i) {
        if (i == 4 || i == 6 || i == 8 || i == 10) text[at++] = '-';
        text[at++] = DIGITS[bytes[i] >> 4];
        text[at++] = DIGITS[bytes[i] & 0x0F];
    }
    return text;
}

} // namespace

Uuid::Uuid() : bytes_() {}

Uuid::Uuid(unsigned char const (&bytes)[16]) { std::copy_n(bytes, 16, bytes_); }

Uuid::Uuid(std::vector<unsigned char> const& bytes) : bytes_() {
    if (bytes.size() == 16) std::copy_n(bytes.data(), 16, bytes_);
}

Uuid::Uuid(std::string const& text) : bytes_() {
    if (length(text) != TEXT_SIZE) return;
    Text digits;
    std::copy_n(text.data(), TEXT_SIZE, digits.data());
    // Intended: hyphens anywhere. The last places keep what stood there and have to be digits too.
    static_cast<void>(std::remove(digits.begin(), digits.end(), '-'));
    std::array<std::uint8_t, TEXT_SIZE> values;
    std::uint8_t all = 0;
    for (std::size_t i = 0; i < TEXT_SIZE; ++i) {
        values[i] = VALUES[static_cast<unsigned char>(digits[i])];
        all |= values[i];
    }
    if (all == NO_DIGIT) return;
    for (std::size_t i = 0; i < 16; ++i) {
        bytes_[i] = static_cast<unsigned char>(values[2 * i] << 4 | values[2 * i + 1]);
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
