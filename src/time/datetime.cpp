#include <koru/datetime.h>

#include <cstdlib>
#include <stdexcept>

#include "text/insert.h"

namespace Koru {

// For callers who take their addresses; the values are in the header.
unsigned int const DateTime::DATE;
unsigned int const DateTime::TIME;

namespace {

constexpr int SECONDS_PER_HOUR = 3600;

/// The offset of the local zone at a moment, in whole hours east of UTC, without the hour of
/// daylight saving: gmtime sets tm_isdst to 0.
std::int16_t _offsetHours(std::time_t moment) {
    std::tm* const utc = std::gmtime(&moment);
    if (utc == nullptr) return 0;
    // On 64 bits: near the limits of time_t mktime may fail, and the difference may not fit.
    std::int64_t const difference = std::int64_t{moment} - std::int64_t{std::mktime(utc)};
    return static_cast<std::int16_t>(difference / SECONDS_PER_HOUR);
}

std::tm const& _localTime(long seconds) {
    std::time_t const moment = seconds;
    std::tm const* const local = std::localtime(&moment);
    if (local == nullptr) throw std::invalid_argument("t is too small.");
    return *local;
}

bool _has(std::string const& text, std::size_t position, char c) {
    return position < text.size() && text[position] == c;
}

bool _isDigit(char c) { return c >= '0' && c <= '9'; }

/// The number that strtol finds in `size` characters of a text that is not shorter than `position`.
template <std::size_t size>
inline long _number(std::string const& text, std::size_t position) {
    if (position + size <= text.size()) {
        char const* const digits = text.data() + position;
        long number = 0;
        bool plain = true;
        for (std::size_t i = 0; i < size; ++i) {
            plain &= _isDigit(digits[i]);
            number = 10 * number + (digits[i] - '0');
        }
        if (plain) return number;
    }
    // strtol deals with signs, blanks and missing digits.
    return std::strtol(text.substr(position, size).c_str(), nullptr, 10);
}

void _check(bool inRange, char const* message) {
    if (!inRange) throw std::invalid_argument(message);
}

void _readDate(DateTime& value, std::string const& text) {
    _check(_has(text, 4, '-') && _has(text, 7, '-'), "incorrect format.");
    // Intended: a number of 0 is skipped.
    if (long const year = _number<4>(text, 0)) value.setYear(static_cast<unsigned short>(year));
    if (long const month = _number<2>(text, 5)) value.setMonth(static_cast<unsigned char>(month));
    if (long const day = _number<2>(text, 8)) value.setDay(static_cast<unsigned char>(day));
}

void _readTime(DateTime& value, std::string const& text) {
    std::size_t start = 0;
    if (!_has(text, 2, ':') || !_has(text, 5, ':')) {
        start = 11;
        _check(_has(text, 13, ':') && _has(text, 16, ':'), "incorrect format.");
    }
    value.setHour(static_cast<unsigned char>(_number<2>(text, start)));
    value.setMinute(static_cast<unsigned char>(_number<2>(text, start + 3)));
    value.setSecond(static_cast<unsigned char>(_number<2>(text, start + 6)));
}

/// Writes a number with leading zeros, or all its digits if they are more than `width`.
char* _put(char* to, unsigned int number, unsigned int width) {
    unsigned int digits = width;
    for (unsigned int rest = number / (width == 4 ? 10000U : 100U); rest != 0; rest /= 10) ++digits;
    for (unsigned int i = digits; i-- != 0; number /= 10)
        to[i] = static_cast<char>('0' + number % 10);
    return to + digits;
}

char* _put(char* to, char c) {
    *to = c;
    return to + 1;
}

constexpr std::size_t TEXT_SIZE = sizeof "65535-255-255 255:255:255";

/// Writes the given parts of a value and returns the end of the text.
char* _format(DateTime const& value, unsigned int parts, char* to) {
    if ((parts & DateTime::DATE) != 0) {
        to = _put(_put(to, value.getYear(), 4), '-');
        to = _put(_put(to, value.getMonth(), 2), '-');
        to = _put(to, value.getDay(), 2);
    }
    unsigned int const both = DateTime::DATE | DateTime::TIME;
    if ((parts & both) == both) to = _put(to, ' ');
    if ((parts & DateTime::TIME) != 0) {
        to = _put(_put(to, value.getHour(), 2), ':');
        to = _put(_put(to, value.getMinute(), 2), ':');
        to = _put(to, value.getSecond(), 2);
    }
    return to;
}

} // namespace

DateTime::DateTime()
    : year_(0), month_(0), day_(0), hour_(0), minute_(0), second_(0), millisecond_(0), offset_(0),
      parts_(DATE | TIME) {}

DateTime::DateTime(std::tm const& time, unsigned int parts) : DateTime() {
    std::tm copy = time;
    if ((parts & DATE) != 0) {
        year_ = static_cast<std::uint16_t>(static_cast<unsigned int>(time.tm_year) + 1900U);
        month_ = static_cast<std::uint8_t>(static_cast<unsigned int>(time.tm_mon) + 1U);
        day_ = static_cast<std::uint8_t>(time.tm_mday);
    }
    if ((parts & TIME) != 0) {
        hour_ = static_cast<std::uint8_t>(time.tm_hour);
        minute_ = static_cast<std::uint8_t>(time.tm_min);
        second_ = static_cast<std::uint8_t>(time.tm_sec);
    }
    // `time` may be in the storage that the C library's calls share: it is not used from here on.
    std::time_t const moment = std::mktime(&copy);
    if ((parts & TIME) != 0) offset_ = _offsetHours(moment);
    parts_ = static_cast<std::uint8_t>(parts);
}

DateTime::DateTime(long seconds, unsigned int parts) : DateTime(_localTime(seconds), parts) {}

DateTime::DateTime(timeval const& time, unsigned int parts)
    : DateTime(static_cast<long>(time.tv_sec), parts) {
    millisecond_ = static_cast<std::uint32_t>(time.tv_usec / 1000);
}

DateTime::DateTime(std::string const& text, unsigned int parts) : DateTime() {
    if ((parts & DATE) != 0) _readDate(*this, text);
    if ((parts & TIME) != 0) _readTime(*this, text);
    parts_ = static_cast<std::uint8_t>(parts);
}

std::uint16_t DateTime::getYear() const { return year_; }

std::uint8_t DateTime::getMonth() const { return month_; }

std::uint8_t DateTime::getDay() const { return day_; }

std::uint8_t DateTime::getHour() const { return hour_; }

std::uint8_t DateTime::getMinute() const { return minute_; }

std::uint8_t DateTime::getSecond() const { return second_; }

std::uint32_t DateTime::getMillisecond() const { return millisecond_; }

std::int16_t DateTime::getOffset() const { return offset_; }

void DateTime::setYear(unsigned short year) {
    _check(year >= 1000 && year <= 3000, "year out-of-range");
    year_ = year;
}

void DateTime::setMonth(unsigned char month) {
    _check(month >= 1 && month <= 12, "month out-of-range.");
    month_ = month;
}

void DateTime::setDay(unsigned char day) {
    _check(day >= 1 && day <= 31, "day out-of-range.");
    day_ = day;
}

void DateTime::setHour(unsigned char hour) {
    _check(hour <= 23, "hour out-of-range.");
    hour_ = hour;
}

void DateTime::setMinute(unsigned char minute) {
    _check(minute <= 59, "minute out-of-range.");
    minute_ = minute;
}

void DateTime::setSecond(unsigned char second) {
    _check(second <= 59, "minute out-of-range."); // Intended: the minute's message.
    second_ = second;
}

void DateTime::setMillisecond(unsigned int millisecond) { millisecond_ = millisecond; }

void DateTime::setOffset(short offset) {
    _check(offset >= -720 && offset <= 840, "offset out-of-range.");
    offset_ = offset;
}

void DateTime::clear(unsigned int parts) {
    if ((parts & DATE) != 0) {
        year_ = 0;
        month_ = 0;
        day_ = 0;
    }
    if ((parts & TIME) != 0) {
        hour_ = 0;
        minute_ = 0;
        second_ = 0;
        millisecond_ = 0;
        offset_ = 0;
    }
}

DateTime::operator long() const {
    std::tm time{};
    time.tm_sec = second_;
    time.tm_min = minute_;
    time.tm_hour = hour_;
    time.tm_mday = day_;
    time.tm_isdst = -1;
    if (year_ != 0) time.tm_year = year_ - 1900;
    if (month_ != 0) time.tm_mon = month_ - 1;
    return static_cast<long>(std::mktime(&time));
}

DateTime::operator std::string() const {
    char text[TEXT_SIZE];
    return std::string(text, _format(*this, parts_, text));
}

std::ostream& operator<<(std::ostream& os, DateTime const& value) {
    char text[TEXT_SIZE];
    insert(os, text, static_cast<std::size_t>(_format(value, value.parts_, text) - text));
    return os;
}

namespace {

/// Month, day, hour and minute as one number, in the order of their bytes in memory, so that the
/// compiler makes one load of them.
std::uint32_t _monthToMinute(DateTime const& value) {
    return value.getMonth() | std::uint32_t{value.getDay()} << 8 |
           std::uint32_t{value.getHour()} << 16 | std::uint32_t{value.getMinute()} << 24;
}

/// Whether the fields that a conversion looks at are the same.
bool _haveSameFields(DateTime const& a, DateTime const& b) {
    return a.getYear() == b.getYear() && _monthToMinute(a) == _monthToMinute(b) &&
           a.getSecond() == b.getSecond();
}

/// Whether the fields are a date and time that every time_t holds, in every zone.
bool _isRegular(DateTime const& value) {
    return value.getYear() > 1902 && value.getYear() < 2037 && value.getMonth() >= 1 &&
           value.getMonth() <= 12 && value.getDay() >= 1 && value.getDay() <= 31 &&
           value.getHour() <= 23 && value.getMinute() <= 59 && value.getSecond() <= 59;
}

/// Days as if every month had 31.
int _days(DateTime const& value) {
    return (value.getYear() * 12 + value.getMonth()) * 31 + value.getDay();
}

/// How two values with different fields compare: by their epoch seconds. Converts both, first `a`,
/// unless the fields decide beyond doubt. Not inlined: values with the same fields are compared
/// sooner without the registers that this takes.
[[gnu::noinline]] int _orderInTime(DateTime const& a, DateTime const& b) {
    if (_isRegular(a) && _isRegular(b)) {
        // Seven of these days are at least four calendar days, namely at the end of February, and
        // so more than 72 hours between any times of day. A zone is less than 25 hours from UTC
        // (POSIX), so it shifts by less than 50 hours between the two moments.
        constexpr int beyondDoubt = 7;
        int const difference = _days(a) - _days(b);
        if (difference >= beyondDoubt || difference <= -beyondDoubt) return difference;
    }
    long const secondsA = a;
    long const secondsB = b;
    return secondsA < secondsB ? -1 : secondsA > secondsB;
}

/// How two values compare: less than, equal to or greater than 0.
inline int _order(DateTime const& a, DateTime const& b) {
    return _haveSameFields(a, b) ? 0 : _orderInTime(a, b);
}

} // namespace

bool operator==(DateTime const& a, DateTime const& b) { return _order(a, b) == 0; }

bool operator!=(DateTime const& a, DateTime const& b) { return !(a == b); }

bool operator<(DateTime const& a, DateTime const& b) { return _order(a, b) < 0; }

bool operator<=(DateTime const& a, DateTime const& b) { return !(a > b); }

bool operator>(DateTime const& a, DateTime const& b) { return _order(a, b) > 0; }

bool operator>=(DateTime const& a, DateTime const& b) { return !(a < b); }

} // namespace Koru
