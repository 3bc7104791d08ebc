// Settings files where there is no memory for what is only a guess or a help. A file of its own,
// since the operators that allocate memory are replaced for the whole executable and the libraries
// it loaded.
#include <doctest/doctest.h>

#include <cstddef>
#include <cstdlib>
#include <new>
#include <string>

#include <koru/initializationfile.h>
#include <koru/propertyfile.h>

#include "support/settingsfixture.h"

using Koru::InitializationFile;
using test::READ;
using test::SettingsPlace;

namespace {

// Allocations from the one size up to the other fail.
std::size_t failsFrom = static_cast<std::size_t>(-1);
std::size_t failsTo = 0;
std::size_t failures = 0;

void* _allocate(std::size_t size) noexcept {
    if (size < failsFrom || size > failsTo) return std::malloc(size == 0 ? 1 : size);
    ++failures;
    return nullptr;
}

void* _allocateOrThrow(std::size_t size) {
    void* const memory = _allocate(size);
    if (memory == nullptr) throw std::bad_alloc();
    return memory;
}

constexpr std::size_t ANY = static_cast<std::size_t>(-1);

/// Lets allocations of some sizes fail while the callable runs.
template <class Callable>
void withoutMemory(std::size_t from, std::size_t to, Callable callable) {
    struct Scope {
        ~Scope() { failsFrom = ANY; }
    } const scope;
    failures = 0;
    failsTo = to;
    failsFrom = from;
    callable();
}

std::string lines(int count) {
    std::string bytes;
    for (int i = 0; i < count; ++i) bytes += "key" + std::to_string(i) + "=v\n";
    return bytes;
}

} // namespace

void* operator new(std::size_t size) { return _allocateOrThrow(size); }
void* operator new[](std::size_t size) { return _allocateOrThrow(size); }
void* operator new(std::size_t size, std::nothrow_t const&) noexcept { return _allocate(size); }
void* operator new[](std::size_t size, std::nothrow_t const&) noexcept { return _allocate(size); }
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete[](void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }
void operator delete[](void* memory, std::size_t) noexcept { std::free(memory); }
void operator delete(void* memory, std::nothrow_t const&) noexcept { std::free(memory); }
void operator delete[](void* memory, std::nothrow_t const&) noexcept { std::free(memory); }

TEST_CASE("look-ups find what is there without any memory, and then with it") {
    SettingsPlace const place;
    for (int const count : {1, 4, 5, 60, 300}) {
        CAPTURE(count);
        place.write("[section]\n" + lines(count));
        InitializationFile file(place.path());
        file.open(READ);
        std::wstring const section = L"SECTION";
        std::wstring const missing = L"KEY";
        for (int i = 0; i < 2 * count; ++i) {
            std::wstring const key = missing + std::to_wstring(i % count);
            std::wstring found; // short enough to need no memory
            std::wstring missed;
            withoutMemory(i < count ? 0 : ANY, ANY, [&] {
                found = file.getValue(section, key);
                missed = file.getValue(section, missing);
            });
            CHECK((found == L"v"));
            CHECK(missed.empty());
            CHECK((failures != 0) == (i < count && count > 4));
        }
    }
}

TEST_CASE("entries are removed where the memory for look-ups came late") {
    SettingsPlace const place;
    place.write(lines(100));
    Koru::PropertyFile file(place.path());
    file.open(READ);
    auto const key = [](int i) { return L"key" + std::to_wstring(i * 37 % 100); };
    for (int i = 0; i < 100; ++i) {
        std::wstring const removed = key(i);
        withoutMemory(i < 20 ? 0 : ANY, ANY, [&] { file.removeKey(removed); });
        for (int k = 0; k < 100; k += 9) {
            std::wstring value;
            std::wstring const asked = key(k);
            withoutMemory(i < 10 ? 0 : ANY, ANY, [&] { value = file.getValue(asked); });
            CHECK((value == (k <= i ? L"" : L"v")));
        }
    }
    CHECK(file.enumerateKeys().empty());
}

TEST_CASE("a file of comments opens without the memory for as many entries") {
    SettingsPlace const place;
    std::string comments;
    while (comments.size() < 1000000) comments += "; a comment of the usual length\n";
    place.write(comments + "[s]\nk=v\n");
    InitializationFile file(place.path());
    std::size_t const guess = comments.size() / 32 * 5 * sizeof(void*);
    withoutMemory(guess, guess + 1000, [&] { file.open(READ); });
    CHECK(failures == 1);
    CHECK((file.getValue(L"s", L"k") == L"v"));
}
