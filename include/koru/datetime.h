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

/// A calendar date, a time of day with milliseconds and an offset from UTC, and a mask that says
/// which of the two halves the value carries. A plain value.
///
/// Construction from a `tm`, a `long` or a `timeval`, conversion to `long`, and with it some
/// comparisons, use `localtime`, `gmtime` and `mktime` (POSIX), which share static storage: threads
/// that do so at once serialise it. Everything else may be done from several threads at once.
///
/// Intended: the offset takes part in nothing. Constructors derive it in whole hours, without the
/// hour of daylight saving; `setOffset` takes minutes.
class KORU_EXPORT DateTime {
public:
    /// Parts, combined with `|`: year, month and day; hour, minute, second, millisecond and offset.
    static unsigned int const DATE = 1U;
    static unsigned int const TIME = 2U;

    /// All fields 0, with both parts.
    DateTime();

    /// The given parts of a broken-down time, unchecked; the other fields are 0.
    DateTime(std::tm const& time, unsigned int parts = DATE | TIME);

    /// The given parts of a moment in seconds since the epoch, in local time.
    /// @throws std::invalid_argument "t is too small."  when the C library cannot convert it
    DateTime(long seconds, unsigned int parts = DATE | TIME);

    /// The same with milliseconds, which are set whatever the parts.
    DateTime(timeval const& time, unsigned int parts = DATE | TIME);

    /// Reads the given parts of "YYYY-MM-DD HH:MM:SS", "YYYY-MM-DD" or, for `TIME` alone,
    /// "HH:MM:SS". Intended: what stands behind the date's place is not looked at, numbers are read
    /// as `strtol` reads them, and of a date's numbers 0 or none at all leaves the field 0.
    /// @throws std::invalid_argument "incorrect format.", and what the setters throw
    DateTime(std::string const& text, unsigned int parts = DATE | TIME);

    std::uint16_t getYear() const;        ///< 0 when absent
    std::uint8_t getMonth() const;        ///< 1 to 12, 0 when absent
    std::uint8_t getDay() const;          ///< 1 to 31, 0 when absent
    std::uint8_t getHour() const;         ///< 0 to 23
    std::uint8_t getMinute() const;       ///< 0 to 59
    std::uint8_t getSecond() const;       ///< 0 to 59
    std::uint32_t getMillisecond() const; ///< within the second, but any number that was set
    std::int16_t getOffset() const;       ///< hours or minutes, see above

    /// @name Setters
    /// Each checks and sets one field; a value that is refused leaves the object as it was. The day
    /// is not checked against the month.
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
    /// Any number.
    void setMillisecond(unsigned int millisecond);
    /// @throws std::invalid_argument "offset out-of-range." unless -720 to 840 minutes
    void setOffset(short offset);

    /// @}

    /// Sets the fields of the given parts to 0. The value still carries the parts it carried.
    void clear(unsigned int parts);

    /// Seconds since the epoch of the fields as local time, daylight saving as the C library finds
    /// it; -1 where `mktime` fails. A year of 0 counts as 1900, a month of 0 as January.
    operator long() const;

    /// "YYYY-MM-DD HH:MM:SS" or the half that the value carries; empty when it carries none.
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

/// Compare the epoch seconds of both values. Milliseconds, offset and parts play no part.
KORU_EXPORT bool operator==(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator!=(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator<(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator<=(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator>(DateTime const& a, DateTime const& b);
KORU_EXPORT bool operator>=(DateTime const& a, DateTime const& b);

/// Writes the text form.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, DateTime const& value);

} // namespace Koru

#endif
