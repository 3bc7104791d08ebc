// Where a virtual operation is in the table of its class, which programs built before rely on.
#ifndef KORU_TESTS_SLOTS_H
#define KORU_TESTS_SLOTS_H

#include <doctest/doctest.h>

#include <cstddef>
#include <cstring>

namespace test {

/// The place of a virtual operation in the table of its class. A pointer to a virtual member is one
/// more than the operation's distance from the table's start (Itanium C++ ABI).
template <class Member>
std::size_t slotOf(Member member) {
    static_assert(sizeof(Member) == 2 * sizeof(std::size_t), "");
    std::size_t words[2];
    std::memcpy(words, &member, sizeof words);
    CHECK(words[0] % sizeof(void*) == 1);
    CHECK(words[1] == 0);
    return (words[0] - 1) / sizeof(void*);
}

/// The place of `open(unsigned long)`, of which there are overloads.
template <class File>
std::size_t slotOfOpen() {
    return slotOf(static_cast<void (File::*)(unsigned long)>(&File::open));
}

} // namespace test

#endif
