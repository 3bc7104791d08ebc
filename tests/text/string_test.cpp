// The string functions: the two constants, length, copies up to the first NUL, and what none of the
// functions depends on. Comparison, conversion and insertion have programs of their own.
#include <koru/string.h>

#include <doctest/doctest.h>

#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <locale>
#include <sstream>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include "support/selfexec.h"
#include "support/streamprobe.h"
#include "support/subprocess.h"
#include "text/textmodel.h"

using namespace test;

namespace {

/// What a static constructor of an application sees.
struct Early {
    bool constantsEmpty = Koru::_null_string.empty() && Koru::_null_wstring.empty();
    std::string narrowOfNull = Koru::make_string(static_cast<char const*>(nullptr));
    std::wstring wideOfNull = Koru::make_wstring(static_cast<wchar_t const*>(nullptr));
    std::string copied = Koru::_null_string;
    std::wstring wideCopied = Koru::_null_wstring;
    std::string encoded = Koru::make_string(L"\u00E9");
};
// The smallest number an application may use: constructed before all its other static objects.
Early const early __attribute__((init_priority(101)));

/// What a static destructor of an application sees; told on standard output when asked for.
struct Late {
    bool asked = false;
    ~Late() {
        if (!asked) return;
        bool const usable = Koru::_null_string.empty() && Koru::_null_wstring.empty() &&
                            Koru::make_string(L"") == "" && Koru::make_wstring("a") == L"a";
        char const answer = usable ? 'y' : 'n';
        if (::write(STDOUT_FILENO, &answer, 1) != 1) ::_exit(1);
    }
};
Late late __attribute__((init_priority(101)));

RegisterSelf const registerLate("use-strings-at-exit", [](int, char**) {
    late.asked = true;
    return 0;
});

std::string copyOf(char const* s) { return Koru::make_string(s); }
std::wstring copyOf(wchar_t const* s) { return Koru::make_wstring(s); }

template <class Char>
std::string lowBytes(std::basic_string<Char> const& text) {
    return bytes(std::vector<std::uint32_t>(text.begin(), text.end()));
}

} // namespace

TEST_CASE("the null strings are constant and empty") {
    static_assert(std::is_same<decltype(Koru::_null_string), std::string const>::value, "");
    static_assert(std::is_same<decltype(Koru::_null_wstring), std::wstring const>::value, "");
    CHECK(Koru::_null_string.size() == 0);
    CHECK(Koru::_null_wstring.size() == 0);
}

TEST_CASE("the null strings serve the static constructors of an application") {
    CHECK(early.constantsEmpty);
    CHECK(early.narrowOfNull == "");
    CHECK(early.wideOfNull.empty());
    CHECK(early.copied == "");
    CHECK(early.wideCopied.empty());
    CHECK(hex(early.encoded) == "C3 A9");
}

TEST_CASE("the null strings serve the static destructors of an application") {
    Outcome const outcome = execute(ownExecutable(), {"string_test", "--self=use-strings-at-exit"});
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "y");
}

TEST_CASE("changing what came from a null string leaves the null string empty") {
    Koru::make_string(static_cast<char const*>(nullptr)) += "changed";
    Koru::make_wstring(static_cast<char const*>(nullptr)) += L"changed";
    CHECK(Koru::_null_string == "");
    CHECK(Koru::_null_wstring.empty());
    CHECK(Koru::make_string(L"") == "");
    CHECK(Koru::make_wstring("").empty());
}

TEST_CASE_TEMPLATE("length of a null pointer is 0", Char, char, wchar_t) {
    CHECK(Koru::length(static_cast<Char const*>(nullptr)) == 0);
}

TEST_CASE("length counts bytes and wide characters, not letters or bytes of wide characters") {
    CHECK(Koru::length("") == 0);
    CHECK(Koru::length(L"") == 0);
    CHECK(Koru::length("\xC3\xA9\xFF") == 3);
    CHECK(Koru::length(L"\u00E9\U0001F600") == 2);
    CHECK(Koru::length(units({0xFFFFFFFFU, 0x80000000U, 0x100, 0x10000}).c_str()) == 4);
}

TEST_CASE_TEMPLATE("length of a string object ends at its first NUL whatever its stored size", Char,
                   char, wchar_t) {
    using Text = std::basic_string<Char>;
    CHECK(Koru::length(Text()) == 0);
    CHECK(Koru::length(Text{'a', '\0', 'b'}) == 1);
    CHECK(Koru::length(Text(5, '\0')) == 0);
    CHECK(Koru::length(Text{'a', 'b', 'c', '\0'}) == 3);
    CHECK(Koru::length(Text(100000, 'x')) == 100000);
}

TEST_CASE_TEMPLATE("length finds the first NUL at every distance and alignment", Char, char,
                   wchar_t) {
    Differences differences;
    for (std::size_t offset = 0; offset < 40; ++offset) {
        for (std::size_t size = 0; size < 140; ++size) {
            std::basic_string<Char> text(offset + size, static_cast<Char>(0x80000080U));
            text.append({'\0', static_cast<Char>(0xFF), '\0', 'z'});
            bool const same = Koru::length(text.c_str() + offset) == size &&
                              Koru::length(text.substr(offset)) == size;
            differences.note(same, [&] { return std::to_string(size) + " characters"; });
        }
    }
    CHECK(differences.firstOf(40 * 140) == "");
}

TEST_CASE_TEMPLATE("the functions read nothing outside the text they are given", Char, char,
                   wchar_t) {
    GuardedMemory const memory;
    GuardedMemory const other;
    Random random(1);
    Differences differences;
    for (std::size_t size = 0; size < 300; ++size) {
        std::basic_string<Char> const text = randomText<Char>(random, size);
        auto const expected = modelOf(text);
        auto const copyTo = [&text](Char* to) {
            std::copy_n(text.c_str(), text.size() + 1, to);
            return to;
        };
        Char const* const end = copyTo(other.last<Char>(size + 1));
        for (Char* const place : {memory.first<Char>(), memory.last<Char>(size + 1)}) {
            Char const* const s = copyTo(place);
            bool const same = Koru::length(s) == size && copyOf(s) == text &&
                              converted(s) == expected && Koru::compare(s, end) == 0;
            differences.note(same, [&] { return hex(text); });
        }
    }
    CHECK(differences.firstOf(300 * 2) == "");
}

TEST_CASE("every make function gives an empty string for a null pointer and for empty text") {
    CHECK(Koru::make_string(static_cast<char const*>(nullptr)) == "");
    CHECK(Koru::make_string(static_cast<wchar_t const*>(nullptr)) == "");
    CHECK(Koru::make_wstring(static_cast<char const*>(nullptr)).empty());
    CHECK(Koru::make_wstring(static_cast<wchar_t const*>(nullptr)).empty());
    CHECK(Koru::make_string("") == "");
    CHECK(Koru::make_string(L"") == "");
    CHECK(Koru::make_wstring("").empty());
    CHECK(Koru::make_wstring(L"").empty());
    CHECK(Koru::make_string(std::wstring()) == "");
    CHECK(Koru::make_wstring(std::string()).empty());
    CHECK(Koru::make_string(std::wstring(3, L'\0')) == "");
    CHECK(Koru::make_wstring(std::string(3, '\0')).empty());
}

TEST_CASE("make_string of narrow text copies its bytes, valid UTF-8 or not, up to the NUL") {
    CHECK(Koru::make_string("abc") == "abc");
    CHECK(Koru::make_string("ab\0c") == "ab");
    CHECK(hex(Koru::make_string("\xC3\x80\xFF\xFEz")) == "C3 80 FF FE 7A");
    Random random(9);
    std::string const text = randomText<char>(random, 100000);
    CHECK((Koru::make_string(text.c_str()) == text));
}

TEST_CASE("make_wstring of wide text copies its characters, whatever they are, up to the NUL") {
    CHECK(hex(Koru::make_wstring(L"abc")) == "61 62 63");
    CHECK(hex(Koru::make_wstring(L"ab\0c")) == "61 62");
    std::wstring const odd = units({0xFFFFFFFFU, 0xD800, 0x80000000U, 0x7FFFFFFF, 0x100, 0xDC00});
    CHECK(hex(Koru::make_wstring(odd.c_str())) == hex(odd));
    Random random(9);
    std::wstring const text = randomText<wchar_t>(random, 100000);
    CHECK((Koru::make_wstring(text.c_str()) == text));
}

TEST_CASE("conversions, inserters and compare do not depend on the global C++ locale") {
    // Facets that turn every character into '#' and find no two characters of one case.
    struct Narrow : std::ctype<char> {
        char do_widen(char) const override { return '#'; }
        char do_narrow(char, char) const override { return '#'; }
        char do_tolower(char) const override { return '#'; }
    };
    struct Wide : std::ctype<wchar_t> {
        wchar_t do_widen(char) const override { return L'#'; }
        char do_narrow(wchar_t, char) const override { return '#'; }
        wchar_t do_tolower(wchar_t) const override { return L'#'; }
    };
    struct Convert : std::codecvt<wchar_t, char, std::mbstate_t> {
        result do_out(std::mbstate_t&, wchar_t const*, wchar_t const*, wchar_t const*&, char*,
                      char*, char*&) const override {
            return error;
        }
        result do_in(std::mbstate_t&, char const*, char const*, char const*&, wchar_t*, wchar_t*,
                     wchar_t*&) const override {
            return error;
        }
    };
    std::locale const narrowOdd(std::locale::classic(), new Narrow);
    std::locale const bothOdd(narrowOdd, new Wide);
    std::string encoded;
    std::wstring decoded;
    std::string written;
    bool comparesAsEver = false;
    {
        GlobalLocale const scope(std::locale(bothOdd, new Convert));
        encoded = Koru::make_string(L"a\u00E9\u20AC\U0001F600");
        decoded = Koru::make_wstring("a\xC3\xA9\xE2\x82\xAC");
        std::ostringstream out;
        Koru::operator<<(out, std::string("a\0\xE9", 3));
        Koru::operator<<(out, std::wstring(L"a\0\u00E9\u20AC", 4));
        written = out.str();
        comparesAsEver = Koru::compare("ABC", "abc") == 0 && Koru::compare(L"ABC", L"abc") == 0 &&
                         Koru::compare("a", "b") < 0 && Koru::compare(L"b", L"a") > 0;
    }
    CHECK(hex(encoded) == "61 C3 A9 E2 82 AC F0 9F 98 80");
    CHECK(hex(decoded) == "61 E9 20AC");
    CHECK(hex(written) == "61 0 E9 61 0 E9 AC");
    CHECK(comparesAsEver);
}

TEST_CASE_TEMPLATE("the string functions may be called from several threads at once", Char, char,
                   wchar_t) {
    std::vector<Differences> differences(4);
    std::vector<std::thread> threads;
    for (std::uint32_t i = 0; i < 4; ++i) {
        threads.emplace_back([&differences, i] {
            Random random(100 + i);
            for (std::size_t size = 0; size < 300; ++size) {
                std::basic_string<Char> const text = randomText<Char>(random, size);
                std::ostringstream out;
                Koru::operator<<(out, text.substr(0, 127));
                bool const same = converted(text.c_str()) == modelOf(text) &&
                                  copyOf(text.c_str()) == text && Koru::compare(text, text) == 0 &&
                                  Koru::compare(text, text + Char('x')) < 0 &&
                                  out.str() == lowBytes(text.substr(0, 127));
                differences[i].note(same, [&] { return hex(text); });
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    for (Differences const& each : differences) CHECK(each.firstOf(300) == "");
}
