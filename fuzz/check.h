// What a fuzz target asserts, in every build type.
#ifndef KORU_FUZZ_CHECK_H
#define KORU_FUZZ_CHECK_H

#include <cstdio>
#include <cstdlib>

#define KORU_CHECK(condition)                                                                      \
    do {                                                                                           \
        if (!(condition)) {                                                                        \
            std::fprintf(stderr, "%s:%d: %s does not hold\n", __FILE__, __LINE__, #condition);     \
            std::abort();                                                                          \
        }                                                                                          \
    } while (false)

#endif
