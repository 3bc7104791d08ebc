// The two stream inserters, compared with the loops that insert one character at a time.
#include <koru/string.h>

#include <doctest/doctest.h>

#include <pthread.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <iomanip>
#include <sstream>
#include <streambuf>
#include <string>
#include <thread>
#include <vector>

#include "support/locales.h"
#include "support/streamprobe.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "text/textmodel.h"

using namespace test;

namespace {

/// The number of bytes that the narrow inserter writes of a string of this stored size.
std::size_t narrowCount(std::size_t size) { return size % 256 < 128 ? size % 256 : 0; }

std::string expectedOf(std::string const& s) { return s.substr(0, narrowCount(s.size())); }
std::string expectedOf(std::wstring const& s) {
    return bytes(std::vector<std::uint32_t>(s.begin(), s.end()));
}

template <class String>
std::ostream& insertOneByOne(std::ostream& os, String const& s) {
    for (char const c : expectedOf(s)) os << static_cast<signed char>(c);
    return os;
}

template <class String>
std::string written(String const& s) {
    std::ostringstream os;
    Koru::operator<<(os, s);
    return os.str();
}

template <class String>
void expectWritten(Differences& differences, String const& s) {
    differences.expect(hex(s), hex(written(s)), hex(expectedOf(s)));
}

/// Characters that tell where they come from, a NUL among them.
template <class Char = char>
std::basic_string<Char> pattern(std::size_t size) {
    std::uint32_t const step = sizeof(Char) == 1 ? 1 : 257;
    std::basic_string<Char> text;
    for (std::uint32_t i = 0; i < size; ++i) text += static_cast<Char>('a' + i * step % 0xFFFF9F);
    return text;
}

template <class Text>
void expectInsertedAsOneByOne(Differences& differences, StreamSetup const& setup,
                              Text const& text) {
    expectSameInsertions(
        differences, setup,
        [&](std::ostream& os) -> std::ostream& { return Koru::operator<<(os, text); },
        [&](std::ostream& os) -> std::ostream& { return insertOneByOne(os, text); });
}

} // namespace

TEST_CASE("the narrow inserter counts with a signed number of 8 bits") {
    struct Row {
        std::size_t size, written;
    };
    Row const rows[] = {{0, 0},      {1, 1},      {2, 2},     {44, 44},  {126, 126}, {127, 127},
                        {128, 0},    {129, 0},    {200, 0},   {255, 0},  {256, 0},   {257, 1},
                        {300, 44},   {383, 127},  {384, 0},   {385, 0},  {511, 0},   {512, 0},
                        {513, 1},    {639, 127},  {640, 0},   {1000, 0}, {65536, 0}, {65537, 1},
                        {65600, 64}, {100000, 0}, {100100, 4}};
    for (Row const& row : rows) {
        CAPTURE(row.size);
        CHECK(hex(written(pattern(row.size))) == hex(pattern(row.written)));
    }
}

TEST_CASE("the narrow inserter follows its count for every size up to 1100") {
    Differences differences;
    for (std::size_t size = 0; size <= 1100; ++size) expectWritten(differences, pattern(size));
    CHECK(differences.firstOf(1101) == "");
}

TEST_CASE("the narrow inserter counts the stored size and writes NULs") {
    CHECK(hex(written(std::string("a\0b", 3))) == "61 0 62");
    CHECK(hex(written(std::string(2, '\0'))) == "0 0");
    CHECK(hex(written(std::string("\xE9\xFF\x80\x7F"))) == "E9 FF 80 7F");
    CHECK(written("short" + std::string(195, '\0')) == "");
}

TEST_CASE("the wide inserter writes the low 8 bits of every stored character") {
    CHECK(written(std::wstring()) == "");
    CHECK(hex(written(std::wstring(L"a\u00E9\u20AC\U0001F600z"))) == "61 E9 AC 0 7A");
    CHECK(hex(written(std::wstring(L"a\0b\0", 4))) == "61 0 62 0");
    CHECK(hex(written(units({0xFFFFFFFFU, 0x80000000U, 0x7FFFFFFF, 0x12345678}))) == "FF 0 FF 78");
}

TEST_CASE("the wide inserter writes the low 8 bits at every size up to 6200") {
    Random random(6);
    Differences differences;
    for (std::size_t size = 0; size <= 6200; size += size < 100 ? 1 : 29) {
        std::wstring text(size, L'\0');
        for (wchar_t& c : text) c = unit(random.next());
        expectWritten(differences, text);
    }
    CHECK(differences.first() == "");
}

TEST_CASE("the wide inserter counts with its full width") {
    for (std::size_t const size : {1U, 44U, 127U, 128U, 129U, 255U, 256U, 257U, 300U, 384U, 511U,
                                   512U, 513U, 1024U, 65535U, 65536U, 65537U, 100000U}) {
        CHECK((written(pattern<wchar_t>(size)) == expectedOf(pattern<wchar_t>(size))));
    }
}

TEST_CASE_TEMPLATE("the inserters write the same in every C locale", Char, char, wchar_t) {
    inEachLocale([] {
        Differences differences;
        for (std::size_t size = 0; size < 200; ++size) {
            expectWritten(differences, pattern<Char>(size));
        }
        CHECK(differences.firstOf(200) == "");
    });
}

TEST_CASE_TEMPLATE("the inserters pad the first character only and then have used up the width",
                   Char, char, wchar_t) {
    struct Row {
        std::string label;
        std::ios_base& (*adjust)(std::ios_base&);
        int width;
        std::string expected;
    };
    Row const rows[] = {{"right", std::right, 6, ".....abc"},
                        {"left", std::left, 6, "a.....bc"},
                        {"internal", std::internal, 6, ".....abc"},
                        {"one", std::right, 1, "abc"},
                        {"two", std::right, 2, ".abc"},
                        {"none", std::right, 0, "abc"}};
    for (Row const& row : rows) {
        CAPTURE(row.label);
        std::ostringstream os;
        os << row.adjust << std::setfill('.') << std::setw(row.width);
        Koru::operator<<(os, std::basic_string<Char>{'a', 'b', 'c'});
        CHECK(os.str() == row.expected);
        CHECK(os.width() == 0);
        CHECK(os.fill() == '.');
    }
}

TEST_CASE("the inserters return their stream and can be chained") {
    using Koru::operator<<;
    std::ostringstream os;
    CHECK(&Koru::operator<<(os, std::string("a")) == &os);
    CHECK(&Koru::operator<<(os, std::wstring(L"b")) == &os);
    CHECK(&Koru::operator<<(os, std::string(128, 'x')) == &os);
    os << std::wstring(L"c") << std::string("d") << std::wstring(L"\u0165") << 1;
    CHECK(os.str() == "abcde1");
}

TEST_CASE("the narrow inserter is chosen over the standard one where it is imported") {
    std::string const text(200, 'x');
    std::ostringstream standard;
    standard << text;
    CHECK(standard.str().size() == 200);
    using Koru::operator<<;
    std::ostringstream os;
    os << text;
    CHECK(os.str().size() == 0);
}

TEST_CASE_TEMPLATE("an inserter behaves on every stream as one character after another does", Char,
                   char, wchar_t) {
    static std::size_t const sizes[] = {0, 1, 3, 10, 44, 127, 128, 256, 300, 511, 2000};
    Random random(9);
    Differences differences;
    for (int i = 0; i < 20000; ++i) {
        StreamSetup const setup = randomSetup(random);
        expectInsertedAsOneByOne(differences, setup, pattern<Char>(random.of(sizes)));
    }
    CHECK(differences.firstOf(20000) == "");
}

TEST_CASE("the inserters write as much as the buffer takes, for every amount") {
    Differences differences;
    StreamSetup setup;
    for (std::size_t const area : {0U, 1U, 7U, 64U}) {
        setup.putArea = area;
        for (setup.room = 0; setup.room <= 130; ++setup.room) {
            expectInsertedAsOneByOne(differences, setup, pattern(127));
            expectInsertedAsOneByOne(differences, setup, pattern<wchar_t>(129));
        }
    }
    CHECK(differences.firstOf(4 * 131 * 2) == "");
}

TEST_CASE("the inserters write to files, and a full device makes the stream bad") {
    TempDir const directory;
    {
        std::ofstream file(directory / "text", std::ios::binary);
        Koru::operator<<(file, pattern(127));
        Koru::operator<<(file, pattern(300));
        Koru::operator<<(file, std::wstring(L"a\0\u0141", 3));
        Koru::operator<<(file, std::wstring(50000, L'w'));
        CHECK(file.good());
    }
    std::string const expected =
        pattern(127) + pattern(44) + std::string("a\0A", 3) + std::string(50000, 'w');
    CHECK((readFile(directory / "text") == expected));
    std::ofstream full("/dev/full", std::ios::binary);
    REQUIRE(full.is_open());
    Koru::operator<<(full, std::wstring(100000, L'w'));
    CHECK(full.bad());
}

TEST_CASE("the inserters write where the stream is") {
    std::ostringstream os("0123456789");
    os.seekp(2);
    Koru::operator<<(os, std::string("ab"));
    Koru::operator<<(os, std::wstring(L"cd"));
    CHECK(os.str() == "01abcd6789");
    CHECK(static_cast<long>(os.tellp()) == 6);
}

namespace {

/// A buffer that ends its thread when the third character arrives.
struct EndsThread : std::streambuf {
    int_type overflow(int_type c) override {
        if (taken.size() == 2) ::pthread_exit(nullptr);
        taken += traits_type::to_char_type(c);
        return c;
    }
    std::string taken;
};

/// What a thread leaves that inserts into such a buffer. When it ends as it should, its stack is
/// unwound through the insertion.
template <class Insert>
std::string endedWhileInserting(Insert insert) {
    struct Unwinds {
        std::string& end;
        ~Unwinds() { end += " unwound "; }
    };
    EndsThread buffer;
    std::ostream os(&buffer);
    std::string end;
    std::thread inserting([&] {
        Unwinds const unwinds{end};
        insert(os);
        end = " returned";
    });
    inserting.join();
    return buffer.taken + end + std::to_string(static_cast<int>(os.rdstate()));
}

} // namespace

TEST_CASE("a thread that ends while it inserts is unwound, as with one character after another") {
    // In a child: an implementation that kept the unwinding inside would end the process.
    Outcome const outcome = inChild([] {
        ::alarm(60);
        std::string const narrow = "abcdef";
        std::wstring const wide = L"abcdef";
        std::string const all[] = {
            endedWhileInserting([&](std::ostream& os) { insertOneByOne(os, narrow); }),
            endedWhileInserting([&](std::ostream& os) { Koru::operator<<(os, narrow); }),
            endedWhileInserting([&](std::ostream& os) { Koru::operator<<(os, wide); })};
        for (std::string const& each : all) std::printf("%s\n", each.c_str());
        return 0;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "ab unwound 1\nab unwound 1\nab unwound 1\n");
}
