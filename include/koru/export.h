/// @file
/// The export macro, and what an application's build has to agree on with the library. Text, lists,
/// streams and time cross the interface as the types of the C and C++ libraries, so a build that
/// lays them out differently would link and then corrupt memory; it is refused here instead.
#ifndef KORU_EXPORT_H
#define KORU_EXPORT_H

#include <cstddef>
#include <ctime>

/// Marks the classes and functions that libkoru.so exports.
#define KORU_EXPORT __attribute__((visibility("default")))

#if !defined(__GLIBCXX__)
#error "Koru's interface uses the types of GNU libstdc++: compile without -stdlib=libc++."
#elif !defined(_GLIBCXX_USE_CXX11_ABI) || !_GLIBCXX_USE_CXX11_ABI
#error "Koru's interface uses the new std::string: compile without -D_GLIBCXX_USE_CXX11_ABI=0."
#elif __SIZEOF_WCHAR_T__ != 4
#error "Koru's interface uses a wchar_t of 32 bits: compile without -fshort-wchar."
#elif defined(_GLIBCXX_DEBUG) && !defined(KORU_GLIBCXX_DEBUG)
#error "Koru's interface uses the plain std::vector: compile without -D_GLIBCXX_DEBUG."
#elif !defined(_GLIBCXX_DEBUG) && defined(KORU_GLIBCXX_DEBUG)
#error "This Koru was built with libstdc++'s debug mode: compile with -D_GLIBCXX_DEBUG."
#elif defined(__USE_TIME_BITS64) && !defined(__LP64__)
#error "Koru's interface uses a time_t of 32 bits here: compile without -D_TIME_BITS=64."
#endif

#endif
