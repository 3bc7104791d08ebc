// What helps those who type: the manual page, the completion of bash and docs/tool.md tell what the
// program does.
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

/// A command as its help shows it: {"settings", "list"}, say, or the program itself.
struct Command {
    Words words;
    Names subcommands;
    Names options;
};

/// The command and all below it.
std::vector<Command> commands(Desk const& desk, Words const& words = {}) {
    Words help = words;
    help.push_back("--help");
    std::string const text = desk.output(help);
    std::vector<Command> result = {{words, namesIn(text, "Subcommands"), namesIn(text, "Options")}};
    for (std::string const& name : Names(result[0].subcommands)) {
        help.back() = name;
        for (Command const& below : commands(desk, help)) result.push_back(below);
    }
    return result;
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

TEST_CASE("the manual page and the completion know the commands and options of the help") {
    Desk const desk;
    std::string const manual = test::readFile(KORU_MANUAL);
    auto const has = [&](std::string const& text) {
        return manual.find(text) != std::string::npos;
    };
    std::vector<Command> const all = commands(desk);
    CHECK(all.size() == 26);
    for (Command const& command : all) {
        std::string const name = command.words.empty() ? "settings" : command.words.back();
        CAPTURE(name);
        CHECK((has("\n.It Cm " + name + "\n") || has("\n.Cm " + name + " ")));
        for (std::string const& option : command.options) {
            CAPTURE(option);
            std::string const macro = option.substr(1); // of two hyphens the page has one
            CHECK((has("\n.It Fl " + macro) || has("\n.It Fl h , " + macro)));
        }
        Words words = command.words;
        words.push_back("-");
        CHECK(offered(desk, words) == command.options);
        words.back() = "";
        if (!command.subcommands.empty()) CHECK(offered(desk, words) == command.subcommands);
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

namespace {

/// The blocks of a document that show sessions.
std::string sessions(std::string const& document) {
    std::istringstream in(test::readFile(document));
    std::string result;
    bool isInside = false;
    for (std::string line; std::getline(in, line);) {
        if (line.rfind("```", 0) == 0)
            isInside = line == "```console";
        else if (isInside)
            result += line + "\n";
    }
    return result;
}

} // namespace

TEST_CASE("the sessions of docs/tool.md go as they are shown") {
    Desk const desk;
    std::string const shown = sessions(KORU_TOOL_DOCUMENT);
    std::istringstream in(shown);
    std::string script = "exec 2>&1\nPATH=$(dirname '" KORU_TOOL "'):$PATH\n";
    for (std::string line; std::getline(in, line);) {
        if (line.rfind("$ ", 0) != 0) continue;
        script += "cat <<'END'\n" + line + "\nEND\n" + line.substr(2) + "\n";
    }
    desk.write("script", script);
    CHECK(test::execute("/bin/bash", {"bash", "script"}, desk.path()).out == shown);
}
