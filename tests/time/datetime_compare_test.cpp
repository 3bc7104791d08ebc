// DateTime to seconds and compared. Values compare by their seconds, and the library decides that
// without converting them where it can: so these tests compare many pairs with their seconds.
#include "time/datetimefixture.h"

#include <doctest/doctest.h>

#include <cstddef>
#include <cstdint>
#include <ctime>
#include <functional>
#include <string>
#include <type_traits>
#include <vector>

using namespace test;

namespace {

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

std::string const LESS = "!= < <= ";
std::string const EQUAL = "== <= >= ";
std::string const GREATER = "!= > >= ";

/// Compares every value with every other one.
void checkComparisons(std::vector<DateTime> const& values) {
    std::vector<long> moments;
    for (DateTime const& value : values) moments.push_back(secondsModel(fieldsOf(value)));
    Differences differences;
    for (std::size_t i = 0; i < values.size(); ++i) {
        differences.expect(shown(values[i]), std::to_string(seconds(values[i])),
                           std::to_string(moments[i]));
        for (std::size_t k = 0; k < values.size(); ++k) {
            std::string const actual = comparisons(values[i], values[k]);
            std::string const expected = comparisons(moments[i], moments[k]);
            differences.note(actual == expected, [&] {
                return shown(values[i]) + ' ' + actual + shown(values[k]) + ", not " + expected;
            });
        }
    }
    CHECK(differences.first() == "");
}

bool const IS_32_BIT = sizeof(long) == 4;

/// A number of 64 bits, or what a failed conversion gives if a long does not hold it.
long orFailure(std::int64_t moment) { return IS_32_BIT ? -1 : static_cast<long>(moment); }

} // namespace

TEST_CASE("the fields are converted as local time") {
    struct Row {
        char const* zone;
        char const* text;
        long expected;
    };
    Row const rows[] = {
        {"UTC0", "1970-01-01 00:00:00", 0},
        {"UTC0", "1969-12-31 23:59:59", -1},
        {"UTC0", "2005-03-07 09:05:00", MARCH},
        {"UTC0", "2005-02-31 00:00:00", 1109808000},
        {"UTC0", "2005-03-03 00:00:00", 1109808000},
        {"UTC0", "2038-01-19 03:14:07", 2147483647},
        {"UTC0", "1901-12-13 20:45:52", -2147483647 - 1},
        {CENTRAL_EUROPE, "2005-03-07 10:05:00", MARCH},
        {CENTRAL_EUROPE, "2005-07-07 11:05:00", 1120727100},
        {NEW_YORK, "2005-07-07 05:05:00", 1120727100},
        {"NST3:30", "2005-03-07 05:35:00", MARCH},
        {"<+1245>-12:45", "2005-03-07 21:50:00", MARCH},
    };
    for (Row const& row : rows) {
        CAPTURE(row.zone);
        CAPTURE(row.text);
        Zone const zone(row.zone);
        CHECK(seconds(fromText(row.text)) == row.expected);
    }
}

TEST_CASE("millisecond, offset and parts play no part in the conversion") {
    Zone const zone(NEW_YORK);
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        DateTime value = fromText("2005-07-07 05:05:00", parts);
        value.setYear(2005);
        value.setMonth(7);
        value.setDay(7);
        value.setHour(5);
        value.setMinute(5);
        CHECK(seconds(value) == 1120727100);
        value.setMillisecond(0xFFFFFFFF);
        value.setOffset(840);
        CHECK(seconds(value) == 1120727100);
    }
}

TEST_CASE("a conversion asks mktime once, daylight saving left open") {
    DateTime const value = fromText("2005-02-31 23:58:57");
    Calls const calls;
    CHECK(seconds(value) == secondsModel(fieldsOf(value)));
    // The first is the library's, the second the model's.
    REQUIRE(calls.mktime.size() == 2);
    CHECK(isSame(calls.mktime[0], brokenDown(2005, 2, 31, 23, 58, 57)));
    CHECK(calls.gmtime.empty());
    CHECK(calls.localtime.empty());
}

TEST_CASE("the result is that of mktime, -1 where it fails") {
    for (std::time_t const answer : {std::time_t{-1}, std::time_t{0}, std::time_t{12345}}) {
        Calls calls;
        calls.mktimeAnswers = {answer};
        CHECK(seconds(fromText("2005-03-07 09:05:00")) == answer);
    }
    Zone const zone("UTC0");
    CHECK(seconds(fromText("2038-01-19 03:14:08")) == orFailure(2147483648));
    CHECK(seconds(fromText("1901-12-13 20:45:51")) == orFailure(-2147483649));
    CHECK(seconds(fromText("3000-01-01 00:00:00")) == orFailure(32503680000));
}

TEST_CASE("a year of 0 converts as 1900 and a month of 0 as January") {
    Zone const zone("UTC0");
    struct Row {
        char const* text;
        int year, month, day;
        std::int64_t expected;
    };
    Row const rows[] = {{"0000-00-00", 1900, 1, 0, -2209075200}, // 31 December 1899
                        {"0000-03-07", 1900, 3, 7, -2203372800},
                        {"2005-00-07", 2005, 1, 7, 1105056000},
                        {"0000-00-07", 1900, 1, 7, -2208470400},
                        {"2005-03-00", 2005, 3, 0, 1109548800}}; // the last day of February
    for (Row const& row : rows) {
        CAPTURE(row.text);
        Calls const calls;
        bool const fits = row.year != 1900;
        CHECK(seconds(fromText(row.text, DATE)) ==
              (fits ? static_cast<long>(row.expected) : orFailure(row.expected)));
        REQUIRE(calls.mktime.size() == 1);
        CHECK(isSame(calls.mktime[0], brokenDown(row.year, row.month, row.day)));
    }
    CHECK(seconds(DateTime()) == orFailure(-2209075200));
}

TEST_CASE("values compare by their seconds in all six ways") {
    DateTime const earlier = fromText("2005-03-07 09:05:00");
    DateTime const later = fromText("2005-03-07 09:05:01");
    CHECK(comparisons(earlier, later) == LESS);
    CHECK(comparisons(later, earlier) == GREATER);
    CHECK(comparisons(earlier, earlier) == EQUAL);
    CHECK(comparisons(earlier, DateTime(earlier)) == EQUAL);
    CHECK(std::is_same<decltype(earlier == later), bool>::value);
}

TEST_CASE("values that differ in millisecond, offset or parts only are equal") {
    DateTime const value = fromText("2005-03-07 09:05:00");
    DateTime other(value);
    for (unsigned int const millisecond : {999U, 5000U}) {
        other.setMillisecond(millisecond);
        CHECK(comparisons(value, other) == EQUAL);
    }
    other.setOffset(-720);
    CHECK(comparisons(value, other) == EQUAL);
    for (unsigned int const parts : {0U, DATE, TIME, 0xFFU}) {
        DateTime same = fromText("2005-03-07 09:05:00", parts);
        same.setYear(2005);
        same.setMonth(3);
        same.setDay(7);
        same.setHour(9);
        same.setMinute(5);
        CHECK(comparisons(value, same) == EQUAL);
    }
}

TEST_CASE("different fields of one moment are equal") {
    Zone const zone("UTC0");
    DateTime const pairs[][2] = {
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
        {valueOf(0, 3, 7), valueOf(1900, 3, 7)},
    };
    for (auto const& pair : pairs) {
        CAPTURE(text(pair[0]));
        CHECK(comparisons(pair[0], pair[1]) == EQUAL);
        CHECK(comparisons(pair[1], pair[0]) == EQUAL);
    }
}

TEST_CASE("values that mktime does not convert are the last second of 1969") {
    Zone const zone("UTC0");
    DateTime const last = valueOf(1969, 12, 31, 23, 59, 59);
    DateTime const far = valueOf(3000, 1, 1);
    DateTime const past = valueOf(1000, 1, 1);
    CHECK(comparisons(far, last) == (IS_32_BIT ? EQUAL : GREATER));
    CHECK(comparisons(far, valueOf(3000, 1, 2)) == (IS_32_BIT ? EQUAL : LESS));
    CHECK(comparisons(past, far) == (IS_32_BIT ? EQUAL : LESS));
    CHECK(comparisons(DateTime(), last) == (IS_32_BIT ? EQUAL : LESS));
    CHECK(comparisons(far, valueOf(1970, 1, 1)) == (IS_32_BIT ? LESS : GREATER));
    CHECK(comparisons(past, valueOf(1969, 12, 31)) == (IS_32_BIT ? GREATER : LESS));
}

TEST_CASE_TEMPLATE("a comparison asks mktime for no more than two conversions, and nothing else",
                   Compare, std::equal_to<>, std::not_equal_to<>, std::less<>, std::less_equal<>,
                   std::greater<>, std::greater_equal<>) {
    DateTime const values[] = {valueOf(2005, 3, 7), valueOf(2005, 3, 8), valueOf(1900, 1, 1),
                               valueOf(3000, 1, 1), DateTime()};
    for (DateTime const& a : values) {
        for (DateTime const& b : values) {
            Calls const calls;
            Compare()(a, b);
            CHECK(calls.mktime.size() <= 2);
            CHECK(calls.gmtime.empty());
            CHECK(calls.localtime.empty());
        }
    }
}

TEST_CASE_TEMPLATE("a comparison converts its first value first", Compare, std::equal_to<>,
                   std::not_equal_to<>, std::less<>, std::less_equal<>, std::greater<>,
                   std::greater_equal<>) {
    Calls const calls;
    Compare()(valueOf(2005, 3, 7), valueOf(2005, 3, 8));
    std::string days;
    for (std::tm const& time : calls.mktime) days += std::to_string(time.tm_mday) + ' ';
    // Those that make the values come before.
    CHECK(days.substr(days.size() - 4) == "7 8 ");
}

TEST_CASE("values around changes of summer time compare by their seconds") {
    // Of the hours that do not exist and those that come twice, in any of the zones.
    int const days[][2] = {{3, 27}, {10, 30}, {3, 13}, {11, 6}, {4, 3}, {10, 2}};
    for (char const* const zoneText : ZONES) {
        CAPTURE(zoneText);
        Zone const zone(zoneText);
        for (auto const& [month, day] : days) {
            std::vector<DateTime> values = {valueOf(2005, month, day - 1, 23, 59, 59),
                                            valueOf(2005, month, day + 1)};
            for (int minute = 0; minute < 5 * 60; minute += 15) {
                values.push_back(valueOf(2005, month, day, minute / 60, minute % 60));
            }
            checkComparisons(values);
        }
    }
}

TEST_CASE("values around changes of fifty hours, and of days that no month has, compare by them") {
    for (char const* const zoneText : {NEW_YORK, EXTREME, EXTREME_FEBRUARY}) {
        CAPTURE(zoneText);
        Zone const zone(zoneText);
        for (int const month : {2, 3, 10}) {
            std::vector<DateTime> values;
            for (int const hour : {0, 2, 23}) {
                for (int day = 17; day <= 31; ++day)
                    values.push_back(valueOf(2005, month, day, hour));
                for (int day = 1; day <= 10; ++day)
                    values.push_back(valueOf(2005, month + 1, day, hour));
            }
            checkComparisons(values);
        }
    }
}

TEST_CASE("any two values compare by their seconds") {
    static int const years[] = {0,    1,    2,    1000, 1899, 1900, 1901,  1902,  1903,
                                1904, 1969, 1970, 1999, 2000, 2004, 2005,  2036,  2037,
                                2038, 2039, 2040, 2100, 3000, 3001, 32767, 32768, 65535};
    static int const odd[] = {0, 13, 24, 31, 32, 60, 61, 100, 127, 128, 200, 254, 255};
    Random random(106);
    auto const below = [&random](std::uint32_t limit) {
        return static_cast<int>(random.below(limit));
    };
    for (char const* const zoneText : ZONES) {
        CAPTURE(zoneText);
        Zone const zone(zoneText);
        for (int round = 0; round < 14; ++round) {
            // Each time some around an edge of the years that every time_t holds.
            int const year = round < 4 ? 1901 + 135 * (round / 2) + round % 2 : random.of(years);
            int const month = round < 4 ? 12 : 1 + below(12);
            int const day = 1 + below(31);
            std::vector<DateTime> values;
            for (int i = 0; i < 5; ++i) {
                values.push_back(
                    valueOf(year, month, day + below(9), below(24), below(3), below(3)));
                values.push_back(valueOf(year + below(2), month + below(2), day));
                values.push_back(
                    valueOf(year + below(3), 1 + 11 * below(2), 1 + below(31), below(24)));
                values.push_back(valueOf(random.of(years), 1 + below(12), 1 + below(31), below(24),
                                         below(60), below(60)));
                values.push_back(valueOf(random.of(years), random.of(odd), random.of(odd),
                                         random.of(odd), random.of(odd), random.of(odd)));
                values.push_back(valueOf(year, month, day, random.of(odd), random.of(odd)));
            }
            checkComparisons(values);
        }
    }
}
