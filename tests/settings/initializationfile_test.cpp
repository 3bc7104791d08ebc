// The sectioned settings file: its format, its operations and its life cycle. Beside this file,
// initializationfile_failures_test.cpp has failures, lock and threads,
// initializationfile_model_test.cpp compares many tables with a plain model, and
// writeback_memory_test.cpp lets memory run out.
#include <doctest/doctest.h>

#include <sys/stat.h>

#include <cstddef>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <initializer_list>
#include <memory>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <vector>

#include <koru/initializationfile.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::File;
using Koru::InitializationFile;
using test::checkSame;
using test::drain;
using test::loaded;
using test::messageOf;
using test::READ;
using test::READ_WRITE;
using test::Settings;
using test::SettingsPlace;
using test::slotOf;
using test::slotOfOpen;
using test::WRITE;
using test::written;
using namespace std::string_literals;

namespace {

struct Row {
    std::string label;
    std::string bytes;
    Settings expected;
};

void checkRows(std::vector<Row> const& rows) {
    SettingsPlace const place;
    for (Row const& row : rows) {
        CAPTURE(row.label);
        checkSame(loaded(place, row.bytes), row.expected);
    }
}

std::vector<std::wstring> names(std::initializer_list<wchar_t const*> list) {
    return {list.begin(), list.end()};
}

} // namespace

// ---------------------------------------------------------------------------------------- the type

TEST_CASE("an initialization file is a file, a stream and not copyable") {
    static_assert(std::is_base_of<File, InitializationFile>::value, "");
    static_assert(std::is_convertible<InitializationFile*, std::fstream*>::value, "");
    static_assert(!std::is_copy_constructible<InitializationFile>::value, "");
    static_assert(!std::is_copy_assignable<InitializationFile>::value, "");
    static_assert(std::has_virtual_destructor<InitializationFile>::value, "");
    static_assert(std::is_nothrow_destructible<InitializationFile>::value, "");
    unsigned long const length = InitializationFile::MAX_LINE_LENGTH;
    CHECK(length == 4294967295UL);
}

TEST_CASE("the virtual operations keep their order behind the two entries of the destructor") {
    CHECK(slotOfOpen<InitializationFile>() == 2);
    CHECK(slotOf(&InitializationFile::close) == 3);
    CHECK(slotOf(&InitializationFile::synchronize) == 4);
    CHECK(slotOf(&InitializationFile::getMode) == 5);
    CHECK(slotOf(&InitializationFile::setMode) == 6);
    CHECK(slotOf(&InitializationFile::enumerateSections) == 7);
    CHECK(slotOf(&InitializationFile::createSection) == 8);
    CHECK(slotOf(&InitializationFile::removeSection) == 9);
    CHECK(slotOf(&InitializationFile::enumerateKeys) == 10);
    CHECK(slotOf(&InitializationFile::createKey) == 11);
    CHECK(slotOf(&InitializationFile::removeKey) == 12);
    CHECK(slotOf(&InitializationFile::getValue) == 13);
    CHECK(slotOf(&InitializationFile::setValue) == 14);
}

TEST_CASE("a new object is closed, has mode 0, an empty table and the path's name") {
    InitializationFile nameless;
    CHECK(!nameless.is_open());
    CHECK(nameless.getMode() == 0UL);
    CHECK(nameless.getName().empty());
    CHECK(nameless.enumerateSections().empty());

    SettingsPlace const place;
    Koru::File::Path const path(place.path());
    InitializationFile file(path);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    checkSame(file.getName(), static_cast<std::wstring>(path));
    CHECK(file.enumerateSections().empty());
    CHECK(!place.exists());
}

// -------------------------------------------------------------------------------------- the format

TEST_CASE("lines become entries as the format says") {
    checkRows({
        {"nothing", "", {}},
        {"one line feed", "\n", {}},
        {"line feeds", "\n\n\n\n", {}},
        {"a header alone", "[s]\n", {}},
        {"a header without line feed", "[s]", {}},
        {"an entry", "[s]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"the last line without line feed", "[s]\nk=v", {{L"s", L"k", L"v"}}},
        {"blank lines between", "\n\n[s]\n\n\nk=v\n\n\n", {{L"s", L"k", L"v"}}},
        {"before the first header", "a=1\nb=2\n[s]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"no header at all", "a=1\nb=2\n", {}},
        {"trimmed", "[s]\n  key=value\t\n", {{L"s", L"key", L"value"}}},
        {"trimmed of many", "[s]\n \t \tkey=value\t \t  \n", {{L"s", L"key", L"value"}}},
        {"trimmed without line feed", "[s]\n \tk=v \t", {{L"s", L"k", L"v"}}},
        {"not trimmed at the equals", "[s]\nkey = value\n", {{L"s", L"key ", L" value"}}},
        {"tabs at the equals", "[s]\nk\t=\tv\n", {{L"s", L"k\t", L"\tv"}}},
        {"an empty value", "[s]\nk=\n", {{L"s", L"k", L""}}},
        {"a value of blanks", "[s]\nk=  \t\n", {{L"s", L"k", L""}}},
        {"the first equals counts", "[s]\nk=a=b==\n", {{L"s", L"k", L"a=b=="}}},
        {"two equals", "[s]\nk==\n", {{L"s", L"k", L"="}}},
        {"an empty key", "[s]\n=5\n", {}},
        {"an empty key after trimming", "[s]\n  =5\n", {}},
        {"only an equals", "[s]\n=\n", {}},
        {"a key of inner blanks cannot be", "[s]\n \t = 5\n", {}},
        {"no equals", "[s]\nword\nk=v\nmore words\n", {{L"s", L"k", L"v"}}},
        {"a line of blanks", "[s]\n  \n\t\t\n \t \nk=v\n", {{L"s", L"k", L"v"}}},
        {"brackets after the start",
         "[s]\nk[0]=v]\n]=w\n",
         {{L"s", L"]", L"w"}, {L"s", L"k[0]", L"v]"}}},
        {"inner blanks stay", "[s]\na  b\t=c  d\n", {{L"s", L"a  b\t", L"c  d"}}},
        {"quotes are text", "[s]\n\"k\"='v'\n", {{L"s", L"\"k\"", L"'v'"}}},
        {"backslashes are text", "[s]\nk=a\\\nb=c\n", {{L"s", L"b", L"c"}, {L"s", L"k", L"a\\"}}},
        {"other white space is text", "[s]\n\v\f k=v \v\f\n", {{L"s", L"\v\f k", L"v \v\f"}}},
        {"other white space before a bracket", "[s]\n\v[t]\nk=v\n", {{L"s", L"k", L"v"}}},
    });
}

TEST_CASE("a line that begins with # or ; is a comment") {
    checkRows({
        {"both", "[s]\n#a=1\n;b=2\nk=v\n", {{L"s", L"k", L"v"}}},
        {"indented", "[s]\n  #a=1\n\t;b=2\n \t ;\nk=v\n", {{L"s", L"k", L"v"}}},
        {"a header in a comment", "[s]\n#[t]\n;[u]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"before the first header", "# a\n; b\n[s]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"behind the start", "[s]\nk#a=v ; w # x\n", {{L"s", L"k#a", L"v ; w # x"}}},
        {"as first byte of a value",
         "[s]\nk=#v\nl=;w\n",
         {{L"s", L"k", L"#v"}, {L"s", L"l", L";w"}}},
        {"bare", "[s]\n#\n;\n##\n;;\nk=v\n", {{L"s", L"k", L"v"}}},
        {"without line feed", "[s]\nk=v\n#a=1", {{L"s", L"k", L"v"}}},
        {"other signs are none", "[s]\n//a=1\n!b=2\n", {{L"s", L"!b", L"2"}, {L"s", L"//a", L"1"}}},
    });
}

TEST_CASE("a header names the section by what is left without the brackets at both ends") {
    struct Header {
        std::string line;
        wchar_t const* section;
    };
    Header const headers[] = {
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
    };
    SettingsPlace const place;
    for (Header const& header : headers) {
        CAPTURE(header.line);
        checkSame(loaded(place, "[before]\n" + header.line + "\nk=v\n"),
                  {{header.section, L"k", L"v"}});
        checkSame(loaded(place, header.line + "\nk=v"), {{header.section, L"k", L"v"}});
        checkSame(loaded(place, "[s]\nk=v\n" + header.line), {{L"s", L"k", L"v"}});
    }
}

TEST_CASE("a carriage return is ordinary text") {
    checkRows({
        {"at the end of lines",
         "[Main]\r\nk=v\r\nl=\r\n",
         {{L"Main]\r", L"k", L"v\r"}, {L"Main]\r", L"l", L"\r"}}},
        {"blank lines", "[s]\n\r\n\r\nk=v\n", {{L"s", L"k", L"v"}}},
        {"ends no line", "[s]\nk=v\rl=w\n", {{L"s", L"k", L"v\rl=w"}}},
        {"keeps what is before it", "[s]\nk=v \t\r\n", {{L"s", L"k", L"v \t\r"}}},
        {"before a header", "[s]\n\r[t]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"before a comment", "[s]\n\r#a=1\n", {{L"s", L"\r#a", L"1"}}},
        {"as a key", "[s]\n\r=1\r\n", {{L"s", L"\r", L"1\r"}}},
        {"a header of brackets", "[]\r\nk=v\r\n", {{L"]\r", L"k", L"v\r"}}},
        {"alone at the end", "[s]\nk=v\n\r", {{L"s", L"k", L"v"}}},
    });
}

TEST_CASE("section, key and value each end at their first NUL, and lines do not") {
    checkRows({
        {"in a value", "[s]\nk=a\0b\n"s, {{L"s", L"k", L"a"}}},
        {"in a key", "[s]\na\0b=c\n"s, {{L"s", L"a", L"c"}}},
        {"in a section", "[a\0b]\nk=v\n"s, {{L"a", L"k", L"v"}}},
        {"in all of them", "[a\0b]\nc\0d=e\0f\n"s, {{L"a", L"c", L"e"}}},
        {"before the equals", "[s]\nk\0=v\n"s, {{L"s", L"k", L"v"}}},
        {"behind the equals", "[s]\nk=\0v\n"s, {{L"s", L"k", L""}}},
        {"a key of none", "[s]\n\0k=v\n"s, {}},
        {"a section of none", "[s]\n[\0t]\nk=v\n"s, {}},
        {"a section of none, then another", "[\0]\na=1\n[s]\nk=v\n"s, {{L"s", L"k", L"v"}}},
        {"before a comment sign", "[s]\n\0#k=v\n"s, {}},
        {"before a bracket", "[s]\n\0[t]\nk=v\n"s, {{L"s", L"k", L"v"}}},
        {"keeps trailing blanks", "[s]\nk=v \0 \n"s, {{L"s", L"k", L"v "}}},
        {"hides the bracket at the end", "[s]\0\nk=v\n"s, {{L"s]", L"k", L"v"}}},
        {"a line of them", "[s]\n\0\0\0\nk=v\n"s, {{L"s", L"k", L"v"}}},
        {"a file of them", "\0\0\0"s, {}},
    });
}

TEST_CASE("text is UTF-8, decoded as make_wstring decodes it, each part by itself") {
    checkRows({
        {"two, three and four bytes",
         "[\xC3\xA9]\n\xE2\x82\xAC=\xF0\x9F\x98\x80\n",
         {{L"\u00E9", L"\u20AC", L"\U0001F600"}}},
        {"six bytes", "[s]\nk=\xFD\xBF\xBF\xBF\xBF\xBF\n", {{L"s", L"k", L"\x7FFFFFFF"}}},
        {"five bytes", "[s]\nk=\xF8\x88\x80\x80\x80\n", {{L"s", L"k", L"\x200000"}}},
        {"a surrogate",
         "[s]\nk=\xED\xA0\x80\n",
         {{L"s", L"k", std::wstring(1, static_cast<wchar_t>(0xD800))}}},
        {"cut by the equals", "[s]\nk\xC3=\xA9\n", {{L"s", L"k?", L"?"}}},
        {"cut by the line feed",
         "[s]\nk=\xE2\x82\nl=w\n",
         {{L"s", L"k", L"??"}, {L"s", L"l", L"w"}}},
        {"cut by the end of the file", "[s]\nk=\xF0\x9F\x98", {{L"s", L"k", L"???"}}},
        {"a stray byte near the end",
         "[s]\nk=\x80"
         "abc\n",
         {{L"s", L"k", L"?abc"}}},
        {"a stray byte with five more",
         "[s]\nk=\x80"
         "abcdef\n",
         {{L"s", L"k",
           L"\x218A3925"
           L"f"}}},
        {"an overlong letter", "[s]\n\xC1\x81=v\n", {{L"s", L"A", L"v"}}},
        {"an overlong equals is none", "[s]\nk\xC0\xBD=v\n", {{L"s", L"k=", L"v"}}},
        {"an overlong equals alone", "[s]\nk\xC0\xBDv\n", {}},
        {"an overlong zero ends the value",
         "[s]\nk=a\xC0\x80"
         "b\n",
         {{L"s", L"k", L"a"}}},
        {"an overlong zero ends the key",
         "[s]\na\xC0\x80"
         "b=v\n",
         {{L"s", L"a", L"v"}}},
        {"an overlong zero ends the section",
         "[a\xC0\x80"
         "b]\nk=v\n",
         {{L"a", L"k", L"v"}}},
        {"an overlong zero as key", "[s]\n\xC0\x80=v\n", {}},
        {"an overlong zero as section", "[s]\n[\xE0\x80\x80]\nk=v\n", {}},
        {"a byte order mark hides the header", "\xEF\xBB\xBF[s]\nk=v\n", {}},
        {"a byte order mark before an entry", "[s]\n\xEF\xBB\xBFk=v\n", {{L"s", L"\uFEFFk", L"v"}}},
        {"a no-break space is not trimmed",
         "[s]\n\xC2\xA0k=v\xC2\xA0\n",
         {{L"s", L"\u00A0k", L"v\u00A0"}}},
        {"a lead byte takes the bracket", "[s\xC3]\nk=v\n", {{L"s?", L"k", L"v"}}},
    });
}

TEST_CASE("lines of any length and files of any size are read") {
    SettingsPlace const place;
    SUBCASE("a long value, key and section") {
        std::string const section(100000, 's');
        std::string const key(200000, 'k');
        std::string const value(3000000, 'v');
        Settings const expected{
            {std::wstring(100000, L's'), std::wstring(200000, L'k'), std::wstring(3000000, L'v')}};
        CHECK(loaded(place, "[" + section + "]\n" + key + "=" + value) == expected);
    }
    SUBCASE("long white space and long comments") {
        std::string const blanks(100000, ' ');
        std::string const tabs(100000, '\t');
        std::string const lines(100000, '\n');
        checkSame(loaded(place, lines + blanks + "[s]" + tabs + "\n" + lines + tabs + "k=v" +
                                    blanks + "\n#" + blanks + "a=1\n" + blanks + tabs),
                  {{L"s", L"k", L"v"}});
    }
    SUBCASE("lines around the sizes of buffers") {
        for (std::size_t const size : {512UL, 1024UL, 4096UL, 8191UL, 8192UL, 65536UL}) {
            for (std::size_t filler = size - 12; filler <= size + 2; ++filler) {
                CAPTURE(size);
                CAPTURE(filler);
                std::string const comment = "#" + std::string(filler - 2, 'x') + "\n";
                checkSame(loaded(place, comment + "[sect]\nkey=value\nlast=1"),
                          {{L"sect", L"key", L"value"}, {L"sect", L"last", L"1"}});
            }
        }
    }
}

TEST_CASE("entries are sorted by section and key without regard to case") {
    SettingsPlace const place;
    checkSame(loaded(place, "[b]\nZ=1\na=2\nM=3\n[C]\nk=4\n[A]\ny=5\nX=6\n"), {{L"A", L"X", L"6"},
                                                                               {L"A", L"y", L"5"},
                                                                               {L"b", L"a", L"2"},
                                                                               {L"b", L"M", L"3"},
                                                                               {L"b", L"Z", L"1"},
                                                                               {L"C", L"k", L"4"}});
    // Letters compare as lower case, so the signs between Z and a come before all of them.
    checkSame(loaded(place, "[s]\nB=1\n_=2\na=3\n^x=4\nz=5\n~=6\n0=7\n"), {{L"s", L"0", L"7"},
                                                                           {L"s", L"^x", L"4"},
                                                                           {L"s", L"_", L"2"},
                                                                           {L"s", L"a", L"3"},
                                                                           {L"s", L"B", L"1"},
                                                                           {L"s", L"z", L"5"},
                                                                           {L"s", L"~", L"6"}});
    checkSame(
        loaded(place, "[s]\nab=1\na=2\nabc=3\nA b=4\n"),
        {{L"s", L"a", L"2"}, {L"s", L"A b", L"4"}, {L"s", L"ab", L"1"}, {L"s", L"abc", L"3"}});
}

TEST_CASE("parts of one section come together, and each entry keeps its spelling") {
    SettingsPlace const place;
    checkSame(loaded(place, "[a]\nm=1\n[B]\nx=2\n[A]\nc=3\n[b]\ny=4\n[a]\nz=5\n"),
              {{L"A", L"c", L"3"},
               {L"a", L"m", L"1"},
               {L"a", L"z", L"5"},
               {L"B", L"x", L"2"},
               {L"b", L"y", L"4"}});
}

TEST_CASE("every entry with equal names is kept, in the order of the file") {
    SettingsPlace const place;
    checkSame(loaded(place, "[s]\na=1\nA=2\na=3\n"),
              {{L"s", L"a", L"1"}, {L"s", L"A", L"2"}, {L"s", L"a", L"3"}});
    checkSame(loaded(place, "[s]\nA=2\na=1\n"), {{L"s", L"A", L"2"}, {L"s", L"a", L"1"}});

    std::string bytes;
    Settings expected;
    for (int i = 0; i < 400; ++i) {
        std::string const number = std::to_string(i);
        bytes += i % 3 == 0 ? "[S]\n" : "[s]\n";
        bytes += (i % 2 == 0 ? "KEY=" : "key=") + number + "\n";
        expected.push_back({i % 3 == 0 ? L"S" : L"s", i % 2 == 0 ? L"KEY" : L"key",
                            std::wstring(number.begin(), number.end())});
    }
    checkSame(loaded(place, bytes), expected);
}

TEST_CASE("the table is written as a header per run and a line per entry") {
    SettingsPlace const place;
    CHECK(written(place, {}) == "");
    CHECK(written(place, {{L"s", L"k", L"v"}}) == "[s]\nk=v\n");
    CHECK(written(place, {{L"s", L"k", L""}}) == "[s]\nk=\n");
    CHECK(written(place, {{L"b", L"z", L"1"}, {L"a", L"y", L"2"}, {L"b", L"x", L"3"}}) ==
          "[a]\ny=2\n[b]\nx=3\nz=1\n");
    CHECK(written(place, {{L"s", L"k ", L" v "}}) == "[s]\nk = v \n");
    CHECK(written(place, {{L"", L"k", L"v"}, {L"s", L"", L"w"}}) == "[]\nk=v\n[s]\n=w\n");
    CHECK(written(place, {{L"", L"", L""}}) == "[]\n=\n");
    // Nothing is escaped.
    CHECK(written(place, {{L"a]\n[b", L"k=\n", L"v\n#"}}) == "[a]\n[b]\nk=\n=v\n#\n");
}

TEST_CASE("a section has one header, spelt as its entry with the smallest key spells it") {
    SettingsPlace const place;
    {
        InitializationFile file(place.path());
        file.open(WRITE);
        file.setValue(L"net", L"b", L"1");
        file.setValue(L"NET", L"c", L"2");
        file.setValue(L"Net", L"a", L"3");
        file.close();
    }
    CHECK(place.bytes() == "[Net]\na=3\nb=1\nc=2\n");
}

TEST_CASE("text is written as make_string encodes it") {
    SettingsPlace const place;
    CHECK(written(place, {{L"\u00E9", L"\u20AC", L"\U0001F600"}}) ==
          "[\xC3\xA9]\n\xE2\x82\xAC=\xF0\x9F\x98\x80\n");
    CHECK(written(place, {{L"s", L"k", L"\x7FFFFFFF"}}) == "[s]\nk=\xFD\xBF\xBF\xBF\xBF\xBF\n");
    CHECK(written(place, {{L"s\0t"s, L"k\0l"s, L"v\0w"s}}) == "[s]\nk=v\n");
    // Of a unit of 0x80000000 and above its low byte is written, and if that is zero, no more.
    std::wstring const high{static_cast<wchar_t>(0x80000041), L'b',
                            static_cast<wchar_t>(0xFFFFFFC3)};
    CHECK(written(place, {{L"s", L"k", high}}) == "[s]\nk=Ab\xC3\n");
    std::wstring const zero{L'a', static_cast<wchar_t>(0x80000000), L'b'};
    CHECK(written(place, {{zero, zero, zero}}) == "[a]\na=a\n");
    std::wstring const surrogate{static_cast<wchar_t>(0xD800)};
    CHECK(written(place, {{L"s", L"k", surrogate}}) == "[s]\nk=\xED\xA0\x80\n");
}

TEST_CASE("comments, blank lines, spacing and the order of lines are lost when written") {
    SettingsPlace const place;
    place.write("# top\nlost=1\n\n[ b ]\n  z = 1  \n; c\n a=2\n\n\n[a]\nword\nk=v");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[ b ]\na=2\nz = 1\n[a]\nk=v\n");
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[ b ]\na=2\nz = 1\n[a]\nk=v\n");
}

TEST_CASE("malformed text is written as it was decoded") {
    SettingsPlace const place;
    place.write("[s\xC3]\n\xC1\x81=\x80xyz\nb=\xC0\x80lost\nc=\xF0\x82\x82\xAC\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[s?]\nA=?xyz\nb=\nc=\xE2\x82\xAC\n");
}

TEST_CASE("duplicates and their order survive writing and reading") {
    SettingsPlace const place;
    place.write("[s]\nb=1\na=2\nB=3\na=4\nA=5\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[s]\na=2\na=4\nA=5\nb=1\nB=3\n");
}

TEST_CASE("a section without keys does not survive writing and reading") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.createSection(L"Empty");
    file.setValue(L"Full", L"k", L"v");
    file.synchronize();
    CHECK(place.bytes() == "[Empty]\n=\n[Full]\nk=v\n");
    checkSame(file.enumerateSections(), names({L"Full"}));
}

TEST_CASE("entries of the empty section come back in section [") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"s", L"k", L"v");
    file.setValue(L"", L"k", L"w");
    file.synchronize();
    CHECK(place.bytes() == "[]\nk=w\n[s]\nk=v\n");
    checkSame(file.enumerateSections(), names({L"[", L"s"}));
    checkSame(file.getValue(L"[", L"k"), L"w");
    checkSame(file.getValue(L"", L"k"), L"");
}

// ---------------------------------------------------------------------------------- the operations

TEST_CASE("a missing section or key gives an empty value, an empty list or no effect") {
    SettingsPlace const place;
    place.write("[s]\nk=v\nempty=\n");
    InitializationFile file(place.path());
    file.open(READ);
    checkSame(file.getValue(L"s", L"missing"), L"");
    checkSame(file.getValue(L"missing", L"k"), L"");
    checkSame(file.getValue(L"k", L"s"), L"");
    checkSame(file.getValue(L"", L""), L"");
    checkSame(file.getValue(L"s", L""), L"");
    checkSame(file.getValue(L"s", L"empty"), L"");
    CHECK(file.enumerateKeys(L"missing").empty());
    CHECK(file.enumerateKeys(L"").empty());
    file.removeKey(L"s", L"missing");
    file.removeKey(L"missing", L"k");
    file.removeKey(L"s", L"");
    file.removeSection(L"missing");
    file.removeSection(L"");
    checkSame(drain(file), {{L"s", L"empty", L""}, {L"s", L"k", L"v"}});
}

TEST_CASE("names match without regard to case and in full") {
    SettingsPlace const place;
    place.write("[Net]\nHost=a\nHostname=b\n[Network]\nHost=c\n");
    InitializationFile file(place.path());
    file.open(READ);
    checkSame(file.getValue(L"NET", L"hOST"), L"a");
    checkSame(file.getValue(L"net", L"HOSTNAME"), L"b");
    checkSame(file.getValue(L"nETWORK", L"host"), L"c");
    checkSame(file.getValue(L"Ne", L"Host"), L"");
    checkSame(file.getValue(L"Net", L"Hos"), L"");
    checkSame(file.getValue(L"Net", L"Host "), L"");
    checkSame(file.enumerateKeys(L"nEt"), names({L"Host", L"Hostname"}));
    // Only letters have a case: signs that are 32 apart differ.
    struct Pair {
        wchar_t const* held;
        wchar_t const* asked;
    };
    for (Pair const& pair :
         {Pair{L"@", L"`"}, Pair{L"[", L"{"}, Pair{L"^", L"~"}, Pair{L"_", L"\x7F"},
          Pair{L"\r", L"-"}, Pair{L"0", L"\x10"}, Pair{L"\u00C9", L"\u00E9"}, Pair{L"\u0141", L"A"},
          Pair{L"\U00010041", L"A"}}) {
        CAPTURE(test::shown(std::wstring(pair.held)));
        file.setValue(L"signs", pair.held, L"x");
        checkSame(file.getValue(L"signs", pair.asked), L"");
        checkSame(file.getValue(L"signs", pair.held), L"x");
    }
}

TEST_CASE("setValue replaces the first entry's value in its place and keeps its names") {
    SettingsPlace const place;
    place.write("[S]\nA=1\nb=2\nB=3\nc=4\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"s", L"B", L"new");
    file.setValue(L"s", L"a", L"");
    checkSame(drain(file),
              {{L"S", L"A", L""}, {L"S", L"b", L"new"}, {L"S", L"B", L"3"}, {L"S", L"c", L"4"}});
}

TEST_CASE("setValue adds a missing entry, and with it the section, at the end of the table") {
    SettingsPlace const place;
    place.write("[m]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"m", L"a", L"2");
    file.setValue(L"a", L"k", L"3");
    file.setValue(L"", L"", L"4");
    file.setValue(L"m", L"", L"5");
    checkSame(drain(file), {{L"m", L"k", L"1"},
                            {L"m", L"a", L"2"},
                            {L"a", L"k", L"3"},
                            {L"", L"", L"4"},
                            {L"m", L"", L"5"}});
}

TEST_CASE("createKey adds a missing entry and keeps the value of one that exists") {
    SettingsPlace const place;
    place.write("[m]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.createKey(L"M", L"K");
    file.createKey(L"m", L"a");
    file.createKey(L"new", L"k");
    file.createKey(L"", L"");
    file.createKey(L"", L"");
    checkSame(drain(file),
              {{L"m", L"k", L"1"}, {L"m", L"a", L""}, {L"new", L"k", L""}, {L"", L"", L""}});
}

TEST_CASE("createSection adds an entry with empty key and value unless the section exists") {
    SettingsPlace const place;
    place.write("[m]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.createSection(L"M");
    file.createSection(L"Net");
    file.createSection(L"nET");
    file.createSection(L"");
    checkSame(file.enumerateKeys(L"net"), names({L""}));
    checkSame(file.getValue(L"net", L""), L"");
    // The placeholder is an entry like any other.
    file.createKey(L"Net", L"");
    file.setValue(L"NET", L"", L"v");
    file.setValue(L"Net", L"k", L"w");
    checkSame(drain(file),
              {{L"m", L"k", L"1"}, {L"Net", L"", L"v"}, {L"", L"", L""}, {L"Net", L"k", L"w"}});
}

TEST_CASE("removeKey removes only the first of equal entries") {
    SettingsPlace const place;
    place.write("[s]\na=1\nb=2\nB=3\nb=4\nc=5\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.removeKey(L"S", L"B");
    checkSame(file.getValue(L"s", L"b"), L"3");
    checkSame(file.enumerateKeys(L"s"), names({L"a", L"B", L"b", L"c"}));
    file.removeKey(L"s", L"b");
    file.removeKey(L"s", L"a");
    checkSame(drain(file), {{L"s", L"b", L"4"}, {L"s", L"c", L"5"}});
}

TEST_CASE("a section is gone with its last entry") {
    SettingsPlace const place;
    place.write("[a]\nk=1\n[b]\nk=2\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.removeKey(L"a", L"k");
    checkSame(file.enumerateSections(), names({L"b"}));
    file.removeKey(L"b", L"k");
    CHECK(file.enumerateSections().empty());
    file.setValue(L"B", L"k", L"3");
    checkSame(drain(file), {{L"B", L"k", L"3"}});
}

TEST_CASE("removeSection skips the entry that moves into a removed one's place") {
    SettingsPlace const place;
    for (std::size_t count = 0; count <= 9; ++count) {
        CAPTURE(count);
        std::string bytes = "[a]\nk=1\n[s]\n";
        Settings expected{{L"a", L"k", L"1"}};
        for (std::size_t i = 0; i < count; ++i) {
            std::string const key(1, static_cast<char>('a' + i));
            bytes += key + "=v\n";
            // The second, the fourth and so on stay.
            if (i % 2 == 1) expected.push_back({L"s", std::wstring(key.begin(), key.end()), L"v"});
        }
        place.write(bytes + "[t]\nk=2\n");
        expected.push_back({L"t", L"k", L"2"});
        InitializationFile file(place.path());
        file.open(READ);
        file.removeSection(L"S");
        checkSame(drain(file), expected);
    }
}

TEST_CASE("removeSection removes single entries of a section wherever they are") {
    SettingsPlace const place;
    place.write("[s]\na=1\n[t]\na=2\n[u]\na=3\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"S", L"b", L"4");
    file.setValue(L"t", L"b", L"5");
    file.setValue(L"s", L"c", L"6");
    file.removeSection(L"s");
    checkSame(drain(file), {{L"t", L"a", L"2"}, {L"u", L"a", L"3"}, {L"t", L"b", L"5"}});
}

TEST_CASE("enumerateKeys gives every key of the section in the order of the table") {
    SettingsPlace const place;
    place.write("[s]\nb=1\na=2\nB=3\n[t]\nx=4\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"S", L"A!", L"5");
    file.setValue(L"s", L"", L"6");
    file.setValue(L"t", L"y", L"7");
    checkSame(file.enumerateKeys(L"S"), names({L"a", L"b", L"B", L"A!", L""}));
    checkSame(file.enumerateKeys(L"T"), names({L"x", L"y"}));
}

TEST_CASE("enumerateSections names each run of entries as its first entry does") {
    SettingsPlace const place;
    place.write("[B]\nk=1\n[a]\nk=2\n[b]\na=3\n[C]\nk=4\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C"}));
    file.setValue(L"c", L"new", L"5"); // joins the last run
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C"}));
    file.setValue(L"A", L"new", L"6");
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C", L"A"}));
    file.setValue(L"a", L"k", L"7"); // changes a value only
    file.createKey(L"B", L"new");
    file.createSection(L"b");
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C", L"A", L"B"}));
    file.synchronize();
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C"}));
}

TEST_CASE("values and names are held as they were set until they are written") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    std::wstring const odd{L'a',
                           L'\0',
                           L'b',
                           static_cast<wchar_t>(0x80000041),
                           static_cast<wchar_t>(0xFFFFFFFF),
                           static_cast<wchar_t>(0xD800),
                           L'\n'};
    file.setValue(L"s", L"k", odd);
    CHECK(file.getValue(L"s", L"k") == odd);
    file.setValue(L"s\0one"s, L"n\0one"s, L"v");
    checkSame(file.enumerateSections(), names({L"s"}));
    CHECK(file.enumerateKeys(L"s") == std::vector<std::wstring>{L"k", L"n\0one"s});
    // Names are compared up to their first NUL.
    checkSame(file.getValue(L"S", L"N"), L"v");
    checkSame(file.getValue(L"s\0two"s, L"n\0two"s), L"v");
    file.createSection(L"\0x"s);
    CHECK(file.enumerateSections() == std::vector<std::wstring>{L"s", L"\0x"s});
    checkSame(file.enumerateKeys(L""), names({L""}));
    file.removeKey(L"", L"\0y"s);
    file.createKey(L"t", L"");
    file.setValue(L"t", L"\0z"s, L"w\0"s);
    CHECK(file.getValue(L"t", L"") == L"w\0"s);

    file.synchronize();
    checkSame(drain(file), {{L"s", L"k", L"a"}, {L"s", L"n", L"v"}});
}

TEST_CASE("names of units that no UTF-8 gives are found again") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(WRITE);
    for (unsigned long const unit : {0x80000000UL, 0x80000041UL, 0xC0000000UL, 0xFFFFFFFFUL,
                                     0x7FFFFFFFUL, 0xD800UL, 0x110000UL}) {
        CAPTURE(unit);
        std::wstring const name{L'n', static_cast<wchar_t>(unit), L'x'};
        std::wstring const spelt{L'N', static_cast<wchar_t>(unit), L'X'};
        file.setValue(name, name, name);
        CHECK(file.getValue(spelt, spelt) == name);
        CHECK(file.enumerateKeys(spelt) == std::vector<std::wstring>{name});
    }
}

TEST_CASE("results are copies that later changes do not touch") {
    SettingsPlace const place;
    place.write("[s]\na=1\nb=2\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    std::vector<std::wstring> const sections = file.enumerateSections();
    std::vector<std::wstring> const keys = file.enumerateKeys(L"s");
    std::wstring const value = file.getValue(L"s", L"a");
    file.setValue(sections[0], keys[0], value + value);
    file.removeKey(sections[0], keys[1]);
    file.synchronize();
    file.close();
    checkSame(sections, names({L"s"}));
    checkSame(keys, names({L"a", L"b"}));
    checkSame(value, L"1");
    CHECK(place.bytes() == "[s]\na=11\n");
}

// ---------------------------------------------------------------------------------- the life cycle

TEST_CASE("opening a missing file fails for reading and creates it for writing") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    CHECK(!file.is_open());
    CHECK(!place.exists());
    file.open(READ_WRITE);
    CHECK(file.is_open());
    CHECK(file.getMode() == READ_WRITE);
    CHECK(place.bytes() == "");
    file.close();
    CHECK(place.bytes() == "");
    std::filesystem::remove(place.path());
    file.open(WRITE);
    CHECK(place.bytes() == "");
}

TEST_CASE("a mode without reading and writing is refused") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    unsigned long const binary = File::BINARY;
    for (unsigned long const mode : {0UL, 4UL, binary}) {
        CHECK(messageOf<std::runtime_error>([&] { file.open(mode); }) == "failed to open file.");
        CHECK(!file.is_open());
        CHECK(file.getMode() == 0UL);
    }
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("an open that fails leaves the table as it was") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.setValue(L"s", L"k", L"v");
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    checkSame(file.getValue(L"s", L"k"), L"v");
    CHECK(file.getMode() == 0UL);

    InitializationFile nameless;
    nameless.setValue(L"s", L"k", L"v");
    CHECK(messageOf<std::runtime_error>([&] { nameless.open(READ_WRITE); }) ==
          "failed to open file.");
    checkSame(nameless.getValue(L"s", L"k"), L"v");
}

TEST_CASE("open discards what the table held") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    file.setValue(L"early", L"k", L"v");
    file.open(READ_WRITE);
    checkSame(file.enumerateSections(), names({L"s"}));
    file.close();
    file.setValue(L"between", L"k", L"v");
    file.open(WRITE);
    CHECK(file.enumerateSections().empty());
    file.close();
    CHECK(place.bytes() == "");
}

TEST_CASE("changes without the write bit vanish at close and the file stays untouched") {
    SettingsPlace const place;
    std::string const bytes = "; comment\n\n[s]\r\nk = v\n";
    place.write(bytes);
    auto const time = std::filesystem::last_write_time(place.path());
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"s", L"k", L"changed");
    file.createSection(L"new");
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.enumerateSections().empty());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    file.open(READ);
    checkSame(drain(file), {{L"s]\r", L"k ", L" v"}});
    file.close();
    CHECK(place.bytes() == bytes);
    CHECK(std::filesystem::last_write_time(place.path()) == time);
}

TEST_CASE("opening for writing alone begins with an empty table and replaces the whole file") {
    SettingsPlace const place;
    place.write("[old]\nk=v\n");
    InitializationFile file(place.path());
    file.open(WRITE);
    CHECK(file.enumerateSections().empty());
    CHECK(place.bytes() == "");
    file.setValue(L"new", L"k", L"v");
    CHECK(place.bytes() == "");
    file.close();
    CHECK(place.bytes() == "[new]\nk=v\n");
    CHECK(file.enumerateSections().empty());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
}

TEST_CASE("the mode keeps the bits without a meaning") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    unsigned long const mode = READ_WRITE | File::BINARY | 0x40UL;
    file.open(mode);
    CHECK(file.getMode() == mode);
    file.setValue(L"s", L"k", L"v");
    file.synchronize();
    CHECK(file.getMode() == mode);
    checkSame(file.getValue(L"s", L"k"), L"v");
}

TEST_CASE("a file may be opened and closed again and again") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    for (int i = 0; i < 20; ++i) {
        file.open(READ_WRITE);
        std::wstring const number = std::to_wstring(i);
        checkSame(file.getValue(L"s", L"count"), i == 0 ? L"" : std::to_wstring(i - 1));
        file.setValue(L"s", L"count", number);
        file.close();
    }
    CHECK(place.bytes() == "[s]\ncount=19\n");
}

TEST_CASE("closing or destroying an object that was never opened touches no file") {
    SettingsPlace const place;
    {
        InitializationFile file(place.path());
        file.setValue(L"s", L"k", L"v");
        CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
        CHECK(file.enumerateSections().empty());
        CHECK(file.getMode() == 0UL);
        CHECK(file.fail());
        file.setValue(L"s", L"k", L"v");
    }
    CHECK(!place.exists());
    place.write("old");
    { InitializationFile const file(place.path()); }
    CHECK(place.bytes() == "old");
    { InitializationFile const nameless; }
    InitializationFile nameless;
    nameless.setValue(L"s", L"k", L"v");
    CHECK(messageOf<std::exception>([&] { nameless.close(); }) == "<nothing>");
    nameless.synchronize();
}

TEST_CASE("closing twice is harmless") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"s", L"k", L"v");
    file.close();
    file.setValue(L"t", L"k", L"v");
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.getMode() == 0UL);
    CHECK(file.enumerateSections().empty());
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("the destructor writes a file that is open for writing") {
    SettingsPlace const place;
    {
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"v");
    }
    CHECK(place.bytes() == "[s]\nk=v\n");
    {
        InitializationFile file(place.path());
        file.open(READ);
        file.setValue(L"s", L"k", L"w");
    }
    CHECK(place.bytes() == "[s]\nk=v\n");
    {
        std::unique_ptr<File> const file(new InitializationFile(place.path()));
        file->open(WRITE);
    }
    CHECK(place.bytes() == "");
    {
        auto* const settings = new InitializationFile(place.path());
        std::unique_ptr<std::iostream> const stream(settings);
        settings->open(WRITE);
        settings->setValue(L"deleted", L"as", L"a stream");
    }
    CHECK(place.bytes() == "[deleted]\nas=a stream\n");
}

namespace {

/// Counts the calls that reach its overrides.
class Counting : public InitializationFile {
public:
    Counting(std::string const& path, int& opens, int& closes)
        : InitializationFile(File::Path(path)), opens_(opens), closes_(closes) {}
    void open(unsigned long mode) override {
        ++opens_;
        InitializationFile::open(mode);
    }
    void close() override {
        ++closes_;
        InitializationFile::close();
    }

private:
    int& opens_;
    int& closes_;
};

} // namespace

TEST_CASE("synchronize reaches overrides, and the destructor calls the class's own close") {
    SettingsPlace const place;
    int opens = 0;
    int closes = 0;
    {
        Counting file(place.path(), opens, closes);
        file.synchronize();
        CHECK(opens == 0);
        CHECK(closes == 0);
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"v");
        file.synchronize();
        CHECK(opens == 2);
        CHECK(closes == 1);
        CHECK(place.bytes() == "[s]\nk=v\n");
        file.setValue(L"s", L"k", L"w");
    }
    CHECK(opens == 2);
    CHECK(closes == 1);
    CHECK(place.bytes() == "[s]\nk=w\n");
}

TEST_CASE("synchronize writes back and reads again") {
    SettingsPlace const place;
    place.write("[s]\nb=1\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"s", L"c", L"2");
    file.setValue(L"r", L"a", L"3");
    file.setValue(L"s", L"odd", L"x\ny=z");
    file.createSection(L"t");
    file.synchronize();
    CHECK(place.bytes() == "[r]\na=3\n[s]\nb=1\nc=2\nodd=x\ny=z\n[t]\n=\n");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ_WRITE);
    checkSame(drain(file), {{L"r", L"a", L"3"},
                            {L"s", L"b", L"1"},
                            {L"s", L"c", L"2"},
                            {L"s", L"odd", L"x"},
                            {L"s", L"y", L"z"}});
}

TEST_CASE("synchronize of a file open for reading drops changes and reads what is there now") {
    SettingsPlace const place;
    place.write("[s]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"s", L"k", L"mine");
    place.write("[s]\nk=2\n");
    file.synchronize();
    checkSame(drain(file), {{L"s", L"k", L"2"}});
    CHECK(file.getMode() == READ);
    CHECK(place.bytes() == "[s]\nk=2\n");
}

TEST_CASE("synchronize of a file open for writing alone leaves file and table empty") {
    // Intended: reopening for writing empties the file that was just written.
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(WRITE);
    file.setValue(L"s", L"k", L"v");
    file.synchronize();
    CHECK(file.getMode() == WRITE);
    CHECK(file.enumerateSections().empty());
    CHECK(place.bytes() == "");
}

TEST_CASE("synchronize leaves a closed file and its table as they are") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.setValue(L"s", L"k", L"v");
    file.synchronize();
    checkSame(file.getValue(L"s", L"k"), L"v");
    CHECK(!file.is_open());
    CHECK(!place.exists());
}

TEST_CASE("setMode decides what the next close does") {
    SettingsPlace const place;
    place.write("; c\n[s]\nk=1\n");
    InitializationFile file(place.path());
    SUBCASE("writing allowed later") {
        file.open(READ);
        file.setValue(L"s", L"k", L"2");
        file.setMode(READ_WRITE);
        file.synchronize();
        CHECK(place.bytes() == "[s]\nk=2\n");
        CHECK(file.getMode() == READ_WRITE);
        checkSame(file.getValue(L"s", L"k"), L"2");
    }
    SUBCASE("writing no longer allowed") {
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"2");
        file.setMode(READ);
        file.synchronize();
        CHECK(file.getMode() == READ);
        checkSame(file.getValue(L"s", L"k"), L"1");
        file.close();
        CHECK(place.bytes() == "; c\n[s]\nk=1\n");
    }
    SUBCASE("writing alone") {
        file.open(READ);
        file.setMode(WRITE);
        file.close();
        CHECK(place.bytes() == "[s]\nk=1\n");
    }
    SUBCASE("neither") {
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"2");
        file.setMode(0);
        CHECK(messageOf<std::runtime_error>([&] { file.synchronize(); }) == "failed to open file.");
        CHECK(!file.is_open());
        CHECK(place.bytes() == "; c\n[s]\nk=1\n");
    }
    SUBCASE("writing, without the file ever opened") {
        file.setMode(READ_WRITE);
        file.setValue(L"t", L"k", L"v");
        file.close();
        CHECK(place.bytes() == "[t]\nk=v\n");
        CHECK(file.getMode() == 0UL);
        CHECK(!file.is_open());
    }
}

TEST_CASE("opening an open file reads it again and changes the mode, but not the stream") {
    SettingsPlace const place;
    place.write("[s]\nk=1\n");
    InitializationFile file(place.path());
    SUBCASE("to read again") {
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"mine");
        file.open(READ);
        CHECK(file.getMode() == READ);
        checkSame(file.getValue(L"s", L"k"), L"1");
        file.setValue(L"s", L"k", L"mine");
        file.close();
        CHECK(place.bytes() == "[s]\nk=1\n");
    }
    SUBCASE("to write") {
        file.open(READ);
        file.open(WRITE);
        CHECK(file.getMode() == WRITE);
        CHECK(file.enumerateSections().empty());
        CHECK(place.bytes() == "[s]\nk=1\n"); // not emptied: it was not opened again
        file.setValue(L"t", L"k", L"2");
        file.close();
        CHECK(place.bytes() == "[t]\nk=2\n");
    }
    SUBCASE("to read what was opened for writing alone") {
        file.open(WRITE);
        file.setValue(L"s", L"k", L"mine");
        file.open(READ);
        CHECK(file.enumerateSections().empty());
        file.close();
        CHECK(place.bytes() == "");
    }
    SUBCASE("with no mode at all") {
        file.open(READ_WRITE);
        file.open(0);
        CHECK(file.is_open());
        CHECK(file.getMode() == 0UL);
        CHECK(file.enumerateSections().empty());
        file.close();
        CHECK(place.bytes() == "[s]\nk=1\n");
    }
}

TEST_CASE("open leaves the stream at the end of the file, where it can be used") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    file.open(READ);
    CHECK(file.rdstate() == std::ios::eofbit);
    file.clear();
    CHECK(file.tellg() == std::streampos(8));
    file.seekg(0);
    std::string line;
    CHECK(bool(std::getline(file, line)));
    CHECK(line == "[s]");
    checkSame(file.getValue(L"s", L"k"), L"v");
    file.close();
    file.open(READ);
    CHECK(file.rdstate() == std::ios::eofbit);
    file.close();

    place.write("");
    file.open(READ_WRITE);
    CHECK(file.rdstate() == std::ios::eofbit);
    file.close();
    InitializationFile other(place.path());
    other.open(WRITE);
    CHECK(other.good());
    other.write("direct", 6).flush();
    CHECK(place.bytes() == "direct");
    other.close();
    CHECK(place.bytes() == "");
}

TEST_CASE("open and close clear what went wrong with the stream before") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    CHECK(file.fail());
    file.open(WRITE);
    file.setValue(L"s", L"k", L"v");
    file.setstate(std::ios::failbit | std::ios::badbit);
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(place.bytes() == "[s]\nk=v\n");
    file.setstate(std::ios::failbit | std::ios::badbit);
    file.open(READ);
    CHECK(file.rdstate() == std::ios::eofbit);
    checkSame(drain(file), {{L"s", L"k", L"v"}});
}

TEST_CASE("close deletes the old file and writes another in its place") {
    SettingsPlace const place;
    std::string const other = place.directory() / "other";
    mode_t const mask = ::umask(022);
    SUBCASE("another name of the old file keeps the old content") {
        place.write("[s]\nk=old\n");
        std::filesystem::create_hard_link(place.path(), other);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"new");
        file.close();
        CHECK(place.bytes() == "[s]\nk=new\n");
        CHECK(test::readFile(other) == "[s]\nk=old\n");
    }
    SUBCASE("a link is replaced, not what it leads to") {
        test::writeFile(other, "[s]\nk=old\n");
        std::filesystem::create_symlink(other, place.path());
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        checkSame(file.getValue(L"s", L"k"), L"old");
        file.setValue(L"s", L"k", L"new");
        file.close();
        CHECK(!std::filesystem::is_symlink(place.path()));
        CHECK(place.bytes() == "[s]\nk=new\n");
        CHECK(test::readFile(other) == "[s]\nk=old\n");
    }
    SUBCASE("the new file has a new file's permissions") {
        place.write("[s]\nk=old\n");
        CHECK(::chmod(place.path().c_str(), 0600) == 0);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.close();
        struct stat status = {};
        CHECK(::stat(place.path().c_str(), &status) == 0);
        CHECK((status.st_mode & 0777U) == 0644U);
    }
    SUBCASE("a file that was deleted meanwhile comes back") {
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        std::filesystem::remove(place.path());
        file.close();
        CHECK(place.bytes() == "[s]\nk=v\n");
    }
    SUBCASE("what another wrote meanwhile is lost") {
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        place.write("[other]\nlong=content of somebody else\n");
        file.close();
        CHECK(place.bytes() == "[s]\nk=v\n");
    }
    SUBCASE("an empty directory in its place is deleted too") {
        InitializationFile file(place.path());
        file.open(WRITE);
        file.setValue(L"s", L"k", L"v");
        std::filesystem::remove(place.path());
        std::filesystem::create_directory(place.path());
        file.close();
        CHECK(place.bytes() == "[s]\nk=v\n");
    }
    ::umask(mask);
}
