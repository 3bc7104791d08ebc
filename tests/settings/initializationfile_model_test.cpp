// The sectioned settings file against the plain model of support/settingsmodel.h: every short line,
// random files, random sequences of operations, large tables and the names that locales fold.
#include <doctest/doctest.h>

#include <wchar.h>

#include <algorithm>
#include <clocale>
#include <cstddef>
#include <cwctype>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/initializationfile.h>
#include <koru/string.h>

#include "support/choices.h"
#include "support/locales.h"
#include "support/plainlocale.h"
#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/skip.h"
#include "support/throws.h"

using Koru::InitializationFile;
using test::checkSame;
using test::checkTable;
using test::Dice;
using test::drain;
using test::forEachText;
using test::inEachLocale;
using test::loaded;
using test::messageOf;
using test::Place;
using test::READ;
using test::READ_WRITE;
using test::Setting;
using test::Settings;
using test::SettingsFile;
using test::SettingsFileModel;
using test::sortedSettings;
using test::Twins;
using test::WRITE;
using namespace std::string_literals;

namespace {

/// Opens a file of these bytes, compares the table with the model, writes it back and compares the
/// bytes, then reads and compares again.
void checkFile(Place const& place, std::string const& bytes) {
    place.write(bytes);
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    SettingsFileModel model;
    model.exists = true;
    model.bytes = bytes;
    CHECK(model.open(READ_WRITE));
    checkTable(file, model);
    file.synchronize();
    CHECK(model.synchronize());
    checkSame(place.bytes(), model.bytes);
    checkTable(file, model);
    file.close();
    model.close();
    checkSame(place.bytes(), model.bytes);
}

} // namespace

TEST_CASE("every line of up to five characters of the syntax is read as the model reads it") {
    Place const place;
    std::string bytes;
    std::size_t lines = 0;
    forEachText("[]=#;a\t ", 5, [&](std::string const& line) {
        // A header of its own before each, and an entry after it that shows the section then.
        bytes += "[h" + std::to_string(lines) + "]\n" + line + "\nk=v\n";
        if (++lines % 128 != 0) return;
        checkFile(place, bytes);
        bytes.clear();
    });
    checkFile(place, bytes);
    CHECK(lines == 37449U);
}

TEST_CASE("every line of up to four characters of the syntax is read at the end of a file") {
    Place const place;
    forEachText("[]=#;a\t ", 4, [&place](std::string const& line) {
        CAPTURE(line);
        std::string const bytes = "[h]\nb=1\n" + line;
        checkSame(loaded(place, bytes), sortedSettings(bytes));
    });
}

TEST_CASE("every line of up to three bytes that matter to UTF-8 is read as the model reads it") {
    Place const place;
    std::string bytes;
    std::size_t lines = 0;
    forEachText("[=a\0\x80\xBF\xC0\xC3\xE2\xFF"s, 3, [&](std::string const& line) {
        std::string const number = std::to_string(lines);
        bytes += "[h" + number + "]\n" + line + "\nk=v\n[" + line + "]\nk" + number + "=v\nk" +
                 line + "=v" + line + "\n";
        if (++lines % 64 != 0) return;
        checkFile(place, bytes);
        bytes.clear();
    });
    checkFile(place, bytes);
}

TEST_CASE("random files are read and written as the model does") {
    Place const place;
    std::string const syntax = "[]=#;aAb\t \r\n\0\x80\xC3\xA9\xE2\xFF\xC0"s;
    for (unsigned seed = 1; seed <= 1500; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string bytes = dice.oneIn(4) ? "" : "[s]\n";
        bytes += dice.text(syntax, 300);
        checkSame(loaded(place, bytes), sortedSettings(bytes));
        checkFile(place, bytes);
    }
}

TEST_CASE("random files of likely lines are read and written as the model does") {
    Place const place;
    std::vector<std::string> const pieces{
        "[",     "]",     "=",       "#",        ";",        "\n",   "\n",       "\n",
        "[a]\n", "[A]\n", "[b c]\n", "key",      "KEY",      "Key2", "=value",   " ",
        "\t",    "k=v\n", "K=w\n",   "\xC3\xA9", "\xC3\x89", "\r\n", "\xC0\x80", "\0"s};
    for (unsigned seed = 1; seed <= 300; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string bytes = "[s]\n";
        for (std::size_t left = dice.below(400); left > 0; --left) bytes += dice.from(pieces);
        checkFile(place, bytes);
    }
}

TEST_CASE("removeSection does the same as the model on every arrangement of eight entries") {
    for (unsigned pattern = 0; pattern < 256; ++pattern) {
        CAPTURE(pattern);
        Twins<> twins;
        twins.change([pattern](auto& table) {
            for (unsigned i = 0; i < 8; ++i) {
                table.setValue((pattern >> i & 1U) != 0 ? L"s" : L"t", std::to_wstring(i), L"v");
            }
            table.removeSection(L"S");
        });
        checkSame(drain(twins.file), twins.model.settings);
    }
}

namespace {

/// A library's file and the model, given the same random commands.
class RandomTwins : public Twins<SettingsFileModel> {
public:
    explicit RandomTwins(unsigned seed) : dice_(seed) {}

    /// A file of likely entries to begin with.
    void begin(std::size_t entries) {
        std::string bytes;
        for (; entries > 0; --entries) {
            if (dice_.oneIn(5)) bytes += "[" + Koru::make_string(section()) + "]\n";
            bytes += Koru::make_string(key()) + "=" + Koru::make_string(value()) + "\n";
        }
        file.place.write(bytes);
        model.exists = true;
        model.bytes = bytes;
        open(READ_WRITE);
    }

    void step() {
        section_ = section();
        key_ = key();
        value_ = value();
        std::size_t const choice = dice_.below(24);
        if (choice == 2) return lifeCycle();
        if (choice >= 9 && choice < 12) return glance();
        change([this, choice](auto& table) {
            if (choice == 0) return table.createSection(section_);
            if (choice == 1) return table.removeSection(section_);
            if (choice < 6) return table.createKey(section_, key_);
            if (choice < 9) return table.removeKey(section_, key_);
            table.setValue(section_, key_, value_);
        });
    }

    void checkAll() {
        check();
        CHECK(file.getMode() == model.getMode());
        CHECK(file.is_open() == model.isOpen());
        CHECK(file.place.exists() == model.exists);
        if (model.exists) checkSame(file.place.bytes(), model.bytes);
    }

    /// A cheaper look: the names in one section and one value.
    void glance() {
        checkSame(file.enumerateKeys(section_), model.enumerateKeys(section_));
        checkSame(file.getValue(section_, key_), model.getValue(section_, key_));
        checkSame(file.enumerateSections(), model.enumerateSections());
    }

    /// Fewer names make more duplicates and more matches.
    std::size_t sectionNames = 4;
    std::size_t keyNames = 6;

private:
    Dice dice_;
    std::wstring section_;
    std::wstring key_;
    std::wstring value_;

    /// Each name in several spellings, and some that are easily taken for another.
    std::wstring name(std::wstring const& stem, std::size_t count) {
        std::size_t const number = dice_.below(count);
        if (dice_.oneIn(40)) return L"";
        std::wstring result = stem + std::to_wstring(number);
        if (number % 5 == 4) result += L"\u00C9";
        if (number % 7 == 6) result += L"\u4E2D\U0001F600";
        for (wchar_t& c : result) {
            if (c >= L'a' && c <= L'z' && dice_.oneIn(2)) c -= L'a' - L'A';
        }
        if (dice_.oneIn(30)) result += L'\0';
        if (dice_.oneIn(30)) result += L" x";
        return result;
    }

    std::wstring section() { return name(L"section", sectionNames); }
    std::wstring key() { return name(L"key", keyNames); }

    std::wstring value() {
        static std::wstring const alphabet = L"[]=#; \t\n\r\0aZ\u00E9\u20AC\U0001F600\xD800"s +
                                             static_cast<wchar_t>(0x80000041) +
                                             static_cast<wchar_t>(0xFFFFFFFF);
        if (dice_.oneIn(50)) return std::wstring(dice_.below(20000), dice_.from(alphabet));
        return dice_.text(alphabet, 12);
    }

    /// Both succeed, or both fail.
    template <class Both>
    void attempt(Both both) {
        std::string const message = messageOf<std::runtime_error>([&] { both(file); });
        CHECK(message == (both(model) ? "<nothing>" : "failed to open file."));
    }

    void open(unsigned long mode) {
        attempt([mode](auto& table) { return table.open(mode); });
    }

    void lifeCycle() {
        static std::vector<unsigned long> const modes{READ,       READ_WRITE, READ_WRITE,
                                                      READ_WRITE, READ_WRITE, WRITE};
        std::size_t const choice = dice_.below(8);
        if (choice == 0) return change([this](auto& table) { table.setMode(value_.size() % 4); });
        if (choice == 1) return open(dice_.from(modes)); // perhaps on the open file
        if (choice < 5) return attempt([](auto& table) { return table.synchronize(); });
        change([](auto& table) { table.close(); });
        checkSame(file.place.bytes(), model.bytes);
        open(dice_.from(modes));
    }
};

} // namespace

TEST_CASE("random operations on small tables agree with the model after every step") {
    for (unsigned seed = 1; seed <= 30; ++seed) {
        CAPTURE(seed);
        RandomTwins twins(seed);
        twins.begin(seed % 30);
        for (int step = 0; step < 80; ++step) {
            CAPTURE(step);
            twins.step();
            twins.checkAll();
        }
    }
}

TEST_CASE("random operations on tables of hundreds of entries agree with the model") {
    for (unsigned seed = 1; seed <= 8; ++seed) {
        CAPTURE(seed);
        RandomTwins twins(seed);
        twins.sectionNames = 3 + seed * 2;
        twins.keyNames = 40;
        twins.begin(400);
        for (int step = 0; step < 600; ++step) {
            CAPTURE(step);
            twins.step();
            twins.glance();
            if (step % 100 == 0) twins.checkAll();
        }
        twins.checkAll();
    }
}

TEST_CASE("tables of every size up to two hundred find, miss and remove as the model does") {
    test::PlainLocale const plain;
    for (std::size_t size = 0; size <= 200; ++size) {
        CAPTURE(size);
        Twins<> twins;
        twins.change([size](auto& table) {
            for (std::size_t i = 0; i < size; ++i) {
                std::wstring const key = L"Key" + std::to_wstring(i);
                table.setValue(L"Section" + std::to_wstring(i % 3), key, key);
            }
        });
        for (std::size_t i = 0; i < size; ++i) {
            std::wstring const number = std::to_wstring(i);
            checkSame(twins.file.getValue(L"SECTION" + std::to_wstring(i % 3), L"KEY" + number),
                      L"Key" + number);
        }
        checkSame(twins.file.getValue(L"Section0", L"Key" + std::to_wstring(size)), L"");
        checkSame(twins.file.getValue(L"Section1", L"Key0"), L"");
        twins.change([size](auto& table) {
            for (std::size_t const i : {size / 2, std::size_t(0), size - 1}) {
                table.removeKey(L"section" + std::to_wstring(i % 3), L"key" + std::to_wstring(i));
            }
        });
        twins.check();
        checkSame(drain(twins.file), twins.model.settings);
    }
}

TEST_CASE("in a table of six thousand entries every key is found and every other is missed") {
    std::string bytes;
    for (int section = 0; section < 60; ++section) {
        bytes += "[Section " + std::to_string(section) + "]\n";
        for (int key = 0; key < 100; ++key) {
            std::string const number = std::to_string(section * 100 + key);
            bytes += "Key " + std::to_string(key * 7919 % 100) + "=value " + number + "\n";
        }
    }
    Settings const expected = sortedSettings(bytes);
    CHECK(expected.size() == 6000U);
    SettingsFile file(bytes, READ_WRITE);
    for (Setting const& s : expected) {
        // Keys and sections differ in their numbers, so the entry itself is the first match.
        CHECK(file.getValue(L's' + s.section.substr(1), L"KEY" + s.key.substr(3)) == s.value);
    }
    for (int section = 0; section < 60; ++section) {
        std::wstring const name = L"section " + std::to_wstring(section);
        CHECK(file.getValue(name, L"Key 100").empty());
        CHECK(file.getValue(name, L"Key").empty());
        CHECK(file.getValue(name + L" ", L"Key 1").empty());
        CHECK(file.getValue(L"Key 1", name).empty());
        CHECK(file.enumerateKeys(name).size() == 100U);
    }
    CHECK(file.enumerateSections().size() == 60U);
    file.close();
    CHECK(file.place.bytes() == test::settingsText(expected));
}

TEST_CASE("sections and keys that come and go by the thousand leave the table right") {
    std::string bytes;
    for (int i = 0; i < 10; ++i) bytes += "[kept " + std::to_string(i) + "]\nk=v\nl=w\n";
    Twins<> twins;
    twins.file.place.write(bytes);
    twins.file.open(READ_WRITE);
    twins.model.settings = test::parseSettings(bytes);
    for (int i = 0; i < 4000; ++i) {
        CAPTURE(i);
        std::wstring const section = L"section " + std::to_wstring(i % 300);
        std::wstring const key = L"key " + std::to_wstring(i % 7);
        twins.change([&](auto& table) {
            table.setValue(section, key, std::to_wstring(i));
            if (i % 10 == 0) table.setValue(L"KEPT " + std::to_wstring(i / 10 % 10), key, L"too");
            table.removeKey(section, key);
        });
        if (i % 97 == 0) twins.check();
    }
    twins.check();
    test::sortSettings(twins.model.settings);
    twins.file.close();
    CHECK(twins.file.place.bytes() == test::settingsText(twins.model.settings));
}

TEST_CASE("names of the same length, letters or ends are told apart") {
    std::vector<std::wstring> names{L"", L" ", L"=", L"ab", L"ba", L"aab", L"aba", L"baa", L"abab"};
    std::wstring const stem = L"a name of some length";
    for (std::size_t i = 0; i < stem.size(); ++i) {
        for (wchar_t const c : {L'b', L'`', L'@', L'0', L'\x10', L'\x01', L'\x161', L'\x10061'}) {
            std::wstring name = stem;
            name[i] = c; // one character is another
            names.push_back(name);
        }
        names.push_back(stem.substr(0, i));
        names.push_back(stem.substr(i));
        names.push_back(stem.substr(i) + stem.substr(0, i));
    }
    for (std::size_t length = 1; length < 70; ++length) {
        names.push_back(std::wstring(length, L'x'));
        names.push_back(std::wstring(length, L'\u4E2D'));
        names.push_back(std::wstring(length - 1, L'x') + L'\x7F');
        names.push_back(std::wstring(length - 1, L'x') + L"\0y"s);
    }
    Twins<> twins;
    twins.change([&names](auto& table) {
        for (std::size_t i = 0; i < names.size(); ++i) {
            table.setValue(names[i * 31 % names.size()], names[i], std::to_wstring(i));
        }
    });
    twins.check();
    auto const checkValue = [&twins](std::wstring const& section, std::wstring const& key) {
        checkSame(twins.file.getValue(section, key), twins.model.getValue(section, key));
    };
    for (std::size_t i = 0; i < names.size(); ++i) {
        for (std::size_t const j : {i, i + 1, i * 31, i * 7 + 3, i * 31 + 31}) {
            checkValue(names[j % names.size()], names[i]);
            checkValue(names[i], names[j % names.size()]);
        }
    }
}

TEST_CASE("long keys and values of every length around the sizes of blocks are held") {
    Twins<> twins;
    twins.file.open(READ_WRITE);
    twins.change([](auto& table) {
        for (std::size_t length = 0; length <= 150; ++length) {
            for (wchar_t const last : {L'z', L'\u00E9', L'\U0001F600'}) {
                std::wstring const key = std::wstring(length, L'k') + last;
                table.setValue(L"S" + key, key, std::wstring(length, L'v') + last);
            }
        }
    });
    twins.check();
    twins.file.synchronize();
    test::sortSettings(twins.model.settings);
    twins.check();
    CHECK(twins.file.place.bytes() == test::settingsText(twins.model.settings));
}

namespace {

/// wcscasecmp subtracts 32-bit units, so of three of these each may be less than the next.
std::wstring inconsistentUnits() {
    std::wstring units;
    for (unsigned long const unit : {0x80000000UL, 0xFFFFFFFFUL, 0xC0000000UL, 0x7FFFFFFFUL,
                                     0x40000000UL, 0x80000001UL, 0x61UL, 0xBFFFFFFFUL, 0x1UL}) {
        units.push_back(static_cast<wchar_t>(unit));
    }
    return units;
}

void sortByUnits(Settings& settings) {
    std::sort(settings.begin(), settings.end(), [](Setting const& a, Setting const& b) {
        return a.section != b.section ? a.section < b.section : a.key < b.key;
    });
}

} // namespace

TEST_CASE("units that compare inconsistently neither crash the sorting nor lose an entry") {
    std::wstring const units = inconsistentUnits();
    for (std::size_t size = 0; size <= 300; ++size) {
        CAPTURE(size);
        Dice dice(static_cast<unsigned>(size) + 1);
        SettingsFile file("", WRITE);
        Settings expected;
        while (expected.size() < size) {
            std::wstring const section = dice.text(units, 2);
            std::wstring const key = dice.text(units, 4);
            if (!file.getValue(section, key).empty()) continue;
            std::wstring const value = std::to_wstring(expected.size()) + units[size % 9];
            file.setValue(section, key, value);
            expected.push_back({section, key, value});
        }
        // close sorts the table; without a place to write to it keeps it.
        std::filesystem::remove_all(file.place.directory().path());
        CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "failed to open file.");
        Settings sorted = drain(file);
        sortByUnits(sorted);
        sortByUnits(expected);
        checkSame(sorted, expected);
    }
}

TEST_CASE("a table with units that compare inconsistently is written whole") {
    SettingsFile file("", WRITE);
    Dice dice(7);
    for (int i = 0; i < 300; ++i) {
        wchar_t const unit = static_cast<wchar_t>(dice.below(4) << 30 | 0x41);
        file.setValue(L"s", unit + std::to_wstring(i), L"v");
    }
    file.close();
    std::string const bytes = file.place.bytes();
    for (int i = 0; i < 300; ++i) {
        CAPTURE(i);
        CHECK(bytes.find(std::to_string(i) + "=v\n") != std::string::npos);
    }
    CHECK(std::count(bytes.begin(), bytes.end(), '\n') == 301);
}

namespace {

/// Characters that some locale folds in a way of its own, with their partners.
std::wstring const folded =
    L"IiKkSsJjAaEe\u0130\u0131\u212A\u017F\u00DF\u1E9E\u00E9\u00C9\u00E5\u00C5\u212B\u00B5\u03BC"
    L"\u039C"
    L"\u03A3\u03C3\u03C2\u03A9\u03C9\u2126\u01C4\u01C5\u01C6\u0416\u0436\u0390\u1FD3\u10A0\u2D00"
    L"\u13A0\uAB70\u1E9B\u1E60\u0345\u0399\u03B9\u1FBE\u0149\u01F0\U00010400\U00010428";

/// All names of one and some of two characters that fold.
std::vector<std::wstring> foldedNames() {
    std::vector<std::wstring> names;
    for (wchar_t const a : folded) {
        names.push_back(std::wstring(1, a));
        names.push_back(L"t" + std::wstring(1, a) + L"tle");
    }
    for (wchar_t const a : folded.substr(0, 18)) {
        for (wchar_t const b : folded.substr(0, 18)) names.push_back(std::wstring{a, b});
    }
    return names;
}

} // namespace

TEST_CASE("lookups agree with a scan by compare under the locale of the moment") {
    std::vector<std::wstring> const names = foldedNames();
    std::string bytes = "[keys]\n";
    for (std::wstring const& name : names) bytes += Koru::make_string(name) + "=" + "v\n";
    for (wchar_t const c : folded) {
        std::string const name = Koru::make_string(std::wstring(1, c));
        bytes += "[" + name + "]\nk=in " + name + "\n";
    }
    inEachLocale([&] {
        // Sorted under one locale, asked under each of the others.
        Twins<> twins;
        twins.file.place.write(bytes);
        twins.file.open(READ);
        twins.model.settings = sortedSettings(bytes);
        twins.check();
        inEachLocale([&] {
            twins.check();
            auto const checkValue = [&twins](std::wstring const& section, std::wstring const& key) {
                checkSame(twins.file.getValue(section, key), twins.model.getValue(section, key));
            };
            for (std::wstring const& name : names) {
                checkValue(L"KEYS", name);
                checkValue(name, L"K");
                checkValue(name, L"\u212A");
            }
            // Changes as well: what exists under this locale is not added again.
            twins.change([](auto& table) {
                for (wchar_t const c : folded) {
                    std::wstring const name(1, c);
                    table.createKey(name, L"k");
                    table.setValue(L"keys", name + L"x", name);
                }
                table.removeKey(L"keys", L"I");
                table.removeSection(L"\u017F");
            });
            twins.check();
        });
    });
}

TEST_CASE("every character with a case is found as wcscasecmp finds it, in each locale") {
    test::PlainLocale const plain;
    std::vector<std::wstring> keys;
    inEachLocale([&keys] {
        for (wint_t c = 0x80; c < 0x1F000; ++c) {
            if (std::towlower(c) == c && std::towupper(c) == c) continue;
            keys.push_back(std::wstring(1, static_cast<wchar_t>(c)));
        }
    });
    std::sort(keys.begin(), keys.end());
    keys.erase(std::unique(keys.begin(), keys.end()), keys.end());
    SettingsFile file;
    for (std::wstring const& key : keys) file.setValue(key, L"k", key);
    std::size_t folds = 0;
    std::size_t locales = 0;
    inEachLocale([&] {
        ++locales;
        for (std::size_t i = 0; i < keys.size(); ++i) {
            wint_t const c = static_cast<wint_t>(keys[i][0]);
            if (c >= 0x250 && i % 3 != 0) continue; // every third will do
            for (wint_t const other : {std::towlower(c), std::towupper(c)}) {
                std::wstring const partner(1, static_cast<wchar_t>(other));
                // The first that the C library takes for the same.
                auto const expected =
                    std::find_if(keys.begin(), keys.end(), [&partner](std::wstring const& key) {
                        return ::wcscasecmp(key.c_str(), partner.c_str()) == 0;
                    });
                std::wstring const found = file.getValue(partner, L"K");
                checkSame(found, expected == keys.end() ? L"" : *expected);
                if (found != partner) ++folds;
            }
        }
    });
    if (locales > 1) CHECK(folds > 0);
}

TEST_CASE("a locale set between open and lookup counts at the lookup") {
    test::PlainLocale const plain;
    std::string const previous = std::setlocale(LC_ALL, nullptr);
    REQUIRE(std::setlocale(LC_ALL, "C") != nullptr);
    SettingsFile file("[\xC3\x89t\xC3\xA9]\n\xC3\x85=lower comes first\n\xC3\xA5=second\n",
                      READ_WRITE);
    checkSame(file.getValue(L"\u00E9T\u00C9", L"\u00E5"), L"");
    CHECK(file.enumerateKeys(L"\u00E9T\u00C9").empty());
    if (std::setlocale(LC_ALL, "C.UTF-8") == nullptr) {
        test::skipped("there is no locale C.UTF-8");
    } else {
        checkSame(file.getValue(L"\u00E9T\u00C9", L"\u00E5"), L"lower comes first");
        CHECK(file.enumerateKeys(L"\u00E9T\u00C9").size() == 2U);
        file.setValue(L"\u00E9t\u00E9", L"A\u030A", L"3");
        file.createKey(L"\u00C9T\u00C9", L"\u00C5");
        file.close();
        CHECK(file.place.bytes() == "[\xC3\xA9t\xC3\xA9]\nA\xCC\x8A=3\n"
                                    "\xC3\x85=lower comes first\n\xC3\xA5=second\n");
    }
    REQUIRE(std::setlocale(LC_ALL, previous.c_str()) != nullptr);
}
