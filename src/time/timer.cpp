#include <koru/timer.h>

#include <sys/time.h>

#include <ostream>

namespace Koru {

namespace {

/// Seconds since the epoch as a 32-bit float. Intended: rounded, but once only. The sum is exact
/// enough as a double, and the volatile object takes away what a register of the x87 holds beyond.
float _total(Timer const& timer) {
    double const exact = timer.getSeconds() + timer.getMilliseconds() / double{1000.0F};
    float volatile const rounded = static_cast<float>(exact);
    return rounded;
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
    return os << static_cast<double>(elapsed);
}

} // namespace Koru
