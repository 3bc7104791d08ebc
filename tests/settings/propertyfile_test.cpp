// The flat property file: its format, its operations, its life cycle, its failures and its lock;
// and all of it against a plain model, over every short line, random files and random sequences of
// operations.
#include <doctest/doctest.h>

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

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <clocale>
#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <initializer_list>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include <koru/initializationfile.h>
#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/cancellation.h"
#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::File;
using Koru::PropertyFile;
using test::checkSame;
using test::messageOf;
using test::READ;
using test::READ_WRITE;
using test::sameName;
using test::SettingsPlace;
using test::slotOf;
using test::slotOfOpen;
using test::WRITE;
using namespace std::string_literals;

// The reading and writing system calls of this executable and the libraries it loaded pass through
// here, so that a test can make them fail, transfer less than they were asked for or wait.
namespace {

std::atomic<int> readsBeforeFailure{-1};   // -1: none fails
std::atomic<int> writesBeforeFailure{-1};  // -1: none fails
std::atomic<std::size_t> transferLimit{0}; // bytes at once; 0: no limit
std::atomic<std::size_t> bytesRead{0};
std::atomic<int> failedCalls{0};
std::atomic<bool> writesWait{false};
std::atomic<bool> aWriteWaits{false};

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

void _waitIfAsked() {
    while (writesWait) {
        aWriteWaits = true;
        ::usleep(1000);
    }
}

} // namespace

// As the calls of the system do, they let a cancelled thread end.
extern "C" ssize_t read(int fd, void* buffer, size_t count) {
    ::pthread_testcancel();
    if (_failsNow(readsBeforeFailure, EIO)) return -1;
    long const n = ::syscall(SYS_read, fd, buffer, _limited(count));
    if (n > 0) bytesRead += static_cast<std::size_t>(n);
    return static_cast<ssize_t>(n);
}

extern "C" ssize_t write(int fd, void const* buffer, size_t count) {
    ::pthread_testcancel();
    _waitIfAsked();
    if (_failsNow(writesBeforeFailure, ENOSPC)) return -1;
    return static_cast<ssize_t>(::syscall(SYS_write, fd, buffer, _limited(count)));
}

extern "C" ssize_t writev(int fd, iovec const* pieces, int count) {
    ::pthread_testcancel();
    _waitIfAsked();
    if (_failsNow(writesBeforeFailure, ENOSPC)) return -1;
    if (transferLimit != 0 && count > 0) {
        iovec first = pieces[0];
        if (first.iov_len == 0 && count > 1) first = pieces[1];
        first.iov_len = _limited(first.iov_len);
        return static_cast<ssize_t>(::syscall(SYS_writev, fd, &first, 1));
    }
    return static_cast<ssize_t>(::syscall(SYS_writev, fd, pieces, count));
}

// --------------------------------------------------------------------------------------- the model

namespace {

/// An entry of the list.
struct Property {
    std::wstring key;
    std::wstring value;
};

bool operator==(Property const& a, Property const& b) {
    return a.key == b.key && a.value == b.value;
}

using Properties = std::vector<Property>;

std::string shownList(Properties const& list) {
    std::string result;
    for (Property const& p : list) {
        result += test::shown(p.key) + "=" + test::shown(p.value) + "\n";
    }
    return result;
}

void checkList(Properties const& actual, Properties const& expected) {
    if (actual == expected) {
        CHECK(true);
        return;
    }
    INFO("actual:\n", shownList(actual), "expected:\n", shownList(expected));
    CHECK(false);
}

/// As test::checkSame, and quick with the many bytes of a random file.
void checkBytes(std::string const& actual, std::string const& expected) {
    if (actual == expected) {
        CHECK(true);
        return;
    }
    checkSame(actual, expected);
}

std::string untilZero(std::string const& bytes) { return bytes.substr(0, bytes.find('\0')); }

/// Parses one line; a key that stays empty means that it adds nothing.
Property parseLine(std::string line) {
    std::size_t const first = line.find_first_not_of("\t ");
    if (first != std::string::npos) line.erase(0, first);
    std::size_t const last = line.find_last_not_of("\t ");
    if (last != std::string::npos) line.erase(last + 1);

    if (!line.empty() && (line[0] == '#' || line[0] == ';')) return {};
    std::size_t const equals = line.find('=');
    if (equals == std::string::npos) return {L"", Koru::make_wstring(untilZero(line))};
    return {Koru::make_wstring(untilZero(line.substr(0, equals))),
            Koru::make_wstring(untilZero(line.substr(equals + 1)))};
}

Properties parse(std::string const& bytes) {
    Properties list;
    std::size_t at = 0;
    while (at < bytes.size()) {
        if (bytes[at] == '\n') {
            ++at;
            continue;
        }
        std::size_t const end = std::min(bytes.find('\n', at), bytes.size());
        Property const property = parseLine(bytes.substr(at, end - at));
        if (!property.key.empty()) list.push_back(property);
        at = end;
    }
    return list;
}

std::string textOf(Properties const& list) {
    std::string text;
    for (Property const& p : list) {
        text += Koru::make_string(p.key) + "=" + Koru::make_string(p.value) + "\n";
    }
    return text;
}

/// What a property file does, in the plainest way: a list, every operation a loop over all of it,
/// and a file that is a string.
class PropertyFileModel {
public:
    Properties list;
    bool exists = false; ///< whether the file is on the disk
    std::string bytes;   ///< what it holds then

    bool isOpen() const { return open_; }
    unsigned long getMode() const { return mode_; }
    void setMode(unsigned long mode) { mode_ = mode; }

    /// False where the library throws "failed to open file.".
    bool open(unsigned long mode) {
        if (!open_ && !openStream(mode)) return false;
        mode_ = mode;
        list.clear();
        if (reads(mode) && readable_) list = parse(bytes);
        return true;
    }

    void close() {
        if (writes(mode_)) {
            exists = true;
            bytes = textOf(list);
        }
        list.clear();
        open_ = false;
        mode_ = 0;
    }

    bool synchronize() {
        if (!open_) return true;
        unsigned long const mode = mode_;
        close();
        return open(mode);
    }

    std::vector<std::wstring> enumerateKeys() const {
        std::vector<std::wstring> keys;
        for (Property const& p : list) keys.push_back(p.key);
        return keys;
    }

    void createKey(std::wstring const& key) {
        if (find(key) == list.size()) list.push_back({key, L""});
    }

    void removeKey(std::wstring const& key) {
        std::size_t const at = find(key);
        if (at < list.size()) list.erase(list.begin() + static_cast<std::ptrdiff_t>(at));
    }

    std::wstring getValue(std::wstring const& key) const {
        std::size_t const at = find(key);
        return at < list.size() ? list[at].value : std::wstring();
    }

    void setValue(std::wstring const& key, std::wstring const& value) {
        std::size_t const at = find(key);
        if (at < list.size()) {
            list[at].value = value;
        } else {
            list.push_back({key, value});
        }
    }

private:
    bool open_ = false;
    bool readable_ = false; // of the open stream, whatever mode was set since
    unsigned long mode_ = 0;

    static bool reads(unsigned long mode) { return (mode & READ) != 0; }
    static bool writes(unsigned long mode) { return (mode & WRITE) != 0; }

    bool openStream(unsigned long mode) {
        if (!reads(mode) && !writes(mode)) return false;
        if (!writes(mode) && !exists) return false;
        if (!reads(mode) || !exists) bytes.clear();
        exists = true;
        open_ = true;
        readable_ = reads(mode);
        return true;
    }

    std::size_t find(std::wstring const& key) const {
        for (std::size_t i = 0; i < list.size(); ++i) {
            if (sameName(list[i].key, key)) return i;
        }
        return list.size();
    }
};

// ------------------------------------------------------------------------- looking at the
// library's

/// Takes the list apart from its front and returns it, each entry exactly as it is held: when an
/// entry's turn comes, those before it are gone.
Properties drain(PropertyFile& file) {
    Properties all;
    for (std::wstring const& key : file.enumerateKeys()) {
        all.push_back({key, file.getValue(key)});
        file.removeKey(key);
    }
    CHECK(file.enumerateKeys().empty());
    return all;
}

/// The list that a file of these bytes is read into.
Properties listOf(SettingsPlace const& place, std::string const& bytes) {
    place.write(bytes);
    PropertyFile file(place.path());
    file.open(READ);
    return drain(file);
}

/// The bytes that a list, filled in this order, is written as.
std::string bytesOf(SettingsPlace const& place, Properties const& list) {
    PropertyFile file(place.path());
    file.open(WRITE);
    for (Property const& p : list) file.setValue(p.key, p.value);
    file.close();
    return place.bytes();
}

/// Every key and value that the library gives is the model's.
void checkAgrees(PropertyFile& file, PropertyFileModel const& model) {
    Properties actual;
    for (std::wstring const& key : file.enumerateKeys()) {
        actual.push_back({key, file.getValue(key)});
    }
    Properties expected;
    for (Property const& p : model.list) expected.push_back({p.key, model.getValue(p.key)});
    checkList(actual, expected);
}

/// Opens a file of these bytes, compares with the model, writes it back and compares the bytes,
/// then reads and compares again.
void checkFile(SettingsPlace const& place, std::string const& bytes) {
    place.write(bytes);
    PropertyFileModel model;
    model.exists = true;
    model.bytes = bytes;
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    CHECK(model.open(READ_WRITE));
    checkAgrees(file, model);
    file.synchronize();
    CHECK(model.synchronize());
    checkBytes(place.bytes(), model.bytes);
    checkAgrees(file, model);
    file.close();
    model.close();
    checkBytes(place.bytes(), model.bytes);
}

struct Row {
    std::string label;
    std::string bytes;
    Properties expected;
};

void checkRows(std::vector<Row> const& rows) {
    SettingsPlace const place;
    for (Row const& row : rows) {
        CAPTURE(row.label);
        checkList(listOf(place, row.bytes), row.expected);
        checkFile(place, row.bytes);
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

TEST_CASE("a property file is a file, a stream and not copyable") {
    static_assert(std::is_base_of<File, PropertyFile>::value, "");
    static_assert(std::is_convertible<PropertyFile*, std::fstream*>::value, "");
    // Only a base that is not virtual can be cast down.
    static_assert(std::is_same<decltype(static_cast<PropertyFile*>(std::declval<File*>())),
                               PropertyFile*>::value,
                  "");
    static_assert(std::is_constructible<PropertyFile, File::Path const&>::value, "");
    static_assert(!std::is_copy_constructible<PropertyFile>::value, "");
    static_assert(!std::is_copy_assignable<PropertyFile>::value, "");
    static_assert(std::has_virtual_destructor<PropertyFile>::value, "");
    static_assert(std::is_nothrow_destructible<PropertyFile>::value, "");
}

TEST_CASE("the published line length is the largest of a 32-bit unsigned long") {
    static_assert(std::is_same<decltype(PropertyFile::MAX_LINE_LENGTH), unsigned long const>::value,
                  "");
    static_assert(PropertyFile::MAX_LINE_LENGTH == 4294967295UL, "");
    unsigned long const length = PropertyFile::MAX_LINE_LENGTH;
    CHECK(length == 4294967295UL);
}

TEST_CASE("the virtual operations keep their order behind the two entries of the destructor") {
    CHECK(slotOfOpen<PropertyFile>() == 2);
    CHECK(slotOf(&PropertyFile::close) == 3);
    CHECK(slotOf(&PropertyFile::synchronize) == 4);
    CHECK(slotOf(&PropertyFile::getMode) == 5);
    CHECK(slotOf(&PropertyFile::setMode) == 6);
    CHECK(slotOf(&PropertyFile::enumerateKeys) == 7);
    CHECK(slotOf(&PropertyFile::createKey) == 8);
    CHECK(slotOf(&PropertyFile::removeKey) == 9);
    CHECK(slotOf(&PropertyFile::getValue) == 10);
    CHECK(slotOf(&PropertyFile::setValue) == 11);
}

TEST_CASE("a new object is closed, has mode 0, an empty list and the path's name") {
    PropertyFile nameless;
    CHECK(!nameless.is_open());
    CHECK(nameless.getMode() == 0UL);
    CHECK(nameless.getName().empty());
    CHECK(nameless.enumerateKeys().empty());

    SettingsPlace const place;
    File::Path const path(place.path());
    PropertyFile file(path);
    CHECK(!file.is_open());
    CHECK(file.good());
    CHECK(file.getMode() == 0UL);
    checkSame(file.getName(), static_cast<std::wstring>(path));
    CHECK(file.enumerateKeys().empty());
    checkSame(file.getValue(L"k"), L"");
    CHECK(!place.exists());
}

// -------------------------------------------------------------------------------------- the format

TEST_CASE("lines become entries as the format says") {
    checkRows({
        {"nothing", "", {}},
        {"one line feed", "\n", {}},
        {"line feeds", "\n\n\n\n", {}},
        {"an entry", "k=v\n", {{L"k", L"v"}}},
        {"the last line without line feed", "a=1\nk=v", {{L"a", L"1"}, {L"k", L"v"}}},
        {"blank lines between", "\n\na=1\n\n\nk=v\n\n\n", {{L"a", L"1"}, {L"k", L"v"}}},
        {"a comment between", "b=2\n# note\na=1\n", {{L"b", L"2"}, {L"a", L"1"}}},
        {"trimmed", "  key=value\t\n", {{L"key", L"value"}}},
        {"trimmed of many", " \t \tkey=value\t \t  \n", {{L"key", L"value"}}},
        {"trimmed without line feed", " \tk=v \t", {{L"k", L"v"}}},
        {"not trimmed at the equals", "name = value\n", {{L"name ", L" value"}}},
        {"tabs at the equals", "k\t=\tv\n", {{L"k\t", L"\tv"}}},
        {"an empty value", "k=\n", {{L"k", L""}}},
        {"a value of blanks", "k=  \t\n", {{L"k", L""}}},
        {"a key of a trailing blank, no value", " k =\n", {{L"k ", L""}}},
        {"the first equals counts", "k=a=b==\n", {{L"k", L"a=b=="}}},
        {"two equals", "k==\n", {{L"k", L"="}}},
        {"an empty key", "=x\n", {}},
        {"an empty key after trimming", "  =5\n", {}},
        {"only an equals", "=\n", {}},
        {"only equals", "===\n", {}},
        {"a key of blanks cannot be", " \t = 5\n", {}},
        {"no equals", "word\nk=v\nmore words\n", {{L"k", L"v"}}},
        {"no equals at the end", "k=v\nword", {{L"k", L"v"}}},
        {"a line of blanks", "  \n\t\t\n \t \nk=v\n", {{L"k", L"v"}}},
        {"blanks at the end", "k=v\n \t ", {{L"k", L"v"}}},
        {"inner blanks stay", "a  b\t=c  d\n", {{L"a  b\t", L"c  d"}}},
        {"quotes are text", "\"k\"='v'\n", {{L"\"k\"", L"'v'"}}},
        {"backslashes are text", "k=a\\\nb=c\\n\n", {{L"k", L"a\\"}, {L"b", L"c\\n"}}},
        {"a colon separates nothing", "k:v\na:b=c\n", {{L"a:b", L"c"}}},
        {"other white space is text", "\v\f k=v \v\f\n", {{L"\v\f k", L"v \v\f"}}},
    });
}

TEST_CASE("a line that begins with # or ; is a comment") {
    checkRows({
        {"both", "#a=1\n;b=2\nk=v\n", {{L"k", L"v"}}},
        {"indented", "  #a=1\n\t;b=2\n \t ;\nk=v\n", {{L"k", L"v"}}},
        {"behind the start", "k#a=v ; w # x\n", {{L"k#a", L"v ; w # x"}}},
        {"as first byte of a value", "k=#v\nl=;w\n", {{L"k", L"#v"}, {L"l", L";w"}}},
        {"bare", "#\n;\n##\n;;\nk=v\n", {{L"k", L"v"}}},
        {"without line feed", "k=v\n#a=1", {{L"k", L"v"}}},
        {"other signs are none", "//a=1\n!b=2\n", {{L"//a", L"1"}, {L"!b", L"2"}}},
        {"does not go on in the next line", "#a \\\nk=v\n", {{L"k", L"v"}}},
    });
}

TEST_CASE("there are no sections: a line that begins with [ is a line like any other") {
    checkRows({
        {"a header adds nothing", "[Main]\n", {}},
        {"with an equals", "[x]=1\n", {{L"[x]", L"1"}}},
        {"with an equals inside", "[a=b]\n", {{L"[a", L"b]"}}},
        {"only a bracket", "[=\n", {{L"[", L""}}},
        {"many brackets", "[[[=]]]\n", {{L"[[[", L"]]]"}}},
        {"between entries",
         "a=1\n[s]\na=2\n[]\n[\n]=3\n",
         {{L"a", L"1"}, {L"a", L"2"}, {L"]", L"3"}}},
        {"indented", "\t [x] = 1 \n", {{L"[x] ", L" 1"}}},
    });
}

TEST_CASE("a carriage return is ordinary text") {
    checkRows({
        {"at the end of lines", "k=v\r\nl=\r\n", {{L"k", L"v\r"}, {L"l", L"\r"}}},
        {"blank lines", "\r\n\r\nk=v\n", {{L"k", L"v"}}},
        {"ends no line", "k=v\rl=w\n", {{L"k", L"v\rl=w"}}},
        {"keeps what is before it", "k=v \t\r\n", {{L"k", L"v \t\r"}}},
        {"before a comment", "\r#a=1\n", {{L"\r#a", L"1"}}},
        {"as a key", "\r=1\r\n", {{L"\r", L"1\r"}}},
        {"alone at the end", "k=v\n\r", {{L"k", L"v"}}},
    });
}

TEST_CASE("key and value each end at their first NUL, and lines do not") {
    checkRows({
        {"in a value", "k=a\0b\n"s, {{L"k", L"a"}}},
        {"in a key", "a\0b=c\n"s, {{L"a", L"c"}}},
        {"in both", "c\0d=e\0f\n"s, {{L"c", L"e"}}},
        {"more than one", "c\0d\0=e\0f\0\n"s, {{L"c", L"e"}}},
        {"before the equals", "k\0=v\n"s, {{L"k", L"v"}}},
        {"behind the equals", "k=\0v\n"s, {{L"k", L""}}},
        {"a key of none", "\0k=v\n"s, {}},
        {"before a comment sign", "\0#k=v\n"s, {}},
        {"an equals behind one in a key", "a\0=b=c\n"s, {{L"a", L"b=c"}}},
        {"keeps trailing blanks", "k=v \0 \n"s, {{L"k", L"v "}}},
        {"keeps a key's blanks", "k \0 =v\n"s, {{L"k ", L"v"}}},
        {"a line of them", "\0\0\0\nk=v\n"s, {{L"k", L"v"}}},
        {"a file of them", "\0\0\0"s, {}},
    });
}

TEST_CASE("text is UTF-8, decoded as make_wstring decodes it, each part by itself") {
    checkRows({
        {"two, three and four bytes",
         "\xC3\xA9\xE2\x82\xAC=\xF0\x9F\x98\x80\n",
         {{L"\u00E9\u20AC", L"\U0001F600"}}},
        {"six bytes", "k=\xFD\xBF\xBF\xBF\xBF\xBF\n", {{L"k", L"\x7FFFFFFF"}}},
        {"five bytes", "k=\xF8\x88\x80\x80\x80\n", {{L"k", L"\x200000"}}},
        {"a surrogate",
         "k=\xED\xA0\x80\n",
         {{L"k", std::wstring(1, static_cast<wchar_t>(0xD800))}}},
        {"cut by the equals", "k\xC3=\xA9\n", {{L"k?", L"?"}}},
        {"cut by the line feed", "k=\xE2\x82\nl=w\n", {{L"k", L"??"}, {L"l", L"w"}}},
        {"cut by the end of the file", "k=\xF0\x9F\x98", {{L"k", L"???"}}},
        {"cut by a NUL", "k\xC3\0\xA9=\xC3\0\xA9\n"s, {{L"k?", L"?"}}},
        {"a stray byte near the end",
         "k=\x80"
         "abc\n",
         {{L"k", L"?abc"}}},
        {"a stray byte with five more",
         "k=\x80"
         "abcdef\n",
         {{L"k", L"\x218A3925"
                 L"f"}}},
        {"an overlong letter", "\xC1\x81=v\n", {{L"A", L"v"}}},
        {"an overlong equals is none", "k\xC0\xBD=v\n", {{L"k=", L"v"}}},
        {"an overlong equals alone", "k\xC0\xBDv\n", {}},
        {"an overlong comment sign is none", "\xC0\xA3k=v\n", {{L"#k", L"v"}}},
        {"an overlong blank is not trimmed", "k=v\xC0\xA0\n", {{L"k", L"v "}}},
        {"an overlong line feed ends no line", "k=v\xC0\x8Al=w\n", {{L"k", L"v\nl=w"}}},
        {"an overlong zero ends the value",
         "k=a\xC0\x80"
         "b\n",
         {{L"k", L"a"}}},
        {"an overlong zero ends the key",
         "a\xC0\x80"
         "b=v\n",
         {{L"a", L"v"}}},
        {"an overlong zero as key", "\xC0\x80=v\n", {}},
        {"a byte order mark", "\xEF\xBB\xBFk=v\n", {{L"\uFEFFk", L"v"}}},
        {"a byte order mark before a comment", "\xEF\xBB\xBF#k=v\n", {{L"\uFEFF#k", L"v"}}},
        {"a no-break space is not trimmed", "\xC2\xA0k=v\xC2\xA0\n", {{L"\u00A0k", L"v\u00A0"}}},
    });
}

TEST_CASE("lines of any length and files of any size are read") {
    SettingsPlace const place;
    SUBCASE("a long value and key") {
        Properties const expected{{std::wstring(200000, L'k'), std::wstring(3000000, L'v')},
                                  {L"a", L"1"}};
        CHECK(listOf(place, std::string(200000, 'k') + "=" + std::string(3000000, 'v') + "\na=1") ==
              expected);
    }
    SUBCASE("long white space, long comments and long lines without equals") {
        std::string const blanks(100000, ' ');
        std::string const tabs(100000, '\t');
        std::string const lines(100000, '\n');
        checkList(listOf(place, lines + blanks + "word" + tabs + "\n" + lines + tabs + "k=v" +
                                    blanks + "\n#" + blanks + "a=1\n" + blanks + tabs),
                  {{L"k", L"v"}});
    }
    SUBCASE("lines around the sizes of buffers") {
        for (std::size_t const size : {512UL, 1024UL, 4096UL, 8191UL, 8192UL, 65536UL}) {
            for (std::size_t filler = size - 12; filler <= size + 2; ++filler) {
                CAPTURE(size);
                CAPTURE(filler);
                std::string const comment = "#" + std::string(filler - 2, 'x') + "\n";
                checkList(listOf(place, comment + "key=value\n\nlast=1"),
                          {{L"key", L"value"}, {L"last", L"1"}});
            }
        }
    }
}

TEST_CASE("a hundred thousand lines are loaded, found and written in their order") {
    SettingsPlace const place;
    int const count = 100000;
    std::string bytes;
    std::vector<int> order;
    for (int i = 0; i < count; ++i) {
        int const number = static_cast<int>(i * 7919LL % count);
        order.push_back(number);
        bytes += "Key " + std::to_string(number) + "=value " + std::to_string(i) + "\n";
    }
    place.write(bytes);
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    std::vector<std::wstring> const keys = file.enumerateKeys();
    REQUIRE(keys.size() == static_cast<std::size_t>(count));
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
    int const stride = 37; // each lookup takes a hundred times as long there
#else
    int const stride = 1;
#endif
    bool everyKey = true;
    bool everyValue = true;
    for (int i = 0; i < count; ++i) {
        std::wstring const number = std::to_wstring(order[static_cast<std::size_t>(i)]);
        everyKey = everyKey && keys[static_cast<std::size_t>(i)] == L"Key " + number;
        if (i % stride != 0) continue;
        std::wstring const value = L"value " + std::to_wstring(i);
        everyValue = everyValue && file.getValue(L"kEY " + number) == value;
    }
    CHECK(everyKey);
    CHECK(everyValue);
    checkSame(file.getValue(L"Key 100000"), L"");
    checkSame(file.getValue(L"Key"), L"");
    file.setValue(L"KEY 0", L"first");
    file.setValue(L"new", L"last");
    file.removeKey(L"key 7919"); // the second
    file.close();
    bytes.replace(0, bytes.find('\n'), "Key 0=first");
    bytes.erase(bytes.find("Key 7919="), std::strlen("Key 7919=value 1\n"));
    CHECK(place.bytes() == bytes + "new=last\n");
}

TEST_CASE("the order of the list is that of the lines, whatever the keys are") {
    SettingsPlace const place;
    std::string const bytes = "z=1\nb=2\nA=3\na=4\nY=5\nB=6\n_=7\n0=8\na=9\n";
    checkList(listOf(place, bytes), {{L"z", L"1"},
                                     {L"b", L"2"},
                                     {L"A", L"3"},
                                     {L"a", L"4"},
                                     {L"Y", L"5"},
                                     {L"B", L"6"},
                                     {L"_", L"7"},
                                     {L"0", L"8"},
                                     {L"a", L"9"}});
    place.write(bytes);
    for (int i = 0; i < 3; ++i) {
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        file.close();
        CHECK(place.bytes() == bytes);
    }
}

TEST_CASE("the list is written as a line per entry in its order, and nothing else") {
    SettingsPlace const place;
    CHECK(bytesOf(place, {}) == "");
    CHECK(bytesOf(place, {{L"k", L"v"}}) == "k=v\n");
    CHECK(bytesOf(place, {{L"k", L""}}) == "k=\n");
    CHECK(bytesOf(place, {{L"z", L"1"}, {L"y", L"2"}, {L"A", L"3"}}) == "z=1\ny=2\nA=3\n");
    CHECK(bytesOf(place, {{L"k ", L" v "}}) == "k = v \n");
    CHECK(bytesOf(place, {{L"", L"w"}}) == "=w\n");
    CHECK(bytesOf(place, {{L"", L""}}) == "=\n");
    // Nothing is escaped.
    CHECK(bytesOf(place, {{L"#k=\n", L"v\n;"}}) == "#k=\n=v\n;\n");
}

TEST_CASE("comments, blank lines and spacing are lost when written, the order is not") {
    SettingsPlace const place;
    place.write("# top\n[Main]\n\n  z = 1  \n; c\n a=2\n\n\nword\n=x\nM=v");
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "z = 1\na=2\nM=v\n");
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "z = 1\na=2\nM=v\n");
}

TEST_CASE("text is written as make_string encodes it") {
    SettingsPlace const place;
    CHECK(bytesOf(place, {{L"\u00E9\u20AC", L"\U0001F600"}}) ==
          "\xC3\xA9\xE2\x82\xAC=\xF0\x9F\x98\x80\n");
    CHECK(bytesOf(place, {{L"k", L"\x7FFFFFFF"}}) == "k=\xFD\xBF\xBF\xBF\xBF\xBF\n");
    CHECK(bytesOf(place, {{L"k\0l"s, L"v\0w"s}}) == "k=v\n");
    // Of a unit of 0x80000000 and above its low byte is written, and if that is zero, no more.
    std::wstring const high{static_cast<wchar_t>(0x80000041), L'b',
                            static_cast<wchar_t>(0xFFFFFFC3)};
    CHECK(bytesOf(place, {{L"k", high}}) == "k=Ab\xC3\n");
    std::wstring const zero{L'a', static_cast<wchar_t>(0x80000000), L'b'};
    CHECK(bytesOf(place, {{zero, zero}}) == "a=a\n");
    std::wstring const surrogate{static_cast<wchar_t>(0xD800)};
    CHECK(bytesOf(place, {{L"k", surrogate}}) == "k=\xED\xA0\x80\n");
}

TEST_CASE("malformed text is written as it was decoded") {
    SettingsPlace const place;
    place.write("s\xC3=1\n\xC1\x81=\x80xyz\nb=\xC0\x80lost\nc=\xF0\x82\x82\xAC\n");
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    file.close();
    CHECK(place.bytes() == "s?=1\nA=?xyz\nb=\nc=\xE2\x82\xAC\n");
}

TEST_CASE("keys and values of every length are written whole") {
    SettingsPlace const place;
    Properties list;
    for (std::size_t length = 0; length <= 600; ++length) {
        list.push_back({std::to_wstring(length) + std::wstring(length, L'k'),
                        std::wstring(length, L'\u00E9')});
    }
    CHECK(bytesOf(place, list) == textOf(list));
    checkList(listOf(place, place.bytes()), list);
}

TEST_CASE("the stream's formatting does not show in the file") {
    SettingsPlace const place;
    place.write(" a=1\n\n\tb=2\n");
    PropertyFile file(place.path());
    file.width(30);
    file.fill('*');
    file.setf(std::ios::left | std::ios::unitbuf | std::ios::showbase);
    file.unsetf(std::ios::skipws);
    file.open(READ_WRITE);
    checkSame(file.enumerateKeys(), names({L"a", L"b"}));
    file.width(30);
    file.close();
    CHECK(place.bytes() == "a=1\nb=2\n");
}

TEST_CASE("what the format cannot carry is another list when read again") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"", L"lost");
    file.setValue(L"#comment", L"lost");
    file.setValue(L" ;comment", L"lost");
    file.setValue(L"a=b", L"c");
    file.setValue(L"  k", L"v \t");
    file.setValue(L" ", L"lost");
    file.setValue(L"two", L"lines\nx=y");
    file.createKey(L"empty");
    file.setValue(L"[s]", L"kept");
    file.synchronize();
    CHECK(place.bytes() == "=lost\n#comment=lost\n ;comment=lost\na=b=c\n  k=v \t\n =lost\n"
                           "two=lines\nx=y\nempty=\n[s]=kept\n");
    checkList(drain(file), {{L"a", L"b=c"},
                            {L"k", L"v"},
                            {L"two", L"lines"},
                            {L"x", L"y"},
                            {L"empty", L""},
                            {L"[s]", L"kept"}});
}

TEST_CASE("duplicates survive writing and reading") {
    SettingsPlace const place;
    std::string const bytes = "b=1\na=2\nB=3\na=2\nA=5\n";
    place.write(bytes);
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    file.synchronize();
    CHECK(place.bytes() == bytes);
    checkSame(file.enumerateKeys(), names({L"b", L"a", L"B", L"a", L"A"}));
}

// ---------------------------------------------------------------------------------- the operations

TEST_CASE("a missing key gives an empty value or no effect") {
    SettingsPlace const place;
    place.write("k=v\nempty=\n");
    PropertyFile file(place.path());
    file.open(READ);
    checkSame(file.getValue(L"missing"), L"");
    checkSame(file.getValue(L""), L"");
    checkSame(file.getValue(L"empty"), L"");
    file.removeKey(L"missing");
    file.removeKey(L"");
    checkList(drain(file), {{L"k", L"v"}, {L"empty", L""}});
    file.removeKey(L"k");
    checkSame(file.getValue(L"k"), L"");
}

TEST_CASE("keys match without regard to case and in full") {
    SettingsPlace const place;
    place.write("Host=a\nHostname=b\nname =c\n");
    PropertyFile file(place.path());
    file.open(READ);
    checkSame(file.getValue(L"hOST"), L"a");
    checkSame(file.getValue(L"HOSTNAME"), L"b");
    checkSame(file.getValue(L"NAME "), L"c");
    checkSame(file.getValue(L"name"), L"");
    checkSame(file.getValue(L"Hos"), L"");
    checkSame(file.getValue(L"Host "), L"");
    checkSame(file.getValue(L" Host"), L"");
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
        file.setValue(pair.held, L"x");
        checkSame(file.getValue(pair.asked), L"");
        checkSame(file.getValue(pair.held), L"x");
    }
}

TEST_CASE("setValue replaces the first entry's value in its place and keeps its key's case") {
    SettingsPlace const place;
    place.write("b=2\n# note\na=1\nB=4\n");
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"B", L"3");
    file.setValue(L"A", L"");
    checkSame(file.enumerateKeys(), names({L"b", L"a", L"B"}));
    checkSame(file.getValue(L"b"), L"3");
    file.close();
    CHECK(place.bytes() == "b=3\na=\nB=4\n");
}

TEST_CASE("setValue adds a missing entry at the end of the list") {
    SettingsPlace const place;
    place.write("m=1\n");
    PropertyFile file(place.path());
    file.open(READ);
    file.setValue(L"a", L"2");
    file.setValue(L"Z", L"3");
    file.setValue(L"", L"4");
    file.setValue(L"", L"5");
    file.setValue(L"b", L"");
    checkList(drain(file), {{L"m", L"1"}, {L"a", L"2"}, {L"Z", L"3"}, {L"", L"5"}, {L"b", L""}});
}

TEST_CASE("createKey adds a missing entry and keeps the value of one that exists") {
    SettingsPlace const place;
    place.write("m=1\nM=2\n");
    PropertyFile file(place.path());
    file.open(READ);
    file.createKey(L"M");
    file.createKey(L"new");
    file.createKey(L"NEW");
    file.createKey(L"");
    file.createKey(L"");
    file.createKey(L"a");
    checkList(drain(file), {{L"m", L"1"}, {L"M", L"2"}, {L"new", L""}, {L"", L""}, {L"a", L""}});
}

TEST_CASE("removeKey removes only the first of two keys that differ in case") {
    SettingsPlace const place;
    place.write("k=1\nK=2\n");
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    checkSame(file.getValue(L"k"), L"1");
    checkSame(file.getValue(L"K"), L"1");
    checkSame(file.enumerateKeys(), names({L"k", L"K"}));
    file.removeKey(L"k");
    checkSame(file.enumerateKeys(), names({L"K"}));
    checkSame(file.getValue(L"k"), L"2");
    file.close();
    CHECK(place.bytes() == "K=2\n");
}

TEST_CASE("later entries move up in order when one is removed") {
    SettingsPlace const place;
    place.write("a=1\nb=2\nB=3\nb=4\nc=5\n");
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    file.removeKey(L"B");
    checkSame(file.getValue(L"b"), L"3");
    checkSame(file.enumerateKeys(), names({L"a", L"B", L"b", L"c"}));
    file.setValue(L"b", L"new");
    file.removeKey(L"a");
    checkSame(file.getValue(L"C"), L"5");
    file.setValue(L"A", L"6"); // comes back at the end, spelt anew
    file.close();
    CHECK(place.bytes() == "B=new\nb=4\nc=5\nA=6\n");
}

TEST_CASE("values and keys are held as they were set until they are written") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    std::wstring const odd{L'a',
                           L'\0',
                           L'b',
                           static_cast<wchar_t>(0x80000041),
                           static_cast<wchar_t>(0xFFFFFFFF),
                           static_cast<wchar_t>(0xD800),
                           L'\n'};
    file.setValue(L"k", odd);
    CHECK(file.getValue(L"k") == odd);
    file.setValue(L"n\0one"s, L"v\0"s);
    CHECK(file.enumerateKeys() == std::vector<std::wstring>{L"k", L"n\0one"s});
    // Keys are compared up to their first NUL.
    CHECK(file.getValue(L"N") == L"v\0"s);
    file.setValue(L"N\0two"s, L"\0w"s);
    CHECK(file.getValue(L"n\0three"s) == L"\0w"s);
    file.createKey(L"n");
    file.createKey(L"\0x"s);
    file.createKey(L"");
    CHECK(file.enumerateKeys() == std::vector<std::wstring>{L"k", L"n\0one"s, L"\0x"s});
    file.removeKey(L"\0y"s);
    file.synchronize();
    CHECK(place.bytes() == "k=a\nn=\n");
    checkList(drain(file), {{L"k", L"a"}, {L"n", L""}});
}

TEST_CASE("keys of units that no UTF-8 gives are found again") {
    PropertyFile file;
    for (unsigned long const unit : {0x80000000UL, 0x80000041UL, 0xC0000000UL, 0xFFFFFFFFUL,
                                     0x7FFFFFFFUL, 0xD800UL, 0x110000UL}) {
        CAPTURE(unit);
        std::wstring const key{L'n', static_cast<wchar_t>(unit), L'x'};
        file.setValue(key, key);
        CHECK(file.getValue({L'N', static_cast<wchar_t>(unit), L'X'}) == key);
        CHECK(file.enumerateKeys().back() == key);
    }
}

TEST_CASE("results are copies that later changes do not touch") {
    SettingsPlace const place;
    place.write("a=1\nb=2\n");
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    std::vector<std::wstring> const keys = file.enumerateKeys();
    std::wstring const value = file.getValue(L"a");
    file.setValue(keys[0], value + value);
    file.removeKey(keys[1]);
    file.synchronize();
    file.close();
    checkSame(keys, names({L"a", L"b"}));
    checkSame(value, L"1");
    CHECK(place.bytes() == "a=11\n");
}

TEST_CASE("the operations work on an object that was never opened") {
    PropertyFile file;
    file.setValue(L"k", L"v");
    file.createKey(L"l");
    file.removeKey(L"K");
    file.setValue(L"L", L"w");
    checkList(drain(file), {{L"l", L"w"}});
    CHECK(file.good());
}

TEST_CASE("a list that empties and fills again and again holds what was set last") {
    SettingsPlace const place;
    place.write("a=from the file\nb=from the file\n");
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    for (int i = 0; i < 1000; ++i) {
        std::wstring const number = std::to_wstring(i);
        file.removeKey(L"A");
        file.removeKey(L"B");
        CHECK(file.enumerateKeys().empty());
        file.setValue(L"b", number);
        file.createKey(L"a");
        file.setValue(L"A", number + std::wstring(static_cast<std::size_t>(i % 9), L'x'));
        checkSame(file.getValue(L"B"), number);
    }
    file.close();
    CHECK(place.bytes() == "b=999\na=999\n");
}

// ---------------------------------------------------------------------------------- the life cycle

TEST_CASE("opening a missing file fails for reading and creates it for writing") {
    SettingsPlace const place;
    PropertyFile file(place.path());
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
    place.write("k=v\n");
    PropertyFile file(place.path());
    unsigned long const binary = File::BINARY;
    for (unsigned long const mode : {0UL, 4UL, binary}) {
        CHECK(messageOf<std::runtime_error>([&] { file.open(mode); }) == "failed to open file.");
        CHECK(!file.is_open());
        CHECK(file.getMode() == 0UL);
    }
    CHECK(place.bytes() == "k=v\n");
}

TEST_CASE("an open that fails leaves the list as it was") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.setValue(L"k", L"v");
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    checkSame(file.getValue(L"k"), L"v");
    CHECK(file.getMode() == 0UL);

    PropertyFile nameless;
    nameless.setValue(L"k", L"v");
    CHECK(messageOf<std::runtime_error>([&] { nameless.open(READ_WRITE); }) ==
          "failed to open file.");
    checkSame(nameless.getValue(L"k"), L"v");
}

TEST_CASE("open discards what the list held") {
    SettingsPlace const place;
    place.write("k=v\n");
    PropertyFile file(place.path());
    file.setValue(L"early", L"v");
    file.open(READ_WRITE);
    checkSame(file.enumerateKeys(), names({L"k"}));
    file.close();
    file.setValue(L"between", L"v");
    file.open(WRITE);
    CHECK(file.enumerateKeys().empty());
    file.close();
    CHECK(place.bytes() == "");
}

TEST_CASE("changes without the write bit vanish at close and the file stays untouched") {
    SettingsPlace const place;
    std::string const bytes = "; comment\n\n k = v\r\n";
    place.write(bytes);
    auto const time = std::filesystem::last_write_time(place.path());
    PropertyFile file(place.path());
    file.open(READ);
    file.setValue(L"k ", L"changed");
    file.createKey(L"new");
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.enumerateKeys().empty());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
    file.open(READ);
    checkList(drain(file), {{L"k ", L" v\r"}});
    file.close();
    CHECK(place.bytes() == bytes);
    CHECK(std::filesystem::last_write_time(place.path()) == time);
}

TEST_CASE("opening for writing alone begins with an empty list and replaces the whole file") {
    SettingsPlace const place;
    place.write("old=v\n");
    PropertyFile file(place.path());
    file.open(WRITE);
    CHECK(file.enumerateKeys().empty());
    CHECK(place.bytes() == "");
    file.setValue(L"new", L"v");
    CHECK(place.bytes() == "");
    file.close();
    CHECK(place.bytes() == "new=v\n");
    CHECK(file.enumerateKeys().empty());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0UL);
}

TEST_CASE("the mode keeps the bits without a meaning") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    unsigned long const mode = READ_WRITE | File::BINARY | 0x40UL;
    file.open(mode);
    CHECK(file.getMode() == mode);
    file.setValue(L"k", L"v");
    file.synchronize();
    CHECK(file.getMode() == mode);
    checkSame(file.getValue(L"k"), L"v");
    CHECK(place.bytes() == "k=v\n");
}

TEST_CASE("a file may be opened and closed again and again") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    for (int i = 0; i < 20; ++i) {
        file.open(READ_WRITE);
        checkSame(file.getValue(L"count"), i == 0 ? L"" : std::to_wstring(i - 1));
        file.setValue(L"count", std::to_wstring(i));
        file.close();
    }
    CHECK(place.bytes() == "count=19\n");
}

TEST_CASE("closing or destroying an object that was never opened touches no file") {
    SettingsPlace const place;
    {
        PropertyFile file(place.path());
        file.setValue(L"k", L"v");
        CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
        CHECK(file.enumerateKeys().empty());
        CHECK(file.getMode() == 0UL);
        CHECK(file.fail());
        file.setValue(L"k", L"v");
    }
    CHECK(!place.exists());
    place.write("old");
    { PropertyFile const file(place.path()); }
    CHECK(place.bytes() == "old");
    { PropertyFile const nameless; }
    PropertyFile nameless;
    nameless.setValue(L"k", L"v");
    CHECK(messageOf<std::exception>([&] { nameless.close(); }) == "<nothing>");
    nameless.synchronize();
}

TEST_CASE("an object whose open failed touches no file when it is destroyed") {
    SettingsPlace const place;
    {
        PropertyFile file(place.path());
        CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
        file.setValue(L"k", L"v");
        place.write("old");
    }
    CHECK(place.bytes() == "old");
}

TEST_CASE("closing twice is harmless") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"k", L"v");
    file.close();
    file.setValue(L"l", L"v");
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(file.getMode() == 0UL);
    CHECK(file.enumerateKeys().empty());
    CHECK(place.bytes() == "k=v\n");
}

TEST_CASE("the destructor writes a file that is open for writing") {
    SettingsPlace const place;
    {
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"k", L"v");
    }
    CHECK(place.bytes() == "k=v\n");
    {
        PropertyFile file(place.path());
        file.open(READ);
        file.setValue(L"k", L"w");
    }
    CHECK(place.bytes() == "k=v\n");
    {
        std::unique_ptr<File> const file(new PropertyFile(place.path()));
        file->open(WRITE);
    }
    CHECK(place.bytes() == "");
    {
        auto* const settings = new PropertyFile(place.path());
        std::unique_ptr<std::iostream> const stream(settings);
        settings->open(WRITE);
        settings->setValue(L"deleted as", L"a stream");
    }
    CHECK(place.bytes() == "deleted as=a stream\n");
}

namespace {

/// Counts the calls that reach its overrides.
class Counting : public PropertyFile {
public:
    Counting(std::string const& path, int& opens, int& closes)
        : PropertyFile(File::Path(path)), opens_(opens), closes_(closes) {}
    void open(unsigned long mode) override {
        ++opens_;
        PropertyFile::open(mode);
    }
    void close() override {
        ++closes_;
        PropertyFile::close();
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
        file.setValue(L"k", L"v");
        file.synchronize();
        CHECK(opens == 2);
        CHECK(closes == 1);
        CHECK(place.bytes() == "k=v\n");
        file.setValue(L"k", L"w");
    }
    CHECK(opens == 2);
    CHECK(closes == 1);
    CHECK(place.bytes() == "k=w\n");
}

TEST_CASE("synchronize of a file open for reading drops changes and reads what is there now") {
    SettingsPlace const place;
    place.write("k=1\n");
    PropertyFile file(place.path());
    file.open(READ);
    file.setValue(L"k", L"mine");
    place.write("k=2\n");
    file.synchronize();
    checkList(drain(file), {{L"k", L"2"}});
    CHECK(file.getMode() == READ);
    CHECK(place.bytes() == "k=2\n");
}

TEST_CASE("synchronize of a file open for writing alone leaves file and list empty") {
    // Intended: reopening for writing empties the file that was just written.
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.open(WRITE);
    file.setValue(L"k", L"v");
    file.synchronize();
    CHECK(file.getMode() == WRITE);
    CHECK(file.enumerateKeys().empty());
    CHECK(place.bytes() == "");
}

TEST_CASE("synchronize leaves a closed file and its list as they are") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.setValue(L"k", L"v");
    file.synchronize();
    checkSame(file.getValue(L"k"), L"v");
    CHECK(!file.is_open());
    CHECK(!place.exists());
}

TEST_CASE("setMode decides what the next close does") {
    SettingsPlace const place;
    place.write("; c\nk=1\n");
    PropertyFile file(place.path());
    SUBCASE("writing allowed later") {
        file.open(READ);
        file.setValue(L"k", L"2");
        file.setMode(READ_WRITE);
        file.synchronize();
        CHECK(place.bytes() == "k=2\n");
        CHECK(file.getMode() == READ_WRITE);
        checkSame(file.getValue(L"k"), L"2");
    }
    SUBCASE("writing no longer allowed") {
        file.open(READ_WRITE);
        file.setValue(L"k", L"2");
        file.setMode(READ);
        file.synchronize();
        CHECK(file.getMode() == READ);
        checkSame(file.getValue(L"k"), L"1");
        file.close();
        CHECK(place.bytes() == "; c\nk=1\n");
    }
    SUBCASE("writing alone") {
        file.open(READ);
        file.setMode(WRITE);
        file.close();
        CHECK(place.bytes() == "k=1\n");
    }
    SUBCASE("neither") {
        file.open(READ_WRITE);
        file.setValue(L"k", L"2");
        file.setMode(0);
        CHECK(messageOf<std::runtime_error>([&] { file.synchronize(); }) == "failed to open file.");
        CHECK(!file.is_open());
        CHECK(place.bytes() == "; c\nk=1\n");
    }
    SUBCASE("writing, without the file ever opened") {
        file.setMode(READ_WRITE);
        file.setValue(L"l", L"v");
        file.close();
        CHECK(place.bytes() == "l=v\n");
        CHECK(file.getMode() == 0UL);
        CHECK(!file.is_open());
    }
}

TEST_CASE("opening an open file reads it again and changes the mode, but not the stream") {
    SettingsPlace const place;
    place.write("k=1\n");
    PropertyFile file(place.path());
    SUBCASE("to read again") {
        file.open(READ_WRITE);
        file.setValue(L"k", L"mine");
        file.open(READ);
        CHECK(file.getMode() == READ);
        CHECK(file.rdstate() == std::ios::eofbit);
        checkSame(file.getValue(L"k"), L"1");
        file.setValue(L"k", L"mine");
        file.close();
        CHECK(place.bytes() == "k=1\n");
    }
    SUBCASE("to read again from the start, wherever the caller left the stream") {
        file.open(READ);
        file.clear();
        file.seekg(2);
        file.open(READ);
        checkList(drain(file), {{L"k", L"1"}});
    }
    SUBCASE("to read what the caller wrote through the stream") {
        file.open(READ_WRITE);
        file.clear();
        file.seekp(0, std::ios::end);
        file.write("l=2\n", 4);
        file.open(READ_WRITE);
        checkList(drain(file), {{L"k", L"1"}, {L"l", L"2"}});
    }
    SUBCASE("to write") {
        file.open(READ);
        file.open(WRITE);
        CHECK(file.getMode() == WRITE);
        CHECK(file.enumerateKeys().empty());
        CHECK(place.bytes() == "k=1\n"); // not emptied: it was not opened again
        file.setValue(L"l", L"2");
        file.close();
        CHECK(place.bytes() == "l=2\n");
    }
    SUBCASE("to read what was opened for writing alone") {
        file.open(WRITE);
        file.setValue(L"k", L"mine");
        file.open(READ);
        CHECK(file.enumerateKeys().empty());
        file.close();
        CHECK(place.bytes() == "");
    }
    SUBCASE("with no mode at all") {
        file.open(READ_WRITE);
        file.open(0);
        CHECK(file.is_open());
        CHECK(file.getMode() == 0UL);
        CHECK(file.enumerateKeys().empty());
        file.close();
        CHECK(place.bytes() == "k=1\n");
    }
}

TEST_CASE("open leaves the stream at the end of the file, where it can be used") {
    SettingsPlace const place;
    for (std::string const& bytes : {"a=1\nk=v\n"s, "a=1\nk=v"s, "a=1\n\n\n"s, "word"s, ""s}) {
        CAPTURE(bytes);
        place.write(bytes);
        for (unsigned long const mode : {READ, READ_WRITE}) {
            PropertyFile file(place.path());
            file.open(mode);
            CHECK(file.rdstate() == std::ios::eofbit);
            file.clear();
            CHECK(file.tellg() == std::streampos(static_cast<std::streamoff>(bytes.size())));
            file.setMode(READ); // nothing is to be written
        }
    }
    place.write("a=1\nk=v\n");
    PropertyFile file(place.path());
    file.open(READ);
    file.clear();
    file.seekg(0);
    std::string line;
    CHECK(bool(std::getline(file, line)));
    CHECK(line == "a=1");
    checkSame(file.getValue(L"k"), L"v");
    file.close();

    PropertyFile other(place.path());
    other.open(WRITE);
    CHECK(other.good());
    other.write("direct", 6).flush();
    CHECK(place.bytes() == "direct");
    other.close();
    CHECK(place.bytes() == "");
}

TEST_CASE("open and close clear what went wrong with the stream before") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to open file.");
    CHECK(file.fail());
    file.open(WRITE);
    for (std::ios::iostate const state :
         {std::ios::failbit, std::ios::badbit, std::ios::failbit | std::ios::badbit}) {
        CAPTURE(state);
        file.setValue(L"k", L"v");
        file.setstate(state);
        CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
        CHECK(place.bytes() == "k=v\n");
        file.setstate(state);
        file.open(READ_WRITE);
        CHECK(file.rdstate() == std::ios::eofbit);
        checkList(drain(file), {{L"k", L"v"}});
        file.setValue(L"k", L"w");
        file.setstate(state);
        file.synchronize();
        CHECK(place.bytes() == "k=w\n");
        checkSame(file.getValue(L"k"), L"w");
    }
}

TEST_CASE("close deletes the old file and writes another in its place") {
    SettingsPlace const place;
    std::string const other = place.directory() / "other";
    mode_t const mask = ::umask(022);
    SUBCASE("another name of the old file keeps the old content") {
        place.write("k=old\n");
        std::filesystem::create_hard_link(place.path(), other);
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"k", L"new");
        file.close();
        CHECK(place.bytes() == "k=new\n");
        CHECK(test::readFile(other) == "k=old\n");
    }
    SUBCASE("a link is replaced, not what it leads to") {
        test::writeFile(other, "k=old\n");
        std::filesystem::create_symlink(other, place.path());
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        checkSame(file.getValue(L"k"), L"old");
        file.setValue(L"k", L"new");
        file.close();
        CHECK(!std::filesystem::is_symlink(place.path()));
        CHECK(place.bytes() == "k=new\n");
        CHECK(test::readFile(other) == "k=old\n");
    }
    SUBCASE("the new file has a new file's permissions") {
        place.write("k=old\n");
        CHECK(::chmod(place.path().c_str(), 0600) == 0);
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        file.close();
        struct stat status = {};
        CHECK(::stat(place.path().c_str(), &status) == 0);
        CHECK((status.st_mode & 0777U) == 0644U);
    }
    SUBCASE("a file that was deleted meanwhile comes back") {
        place.write("k=v\n");
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        std::filesystem::remove(place.path());
        file.close();
        CHECK(place.bytes() == "k=v\n");
    }
    SUBCASE("what another wrote meanwhile is lost") {
        place.write("k=v\n");
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        place.write("other=long content of somebody else\n");
        file.close();
        CHECK(place.bytes() == "k=v\n");
    }
    SUBCASE("an empty directory in its place is deleted too") {
        PropertyFile file(place.path());
        file.open(WRITE);
        file.setValue(L"k", L"v");
        std::filesystem::remove(place.path());
        std::filesystem::create_directory(place.path());
        file.close();
        CHECK(place.bytes() == "k=v\n");
    }
    ::umask(mask);
}

TEST_CASE("a pipe is read to its end") {
    test::TempDir const directory;
    std::string const path = directory / "pipe";
    REQUIRE(::mkfifo(path.c_str(), 0600) == 0);
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        std::string bytes;
        for (int i = 0; i < 10000; ++i) bytes += "key" + std::to_string(i) + "=value\n";
        std::thread writer([&] { test::writeFile(path, bytes + "k=v"); });
        PropertyFile file(path);
        file.open(READ);
        writer.join();
        say("%d ", static_cast<int>(file.enumerateKeys().size()));
        say("%s ", test::shown(file.getValue(L"k")).c_str());
        file.close();
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "10001 v ");
    CHECK(std::filesystem::is_fifo(path));
}

// ------------------------------------------------------------------------------------ the failures

TEST_CASE("a write-back that cannot open the file again keeps the list and leaves it closed") {
    SettingsPlace const place;
    std::string const folder = place.directory() / "folder";
    std::string const path = folder + "/settings.properties";
    for (bool const synchronize : {false, true}) {
        CAPTURE(synchronize);
        for (bool const obstructed : {false, true}) {
            CAPTURE(obstructed);
            std::filesystem::remove_all(folder);
            std::filesystem::create_directory(folder);
            PropertyFile file(path);
            file.open(READ_WRITE);
            file.setValue(L"b", L"1");
            file.setValue(L"a", L"2");
            if (obstructed) {
                std::filesystem::remove(path);
                std::filesystem::create_directories(path + "/content");
            } else {
                std::filesystem::remove_all(folder);
            }
            CHECK(messageOf<std::runtime_error>([&] {
                      synchronize ? file.synchronize() : file.close();
                  }) == "failed to open file.");
            CHECK(!file.is_open());
            CHECK(file.getMode() == 0UL);
            std::filesystem::remove_all(folder);
            std::filesystem::create_directory(folder);
            // The list can be written once there is a place for it.
            file.setMode(WRITE);
            file.close();
            CHECK(test::readFile(path) == "b=1\na=2\n");
        }
    }
}

TEST_CASE("a destructor that cannot open the file again keeps the exception inside") {
    test::Outcome const outcome = test::inChild([] {
        test::TempDir const directory;
        std::string const folder = directory / "folder";
        std::filesystem::create_directory(folder);
        {
            PropertyFile file(folder + "/settings.properties");
            file.open(WRITE);
            file.setValue(L"k", L"v");
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
    PropertyFile file(path);
    file.setValue(L"early", L"v");
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to read from file");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(file.enumerateKeys().empty());
    CHECK(messageOf<std::runtime_error>([&] { file.synchronize(); }) == "failed to read from file");
    CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) == "failed to open file.");
    CHECK(messageOf<std::runtime_error>([&] { file.open(WRITE); }) == "failed to open file.");
    CHECK(std::filesystem::is_directory(path));
}

TEST_CASE("a file whose first read fails is not an empty file") {
    PropertyFile file("/proc/self/mem"s);
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to read from file");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(file.enumerateKeys().empty());
}

TEST_CASE("a read that fails midway is an error and keeps the complete lines before it") {
    SettingsPlace const place;
    std::string bytes;
    for (int i = 200; i > 0; --i) {
        bytes += "key" + std::to_string(i) + "=value " + std::to_string(i % 7) + "\n";
        if (i % 20 == 0) bytes += "\n# a comment\n";
    }
    place.write(bytes);
    for (std::size_t const limit : {std::size_t(13), std::size_t(100), std::size_t(0)}) {
        CAPTURE(limit);
        int failures = 0;
        for (;; ++failures) {
            CAPTURE(failures);
            PropertyFile file(place.path());
            bytesRead = 0;
            transferLimit = limit;
            readsBeforeFailure = failures;
            std::string const message = messageOf<std::runtime_error>([&] { file.open(READ); });
            readsBeforeFailure = -1;
            transferLimit = 0;
            if (message == "<nothing>") {
                checkSame(file.enumerateKeys().back(), L"key1");
                break;
            }
            CHECK(message == "failed to read from file");
            CHECK(file.is_open());
            CHECK(file.getMode() == READ);
            std::string const delivered = bytes.substr(0, bytesRead);
            std::size_t const lastLine = delivered.rfind('\n');
            checkList(drain(file), parse(delivered.substr(0, lastLine + 1)));
        }
        CHECK(failures > 0);
        if (limit != 0) CHECK(static_cast<std::size_t>(failures) >= bytes.size() / limit);
    }
}

TEST_CASE("a file that could not be read is kept by taking the write bit away before close") {
    SettingsPlace const place;
    place.write("k=v\n");
    PropertyFile file(place.path());
    readsBeforeFailure = 0;
    std::string const message = messageOf<std::runtime_error>([&] { file.open(READ_WRITE); });
    readsBeforeFailure = -1;
    CHECK(message == "failed to read from file");
    CHECK(file.getMode() == READ_WRITE);
    CHECK(place.bytes() == "k=v\n");
    file.setMode(READ);
    file.close();
    CHECK(place.bytes() == "k=v\n");
}

TEST_CASE("reads and writes that transfer little at a time make no difference") {
    SettingsPlace const place;
    Properties list;
    for (int i = 0; i < 300; ++i) {
        list.push_back({L"key " + std::to_wstring(i),
                        std::wstring(static_cast<std::size_t>(i) % 50, L'\u00E9')});
    }
    for (std::size_t const limit : {1UL, 7UL, 1000UL}) {
        CAPTURE(limit);
        transferLimit = limit;
        std::string const bytes = bytesOf(place, list);
        PropertyFile file(place.path());
        file.open(READ);
        Properties const read = drain(file);
        transferLimit = 0;
        CHECK(bytes == textOf(list));
        checkList(read, list);
    }
}

namespace {

/// What a caller sees of a file with one long entry.
std::string stateOf(PropertyFile& file) {
    return std::string(file.is_open() ? "open" : "closed") + ", mode " +
           std::to_string(file.getMode()) + ", value of " +
           std::to_string(file.getValue(L"k").size());
}

} // namespace

TEST_CASE("a write that fails leaves the list intact, the file open and the mode unchanged") {
    SettingsPlace const place;
    for (std::size_t const size : {1UL, 100UL, 5000UL, 300000UL}) {
        for (bool const synchronize : {false, true}) {
            for (unsigned long const mode : {WRITE, READ_WRITE}) {
                CAPTURE(size);
                CAPTURE(synchronize);
                CAPTURE(mode);
                std::string const complete = "k=" + std::string(size, 'x') + "\n";
                std::string const open =
                    "open, mode " + std::to_string(mode) + ", value of " + std::to_string(size);
                place.write("k=old value\n");
                PropertyFile file(place.path());
                file.open(mode);
                file.setValue(L"k", std::wstring(size, L'x'));
                int failures = 0;
                for (;; ++failures) {
                    CAPTURE(failures);
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

TEST_CASE("after a write that failed the next close writes everything in its order") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    Properties list;
    for (int i = 0; i < 2000; ++i) {
        list.push_back({L"k" + std::to_wstring(i * 7 % 2000), L"value " + std::to_wstring(i)});
        file.setValue(list.back().key, list.back().value);
    }
    transferLimit = 10000;
    writesBeforeFailure = 1; // after the first 10000 bytes
    std::string const message = messageOf<std::runtime_error>([&] { file.close(); });
    writesBeforeFailure = -1;
    transferLimit = 0;
    CHECK(message == "failed to write to file");
    std::string const left = place.bytes();
    CHECK(textOf(list).compare(0, left.size(), left) == 0);
    file.close();
    CHECK(place.bytes() == textOf(list));
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
        for (rlim_t const limit : {rlim_t(0), rlim_t(1), rlim_t(3)}) {
            CAPTURE(size);
            CAPTURE(limit);
            std::string const complete = "k=" + std::string(size, 'x') + "\n";
            test::Outcome const outcome = test::inChild([&] {
                PropertyFile file(place.path());
                file.open(READ_WRITE);
                file.setValue(L"k", std::wstring(size, L'x'));
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
                PropertyFile file(place.path());
                file.open(WRITE);
                file.setValue(L"k", std::wstring(size, L'x'));
            }
            {
                PropertyFile file(place.path());
                file.open(WRITE);
                file.setValue(L"k", std::wstring(size, L'x'));
                if (messageOf<std::runtime_error>([&] { file.close(); }) == "<nothing>") return 1;
            }
            {
                PropertyFile file(place.path());
                file.open(WRITE);
                file.exceptions(std::ios::badbit | std::ios::failbit | std::ios::eofbit);
                file.setValue(L"k", std::wstring(size, L'x'));
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
        Mount const disk("none", small, "tmpfs", 0, "size=8k");
        if (!disk.done()) return CANNOT_MOUNT;
        std::string const path = small + "/settings.properties";
        test::writeFile(path, "k=old\n");
        PropertyFile file(path);
        file.open(READ_WRITE);
        file.setValue(L"k", std::wstring(100000, L'x'));
        say("%s; ", messageOf<std::runtime_error>([&] { file.close(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        file.setValue(L"k", L"short");
        say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        // A disk that somebody else filled before.
        std::ofstream(small + "/filler") << std::string(20000, 'f');
        file.setValue(L"l", std::wstring(5000, L'y'));
        say("%s; ", messageOf<std::runtime_error>([&] { file.close(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        return 0; // the destructor meets the full disk once more
    });
    if (outcome.exitCode == CANNOT_MOUNT) {
        MESSAGE("no file system can be mounted here: the full disk was not tested");
        return;
    }
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "failed to write to file; open, mode 3, value of 100000; "
                         "failed to write to file; open, mode 3, value of 100000; "
                         "<nothing>; open, mode 3, value of 5; "
                         "failed to write to file; open, mode 3, value of 5; ");
}

namespace {

/// Old content, and the value that is to replace it: shorter, equally long, longer, none at all.
struct Replacement {
    std::string oldBytes;
    wchar_t const* newValue; // null: the list is emptied
    std::string newBytes;
};

Replacement const replacements[] = {
    {"# a comment\nk=a rather long old value\nl=1\n", L"v", "k=v\nl=1\n"},
    {"k=old\nl=1\n", L"new", "k=new\nl=1\n"},
    {"k=v\nl=1\n", L"a rather long new value", "k=a rather long new value\nl=1\n"},
    {"# a comment\nk=a rather long old value\nl=1\n", nullptr, ""},
};

/// Puts the new value in and closes. For a child process: nothing is written to the terminal.
std::string replaceValue(std::string const& path, wchar_t const* value) {
    return messageOf<std::runtime_error>([&] {
        PropertyFile file(path);
        file.open(READ_WRITE);
        if (value != nullptr) {
            file.setValue(L"k", value);
        } else {
            for (std::wstring const& key : file.enumerateKeys()) file.removeKey(key);
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

// ------------------------------------------------------------------------------- lock and threads

namespace {

struct Action {
    std::string label;
    std::function<void(PropertyFile&)> run;
};

/// Every operation that takes the lock, on a file whose path can be opened.
std::vector<Action> allOperations() {
    return {
        {"open", [](PropertyFile& f) { f.open(READ_WRITE); }},
        {"close", [](PropertyFile& f) { f.close(); }},
        {"close without writing",
         [](PropertyFile& f) {
             f.setMode(READ);
             f.close();
         }},
        {"synchronize", [](PropertyFile& f) { f.synchronize(); }},
        {"enumerateKeys", [](PropertyFile& f) { f.enumerateKeys(); }},
        {"createKey", [](PropertyFile& f) { f.createKey(L"n"); }},
        {"createKey that exists", [](PropertyFile& f) { f.createKey(L"k"); }},
        {"removeKey", [](PropertyFile& f) { f.removeKey(L"k"); }},
        {"removeKey of nothing", [](PropertyFile& f) { f.removeKey(L"n"); }},
        {"getValue", [](PropertyFile& f) { f.getValue(L"k"); }},
        {"getValue of nothing", [](PropertyFile& f) { f.getValue(L"n"); }},
        {"setValue", [](PropertyFile& f) { f.setValue(L"k", L"w"); }},
        {"setValue of a new key", [](PropertyFile& f) { f.setValue(L"n", L"w"); }},
    };
}

/// Runs the action on an open file in a child process and says how it ended: "free" when another
/// thread could use the file afterwards. With the lock still held the alarm ends the child.
std::string lockAfter(Action const& action) {
    SettingsPlace const place;
    place.write("k=v\n");
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(30);
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        try {
            action.run(file);
        } catch (std::exception const& e) {
            say("%s, ", e.what());
        }
        readsBeforeFailure = -1;
        writesBeforeFailure = -1;
        std::thread([&] { file.getValue(L"k"); }).join();
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
    CHECK(lockAfter({"open", [](PropertyFile& f) {
                         f.close();
                         f.open(0);
                     }}) == "failed to open file., free");
    CHECK(lockAfter({"read", [](PropertyFile& f) {
                         f.close();
                         readsBeforeFailure = 0;
                         f.open(READ);
                     }}) == "failed to read from file, free");
    CHECK(lockAfter({"close", [](PropertyFile& f) {
                         writesBeforeFailure = 0;
                         f.close();
                     }}) == "failed to write to file, free");
    CHECK(lockAfter({"synchronize, writing", [](PropertyFile& f) {
                         writesBeforeFailure = 0;
                         f.synchronize();
                     }}) == "failed to write to file, free");
    CHECK(lockAfter({"synchronize, reading", [](PropertyFile& f) {
                         readsBeforeFailure = 0;
                         f.synchronize();
                     }}) == "failed to read from file, free");
    CHECK(lockAfter({"synchronize, opening", [](PropertyFile& f) {
                         f.setMode(0);
                         f.synchronize();
                     }}) == "failed to open file., free");
}

TEST_CASE("stream exceptions that a caller enabled leave the lock free") {
    std::string const result =
        lockAfter({"close and open", [](PropertyFile& f) {
                       f.clear();
                       f.exceptions(std::ios::badbit | std::ios::failbit | std::ios::eofbit);
                       f.synchronize();
                   }});
    CAPTURE(result);
    CHECK(result.size() >= 4);
    CHECK(result.substr(result.size() - 4) == "free");
    std::string const writing = lockAfter({"close", [](PropertyFile& f) {
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
        place.write("k=v\n");
        PropertyFile file(place.path());
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
        place.write("k=v\n");
        PropertyFile file(place.path());
        file.open(READ_WRITE);
        CHECK(file.lock());
        CHECK(messageOf<std::exception>([&] { action.run(file); }) == "<nothing>");
        CHECK(file.unlock());
    }
}

TEST_CASE("the destructor waits while another thread holds the lock") {
    SettingsPlace const place;
    auto* const file = new PropertyFile(place.path());
    file->open(WRITE);
    file->setValue(L"k", L"v");
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
    CHECK(place.bytes() == "k=v\n");
}

TEST_CASE("the lock is held across the whole read of open") {
    // The pipe keeps open reading until the test has seen that the lock is taken.
    test::TempDir const directory;
    std::string const path = directory / "pipe";
    REQUIRE(::mkfifo(path.c_str(), 0600) == 0);
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        PropertyFile file(path);
        std::atomic<bool> got{false};
        std::thread reader([&] { file.open(READ); });
        std::ofstream pipe(path); // returns when the reader has opened it
        pipe << "a=1\n" << std::flush;
        std::thread other([&] {
            say("%s ", test::shown(file.getValue(L"b")).c_str());
            got = true;
        });
        ::usleep(30000);
        say("%s ", got ? "got it early" : "waits");
        std::fflush(stdout);
        pipe << "b=2\n";
        pipe.close();
        reader.join();
        other.join();
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "waits 2 ");
}

TEST_CASE("the lock is held across the whole write-back of close and synchronize") {
    for (bool const synchronize : {false, true}) {
        CAPTURE(synchronize);
        SettingsPlace const place;
        test::Outcome const outcome = test::inChild([&] {
            ::alarm(60);
            PropertyFile file(place.path());
            file.open(READ_WRITE);
            file.setValue(L"k", L"v");
            aWriteWaits = false;
            writesWait = true;
            std::thread writer([&] { synchronize ? file.synchronize() : file.close(); });
            while (!aWriteWaits) ::usleep(1000);
            std::atomic<bool> got{false};
            std::string value;
            std::thread other([&] {
                value = test::shown(file.getValue(L"k"));
                got = true;
            });
            ::usleep(30000);
            bool const early = got;
            writesWait = false;
            writer.join();
            other.join();
            say("%s, then \"%s\"", early ? "got it early" : "waits", value.c_str());
            return 0;
        });
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == (synchronize ? "waits, then \"v\"" : "waits, then \"\""));
    }
}

TEST_CASE("edits of several threads are not lost while others synchronize") {
    SettingsPlace const place;
    PropertyFile file(place.path());
    file.open(READ_WRITE);
    int const count = 60;
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t) {
        threads.emplace_back([&file, t] {
            for (int i = 0; i < count; ++i) {
                std::wstring const key = std::to_wstring(t) + L"." + std::to_wstring(i);
                file.setValue(key, L"value " + key);
                file.createKey(L"removed " + key);
                file.removeKey(L"Removed " + key);
            }
        });
    }
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) file.synchronize();
    });
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) {
            for (std::wstring const& key : file.enumerateKeys()) file.getValue(key);
        }
    });
    for (std::thread& thread : threads) thread.join();
    file.synchronize();
    CHECK(file.enumerateKeys().size() == 3U * count);
    // Each thread's entries are in the order in which it made them.
    std::vector<int> next(3);
    for (std::wstring const& key : file.enumerateKeys()) {
        std::size_t const t = static_cast<std::size_t>(key[0] - L'0');
        checkSame(key, std::to_wstring(t) + L"." + std::to_wstring(next.at(t)++));
        checkSame(file.getValue(key), L"value " + key);
    }
}

TEST_CASE("the destructor completes its work in a thread that is being cancelled") {
    SettingsPlace const place;
    place.write("k=old\n");
    std::size_t const size = 300000;
    auto* const file = new PropertyFile(place.path());
    file->open(READ_WRITE);
    file->setValue(L"k", std::wstring(size, L'n'));
    std::atomic<bool> survived{false};
    bool const cancelled = test::endsCancelled(
        [&] {
            ::pthread_cancel(::pthread_self());
            delete file;
            survived = true;
            ::pthread_testcancel();
        },
        [](pthread_t) {});
    CHECK(survived);
    CHECK(cancelled);
    CHECK(place.bytes() == "k=" + std::string(size, 'n') + "\n");
}

TEST_CASE("a thread cancelled in an operation leaves the lock free and a whole file") {
    std::string const before = "k=old\n";
    std::string const after = "k=" + std::string(300000, 'n') + "\n";
    for (std::string const operation : {"close", "open", "synchronize"}) {
        CAPTURE(operation);
        SettingsPlace const place;
        place.write(before);
        test::Outcome const outcome = test::inChild([&] {
            ::alarm(60);
            PropertyFile file(place.path());
            file.open(READ_WRITE);
            file.setValue(L"k", std::wstring(300000, L'n'));
            bool const cancelled = test::endsCancelled(
                [&] {
                    ::pthread_cancel(::pthread_self());
                    if (operation == "close") file.close();
                    if (operation == "open") file.open(READ_WRITE);
                    if (operation == "synchronize") file.synchronize();
                    ::pthread_testcancel();
                },
                [](pthread_t) {});
            say("%s, ", cancelled ? "cancelled" : "not cancelled");
            file.enumerateKeys(); // waits for ever while the lock is held
            std::string const bytes = place.bytes();
            say("free, %s", bytes == before || bytes == after ? "whole" : "damaged");
            file.setMode(0); // the destructor has nothing to write
            return 0;
        });
        CHECK(outcome.signal == 0);
        CHECK(outcome.out == "cancelled, free, whole");
    }
}

TEST_CASE("a thread cancelled while it waits for the lock does no harm") {
    SettingsPlace const place;
    place.write("k=v\n");
    PropertyFile file(place.path());
    file.open(READ);
    CHECK(file.lock());
    bool const cancelled = test::endsCancelled([&] { file.getValue(L"k"); },
                                               [](pthread_t thread) {
                                                   ::usleep(20000);
                                                   ::pthread_cancel(thread);
                                               });
    CHECK(cancelled);
    CHECK(file.unlock());
    std::wstring value;
    std::thread([&] { value = file.getValue(L"k"); }).join();
    checkSame(value, L"v");
}

// ------------------------------------------------------------------------------- against the model

namespace {

/// Calls `visit` with every string of up to `longest` characters of the alphabet.
template <class Visit>
void forEachLine(std::string const& alphabet, std::size_t longest, Visit visit) {
    visit(std::string());
    std::vector<std::string> lines{""};
    for (std::size_t length = 1; length <= longest; ++length) {
        std::vector<std::string> longer;
        for (std::string const& line : lines) {
            for (char const c : alphabet) {
                longer.push_back(line + c);
                visit(longer.back());
            }
        }
        lines.swap(longer);
    }
}

/// Random choices that are the same on every run and every platform.
class Dice {
public:
    explicit Dice(unsigned seed) : engine_(seed) {}
    std::size_t below(std::size_t limit) { return engine_() % limit; }
    bool oneIn(std::size_t chances) { return below(chances) == 0; }
    template <class Sequence>
    typename Sequence::value_type const& from(Sequence const& choices) {
        return choices[below(choices.size())];
    }
    template <class String>
    String text(String const& alphabet, std::size_t longest) {
        String result;
        for (std::size_t length = below(longest + 1); length > 0; --length) {
            result += from(alphabet);
        }
        return result;
    }

private:
    std::mt19937 engine_;
};

std::string const syntax = "[=#;a\t \0"s;

} // namespace

TEST_CASE(
    "every line of up to five characters of the syntax is read and written as the model does") {
    SettingsPlace const place;
    std::string bytes;
    std::size_t lines = 0;
    std::size_t total = 0;
    forEachLine(syntax, 5, [&](std::string const& line) {
        // An entry behind each tells where it belongs.
        bytes += line + "\nk" + std::to_string(total++) + "=v\n";
        if (++lines < 128) return;
        checkFile(place, bytes);
        bytes.clear();
        lines = 0;
    });
    checkFile(place, bytes);
    CHECK(total == 37449U);
}

TEST_CASE("every line of up to five characters of the syntax is read alone in a file") {
    SettingsPlace const place;
    std::size_t total = 0;
    PropertyFile file(place.path());
    forEachLine(syntax, 5, [&](std::string const& line) {
        CAPTURE(test::shown(line));
        place.write(line);
        file.open(READ);
        bool const same = drain(file) == parse(line);
        CHECK(same);
        file.close();
        ++total;
    });
    CHECK(total == 37449U);
}

TEST_CASE("every line of up to three bytes that matter to UTF-8 is read as the model reads it") {
    SettingsPlace const place;
    std::string bytes;
    std::size_t lines = 0;
    forEachLine("=a\0\x80\xBF\xC0\xC3\xE2\xFF"s, 3, [&](std::string const& line) {
        bytes += line + "\nk" + std::to_string(lines) + "=v" + line + "\n" + line + "=w\n";
        if (++lines % 64 != 0) return;
        checkFile(place, bytes);
        bytes.clear();
    });
    checkFile(place, bytes);
}

TEST_CASE("random files are read and written as the model does") {
    SettingsPlace const place;
    std::string const alphabet = "[]=#;aAb\t \r\n\n=\0\x80\xC3\xA9\xE2\xFF\xC0"s;
    for (unsigned seed = 1; seed <= 1500; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string const bytes = dice.text(alphabet, 300);
        checkList(listOf(place, bytes), parse(bytes));
        checkFile(place, bytes);
    }
}

TEST_CASE("random files of likely lines are read and written as the model does") {
    SettingsPlace const place;
    std::vector<std::string> const pieces{
        "[",     "]",     "=",    "#",      ";",        "\n",       "\n",   "\n",       "[a]\n",
        "key",   "KEY",   "Key2", "=v\n",   " ",        "\t",       "\r\n", "\xC0\x80", "\0"s,
        "k=v\n", "K=w\n", " = ",  "word\n", "\xC3\xA9", "\xC3\x89", "\n#",  "\xFF"};
    for (unsigned seed = 1; seed <= 300; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string bytes;
        for (std::size_t count = dice.below(400); count > 0; --count) bytes += dice.from(pieces);
        checkList(listOf(place, bytes), parse(bytes));
        checkFile(place, bytes);
    }
}

namespace {

/// A library's file and the model, given the same commands.
class Pair {
public:
    /// Fewer keys make more duplicates and more matches.
    Pair(unsigned seed, std::size_t keys) : keys_(keys), dice_(seed), file_(place_.path()) {}

    /// A file of likely entries to begin with.
    void begin(std::size_t entries) {
        std::string bytes;
        for (; entries > 0; --entries) {
            bytes += Koru::make_string(key()) + "=" + Koru::make_string(value()) + "\n";
            if (dice_.oneIn(5)) bytes += "# a comment\n[Main]\n";
        }
        place_.write(bytes);
        model_.exists = true;
        model_.bytes = bytes;
        open(READ_WRITE);
    }

    void step() {
        std::wstring const k = key();
        std::size_t const choice = dice_.below(24);
        if (choice < 3) {
            lifeCycle();
        } else if (choice < 6) {
            file_.createKey(k);
            model_.createKey(k);
        } else if (choice < 11) {
            file_.removeKey(k);
            model_.removeKey(k);
        } else if (choice < 13) {
            checkSame(file_.getValue(k), model_.getValue(k));
        } else {
            std::wstring const v = value();
            file_.setValue(k, v);
            model_.setValue(k, v);
        }
    }

    void check() {
        checkAgrees(file_, model_);
        CHECK(file_.getMode() == model_.getMode());
        CHECK(file_.is_open() == model_.isOpen());
        CHECK(place_.exists() == model_.exists);
        if (model_.exists) checkBytes(place_.bytes(), model_.bytes);
    }

    void end() { checkList(drain(file_), model_.list); }

private:
    std::size_t keys_;
    SettingsPlace place_;
    Dice dice_;
    PropertyFile file_;
    PropertyFileModel model_;

    /// Each key in several spellings, and some that are easily taken for another.
    std::wstring key() {
        std::size_t const number = dice_.below(keys_);
        if (dice_.oneIn(40)) return L"";
        std::wstring result = L"key" + std::to_wstring(number);
        if (number % 5 == 4) result += L"\u00C9";
        if (number % 7 == 6) result += L"\u4E2D\U0001F600";
        for (wchar_t& c : result) {
            if (c >= L'a' && c <= L'z' && dice_.oneIn(2)) c -= L'a' - L'A';
        }
        if (dice_.oneIn(30)) result += L"\0x"s;
        if (dice_.oneIn(30)) result += L" x";
        if (dice_.oneIn(60)) result.insert(0, 1, L'#');
        return result;
    }

    std::wstring value() {
        static std::wstring const alphabet = L"[]=#; \t\n\r\0aZ\u00E9\u20AC\U0001F600\xD800"s +
                                             static_cast<wchar_t>(0x80000041) +
                                             static_cast<wchar_t>(0xFFFFFFFF);
        if (dice_.oneIn(50)) return std::wstring(dice_.below(10000), dice_.from(alphabet));
        return dice_.text(alphabet, 12);
    }

    void open(unsigned long mode) {
        std::string const message = messageOf<std::runtime_error>([&] { file_.open(mode); });
        CHECK(message == (model_.open(mode) ? "<nothing>" : "failed to open file."));
    }

    void lifeCycle() {
        static std::vector<unsigned long> const modes{READ,       READ_WRITE, READ_WRITE,
                                                      READ_WRITE, READ_WRITE, WRITE};
        switch (dice_.below(8)) {
        case 0: {
            unsigned long const mode = dice_.below(4);
            file_.setMode(mode);
            model_.setMode(mode);
            break;
        }
        case 1:
            open(dice_.from(modes)); // perhaps on the open file
            break;
        case 2:
        case 3:
        case 4: {
            std::string const message = messageOf<std::runtime_error>([&] { file_.synchronize(); });
            CHECK(message == (model_.synchronize() ? "<nothing>" : "failed to open file."));
            break;
        }
        default:
            file_.close();
            model_.close();
            checkBytes(place_.bytes(), model_.bytes);
            open(dice_.from(modes));
        }
    }
};

} // namespace

TEST_CASE("random operations on small lists agree with the model after every step") {
    for (unsigned seed = 1; seed <= 60; ++seed) {
        CAPTURE(seed);
        Pair pair(seed, 8);
        pair.begin(seed % 30);
        for (int step = 0; step < 120; ++step) {
            CAPTURE(step);
            pair.step();
            pair.check();
        }
        pair.end();
    }
}

TEST_CASE("random operations on lists of hundreds of entries agree with the model") {
    for (unsigned seed = 1; seed <= 8; ++seed) {
        CAPTURE(seed);
        Pair pair(seed, 40 + seed * 40);
        pair.begin(400);
        for (int step = 0; step < 400; ++step) {
            CAPTURE(step);
            pair.step();
            if (step % 20 == 0) pair.check();
        }
        pair.check();
        pair.end();
    }
}

TEST_CASE("lists of every size up to two hundred find, miss and remove as the model does") {
    PropertyFile file;
    for (std::size_t size = 0; size <= 200; ++size) {
        CAPTURE(size);
        PropertyFileModel model;
        for (std::size_t i = 0; i < size; ++i) {
            std::wstring const key = L"Key" + std::to_wstring(i);
            file.setValue(key, key);
            model.setValue(key, key);
        }
        for (std::size_t i = 0; i < size; ++i) {
            checkSame(file.getValue(L"KEY" + std::to_wstring(i)), L"Key" + std::to_wstring(i));
        }
        checkSame(file.getValue(L"Key" + std::to_wstring(size)), L"");
        for (std::size_t const i : {size / 2, std::size_t(0), size - 1}) {
            file.removeKey(L"key" + std::to_wstring(i));
            model.removeKey(L"key" + std::to_wstring(i));
        }
        checkAgrees(file, model);
        checkList(drain(file), model.list);
    }
}

TEST_CASE("the same lines give the same keys and values as in a section of the sectioned file") {
    SettingsPlace const place;
    // Only a line that begins with a bracket means something else there.
    std::string const alphabet = "]=#;aAb\t \r\n\n=\0\x80\xC3\xA9\xE2\xFF\xC0"s;
    for (unsigned seed = 1; seed <= 400; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string const bytes = dice.text(alphabet, 300);
        Properties flat = listOf(place, bytes);
        test::Settings expected;
        for (Property const& p : flat) expected.push_back({L"s", p.key, p.value});
        test::sortSettings(expected);
        checkSame(test::loaded(place, "[s]\n" + bytes), expected);
    }
}

// ------------------------------------------------------------------------------------- the locales

TEST_CASE("keys compare under the locale of the moment") {
    std::string const previous = std::setlocale(LC_ALL, nullptr);
    if (std::setlocale(LC_ALL, "C.UTF-8") == nullptr) {
        MESSAGE("this system has no C.UTF-8: the change of locale was not tested");
        return;
    }
    std::wstring const folded = L"IiKkSsJjAaEe\u0130\u0131\u212A\u017F\u00DF\u1E9E\u00E9\u00C9"
                                L"\u00E5\u00C5\u212B\u00B5\u03BC"
                                L"\u039C\u03A3\u03C3\u03C2\u03A9\u03C9\u2126\u01C4\u01C5\u01C6"
                                L"\u0416\u0436\u1E9B\u1E60\u0345"
                                L"\u0399\u03B9\u1FBE\U00010400\U00010428";
    PropertyFile file;
    PropertyFileModel model;
    for (char const* const locale : {"C", "C.UTF-8", "C", "C.UTF-8", "C.UTF-8", "C"}) {
        CAPTURE(locale);
        REQUIRE(std::setlocale(LC_ALL, locale) != nullptr);
        checkAgrees(file, model);
        for (std::size_t i = 0; i < folded.size(); ++i) {
            std::wstring const key = L"t" + folded.substr(i, 1) + L"tle";
            checkSame(file.getValue(key), model.getValue(key));
            file.setValue(key, std::to_wstring(i) + key);
            model.setValue(key, std::to_wstring(i) + key);
            file.createKey(folded.substr(i, 1));
            model.createKey(folded.substr(i, 1));
            if (i % 5 == 0) file.removeKey(key);
            if (i % 5 == 0) model.removeKey(key);
        }
        checkAgrees(file, model);
    }
    checkList(drain(file), model.list);

    REQUIRE(std::setlocale(LC_ALL, "C") != nullptr);
    SettingsPlace const place;
    place.write("\xC3\x85=first\n\xC3\xA5=second\n");
    file.setValue(L"gone", L"with open");
    PropertyFile other(place.path());
    other.open(READ);
    checkSame(other.getValue(L"\u00E5"), L"second");
    REQUIRE(std::setlocale(LC_ALL, "C.UTF-8") != nullptr);
    checkSame(other.getValue(L"\u00E5"), L"first");
    REQUIRE(std::setlocale(LC_ALL, previous.c_str()) != nullptr);
}
