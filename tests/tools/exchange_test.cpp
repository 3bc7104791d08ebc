// `koru ... export` and `import`: what one writes, the other reads.
#include <doctest/doctest.h>

#include <koru/datafile.h>
#include <koru/initializationfile.h>
#include <koru/propertyfile.h>

#include <algorithm>
#include <random>
#include <sstream>
#include <string>

#include "tools/koru.h"

using Koru::File;
using test::Desk;
using test::Words;

namespace {

/// Text in which what is special somewhere is frequent.
class RandomText {
public:
    std::wstring next(std::wstring const& alphabet) {
        std::wstring result(1, L'k'); // A first character that no place refuses, and a last one.
        for (std::size_t i = random_() % 8; i > 0; --i)
            result += alphabet[random_() % alphabet.size()];
        return result + L'e';
    }
    std::vector<unsigned char> bytes() {
        std::vector<unsigned char> result(random_() % 6);
        for (unsigned char& byte : result) byte = static_cast<unsigned char>(random_());
        return result;
    }

private:
    std::mt19937 random_{20261122};
};

std::wstring const VALUES = L"ab[]=#; \t\r\"\\\x1\x7F\u00FC\u20AC\U0001F600";
std::wstring const KEYS = L"ab[]#; \t\r\"\\\x1\x7F\u00FC\u20AC\U0001F600";
std::wstring const RECORD_KEYS = L"ab[]#; \t\r\"\\\x1\x7F";

void makeSettings(std::wstring const& path) {
    RandomText text;
    Koru::InitializationFile file{File::Path(path)};
    file.open(File::READ | File::WRITE);
    for (int i = 0; i < 100; ++i) {
        std::wstring const section = text.next(KEYS);
        for (int j = 0; j < 5; ++j) file.setValue(section, text.next(KEYS), text.next(VALUES));
    }
    file.close();
}

void makeProperties(std::wstring const& path) {
    RandomText text;
    Koru::PropertyFile file{File::Path(path)};
    file.open(File::READ | File::WRITE);
    for (int i = 0; i < 500; ++i) file.setValue(text.next(KEYS), text.next(VALUES));
    file.close();
}

void makeRecords(std::wstring const& path) {
    RandomText text;
    Koru::DataFile file{File::Path(path)};
    file.open(File::READ | File::WRITE);
    for (int i = 0; i < 500; ++i) file.insert({text.next(RECORD_KEYS), text.bytes()});
    file.close();
}

std::string sortedLines(std::string const& text) {
    std::istringstream in(text);
    Words lines;
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    std::sort(lines.begin(), lines.end());
    std::string result;
    for (std::string const& line : lines) result += line + "\n";
    return result;
}

/// Exports a file, imports that to a new one and compares the two: they have the same exports, and
/// if their order is fixed, the same bytes.
void exchange(Desk const& desk, std::string const& family, std::string const& format) {
    CAPTURE(family);
    CAPTURE(format);
    std::string const option = "--format=" + format;
    std::string const exported = desk.output({family, "export", family, option});
    CHECK(desk.output({family, "import", family + "." + format, option}, exported) == "");
    std::string const again = desk.output({family, "export", family + "." + format, option});
    CHECK(sortedLines(again) == sortedLines(exported));
    if (family != "records") CHECK(desk.read(family + "." + format) == desk.read(family));
}

} // namespace

TEST_CASE("an import of an export gives the same file, in both formats") {
    Desk const desk;
    std::wstring const folder(desk.path().begin(), desk.path().end());
    makeSettings(folder + L"/settings");
    makeProperties(folder + L"/properties");
    makeRecords(folder + L"/records");
    for (std::string const family : {"settings", "properties", "records"}) {
        for (std::string const format : {"text", "json"}) exchange(desk, family, format);
    }
}

TEST_CASE("an export shows what counts, without comments") {
    Desk const desk;
    desk.write("a.ini", "# mine\n[b]\n\nx=1\nX=2\n[a]\ny = \"q\"\n");
    CHECK(desk.output({"settings", "export", "a.ini"}) == "[a]\ny = \"q\"\n[b]\nx=1\n");
    CHECK(desk.output({"settings", "export", "a.ini", "--format=json"}) ==
          "{\"section\":\"a\",\"key\":\"y \",\"value\":\" \\\"q\\\"\"}\n"
          "{\"section\":\"b\",\"key\":\"x\",\"value\":\"1\"}\n");
    desk.write("p", "b=1\na=2\n");
    CHECK(desk.output({"properties", "export", "p"}) == "b=1\na=2\n");
    CHECK(desk.output({"properties", "export", "p", "--format=json"}) ==
          "{\"key\":\"b\",\"value\":\"1\"}\n{\"key\":\"a\",\"value\":\"2\"}\n");
}

TEST_CASE("an import adds to what is there, or replaces it") {
    Desk const desk;
    desk.write("a.ini", "[s]\na=1\nb=2\n");
    desk.write("more", "; any settings file will do\n[S]\nB=3\n[t]\nc=4\n");
    CHECK(desk.output({"settings", "import", "a.ini", "more"}) == "");
    CHECK(desk.read("a.ini") == "[s]\na=1\nb=3\n[t]\nc=4\n");
    CHECK(desk.output({"settings", "import", "a.ini", "more", "--replace"}) == "");
    CHECK(desk.read("a.ini") == "[S]\nB=3\n[t]\nc=4\n");
    CHECK(desk.output({"settings", "import", "a.ini", "--replace"}, "") == "");
    CHECK(desk.read("a.ini") == "");
}

TEST_CASE("an import that cannot be read is told with its line, and changes nothing") {
    struct Row {
        Words words;
        char const* input;
        char const* complaint;
    };
    Row const rows[] = {
        {{"settings", "import", "f", "--format=json"},
         "{\"section\":\"s\",\"key\":\"k\",\"value\":\"v\"}\n\n[]\n",
         "3 koru: -: line 3 is no setting in JSON\n"},
        {{"settings", "import", "f", "--format=json"},
         "{\"key\":\"k\",\"value\":\"v\"}",
         "3 koru: -: line 1 is no setting in JSON\n"},
        {{"properties", "import", "f", "--format=json"},
         "{\"section\":\"s\",\"key\":\"k\",\"value\":\"v\"}",
         "3 koru: -: line 1 is no property in JSON\n"},
        {{"properties", "import", "f"},
         "k=v\n[s]\n",
         "2 koru: -: line 2 would be lost: a line without = is ignored "
         "(--force goes on all the same)\n"},
        {{"properties", "import", "f", "--format=json"},
         "{\"key\":\"k\",\"value\":1}",
         "3 koru: -: line 1 is no property in JSON\n"},
        {{"records", "import", "f", "--format=json"},
         "{\"key\":\"k\",\"value\":\"\"}",
         "3 koru: -: line 1 is no record in JSON\n"},
        {{"properties", "import", "f", "--format=json"},
         "{\"key\":\"k\",\"value\":\"a\\nb\"}",
         "2 koru: -: a value with a line break cannot be stored\n"},
        {{"properties", "import", "f", "--format=json"},
         "{\"key\":\"k\",\"value\":\"a\\u0000b\"}",
         "2 koru: -: a NUL cannot be stored\n"},
        {{"records", "import", "f"},
         "k=0102\nl=01x",
         "2 koru: -: data are pairs of hexadecimal digits\n"},
        {{"properties", "import", "f"},
         "k=\xFC",
         "2 koru: -: line 1 would be lost: a byte is no UTF-8, so the text is read as another one "
         "(--force goes on all the same)\n"},
        {{"properties", "import", "f", "none"},
         "",
         "3 koru: none: cannot open it: No such file or directory\n"},
        {{"properties", "import", "f", "."}, "", "3 koru: .: Is a directory\n"},
    };
    Desk const desk;
    for (Row const& row : rows) CHECK(desk.complaint(row.words, row.input) == row.complaint);
    CHECK(desk.names().empty());
}

TEST_CASE("what has no form in a format is refused there") {
    Desk const desk;
    CHECK(desk.output({"records", "set", "r", "a=b", "01"}) == "");
    CHECK(desk.complaint({"records", "export", "r"}) ==
          "2 koru: r: a key with = would be cut there\n");
    CHECK(desk.output({"records", "export", "r", "--format=json"}) ==
          "{\"key\":\"a=b\",\"data\":\"01\"}\n");
    // A surrogate comes back, but is not a character of Unicode.
    desk.write("p", "k=\xED\xA0\x80\n");
    CHECK(desk.output({"properties", "export", "p"}) == "k=\xED\xA0\x80\n");
    CHECK(desk.complaint({"properties", "export", "p", "--format=json"}) ==
          "3 koru: p: it has text that is no UTF-8 and so no JSON\n");
    // An overlong line feed is one when it has been read.
    desk.write("p", "k=a\xC0\x8A"
                    "b\n");
    CHECK(desk.complaint({"properties", "export", "p"}) ==
          "2 koru: p: a value with a line break cannot be stored\n");
    desk.write("r", std::string("\4\0\0\0\0a\0\0\0\0\0\0", 12));
    CHECK(desk.complaint({"records", "list", "r"}) ==
          "3 koru: r: a name in it has a NUL, which this program cannot show\n");
}

TEST_CASE("output that cannot be written is a failure") {
    Desk const desk;
    desk.write("p", "k=v\n");
    test::Outcome const outcome = test::inChild([&] {
        test::redirect("/dev/full", O_WRONLY, STDOUT_FILENO);
        test::redirect("/dev/null", O_WRONLY, STDERR_FILENO);
        return test::become(desk.path(), {"properties", "export", "p"});
    });
    CHECK(outcome.exitCode == 3);
}
