// The record file's format: what is written, what is read, and files that are damaged or hostile.
#include <doctest/doctest.h>

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/datafile.h>

#include "records/recordfixture.h"
#include "support/shown.h"
#include "support/subprocess.h"
#include "support/throws.h"

using namespace test;
using Koru::DataFile;
using Record = Koru::DataFile::Record;
using namespace std::string_literals;

namespace {

char const* const NOT_READ = "failed to read from file";
char const* const NOTHING = "<nothing>";

/// What is read after an odd length.
Entry oddEntry(std::wstring const& key, std::string const& data) {
    return entry(key + L'\0', data);
}

} // namespace

TEST_CASE("records are written as length and key, length and data") {
    struct Row {
        char const* label;
        std::wstring key;
        std::string data;
        std::string expected;
    };
    std::wstring const negative(1, static_cast<wchar_t>(0xFFFFFFE9));
    Place const place;
    for (Row const& row : std::vector<Row>{
             {"the plainest", L"ab", "\1\2\3", "\4\0\0\0\0a\0b\3\0\0\0\1\2\3"s},
             {"no data", L"k", "", "\2\0\0\0\0k\0\0\0\0"s},
             {"data of NULs", L"k", "\0\0"s, "\2\0\0\0\0k\2\0\0\0\0\0"s},
             {"data of any bytes", L"k", "\xFF\n\r\x1A", "\2\0\0\0\0k\4\0\0\0\xFF\n\r\x1A"s},
             {"U+00E9", L"\u00E9", "", "\2\0\0\0\0\xE9\0\0\0\0"s},
             {"U+0141", L"\u0141", "", "\2\0\0\0\0A\0\0\0\0"s},
             {"beyond 16 bits", L"\U0001F642", "", "\2\0\0\0\0B\0\0\0\0"s},
             {"0xFFFFFFE9", negative, "", "\2\0\0\0\0\xE9\0\0\0\0"s},
             {"U+0100 in front", L"\u0100x", "", "\4\0\0\0\0\0\0x\0\0\0\0"s},
             {"NUL inside", L"a\0b"s, "d", "\6\0\0\0\0a\0\0\0b\1\0\0\0d"s},
             {"NULs at the end", L"a\0\0"s, "d", "\6\0\0\0\0a\0\0\0\0\1\0\0\0d"s},
             {"blanks only", L" \t\n", "", "\6\0\0\0\0 \0\t\0\n\0\0\0\0"s},
         }) {
        CAPTURE(row.label);
        CHECK(shown(written(place, {record(row.key, row.data)})) == shown(row.expected));
    }
}

TEST_CASE("without records the file is empty, and an empty file holds no records") {
    Place const place;
    CHECK(written(place, {}) == "");
    CHECK(loaded(place, "").empty());
}

TEST_CASE("a default record is written with an empty key, which cannot be read") {
    Place const place;
    CHECK(written(place, {Record()}) == std::string(8, '\0'));
    Record nameless;
    nameless.setData(bytes("data"));
    CHECK(written(place, {nameless}) == "\0\0\0\0\4\0\0\0data"s);
    DataFile file(place.path());
    CHECK(openMessage(file, READ) == NO_KEY);
    CHECK(file.is_open());
    CHECK(file.size() == 0UL);
}

TEST_CASE("lengths are four bytes, the lowest first") {
    Place const place;
    std::wstring const key(0x12345, L'k');
    std::string const data(0x54321, 'd');
    std::string const content = written(place, {record(key, data)});
    REQUIRE(content.size() == 8 + 2 * key.size() + data.size());
    CHECK(content.substr(0, 4) == "\x8A\x46\x02\x00"s);
    CHECK(content.substr(4 + 2 * key.size(), 4) == "\x21\x43\x05\x00"s);
    checkSame(loaded(place, content), {entry(key, data)});
}

TEST_CASE("a key keeps the low 8 bits of each character, and they come back with their sign") {
    Place const place;
    for (std::uint32_t const high : {0U, 0x100U, 0x10FF00U, 0x7FFFFF00U, 0xFFFFFF00U}) {
        std::vector<Record> records;
        Entries expected;
        for (std::uint32_t low = 0; low < 256; ++low) {
            // A number of two characters in front keeps the keys apart.
            std::wstring const number{static_cast<wchar_t>(L'0' + low / 16),
                                      static_cast<wchar_t>(L'0' + low % 16)};
            records.push_back(record(number + static_cast<wchar_t>(high | low) + L'.'));
            auto const back = static_cast<wchar_t>(low < 0x80 ? low : 0xFFFFFF00U | low);
            expected.push_back(entry(number + back + L'.'));
        }
        checkSameRecords(loaded(place, written(place, records)), expected);
    }
}

TEST_CASE("what 8 bits make of the ends of a key is trimmed or refused when it is read") {
    struct Row {
        std::wstring key;
        std::string message;
        Entries expected;
    };
    Place const place;
    for (Row const& row : std::vector<Row>{
             {L"\u0120a\u0109", NOTHING, {entry(L"a")}},
             {L"\u010Aa\u0120b\u010A", NOTHING, {entry(L"a b")}},
             {L"\u0120\u0109", NOTHING, {entry(L" \t")}},
             {L"a\u0100", NOTHING, {entry(L"a\0"s)}},
             {L"\u0100a", NO_KEY, {}},
             {L"\u0120\u0100a", NO_KEY, {}},
             {L"\u0100", NO_KEY, {}},
         }) {
        CAPTURE(shown(row.key));
        written(place, {record(row.key)});
        DataFile file(place.path());
        CHECK(openMessage(file, READ) == row.message);
        checkSame(held(file), row.expected);
    }
}

TEST_CASE("the first byte of each pair of a key is ignored, the second sign-extended") {
    Place const place;
    for (char const first : "\x00\x01\x20\x5A\x80\xFF"s) {
        for (int second = 1; second < 256; ++second) {
            std::string const pairs{'\0', 'x', first, static_cast<char>(second)};
            Entries const entries = loaded(place, lengthField(4) + pairs + lengthField(0));
            bool const isBlank = second == ' ' || second == '\t' || second == '\n';
            std::wstring const back(1, static_cast<wchar_t>(static_cast<signed char>(second)));
            REQUIRE(entries.size() == 1);
            checkKey(entries[0].key, L"x" + (isBlank ? L"" : back));
        }
    }
}

TEST_CASE("files are read entry by entry, and what is wrong ends the reading") {
    struct Row {
        std::string label;
        std::string content;
        std::string message;
        Entries expected;
    };
    Entry const one = entry(L"a", "one");
    Entry const two = entry(L"b", "two");
    Entry const longOne = entry(L"a long key of many letters", "d");
    std::string const a = fileBytes(one);
    std::string const b = fileBytes(two);
    std::string const noKey = fileBytes(entry(L""));
    std::string const dataCut = lengthField(0) + lengthField(2) + "d";
    std::string const upperA = fileBytes(entry(L"A", "x"));
    std::string const odd = "\3\0\0\0\0ax\0\0\0\0"s;
    Place const place;
    for (Row const& row : std::vector<Row>{
             {"nothing", "", NOTHING, {}},
             {"two", a + b, NOTHING, {one, two}},
             {"equal ones", a + a, NOTHING, {one, one}},
             {"equal but for case", a + upperA, NOTHING, {entry(L"A", "x"), one}},
             {"blanks to trim", fileBytes(entry(L" \ta\n")), NOTHING, {entry(L"a")}},
             {"blanks alone", fileBytes(entry(L" \t ")), NOTHING, {entry(L" \t ")}},
             {"no key", a + noKey, NO_KEY, {one}},
             {"no key but data", a + fileBytes(entry(L"", "d")) + b, NO_KEY, {one}},
             {"no key, data cut", a + dataCut, NOT_READ, {one}},
             {"no key, no data length", a + lengthField(0), NOT_READ, {one}},
             {"NUL as key", fileBytes(entry(L"\0"s)), NO_KEY, {}},
             {"NUL in front", fileBytes(entry(L" \0a"s)), NO_KEY, {}},
             {"one byte more", a + "x", NOT_READ, {one}},
             {"three bytes more", a + "\0\0\0"s, NOT_READ, {one}},
             {"a line feed more", a + b + "\n", NOT_READ, {one, two}},
             {"an odd key of one byte", "\1\0\0\0x\0\0\0\0"s, NO_KEY, {}},
             {"an odd key of three", odd, NOTHING, {oddEntry(L"a", "")}},
             {"an odd key of five", "\5\0\0\0\0a\0bx\0\0\0\0"s, NOTHING, {oddEntry(L"ab", "")}},
             {"an odd key's NUL shields blanks",
              "\5\0\0\0\0a\0 x\0\0\0\0"s,
              NOTHING,
              {oddEntry(L"a ", "")}},
             {"an odd key of blanks", "\5\0\0\0\0 \0 x\0\0\0\0"s, NO_KEY, {}},
             {"an odd key after a long one",
              fileBytes(longOne) + odd,
              NOTHING,
              {longOne, oddEntry(L"a", "")}},
             {"a key length of a text file", "ke\0\0=value\n"s, NOT_READ, {}},
         }) {
        CAPTURE(row.label);
        place.write(row.content);
        DataFile file(place.path());
        CHECK(openMessage(file, READ) == row.message);
        CHECK(file.is_open());
        CHECK(file.getMode() == (READ | BINARY));
        checkSameRecords(held(file), row.expected);
        CHECK(isFree(file));
    }
}

TEST_CASE("the NUL that ends an odd key is written, so the key grows to an even length") {
    OwnDataFile file("\3\0\0\0\0ax\1\0\0\0d"s, READ_WRITE);
    file.close();
    CHECK(file.bytes() == "\4\0\0\0\0a\0\0\1\0\0\0d"s);
}

TEST_CASE("characters that do not survive in a key do so at the second reading") {
    Place const place;
    written(place, {record(L"\u00E9\u0141", "d")});
    Entries const once{entry({static_cast<wchar_t>(0xFFFFFFE9), L'A'}, "d")};
    DataFile file(place.path());
    file.open(READ_WRITE);
    checkSame(held(file), once);
    file.synchronize();
    checkSame(held(file), once);
}

namespace {

std::string pattern(std::size_t size) {
    std::string result;
    for (std::size_t i = 0; i < size; ++i) result += static_cast<char>(i * 7 + i / 256);
    return result;
}

} // namespace

TEST_CASE("every size of key and data around the sizes of buffers is written and read") {
    Place const place;
    std::string const data = pattern(70000);
    for (std::size_t const middle : {511UL, 1023UL, 4095UL, 8191UL, 16383UL, 65535UL}) {
        for (std::size_t size = middle - 20; size < middle + 6; ++size) {
            CAPTURE(size);
            std::wstring const longKey(size / 2 + 2, L'k');
            writeAndRead(place, {entry(L"a", data.substr(0, size)),
                                 entry(longKey, data.substr(1, 30)), entry(L"c", "z")});
        }
    }
}

TEST_CASE("keys of every length and any characters are written and read as the plain rule says") {
    Place const place;
    std::mt19937 random(19);
    for (std::size_t length = 1; length <= 70; ++length) {
        CAPTURE(length);
        Entries entries;
        std::string content;
        for (int i = 0; i < 20; ++i) {
            std::wstring key;
            while (key.size() < length) key += static_cast<wchar_t>(random() >> random() % 32);
            key.back() = L'z';                            // which is not trimmed
            key.front() = static_cast<wchar_t>(L'a' + i); // none is equal or refused
            entries.push_back(entry(key, "data"));
            std::string field = fileBytes(entries.back());
            // What is read may have anything before each character.
            for (std::size_t at = 4; at < 4 + 2 * length; at += 2) {
                field[at] = static_cast<char>(random());
            }
            content += field;
        }
        // And half a character more.
        content += lengthField(static_cast<std::uint32_t>(2 * length + 1)) +
                   std::string(2 * length + 1, '\xF1') + lengthField(0);
        CHECK(writeAndRead(place, entries) == 20);
        Loaded const expected = load(content);
        CHECK(expected.entries.size() == 21);
        checkSameRecords(loaded(place, content), expected.entries);
    }
}

TEST_CASE("large data and long keys survive writing and reading") {
    Place const place;
    std::string const large = pattern(10UL << 20);
    std::wstring longKey;
    for (int i = 0; i < 100000; ++i) longKey += static_cast<wchar_t>(L'!' + i % 90);
    writeAndRead(place, {entry(L"1 MiB", large.substr(0, 1UL << 20)), entry(L"10 MiB", large),
                         entry(longKey, large.substr(0, 1000))});
    DataFile file(place.path());
    file.open(READ);
    file.insert(record(longKey));
    CHECK(file.size() == 3UL);
    longKey.back() = L'~';
    file.insert(record(longKey));
    CHECK(file.size() == 4UL);
}

TEST_CASE("synchronize of records that cannot be read again keeps those before") {
    OwnDataFile file(READ_WRITE);
    file.insert(record(L"k"));
    file.insert(record(L"l"));
    Entries const entries = held(file);
    file[1] = Record();
    CHECK(messageOf<std::invalid_argument>([&] { file.synchronize(); }) == NO_KEY);
    CHECK(file.is_open());
    checkSame(held(file), {entries[0]});
    CHECK(isFree(file));
    CHECK(file.bytes() == fileBytes({entries[0], entry(L"")}));
}

namespace {

std::string fewEntries() {
    return fileBytes({entry(L"ab", "\1\2\3"), entry(L"name"), entry(L"a\0b"s, "text"),
                      entry(L"\u00E9", std::string(20, '\xFF'))});
}

} // namespace

TEST_CASE("every prefix of a file gives its complete entries and a failure to read") {
    std::string const whole = fewEntries() + fileBytes({entry(L"", "no key"), entry(L"last", "x")});
    CHECK(load(whole).message == NO_KEY);
    std::vector<std::string> contents;
    for (std::size_t size = 0; size <= whole.size(); ++size) {
        contents.push_back(whole.substr(0, size));
    }
    checkFaultless(contents);
}

TEST_CASE("every single flipped bit of a file is read or refused") {
    std::vector<std::string> contents(8 * fewEntries().size(), fewEntries());
    for (std::size_t bit = 0; bit < contents.size(); ++bit) {
        char& byte = contents[bit][bit / 8];
        byte = static_cast<char>(byte ^ (1 << bit % 8));
    }
    checkFaultless(contents);
}

TEST_CASE("every single wrong byte of a file is read or refused") {
    std::string const whole = fileBytes({entry(L"ab", "\1\2\3"), entry(L"k", "d")});
    std::vector<std::string> contents;
    for (std::size_t i = 0; i < whole.size(); ++i) {
        bool const isLength = i < 4 || (i >= 8 && i < 12);
        for (int byte = 0; byte < 256; byte += isLength ? 1 : 16) {
            contents.push_back(whole);
            contents.back()[i] = static_cast<char>(byte);
        }
    }
    checkFaultless(contents);
}

TEST_CASE("a length beyond the file is a failure to read, one beyond any object std::bad_alloc") {
    std::vector<std::string> contents{"[section]\nkey=value\n", std::string(1000, 'x'),
                                      std::string(1000, '\xFF')};
    for (std::string const& before : {""s, fewEntries()}) {
        for (std::uint32_t const length :
             {0xFFFFFFFFU, 0xFFFFFFFEU, 0xFFFFFFFDU, 0xFFFFFFFCU, 0xFFFFFFF0U, 0x80000001U,
              0x80000000U, 0x7FFFFFFFU, 0x7FFFFFFEU, 0x40000000U, 0x3FFFFFFFU, 0x20000000U,
              0x10000000U, 0x01000000U, 0x00010001U, 0x00010000U, 0x0000FFFFU, 100U}) {
            for (std::string const& after : {""s, "x"s, "xy"s, "\0a\0b\3\0\0\0\1\2\3"s}) {
                contents.push_back(before + lengthField(length) + after);
                contents.push_back(before + "\2\0\0\0\0k"s + lengthField(length) + after);
                contents.push_back(before + lengthField(0) + lengthField(length) + after);
            }
        }
    }
    checkFaultless(contents);
}

TEST_CASE("a length that the file has but memory does not ends in std::bad_alloc" *
          doctest::skip(!MEMORY_CAN_BE_LIMITED)) {
    struct Row {
        std::string label;
        std::string lengths;
        std::uint64_t size; // with a hole after the lengths
    };
    Place const place;
    std::uint64_t const gibi = 1ULL << 30;
    for (Row const& row : std::vector<Row>{
             {"1 GiB of data", "\2\0\0\0\0k\0\0\0\x40"s, gibi + 100},
             {"nearly 4 GiB of data", "\2\0\0\0\0k\xFF\xFF\xFF\xFF"s, 4 * gibi + 100},
             {"1 GiB of key", "\0\0\0\x40"s, gibi + 100},
             {"nearly 4 GiB of key", "\xFF\xFF\xFF\xFF"s, 4 * gibi + 100},
         }) {
        CAPTURE(row.label);
        place.write(fileBytes(entry(L"first", "data")) + row.lengths);
        std::filesystem::resize_file(place.path(), row.size);
        Outcome const outcome = inChild([&] {
            ::alarm(100);
            limitMemory();
            DataFile file(place.path());
            std::string const message = openMessage(file, READ);
            bool const isFirst = file.size() == 1 && file[0].getKey() == L"first";
            std::printf("%s, %s, %s, %s", message.c_str(), file.is_open() ? "open" : "closed",
                        isFirst ? "first" : "other", isFree(file) ? "free" : "locked");
            return 0;
        });
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "std::bad_alloc, open, first, free");
    }
}

// Elsewhere either no file can have such a key, or memory is counted otherwise.
TEST_CASE("a key of more characters than a wide string holds ends in std::bad_alloc" *
          doctest::skip(sizeof(std::size_t) > 4 || !MEMORY_CAN_BE_LIMITED)) {
    Place const place;
    std::uint64_t const size = 2 * (std::uint64_t{std::wstring().max_size()} + 1);
    place.write(lengthField(static_cast<std::uint32_t>(size)));
    std::filesystem::resize_file(place.path(), 4 + size);
    DataFile file(place.path());
    CHECK(openMessage(file, READ) == "std::bad_alloc");
    CHECK(file.is_open());
    CHECK(file.size() == 0UL);
}

TEST_CASE("what could be read of a damaged file is what close writes") {
    struct Row {
        unsigned long opened;
        std::string message;
        unsigned long closed;
        std::string expected;
    };
    Place const place;
    std::string const good = fileBytes(entry(L"k", "data"));
    std::string const damage = "\4\0\0\0\0k"s;
    for (Row const& row : std::vector<Row>{
             {READ_WRITE, NOT_READ, READ_WRITE, good},
             {READ_WRITE, NOT_READ, READ, good + damage}, // which keeps the file
             {WRITE, NOTHING, WRITE, ""},                 // not read, so it does not matter
         }) {
        CAPTURE(row.opened);
        CAPTURE(row.closed);
        place.write(good + damage);
        DataFile file(place.path());
        CHECK(openMessage(file, row.opened) == row.message);
        file.setMode(row.closed);
        file.close();
        CHECK(place.bytes() == row.expected);
    }
}
