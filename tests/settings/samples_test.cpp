// Settings files as programs ship them, in examples/data: of our own, with what is met in real
// ones. What they say is worked out here line by line, apart from the model and the library's
// parser.
#include <doctest/doctest.h>

#include <cstddef>
#include <filesystem>
#include <iterator>
#include <map>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/string.h>

#include "support/plainlocale.h"
#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/shown.h"
#include "support/tempdir.h"

using test::checkSame;
using test::READ;
using test::READ_WRITE;
using test::Setting;
using test::Settings;
using test::SettingsFile;
using test::sortedSettings;
using test::spelledOnce;

namespace {

/// A file, with the numbers of its entries and of its sections that have any.
struct Sample {
    std::string name;
    std::size_t entries;
    std::size_t sections;
    std::string bytes;
};

Sample stored(std::string const& name, std::size_t entries, std::size_t sections) {
    return {name, entries, sections, test::readFile(KORU_SAMPLES "/" + name)};
}

/// As themes of icons are: hundreds of sections, all named by one line of eleven thousand bytes.
Sample theme() {
    std::string directories;
    std::string sections;
    for (int size = 16; size < 16 + 40; ++size) {
        std::string const pixels = std::to_string(size);
        for (int i = 1; i <= 16; ++i) {
            std::string const name = pixels + "x" + pixels + "/top shelf " + std::to_string(i);
            directories += name + ",";
            sections += "\n[" + name + "]\nSize=" + pixels + "\nContext=Shelves\nType=Fixed\n";
        }
    }
    std::string const head = "[Icon Theme]\nName=Pebbles\nHidden=true\nDirectories=";
    return {"index.theme", 640 * 3 + 3, 641, head + directories + "\n" + sections};
}

std::vector<Sample> const samples{
    stored("commons.conf", 20, 4),      // indented, comments with both signs, a section twice
    stored("creatures.quirks", 26, 5),  // sections and keys twice, spelled otherwise
    stored("dachboden.cfg", 13, 3),     // bytes that are not UTF-8, no end of the last line
    stored("dusk.colors", 35, 15),      // small sections, colons in their names
    stored("gatekeeper.conf", 22, 5),   // mostly comments, values that go on below
    stored("harbour.skin", 20, 4),      // indented, with box characters
    stored("hillpost.cnf", 18, 5),      // entries without a section, padded headers, tabs
    stored("lanternd.service", 27, 3),  // keys that are there several times, long values
    stored("orchard.ini", 14, 4),       // many comments, blanks around the equals sign
    stored("paperkite.desktop", 48, 3), // many languages
    stored("tidepool.ini", 12, 4),      // carriage returns
    theme(),
};

std::string bytesOf(std::string const& name) {
    for (Sample const& sample : samples) {
        if (sample.name == name) return sample.bytes;
    }
    throw std::runtime_error("there is no sample " + name);
}

/// Calls `check` with each sample and a file of its bytes, open.
template <class Check>
void forEachSample(unsigned long mode, Check check) {
    for (Sample const& sample : samples) {
        CAPTURE(sample.name);
        SettingsFile file(sample.bytes, mode);
        check(sample, file);
    }
}

/// A line that counts: the header above it, its key and its value.
struct Line {
    std::wstring header;
    std::wstring key;
    std::wstring value;
};

/// The name in a header line. None of the files has a header of nothing but brackets.
std::string headerName(std::string line) {
    while (line.back() == ']') line.pop_back();
    while (line.front() == '[') line.erase(line.begin());
    return line;
}

std::vector<Line> linesOf(std::string const& bytes) {
    std::vector<Line> lines;
    std::istringstream in(bytes);
    std::string header;
    for (std::string line; std::getline(in, line);) {
        auto const isBlank = [](char c) { return c == ' ' || c == '\t'; };
        while (!line.empty() && isBlank(line.back())) line.pop_back();
        while (!line.empty() && isBlank(line.front())) line.erase(line.begin());
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
        std::string const value(std::istreambuf_iterator<char>(parts), {});
        lines.push_back(
            {Koru::make_wstring(header), Koru::make_wstring(key), Koru::make_wstring(value)});
    }
    return lines;
}

/// ASCII letters in lower case, which is all that these names need in the C locale.
std::wstring lowered(std::wstring text) {
    for (wchar_t& c : text) {
        if (c >= L'A' && c <= L'Z') c += L'a' - L'A';
    }
    return text;
}

/// Another spelling of the same name.
std::wstring respelt(std::wstring text) {
    for (wchar_t& c : text) {
        if (c >= L'a' && c <= L'z') c -= L'a' - L'A';
    }
    return text;
}

} // namespace

TEST_CASE("every sample is in the table of samples, with its entries and sections") {
    std::filesystem::directory_iterator const files(KORU_SAMPLES);
    // One more is made here.
    CHECK(static_cast<std::size_t>(std::distance(begin(files), end(files))) + 1 == samples.size());
    for (Sample const& sample : samples) {
        CAPTURE(sample.name);
        std::vector<Line> const lines = linesOf(sample.bytes);
        std::set<std::wstring> sections;
        for (Line const& line : lines) sections.insert(lowered(line.header));
        CHECK(lines.size() == sample.entries);
        CHECK(sections.size() == sample.sections);
    }
}

TEST_CASE("the samples have the traits that they are there for") {
    std::string all;
    for (Sample const& sample : samples) all += sample.bytes;
    CHECK(all.find("\r\n") != std::string::npos);
    CHECK(all.find("\t\t= ") != std::string::npos);
    CHECK(bytesOf("commons.conf").find("\n; ") != std::string::npos);
    CHECK(bytesOf("commons.conf").find("\n# ") != std::string::npos);
    CHECK(bytesOf("dachboden.cfg").back() != '\n');
    std::string const theme = bytesOf("index.theme");
    std::size_t const longest = theme.find("Directories=");
    CHECK(theme.find('\n', longest) - longest > 11000);
}

TEST_CASE("every key line of a sample comes out as it is there") {
    test::PlainLocale const locale;
    forEachSample(READ, [](Sample const& sample, SettingsFile& file) {
        CHECK(file.enumerateSections().size() == sample.sections);
        // Of equal entries the first of the file comes first; removing it uncovers the next.
        for (Line const& line : linesOf(sample.bytes)) {
            CAPTURE(test::shown(line.header));
            CAPTURE(test::shown(line.key));
            checkSame(file.getValue(line.header, line.key), line.value);
            checkSame(file.getValue(respelt(line.header), respelt(line.key)), line.value);
            file.removeKey(line.header, line.key);
        }
        CHECK(file.enumerateSections().empty());
        file.close();
        CHECK(file.place.bytes() == sample.bytes);
    });
}

TEST_CASE("sections and keys of a sample are listed once per line, in order, as spelt") {
    test::PlainLocale const locale;
    forEachSample(READ, [](Sample const& sample, SettingsFile& file) {
        // Section and key in lower case, then the number of the line, sort as the table does.
        std::map<std::wstring, std::multimap<std::wstring, Line>> sorted;
        for (Line const& line : linesOf(sample.bytes)) {
            sorted[lowered(line.header)].emplace(lowered(line.key), line);
        }
        std::vector<std::wstring> sections;
        for (auto const& section : sorted) {
            std::vector<std::wstring> keys;
            for (auto const& key : section.second) keys.push_back(key.second.key);
            checkSame(file.enumerateKeys(section.first), keys);
            sections.push_back(section.second.begin()->second.header);
        }
        checkSame(file.enumerateSections(), sections);
    });
}

TEST_CASE("a sample that was written back reads the same, and is written the same again") {
    forEachSample(READ_WRITE, [](Sample const& sample, SettingsFile& file) {
        file.close();
        std::string const rewritten = file.place.bytes();
        Settings const expected = sortedSettings(sample.bytes);
        CHECK(expected.size() == sample.entries);
        checkSame(test::parseSettings(rewritten), spelledOnce(expected));
        CHECK(rewritten == test::settingsText(expected));
        file.open(READ_WRITE);
        file.synchronize();
        file.close();
        CHECK(file.place.bytes() == rewritten);
    });
}

TEST_CASE("changing one value of a sample leaves all others") {
    test::PlainLocale const locale;
    forEachSample(READ_WRITE, [](Sample const& sample, SettingsFile& file) {
        Settings expected = sortedSettings(sample.bytes);
        Setting& changed = expected[expected.size() / 2];
        // Not one that has an equal before it: the first is the one that is changed.
        checkSame(file.getValue(changed.section, changed.key), changed.value);
        changed.value = L"\u00C4nderung = " + changed.value;
        file.setValue(changed.section, changed.key, changed.value);
        file.synchronize();
        CHECK(file.place.bytes() == test::settingsText(expected));
        checkSame(test::drain(file), spelledOnce(expected));
    });
}

TEST_CASE("samples say what a reader finds in them") {
    struct Row {
        std::string file;
        wchar_t const* section;
        wchar_t const* key;
        wchar_t const* value;
    };
    Row const rows[] = {
        {"paperkite.desktop", L"Desktop Entry", L"Name[ja]", L"\u7D19\u306E\u51E7"},
        {"paperkite.desktop", L"Desktop Entry", L"Name[de]", L"Papierdrachen"},
        {"paperkite.desktop", L"Desktop Entry", L"GenericName[el]",
         L"\u03A3\u03C7\u03AD\u03B4\u03B9\u03B1 "
         L"\u03B4\u03B9\u03C0\u03BB\u03CE\u03BC\u03B1\u03C4\u03BF\u03C2"},
        {"paperkite.desktop", L"Desktop Entry", L"Keywords[emoji]", L"\U0001F4C4;\U0001FA81;"},
        {"paperkite.desktop", L"Desktop Action NewSheet", L"Name[de]", L"Neues Blatt \u00F6ffnen"},
        {"dusk.colors", L"General", L"Name[ja]", L"\u5915\u66AE\u308C"},
        {"dusk.colors", L"Shade:Asleep", L"Contrast", L"0.55"},
        {"dusk.colors", L"Ink0Pale", L"Colour", L"28,26,37"},
        {"dusk.colors", L"Ink0Pale", L"Bold", L""},
        {"lanternd.service", L"Service", L"LimitNOFILE", L"8192"},
        // The first of several counts, and only the first = divides.
        {"lanternd.service", L"Install", L"WantedBy", L"sunset.target"},
        {"lanternd.service", L"Service", L"Environment",
         L"LANTERN_SHADE=0.35 \"LANTERN_MOTTO=steady = safe\""},
        {"index.theme", L"16x16/top shelf 1", L"Type", L"Fixed"},
        // The first of two sections of this name counts.
        {"creatures.quirks", L"Pad of the Grey Heron (radio)", L"Maker", L"0x0F1E"},
        {"creatures.quirks", L"pad of the grey heron (cable)", L"wet", L"1"},
        {"creatures.quirks", L"Keys of the Grey Heron", L"Name", L"*Heron, Keys of*"},
        {"creatures.quirks", L"Keys of the Grey Heron", L"PLACE", L"inside"},
        // All brackets around a name are taken off.
        {"creatures.quirks", L"Hedgehog", L"Kind", L"ball"},
        {"commons.conf", L"kitchen", L"comment ", L" Pans, and who stirs them"},
        {"harbour.skin", L"Frame", L"across ", L" \u2500"},
        {"harbour.skin", L"names", L"sail ", L" #eee"},
        // Blanks and tabs belong to names; text after # belongs to the value.
        {"hillpost.cnf", L" bags_morning ", L"shelf\t\t", L" ./bags\t\t# left of the door"},
        {"hillpost.cnf", L"bags_morning", L"shelf", L""},
        {"hillpost.cnf", L"", L"STAIRS\t\t", L""},
        {"hillpost.cnf", L"weights", L"indented.letter\t", L"\t5.6.7.8"},
        {"orchard.ini", L"Orchard", L"report_smells ", L" ALL & ~LEAVES & ~SMOKE"},
        {"orchard.ini", L"Orchard", L"rhyme ", L" \"drink me late = drink me great\""},
        {"orchard.ini", L"Orchard", L"refuse ", L""},
        {"orchard.ini", L"Orchard", L"turns", L""},
        {"commons.conf", L"garden tools", L"ladder ", L" /srv/house/shed"},
        {"commons.conf", L"attic", L"comment ", L" Boxes\tand one rocking horse"},
        {"gatekeeper.conf", L"south", L"knocks   ", L" 2"},
        // A line that goes on below is cut, and what goes on may be an entry of its own.
        {"gatekeeper.conf", L"DEFAULT", L"alarm ", L" %(note)s"},
        {"gatekeeper.conf", L"DEFAULT", L"bell[tone", L"\"low\","},
        // A carriage return stays, and keeps the bracket in the section's name.
        {"tidepool.ini", L"Startup]\r", L"Program", L"Tidepool\r"},
        {"tidepool.ini", L"Startup]\r", L"language", L"\r"},
        {"tidepool.ini", L"test]\r", L"foo", L"bar\r"},
        {"tidepool.ini", L"test", L"foo", L""},
        // Latin-1 decodes to other characters, and the end of a line may cut them short.
        {"dachboden.cfg", L"Allgemein", L"Festmahl",
         L"S\x1F973826\x32802932"
         L"en"},
        {"dachboden.cfg", L"Allgemein", L"Nachtisch", L"?"},
        {"dachboden.cfg", L"\u05A6nung", L"Montag", L""},
        {"dachboden.cfg", L"Raw", L"bom", L"\uFEFFtext"},
        {"dachboden.cfg", L"Raw", L"lone", L"?"},
        {"dachboden.cfg", L"Raw", L"over", L"/"},
        {"dachboden.cfg", L"Raw", L"last", L"without an end of the line"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.file);
        CAPTURE(test::shown(std::wstring(row.key)));
        SettingsFile file(bytesOf(row.file));
        checkSame(file.getValue(row.section, row.key), row.value);
    }
}
