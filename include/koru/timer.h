/// @file
/// A stopwatch that streams write.
#ifndef KORU_TIMER_H
#define KORU_TIMER_H

#include <cstdint>
#include <iosfwd>

#include <koru/export.h>

namespace Koru {

/// The moment of its making, by the wall clock; written to a stream it gives the seconds since
/// then. A plain value: distinct objects may be used from several threads at once.
///
/// Intended: the time elapsed is the difference of two 32-bit floats of seconds since the epoch,
/// which today have steps of 128 seconds. So it reads 0.000 until it jumps to 128.000. For time
/// measured finely use `std::chrono::steady_clock`.
class KORU_EXPORT Timer {
public:
    /// Starts now.
    Timer();

    /// Starts anew, now.
    void reset();

    /// The start moment, not the time elapsed: seconds since the epoch and milliseconds (0 to 999)
    /// within the second.
    std::uint32_t getSeconds() const;
    std::uint32_t getMilliseconds() const;

private:
    std::uint32_t seconds_;
    std::uint32_t milliseconds_;
};

/// Writes the seconds since the start with three decimals.
/// Intended: the stream keeps fixed notation, `showpoint` and a precision of 3.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, Timer const& timer);

} // namespace Koru

#endif
