// The fingerprints of names: what is equal has one number, under whatever locale, as bytes and
// wide. The sources are compiled into this program, since the library exports none of this.
#include <doctest/doctest.h>

#include <wctype.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <map>
#include <random>
#include <set>
#include <string>
#include <vector>

#include <koru/string.h>

#include "support/locales.h"
#include "text/fingerprint.h"

using Koru::classOf;
using Koru::findFingerprint;
using Koru::Fingerprint;
using Koru::NOT_FOUND;
using test::inEachLocale;

namespace {

/// From memory that ends where the text ends, so that a sanitizer sees what is read beyond it.
template <class Char>
std::uint32_t numberOf(std::basic_string<Char> const& name, std::uint32_t before = 0) {
    std::vector<Char> const exact(name.begin(), name.end());
    return Koru::mixFingerprint(before, exact.data(), exact.size());
}

/// Characters that some locale folds in a way of its own, with their partners, and their
/// neighbours.
std::wstring const odd = L"Ii\u0130\u0131Kk\u212ASs\u017FJjZz@`[{\u00E9\u00C9\u03C3\u03C2\u20AC"
                         L"\U0001F600\x7F\x1";

wchar_t randomCharacter(std::mt19937& random) {
    if (random() % 4 == 0) return odd[random() % odd.size()];
    return static_cast<wchar_t>(random() % 8 == 0 ? 1 + random() % 0x2FFF : L'A' + random() % 58);
}

} // namespace

TEST_CASE("a character counts as what any locale lowers it to") {
    inEachLocale([] {
        auto const countsAsItsLower = [](std::uint32_t c) {
            return classOf(c) == classOf(static_cast<std::uint32_t>(::towlower(c)));
        };
        std::vector<std::uint32_t> wrong;
        for (std::uint32_t c = 1; c < 0x120000; ++c) {
            if (!countsAsItsLower(c) || ::towlower(c) == 0) wrong.push_back(c);
        }
        for (std::uint32_t c = 0x120000; c < 0xFFFF0000U; c += 0xFFFD) {
            if (!countsAsItsLower(c)) wrong.push_back(c);
        }
        CHECK(countsAsItsLower(0xFFFFFFFFU));
        CHECK(wrong == std::vector<std::uint32_t>());
    });
}

TEST_CASE("names of up to three characters that a locale finds equal have one number") {
    std::vector<std::wstring> names = {L""};
    for (std::size_t i = 0; names[i].size() < 3; ++i) {
        for (wchar_t const c : odd) names.push_back(std::wstring(names[i]) + c);
    }
    inEachLocale([&names] {
        std::map<std::wstring, std::uint32_t> numbers; // of folded names
        for (std::wstring const& name : names) {
            std::wstring folded = name;
            for (wchar_t& c : folded) c = static_cast<wchar_t>(::towlower(static_cast<wint_t>(c)));
            std::uint32_t const number = numbers.emplace(folded, numberOf(name)).first->second;
            bool const equal = number == numberOf(name) && number == numberOf(folded) &&
                               number == numberOf(Koru::make_string(name));
            if (!equal) CHECK(Koru::make_string(name) == "");
        }
        CHECK(numbers.size() > names.size() / 4);
    });
}

TEST_CASE("the number of a name is that of its classes, as bytes and wide, at any length") {
    std::mt19937 random(1);
    for (std::size_t i = 0; i < 20000; ++i) {
        std::wstring name(i % 300, L'\0');
        bool const plain = random() % 2 == 0;
        std::string classes;
        for (wchar_t& c : name) {
            c = plain ? static_cast<wchar_t>(1 + random() % 0x7F) : randomCharacter(random);
            classes += static_cast<char>(classOf(static_cast<std::uint32_t>(c)));
        }
        auto const before = static_cast<std::uint32_t>(random());
        CAPTURE(name.size());
        CHECK(numberOf(name, before) == numberOf(classes, before));
        CHECK(numberOf(Koru::make_string(name), before) == numberOf(classes, before));
    }
}

TEST_CASE("units that no UTF-8 gives count as any other beyond ASCII") {
    for (std::size_t size = 1; size < 40; ++size) {
        for (std::size_t place = 0; place < size; ++place) {
            for (std::int64_t const unit : {-1LL, -128LL, -65LL, -0x80000000LL, 0x80LL, 0xFFLL,
                                            0x100LL, 0x8069LL, 0x10069LL, 0x7FFFFFFFLL}) {
                std::wstring name(size, L'x');
                name[place] = static_cast<wchar_t>(unit);
                std::string classes(size, 'x');
                classes[place] = 'i';
                CHECK(numberOf(name) == numberOf(classes));
            }
        }
    }
}

TEST_CASE("a wide name ends at its first NUL") {
    for (std::size_t size = 0; size < 60; ++size) {
        for (std::size_t place = 0; place < size; ++place) {
            std::wstring name(size, L'n');
            name[place] = L'\0';
            CHECK(numberOf(name) == numberOf(name.substr(0, place)));
        }
    }
}

TEST_CASE("names that differ in one character have different numbers before these are cut") {
    for (std::size_t size = 1; size <= 256; ++size) {
        for (std::size_t place = 0; place < size; ++place) {
            std::string name(size, 'a');
            std::uint32_t const number = numberOf(name);
            name[place] = 'b';
            CHECK(numberOf(name) != number);
        }
        CHECK(numberOf(std::string(size, 'a')) != numberOf(std::string(size - 1, 'a')));
    }
}

TEST_CASE("names that are numbered have numbers as if drawn by lot") {
    for (std::string const form : {"#", "key#", "window.#.title", "cache.#.maximum.and.more#",
                                   "SECTION #", "a very long name in front of the number #"}) {
        std::map<Fingerprint, std::size_t> names;
        constexpr std::size_t count = 20000;
        for (std::size_t i = 0; i < count; ++i) {
            std::string name = form;
            while (name.find('#') != std::string::npos)
                name.replace(name.find('#'), 1, std::to_string(i));
            ++names[Koru::toFingerprint(numberOf(name))];
        }
        std::size_t pairs = 0;
        for (auto const& each : names) pairs += each.second * (each.second - 1) / 2;
        CAPTURE(form);
        std::size_t const byLot = count * (count - 1) / 2 / 65536;
        CHECK(pairs < byLot * 3 / 2);
    }
}

TEST_CASE("what comes before a name counts") {
    std::set<Fingerprint> numbers;
    for (std::uint32_t i = 0; i < 1000; ++i) {
        numbers.insert(Koru::toFingerprint(
            numberOf(std::string("key"), numberOf("section " + std::to_string(i)))));
    }
    CHECK(numbers.size() > 960);
}

TEST_CASE("a number is found first at its first place from any place on, in columns of any size") {
    for (std::size_t size = 0; size < 150; ++size) {
        std::vector<Fingerprint> column(size, 1);
        for (std::size_t place = 0; place <= size; ++place) {
            if (place != size) column[place] = 2;
            if (place + 40 < size) column[place + 40] = 3;
            for (std::size_t from = 0; from <= size; from += 1 + size / 20) {
                auto const expect = [&](auto matches) {
                    auto const begin = column.begin() + static_cast<std::ptrdiff_t>(from);
                    auto const found = std::find_if(begin, column.end(), matches);
                    return found == column.end() ? NOT_FOUND
                                                 : static_cast<std::size_t>(found - column.begin());
                };
                for (bool const wide : {false, Koru::HAS_WIDE_VECTORS}) {
                    CHECK(findFingerprint(column, 2, from, wide) ==
                          expect([](auto n) { return n == 2; }));
                }
                CHECK(findFingerprint(column, 3, 2, from) ==
                      expect([](auto n) { return n == 2 || n == 3; }));
            }
            std::fill(column.begin(), column.end(), Fingerprint{1});
        }
    }
}
