// The lines of the two settings files, and what is done to their entries. Keys are in their order
// here, so that it does not matter that the sectioned file sorts them.
#include <doctest/doctest.h>

#include <algorithm>
#include <cstddef>
#include <string>
#include <vector>

#include "structured/lines.h"
#include "support/choices.h"
#include "support/plainlocale.h"

using namespace structured;
using namespace std::string_literals;

namespace {

/// The lines that these entries are written as.
template <class Family>
std::string written(Properties const& list) {
    Lines<Family> file("", WRITE);
    for (Property const& p : list) file.put(p.key, p.value);
    return file.written();
}

} // namespace

SETTINGS_TEST_CASE("lines become entries as the format says") {
    checkRows<Family>({
        {"nothing", "", ""},
        {"one line feed", "\n", ""},
        {"line feeds", "\n\n\n\n", ""},
        {"an entry", "k=v\n", "k/v"},
        {"the last line without line feed", "a=1\nk=v", "a/1 | k/v"},
        {"blank lines between", "\n\na=1\n\n\nk=v\n\n\n", "a/1 | k/v"},
        {"a comment between", "a=2\n# note\nb=1\n", "a/2 | b/1"},
        {"trimmed", "  key=value\t\n", "key/value"},
        {"trimmed of many", " \t \tkey=value\t \t  \n", "key/value"},
        {"trimmed without line feed", " \tk=v \t", "k/v"},
        {"not trimmed at the equals", "name = value\n", "name / value"},
        {"tabs at the equals", "k\t=\tv\n", "k<9>/<9>v"},
        {"an empty value", "k=\n", "k/"},
        {"a value of blanks", "k=  \t\n", "k/"},
        {"a key of a trailing blank, no value", " k =\n", "k /"},
        {"the first equals counts", "k=a=b==\n", "k/a=b=="},
        {"two equals", "k==\n", "k/="},
        {"an empty key", "=x\n", ""},
        {"an empty key after trimming", "  =5\n", ""},
        {"only an equals", "=\n", ""},
        {"only equals", "===\n", ""},
        {"a key of blanks cannot be", " \t = 5\n", ""},
        {"no equals", "word\nk=v\nmore words\n", "k/v"},
        {"no equals at the end", "k=v\nword", "k/v"},
        {"a line of blanks", "  \n\t\t\n \t \nk=v\n", "k/v"},
        {"blanks at the end", "k=v\n \t ", "k/v"},
        {"brackets after the start", "]=w\nk[0]=v]\n", "]/w | k[0]/v]"},
        {"inner blanks stay", "a  b\t=c  d\n", "a  b<9>/c  d"},
        {"quotes are text", "\"k\"='v'\n", "\"k\"/'v'"},
        {"backslashes are text", "b=a\\\nk=c\\n\n", "b/a\\ | k/c\\n"},
        {"a colon separates nothing", "k:v\na:b=c\n", "a:b/c"},
        {"other white space is text", "\v\f k=v \v\f\n", "<b><c> k/v <b><c>"},
    });
}

SETTINGS_TEST_CASE("a line that begins with # or ; is a comment") {
    checkRows<Family>({
        {"both", "#a=1\n;b=2\nk=v\n", "k/v"},
        {"indented", "  #a=1\n\t;b=2\n \t ;\nk=v\n", "k/v"},
        {"a header in a comment", "#[t]\n;[u]\nk=v\n", "k/v"},
        {"after the start", "k#a=v ; w # x\n", "k#a/v ; w # x"},
        {"as first byte of a value", "k=#v\nl=;w\n", "k/#v | l/;w"},
        {"bare", "#\n;\n##\n;;\nk=v\n", "k/v"},
        {"without line feed", "k=v\n#a=1", "k/v"},
        {"other signs are none", "!b=2\n//a=1\n", "!b/2 | //a/1"},
        {"does not go on in the next line", "#a \\\nk=v\n", "k/v"},
    });
}

SETTINGS_TEST_CASE("a carriage return is ordinary text") {
    checkRows<Family>({
        {"at the end of lines", "k=v\r\nl=\r\n", "k/v<d> | l/<d>"},
        {"blank lines", "\r\n\r\nk=v\n", "k/v"},
        {"ends no line", "k=v\rl=w\n", "k/v<d>l=w"},
        {"keeps what is before it", "k=v \t\r\n", "k/v <9><d>"},
        {"before a comment", "\r#a=1\n", "<d>#a/1"},
        {"before a header", "\r[t]\nk=v\n", "k/v"},
        {"as a key", "\r=1\r\n", "<d>/1<d>"},
        {"alone at the end", "k=v\n\r", "k/v"},
    });
}

SETTINGS_TEST_CASE("key and value each end at their first NUL, and lines do not") {
    checkRows<Family>({
        {"in a value", "k=a\0b\n"s, "k/a"},
        {"in a key", "a\0b=c\n"s, "a/c"},
        {"in both", "c\0d=e\0f\n"s, "c/e"},
        {"more than one", "c\0d\0=e\0f\0\n"s, "c/e"},
        {"before the equals", "k\0=v\n"s, "k/v"},
        {"after the equals", "k=\0v\n"s, "k/"},
        {"a key of none", "\0k=v\n"s, ""},
        {"before a comment sign", "\0#k=v\n"s, ""},
        {"before a bracket", "\0[t]\nk=v\n"s, "k/v"},
        {"an equals after one in a key", "a\0=b=c\n"s, "a/b=c"},
        {"keeps trailing blanks", "k=v \0 \n"s, "k/v "},
        {"keeps a key's blanks", "k \0 =v\n"s, "k /v"},
        {"a line of them", "\0\0\0\nk=v\n"s, "k/v"},
        {"a file of them", "\0\0\0"s, ""},
    });
}

SETTINGS_TEST_CASE("text is UTF-8, decoded as make_wstring decodes it, each part by itself") {
    checkRows<Family>({
        {"two, three and four bytes", "\xC3\xA9\xE2\x82\xAC=\xF0\x9F\x98\x80\n",
         "<e9><20ac>/<1f600>"},
        {"six bytes", "k=\xFD\xBF\xBF\xBF\xBF\xBF\n", "k/<7fffffff>"},
        {"five bytes", "k=\xF8\x88\x80\x80\x80\n", "k/<200000>"},
        {"a surrogate", "k=\xED\xA0\x80\n", "k/<d800>"},
        {"cut by the equals", "k\xC3=\xA9\n", "k?/?"},
        {"cut by the line feed", "k=\xE2\x82\nl=w\n", "k/?? | l/w"},
        {"cut by the end of the file", "k=\xF0\x9F\x98", "k/???"},
        {"cut by a NUL", "k\xC3\0\xA9=\xC3\0\xA9\n"s, "k?/?"},
        {"a stray byte near the end", "k=\200abc\n", "k/?abc"},
        {"a stray byte with five more", "k=\200abcdef\n", "k/<218a3925>f"},
        {"an overlong letter", "\xC1\x81=v\n", "A/v"},
        {"an overlong equals is none", "k\xC0\xBD=v\n", "k=/v"},
        {"an overlong equals alone", "k\xC0\xBDv\n", ""},
        {"an overlong comment sign is none", "\xC0\xA3k=v\n", "#k/v"},
        {"an overlong blank is not trimmed", "k=v\xC0\xA0\n", "k/v "},
        {"an overlong line feed ends no line", "k=v\xC0\x8Al=w\n", "k/v<a>l=w"},
        {"an overlong zero ends the value", "k=a\300\200b\n", "k/a"},
        {"an overlong zero ends the key", "a\300\200b=v\n", "a/v"},
        {"an overlong zero as key", "\xC0\x80=v\n", ""},
        {"a byte order mark before an entry", "\xEF\xBB\xBFk=v\n", "<feff>k/v"},
        {"a byte order mark before a comment", "\xEF\xBB\xBF#k=v\n", "<feff>#k/v"},
        {"a no-break space is not trimmed", "\xC2\xA0k=v\xC2\xA0\n", "<a0>k/v<a0>"},
    });
}

SETTINGS_TEST_CASE("lines of any length and files of any size are read") {
    std::string const blanks(100000, ' ');
    std::string const tabs(100000, '\t');
    std::string const feeds(100000, '\n');
    std::string const key(200000, 'k');
    std::string const value(3000000, 'v');
    CHECK((Lines<Family>("a=1\n" + key + "=" + value).drained() == "a/1 | " + key + "/" + value));
    CHECK(Lines<Family>(feeds + blanks + "word" + tabs + "\n" + feeds + tabs + "k=v" + blanks +
                        "\n#" + blanks + "a=1\n" + blanks + tabs)
              .drained() == "k/v");
    // Lines around the sizes of buffers.
    for (std::size_t const size : {512UL, 1024UL, 4096UL, 8191UL, 8192UL, 65536UL}) {
        for (std::size_t filler = size - 12; filler <= size + 2; ++filler) {
            CAPTURE(filler);
            std::string const comment = "#" + std::string(filler - 2, 'x') + "\n";
            CHECK(Lines<Family>(comment + "key=value\n\nlast=1").drained() == "key/value | last/1");
        }
    }
}

SETTINGS_TEST_CASE("an entry is written as a line, and nothing is escaped") {
    CHECK(written<Family>({}) == "");
    CHECK(written<Family>({{L"k", L"v"}}) == "k=v\n");
    CHECK(written<Family>({{L"k", L""}}) == "k=\n");
    CHECK(written<Family>({{L"a", L"1"}, {L"b", L"2"}, {L"C", L"3"}}) == "a=1\nb=2\nC=3\n");
    CHECK(written<Family>({{L"k ", L" v "}}) == "k = v \n");
    CHECK(written<Family>({{L"", L"w"}}) == "=w\n");
    CHECK(written<Family>({{L"", L""}}) == "=\n");
    CHECK(written<Family>({{L"#k=\n", L"v\n;"}}) == "#k=\n=v\n;\n");
}

SETTINGS_TEST_CASE("text is written as make_string encodes it") {
    CHECK(written<Family>({{L"\u00E9\u20AC", L"\U0001F600"}}) ==
          "\xC3\xA9\xE2\x82\xAC=\xF0\x9F\x98\x80\n");
    CHECK(written<Family>({{L"k", L"\x7FFFFFFF"}}) == "k=\xFD\xBF\xBF\xBF\xBF\xBF\n");
    CHECK(written<Family>({{L"k\0l"s, L"v\0w"s}}) == "k=v\n");
    // Of a unit of 0x80000000 and above its low byte is written, and if that is zero, no more.
    std::wstring const high{static_cast<wchar_t>(0x80000041), L'b',
                            static_cast<wchar_t>(0xFFFFFFC3)};
    CHECK(written<Family>({{L"k", high}}) == "k=Ab\xC3\n");
    std::wstring const zero{L'a', static_cast<wchar_t>(0x80000000), L'b'};
    CHECK(written<Family>({{zero, zero}}) == "a=a\n");
    std::wstring const surrogate{static_cast<wchar_t>(0xD800)};
    CHECK(written<Family>({{L"k", surrogate}}) == "k=\xED\xA0\x80\n");
}

SETTINGS_TEST_CASE("malformed text is written as it was decoded") {
    CHECK(Lines<Family>("\xC1\x81=\x80xyz\nb=\xC0\x80lost\nc=\xF0\x82\x82\xAC\ns\xC3=1\n")
              .written() == "A=?xyz\nb=\nc=\xE2\x82\xAC\ns?=1\n");
}

SETTINGS_TEST_CASE("comments, blank lines and spacing are lost when written") {
    CHECK(Lines<Family>("# top\n\n  a = 1  \n; c\n b=2\n\n\nword\n=x\nM=v").written() ==
          "a = 1\nb=2\nM=v\n");
}

SETTINGS_TEST_CASE("duplicates survive writing and reading") {
    Lines<Family> file("a=2\nA=5\na=2\nb=1\nB=3\n", READ_WRITE);
    file.synchronize();
    CHECK(file.drained() == "a/2 | A/5 | a/2 | b/1 | B/3");
}

SETTINGS_TEST_CASE("keys and values of every length are written whole") {
    Lines<Family> file("", WRITE);
    Properties list;
    for (std::size_t length = 0; length <= 600; ++length) {
        list.push_back({std::wstring(length + 1, L'k'), std::wstring(length, L'\u00E9')});
        file.put(list.back().key, list.back().value);
    }
    std::string const lines = file.written();
    CHECK((lines == textOf(list)));
    CHECK((Lines<Family>(lines).drain() == list));
}

SETTINGS_TEST_CASE("what the format cannot carry is another list when read again") {
    Lines<Family> file("", READ_WRITE);
    for (std::wstring const key : {L"", L" ", L" ;comment", L"#comment"}) file.put(key, L"lost");
    file.put(L"a=b", L"c");
    file.create(L"empty");
    file.put(L"  k", L"v \t");
    file.put(L"two", L"lines\nx=y");
    file.synchronize();
    CHECK(file.drained() == "a/b=c | empty/ | k/v | two/lines | x/y");
}

SETTINGS_TEST_CASE("a missing key gives an empty value or no effect") {
    Lines<Family> file("empty=\nk=v\n");
    CHECK(file.get(L"missing").empty());
    CHECK(file.get(L"").empty());
    CHECK(file.get(L"empty").empty());
    file.erase(L"missing");
    file.erase(L"");
    CHECK(file.drained() == "empty/ | k/v");
    file.erase(L"k");
    CHECK(file.get(L"k").empty());
}

SETTINGS_TEST_CASE("keys match without regard to case and in full") {
    test::PlainLocale const locale;
    Lines<Family> file("Host=a\nHostname=b\nname =c\n");
    CHECK((file.get(L"hOST") == L"a"));
    CHECK((file.get(L"HOSTNAME") == L"b"));
    CHECK((file.get(L"NAME ") == L"c"));
    for (wchar_t const* const key : {L"name", L"Hos", L"Host ", L" Host"}) {
        CHECK(file.get(key).empty());
    }
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
        file.put(pair.held, L"x");
        CHECK(file.get(pair.asked).empty());
        CHECK((file.get(pair.held) == L"x"));
    }
}

SETTINGS_TEST_CASE(
    "setValue replaces the first entry's value in its place and keeps its key's case") {
    Lines<Family> file("A=1\nb=2\n# note\nB=3\nc=4\n");
    file.put(L"B", L"new");
    file.put(L"a", L"");
    CHECK((file.get(L"b") == L"new"));
    CHECK(file.drained() == "A/ | b/new | B/3 | c/4");
}

SETTINGS_TEST_CASE("setValue adds a missing entry at the end of the list") {
    Lines<Family> file("m=1\n");
    file.put(L"a", L"2");
    file.put(L"Z", L"3");
    file.put(L"", L"4");
    file.put(L"", L"5");
    file.put(L"b", L"");
    CHECK(file.drained() == "m/1 | a/2 | Z/3 | /5 | b/");
}

SETTINGS_TEST_CASE("createKey adds a missing entry and keeps the value of one that exists") {
    Lines<Family> file("m=1\nM=2\n");
    for (wchar_t const* const key : {L"M", L"new", L"NEW", L"", L"", L"a"}) file.create(key);
    CHECK(file.drained() == "m/1 | M/2 | new/ | / | a/");
}

SETTINGS_TEST_CASE("removeKey removes only the first of two keys that differ in case") {
    Lines<Family> file("k=1\nK=2\n");
    CHECK((file.get(L"k") == L"1"));
    CHECK((file.get(L"K") == L"1"));
    CHECK(test::shown(file.keys()) == "\"k\" \"K\" ");
    file.erase(L"k");
    CHECK((file.get(L"k") == L"2"));
    CHECK(file.written() == "K=2\n");
}

SETTINGS_TEST_CASE("later entries move up in order when one is removed") {
    Lines<Family> file("a=1\nb=2\nB=3\nb=4\nc=5\n");
    file.erase(L"B");
    CHECK((file.get(L"b") == L"3"));
    CHECK(test::shown(file.keys()) == "\"a\" \"B\" \"b\" \"c\" ");
    file.put(L"b", L"new");
    file.erase(L"a");
    CHECK((file.get(L"C") == L"5"));
    file.put(L"A", L"6"); // comes back at the end, in its new spelling
    CHECK(file.drained() == "B/new | b/4 | c/5 | A/6");
}

SETTINGS_TEST_CASE("values and keys are held as they were set until they are written") {
    Lines<Family> file("", READ_WRITE);
    std::wstring const odd = L"a\0b"s + static_cast<wchar_t>(0x80000041) +
                             static_cast<wchar_t>(0xFFFFFFFF) + static_cast<wchar_t>(0xD800) +
                             L'\n';
    file.put(L"k", odd);
    CHECK((file.get(L"k") == odd));
    file.put(L"n\0one"s, L"v\0"s);
    CHECK((file.keys() == std::vector<std::wstring>{L"k", L"n\0one"s}));
    // Keys are compared up to their first NUL.
    CHECK((file.get(L"N") == L"v\0"s));
    file.put(L"N\0two"s, L"\0w"s);
    CHECK((file.get(L"n\0three"s) == L"\0w"s));
    for (std::wstring const& key : {L"n"s, L"\0x"s, L""s}) file.create(key);
    CHECK((file.keys() == std::vector<std::wstring>{L"k", L"n\0one"s, L"\0x"s}));
    file.erase(L"\0y"s);
    file.synchronize();
    CHECK(file.bytes() == Family::header() + "k=a\nn=\n"s);
    CHECK(file.drained() == "k/a | n/");
}

SETTINGS_TEST_CASE("keys of units that no UTF-8 gives are found again") {
    Lines<Family> file("");
    for (unsigned long const unit : {0x80000000UL, 0x80000041UL, 0xC0000000UL, 0xFFFFFFFFUL,
                                     0x7FFFFFFFUL, 0xD800UL, 0x110000UL}) {
        CAPTURE(unit);
        std::wstring const key{L'n', static_cast<wchar_t>(unit), L'x'};
        file.put(key, key);
        CHECK((file.get({L'N', static_cast<wchar_t>(unit), L'X'}) == key));
        CHECK((file.keys().back() == key));
    }
}

SETTINGS_TEST_CASE("a list that empties and fills again and again holds what was set last") {
    Lines<Family> file("a=from the file\nb=from the file\n", READ_WRITE);
    for (int i = 0; i < 1000; ++i) {
        std::wstring const number = std::to_wstring(i);
        file.erase(L"A");
        file.erase(L"B");
        CHECK(file.keys().empty());
        file.put(L"b", number);
        file.create(L"a");
        file.put(L"A", number + std::wstring(static_cast<std::size_t>(i % 9), L'x'));
        CHECK((file.get(L"B") == number));
    }
    CHECK(file.drained() == "b/999 | a/999");
}

TEST_CASE("the same lines give the same entries in the flat file and in a section") {
    // Only a line that begins with a bracket means something else there.
    std::string const alphabet = "]=#;aAb\t \r\n\n=\0\x80\xC3\xA9\xE2\xFF\xC0"s;
    for (unsigned seed = 1; seed <= 400; ++seed) {
        CAPTURE(seed);
        std::string const lines = test::Dice(seed).text(alphabet, 300);
        Properties list = Lines<Flat>(lines).drain();
        std::stable_sort(list.begin(), list.end(), [](Property const& a, Property const& b) {
            return Koru::compare(a.key, b.key) < 0;
        });
        CHECK(Lines<Sectioned>(lines).drained() == shown(list));
    }
}
