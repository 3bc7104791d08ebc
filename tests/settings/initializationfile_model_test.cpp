// The sectioned settings file against the plain model of support/settingsmodel.h: every short line,
// random files, random sequences of operations, large tables and the names that locales fold.
#include <doctest/doctest.h>

#include <locale.h>
#include <wchar.h>

#include <algorithm>
#include <clocale>
#include <cstddef>
#include <cstdlib>
#include <cwctype>
#include <filesystem>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/initializationfile.h>
#include <koru/string.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::InitializationFile;
using test::checkSame;
using test::checkTable;
using test::drain;
using test::loaded;
using test::messageOf;
using test::READ;
using test::READ_WRITE;
using test::Setting;
using test::Settings;
using test::SettingsFileModel;
using test::SettingsPlace;
using test::SettingsTableModel;
using test::WRITE;
using namespace std::string_literals;

namespace {

/// Calls `visit` with every string of up to `longest` characters of the alphabet.
template <class Visit>
void forEachLine(std::string const& alphabet, std::size_t longest, Visit visit) {
    visit(std::string());
    std::vector<std::string> lines{""};
    for (std::size_t length = 1; length <= longest; ++length) {
        std::vector<std::string> longer;
        for (std::string const& line : lines) {
            for (char const c : alphabet) {
                longer.push_back(line + c);
                visit(longer.back());
            }
        }
        lines.swap(longer);
    }
}

/// Opens a file of these bytes, compares the table with the model, writes it back and compares the
/// bytes, then reads and compares again.
void checkFile(SettingsPlace const& place, std::string const& bytes) {
    place.write(bytes);
    SettingsFileModel model;
    model.exists = true;
    model.bytes = bytes;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
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

/// Random choices that are the same on every run and every platform.
class Dice {
public:
    explicit Dice(unsigned seed) : engine_(seed) {}
    std::size_t below(std::size_t limit) { return engine_() % limit; }
    bool oneIn(std::size_t chances) { return below(chances) == 0; }
    template <class Sequence>
    typename Sequence::value_type const& from(Sequence const& choices) {
        return choices[below(choices.size())];
    }
    template <class String>
    String text(String const& alphabet, std::size_t longest) {
        String result;
        for (std::size_t length = below(longest + 1); length > 0; --length) {
            result += from(alphabet);
        }
        return result;
    }

private:
    std::mt19937 engine_;
};

std::string const syntax = "[]=#;aAb\t \r\n\0\x80\xC3\xA9\xE2\xFF\xC0"s;

} // namespace

TEST_CASE("every line of up to five characters of the syntax is read as the model reads it") {
    SettingsPlace const place;
    std::string bytes;
    std::size_t lines = 0;
    std::size_t total = 0;
    forEachLine("[]=#;a\t ", 5, [&](std::string const& line) {
        // A header of its own before each, and an entry behind it that shows the section then.
        bytes += "[h" + std::to_string(total++) + "]\n" + line + "\nk=v\n";
        if (++lines < 128) return;
        checkFile(place, bytes);
        bytes.clear();
        lines = 0;
    });
    checkFile(place, bytes);
    CHECK(total == 37449U);
}

TEST_CASE("every line of up to four characters of the syntax is read at the end of a file") {
    SettingsPlace const place;
    forEachLine("[]=#;a\t ", 4, [&](std::string const& line) {
        CAPTURE(line);
        std::string const bytes = "[h]\nb=1\n" + line;
        Settings expected = test::parseSettings(bytes);
        test::sortSettings(expected);
        checkSame(loaded(place, bytes), expected);
    });
}

TEST_CASE("every line of up to three bytes that matter to UTF-8 is read as the model reads it") {
    SettingsPlace const place;
    std::string bytes;
    std::size_t lines = 0;
    forEachLine("[=a\0\x80\xBF\xC0\xC3\xE2\xFF"s, 3, [&](std::string const& line) {
        bytes += "[h" + std::to_string(lines) + "]\n" + line + "\nk=v\n[" + line + "]\nk" +
                 std::to_string(lines) + "=v\nk" + line + "=v" + line + "\n";
        if (++lines % 64 != 0) return;
        checkFile(place, bytes);
        bytes.clear();
    });
    checkFile(place, bytes);
}

TEST_CASE("random files are read and written as the model does") {
    SettingsPlace const place;
    for (unsigned seed = 1; seed <= 1500; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string bytes = dice.oneIn(4) ? "" : "[s]\n";
        bytes += dice.text(syntax, 300);
        Settings expected = test::parseSettings(bytes);
        test::sortSettings(expected);
        checkSame(loaded(place, bytes), expected);
        checkFile(place, bytes);
    }
}

TEST_CASE("random files of likely lines are read and written as the model does") {
    SettingsPlace const place;
    std::vector<std::string> const pieces{
        "[",     "]",     "=",       "#",        ";",        "\n",   "\n",       "\n",
        "[a]\n", "[A]\n", "[b c]\n", "key",      "KEY",      "Key2", "=value",   " ",
        "\t",    "k=v\n", "K=w\n",   "\xC3\xA9", "\xC3\x89", "\r\n", "\xC0\x80", "\0"s};
    for (unsigned seed = 1; seed <= 300; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string bytes = "[s]\n";
        for (std::size_t count = dice.below(400); count > 0; --count) bytes += dice.from(pieces);
        checkFile(place, bytes);
    }
}

TEST_CASE("removeSection does the same as the model on every arrangement of eight entries") {
    InitializationFile file;
    for (unsigned pattern = 0; pattern < 256; ++pattern) {
        CAPTURE(pattern);
        SettingsTableModel model;
        for (unsigned i = 0; i < 8; ++i) {
            std::wstring const section = (pattern >> i & 1U) != 0 ? L"s" : L"t";
            std::wstring const key = std::to_wstring(i);
            file.setValue(section, key, L"v");
            model.setValue(section, key, L"v");
        }
        file.removeSection(L"S");
        model.removeSection(L"S");
        checkSame(drain(file), model.settings);
    }
}

namespace {

/// A library's file and the model, given the same commands.
class Pair {
public:
    explicit Pair(unsigned seed) : dice_(seed), file_(place_.path()) {}

    /// A file of likely entries to begin with.
    void begin(std::size_t entries) {
        std::string bytes;
        for (; entries > 0; --entries) {
            if (dice_.oneIn(5)) bytes += "[" + Koru::make_string(section()) + "]\n";
            bytes += Koru::make_string(key()) + "=" + Koru::make_string(value()) + "\n";
        }
        place_.write(bytes);
        model_.exists = true;
        model_.bytes = bytes;
        checkSame(openResult(READ_WRITE), L"<nothing>");
    }

    void step() {
        section_ = section();
        key_ = key();
        value_ = value();
        std::size_t const choice = dice_.below(24);
        if (choice == 0) {
            file_.createSection(section_);
            model_.createSection(section_);
        } else if (choice == 1) {
            file_.removeSection(section_);
            model_.removeSection(section_);
        } else if (choice == 2) {
            lifeCycle();
        } else if (choice < 6) {
            file_.createKey(section_, key_);
            model_.createKey(section_, key_);
        } else if (choice < 9) {
            file_.removeKey(section_, key_);
            model_.removeKey(section_, key_);
        } else if (choice < 12) {
            checkSame(file_.getValue(section_, key_), model_.getValue(section_, key_));
            checkSame(file_.enumerateKeys(section_), model_.enumerateKeys(section_));
        } else {
            file_.setValue(section_, key_, value_);
            model_.setValue(section_, key_, value_);
        }
    }

    void check() {
        checkTable(file_, model_);
        CHECK(file_.getMode() == model_.getMode());
        CHECK(file_.is_open() == model_.isOpen());
        CHECK(place_.exists() == model_.exists);
        if (model_.exists) checkSame(place_.bytes(), model_.bytes);
    }

    /// A cheaper look: the names in one section and one value.
    void glance() {
        checkSame(file_.enumerateKeys(section_), model_.enumerateKeys(section_));
        checkSame(file_.getValue(section_, key_), model_.getValue(section_, key_));
        checkSame(file_.enumerateSections(), model_.enumerateSections());
    }

    /// Fewer names make more duplicates and more matches.
    std::size_t sectionNames = 4;
    std::size_t keyNames = 6;

private:
    SettingsPlace place_;
    Dice dice_;
    InitializationFile file_;
    SettingsFileModel model_;
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

    std::wstring openResult(unsigned long mode) {
        std::string const message = messageOf<std::runtime_error>([&] { file_.open(mode); });
        CHECK((message == "<nothing>") == model_.open(mode));
        return std::wstring(message.begin(), message.end());
    }

    void lifeCycle() {
        static std::vector<unsigned long> const modes{READ,       READ_WRITE, READ_WRITE,
                                                      READ_WRITE, READ_WRITE, WRITE};
        switch (dice_.below(8)) {
        case 0:
            file_.setMode(value_.size() % 4);
            model_.setMode(value_.size() % 4);
            break;
        case 1:
            openResult(dice_.from(modes)); // perhaps on the open file
            break;
        case 2:
        case 3:
        case 4: {
            std::string const message = messageOf<std::runtime_error>([&] { file_.synchronize(); });
            CHECK((message == "<nothing>") == model_.synchronize());
            break;
        }
        default:
            file_.close();
            model_.close();
            checkSame(place_.bytes(), model_.bytes);
            openResult(dice_.from(modes));
        }
    }
};

} // namespace

TEST_CASE("random operations on small tables agree with the model after every step") {
    for (unsigned seed = 1; seed <= 30; ++seed) {
        CAPTURE(seed);
        Pair pair(seed);
        pair.begin(seed % 30);
        for (int step = 0; step < 80; ++step) {
            CAPTURE(step);
            pair.step();
            pair.check();
        }
    }
}

TEST_CASE("random operations on tables of hundreds of entries agree with the model") {
    for (unsigned seed = 1; seed <= 8; ++seed) {
        CAPTURE(seed);
        Pair pair(seed);
        pair.sectionNames = 3 + seed * 2;
        pair.keyNames = 40;
        pair.begin(400);
        for (int step = 0; step < 600; ++step) {
            CAPTURE(step);
            pair.step();
            pair.glance();
            if (step % 100 == 0) pair.check();
        }
        pair.check();
    }
}

TEST_CASE("tables of every size up to two hundred find, miss and remove as the model does") {
    InitializationFile file;
    for (std::size_t size = 0; size <= 200; ++size) {
        CAPTURE(size);
        SettingsTableModel model;
        for (std::size_t i = 0; i < size; ++i) {
            std::wstring const section = L"Section" + std::to_wstring(i % 3);
            std::wstring const key = L"Key" + std::to_wstring(i);
            file.setValue(section, key, key);
            model.setValue(section, key, key);
        }
        for (std::size_t i = 0; i < size; ++i) {
            checkSame(
                file.getValue(L"SECTION" + std::to_wstring(i % 3), L"KEY" + std::to_wstring(i)),
                L"Key" + std::to_wstring(i));
        }
        checkSame(file.getValue(L"Section0", L"Key" + std::to_wstring(size)), L"");
        checkSame(file.getValue(L"Section1", L"Key0"), L"");
        for (std::size_t const i : {size / 2, std::size_t(0), size - 1}) {
            file.removeKey(L"section" + std::to_wstring(i % 3), L"key" + std::to_wstring(i));
            model.removeKey(L"section" + std::to_wstring(i % 3), L"key" + std::to_wstring(i));
        }
        checkTable(file, model);
        checkSame(drain(file), model.settings);
    }
}

TEST_CASE("in a table of six thousand entries every key is found and every other is missed") {
    SettingsPlace const place;
    std::string bytes;
    for (int section = 0; section < 60; ++section) {
        bytes += "[Section " + std::to_string(section) + "]\n";
        for (int key = 0; key < 100; ++key) {
            std::string const number = std::to_string(section * 100 + key);
            bytes += "Key " + std::to_string(key * 7919 % 100) + "=value " + number + "\n";
        }
    }
    place.write(bytes);
    Settings expected = test::parseSettings(bytes);
    CHECK(expected.size() == 6000U);
    test::sortSettings(expected);
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    for (Setting const& s : expected) {
        // Keys and sections differ in their numbers, so the entry itself is the first match.
        std::wstring section = s.section;
        std::wstring key = s.key;
        section[0] = L's';
        key[2] = L'Y';
        CHECK(file.getValue(section, key) == s.value);
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
    CHECK(place.bytes() == test::settingsText(expected));
}

TEST_CASE("sections and keys that come and go by the thousand leave the table right") {
    SettingsPlace const place;
    std::string bytes;
    for (int i = 0; i < 10; ++i) bytes += "[kept " + std::to_string(i) + "]\nk=v\n";
    place.write(bytes);
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    SettingsTableModel model;
    model.settings = test::parseSettings(bytes);
    for (int i = 0; i < 4000; ++i) {
        CAPTURE(i);
        std::wstring const section = L"section " + std::to_wstring(i % 300);
        std::wstring const key = L"key " + std::to_wstring(i % 7);
        file.setValue(section, key, std::to_wstring(i));
        model.setValue(section, key, std::to_wstring(i));
        if (i % 10 == 0) {
            file.setValue(L"KEPT " + std::to_wstring(i / 10 % 10), key, L"also kept");
            model.setValue(L"KEPT " + std::to_wstring(i / 10 % 10), key, L"also kept");
        }
        file.removeKey(section, key);
        model.removeKey(section, key);
        if (i % 97 == 0) checkTable(file, model);
    }
    checkTable(file, model);
    test::sortSettings(model.settings);
    file.close();
    CHECK(place.bytes() == test::settingsText(model.settings));
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
    InitializationFile file;
    SettingsTableModel model;
    for (std::size_t i = 0; i < names.size(); ++i) {
        std::wstring const& section = names[i * 31 % names.size()];
        file.setValue(section, names[i], std::to_wstring(i));
        model.setValue(section, names[i], std::to_wstring(i));
    }
    checkTable(file, model);
    for (std::size_t i = 0; i < names.size(); ++i) {
        for (std::size_t const j : {i, i + 1, i * 31, i * 7 + 3, i * 31 + 31}) {
            std::wstring const& section = names[j % names.size()];
            checkSame(file.getValue(section, names[i]), model.getValue(section, names[i]));
            checkSame(file.getValue(names[i], section), model.getValue(names[i], section));
        }
    }
}

TEST_CASE("long keys and values of every length around the sizes of blocks are held") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    SettingsTableModel model;
    for (std::size_t length = 0; length <= 150; ++length) {
        for (wchar_t const last : {L'z', L'\u00E9', L'\U0001F600'}) {
            std::wstring const key = std::wstring(length, L'k') + last;
            std::wstring const value = std::wstring(length, L'v') + last;
            file.setValue(L"S" + key, key, value);
            model.setValue(L"S" + key, key, value);
        }
    }
    checkTable(file, model);
    file.synchronize();
    test::sortSettings(model.settings);
    checkTable(file, model);
    CHECK(place.bytes() == test::settingsText(model.settings));
}

TEST_CASE("units that compare inconsistently neither crash the sorting nor lose an entry") {
    // wcscasecmp subtracts 32-bit units, so of three names each may be less than the next.
    std::wstring units;
    for (unsigned long const unit : {0x80000000UL, 0xFFFFFFFFUL, 0xC0000000UL, 0x7FFFFFFFUL,
                                     0x40000000UL, 0x80000001UL, 0x61UL, 0xBFFFFFFFUL, 0x1UL}) {
        units.push_back(static_cast<wchar_t>(unit));
    }
    test::TempDir const directory;
    std::string const folder = directory / "folder";
    auto const byNames = [](Setting const& a, Setting const& b) {
        if (a.section != b.section) return a.section < b.section;
        return a.key < b.key;
    };
    for (std::size_t size = 0; size <= 300; ++size) {
        CAPTURE(size);
        Dice dice(static_cast<unsigned>(size) + 1);
        std::filesystem::create_directory(folder);
        InitializationFile file(folder + "/settings.ini");
        file.open(WRITE);
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
        std::filesystem::remove_all(folder);
        CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "failed to open file.");
        Settings sorted = drain(file);
        std::sort(sorted.begin(), sorted.end(), byNames);
        std::sort(expected.begin(), expected.end(), byNames);
        checkSame(sorted, expected);
    }
}

TEST_CASE("a table with units that compare inconsistently is written whole") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(WRITE);
    Dice dice(7);
    for (int i = 0; i < 300; ++i) {
        std::wstring key = std::to_wstring(i);
        key.insert(0, 1, static_cast<wchar_t>(dice.below(4) << 30 | 0x41));
        file.setValue(L"s", key, L"v");
    }
    file.close();
    std::string const bytes = place.bytes();
    for (int i = 0; i < 300; ++i) {
        CAPTURE(i);
        CHECK(bytes.find(std::to_string(i) + "=v\n") != std::string::npos);
    }
    CHECK(std::count(bytes.begin(), bytes.end(), '\n') == 301);
}

// ------------------------------------------------------------------------------------- the locales

namespace {

/// A locale for the calls of this thread, for the time of a scope.
class ThreadLocale {
public:
    explicit ThreadLocale(locale_t locale) : previous_(::uselocale(locale)) {}
    ThreadLocale(ThreadLocale const&) = delete;
    ThreadLocale& operator=(ThreadLocale const&) = delete;
    ~ThreadLocale() { ::uselocale(previous_); }

private:
    locale_t previous_;
};

/// The locales that the tests go through; Turkish is compiled here where it can be.
class Locales {
public:
    Locales() {
        add("C", "C");
        add("C.UTF-8", "C.UTF-8");
        std::string const name = "tr_TR.UTF-8";
        test::execute("/usr/bin/localedef",
                      {"localedef", "-i", "tr_TR", "-f", "UTF-8", directory_ / name});
        ::setenv("LOCPATH", directory_.path().c_str(), 1);
        add("Turkish", name.c_str());
        ::unsetenv("LOCPATH");
    }
    Locales(Locales const&) = delete;
    Locales& operator=(Locales const&) = delete;
    ~Locales() {
        for (locale_t const locale : all_) ::freelocale(locale);
    }
    std::vector<locale_t> const& all() const { return all_; }

private:
    test::TempDir directory_;
    std::vector<locale_t> all_;

    void add(char const* label, char const* name) {
        std::string const previous = std::setlocale(LC_ALL, nullptr);
        if (std::setlocale(LC_ALL, name) != nullptr) {
            all_.push_back(::duplocale(LC_GLOBAL_LOCALE));
        } else {
            MESSAGE("this locale is not to be had here and was not tested: ", label);
        }
        std::setlocale(LC_ALL, previous.c_str());
    }
};

Locales const& locales() {
    static Locales const theLocales; // compiling one takes a second
    return theLocales;
}

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
    SettingsPlace const place;
    std::vector<std::wstring> const names = foldedNames();
    std::string bytes = "[keys]\n";
    for (std::wstring const& name : names) bytes += Koru::make_string(name) + "=" + "v\n";
    for (wchar_t const c : folded) {
        std::string const name = Koru::make_string(std::wstring(1, c));
        bytes += "[" + name + "]\nk=in " + name + "\n";
    }
    place.write(bytes);
    for (std::size_t opened = 0; opened < locales().all().size(); ++opened) {
        // Sorted under one locale, asked under each of the others.
        CAPTURE(opened);
        InitializationFile file(place.path());
        SettingsTableModel model;
        {
            ThreadLocale const locale(locales().all()[opened]);
            file.open(READ);
            model.settings = test::parseSettings(bytes);
            test::sortSettings(model.settings);
            checkTable(file, model);
        }
        for (std::size_t asked = 0; asked < locales().all().size(); ++asked) {
            CAPTURE(asked);
            ThreadLocale const locale(locales().all()[asked]);
            checkTable(file, model);
            for (std::wstring const& name : names) {
                checkSame(file.getValue(L"KEYS", name), model.getValue(L"KEYS", name));
                checkSame(file.getValue(name, L"K"), model.getValue(name, L"K"));
                checkSame(file.getValue(name, L"\u212A"), model.getValue(name, L"\u212A"));
            }
            // Changes as well: what exists under this locale is not added again.
            for (wchar_t const c : folded) {
                std::wstring const name(1, c);
                file.createKey(name, L"k");
                model.createKey(name, L"k");
                file.setValue(L"keys", name + L"x", name);
                model.setValue(L"keys", name + L"x", name);
            }
            file.removeKey(L"keys", L"I");
            model.removeKey(L"keys", L"I");
            file.removeSection(L"\u017F");
            model.removeSection(L"\u017F");
            checkTable(file, model);
        }
    }
}

TEST_CASE("every character with a case is found as wcscasecmp finds it, in each locale") {
    InitializationFile file;
    std::vector<std::wstring> keys;
    for (locale_t const locale : locales().all()) {
        for (wint_t c = 0x80; c < 0x1F000; ++c) {
            if (::towlower_l(c, locale) == c && ::towupper_l(c, locale) == c) continue;
            keys.push_back(std::wstring(1, static_cast<wchar_t>(c)));
        }
    }
    std::sort(keys.begin(), keys.end());
    keys.erase(std::unique(keys.begin(), keys.end()), keys.end());
    {
        ThreadLocale const c(locales().all()[0]);
        for (std::wstring const& key : keys) file.setValue(key, L"k", key);
    }
    std::size_t folds = 0;
    for (locale_t const locale : locales().all()) {
        ThreadLocale const current(locale);
        for (std::size_t i = 0; i < keys.size(); ++i) {
            wint_t const c = static_cast<wint_t>(keys[i][0]);
            if (c >= 0x250 && i % 3 != 0) continue; // every third will do
            for (wint_t const other : {::towlower_l(c, locale), ::towupper_l(c, locale)}) {
                std::wstring const partner(1, static_cast<wchar_t>(other));
                std::wstring const found = file.getValue(partner, L"K");
                // The first that the C library takes for the same.
                std::wstring expected;
                for (std::wstring const& key : keys) {
                    if (::wcscasecmp(key.c_str(), partner.c_str()) != 0) continue;
                    expected = key;
                    break;
                }
                checkSame(found, expected);
                if (found != partner) ++folds;
            }
        }
    }
    if (locales().all().size() > 1) CHECK(folds > 0);
}

TEST_CASE("a locale set between open and lookup counts at the lookup") {
    std::string const previous = std::setlocale(LC_ALL, nullptr);
    SettingsPlace const place;
    place.write("[\xC3\x89t\xC3\xA9]\n\xC3\x85=lower comes first\n\xC3\xA5=second\n");
    REQUIRE(std::setlocale(LC_ALL, "C") != nullptr);
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    checkSame(file.getValue(L"\u00E9T\u00C9", L"\u00E5"), L"");
    CHECK(file.enumerateKeys(L"\u00E9T\u00C9").empty());
    if (std::setlocale(LC_ALL, "C.UTF-8") == nullptr) {
        MESSAGE("this system has no C.UTF-8: the change of locale was not tested");
    } else {
        checkSame(file.getValue(L"\u00E9T\u00C9", L"\u00E5"), L"lower comes first");
        CHECK(file.enumerateKeys(L"\u00E9T\u00C9").size() == 2U);
        file.setValue(L"\u00E9t\u00E9", L"A\u030A", L"3");
        file.createKey(L"\u00C9T\u00C9", L"\u00C5");
        file.close();
        CHECK(place.bytes() == "[\xC3\xA9t\xC3\xA9]\nA\xCC\x8A=3\n\xC3\x85=lower comes first\n"
                               "\xC3\xA5=second\n");
    }
    REQUIRE(std::setlocale(LC_ALL, previous.c_str()) != nullptr);
}
