// The flat property file: its format and its operations, and all of it against a plain model, over
// every short line, random files and random sequences of operations. What it shares with the other
// structured files is tested in tests/structured.
#include <doctest/doctest.h>

#include <algorithm>
#include <clocale>
#include <cstddef>
#include <cstring>
#include <initializer_list>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/throws.h"

using Koru::PropertyFile;
using test::checkSame;
using test::messageOf;
using test::READ;
using test::READ_WRITE;
using test::sameName;
using test::SettingsPlace;
using test::WRITE;
using namespace std::string_literals;

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

} // namespace

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
