// The example that saves safely, stopped wherever it can be stopped.
#include <doctest/doctest.h>

#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/tracedprocess.h"

using test::Place;

namespace {

char const* const PROGRAM = KORU_SAFESAVE;

std::string content(int entries, std::string const& value) {
    std::string result = "[s]\na=" + value + "\n";
    for (int i = 0; i < entries; ++i) result += "key" + std::to_string(100000 + i) + "=value\n";
    return result;
}

/// Sets `a` to "new", but is killed at a system call; false if it makes fewer calls.
bool savedUntil(long call, Place const& place) {
    return test::killedAtCall(call, [&place] {
        // The search for leaks traces the program itself, so it fails where that is traced already.
        ::setenv("ASAN_OPTIONS", "detect_leaks=0", 1);
        ::execl(PROGRAM, PROGRAM, place.path().c_str(), "s", "a", "new", nullptr);
        ::_exit(127);
    });
}

/// Tries every system call and returns their number.
long countCalls(int entries) {
    std::string const before = content(entries, "old");
    std::string const after = content(entries, "new");
    Place const place;
    long call = 0;
    long oldOnes = 0;
    for (bool isKilled = true; isKilled; ++call) {
        place.write(before);
        isKilled = savedUntil(call, place);
        std::string const left = place.bytes();
        bool const isOld = left == before;
        if (!isOld && left != after) FAIL_CHECK("lost at system call ", call);
        if (isOld) ++oldOnes;
    }
    CHECK(oldOnes < call);
    CHECK(place.bytes() == after);
    return call;
}

} // namespace

TEST_CASE("killed at any system call, the example leaves the old file or the new one, whole") {
    long points = 0;
    for (int const entries : {0, 100, 5000}) points += countCalls(entries);
    CHECK(points >= 200);
}

TEST_CASE("what an earlier run has left does not hinder the next one") {
    Place const place;
    place.write("[s]\nb=1\n");
    test::writeFile(place.path() + ".new", "[s]\nc=half a li");
    CHECK(!savedUntil(-1, place));
    CHECK(place.bytes() == "[s]\na=new\nb=1\n");
    CHECK(::access((place.path() + ".new").c_str(), F_OK) != 0);
}

TEST_CASE("the saved file keeps its permissions") {
    Place const place;
    place.write("[s]\n");
    REQUIRE(::chmod(place.path().c_str(), 0640) == 0);
    CHECK(!savedUntil(-1, place));
    struct stat status = {};
    REQUIRE(::stat(place.path().c_str(), &status) == 0);
    CHECK((status.st_mode & 0777U) == 0640U);
}

TEST_CASE("a new file that cannot be written is reported, and the old one stays") {
    Place const place;
    place.write("[s]\na=old\n");
    // A folder that is not empty cannot be replaced by a file.
    REQUIRE(::mkdir((place.path() + ".new").c_str(), 0700) == 0);
    test::writeFile(place.path() + ".new/inside", "");
    CHECK(test::execute(PROGRAM, {PROGRAM, place.path(), "s", "a", "new"}).exitCode == 1);
    CHECK(place.bytes() == "[s]\na=old\n");
}
