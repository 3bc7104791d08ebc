// What a stateful target takes from its input, front to back: operations, numbers and texts. Where
// the input ends, all of them are zero or empty.
#ifndef KORU_FUZZ_INPUT_H
#define KORU_FUZZ_INPUT_H

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>

namespace fuzz {

class Input {
public:
    Input(std::uint8_t const* data, std::size_t size) : next_(data), end_(data + size) {}

    bool isAtEnd() const { return next_ == end_; }

    unsigned byte() { return isAtEnd() ? 0 : *next_++; }

    unsigned below(unsigned limit) { return byte() % limit; }

    std::uint32_t word() {
        std::uint32_t result = 0;
        for (int i = 0; i < 4; ++i) result = result << 8 | byte();
        return result;
    }

    /// Up to seven bytes as they are, or now and then up to 255.
    std::string bytes() {
        unsigned const size = byte();
        std::size_t const wanted = size < 248 ? size % 8 : byte();
        auto const there = static_cast<std::size_t>(end_ - next_);
        std::string result(reinterpret_cast<char const*>(next_), std::min(wanted, there));
        next_ += result.size();
        return result;
    }

    /// A name out of few, so that operations meet those of others; now and then any characters.
    std::wstring name() {
        static wchar_t const* const names[] = {L"a",     L"A",      L"b",      L"k",
                                               L"K",     L"\u212A", L"key",    L"KEY",
                                               L"name ", L"\u00E9", L"\u00C9", L""};
        unsigned const choice = below(16);
        return choice < 12 ? names[choice] : text();
    }

    /// Any characters; most of them are below U+0100.
    std::wstring text() {
        std::wstring result;
        for (char const c : bytes()) {
            auto const value = static_cast<unsigned char>(c);
            result += value < 0xF8 ? static_cast<wchar_t>(value) : static_cast<wchar_t>(word());
        }
        return result;
    }

    std::string rest() {
        std::string result(reinterpret_cast<char const*>(next_),
                           static_cast<std::size_t>(end_ - next_));
        next_ = end_;
        return result;
    }

private:
    std::uint8_t const* next_;
    std::uint8_t const* end_;
};

} // namespace fuzz

#endif
