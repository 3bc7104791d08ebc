// The record file: the record, the file format, the positions, the operations, the life cycle, what
// goes wrong, and the lock. datafile_model_test.cpp compares it with a plain model over many
// operations; datafile_memory_test.cpp lets memory run out.
#include <doctest/doctest.h>

#include <fcntl.h>
#include <grp.h>
#include <locale.h>
#include <pthread.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <climits>
#include <clocale>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <new>
#include <random>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include <koru/datafile.h>

#include "records/recordfixture.h"
#include "support/shown.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::DataFile;
using Koru::File;
using test::BINARY;
using test::Bytes;
using test::bytes;
using test::checkKey;
using test::checkSame;
using test::checkSameRecords;
using test::Entries;
using test::Entry;
using test::fileBytes;
using test::held;
using test::isFree;
using test::isInOrderOfAddresses;
using test::lengthField;
using test::messageOf;
using test::READ;
using test::READ_WRITE;
using test::record;
using test::RecordPlace;
using test::slotOf;
using test::slotOfOpen;
using test::WRITE;
using Record = Koru::DataFile::Record;
using namespace std::string_literals;

// The reading and writing system calls of this executable and the libraries it loaded pass through
// here, so that a test can make them fail or transfer less than they were asked for.
namespace {

std::atomic<int> readsBeforeFailure{-1};   // -1: none fails
std::atomic<int> writesBeforeFailure{-1};  // -1: none fails
std::atomic<std::size_t> transferLimit{0}; // bytes at once; 0: no limit
std::atomic<int> failedCalls{0};

bool _failsNow(std::atomic<int>& callsBeforeFailure, int error) {
    if (callsBeforeFailure < 0 || callsBeforeFailure-- > 0) return false;
    callsBeforeFailure = 0; // every later one fails as well
    ++failedCalls;
    errno = error;
    return true;
}

std::size_t _limited(std::size_t count) {
    std::size_t const limit = transferLimit;
    return limit != 0 && count > limit ? limit : count;
}

} // namespace

extern "C" ssize_t read(int fd, void* buffer, size_t count) {
    if (_failsNow(readsBeforeFailure, EIO)) return -1;
    return static_cast<ssize_t>(::syscall(SYS_read, fd, buffer, _limited(count)));
}

extern "C" ssize_t write(int fd, void const* buffer, size_t count) {
    if (_failsNow(writesBeforeFailure, ENOSPC)) return -1;
    return static_cast<ssize_t>(::syscall(SYS_write, fd, buffer, _limited(count)));
}

extern "C" ssize_t writev(int fd, iovec const* pieces, int count) {
    if (_failsNow(writesBeforeFailure, ENOSPC)) return -1;
    if (transferLimit != 0 && count > 0) {
        iovec first = pieces[0];
        if (first.iov_len == 0 && count > 1) first = pieces[1];
        first.iov_len = _limited(first.iov_len);
        return static_cast<ssize_t>(::syscall(SYS_writev, fd, &first, 1));
    }
    return static_cast<ssize_t>(::syscall(SYS_writev, fd, pieces, count));
}

namespace {

char const* const NOT_OPENED = "failed to open file.";
char const* const NOT_READ = "failed to read from file";
char const* const NOT_WRITTEN = "failed to write to file";
char const* const NO_KEY = "zero length key";
char const* const NO_RECORD = "object does not exist";

template <class Callable>
std::string complaint(Callable callable) {
    return messageOf<std::runtime_error>(callable);
}

/// A report that a child process writes for its parent.
#define SAY_FORMAT __attribute__((format(printf, 1, 2)))
SAY_FORMAT void say(char const* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    std::vprintf(format, arguments);
    va_end(arguments);
}

/// The bytes of the file that these records are written to.
std::string written(RecordPlace const& place, std::vector<Record> const& records) {
    DataFile file(place.path());
    file.open(WRITE);
    for (Record const& r : records) file.insert(r);
    file.close();
    return place.content();
}

/// What a file of these bytes is loaded as.
Entries loaded(RecordPlace const& place, std::string const& content) {
    place.write(content);
    DataFile file(place.path());
    file.open(READ);
    return held(file);
}

/// The message with which loading ends: of a runtime_error or an invalid_argument, as it should be.
std::string openMessage(DataFile& file, unsigned long mode) {
    try {
        file.open(mode);
    } catch (std::bad_alloc const&) {
        return "std::bad_alloc";
    } catch (std::invalid_argument const& e) {
        return e.what() == std::string(NO_KEY) ? NO_KEY : "another invalid_argument";
    } catch (std::runtime_error const& e) {
        return e.what() == std::string(NO_KEY) ? "wrong type" : e.what();
    }
    return "<nothing>";
}

Entry entry(std::wstring const& key, std::string const& data) { return {key, bytes(data)}; }

} // namespace

// ---------------------------------------------------------------------------------------- the
// types

TEST_CASE("a record file is a file, a stream and not copyable") {
    static_assert(std::is_base_of<File, DataFile>::value, "");
    static_assert(std::is_convertible<DataFile*, std::fstream*>::value, "");
    static_assert(!std::is_copy_constructible<DataFile>::value, "");
    static_assert(!std::is_copy_assignable<DataFile>::value, "");
    static_assert(std::has_virtual_destructor<DataFile>::value, "");
    static_assert(std::is_nothrow_destructible<DataFile>::value, "");
    static_assert(std::is_constructible<DataFile, File::Path const&>::value, "");
    static_assert(
        std::is_same<decltype(std::declval<DataFile const&>().size()), unsigned long>::value, "");
    static_assert(std::is_same<decltype(std::declval<DataFile&>()[0UL]), Record&>::value, "");
    RecordPlace const place;
    DataFile file(place.path());
    file.open(WRITE);
    std::fstream& stream = file;
    CHECK(stream.is_open());
}

TEST_CASE("a record is a plain value of key and data with a table of virtual operations") {
    static_assert(std::is_default_constructible<Record>::value, "");
    static_assert(std::is_copy_constructible<Record>::value, "");
    static_assert(std::is_copy_assignable<Record>::value, "");
    static_assert(std::is_polymorphic<Record>::value, "");
    static_assert(std::has_virtual_destructor<Record>::value, "");
    static_assert(
        std::is_same<decltype(std::declval<Record const&>().getKey()), std::wstring const&>::value,
        "");
    static_assert(
        std::is_same<decltype(std::declval<Record const&>().getData()), Bytes const&>::value, "");
    std::size_t const parts = sizeof(void*) + sizeof(std::wstring) + sizeof(Bytes);
    CHECK(sizeof(Record) == parts);
}

TEST_CASE("the virtual operations keep their order behind the two entries of the destructor") {
    CHECK(slotOfOpen<DataFile>() == 2);
    CHECK(slotOf(&DataFile::close) == 3);
    CHECK(slotOf(&DataFile::synchronize) == 4);
    CHECK(slotOf(&DataFile::getMode) == 5);
    CHECK(slotOf(&DataFile::setMode) == 6);
    CHECK(slotOf(&Record::getKey) == 2);
    CHECK(slotOf(&Record::setKey) == 3);
    CHECK(slotOf(&Record::getData) == 4);
    CHECK(slotOf(&Record::setData) == 5);
}

TEST_CASE("a new object is closed, has mode 0, no records and the path's name") {
    DataFile nameless;
    CHECK(!nameless.is_open());
    CHECK(nameless.getMode() == 0UL);
    CHECK(nameless.getName().empty());
    CHECK(nameless.size() == 0UL);

    RecordPlace const place;
    File::Path const path(place.path());
    DataFile const file(path);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    checkKey(file.getName(), static_cast<std::wstring>(path));
    CHECK(file.size() == 0UL);
    CHECK(!place.exists());
}

// --------------------------------------------------------------------------------------- the
// record

TEST_CASE("setKey trims blanks, tabs and line feeds, unless there is nothing else") {
    struct Row {
        char const* label;
        std::wstring key;
        std::wstring stored;
    };
    std::wstring const nul(1, L'\0');
    Row const rows[] = {
        {"nothing to trim", L"Name", L"Name"},
        {"both ends", L"  Name\t\n", L"Name"},
        {"all three in front", L" \t\nName", L"Name"},
        {"all three behind", L"Name \t\n \t\n", L"Name"},
        {"inside stays", L" a \t\n b ", L"a \t\n b"},
        {"three spaces stay", L"   ", L"   "},
        {"one of each stays", L"\n\t ", L"\n\t "},
        {"one line feed stays", L"\n", L"\n"},
        {"carriage return behind", L"Name\r", L"Name\r"},
        {"carriage return shields blanks", L" Name \r", L"Name \r"},
        {"carriage return in front", L"\r Name", L"\r Name"},
        {"only a carriage return", L"\r", L"\r"},
        {"other white space", L"\v\fName\v\f", L"\v\fName\v\f"},
        {"wide white space", L"\u00A0\u3000Name\u2003", L"\u00A0\u3000Name\u2003"},
        {"one character", L" x ", L"x"},
        {"NUL inside", L" a" + nul + L"b ", L"a" + nul + L"b"},
        {"NUL behind shields blanks", L"a " + nul, L"a " + nul},
        {"blanks behind a NUL", L"a" + nul + L"  ", L"a" + nul},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        Record changed;
        changed.setKey(row.key);
        checkKey(changed.getKey(), row.stored);
        Record const made(row.key, bytes("data"));
        checkKey(made.getKey(), row.stored);
        CHECK((made.getData() == bytes("data")));
    }
}

TEST_CASE("a key that is empty or begins with NUL is refused and changes nothing") {
    std::wstring const nul(1, L'\0');
    for (std::wstring const& key : {L""s, nul, nul + L"a", L" \t" + nul, L"\n" + nul + L" ",
                                    L"  " + nul + L"a  ", nul + nul}) {
        CAPTURE(test::shown(key));
        Record changed(L"before", bytes("data"));
        CHECK(messageOf<std::invalid_argument>([&] { changed.setKey(key); }) == NO_KEY);
        checkKey(changed.getKey(), L"before");
        CHECK((changed.getData() == bytes("data")));
        CHECK(messageOf<std::invalid_argument>([&] { Record const made(key, bytes("x")); }) ==
              NO_KEY);
        Record empty;
        CHECK(messageOf<std::invalid_argument>([&] { empty.setKey(key); }) == NO_KEY);
        CHECK(empty.getKey().empty());
    }
}

TEST_CASE("every key of up to five characters is trimmed or refused as the plain rule says") {
    wchar_t const characters[] = {L' ', L'\t', L'\n', L'\r', L'a', L'\0', L'\u3000'};
    std::size_t const count = sizeof characters / sizeof *characters;
    int differences = 0;
    int keys = 0;
    for (std::size_t length = 0; length <= 5; ++length) {
        std::size_t all = 1;
        for (std::size_t i = 0; i < length; ++i) all *= count;
        for (std::size_t n = 0; n < all; ++n, ++keys) {
            std::wstring key;
            for (std::size_t rest = n; key.size() < length; rest /= count) {
                key += characters[rest % count];
            }
            std::wstring expected = L"before";
            std::string message = "<nothing>";
            try {
                expected = test::storedKey(key);
            } catch (std::invalid_argument const& e) {
                message = e.what();
            }
            Record changed(L"before", {});
            bool const same =
                messageOf<std::invalid_argument>([&] { changed.setKey(key); }) == message &&
                changed.getKey() == expected;
            if (!same && differences++ == 0) CHECK(test::shown(key) == "as expected");
        }
    }
    CHECK(differences == 0);
    CHECK(keys == 1 + 7 + 49 + 343 + 2401 + 16807);
}

TEST_CASE("a record may be given its own key and data") {
    Record r(L"key", bytes("data"));
    r.setKey(r.getKey());
    r.setData(r.getData());
    Record const& itself = r;
    r = itself;
    checkSame({test::entryOf(r)}, {entry(L"key", "data")});
}

TEST_CASE("a default record is empty and unchecked, and data is stored as it is") {
    Record r;
    CHECK(r.getKey().empty());
    CHECK(r.getData().empty());
    Bytes all;
    for (int i = 0; i < 256; ++i) all.push_back(static_cast<unsigned char>(i));
    r.setData(all);
    CHECK((r.getData() == all));
    CHECK(r.getKey().empty());
    r.setData({});
    CHECK(r.getData().empty());
}

TEST_CASE("getKey and getData refer to what the record stores") {
    Record r(L"first", bytes("one"));
    std::wstring const& key = r.getKey();
    Bytes const& data = r.getData();
    CHECK(&key == &r.getKey());
    CHECK(&data == &r.getData());
    r.setKey(L"second");
    r.setData(bytes("two"));
    checkKey(key, L"second");
    CHECK((data == bytes("two")));
}

TEST_CASE("records are copied member by member, without checks, and apart from then on") {
    Record const empty;
    Record copy(empty);
    CHECK(copy.getKey().empty());
    Record assigned(L"key", bytes("data"));
    assigned = empty;
    CHECK(assigned.getKey().empty());
    CHECK(assigned.getData().empty());
    Record const original(L"key", bytes("data"));
    Record apart(original);
    apart.setKey(L"other");
    apart.setData({});
    checkSame({test::entryOf(original)}, {entry(L"key", "data")});
}

// -------------------------------------------------------------------------------------- the format

TEST_CASE("records are written as length and key, length and data") {
    struct Row {
        char const* label;
        std::wstring key;
        std::string data;
        std::string expected;
    };
    Row const rows[] = {
        {"the plainest", L"ab", "\1\2\3", "\4\0\0\0\0a\0b\3\0\0\0\1\2\3"s},
        {"no data", L"k", "", "\2\0\0\0\0k\0\0\0\0"s},
        {"data of NULs", L"k", "\0\0"s, "\2\0\0\0\0k\2\0\0\0\0\0"s},
        {"data of any bytes", L"k", "\xFF\n\r\x1A", "\2\0\0\0\0k\4\0\0\0\xFF\n\r\x1A"s},
        {"U+00E9", L"\u00E9", "", "\2\0\0\0\0\xE9\0\0\0\0"s},
        {"U+0141", L"\u0141", "", "\2\0\0\0\0A\0\0\0\0"s},
        {"beyond 16 bits", L"\U0001F642", "", "\2\0\0\0\0B\0\0\0\0"s},
        {"0xFFFFFFE9", std::wstring(1, static_cast<wchar_t>(0xFFFFFFE9)), "",
         "\2\0\0\0\0\xE9\0\0\0\0"s},
        {"U+0100 in front", L"\u0100x", "", "\4\0\0\0\0\0\0x\0\0\0\0"s},
        {"NUL inside", L"a\0b"s, "d", "\6\0\0\0\0a\0\0\0b\1\0\0\0d"s},
        {"NULs at the end", L"a\0\0"s, "d", "\6\0\0\0\0a\0\0\0\0\1\0\0\0d"s},
        {"blanks only", L" \t\n", "", "\6\0\0\0\0 \0\t\0\n\0\0\0\0"s},
    };
    RecordPlace const place;
    for (Row const& row : rows) {
        CAPTURE(row.label);
        std::string const actual = written(place, {record(row.key, row.data)});
        CHECK(test::shown(actual) == test::shown(row.expected));
    }
}

TEST_CASE("without records the file is empty, and an empty file holds no records") {
    RecordPlace const place;
    CHECK(written(place, {}) == "");
    DataFile file(place.path());
    file.open(READ);
    CHECK(file.size() == 0UL);
    CHECK(messageOf<std::out_of_range>([&] { file[0]; }) == NO_RECORD);
}

TEST_CASE("a default record is written with an empty key, which cannot be read") {
    RecordPlace const place;
    CHECK(written(place, {Record()}) == std::string(8, '\0'));
    Record nameless;
    nameless.setData(bytes("data"));
    CHECK(written(place, {nameless}) == "\0\0\0\0\4\0\0\0data"s);
    DataFile file(place.path());
    CHECK(messageOf<std::invalid_argument>([&] { file.open(READ); }) == NO_KEY);
    CHECK(file.is_open());
    CHECK(file.size() == 0UL);
}

TEST_CASE("lengths are four bytes, the lowest first") {
    RecordPlace const place;
    std::wstring const key(0x12345, L'k');
    std::string const data(0x54321, 'd');
    std::string const content = written(place, {record(key, data)});
    REQUIRE(content.size() == 8 + 2 * key.size() + data.size());
    CHECK(content.substr(0, 4) == "\x8A\x46\x02\x00"s);
    CHECK(content.substr(4 + 2 * key.size(), 4) == "\x21\x43\x05\x00"s);
    checkSame(loaded(place, content), {{key, bytes(data)}});
}

TEST_CASE("a key keeps the low 8 bits of each character, and they come back with their sign") {
    RecordPlace const place;
    for (std::uint32_t const high : {0U, 0x100U, 0x10FF00U, 0x7FFFFF00U, 0xFFFFFF00U}) {
        std::vector<Record> records;
        Entries expected;
        for (std::uint32_t low = 0; low < 256; ++low) {
            // A number of two characters in front keeps the keys apart.
            std::wstring const number{static_cast<wchar_t>(L'0' + low / 16),
                                      static_cast<wchar_t>(L'0' + low % 16)};
            auto const character = static_cast<wchar_t>(high | low);
            records.push_back(record(number + character + L'.', "x"));
            auto const back = static_cast<wchar_t>(low < 0x80 ? low : 0xFFFFFF00U | low);
            expected.push_back(entry(number + back + L'.', "x"));
        }
        written(place, records);
        DataFile file(place.path());
        file.open(READ);
        checkSameRecords(held(file), expected);
    }
}

TEST_CASE("what 8 bits make of the ends of a key is trimmed or refused when it is read") {
    struct Row {
        std::wstring key;
        std::string message;
        Entries expected;
    };
    RecordPlace const place;
    for (Row const& row : std::vector<Row>{
             {L"\u0120a\u0109", "<nothing>", {entry(L"a", "")}},
             {L"\u010Aa\u0120b\u010A", "<nothing>", {entry(L"a b", "")}},
             {L"\u0120\u0109", "<nothing>", {entry(L" \t", "")}},
             {L"a\u0100", "<nothing>", {entry(L"a\0"s, "")}},
             {L"\u0100a", NO_KEY, {}},
             {L"\u0120\u0100a", NO_KEY, {}},
             {L"\u0100", NO_KEY, {}},
         }) {
        CAPTURE(test::shown(row.key));
        written(place, {record(row.key)});
        DataFile file(place.path());
        CHECK(openMessage(file, READ) == row.message);
        checkSame(held(file), row.expected);
    }
}

TEST_CASE("the first byte of each pair of a key is ignored, the second sign-extended") {
    RecordPlace const place;
    for (int const first : {0x00, 0x01, 0x20, 0x5A, 0x80, 0xFF}) {
        for (int second = 1; second < 256; ++second) {
            std::string content = lengthField(4) + "\0x"s;
            content += static_cast<char>(first);
            content += static_cast<char>(second);
            content += lengthField(0);
            std::wstring key = L"x";
            key += static_cast<wchar_t>(static_cast<signed char>(second));
            if (second == ' ' || second == '\t' || second == '\n') key = L"x";
            Entries const entries = loaded(place, content);
            REQUIRE(entries.size() == 1);
            if (entries[0].key != key) checkKey(entries[0].key, key);
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
    std::string const a = fileBytes(entry(L"a", "one"));
    std::string const b = fileBytes(entry(L"b", "two"));
    Row const rows[] = {
        {"nothing", "", "<nothing>", {}},
        {"two", a + b, "<nothing>", {entry(L"a", "one"), entry(L"b", "two")}},
        {"equal ones", a + a, "<nothing>", {entry(L"a", "one"), entry(L"a", "one")}},
        {"equal but for case",
         a + fileBytes(entry(L"A", "x")),
         "<nothing>",
         {entry(L"A", "x"), entry(L"a", "one")}},
        {"blanks to trim", fileBytes(entry(L" \ta\n", "d")), "<nothing>", {entry(L"a", "d")}},
        {"blanks alone", fileBytes(entry(L" \t ", "d")), "<nothing>", {entry(L" \t ", "d")}},
        {"no key", a + fileBytes(entry(L"", "")), NO_KEY, {entry(L"a", "one")}},
        {"no key but data", a + fileBytes(entry(L"", "d")) + b, NO_KEY, {entry(L"a", "one")}},
        {"no key, data cut",
         a + lengthField(0) + lengthField(2) + "d",
         NOT_READ,
         {entry(L"a", "one")}},
        {"no key, no data length", a + lengthField(0), NOT_READ, {entry(L"a", "one")}},
        {"NUL as key", fileBytes(entry(L"\0"s, "")), NO_KEY, {}},
        {"NUL in front", fileBytes(entry(L" \0a"s, "")), NO_KEY, {}},
        {"one byte behind", a + "x", NOT_READ, {entry(L"a", "one")}},
        {"three bytes behind", a + "\0\0\0"s, NOT_READ, {entry(L"a", "one")}},
        {"a line feed behind", a + b + "\n", NOT_READ, {entry(L"a", "one"), entry(L"b", "two")}},
        {"an odd key of one byte", "\1\0\0\0x\0\0\0\0"s, NO_KEY, {}},
        {"an odd key of three", "\3\0\0\0\0ax\1\0\0\0d"s, "<nothing>", {entry(L"a\0"s, "d")}},
        {"an odd key of five", "\5\0\0\0\0a\0bx\0\0\0\0"s, "<nothing>", {entry(L"ab\0"s, "")}},
        {"an odd key's NUL shields blanks",
         "\5\0\0\0\0a\0 x\0\0\0\0"s,
         "<nothing>",
         {entry(L"a \0"s, "")}},
        {"an odd key of blanks", "\5\0\0\0\0 \0 x\0\0\0\0"s, NO_KEY, {}},
        {"an odd key behind a long one",
         fileBytes(entry(L"a long key of many letters", "d")) + "\3\0\0\0\0ax\0\0\0\0"s,
         "<nothing>",
         {entry(L"a long key of many letters", "d"), entry(L"a\0"s, "")}},
        {"a key length of a text file", "ke\0\0=value\n"s, NOT_READ, {}},
    };
    RecordPlace const place;
    for (Row const& row : rows) {
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
    RecordPlace const place;
    place.write("\3\0\0\0\0ax\1\0\0\0d"s);
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.content() == "\4\0\0\0\0a\0\0\1\0\0\0d"s);
}

TEST_CASE("characters that do not survive in a key do so at the second reading") {
    RecordPlace const place;
    written(place, {record(L"\u00E9\u0141", "d")});
    DataFile file(place.path());
    file.open(READ_WRITE);
    Entries const once = held(file);
    checkSame(once, {{std::wstring{static_cast<wchar_t>(0xFFFFFFE9), L'A'}, bytes("d")}});
    file.synchronize();
    checkSame(held(file), once);
}

TEST_CASE("every size of key and data around the sizes of buffers is written and read") {
    RecordPlace const place;
    std::string pattern;
    for (int i = 0; i < 70000; ++i) pattern += static_cast<char>(i * 7 + i / 256);
    for (std::size_t const middle : {511UL, 1023UL, 4095UL, 8191UL, 16383UL, 65535UL}) {
        for (std::size_t size = middle - 20; size < middle + 6; ++size) {
            CAPTURE(size);
            std::vector<Record> const records{
                record(L"a", pattern.substr(0, size)),
                record(std::wstring(size / 2 + 2, L'k'), pattern.substr(1, 30)), record(L"c", "z")};
            DataFile file(place.path());
            file.open(WRITE);
            for (Record const& r : records) file.insert(r);
            Entries const entries = held(file);
            file.close();
            bool const same = place.content() == fileBytes(entries);
            CHECK(same);
            file.open(READ);
            checkSameRecords(held(file), entries);
        }
    }
}

TEST_CASE("keys of every length and any characters are written and read as the plain rule says") {
    RecordPlace const place;
    std::mt19937 random(19);
    for (std::size_t length = 1; length <= 70; ++length) {
        CAPTURE(length);
        Entries entries;
        std::string content;
        for (int i = 0; i < 20; ++i) {
            std::wstring key;
            while (key.size() < length) key += static_cast<wchar_t>(random() >> random() % 32);
            key.front() = static_cast<wchar_t>(L'a' + i); // none is equal or refused
            key.back() = L'z';
            entries.push_back({key, bytes("data")});
            std::string const field = fileBytes(entries.back());
            content += field;
            // What is read may have anything before each character, and half a character more.
            for (std::size_t at = 4; at < 4 + 2 * length; at += 2) {
                content[content.size() - field.size() + at] = static_cast<char>(random());
            }
        }
        content += lengthField(static_cast<std::uint32_t>(2 * length + 1)) +
                   std::string(2 * length + 1, '\xF1') + lengthField(0);

        DataFile file(place.path());
        file.open(WRITE);
        for (Entry const& e : entries) file.insert(Record(e.key, e.data));
        Entries const inserted = held(file);
        file.close();
        CHECK(inserted.size() == (length == 1 ? 1U : 20U));
        bool const same = place.content() == fileBytes(inserted);
        CHECK(same);
        test::Loaded const expected = test::load(content);
        CHECK(expected.entries.size() == 21);
        checkSameRecords(loaded(place, content), expected.entries);
    }
}

TEST_CASE("large data and long keys survive writing and reading") {
    RecordPlace const place;
    std::string large;
    for (std::size_t i = 0; i < 10UL << 20; ++i) large += static_cast<char>(i % 251);
    std::wstring longKey;
    for (int i = 0; i < 100000; ++i) longKey += static_cast<wchar_t>(L'!' + i % 90);
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.insert(record(L"1 MiB", large.substr(0, 1UL << 20)));
    file.insert(record(L"10 MiB", large));
    file.insert(record(longKey, large.substr(0, 1000)));
    Entries const entries = held(file);
    CHECK(entries.size() == 3);
    file.close();
    bool const same = place.content() == fileBytes(entries);
    CHECK(same);
    file.open(READ);
    checkSameRecords(held(file), entries);
    file.insert(record(longKey));
    CHECK(file.size() == 3UL);
    longKey.back() = L'~';
    file.insert(record(longKey));
    CHECK(file.size() == 4UL);
}

// ---------------------------------------------------------------------- damaged and hostile files

namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
bool const MEMORY_CAN_BE_LIMITED = false; // the sanitizers reserve more than any limit allows
#else
bool const MEMORY_CAN_BE_LIMITED = true;
#endif

/// Gives this process that much more address space than it has now. Only for child processes.
void limitMemory(std::size_t more) {
    if (!MEMORY_CAN_BE_LIMITED) return;
    std::size_t pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    rlimit limit = {};
    ::getrlimit(RLIMIT_AS, &limit);
    limit.rlim_cur = pages * static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)) + more;
    ::setrlimit(RLIMIT_AS, &limit);
}

std::size_t const ENOUGH_MEMORY = 256UL << 20;

/// Opens a file of these bytes and says what is not as it should be; "" when all is well.
std::string faultWith(RecordPlace const& place, std::string const& content) {
    test::Loaded const expected = test::load(content);
    place.write(content);
    DataFile file(place.path());
    std::string const message = openMessage(file, READ);
    std::string fault;
    if (message != expected.message) fault += message + " instead of " + expected.message + ", ";
    if (!file.is_open()) fault += "not open, ";
    if (test::sorted(held(file)) != test::sorted(expected.entries)) fault += "other records, ";
    if (!isFree(file)) fault += "still locked, ";
    // The object can still be used.
    place.write(fileBytes(entry(L"good", "file")));
    file.close();
    file.open(READ);
    if (file.size() != 1) fault += "not usable, ";
    return fault;
}

/// Tries all of these files in a child with little memory.
void checkFaultless(RecordPlace const& place, std::vector<std::string> const& contents) {
    REQUIRE(!contents.empty());
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(250);
        limitMemory(ENOUGH_MEMORY);
        for (std::string const& content : contents) {
            std::string const fault = faultWith(place, content);
            if (fault.empty()) continue;
            say("%s: %s\n", test::shown(content).c_str(), fault.c_str());
        }
        say("tried all");
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "tried all");
}

Entries fewEntries() {
    return {entry(L"ab", "\1\2\3"), entry(L"name", ""), entry(L"a\0b"s, "text"),
            entry(L"\u00E9", std::string(20, '\xFF'))};
}

} // namespace

TEST_CASE("every prefix of a file gives its complete entries and a failure to read") {
    RecordPlace const place;
    std::string const whole =
        fileBytes(fewEntries()) + fileBytes(entry(L"", "no key")) + fileBytes(entry(L"last", "x"));
    std::vector<std::string> contents;
    for (std::size_t size = 0; size <= whole.size(); ++size) {
        contents.push_back(whole.substr(0, size));
    }
    CHECK(test::load(whole).message == NO_KEY);
    checkFaultless(place, contents);
}

TEST_CASE("every single flipped bit of a file is read or refused") {
    RecordPlace const place;
    std::string const whole = fileBytes(fewEntries());
    std::vector<std::string> contents;
    for (std::size_t bit = 0; bit < 8 * whole.size(); ++bit) {
        std::string damaged = whole;
        damaged[bit / 8] = static_cast<char>(damaged[bit / 8] ^ (1 << bit % 8));
        contents.push_back(damaged);
    }
    checkFaultless(place, contents);
}

TEST_CASE("every single wrong byte of a file is read or refused") {
    RecordPlace const place;
    std::string const whole = fileBytes(Entries{entry(L"ab", "\1\2\3"), entry(L"k", "d")});
    std::vector<std::string> contents;
    for (std::size_t i = 0; i < whole.size(); ++i) {
        for (int byte = 0; byte < 256; ++byte) {
            bool const isLength = i < 4 || (i >= 8 && i < 12);
            if (!isLength && byte % 16 != 0) continue;
            contents.push_back(whole);
            contents.back()[i] = static_cast<char>(byte);
        }
    }
    checkFaultless(place, contents);
}

TEST_CASE("a length beyond the file is a failure to read, one beyond any object std::bad_alloc") {
    RecordPlace const place;
    std::vector<std::string> contents;
    for (std::string const& before : {""s, fileBytes(fewEntries())}) {
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
    contents.push_back("[section]\nkey=value\n");
    contents.push_back(std::string(1000, 'x'));
    contents.push_back(std::string(1000, '\xFF'));
    checkFaultless(place, contents);
}

TEST_CASE("a length that the file has but memory does not ends in std::bad_alloc") {
    if (!MEMORY_CAN_BE_LIMITED) {
        MESSAGE("memory cannot be limited under a sanitizer");
        return;
    }
    RecordPlace const place;
    struct Row {
        std::string label;
        std::string before;
        std::uint64_t size; // with a hole behind
    };
    std::string const first = fileBytes(entry(L"first", "data"));
    std::uint64_t const gibi = 1ULL << 30;
    for (Row const& row : std::vector<Row>{
             {"1 GiB of data", first + "\2\0\0\0\0k\0\0\0\x40"s, gibi + 100},
             {"nearly 4 GiB of data", first + "\2\0\0\0\0k\xFF\xFF\xFF\xFF"s, 4 * gibi + 100},
             {"1 GiB of key", first + "\0\0\0\x40"s, gibi + 100},
             {"nearly 4 GiB of key", first + "\xFF\xFF\xFF\xFF"s, 4 * gibi + 100},
         }) {
        CAPTURE(row.label);
        place.write(row.before);
        std::filesystem::resize_file(place.path(), row.size);
        test::Outcome const outcome = test::inChild([&] {
            ::alarm(100);
            limitMemory(ENOUGH_MEMORY);
            DataFile file(place.path());
            say("%s, ", openMessage(file, READ).c_str());
            say("%s, ", file.is_open() ? "open" : "closed");
            say("%s, ", file.size() == 1 && file[0].getKey() == L"first" ? "first" : "other");
            say("%s", isFree(file) ? "free" : "locked");
            return 0;
        });
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "std::bad_alloc, open, first, free");
    }
}

TEST_CASE("a key of more characters than a wide string holds ends in std::bad_alloc") {
    // Elsewhere either no file can have such a key, or memory is counted otherwise.
    if (sizeof(std::size_t) > 4 || !MEMORY_CAN_BE_LIMITED) return;
    RecordPlace const place;
    std::uint64_t const size = 2 * (std::uint64_t{std::wstring().max_size()} + 1);
    place.write(lengthField(static_cast<std::uint32_t>(size)));
    std::filesystem::resize_file(place.path(), 4 + size);
    DataFile file(place.path());
    CHECK(openMessage(file, READ) == "std::bad_alloc");
    CHECK(file.is_open());
    CHECK(file.size() == 0UL);
}

TEST_CASE("what could be read of a damaged file is what close writes") {
    RecordPlace const place;
    std::string const good = fileBytes(entry(L"k", "data"));
    std::string const damage = "\4\0\0\0\0k"s;
    place.write(good + damage);
    {
        DataFile file(place.path());
        CHECK(openMessage(file, READ_WRITE) == NOT_READ);
        file.close();
    }
    CHECK(place.content() == good);

    place.write(good + damage);
    {
        DataFile file(place.path());
        CHECK(openMessage(file, READ_WRITE) == NOT_READ);
        file.setMode(READ); // which keeps the file
        file.close();
    }
    CHECK(place.content() == good + damage);

    DataFile file(place.path());
    file.open(WRITE); // which does not read, so it does not mind
    file.close();
    CHECK(place.content() == "");
}

// ------------------------------------------------------------------------------------- positions

namespace {

std::wstring numbered(int i) { return L"key " + std::to_wstring(i); }

/// A file of this many records, keys numbered from 0.
std::string manyBytes(int count) {
    std::string content;
    for (int i = 0; i < count; ++i) content += fileBytes(entry(numbered(i), std::to_string(i)));
    return content;
}

} // namespace

TEST_CASE("positions follow the addresses of the records, whatever was done before") {
    RecordPlace const place;
    for (int const count : {0, 1, 2, 63, 64, 65, 127, 128, 129, 500, 2000}) {
        CAPTURE(count);
        place.write(manyBytes(count));
        DataFile file(place.path());
        file.open(READ_WRITE);
        CHECK(isInOrderOfAddresses(file));
        for (int i = 0; i < count; i += 3) file.remove(record(numbered(i)));
        CHECK(isInOrderOfAddresses(file));
        for (int i = 0; i < count; i += 6) file.insert(record(numbered(i)));
        CHECK(isInOrderOfAddresses(file));
        for (int i = 0; i < 300; ++i) file.insert(record(L"new " + std::to_wstring(i)));
        CHECK(isInOrderOfAddresses(file));
        for (int i = 299; i >= 0; i -= 2) file.remove(record(L"new " + std::to_wstring(i)));
        CHECK(isInOrderOfAddresses(file));
        Entries const entries = held(file);
        file.synchronize();
        CHECK(isInOrderOfAddresses(file));
        checkSameRecords(held(file), entries);
    }
}

TEST_CASE("a record stays where it is until it is removed, whatever happens to others") {
    DataFile file;
    std::vector<Record*> records;
    std::set<Record*> places;
    for (int i = 0; i < 1000; ++i) {
        file.insert(record(numbered(i), std::to_string(i)));
        for (unsigned long at = 0; at < file.size(); ++at) {
            if (places.insert(&file[at]).second) records.push_back(&file[at]);
        }
        REQUIRE(records.size() == static_cast<std::size_t>(i) + 1);
    }
    for (int i = 0; i < 1000; i += 2) file.remove(record(numbered(i)));
    for (int i = 0; i < 500; ++i) file.insert(record(L"other" + std::to_wstring(i)));
    for (int i = 1; i < 1000; i += 2) {
        Record const& kept = *records[static_cast<std::size_t>(i)];
        if (kept.getKey() != numbered(i)) checkKey(kept.getKey(), numbered(i));
        if (kept.getData() != bytes(std::to_string(i))) CHECK(i == -1);
    }
    CHECK(file.size() == 1000UL);
    CHECK(isInOrderOfAddresses(file));
}

TEST_CASE("records are written in the order of their positions") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(WRITE);
    for (int i = 0; i < 300; ++i) file.insert(record(numbered(i), std::to_string(i)));
    for (int i = 0; i < 300; i += 4) file.remove(record(numbered(i)));
    for (int i = 0; i < 300; i += 8) file.insert(record(numbered(i), "again"));
    std::string const expected = fileBytes(held(file));
    file.close();
    bool const same = place.content() == expected;
    CHECK(same);
}

TEST_CASE("a position behind the last is refused") {
    RecordPlace const place;
    DataFile file(place.path());
    for (unsigned long const index : {0UL, 1UL, ULONG_MAX}) {
        CHECK(messageOf<std::out_of_range>([&] { file[index]; }) == NO_RECORD);
    }
    file.open(WRITE);
    CHECK(messageOf<std::out_of_range>([&] { file[0]; }) == NO_RECORD);
    for (unsigned long count = 1; count <= 200; ++count) {
        file.insert(record(numbered(static_cast<int>(count))));
        CHECK(file.size() == count);
        CHECK(messageOf<std::exception>([&] { file[count - 1]; }) == "<nothing>");
        for (unsigned long const index : {count, count + 1, 0xFFFFFFFFUL, ULONG_MAX}) {
            CHECK(messageOf<std::out_of_range>([&] { file[index]; }) == NO_RECORD);
        }
        CHECK(file.size() == count);
    }
    CHECK(isFree(file));
}

// ------------------------------------------------------------------------------- insert and remove

TEST_CASE("a record with an equal key is not inserted, and the one held stays as it is") {
    DataFile file;
    file.insert(record(L"name", "first"));
    for (wchar_t const* const key : {L"name", L"NAME", L"Name", L"nAmE", L" name\n"}) {
        file.insert(record(key, "second"));
        checkSame(held(file), {entry(L"name", "first")});
    }
    file.insert(record(L"name\0else"s, "second")); // equal up to its NUL
    checkSame(held(file), {entry(L"name", "first")});
    for (wchar_t const* const key : {L"na", L"names", L"name.", L"\u00F1ame"}) {
        file.insert(record(key));
    }
    CHECK(file.size() == 5UL);
}

TEST_CASE("keys count up to their first NUL where they are compared, and in full where written") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.insert(record(L"a\0b"s, "first"));
    file.insert(record(L"A", "second"));
    file.insert(record(L"a\0c"s, "third"));
    CHECK(file.size() == 1UL);
    file.synchronize();
    checkSame(held(file), {entry(L"a\0b"s, "first")});
    file.remove(record(L"A\0"s));
    CHECK(file.size() == 0UL);
}

TEST_CASE("insert copies the record as it is") {
    DataFile file;
    {
        Record r(L"key", bytes("data"));
        file.insert(r);
        r.setKey(L"other");
        r.setData({});
    }
    checkSame(held(file), {entry(L"key", "data")});
}

TEST_CASE("a default record can be inserted once, and removed") {
    DataFile file;
    file.insert(Record());
    file.insert(Record());
    CHECK(file.size() == 1UL);
    CHECK(file[0].getKey().empty());
    file.insert(record(L" "));
    CHECK(file.size() == 2UL);
    file.remove(Record());
    CHECK(file.size() == 1UL);
    checkKey(file[0].getKey(), L" ");
}

TEST_CASE("remove removes the first record of an equal key, and nothing without one") {
    RecordPlace const place;
    std::string content;
    for (int i = 0; i < 10; ++i) {
        content += fileBytes(entry(i % 2 == 0 ? L"Name" : L"nAME", std::to_string(i)));
        content += fileBytes(entry(L"other " + std::to_wstring(i), ""));
    }
    place.write(content);
    DataFile file(place.path());
    file.open(READ);
    Entries expected = held(file);
    REQUIRE(expected.size() == 20);
    for (int i = 0; i < 12; ++i) {
        for (auto at = expected.begin(); at != expected.end(); ++at) {
            if (!test::sameKey(at->key, L"name")) continue;
            expected.erase(at);
            break;
        }
        file.remove(record(L"NAME"));
        checkSame(held(file), expected);
    }
    CHECK(file.size() == 10UL);
    file.remove(record(L"nothing"));
    file.remove(Record());
    CHECK(file.size() == 10UL);
}

TEST_CASE("a held record may itself be the argument") {
    DataFile file;
    for (int i = 0; i < 100; ++i) file.insert(record(numbered(i)));
    for (unsigned long i = 0; i < 100; ++i) file.insert(file[i]);
    CHECK(file.size() == 100UL);
    for (unsigned long left = 100; left > 0; --left) {
        std::wstring const key = file[left / 2].getKey();
        file.remove(file[left / 2]);
        REQUIRE(file.size() == left - 1);
        for (Entry const& e : held(file)) CHECK(e.key != key);
    }
}

TEST_CASE("changes through a reference are changes of the record held") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.insert(record(L"key", "data"));
    file[0].setKey(L"  new ");
    file[0].setData(bytes("new data"));
    CHECK(messageOf<std::invalid_argument>([&] { file[0].setKey(L""); }) == NO_KEY);
    file.synchronize();
    checkSame(held(file), {entry(L"new", "new data")});
    file[0] = record(L"assigned", "as a whole");
    file.close();
    CHECK(place.content() == fileBytes(entry(L"assigned", "as a whole")));
}

TEST_CASE("a record is found under the key that it has now") {
    for (int const others : {0, 1, 31, 32, 33, 64, 200}) {
        for (int const position : {0, others / 2, others}) {
            CAPTURE(others);
            CAPTURE(position);
            DataFile file;
            for (int i = 0; i <= others; ++i) file.insert(record(numbered(i)));
            Record& changed = file[static_cast<unsigned long>(position)];
            std::wstring const before = changed.getKey();
            auto const size = static_cast<unsigned long>(others) + 1;

            changed.setKey(L"changed");
            file.insert(record(L"CHANGED"));
            CHECK(file.size() == size);
            file.insert(record(before));
            CHECK(file.size() == size + 1);
            file.remove(record(before));
            CHECK(file.size() == size);
            file.remove(record(before));
            CHECK(file.size() == size);
            checkKey(changed.getKey(), L"changed");
            file.remove(record(L"Changed"));
            CHECK(file.size() == size - 1);
            file.remove(record(L"Changed"));
            CHECK(file.size() == size - 1);
        }
    }
}

TEST_CASE("a key changed long after the reference was given is found all the same") {
    DataFile file;
    for (int i = 0; i < 100; ++i) file.insert(record(numbered(i)));
    Record& kept = file[50];
    std::wstring const before = kept.getKey();
    for (int round = 0; round < 3; ++round) {
        for (int i = 0; i < 100; ++i) {
            if (numbered(i) != before) file.remove(record(numbered(i)));
        }
        for (int i = 1000; i < 3000; ++i) file.insert(record(numbered(i)));
        for (int i = 1000; i < 3000; i += 1 + round) file.remove(record(numbered(i)));
    }
    unsigned long const size = file.size();
    kept.setKey(L"at last");
    file.insert(record(L"AT LAST"));
    CHECK(file.size() == size);
    file.insert(record(before));
    CHECK(file.size() == size + 1);
    kept.setKey(L"once more");
    file.remove(record(L"at last"));
    CHECK(file.size() == size + 1);
    file.remove(record(L"once MORE"));
    CHECK(file.size() == size);
}

TEST_CASE("a key changed through a reference is not compared with others") {
    DataFile file;
    file.insert(record(L"a", "1"));
    file.insert(record(L"b", "2"));
    file[0].setKey(L"same");
    file[1].setKey(L"SAME");
    Entries const entries = held(file);
    CHECK(entries.size() == 2);
    file.remove(record(L"Same"));
    checkSame(held(file), {entries[1]});
}

TEST_CASE("the data held may be large while records come and go") {
    DataFile file;
    for (int i = 0; i < 50; ++i) {
        file.insert(record(numbered(i), std::string(100000, static_cast<char>('0' + i))));
        if (i >= 10) file.remove(record(numbered(i - 10)));
    }
    CHECK(file.size() == 10UL);
    for (Entry const& e : held(file)) CHECK(e.data.size() == 100000U);
}

namespace {

/// A record that gives another key than the one it stores.
class Alias : public Record {
public:
    Alias(std::wstring const& key, std::wstring const& alias) : Record(key, {}), alias_(alias) {}
    std::wstring const& getKey() const override { return alias_; }

private:
    std::wstring alias_;
};

/// A record whose key needs the file, or cannot be had.
class Curious : public Record {
public:
    explicit Curious(DataFile& file) : Record(L"curious", {}), file_(file) {}
    std::wstring const& getKey() const override {
        if (file_.size() == 0) throw std::domain_error("no key");
        return Record::getKey();
    }

private:
    DataFile& file_;
};

} // namespace

TEST_CASE("insert and remove ask the argument for its key, and copy what it stores") {
    DataFile file;
    file.insert(record(L"held"));
    file.insert(Alias(L"held", L"other")); // not equal as "other"
    CHECK(file.size() == 2UL);
    checkKey(file[0].getKey(), L"held");
    checkKey(file[1].getKey(), L"held");
    file.insert(Alias(L"new", L"HELD")); // equal as "held"
    CHECK(file.size() == 2UL);
    file.remove(Alias(L"held", L"other"));
    CHECK(file.size() == 2UL);
    file.remove(Alias(L"other", L"Held"));
    CHECK(file.size() == 1UL);
}

TEST_CASE("an argument's key may come from the file itself or not at all") {
    DataFile file;
    CHECK(messageOf<std::domain_error>([&] { file.remove(Curious(file)); }) == "no key");
    CHECK(messageOf<std::domain_error>([&] { file.insert(Curious(file)); }) == "no key");
    CHECK(isFree(file));
    CHECK(file.size() == 0UL);
    file.insert(record(L"k"));
    file.insert(Curious(file));
    CHECK(file.size() == 2UL);
    file.remove(Curious(file));
    CHECK(file.size() == 1UL);
    CHECK(isFree(file));
}

TEST_CASE("keys are compared under the C locale of the moment") {
    if (std::setlocale(LC_ALL, "C.UTF-8") == nullptr) {
        MESSAGE("there is no C.UTF-8 locale: keys were not compared under it");
        return;
    }
    std::setlocale(LC_ALL, "C");
    DataFile file;
    file.insert(record(L"\u00C9t\u00E9"));
    file.insert(record(L"\u00E9T\u00E9")); // no letters of one case in this locale
    CHECK(file.size() == 2UL);
    file.remove(record(L"\u00E9T\u00C9"));
    CHECK(file.size() == 2UL);
    std::setlocale(LC_ALL, "C.UTF-8");
    file.insert(record(L"\u00C9T\u00C9"));
    CHECK(file.size() == 2UL);
    file.remove(record(L"\u00E9t\u00E9"));
    CHECK(file.size() == 1UL);
    file.insert(record(L"kelvin"));
    file.insert(record(L"\u212AELVIN")); // whose small letter is k
    CHECK(file.size() == 2UL);
    std::setlocale(LC_ALL, "C");
    file.insert(record(L"\u212AELVIN"));
    file.remove(record(L"\u00C9T\u00C9"));
    CHECK(file.size() == 3UL);

    // A thread's own locale counts, too.
    ::locale_t const own = ::newlocale(LC_ALL_MASK, "C.UTF-8", nullptr);
    REQUIRE(own != nullptr);
    ::locale_t const before = ::uselocale(own);
    file.remove(record(L"\u00E9t\u00E9"));
    ::uselocale(before);
    ::freelocale(own);
    CHECK(file.size() == 2UL);
}

TEST_CASE("of many records the equal one is found, and only that") {
    int const count = 20000;
    RecordPlace const place;
    place.write(manyBytes(count));
    DataFile file(place.path());
    file.open(READ);
    CHECK(file.size() == static_cast<unsigned long>(count));
    for (int i = 0; i < count; i += 7) file.insert(record(L"KEY " + std::to_wstring(i)));
    CHECK(file.size() == static_cast<unsigned long>(count));
    for (int i = 0; i < 500; ++i) file.remove(record(L"kEY " + std::to_wstring(i * 37)));
    CHECK(file.size() == static_cast<unsigned long>(count - 500));
    for (int i = 0; i < 500; ++i) file.remove(record(L"kEY " + std::to_wstring(i * 37)));
    for (int i = 0; i < 500; ++i) file.remove(record(L"none " + std::to_wstring(i)));
    CHECK(file.size() == static_cast<unsigned long>(count - 500));
    for (int i = 0; i < 500; ++i) file.insert(record(L"new " + std::to_wstring(i)));
    CHECK(file.size() == static_cast<unsigned long>(count));
}

TEST_CASE("records can be held by a file that is closed, until it is opened or closed") {
    RecordPlace const place;
    place.write(fileBytes(entry(L"stored", "")));
    DataFile file(place.path());
    file.insert(record(L"a"));
    file.insert(record(L"A"));
    file.insert(record(L"b"));
    file.remove(record(L"B"));
    checkSame(held(file), {entry(L"a", "")});
    SUBCASE("opened for reading") {
        file.open(READ_WRITE);
        checkSame(held(file), {entry(L"stored", "")});
        file.close();
        CHECK(place.content() == fileBytes(entry(L"stored", "")));
    }
    SUBCASE("opened for writing alone") {
        file.open(WRITE);
        CHECK(file.size() == 0UL);
    }
    SUBCASE("closed") {
        file.close();
        CHECK(file.size() == 0UL);
        CHECK(place.content() == fileBytes(entry(L"stored", "")));
    }
    SUBCASE("synchronized, which does nothing") {
        file.synchronize();
        checkSame(held(file), {entry(L"a", "")});
        CHECK(!file.is_open());
        CHECK(place.content() == fileBytes(entry(L"stored", "")));
    }
}

// ---------------------------------------------------------------------------------- the life cycle

TEST_CASE("opening a missing file fails for reading and creates it for writing") {
    RecordPlace const place;
    DataFile file(place.path());
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    CHECK(!file.is_open());
    CHECK(!place.exists());
    file.open(READ_WRITE);
    CHECK(file.is_open());
    CHECK(place.content() == "");
    file.close();
    CHECK(place.content() == "");
    std::filesystem::remove(place.path());
    file.open(WRITE);
    CHECK(place.content() == "");
}

TEST_CASE("the mode of an open file includes BINARY and keeps the bits without a meaning") {
    RecordPlace const place;
    DataFile file(place.path());
    for (unsigned long const mode : {WRITE, READ_WRITE, READ, READ_WRITE | 0x40UL, READ | BINARY}) {
        file.open(mode);
        CHECK(file.getMode() == (mode | BINARY));
        file.synchronize();
        CHECK(file.getMode() == (mode | BINARY));
        file.close();
        CHECK(file.getMode() == 0UL);
    }
}

TEST_CASE("a mode without reading and writing is refused") {
    RecordPlace const place;
    place.write("anything");
    DataFile file(place.path());
    for (unsigned long const mode : {0UL, 4UL, 0UL + BINARY}) {
        CHECK(complaint([&] { file.open(mode); }) == NOT_OPENED);
        CHECK(!file.is_open());
        CHECK(file.getMode() == 0UL);
    }
    CHECK(place.content() == "anything");
}

TEST_CASE("an open that fails leaves the records as they were") {
    RecordPlace const place;
    DataFile file(place.path());
    file.insert(record(L"k", "data"));
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    checkSame(held(file), {entry(L"k", "data")});
    CHECK(isFree(file));
    DataFile nameless;
    nameless.insert(record(L"k", "data"));
    CHECK(complaint([&] { nameless.open(READ_WRITE); }) == NOT_OPENED);
    checkSame(held(nameless), {entry(L"k", "data")});
}

TEST_CASE("changes without the write bit vanish at close and the file stays untouched") {
    RecordPlace const place;
    std::string const content = fileBytes(fewEntries());
    place.write(content);
    auto const time = std::filesystem::last_write_time(place.path());
    DataFile file(place.path());
    file.open(READ);
    file.insert(record(L"new"));
    file.remove(record(L"name"));
    file[0].setData(bytes("changed"));
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.size() == 0UL);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    { // and with the destructor
        DataFile other(place.path());
        other.open(READ);
        other.insert(record(L"new"));
    }
    CHECK(place.content() == content);
    CHECK(std::filesystem::last_write_time(place.path()) == time);
}

TEST_CASE("opening for writing alone begins without records and replaces the whole file") {
    RecordPlace const place;
    place.write(fileBytes(fewEntries()));
    DataFile file(place.path());
    file.open(WRITE);
    CHECK(file.size() == 0UL);
    CHECK(place.content() == "");
    file.insert(record(L"k", "data"));
    CHECK(place.content() == "");
    file.close();
    CHECK(place.content() == fileBytes(entry(L"k", "data")));
    CHECK(file.size() == 0UL);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    file.open(WRITE);
    file.close();
    CHECK(place.content() == "");
}

TEST_CASE("a file may be opened and closed again and again") {
    RecordPlace const place;
    DataFile file(place.path());
    for (int i = 0; i < 20; ++i) {
        file.open(READ_WRITE);
        CHECK(file.size() == static_cast<unsigned long>(i));
        file.insert(record(numbered(i)));
        file.close();
    }
    file.open(READ);
    CHECK(file.size() == 20UL);
}

TEST_CASE("closing or destroying an object that was never opened touches no file") {
    RecordPlace const place;
    {
        DataFile file(place.path());
        file.insert(record(L"k"));
        CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
        CHECK(file.size() == 0UL);
        CHECK(file.getMode() == 0UL);
        CHECK(file.fail());
        // The destructor destroys these, which the address sanitizer would tell.
        for (int i = 0; i < 200; ++i) file.insert(record(numbered(i), std::string(1000, 'x')));
    }
    CHECK(!place.exists());
    place.write("old");
    {
        DataFile file(place.path());
        file.insert(record(L"k"));
    }
    CHECK(place.content() == "old");
    { DataFile const nameless; }
    DataFile nameless;
    nameless.insert(record(L"k"));
    nameless.synchronize();
    CHECK(nameless.size() == 1UL);
    CHECK(messageOf<std::exception>([&] { nameless.close(); }) == "<nothing>");
    CHECK(nameless.size() == 0UL);
}

TEST_CASE("closing twice is harmless") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.insert(record(L"k"));
    file.close();
    file.insert(record(L"lost"));
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.getMode() == 0UL);
    CHECK(file.size() == 0UL);
    CHECK(place.content() == fileBytes(entry(L"k", "")));
}

TEST_CASE("the destructor writes a file that is open for writing") {
    RecordPlace const place;
    for (unsigned long const mode : {WRITE, READ_WRITE}) {
        place.write("");
        {
            DataFile file(place.path());
            file.open(mode);
            file.insert(record(L"k", "data"));
        }
        CHECK(place.content() == fileBytes(entry(L"k", "data")));
    }
    { // Not one that was closed, whatever it holds.
        DataFile file(place.path());
        file.open(READ_WRITE);
        file.close();
        file.insert(record(L"lost"));
    }
    CHECK(place.content() == fileBytes(entry(L"k", "data")));
    { // Nor one that is not open, whatever its mode.
        DataFile file(place.path());
        file.setMode(WRITE);
        file.insert(record(L"lost"));
    }
    CHECK(place.content() == fileBytes(entry(L"k", "data")));
    std::unique_ptr<std::fstream> const stream = [&] {
        auto file = std::make_unique<DataFile>(place.path());
        file->open(WRITE);
        file->insert(record(L"by way of the stream"));
        return file;
    }();
    CHECK(place.content() == "");
    const_cast<std::unique_ptr<std::fstream>&>(stream).reset();
    CHECK(place.content() == fileBytes(entry(L"by way of the stream", "")));
}

namespace {

/// A record file whose overrides note the calls.
class Recorder : public DataFile {
public:
    Recorder(std::string const& path, std::vector<std::string>& calls)
        : DataFile(path), calls_(calls) {}
    ~Recorder() override { calls_.push_back("destroyed"); }
    void open(unsigned long mode) override {
        calls_.push_back("open " + std::to_string(mode));
        DataFile::open(mode);
    }
    void close() override {
        calls_.push_back("close");
        DataFile::close();
    }

private:
    std::vector<std::string>& calls_;
};

} // namespace

TEST_CASE("synchronize reaches overrides, and the destructor calls the class's own close") {
    RecordPlace const place;
    std::vector<std::string> calls;
    {
        Recorder file(place.path(), calls);
        static_cast<File&>(file).open(READ_WRITE);
        file.insert(record(L"k"));
        file.synchronize();
    }
    std::vector<std::string> const expected{"open 3", "close", "open 2147483651", "destroyed"};
    CHECK((calls == expected));
    CHECK(place.content() == fileBytes(entry(L"k", "")));
}

TEST_CASE("synchronize writes back and reads again") {
    RecordPlace const place;
    place.write(fileBytes(entry(L"old", "data")));
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.insert(record(L"\u00E9\u0141", "new"));
    file.synchronize();
    CHECK(file.is_open());
    std::wstring const back{static_cast<wchar_t>(0xFFFFFFE9), L'A'};
    checkSameRecords(held(file), {entry(L"old", "data"), entry(back, "new")});
    CHECK(place.content() == fileBytes(held(file)));
}

TEST_CASE("synchronize of a file open for reading drops changes and reads what is there now") {
    RecordPlace const place;
    place.write(fileBytes(entry(L"old", "")));
    DataFile file(place.path());
    file.open(READ);
    file.insert(record(L"mine"));
    test::writeFile(place.path(), fileBytes(entry(L"new", "")));
    file.synchronize();
    checkSame(held(file), {entry(L"new", "")});
    CHECK(place.content() == fileBytes(entry(L"new", "")));
}

TEST_CASE("synchronize of a file open for writing alone leaves no records and an empty file") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(WRITE);
    file.insert(record(L"k"));
    file.synchronize();
    CHECK(file.size() == 0UL);
    CHECK(place.content() == "");
    file.insert(record(L"last"));
    file.close();
    CHECK(place.content() == fileBytes(entry(L"last", "")));
}

TEST_CASE("synchronize of records that cannot be read again keeps those before") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.insert(Record());
    CHECK(messageOf<std::invalid_argument>([&] { file.synchronize(); }) == NO_KEY);
    CHECK(file.is_open());
    CHECK(file.size() == 0UL);
    CHECK(isFree(file));
    CHECK(place.content() == std::string(8, '\0'));
}

TEST_CASE("setMode decides what the next close does") {
    RecordPlace const place;
    std::string const one = fileBytes(entry(L"one", "1"));
    place.write(one);
    DataFile file(place.path());
    SUBCASE("writing allowed later") {
        file.open(READ);
        file[0].setKey(L"two");
        file.setMode(READ_WRITE);
        file.synchronize();
        CHECK(place.content() == fileBytes(entry(L"two", "1")));
        CHECK(file.getMode() == (READ_WRITE | BINARY));
        checkSame(held(file), {entry(L"two", "1")});
    }
    SUBCASE("writing no longer allowed") {
        file.open(READ_WRITE);
        file[0].setKey(L"two");
        file.setMode(READ);
        file.synchronize();
        checkSame(held(file), {entry(L"one", "1")});
        file.close();
        CHECK(place.content() == one);
    }
    SUBCASE("neither") {
        file.open(READ_WRITE);
        file[0].setKey(L"two");
        file.setMode(0);
        CHECK(complaint([&] { file.synchronize(); }) == NOT_OPENED);
        CHECK(!file.is_open());
        CHECK(place.content() == one);
    }
    SUBCASE("writing, without the file ever opened") {
        file.setMode(READ_WRITE);
        file.insert(record(L"two", "2"));
        file.close();
        CHECK(place.content() == fileBytes(entry(L"two", "2")));
        CHECK(file.getMode() == 0UL);
        CHECK(!file.is_open());
    }
}

TEST_CASE("opening an open file reads it again and changes the mode, but not the stream") {
    RecordPlace const place;
    std::string const one = fileBytes(entry(L"one", "1"));
    place.write(one);
    DataFile file(place.path());
    SUBCASE("to read again") {
        file.open(READ_WRITE);
        file.insert(record(L"mine"));
        file.open(READ);
        CHECK(file.getMode() == (READ | BINARY));
        checkSame(held(file), {entry(L"one", "1")});
        file.insert(record(L"mine"));
        file.close();
        CHECK(place.content() == one);
    }
    SUBCASE("to write") {
        file.open(READ);
        file.open(WRITE);
        CHECK(file.size() == 0UL);
        CHECK(place.content() == one); // not emptied: it was not opened again
        file.insert(record(L"two"));
        file.close();
        CHECK(place.content() == fileBytes(entry(L"two", "")));
    }
    SUBCASE("with no mode at all") {
        file.open(READ_WRITE);
        file.open(0);
        CHECK(file.is_open());
        CHECK(file.getMode() == 0UL + BINARY);
        CHECK(file.size() == 0UL);
        file.close();
        CHECK(place.content() == one);
    }
}

TEST_CASE("open and close clear what went wrong with the stream before") {
    RecordPlace const place;
    DataFile file(place.path());
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    CHECK(file.fail());
    file.open(WRITE);
    file.insert(record(L"k"));
    file.setstate(std::ios::failbit | std::ios::badbit);
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(place.content() == fileBytes(entry(L"k", "")));
    file.setstate(std::ios::failbit | std::ios::badbit);
    file.open(READ);
    CHECK(!file.fail());
    checkSame(held(file), {entry(L"k", "")});
}

TEST_CASE("the stream can be used while the file is open") {
    RecordPlace const place;
    std::string const one = fileBytes(entry(L"one", "1"));
    place.write(one);
    DataFile file(place.path());
    file.open(READ);
    file.clear();
    CHECK(file.tellg() == std::streampos(static_cast<std::streamoff>(one.size())));
    file.seekg(0);
    std::string content(one.size(), ' ');
    CHECK(bool(file.read(&content[0], static_cast<std::streamsize>(content.size()))));
    CHECK(content == one);
    file.seekg(3);
    file.open(READ); // begins at the start again
    checkSame(held(file), {entry(L"one", "1")});
}

TEST_CASE("close deletes the old file and writes another in its place") {
    RecordPlace const place;
    std::string const other = place.directory() / "other";
    std::string const before = fileBytes(entry(L"old", "data"));
    std::string const after = fileBytes(entry(L"new", ""));
    mode_t const mask = ::umask(022);
    auto const replace = [&](std::function<void()> const& meanwhile) {
        DataFile file(place.path());
        file.open(READ_WRITE);
        CHECK(file.size() == 1UL);
        file.remove(record(L"old"));
        file.insert(record(L"new"));
        meanwhile();
        file.close();
        CHECK(place.content() == after);
    };
    SUBCASE("another name of the old file keeps the old content") {
        place.write(before);
        std::filesystem::create_hard_link(place.path(), other);
        replace([] {});
        CHECK(test::readFile(other) == before);
    }
    SUBCASE("a link is replaced, not what it leads to") {
        test::writeFile(other, before);
        std::filesystem::create_symlink(other, place.path());
        replace([] {});
        CHECK(!std::filesystem::is_symlink(place.path()));
        CHECK(test::readFile(other) == before);
    }
    SUBCASE("the new file has a new file's permissions") {
        place.write(before);
        CHECK(::chmod(place.path().c_str(), 0600) == 0);
        replace([] {});
        struct stat status = {};
        CHECK(::stat(place.path().c_str(), &status) == 0);
        CHECK((status.st_mode & 0777U) == 0644U);
    }
    SUBCASE("a file that was deleted meanwhile comes back") {
        place.write(before);
        replace([&] { std::filesystem::remove(place.path()); });
    }
    SUBCASE("what another wrote meanwhile is lost") {
        place.write(before);
        replace([&] { place.write(std::string(10000, 'x')); });
    }
    ::umask(mask);
}

// ------------------------------------------------------------------------------------ the failures

TEST_CASE("a close that cannot open the file again keeps the records and leaves the file closed") {
    RecordPlace const place;
    std::string const folder = place.directory() / "folder";
    std::string const path = folder + "/records.dat";
    std::filesystem::create_directory(folder);
    DataFile file(path);
    file.open(READ_WRITE);
    file.insert(record(L"a", "1"));
    file.insert(record(L"b", "2"));
    Entries const entries = held(file);
    bool synchronize = false;
    SUBCASE("its directory is gone") { std::filesystem::remove_all(folder); }
    SUBCASE("its directory is gone, synchronizing") {
        std::filesystem::remove_all(folder);
        synchronize = true;
    }
    SUBCASE("a directory with content is in its place") {
        std::filesystem::remove(path);
        std::filesystem::create_directories(path + "/content");
    }
    CHECK(complaint([&] { synchronize ? file.synchronize() : file.close(); }) == NOT_OPENED);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    checkSame(held(file), entries);
    CHECK(isFree(file));
}

TEST_CASE("a destructor that cannot open the file again keeps the exception inside") {
    test::Outcome const outcome = test::inChild([] {
        test::TempDir const directory;
        std::string const folder = directory / "folder";
        std::filesystem::create_directory(folder);
        {
            DataFile file(folder + "/records.dat");
            file.open(WRITE);
            file.insert(record(L"k"));
            std::filesystem::remove_all(folder);
        }
        return 42;
    });
    CHECK(outcome.exitCode == 42);
    CHECK(outcome.out == "");
}

TEST_CASE("a directory cannot be read and cannot be opened for writing") {
    test::TempDir const directory;
    std::string const path = directory / "folder";
    std::filesystem::create_directory(path);
    DataFile file(path);
    CHECK(complaint([&] { file.open(READ); }) == NOT_READ);
    CHECK(file.is_open());
    CHECK(file.getMode() == (READ | BINARY));
    CHECK(file.size() == 0UL);
    file.close();
    file.clear();
    CHECK(complaint([&] { file.open(READ_WRITE); }) == NOT_OPENED);
    CHECK(complaint([&] { file.open(WRITE); }) == NOT_OPENED);
    CHECK(std::filesystem::is_directory(path));
}

TEST_CASE("a read that fails midway is not the end of the file") {
    RecordPlace const place;
    int const count = 4000;
    place.write(manyBytes(count));
    int failures = 0;
    std::size_t most = 0;
    for (;; ++failures) {
        CAPTURE(failures);
        DataFile file(place.path());
        readsBeforeFailure = failures;
        std::string const message = complaint([&] { file.open(READ); });
        readsBeforeFailure = -1;
        if (message == "<nothing>") break;
        CHECK(message == NOT_READ);
        CHECK(file.is_open());
        CHECK(file.getMode() == (READ | BINARY));
        CHECK(isFree(file));
        // What was read so far is held: the first ones.
        Entries const entries = held(file);
        CHECK(entries.size() <= static_cast<std::size_t>(count));
        std::set<std::wstring> keys;
        for (Entry const& e : entries) keys.insert(e.key);
        for (std::size_t i = 0; i < entries.size(); ++i) {
            if (keys.count(numbered(static_cast<int>(i))) == 0) CHECK(i == entries.size());
        }
        most = std::max(most, entries.size());
    }
    CHECK(failures > 1);
    CHECK(most > 0);
    DataFile file(place.path());
    file.open(READ);
    CHECK(file.size() == static_cast<unsigned long>(count));
}

TEST_CASE("reads and writes that transfer little at a time make no difference") {
    RecordPlace const place;
    for (std::size_t const limit : {1UL, 7UL, 1000UL}) {
        CAPTURE(limit);
        transferLimit = limit;
        DataFile file(place.path());
        file.open(WRITE);
        for (int i = 0; i < 200; ++i) file.insert(record(numbered(i), std::string(50, 'd')));
        Entries const entries = held(file);
        file.close();
        file.open(READ);
        Entries const back = held(file);
        transferLimit = 0;
        CHECK(place.content() == fileBytes(entries));
        checkSameRecords(back, entries);
    }
}

namespace {

/// What a caller sees of a file with one record.
std::string stateOf(DataFile& file) {
    std::string data = "none";
    if (file.size() == 1) data = std::to_string(file[0].getData().size());
    return std::string(file.is_open() ? "open" : "closed") + ", mode " +
           std::to_string(file.getMode()) + ", data of " + data;
}

} // namespace

TEST_CASE("a write that fails leaves the records, the file open and the mode unchanged") {
    RecordPlace const place;
    for (std::size_t const size : {1UL, 100UL, 5000UL, 300000UL}) {
        for (bool const synchronize : {false, true}) {
            for (unsigned long const mode : {WRITE, READ_WRITE}) {
                CAPTURE(size);
                CAPTURE(synchronize);
                CAPTURE(mode);
                std::string const complete = fileBytes(entry(L"k", std::string(size, 'x')));
                std::string const open = "open, mode " + std::to_string(mode | BINARY) +
                                         ", data of " + std::to_string(size);
                place.write("");
                DataFile file(place.path());
                int failures = 0;
                for (;; ++failures) {
                    CAPTURE(failures);
                    if (!file.is_open()) {
                        file.open(mode);
                        file.insert(record(L"k", std::string(size, 'x')));
                    }
                    failedCalls = 0;
                    writesBeforeFailure = failures;
                    std::string const message =
                        complaint([&] { synchronize ? file.synchronize() : file.close(); });
                    writesBeforeFailure = -1;
                    if (failedCalls == 0) {
                        CHECK(message == "<nothing>");
                        break;
                    }
                    CHECK(message == NOT_WRITTEN);
                    CHECK(stateOf(file) == open);
                    CHECK(isFree(file));
                    std::string const left = place.content();
                    CHECK(complete.compare(0, left.size(), left) == 0);
                }
                CHECK(failures > 0);
                if (!synchronize) CHECK(place.content() == complete);
                if (synchronize && mode == READ_WRITE) CHECK(stateOf(file) == open);
            }
        }
    }
}

TEST_CASE("after a write that failed the next close writes everything") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(READ_WRITE);
    for (int i = 0; i < 1000; ++i) file.insert(record(numbered(i), std::string(30, 'd')));
    Entries const entries = held(file);
    transferLimit = 10000;
    writesBeforeFailure = 1; // after the first 10000 bytes
    std::string const message = complaint([&] { file.close(); });
    writesBeforeFailure = -1;
    transferLimit = 0;
    CHECK(message == NOT_WRITTEN);
    checkSame(held(file), entries);
    file.close();
    bool const same = place.content() == fileBytes(entries);
    CHECK(same);
}

namespace {

/// Limits the size of files that this process writes. Only for child processes.
void limitFileSize(rlim_t limitInBytes) {
    ::signal(SIGXFSZ, SIG_IGN);
    rlimit limit = {};
    ::getrlimit(RLIMIT_FSIZE, &limit);
    limit.rlim_cur = limitInBytes;
    ::setrlimit(RLIMIT_FSIZE, &limit);
}

} // namespace

TEST_CASE("a file-size limit is a failure to write") {
    RecordPlace const place;
    for (std::size_t const size : {1UL, 100UL, 200000UL}) {
        for (rlim_t const limit : {rlim_t(0), rlim_t(1), rlim_t(5)}) {
            CAPTURE(size);
            CAPTURE(limit);
            std::string const complete = fileBytes(entry(L"k", std::string(size, 'x')));
            test::Outcome const outcome = test::inChild([&] {
                DataFile file(place.path());
                file.open(READ_WRITE);
                file.remove(record(L"k")); // from the round before
                file.insert(record(L"k", std::string(size, 'x')));
                limitFileSize(limit);
                say("%s; ", complaint([&] { file.close(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                std::string const left = place.content();
                say("%s; ", complete.compare(0, left.size(), left) == 0 ? "prefix" : "other");
                say("%s; ", complaint([&] { file.synchronize(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                limitFileSize(RLIM_INFINITY);
                say("%s; ", complaint([&] { file.synchronize(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                say("%s", place.content() == complete ? "complete" : "incomplete");
                return 0;
            });
            CHECK(outcome.exitCode == 0);
            std::string const state =
                "open, mode 2147483651, data of " + std::to_string(size) + "; ";
            CHECK(outcome.out == "failed to write to file; " + state + "prefix; " +
                                     "failed to write to file; " + state + "<nothing>; " + state +
                                     "complete");
        }
    }
}

TEST_CASE("a destructor that cannot write does not end the process") {
    RecordPlace const place;
    for (std::size_t const size : {1UL, 200000UL}) {
        test::Outcome const outcome = test::inChild([&] {
            limitFileSize(2);
            {
                DataFile file(place.path());
                file.open(WRITE);
                file.insert(record(L"k", std::string(size, 'x')));
            }
            DataFile file(place.path());
            file.open(WRITE);
            file.insert(record(L"k", std::string(size, 'x')));
            if (complaint([&] { file.close(); }) != NOT_WRITTEN) return 1;
            return 42;
        });
        CHECK(outcome.exitCode == 42);
        CHECK(outcome.out == "");
    }
}

namespace {

int const CANNOT_MOUNT = 77;

/// A mount for the time of a scope, in a name space of this process's own where that can be had.
/// Only for child processes, and only onto something in a test's own directory.
class Mount {
public:
    Mount(char const* source, std::string const& target, char const* type, unsigned long flags,
          char const* options)
        : target_(target) {
        if (::unshare(CLONE_NEWNS) == 0) {
            static_cast<void>(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr));
        }
        mounted_ = ::mount(source, target.c_str(), type, flags, options) == 0;
    }
    Mount(Mount const&) = delete;
    Mount& operator=(Mount const&) = delete;
    ~Mount() {
        if (mounted_) ::umount2(target_.c_str(), MNT_DETACH);
    }
    bool done() const { return mounted_; }

private:
    std::string target_;
    bool mounted_;
};

} // namespace

TEST_CASE("a full disk is a failure to write") {
    RecordPlace const place;
    std::string const small = place.directory() / "small";
    std::filesystem::create_directory(small);
    test::Outcome const outcome = test::inChild([&] {
        Mount const disk("none", small, "tmpfs", 0, "size=64k");
        if (!disk.done()) return CANNOT_MOUNT;
        DataFile file(small + "/records.dat");
        file.open(READ_WRITE);
        file.insert(record(L"k", std::string(100000, 'x')));
        say("%s; ", complaint([&] { file.close(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        say("%s; ", complaint([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        file[0].setData(bytes("short"));
        say("%s; ", complaint([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        file[0].setData(Bytes(100000, 'x'));
        return 0; // the destructor meets the full disk once more
    });
    if (outcome.exitCode == CANNOT_MOUNT) {
        MESSAGE("no file system can be mounted here: the full disk was not tested");
        return;
    }
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "failed to write to file; open, mode 2147483651, data of 100000; "
                         "failed to write to file; open, mode 2147483651, data of 100000; "
                         "<nothing>; open, mode 2147483651, data of 5; ");
}

namespace {

/// Gives the file's one record new data, or removes it, and closes. For a child process: nothing is
/// written to the terminal.
std::string replaceData(std::string const& path, char const* data) {
    return complaint([&] {
        DataFile file(path);
        file.open(READ_WRITE);
        file.remove(record(L"k"));
        if (data != nullptr) file.insert(record(L"k", data));
        file.close();
    });
}

std::string bytesWith(char const* data) {
    return data == nullptr ? "" : fileBytes(entry(L"k", data));
}

/// New data in place of "old data": shorter, equally long, longer, none.
char const* const replacements[] = {"x", "new data", "a rather long text of new data", nullptr};

} // namespace

TEST_CASE("a file that can be written but not deleted keeps no old tail: another file system") {
    RecordPlace const place;
    for (char const* const data : replacements) {
        CAPTURE(bytesWith(data));
        place.write(bytesWith("old data"));
        test::Outcome const outcome = test::inChild([&] {
            Mount const itself(place.path().c_str(), place.path(), nullptr, MS_BIND, nullptr);
            if (!itself.done()) return CANNOT_MOUNT;
            say("%s", replaceData(place.path(), data).c_str());
            return 0;
        });
        if (outcome.exitCode == CANNOT_MOUNT) {
            MESSAGE("nothing can be mounted here: the undeletable file was not tested this way");
            return;
        }
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "<nothing>");
        CHECK(place.content() == bytesWith(data));
    }
}

TEST_CASE("a file that can be written but not deleted keeps no old tail: a read-only directory") {
    RecordPlace const place;
    for (char const* const data : replacements) {
        CAPTURE(bytesWith(data));
        place.write(bytesWith("old data"));
        REQUIRE(::chmod(place.path().c_str(), 0666) == 0);
        REQUIRE(::chmod(place.directory().path().c_str(), 0555) == 0);
        test::Outcome const outcome = test::inChild([&] {
            // The administrator may delete everything, so become somebody else.
            unsigned const nobody = 65534;
            if (::geteuid() == 0 &&
                (::setgroups(0, nullptr) != 0 || ::setgid(nobody) != 0 || ::setuid(nobody) != 0)) {
                return 1;
            }
            say("%s", replaceData(place.path(), data).c_str());
            return 0;
        });
        REQUIRE(::chmod(place.directory().path().c_str(), 0700) == 0);
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "<nothing>");
        CHECK(place.content() == bytesWith(data));
    }
}

TEST_CASE("a pipe is read to its end") {
    test::TempDir const directory;
    std::string const path = directory / "pipe";
    REQUIRE(::mkfifo(path.c_str(), 0600) == 0);
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        std::thread writer(
            [&] { test::writeFile(path, manyBytes(5000) + fileBytes(entry(L"last", "data"))); });
        DataFile file(path);
        file.open(READ);
        writer.join();
        say("%lu ", file.size());
        file.remove(record(L"LAST"));
        file.remove(record(L"KEY 4999"));
        say("%lu", file.size());
        file.close();
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "5001 4999");
    CHECK(std::filesystem::is_fifo(path));
}

// ------------------------------------------------------------------------------- lock and threads

namespace {

struct Action {
    std::string label;
    std::function<void(DataFile&)> run;
};

/// Every operation that takes the lock, on a file whose path can be opened.
std::vector<Action> allOperations() {
    return {
        {"open", [](DataFile& f) { f.open(READ_WRITE); }},
        {"close", [](DataFile& f) { f.close(); }},
        {"synchronize", [](DataFile& f) { f.synchronize(); }},
        {"size", [](DataFile& f) { static_cast<void>(f.size()); }},
        {"operator[]", [](DataFile& f) { static_cast<void>(f[0]); }},
        {"insert", [](DataFile& f) { f.insert(record(L"new")); }},
        {"insert of an equal key", [](DataFile& f) { f.insert(record(L"K")); }},
        {"remove", [](DataFile& f) { f.remove(record(L"K")); }},
        {"remove of nothing", [](DataFile& f) { f.remove(record(L"none")); }},
    };
}

struct OpenFile {
    RecordPlace place;
    std::unique_ptr<DataFile> file;
    OpenFile() {
        place.write(fileBytes(entry(L"k", "data")));
        file = std::make_unique<DataFile>(place.path());
        file->open(READ_WRITE);
    }
};

} // namespace

TEST_CASE("every operation leaves the lock free") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        OpenFile const open;
        action.run(*open.file);
        CHECK(isFree(*open.file));
    }
}

TEST_CASE("every exception leaves the lock free") {
    OpenFile const open;
    DataFile& file = *open.file;
    CHECK(messageOf<std::out_of_range>([&] { file[1]; }) == NO_RECORD);
    CHECK(isFree(file));
    writesBeforeFailure = 0;
    std::string message = complaint([&] { file.synchronize(); });
    writesBeforeFailure = -1;
    CHECK(message == NOT_WRITTEN);
    CHECK(isFree(file));
    readsBeforeFailure = 0;
    message = complaint([&] { file.synchronize(); });
    readsBeforeFailure = -1;
    CHECK(message == NOT_READ);
    CHECK(isFree(file));
    file.setMode(0);
    CHECK(complaint([&] { file.synchronize(); }) == NOT_OPENED);
    CHECK(isFree(file));
}

TEST_CASE("stream exceptions that a caller enabled leave the lock free") {
    OpenFile const open;
    DataFile& file = *open.file;
    file.clear();
    file.exceptions(std::ios::badbit | std::ios::failbit | std::ios::eofbit);
    try {
        file.synchronize();
    } catch (std::ios::failure const&) {
    }
    CHECK(isFree(file));
    file.exceptions(std::ios::goodbit);
    file.clear();
    file.exceptions(std::ios::badbit | std::ios::failbit);
    writesBeforeFailure = 0;
    std::string const message = messageOf<std::runtime_error>([&] { file.close(); });
    writesBeforeFailure = -1;
    CHECK(message != "<nothing>");
    CHECK(isFree(file));
    file.exceptions(std::ios::goodbit);
}

TEST_CASE("every operation waits while another thread holds the lock") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        OpenFile const open;
        CHECK(open.file->lock());
        std::atomic<bool> done{false};
        std::thread other([&] {
            action.run(*open.file);
            done = true;
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        CHECK(!done);
        CHECK(open.file->unlock());
        other.join();
        CHECK(done);
    }
}

TEST_CASE("every operation works for the thread that holds the lock") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        OpenFile const open;
        CHECK(open.file->lock());
        CHECK(messageOf<std::exception>([&] { action.run(*open.file); }) == "<nothing>");
        CHECK(open.file->unlock());
        CHECK(isFree(*open.file));
    }
}

TEST_CASE("the destructor waits while another thread holds the lock") {
    RecordPlace const place;
    auto* const file = new DataFile(place.path());
    file->open(WRITE);
    file->insert(record(L"k"));
    CHECK(file->lock());
    std::atomic<bool> done{false};
    std::thread other([&] {
        delete file;
        done = true;
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    CHECK(!done);
    CHECK(place.content() == "");
    file->unlock();
    other.join();
    CHECK(place.content() == fileBytes(entry(L"k", "")));
}

TEST_CASE("records of several threads are not lost while others synchronize") {
    RecordPlace const place;
    DataFile file(place.path());
    file.open(READ_WRITE);
    int const count = 60;
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t) {
        threads.emplace_back([&file, t] {
            for (int i = 0; i < count; ++i) {
                std::wstring const key = std::to_wstring(t) + L"." + std::to_wstring(i);
                file.insert(record(key, "data"));
                file.insert(record(L"removed " + key));
                file.insert(record(L"everybody's " + std::to_wstring(i)));
                file.remove(record(L"removed " + key));
            }
        });
    }
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) file.synchronize();
    });
    threads.emplace_back([&file] {
        unsigned long most = 0;
        for (int i = 0; i < 50; ++i) most = std::max(most, file.size());
        static_cast<void>(most);
    });
    for (std::thread& thread : threads) thread.join();
    file.synchronize();
    Entries expected;
    for (int i = 0; i < count; ++i) {
        for (int t = 0; t < 3; ++t) {
            expected.push_back(entry(std::to_wstring(t) + L"." + std::to_wstring(i), "data"));
        }
        expected.push_back(entry(L"everybody's " + std::to_wstring(i), ""));
    }
    checkSameRecords(held(file), expected);
}

namespace {

std::atomic<bool> survived{false};

/// Destroys a file with a cancellation of this thread pending.
void* destroyWhileCancelled(void* file) {
    ::pthread_cancel(::pthread_self());
    delete static_cast<DataFile*>(file);
    survived = true;
    ::pthread_testcancel();
    return nullptr;
}

} // namespace

TEST_CASE("the destructor completes its work in a thread that is being cancelled") {
    RecordPlace const place;
    std::string const data(300000, 'n');
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        auto* const file = new DataFile(place.path());
        file->open(READ_WRITE);
        file->insert(record(L"k", data));
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, destroyWhileCancelled, file) != 0) return 1;
        void* result = nullptr;
        ::pthread_join(thread, &result);
        say("%s, ", survived ? "survived" : "interrupted");
        say("%s", result == PTHREAD_CANCELED ? "cancelled after it" : "not cancelled");
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "survived, cancelled after it");
    bool const same = place.content() == fileBytes(entry(L"k", data));
    CHECK(same);
}
