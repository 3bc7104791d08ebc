// The flat property file: what the other structured files do not have in common with it, and all of
// it against a plain model, over every short line, random files and random sequences of operations.
// The rest is tested in tests/structured.
#include <doctest/doctest.h>

#include <algorithm>
#include <clocale>
#include <cstddef>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/propertyfile.h>
#include <koru/string.h>

#include "structured/lines.h"
#include "support/choices.h"
#include "support/propertymodel.h"
#include "support/sanitizers.h"
#include "support/skip.h"

using namespace structured;
using namespace std::string_literals;
using test::Dice;

namespace {

void checkSame(Properties const& actual, Properties const& expected) {
    bool const same = actual == expected;
    INFO("actual: ", shown(actual), "\nexpected: ", shown(expected));
    CHECK(same);
}

void checkSame(std::string const& actual, std::string const& expected) {
    bool const same = actual == expected;
    INFO("actual: ", test::shown(actual), "\nexpected: ", test::shown(expected));
    CHECK(same);
}

/// The library's file and the model, given the same steps.
struct Twins {
    Lines<Flat> file;
    test::PropertyFileModel model;

    explicit Twins(std::string const& bytes = "") : file(bytes, READ_WRITE) {
        model.bytes = bytes;
        model.open(READ_WRITE);
    }

    template <class Step>
    void step(Step step) {
        std::string const expected = complaint([&] { step(model); });
        CHECK(complaint([&] { step(file); }) == expected);
    }

    /// Every key and value that the library gives is the model's.
    void check() {
        Properties actual;
        for (std::wstring const& key : file.keys()) actual.push_back({key, file.get(key)});
        Properties expected;
        for (Property const& p : model.list) expected.push_back({p.key, model.getValue(p.key)});
        checkSame(actual, expected);
        CHECK(file.getMode() == model.getMode());
        CHECK(file.is_open() == model.isOpen());
        CHECK(file.place.exists() == model.exists);
        if (model.exists) checkSame(file.bytes(), model.bytes);
    }
    void checkInFull() {
        check();
        checkSame(file.drain(), model.list);
        model.list.clear();
    }
};

/// A file of these bytes is read, written back and read again as the model does.
void checkFile(std::string const& bytes) {
    Twins twins(bytes);
    checkSame(twins.file.drain(), twins.model.list);
    twins.step([](auto& f) { f.open(READ); });
    twins.check();
    twins.step([](auto& f) { f.open(READ_WRITE); });
    twins.step([](auto& f) { f.synchronize(); });
    twins.check();
    twins.step([](auto& f) { f.close(); });
    twins.check();
}

std::string const SYNTAX = "[=#;a\t \0"s;

} // namespace

TEST_CASE("there are no sections: a line that begins with [ is a line like any other") {
    checkRows<Flat>({
        {"a header adds nothing", "[Main]\n", ""},
        {"with an equals", "[x]=1\n", "[x]/1"},
        {"with an equals inside", "[a=b]\n", "[a/b]"},
        {"only a bracket", "[=\n", "[/"},
        {"many brackets", "[[[=]]]\n", "[[[/]]]"},
        {"between entries", "a=1\n[s]\na=2\n[]\n[\n]=3\n", "a/1 | a/2 | ]/3"},
        {"indented", "\t [x] = 1 \n", "[x] / 1"},
    });
}

TEST_CASE("the order of the list is that of the lines, whatever the keys are") {
    checkRows<Flat>({
        {"read and written", "z=1\nb=2\nA=3\na=4\nY=5\nB=6\n_=7\n0=8\na=9\n",
         "z/1 | b/2 | A/3 | a/4 | Y/5 | B/6 | _/7 | 0/8 | a/9"},
        {"with lines that are lost", "# top\n[Main]\n\n  z = 1  \n; c\n a=2\n\nword\n=x\nM=v",
         "z / 1 | a/2 | M/v"},
    });
    Lines<Flat> file("m=1\n", READ_WRITE);
    file.put(L"z", L"2");
    file.put(L"[s]", L"4");
    file.put(L"a", L"3");
    CHECK(file.written() == "m=1\nz=2\n[s]=4\na=3\n");
}

TEST_CASE("a hundred thousand lines are loaded, found and written in their order") {
    int const count = 100000;
    Properties list;
    for (int i = 0; i < count; ++i) {
        list.push_back({L"Key " + std::to_wstring(i * 7919LL % count), std::to_wstring(i)});
    }
    Lines<Flat> file(textOf(list), READ_WRITE);
    std::vector<std::wstring> const keys = file.keys();
    REQUIRE(keys.size() == list.size());
    // Each lookup takes a hundred times as long with a sanitizer.
    std::size_t const stride = test::SANITIZED ? 37 : 1;
    bool same = true;
    for (std::size_t i = 0; i < keys.size(); ++i) {
        same = same && keys[i] == list[i].key;
        if (i % stride == 0) same = same && file.get(L"kEY " + keys[i].substr(4)) == list[i].value;
    }
    CHECK(same);
    CHECK(file.get(L"Key 100000").empty());
    CHECK(file.get(L"Key").empty());
    file.put(L"KEY 0", L"first");
    file.put(L"new", L"last");
    file.erase(L"key 7919"); // the second
    list[0].value = L"first";
    list.erase(list.begin() + 1);
    list.push_back({L"new", L"last"});
    CHECK((file.written() == textOf(list)));
}

TEST_CASE(
    "every line of up to five characters of the syntax is read and written as the model does") {
    std::string bytes;
    std::size_t lines = 0;
    test::forEachText(SYNTAX, 5, [&](std::string const& line) {
        // An entry after each tells where it belongs.
        bytes += line + "\nk" + std::to_string(lines++) + "=v\n";
        if (lines % 128 != 0) return;
        checkFile(bytes);
        bytes.clear();
    });
    checkFile(bytes);
    CHECK(lines == 37449U);
}

TEST_CASE("every line of up to five characters of the syntax is read alone in a file") {
    std::size_t total = 0;
    OwnFile<Flat> file;
    test::forEachText(SYNTAX, 5, [&](std::string const& line) {
        CAPTURE(test::shown(line));
        file.place.write(line);
        file.open(READ);
        Properties const list = test::parseProperties(line);
        bool const same = file.count() == list.size() &&
                          (list.empty() || (file.enumerateKeys()[0] == list[0].key &&
                                            file.getValue(list[0].key) == list[0].value));
        CHECK(same);
        file.close();
        ++total;
    });
    CHECK(total == 37449U);
}

TEST_CASE("every line of up to three bytes that matter to UTF-8 is read as the model reads it") {
    std::string bytes;
    std::size_t lines = 0;
    test::forEachText("=a\0\x80\xBF\xC0\xC3\xE2\xFF"s, 3, [&](std::string const& line) {
        bytes += line + "\nk" + std::to_string(lines) + "=v" + line + "\n" + line + "=w\n";
        if (++lines % 64 != 0) return;
        checkFile(bytes);
        bytes.clear();
    });
    checkFile(bytes);
}

TEST_CASE("random files are read and written as the model does") {
    std::string const alphabet = "[]=#;aAb\t \r\n\n=\0\x80\xC3\xA9\xE2\xFF\xC0"s;
    for (unsigned seed = 1; seed <= 1500; ++seed) {
        CAPTURE(seed);
        checkFile(Dice(seed).text(alphabet, 300));
    }
}

TEST_CASE("random files of likely lines are read and written as the model does") {
    std::vector<std::string> const pieces{
        "[",     "]",     "=",    "#",      ";",        "\n",       "\n",   "\n",       "[a]\n",
        "key",   "KEY",   "Key2", "=v\n",   " ",        "\t",       "\r\n", "\xC0\x80", "\0"s,
        "k=v\n", "K=w\n", " = ",  "word\n", "\xC3\xA9", "\xC3\x89", "\n#",  "\xFF"};
    for (unsigned seed = 1; seed <= 300; ++seed) {
        CAPTURE(seed);
        Dice dice(seed);
        std::string bytes;
        for (std::size_t count = dice.below(400); count > 0; --count) bytes += dice.from(pieces);
        checkFile(bytes);
    }
}

namespace {

/// Random keys, values and steps. Fewer keys make more duplicates and more matches.
class Play {
public:
    Play(unsigned seed, std::size_t keys) : keys_(keys), dice_(seed) {}

    /// A file of likely entries to begin with.
    std::string bytes(std::size_t entries) {
        std::string result;
        for (; entries > 0; --entries) {
            result += textOf({{key(), value()}});
            if (dice_.oneIn(5)) result += "# a comment\n[Main]\n";
        }
        return result;
    }

    void step(Twins& twins) {
        std::wstring const k = key();
        std::size_t const choice = dice_.below(24);
        if (choice < 3) {
            lifeCycle(twins);
        } else if (choice < 6) {
            twins.step([&](auto& f) { f.createKey(k); });
        } else if (choice < 11) {
            twins.step([&](auto& f) { f.removeKey(k); });
        } else if (choice < 13) {
            CHECK((twins.file.get(k) == twins.model.getValue(k)));
        } else {
            std::wstring const v = value();
            twins.step([&](auto& f) { f.setValue(k, v); });
        }
    }

private:
    std::size_t keys_;
    Dice dice_;

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

    void lifeCycle(Twins& twins) {
        static std::vector<unsigned long> const modes{READ,       READ_WRITE, READ_WRITE,
                                                      READ_WRITE, READ_WRITE, WRITE};
        std::size_t const choice = dice_.below(8);
        unsigned long const mode = choice == 0 ? dice_.below(4) : dice_.from(modes);
        if (choice == 0) {
            twins.step([&](auto& f) { f.setMode(mode); });
        } else if (choice >= 2 && choice <= 4) {
            twins.step([](auto& f) { f.synchronize(); });
        } else {
            if (choice != 1) twins.step([](auto& f) { f.close(); });
            twins.check();
            twins.step([&](auto& f) { f.open(mode); }); // perhaps on the open file
        }
    }
};

} // namespace

TEST_CASE("random operations on small lists agree with the model after every step") {
    for (unsigned seed = 1; seed <= 60; ++seed) {
        CAPTURE(seed);
        Play play(seed, 8);
        Twins twins(play.bytes(seed % 30));
        for (int step = 0; step < 120; ++step) {
            CAPTURE(step);
            play.step(twins);
            twins.check();
        }
        twins.checkInFull();
    }
}

TEST_CASE("random operations on lists of hundreds of entries agree with the model") {
    for (unsigned seed = 1; seed <= 8; ++seed) {
        CAPTURE(seed);
        Play play(seed, 40 + seed * 40);
        Twins twins(play.bytes(400));
        for (int step = 0; step < 400; ++step) {
            CAPTURE(step);
            play.step(twins);
            if (step % 20 == 0) twins.check();
        }
        twins.checkInFull();
    }
}

TEST_CASE("lists of every size up to two hundred find, miss and remove as the model does") {
    Twins twins;
    for (std::size_t size = 0; size <= 200; ++size) {
        CAPTURE(size);
        for (std::size_t i = 0; i < size; ++i) {
            std::wstring const key = L"Key" + std::to_wstring(i);
            twins.step([&](auto& f) { f.setValue(key, key); });
        }
        for (std::size_t i = 0; i < size; ++i) {
            CHECK((twins.file.get(L"KEY" + std::to_wstring(i)) == L"Key" + std::to_wstring(i)));
        }
        CHECK(twins.file.get(L"Key" + std::to_wstring(size)).empty());
        for (std::size_t const i : {size / 2, std::size_t(0), size - 1}) {
            twins.step([&](auto& f) { f.removeKey(L"key" + std::to_wstring(i)); });
        }
        twins.checkInFull();
    }
}

TEST_CASE("keys compare under the locale of the moment") {
    std::string const previous = std::setlocale(LC_ALL, nullptr);
    if (std::setlocale(LC_ALL, "C.UTF-8") == nullptr) {
        test::skipped("there is no locale C.UTF-8");
        return;
    }
    std::wstring const folded = L"IiKkSsJjAaEe\u0130\u0131\u212A\u017F\u00DF\u1E9E\u00E9\u00C9"
                                L"\u00E5\u00C5\u212B\u00B5\u03BC"
                                L"\u039C\u03A3\u03C3\u03C2\u03A9\u03C9\u2126\u01C4\u01C5\u01C6"
                                L"\u0416\u0436\u1E9B\u1E60\u0345"
                                L"\u0399\u03B9\u1FBE\U00010400\U00010428";
    Twins twins;
    for (char const* const locale : {"C", "C.UTF-8", "C", "C.UTF-8", "C.UTF-8", "C"}) {
        CAPTURE(locale);
        REQUIRE(std::setlocale(LC_ALL, locale) != nullptr);
        twins.check();
        for (std::size_t i = 0; i < folded.size(); ++i) {
            std::wstring const key = L"t" + folded.substr(i, 1) + L"tle";
            CHECK((twins.file.get(key) == twins.model.getValue(key)));
            twins.step([&](auto& f) { f.setValue(key, std::to_wstring(i) + key); });
            twins.step([&](auto& f) { f.createKey(folded.substr(i, 1)); });
            if (i % 5 == 0) twins.step([&](auto& f) { f.removeKey(key); });
        }
        twins.check();
    }
    twins.checkInFull();

    REQUIRE(std::setlocale(LC_ALL, "C") != nullptr);
    Lines<Flat> file("\xC3\x85=first\n\xC3\xA5=second\n");
    CHECK((file.get(L"\u00E5") == L"second"));
    REQUIRE(std::setlocale(LC_ALL, "C.UTF-8") != nullptr);
    CHECK((file.get(L"\u00E5") == L"first"));
    REQUIRE(std::setlocale(LC_ALL, previous.c_str()) != nullptr);
}
