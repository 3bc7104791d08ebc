/// @file
/// Calendar date and time of day.
#ifndef KORU_DATETIME_H
#define KORU_DATETIME_H

#include <sys/time.h>

#include <cstdint>
#include <ctime>
#include <iosfwd>
#include <string>

#include <koru/export.h>

namespace Koru {

/// A calendar date, a time of day with milliseconds, an offset from UTC, and a mask that says which
/// of the two halves, date and time, the value has. A plain value:
/// @code
///     Koru::DateTime const start("2005-07-07 11:05:00");
///     long const seconds = start; // since the epoch, 1120734300 in UTC
///     std::string const later = Koru::DateTime(seconds + 3600); // "2005-07-07 12:05:00"
/// @endcode
///
/// Construction from a `tm`, a `long` or a `timeval`, conversion to `long`, and thus some
/// comparisons use `localtime`, `gmtime` and `mktime` (POSIX), which share static storage: threads
/// have to take turns with these. Several threads may do everything else at once.
///
/// Intended: nothing uses the offset. Constructors derive it in whole hours, without the hour of
/// daylight saving; `setOffset` takes minutes.
class KORU_EXPORT DateTime {
public:
    /// Parts, combined with `|`.
    static unsigned int const DATE = 1U; ///< year, month and day
    static unsigned int const TIME = 2U; ///< hour, minute, second, millisecond and offset

    /// All fields 0, with both parts.
    DateTime();

    /// The given parts of a broken-down time, unchecked; the other fields are 0.
    DateTime(std::tm const& time, unsigned int parts = DATE | TIME);

    /// The given parts of a moment in seconds since the epoch, in local time.
    /// @throws std::invalid_argument "t is too small."  when the C library cannot convert it
    DateTime(long seconds, unsigned int parts = DATE | TIME);

    /// The same with milliseconds, which it sets whatever the parts.
    DateTime(timeval const& time, unsigned int parts = DATE | TIME);

    /// Reads the given parts of "YYYY-MM-DD HH:MM:SS", "YYYY-MM-DD" or, for `TIME` alone,
    /// "HH:MM:SS". Intended: it ignores the character between date and time and everything after
    /// the last part, reads numbers as `strtol` does, and leaves a field of the date 0 where the
    /// number is 0 or missing.
    /// @throws std::invalid_argument "incorrect format.", and what the setters throw
    DateTime(std::string const& text, unsigned int parts = DATE | TIME);

    std::uint16_t getYear() const;        ///< 0 when absent
    std::uint8_t getMonth() const;        ///< 1 to 12, 0 when absent
    std::uint8_t getDay() const;          ///< 1 to 31, 0 when absent
    std::uint8_t getHour() const;         ///< 0 to 23
    std::uint8_t getMinute() const;       ///< 0 to 59
    std::uint8_t getSecond() const;       ///< 0 to 59
    std::uint32_t getMillisecond() const; ///< within the second, or whatever number was set
    std::int16_t getOffset() const;       ///< hours or minutes, see above

    /// @name Setters
    /// Each checks and sets one field; when it refuses a value, the object is unchanged. Nothing
    /// checks the day against the month.
    /// @{

    /// @throws std::invalid_argument "year out-of-range" unless 1000 to 3000
    void setYear(unsigned short year);
    /// @throws std::invalid_argument "month out-of-range." unless 1 to 12
    void setMonth(unsigned char month);
    /// @throws std::invalid_argument "day out-of-range." unless 1 to 31
    void setDay(unsigned char day);
    /// @throws std::invalid_argument "hour out-of-range." unless 0 to 23
    void setHour(unsigned char hour);
    /// @throws std::invalid_argument "minute out-of-range." unless 0 to 59
    void setMinute(unsigned char minute);
    /// @throws std::invalid_argument "minute out-of-range." (Intended: the minute's message) unless
    ///         0 to 59
    void setSecond(unsigned char second);
    /// Takes any number.
    void setMillisecond(unsigned int millisecond);
    /// @throws std::invalid_argument "offset out-of-range." unless -720 to 840 minutes
    void setOffset(short offset);

    /// @}

    /// Sets the fields of the given parts to 0. The value keeps the parts that it had.
    void clear(unsigned int parts);

    /// The seconds since the epoch for the fields as local time; -1 if `mktime` fails. The C
    /// library decides on daylight saving; of an hour that a clock shows twice, it may take the
    /// first at one call and the second at another. A year of 0 counts as 1900, a month of 0 as
    /// January.
    operator long() const;

    /// "YYYY-MM-DD HH:MM:SS", or the half of it that the value has; empty when it has none.
    operator std::string() const;

    friend KORU_EXPORT std::ostream& operator<<(std::ostream& os, DateTime const& value);

private:
    std::uint16_t year_;
    std::uint8_t month_;
    std::uint8_t day_;
    std::uint8_t hour_;
    std::uint8_t minute_;
    std::uint8_t second_;
    std::uint32_t millisecond_;
    std::int16_t offset_;
    std::uint8_t parts_;
};

/// @{
/// Compares the seconds since the epoch of both values; milliseconds, offset and parts do
/// not count.
KORU_EXPORT bool operator==(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator!=(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator<(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator<=(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator>(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator>=(DateTime const& a, DateTime const& b);
/// @}

/// Writes the text form.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, DateTime const& value);

} // namespace Koru

#endif
