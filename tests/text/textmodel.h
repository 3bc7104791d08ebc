// The two conversions as their description puts them, character by character, and text to hold the
// library against them.
#ifndef KORU_TESTS_TEXTMODEL_H
#define KORU_TESTS_TEXTMODEL_H

#include <koru/string.h>

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/differences.h"

namespace test {

inline wchar_t unit(std::uint32_t value) { return static_cast<wchar_t>(value); }
inline char byte(std::uint32_t value) { return static_cast<char>(value & 0xFF); }
inline std::uint32_t valueOf(wchar_t c) { return static_cast<std::uint32_t>(c); }
inline std::uint32_t valueOf(char c) { return static_cast<unsigned char>(c); }

inline std::wstring units(std::vector<std::uint32_t> const& values) {
    return std::wstring(values.begin(), values.end());
}
inline std::string bytes(std::vector<std::uint32_t> const& values) {
    std::string text;
    for (std::uint32_t const value : values) text += byte(value);
    return text;
}

/// Both widths in hexadecimal, for comparing and for messages.
template <class Char>
std::string hex(std::basic_string<Char> const& text) {
    std::ostringstream out;
    out << std::hex << std::uppercase;
    for (std::size_t i = 0; i < text.size() && i < 160; ++i) {
        out << (i == 0 ? "" : " ") << valueOf(text[i]);
    }
    if (text.size() > 160) out << " ... (" << std::dec << text.size() << ')';
    return out.str();
}

template <class Char>
std::basic_string<Char> untilNul(std::basic_string<Char> const& text) {
    return text.substr(0, text.find(Char()));
}

/// Wide to UTF-8: one to six bytes by the size of the signed value.
inline std::string modelOf(std::wstring const& text) {
    std::string out;
    for (wchar_t const c : untilNul(text)) {
        unsigned tails = 0; // bytes after the lead
        for (wchar_t const limit : {0x7F, 0x7FF, 0xFFFF, 0x1FFFFF, 0x3FFFFFF}) tails += c > limit;
        static std::uint32_t const leads[] = {0, 0xC0, 0xE0, 0xF0, 0xF8, 0xFC};
        out += byte(leads[tails] | valueOf(c) >> 6 * tails);
        while (tails-- != 0) out += byte(0x80 | (valueOf(c) >> 6 * tails & 0x3F));
    }
    return untilNul(out);
}

/// UTF-8 to wide. The forms are tried in this order; each one's last byte has to exist, and the
/// last form takes any lead.
inline std::wstring modelOf(std::string const& text) {
    struct Form {
        std::size_t size;
        std::uint32_t mask, pattern, leadBits;
    };
    static Form const forms[] = {{2, 0xE0, 0xC0, 0x1F},
                                 {3, 0xF0, 0xE0, 0x0F},
                                 {4, 0xF8, 0xF0, 0x07},
                                 {5, 0xFC, 0xF8, 0x03},
                                 {6, 0x00, 0x00, 0x01}};
    std::string const s = untilNul(text);
    std::wstring out;
    for (std::size_t i = 0, taken = 1; i < s.size(); i += taken) {
        std::uint32_t const b = valueOf(s[i]);
        std::uint32_t c = b < 0x80 ? b : '?';
        taken = 1;
        for (Form const& form : forms) {
            if (b < 0x80 || i + form.size > s.size() || (b & form.mask) != form.pattern) continue;
            c = b & form.leadBits;
            for (taken = 1; taken < form.size; ++taken) c = c << 6 | (valueOf(s[i + taken]) & 0x3F);
            break;
        }
        out += unit(c);
    }
    return untilNul(out);
}

/// The conversion of either width.
inline std::wstring converted(std::string const& text) { return Koru::make_wstring(text); }
inline std::wstring converted(char const* text) { return Koru::make_wstring(text); }
inline std::string converted(std::wstring const& text) { return Koru::make_string(text); }
inline std::string converted(wchar_t const* text) { return Koru::make_string(text); }

template <class Char>
std::basic_string<Char> randomText(Random& random, std::size_t size, bool withNuls = false);

/// ASCII runs, whole and broken characters, bytes that are neither, and NULs if wanted.
template <>
inline std::string randomText(Random& random, std::size_t size, bool withNuls) {
    std::string text;
    auto const run = [&](std::uint32_t sizes, std::uint32_t least, std::uint32_t count) {
        for (auto n = random.below(sizes); n > 0; --n) text += byte(least + random.below(count));
    };
    while (text.size() < size) {
        std::uint32_t const kind = random.below(withNuls ? 8 : 7);
        if (kind < 2) run(40, 1, 127);
        if (kind == 2 || kind == 3) {
            text += modelOf(units({1 + (random.next() >> random.below(32))}));
        }
        if (kind == 4) run(9, 0x80, 64);
        if (kind == 5) run(3, 0xC0, 64);
        if (kind == 6) run(3, 1, 255);
        if (kind == 7) text += '\0';
    }
    text.resize(size);
    return text;
}

/// Runs of ASCII, of characters of each form and of negative ones, and what ends a text if wanted.
template <>
inline std::wstring randomText(Random& random, std::size_t size, bool withNuls) {
    std::wstring text;
    while (text.size() < size) {
        std::uint32_t const kind = random.below(withNuls ? 6 : 5);
        std::uint32_t const shift = random.below(32);
        for (std::uint32_t n = random.below(kind < 2 ? 40 : 20); n > 0 && kind < 4; --n) {
            text += kind < 2 ? unit(1 + random.below(127)) : unit((random.next() >> shift) | 1);
        }
        if (kind == 4) text += unit(0x80 + random.below(0x780));
        if (kind == 5) text += unit(random.below(2) == 0 ? 0 : 0x80000000U);
    }
    text.resize(size);
    return text;
}

/// Memory between two pages that must not be touched.
class GuardedMemory {
public:
    GuardedMemory() : page_(static_cast<std::size_t>(::sysconf(_SC_PAGESIZE))), size_(16 * page_) {
        void* const all =
            ::mmap(nullptr, size_ + 2 * page_, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
        if (all == MAP_FAILED) throw std::runtime_error("mmap failed");
        begin_ = static_cast<char*>(all) + page_;
        if (::mprotect(begin_, size_, PROT_READ | PROT_WRITE) != 0) {
            throw std::runtime_error("mprotect failed");
        }
    }
    GuardedMemory(GuardedMemory const&) = delete;
    GuardedMemory& operator=(GuardedMemory const&) = delete;
    ~GuardedMemory() { ::munmap(begin_ - page_, size_ + 2 * page_); }

    /// The first and the last characters of it.
    template <class Char>
    Char* first() const {
        return reinterpret_cast<Char*>(begin_);
    }
    template <class Char>
    Char* last(std::size_t count) const {
        if (count * sizeof(Char) > size_) throw std::length_error("text for guarded memory");
        return reinterpret_cast<Char*>(begin_ + size_) - count;
    }

private:
    std::size_t page_;
    std::size_t size_;
    char* begin_ = nullptr;
};

} // namespace test

#endif
