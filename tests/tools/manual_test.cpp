// What helps those who type: the manual page and the completion of bash know what the program knows.
#include <doctest/doctest.h>

#include <cctype>
#include <set>
#include <sstream>
#include <string>

#include "tools/koru.h"

using test::Desk;
using test::Words;

namespace {

using Names = std::set<std::string>;

/// The names in one chapter of a help: `--help` for the line "  -h,--help    Show this help".
Names namesIn(std::string const& help, std::string const& chapter) {
    Names result;
    std::size_t const begin = help.find("\n" + chapter + ":\n");
    if (begin == std::string::npos) return result;
    std::istringstream in(help.substr(begin + chapter.size() + 3));
    for (std::string line; std::getline(in, line) && !line.empty();) {
        std::string word;
        std::istringstream(line) >> word;
        if (line[2] != ' ') result.insert(word.substr(word.find(',') + 1));
    }
    return result;
}

/// All commands with the arguments that lead to them: {}, {"settings"}, {"settings", "list"}...
std::vector<Words> commands(Desk const& desk, Words const& above = {}) {
    std::vector<Words> result = {above};
    Words words = above;
    words.push_back("--help");
    for (std::string const& name : namesIn(desk.output(words), "Subcommands")) {
        words.back() = name;
        for (Words const& below : commands(desk, words)) result.push_back(below);
    }
    return result;
}

Names optionsOf(Desk const& desk, Words words) {
    words.push_back("--help");
    return namesIn(desk.output(words), "Options");
}

/// What bash offers for the last of the words.
Names offered(Desk const& desk, Words const& words) {
    desk.write("script", "source '" KORU_COMPLETION "'\n"
                         "PATH=$(dirname '" KORU_TOOL "'):$PATH\n"
                         "COMP_WORDS=(\"$@\")\n"
                         "COMP_CWORD=$(($# - 1))\n"
                         "_koru && printf '%s\\n' \"${COMPREPLY[@]}\"\n");
    Words arguments = {"bash", "script", "koru"};
    arguments.insert(arguments.end(), words.begin(), words.end());
    test::Outcome const outcome = test::execute("/bin/bash", arguments, desk.path());
    CHECK(outcome.exitCode == 0);
    std::istringstream in(outcome.out);
    Names result;
    for (std::string line; std::getline(in, line);) result.insert(line);
    result.erase("");
    return result;
}

} // namespace

TEST_CASE("the manual page names every command and option of the help") {
    Desk const desk;
    std::string const manual = test::readFile(KORU_MANUAL);
    auto const has = [&](std::string const& text) {
        return manual.find(text) != std::string::npos;
    };
    std::vector<Words> const all = commands(desk);
    CHECK(all.size() == 26);
    for (Words const& command : all) {
        std::string const name = command.empty() ? "" : command.back();
        CAPTURE(name);
        CHECK((name.empty() || has("\n.It Cm " + name + "\n") || has("\n.Cm " + name + " ")));
        for (std::string const& option : optionsOf(desk, command)) {
            CAPTURE(option);
            CHECK((has("\n.It Fl " + option.substr(1)) || has("\n.It Fl h , " + option.substr(1))));
        }
    }
}

TEST_CASE("bash completes the commands and options of the help") {
    Desk const desk;
    for (Words const& command : commands(desk)) {
        Words words = command;
        words.push_back("--help");
        Names const subcommands = namesIn(desk.output(words), "Subcommands");
        words.back() = "";
        if (!subcommands.empty()) CHECK(offered(desk, words) == subcommands);
        words.back() = "-";
        CHECK(offered(desk, words) == optionsOf(desk, command));
    }
}

TEST_CASE("bash completes formats, sections and keys") {
    Desk const desk;
    desk.write("a b.ini", "[Main]\nx y=1\nxx=2\n[My own]\n$(k)=3\n");
    CHECK(offered(desk, {"settings", "li"}) == Names{"list", "lint"});
    CHECK(offered(desk, {"settings", "list", "--format", "="}) == Names{"json", "text"});
    CHECK(offered(desk, {"settings", "list", "--format", "=", "j"}) == Names{"json"});
    CHECK(offered(desk, {"settings", "list", "--format", "t"}) == Names{"text"});
    CHECK(offered(desk, {"settings", "get", "a\\ b.ini", "M"}) == Names{"Main", "My\\ own"});
    CHECK(offered(desk, {"settings", "list", "--format", "=", "json", "'a b.ini'", "My"}) ==
          Names{"My\\ own"});
    CHECK(offered(desk, {"settings", "get", "a\\ b.ini", "Main", "x"}) == Names{"x\\ y", "xx"});
    CHECK(offered(desk, {"settings", "set", "a\\ b.ini", "My\\ own", ""}) == Names{"\\$\\(k\\)"});
    CHECK(offered(desk, {"settings", "set", "a\\ b.ini", "Main", "xx", ""}).empty());
    CHECK(offered(desk, {"settings", "get", ""}).empty()); // the names of files, by bash itself
    CHECK(offered(desk, {"properties", "get", "a\\ b.ini", "xx"}) == Names{"xx"});
    CHECK(offered(desk, {"properties", "get", "none", ""}).empty());
}
