// The sectioned settings file: its format, its operations, its life cycle, its failures and its
// lock. initializationfile_model_test.cpp compares it with a plain model over many tables;
// writeback_memory_test.cpp lets memory run out.
#include <doctest/doctest.h>

#include <fcntl.h>
#include <grp.h>
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
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include <koru/initializationfile.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::File;
using Koru::InitializationFile;
using test::checkSame;
using test::drain;
using test::loaded;
using test::messageOf;
using test::READ;
using test::READ_WRITE;
using test::Settings;
using test::SettingsPlace;
using test::WRITE;
using test::written;
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

struct Row {
    std::string label;
    std::string bytes;
    Settings expected;
};

void checkRows(std::vector<Row> const& rows) {
    SettingsPlace const place;
    for (Row const& row : rows) {
        CAPTURE(row.label);
        checkSame(loaded(place, row.bytes), row.expected);
    }
}

std::vector<std::wstring> names(std::initializer_list<wchar_t const*> list) {
    return {list.begin(), list.end()};
}

/// A report that a child process writes for its parent.
#define SAY_FORMAT __attribute__((format(printf, 1, 2)))
SAY_FORMAT void say(char const* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    std::vprintf(format, arguments);
    va_end(arguments);
}

} // namespace

// ---------------------------------------------------------------------------------------- the type

TEST_CASE("an initialization file is a file, a stream and not copyable") {
    static_assert(std::is_base_of<File, InitializationFile>::value, "");
    static_assert(std::is_convertible<InitializationFile*, std::fstream*>::value, "");
    static_assert(!std::is_copy_constructible<InitializationFile>::value, "");
    static_assert(!std::is_copy_assignable<InitializationFile>::value, "");
    static_assert(std::has_virtual_destructor<InitializationFile>::value, "");
    static_assert(std::is_nothrow_destructible<InitializationFile>::value, "");
    unsigned long const length = InitializationFile::MAX_LINE_LENGTH;
    CHECK(length == 4294967295UL);
}

namespace {

/// The place of a virtual operation in the table of its class. A pointer to a virtual member is
/// one more than the operation's distance from the table's start (Itanium C++ ABI).
template <class Member>
std::size_t slotOf(Member member) {
    static_assert(sizeof(Member) == 2 * sizeof(std::size_t), "");
    std::size_t words[2];
    std::memcpy(words, &member, sizeof words);
    CHECK(words[0] % 2 == 1);
    CHECK(words[1] == 0);
    return (words[0] - 1) / sizeof(void*);
}

} // namespace

TEST_CASE("the virtual operations keep their order behind the two entries of the destructor") {
    CHECK(slotOf(&InitializationFile::open) == 2);
    CHECK(slotOf(&InitializationFile::close) == 3);
    CHECK(slotOf(&InitializationFile::synchronize) == 4);
    CHECK(slotOf(&InitializationFile::getMode) == 5);
    CHECK(slotOf(&InitializationFile::setMode) == 6);
    CHECK(slotOf(&InitializationFile::enumerateSections) == 7);
    CHECK(slotOf(&InitializationFile::createSection) == 8);
    CHECK(slotOf(&InitializationFile::removeSection) == 9);
    CHECK(slotOf(&InitializationFile::enumerateKeys) == 10);
    CHECK(slotOf(&InitializationFile::createKey) == 11);
    CHECK(slotOf(&InitializationFile::removeKey) == 12);
    CHECK(slotOf(&InitializationFile::getValue) == 13);
    CHECK(slotOf(&InitializationFile::setValue) == 14);
}

TEST_CASE("a new object is closed, has mode 0, an empty table and the path's name") {
    InitializationFile nameless;
    CHECK(!nameless.is_open());
    CHECK(nameless.getMode() == 0UL);
    CHECK(nameless.getName().empty());
    CHECK(nameless.enumerateSections().empty());

    SettingsPlace const place;
    Koru::File::Path const path(place.path());
    InitializationFile file(path);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    checkSame(file.getName(), static_cast<std::wstring>(path));
    CHECK(file.enumerateSections().empty());
    CHECK(!place.exists());
}

// -------------------------------------------------------------------------------------- the format

TEST_CASE("lines become entries as the format says") {
    checkRows({
        {"nothing", "", {}},
        {"one line feed", "\n", {}},
        {"line feeds", "\n\n\n\n", {}},
        {"a header alone", "[s]\n", {}},
        {"a header without line feed", "[s]", {}},
        {"an entry", "[s]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"the last line without line feed", "[s]\nk=v", {{L"s", L"k", L"v"}}},
        {"blank lines between", "\n\n[s]\n\n\nk=v\n\n\n", {{L"s", L"k", L"v"}}},
        {"before the first header", "a=1\nb=2\n[s]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"no header at all", "a=1\nb=2\n", {}},
        {"trimmed", "[s]\n  key=value\t\n", {{L"s", L"key", L"value"}}},
        {"trimmed of many", "[s]\n \t \tkey=value\t \t  \n", {{L"s", L"key", L"value"}}},
        {"trimmed without line feed", "[s]\n \tk=v \t", {{L"s", L"k", L"v"}}},
        {"not trimmed at the equals", "[s]\nkey = value\n", {{L"s", L"key ", L" value"}}},
        {"tabs at the equals", "[s]\nk\t=\tv\n", {{L"s", L"k\t", L"\tv"}}},
        {"an empty value", "[s]\nk=\n", {{L"s", L"k", L""}}},
        {"a value of blanks", "[s]\nk=  \t\n", {{L"s", L"k", L""}}},
        {"the first equals counts", "[s]\nk=a=b==\n", {{L"s", L"k", L"a=b=="}}},
        {"two equals", "[s]\nk==\n", {{L"s", L"k", L"="}}},
        {"an empty key", "[s]\n=5\n", {}},
        {"an empty key after trimming", "[s]\n  =5\n", {}},
        {"only an equals", "[s]\n=\n", {}},
        {"a key of inner blanks cannot be", "[s]\n \t = 5\n", {}},
        {"no equals", "[s]\nword\nk=v\nmore words\n", {{L"s", L"k", L"v"}}},
        {"a line of blanks", "[s]\n  \n\t\t\n \t \nk=v\n", {{L"s", L"k", L"v"}}},
        {"brackets after the start",
         "[s]\nk[0]=v]\n]=w\n",
         {{L"s", L"]", L"w"}, {L"s", L"k[0]", L"v]"}}},
        {"inner blanks stay", "[s]\na  b\t=c  d\n", {{L"s", L"a  b\t", L"c  d"}}},
        {"quotes are text", "[s]\n\"k\"='v'\n", {{L"s", L"\"k\"", L"'v'"}}},
        {"backslashes are text", "[s]\nk=a\\\nb=c\n", {{L"s", L"b", L"c"}, {L"s", L"k", L"a\\"}}},
        {"other white space is text", "[s]\n\v\f k=v \v\f\n", {{L"s", L"\v\f k", L"v \v\f"}}},
        {"other white space before a bracket", "[s]\n\v[t]\nk=v\n", {{L"s", L"k", L"v"}}},
    });
}

TEST_CASE("a line that begins with # or ; is a comment") {
    checkRows({
        {"both", "[s]\n#a=1\n;b=2\nk=v\n", {{L"s", L"k", L"v"}}},
        {"indented", "[s]\n  #a=1\n\t;b=2\n \t ;\nk=v\n", {{L"s", L"k", L"v"}}},
        {"a header in a comment", "[s]\n#[t]\n;[u]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"before the first header", "# a\n; b\n[s]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"behind the start", "[s]\nk#a=v ; w # x\n", {{L"s", L"k#a", L"v ; w # x"}}},
        {"as first byte of a value",
         "[s]\nk=#v\nl=;w\n",
         {{L"s", L"k", L"#v"}, {L"s", L"l", L";w"}}},
        {"bare", "[s]\n#\n;\n##\n;;\nk=v\n", {{L"s", L"k", L"v"}}},
        {"without line feed", "[s]\nk=v\n#a=1", {{L"s", L"k", L"v"}}},
        {"other signs are none", "[s]\n//a=1\n!b=2\n", {{L"s", L"!b", L"2"}, {L"s", L"//a", L"1"}}},
    });
}

TEST_CASE("a header names the section by what is left without the brackets at both ends") {
    struct Header {
        std::string line;
        wchar_t const* section;
    };
    Header const headers[] = {
        {"[Main]", L"Main"},
        {"[[Main]]", L"Main"},
        {"[[[Main]", L"Main"},
        {"[Main]]]", L"Main"},
        {"[Main", L"Main"},
        {"[[Main", L"Main"},
        {"  [Main]\t ", L"Main"},
        {"\t[Main ", L"Main"},
        {"[ Main ]", L" Main "},
        {"[ Main", L" Main"},
        {"[\tMain\t]", L"\tMain\t"},
        {"[a] x", L"a] x"},
        {"[a]x]", L"a]x"},
        {"[a]]x", L"a]]x"},
        {"[a[b]c]", L"a[b]c"},
        {"[a]; comment", L"a]; comment"},
        {"[a] # comment", L"a] # comment"},
        {"[a]=b", L"a]=b"},
        {"[a=b]", L"a=b"},
        {"[=]", L"="},
        {"[#]", L"#"},
        {"[;a]", L";a"},
        {"[ ]", L" "},
        {"[]", L"["},
        {"[", L"["},
        {"[[", L"[["},
        {"[]]", L"["},
        {"[[]", L"[["},
        {"[[]]", L"[["},
        {"[[[]]]", L"[[["},
        {"[] ]", L"] "},
        {"[] x", L"] x"},
        {"[]a", L"]a"},
        {"[][", L"]["},
        {"[][]", L"]["},
        {"[[a]b]]", L"a]b"},
    };
    SettingsPlace const place;
    for (Header const& header : headers) {
        CAPTURE(header.line);
        checkSame(loaded(place, "[before]\n" + header.line + "\nk=v\n"),
                  {{header.section, L"k", L"v"}});
        checkSame(loaded(place, header.line + "\nk=v"), {{header.section, L"k", L"v"}});
        checkSame(loaded(place, "[s]\nk=v\n" + header.line), {{L"s", L"k", L"v"}});
    }
}

TEST_CASE("a carriage return is ordinary text") {
    checkRows({
        {"at the end of lines",
         "[Main]\r\nk=v\r\nl=\r\n",
         {{L"Main]\r", L"k", L"v\r"}, {L"Main]\r", L"l", L"\r"}}},
        {"blank lines", "[s]\n\r\n\r\nk=v\n", {{L"s", L"k", L"v"}}},
        {"ends no line", "[s]\nk=v\rl=w\n", {{L"s", L"k", L"v\rl=w"}}},
        {"keeps what is before it", "[s]\nk=v \t\r\n", {{L"s", L"k", L"v \t\r"}}},
        {"before a header", "[s]\n\r[t]\nk=v\n", {{L"s", L"k", L"v"}}},
        {"before a comment", "[s]\n\r#a=1\n", {{L"s", L"\r#a", L"1"}}},
        {"as a key", "[s]\n\r=1\r\n", {{L"s", L"\r", L"1\r"}}},
        {"a header of brackets", "[]\r\nk=v\r\n", {{L"]\r", L"k", L"v\r"}}},
        {"alone at the end", "[s]\nk=v\n\r", {{L"s", L"k", L"v"}}},
    });
}

TEST_CASE("section, key and value each end at their first NUL, and lines do not") {
    checkRows({
        {"in a value", "[s]\nk=a\0b\n"s, {{L"s", L"k", L"a"}}},
        {"in a key", "[s]\na\0b=c\n"s, {{L"s", L"a", L"c"}}},
        {"in a section", "[a\0b]\nk=v\n"s, {{L"a", L"k", L"v"}}},
        {"in all of them", "[a\0b]\nc\0d=e\0f\n"s, {{L"a", L"c", L"e"}}},
        {"before the equals", "[s]\nk\0=v\n"s, {{L"s", L"k", L"v"}}},
        {"behind the equals", "[s]\nk=\0v\n"s, {{L"s", L"k", L""}}},
        {"a key of none", "[s]\n\0k=v\n"s, {}},
        {"a section of none", "[s]\n[\0t]\nk=v\n"s, {}},
        {"a section of none, then another", "[\0]\na=1\n[s]\nk=v\n"s, {{L"s", L"k", L"v"}}},
        {"before a comment sign", "[s]\n\0#k=v\n"s, {}},
        {"before a bracket", "[s]\n\0[t]\nk=v\n"s, {{L"s", L"k", L"v"}}},
        {"keeps trailing blanks", "[s]\nk=v \0 \n"s, {{L"s", L"k", L"v "}}},
        {"hides the bracket at the end", "[s]\0\nk=v\n"s, {{L"s]", L"k", L"v"}}},
        {"a line of them", "[s]\n\0\0\0\nk=v\n"s, {{L"s", L"k", L"v"}}},
        {"a file of them", "\0\0\0"s, {}},
    });
}

TEST_CASE("text is UTF-8, decoded as make_wstring decodes it, each part by itself") {
    checkRows({
        {"two, three and four bytes",
         "[\xC3\xA9]\n\xE2\x82\xAC=\xF0\x9F\x98\x80\n",
         {{L"\u00E9", L"\u20AC", L"\U0001F600"}}},
        {"six bytes", "[s]\nk=\xFD\xBF\xBF\xBF\xBF\xBF\n", {{L"s", L"k", L"\x7FFFFFFF"}}},
        {"five bytes", "[s]\nk=\xF8\x88\x80\x80\x80\n", {{L"s", L"k", L"\x200000"}}},
        {"a surrogate",
         "[s]\nk=\xED\xA0\x80\n",
         {{L"s", L"k", std::wstring(1, static_cast<wchar_t>(0xD800))}}},
        {"cut by the equals", "[s]\nk\xC3=\xA9\n", {{L"s", L"k?", L"?"}}},
        {"cut by the line feed",
         "[s]\nk=\xE2\x82\nl=w\n",
         {{L"s", L"k", L"??"}, {L"s", L"l", L"w"}}},
        {"cut by the end of the file", "[s]\nk=\xF0\x9F\x98", {{L"s", L"k", L"???"}}},
        {"a stray byte near the end",
         "[s]\nk=\x80"
         "abc\n",
         {{L"s", L"k", L"?abc"}}},
        {"a stray byte with five more",
         "[s]\nk=\x80"
         "abcdef\n",
         {{L"s", L"k",
           L"\x218A3925"
           L"f"}}},
        {"an overlong letter", "[s]\n\xC1\x81=v\n", {{L"s", L"A", L"v"}}},
        {"an overlong equals is none", "[s]\nk\xC0\xBD=v\n", {{L"s", L"k=", L"v"}}},
        {"an overlong equals alone", "[s]\nk\xC0\xBDv\n", {}},
        {"an overlong zero ends the value",
         "[s]\nk=a\xC0\x80"
         "b\n",
         {{L"s", L"k", L"a"}}},
        {"an overlong zero ends the key",
         "[s]\na\xC0\x80"
         "b=v\n",
         {{L"s", L"a", L"v"}}},
        {"an overlong zero ends the section",
         "[a\xC0\x80"
         "b]\nk=v\n",
         {{L"a", L"k", L"v"}}},
        {"an overlong zero as key", "[s]\n\xC0\x80=v\n", {}},
        {"an overlong zero as section", "[s]\n[\xE0\x80\x80]\nk=v\n", {}},
        {"a byte order mark hides the header", "\xEF\xBB\xBF[s]\nk=v\n", {}},
        {"a byte order mark before an entry", "[s]\n\xEF\xBB\xBFk=v\n", {{L"s", L"\uFEFFk", L"v"}}},
        {"a no-break space is not trimmed",
         "[s]\n\xC2\xA0k=v\xC2\xA0\n",
         {{L"s", L"\u00A0k", L"v\u00A0"}}},
        {"a lead byte takes the bracket", "[s\xC3]\nk=v\n", {{L"s?", L"k", L"v"}}},
    });
}

TEST_CASE("lines of any length and files of any size are read") {
    SettingsPlace const place;
    SUBCASE("a long value, key and section") {
        std::string const section(100000, 's');
        std::string const key(200000, 'k');
        std::string const value(3000000, 'v');
        Settings const expected{
            {std::wstring(100000, L's'), std::wstring(200000, L'k'), std::wstring(3000000, L'v')}};
        CHECK(loaded(place, "[" + section + "]\n" + key + "=" + value) == expected);
    }
    SUBCASE("long white space and long comments") {
        std::string const blanks(100000, ' ');
        std::string const tabs(100000, '\t');
        std::string const lines(100000, '\n');
        checkSame(loaded(place, lines + blanks + "[s]" + tabs + "\n" + lines + tabs + "k=v" +
                                    blanks + "\n#" + blanks + "a=1\n" + blanks + tabs),
                  {{L"s", L"k", L"v"}});
    }
    SUBCASE("lines around the sizes of buffers") {
        for (std::size_t const size : {512UL, 1024UL, 4096UL, 8191UL, 8192UL, 65536UL}) {
            for (std::size_t filler = size - 12; filler <= size + 2; ++filler) {
                CAPTURE(size);
                CAPTURE(filler);
                std::string const comment = "#" + std::string(filler - 2, 'x') + "\n";
                checkSame(loaded(place, comment + "[sect]\nkey=value\nlast=1"),
                          {{L"sect", L"key", L"value"}, {L"sect", L"last", L"1"}});
            }
        }
    }
}

TEST_CASE("entries are sorted by section and key without regard to case") {
    SettingsPlace const place;
    checkSame(loaded(place, "[b]\nZ=1\na=2\nM=3\n[C]\nk=4\n[A]\ny=5\nX=6\n"), {{L"A", L"X", L"6"},
                                                                               {L"A", L"y", L"5"},
                                                                               {L"b", L"a", L"2"},
                                                                               {L"b", L"M", L"3"},
                                                                               {L"b", L"Z", L"1"},
                                                                               {L"C", L"k", L"4"}});
    // Letters compare as lower case, so the signs between Z and a come before all of them.
    checkSame(loaded(place, "[s]\nB=1\n_=2\na=3\n^x=4\nz=5\n~=6\n0=7\n"), {{L"s", L"0", L"7"},
                                                                           {L"s", L"^x", L"4"},
                                                                           {L"s", L"_", L"2"},
                                                                           {L"s", L"a", L"3"},
                                                                           {L"s", L"B", L"1"},
                                                                           {L"s", L"z", L"5"},
                                                                           {L"s", L"~", L"6"}});
    checkSame(
        loaded(place, "[s]\nab=1\na=2\nabc=3\nA b=4\n"),
        {{L"s", L"a", L"2"}, {L"s", L"A b", L"4"}, {L"s", L"ab", L"1"}, {L"s", L"abc", L"3"}});
}

TEST_CASE("parts of one section come together, and each entry keeps its spelling") {
    SettingsPlace const place;
    checkSame(loaded(place, "[a]\nm=1\n[B]\nx=2\n[A]\nc=3\n[b]\ny=4\n[a]\nz=5\n"),
              {{L"A", L"c", L"3"},
               {L"a", L"m", L"1"},
               {L"a", L"z", L"5"},
               {L"B", L"x", L"2"},
               {L"b", L"y", L"4"}});
}

TEST_CASE("every entry with equal names is kept, in the order of the file") {
    SettingsPlace const place;
    checkSame(loaded(place, "[s]\na=1\nA=2\na=3\n"),
              {{L"s", L"a", L"1"}, {L"s", L"A", L"2"}, {L"s", L"a", L"3"}});
    checkSame(loaded(place, "[s]\nA=2\na=1\n"), {{L"s", L"A", L"2"}, {L"s", L"a", L"1"}});

    std::string bytes;
    Settings expected;
    for (int i = 0; i < 400; ++i) {
        std::string const number = std::to_string(i);
        bytes += i % 3 == 0 ? "[S]\n" : "[s]\n";
        bytes += (i % 2 == 0 ? "KEY=" : "key=") + number + "\n";
        expected.push_back({i % 3 == 0 ? L"S" : L"s", i % 2 == 0 ? L"KEY" : L"key",
                            std::wstring(number.begin(), number.end())});
    }
    checkSame(loaded(place, bytes), expected);
}

TEST_CASE("the table is written as a header per run and a line per entry") {
    SettingsPlace const place;
    CHECK(written(place, {}) == "");
    CHECK(written(place, {{L"s", L"k", L"v"}}) == "[s]\nk=v\n");
    CHECK(written(place, {{L"s", L"k", L""}}) == "[s]\nk=\n");
    CHECK(written(place, {{L"b", L"z", L"1"}, {L"a", L"y", L"2"}, {L"b", L"x", L"3"}}) ==
          "[a]\ny=2\n[b]\nx=3\nz=1\n");
    CHECK(written(place, {{L"s", L"k ", L" v "}}) == "[s]\nk = v \n");
    CHECK(written(place, {{L"", L"k", L"v"}, {L"s", L"", L"w"}}) == "[]\nk=v\n[s]\n=w\n");
    CHECK(written(place, {{L"", L"", L""}}) == "[]\n=\n");
    // Nothing is escaped.
    CHECK(written(place, {{L"a]\n[b", L"k=\n", L"v\n#"}}) == "[a]\n[b]\nk=\n=v\n#\n");
}

TEST_CASE("a section has one header, spelt as its entry with the smallest key spells it") {
    SettingsPlace const place;
    {
        InitializationFile file(place.path());
        file.open(WRITE);
        file.setValue(L"net", L"b", L"1");
        file.setValue(L"NET", L"c", L"2");
        file.setValue(L"Net", L"a", L"3");
        file.close();
    }
    CHECK(place.bytes() == "[Net]\na=3\nb=1\nc=2\n");
}

TEST_CASE("text is written as make_string encodes it") {
    SettingsPlace const place;
    CHECK(written(place, {{L"\u00E9", L"\u20AC", L"\U0001F600"}}) ==
          "[\xC3\xA9]\n\xE2\x82\xAC=\xF0\x9F\x98\x80\n");
    CHECK(written(place, {{L"s", L"k", L"\x7FFFFFFF"}}) == "[s]\nk=\xFD\xBF\xBF\xBF\xBF\xBF\n");
    CHECK(written(place, {{L"s\0t"s, L"k\0l"s, L"v\0w"s}}) == "[s]\nk=v\n");
    // Of a unit of 0x80000000 and above its low byte is written, and if that is zero, no more.
    std::wstring const high{static_cast<wchar_t>(0x80000041), L'b',
                            static_cast<wchar_t>(0xFFFFFFC3)};
    CHECK(written(place, {{L"s", L"k", high}}) == "[s]\nk=Ab\xC3\n");
    std::wstring const zero{L'a', static_cast<wchar_t>(0x80000000), L'b'};
    CHECK(written(place, {{zero, zero, zero}}) == "[a]\na=a\n");
    std::wstring const surrogate{static_cast<wchar_t>(0xD800)};
    CHECK(written(place, {{L"s", L"k", surrogate}}) == "[s]\nk=\xED\xA0\x80\n");
}

TEST_CASE("comments, blank lines, spacing and the order of lines are lost when written") {
    SettingsPlace const place;
    place.write("# top\nlost=1\n\n[ b ]\n  z = 1  \n; c\n a=2\n\n\n[a]\nword\nk=v");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[ b ]\na=2\nz = 1\n[a]\nk=v\n");
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[ b ]\na=2\nz = 1\n[a]\nk=v\n");
}

TEST_CASE("malformed text is written as it was decoded") {
    SettingsPlace const place;
    place.write("[s\xC3]\n\xC1\x81=\x80xyz\nb=\xC0\x80lost\nc=\xF0\x82\x82\xAC\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[s?]\nA=?xyz\nb=\nc=\xE2\x82\xAC\n");
}

TEST_CASE("duplicates and their order survive writing and reading") {
    SettingsPlace const place;
    place.write("[s]\nb=1\na=2\nB=3\na=4\nA=5\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "[s]\na=2\na=4\nA=5\nb=1\nB=3\n");
}

TEST_CASE("a section without keys does not survive writing and reading") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.createSection(L"Empty");
    file.setValue(L"Full", L"k", L"v");
    file.synchronize();
    CHECK(place.bytes() == "[Empty]\n=\n[Full]\nk=v\n");
    checkSame(file.enumerateSections(), names({L"Full"}));
}

TEST_CASE("entries of the empty section come back in section [") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"s", L"k", L"v");
    file.setValue(L"", L"k", L"w");
    file.synchronize();
    CHECK(place.bytes() == "[]\nk=w\n[s]\nk=v\n");
    checkSame(file.enumerateSections(), names({L"[", L"s"}));
    checkSame(file.getValue(L"[", L"k"), L"w");
    checkSame(file.getValue(L"", L"k"), L"");
}

// ---------------------------------------------------------------------------------- the operations

TEST_CASE("a missing section or key gives an empty value, an empty list or no effect") {
    SettingsPlace const place;
    place.write("[s]\nk=v\nempty=\n");
    InitializationFile file(place.path());
    file.open(READ);
    checkSame(file.getValue(L"s", L"missing"), L"");
    checkSame(file.getValue(L"missing", L"k"), L"");
    checkSame(file.getValue(L"k", L"s"), L"");
    checkSame(file.getValue(L"", L""), L"");
    checkSame(file.getValue(L"s", L""), L"");
    checkSame(file.getValue(L"s", L"empty"), L"");
    CHECK(file.enumerateKeys(L"missing").empty());
    CHECK(file.enumerateKeys(L"").empty());
    file.removeKey(L"s", L"missing");
    file.removeKey(L"missing", L"k");
    file.removeKey(L"s", L"");
    file.removeSection(L"missing");
    file.removeSection(L"");
    checkSame(drain(file), {{L"s", L"empty", L""}, {L"s", L"k", L"v"}});
}

TEST_CASE("names match without regard to case and in full") {
    SettingsPlace const place;
    place.write("[Net]\nHost=a\nHostname=b\n[Network]\nHost=c\n");
    InitializationFile file(place.path());
    file.open(READ);
    checkSame(file.getValue(L"NET", L"hOST"), L"a");
    checkSame(file.getValue(L"net", L"HOSTNAME"), L"b");
    checkSame(file.getValue(L"nETWORK", L"host"), L"c");
    checkSame(file.getValue(L"Ne", L"Host"), L"");
    checkSame(file.getValue(L"Net", L"Hos"), L"");
    checkSame(file.getValue(L"Net", L"Host "), L"");
    checkSame(file.enumerateKeys(L"nEt"), names({L"Host", L"Hostname"}));
    // Only letters have a case: signs that are 32 apart differ.
    struct Pair {
        wchar_t const* held;
        wchar_t const* asked;
    };
    for (Pair const& pair :
         {Pair{L"@", L"`"}, Pair{L"[", L"{"}, Pair{L"^", L"~"}, Pair{L"_", L"\x7F"},
          Pair{L"\r", L"-"}, Pair{L"0", L"\x10"}, Pair{L"\u00C9", L"\u00E9"}, Pair{L"\u0141", L"A"},
          Pair{L"\U00010041", L"A"}}) {
        CAPTURE(test::shown(std::wstring(pair.held)));
        file.setValue(L"signs", pair.held, L"x");
        checkSame(file.getValue(L"signs", pair.asked), L"");
        checkSame(file.getValue(L"signs", pair.held), L"x");
    }
}

TEST_CASE("setValue replaces the first entry's value in its place and keeps its names") {
    SettingsPlace const place;
    place.write("[S]\nA=1\nb=2\nB=3\nc=4\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"s", L"B", L"new");
    file.setValue(L"s", L"a", L"");
    checkSame(drain(file),
              {{L"S", L"A", L""}, {L"S", L"b", L"new"}, {L"S", L"B", L"3"}, {L"S", L"c", L"4"}});
}

TEST_CASE("setValue adds a missing entry, and with it the section, at the end of the table") {
    SettingsPlace const place;
    place.write("[m]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"m", L"a", L"2");
    file.setValue(L"a", L"k", L"3");
    file.setValue(L"", L"", L"4");
    file.setValue(L"m", L"", L"5");
    checkSame(drain(file), {{L"m", L"k", L"1"},
                            {L"m", L"a", L"2"},
                            {L"a", L"k", L"3"},
                            {L"", L"", L"4"},
                            {L"m", L"", L"5"}});
}

TEST_CASE("createKey adds a missing entry and keeps the value of one that exists") {
    SettingsPlace const place;
    place.write("[m]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.createKey(L"M", L"K");
    file.createKey(L"m", L"a");
    file.createKey(L"new", L"k");
    file.createKey(L"", L"");
    file.createKey(L"", L"");
    checkSame(drain(file),
              {{L"m", L"k", L"1"}, {L"m", L"a", L""}, {L"new", L"k", L""}, {L"", L"", L""}});
}

TEST_CASE("createSection adds an entry with empty key and value unless the section exists") {
    SettingsPlace const place;
    place.write("[m]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.createSection(L"M");
    file.createSection(L"Net");
    file.createSection(L"nET");
    file.createSection(L"");
    checkSame(file.enumerateKeys(L"net"), names({L""}));
    checkSame(file.getValue(L"net", L""), L"");
    // The placeholder is an entry like any other.
    file.createKey(L"Net", L"");
    file.setValue(L"NET", L"", L"v");
    file.setValue(L"Net", L"k", L"w");
    checkSame(drain(file),
              {{L"m", L"k", L"1"}, {L"Net", L"", L"v"}, {L"", L"", L""}, {L"Net", L"k", L"w"}});
}

TEST_CASE("removeKey removes only the first of equal entries") {
    SettingsPlace const place;
    place.write("[s]\na=1\nb=2\nB=3\nb=4\nc=5\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.removeKey(L"S", L"B");
    checkSame(file.getValue(L"s", L"b"), L"3");
    checkSame(file.enumerateKeys(L"s"), names({L"a", L"B", L"b", L"c"}));
    file.removeKey(L"s", L"b");
    file.removeKey(L"s", L"a");
    checkSame(drain(file), {{L"s", L"b", L"4"}, {L"s", L"c", L"5"}});
}

TEST_CASE("a section is gone with its last entry") {
    SettingsPlace const place;
    place.write("[a]\nk=1\n[b]\nk=2\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.removeKey(L"a", L"k");
    checkSame(file.enumerateSections(), names({L"b"}));
    file.removeKey(L"b", L"k");
    CHECK(file.enumerateSections().empty());
    file.setValue(L"B", L"k", L"3");
    checkSame(drain(file), {{L"B", L"k", L"3"}});
}

TEST_CASE("removeSection skips the entry that moves into a removed one's place") {
    SettingsPlace const place;
    for (std::size_t count = 0; count <= 9; ++count) {
        CAPTURE(count);
        std::string bytes = "[a]\nk=1\n[s]\n";
        Settings expected{{L"a", L"k", L"1"}};
        for (std::size_t i = 0; i < count; ++i) {
            std::string const key(1, static_cast<char>('a' + i));
            bytes += key + "=v\n";
            // The second, the fourth and so on stay.
            if (i % 2 == 1) expected.push_back({L"s", std::wstring(key.begin(), key.end()), L"v"});
        }
        place.write(bytes + "[t]\nk=2\n");
        expected.push_back({L"t", L"k", L"2"});
        InitializationFile file(place.path());
        file.open(READ);
        file.removeSection(L"S");
        checkSame(drain(file), expected);
    }
}

TEST_CASE("removeSection removes single entries of a section wherever they are") {
    SettingsPlace const place;
    place.write("[s]\na=1\n[t]\na=2\n[u]\na=3\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"S", L"b", L"4");
    file.setValue(L"t", L"b", L"5");
    file.setValue(L"s", L"c", L"6");
    file.removeSection(L"s");
    checkSame(drain(file), {{L"t", L"a", L"2"}, {L"u", L"a", L"3"}, {L"t", L"b", L"5"}});
}

TEST_CASE("enumerateKeys gives every key of the section in the order of the table") {
    SettingsPlace const place;
    place.write("[s]\nb=1\na=2\nB=3\n[t]\nx=4\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"S", L"A!", L"5");
    file.setValue(L"s", L"", L"6");
    file.setValue(L"t", L"y", L"7");
    checkSame(file.enumerateKeys(L"S"), names({L"a", L"b", L"B", L"A!", L""}));
    checkSame(file.enumerateKeys(L"T"), names({L"x", L"y"}));
}

TEST_CASE("enumerateSections names each run of entries as its first entry does") {
    SettingsPlace const place;
    place.write("[B]\nk=1\n[a]\nk=2\n[b]\na=3\n[C]\nk=4\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C"}));
    file.setValue(L"c", L"new", L"5"); // joins the last run
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C"}));
    file.setValue(L"A", L"new", L"6");
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C", L"A"}));
    file.setValue(L"a", L"k", L"7"); // changes a value only
    file.createKey(L"B", L"new");
    file.createSection(L"b");
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C", L"A", L"B"}));
    file.synchronize();
    checkSame(file.enumerateSections(), names({L"a", L"b", L"C"}));
}

TEST_CASE("values and names are held as they were set until they are written") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    std::wstring const odd{L'a',
                           L'\0',
                           L'b',
                           static_cast<wchar_t>(0x80000041),
                           static_cast<wchar_t>(0xFFFFFFFF),
                           static_cast<wchar_t>(0xD800),
                           L'\n'};
    file.setValue(L"s", L"k", odd);
    CHECK(file.getValue(L"s", L"k") == odd);
    file.setValue(L"s\0one"s, L"n\0one"s, L"v");
    checkSame(file.enumerateSections(), names({L"s"}));
    CHECK(file.enumerateKeys(L"s") == std::vector<std::wstring>{L"k", L"n\0one"s});
    // Names are compared up to their first NUL.
    checkSame(file.getValue(L"S", L"N"), L"v");
    checkSame(file.getValue(L"s\0two"s, L"n\0two"s), L"v");
    file.createSection(L"\0x"s);
    CHECK(file.enumerateSections() == std::vector<std::wstring>{L"s", L"\0x"s});
    checkSame(file.enumerateKeys(L""), names({L""}));
    file.removeKey(L"", L"\0y"s);
    file.createKey(L"t", L"");
    file.setValue(L"t", L"\0z"s, L"w\0"s);
    CHECK(file.getValue(L"t", L"") == L"w\0"s);

    file.synchronize();
    checkSame(drain(file), {{L"s", L"k", L"a"}, {L"s", L"n", L"v"}});
}

TEST_CASE("names of units that no UTF-8 gives are found again") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(WRITE);
    for (unsigned long const unit : {0x80000000UL, 0x80000041UL, 0xC0000000UL, 0xFFFFFFFFUL,
                                     0x7FFFFFFFUL, 0xD800UL, 0x110000UL}) {
        CAPTURE(unit);
        std::wstring const name{L'n', static_cast<wchar_t>(unit), L'x'};
        std::wstring const spelt{L'N', static_cast<wchar_t>(unit), L'X'};
        file.setValue(name, name, name);
        CHECK(file.getValue(spelt, spelt) == name);
        CHECK(file.enumerateKeys(spelt) == std::vector<std::wstring>{name});
    }
}

TEST_CASE("results are copies that later changes do not touch") {
    SettingsPlace const place;
    place.write("[s]\na=1\nb=2\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    std::vector<std::wstring> const sections = file.enumerateSections();
    std::vector<std::wstring> const keys = file.enumerateKeys(L"s");
    std::wstring const value = file.getValue(L"s", L"a");
    file.setValue(sections[0], keys[0], value + value);
    file.removeKey(sections[0], keys[1]);
    file.synchronize();
    file.close();
    checkSame(sections, names({L"s"}));
    checkSame(keys, names({L"a", L"b"}));
    checkSame(value, L"1");
    CHECK(place.bytes() == "[s]\na=11\n");
}

// ---------------------------------------------------------------------------------- the life cycle

TEST_CASE("opening a missing file fails for reading and creates it for writing") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    CHECK(!file.is_open());
    CHECK(!place.exists());
    file.open(READ_WRITE);
    CHECK(file.is_open());
    CHECK(file.getMode() == READ_WRITE);
    CHECK(place.bytes() == "");
    file.close();
    CHECK(place.bytes() == "");
    std::filesystem::remove(place.path());
    file.open(WRITE);
    CHECK(place.bytes() == "");
}

TEST_CASE("a mode without reading and writing is refused") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    unsigned long const binary = File::BINARY;
    for (unsigned long const mode : {0UL, 4UL, binary}) {
        CHECK(messageOf<std::runtime_error>([&] { file.open(mode); }) == "failed to open file.");
        CHECK(!file.is_open());
        CHECK(file.getMode() == 0UL);
    }
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("an open that fails leaves the table as it was") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.setValue(L"s", L"k", L"v");
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    checkSame(file.getValue(L"s", L"k"), L"v");
    CHECK(file.getMode() == 0UL);

    InitializationFile nameless;
    nameless.setValue(L"s", L"k", L"v");
    CHECK(messageOf<std::runtime_error>([&] { nameless.open(READ_WRITE); }) ==
          "failed to open file.");
    checkSame(nameless.getValue(L"s", L"k"), L"v");
}

TEST_CASE("open discards what the table held") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    file.setValue(L"early", L"k", L"v");
    file.open(READ_WRITE);
    checkSame(file.enumerateSections(), names({L"s"}));
    file.close();
    file.setValue(L"between", L"k", L"v");
    file.open(WRITE);
    CHECK(file.enumerateSections().empty());
    file.close();
    CHECK(place.bytes() == "");
}

TEST_CASE("changes without the write bit vanish at close and the file stays untouched") {
    SettingsPlace const place;
    std::string const bytes = "; comment\n\n[s]\r\nk = v\n";
    place.write(bytes);
    auto const time = std::filesystem::last_write_time(place.path());
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"s", L"k", L"changed");
    file.createSection(L"new");
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.enumerateSections().empty());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    file.open(READ);
    checkSame(drain(file), {{L"s]\r", L"k ", L" v"}});
    file.close();
    CHECK(place.bytes() == bytes);
    CHECK(std::filesystem::last_write_time(place.path()) == time);
}

TEST_CASE("opening for writing alone begins with an empty table and replaces the whole file") {
    SettingsPlace const place;
    place.write("[old]\nk=v\n");
    InitializationFile file(place.path());
    file.open(WRITE);
    CHECK(file.enumerateSections().empty());
    CHECK(place.bytes() == "");
    file.setValue(L"new", L"k", L"v");
    CHECK(place.bytes() == "");
    file.close();
    CHECK(place.bytes() == "[new]\nk=v\n");
    CHECK(file.enumerateSections().empty());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
}

TEST_CASE("the mode keeps the bits without a meaning") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    unsigned long const mode = READ_WRITE | File::BINARY | 0x40UL;
    file.open(mode);
    CHECK(file.getMode() == mode);
    file.setValue(L"s", L"k", L"v");
    file.synchronize();
    CHECK(file.getMode() == mode);
    checkSame(file.getValue(L"s", L"k"), L"v");
}

TEST_CASE("a file may be opened and closed again and again") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    for (int i = 0; i < 20; ++i) {
        file.open(READ_WRITE);
        std::wstring const number = std::to_wstring(i);
        checkSame(file.getValue(L"s", L"count"), i == 0 ? L"" : std::to_wstring(i - 1));
        file.setValue(L"s", L"count", number);
        file.close();
    }
    CHECK(place.bytes() == "[s]\ncount=19\n");
}

TEST_CASE("closing or destroying an object that was never opened touches no file") {
    SettingsPlace const place;
    {
        InitializationFile file(place.path());
        file.setValue(L"s", L"k", L"v");
        CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
        CHECK(file.enumerateSections().empty());
        CHECK(file.getMode() == 0UL);
        CHECK(file.fail());
        file.setValue(L"s", L"k", L"v");
    }
    CHECK(!place.exists());
    place.write("old");
    { InitializationFile const file(place.path()); }
    CHECK(place.bytes() == "old");
    { InitializationFile const nameless; }
    InitializationFile nameless;
    nameless.setValue(L"s", L"k", L"v");
    CHECK(messageOf<std::exception>([&] { nameless.close(); }) == "<nothing>");
    nameless.synchronize();
}

TEST_CASE("closing twice is harmless") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"s", L"k", L"v");
    file.close();
    file.setValue(L"t", L"k", L"v");
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.getMode() == 0UL);
    CHECK(file.enumerateSections().empty());
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("the destructor writes a file that is open for writing") {
    SettingsPlace const place;
    {
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"v");
    }
    CHECK(place.bytes() == "[s]\nk=v\n");
    {
        InitializationFile file(place.path());
        file.open(READ);
        file.setValue(L"s", L"k", L"w");
    }
    CHECK(place.bytes() == "[s]\nk=v\n");
    {
        std::unique_ptr<File> const file(new InitializationFile(place.path()));
        file->open(WRITE);
    }
    CHECK(place.bytes() == "");
    {
        auto* const settings = new InitializationFile(place.path());
        std::unique_ptr<std::iostream> const stream(settings);
        settings->open(WRITE);
        settings->setValue(L"deleted", L"as", L"a stream");
    }
    CHECK(place.bytes() == "[deleted]\nas=a stream\n");
}

namespace {

/// Counts the calls that reach its overrides.
class Counting : public InitializationFile {
public:
    Counting(std::string const& path, int& opens, int& closes)
        : InitializationFile(File::Path(path)), opens_(opens), closes_(closes) {}
    void open(unsigned long mode) override {
        ++opens_;
        InitializationFile::open(mode);
    }
    void close() override {
        ++closes_;
        InitializationFile::close();
    }

private:
    int& opens_;
    int& closes_;
};

} // namespace

TEST_CASE("synchronize reaches overrides, and the destructor calls the class's own close") {
    SettingsPlace const place;
    int opens = 0;
    int closes = 0;
    {
        Counting file(place.path(), opens, closes);
        file.synchronize();
        CHECK(opens == 0);
        CHECK(closes == 0);
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"v");
        file.synchronize();
        CHECK(opens == 2);
        CHECK(closes == 1);
        CHECK(place.bytes() == "[s]\nk=v\n");
        file.setValue(L"s", L"k", L"w");
    }
    CHECK(opens == 2);
    CHECK(closes == 1);
    CHECK(place.bytes() == "[s]\nk=w\n");
}

TEST_CASE("synchronize writes back and reads again") {
    SettingsPlace const place;
    place.write("[s]\nb=1\n");
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"s", L"c", L"2");
    file.setValue(L"r", L"a", L"3");
    file.setValue(L"s", L"odd", L"x\ny=z");
    file.createSection(L"t");
    file.synchronize();
    CHECK(place.bytes() == "[r]\na=3\n[s]\nb=1\nc=2\nodd=x\ny=z\n[t]\n=\n");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ_WRITE);
    checkSame(drain(file), {{L"r", L"a", L"3"},
                            {L"s", L"b", L"1"},
                            {L"s", L"c", L"2"},
                            {L"s", L"odd", L"x"},
                            {L"s", L"y", L"z"}});
}

TEST_CASE("synchronize of a file open for reading drops changes and reads what is there now") {
    SettingsPlace const place;
    place.write("[s]\nk=1\n");
    InitializationFile file(place.path());
    file.open(READ);
    file.setValue(L"s", L"k", L"mine");
    place.write("[s]\nk=2\n");
    file.synchronize();
    checkSame(drain(file), {{L"s", L"k", L"2"}});
    CHECK(file.getMode() == READ);
    CHECK(place.bytes() == "[s]\nk=2\n");
}

TEST_CASE("synchronize of a file open for writing alone leaves file and table empty") {
    // Intended: reopening for writing empties the file that was just written.
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(WRITE);
    file.setValue(L"s", L"k", L"v");
    file.synchronize();
    CHECK(file.getMode() == WRITE);
    CHECK(file.enumerateSections().empty());
    CHECK(place.bytes() == "");
}

TEST_CASE("synchronize leaves a closed file and its table as they are") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.setValue(L"s", L"k", L"v");
    file.synchronize();
    checkSame(file.getValue(L"s", L"k"), L"v");
    CHECK(!file.is_open());
    CHECK(!place.exists());
}

TEST_CASE("setMode decides what the next close does") {
    SettingsPlace const place;
    place.write("; c\n[s]\nk=1\n");
    InitializationFile file(place.path());
    SUBCASE("writing allowed later") {
        file.open(READ);
        file.setValue(L"s", L"k", L"2");
        file.setMode(READ_WRITE);
        file.synchronize();
        CHECK(place.bytes() == "[s]\nk=2\n");
        CHECK(file.getMode() == READ_WRITE);
        checkSame(file.getValue(L"s", L"k"), L"2");
    }
    SUBCASE("writing no longer allowed") {
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"2");
        file.setMode(READ);
        file.synchronize();
        CHECK(file.getMode() == READ);
        checkSame(file.getValue(L"s", L"k"), L"1");
        file.close();
        CHECK(place.bytes() == "; c\n[s]\nk=1\n");
    }
    SUBCASE("writing alone") {
        file.open(READ);
        file.setMode(WRITE);
        file.close();
        CHECK(place.bytes() == "[s]\nk=1\n");
    }
    SUBCASE("neither") {
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"2");
        file.setMode(0);
        CHECK(messageOf<std::runtime_error>([&] { file.synchronize(); }) == "failed to open file.");
        CHECK(!file.is_open());
        CHECK(place.bytes() == "; c\n[s]\nk=1\n");
    }
    SUBCASE("writing, without the file ever opened") {
        file.setMode(READ_WRITE);
        file.setValue(L"t", L"k", L"v");
        file.close();
        CHECK(place.bytes() == "[t]\nk=v\n");
        CHECK(file.getMode() == 0UL);
        CHECK(!file.is_open());
    }
}

TEST_CASE("opening an open file reads it again and changes the mode, but not the stream") {
    SettingsPlace const place;
    place.write("[s]\nk=1\n");
    InitializationFile file(place.path());
    SUBCASE("to read again") {
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"mine");
        file.open(READ);
        CHECK(file.getMode() == READ);
        checkSame(file.getValue(L"s", L"k"), L"1");
        file.setValue(L"s", L"k", L"mine");
        file.close();
        CHECK(place.bytes() == "[s]\nk=1\n");
    }
    SUBCASE("to write") {
        file.open(READ);
        file.open(WRITE);
        CHECK(file.getMode() == WRITE);
        CHECK(file.enumerateSections().empty());
        CHECK(place.bytes() == "[s]\nk=1\n"); // not emptied: it was not opened again
        file.setValue(L"t", L"k", L"2");
        file.close();
        CHECK(place.bytes() == "[t]\nk=2\n");
    }
    SUBCASE("to read what was opened for writing alone") {
        file.open(WRITE);
        file.setValue(L"s", L"k", L"mine");
        file.open(READ);
        CHECK(file.enumerateSections().empty());
        file.close();
        CHECK(place.bytes() == "");
    }
    SUBCASE("with no mode at all") {
        file.open(READ_WRITE);
        file.open(0);
        CHECK(file.is_open());
        CHECK(file.getMode() == 0UL);
        CHECK(file.enumerateSections().empty());
        file.close();
        CHECK(place.bytes() == "[s]\nk=1\n");
    }
}

TEST_CASE("open leaves the stream at the end of the file, where it can be used") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    file.open(READ);
    CHECK(file.rdstate() == std::ios::eofbit);
    file.clear();
    CHECK(file.tellg() == std::streampos(8));
    file.seekg(0);
    std::string line;
    CHECK(bool(std::getline(file, line)));
    CHECK(line == "[s]");
    checkSame(file.getValue(L"s", L"k"), L"v");
    file.close();
    file.open(READ);
    CHECK(file.rdstate() == std::ios::eofbit);
    file.close();

    place.write("");
    file.open(READ_WRITE);
    CHECK(file.rdstate() == std::ios::eofbit);
    file.close();
    InitializationFile other(place.path());
    other.open(WRITE);
    CHECK(other.good());
    other.write("direct", 6).flush();
    CHECK(place.bytes() == "direct");
    other.close();
    CHECK(place.bytes() == "");
}

TEST_CASE("open and close clear what went wrong with the stream before") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    CHECK(file.fail());
    file.open(WRITE);
    file.setValue(L"s", L"k", L"v");
    file.setstate(std::ios::failbit | std::ios::badbit);
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(place.bytes() == "[s]\nk=v\n");
    file.setstate(std::ios::failbit | std::ios::badbit);
    file.open(READ);
    CHECK(file.rdstate() == std::ios::eofbit);
    checkSame(drain(file), {{L"s", L"k", L"v"}});
}

TEST_CASE("close deletes the old file and writes another in its place") {
    SettingsPlace const place;
    std::string const other = place.directory() / "other";
    mode_t const mask = ::umask(022);
    SUBCASE("another name of the old file keeps the old content") {
        place.write("[s]\nk=old\n");
        std::filesystem::create_hard_link(place.path(), other);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", L"new");
        file.close();
        CHECK(place.bytes() == "[s]\nk=new\n");
        CHECK(test::readFile(other) == "[s]\nk=old\n");
    }
    SUBCASE("a link is replaced, not what it leads to") {
        test::writeFile(other, "[s]\nk=old\n");
        std::filesystem::create_symlink(other, place.path());
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        checkSame(file.getValue(L"s", L"k"), L"old");
        file.setValue(L"s", L"k", L"new");
        file.close();
        CHECK(!std::filesystem::is_symlink(place.path()));
        CHECK(place.bytes() == "[s]\nk=new\n");
        CHECK(test::readFile(other) == "[s]\nk=old\n");
    }
    SUBCASE("the new file has a new file's permissions") {
        place.write("[s]\nk=old\n");
        CHECK(::chmod(place.path().c_str(), 0600) == 0);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.close();
        struct stat status = {};
        CHECK(::stat(place.path().c_str(), &status) == 0);
        CHECK((status.st_mode & 0777U) == 0644U);
    }
    SUBCASE("a file that was deleted meanwhile comes back") {
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        std::filesystem::remove(place.path());
        file.close();
        CHECK(place.bytes() == "[s]\nk=v\n");
    }
    SUBCASE("what another wrote meanwhile is lost") {
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        place.write("[other]\nlong=content of somebody else\n");
        file.close();
        CHECK(place.bytes() == "[s]\nk=v\n");
    }
    SUBCASE("an empty directory in its place is deleted too") {
        InitializationFile file(place.path());
        file.open(WRITE);
        file.setValue(L"s", L"k", L"v");
        std::filesystem::remove(place.path());
        std::filesystem::create_directory(place.path());
        file.close();
        CHECK(place.bytes() == "[s]\nk=v\n");
    }
    ::umask(mask);
}

// ------------------------------------------------------------------------------------ the failures

TEST_CASE("a close that cannot open the file again keeps the table and leaves the file closed") {
    SettingsPlace const place;
    std::string const folder = place.directory() / "folder";
    std::string const path = folder + "/settings.ini";
    std::filesystem::create_directory(folder);
    InitializationFile file(path);
    file.open(READ_WRITE);
    file.setValue(L"s", L"b", L"1");
    file.setValue(L"s", L"a", L"2");
    SUBCASE("its directory is gone") { std::filesystem::remove_all(folder); }
    SUBCASE("a directory with content is in its place") {
        std::filesystem::remove(path);
        std::filesystem::create_directories(path + "/content");
    }
    CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "failed to open file.");
    CHECK(!file.is_open());
    checkSame(file.getValue(L"s", L"a"), L"2");
    // The table was sorted before anything else happened.
    checkSame(drain(file), {{L"s", L"a", L"2"}, {L"s", L"b", L"1"}});
}

TEST_CASE("a destructor that cannot open the file again keeps the exception inside") {
    test::Outcome const outcome = test::inChild([] {
        test::TempDir const directory;
        std::string const folder = directory / "folder";
        std::filesystem::create_directory(folder);
        {
            InitializationFile file(folder + "/settings.ini");
            file.open(WRITE);
            file.setValue(L"s", L"k", L"v");
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
    InitializationFile file(path);
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to read from file");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(file.enumerateSections().empty());
    file.close();
    file.clear();
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) == "failed to open file.");
    CHECK(messageOf<std::runtime_error>([&] { file.open(WRITE); }) == "failed to open file.");
    CHECK(std::filesystem::is_directory(path));
}

TEST_CASE("a file whose first read fails is not an empty file") {
    InitializationFile file("/proc/self/mem"s);
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to read from file");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(file.enumerateSections().empty());
}

TEST_CASE("a read that fails midway is not the end of the file") {
    SettingsPlace const place;
    std::string bytes = "[s]\n";
    std::vector<std::wstring> keys;
    for (int i = 20000; i > 0; --i) {
        bytes += "key" + std::to_string(i) + "=a value of some length\n";
        keys.push_back(L"key" + std::to_wstring(i));
    }
    place.write(bytes);
    int failures = 0;
    for (;; ++failures) {
        CAPTURE(failures);
        InitializationFile file(place.path());
        readsBeforeFailure = failures;
        std::string const message = messageOf<std::runtime_error>([&] { file.open(READ); });
        readsBeforeFailure = -1;
        if (message == "<nothing>") break;
        CHECK(message == "failed to read from file");
        CHECK(file.is_open());
        CHECK(file.getMode() == READ);
        // What was read so far is held, in the order of the file.
        std::vector<std::wstring> const read = file.enumerateKeys(L"s");
        CHECK(read.size() <= keys.size());
        CHECK(std::equal(read.begin(), read.end(), keys.begin()));
    }
    CHECK(failures > 0);
    // Once more with nothing in the way.
    InitializationFile file(place.path());
    file.open(READ);
    CHECK(file.enumerateKeys(L"s").size() == keys.size());
}

TEST_CASE("a file that could not be read is kept by taking the write bit away before close") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    readsBeforeFailure = 0;
    std::string const message = messageOf<std::runtime_error>([&] { file.open(READ_WRITE); });
    readsBeforeFailure = -1;
    CHECK(message == "failed to read from file");
    CHECK(file.getMode() == READ_WRITE);
    CHECK(place.bytes() == "[s]\nk=v\n");
    file.setMode(READ);
    file.close();
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("reads and writes that transfer little at a time make no difference") {
    SettingsPlace const place;
    Settings settings;
    for (int i = 0; i < 300; ++i) {
        settings.push_back({L"section " + std::to_wstring(i % 7), L"key " + std::to_wstring(i),
                            std::wstring(static_cast<std::size_t>(i) % 50, L'\u00E9')});
    }
    test::sortSettings(settings);
    for (std::size_t const limit : {1UL, 7UL, 1000UL}) {
        CAPTURE(limit);
        transferLimit = limit;
        std::string const bytes = written(place, settings);
        InitializationFile file(place.path());
        file.open(READ);
        Settings const read = drain(file);
        transferLimit = 0;
        CHECK(bytes == test::settingsText(settings));
        checkSame(read, settings);
    }
}

namespace {

/// What a caller sees of a file with one long entry.
std::string stateOf(InitializationFile& file) {
    return std::string(file.is_open() ? "open" : "closed") + ", mode " +
           std::to_string(file.getMode()) + ", value of " +
           std::to_string(file.getValue(L"s", L"k").size());
}

} // namespace

TEST_CASE("a write that fails leaves the table intact, the file open and the mode unchanged") {
    SettingsPlace const place;
    for (std::size_t const size : {1UL, 100UL, 5000UL, 300000UL}) {
        for (bool const synchronize : {false, true}) {
            for (unsigned long const mode : {WRITE, READ_WRITE}) {
                CAPTURE(size);
                CAPTURE(synchronize);
                CAPTURE(mode);
                std::string const value(size, 'x');
                std::string const complete = "[s]\nk=" + value + "\n";
                std::string const open =
                    "open, mode " + std::to_string(mode) + ", value of " + std::to_string(size);
                place.write("[s]\nk=old value\n");
                InitializationFile file(place.path());
                int failures = 0;
                for (;; ++failures) {
                    CAPTURE(failures);
                    if (!file.is_open()) {
                        file.open(mode);
                        file.setValue(L"s", L"k", std::wstring(size, L'x'));
                    }
                    failedCalls = 0;
                    writesBeforeFailure = failures;
                    std::string const message = messageOf<std::runtime_error>(
                        [&] { synchronize ? file.synchronize() : file.close(); });
                    writesBeforeFailure = -1;
                    if (failedCalls == 0) {
                        CHECK(message == "<nothing>");
                        break;
                    }
                    CHECK(message == "failed to write to file");
                    CHECK(stateOf(file) == open);
                    std::string const left = place.bytes();
                    CHECK(complete.compare(0, left.size(), left) == 0);
                }
                CHECK(failures > 0);
                if (!synchronize) CHECK(place.bytes() == complete);
                if (synchronize && mode == READ_WRITE) CHECK(stateOf(file) == open);
            }
        }
    }
}

TEST_CASE("after a write that failed the next close writes everything") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    for (int i = 0; i < 2000; ++i) {
        file.setValue(L"s" + std::to_wstring(i % 10), L"k" + std::to_wstring(i), L"some value");
    }
    transferLimit = 10000;
    writesBeforeFailure = 1; // after the first 10000 bytes
    std::string const message = messageOf<std::runtime_error>([&] { file.close(); });
    writesBeforeFailure = -1;
    transferLimit = 0;
    CHECK(message == "failed to write to file");
    file.close();
    InitializationFile again(place.path());
    again.open(READ);
    for (int i = 0; i < 2000; ++i) {
        checkSame(again.getValue(L"S" + std::to_wstring(i % 10), L"K" + std::to_wstring(i)),
                  L"some value");
    }
}

namespace {

/// Limits the size of files that this process writes. Only for child processes.
void limitFileSize(rlim_t bytes) {
    ::signal(SIGXFSZ, SIG_IGN);
    rlimit limit = {};
    ::getrlimit(RLIMIT_FSIZE, &limit);
    limit.rlim_cur = bytes;
    ::setrlimit(RLIMIT_FSIZE, &limit);
}

} // namespace

TEST_CASE("a file-size limit is a failure to write") {
    SettingsPlace const place;
    for (std::size_t const size : {1UL, 100UL, 200000UL}) {
        for (rlim_t const limit : {rlim_t(0), rlim_t(1), rlim_t(5)}) {
            CAPTURE(size);
            CAPTURE(limit);
            std::string const complete = "[s]\nk=" + std::string(size, 'x') + "\n";
            test::Outcome const outcome = test::inChild([&] {
                InitializationFile file(place.path());
                file.open(READ_WRITE);
                file.setValue(L"s", L"k", std::wstring(size, L'x'));
                limitFileSize(limit);
                say("%s; ", messageOf<std::runtime_error>([&] { file.close(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                std::string const left = place.bytes();
                say("%s; ", complete.compare(0, left.size(), left) == 0 ? "prefix" : "other");
                say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                limitFileSize(RLIM_INFINITY);
                say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                say("%s", place.bytes() == complete ? "complete" : "incomplete");
                return 0;
            });
            CHECK(outcome.exitCode == 0);
            std::string const state = "open, mode 3, value of " + std::to_string(size) + "; ";
            CHECK(outcome.out == "failed to write to file; " + state + "prefix; " +
                                     "failed to write to file; " + state + "<nothing>; " + state +
                                     "complete");
        }
    }
}

TEST_CASE("a destructor that cannot write does not end the process") {
    SettingsPlace const place;
    for (std::size_t const size : {1UL, 200000UL}) {
        test::Outcome const outcome = test::inChild([&] {
            limitFileSize(2);
            {
                InitializationFile file(place.path());
                file.open(WRITE);
                file.setValue(L"s", L"k", std::wstring(size, L'x'));
            }
            {
                InitializationFile file(place.path());
                file.open(WRITE);
                file.setValue(L"s", L"k", std::wstring(size, L'x'));
                if (messageOf<std::runtime_error>([&] { file.close(); }) == "<nothing>") return 1;
            }
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
    SettingsPlace const place;
    std::string const small = place.directory() / "small";
    std::filesystem::create_directory(small);
    test::Outcome const outcome = test::inChild([&] {
        Mount const disk("none", small, "tmpfs", 0, "size=64k");
        if (!disk.done()) return CANNOT_MOUNT;
        std::string const path = small + "/settings.ini";
        test::writeFile(path, "[s]\nk=old\n");
        InitializationFile file(path);
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", std::wstring(100000, L'x'));
        say("%s; ", messageOf<std::runtime_error>([&] { file.close(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        file.setValue(L"s", L"k", L"short");
        say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        file.setValue(L"s", L"k", std::wstring(100000, L'x'));
        return 0; // the destructor meets the full disk once more
    });
    if (outcome.exitCode == CANNOT_MOUNT) {
        MESSAGE("no file system can be mounted here: the full disk was not tested");
        return;
    }
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "failed to write to file; open, mode 3, value of 100000; "
                         "failed to write to file; open, mode 3, value of 100000; "
                         "<nothing>; open, mode 3, value of 5; ");
}

namespace {

/// Old content, and the value that is to replace it: shorter, equally long, longer, none at all.
struct Replacement {
    std::string oldBytes;
    wchar_t const* newValue; // null: the table is emptied
    std::string newBytes;
};

Replacement const replacements[] = {
    {"# a comment\n[s]\nk=a rather long old value\nl=1\n", L"v", "[s]\nk=v\nl=1\n"},
    {"[s]\nk=old\nl=1\n", L"new", "[s]\nk=new\nl=1\n"},
    {"[s]\nk=v\nl=1\n", L"a rather long new value", "[s]\nk=a rather long new value\nl=1\n"},
    {"# a comment\n[s]\nk=a rather long old value\nl=1\n", nullptr, ""},
};

/// Puts the new value in and closes. For a child process: nothing is written to the terminal.
std::string replaceValue(std::string const& path, wchar_t const* value) {
    return messageOf<std::runtime_error>([&] {
        InitializationFile file(path);
        file.open(READ_WRITE);
        if (value != nullptr) {
            file.setValue(L"s", L"k", value);
        } else {
            drain(file);
        }
        file.close();
    });
}

} // namespace

TEST_CASE("a file that can be written but not deleted keeps no old tail: another file system") {
    SettingsPlace const place;
    for (Replacement const& row : replacements) {
        CAPTURE(row.newBytes);
        place.write(row.oldBytes);
        test::Outcome const outcome = test::inChild([&] {
            Mount const itself(place.path().c_str(), place.path(), nullptr, MS_BIND, nullptr);
            if (!itself.done()) return CANNOT_MOUNT;
            say("%s", replaceValue(place.path(), row.newValue).c_str());
            return 0;
        });
        if (outcome.exitCode == CANNOT_MOUNT) {
            MESSAGE("nothing can be mounted here: the undeletable file was not tested this way");
            return;
        }
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "<nothing>");
        CHECK(place.bytes() == row.newBytes);
    }
}

TEST_CASE("a file that can be written but not deleted keeps no old tail: a read-only directory") {
    SettingsPlace const place;
    for (Replacement const& row : replacements) {
        CAPTURE(row.newBytes);
        place.write(row.oldBytes);
        REQUIRE(::chmod(place.path().c_str(), 0666) == 0);
        REQUIRE(::chmod(place.directory().path().c_str(), 0555) == 0);
        test::Outcome const outcome = test::inChild([&] {
            // The administrator may delete everything, so become somebody else.
            unsigned const nobody = 65534;
            if (::geteuid() == 0 &&
                (::setgroups(0, nullptr) != 0 || ::setgid(nobody) != 0 || ::setuid(nobody) != 0)) {
                return 1;
            }
            say("%s", replaceValue(place.path(), row.newValue).c_str());
            return 0;
        });
        REQUIRE(::chmod(place.directory().path().c_str(), 0700) == 0);
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "<nothing>");
        CHECK(place.bytes() == row.newBytes);
    }
}

TEST_CASE("a pipe is read to its end") {
    test::TempDir const directory;
    std::string const path = directory / "pipe";
    REQUIRE(::mkfifo(path.c_str(), 0600) == 0);
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        std::string bytes = "[s]\n";
        for (int i = 0; i < 10000; ++i) bytes += "key" + std::to_string(i) + "=value\n";
        std::thread writer([&] { test::writeFile(path, bytes + "[t]\nk=v"); });
        InitializationFile file(path);
        file.open(READ);
        writer.join();
        say("%d ", static_cast<int>(file.enumerateKeys(L"s").size()));
        say("%s ", test::shown(file.getValue(L"t", L"k")).c_str());
        file.close();
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "10000 v ");
    CHECK(std::filesystem::is_fifo(path));
}

// ------------------------------------------------------------------------------- lock and threads

namespace {

struct Action {
    std::string label;
    std::function<void(InitializationFile&)> run;
};

/// Every operation that takes the lock, on a file whose path can be opened.
std::vector<Action> allOperations() {
    return {
        {"open", [](InitializationFile& f) { f.open(READ_WRITE); }},
        {"close", [](InitializationFile& f) { f.close(); }},
        {"synchronize", [](InitializationFile& f) { f.synchronize(); }},
        {"enumerateSections", [](InitializationFile& f) { f.enumerateSections(); }},
        {"createSection", [](InitializationFile& f) { f.createSection(L"n"); }},
        {"createSection that exists", [](InitializationFile& f) { f.createSection(L"s"); }},
        {"removeSection", [](InitializationFile& f) { f.removeSection(L"s"); }},
        {"enumerateKeys", [](InitializationFile& f) { f.enumerateKeys(L"s"); }},
        {"createKey", [](InitializationFile& f) { f.createKey(L"s", L"n"); }},
        {"createKey that exists", [](InitializationFile& f) { f.createKey(L"s", L"k"); }},
        {"removeKey", [](InitializationFile& f) { f.removeKey(L"s", L"k"); }},
        {"removeKey of nothing", [](InitializationFile& f) { f.removeKey(L"s", L"n"); }},
        {"getValue", [](InitializationFile& f) { f.getValue(L"s", L"k"); }},
        {"getValue of nothing", [](InitializationFile& f) { f.getValue(L"s", L"n"); }},
        {"setValue", [](InitializationFile& f) { f.setValue(L"s", L"k", L"w"); }},
        {"setValue of a new key", [](InitializationFile& f) { f.setValue(L"s", L"n", L"w"); }},
    };
}

/// Runs the action on an open file in a child process and says how it ended: "free" when another
/// thread could use the file afterwards. With the lock still held the alarm ends the child.
std::string lockAfter(Action const& action) {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(30);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        try {
            action.run(file);
        } catch (std::exception const& e) {
            say("%s, ", e.what());
        }
        readsBeforeFailure = -1;
        writesBeforeFailure = -1;
        std::thread([&] { file.getValue(L"s", L"k"); }).join();
        say("free");
        file.setMode(0); // the destructor has nothing to write
        return 0;
    });
    return outcome.signal == SIGALRM ? outcome.out + "still held" : outcome.out;
}

} // namespace

TEST_CASE("every operation leaves the lock free") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        CHECK(lockAfter(action) == "free");
    }
}

TEST_CASE("every exception leaves the lock free") {
    CHECK(lockAfter({"open", [](InitializationFile& f) {
                         f.close();
                         f.open(0);
                     }}) == "failed to open file., free");
    CHECK(lockAfter({"read", [](InitializationFile& f) {
                         f.close();
                         readsBeforeFailure = 0;
                         f.open(READ);
                     }}) == "failed to read from file, free");
    CHECK(lockAfter({"close", [](InitializationFile& f) {
                         writesBeforeFailure = 0;
                         f.close();
                     }}) == "failed to write to file, free");
    CHECK(lockAfter({"synchronize, writing", [](InitializationFile& f) {
                         writesBeforeFailure = 0;
                         f.synchronize();
                     }}) == "failed to write to file, free");
    CHECK(lockAfter({"synchronize, reading", [](InitializationFile& f) {
                         readsBeforeFailure = 0;
                         f.synchronize();
                     }}) == "failed to read from file, free");
    CHECK(lockAfter({"synchronize, opening", [](InitializationFile& f) {
                         f.setMode(0);
                         f.synchronize();
                     }}) == "failed to open file., free");
}

TEST_CASE("stream exceptions that a caller enabled leave the lock free") {
    std::string const result =
        lockAfter({"close and open", [](InitializationFile& f) {
                       f.clear();
                       f.exceptions(std::ios::badbit | std::ios::failbit | std::ios::eofbit);
                       f.synchronize();
                   }});
    CAPTURE(result);
    CHECK(result.size() >= 4);
    CHECK(result.substr(result.size() - 4) == "free");
    std::string const writing = lockAfter({"close", [](InitializationFile& f) {
                                               f.clear();
                                               f.exceptions(std::ios::badbit | std::ios::failbit);
                                               writesBeforeFailure = 0;
                                               f.close();
                                           }});
    CAPTURE(writing);
    CHECK(writing != "free");
    CHECK(writing.substr(writing.size() - 4) == "free");
}

TEST_CASE("every operation waits while another thread holds the lock") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        SettingsPlace const place;
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        CHECK(file.lock());
        std::atomic<bool> done{false};
        std::thread other([&] {
            action.run(file);
            done = true;
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        CHECK(!done);
        CHECK(file.unlock());
        other.join();
        CHECK(done);
    }
}

TEST_CASE("every operation works for the thread that holds the lock") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        SettingsPlace const place;
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        CHECK(file.lock());
        CHECK(messageOf<std::exception>([&] { action.run(file); }) == "<nothing>");
        CHECK(file.unlock());
    }
}

TEST_CASE("the destructor waits while another thread holds the lock") {
    SettingsPlace const place;
    auto* const file = new InitializationFile(place.path());
    file->open(WRITE);
    file->setValue(L"s", L"k", L"v");
    CHECK(file->lock());
    std::atomic<bool> done{false};
    std::thread other([&] {
        delete file;
        done = true;
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    CHECK(!done);
    CHECK(place.bytes() == "");
    file->unlock();
    other.join();
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("edits of several threads are not lost while others synchronize") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    int const count = 60;
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t) {
        threads.emplace_back([&file, t] {
            for (int i = 0; i < count; ++i) {
                std::wstring const key = std::to_wstring(t) + L"." + std::to_wstring(i);
                file.setValue(L"section " + std::to_wstring(i % 4), key, L"value " + key);
                file.createKey(L"section 0", L"removed " + key);
                file.removeKey(L"section 0", L"removed " + key);
            }
        });
    }
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) file.synchronize();
    });
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) {
            for (std::wstring const& section : file.enumerateSections()) {
                file.enumerateKeys(section);
            }
        }
    });
    for (std::thread& thread : threads) thread.join();
    file.synchronize();
    checkSame(file.enumerateSections(),
              names({L"section 0", L"section 1", L"section 2", L"section 3"}));
    for (int t = 0; t < 3; ++t) {
        for (int i = 0; i < count; ++i) {
            std::wstring const key = std::to_wstring(t) + L"." + std::to_wstring(i);
            checkSame(file.getValue(L"section " + std::to_wstring(i % 4), key), L"value " + key);
        }
    }
    CHECK(file.enumerateKeys(L"section 1").size() == 3U * count / 4);
}

namespace {

std::atomic<bool> survived{false};

/// Destroys a file with a cancellation of this thread pending.
void* destroyWhileCancelled(void* file) {
    ::pthread_cancel(::pthread_self());
    delete static_cast<InitializationFile*>(file);
    survived = true;
    ::pthread_testcancel();
    return nullptr;
}

void* closeWhileCancelled(void* file) {
    ::pthread_cancel(::pthread_self());
    static_cast<InitializationFile*>(file)->close();
    return nullptr;
}

void* getWhileLocked(void* file) {
    static_cast<InitializationFile*>(file)->getValue(L"s", L"k");
    return nullptr;
}

} // namespace

TEST_CASE("the destructor completes its work in a thread that is being cancelled") {
    SettingsPlace const place;
    place.write("[s]\nk=old\n");
    std::size_t const size = 300000;
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        auto* const file = new InitializationFile(place.path());
        file->open(READ_WRITE);
        file->setValue(L"s", L"k", std::wstring(size, L'n'));
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
    CHECK(place.bytes() == "[s]\nk=" + std::string(size, 'n') + "\n");
}

TEST_CASE("the destructor waits for the lock in a thread that is being cancelled") {
    SettingsPlace const place;
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        auto* const file = new InitializationFile(place.path());
        file->open(WRITE);
        file->setValue(L"s", L"k", L"v");
        file->lock();
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, destroyWhileCancelled, file) != 0) return 1;
        ::usleep(20000);
        file->unlock();
        void* result = nullptr;
        ::pthread_join(thread, &result);
        say("%s, ", survived ? "survived" : "interrupted");
        say("%s", result == PTHREAD_CANCELED ? "cancelled after it" : "not cancelled");
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "survived, cancelled after it");
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("a thread cancelled in close leaves the lock free") {
    SettingsPlace const place;
    place.write("[s]\nk=old\n");
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", std::wstring(300000, L'n'));
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, closeWhileCancelled, &file) != 0) return 1;
        ::pthread_join(thread, nullptr);
        file.enumerateSections(); // waits for ever while the lock is held
        say("free");
        return 0;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.out == "free");
}

TEST_CASE("a thread cancelled while it waits for the lock does no harm") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        InitializationFile file(place.path());
        file.open(READ);
        file.lock();
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, getWhileLocked, &file) != 0) return 1;
        ::usleep(20000);
        ::pthread_cancel(thread);
        void* result = nullptr;
        ::pthread_join(thread, &result);
        say("%s, ", result == PTHREAD_CANCELED ? "cancelled" : "not cancelled");
        file.unlock();
        std::thread([&] { say("%s", test::shown(file.getValue(L"s", L"k")).c_str()); }).join();
        return 0;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.out == "cancelled, v");
}
