// `koru settings lint` and `koru properties lint`.
#include <doctest/doctest.h>

#include <sstream>
#include <string>

#include "tools/koru.h"

using test::Desk;

namespace {

/// What lint says of the bytes, without the name of the file, and its exit code.
std::string found(Desk const& desk, std::string const& family, std::string const& bytes) {
    desk.write("f", bytes);
    test::Run const run = desk.koru({family, "lint", "f"});
    CHECK(run.err == "");
    std::string out = run.out;
    for (std::size_t at = 0; (at = out.find("f:", at)) != std::string::npos;) out.erase(at, 2);
    return std::to_string(run.exitCode) + " " + out;
}

struct Row {
    std::string bytes;
    char const* findings;
};

} // namespace

TEST_CASE("lint tells each kind of danger with its line") {
    Row const rows[] = {
        {"[s]\nk=v\n", "0 "},
        {"[s]\n k=v", "0 "},
        {"", "0 "},
        {"[s]\nk =v\n", "1 2: the blank before = belongs to the key\n"},
        {"[s]\nk=\tv\n", "1 2: the blank after = belongs to the value\n"},
        {"[s]\nk=v ; why\n", "1 2: the text after ; belongs to the value\n"},
        {"[s]\nk=v\t# why\n", "1 2: the text after # belongs to the value\n"},
        {"[s]\nk=a;b#c\n", "0 "},
        {"[s]\nk=v\r\n", "1 2: a carriage return is read as text of the line\n"},
        {"\xEF\xBB\xBFk=v\n[s]\nk=v\n", "1 1: a byte order mark is read as text of this line\n"
                                        "1: an entry before the first header is ignored\n"},
        {"k=v\n[s]\nk=v\n", "1 1: an entry before the first header is ignored\n"},
        {"[s]\nk=v\n[S]\nK=w\n", "1 4: key \"K\" is in line 2 already, which counts\n"},
        {"[s]\n\xC3\xA4=v\n\xC3\x84=w\n", "0 "}, // only ASCII letters have a case
        {"[s]\nk=\xFC\n", "1 2: a byte is no UTF-8, so the text is read as another one\n"},
        {"[s]\nk=\xED\xA0\x80\n", "1 2: a byte is no UTF-8, so the text is read as another one\n"},
        {"[s]\nk\n\nk=v\n",
         "1 2: a line without = is ignored\n note: a save drops comments (0) and "
         "blank lines (1)\n"},
        {"[s]\n=v\nk=v\n", "1 2: an entry without a key is ignored\n"},
        {std::string("[s]\nk=v\0w\n", 10), "1 2: a NUL ends the name or value that it is in\n"},
        {"[s\nk=v\n", "1 1: the header is read as that of section \"s\"\n"},
        {"[s] # x\nk=v\n", "1 1: the header is read as that of section \"s] # x\"\n"},
        {"[]\nk=v\n", "1 1: the header is read as that of section \"[\"\n"},
        {"[s]\n[t]\nk=v\n", "1 1: section \"s\" has no entry here, so its header is lost\n"},
        {"# c\n[s]\n ;c\nk=v\n \n", "0  note: a save drops comments (2) and blank lines (1)\n"},
    };
    Desk const desk;
    for (Row const& row : rows) {
        CAPTURE(row.bytes);
        CHECK(found(desk, "settings", row.bytes) == row.findings);
    }
}

TEST_CASE("lint of properties knows no headers") {
    Row const rows[] = {
        {"k=v\n[x]=1\n", "0 "},
        {"[x]\nk=v\nK =1\nK=2\n", "1 1: a line without = is ignored\n"
                                  "3: the blank before = belongs to the key\n"
                                  "4: key \"K\" is in line 2 already, which counts\n"},
    };
    Desk const desk;
    for (Row const& row : rows) CHECK(found(desk, "properties", row.bytes) == row.findings);
}

TEST_CASE("lint goes through several files and stops at one that is missing") {
    Desk const desk;
    desk.write("a", "[s]\nk =v\n");
    desk.write("b", "[s]\nk=v\n");
    CHECK(desk.koru({"settings", "lint", "a", "b"}).exitCode == 1);
    CHECK(desk.koru({"settings", "lint", "b"}).exitCode == 0);
    test::Run const run = desk.koru({"settings", "lint", "a", "c"});
    CHECK(run.exitCode == 3);
    CHECK(run.out == "a:2: the blank before = belongs to the key\n");
    CHECK(run.err == "koru: c: cannot open it: No such file or directory\n");
}

TEST_CASE("a file of which a save would lose a line is changed only by force") {
    Desk const desk;
    for (std::string const bytes : {"# \xFC\n[s]\na=1\n", "[s]\na=1\n\r\n[t]\n"}) {
        CAPTURE(bytes);
        desk.write("f", bytes);
        CHECK(desk.output({"settings", "set", "f", "s", "a", "2"}) == "");
        CHECK(desk.read("f") == "[s]\na=2\n");
    }
    for (std::string const bytes :
         {"k=v\n[s]\na=1\n", "[s]\na=1\nold text\n", "[s]\na=1\nb=\xFC\n"}) {
        CAPTURE(bytes);
        desk.write("f", bytes);
        CHECK(desk.complaint({"settings", "set", "f", "s", "c", "2"}).find(" would be lost: ") !=
              std::string::npos);
        CHECK(desk.koru({"settings", "remove", "f", "s"}).exitCode == 2);
        CHECK(desk.koru({"settings", "import", "f"}, "[s]\nd=4\n").exitCode == 2);
        CHECK(desk.read("f") == bytes);
        CHECK(desk.output({"settings", "set", "f", "s", "a", "2", "--force"}) == "");
        CHECK(desk.read("f").find("[s]\na=2\n") == 0);
    }
}

namespace {

std::string randomLines(unsigned& random) {
    std::string const alphabet = "[]=#;ab \t\n";
    std::string result = "[s]\n";
    for (int i = 0; i < 12; ++i) {
        random = random * 1664525U + 1013904223U;
        result += alphabet[(random >> 16U) % alphabet.size()];
    }
    return result;
}

/// The lines of a file that mean something, trimmed.
test::Words meaningful(std::string const& bytes) {
    std::istringstream in(bytes);
    test::Words result;
    for (std::string line; std::getline(in, line);) {
        line.erase(line.find_last_not_of(" \t") + 1);
        line.erase(0, line.find_first_not_of(" \t"));
        if (!line.empty() && line[0] != '#' && line[0] != ';') result.push_back(line);
    }
    return result;
}

} // namespace

TEST_CASE("a file without findings keeps all its lines but comments when an entry is set") {
    Desk const desk;
    unsigned random = 1;
    test::Words lint = {"settings", "lint"};
    for (int i = 1000; i < 1300; ++i) {
        lint.push_back("f" + std::to_string(i));
        desk.write(lint.back(), randomLines(random));
    }
    std::string const findings = "\n" + desk.koru(lint).out;
    int clean = 0;
    for (std::string const& file : test::Words(lint.begin() + 2, lint.end())) {
        std::size_t const found = findings.find("\n" + file + ":");
        if (found != std::string::npos && findings[found + file.size() + 2] != ' ') continue;
        test::Words const lines = meaningful(desk.read(file));
        CHECK(desk.output({"settings", "set", file, "s", "zz", "1"}) == "");
        std::string const saved = "\n" + desk.read(file);
        for (std::string const& line : lines)
            CHECK(saved.find("\n" + line + "\n") != std::string::npos);
        ++clean;
    }
    CHECK(clean >= 10);
}
