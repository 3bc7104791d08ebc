// Relative paths, and links. What they become depends on where the executable lies, so copies of it
// are started from elsewhere and answer with what they make of a text.
#include <koru/file.h>
#include <koru/string.h>
#include <koru/system.h>

#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <sstream>
#include <string>

#include <doctest/doctest.h>

#include "file/pathfixture.h"
#include "support/relocate.h"
#include "support/selfexec.h"
#include "support/tempdir.h"

namespace {

using namespace test;
using Koru::File;
using Koru::make_string;

/// A relative path resolved the naive way: as much of the joined text as can be resolved, taking
/// off one component at a time, with the rest after it. Of a link that cannot be resolved, what the
/// C library leaves in its buffer is as much as can be.
std::string naively(std::string const& directory, std::string const& text) {
    std::string const joined = directory + text;
    std::size_t end = joined.size();
    std::size_t missing = end;
    char resolved[4096] = {};
    while (::realpath(joined.substr(0, end).c_str(), resolved) == nullptr) {
        missing = end;
        end = joined.rfind('/', end - 1);
        std::memset(resolved, 0, sizeof resolved);
    }
    std::string const prefix = joined.substr(0, missing);
    if (end != joined.size() && std::filesystem::is_symlink(prefix)) {
        static_cast<void>(::realpath(prefix.c_str(), resolved) == nullptr);
        end = missing;
    }
    return plainly(resolved + joined.substr(end));
}

/// Wide text as an argument of a program, so that NULs and units that are not characters
/// get through.
std::string hexadecimal(std::wstring const& text) {
    std::ostringstream units;
    for (wchar_t const c : text) units << std::hex << static_cast<std::uint32_t>(c) << ' ';
    return "WIDE=" + units.str();
}

std::wstring fromHexadecimal(std::string const& argument) {
    std::wstring text;
    std::istringstream units(argument);
    for (std::uint32_t unit = 0; units >> std::hex >> unit;) text += static_cast<wchar_t>(unit);
    return text;
}

template <class Text>
bool answerWith(Text const& text) {
    test::answer(parsed(text));
    return true;
}

/// Does what an argument in capitals says, and parses any other. False when that fails.
bool follow(std::string const& argument) {
    std::size_t const equals = argument.find('=');
    std::string const command = argument.substr(0, equals);
    std::string const operand = argument.substr(equals + 1);
    if (command == "CHDIR") return ::chdir(operand.c_str()) == 0;
    if (command == "RMDIR") return ::rmdir(operand.c_str()) == 0;
    if (command == "WITHOUT_FILES") return filesAreRefused = true;
    if (command == "WIDE") return answerWith(fromHexadecimal(operand));
    return answerWith(argument);
}

int parse(int count, char** arguments) {
    return std::all_of(arguments, arguments + count, follow) ? 0 : 1;
}

/// Parses the first argument followed by as many missing components as the second one says.
int parseLong(int, char** arguments) {
    std::string text = arguments[0];
    for (long i = std::stol(arguments[1]); i > 0; --i) text += "m/";
    return answerWith(text + "x.ini") ? 0 : 1;
}

/// Opens the file of a relative path for reading and writing, which creates it.
int create(int, char** arguments) {
    File file{Path(arguments[0])};
    file.open(File::READ | File::WRITE);
    file << "here";
    test::answer(make_string(file.getName()));
    return 0;
}

/// Compares the library with `naively` on the relative ones of all paths of up to four of the
/// components. Answers with the number of these paths and with those on which the two differ.
int compareAll(int count, char** components) {
    std::string const executable = make_string(Koru::System::getProcessFileName());
    std::string const directory = executable.substr(0, executable.rfind('/') + 1);
    Strings differing;
    int compared = 0;
    for (std::string const& text : combine<std::string>({components, components + count}, 4, "/")) {
        if (text.empty() || text[0] == '/') continue;
        ++compared;
        std::string const expected = naively(directory, text);
        if (parsed(text) != expected) differing.push_back(text + ", not " + expected);
    }
    test::answer(std::to_string(compared));
    for (std::string const& text : differing) test::answer(text);
    return 0;
}

test::RegisterSelf const registrations[] = {
    {"parse", parse}, {"parseLong", parseLong}, {"create", create}, {"compareAll", compareAll}};

/// An application's directory and what lies around it. The application is `bin/prog`.
struct App {
    App() {
        for (char const* directory : {"bin/conf", "bin/sub", "shared", "elsewhere/conf"}) {
            std::filesystem::create_directories(dir / directory);
        }
        test::copyOwnExecutable(program);
        for (char const* file : {"bin/conf/app.ini", "bin/file.txt", "bin/back\\slash",
                                 "shared/data.txt", "elsewhere/conf/app.ini"}) {
            test::writeFile(dir / file, "content");
        }
        link("../shared", "bin/link");
        link("../shared/data.txt", "bin/filelink");
        link("../shared/data.txt", "bin/back\\link");
        link("nowhere", "bin/dangling");
        link("loop", "bin/loop");
    }

    void link(std::string const& target, std::string const& name) const {
        std::filesystem::create_symlink(target, dir / name);
    }

    /// What the application answers that is started as argv0, the temporary directory written ~.
    Strings ask(std::string const& argv0, std::string const& directory, Strings const& arguments,
                std::string const& command = "parse") const {
        Strings answers = test::ask(program, argv0, directory, command, arguments);
        std::size_t const size = dir.path().size();
        for (std::string& answer : answers) {
            if (answer.compare(0, size, dir.path()) == 0) answer.replace(0, size, "~");
        }
        return answers;
    }

    /// Checks rows in the application's own directory, which is not the working directory.
    void check(Strings const& rows) const {
        Strings texts;
        for (std::string const& row : rows) texts.push_back(cells(row).first);
        Strings const answers = ask(program, dir / "elsewhere", texts);
        REQUIRE(answers.size() == rows.size());
        for (std::size_t i = 0; i < rows.size(); ++i) {
            CHECK(texts[i] + " -> " + answers[i] == rows[i]);
        }
    }

    /// The same for texts that are not UTF-8.
    void check(std::wstring const& text, std::string const& expected) const {
        CHECK(ask(program, dir / "elsewhere", {hexadecimal(text)}) == Strings{expected});
    }

    test::TempDir const dir;
    std::string program = dir / "bin/prog";
};

/// The application in a directory of another name.
struct AppIn : App {
    explicit AppIn(std::string const& directory) {
        std::filesystem::create_directories(dir / directory);
        program = dir / directory + "/prog";
        test::copyOwnExecutable(program);
    }
};

} // namespace

TEST_CASE_FIXTURE(App, "links in an absolute path stay unresolved, whether it exists or not") {
    for (char const* name : {"bin/link/data.txt", "bin/filelink", "bin/dangling", "none/x.ini"}) {
        CHECK(make_string(Path(dir / name)) == dir / name);
    }
    // Nor is a directory told from a file: the trailing slash decides.
    CHECK(parsed(dir / "bin") == dir / "|bin");
    CHECK(parsed(dir / "bin/") == dir / "bin/|");
}

TEST_CASE_FIXTURE(App, "a relative path is joined to the executable's directory and resolved") {
    check({"conf/app.ini -> ~/bin/conf/|app.ini", "file.txt -> ~/bin/|file.txt",
           "./conf/../conf//app.ini -> ~/bin/conf/|app.ini", "link/data.txt -> ~/shared/|data.txt",
           "filelink -> ~/shared/|data.txt", "../shared/data.txt -> ~/shared/|data.txt",
           "link/../elsewhere/conf/app.ini -> ~/elsewhere/conf/|app.ini"});
}

TEST_CASE_FIXTURE(App, "a relative path to an existing directory names it without its slash") {
    std::filesystem::path const root = dir.path();
    std::string const above = root.parent_path().string() + "/|" + root.filename().string();
    check({"conf -> ~/bin/|conf", "conf/ -> ~/bin/|conf", "conf/. -> ~/bin/|conf",
           "conf/.. -> ~/|bin", ". -> ~/|bin", "./ -> ~/|bin", "link -> ~/|shared",
           "link/ -> ~/|shared", ".. -> " + above, "link/.. -> " + above});
}

TEST_CASE_FIXTURE(App, "of a relative path what exists is resolved and the rest is appended") {
    check({"new.ini -> ~/bin/|new.ini", "./new.ini -> ~/bin/|new.ini",
           "conf/new.ini -> ~/bin/conf/|new.ini", "link/new.ini -> ~/shared/|new.ini",
           "link/../new.ini -> ~/|new.ini", "sub/../new.ini -> ~/bin/|new.ini",
           "../new.ini -> ~/|new.ini", "new/sub/deep/x.ini -> ~/bin/new/sub/deep/|x.ini",
           "link/new/sub/x.ini -> ~/shared/new/sub/|x.ini", "../new/x.ini -> ~/new/|x.ini",
           "new/ -> ~/bin/new/|", "link/new/ -> ~/shared/new/|",
           "new//sub///x.ini -> ~/bin/new/sub/|x.ini", "~/x.ini -> ~/bin/~/|x.ini",
           " a b / x .ini  -> ~/bin/ a b /| x .ini ", "C:/x.ini -> ~/bin/C:/|x.ini",
           "\u00FC/\u20AC\U0001F600 -> ~/bin/\u00FC/|\u20AC\U0001F600"});
}

TEST_CASE_FIXTURE(App, "the missing part of a relative path is appended verbatim") {
    check({"new/../x.ini -> ~/bin/new/../|x.ini", "new/./x.ini -> ~/bin/new/./|x.ini",
           "new/.. -> ~/bin/new/|..", "new/. -> ~/bin/new/|.",
           "link/new/../data.txt -> ~/shared/new/../|data.txt",
           "new/../conf/app.ini -> ~/bin/new/../conf/|app.ini"});
}

TEST_CASE_FIXTURE(App,
                  "a relative path through a dangling link is the path that the link leads to") {
    link("dangling", "bin/again");
    link("again", "bin/and-again");
    link("sub/new.ini", "shared/to-new");
    link("none/at/all.ini", "bin/far");
    link("../none//", "bin/slashes");
    link("conf/../new.ini", "bin/new.ini~"); // whose own path begins with the resolved one
    link("file.txt/new.ini", "bin/below-file");
    link(dir / "else/new.ini", "bin/absolute");
    check({"dangling -> ~/bin/|nowhere", "dangling/x.ini -> ~/bin/nowhere/|x.ini",
           "dangling/../x.ini -> ~/bin/nowhere/../|x.ini",
           "link/../bin/dangling/ -> ~/bin/nowhere/|", "again -> ~/bin/|nowhere",
           "and-again -> ~/bin/|nowhere", "and-again/sub/x.ini -> ~/bin/nowhere/sub/|x.ini",
           "link/to-new -> ~/shared/sub/|new.ini", "../shared/to-new -> ~/shared/sub/|new.ini",
           "far -> ~/bin/none/at/|all.ini", "far/x.ini -> ~/bin/none/at/all.ini/|x.ini",
           "slashes -> ~/none/|", "slashes/x.ini -> ~/none/|x.ini", "new.ini~ -> ~/bin/|new.ini",
           "below-file -> ~/bin/file.txt/|new.ini", "absolute -> ~/else/|new.ini",
           "absolute/x.ini -> ~/else/new.ini/|x.ini",
           "dangling/dangling -> ~/bin/nowhere/|dangling"});
}

TEST_CASE_FIXTURE(App, "links that lead back to themselves stay in a relative path") {
    link("ring2", "bin/ring1");
    link("ring1", "bin/ring2");
    link("loop", "bin/to-loop");
    link("longer/x", "bin/longer");
    check({"loop -> ~/bin/|loop", "loop/x.ini -> ~/bin/loop/|x.ini",
           "ring1/x.ini -> ~/bin/ring1/|x.ini", "conf/../ring2/x.ini -> ~/bin/ring2/|x.ini",
           "conf/../to-loop/x.ini -> ~/bin/to-loop/|x.ini", "longer -> ~/bin/|longer"});
}

TEST_CASE_FIXTURE(App, "a chain of links is followed as far as the system does it") {
    link("nowhere", "bin/chain1");
    for (int i = 2; i <= 50; ++i) {
        link("chain" + std::to_string(i - 1), "bin/chain" + std::to_string(i));
    }
    check({"chain1/x.ini -> ~/bin/nowhere/|x.ini", "chain40 -> ~/bin/|nowhere",
           "conf/../chain40/x.ini -> ~/bin/nowhere/|x.ini",
           "chain50/x.ini -> ~/bin/chain50/|x.ini"});
}

TEST_CASE_FIXTURE(App, "what lies below a file counts as missing") {
    check({"file.txt/x.ini -> ~/bin/file.txt/|x.ini",
           "file.txt/new/x.ini -> ~/bin/file.txt/new/|x.ini", "file.txt/ -> ~/bin/file.txt/|",
           "file.txt/../x.ini -> ~/bin/file.txt/../|x.ini",
           "filelink/x.ini -> ~/shared/data.txt/|x.ini", "filelink/ -> ~/shared/data.txt/|"});
}

TEST_CASE_FIXTURE(App, "a name too long for the file system counts as missing") {
    std::string const name(300, 'n');
    check({name + " -> ~/bin/|" + name, "link/" + name + "/x.ini -> ~/shared/" + name + "/|x.ini"});
}

TEST_CASE_FIXTURE(App, "a path that begins with a backslash is relative") {
    check({"\\\\srv\\share\\f.txt -> ~/bin/srv/share/|f.txt",
           "\\\\srv\\\\share\\\\f.txt -> ~/bin/srv/share/|f.txt", "\\f.txt -> ~/bin/|f.txt",
           "\\ -> ~/bin/|", "\\etc/passwd -> ~/bin/etc/|passwd",
           "C:\\x\\y.ini -> ~/bin/C:/x/|y.ini"});
}

TEST_CASE_FIXTURE(App, "backslashes are rewritten after a relative path is resolved") {
    check({"conf\\app.ini -> ~/bin/conf/|app.ini", "link\\data.txt -> ~/bin/link/|data.txt",
           "conf\\..\\app.ini -> ~/bin/conf/../|app.ini", "link/new\\x.ini -> ~/shared/new/|x.ini",
           "back\\slash -> ~/bin/back/|slash", "back\\link -> ~/shared/|data.txt",
           "conf\\ -> ~/bin/conf/|"});
}

TEST_CASE_FIXTURE(App, "a relative path ends at its first NUL") {
    check(std::wstring(L"conf\0/app.ini", 13), "~/bin/|conf");
    check(std::wstring(L"new/\0x.ini", 10), "~/bin/new/|");
    check(std::wstring(L"x.ini\0", 6), "~/bin/|x.ini");
    check(std::wstring(L"\0conf", 5), EMPTY);
}

TEST_CASE_FIXTURE(App, "a relative path takes the way through UTF-8, where odd units are bytes") {
    wchar_t const letter = static_cast<wchar_t>(0x80000041U);
    wchar_t const slash = static_cast<wchar_t>(0x8000002FU);
    wchar_t const backslash = static_cast<wchar_t>(0x8000005CU);
    wchar_t const zero = static_cast<wchar_t>(0x80000000U);
    check({letter}, "~/bin/|A");
    check(std::wstring(L"link") + slash + L"data.txt", "~/shared/|data.txt");
    check({slash, L'x'}, "~/bin/|x");
    check(std::wstring(L"conf") + backslash + L"x", "~/bin/conf/|x");
    check(std::wstring(L"new") + zero + L"er", "~/bin/|new");
    check({zero}, "~/|bin");
    check({static_cast<wchar_t>(0x7FFFFFFF)}, "~/bin/|\xFD\xBF\xBF\xBF\xBF\xBF");
    check({static_cast<wchar_t>(0xD800)}, "~/bin/|\xED\xA0\x80");
}

TEST_CASE_FIXTURE(App, "every short relative path gives what resolving it piece by piece gives") {
    Strings const components{"conf", "link", "filelink", "dangling",   "new",
                             "..",   ".",    "",         "back\\slash"};
    Strings const answers = ask(program, dir / "elsewhere", components, "compareAll");
    REQUIRE(!answers.empty());
    // All but those that begin with the empty component.
    CHECK(answers[0] == std::to_string(8 + 8 * 9 + 8 * 9 * 9 + 8 * 9 * 9 * 9));
    CHECK(answers.size() == 1);
    for (std::size_t i = 1; i < answers.size() && i < 10; ++i) MESSAGE(answers[i]);
}

TEST_CASE_FIXTURE(App, "any number of components may be missing") {
    auto const checkLong = [&](std::string const& start, std::string expected, int count) {
        for (int i = 0; i < count; ++i) expected += "m/";
        Strings const arguments{start, std::to_string(count)};
        CAPTURE(start);
        CHECK((ask(program, "/", arguments, "parseLong") == Strings{expected + "|x.ini"}));
    };
    checkLong("", "~/bin/", 20000);
    checkLong("link/", "~/shared/", 20000);
    checkLong("filelink/", "~/shared/data.txt/", 20000);
    checkLong("conf/../dangling/", "~/bin/nowhere/", 20000);

    // About a second's work; if each component cost a look at all of them, it would be hours.
    auto const begin = std::chrono::steady_clock::now();
    checkLong("link/", "~/shared/", 1000000);
    CHECK(std::chrono::steady_clock::now() - begin < std::chrono::seconds(60));
}

TEST_CASE_FIXTURE(App, "a relative path does not depend on the working directory") {
    for (std::string const& directory :
         {dir / "elsewhere", dir / "bin", dir / "bin/conf", std::string("/")}) {
        CAPTURE(directory);
        CHECK(ask(program, directory,
                  {"conf/app.ini", "new.ini", "CHDIR=" + (dir / "elsewhere"), "conf/app.ini"}) ==
              Strings{"~/bin/conf/|app.ini", "~/bin/|new.ini", "~/bin/conf/|app.ini"});
    }
}

TEST_CASE_FIXTURE(App, "a file of a relative path is created beside the executable") {
    CHECK(ask(program, dir / "elsewhere", {"conf/fresh.ini"}, "create") ==
          Strings{"~/bin/conf/fresh.ini"});
    CHECK(test::readFile(dir / "bin/conf/fresh.ini") == "here");
    CHECK(!std::filesystem::exists(dir / "elsewhere/conf/fresh.ini"));
}

TEST_CASE_FIXTURE(App, "a file is created where a dangling link leads to") {
    CHECK(ask(program, "/", {"dangling"}, "create") == Strings{"~/bin/nowhere"});
    CHECK(test::readFile(dir / "bin/nowhere") == "here");
    CHECK(std::filesystem::is_symlink(dir / "bin/dangling"));
}

TEST_CASE_FIXTURE(App, "the executable's directory is the one its links lead to") {
    std::filesystem::create_directory(dir / "links");
    link("../bin/prog", "links/prog");
    link("../bin", "links/bin");
    for (std::string const name : {"links/prog", "links/bin/prog"}) {
        CAPTURE(name);
        program = dir / name;
        CHECK(ask(program, "/", {"conf/app.ini", "x/y"}) ==
              Strings{"~/bin/conf/|app.ini", "~/bin/x/|y"});
    }
}

TEST_CASE_FIXTURE(App,
                  "a program started as ./prog finds its files until it changes its directory") {
    CHECK(ask("./prog", dir / "bin",
              {"link/data.txt", "CHDIR=" + (dir / "elsewhere"), "conf/app.ini", "link/data.txt"}) ==
          Strings{"~/shared/|data.txt", "~/elsewhere/conf/|app.ini", "~/elsewhere/link/|data.txt"});
}

TEST_CASE("a program below a directory with a blank looks beside that directory") {
    AppIn const app("my apps/bin");
    CHECK(app.ask(app.program, "/", {"conf/app.ini"}) == Strings{"~/conf/|app.ini"});
}

TEST_CASE("a backslash in the executable's directory becomes a slash as well") {
    AppIn const app("o\\dd");
    CHECK(app.ask(app.program, "/", {"x.ini"}) == Strings{"~/o/dd/|x.ini"});
}

TEST_CASE("a program in a directory with other characters than ASCII finds its files") {
    AppIn const app("\u00FC\u20AC\U0001F600");
    app.link("../shared", "\u00FC\u20AC\U0001F600/\u00DF");
    app.check({"new/x.ini -> ~/\u00FC\u20AC\U0001F600/new/|x.ini",
               "\u00DF/data.txt -> ~/shared/|data.txt"});
}

TEST_CASE_FIXTURE(App,
                  "a program without a name of its own resolves against the working directory") {
    CHECK(ask("", dir / "elsewhere",
              {"conf/app.ini", "../shared/data.txt", "new.ini", "conf/new/x.ini", "new/x.ini"}) ==
          Strings{"~/elsewhere/conf/|app.ini", "~/shared/|data.txt", "~/elsewhere/|new.ini",
                  "~/elsewhere/conf/new/|x.ini", "~/elsewhere/new/|x.ini"});
}

TEST_CASE_FIXTURE(App, "a program under a false name looks in that name's directory") {
    auto const as = [&](char const* name) { return ask(dir / name, "/", {"conf/app.ini"}); };
    CHECK(as("elsewhere/none") == Strings{"~/elsewhere/conf/|app.ini"});
    CHECK(as("elsewhere/conf/app.ini") == Strings{"~/elsewhere/conf/conf/|app.ini"});
    // Of what is missing in it, the first component counts as the executable.
    CHECK(as("none/at/all") == Strings{"~/conf/|app.ini"});
}

TEST_CASE_FIXTURE(App, "a relative path is refused when nothing but the root remains") {
    // The executable's directory is the root where its name cannot be resolved beyond it.
    CHECK(ask("/koru-none", dir.path(), {"x.ini", ".", "koru-none-either/x.ini"}) ==
          Strings{UNDETERMINED, UNDETERMINED, "/koru-none-either/|x.ini"});
}

TEST_CASE_FIXTURE(App, "a relative path is refused when neither executable nor working directory "
                       "can be told") {
    std::string const gone = dir / "gone";
    Strings const texts{"x.ini", "conf/app.ini", "../bin/conf/app.ini", ".", "\\"};
    for (std::string const argv0 : {"", "prog", "./prog", "../bin/prog"}) {
        for (Strings arguments : {Strings{"RMDIR=" + gone}, {"RMDIR=" + gone, "WITHOUT_FILES"}}) {
            INFO("as ", argv0, ", ", arguments.back());
            std::filesystem::create_directory(gone);
            arguments.insert(arguments.end(), texts.begin(), texts.end());
            CHECK(ask(argv0, gone, arguments) == Strings(texts.size(), UNDETERMINED));
        }
    }
}

TEST_CASE_FIXTURE(App, "one of executable and working directory is enough for a relative path") {
    std::string const gone = dir / "gone";
    std::filesystem::create_directory(gone);
    CHECK(ask(program, gone, {"RMDIR=" + gone, "conf/app.ini", "new.ini", "/a/b.ini"}) ==
          Strings{"~/bin/conf/|app.ini", "~/bin/|new.ini", "/a/|b.ini"});
    CHECK(ask(program, dir / "elsewhere", {"WITHOUT_FILES", "conf/app.ini", "new/x.ini"}) ==
          Strings{"~/elsewhere/conf/|app.ini", "~/elsewhere/new/|x.ini"});
}

TEST_CASE("in the running test a relative path is joined to the test's own directory") {
    std::string const executable = make_string(Koru::System::getProcessFileName());
    std::string const directory = executable.substr(0, executable.rfind('/') + 1);
    CHECK(parsedInEveryKind("koru-none/x.ini") == directory + "koru-none/|x.ini");
    CHECK(parsedInEveryKind("koru-none") == directory + "|koru-none");
    CHECK(parsedInEveryKind("koru-none/") == directory + "koru-none/|");
}
