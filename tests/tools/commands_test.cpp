// The commands of `koru` on files of all three families.
#include <doctest/doctest.h>

#include <string>

#include "tools/koru.h"

using test::Desk;
using test::Words;

namespace {

std::string const SAMPLE = "[Main]\nheight=600\nWidth=800\n[Other]\nname=value\n";

} // namespace

TEST_CASE("list shows the sections, or the keys of one") {
    Desk const desk;
    desk.write("a.ini", SAMPLE);
    CHECK(desk.output({"settings", "list", "a.ini"}) == "Main\nOther\n");
    CHECK(desk.output({"settings", "list", "a.ini", "MAIN"}) == "height\nWidth\n");
    CHECK(desk.output({"settings", "list", "a.ini", "--format=json"}) ==
          "{\"section\":\"Main\"}\n{\"section\":\"Other\"}\n");
    CHECK(desk.output({"settings", "list", "a.ini", "other", "--format", "json"}) ==
          "{\"section\":\"Other\",\"key\":\"name\"}\n");
    CHECK(desk.complaint({"settings", "list", "a.ini", "none"}) ==
          "1 koru: a.ini: no section \"none\"\n");
}

TEST_CASE("a name is listed once, as it is spelt first") {
    Desk const desk;
    desk.write("a.ini", "[a]\nX=1\nx=2\n[B]\nk=1\n[A]\nx=3\n");
    CHECK(desk.output({"settings", "list", "a.ini"}) == "a\nB\n");
    CHECK(desk.output({"settings", "list", "a.ini", "a"}) == "X\n");
    desk.write("a.properties", "X=1\nb=2\nx=3\n");
    CHECK(desk.output({"properties", "list", "a.properties"}) == "X\nb\n");
}

TEST_CASE("get shows the value that counts, names in any case") {
    Desk const desk;
    desk.write("a.ini", SAMPLE);
    CHECK(desk.output({"settings", "get", "a.ini", "MAIN", "width"}) == "800\n");
    CHECK(desk.complaint({"settings", "get", "a.ini", "main", "depth"}) ==
          "1 koru: a.ini: no setting \"depth\" in section \"main\"\n");
    desk.write("a.properties", "x=1\nX=2\nempty=\n");
    CHECK(desk.output({"properties", "get", "a.properties", "X"}) == "1\n");
    CHECK(desk.output({"properties", "get", "a.properties", "empty"}) == "\n");
    CHECK(desk.complaint({"properties", "get", "a.properties", "y"}) ==
          "1 koru: a.properties: no property \"y\"\n");
}

TEST_CASE("set creates a file, adds and replaces") {
    Desk const desk;
    CHECK(desk.output({"settings", "set", "a.ini", "Main", "width", "800"}) == "");
    CHECK(desk.output({"settings", "set", "a.ini", "MAIN", "WIDTH", "1024"}) == "");
    CHECK(desk.output({"settings", "set", "a.ini", "Main", "title", "Grüße"}) == "");
    CHECK(desk.read("a.ini") == "[Main]\ntitle=Grüße\nwidth=1024\n");
    CHECK(desk.output({"properties", "set", "a.properties", "b", ""}) == "");
    CHECK(desk.output({"properties", "set", "a.properties", "a", "1"}) == "");
    CHECK(desk.read("a.properties") == "b=\na=1\n");
    CHECK(desk.names() == Words{"a.ini", "a.properties"});
}

TEST_CASE("set takes a value from standard input, without the line feed at its end") {
    Desk const desk;
    CHECK(desk.output({"settings", "set", "a.ini", "s", "k"}, "a value\n") == "");
    CHECK(desk.read("a.ini") == "[s]\nk=a value\n");
}

TEST_CASE("words that look like something else are text where text belongs") {
    Desk const desk;
    for (std::string const word : {"list", "settings", "-5", "[a,b]", "{}", "%%", "\"q\"", "a=b",
                                   "#", "--", "--help", "-"}) {
        CAPTURE(word);
        CHECK(desk.output({"properties", "set", "--", "p", "k", word}) == "");
        CHECK(desk.output({"properties", "get", "p", "k"}) == word + "\n");
    }
    CHECK(desk.output({"properties", "set", "p", "k", "-5"}) == "");
    CHECK(desk.output({"settings", "set", "s", "list", "get", "set"}) == "");
    CHECK(desk.read("s") == "[list]\nget=set\n");
}

TEST_CASE("remove takes a name with all its duplicates, or a whole section") {
    Desk const desk;
    desk.write("a.ini", "[a]\n1=\n2=\n3=\n4=\nx=1\nX=2\n[b]\nx=3\n");
    CHECK(desk.output({"settings", "remove", "a.ini", "A", "x"}) == "");
    CHECK(desk.read("a.ini") == "[a]\n1=\n2=\n3=\n4=\n[b]\nx=3\n");
    CHECK(desk.output({"settings", "remove", "a.ini", "A"}) == "");
    CHECK(desk.read("a.ini") == "[b]\nx=3\n");
    desk.write("a.properties", "x=1\nb=2\nX=3\n");
    CHECK(desk.output({"properties", "remove", "a.properties", "X"}) == "");
    CHECK(desk.read("a.properties") == "b=2\n");
}

TEST_CASE("remove of what is missing changes nothing") {
    Desk const desk;
    std::string const commented = "# mine\n" + SAMPLE;
    desk.write("a.ini", commented);
    CHECK(desk.complaint({"settings", "remove", "a.ini", "Main", "x"}) ==
          "1 koru: a.ini: no setting \"x\" in section \"Main\"\n");
    CHECK(desk.complaint({"settings", "remove", "a.ini", "Main", ""}) ==
          "1 koru: a.ini: no setting \"\" in section \"Main\"\n");
    CHECK(desk.complaint({"settings", "remove", "a.ini", "x"}) ==
          "1 koru: a.ini: no section \"x\"\n");
    CHECK(desk.complaint({"settings", "remove", "b.ini", "x"}) ==
          "3 koru: b.ini: No such file or directory\n");
    CHECK(desk.read("a.ini") == commented);
    CHECK(desk.names() == Words{"a.ini"});
}

TEST_CASE("records are set, shown and removed by their keys, as digits or as bytes") {
    Desk const desk;
    CHECK(desk.output({"records", "set", "r", "ab", "010aFF"}) == "");
    CHECK(desk.read("r") == std::string("\4\0\0\0\0a\0b\3\0\0\0\1\n\xFF", 15));
    CHECK(desk.output({"records", "get", "r", "AB"}) == "010aff\n");
    CHECK(desk.output({"records", "get", "r", "ab", "--raw"}) == "\1\n\xFF");
    CHECK(desk.output({"records", "set", "r", "AB", "--raw"}, "text\n") == "");
    CHECK(desk.output({"records", "export", "r"}) == "AB=746578740a\n");
    CHECK(desk.output({"records", "set", "r", "AB", "text", "--raw"}) == "");
    CHECK(desk.output({"records", "list", "r", "--format=json"}) == "{\"key\":\"AB\"}\n");
    CHECK(desk.output({"records", "remove", "r", "ab"}) == "");
    CHECK(desk.read("r") == "");
    CHECK(desk.complaint({"records", "get", "r", "ab"}) == "1 koru: r: no record \"ab\"\n");
}

TEST_CASE("the key of a record is shown by its bytes, as Latin-1") {
    Desk const desk;
    CHECK(desk.output({"records", "set", "r", "é", "01"}) == "");
    CHECK(desk.read("r") == std::string("\2\0\0\0\0\xE9\1\0\0\0\1", 11));
    CHECK(desk.output({"records", "get", "r", "é"}) == "01\n");
    CHECK(desk.output({"records", "remove", "r", "é"}) == "");
    CHECK(desk.complaint({"records", "set", "r", "Łódź", "01"}) ==
          "2 koru: r: a character of a key is at most U+00FF\n");
}

TEST_CASE("text that the file would not give back is refused with the reason") {
    struct Row {
        Words words;
        char const* reason;
    };
    Row const rows[] = {
        {{"settings", "set", "f", "s", "k", "a\nb"}, "a value with a line break cannot be stored"},
        {{"settings", "set", "f", "s", "k\n", "v"}, "a key with a line break cannot be stored"},
        {{"settings", "set", "f", "s\n", "k", "v"}, "a section with a line break cannot be stored"},
        {{"settings", "set", "f", "s", "", "v"}, "an empty key cannot be stored"},
        {{"settings", "set", "f", "", "k", "v"}, "a section without a name cannot be stored"},
        {{"settings", "set", "f", "s", "a=b", "v"}, "a key with = would be cut there"},
        {{"settings", "set", "f", "s", "#k", "v"},
         "a key that begins with # would not be read as one"},
        {{"settings", "set", "f", "s", ";k", "v"},
         "a key that begins with ; would not be read as one"},
        {{"settings", "set", "f", "s", "[k", "v"},
         "a key that begins with [ would not be read as one"},
        {{"settings", "set", "f", "s", " k", "v"}, "a key that begins with a blank would lose it"},
        {{"settings", "set", "f", "s", "k", "v\t"}, "a value that ends with a blank would lose it"},
        {{"settings", "set", "f", "[s", "k", "v"}, "a section that begins with [ would lose it"},
        {{"settings", "set", "f", "s]", "k", "v"}, "a section that ends with ] would lose it"},
        {{"settings", "set", "f", "s", "k", "\xFC"}, "text has to be UTF-8"},
        {{"properties", "set", "f", ";k", "v"},
         "a key that begins with ; would not be read as one"},
        {{"properties", "set", "f", "k", " "}, "a value that ends with a blank would lose it"},
        {{"records", "set", "f", "", "01"}, "an empty key cannot be stored"},
        {{"records", "set", "f", "k ", "01"},
         "a key with blanks or line breaks at its ends would lose them"},
        {{"records", "set", "f", "k", "012"}, "data are pairs of hexadecimal digits"},
        {{"records", "set", "f", "k", "0g"}, "data are pairs of hexadecimal digits"},
    };
    Desk const desk;
    for (Row const& row : rows)
        CHECK(desk.complaint(row.words) == "2 koru: f: " + std::string(row.reason) + "\n");
    CHECK(desk.names().empty());
}

TEST_CASE("text that looks odd but comes back is stored") {
    Desk const desk;
    CHECK(desk.output({"settings", "set", "f", " a]b ", "k ", " v ; # = [x]\r"}) == "");
    CHECK(desk.read("f") == "[ a]b ]\nk = v ; # = [x]\r\n");
    CHECK(desk.output({"settings", "get", "f", " a]b ", "k "}) == " v ; # = [x]\r\n");
    CHECK(desk.output({"properties", "set", "p", "[k]", "v"}) == "");
    CHECK(desk.output({"records", "set", "r", "a=\nb", ""}) == "");
    CHECK(desk.output({"records", "get", "r", "a=\nb"}) == "\n");
}

TEST_CASE("files that cannot be read are told with the system's reason") {
    Desk const desk;
    desk.write("short", std::string("\2\0\0\0\0a\x09\0\0\0", 10));
    CHECK(desk.complaint({"settings", "list", "missing"}) ==
          "3 koru: missing: No such file or directory\n");
    CHECK(desk.complaint({"properties", "get", ".", "k"}) == "3 koru: .: Is a directory\n");
    CHECK(desk.complaint({"records", "list", "short"}) ==
          "3 koru: short: failed to read from file\n");
    CHECK(desk.complaint({"settings", "set", ".", "s", "k", "v"}) == "3 koru: .: Is a directory\n");
    CHECK(desk.complaint({"settings", "set", "/dev/null", "s", "k", "v"}) ==
          "3 koru: /dev/null: it is no regular file\n");
    CHECK(desk.complaint({"settings", "set", "none/f", "s", "k", "v"}) ==
          "3 koru: none/f: cannot open its folder: No such file or directory\n");
    CHECK(desk.complaint({"settings", "list", "a\xFC"}) == "2 koru: a\xFC: text has to be UTF-8\n");
}

TEST_CASE("names of files are taken as they are, backslashes included") {
    Desk const desk;
    CHECK(desk.output({"properties", "set", "a\\b ü", "k", "v"}) == "");
    CHECK(desk.names() == Words{"a\\b ü"});
    CHECK(desk.output({"properties", "get", "./a\\b ü", "k"}) == "v\n");
}
