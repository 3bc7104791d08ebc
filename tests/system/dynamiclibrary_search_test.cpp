// For whose sake the loader searches: it goes by who calls it, so nothing comes before its
// functions here. This executable has a DT_RUNPATH that finds the libraries beside it.
#include <koru/dynamiclibrary.h>

#include <dlfcn.h>

#include <doctest/doctest.h>

using Koru::DynamicLibrary;

namespace {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool SANITIZED = true; // The sanitizer calls the loader then.
#else
constexpr bool SANITIZED = false;
#endif

/// Whether this executable may load it.
bool isFoundFromHere(char const* name) {
    void* const handle = ::dlopen(name, RTLD_LAZY);
    if (handle != nullptr) ::dlclose(handle);
    return handle != nullptr;
}

} // namespace

TEST_CASE("a name without a slash is not searched for in the program's own folders" *
          doctest::skip(SANITIZED)) {
    DynamicLibrary library(L"libkoru_loadable_1.so");
    CHECK(!library.load());
    CHECK(isFoundFromHere("libkoru_loadable_1.so"));
    CHECK(!library.load());
}

TEST_CASE("$ORIGIN is the folder of libkoru" * doctest::skip(SANITIZED)) {
    CHECK(DynamicLibrary(L"$ORIGIN/libkoru.so.1").load());
    CHECK(!DynamicLibrary(L"$ORIGIN/libkoru_loadable_1.so").load());
    CHECK(isFoundFromHere("$ORIGIN/libkoru_loadable_1.so"));
}
