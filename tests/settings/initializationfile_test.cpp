// The sectioned settings file: its format and its operations. What it has in common with the other
// structured files, lines and keys with them, is tested in tests/structured.
#include <doctest/doctest.h>

#include <cstddef>
#include <filesystem>
#include <ios>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/shown.h"
#include "support/throws.h"

using test::checkEntries;
using test::checkSame;
using test::loaded;
using test::messageOf;
using test::Place;
using test::READ;
using test::READ_WRITE;
using test::rewritten;
using test::Settings;
using test::SettingsFile;
using test::WRITE;
using test::written;
using namespace std::string_literals;

namespace {
/// What a file of these bytes is read as, see checkEntries.
struct Row {
    char const* label;
    std::string bytes;
    char const* expected;
};

void checkRows(std::vector<Row> const& rows) {
    Place const place;
    for (Row const& row : rows) {
        CAPTURE(row.label);
        checkEntries(loaded(place, row.bytes), row.expected);
    }
}

} // namespace

TEST_CASE("an entry belongs to the section of the last header before it") {
    checkRows({
        {"a header alone", "[s]\n", ""},
        {"a header without line feed", "[s]", ""},
        {"two sections", "[s]\nk=v\n\n[t]\nl=w\n", "s/k=v | t/l=w"},
        {"before the first header", "a=1\nb=2\n[s]\nk=v\n", "s/k=v"},
        {"no header at all", "a=1\nb=2\n", ""},
        {"comments before the first header", "# a\n; b\n[s]\nk=v\n", "s/k=v"},
        {"a header in a comment", "[s]\n#[t]\n;[u]\nk=v\n", "s/k=v"},
        {"other white space before a bracket", "[s]\n\v[t]\nk=v\n", "s/k=v"},
        {"brackets after the start", "[s]\nk[0]=v]\n]=w\n", "s/]=w | s/k[0]=v]"},
    });
}

TEST_CASE("a header names the section by what is left without the brackets at both ends") {
    struct Header {
        std::string line;
        wchar_t const* section;
    };
    Place const place;
    for (Header const& header : std::vector<Header>{
             {"[Main]", L"Main"},
             {"[[Main]]", L"Main"},
             {"[[[Main]", L"Main"},
             {"[Main]]]", L"Main"},
             {"[Main", L"Main"},
             {"[[Main", L"Main"},
             {"  [Main]\t ", L"Main"},
             {"\t[Main ", L"Main"},
             {"[ Main ]", L" Main "},
             {"[ Main", L" Main"},
             {"[\tMain\t]", L"\tMain\t"},
             {"[a] x", L"a] x"},
             {"[a]x]", L"a]x"},
             {"[a]]x", L"a]]x"},
             {"[a[b]c]", L"a[b]c"},
             {"[a]; comment", L"a]; comment"},
             {"[a] # comment", L"a] # comment"},
             {"[a]=b", L"a]=b"},
             {"[a=b]", L"a=b"},
             {"[=]", L"="},
             {"[#]", L"#"},
             {"[;a]", L";a"},
             {"[ ]", L" "},
             {"[]", L"["},
             {"[", L"["},
             {"[[", L"[["},
             {"[]]", L"["},
             {"[[]", L"[["},
             {"[[]]", L"[["},
             {"[[[]]]", L"[[["},
             {"[] ]", L"] "},
             {"[] x", L"] x"},
             {"[]a", L"]a"},
             {"[][", L"]["},
             {"[][]", L"]["},
             {"[[a]b]]", L"a]b"},
         }) {
        CAPTURE(header.line);
        checkSame(loaded(place, "[before]\n" + header.line + "\nk=v\n"),
                  {{header.section, L"k", L"v"}});
        checkSame(loaded(place, header.line + "\nk=v"), {{header.section, L"k", L"v"}});
        checkSame(loaded(place, "[s]\nk=v\n" + header.line), {{L"s", L"k", L"v"}});
    }
}

TEST_CASE("a carriage return at the end of a header keeps the brackets before it") {
    checkRows({
        {"one", "[Main]\r\nk=v\r\nl=\r\n", "Main]<d>/k=v<d> | Main]<d>/l=<d>"},
        {"a header of brackets", "[]\r\nk=v\r\n", "]<d>/k=v<d>"},
    });
}

TEST_CASE("a section ends at its first NUL, as key and value do, and lines do not") {
    checkRows({
        {"in a section", "[a\0b]\nk=v\n"s, "a/k=v"},
        {"in all of them", "[a\0b]\nc\0d=e\0f\n"s, "a/c=e"},
        {"a section of none", "[s]\n[\0t]\nk=v\n"s, ""},
        {"a section of none, then another", "[\0]\na=1\n[s]\nk=v\n"s, "s/k=v"},
        {"hides the bracket at the end", "[s]\0\nk=v\n"s, "s]/k=v"},
    });
}

TEST_CASE("a section's text is UTF-8, decoded as make_wstring decodes it") {
    checkRows({
        {"two to four bytes", "[\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80]\nk=v\n",
         "<e9><20ac><1f600>/k=v"},
        {"an overlong zero ends it", "[a\300\200b]\nk=v\n", "a/k=v"},
        {"an overlong zero alone", "[s]\n[\xE0\x80\x80]\nk=v\n", ""},
        {"a byte order mark hides the header", "\xEF\xBB\xBF[s]\nk=v\n", ""},
        {"a lead byte takes the bracket", "[s\xC3]\nk=v\n", "s?/k=v"},
    });
}

TEST_CASE("a header of any length is read") {
    std::string const section(100000, 's');
    std::string const blanks(100000, ' ');
    checkEntries(loaded(Place(), blanks + "[" + section + "]" + blanks + "\nk=v\n"),
                 (section + "/k=v").c_str());
}

TEST_CASE("entries are sorted by section and key without regard to case") {
    checkRows({
        {"both", "[b]\nZ=1\na=2\nM=3\n[C]\nk=4\n[A]\ny=5\nX=6\n",
         "A/X=6 | A/y=5 | b/a=2 | b/M=3 | b/Z=1 | C/k=4"},
        {"letters compare as lower case, so signs between Z and a come before them",
         "[s]\nB=1\n_=2\na=3\n^x=4\nz=5\n~=6\n0=7\n",
         "s/0=7 | s/^x=4 | s/_=2 | s/a=3 | s/B=1 | s/z=5 | s/~=6"},
        {"what is longer comes later", "[s]\nab=1\na=2\nabc=3\nA b=4\n",
         "s/a=2 | s/A b=4 | s/ab=1 | s/abc=3"},
    });
}

TEST_CASE("parts of one section come together, and each entry keeps its spelling") {
    checkRows({{"two sections", "[a]\nm=1\n[B]\nx=2\n[A]\nc=3\n[b]\ny=4\n[a]\nz=5\n",
                "A/c=3 | a/m=1 | a/z=5 | B/x=2 | b/y=4"}});
}

TEST_CASE("every entry with equal names is kept, in the order of the file") {
    std::string bytes;
    Settings expected;
    for (int i = 0; i < 400; ++i) {
        bool const isThird = i % 3 == 0;
        bool const isEven = i % 2 == 0;
        bytes += std::string(isThird ? "[S]\n" : "[s]\n") + (isEven ? "KEY=" : "key=") +
                 std::to_string(i) + "\n";
        expected.push_back({isThird ? L"S" : L"s", isEven ? L"KEY" : L"key", std::to_wstring(i)});
    }
    checkSame(loaded(Place(), bytes), expected);
    checkRows({{"three", "[s]\na=1\nA=2\na=3\n", "s/a=1 | s/A=2 | s/a=3"},
               {"two", "[s]\nA=2\na=1\n", "s/A=2 | s/a=1"}});
}

TEST_CASE("the table is written as a header per run and a line per entry") {
    CHECK(written({}) == "");
    CHECK(written({{L"s", L"k", L"v"}}) == "[s]\nk=v\n");
    CHECK(written({{L"s", L"k", L""}}) == "[s]\nk=\n");
    CHECK(written({{L"b", L"z", L"1"}, {L"a", L"y", L"2"}, {L"b", L"x", L"3"}}) ==
          "[a]\ny=2\n[b]\nx=3\nz=1\n");
    CHECK(written({{L"s", L"k ", L" v "}}) == "[s]\nk = v \n");
    CHECK(written({{L"", L"k", L"v"}, {L"s", L"", L"w"}}) == "[]\nk=v\n[s]\n=w\n");
    CHECK(written({{L"", L"", L""}}) == "[]\n=\n");
    // Nothing is escaped.
    CHECK(written({{L"a]\n[b", L"k=\n", L"v\n#"}}) == "[a]\n[b]\nk=\n=v\n#\n");
}

TEST_CASE("a section has one header, spelt as its entry with the smallest key spells it") {
    CHECK(written({{L"net", L"b", L"1"}, {L"NET", L"c", L"2"}, {L"Net", L"a", L"3"}}) ==
          "[Net]\na=3\nb=1\nc=2\n");
}

TEST_CASE("a section is written as make_string encodes it") {
    CHECK(written({{L"\u00E9", L"\u20AC", L"\U0001F600"}}) ==
          "[\xC3\xA9]\n\xE2\x82\xAC=\xF0\x9F\x98\x80\n");
    CHECK(written({{L"s\0t"s, L"k", L"v"}}) == "[s]\nk=v\n");
    // Of a unit of 0x80000000 and above its low byte is written, and if that is zero, no more.
    CHECK(written({{{static_cast<wchar_t>(0x80000041), L'b'}, L"k", L"v"}}) == "[Ab]\nk=v\n");
    CHECK(written({{{L'a', static_cast<wchar_t>(0x80000000), L'b'}, L"k", L"v"}}) == "[a]\nk=v\n");
}

TEST_CASE("comments, blank lines, spacing and the order of lines are lost when written") {
    char const* const left = "[ b ]\na=2\nz = 1\n[a]\nk=v\n";
    CHECK(rewritten("# top\nlost=1\n\n[ b ]\n  z = 1  \n; c\n a=2\n\n\n[a]\nword\nk=v") == left);
    CHECK(rewritten(left) == left);
}

TEST_CASE("a malformed section is written as it was decoded") {
    CHECK(rewritten("[s\xC3]\nk=\x80xyz\n[\xC1\x81]\nk=v\n") == "[A]\nk=v\n[s?]\nk=?xyz\n");
}

TEST_CASE("duplicates and their order survive writing and reading") {
    CHECK(rewritten("[s]\nb=1\na=2\nB=3\na=4\nA=5\n") == "[s]\na=2\na=4\nA=5\nb=1\nB=3\n");
}

TEST_CASE("a byte order mark hides the first header, whose entries are dropped") {
    CHECK(rewritten("\xEF\xBB\xBF[first]\na=1\n[second]\nb=2\n") == "[second]\nb=2\n");
}

TEST_CASE("a section named by a bracket alone gains one with each rewrite") {
    CHECK(rewritten("[]\na=1\n") == "[[]\na=1\n");
    CHECK(rewritten("[[]\na=1\n") == "[[[]\na=1\n");
}

TEST_CASE("a section without keys does not survive writing and reading") {
    SettingsFile file("", READ_WRITE);
    file.createSection(L"Empty");
    file.setValue(L"Full", L"k", L"v");
    file.synchronize();
    CHECK(file.place.bytes() == "[Empty]\n=\n[Full]\nk=v\n");
    checkEntries(file, "Full/k=v");
}

TEST_CASE("entries of the empty section come back in section [") {
    SettingsFile file("", READ_WRITE);
    file.setValue(L"s", L"k", L"v");
    file.setValue(L"", L"k", L"w");
    file.synchronize();
    CHECK(file.place.bytes() == "[]\nk=w\n[s]\nk=v\n");
    checkSame(file.getValue(L"", L"k"), L"");
    checkEntries(file, "[/k=w | s/k=v");
}

TEST_CASE("a missing section gives an empty value, an empty list or no effect") {
    SettingsFile file("[s]\nk=v\nempty=\n");
    checkSame(file.getValue(L"missing", L"k"), L"");
    checkSame(file.getValue(L"k", L"s"), L"");
    checkSame(file.getValue(L"", L""), L"");
    CHECK(file.enumerateKeys(L"missing").empty());
    CHECK(file.enumerateKeys(L"").empty());
    file.removeKey(L"missing", L"k");
    file.removeSection(L"missing");
    file.removeSection(L"");
    checkEntries(file, "s/empty= | s/k=v");
}

TEST_CASE("sections match without regard to case and in full, and keep their case") {
    SettingsFile file("[Net]\nHost=a\nHostname=b\n[Network]\nHost=c\n");
    checkSame(file.getValue(L"NET", L"hOST"), L"a");
    checkSame(file.getValue(L"nETWORK", L"host"), L"c");
    checkSame(file.getValue(L"Ne", L"Host"), L"");
    checkSame(file.enumerateKeys(L"nEt"), {L"Host", L"Hostname"});
    file.setValue(L"NET", L"HOST", L"new");
    file.createKey(L"NETWORK", L"HOST");
    checkEntries(file, "Net/Host=new | Net/Hostname=b | Network/Host=c");
}

TEST_CASE("setValue and createKey add a missing section with the entry, at the end of the table") {
    SettingsFile file("[m]\nk=1\n");
    file.setValue(L"m", L"a", L"2");
    file.setValue(L"a", L"k", L"3");
    file.createKey(L"new", L"k");
    file.setValue(L"", L"", L"4");
    file.createKey(L"", L"");
    file.setValue(L"m", L"", L"5");
    checkEntries(file, "m/k=1 | m/a=2 | a/k=3 | new/k= | /=4 | m/=5");
}

TEST_CASE("createSection adds an entry with empty key and value unless the section exists") {
    SettingsFile file("[m]\nk=1\n");
    file.createSection(L"M");
    file.createSection(L"Net");
    file.createSection(L"nET");
    file.createSection(L"");
    checkSame(file.enumerateKeys(L"net"), {L""});
    checkSame(file.getValue(L"net", L""), L"");
    // The placeholder is an entry like any other.
    file.createKey(L"Net", L"");
    file.setValue(L"NET", L"", L"v");
    file.setValue(L"Net", L"k", L"w");
    checkEntries(file, "m/k=1 | Net/=v | /= | Net/k=w");
}

TEST_CASE("a section is gone with its last entry") {
    SettingsFile file("[a]\nk=1\n[b]\nk=2\n");
    file.removeKey(L"a", L"k");
    checkSame(file.enumerateSections(), {L"b"});
    file.removeKey(L"b", L"k");
    checkSame(file.enumerateSections(), {});
    file.setValue(L"B", L"k", L"3");
    checkEntries(file, "B/k=3");
}

TEST_CASE("removeSection skips the entry that moves into a removed one's place") {
    std::string const entries = "a=v\nb=v\nc=v\nd=v\ne=v\nf=v\ng=v\nh=v\ni=v\n";
    std::string const evenOnes = "s/b=v | s/d=v | s/f=v | s/h=v | ";
    for (std::size_t count = 0; count <= 9; ++count) {
        CAPTURE(count);
        SettingsFile file("[a]\nk=1\n[s]\n" + entries.substr(0, 4 * count) + "[t]\nk=2\n");
        file.removeSection(L"S");
        checkEntries(file, ("a/k=1 | " + evenOnes.substr(0, count / 2 * 8) + "t/k=2").c_str());
    }
}

TEST_CASE("removeSection removes single entries of a section wherever they are") {
    SettingsFile file("[s]\na=1\n[t]\na=2\n[u]\na=3\n");
    file.setValue(L"S", L"b", L"4");
    file.setValue(L"t", L"b", L"5");
    file.setValue(L"s", L"c", L"6");
    file.removeSection(L"s");
    checkEntries(file, "t/a=2 | u/a=3 | t/b=5");
}

TEST_CASE("enumerateKeys gives every key of the section in the order of the table") {
    SettingsFile file("[s]\nb=1\na=2\nB=3\n[t]\nx=4\n");
    file.setValue(L"S", L"A!", L"5");
    file.setValue(L"s", L"", L"6");
    file.setValue(L"t", L"y", L"7");
    checkSame(file.enumerateKeys(L"S"), {L"a", L"b", L"B", L"A!", L""});
    checkSame(file.enumerateKeys(L"T"), {L"x", L"y"});
}

TEST_CASE("enumerateSections names each run of entries as its first entry does") {
    SettingsFile file("[B]\nk=1\n[a]\nk=2\n[b]\na=3\n[C]\nk=4\n", READ_WRITE);
    checkSame(file.enumerateSections(), {L"a", L"b", L"C"});
    file.setValue(L"c", L"new", L"5"); // joins the last run
    checkSame(file.enumerateSections(), {L"a", L"b", L"C"});
    file.setValue(L"A", L"new", L"6");
    checkSame(file.enumerateSections(), {L"a", L"b", L"C", L"A"});
    file.setValue(L"a", L"k", L"7"); // changes a value only
    file.createKey(L"B", L"new");
    file.createSection(L"b");
    checkSame(file.enumerateSections(), {L"a", L"b", L"C", L"A", L"B"});
    file.synchronize();
    checkSame(file.enumerateSections(), {L"a", L"b", L"C"});
}

TEST_CASE("sections are held as they were set until they are written") {
    SettingsFile file("", READ_WRITE);
    file.setValue(L"s\0one"s, L"k", L"v");
    checkSame(file.enumerateSections(), std::vector<std::wstring>{L"s\0one"s});
    // Names are compared up to their first NUL.
    checkSame(file.getValue(L"S", L"K"), L"v");
    checkSame(file.getValue(L"s\0two"s, L"k\0two"s), L"v");
    file.createSection(L"\0x"s);
    checkSame(file.enumerateSections(), std::vector<std::wstring>{L"s\0one"s, L"\0x"s});
    checkSame(file.enumerateKeys(L""), {L""});
    file.removeKey(L"", L"\0y"s);
    file.setValue(L"s", L"l", L"w");
    file.synchronize();
    checkEntries(file, "s/k=v | s/l=w");
}

TEST_CASE("sections of units that no UTF-8 gives are found again") {
    SettingsFile file;
    for (unsigned long const unit : {0x80000000UL, 0x80000041UL, 0xC0000000UL, 0xFFFFFFFFUL,
                                     0x7FFFFFFFUL, 0xD800UL, 0x110000UL}) {
        std::wstring const section{L'n', static_cast<wchar_t>(unit), L'x'};
        std::wstring const spelt{L'N', static_cast<wchar_t>(unit), L'X'};
        file.setValue(section, L"k", section);
        checkSame(file.getValue(spelt, L"k"), section);
        checkSame(file.enumerateKeys(spelt), {L"k"});
    }
}

TEST_CASE("close sorts the table before it touches the file, and look-ups find what it holds") {
    SettingsFile file("", WRITE);
    for (wchar_t const* const key : {L"f", L"e", L"d", L"c", L"b", L"a"}) {
        file.setValue(L"s", key, key);
    }
    std::filesystem::remove_all(file.place.directory().path());
    CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "failed to open file.");
    checkEntries(file, "s/a=a | s/b=b | s/c=c | s/d=d | s/e=e | s/f=f");
}

TEST_CASE("a read that fails leaves what was read so far, in the order of the file") {
    SettingsFile file;
    file.place.write("[s]\nb=1\na=2\nc=3\n");
    file.exceptions(std::ios::eofbit); // as if the end were an error
    CHECK_THROWS_AS(file.open(READ), std::ios::failure);
    checkEntries(file, "s/b=1 | s/a=2 | s/c=3");
}
