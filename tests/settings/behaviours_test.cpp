// What docs/behaviours.md warns of and no single operation shows: two objects on one file, and an
// inserter that is the standard one only the second time.
#include <doctest/doctest.h>

#include <string>

#include <koru/initializationfile.h>
#include <koru/string.h>

#include "support/settingsfixture.h"
#include "support/tempdir.h"

using test::READ_WRITE;
using test::SettingsFile;

TEST_CASE("of two objects that write one file the last to close wins") {
    SettingsFile first("[s]\nk=0\n", READ_WRITE);
    Koru::InitializationFile second(first.place.path());
    second.open(READ_WRITE);
    first.setValue(L"s", L"a", L"1");
    second.setValue(L"s", L"b", L"2");
    first.close();
    CHECK(first.place.bytes() == "[s]\na=1\nk=0\n");
    second.close();
    CHECK(first.place.bytes() == "[s]\nb=2\nk=0\n");
}

TEST_CASE("a file object takes the narrow inserter that counts with 8 bits, once") {
    test::TempDir const directory;
    std::string const text(200, 'x');
    Koru::File file(directory.wide("text"));
    file.open(test::WRITE);
    file << text;
    file.flush();
    CHECK(test::readFile(directory / "text").empty());
    // The first inserter gives a plain stream, for which the second is the standard one.
    file << text << text;
    file.close();
    CHECK(test::readFile(directory / "text") == text);
}
