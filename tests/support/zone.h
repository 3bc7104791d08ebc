// The time zone of a test.
#ifndef KORU_TESTS_ZONE_H
#define KORU_TESTS_ZONE_H

#include <stdlib.h>
#include <time.h>

#include <string>

namespace test {

/// The process's time zone, as a POSIX text, for as long as the object lives.
class Zone {
public:
    /// Whether the C library is told at once, or has to look by itself when it converts.
    enum Told : bool { UNTOLD, TOLD };

    explicit Zone(char const* text, Told told = TOLD) {
        if (char const* const before = ::getenv("TZ")) before_ = before;
        ::setenv("TZ", text, 1);
        if (told) ::tzset();
    }
    Zone(Zone const&) = delete;
    Zone& operator=(Zone const&) = delete;
    ~Zone() {
        ::setenv("TZ", before_.c_str(), 1);
        ::tzset();
    }

private:
    std::string before_ = "UTC0";
};

} // namespace test

#endif
