// The comparison without regard to case, compared with the C library's and with the plain rule.
#include <koru/string.h>

#include <doctest/doctest.h>

#include <dlfcn.h>
#include <strings.h>
#include <wchar.h>
#include <wctype.h>

#include <cctype>
#include <cstddef>
#include <cstdint>
#include <string>
#include <thread>
#include <vector>

#include "support/locales.h"
#include "support/plainlocale.h"
#include "text/textmodel.h"

using namespace test;

namespace {

bool pairsDotlessI = false; ///< as a Turkish locale does

wint_t plainLower(wint_t c) {
    static auto const next = reinterpret_cast<wint_t (*)(wint_t)>(::dlsym(RTLD_NEXT, "towlower"));
    return next(c);
}

} // namespace

// The library under test calls this one in place of the C library's: no machine has every locale.
extern "C" wint_t towlower(wint_t c) noexcept {
    if (pairsDotlessI && c == L'I') return 0x131;
    if (pairsDotlessI && c == 0x130) return L'i';
    return plainLower(c);
}

namespace {

int sign(int value) { return (value > 0) - (value < 0); }

int libraryOrder(char const* a, char const* b) { return sign(::strcasecmp(a, b)); }
int libraryOrder(wchar_t const* a, wchar_t const* b) { return sign(::wcscasecmp(a, b)); }

/// The order by both overloads, or 99 where these differ.
template <class Char>
int order(std::basic_string<Char> const& a, std::basic_string<Char> const& b) {
    int const result = sign(Koru::compare(a, b));
    return sign(Koru::compare(a.c_str(), b.c_str())) == result ? result : 99;
}

/// Compares both ways round with the C library's.
template <class Char>
void expectOrder(Differences& differences, std::basic_string<Char> const& a,
                 std::basic_string<Char> const& b) {
    bool const same = order(a, b) == libraryOrder(a.c_str(), b.c_str()) &&
                      order(b, a) == libraryOrder(b.c_str(), a.c_str());
    differences.note(same, [&] { return hex(a) + " against " + hex(b); });
}

char swappedCase(char c) { return static_cast<char>(std::isalpha(c & 0x7F) ? c ^ 0x20 : c); }
wchar_t swappedCase(wchar_t c) {
    wint_t const other = ::towlower(static_cast<wint_t>(c));
    return unit(other != valueOf(c) ? other : ::towupper(static_cast<wint_t>(c)));
}

void randomCharacter(Random& random, char& c) {
    c = byte(random.below(3) == 0 ? 1 + random.below(255) : 'A' + random.below(58));
}
void randomCharacter(Random& random, wchar_t& c) {
    std::uint32_t const kind = random.below(8);
    if (kind == 0) c = unit(0x80000000U | random.next());
    if (kind == 1) c = unit(1 + (random.next() >> random.below(31)));
    if (kind == 2) c = unit(0x80 + random.below(0x800));
    if (kind > 2) c = unit('A' + random.below(58));
}

/// A pair of strings as they meet in comparisons: equal but for case, but for one character, but
/// for the length, or with an end marked by NUL inside.
template <class Char>
void expectOrderOfRandomPair(Differences& differences, Random& random) {
    std::basic_string<Char> a(random.below(71), Char());
    for (Char& c : a) randomCharacter(random, c);
    std::basic_string<Char> b = a;
    std::uint32_t const one = 1 + random.below(4);
    for (Char& c : b) {
        if (random.below(one) == 0) c = swappedCase(c);
    }
    std::size_t const where = a.empty() ? 0 : random.below(static_cast<std::uint32_t>(a.size()));
    std::uint32_t const change = random.below(5);
    if (change == 1 && !b.empty()) randomCharacter(random, b[where]);
    if (change == 2) b.resize(where);
    if (change == 3) b += Char('x');
    if (change == 4 && !b.empty()) {
        b[where] = Char();
        if (random.below(2) == 0) a[where] = Char();
    }
    expectOrder(differences, a, b);
}

/// ASCII in the other width.
template <class Char>
std::basic_string<Char> widened(std::string const& text) {
    return std::basic_string<Char>(text.begin(), text.end());
}

/// The order by the plain rule.
int plainOrder(std::wstring const& a, std::wstring const& b) {
    for (std::size_t i = 0;; ++i) {
        auto const x = towlower(static_cast<wint_t>(a.c_str()[i]));
        auto const y = towlower(static_cast<wint_t>(b.c_str()[i]));
        if (x != y) return sign(static_cast<int>(x - y));
        if (x == 0) return 0;
    }
}

/// Compares the order both ways round with the plain one, whatever the locale says of I.
void expectPlainOrder(Differences& differences, std::wstring const& a, std::wstring const& b) {
    for (bool const turkish : {false, true}) {
        pairsDotlessI = turkish;
        bool const same = order(a, b) == plainOrder(a, b) && order(b, a) == plainOrder(b, a);
        pairsDotlessI = false;
        differences.note(
            same, [&] { return hex(a) + " against " + hex(b) + (turkish ? " in Turkish" : ""); });
    }
}

/// The characters where folding has its corners.
std::wstring const CORNERS =
    std::wstring(L"\0\1 @AIZ[`aiz{\x7F\u00C9\u00E9\u0130\u0131\u212A", 19) +
    units({0x10041, 0x10061, 0xFFFFFFFF, 0x80000061});

} // namespace

TEST_CASE_TEMPLATE("compare ignores case and folds to small letters before it orders", Char, char,
                   wchar_t) {
    struct Row {
        std::string a, b;
        int expected;
    };
    Row const rows[] = {
        {"", "", 0},          {"ABC", "abc", 0}, {"abc", "ABC", 0}, {"aBcDe", "AbCdE", 0},
        {"a", "b", -1},       {"B", "a", 1},     {"a", "B", -1},    {"ab", "abc", -1},
        {"ABC", "ab", 1},     {"", "a", -1},     {"a", "", 1},      {"a_b", "a-b", 1},
        {"_", "A", -1},       {"A", "_", 1},     {"[", "Z", -1},    {"@", "a", -1},
        {"`", "A", -1},       {"{", "Z", 1},     {"0", "A", -1},    {"a b", "aB", -1},
        {"key1", "KEY2", -1}, {"k e", "K E", 0}, {"~", "Z", 1},
    };
    for (Row const& row : rows) {
        CAPTURE(row.a);
        CAPTURE(row.b);
        CHECK(order(widened<Char>(row.a), widened<Char>(row.b)) == row.expected);
        CHECK(order(widened<Char>(row.a), widened<Char>(row.a)) == 0);
    }
}

TEST_CASE_TEMPLATE("compare of string objects ends at their first NUL", Char, char, wchar_t) {
    using Text = std::basic_string<Char>;
    CHECK(order(Text{'a', 'b', '\0', 'x'}, Text{'A', 'B', '\0', 'y'}) == 0);
    CHECK(order(Text{'a', 'b', '\0', 'x'}, Text{'a', 'b'}) == 0);
    CHECK(order(Text{'\0', 'x'}, Text()) == 0);
    CHECK(order(Text{'a', '\0', 'z'}, Text{'a', 'b'}) == -1);
}

TEST_CASE("compare takes bytes as unsigned, and only ASCII letters have case in the C locale") {
    test::PlainLocale const plain;
    CHECK(Koru::compare("\x80", "z") > 0);
    CHECK(Koru::compare("z", "\xFF") < 0);
    CHECK(Koru::compare("\xC9", "\xE9") < 0);
    CHECK(Koru::compare("\xC3\x89", "\xC3\xA9") < 0);
    CHECK(Koru::compare(L"\u00C9", L"\u00E9") < 0);
    CHECK(Koru::compare(L"\u0416", L"\u0436") < 0);
}

TEST_CASE_TEMPLATE("compare finds a difference at every position of texts of every length", Char,
                   char, wchar_t) {
    Differences differences;
    for (std::size_t size = 1; size < 70; ++size) {
        for (std::size_t place = 0; place < size; ++place) {
            for (std::uint32_t const c : {0x40U, 0x4BU, 0x5BU, 0x6BU, 0x6CU, 0x7FU, 0x80000080U}) {
                std::basic_string<Char> const a(size, Char('K'));
                std::basic_string<Char> b(size, Char('k'));
                b[place] = static_cast<Char>(c);
                expectOrder(differences, a, b);
            }
        }
    }
    CHECK(differences.firstOf(69 * 70 / 2 * 7) == "");
}

TEST_CASE_TEMPLATE("compare orders random texts as the C library does in every locale", Char, char,
                   wchar_t) {
    inEachLocale([] {
        Random random(2);
        Differences differences;
        for (int i = 0; i < 8000; ++i) expectOrderOfRandomPair<Char>(differences, random);
        CHECK(differences.firstOf(8000) == "");
    });
}

TEST_CASE("compare agrees with the C library on every pair of bytes in every locale") {
    inEachLocale([] {
        Differences differences;
        for (unsigned a = 0; a < 256; ++a) {
            for (unsigned b = 0; b <= a; ++b) expectOrder(differences, bytes({a}), bytes({b}));
        }
        CHECK(differences.firstOf(256 * 257 / 2) == "");
    });
}

TEST_CASE("compare agrees with the C library on pairs of wide characters in every locale") {
    std::vector<std::uint32_t> const selected = {
        0xD800,     0x1E9E,     0x1EA0,     0x2126,     0x212A,     0x212B,     0x2C2F,
        0x2C5F,     0xA64A,     0xFF21,     0xFF41,     0xFFFF,     0x10000,    0x10400,
        0x10428,    0x10FFFF,   0x110000,   0x3FFFFFF,  0x7FFFFFFF, 0x80000000, 0x80000041,
        0x80000061, 0xFFFFFF80, 0xFFFFFFC1, 0xFFFFFFE1, 0xFFFFFFFF};
    std::vector<std::uint32_t> all = selected;
    for (std::uint32_t c = 0; c < 0x800; ++c) all.push_back(c); // Latin to Arabic
    inEachLocale([&] {
        Differences differences;
        for (std::uint32_t const a : all) {
            for (std::uint32_t const b : selected) {
                expectOrder(differences, units({a}), units({b}));
            }
            for (std::uint32_t b = a > 0x180 ? a - 0x60 : 0; b <= a && a < 0x800; ++b) {
                expectOrder(differences, units({a}), units({b}));
            }
        }
        CHECK(differences.first() == "");
    });
}

TEST_CASE("compare finds every wide character equal to its other case where the locale does") {
    inEachLocale([] {
        Differences differences;
        for (std::uint32_t c = 1; c <= 0x10FFFF; ++c) {
            wchar_t const self[] = {unit(c), 0};
            for (wchar_t const other : {swappedCase(unit(c)), unit(c + 1)}) {
                wchar_t const text[] = {other, 0};
                bool const same = sign(Koru::compare(self, text)) == libraryOrder(self, text);
                differences.note(same, [&] { return hex(units({c})); });
            }
        }
        CHECK(differences.firstOf(2 * 0x10FFFF) == "");
    });
}

TEST_CASE("compare follows each change of the C locale") {
    std::vector<NamedLocale> order = allLocales();
    order.insert(order.end(), allLocales().rbegin(), allLocales().rend());
    for (NamedLocale const& locale : order) {
        CAPTURE(locale.name);
        ProcessLocale const scope(locale);
        Differences differences;
        for (std::string const pair : {"Ii", "\xC9\xE9", "\xDD\xFD"}) {
            expectOrder(differences, std::string(40, pair[0]), std::string(40, pair[1]));
        }
        for (std::wstring const upper : {L"I", L"\u0130", L"\u00C9", L"\u0416"}) {
            for (std::wstring const lower : {L"i", L"\u0131", L"\u00E9", L"\u0436"}) {
                expectOrder(differences, upper, lower);
            }
        }
        CHECK(differences.firstOf(3 + 4 * 4) == "");
        if (locale.name == "C") CHECK(Koru::compare(L"\u00C9", L"\u00E9") < 0);
        if (locale.name == "C.utf8") CHECK(Koru::compare(L"\u00C9", L"\u00E9") == 0);
        CHECK((Koru::compare(L"I", L"i") == 0) == (locale.name.substr(0, 2) != "tr"));
        if (locale.name == "tr_TR.UTF-8") CHECK(Koru::compare(L"I", L"\u0131") == 0);
        if (locale.name == "de_DE.ISO-8859-1") CHECK(Koru::compare("\xC9t\xC9", "\xE9T\xE9") == 0);
    }
}

TEST_CASE("compare follows the locale of the calling thread") {
    test::PlainLocale const plain;
    for (NamedLocale const& each : allLocales()) {
        CAPTURE(each.name);
        Differences differences;
        std::thread other([&] {
            ThreadLocale const locale(each.locale);
            Random random(3);
            for (int i = 0; i < 1000; ++i) {
                expectOrderOfRandomPair<char>(differences, random);
                expectOrderOfRandomPair<wchar_t>(differences, random);
            }
            expectOrder(differences, units({0xC9, 'I'}), units({0xE9, 'i'}));
            expectOrder(differences, bytes({0xC9, 'I'}), bytes({0xE9, 'i'}));
        });
        other.join();
        CHECK(differences.firstOf(2002) == "");
        CHECK(Koru::compare(L"\u00C9", L"\u00E9") < 0);
    }
}

TEST_CASE("compare orders any two corner characters at any place by the plain rule") {
    Differences differences;
    for (std::size_t before = 0; before <= 9; ++before) {
        std::wstring const left(before, L'Q');
        std::wstring const right(before, L'q');
        for (wchar_t const x : CORNERS) {
            for (wchar_t const y : CORNERS) {
                expectPlainOrder(differences, left + x, right + y);
                expectPlainOrder(differences, left + x + L"Item", right + y + L"ITEM");
                expectPlainOrder(differences, L"Ii" + left + x + L"name",
                                 L"iI" + right + y + L"NAME");
                expectPlainOrder(differences, left + x + L"abcdefgh", right + y);
            }
        }
    }
    CHECK(differences.firstOf(10 * CORNERS.size() * CORNERS.size() * 4 * 2) == "");
}

TEST_CASE("compare orders random text that is equal but for case, or nearly, by the plain rule") {
    Random random(5);
    Differences differences;
    for (int i = 0; i < 20000; ++i) {
        std::wstring a(random.below(40), L'\0');
        for (wchar_t& c : a) {
            std::uint32_t const corner = random.below(static_cast<std::uint32_t>(CORNERS.size()));
            c = random.below(16) == 0 ? CORNERS[corner] : unit('A' + random.below(26));
        }
        std::wstring b = a;
        for (wchar_t& c : b) {
            if (random.below(2) == 0 && c >= L'A' && c <= L'Z') c += L'a' - L'A';
        }
        expectPlainOrder(differences, a, b);
        if (b.empty()) continue;
        std::uint32_t const place = random.below(static_cast<std::uint32_t>(b.size()));
        b[place] = CORNERS[random.below(static_cast<std::uint32_t>(CORNERS.size()))];
        expectPlainOrder(differences, a, b);
        expectPlainOrder(differences, a, b.substr(0, place));
    }
    CHECK(differences.first() == "");
}
