// For whose sake the loader searches: it goes by who calls it, so nothing comes before its
// functions here, which a sanitizer would. This executable has a DT_RUNPATH that finds the
// libraries beside it.
#include <koru/dynamiclibrary.h>

#include <dlfcn.h>

#include <doctest/doctest.h>

#include "support/sanitizers.h"

using Koru::DynamicLibrary;
using test::SANITIZED;

namespace {

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
