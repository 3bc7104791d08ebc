// File paths: absolute ones, their parts, copies and comparison. What relative ones become is in
// relativepath_test.cpp.
#include <koru/file.h>
#include <koru/string.h>

#include <cstddef>
#include <cstdint>
#include <new>
#include <sstream>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <vector>

#include <doctest/doctest.h>

#include "file/pathfixture.h"
#include "support/failingmemory.h"
#include "support/sanitizers.h"
#include "support/skip.h"
#include "support/slots.h"
#include "support/throws.h"

namespace {

using namespace test;
using Koru::make_string;

// Built before main, as an application's own static objects are.
wchar_t const separators[] = {Koru::_FSLASH, Koru::_BSLASH, Koru::_COLON};
Path const early(L"/early\\bird/worm.txt");
Path const earlyRelative("koru-none/worm.txt");

Path pathOf(std::wstring const& volume, std::wstring const& directory, std::wstring const& name) {
    Path path;
    path.setVolume(volume);
    path.setDirectory(directory);
    path.setName(name);
    return path;
}

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
