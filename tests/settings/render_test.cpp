// What a settings file writes when the C locale changes under its hands, as another thread may
// change it. A file of its own, since towlower is replaced for the whole executable and the
// libraries it loaded.
#include <doctest/doctest.h>

#include <wctype.h>

#include <algorithm>
#include <cstddef>
#include <string>
#include <vector>

#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/choices.h"
#include "support/failingmemory.h" // for its end of a process that writes beyond a block
#include "support/settingsfixture.h"
#include "support/settingsmodel.h"

using test::checkSame;
using test::READ_WRITE;
using test::SettingsFile;
using test::Twins;
using namespace std::string_literals;

namespace {

// Whether U+00C9 and U+00E9 are a pair, and after how many questions that changes.
bool isPair = true;
long questionsBeforeChange = -1;

} // namespace

extern "C" wint_t towlower(wint_t c) noexcept {
    if (questionsBeforeChange >= 0 && questionsBeforeChange-- == 0) isPair = !isPair;
    if (c == 0xC9) return isPair ? 0xE9 : 0xC9;
    return c >= L'A' && c <= L'Z' ? c + 0x20 : c;
}

namespace {

/// A file whose entries are by turns in two sections that may be one.
std::string bytesOfTwoSections(int entries) {
    std::string bytes;
    for (int i = 10; i < 10 + entries; ++i) {
        bytes += i % 2 == 0 ? "[a long name \xC3\x89]\n" : "[a long name \xC3\xA9]\n";
        bytes += "k" + std::to_string(i) + "=v\n";
    }
    return bytes;
}

/// The lines that are not headers, in order.
std::vector<std::string> entryLines(std::string const& bytes) {
    std::vector<std::string> lines;
    for (std::size_t at = 0; at < bytes.size();) {
        std::size_t const end = bytes.find('\n', at);
        if (bytes[at] != '[') lines.push_back(bytes.substr(at, end - at));
        at = end + 1;
    }
    std::sort(lines.begin(), lines.end());
    return lines;
}

} // namespace

TEST_CASE(
    "a locale that changes at any moment of close does not make the text overrun its memory") {
    std::string const bytes = bytesOfTwoSections(12);
    std::vector<std::string> expected = entryLines(bytes);
    expected.push_back("set=v");
    for (bool const pairAtFirst : {true, false}) {
        for (long questions = 0; questions < 150; ++questions) {
            CAPTURE(pairAtFirst);
            CAPTURE(questions);
            isPair = pairAtFirst;
            SettingsFile file(bytes, READ_WRITE);
            file.setValue(L"b", L"set", L"v"); // last
            questionsBeforeChange = questions;
            file.close();
            questionsBeforeChange = -1;
            CHECK(entryLines(file.place.bytes()) == expected);
        }
    }
}

TEST_CASE("what is between the entries of a file is not written with them") {
    std::vector<std::string> const pieces = {
        "[s]\n",    "[S]\n",        "[[t]]\n",   "[u\n",     "a=1\n",        "B=2\n",
        "c=\n",     "=x\n",         " d=3 \t\n", "e=4\r\n",  "# comment\n",  "\n",
        "f=\0g\n"s, "none\n",       "i==\n",     "j=\x80\n", "k=[s]\n",      "l=5\n[s]",
        "m=6",      "\xC1\x81=7\n", "a\0b=8\n"s, "  \n",     "[\xC3\x89]\n", "\xC3\xA9=\xC3\xA9\n"};
    isPair = true;
    test::Dice dice(1);
    for (int i = 0; i < 3000; ++i) {
        std::string bytes = "[s]\n";
        for (std::size_t left = dice.below(12); left != 0; --left) bytes += dice.from(pieces);
        INFO(test::shown(bytes));
        Twins<> twins;
        twins.file.place.write(bytes);
        twins.file.open(READ_WRITE);
        twins.model.settings = test::sortedSettings(bytes);
        std::wstring const value(dice.below(40), dice.oneIn(4) ? L'\u00E9' : L'v');
        for (wchar_t const* const key : {L"a", L"new", L"c"}) {
            if (i % 2 == 0) twins.change([&](auto& table) { table.setValue(L"s", key, value); });
        }
        twins.file.close();
        test::sortSettings(twins.model.settings);
        checkSame(twins.file.place.bytes(), test::settingsText(twins.model.settings));
    }
}

TEST_CASE("wide values of every length are written as make_string encodes them") {
    test::Place const place;
    Koru::PropertyFile file(place.path());
    for (std::size_t size = 0; size < 70; ++size) {
        for (wchar_t const c :
             {L'a', L'\u00E9', L'\0', static_cast<wchar_t>(0x80000041), L'\U0001F600'}) {
            std::wstring value(size, L'a');
            if (size > 2) value[size - 2] = c;
            file.open(test::WRITE);
            file.setValue(value, value);
            file.close();
            std::string const encoded = Koru::make_string(value);
            checkSame(place.bytes(), encoded + "=" + encoded + "\n");
        }
    }
}
