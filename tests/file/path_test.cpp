// File paths. Absolute ones are parsed here; relative ones depend on where the executable lies, so
// copies of it are started from elsewhere and answer with what they make of them.
#include <koru/file.h>
#include <koru/string.h>
#include <koru/system.h>

#include <stdlib.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <new>
#include <sstream>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include <doctest/doctest.h>

#include "support/failingmemory.h"
#include "support/relocate.h"
#include "support/sanitizers.h"
#include "support/selfexec.h"
#include "support/skip.h"
#include "support/slots.h"
#include "support/tempdir.h"
#include "support/throws.h"

namespace {

using Koru::File;
using Koru::make_string;
using Path = Koru::File::Path;
using test::slotOf;
using Strings = std::vector<std::string>;

char const* const EMPTY = "null or empty string passed as file path";
char const* const UNDETERMINED = "cannot determine path";

// Built before main, as an application's own static objects are.
wchar_t const separators[] = {Koru::_FSLASH, Koru::_BSLASH, Koru::_COLON};
Path const early(L"/early\\bird/worm.txt");
Path const earlyRelative("koru-none/worm.txt");

/// The parts with bars between them, without that of the volume where it is empty.
std::string shown(Path const& path) {
    std::string const volume = make_string(path.getVolume());
    return (volume.empty() ? "" : volume + "|") + make_string(path.getDirectory()) + "|" +
           make_string(path.getName());
}

bool filesAreRefused = false;

/// The path of a text. Meanwhile no file can be opened, if that was asked for, so nothing says
/// where the executable is. (The sanitizers open some themselves before and after.)
template <class Text>
Path made(Text const& text) {
    struct Limit {
        Limit() {
            ::getrlimit(RLIMIT_NOFILE, &before);
            rlimit const none{0, before.rlim_max};
            if (filesAreRefused) ::setrlimit(RLIMIT_NOFILE, &none);
        }
        ~Limit() { ::setrlimit(RLIMIT_NOFILE, &before); }
        rlimit before{};
    } const limit;
    return Path(text);
}

/// How a text is parsed: the parts, or the message of the exception.
template <class Text>
std::string parsed(Text const& text) {
    std::string parts;
    std::string const message =
        test::messageOf<std::invalid_argument>([&] { parts = shown(made(text)); });
    return parts.empty() ? message : parts;
}

/// The same of a text in each kind of string.
std::string parsedInEveryKind(std::string const& text) {
    std::wstring const wide = Koru::make_wstring(text);
    std::string const parts = parsed(wide);
    CHECK(parsed(wide.c_str()) == parts);
    CHECK(parsed(text) == parts);
    CHECK(parsed(text.c_str()) == parts);
    return parts;
}

/// A row of a table: a text, an arrow and how the text is parsed.
std::pair<std::string, std::string> cells(std::string const& row) {
    std::size_t const arrow = row.find(" -> ");
    return {row.substr(0, arrow), row.substr(arrow + 4)};
}

Path pathOf(std::wstring const& volume, std::wstring const& directory, std::wstring const& name) {
    Path path;
    path.setVolume(volume);
    path.setDirectory(directory);
    path.setName(name);
    return path;
}

/// Every text of one piece up to this many, with the separator between them.
template <class Text>
std::vector<Text> combine(std::vector<Text> const& pieces, int most, Text const& separator) {
    std::vector<Text> texts = pieces;
    std::size_t begin = 0;
    for (int count = 2; count <= most; ++count) {
        for (std::size_t const end = texts.size(); begin < end; ++begin) {
            for (Text const& piece : pieces) texts.push_back(texts[begin] + separator + piece);
        }
    }
    return texts;
}

/// The parts of an absolute path by the plain rule: every segment before a separator that is not
/// empty, and what comes after the last separator.
std::string plainly(std::string const& text) {
    std::string directory = "/";
    std::string segment;
    for (char const c : text) {
        segment += c;
        if (c != '/' && c != '\\') continue;
        segment.pop_back();
        if (!segment.empty()) directory += segment + "/";
        segment.clear();
    }
    return directory == "/" ? UNDETERMINED : directory + "|" + segment;
}

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

struct Renamed : Path {
    using Path::Path;
    std::wstring const& getName() const override { return other; }
    void setName(std::wstring const& name) override { other = name; }
    std::wstring other = L"other";
};

/// Makes each allocation of the assignment fail in turn and tells how many there are.
template <class Source>
long checkAssignment(Source const& source, Path const& expected) {
    for (long before = 0;; ++before) {
        CAPTURE(before);
        Path path = pathOf(L"C:", L"/a/", L"b");
        std::string const outcome =
            test::runOutOfMemory(before, test::Failing::ONE, [&] { path = source; });
        bool const done = !test::memoryRanOut();
        CHECK(outcome == (done ? "done" : "std::bad_alloc"));
        CHECK(shown(path) == (done ? shown(expected) : "C:|/a/|b"));
        if (done) return before;
    }
}

} // namespace

TEST_CASE("the separators are slash, backslash and colon, also in static constructors") {
    CHECK(std::wstring(separators, 3) == L"/\\:");
    CHECK(std::wstring{Koru::_FSLASH, Koru::_BSLASH, Koru::_COLON} == L"/\\:");
    static_assert(std::is_same<decltype(Koru::_FSLASH), wchar_t const>::value, "");
    static_assert(std::is_same<decltype(Koru::_BSLASH), wchar_t const>::value, "");
    static_assert(std::is_same<decltype(Koru::_COLON), wchar_t const>::value, "");
}

TEST_CASE("paths can be built in static constructors") {
    CHECK(shown(early) == "/early/bird/|worm.txt");
    CHECK(shown(earlyRelative) == parsed("koru-none/worm.txt"));
    CHECK(earlyRelative.getName() == L"worm.txt");
}

TEST_CASE("a path is a table pointer and three wide strings: volume, directory, name") {
    static_assert(std::is_polymorphic<Path>::value, "");
    static_assert(std::has_virtual_destructor<Path>::value, "");
    static_assert(sizeof(Path) == sizeof(void*) + 3 * sizeof(std::wstring), "");
    Path const path;
    auto const* const bytes = reinterpret_cast<unsigned char const*>(&path) + sizeof(void*);
    auto const* const members = reinterpret_cast<std::wstring const*>(bytes);
    CHECK(members == &path.getVolume());
    CHECK(members + 1 == &path.getDirectory());
    CHECK(members + 2 == &path.getName());
}

TEST_CASE("the virtual functions of a path are in the order of the published table") {
    // The destructor takes the first two places.
    CHECK(slotOf(&Path::getVolume) == 2);
    CHECK(slotOf(&Path::setVolume) == 3);
    CHECK(slotOf(&Path::getDirectory) == 4);
    CHECK(slotOf(&Path::setDirectory) == 5);
    CHECK(slotOf(&Path::getName) == 6);
    CHECK(slotOf(&Path::setName) == 7);
}

TEST_CASE_TEMPLATE("a path is made of every kind of string without a cast, and becomes a wide one",
                   Text, std::wstring, wchar_t const*, std::string, char const*) {
    static_assert(std::is_convertible<Text, Path>::value, "");
    static_assert(std::is_convertible<Path, std::wstring>::value, "");
}

TEST_CASE_TEMPLATE("null and empty strings are refused as paths", Character, wchar_t, char) {
    using String = std::basic_string<Character>;
    CHECK(parsed(static_cast<Character const*>(nullptr)) == EMPTY);
    CHECK(parsed(String()) == EMPTY);
    CHECK(parsed(String().c_str()) == EMPTY);
    CHECK(parsed(String{0, '/', 'a', '/', 'b'}) == EMPTY);
}

TEST_CASE("a default path has three empty parts") {
    CHECK(shown(Path()) == "|");
    CHECK(std::wstring(Path()) == L"");
}

TEST_CASE("an absolute path is split at its last slash, slashes made one, nothing resolved") {
    auto const check = [](Strings const& rows) {
        for (std::string const& row : rows) {
            CAPTURE(row);
            auto const [text, parts] = cells(row);
            CHECK(parsedInEveryKind(text) == parts);
            Path const path(text);
            CHECK(std::wstring(path) == path.getDirectory() + path.getName());
            CHECK(parsed(std::wstring(path)) == parts);
        }
    };
    check({"/etc/app/app.ini -> /etc/app/|app.ini",
           "//etc///app//x.log -> /etc/app/|x.log",
           "/etc/app/ -> /etc/app/|",
           "/etc/app/// -> /etc/app/|",
           "/a/b -> /a/|b",
           "/a/ -> /a/|",
           "/a/./b/../c.txt -> /a/./b/../|c.txt",
           "/./x -> /./|x",
           "/../x -> /../|x",
           "/a/. -> /a/|.",
           "/a/.. -> /a/|..",
           "/a\\b\\c.txt -> /a/b/|c.txt",
           "/a/b\\ -> /a/b/|",
           "/a\\\\/\\b -> /a/|b",
           "/\\a\\b -> /a/|b",
           "/C:/x.txt -> /C:/|x.txt",
           "/a:b/c:d -> /a:b/|c:d",
           "/ a b / c.txt  -> / a b /| c.txt ",
           "/a\n/b\t -> /a\n/|b\t",
           "/~/x -> /~/|x",
           "/Mixed/CASE.Txt -> /Mixed/|CASE.Txt",
           "/\u00FC/\u20AC\U0001F600 -> /\u00FC/|\u20AC\U0001F600"});
}

TEST_CASE("every short absolute path is split as the plain rule says") {
    for (std::string const& text : combine<std::string>({"/", "\\", "a", "."}, 6, "")) {
        CAPTURE(text);
        CHECK(parsed(Koru::make_wstring("/" + text)) == plainly("/" + text));
    }
}

TEST_CASE("a path without a directory below the root cannot be represented") {
    for (std::string const text : {"/x.txt", "/", "//", "///x", "/\\", "/\\x", "/.", "/.."}) {
        CAPTURE(text);
        CHECK(parsedInEveryKind(text) == UNDETERMINED);
    }
}

TEST_CASE("an absolute path ends at its first NUL") {
    CHECK(parsed(std::wstring(L"/a/b\0c", 6)) == "/a/|b");
    CHECK(parsed(std::wstring(L"/a/b\0/c/d", 9)) == "/a/|b");
    CHECK(parsed(std::wstring(L"/a/\0b", 5)) == "/a/|");
    CHECK(parsed(std::wstring(L"/x\0/y", 5)) == UNDETERMINED);
    CHECK(parsed(std::wstring(L"/\0a/b", 5)) == UNDETERMINED);
    CHECK(parsed(std::string("/a/b\0c", 6)) == "/a/|b");
}

TEST_CASE("narrow paths are UTF-8, decoded as make_wstring decodes") {
    CHECK(Path("/\xC3\xBC/\xE2\x82\xAC").getDirectory() == L"/\u00FC/");
    CHECK(Path("/\xC3\xBC/\xE2\x82\xAC").getName() == L"\u20AC");
    CHECK(parsedInEveryKind("/a/b\xC3") == "/a/|b?");
    std::string const broken = std::string("/a/\x80") + "bcdefg";
    CHECK(parsedInEveryKind(broken) == plainly(make_string(Koru::make_wstring(broken))));
}

TEST_CASE("an overlong slash splits a narrow path, as it is decoded before") {
    CHECK(parsedInEveryKind(std::string("/a/b\xC0\xAF") + "c") == "/a/b/|c");
    CHECK(parsedInEveryKind(std::string("\xC0\xAF") + "a/b") == "/a/|b");
    CHECK(parsed("\xC0\x80/a/b") == EMPTY);
}

TEST_CASE("an absolute path keeps units that are not characters") {
    std::wstring const name = {static_cast<wchar_t>(0x80000041U), static_cast<wchar_t>(0x8000002FU),
                               static_cast<wchar_t>(0xD800), static_cast<wchar_t>(0x7FFFFFFF)};
    CHECK(Path(L"/a/" + name).getDirectory() == L"/a/");
    CHECK(Path(L"/a/" + name).getName() == name);
}

TEST_CASE("an absolute path may be longer than the system takes") {
    std::wstring directory = L"/";
    for (int i = 0; i < 20000; ++i) directory += L"component/";
    Path const path(directory + L"name");
    CHECK((path.getDirectory() == directory));
    CHECK(path.getName() == L"name");
}

TEST_CASE_FIXTURE(App, "links in an absolute path stay unresolved, whether it exists or not") {
    for (char const* name : {"bin/link/data.txt", "bin/filelink", "bin/dangling", "none/x.ini"}) {
        CHECK(make_string(Path(dir / name)) == dir / name);
    }
    // Nor is a directory told from a file: the trailing slash decides.
    CHECK(parsed(dir / "bin") == dir / "|bin");
    CHECK(parsed(dir / "bin/") == dir / "bin/|");
}

TEST_CASE("setters store their argument verbatim, getters give the stored part") {
    for (std::wstring const& text :
         {std::wstring(), std::wstring(L"plain"), std::wstring(L"/with/slashes/"),
          std::wstring(L"back\\slash"), std::wstring(L"//a//"), std::wstring(L".."),
          std::wstring(L" "), std::wstring(L"a\0b", 3)}) {
        Path const path = pathOf(text, text + L"1", text + L"2");
        CHECK(path.getVolume() == text);
        CHECK(path.getDirectory() == text + L"1");
        CHECK(path.getName() == text + L"2");
        CHECK(std::wstring(path) == text + text + L"1" + text + L"2");
    }
}

TEST_CASE("a setter changes its part only") {
    Path path(L"/a/b");
    path.setVolume(L"C:");
    CHECK(shown(path) == "C:|/a/|b");
    path.setName(L"/c/d");
    CHECK(shown(path) == "C:|/a/|/c/d");
    CHECK(std::wstring(path) == L"C:/a//c/d");
    path.setDirectory(L"");
    CHECK(shown(path) == "C:||/c/d");
}

TEST_CASE("a path too long for a wide string is std::bad_alloc" * doctest::skip(test::SANITIZED)) {
    if (sizeof(std::size_t) > 4) {
        test::skipped("with 64 bits no memory holds a text too long for a string");
        return;
    }
    std::size_t const half = std::wstring().max_size() / 2 + 1;
    Path path;
    path.setDirectory(std::wstring(half, L'd'));
    path.setName(path.getDirectory());
    CHECK(test::messageOf<std::bad_alloc>([&] { static_cast<void>(std::wstring(path)); }) ==
          std::bad_alloc().what());
}

TEST_CASE("setters never add a separator") {
    CHECK(std::wstring(pathOf(L"", L"dir", L"f")) == L"dirf");
}

TEST_CASE("getters give references that stay valid and follow the setters") {
    Path path(L"/a/b");
    std::wstring const* const parts[] = {&path.getVolume(), &path.getDirectory(), &path.getName()};
    path.setVolume(L"v");
    path.setDirectory(L"d");
    path.setName(L"n");
    CHECK(*parts[0] + *parts[1] + *parts[2] == L"vdn");
    path.setName(path.getDirectory());
    CHECK(*parts[2] == L"d");
    path.setName(path.getName());
    CHECK(*parts[2] == L"d");
}

TEST_CASE("the parts of a path can be overridden") {
    Renamed renamed;
    Path& path = renamed;
    CHECK(path.getName() == L"other");
    path.setName(L"another");
    CHECK(shown(path) == "|another");
}

TEST_CASE("copies have all three parts, the volume too, and are independent") {
    Path original = pathOf(L"C:", L"/a/", L"b");
    Path const copy(original);
    Path assigned(L"/c/d");
    CHECK(&(assigned = original) == &assigned);
    original = pathOf(L"D:", L"/e/", L"f");
    CHECK(shown(copy) == "C:|/a/|b");
    CHECK(shown(assigned) == "C:|/a/|b");
}

TEST_CASE("a path assigned to itself keeps its volume, and one without a volume empties it") {
    Path path = pathOf(L"C:", L"/a/", L"b");
    Path const& same = path;
    CHECK(&(path = same) == &path);
    CHECK(shown(path) == "C:|/a/|b");
    path = L"/c/d";
    CHECK(shown(path) == "/c/|d");
}

TEST_CASE("a refused text leaves the path it was to be assigned to as it was") {
    Path path(L"/a/b");
    CHECK(test::messageOf<std::invalid_argument>([&] { path = L"/x"; }) == UNDETERMINED);
    CHECK(test::messageOf<std::invalid_argument>([&] { path = ""; }) == EMPTY);
    CHECK(shown(path) == "/a/|b");
}

TEST_CASE("when memory runs out, a path that is assigned to keeps all of its parts") {
    std::wstring const text = L"/" + std::wstring(100, L'd') + L"/" + std::wstring(100, L'n');
    std::string const narrow = make_string(text);
    Path const path(text);
    CHECK(checkAssignment(text, path) >= 2);
    CHECK(checkAssignment(text.c_str(), path) >= 2);
    CHECK(checkAssignment(narrow, path) >= 2);
    CHECK(checkAssignment(narrow.c_str(), path) >= 2);
    Path withVolume(text);
    withVolume.setVolume(std::wstring(100, L'v'));
    CHECK(checkAssignment(withVolume, withVolume) == 3);
    std::wstring const relative = std::wstring(100, L'r') + L"/x.ini";
    CHECK(checkAssignment(relative, Path(relative)) >= 2);
}

TEST_CASE("a path is written to a stream as the low bytes of its characters") {
    std::ostringstream os;
    Path path(L"/gr\u00FC\u00DF/\u20AC\U0001F641.txt");
    CHECK(&(os << path) == &os);
    path.setVolume(std::wstring(L"C\0:", 3));
    os << '|' << path << '|' << 1 << Path();
    std::string const bytes = "/gr\xFC\xDF/\xAC\x41.txt";
    CHECK(os.str() == bytes + "|" + std::string("C\0:", 3) + bytes + "|1");
}

TEST_CASE("paths are equal when their texts are, without regard to case") {
    auto const check = [](bool equal, Path const& a, Path const& b) {
        INFO(shown(a), " and ", shown(b));
        CHECK((a == b) == equal);
        CHECK((b == a) == equal);
        CHECK((a != b) == !equal);
        CHECK((b != a) == !equal);
        CHECK((a == a));
        CHECK(!(a != a));
    };
    check(true, L"/a/b.txt", L"/a/b.txt");
    check(true, L"/A/B.TXT", L"/a/b.txt");
    check(true, L"/a/b.txt", L"//a\\b.txt");
    check(true, Path(), Path());
    check(true, pathOf(L"", L"/a/", L"b"), pathOf(L"/", L"a", L"/b")); // split elsewhere
    check(true, pathOf(L"C:", L"/a/", L"b"), pathOf(L"c:", L"/A/", L"B"));
    std::wstring const cut(L"/a/\0x", 5); // what comes after a NUL does not count
    check(true, pathOf(L"", cut, L"b"), pathOf(L"", L"/A/", std::wstring(L"\0y", 2)));
    check(false, L"/a/b.txt", L"/a/c.txt");
    check(false, L"/a/b.txt", L"/c/b.txt");
    check(false, L"/a/b.txt", L"/a/b.tx");
    check(false, L"/a/b", L"/a/b/");
    check(false, L"/a/./b.txt", L"/a/b.txt");
    check(false, Path(), L"/a/b");
    check(false, pathOf(L"C:", L"/a/", L"b"), L"/a/b");

    CHECK((Path(L"/a/b") == L"/A/B"));
    CHECK(("/A/B" == Path(L"/a/b")));
    CHECK((Path(L"/a/b") != std::string("/a/c")));
}

TEST_CASE("paths of any parts are equal when compare finds their texts equal") {
    std::vector<Path> paths;
    std::wstring const nul(1, L'\0');
    std::vector<std::wstring> const parts{L"", L"a", L"A", nul};
    for (std::wstring const& volume : parts) {
        for (std::wstring const& directory :
             combine<std::wstring>({L"", L"a", L"B", nul}, 2, L"")) {
            for (std::wstring const& name : parts) paths.push_back(pathOf(volume, directory, name));
        }
    }
    std::size_t wrong = 0;
    for (Path const& a : paths) {
        for (Path const& b : paths) {
            bool const equal = Koru::compare(std::wstring(a), std::wstring(b)) == 0;
            if ((a == b) != equal || (a != b) == equal) ++wrong;
        }
    }
    CHECK(wrong == 0);
}

TEST_CASE("equality takes the parts that a path converts to, not what overrides give") {
    Renamed const renamed(L"/a/b");
    CHECK((renamed == Path(L"/a/b")));
    CHECK((renamed != Path(L"/a/other")));
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
