/// @file
/// A stopwatch that shows its time on a stream.
#ifndef KORU_TIMER_H
#define KORU_TIMER_H

#include <cstdint>
#include <iosfwd>

#include <koru/export.h>

namespace Koru {

/// Remembers when it was made, by the system's clock; written to a stream, it shows the seconds
/// since then. A plain value: several threads may use distinct objects at once.
///
/// Intended: the time elapsed is the difference of two 32-bit floats that count seconds since the
/// epoch, and such floats are 128 seconds apart today. So a timer shows 0.000 until it jumps to
/// 128.000. To measure time precisely, use `std::chrono::steady_clock`.
class KORU_EXPORT Timer {
public:
    /// Starts now.
    Timer();

    /// Starts again, now.
    void reset();

    /// When the timer was started, not the time elapsed: whole seconds since the epoch.
    std::uint32_t getSeconds() const;

    /// The milliseconds of that moment, 0 to 999.
    std::uint32_t getMilliseconds() const;

private:
    std::uint32_t seconds_;
    std::uint32_t milliseconds_;
};

/// Writes the seconds since the start with three decimals.
/// Intended: the stream's fixed notation, `showpoint` and precision of 3 remain set.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, Timer const& timer);

} // namespace Koru

#endif
