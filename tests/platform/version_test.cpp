// The version that applications can read.
#include <koru/version.h>

#include <doctest/doctest.h>

#include <string>

TEST_CASE("the version's number and its text are made of its three parts") {
    CHECK(KORU_VERSION ==
          KORU_VERSION_MAJOR * 10000 + KORU_VERSION_MINOR * 100 + KORU_VERSION_PATCH);
    CHECK(KORU_VERSION_STRING == std::to_string(KORU_VERSION_MAJOR) + '.' +
                                     std::to_string(KORU_VERSION_MINOR) + '.' +
                                     std::to_string(KORU_VERSION_PATCH));
}

TEST_CASE("the preprocessor can compare the version") {
#if KORU_VERSION >= 10000 && KORU_VERSION < 20000
    bool const isOne = true;
#else
    bool const isOne = false;
#endif
    CHECK(isOne == (KORU_VERSION_MAJOR == 1));
}

TEST_CASE("the build has the version of the header") {
    CHECK(std::string(KORU_PROJECT_VERSION) == KORU_VERSION_STRING);
}
