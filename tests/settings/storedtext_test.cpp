// Text as a settings table keeps it, bytes or wide, against the rules that hold for wide strings.
// The sources are compiled into this program, since the library exports none of this.
#include <doctest/doctest.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <string>
#include <string_view>
#include <vector>

#include <koru/string.h>

#include "settings/render.h"
#include "settings/settingstable.h"
#include "settings/storedtext.h"
#include "support/choices.h"
#include "support/locales.h"
#include "support/shown.h"

namespace Koru {

// What the library has for itself, the plain way.
std::wstring make_wstring(char const* s, std::size_t size) {
    return make_wstring(std::string(s, size));
}
std::wstring wideString(wchar_t const* s, std::size_t size) { return std::wstring(s, size); }
std::size_t encodedBound(wchar_t const* s, std::size_t size) {
    return make_string(std::wstring(s, size)).size();
}
char* encode(wchar_t const* s, std::size_t size, char* to) {
    std::string const bytes = make_string(std::wstring(s, size));
    return std::copy(bytes.begin(), bytes.end(), to);
}

} // namespace Koru

using Koru::StoredText;
using test::Dice;
using test::inEachLocale;
using namespace std::string_literals;

namespace {

/// One text in both forms. The bytes are in memory that ends where they end, so that a sanitizer
/// sees what is read after them.
class Text {
public:
    explicit Text(std::wstring const& characters) : string_(characters) {
        std::string const bytes = Koru::make_string(characters);
        bytes_.assign(bytes.begin(), bytes.end());
    }
    Text(Text const&) = delete;
    Text& operator=(Text const&) = delete;

    std::wstring const& string() const { return string_; }
    StoredText narrow() const { return StoredText(std::string_view(bytes_.data(), bytes_.size())); }
    StoredText wide() { return StoredText(&string_); }

private:
    std::wstring string_;
    std::vector<char> bytes_;
};

int sign(int value) { return (value > 0) - (value < 0); }

/// The texts compare as the library's own rule orders them, character by character.
void checkPair(Text& a, Text& b) {
    int const order = sign(Koru::compare(a.string().c_str(), b.string().c_str()));
    bool same = true;
    for (StoredText const& x : {a.narrow(), a.wide()}) {
        for (StoredText const& y : {b.narrow(), b.wide()}) same &= sign(compare(x, y)) == order;
        same &= areEqual(x, b.string()) == (order == 0);
    }
    if (same) return;
    INFO(test::shown(a.string()), " and ", test::shown(b.string()));
    CHECK(same);
}

/// Characters that some locale folds in a way of its own, with partners and neighbours.
std::wstring const odd =
    L"AaIi\u0130\u0131Kk\u212AZz@[`{\x7F\u00E9\u00C9\u00DF\u03C3\u03A3\u20AC\u4E2D\U0001F600";

} // namespace

TEST_CASE("texts of up to two odd characters compare as wide strings do, after any beginning") {
    std::vector<std::wstring> names = {L""};
    for (std::size_t i = 0; names[i].size() < 2; ++i) {
        for (wchar_t const c : odd) names.push_back(std::wstring(names[i]) + c);
    }
    for (std::size_t const before : {0U, 1U, 3U, 4U, 14U, 15U, 16U, 31U}) {
        std::vector<std::unique_ptr<Text>> texts;
        for (std::size_t i = 0; i < names.size(); i += before % 4 == 0 ? 1 : 7) {
            texts.push_back(std::make_unique<Text>(std::wstring(before, L'x') + names[i]));
        }
        inEachLocale([&texts] {
            for (auto const& a : texts) {
                for (auto const& b : texts) checkPair(*a, *b);
            }
        });
    }
}

TEST_CASE("random texts that are alike but for case, a character or the end compare likewise") {
    std::wstring printable;
    for (wchar_t c = L' '; c < 0x7F; ++c) printable += c;
    Dice dice(1);
    inEachLocale([&] {
        for (int i = 0; i < 20000; ++i) {
            std::wstring const a = dice.text(dice.oneIn(2) ? printable : odd, 69);
            std::wstring b = a;
            std::size_t const one = dice.below(a.size() + 1);
            std::size_t const change = dice.below(4);
            if (change == 1) b.resize(one);
            if (change == 2 && one != a.size()) b[one] = dice.from(odd);
            for (wchar_t& c : b) {
                if (change == 3 && c < 0x80 && (c | 0x20) >= 'a') c ^= 0x20;
            }
            Text first(a);
            Text second(b);
            checkPair(first, second);
        }
    });
}

TEST_CASE("a name that is looked for ends at its first NUL, and so does one that was set") {
    Text text(L"name");
    std::wstring set = L"name\0is long"s;
    for (StoredText const& name : {text.narrow(), text.wide(), StoredText(&set)}) {
        CHECK(areEqual(name, L"name\0more"s));
        CHECK(areEqual(name, L"name"));
        CHECK(!areEqual(name, L"nam\0"s));
        CHECK(!areEqual(name, L"nam\0e"s));
        CHECK(!areEqual(name, L""));
    }
    CHECK(areEqual(StoredText(), std::wstring()));
    CHECK(!areEqual(StoredText(), L"x"));
    CHECK(areEqual(StoredText(), L"\0x"s));
}

TEST_CASE("text is plain unless a byte of it is NUL or beyond ASCII, at any place") {
    for (std::size_t size = 0; size < 70; ++size) {
        std::vector<char> bytes(size, 'p');
        std::string_view const view(bytes.data(), size);
        CHECK(Koru::isPlain(view));
        for (char& c : bytes) {
            for (int const unit : {0, 1, 0x7F, 0x80, 0xC3, 0xFF}) {
                c = static_cast<char>(unit);
                CHECK(Koru::isPlain(view) == (unit > 0 && unit < 0x80));
            }
            c = 'p';
        }
    }
}

TEST_CASE("text of any length is widened to what it was made of") {
    for (std::size_t size = 0; size < 150; ++size) {
        for (wchar_t const c : {L'a', L'\u00E9', L'\u4E2D'}) {
            std::wstring string(size, L'a');
            if (size > 3) string[size - 2] = c;
            Text text(string);
            CHECK((text.narrow().str() == string));
            CHECK((text.wide().str() == string));
        }
    }
}

TEST_CASE("more text than there are addresses is want of memory when it is to be written" *
          doctest::skip(sizeof(void*) > 4)) {
    // Two such texts and "=\n" are one byte too many. Nobody looks at them.
    // NOLINTNEXTLINE(bugprone-string-constructor)
    StoredText const huge(std::string_view("", PTRDIFF_MAX));
    Koru::SettingsTable table;
    table.add(table.addSection(StoredText()), huge, huge);
    CHECK_THROWS_AS(render(table, Koru::Headers::NONE), std::bad_alloc);
}
