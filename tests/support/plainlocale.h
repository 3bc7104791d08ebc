// The "C" locale, where a test tells what happens under it.
#ifndef KORU_TESTS_PLAINLOCALE_H
#define KORU_TESTS_PLAINLOCALE_H

#include <clocale>
#include <string>

namespace test {

/// The locale "C" for all threads that have none of their own, for the time of a scope.
class PlainLocale {
public:
    PlainLocale() { std::setlocale(LC_ALL, "C"); }
    PlainLocale(PlainLocale const&) = delete;
    PlainLocale& operator=(PlainLocale const&) = delete;
    ~PlainLocale() { std::setlocale(LC_ALL, before_.c_str()); }

private:
    std::string const before_ = std::setlocale(LC_ALL, nullptr);
};

} // namespace test

#endif
