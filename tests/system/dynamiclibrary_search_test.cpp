// For whose sake the loader searches: it goes by who calls it, so nothing stands before its
// functions here. This executable has a DT_RUNPATH that finds the libraries beside it.
#include <koru/dynamiclibrary.h>

#include <dlfcn.h>

#include <string>

#include <doctest/doctest.h>

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define KORU_TEST_SANITIZED true // The sanitizer calls the loader then.
#else
#define KORU_TEST_SANITIZED false
#endif

namespace {

/// Whether this executable may load it.
bool isFoundFromHere(char const* name) {
    void* const handle = ::dlopen(name, RTLD_LAZY);
    if (handle != nullptr) ::dlclose(handle);
    return handle != nullptr;
}

} // namespace

TEST_CASE("the program's DT_RUNPATH is not used" * doctest::skip(KORU_TEST_SANITIZED)) {
    Koru::DynamicLibrary library(L"libkoru_loadable_1.so");
    CHECK(!library.load());
    CHECK(isFoundFromHere("libkoru_loadable_1.so"));
    CHECK(!library.load());
}

TEST_CASE("$ORIGIN is the folder of libkoru" * doctest::skip(KORU_TEST_SANITIZED)) {
    CHECK(Koru::DynamicLibrary(L"$ORIGIN/libkoru.so.1").load());
    CHECK(!Koru::DynamicLibrary(L"$ORIGIN/libkoru_loadable_1.so").load());
    CHECK(isFoundFromHere("$ORIGIN/libkoru_loadable_1.so"));
}
