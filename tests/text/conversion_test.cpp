// The two conversions, compared with the model. They go through text in blocks and take shortcuts
// in steps of sixteen units, with the machine's shuffle instruction and without it: their sources
// are compiled into this program, so that it reaches both ways whatever the machine has.
#include <koru/string.h>

#include <doctest/doctest.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

#include "support/locales.h"
#include "support/sanitizers.h"
#include "text/convert.h"
#include "text/processor.h"
#include "text/textmodel.h"
#include "text/utf8.h"

#if defined(KORU_ADDRESS_SANITIZER)
// The allocator keeps what was freed of each size for long, and these texts are of very many sizes.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" __attribute__((used)) char const* __asan_default_options() {
    return "quarantine_size_mb=8";
}
#endif

using namespace test;

namespace {

// What differs between decoding text of bytes and encoding wide text.

wchar_t* block(char const*& s, char const* end, wchar_t* to, bool shuffle) {
    return Koru::decodeBlock(s, end, to, shuffle);
}
char* block(wchar_t const*& s, wchar_t const* end, char* to, bool shuffle) {
    return Koru::encodeBlock(s, end, to, shuffle);
}

/// What blocks are made of: there is no zero byte in what is decoded.
std::string input(std::string const& text) { return untilNul(text); }
std::wstring input(std::wstring const& text) { return text; }

/// The text that is converted to these characters, or from them.
template <class Char>
std::basic_string<Char> of(std::wstring const& characters) {
    if constexpr (sizeof(Char) == 1)
        return modelOf(characters);
    else
        return characters;
}

std::string const ODD_BYTES = bytes({0x00, 0x01, 0x41, 0x7F, 0x80, 0x81, 0xBF, 0xC0, 0xC3, 0xDF,
                                     0xE0, 0xE2, 0xEF, 0xF0, 0xF4, 0xF8, 0xFB, 0xFD, 0xFE, 0xFF});
std::wstring const ODD_UNITS = units(
    {0,         1,          0x41,       0x7F,       0x80,       0xFF,       0x7FF,     0x800,
     0x7FFF,    0x8000,     0x8041,     0xFFFF,     0x10000,    0x1FFFFF,   0x200000,  0x3FFFFFF,
     0x4000000, 0x7FFFFFFF, 0x80000000, 0x80000041, 0xFFFFFF00, 0xFFFFFF80, 0xFFFFFFFF});

template <class Char>
std::basic_string<Char> oddUnits() {
    if constexpr (sizeof(Char) == 1)
        return ODD_BYTES;
    else
        return ODD_UNITS;
}

/// What the blocks are put together to, each in memory with nothing around it.
template <class Out, class In>
std::basic_string<Out> byBlocks(std::basic_string<In> const& text, bool shuffle) {
    static GuardedMemory const in;
    static GuardedMemory const out;
    In* const copy = in.last<In>(text.size());
    std::copy(text.begin(), text.end(), copy);
    std::basic_string<Out> result;
    for (In const *s = copy, *const end = copy + text.size(); s != end;) {
        Out* const to = out.last<Out>(Koru::BLOCK);
        result.append(to, block(s, end, to, shuffle));
    }
    return result;
}

/// Compares all ways of converting a text with the model.
template <class Text>
void expectConverted(Differences& differences, Text const& text) {
    auto const expected = modelOf(text);
    std::string wrong;
    auto const expect = [&](char const* way, auto const& actual) {
        if (actual == expected) return;
        wrong = hex(text) + " gave " + hex(actual) + " as " + way + ", not " + hex(expected);
    };
    using Out = typename decltype(modelOf(text))::value_type;
    expect("a string", converted(text));
    expect("a pointer", converted(text.c_str()));
    expect("plain blocks", byBlocks<Out>(input(text), false));
    if (Koru::CAN_SHUFFLE) expect("shuffled blocks", byBlocks<Out>(input(text), true));
    differences.note(wrong.empty(), [&wrong] { return wrong; });
}

/// Characters that take one to four bytes.
std::wstring const FILLERS = L"x\u00E9\u4E2D\U0001F600";

/// Runs of characters of one form each, none of them negative.
std::wstring randomCharacters(Random& random, std::size_t size) {
    static std::uint32_t const limits[] = {0x80,    0x80,     0x80,     0x800,     0x10000,
                                           0x10000, 0x110000, 0x200000, 0x4000000, 0x7FFFFFFF};
    std::wstring text;
    while (text.size() < size) {
        // The last two are rare, or hardly a step would be without one.
        std::uint32_t const limit = limits[random.below(random.below(64) == 0 ? 10 : 7)];
        for (auto n = 1 + random.below(24); n != 0; --n) text += unit(1 + random.below(limit - 1));
    }
    text.resize(size);
    return text;
}

std::size_t randomSize(Random& random) {
    return random.below(16) == 0 ? random.below(3 * Koru::BLOCK) : random.below(80);
}

/// The bytes of a text like "C3 A9".
std::string fromHex(std::string const& text) {
    std::istringstream in(text);
    std::string out;
    for (std::uint32_t value = 0; in >> std::hex >> value;) out += byte(value);
    return out;
}

/// Encoding and decoding again, of a value that is not negative.
void expectSurvives(Differences& differences, std::uint32_t value) {
    std::wstring const text = units({value});
    std::string const encoded = Koru::make_string(text);
    bool const survives = encoded == modelOf(text) && Koru::make_wstring(encoded) == text;
    differences.note(survives, [&] { return hex(text) + " became " + hex(encoded); });
}

} // namespace

TEST_CASE("make_string encodes a wide character by its size") {
    struct Row {
        std::vector<std::uint32_t> values;
        std::string expected;
    };
    Row const rows[] = {
        {{0x1, 0x7F, 0x80}, "1 7F C2 80"},
        {{0xE9, 0x7FF}, "C3 A9 DF BF"},
        {{0x800, 0x20AC, 0xFFFF}, "E0 A0 80 E2 82 AC EF BF BF"},
        {{0x10000, 0x1F600}, "F0 90 80 80 F0 9F 98 80"},
        {{0x10FFFF, 0x110000, 0x1FFFFF}, "F4 8F BF BF F4 90 80 80 F7 BF BF BF"},
        {{0x200000, 0x3FFFFFF}, "F8 88 80 80 80 FB BF BF BF BF"},
        {{0x4000000, 0x12345678}, "FC 84 80 80 80 80 FC 92 8D 85 99 B8"},
        {{0x3FFFFFFF, 0x40000000}, "FC BF BF BF BF BF FD 80 80 80 80 80"},
        {{0x7FFFFFFF}, "FD BF BF BF BF BF"},
        // Surrogates are not joined to one character.
        {{0xD83D, 0xDE00, 0xDFFF}, "ED A0 BD ED B8 80 ED BF BF"},
        // A negative character becomes its low byte, and ends the text where that is zero.
        {{0x80000001, 0x80000041, 0xFFFFFF80, 0xFFFFFFE9, 0xFFFFFFFF}, "1 41 80 E9 FF"},
        {{0x80000000}, ""},
        {{0xDEADBE00}, ""},
        {{'a', 0xFFFFFF00, 'c'}, "61"},
        {{0xE9, 0x80000000, 0xE9, 0, 'x'}, "C3 A9"},
        {{'a', 0, 'b'}, "61"},
    };
    for (Row const& row : rows) {
        std::wstring const text = units(row.values);
        CHECK(hex(modelOf(text)) == row.expected);
        CHECK(hex(Koru::make_string(text)) == row.expected);
        CHECK(hex(Koru::make_string(text.c_str())) == row.expected);
    }
}

TEST_CASE("make_wstring takes the first form that the lead byte and the rest of the text allow") {
    struct Row {
        std::string label, input, expected;
    };
    Row const rows[] = {
        {"one and two bytes", "41 7F 1 C3 A9", "41 7F 1 E9"},
        {"three and four bytes", "E2 82 AC F0 9F 98 80", "20AC 1F600"},
        {"five bytes", "FB BF BF BF BF", "3FFFFFF"},
        {"six bytes", "FD BF BF BF BF BF", "7FFFFFFF"},
        {"six bytes, low lead bit 0", "FC BF BF BF BF BF", "3FFFFFFF"},
        {"surrogate", "ED A0 80", "D800"},
        {"beyond Unicode", "F7 BF BF BF", "1FFFFF"},
        {"four bytes cut short", "F0 9F 98", "3F 3F 3F"},
        {"six bytes cut short", "FD BF BF BF BF", "3F 3F 3F 3F 3F"},
        {"cut short before ASCII", "E2 41", "3F 41"},
        {"cut short before two bytes", "F0 C3 A9", "3F E9"},
        {"continuation before five ASCII", "80 61 62 63 64 65 66", "218A3925 66"},
        {"continuation before four", "80 61 62 63 64", "3F 61 62 63 64"},
        {"FE before five", "FE 80 80 80 80 81", "1"},
        {"FF before five", "FF 80 80 80 80 81", "40000001"},
        {"ASCII in the place of a continuation", "C3 29", "E9"},
        {"lead in the place of a continuation", "C3 E9", "E9"},
        {"three-byte lead over ASCII", "E2 42 6C", "20AC"},
        {"overlong slashes", "C0 AF E0 80 AF FC 80 80 80 80 AF", "2F 2F 2F"},
        {"overlong zero of two", "61 C0 80 62", "61"},
        {"overlong zero of three", "E0 80 80 62", ""},
        {"overlong zero of four", "61 F0 80 80 80 62", "61"},
        {"overlong zero of six", "61 FC 80 80 80 80 80 62", "61"},
        {"zero of a stray continuation", "61 80 80 80 80 80 80 62", "61"},
        {"NUL", "61 00 62", "61"},
        {"NUL in the place of a continuation", "C3 00 A9", "3F"},
        {"NUL within six bytes", "80 61 62 00 64 65 66", "3F 61 62"},
        {"Latin-1 word", "63 61 66 E9", "63 61 66 3F"},
        {"Latin-1 within text", "E9 74 75 64 65", "9D35 64 65"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        std::string const input = fromHex(row.input);
        CHECK(hex(modelOf(input)) == row.expected);
        CHECK(hex(Koru::make_wstring(input)) == row.expected);
        CHECK(hex(Koru::make_wstring(input.c_str())) == row.expected);
    }
}

TEST_CASE("every value from 1 to 0x10FFFF survives the way to UTF-8 and back") {
    Differences differences;
    for (std::uint32_t value = 1; value <= 0x10FFFF; ++value) expectSurvives(differences, value);
    CHECK(differences.firstOf(0x10FFFF) == "");
}

TEST_CASE("values of the four-, five- and six-byte forms survive the way to UTF-8 and back") {
    Differences differences;
    for (std::uint32_t value = 0x10FFFF; value < 0x80000000U; value += 4099) {
        expectSurvives(differences, value);
    }
    for (std::uint32_t const edge : {0x110000U, 0x200000U, 0x4000000U, 0x40000000U, 0x7FFFFFFFU}) {
        for (std::uint32_t value = edge - 600; value <= std::min(edge + 600, 0x7FFFFFFFU); ++value)
            expectSurvives(differences, value);
    }
    for (unsigned shift = 0; shift < 31; ++shift) {
        expectSurvives(differences, 1U << shift);
        expectSurvives(differences, 0x7FFFFFFFU ^ 1U << shift);
    }
    CHECK(differences.first() == "");
}

TEST_CASE("a negative value becomes its low byte") {
    Differences differences;
    for (std::uint32_t value = 0x80000000U; value < 0xFFFFF000U; value += 8191) {
        expectConverted(differences, units({'a', value, 'b'}));
    }
    for (std::uint32_t i = 0; i < 1024; ++i) {
        expectConverted(differences, units({0x80000000U + i}));
        expectConverted(differences, units({'a', 0xFFFFFFFFU - i, 'b'}));
    }
    CHECK(differences.first() == "");
}

TEST_CASE_TEMPLATE("every code point is converted beside its neighbours", Char, char, wchar_t) {
    Differences differences;
    std::wstring text;
    for (std::uint32_t value = 1; value <= 0x110000; ++value) {
        text += unit(value);
        if (text.size() < 1021 && value != 0x110000) continue;
        expectConverted(differences, of<Char>(text));
        text.clear();
    }
    CHECK(differences.firstOf(0x110000 / 1021 + 1) == "");
}

TEST_CASE_TEMPLATE("an odd unit is seen at every position of an ASCII run", Char, char, wchar_t) {
    Differences differences;
    auto const odd = oddUnits<Char>();
    auto all = odd; // any low byte at least, for short names
    for (int unit = -300; unit <= 300; ++unit) all += static_cast<Char>(unit);
    for (std::size_t place = 0; place < 130; ++place) {
        for (std::size_t size = place + 1; size <= 130; ++size) {
            std::basic_string<Char> text(size, 'a');
            for (auto const unit : size <= 18 ? all : odd) {
                text[place] = unit;
                expectConverted(differences, text);
            }
        }
    }
    CHECK(differences.firstOf(130 * 131 / 2 * odd.size() + 18 * 19 / 2 * 601) == "");
}

TEST_CASE_TEMPLATE("any three odd units at any place of a step are converted", Char, char,
                   wchar_t) {
    Differences differences;
    std::basic_string<Char> three(3, 'x');
    auto const odd = oddUnits<Char>();
    auto const forEachThree = [&](auto use) {
        for (std::size_t i = 0; i < odd.size() * odd.size() * odd.size(); ++i) {
            three[0] = odd[i % odd.size()];
            three[1] = odd[i / odd.size() % odd.size()];
            three[2] = odd[i / odd.size() / odd.size()];
            use();
        }
    };
    for (wchar_t const filler : FILLERS) {
        auto const right = of<Char>(std::wstring(12, filler));
        for (std::size_t before = 0; before <= 17; before += filler == L'x' ? 1 : 4) {
            auto const left = of<Char>(std::wstring(before, filler));
            forEachThree([&] {
                if (before % 3 == 0) expectConverted(differences, left + three);
                if (before % 3 != 0) expectConverted(differences, left + three + right);
            });
        }
    }
    CHECK(differences.first() == "");
}

TEST_CASE_TEMPLATE("random text of every length up to 600 is converted at every alignment", Char,
                   char, wchar_t) {
    Random random(6);
    Differences differences;
    for (std::size_t size = 0; size <= 600; ++size) {
        for (std::size_t offset = 0; offset < 32; ++offset) {
            auto const text = randomText<Char>(random, size, offset % 4 == 0);
            expectConverted(differences, text);
            auto const shifted = std::basic_string<Char>(offset, 'x') + text;
            bool const same = converted(&shifted[offset]) == modelOf(text);
            differences.note(same, [&] { return hex(text) + " at " + std::to_string(offset); });
        }
    }
    CHECK(differences.firstOf(601 * 32 * 2) == "");
}

TEST_CASE_TEMPLATE("random text is converted, well-formed or damaged", Char, char, wchar_t) {
    Random random(1);
    Differences differences;
    for (int i = 0; i < 6000; ++i) {
        auto text = of<Char>(randomCharacters(random, randomSize(random)));
        expectConverted(differences, text);
        for (int damage = 0; damage < 3 && !text.empty(); ++damage) {
            auto& damaged = text[random.below(static_cast<std::uint32_t>(text.size()))];
            damaged = static_cast<Char>(random.next());
            expectConverted(differences, text);
        }
    }
    CHECK(differences.first() == "");
}

TEST_CASE_TEMPLATE("text of one, two and more blocks is converted", Char, char, wchar_t) {
    Random random(2);
    Differences differences;
    std::vector<std::size_t> sizes = {4096, 4097, 10000};
    for (std::size_t size = 0; size <= 3 * Koru::BLOCK; size += size < 100 ? 1 : 29) {
        sizes.push_back(size);
    }
    for (std::size_t size = Koru::BLOCK - 100; size <= Koru::BLOCK + 20; ++size) {
        sizes.push_back(size);
    }
    for (std::size_t const size : sizes) {
        expectConverted(differences, of<Char>(randomCharacters(random, size)));
        expectConverted(differences, randomText<Char>(random, size));
        for (std::uint32_t const value :
             {0x78U, 0xE9U, 0x4E2DU, 0x1F600U, 0x3FFFFFFU, 0x7FFFFFFFU, 0x80000080U, 0xFFFFFFFFU}) {
            std::wstring const same(size, unit(value));
            std::wstring const other = std::wstring(size, L'x') + std::wstring(40, unit(value));
            expectConverted(differences, of<Char>(same));
            expectConverted(differences, of<Char>(other));
        }
    }
    CHECK(differences.firstOf(sizes.size() * 18) == "");
}

TEST_CASE_TEMPLATE("a NUL ends the text in any step and any block", Char, char, wchar_t) {
    Differences differences;
    for (std::size_t before = 0; before <= 2 * Koru::BLOCK; before += before < 70 ? 1 : 37) {
        for (wchar_t const filler : FILLERS) {
            auto text = of<Char>(std::wstring(before, filler));
            text.append(1, '\0').append(text).append(1, 'y');
            expectConverted(differences, text);
        }
    }
    CHECK(differences.first() == "");
}

TEST_CASE_TEMPLATE("text is converted alike in every C locale", Char, char, wchar_t) {
    inEachLocale([] {
        Random random(8);
        Differences differences;
        for (std::size_t size = 0; size < 200; ++size) {
            expectConverted(differences, randomText<Char>(random, size));
        }
        CHECK(differences.firstOf(200) == "");
    });
}

TEST_CASE("every one and two bytes are decoded before every tail, and many three") {
    Differences differences;
    std::string const tails[] = {"abcdefg", bytes({0x80, 0xBF, 0x81, 0x82, 0x83, 0x84, 0x85})};
    for (unsigned first = 0; first < 256; ++first) {
        expectConverted(differences, bytes({first}));
        for (unsigned second = 0; second < 256; ++second) {
            std::string const two = bytes({first, second});
            for (std::string const& tail : tails) {
                for (std::size_t size = 0; size <= 7; ++size) {
                    expectConverted(differences, two + tail.substr(0, size));
                }
            }
            std::string const three = two + byte(first * 7 + second * 31);
            expectConverted(differences, three);
            expectConverted(differences, "ab" + three + "cd\xC3\xA9");
        }
    }
    CHECK(differences.firstOf(256 + 65536 * 18) == "");
}

TEST_CASE("a whole, cut, odd or overlong character is decoded anywhere between others") {
    std::vector<std::string> pieces = {"\xC0\x80", "\xE0\x80\x80", "\xF0\x80\x80\x80", "\xC0@",
                                       "\xE0@@"}; // zeros
    for (std::uint32_t const value : {0xE9U, 0x20ACU, 0x1F600U, 0x3FFFFFFU, 0x7FFFFFFFU}) {
        std::string const whole = modelOf(units({value}));
        for (std::size_t size = 1; size <= whole.size(); ++size)
            pieces.push_back(whole.substr(0, size));
    }
    // Once failed: D0 to DF before three continuation bytes passed for leads of four bytes.
    for (unsigned lead = 0x01; lead <= 0xFF; ++lead) {
        for (std::size_t tails = 0; tails <= 5; ++tails)
            pieces.push_back(bytes({lead}) + std::string(tails, '\xA5'));
    }
    Differences differences;
    for (wchar_t const filler : FILLERS) {
        for (std::size_t before = 0; before <= 17; ++before) {
            std::string const left = modelOf(std::wstring(before, filler));
            std::string const right = modelOf(std::wstring(9, filler));
            for (std::string const& piece : pieces) {
                for (char const* const end : {"", "z", "zzzz", "zzzzz", right.c_str()}) {
                    expectConverted(differences, left + piece + end);
                }
            }
        }
    }
    CHECK(differences.firstOf(4 * 18 * pieces.size() * 5) == "");
}

TEST_CASE("the bound is the size of the encoded text, or more where it ends early") {
    Random random(3);
    for (int i = 0; i < 3000; ++i) {
        std::wstring text = randomCharacters(random, randomSize(random));
        CHECK(Koru::encodedBound(text.data(), text.size()) == modelOf(text).size());
        if (text.empty()) continue;
        text[random.below(static_cast<std::uint32_t>(text.size()))] = unit(random.below(3) << 30);
        CHECK(Koru::encodedBound(text.data(), text.size()) >= modelOf(text).size());
    }
}

TEST_CASE("the bound has room for the last and the first character of each size") {
    for (wchar_t const c : ODD_UNITS) {
        if (modelOf(std::wstring(1, c)).empty()) continue; // It ends the text.
        CAPTURE(static_cast<std::uint32_t>(c));
        for (std::size_t size = 1; size <= 40; ++size) {
            std::wstring const text(size, c);
            CHECK(Koru::encodedBound(text.data(), text.size()) == modelOf(text).size());
        }
    }
}

TEST_CASE("the bound leaves out what comes after a NUL, but for less than a step") {
    for (wchar_t const c : {L'x', L'\u4E2D', wchar_t{-1}}) {
        for (std::size_t before = 0; before <= 40; ++before) {
            std::wstring const text(before, c);
            std::size_t const least = modelOf(text).size();
            std::wstring const whole = text + L'\0' + std::wstring(500, L'\u4E2D');
            std::size_t const bound = Koru::encodedBound(whole.data(), whole.size());
            CHECK(bound >= least);
            CHECK(bound < least + 6 * 16);
        }
    }
}

TEST_CASE("the characters of well-formed text are counted") {
    Random random(4);
    for (std::size_t size = 0; size <= 2000; size += size < 100 ? 1 : 61) {
        std::string const text = modelOf(randomCharacters(random, size));
        CHECK(Koru::countLeads(text.data(), text.size()) == size);
    }
}
