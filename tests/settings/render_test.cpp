// What a settings file writes when the C locale changes under its hands, as another thread may
// change it. A file of its own, since towlower and the operators that allocate memory are replaced
// for the whole executable and the libraries it loaded.
#include <doctest/doctest.h>

#include <dlfcn.h>
#include <wctype.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <new>
#include <random>
#include <string>
#include <vector>

#include <koru/initializationfile.h>
#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"

using Koru::InitializationFile;
using test::READ_WRITE;
using test::SettingsPlace;
using test::WRITE;

namespace {

// Whether U+00C9 and U+00E9 are a pair, and after how many questions that changes.
bool isPair = true;
long questionsBeforeChange = -1;

// Behind each block of memory stands what nobody may write.
constexpr std::array<unsigned char, 64> GUARD = {0xA5, 0x5A, 0xA5, 0x5A};
constexpr std::size_t HEAD = 64;
bool wasOverrun = false;

void* _allocate(std::size_t size) {
    auto* const block = static_cast<unsigned char*>(std::malloc(HEAD + size + GUARD.size()));
    if (block == nullptr) throw std::bad_alloc();
    std::memcpy(block, &size, sizeof size);
    std::memcpy(block + HEAD + size, GUARD.data(), GUARD.size());
    return block + HEAD;
}

void _free(void* memory) noexcept {
    if (memory == nullptr) return;
    auto* const block = static_cast<unsigned char*>(memory) - HEAD;
    std::size_t size;
    std::memcpy(&size, block, sizeof size);
    if (std::memcmp(block + HEAD + size, GUARD.data(), GUARD.size()) != 0) wasOverrun = true;
    std::free(block);
}

} // namespace

extern "C" wint_t towlower(wint_t c) noexcept {
    if (questionsBeforeChange >= 0 && questionsBeforeChange-- == 0) isPair = !isPair;
    if (c == 0xC9) return isPair ? 0xE9 : 0xC9;
    return c >= L'A' && c <= L'Z' ? c + 0x20 : c;
}

void* operator new(std::size_t size) { return _allocate(size); }
void* operator new[](std::size_t size) { return _allocate(size); }
void* operator new(std::size_t size, std::nothrow_t const&) noexcept { return _allocate(size); }
void* operator new[](std::size_t size, std::nothrow_t const&) noexcept { return _allocate(size); }
void operator delete(void* memory) noexcept { _free(memory); }
void operator delete[](void* memory) noexcept { _free(memory); }
void operator delete(void* memory, std::size_t) noexcept { _free(memory); }
void operator delete[](void* memory, std::size_t) noexcept { _free(memory); }

namespace {

/// A file whose entries stand by turns in two sections that may be one.
std::string bytesOfTwoSections(int entries) {
    std::string bytes;
    for (int i = 10; i < 10 + entries; ++i) {
        bytes += i % 2 == 0 ? "[a long name \xC3\x89]\n" : "[a long name \xC3\xA9]\n";
        bytes += "k" + std::to_string(i) + "=v\n";
    }
    return bytes;
}

/// The lines that are no headers, in order.
std::vector<std::string> entryLines(std::string const& bytes) {
    std::vector<std::string> lines;
    for (std::size_t at = 0; at < bytes.size();) {
        std::size_t const end = bytes.find('\n', at);
        if (bytes[at] != '[') lines.push_back(bytes.substr(at, end - at));
        at = end + 1;
    }
    std::sort(lines.begin(), lines.end());
    return lines;
}

void checkChangeDuringClose(std::string const& bytes, bool pairAtFirst, long questions) {
    CAPTURE(pairAtFirst);
    CAPTURE(questions);
    SettingsPlace const place;
    place.write(bytes);
    isPair = pairAtFirst;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    file.setValue(L"b", L"set", L"v"); // last
    questionsBeforeChange = questions;
    wasOverrun = false;
    file.close();
    questionsBeforeChange = -1;
    CHECK(!wasOverrun);
    std::vector<std::string> expected = entryLines(bytes);
    expected.push_back("set=v");
    CHECK(entryLines(place.bytes()) == expected);
}

} // namespace

TEST_CASE(
    "a locale that changes at any moment of close does not make the text overrun its memory") {
    std::string const bytes = bytesOfTwoSections(12);
    for (long questions = 0; questions < 150; ++questions) {
        checkChangeDuringClose(bytes, true, questions);
        checkChangeDuringClose(bytes, false, questions);
    }
}

TEST_CASE("what stands between the entries of a file is not written with them") {
    static std::vector<std::string> const pieces = {"[s]\n",
                                                    "[S]\n",
                                                    "[[t]]\n",
                                                    "[u\n",
                                                    "a=1\n",
                                                    "B=2\n",
                                                    "c=\n",
                                                    "=x\n",
                                                    " d=3 \t\n",
                                                    "e=4\r\n",
                                                    "# comment\n",
                                                    "\n",
                                                    std::string("f=\0g\n", 5),
                                                    "none\n",
                                                    "i==\n",
                                                    "\xC3\xA9=\xC3\xA9\n",
                                                    "j=\x80\n",
                                                    "k=[s]\n",
                                                    "l=5\n[s]",
                                                    "m=6",
                                                    "\xC1\x81=7\n",
                                                    "[\xC3\x89]\n",
                                                    std::string("a\0b=8\n", 6),
                                                    "  \n"};
    std::mt19937 random(1);
    isPair = true;
    for (int i = 0; i < 3000; ++i) {
        std::string bytes = "[s]\n";
        for (auto left = random() % 12; left != 0; --left) {
            bytes += pieces[random() % pieces.size()];
        }
        SettingsPlace const place;
        place.write(bytes);
        test::SettingsTableModel model;
        model.settings = test::parseSettings(bytes);
        test::sortSettings(model.settings);
        wasOverrun = false;
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        if (random() % 2 == 0) {
            std::wstring const value(random() % 40, random() % 4 == 0 ? L'\u00E9' : L'v');
            for (wchar_t const* key : {L"a", L"new", L"c"}) {
                file.setValue(L"s", key, value);
                model.setValue(L"s", key, value);
            }
        }
        file.close();
        test::sortSettings(model.settings);
        INFO(test::shown(bytes));
        test::checkSame(place.bytes(), test::settingsText(model.settings));
        CHECK(!wasOverrun);
    }
}

TEST_CASE("wide values of every length are written as make_string encodes them") {
    SettingsPlace const place;
    for (std::size_t size = 0; size < 70; ++size) {
        for (wchar_t const c :
             {L'a', L'\u00E9', L'\0', static_cast<wchar_t>(0x80000041), L'\U0001F600'}) {
            std::wstring value(size, L'a');
            if (size > 2) value[size - 2] = c;
            Koru::PropertyFile file(place.path());
            file.open(WRITE);
            file.setValue(value, value);
            wasOverrun = false;
            file.close();
            CHECK(!wasOverrun);
            std::string const encoded = Koru::make_string(value);
            test::checkSame(place.bytes(), encoded + "=" + encoded + "\n");
        }
    }
}
