// What docs/behaviours.md warns of and no single operation shows: two objects on one file, marks
// that other programs leave, and names that change each time they are written.
#include <doctest/doctest.h>
#include <koru/initializationfile.h>
#include <koru/string.h>

#include <string>

#include "support/tempdir.h"

namespace {

using Koru::File;
using Koru::InitializationFile;

constexpr unsigned long BOTH = 3; // read and write

void rewrite(std::wstring const& name) {
    InitializationFile file{File::Path(name)};
    file.open(BOTH);
    file.close();
}

} // namespace

TEST_CASE("of two objects that write one file the last to close wins") {
    test::TempDir const dir;
    test::writeFile(dir / "app.ini", "[s]\nk=0\n");
    InitializationFile first{File::Path(dir.wide("app.ini"))};
    InitializationFile second{File::Path(dir.wide("app.ini"))};
    first.open(BOTH);
    second.open(BOTH);
    first.setValue(L"s", L"a", L"1");
    second.setValue(L"s", L"b", L"2");
    first.close();
    CHECK(test::readFile(dir / "app.ini") == "[s]\na=1\nk=0\n");
    second.close();
    CHECK(test::readFile(dir / "app.ini") == "[s]\nb=2\nk=0\n");
}

TEST_CASE("a byte order mark hides the first header, whose entries are dropped") {
    test::TempDir const dir;
    test::writeFile(dir / "app.ini", "\xEF\xBB\xBF[first]\na=1\n[second]\nb=2\n");
    rewrite(dir.wide("app.ini"));
    CHECK(test::readFile(dir / "app.ini") == "[second]\nb=2\n");
}

TEST_CASE("a section named by a bracket alone gains one with each rewrite") {
    test::TempDir const dir;
    test::writeFile(dir / "app.ini", "[]\na=1\n");
    rewrite(dir.wide("app.ini"));
    CHECK(test::readFile(dir / "app.ini") == "[[]\na=1\n");
    rewrite(dir.wide("app.ini"));
    CHECK(test::readFile(dir / "app.ini") == "[[[]\na=1\n");
}

TEST_CASE("a file object takes the narrow inserter that counts with 8 bits, once") {
    test::TempDir const dir;
    std::string const text(200, 'x');
    File file(dir.wide("text"));
    file.open(File::WRITE);
    file << text;
    file.flush();
    CHECK(test::readFile(dir / "text").empty());
    // The first inserter gives a plain stream, for which the second is the standard one.
    file << text << text;
    file.close();
    CHECK(test::readFile(dir / "text") == text);
}
