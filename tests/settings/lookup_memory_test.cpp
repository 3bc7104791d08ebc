// Settings files where there is no memory for what is only a guess or a help.
#include <doctest/doctest.h>

#include <cstddef>
#include <string>

#include <koru/propertyfile.h>

#include "support/failingmemory.h"
#include "support/plainlocale.h"
#include "support/settingsfixture.h"

using test::Failing;
using test::FailingMemory;
using test::SettingsFile;

namespace {

/// Runs the callable, without any memory or with it.
template <class Callable>
void run(bool withMemory, Callable callable) {
    FailingMemory const plan({withMemory ? -1 : 0, Failing::ONE_AND_ALL_LATER});
    callable();
}

std::string lines(int count) {
    std::string bytes;
    for (int i = 0; i < count; ++i) bytes += "key" + std::to_string(i) + "=v\n";
    return bytes;
}

} // namespace

TEST_CASE("look-ups find what is there without any memory, and then with it") {
    test::PlainLocale const locale; // In Turkish, "SECTION" would be another name.
    for (int const count : {1, 4, 5, 60, 300}) {
        CAPTURE(count);
        SettingsFile file("[section]\n" + lines(count));
        std::wstring const section = L"SECTION";
        std::wstring const missing = L"KEY";
        for (int i = 0; i < 2 * count; ++i) {
            std::wstring const key = missing + std::to_wstring(i % count);
            std::wstring found; // short enough to need no memory
            std::wstring missed;
            run(i >= count, [&] {
                found = file.getValue(section, key);
                missed = file.getValue(section, missing);
            });
            CHECK((found == L"v"));
            CHECK(missed.empty());
            CHECK(test::memoryRanOut() == (i < count && count > 4));
        }
    }
}

TEST_CASE("entries are removed where the memory for look-ups came late") {
    test::Place const place;
    place.write(lines(100));
    Koru::PropertyFile file(place.path());
    file.open(test::READ);
    auto const key = [](int i) { return L"key" + std::to_wstring(i * 37 % 100); };
    for (int i = 0; i < 100; ++i) {
        std::wstring const removed = key(i);
        run(i >= 20, [&] { file.removeKey(removed); });
        for (int k = 0; k < 100; k += 9) {
            std::wstring value;
            std::wstring const asked = key(k);
            run(i >= 10, [&] { value = file.getValue(asked); });
            CHECK((value == (k <= i ? L"" : L"v")));
        }
    }
    CHECK(file.enumerateKeys().empty());
}

TEST_CASE("what was set is removed without any memory, and can be set again") {
    SettingsFile file("[s]\n" + lines(3));
    std::wstring const section = L"s";
    std::wstring const key = L"key1";
    for (wchar_t const* const value : {L"set", L"set again"}) {
        file.setValue(section, key, value);
        CHECK((file.getValue(section, key) == value));
        run(false, [&] { file.removeKey(section, key); });
        CHECK(test::memoryRanOut());
        test::checkSame(file.enumerateKeys(section), {L"key0", L"key2"});
    }
}

TEST_CASE("a file of comments opens without the memory for as many entries") {
    std::string comments;
    while (comments.size() < 1000000) comments += "; a comment of the usual length\n";
    SettingsFile file;
    file.place.write(comments + "[s]\nk=v\n");
    std::size_t const guess = comments.size() / 32 * 5 * sizeof(void*);
    {
        FailingMemory const plan({0, Failing::ONE_AND_ALL_LATER, guess, guess + 1000});
        file.open(test::READ);
    }
    CHECK(test::failedAllocations() == 1);
    CHECK((file.getValue(L"s", L"k") == L"v"));
}

TEST_CASE("sections, keys and values that come and go leave no memory behind" *
          doctest::skip(test::SANITIZED)) {
    SettingsFile file("[s]\nk=v\n");
    auto const comeAndGo = [&file](int times) {
        test::MostBytes const most;
        for (int i = 0; i < times; ++i) {
            std::wstring const section(100, static_cast<wchar_t>(L'a' + i % 26));
            file.setValue(section + std::to_wstring(i), section, section);
            file.removeSection(section + std::to_wstring(i));
        }
        return most.count();
    };
    comeAndGo(1000);
    CHECK(comeAndGo(10000) < 100000);
}
