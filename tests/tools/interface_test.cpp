// How `koru` is called: help, version, wrong arguments, and the commands that need no file of ours.
#include <doctest/doctest.h>

#include <filesystem>
#include <string>

#include "tools/koru.h"

using test::Desk;
using test::Words;

TEST_CASE("the version is that of the library") {
    CHECK(Desk().output({"--version"}) == "koru " KORU_PROJECT_VERSION "\n");
}

TEST_CASE("every command has help, which does nothing else") {
    Desk const desk;
    Words commands = {"list", "get", "set", "remove", "import", "export"};
    CHECK(desk.output({"--help"}).find("Usage: koru [OPTIONS] SUBCOMMAND") != std::string::npos);
    for (std::string const family : {"settings", "properties", "records"}) {
        for (std::string const& command : commands) {
            std::string const help = desk.output({family, command, "--help"});
            CHECK(help.find("Usage: koru " + family + " " + command + " [OPTIONS] FILE") !=
                  std::string::npos);
            CHECK(help.find("Exit codes: 0 done; 1 not found") != std::string::npos);
        }
    }
    CHECK(desk.output({"uuid", "--help"}).find("Usage: koru uuid") != std::string::npos);
    CHECK(desk.output({"settings", "set", "f", "s", "k", "v", "--help"}).find("Usage:") !=
          std::string::npos);
    CHECK(desk.names().empty());
}

TEST_CASE("wrong arguments are told and do nothing") {
    Desk const desk;
    Words const rows[] = {{},
                          {"settings"},
                          {"unknown"},
                          {"settings", "unknown"},
                          {"settings", "set"},
                          {"settings", "set", "f", "s"},
                          {"settings", "set", "f", "s", "k", "v", "more"},
                          {"settings", "set", "f", "s", "k", "v", "--unknown"},
                          {"settings", "set", "f", "s", "k", "v", "--raw"},
                          {"records", "set", "f", "k", "01", "--force"},
                          {"settings", "import", "f", "--format=xml"},
                          {"records", "lint", "f"},
                          {"path"},
                          {"uuid", "a", "b"}};
    for (Words const& words : rows) {
        std::string const complaint = desk.complaint(words);
        CAPTURE(complaint);
        CHECK(complaint.find("2 koru: ") == 0);
        CHECK(complaint.find("(koru --help tells more)\n") != std::string::npos);
    }
    CHECK(desk.names().empty());
}

TEST_CASE("uuid makes identifiers, each another one") {
    Desk const desk;
    std::string const one = desk.output({"uuid"});
    std::string const other = desk.output({"uuid"});
    CHECK(one != other);
    CHECK(one.size() == 37);
    CHECK(desk.output({"uuid", one.substr(0, 36)}) == one);
}

TEST_CASE("uuid shows an identifier as the library writes it, and refuses what is none") {
    Desk const desk;
    std::string const text = "00112233-4455-6677-8899-aabbccddeeff";
    CHECK(desk.output({"uuid", "00112233-4455-6677-8899-AABBCCDDEEFF"}) == text + "\n");
    CHECK(desk.output({"uuid", "0011-2233-44556677-8899-aabbccddeeff"}) == text + "\n");
    std::string const zeros = "00000000-0000-0000-0000-000000000000";
    CHECK(desk.output({"uuid", zeros}) == zeros + "\n");
    for (std::string const& bad :
         {std::string(), std::string("0"), "{" + text + "}", text + "0", text.substr(1),
          std::string("00112233445566778899aabbccddeeff"), std::string(36, 'a'),
          std::string("0011223344556677-8899-aabb-c-c-ddeef")}) {
        CAPTURE(bad);
        CHECK(desk.complaint({"uuid", bad}) == "1 koru: \"" + bad + "\" is no identifier\n");
    }
}

TEST_CASE("path shows which file a path names, for this program or another one") {
    Desk const desk;
    // By a link, for a path with a blank would end there.
    std::filesystem::create_symlink(KORU_TOOL, desk / "koru");
    std::string const folder = std::filesystem::canonical(KORU_TOOL).parent_path().string();
    CHECK(test::execute(desk / "koru", {desk / "koru", "path", "none.ini"}).out ==
          folder + "/none.ini\n");
    CHECK(desk.output({"path", "/a//b\\c/../d"}) == "/a/b/c/../d\n");
    desk.write("prog", "");
    CHECK(desk.output({"path", "none.ini", "--program", desk / "prog"}) ==
          desk / "none.ini" + "\n");
    CHECK(desk.output({"path", "--program=./prog", "--", "-x/ü.ini"}) == desk / "-x/ü.ini" + "\n");
    CHECK(desk.complaint({"path", "/none.ini"}) == "1 koru: /none.ini: cannot determine path\n");
    CHECK(desk.complaint({"path", ""}) == "1 koru: null or empty string passed as file path\n");
    CHECK(desk.complaint({"path", "x", "--program=none"}) ==
          "3 koru: x: cannot find none: No such file or directory\n");
}
