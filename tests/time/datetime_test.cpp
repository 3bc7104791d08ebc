// Calendar date and time: fields and setters, conversion from and to broken-down time, seconds and
// text, comparison. Each conversion is held against a model of a few lines that calls the C library
// as the conversion is described.
#include <koru/datetime.h>

#include <doctest/doctest.h>

#include <dlfcn.h>
#include <stdlib.h>
#include <sys/time.h>

#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <deque>
#include <iomanip>
#include <locale>
#include <random>
#include <sstream>
#include <stdexcept>
#include <streambuf>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "support/throws.h"

namespace {

/// What the time functions of the C library are asked, and what they shall answer.
struct Calls {
    std::vector<std::tm> mktime;
    std::vector<std::time_t> gmtime;
    std::vector<std::time_t> localtime;
    std::deque<std::time_t> mktimeAnswers; ///< else the C library's own
    bool localtimeFails = false;
};
Calls calls;

template <class Function>
Function* next(char const* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

} // namespace

// These stand before the C library's functions. Of an hour that comes twice glibc's mktime takes
// the one that fits the conversion before, so each conversion here follows one and the same other.
extern "C" std::time_t mktime(std::tm* time) noexcept {
    static auto* const real = next<std::time_t(std::tm*)>("mktime");
    calls.mktime.push_back(*time);
    if (!calls.mktimeAnswers.empty()) {
        std::time_t const answer = calls.mktimeAnswers.front();
        calls.mktimeAnswers.pop_front();
        return answer;
    }
    std::tm other = {};
    other.tm_year = 105;
    other.tm_mday = 15;
    other.tm_hour = 12;
    real(&other);
    return real(time);
}

extern "C" std::tm* gmtime(std::time_t const* moment) noexcept {
    static auto* const real = next<std::tm*(std::time_t const*)>("gmtime");
    calls.gmtime.push_back(*moment);
    return real(moment);
}

extern "C" std::tm* localtime(std::time_t const* moment) noexcept {
    static auto* const real = next<std::tm*(std::time_t const*)>("localtime");
    calls.localtime.push_back(*moment);
    return calls.localtimeFails ? nullptr : real(moment);
}

namespace {

using Koru::DateTime;
unsigned int const DATE = DateTime::DATE;
unsigned int const TIME = DateTime::TIME;
unsigned int const BOTH = DateTime::DATE | DateTime::TIME;

/// The process's time zone, as a POSIX text, for as long as it lives.
class Zone {
public:
    explicit Zone(char const* text) {
        if (char const* const before = std::getenv("TZ")) {
            wasSet_ = true;
            before_ = before;
        }
        ::setenv("TZ", text, 1);
        ::tzset();
    }
    Zone(Zone const&) = delete;
    Zone& operator=(Zone const&) = delete;
    ~Zone() {
        if (wasSet_) {
            ::setenv("TZ", before_.c_str(), 1);
        } else {
            ::unsetenv("TZ");
        }
        ::tzset();
    }

private:
    bool wasSet_ = false;
    std::string before_;
};

char const CENTRAL_EUROPE[] = "CET-1CEST,M3.5.0,M10.5.0/3";
char const NEW_YORK[] = "EST5EDT,M3.2.0,M11.1.0";
/// Summer time is two days and two hours later than winter time, which is as far as it goes.
char const EXTREME[] = "AAA24:59:59BBB-24:59:59,M3.5.0,M10.5.0";
/// The same on 28 February, where a month is shortest.
char const EXTREME_FEBRUARY[] = "AAA24:59:59BBB-24:59:59,J59/0,J300";

char const* const ZONES[] = {
    "UTC0",
    CENTRAL_EUROPE,
    NEW_YORK,
    "IST-5:30",
    "NST3:30",
    "<+1245>-12:45",
    "<-0030>0:30",
    "<+0030>-0:30",
    "<+14>-14",
    "<-12>12",
    "AEST-10AEDT,M10.1.0,M4.1.0/3",
    "<+1030>-10:30<+11>-11,M10.1.0,M4.1.0",
    EXTREME,
};

/// Numbers in groups of one digit each.
struct Grouped : std::numpunct<char> {
    char do_thousands_sep() const override { return '.'; }
    std::string do_grouping() const override { return "\1"; }
};

/// The fields in a text of the test's own.
struct Fields {
    unsigned long year = 0;
    unsigned long month = 0;
    unsigned long day = 0;
    unsigned long hour = 0;
    unsigned long minute = 0;
    unsigned long second = 0;
    unsigned long millisecond = 0;
    long offset = 0;
    unsigned long parts = 0;

    std::string shown() const {
        char text[200];
        std::snprintf(text, sizeof text, "%lu/%lu/%lu %lu:%lu:%lu.%lu offset %ld parts %lu", year,
                      month, day, hour, minute, second, millisecond, offset, parts);
        return text;
    }
};

/// One field of the object as it lies in memory.
template <class T>
T at(DateTime const& value, std::size_t position) {
    unsigned char bytes[sizeof(DateTime)];
    std::memcpy(bytes, &value, sizeof bytes);
    T field;
    std::memcpy(&field, bytes + position, sizeof field);
    return field;
}

std::size_t const PARTS_POSITION = 14;

Fields fieldsOf(DateTime const& value) {
    Fields fields;
    fields.year = value.getYear();
    fields.month = value.getMonth();
    fields.day = value.getDay();
    fields.hour = value.getHour();
    fields.minute = value.getMinute();
    fields.second = value.getSecond();
    fields.millisecond = value.getMillisecond();
    fields.offset = value.getOffset();
    fields.parts = at<std::uint8_t>(value, PARTS_POSITION);
    return fields;
}

std::string shown(DateTime const& value) { return fieldsOf(value).shown(); }

std::string text(DateTime const& value) { return value; }

long seconds(DateTime const& value) { return value; }

std::tm brokenDown(int year, int month, int day, int hour = 0, int minute = 0, int second = 0) {
    std::tm time = {};
    time.tm_year = year - 1900;
    time.tm_mon = month - 1;
    time.tm_mday = day;
    time.tm_hour = hour;
    time.tm_min = minute;
    time.tm_sec = second;
    time.tm_isdst = -1;
    return time;
}

/// A value of any fields, which are not checked on this way.
DateTime valueOf(int year, int month, int day, int hour = 0, int minute = 0, int second = 0,
                 unsigned int parts = BOTH) {
    return DateTime(brokenDown(year, month, day, hour, minute, second), parts);
}

// --------------------------------------------------------------------------------- the models

Fields modelOf(std::tm const& time, unsigned int parts) {
    Fields fields;
    if ((parts & DATE) != 0) {
        fields.year = static_cast<std::uint16_t>(std::int64_t{time.tm_year} + 1900);
        fields.month = static_cast<std::uint8_t>(std::int64_t{time.tm_mon} + 1);
        fields.day = static_cast<std::uint8_t>(time.tm_mday);
    }
    if ((parts & TIME) != 0) {
        fields.hour = static_cast<std::uint8_t>(time.tm_hour);
        fields.minute = static_cast<std::uint8_t>(time.tm_min);
        fields.second = static_cast<std::uint8_t>(time.tm_sec);
    }
    std::tm copy = time;
    std::time_t const s = std::mktime(&copy);
    if ((parts & TIME) != 0) {
        std::int64_t const east = std::int64_t{s} - std::int64_t{std::mktime(std::gmtime(&s))};
        fields.offset = static_cast<std::int16_t>(east / 3600);
    }
    fields.parts = parts & 0xFFU;
    return fields;
}

unsigned long ranged(long number, long least, long greatest, char const* message) {
    if (number < least || number > greatest) throw std::invalid_argument(message);
    return static_cast<unsigned long>(number);
}

/// Fields, or the message of the exception.
std::string modelOf(std::string const& text, unsigned int parts) {
    auto const is = [&](std::size_t i, char c) { return i < text.size() && text[i] == c; };
    auto const number = [&](std::size_t from, std::size_t count) {
        return std::strtol(text.substr(from, count).c_str(), nullptr, 10);
    };
    Fields fields;
    fields.parts = parts & 0xFFU;
    try {
        if ((parts & DATE) != 0) {
            if (!is(4, '-') || !is(7, '-')) return "incorrect format.";
            long const year = number(0, 4);
            long const month = number(5, 2);
            long const day = number(8, 2);
            if (year != 0) fields.year = ranged(year & 0xFFFF, 1000, 3000, "year out-of-range");
            if (month != 0) fields.month = ranged(month & 0xFF, 1, 12, "month out-of-range.");
            if (day != 0) fields.day = ranged(day & 0xFF, 1, 31, "day out-of-range.");
        }
        if ((parts & TIME) != 0) {
            std::size_t start = 0;
            if (!is(2, ':') || !is(5, ':')) {
                if (!is(13, ':') || !is(16, ':')) return "incorrect format.";
                start = 11;
            }
            fields.hour = ranged(number(start, 2) & 0xFF, 0, 23, "hour out-of-range.");
            fields.minute = ranged(number(start + 3, 2) & 0xFF, 0, 59, "minute out-of-range.");
            fields.second = ranged(number(start + 6, 2) & 0xFF, 0, 59, "minute out-of-range.");
        }
    } catch (std::invalid_argument const& e) {
        return e.what();
    }
    return fields.shown();
}

/// What the library makes of a text: fields, or the message of the exception.
std::string readFrom(std::string const& text, unsigned int parts) {
    std::string result;
    std::string const message =
        test::messageOf<std::invalid_argument>([&] { result = shown(DateTime(text, parts)); });
    return message == "<nothing>" ? result : message;
}

long secondsModel(Fields const& fields) {
    std::tm time = {};
    time.tm_sec = static_cast<int>(fields.second);
    time.tm_min = static_cast<int>(fields.minute);
    time.tm_hour = static_cast<int>(fields.hour);
    time.tm_mday = static_cast<int>(fields.day);
    time.tm_isdst = -1;
    if (fields.year != 0) time.tm_year = static_cast<int>(fields.year) - 1900;
    if (fields.month != 0) time.tm_mon = static_cast<int>(fields.month) - 1;
    return std::mktime(&time);
}

std::string textModel(Fields const& fields) {
    char date[100] = "";
    char time[100] = "";
    if ((fields.parts & DATE) != 0) {
        std::snprintf(date, sizeof date, "%04lu-%02lu-%02lu", fields.year, fields.month,
                      fields.day);
    }
    if ((fields.parts & TIME) != 0) {
        std::snprintf(time, sizeof time, "%02lu:%02lu:%02lu", fields.hour, fields.minute,
                      fields.second);
    }
    return std::string(date) + ((fields.parts & BOTH) == BOTH ? " " : "") + time;
}

/// Keeps the first of the differences that a loop finds.
class FirstDifference {
public:
    void check(std::string const& label, std::string const& actual, std::string const& expected) {
        if (actual == expected || !text_.empty()) return;
        text_.append(label).append(": ").append(actual).append(", not ").append(expected);
    }
    /// Empty if there was none.
    std::string const& text() const { return text_; }

private:
    std::string text_;
};

/// Of two numbers, or values: which of the six comparisons hold.
template <class T>
std::string comparisons(T const& a, T const& b) {
    std::string result;
    if (a == b) result += "== ";
    if (a != b) result += "!= ";
    if (a < b) result += "< ";
    if (a <= b) result += "<= ";
    if (a > b) result += "> ";
    if (a >= b) result += ">= ";
    return result;
}

/// Compares every value with every other one, and gives what was wrong first.
std::string firstMiscomparison(std::vector<DateTime> const& values) {
    std::vector<long> moments;
    moments.reserve(values.size());
    for (DateTime const& value : values) moments.push_back(secondsModel(fieldsOf(value)));
    calls = Calls();
    for (std::size_t i = 0; i < values.size(); ++i) {
        if (seconds(values[i]) != moments[i]) {
            return shown(values[i]) + " is " + std::to_string(seconds(values[i])) + ", not " +
                   std::to_string(moments[i]);
        }
        for (std::size_t k = 0; k < values.size(); ++k) {
            if (comparisons(values[i], values[k]) != comparisons(moments[i], moments[k])) {
                return shown(values[i]) + ' ' + comparisons(values[i], values[k]) +
                       shown(values[k]) + ", not " + comparisons(moments[i], moments[k]);
            }
        }
        calls = Calls();
    }
    return "";
}

/// Reproducible random numbers.
class Random {
public:
    explicit Random(unsigned int seed) : engine_(seed) {}
    /// 0 to limit - 1.
    int below(int limit) { return static_cast<int>(engine_() % static_cast<unsigned int>(limit)); }
    std::int32_t number() { return static_cast<std::int32_t>(engine_()); }
    template <class T, std::size_t N>
    T const& of(T const (&all)[N]) {
        return all[below(static_cast<int>(N))];
    }

private:
    std::mt19937 engine_;
};

} // namespace

// ========================================================================================= shape

TEST_CASE("a DateTime is a plain value of 16 bytes") {
    CHECK(sizeof(DateTime) == 16);
    CHECK(std::is_trivially_copyable<DateTime>::value);
    CHECK(std::is_standard_layout<DateTime>::value);
    CHECK(!std::is_polymorphic<DateTime>::value);
    CHECK(std::is_nothrow_destructible<DateTime>::value);
}

TEST_CASE("DATE is 1 and TIME is 2") {
    CHECK(DATE == 1);
    CHECK(TIME == 2);
}

TEST_CASE("the fields lie in their order and have their widths") {
    Zone const zone("<+14>-14");
    DateTime value(brokenDown(2005, 3, 7, 9, 5, 59), BOTH);
    value.setMillisecond(0x89ABCDEF);
    CHECK(at<std::uint16_t>(value, 0) == 2005);
    CHECK(at<std::uint8_t>(value, 2) == 3);
    CHECK(at<std::uint8_t>(value, 3) == 7);
    CHECK(at<std::uint8_t>(value, 4) == 9);
    CHECK(at<std::uint8_t>(value, 5) == 5);
    CHECK(at<std::uint8_t>(value, 6) == 59);
    CHECK(at<std::uint32_t>(value, 8) == 0x89ABCDEF);
    CHECK(at<std::int16_t>(value, 12) == 14);
    CHECK(at<std::uint8_t>(value, 14) == 3);
}

TEST_CASE("the accessors give the widths of the fields") {
    using D = DateTime const;
    CHECK(std::is_same<decltype(std::declval<D>().getYear()), std::uint16_t>::value);
    CHECK(std::is_same<decltype(std::declval<D>().getMonth()), std::uint8_t>::value);
    CHECK(std::is_same<decltype(std::declval<D>().getDay()), std::uint8_t>::value);
    CHECK(std::is_same<decltype(std::declval<D>().getHour()), std::uint8_t>::value);
    CHECK(std::is_same<decltype(std::declval<D>().getMinute()), std::uint8_t>::value);
    CHECK(std::is_same<decltype(std::declval<D>().getSecond()), std::uint8_t>::value);
    CHECK(std::is_same<decltype(std::declval<D>().getMillisecond()), std::uint32_t>::value);
    CHECK(std::is_same<decltype(std::declval<D>().getOffset()), std::int16_t>::value);
}

TEST_CASE("a new value is all zeros and carries both parts") {
    DateTime const value;
    CHECK(shown(value) == "0/0/0 0:0:0.0 offset 0 parts 3");
    CHECK(text(value) == "0000-00-00 00:00:00");
}

TEST_CASE("a copy has every field and the parts") {
    Zone const zone(NEW_YORK);
    timeval const moment = {1110186300, 123456};
    for (unsigned int const parts : {0U, DATE, TIME, BOTH, 0xFFU}) {
        DateTime const original(moment, parts);
        DateTime const copy(original);
        DateTime assigned;
        assigned = original;
        CHECK(shown(copy) == shown(original));
        CHECK(shown(assigned) == shown(original));
    }
    DateTime const full(moment, BOTH);
    CHECK(shown(full) == "2005/3/7 4:5:0.123 offset -5 parts 3");
}

TEST_CASE("of the four conversions every one takes both parts if none are named") {
    Zone const zone("IST-5:30");
    CHECK(shown(DateTime(brokenDown(2005, 3, 7, 9, 5, 1))) == "2005/3/7 9:5:1.0 offset 5 parts 3");
    CHECK(shown(DateTime(1110186300L)) == "2005/3/7 14:35:0.0 offset 5 parts 3");
    CHECK(shown(DateTime(timeval{1110186300, 7000})) == "2005/3/7 14:35:0.7 offset 5 parts 3");
    CHECK(shown(DateTime(std::string("2005-03-07 09:05:01"))) ==
          "2005/3/7 9:5:1.0 offset 0 parts 3");
    CHECK(readFrom("2005-03-07", BOTH) == "incorrect format.");
}

// ======================================================================================= setters

TEST_CASE("a setter takes the numbers of its range and refuses every other one") {
    DateTime value;
    std::string wrong;
    auto const check = [&](char const* name, long number, bool inRange, char const* message,
                           auto set, auto get) {
        std::string const before = shown(value);
        std::string const thrown = test::messageOf<std::invalid_argument>(set);
        bool const right = inRange ? thrown == "<nothing>" && get() == number
                                   : thrown == message && shown(value) == before;
        if (!right)
            wrong += std::string(name) + ' ' + std::to_string(number) + ": " + thrown + '\n';
    };
    for (long n = 0; n <= 0xFFFF; ++n) {
        auto const number = static_cast<unsigned short>(n);
        check(
            "year", n, n >= 1000 && n <= 3000, "year out-of-range", [&] { value.setYear(number); },
            [&] { return value.getYear(); });
    }
    for (long n = 0; n <= 0xFF; ++n) {
        auto const number = static_cast<unsigned char>(n);
        check(
            "month", n, n >= 1 && n <= 12, "month out-of-range.", [&] { value.setMonth(number); },
            [&] { return value.getMonth(); });
        check(
            "day", n, n >= 1 && n <= 31, "day out-of-range.", [&] { value.setDay(number); },
            [&] { return value.getDay(); });
        check(
            "hour", n, n <= 23, "hour out-of-range.", [&] { value.setHour(number); },
            [&] { return value.getHour(); });
        check(
            "minute", n, n <= 59, "minute out-of-range.", [&] { value.setMinute(number); },
            [&] { return value.getMinute(); });
    }
    for (long n = SHRT_MIN; n <= SHRT_MAX; ++n) {
        auto const number = static_cast<short>(n);
        check(
            "offset", n, n >= -720 && n <= 840, "offset out-of-range.",
            [&] { value.setOffset(number); }, [&] { return value.getOffset(); });
    }
    CHECK(wrong == "");
    CHECK(shown(value) == "3000/12/31 23:59:0.0 offset 840 parts 3");
}

TEST_CASE("a second is refused with the message of the minute") {
    DateTime value;
    for (int n = 0; n <= 255; ++n) {
        CAPTURE(n);
        std::string const thrown = test::messageOf<std::invalid_argument>(
            [&] { value.setSecond(static_cast<unsigned char>(n)); });
        CHECK(thrown == (n <= 59 ? "<nothing>" : "minute out-of-range."));
        CHECK(value.getSecond() == (n <= 59 ? n : 59));
    }
}

TEST_CASE("any number is a millisecond") {
    DateTime value;
    for (unsigned int const number : {0U, 1U, 999U, 1000U, 65536U, 0x80000000U, 0xFFFFFFFFU}) {
        value.setMillisecond(number);
        CHECK(value.getMillisecond() == number);
    }
}

TEST_CASE("the day is not checked against the month") {
    DateTime value;
    value.setYear(2005);
    value.setMonth(2);
    value.setDay(31);
    CHECK(text(value) == "2005-02-31 00:00:00");
    value.setMonth(4);
    CHECK(text(value) == "2005-04-31 00:00:00");
}

TEST_CASE("a setter changes its field and nothing else") {
    for (unsigned int const parts : {0U, DATE, TIME, BOTH, 0xFCU}) {
        DateTime value(std::string("2001-01-01 01:01:01"), parts);
        Fields expected = fieldsOf(value);
        auto const same = [&] { return shown(value) == expected.shown(); };
        value.setYear(2345);
        expected.year = 2345;
        CHECK(same());
        value.setMonth(12);
        expected.month = 12;
        CHECK(same());
        value.setDay(31);
        expected.day = 31;
        CHECK(same());
        value.setHour(23);
        expected.hour = 23;
        CHECK(same());
        value.setMinute(58);
        expected.minute = 58;
        CHECK(same());
        value.setSecond(59);
        expected.second = 59;
        CHECK(same());
        value.setMillisecond(4000000000U);
        expected.millisecond = 4000000000U;
        CHECK(same());
        value.setOffset(-720);
        expected.offset = -720;
        CHECK(same());
        expected.parts = parts;
        CHECK(same());
    }
}

TEST_CASE("an offset is stored as given") {
    DateTime value(1110186300L);
    std::string const before = text(value);
    long const moment = value;
    for (short const offset : {short{-720}, short{-1}, short{0}, short{60}, short{840}}) {
        value.setOffset(offset);
        CHECK(value.getOffset() == offset);
        CHECK(text(value) == before);
        CHECK(seconds(value) == moment);
    }
}

TEST_CASE("what was refused leaves all fields of a full value") {
    DateTime value(std::string("2005-03-07 09:05:00"));
    value.setMillisecond(5);
    value.setOffset(6);
    std::string const before = shown(value);
    auto const message = [](auto set) { return test::messageOf<std::invalid_argument>(set); };
    CHECK(message([&] { value.setYear(999); }) == "year out-of-range");
    CHECK(message([&] { value.setYear(3001); }) == "year out-of-range");
    CHECK(message([&] { value.setMonth(0); }) == "month out-of-range.");
    CHECK(message([&] { value.setMonth(13); }) == "month out-of-range.");
    CHECK(message([&] { value.setDay(0); }) == "day out-of-range.");
    CHECK(message([&] { value.setDay(32); }) == "day out-of-range.");
    CHECK(message([&] { value.setHour(24); }) == "hour out-of-range.");
    CHECK(message([&] { value.setMinute(60); }) == "minute out-of-range.");
    CHECK(message([&] { value.setSecond(60); }) == "minute out-of-range.");
    CHECK(message([&] { value.setOffset(-721); }) == "offset out-of-range.");
    CHECK(message([&] { value.setOffset(841); }) == "offset out-of-range.");
    CHECK(shown(value) == before);
}

TEST_CASE("clear sets the fields of the given parts to 0 and keeps the parts of the value") {
    struct Row {
        unsigned int parts;
        char const* expected;
    };
    static Row const rows[] = {
        {0, "2005/3/7 9:5:1.123 offset 60 parts 3"},
        {DATE, "0/0/0 9:5:1.123 offset 60 parts 3"},
        {TIME, "2005/3/7 0:0:0.0 offset 0 parts 3"},
        {BOTH, "0/0/0 0:0:0.0 offset 0 parts 3"},
        {4, "2005/3/7 9:5:1.123 offset 60 parts 3"},
        {0x100, "2005/3/7 9:5:1.123 offset 60 parts 3"},
        {0x101, "0/0/0 9:5:1.123 offset 60 parts 3"},
        {0xFFFFFFFE, "2005/3/7 0:0:0.0 offset 0 parts 3"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.parts);
        DateTime value(std::string("2005-03-07 09:05:01"));
        value.setMillisecond(123);
        value.setOffset(60);
        value.clear(row.parts);
        CHECK(shown(value) == row.expected);
    }
    DateTime dateOnly(std::string("2005-03-07"), DATE);
    dateOnly.clear(BOTH);
    CHECK(text(dateOnly) == "0000-00-00");
    DateTime full(std::string("2005-03-07 09:05:01"));
    full.clear(DATE);
    CHECK(text(full) == "0000-00-00 09:05:01");
}

// ========================================================================= from broken-down time

TEST_CASE("a broken-down time gives the fields of the given parts, and 0 for the others") {
    Zone const zone(CENTRAL_EUROPE);
    struct Row {
        unsigned int parts;
        char const* expected;
    };
    static Row const rows[] = {
        {0, "0/0/0 0:0:0.0 offset 0 parts 0"},
        {DATE, "2005/3/7 0:0:0.0 offset 0 parts 1"},
        {TIME, "0/0/0 9:5:1.0 offset 1 parts 2"},
        {BOTH, "2005/3/7 9:5:1.0 offset 1 parts 3"},
        {4, "0/0/0 0:0:0.0 offset 0 parts 4"},
        {7, "2005/3/7 9:5:1.0 offset 1 parts 7"},
        {0xFF, "2005/3/7 9:5:1.0 offset 1 parts 255"},
        {0x100, "0/0/0 0:0:0.0 offset 0 parts 0"},
        {0x101, "2005/3/7 0:0:0.0 offset 0 parts 1"},
        {0xFFFFFF02, "0/0/0 9:5:1.0 offset 1 parts 2"},
        {0xFFFFFFFF, "2005/3/7 9:5:1.0 offset 1 parts 255"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.parts);
        CHECK(shown(DateTime(brokenDown(2005, 3, 7, 9, 5, 1), row.parts)) == row.expected);
    }
}

TEST_CASE("the fields of a broken-down time are cut to their widths and not checked") {
    std::tm time = {};
    auto const fields = [&] { return textModel(fieldsOf(DateTime(time, BOTH))); };
    CHECK(fields() == "1900-01-00 00:00:00");
    time.tm_mon = 200;
    time.tm_mday = 77;
    time.tm_hour = 255;
    time.tm_min = 99;
    time.tm_sec = 60;
    CHECK(fields() == "1900-201-77 255:99:60");
    time.tm_year = -1900;
    time.tm_mon = -1;
    CHECK(fields() == "0000-00-77 255:99:60");
    time.tm_year = 65535 - 1900;
    time.tm_mon = 254;
    CHECK(fields() == "65535-255-77 255:99:60");
    time.tm_year = 65536 - 1900;
    time.tm_mon = 255;
    time.tm_mday = 256 + 3;
    time.tm_hour = 256 + 4;
    time.tm_min = -1;
    time.tm_sec = 512;
    CHECK(fields() == "0000-00-03 04:255:00");
    time.tm_year = INT_MAX;
    time.tm_mon = INT_MAX;
    time.tm_mday = INT_MAX;
    time.tm_hour = INT_MIN;
    time.tm_min = INT_MIN;
    time.tm_sec = INT_MAX;
    CHECK(fields() == "1899-00-255 00:00:255");
    time.tm_year = INT_MIN;
    CHECK(fields() == "1900-00-255 00:00:255");
}

TEST_CASE("the caller's broken-down time is not changed") {
    Zone const zone(CENTRAL_EUROPE);
    // mktime would make 9 March 2006 of it, with the day of the week and all.
    std::tm time = brokenDown(2005, 14, 37, 25, 61, 61);
    time.tm_wday = 77;
    time.tm_yday = 777;
    time.tm_gmtoff = 7777;
    static char const name[] = "name";
    time.tm_zone = name;
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        std::tm const before = time;
        DateTime const value(time, parts);
        CHECK(time.tm_year == before.tm_year);
        CHECK(time.tm_mon == before.tm_mon);
        CHECK(time.tm_mday == before.tm_mday);
        CHECK(time.tm_hour == before.tm_hour);
        CHECK(time.tm_min == before.tm_min);
        CHECK(time.tm_sec == before.tm_sec);
        CHECK(time.tm_isdst == before.tm_isdst);
        CHECK(time.tm_wday == 77);
        CHECK(time.tm_yday == 777);
        CHECK(time.tm_gmtoff == 7777);
        CHECK(time.tm_zone == name);
    }
    CHECK(text(DateTime(time)) == "2005-14-37 25:61:61");
}

TEST_CASE("the broken-down time may be the one that gmtime and localtime share") {
    struct Row {
        char const* zone;
        char const* fromGmtime;
        char const* fromLocaltime;
    };
    // 2005-03-07 23:05:01 UTC.
    std::time_t const moment = 1110236701;
    static Row const rows[] = {
        {"UTC0", "2005/3/7 23:5:1.0 offset 0 parts 3", "2005/3/7 23:5:1.0 offset 0 parts 3"},
        {"IST-5:30", "2005/3/7 23:5:1.0 offset 5 parts 3", "2005/3/8 4:35:1.0 offset 5 parts 3"},
        {"<-12>12", "2005/3/7 23:5:1.0 offset -12 parts 3", "2005/3/7 11:5:1.0 offset -12 parts 3"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.zone);
        Zone const zone(row.zone);
        CHECK(shown(DateTime(*std::gmtime(&moment), BOTH)) == row.fromGmtime);
        CHECK(shown(DateTime(*std::localtime(&moment), BOTH)) == row.fromLocaltime);
    }
}

TEST_CASE("the offset is whole hours east of UTC, without the hour of daylight saving") {
    // 2005-03-07 and 2005-07-07, 09:05:00 UTC.
    long const march = 1110186300;
    long const july = 1120727100;
    struct Row {
        char const* zone;
        char const* inMarch;
        char const* inJuly;
        int offset;
    };
    static Row const rows[] = {
        {"UTC0", "2005-03-07 09:05:00", "2005-07-07 09:05:00", 0},
        {CENTRAL_EUROPE, "2005-03-07 10:05:00", "2005-07-07 11:05:00", 1},
        {NEW_YORK, "2005-03-07 04:05:00", "2005-07-07 05:05:00", -5},
        {"IST-5:30", "2005-03-07 14:35:00", "2005-07-07 14:35:00", 5},
        {"NST3:30", "2005-03-07 05:35:00", "2005-07-07 05:35:00", -3},
        {"<+1245>-12:45", "2005-03-07 21:50:00", "2005-07-07 21:50:00", 12},
        {"<-0030>0:30", "2005-03-07 08:35:00", "2005-07-07 08:35:00", 0},
        {"<+0030>-0:30", "2005-03-07 09:35:00", "2005-07-07 09:35:00", 0},
        {"<+14>-14", "2005-03-07 23:05:00", "2005-07-07 23:05:00", 14},
        {"<-12>12", "2005-03-06 21:05:00", "2005-07-06 21:05:00", -12},
        {"AEST-10AEDT,M10.1.0,M4.1.0/3", "2005-03-07 20:05:00", "2005-07-07 19:05:00", 10},
        {"<+1030>-10:30<+11>-11,M10.1.0,M4.1.0", "2005-03-07 20:05:00", "2005-07-07 19:35:00", 10},
    };
    for (Row const& row : rows) {
        CAPTURE(row.zone);
        Zone const zone(row.zone);
        CHECK(text(DateTime(march)) == row.inMarch);
        CHECK(text(DateTime(july)) == row.inJuly);
        CHECK(DateTime(march).getOffset() == row.offset);
        CHECK(DateTime(july).getOffset() == row.offset);
        CHECK(DateTime(brokenDown(2005, 7, 7, 9, 5)).getOffset() == row.offset);
        CHECK(DateTime(july, DATE).getOffset() == 0);
        CHECK(DateTime(july, TIME).getOffset() == row.offset);
    }
}

TEST_CASE("the offset is the difference to mktime of gmtime, divided towards zero") {
    struct Row {
        std::time_t east;
        int offset;
    };
    static Row const rows[] = {
        {0, 0},      {1, 0},      {-1, 0},       {3599, 0},          {-3599, 0},
        {3600, 1},   {-3600, -1}, {7199, 1},     {-7199, -1},        {7200, 2},
        {-7200, -2}, {50400, 14}, {-43200, -12}, {117961200, 32767}, {117964800, -32768},
    };
    Zone const zone("UTC0");
    std::time_t const moment = 1110186300;
    for (Row const& row : rows) {
        CAPTURE(row.east);
        calls = Calls();
        calls.mktimeAnswers = {moment, moment - row.east};
        CHECK(DateTime(brokenDown(1999, 1, 1), TIME).getOffset() == row.offset);
        REQUIRE(calls.gmtime.size() == 1);
        CHECK(calls.gmtime[0] == moment);
        REQUIRE(calls.mktime.size() == 2);
        CHECK(calls.mktime[1].tm_year == 105);
        CHECK(calls.mktime[1].tm_mon == 2);
        CHECK(calls.mktime[1].tm_hour == 9);
        CHECK(calls.mktime[1].tm_isdst == 0);
        calls = Calls();
    }
}

TEST_CASE("a broken-down time costs mktime once, and with a time of day gmtime and mktime") {
    std::tm const time = brokenDown(2005, 3, 7, 9, 5, 1);
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        CAPTURE(parts);
        calls = Calls();
        DateTime const value(time, parts);
        bool const hasTime = (parts & TIME) != 0;
        CHECK(calls.mktime.size() <= (hasTime ? 2U : 1U));
        CHECK(calls.gmtime.size() == (hasTime ? 1U : 0U));
        CHECK(calls.localtime.empty());
    }
    calls = Calls();
}

TEST_CASE("any broken-down time becomes what the model makes of it") {
    Random random(101);
    FirstDifference wrong;
    for (char const* const text : ZONES) {
        Zone const zone(text);
        for (int i = 0; i < 600; ++i) {
            std::tm time = {};
            time.tm_year = random.below(400) - 100;
            time.tm_mon = random.below(300) - 20;
            time.tm_mday = random.below(300) - 20;
            time.tm_hour = random.below(300) - 20;
            time.tm_min = random.below(300) - 20;
            time.tm_sec = random.below(300) - 20;
            time.tm_isdst = random.below(3) - 1;
            unsigned int const parts = static_cast<unsigned int>(random.below(0x400));
            wrong.check(text, shown(DateTime(time, parts)), modelOf(time, parts).shown());
            calls = Calls();
        }
    }
    CHECK(wrong.text() == "");
}

// ================================================================================== from seconds

TEST_CASE("seconds since the epoch become local time") {
    struct Row {
        char const* zone;
        long moment;
        char const* expected;
    };
    static Row const rows[] = {
        {"UTC0", 0, "1970/1/1 0:0:0.0 offset 0 parts 3"},
        {"UTC0", -1, "1969/12/31 23:59:59.0 offset 0 parts 3"},
        {"UTC0", 1078056000, "2004/2/29 12:0:0.0 offset 0 parts 3"},
        {"UTC0", 2147483647, "2038/1/19 3:14:7.0 offset 0 parts 3"},
        {"UTC0", -2147483647, "1901/12/13 20:45:53.0 offset 0 parts 3"},
        {"UTC0", -2147483647 - 1, "1901/12/13 20:45:52.0 offset 0 parts 3"},
        {CENTRAL_EUROPE, 0, "1970/1/1 1:0:0.0 offset 1 parts 3"},
        {NEW_YORK, 0, "1969/12/31 19:0:0.0 offset -5 parts 3"},
        {NEW_YORK, -1, "1969/12/31 18:59:59.0 offset -5 parts 3"},
        {"NST3:30", 0, "1969/12/31 20:30:0.0 offset -3 parts 3"},
        // The changes to daylight saving and back, with the hour that comes twice.
        {CENTRAL_EUROPE, 1111885199, "2005/3/27 1:59:59.0 offset 1 parts 3"},
        {CENTRAL_EUROPE, 1111885200, "2005/3/27 3:0:0.0 offset 1 parts 3"},
        {CENTRAL_EUROPE, 1130630400, "2005/10/30 2:0:0.0 offset 1 parts 3"},
        {CENTRAL_EUROPE, 1130633999, "2005/10/30 2:59:59.0 offset 1 parts 3"},
        {CENTRAL_EUROPE, 1130634000, "2005/10/30 2:0:0.0 offset 1 parts 3"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.zone);
        CAPTURE(row.moment);
        Zone const zone(row.zone);
        CHECK(shown(DateTime(row.moment, BOTH)) == row.expected);
    }
}

TEST_CASE("seconds give the fields of the given parts") {
    Zone const zone("IST-5:30");
    CHECK(shown(DateTime(1110186301L, 0)) == "0/0/0 0:0:0.0 offset 0 parts 0");
    CHECK(shown(DateTime(1110186301L, DATE)) == "2005/3/7 0:0:0.0 offset 0 parts 1");
    CHECK(shown(DateTime(1110186301L, TIME)) == "0/0/0 14:35:1.0 offset 5 parts 2");
    CHECK(shown(DateTime(1110186301L, 0x1FF)) == "2005/3/7 14:35:1.0 offset 5 parts 255");
    CHECK(shown(DateTime(1110186301L, 0x104)) == "0/0/0 0:0:0.0 offset 0 parts 4");
}

TEST_CASE("seconds that localtime does not convert are refused") {
    auto const message = [](long moment, unsigned int parts) {
        return test::messageOf<std::invalid_argument>([&] { DateTime const d(moment, parts); });
    };
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        CHECK(message(0, parts) == "<nothing>");
        calls.localtimeFails = true;
        CHECK(message(0, parts) == "t is too small.");
        CHECK(message(LONG_MAX, parts) == "t is too small.");
        CHECK(test::messageOf<std::invalid_argument>([&] {
                  DateTime const d(timeval{0, 0}, parts);
              }) == "t is too small.");
        calls = Calls();
        // Every moment of 32 bits has a year; of 64 bits most have none that fits an int.
        char const* const expected = sizeof(long) == 4 ? "<nothing>" : "t is too small.";
        CHECK(message(LONG_MIN, parts) == expected);
        CHECK(message(LONG_MAX, parts) == expected);
    }
}

#if LONG_MAX > 2147483647
TEST_CASE("moments beyond 32 bits are converted up to the last year that fits a tm") {
    Zone const zone("UTC0");
    CHECK(shown(DateTime(2147483648L)) == "2038/1/19 3:14:8.0 offset 0 parts 3");
    CHECK(shown(DateTime(-2147483649L)) == "1901/12/13 20:45:51.0 offset 0 parts 3");
    CHECK(shown(DateTime(32503680000L)) == "3000/1/1 0:0:0.0 offset 0 parts 3");
    // The year 2147485547, cut to 16 bits.
    CHECK(shown(DateTime(67768036191676799L)) == "1899/12/31 23:59:59.0 offset 0 parts 3");
    CHECK(test::messageOf<std::invalid_argument>([] { DateTime const d(67768036191676800L); }) ==
          "t is too small.");
}
#endif

TEST_CASE("seconds cost localtime once, and what a broken-down time costs") {
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        CAPTURE(parts);
        calls = Calls();
        DateTime const value(1110186300L, parts);
        bool const hasTime = (parts & TIME) != 0;
        REQUIRE(calls.localtime.size() == 1);
        CHECK(calls.localtime[0] == 1110186300);
        CHECK(calls.mktime.size() <= (hasTime ? 2U : 1U));
        CHECK(calls.gmtime.size() == (hasTime ? 1U : 0U));
    }
    calls = Calls();
}

TEST_CASE("any moment of 32 bits becomes what the model makes of localtime's answer") {
    Random random(102);
    // Those around changes of summer time, and those where the C library has no later or earlier.
    static long const edges[] = {0,          1111885200, 1130634000, 1112511600, 1130652000,
                                 1110697200, 1131256800, 1096128000, 1112454000, 951782400};
    FirstDifference wrong;
    for (char const* const text : ZONES) {
        CAPTURE(text);
        Zone const zone(text);
        auto const check = [&](long moment) {
            unsigned int const parts = static_cast<unsigned int>(random.below(4));
            std::tm const local = *std::localtime(static_cast<std::time_t const*>(&moment));
            std::string const actual = shown(DateTime(moment, parts));
            wrong.check(std::to_string(moment), actual, modelOf(local, parts).shown());
            calls = Calls();
        };
        for (int i = 0; i < 700; ++i) {
            check(random.number());
            check(random.of(edges) + random.below(20000) - 10000);
            check(2147483647L - random.below(200000));
            check(-2147483647L - 1 + random.below(200000));
        }
        for (long i = 0; i < 5; ++i) {
            check(2147483647L - i);
            check(-2147483647L - 1 + i);
            check(i - 2);
        }
    }
    CHECK(wrong.text() == "");
}

TEST_CASE("seconds that become a value become the same seconds again") {
    Random random(103);
    for (char const* const text : {"UTC0", "IST-5:30", "NST3:30", "<+1245>-12:45", "<-0030>0:30"}) {
        CAPTURE(text);
        Zone const zone(text);
        long wrong = 0;
        for (int i = 0; i < 1000; ++i) {
            long const moment = random.number();
            if (seconds(DateTime(moment)) != moment) wrong = moment;
            calls = Calls();
        }
        CHECK(wrong == 0);
        for (long const moment : {0L, -1L, 2147483647L, -2147483647L - 1}) {
            CHECK(seconds(DateTime(moment)) == moment);
        }
    }
}

// ================================================================================== from timeval

TEST_CASE("a timeval gives its milliseconds whatever the parts") {
    Zone const zone("NST3:30");
    struct Row {
        int microseconds;
        unsigned int parts;
        char const* expected;
    };
    static Row const rows[] = {
        {0, BOTH, "2005/3/7 5:35:1.0 offset -3 parts 3"},
        {999, BOTH, "2005/3/7 5:35:1.0 offset -3 parts 3"},
        {1000, BOTH, "2005/3/7 5:35:1.1 offset -3 parts 3"},
        {1999, BOTH, "2005/3/7 5:35:1.1 offset -3 parts 3"},
        {999999, BOTH, "2005/3/7 5:35:1.999 offset -3 parts 3"},
        {999999, DATE, "2005/3/7 0:0:0.999 offset 0 parts 1"},
        {999999, TIME, "0/0/0 5:35:1.999 offset -3 parts 2"},
        {999999, 0, "0/0/0 0:0:0.999 offset 0 parts 0"},
        {999999, 4, "0/0/0 0:0:0.999 offset 0 parts 4"},
        {999999, 0x101, "2005/3/7 0:0:0.999 offset 0 parts 1"},
        // Not checked either.
        {1000000, BOTH, "2005/3/7 5:35:1.1000 offset -3 parts 3"},
        {2000000000, BOTH, "2005/3/7 5:35:1.2000000 offset -3 parts 3"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.microseconds);
        CAPTURE(row.parts);
        timeval const moment = {1110186301, row.microseconds};
        CHECK(shown(DateTime(moment, row.parts)) == row.expected);
    }
}

TEST_CASE("a timeval before the epoch keeps its microseconds apart") {
    Zone const zone("UTC0");
    CHECK(shown(DateTime(timeval{-1, 999999})) == "1969/12/31 23:59:59.999 offset 0 parts 3");
}

// ===================================================================================== from text

TEST_CASE("a text is read into the fields of the given parts") {
    std::string const both = "2005-03-07 09:05:01";
    CHECK(readFrom(both, BOTH) == "2005/3/7 9:5:1.0 offset 0 parts 3");
    CHECK(readFrom(both, DATE) == "2005/3/7 0:0:0.0 offset 0 parts 1");
    CHECK(readFrom(both, TIME) == "0/0/0 9:5:1.0 offset 0 parts 2");
    CHECK(readFrom("2005-03-07", DATE) == "2005/3/7 0:0:0.0 offset 0 parts 1");
    CHECK(readFrom("09:05:01", TIME) == "0/0/0 9:5:1.0 offset 0 parts 2");
    CHECK(readFrom(both, 0) == "0/0/0 0:0:0.0 offset 0 parts 0");
    CHECK(readFrom("any text", 0) == "0/0/0 0:0:0.0 offset 0 parts 0");
    CHECK(readFrom("any text", 0xFFFFFF04) == "0/0/0 0:0:0.0 offset 0 parts 4");
    CHECK(readFrom(both, 0x101) == "2005/3/7 0:0:0.0 offset 0 parts 1");
    CHECK(readFrom(both, 0xFFFFFFFF) == "2005/3/7 9:5:1.0 offset 0 parts 255");
}

TEST_CASE("a text is read without a look at the time zone") {
    Zone const zone(NEW_YORK);
    calls = Calls();
    CHECK(readFrom("2005-07-07 09:05:01", BOTH) == "2005/7/7 9:5:1.0 offset 0 parts 3");
    CHECK(calls.mktime.empty());
    CHECK(calls.gmtime.empty());
    CHECK(calls.localtime.empty());
}

TEST_CASE("dates are read as their four, two and two characters say") {
    using std::string;
    struct Row {
        string text;
        string expected; ///< the date, or a message
    };
    string const noYear = "year out-of-range";
    string const noMonth = "month out-of-range.";
    string const noDay = "day out-of-range.";
    string const noFormat = "incorrect format.";
    Row const rows[] = {
        {"2005-02-31", "2005-02-31"},
        {"1000-01-01", "1000-01-01"},
        {"3000-12-31", "3000-12-31"},
        {"0999-01-01", noYear},
        {"3001-01-01", noYear},
        {"9999-01-01", noYear},
        {"2005-13-01", noMonth},
        {"2005-99-01", noMonth},
        {"2005-12-32", noDay},
        {"2005-12-99", noDay},
        // A number of 0, or none, is skipped.
        {"0000-00-00", "0000-00-00"},
        {"0000-03-07", "0000-03-07"},
        {"2005-00-07", "2005-00-07"},
        {"2005-03-00", "2005-03-00"},
        {"abcd-ef-gh", "0000-00-00"},
        {"    -  -  ", "0000-00-00"},
        {"-----------", "0000-00-00"},
        {"0x7D-0x-0x", "0000-00-00"},
        {"+-20-+--+-", "0000-00-00"},
        {"- 20-- -- 1", "0000-00-00"},
        // Numbers are those of strtol: white space and a sign before the digits, ended by others.
        {"2005-3x-7x", "2005-03-07"},
        {"2005- 3- 7", "2005-03-07"},
        {"2005-\t3-\n7", "2005-03-07"},
        {"2005-\v3-\r7", "2005-03-07"},
        {"2005-+3-+7", "2005-03-07"},
        {"2005-3 -7", "2005-03-07"},
        {"2005-x3-x7", "2005-00-00"},
        {"2005-3.-7,", "2005-03-07"},
        {"12e3-03-07", noYear},
        {"1x05-03-07", noYear},
        {" 205-03-07", noYear},
        {"+999-03-07", noYear},
        {"  +5-03-07", noYear},
        // Cut to 16 and 8 bits: -1 is 65535 or 255.
        {"-001-03-07", noYear},
        {"  -1-03-07", noYear},
        {"-999-03-07", noYear},
        {"-000-03-07", "0000-03-07"},
        {"2005--1-07", noMonth},
        {"2005--9-07", noMonth},
        {"2005--0-07", "2005-00-07"},
        {"2005-03--1", noDay},
        {"2005-03--9", noDay},
        {"2005-03--0", "2005-03-00"},
        // What stands behind is not looked at.
        {"2005-03-071", "2005-03-07"},
        {"2005-03-07 and more", "2005-03-07"},
        {"2005-03-07 99:99:99", "2005-03-07"},
        // The two separators.
        {"2005/03/07", noFormat},
        {"2005-03/07", noFormat},
        {"2005/03-07", noFormat},
        {"05-03-07", noFormat},
        {"20050307", noFormat},
        {" 2005-03-07", noFormat},
        {"12:34:56", noFormat},
        // A NUL is a character like another to the separators, and ends a number.
        {string("0\0"
                "05-01-01",
                10),
         "0000-01-01"},
        {string("2\0"
                "05-01-01",
                10),
         noYear},
        {string("2005-0\0-17", 10), "2005-00-17"},
        {string("2005-1\0-1\0", 10), "2005-01-01"},
        {string("2005-\0"
                "1-\0"
                "1",
                10),
         "2005-00-00"},
        {string("2005\0"
                "01-01",
                10),
         noFormat},
        {string("2005-01\0"
                "01",
                10),
         noFormat},
        {string("\0\0\0\0-\0\0-\0\0", 10), "0000-00-00"},
        // Bytes that are no digits in any encoding.
        {"\xD9\xA1\xD9\xA2-\xB2\xB3-\xFF\xFF", "0000-00-00"},
        // Of several numbers the first one counts.
        {"0999-13-32", noYear},
        {"2005-13-32", noMonth},
        {"0000-13-32", noMonth},
        {"0000-00-32", noDay},
    };
    for (Row const& row : rows) {
        CAPTURE(row.text);
        std::string result;
        std::string const message = test::messageOf<std::invalid_argument>(
            [&] { result = text(DateTime(row.text, DATE)); });
        CHECK((message == "<nothing>" ? result : message) == row.expected);
    }
}

TEST_CASE("times are read as their two, two and two characters say, zero included") {
    using std::string;
    struct Row {
        string text;
        string expected; ///< the time, or a message
    };
    string const noHour = "hour out-of-range.";
    string const noMinute = "minute out-of-range.";
    string const noFormat = "incorrect format.";
    Row const rows[] = {
        {"00:00:00", "00:00:00"},
        {"23:59:59", "23:59:59"},
        {"24:00:00", noHour},
        {"99:00:00", noHour},
        {"12:60:00", noMinute},
        {"12:30:60", noMinute},
        {"12:30:61", noMinute},
        {"12:30:", "12:30:00"},
        {"12:30:4", "12:30:04"},
        {"12:30:456", "12:30:45"},
        {"12:30:45.678", "12:30:45"},
        // Numbers are those of strtol.
        {"+5:+6:+7", "05:06:07"},
        {" 5: 6: 7", "05:06:07"},
        {"5 :6 :7 ", "05:06:07"},
        {"5x:6x:7x", "05:06:07"},
        {"x5:x6:x7", "00:00:00"},
        {"ab:cd:ef", "00:00:00"},
        {"  :  :  ", "00:00:00"},
        {"::::::::", "00:00:00"},
        {"0x:0x:0x", "00:00:00"},
        {"-0:-0:-0", "00:00:00"},
        // Cut to 8 bits.
        {"-1:00:00", noHour},
        {"-9:00:00", noHour},
        {"12:-1:00", noMinute},
        {"12:30:-1", noMinute},
        {"12:30:-9", noMinute},
        // The longer form, whatever stands before it and at position 10.
        {"2005-01-02 12:34:56", "12:34:56"},
        {"2005-01-02T12:34:56", "12:34:56"},
        {"2005-01-02912:34:56", "12:34:56"},
        {"xxxxxxxxxxx12:34:56", "12:34:56"},
        {"9999-99-99 12:34:56", "12:34:56"},
        {string(11, '\0') + "12:34:56", "12:34:56"},
        {"xxxxxxxxxxx12:34:", "12:34:00"},
        {"xxxxxxxxxxx12:34:5", "12:34:05"},
        {"xxxxxxxxxxx12:34:56 and more", "12:34:56"},
        {"xxxxxxxxxxx24:34:56", noHour},
        {"xxxxxxxxxxx-1:34:56", noHour},
        {"xxxxxxxxxxx12:60:56", noMinute},
        {"xxxxxxxxxxx12:34:60", noMinute},
        // Both separators of the shorter form decide for it.
        {"01:02:03 xx12:34:56", "01:02:03"},
        {"99:02:03 xx12:34:56", noHour},
        {"01:02-03 xx12:34:56", "12:34:56"},
        {"01-02:03 xx12:34:56", "12:34:56"},
        {"01-02-03 xx12:34:56", "12:34:56"},
        {"01:02-03", noFormat},
        {"01-02:03", noFormat},
        {"01:02-03 xx12:34-56", noFormat},
        {"01:02-03 xx12-34:56", noFormat},
        {"1:02:03", noFormat},
        {"12:30", noFormat},
        {" 12:30:00", noFormat},
        {"2005-01-02", noFormat},
        {"2005-01-02  12:34:56", noFormat},
        // A NUL is a character to the separators and ends a number.
        {string("1\0:2\0:3\0", 8), "01:02:03"},
        {string("\0"
                "1:\0"
                "2:\0"
                "3",
                8),
         "00:00:00"},
        {string("12\0"
                "34:56",
                8),
         noFormat},
        {string("12:34\0"
                "56",
                8),
         noFormat},
        // Of several numbers the first one counts.
        {"24:60:60", noHour},
        {"23:60:60", noMinute},
    };
    for (Row const& row : rows) {
        CAPTURE(row.text);
        std::string result;
        std::string const message = test::messageOf<std::invalid_argument>(
            [&] { result = text(DateTime(row.text, TIME)); });
        CHECK((message == "<nothing>" ? result : message) == row.expected);
    }
}

TEST_CASE("with both parts the date comes first, in form and in numbers") {
    struct Row {
        char const* text;
        char const* expected;
    };
    static Row const rows[] = {
        {"2005-02-31 10:00:00", "2005/2/31 10:0:0.0 offset 0 parts 3"},
        {"0000-00-00 00:00:00", "0/0/0 0:0:0.0 offset 0 parts 3"},
        {"2005-03-07x09:05:01", "2005/3/7 9:5:1.0 offset 0 parts 3"},
        {"12:34:56", "incorrect format."},
        {"2005-01-02", "incorrect format."},
        {"2005-01-02 12:34", "incorrect format."},
        {"2005-01-02 12:34:", "2005/1/2 12:34:0.0 offset 0 parts 3"},
        // A wrong date is told before a time in the wrong form, and the date's form before all.
        {"2005-13-01 12-34-56", "month out-of-range."},
        {"2005-01-32 99:99:99", "day out-of-range."},
        {"0999-01-01", "year out-of-range"},
        {"2005/13/01 99:99:99", "incorrect format."},
        {"2005-01-01 99:99:99", "hour out-of-range."},
        {"2005-01-01 23:99:99", "minute out-of-range."},
        {"2005-01-01 23:59:99", "minute out-of-range."},
        // A date with the separators of a time.
        {"00:0-:1-05", "0/0/5 0:0:1.0 offset 0 parts 3"},
        {"10:0-:1-05", "year out-of-range"},
        {"00:5-:1-05 12:34:56", "0/0/5 0:5:1.0 offset 0 parts 3"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.text);
        CHECK(readFrom(row.text, BOTH) == row.expected);
    }
}

TEST_CASE("a text that ends early fails where a separator is missing, and else has less digits") {
    std::string const full = "2005-03-17 19:45:58x";
    std::string const time = "19:45:58";
    for (std::size_t length = 0; length <= full.size(); ++length) {
        CAPTURE(length);
        std::string const cut = full.substr(0, length);
        std::string const date = length < 8    ? "incorrect format."
                                 : length == 8 ? "2005/3/0 0:0:0.0 offset 0 parts 1"
                                 : length == 9 ? "2005/3/1 0:0:0.0 offset 0 parts 1"
                                               : "2005/3/17 0:0:0.0 offset 0 parts 1";
        CHECK(readFrom(cut, DATE) == date);
        std::string const second = length == 17 ? "0" : length == 18 ? "5" : "58";
        bool const complete = length >= 17;
        CHECK(readFrom(cut, TIME) ==
              (complete ? "0/0/0 19:45:" + second + ".0 offset 0 parts 2" : "incorrect format."));
        CHECK(readFrom(cut, BOTH) == (complete ? "2005/3/17 19:45:" + second + ".0 offset 0 parts 3"
                                               : "incorrect format."));
        CHECK(readFrom(cut, 0) == "0/0/0 0:0:0.0 offset 0 parts 0");
    }
    for (std::size_t length = 0; length <= time.size(); ++length) {
        CAPTURE(length);
        std::string const second = length == 6 ? "0" : length == 7 ? "5" : "58";
        CHECK(readFrom(time.substr(0, length), TIME) ==
              (length < 6 ? "incorrect format." : "0/0/0 19:45:" + second + ".0 offset 0 parts 2"));
    }
}

TEST_CASE("any text is read as the model reads it") {
    static char const characters[] = "00112233459:::---- +x\t.";
    static char const* const patterns[] = {
        "2005-03-17 19:45:58", "2005-03-17",          "19:45:58",
        "0000-00-00 00:00:00", "00:0-:1-05 12:34:56", "01:02:03 xx12:34:56"};
    Random random(104);
    FirstDifference wrong;
    int accepted = 0;
    for (int i = 0; i < 100000; ++i) {
        std::string input = random.of(patterns);
        for (int changes = random.below(4); changes > 0; --changes) {
            auto const position =
                static_cast<std::size_t>(random.below(static_cast<int>(input.size())));
            // The last character of the array is its NUL, which takes part.
            input[position] = random.of(characters);
        }
        if (random.below(4) == 0) input.resize(static_cast<std::size_t>(random.below(24)));
        if (input.empty()) input = "-";
        auto const parts = static_cast<unsigned int>(random.below(4));
        std::string const actual = readFrom(input, parts);
        accepted += actual.find("offset 0") != std::string::npos;
        wrong.check(input, actual, modelOf(input, parts));
    }
    CHECK(wrong.text() == "");
    CHECK(accepted > 25000);
    CHECK(accepted < 95000);
}

TEST_CASE("a year is read from any four digits") {
    std::string wrong;
    for (int year = 0; year <= 9999; ++year) {
        char input[32];
        std::snprintf(input, sizeof input, "%04d-01-01", year);
        bool const accepted = year == 0 || (year >= 1000 && year <= 3000);
        std::string const expected =
            accepted ? std::to_string(year) + "/1/1 0:0:0.0 offset 0 parts 1" : "year out-of-range";
        if (readFrom(input, DATE) != expected) wrong += std::string(input) + ' ';
    }
    CHECK(wrong == "");
}

// ======================================================================================= to text

TEST_CASE("a value is written in the halves that it carries") {
    Zone const zone("UTC0");
    CHECK(text(DateTime(1110186300L, BOTH)) == "2005-03-07 09:05:00");
    CHECK(text(DateTime(1110186300L, DATE)) == "2005-03-07");
    CHECK(text(DateTime(1110186300L, TIME)) == "09:05:00");
    CHECK(text(DateTime(1110186300L, 0)) == "");
    CHECK(text(DateTime(1110186300L, 4)) == "");
    CHECK(text(DateTime(1110186300L, 0xFD)) == "2005-03-07");
    CHECK(text(DateTime(1110186300L, 0x103)) == "2005-03-07 09:05:00");
    CHECK(text(DateTime(1110186300L, 0x100)) == "");
}

TEST_CASE("the parts decide what is written, not the fields") {
    DateTime dateOnly(std::string("2005-03-07"), DATE);
    dateOnly.setHour(9);
    dateOnly.setMillisecond(500);
    CHECK(text(dateOnly) == "2005-03-07");
    DateTime timeOnly(std::string("09:05:01"), TIME);
    timeOnly.setYear(2005);
    CHECK(text(timeOnly) == "09:05:01");
    DateTime nothing(std::string(), 0);
    nothing.setDay(7);
    nothing.setSecond(7);
    CHECK(text(nothing) == "");
}

TEST_CASE("numbers have zeros before them and are not cut") {
    struct Row {
        DateTime value;
        char const* expected;
    };
    Row const rows[] = {
        {valueOf(0, 0, 0), "0000-00-00 00:00:00"},
        {valueOf(5, 1, 1), "0005-01-01 00:00:00"},
        {valueOf(99, 9, 9, 9, 9, 9), "0099-09-09 09:09:09"},
        {valueOf(999, 10, 10, 10, 10, 10), "0999-10-10 10:10:10"},
        {valueOf(9999, 99, 99, 99, 99, 99), "9999-99-99 99:99:99"},
        {valueOf(10000, 100, 100, 100, 100, 100), "10000-100-100 100:100:100"},
        {valueOf(65535, 255, 255, 255, 255, 255), "65535-255-255 255:255:255"},
        {valueOf(65535, 255, 255, 255, 255, 255, DATE), "65535-255-255"},
        {valueOf(65535, 255, 255, 255, 255, 255, TIME), "255:255:255"},
    };
    for (Row const& row : rows) CHECK(text(row.value) == row.expected);
}

TEST_CASE("every number of a field is written as the model writes it") {
    std::string wrong;
    auto const check = [&](DateTime const& value) {
        if (text(value) != textModel(fieldsOf(value))) wrong = text(value);
        calls = Calls();
    };
    for (int n = 0; n <= 0xFF; ++n) check(valueOf(n, n, 255 - n, n, 255 - n, n));
    for (int n = 0; n <= 0xFFFF; ++n) check(valueOf(n, 1, 1, 0, 0, 0, DATE));
    CHECK(wrong == "");
}

TEST_CASE("millisecond and offset are not written") {
    DateTime value(std::string("2005-03-07 09:05:01"));
    value.setMillisecond(123);
    value.setOffset(-720);
    CHECK(text(value) == "2005-03-07 09:05:01");
}

TEST_CASE("text is read back as it was written, with the same parts") {
    Random random(105);
    std::string wrong;
    for (int i = 0; i < 20000; ++i) {
        auto const parts = static_cast<unsigned int>(random.below(4));
        bool const hasZeros = random.below(4) == 0;
        DateTime const value =
            valueOf(hasZeros ? 0 : 1000 + random.below(2001), hasZeros ? 0 : 1 + random.below(12),
                    hasZeros ? 0 : 1 + random.below(31), random.below(24), random.below(60),
                    random.below(60), parts);
        calls = Calls();
        Fields expected = fieldsOf(value);
        expected.offset = 0;
        if (readFrom(text(value), parts) != expected.shown()) wrong = text(value);
    }
    CHECK(wrong == "");
}

TEST_CASE("writing a value needs no conversion") {
    DateTime const value(1110186300L);
    calls = Calls();
    std::ostringstream out;
    out << text(value) << value;
    CHECK(calls.mktime.empty());
    CHECK(calls.gmtime.empty());
    CHECK(calls.localtime.empty());
}

TEST_CASE("the locale set globally does not change text, written or read") {
    DateTime const value(std::string("2005-03-07 09:05:01"));
    DateTime const wide = valueOf(65535, 255, 255, 255, 255, 255);
    std::ostringstream before;
    std::locale const old = std::locale::global(std::locale(std::locale::classic(), new Grouped));
    std::string const valueText = text(value);
    std::string const wideText = text(wide);
    std::string const read = readFrom("2005-03-07 09:05:01", BOTH);
    std::ostringstream after;
    before << value;
    after << value << ' ' << 2005;
    std::locale::global(old);
    CHECK(valueText == "2005-03-07 09:05:01");
    CHECK(wideText == "65535-255-255 255:255:255");
    CHECK(read == "2005/3/7 9:5:1.0 offset 0 parts 3");
    CHECK(before.str() == "2005-03-07 09:05:01");
    CHECK(after.str() == "2005-03-07 09:05:01 2.0.0.5");
}

// ==================================================================================== to streams

TEST_CASE("a stream gets the text") {
    struct Row {
        unsigned int parts;
        char const* expected;
    };
    static Row const rows[] = {
        {BOTH, "2005-03-07 09:05:01"}, {DATE, "2005-03-07"}, {TIME, "09:05:01"}, {0, ""}};
    for (Row const& row : rows) {
        std::ostringstream out;
        std::ostream& returned = out << '<'
                                     << DateTime(std::string("2005-03-07 09:05:01"), row.parts);
        CHECK(&returned == &out);
        CHECK(out.str() == std::string("<") + row.expected);
    }
    std::ostringstream out;
    out << valueOf(65535, 255, 255, 255, 255, 255);
    CHECK(out.str() == "65535-255-255 255:255:255");
}

TEST_CASE("the width of a stream goes to the first character") {
    DateTime const value(std::string("2005-03-07"), DATE);
    std::ostringstream out;
    out << std::setfill('*') << std::setw(4) << value;
    CHECK(out.str() == "***2005-03-07");
    CHECK(out.width() == 0);
    out.str("");
    out << std::left << std::setw(4) << value << value;
    CHECK(out.str() == "2***005-03-072005-03-07");
    out.str("");
    out << std::right << std::setw(14) << value;
    CHECK(out.str() == "*************2005-03-07");
    out.str("");
    out << std::internal << std::setw(2) << value;
    CHECK(out.str() == "*2005-03-07");
}

TEST_CASE("an empty text leaves the width of a stream") {
    std::ostringstream out;
    out << std::setw(4) << DateTime(std::string(), 0);
    CHECK(out.str() == "");
    CHECK(out.width() == 4);
}

TEST_CASE("settings for numbers do not show in a stream, and stay") {
    std::ostringstream out;
    out.imbue(std::locale(std::locale::classic(), new Grouped));
    out << std::hex << std::showbase << std::showpos << std::uppercase << std::setfill('x')
        << std::setprecision(1);
    std::ios::fmtflags const before = out.flags();
    out << DateTime(std::string("2005-10-31 09:05:01"));
    CHECK(out.str() == "2005-10-31 09:05:01");
    bool const same = out.flags() == before;
    CHECK(same);
    CHECK(out.fill() == 'x');
    CHECK(out.precision() == 1);
}

TEST_CASE("nothing is written to a stream that has failed") {
    for (std::ios::iostate const state : {std::ios::badbit, std::ios::failbit, std::ios::eofbit}) {
        std::ostringstream out;
        out.setstate(state);
        out << DateTime();
        CHECK(out.str() == "");
        CHECK((out.rdstate() & state) == state);
    }
}

TEST_CASE("a stream that takes no more keeps what it took, and has failed") {
    struct Narrow : std::streambuf {
        std::size_t room = 0;
        std::string taken;
        int_type overflow(int_type c) override {
            if (taken.size() == room || traits_type::eq_int_type(c, traits_type::eof())) {
                return traits_type::eof();
            }
            taken += traits_type::to_char_type(c);
            return c;
        }
    };
    DateTime const value(std::string("2005-03-07 09:05:01"));
    for (std::size_t room = 0; room <= 20; ++room) {
        CAPTURE(room);
        Narrow narrow;
        narrow.room = room;
        std::ostream out(&narrow);
        out << value;
        CHECK(out.good() == (room >= 19));
        CHECK(narrow.taken == std::string("2005-03-07 09:05:01").substr(0, room));
        Narrow other;
        other.room = room;
        std::ostream loud(&other);
        loud.exceptions(std::ios::badbit | std::ios::failbit);
        bool threw = false;
        try {
            loud << value;
        } catch (std::ios::failure const&) {
            threw = true;
        }
        CHECK(threw == (room < 19));
        CHECK(other.taken == narrow.taken);
    }
}

// ==================================================================================== to seconds

TEST_CASE("the fields are converted as local time") {
    struct Row {
        char const* zone;
        char const* text;
        long expected;
    };
    static Row const rows[] = {
        {"UTC0", "1970-01-01 00:00:00", 0},
        {"UTC0", "1969-12-31 23:59:59", -1},
        {"UTC0", "2005-03-07 09:05:00", 1110186300},
        {"UTC0", "2005-02-31 00:00:00", 1109808000},
        {"UTC0", "2005-03-03 00:00:00", 1109808000},
        {"UTC0", "2038-01-19 03:14:07", 2147483647},
        {"UTC0", "1901-12-13 20:45:52", -2147483647 - 1},
        {CENTRAL_EUROPE, "2005-03-07 10:05:00", 1110186300},
        {CENTRAL_EUROPE, "2005-07-07 11:05:00", 1120727100},
        {NEW_YORK, "2005-07-07 05:05:00", 1120727100},
        {"NST3:30", "2005-03-07 05:35:00", 1110186300},
        {"<+1245>-12:45", "2005-03-07 21:50:00", 1110186300},
    };
    for (Row const& row : rows) {
        CAPTURE(row.zone);
        CAPTURE(row.text);
        Zone const zone(row.zone);
        CHECK(seconds(DateTime(std::string(row.text))) == row.expected);
    }
}

TEST_CASE("millisecond, offset and parts play no part in the conversion") {
    Zone const zone(NEW_YORK);
    DateTime value(1120727100L, BOTH);
    value.setMillisecond(0xFFFFFFFF);
    value.setOffset(840);
    CHECK(seconds(value) == 1120727100);
    for (unsigned int const parts : {0U, DATE, TIME}) {
        DateTime other(std::string("2005-07-07 05:05:00"), parts);
        other.setYear(2005);
        other.setMonth(7);
        other.setDay(7);
        other.setHour(5);
        other.setMinute(5);
        CHECK(seconds(other) == 1120727100);
    }
}

TEST_CASE("a conversion asks mktime once, daylight saving left open") {
    DateTime const value(std::string("2005-02-31 23:58:57"));
    calls = Calls();
    CHECK(seconds(value) == secondsModel(fieldsOf(value)));
    // The first is the library's, the second the model's.
    REQUIRE(calls.mktime.size() == 2);
    std::tm const& time = calls.mktime[0];
    CHECK(time.tm_year == 105);
    CHECK(time.tm_mon == 1);
    CHECK(time.tm_mday == 31);
    CHECK(time.tm_hour == 23);
    CHECK(time.tm_min == 58);
    CHECK(time.tm_sec == 57);
    CHECK(time.tm_isdst == -1);
    CHECK(calls.gmtime.empty());
    CHECK(calls.localtime.empty());
    calls = Calls();
}

TEST_CASE("the result is that of mktime, -1 where it fails") {
    DateTime const value(std::string("2005-03-07 09:05:00"));
    for (std::time_t const answer : {std::time_t{-1}, std::time_t{0}, std::time_t{12345}}) {
        calls = Calls();
        calls.mktimeAnswers = {answer};
        CHECK(seconds(value) == answer);
    }
    calls = Calls();
    Zone const zone("UTC0");
    bool const is32Bit = sizeof(long) == 4;
    CHECK(seconds(DateTime(std::string("2038-01-19 03:14:08"))) ==
          (is32Bit ? -1 : static_cast<long>(std::int64_t{2147483648})));
    CHECK(seconds(DateTime(std::string("1901-12-13 20:45:51"))) ==
          (is32Bit ? -1 : static_cast<long>(std::int64_t{-2147483649})));
    CHECK(seconds(DateTime(std::string("3000-01-01 00:00:00"))) ==
          (is32Bit ? -1 : static_cast<long>(std::int64_t{32503680000})));
}

TEST_CASE("a year of 0 converts as 1900 and a month of 0 as January") {
    Zone const zone("UTC0");
    struct Row {
        DateTime value;
        int year;
        int month;
        int day;
    };
    Row const rows[] = {
        {DateTime(), 1900, 1, 0},
        {DateTime(std::string("0000-03-07"), DATE), 1900, 3, 7},
        {DateTime(std::string("2005-00-07"), DATE), 2005, 1, 7},
        {DateTime(std::string("0000-00-07"), DATE), 1900, 1, 7},
        {DateTime(std::string("2005-03-00"), DATE), 2005, 3, 0},
    };
    for (Row const& row : rows) {
        CAPTURE(text(row.value));
        calls = Calls();
        long const result = row.value;
        REQUIRE(calls.mktime.size() == 1);
        CHECK(calls.mktime[0].tm_year == row.year - 1900);
        CHECK(calls.mktime[0].tm_mon == row.month - 1);
        CHECK(calls.mktime[0].tm_mday == row.day);
        std::tm time = brokenDown(row.year, row.month, row.day);
        CHECK(result == std::mktime(&time));
    }
    calls = Calls();
    // 31 December 1899, which 32 bits do not hold.
    CHECK(seconds(DateTime()) ==
          (sizeof(long) == 4 ? -1 : static_cast<long>(std::int64_t{-2209075200})));
    // The last day of February.
    CHECK(seconds(DateTime(std::string("2005-03-00"), DATE)) == 1109548800);
}

// ==================================================================================== comparison

TEST_CASE("values compare by their seconds in all six ways") {
    DateTime const earlier(std::string("2005-03-07 09:05:00"));
    DateTime const later(std::string("2005-03-07 09:05:01"));
    CHECK(comparisons(earlier, later) == "!= < <= ");
    CHECK(comparisons(later, earlier) == "!= > >= ");
    CHECK(comparisons(earlier, earlier) == "== <= >= ");
    CHECK(comparisons(earlier, DateTime(earlier)) == "== <= >= ");
    CHECK(std::is_same<decltype(earlier == later), bool>::value);
}

TEST_CASE("values that differ in millisecond, offset or parts only are equal") {
    DateTime const value(std::string("2005-03-07 09:05:00"));
    DateTime other(value);
    other.setMillisecond(999);
    CHECK(comparisons(value, other) == "== <= >= ");
    other.setMillisecond(5000);
    CHECK(comparisons(value, other) == "== <= >= ");
    other.setOffset(-720);
    CHECK(comparisons(value, other) == "== <= >= ");
    for (unsigned int const parts : {0U, DATE, TIME, 0xFFU}) {
        DateTime const unlike = valueOf(2005, 3, 7, 9, 5, 0, BOTH);
        DateTime same(std::string("2005-03-07 09:05:00"), parts);
        same.setYear(2005);
        same.setMonth(3);
        same.setDay(7);
        same.setHour(9);
        same.setMinute(5);
        CHECK(comparisons(unlike, same) == "== <= >= ");
    }
}

TEST_CASE("different fields of one moment are equal") {
    Zone const zone("UTC0");
    struct Row {
        DateTime a;
        DateTime b;
    };
    Row const rows[] = {
        {valueOf(2005, 2, 31), valueOf(2005, 3, 3)},
        {valueOf(2004, 2, 31), valueOf(2004, 3, 2)},
        {valueOf(2005, 4, 31), valueOf(2005, 5, 1)},
        {valueOf(2005, 3, 0), valueOf(2005, 2, 28)},
        {valueOf(2005, 1, 1, 24), valueOf(2005, 1, 2)},
        {valueOf(2005, 1, 1, 0, 60), valueOf(2005, 1, 1, 1)},
        {valueOf(2005, 12, 31, 23, 59, 60), valueOf(2006, 1, 1)},
        {valueOf(2005, 13, 1), valueOf(2006, 1, 1)},
        {valueOf(2005, 1, 200), valueOf(2005, 7, 19)},
        {valueOf(2005, 201, 1), valueOf(2021, 9, 1)},
        {valueOf(2005, 1, 1, 255), valueOf(2005, 1, 11, 15)},
        {valueOf(2005, 0, 5), valueOf(2005, 1, 5)},
    };
    for (Row const& row : rows) {
        CAPTURE(text(row.a));
        CHECK(comparisons(row.a, row.b) == "== <= >= ");
        CHECK(comparisons(row.b, row.a) == "== <= >= ");
    }
    CHECK(comparisons(valueOf(0, 3, 7), valueOf(1900, 3, 7)) == "== <= >= ");
}

TEST_CASE("values that mktime does not convert are the last second of 1969") {
    Zone const zone("UTC0");
    DateTime const last = valueOf(1969, 12, 31, 23, 59, 59);
    DateTime const far = valueOf(3000, 1, 1);
    DateTime const farther = valueOf(3000, 1, 2);
    DateTime const past = valueOf(1000, 1, 1);
    if (sizeof(long) == 4) {
        CHECK(comparisons(far, last) == "== <= >= ");
        CHECK(comparisons(far, farther) == "== <= >= ");
        CHECK(comparisons(far, past) == "== <= >= ");
        CHECK(comparisons(far, valueOf(1970, 1, 1)) == "!= < <= ");
        CHECK(comparisons(past, valueOf(1969, 12, 31)) == "!= > >= ");
        CHECK(comparisons(DateTime(), last) == "== <= >= ");
    } else {
        CHECK(comparisons(far, last) == "!= > >= ");
        CHECK(comparisons(far, farther) == "!= < <= ");
        CHECK(comparisons(past, far) == "!= < <= ");
        CHECK(comparisons(DateTime(), last) == "!= < <= ");
    }
}

TEST_CASE("a comparison asks mktime for no more than two conversions, and nothing else") {
    DateTime const values[] = {valueOf(2005, 3, 7), valueOf(2005, 3, 8), valueOf(1900, 1, 1),
                               valueOf(3000, 1, 1), DateTime()};
    for (DateTime const& a : values) {
        for (DateTime const& b : values) {
            auto const conversions = [&](auto compare) {
                calls = Calls();
                compare();
                bool const others = !calls.gmtime.empty() || !calls.localtime.empty();
                return others ? 99 : calls.mktime.size();
            };
            CHECK(conversions([&] { return a == b; }) <= 2);
            CHECK(conversions([&] { return a != b; }) <= 2);
            CHECK(conversions([&] { return a < b; }) <= 2);
            CHECK(conversions([&] { return a <= b; }) <= 2);
            CHECK(conversions([&] { return a > b; }) <= 2);
            CHECK(conversions([&] { return a >= b; }) <= 2);
        }
    }
    calls = Calls();
}

TEST_CASE("a comparison converts its first value first, whichever it is") {
    DateTime const a = valueOf(2005, 3, 7);
    DateTime const b = valueOf(2005, 3, 8);
    auto const days = [](auto compare) {
        calls = Calls();
        compare();
        std::string result;
        for (std::tm const& time : calls.mktime) result += std::to_string(time.tm_mday) + ' ';
        calls = Calls();
        return result;
    };
    CHECK(days([&] { return a == b; }) == "7 8 ");
    CHECK(days([&] { return a != b; }) == "7 8 ");
    CHECK(days([&] { return a < b; }) == "7 8 ");
    CHECK(days([&] { return a <= b; }) == "7 8 ");
    CHECK(days([&] { return a > b; }) == "7 8 ");
    CHECK(days([&] { return a >= b; }) == "7 8 ");
    CHECK(days([&] { return b > a; }) == "8 7 ");
}

TEST_CASE("values around the changes of summer time compare by their seconds") {
    for (char const* const text : ZONES) {
        CAPTURE(text);
        Zone const zone(text);
        // Of the hours that do not exist and those that come twice, in any of the zones.
        struct Day {
            int month;
            int day;
        };
        for (Day const day :
             {Day{3, 27}, Day{10, 30}, Day{3, 13}, Day{11, 6}, Day{4, 3}, Day{10, 2}}) {
            std::vector<DateTime> values;
            for (int hour = 0; hour <= 4; ++hour) {
                for (int minute = 0; minute < 60; minute += 15) {
                    values.push_back(valueOf(2005, day.month, day.day, hour, minute));
                }
            }
            values.push_back(valueOf(2005, day.month, day.day - 1, 23, 59, 59));
            values.push_back(valueOf(2005, day.month, day.day + 1));
            CHECK(firstMiscomparison(values) == "");
        }
    }
}

TEST_CASE("values around changes of fifty hours compare by their seconds") {
    struct Row {
        char const* zone;
        int month;
        int firstDay;
    };
    for (Row const& row :
         {Row{EXTREME, 3, 17}, Row{EXTREME, 10, 19}, Row{EXTREME_FEBRUARY, 2, 19}}) {
        CAPTURE(row.zone);
        CAPTURE(row.month);
        Zone const zone(row.zone);
        std::vector<DateTime> values;
        for (int day = row.firstDay; day <= 31; ++day) {
            for (int const hour : {0, 2, 23}) values.push_back(valueOf(2005, row.month, day, hour));
        }
        for (int day = 1; day <= 10; ++day) {
            for (int const hour : {0, 23})
                values.push_back(valueOf(2005, row.month + 1, day, hour));
        }
        CHECK(firstMiscomparison(values) == "");
    }
}

TEST_CASE("days that a month does not have compare by their seconds") {
    Zone const zone(NEW_YORK);
    for (int const year : {2004, 2005}) {
        std::vector<DateTime> values;
        for (int const month : {1, 2, 3}) {
            for (int day = 1; day <= 31; ++day) {
                values.push_back(valueOf(year, month, day, day % 2 == 0 ? 0 : 23));
            }
        }
        CHECK(firstMiscomparison(values) == "");
    }
}

TEST_CASE("any two values compare by their seconds") {
    static int const years[] = {0,    1,    2,    1000, 1899, 1900, 1901,  1902,  1903,
                                1904, 1969, 1970, 1999, 2000, 2004, 2005,  2036,  2037,
                                2038, 2039, 2040, 2100, 3000, 3001, 32767, 32768, 65535};
    static int const odd[] = {0, 13, 24, 31, 32, 60, 61, 100, 127, 128, 200, 254, 255};
    Random random(106);
    for (char const* const text : ZONES) {
        CAPTURE(text);
        Zone const zone(text);
        for (int round = 0; round < 10; ++round) {
            int const year = random.of(years);
            int const month = 1 + random.below(12);
            int const day = 1 + random.below(31);
            std::vector<DateTime> values;
            for (int i = 0; i < 5; ++i) {
                // Close to each other, as a rule.
                values.push_back(valueOf(year, month, day + random.below(9), random.below(24),
                                         random.below(3), random.below(3)));
                values.push_back(valueOf(year + random.below(2), month + random.below(2), day));
                values.push_back(valueOf(random.of(years), 1 + random.below(12),
                                         1 + random.below(31), random.below(24), random.below(60),
                                         random.below(60)));
                values.push_back(valueOf(random.of(years), random.of(odd), random.of(odd),
                                         random.of(odd), random.of(odd), random.of(odd)));
                values.push_back(valueOf(year, month, day, random.of(odd), random.of(odd)));
            }
            std::string const wrong = firstMiscomparison(values);
            if (!wrong.empty()) FAIL_CHECK(wrong);
        }
    }
}

TEST_CASE("values within a year of the edges of 32 bits compare by their seconds") {
    Random random(107);
    for (char const* const text : ZONES) {
        CAPTURE(text);
        Zone const zone(text);
        std::vector<DateTime> values;
        for (int const year : {1901, 1902, 1903, 2036, 2037, 2038}) {
            for (int const month : {1, 12}) {
                for (int const day : {1, 13, 14, 19, 31}) {
                    values.push_back(valueOf(year, month, day, random.below(24)));
                }
            }
        }
        CHECK(firstMiscomparison(values) == "");
    }
}
