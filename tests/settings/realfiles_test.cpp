// Settings files of other programs, see data/settings/SOURCES.md. What they say is worked out here
// line by line, apart from the model and the library's parser.
#include <doctest/doctest.h>

#include <cstddef>
#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <koru/initializationfile.h>
#include <koru/string.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/tempdir.h"

using Koru::InitializationFile;
using test::checkSame;
using test::READ;
using test::READ_WRITE;
using test::Setting;
using test::Settings;
using test::SettingsPlace;

namespace {

std::string const folder = std::string(KORU_TEST_DATA) + "/settings/";

/// A file, with the numbers of its entries and of its sections that have any.
struct Sample {
    std::string name;
    std::size_t entries;
    std::size_t sections;
};

std::vector<Sample> const samples{
    {"BreezeDark.colors", 171, 13},
    {"DarkPastels.colorscheme", 42, 31},
    {"avahi-daemon.conf", 7, 3},
    {"fail2ban-jail.conf", 281, 93},
    {"hicolor-index.theme", 2505, 650},
    {"libinput-50-system-apple.quirks", 86, 14},
    {"mc-seasons-spring16M.ini", 152, 18},
    {"openssl.cnf", 114, 22},
    {"org.gnome.Mahjongg.desktop", 229, 1},
    {"org.kde.konsole.desktop", 381, 3},
    {"php.ini-production", 100, 14},
    {"pyparsing-Setup.ini", 64, 3},
    {"smb.conf", 31, 4},
    {"systemd-journald.service", 33, 2},
};

/// A line that counts, as bytes: the header that it stands under, its key and its value.
struct Line {
    std::string header;
    std::string key;
    std::string value;
};

bool isBlank(char c) { return c == ' ' || c == '\t'; }

std::string stripped(std::string line) {
    while (!line.empty() && isBlank(line.back())) line.pop_back();
    while (!line.empty() && isBlank(line.front())) line.erase(line.begin());
    return line;
}

/// The name in a header line. None of the files has a header of nothing but brackets.
std::string headerName(std::string line) {
    while (line.back() == ']') line.pop_back();
    while (line.front() == '[') line.erase(line.begin());
    return line;
}

std::vector<Line> linesOf(std::string const& path) {
    std::vector<Line> lines;
    std::ifstream in(path, std::ios::binary);
    std::string header;
    for (std::string raw; std::getline(in, raw);) {
        std::string const line = stripped(raw);
        char const first = line.empty() ? '#' : line[0];
        if (first == '#' || first == ';') continue;
        if (first == '[') {
            header = headerName(line);
            continue;
        }
        std::istringstream parts(line);
        std::string key;
        std::getline(parts, key, '=');
        if (parts.eof() || key.empty() || header.empty()) continue;
        std::string value(std::istreambuf_iterator<char>(parts), {});
        lines.push_back({header, key, value});
    }
    return lines;
}

/// ASCII letters in lower case, which is all that these names need in the C locale.
std::string lowered(std::string text) {
    for (char& c : text) {
        if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
    }
    return text;
}

std::wstring wide(std::string const& text) { return Koru::make_wstring(text); }

/// Another spelling of the same name.
std::wstring respelt(std::string text) {
    for (char& c : text) {
        if (c >= 'a' && c <= 'z') c = static_cast<char>(c - 'a' + 'A');
    }
    return wide(text);
}

Settings sortedSettings(std::string const& bytes) {
    Settings settings = test::parseSettings(bytes);
    test::sortSettings(settings);
    return settings;
}

} // namespace

TEST_CASE("every sample is in the table of samples, with its entries and sections") {
    std::size_t files = 0;
    for (auto const& entry : std::filesystem::directory_iterator(folder)) {
        if (entry.path().filename() != "SOURCES.md") ++files;
    }
    CHECK(files == samples.size());
    for (Sample const& sample : samples) {
        CAPTURE(sample.name);
        std::vector<Line> const lines = linesOf(folder + sample.name);
        std::set<std::string> sections;
        for (Line const& line : lines) sections.insert(lowered(line.header));
        CHECK(lines.size() == sample.entries);
        CHECK(sections.size() == sample.sections);
    }
}

TEST_CASE("every key line of a real file comes out as it stands there") {
    for (Sample const& sample : samples) {
        CAPTURE(sample.name);
        InitializationFile file(folder + sample.name);
        file.open(READ);
        CHECK(file.enumerateSections().size() == sample.sections);
        // Of equal entries the first of the file comes first; removing it uncovers the next.
        for (Line const& line : linesOf(folder + sample.name)) {
            CAPTURE(line.header);
            CAPTURE(line.key);
            checkSame(file.getValue(wide(line.header), wide(line.key)), wide(line.value));
            checkSame(file.getValue(respelt(line.header), respelt(line.key)), wide(line.value));
            file.removeKey(wide(line.header), wide(line.key));
        }
        CHECK(file.enumerateSections().empty());
    }
}

TEST_CASE("sections and keys of a real file are listed once per line, in order, as spelt") {
    for (Sample const& sample : samples) {
        CAPTURE(sample.name);
        // Section and key in lower case, then the number of the line, sort as the table does.
        std::map<std::string, std::multimap<std::string, Line>> sorted;
        for (Line const& line : linesOf(folder + sample.name)) {
            sorted[lowered(line.header)].emplace(lowered(line.key), line);
        }
        std::vector<std::wstring> sections;
        InitializationFile file(folder + sample.name);
        file.open(READ);
        for (auto const& section : sorted) {
            std::vector<std::wstring> keys;
            for (auto const& key : section.second) keys.push_back(wide(key.second.key));
            checkSame(file.enumerateKeys(wide(section.first)), keys);
            sections.push_back(wide(section.second.begin()->second.header));
        }
        checkSame(file.enumerateSections(), sections);
    }
}

TEST_CASE("a real file that was written back reads the same, and is written the same again") {
    SettingsPlace const place;
    for (Sample const& sample : samples) {
        CAPTURE(sample.name);
        std::string const original = test::readFile(folder + sample.name);
        place.write(original);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.close();
        std::string const rewritten = place.bytes();
        Settings const expected = sortedSettings(original);
        CHECK(expected.size() == sample.entries);
        checkSame(test::parseSettings(rewritten), expected);
        CHECK(rewritten == test::settingsText(expected));
        CHECK(test::readFile(folder + sample.name) == original);

        file.open(READ_WRITE);
        file.synchronize();
        file.close();
        CHECK(place.bytes() == rewritten);
    }
}

TEST_CASE("changing one value of a real file leaves all others") {
    SettingsPlace const place;
    for (Sample const& sample : samples) {
        CAPTURE(sample.name);
        std::string const original = test::readFile(folder + sample.name);
        Settings expected = sortedSettings(original);
        Setting& changed = expected[expected.size() / 2];
        place.write(original);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        // Not one that has an equal before it: the first is the one that is changed.
        checkSame(file.getValue(changed.section, changed.key), changed.value);
        changed.value = L"\u00C4nderung = " + changed.value;
        file.setValue(changed.section, changed.key, changed.value);
        file.synchronize();
        CHECK(place.bytes() == test::settingsText(expected));
        CHECK(test::drain(file) == expected);
    }
}

TEST_CASE("real files say what a reader finds in them") {
    struct Row {
        std::string file;
        wchar_t const* section;
        wchar_t const* key;
        wchar_t const* value;
    };
    Row const rows[] = {
        {"org.gnome.Mahjongg.desktop", L"Desktop Entry", L"Name[ja]", L"GNOME \u4E0A\u6D77"},
        {"org.kde.konsole.desktop", L"Desktop Entry", L"Name[de]", L"Konsole"},
        {"org.kde.konsole.desktop", L"Desktop Entry", L"GenericName[el]",
         L"\u03A4\u03B5\u03C1\u03BC\u03B1\u03C4\u03B9\u03BA\u03CC"},
        {"org.kde.konsole.desktop", L"Desktop Action NewWindow", L"Name[de]",
         L"Ein neues Fenster \u00F6ffnen"},
        {"BreezeDark.colors", L"General", L"Name[ja]", L"Breeze \u30C0\u30FC\u30AF"},
        {"BreezeDark.colors", L"ColorEffects:Disabled", L"ContrastAmount", L"0.65"},
        {"DarkPastels.colorscheme", L"Color0Faint", L"Color", L"52,52,52"},
        {"DarkPastels.colorscheme", L"Color0Faint", L"Bold", L""},
        {"avahi-daemon.conf", L"server", L"ratelimit-interval-usec", L"1000000"},
        {"avahi-daemon.conf", L"server", L"host-name", L""},
        {"hicolor-index.theme", L"16x16/actions", L"Type", L"Threshold"},
        // The first of two sections of this name counts.
        {"libinput-50-system-apple.quirks", L"Apple Laptop Touchpad (SPI)", L"MatchVendor",
         L"0x5AC"},
        {"libinput-50-system-apple.quirks", L"Apple Internal Keyboard", L"MatchName",
         L"*Apple Inc. Apple Internal Keyboard*"},
        {"mc-seasons-spring16M.ini", L"Lines", L"horiz ", L" \u2500"},
        {"mc-seasons-spring16M.ini", L"aliases", L"mainfg ", L" #000"},
        // Blanks and tabs belong to names; text behind # belongs to the value.
        {"openssl.cnf", L" CA_default ", L"dir\t\t", L" ./demoCA\t\t# Where everything is kept"},
        {"openssl.cnf", L"CA_default", L"dir", L""},
        {"openssl.cnf", L"", L"openssl_conf ", L""},
        {"php.ini-production", L"PHP", L"error_reporting ", L" E_ALL & ~E_DEPRECATED & ~E_STRICT"},
        {"smb.conf", L"printers", L"path ", L" /var/tmp"},
        {"fail2ban-jail.conf", L"sshd", L"port    ", L" ssh"},
        // A carriage return stays, and keeps the bracket in the section's name.
        {"pyparsing-Setup.ini", L"Startup]\r", L"AppName", L"M3i.comm\r"},
        {"pyparsing-Setup.ini", L"Startup]\r", L"win95path", L"\r"},
        {"pyparsing-Setup.ini", L"test]\r", L"foo", L"bar\r"},
        {"pyparsing-Setup.ini", L"test", L"foo", L""},
    };
    for (Row const& row : rows) {
        CAPTURE(row.file);
        CAPTURE(test::shown(std::wstring(row.key)));
        InitializationFile file(folder + row.file);
        file.open(READ);
        checkSame(file.getValue(row.section, row.key), row.value);
    }
}
