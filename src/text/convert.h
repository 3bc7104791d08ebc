// Conversion of text that is given as a range of memory: what the public make_string and
// make_wstring do with strings, for those who hold views.
#ifndef KORU_TEXT_CONVERT_H
#define KORU_TEXT_CONVERT_H

#include <cstddef>
#include <cstdint>
#include <string>

namespace Koru {

/// Decodes the bytes up to the first zero byte or the end, as make_wstring(std::string) does.
std::wstring make_wstring(char const* s, std::size_t size);

/// A string of these characters. Constructing it from them would take 35 ns on i386 however few
/// they are: strings copy with wmemcpy, which there is the version for the oldest processors.
std::wstring wideString(wchar_t const* s, std::size_t size);

/// The number of bytes that `encode` writes for the characters at the most.
std::size_t encodedBound(wchar_t const* s, std::size_t size);

/// Writes what make_string gives for the characters to `to`, which has room for it, and returns the
/// end of what was written.
char* encode(wchar_t const* s, std::size_t size, char* to);

/// Whether a byte continues a character that began before it.
inline bool isContinuation(char c) { return (c & 0xC0) == 0x80; }

/// The value of one character of UTF-8, and how many bytes it took.
struct Decoded {
    wchar_t value;
    std::size_t size;
};

/// Decodes the character at the start of a text of at least one byte.
inline Decoded decodeOne(char const* text, std::size_t size) {
    auto const byte = [text](std::size_t i) {
        return static_cast<std::int32_t>(static_cast<unsigned char>(text[i]));
    };
    auto const tail = [&byte](std::size_t i) { return byte(i) & 0x3F; };
    std::int32_t const b = byte(0);
    if (b < 0x80) return {b, 1};
    // A sequence cut short by the end is not tried as a longer form: its lead becomes `?`.
    if ((b & 0xE0) == 0xC0) {
        if (size >= 2) return {(b & 0x1F) << 6 | tail(1), 2};
    } else if ((b & 0xF0) == 0xE0) {
        if (size >= 3) return {(b & 0x0F) << 12 | tail(1) << 6 | tail(2), 3};
    } else if ((b & 0xF8) == 0xF0) {
        if (size >= 4) return {(b & 0x07) << 18 | tail(1) << 12 | tail(2) << 6 | tail(3), 4};
    } else if ((b & 0xFC) == 0xF8) {
        if (size >= 5) {
            return {(b & 0x03) << 24 | tail(1) << 18 | tail(2) << 12 | tail(3) << 6 | tail(4), 5};
        }
    } else if (size >= 6) {
        // Intended: whatever the byte is, a stray continuation byte too.
        return {(b & 0x01) << 30 | tail(1) << 24 | tail(2) << 18 | tail(3) << 12 | tail(4) << 6 |
                    tail(5),
                6};
    }
    return {L'?', 1};
}

} // namespace Koru

#endif
