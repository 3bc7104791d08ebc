#include <koru/timer.h>

#include <sys/time.h>

#include <charconv>
#include <cmath>
#include <cstring>
#include <iterator>
#include <locale>
#include <ostream>

namespace Koru {

namespace {

/// Seconds since the epoch as a 32-bit float. Intended: rounded, but only once. A double holds the
/// sum precisely enough, and storing to a volatile object drops what an x87 register has beyond it.
float _total(Timer const& timer) {
    double const exact = timer.getSeconds() + timer.getMilliseconds() / double{1000.0F};
    float volatile const rounded = static_cast<float>(exact);
    return rounded;
}

/// Whether the stream writes a number without a sign, padding and separators.
bool _writesPlainly(std::ostream const& os) {
    return os.width() == 0 && (os.flags() & std::ios::showpos) == 0 &&
           os.getloc() == std::locale::classic();
}

/// Writes seconds as the stream does, which is set to three decimals. Whole numbers do not need the
/// C library for that, and the difference of two floats of our time has no fraction.
void _write(std::ostream& os, float seconds) {
    char text[sizeof "4294967295.000"];
    bool const isWhole = !std::signbit(seconds) && seconds < 4e9F && seconds == std::trunc(seconds);
    if (isWhole && _writesPlainly(os)) {
        char* const point =
            std::to_chars(text, std::end(text), static_cast<std::uint32_t>(seconds)).ptr;
        std::strcpy(point, ".000");
        os << text;
    } else {
        os << static_cast<double>(seconds);
    }
}

} // namespace

Timer::Timer() : seconds_(0), milliseconds_(0) {
    timeval now;
    if (::gettimeofday(&now, nullptr) != 0) return;
    seconds_ = static_cast<std::uint32_t>(now.tv_sec);
    milliseconds_ = static_cast<std::uint32_t>(now.tv_usec) / 1000U;
}

void Timer::reset() { *this = Timer(); }

std::uint32_t Timer::getSeconds() const { return seconds_; }

std::uint32_t Timer::getMilliseconds() const { return milliseconds_; }

std::ostream& operator<<(std::ostream& os, Timer const& timer) {
    float const now = _total(Timer());
    float volatile const elapsed = now - _total(timer);
    os.setf(std::ios::fixed, std::ios::floatfield);
    os.setf(std::ios::showpoint);
    os.precision(3);
    _write(os, elapsed);
    return os;
}

} // namespace Koru
