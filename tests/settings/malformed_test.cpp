// What malformed text becomes in a settings file, and how much memory it takes. A program of its own,
// since the operators that allocate memory are replaced for all of it.
#include <doctest/doctest.h>

#include <cstddef>
#include <string>
#include <vector>

#include <koru/datafile.h>
#include <koru/initializationfile.h>
#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/failingmemory.h"
#include "support/tempdir.h"

namespace {

constexpr std::size_t SIZE = 1 << 20;
// Above the size of the text: sixteen megabytes, or as many as pointers need that are twice as long.
constexpr std::size_t MOST = SIZE + (sizeof(void*) << 22);

std::string repeated(std::string const& piece) {
    std::string bytes;
    while (bytes.size() + piece.size() <= SIZE) bytes += piece;
    return bytes;
}

struct Text {
    std::string name;
    std::string bytes;
};

std::vector<Text> malformedTexts() {
    std::string const valid(SIZE, 'x');
    return {{"a value of stray bytes", "[s]\nk=" + std::string(SIZE, '\xFF')},
            {"a value that begins with one", "[s]\nk=\xFF" + valid},
            {"a value of leads without tails", "[s]\nk=" + std::string(SIZE, '\xC3')},
            {"a value that a lead ends", "[s]\nk=" + valid + "\xC3"},
            {"a key of stray bytes", "[s]\n" + std::string(SIZE, '\xFF') + "=v"},
            {"a key that begins with one", "[s]\n\xFF" + valid + "=v"},
            {"a name of a section", "[\xFF" + valid + "]\nk=v"},
            {"a comment", "[s]\n;" + std::string(SIZE, '\xFF')},
            {"many short entries", "[s]\n" + repeated("\xFF=\xFF\n")},
            {"many keys", "[s]\n" + repeated("\xFF=\n")},
            {"many sections", repeated("[\xFF]\n\xFF=\n")},
            {"many headers", repeated("[\xFF]\n")},
            {"overlong zeros", "[s]\n" + repeated("a\xC0\x80=\xC0\x80\n")},
            {"overlong slashes", "[s]\n" + repeated("\xC0\xAF=\xC0\xAF\n")},
            {"stray bytes and five more", "[s]\n" + repeated("\x80qwert=\xFEqwert\n")}};
}

void lookUp(Koru::InitializationFile& file) { static_cast<void>(file.getValue(L"s", L"k")); }
void lookUp(Koru::PropertyFile& file) { static_cast<void>(file.getValue(L"k")); }
void lookUp(Koru::DataFile& file) { static_cast<void>(file.size()); }

/// What opening a file of these bytes, looking something up and writing it back holds at a time.
template <class File>
std::size_t mostHeld(std::string const& bytes) {
    test::Place const place;
    place.write(bytes);
    test::MostBytes const most;
    File file(place.path());
    file.open(Koru::File::READ | Koru::File::WRITE);
    lookUp(file);
    file.close();
    return most.count();
}

} // namespace

TEST_CASE("a value is what make_wstring makes of its bytes, and is written as make_string has it") {
    // Leads of every size, too small ones among them, and what may follow.
    std::string const bytes = "\x80\xBF\xAF\x8A\xC0\xC1\xC3\xE0\xEF\xF0\xF7\xF8\xFC\xFD\xFE\xFFz";
    std::vector<std::string> values;
    for (char const a : bytes) {
        for (char const b : bytes) {
            for (char const c : bytes) {
                for (char const* const tail : {"", "y", "\x80", "bcdef", "\x81\x82\x83\x84\x85"}) {
                    values.push_back(std::string{a, b, c} + tail);
                }
            }
        }
    }
    auto const key = [](std::size_t i) { return "key" + std::to_string(i) + "="; };
    std::string before;
    std::string after;
    for (std::size_t i = 0; i < values.size(); ++i) {
        before += key(i) + values[i] + "\n";
        after += key(i) + Koru::make_string(Koru::make_wstring(values[i])) + "\n";
    }
    test::Place const place;
    place.write(before);
    Koru::PropertyFile file(place.path());
    file.open(Koru::File::READ | Koru::File::WRITE);
    for (std::size_t i = 0; i < values.size(); i += 7) {
        std::string const name = key(i);
        std::wstring const value = file.getValue(std::wstring(name.begin(), name.end() - 1));
        CHECK((value == Koru::make_wstring(values[i])));
    }
    file.close();
    CHECK((place.bytes() == after));
}

TEST_CASE_TEMPLATE("a megabyte of malformed settings takes sixteen more at the most, on 32 bits",
                   File, Koru::InitializationFile, Koru::PropertyFile) {
    for (Text const& text : malformedTexts()) {
        CAPTURE(text.name);
        CHECK(mostHeld<File>(text.bytes) <= MOST);
    }
}

TEST_CASE("a megabyte of the shortest records takes sixteen more at the most, on 32 bits") {
    std::string const record("\2\0\0\0\0\xFF\0\0\0\0", 10);
    CHECK(mostHeld<Koru::DataFile>(repeated(record)) <= MOST);
}

TEST_CASE("conversions of a megabyte of malformed text take sixteen more at the most") {
    for (Text const& text : malformedTexts()) {
        CAPTURE(text.name);
        test::MostBytes const most;
        static_cast<void>(Koru::make_string(Koru::make_wstring(text.bytes)));
        static_cast<void>(Koru::File::Path("/d/" + text.bytes));
        CHECK(most.count() <= MOST);
    }
}
