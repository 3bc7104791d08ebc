// The conversions in the plainest way: one character after the other, as the early definition of
// UTF-8 (RFC 2279) has it, without a check of continuation bytes.
#ifndef KORU_FUZZ_TEXTMODEL_H
#define KORU_FUZZ_TEXTMODEL_H

#include <cstddef>
#include <cstdint>
#include <string>

namespace fuzz {

/// What comes before the first NUL.
template <class String>
String upToNul(String const& text) {
    return text.substr(0, text.find(typename String::value_type()));
}

inline std::string encoded(std::wstring const& text) {
    std::string result;
    for (wchar_t const c : upToNul(text)) {
        auto const value = static_cast<std::int32_t>(c);
        int further = 0; // continuation bytes
        for (std::int32_t const limit : {0x7F, 0x7FF, 0xFFFF, 0x1FFFFF, 0x3FFFFFF}) {
            if (value > limit) ++further;
        }
        static unsigned const leads[] = {0, 0xC0, 0xE0, 0xF0, 0xF8, 0xFC};
        auto const bits = static_cast<std::uint32_t>(value);
        result += static_cast<char>(leads[further] | bits >> 6 * further);
        for (; further > 0; --further) {
            result += static_cast<char>(0x80 | (bits >> 6 * (further - 1) & 0x3F));
        }
    }
    return upToNul(result);
}

inline std::wstring decoded(std::string const& text) {
    std::string const bytes = upToNul(text);
    std::wstring result;
    for (std::size_t i = 0; i < bytes.size();) {
        auto const lead = static_cast<unsigned char>(bytes[i]);
        std::size_t const left = bytes.size() - i;
        std::size_t further = 0;
        if (lead >= 0x80) {
            // Each form only where the text is long enough for it; the longest for any lead.
            further = left > 1 && (lead & 0xE0) == 0xC0   ? 1
                      : left > 2 && (lead & 0xF0) == 0xE0 ? 2
                      : left > 3 && (lead & 0xF8) == 0xF0 ? 3
                      : left > 4 && (lead & 0xFC) == 0xF8 ? 4
                      : left > 5                          ? 5
                                                          : 0;
            if (further == 0) {
                result += L'?';
                ++i;
                continue;
            }
        }
        static unsigned const leadBits[] = {0x7F, 0x1F, 0x0F, 0x07, 0x03, 0x01};
        std::uint32_t value = lead & leadBits[further];
        for (std::size_t n = 1; n <= further; ++n) {
            value = value << 6 | (static_cast<unsigned char>(bytes[i + n]) & 0x3FU);
        }
        result += static_cast<wchar_t>(value);
        i += 1 + further;
    }
    return upToNul(result);
}

} // namespace fuzz

#endif
