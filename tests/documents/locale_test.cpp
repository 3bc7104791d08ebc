// What docs/locale.md says, under the four C locales of its tables.
#include <doctest/doctest.h>

#include <locale.h>
#include <wctype.h>

#include <filesystem>
#include <locale>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <koru/datafile.h>
#include <koru/datetime.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/propertyfile.h>
#include <koru/string.h>
#include <koru/timer.h>
#include <koru/uuid.h>

#include "support/locales.h"
#include "support/ownfile.h"
#include "support/settingsfixture.h"
#include "support/throws.h"

using Koru::compare;
using test::READ;
using test::READ_WRITE;
using test::SettingsFile;

namespace {

/// Calls `use` under each of the four locales in turn, set for the process.
template <class Use>
void inEachDocumented(Use use) {
    for (test::NamedLocale const& each : test::documentedLocales()) {
        CAPTURE(each.name);
        test::ProcessLocale const locale(each);
        use();
    }
}

/// The locales under which the answer is yes, each followed by a blank.
template <class Question>
std::string where(Question question) {
    std::string names;
    for (test::NamedLocale const& each : test::documentedLocales()) {
        test::ProcessLocale const locale(each);
        if (question()) names += each.name + ' ';
    }
    return names;
}

std::string const C = "C ";
std::string const GERMAN = "C.UTF-8 de_DE.UTF-8 ";
std::string const TURKISH = "tr_TR.UTF-8 ";

std::string whereEqual(wchar_t const* a, wchar_t const* b) {
    return where([&] { return compare(a, b) == 0; });
}

} // namespace

TEST_CASE("which letters are a pair depends on the locale") {
    struct Row {
        wchar_t const* a;
        wchar_t const* b;
        std::string expected;
    };
    Row const rows[] = {
        {L"title", L"TITLE", C + GERMAN},
        {L"name", L"NAME", C + GERMAN + TURKISH},
        {L"Ä", L"ä", GERMAN + TURKISH},
        {L"Ж", L"ж", GERMAN + TURKISH},
        {L"Σ", L"σ", GERMAN + TURKISH},
        {L"ẞ", L"ß", GERMAN + TURKISH},
        {L"I", L"ı", TURKISH},
        {L"İ", L"i", GERMAN + TURKISH},
        {L"σ", L"ς", ""},
        {L"ß", L"ss", ""},
    };
    for (Row const& row : rows) {
        CAPTURE(test::shown(row.a));
        CHECK(whereEqual(row.a, row.b) == row.expected);
    }
}

TEST_CASE("bytes beyond ASCII have no case in these locales") {
    CHECK(where([] { return compare("Ä", "ä") == 0; }).empty());
    CHECK(where([] { return compare("title", "TITLE") == 0; }) == C + GERMAN);
}

TEST_CASE("only LC_CTYPE counts") {
    for (test::NamedLocale const& each : test::documentedLocales()) {
        bool const isTurkish = each.name + ' ' == TURKISH;
        CAPTURE(each.name);
        test::ProcessLocale const all(each);
        ::setlocale(LC_CTYPE, "C");
        CHECK(compare(L"title", L"TITLE") == 0);
        CHECK(compare(L"Ä", L"ä") != 0);
        ::setlocale(LC_ALL, "C");
        test::LocalePath const path(each.path);
        REQUIRE(::setlocale(LC_CTYPE, each.name.c_str()) != nullptr);
        CHECK((compare(L"title", L"TITLE") == 0) == !isTurkish);
    }
}

TEST_CASE("the locale of a thread counts in that thread") {
    ::setlocale(LC_ALL, "C");
    for (test::NamedLocale const& each : test::documentedLocales()) {
        CAPTURE(each.name);
        bool const hasCase = each.name != "C";
        std::thread([&] {
            test::ThreadLocale const locale(each.locale);
            CHECK((compare(L"Ä", L"ä") == 0) == hasCase);
        }).join();
        CHECK(compare(L"Ä", L"ä") != 0);
    }
}

TEST_CASE("a global locale of C++ that has a name counts too") {
    ::setlocale(LC_ALL, "C");
    std::locale const before = std::locale::global(std::locale("C.UTF-8"));
    CHECK(compare(L"Ä", L"ä") == 0);
    std::locale::global(before);
    CHECK(compare(L"Ä", L"ä") != 0);
}

TEST_CASE("names of settings match as the locale pairs their letters") {
    SettingsFile settings("[MAIN]\nWIDTH=1\nÄNGE=2\n");
    CHECK(where([&] { return settings.getValue(L"MAIN", L"width") == L"1"; }) == C + GERMAN);
    CHECK(where([&] { return settings.getValue(L"main", L"WIDTH") == L"1"; }) == C + GERMAN);
    CHECK(where([&] { return settings.getValue(L"MAIN", L"änge") == L"2"; }) == GERMAN + TURKISH);
    test::OwnFile<Koru::PropertyFile> properties("WIDTH=1\n", READ);
    CHECK(where([&] { return properties.getValue(L"width") == L"1"; }) == C + GERMAN);
}

TEST_CASE("keys of records and paths match as the locale pairs their letters") {
    Koru::DataFile file;
    CHECK(where([&] {
              file.insert(Koru::DataFile::Record(L"WIDTH", {}));
              file.insert(Koru::DataFile::Record(L"width", {}));
              bool const isOne = file.size() == 1;
              while (file.size() > 0) file.remove(Koru::DataFile::Record(file[0]));
              return isOne;
          }) == C + GERMAN);
    CHECK(where([] { return Koru::File::Path("/MAIN/x") == Koru::File::Path("/main/x"); }) ==
          C + GERMAN);
}

TEST_CASE("a change of the locale while a file is open changes what matches") {
    ::setlocale(LC_ALL, "C");
    SettingsFile settings("[s]\nä=1\n");
    CHECK(settings.getValue(L"s", L"Ä").empty());
    ::setlocale(LC_CTYPE, "C.UTF-8");
    CHECK(settings.getValue(L"s", L"Ä") == L"1");
    ::setlocale(LC_CTYPE, "C");
}

TEST_CASE("sorting goes by the numbers of small letters, not by a language") {
    inEachDocumented(
        [] { CHECK(test::rewritten("[s]\nä=1\nz=2\nb=3\n_=4\n") == "[s]\n_=4\nb=3\nz=2\nä=1\n"); });
    // Small, ö is 0xF6; as a capital, which C leaves as it is, it is 0xD6. ã is 0xE3.
    CHECK(where([] { return test::rewritten("[s]\nã=1\nÖ=2\n") == "[s]\nÖ=2\nã=1\n"; }) == C);
}

TEST_CASE("only blanks and tabs are trimmed in every locale") {
    CHECK(where([] { return ::iswspace(L'\u2003') != 0; }) == GERMAN + TURKISH);
    inEachDocumented([] {
        SettingsFile settings("[s]\n \tk\u00A0=\u2003v\u3000\v\t \n");
        CHECK(settings.getValue(L"s", L"k\u00A0") == L"\u2003v\u3000\v");
        Koru::DataFile::Record const record(L" \u2003key\u00A0\t", {});
        CHECK(record.getKey() == L"\u2003key\u00A0");
    });
}

TEST_CASE("text in files and names of files are UTF-8 in every locale") {
    inEachDocumented([] {
        CHECK(Koru::make_string(L"ü€😀") == "\xC3\xBC\xE2\x82\xAC\xF0\x9F\x98\x80");
        CHECK(Koru::make_wstring("\xC3\xBC\xE2\x82\xAC\xF0\x9F\x98\x80") == L"ü€😀");
        CHECK(test::written({{L"s", L"ü", L"€"}}) == "[s]\n\xC3\xBC=\xE2\x82\xAC\n");
        test::TempDir const directory;
        CHECK(Koru::File::create(directory.wide("") + L"ü"));
        CHECK(std::filesystem::exists(directory / "\xC3\xBC"));
    });
}

TEST_CASE("dates, timers and identifiers are the same text in every locale") {
    inEachDocumented([] {
        std::ostringstream out;
        out << Koru::DateTime("2026-11-22 14:30:05") << ' ' << Koru::Timer() << ' '
            << Koru::Uuid("6BA7B810-9DAD-11D1-80B4-00C04FD430C8");
        CHECK(out.str() == "2026-11-22 14:30:05 0.000 6ba7b810-9dad-11d1-80b4-00c04fd430c8");
    });
}

TEST_CASE("the locale of a stream changes the numbers that are written to it") {
    for (test::NamedLocale const& each : test::documentedLocales()) {
        if (each.name != "de_DE.UTF-8") continue;
        test::LocalePath const path(each.path);
        std::ostringstream out;
        out.imbue(std::locale(each.name));
        out << 1234567 << ' ' << Koru::Timer() << ' ' << Koru::DateTime("2026-11-22 14:30:05");
        CHECK(out.str() == "1.234.567 0,000 2026-11-22 14:30:05");
        // A file takes the locale that is global in C++ when it is made.
        std::locale const before = std::locale::global(std::locale(each.name));
        test::Place const place;
        Koru::File file(Koru::make_wstring(place.path()));
        std::locale::global(before);
        file.open(READ_WRITE);
        file << 1234567;
        file.close();
        CHECK(place.bytes() == "1.234.567");
    }
}

TEST_CASE(
    "a number in a value is read with the point of the locale, unless the program sees to it") {
    SettingsFile settings("[s]\nk=1.5\n");
    std::wstring const value = settings.getValue(L"s", L"k");
    CHECK(where([&] { return std::stod(value) == 1.5; }) == C + "C.UTF-8 ");
    CHECK(where([&] {
              std::wistringstream in(value);
              in.imbue(std::locale::classic());
              double number = 0;
              return (in >> number) && number == 1.5;
          }) == C + GERMAN + TURKISH);
}

TEST_CASE("messages are the same in every locale") {
    inEachDocumented([] {
        CHECK(test::messageOf<std::runtime_error>([] { Koru::File(L"/none").open(READ); }) ==
              "failed to open file.");
    });
}

TEST_CASE("the library sets no locale") {
    inEachDocumented([] {
        std::string const before = ::setlocale(LC_ALL, nullptr);
        CHECK(test::rewritten("[s]\nä=1\nB=2\n") == "[s]\nB=2\nä=1\n");
        CHECK(compare("a", "B") < 0);
        CHECK(std::string(::setlocale(LC_ALL, nullptr)) == before);
        CHECK(std::locale() == std::locale::classic());
    });
}
