// What a structured file leaves on the disk when its process is killed while it writes back: there
// is no temporary file, so the old content can be gone before the new one is there.
#include <doctest/doctest.h>

#include <string>
#include <type_traits>

#include "support/structuredfile.h"
#include "support/tempdir.h"
#include "support/tracedprocess.h"

using test::Flat;
using test::killedAtCall;
using test::Place;
using test::Records;
using test::Sectioned;

namespace {

std::string const OLD_VALUE = "old";

/// What the file holds, in a word.
template <class Family>
std::string stateOnDisk(Place const& place, std::string const& newValue) {
    if (!place.exists()) return "missing";
    std::string const bytes = place.bytes();
    if (bytes.empty()) return "empty";
    if (bytes == Family::bytes(0, 1, OLD_VALUE)) return "old";
    std::string const whole = Family::bytes(0, 1, newValue);
    if (bytes == whole) return "new";
    return whole.compare(0, bytes.size(), bytes) == 0 ? "a part" : "damaged";
}

/// The states that are left when `writeBack` is killed at its first system call, its second and so
/// on, each named once. (One run may need a call for memory that another one does without.)
template <class Family, class WriteBack>
std::string statesLeft(std::string const& newValue, WriteBack writeBack) {
    Place const place;
    std::string states;
    bool isKilled = true;
    for (long call = 0; isKilled; ++call) {
        place.write(Family::bytes(0, 1, OLD_VALUE));
        auto* const file = new typename Family::File(place.path());
        file->open(Koru::File::READ | Koru::File::WRITE);
        Family::set(*file, 0, newValue);
        isKilled = killedAtCall(call, [&] { writeBack(file); });
        std::string const state = stateOnDisk<Family>(place, newValue);
        if (states.find(state) == std::string::npos) states += (call == 0 ? "" : ", ") + state;
        file->setMode(0);
        delete file;
    }
    return states;
}

} // namespace

TEST_CASE_TEMPLATE("a killed write-back leaves the old file, none, an empty one or the new one",
                   Family, Sectioned, Flat, Records) {
    std::string const expected = "old, missing, empty, new";
    using File = typename Family::File;
    CHECK(statesLeft<Family>("new", [](File* file) { file->close(); }) == expected);
    CHECK(statesLeft<Family>("new", [](File* file) { file->synchronize(); }) == expected);
    CHECK(statesLeft<Family>("new", [](File* file) { delete file; }) == expected);
}

TEST_CASE_TEMPLATE("a killed write-back of much writes settings at once and records in pieces",
                   Family, Sectioned, Flat, Records) {
    std::string const much(200000, 'x');
    using File = typename Family::File;
    bool const isInPieces = std::is_same<Family, Records>::value;
    std::string const expected =
        isInPieces ? "old, missing, empty, a part, new" : "old, missing, empty, new";
    CHECK(statesLeft<Family>(much, [](File* file) { file->close(); }) == expected);
}
