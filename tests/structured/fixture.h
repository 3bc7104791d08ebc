// What the tests of the structured files share: a file of any family in a directory of its own, and
// what can be seen of it.
#ifndef KORU_TESTS_STRUCTURED_FIXTURE_H
#define KORU_TESTS_STRUCTURED_FIXTURE_H

#include <doctest/doctest.h>

#include <cstddef>
#include <stdexcept>
#include <string>

#include "support/structuredfile.h"
#include "support/tempdir.h"
#include "support/throws.h"

/// A test case for each of the three families, and one for each of the two settings files.
#define FAMILIES_TEST_CASE(name) TEST_CASE_TEMPLATE(name, Family, Sectioned, Flat, Records)
#define SETTINGS_TEST_CASE(name) TEST_CASE_TEMPLATE(name, Family, Sectioned, Flat)

namespace structured {

using namespace test;

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const READ_WRITE = READ | WRITE;

char const* const NOTHING = "<nothing>";
char const* const NOT_OPENED = "failed to open file.";
char const* const NOT_READ = "failed to read from file";
char const* const NOT_WRITTEN = "failed to write to file";

/// The message of the std::runtime_error that the callable throws.
template <class Callable>
std::string complaint(Callable callable) {
    return messageOf<std::runtime_error>(callable);
}

;

/// A structured file in a place of its own. With bytes it is there, with a mode it is open, too.
template <class Family>
class OwnFile : public test::HasPlace, public Family::File {
public:
    OwnFile() : Family::File(place.path()) {}
    explicit OwnFile(std::string const& bytes) : OwnFile() { place.write(bytes); }
    OwnFile(std::string const& bytes, unsigned long mode) : OwnFile(bytes) { this->open(mode); }

    std::string bytes() const { return place.bytes(); }

    /// Adds an entry or changes its value.
    void put(int number, std::string const& value = "value") { Family::set(*this, number, value); }
    void drop(int number) { Family::remove(*this, number); }
    std::size_t count() { return sizeOf<Family>(*this); }
    /// Whether it holds that many entries from entry 0 on, the last one with this value.
    bool has(int entries, std::string const& value = "value") {
        return holds<Family>(*this, 0, entries, value);
    }

    /// Whether it is as `close` leaves it.
    bool isClosedAndEmpty() { return !this->is_open() && this->getMode() == 0 && count() == 0; }
    bool isOpen(unsigned long mode) const {
        return this->is_open() && this->getMode() == (mode | Family::ADDED_MODE);
    }
};

/// The bytes of a file of entry 0.
template <class Family>
std::string one(std::string const& value = "value") {
    return Family::bytes(0, 1, value);
}

} // namespace structured

#endif
