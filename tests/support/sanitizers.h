// Which sanitizer the tests and the library are built with, as macros and as constants. GCC has
// macros of its own for that and Clang asks for features.
#ifndef KORU_TESTS_SANITIZERS_H
#define KORU_TESTS_SANITIZERS_H

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define KORU_ADDRESS_SANITIZER 1
#elif __has_feature(thread_sanitizer)
#define KORU_THREAD_SANITIZER 1
#endif
#elif defined(__SANITIZE_ADDRESS__)
#define KORU_ADDRESS_SANITIZER 1
#elif defined(__SANITIZE_THREAD__)
#define KORU_THREAD_SANITIZER 1
#endif

namespace test {

#if defined(KORU_ADDRESS_SANITIZER) || defined(KORU_THREAD_SANITIZER)
constexpr bool SANITIZED = true;
#else
constexpr bool SANITIZED = false;
#endif

} // namespace test

#endif
