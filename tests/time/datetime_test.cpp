// DateTime: its shape, fields and setters, and the conversions from broken-down time, seconds and
// timeval, compared with a model that calls the C library as the conversion is described.
#include "time/datetimefixture.h"

#include <doctest/doctest.h>

#include <sys/time.h>

#include <climits>
#include <cstdint>
#include <ctime>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

using namespace test;

namespace {

Fields modelOf(std::tm const& time, unsigned int parts) {
    Fields fields = {};
    if ((parts & DATE) != 0) {
        fields.year = static_cast<std::uint16_t>(std::int64_t{time.tm_year} + 1900);
        fields.month = static_cast<std::uint8_t>(std::int64_t{time.tm_mon} + 1);
        fields.day = static_cast<std::uint8_t>(time.tm_mday);
    }
    std::tm copy = time;
    std::time_t const s = std::mktime(&copy);
    if ((parts & TIME) != 0) {
        fields.hour = static_cast<std::uint8_t>(time.tm_hour);
        fields.minute = static_cast<std::uint8_t>(time.tm_min);
        fields.second = static_cast<std::uint8_t>(time.tm_sec);
        std::int64_t const east = std::int64_t{s} - std::int64_t{std::mktime(std::gmtime(&s))};
        fields.offset = static_cast<std::int16_t>(east / 3600);
    }
    fields.parts = parts & 0xFFU;
    return fields;
}

/// A setter, the numbers that its argument can be, and those it takes.
struct Setter {
    long Fields::*field;
    void (*set)(DateTime&, long);
    long lowest, highest, least, greatest;
    char const* message;
};

template <class T, void (DateTime::*setter)(T)>
void set(DateTime& value, long number) {
    (value.*setter)(static_cast<T>(number));
}

using Byte = unsigned char;
Setter const SETTERS[] = {
    {&Fields::year, set<unsigned short, &DateTime::setYear>, 0, 0xFFFF, 1000, 3000,
     "year out-of-range"},
    {&Fields::month, set<Byte, &DateTime::setMonth>, 0, 0xFF, 1, 12, "month out-of-range."},
    {&Fields::day, set<Byte, &DateTime::setDay>, 0, 0xFF, 1, 31, "day out-of-range."},
    {&Fields::hour, set<Byte, &DateTime::setHour>, 0, 0xFF, 0, 23, "hour out-of-range."},
    {&Fields::minute, set<Byte, &DateTime::setMinute>, 0, 0xFF, 0, 59, "minute out-of-range."},
    {&Fields::second, set<Byte, &DateTime::setSecond>, 0, 0xFF, 0, 59, "minute out-of-range."},
    {&Fields::offset, set<short, &DateTime::setOffset>, SHRT_MIN, SHRT_MAX, -720, 840,
     "offset out-of-range."},
};

struct FromBrokenDown {
    static DateTime make(unsigned int parts) {
        return DateTime(brokenDown(2005, 3, 7, 9, 5, 1), parts);
    }
};
struct FromSeconds {
    static DateTime make(unsigned int parts) { return DateTime(MARCH - 3600 + 1, parts); }
};
struct FromTimeval {
    static DateTime make(unsigned int parts) {
        return DateTime(timeval{MARCH - 3600 + 1, 0}, parts);
    }
};

/// A value with every field and all parts set.
DateTime fullValue() {
    DateTime value = fromText("2005-03-07 09:05:01");
    value.setMillisecond(123);
    value.setOffset(60);
    return value;
}

std::string refusal(long moment, unsigned int parts) {
    return messageOf<std::invalid_argument>([&] { DateTime const d(moment, parts); });
}

} // namespace

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
    CHECK(shown(DateTime()) == "0/0/0 0:0:0.0 offset 0 parts 3");
    CHECK(text(DateTime()) == "0000-00-00 00:00:00");
}

TEST_CASE("a copy has every field and the parts") {
    Zone const zone(NEW_YORK);
    for (unsigned int const parts : {0U, DATE, TIME, BOTH, 0xFFU}) {
        DateTime const original(timeval{MARCH, 123456}, parts);
        DateTime const copy(original);
        DateTime assigned;
        assigned = original;
        CHECK(shown(copy) == shown(original));
        CHECK(shown(assigned) == shown(original));
        if (parts == BOTH) CHECK(shown(copy) == "2005/3/7 4:5:0.123 offset -5 parts 3");
    }
}

TEST_CASE("each of the four conversions takes both parts if none are named") {
    Zone const zone("IST-5:30");
    CHECK(shown(DateTime(brokenDown(2005, 3, 7, 9, 5, 1))) == "2005/3/7 9:5:1.0 offset 5 parts 3");
    CHECK(shown(DateTime(MARCH)) == "2005/3/7 14:35:0.0 offset 5 parts 3");
    CHECK(shown(DateTime(timeval{MARCH, 7000})) == "2005/3/7 14:35:0.7 offset 5 parts 3");
    CHECK(shown(DateTime(std::string("2005-03-07 09:05:01"))) ==
          "2005/3/7 9:5:1.0 offset 0 parts 3");
    CHECK(readFrom("2005-03-07", BOTH) == "incorrect format.");
}

TEST_CASE("a setter takes the numbers of its range and refuses every other one") {
    Differences differences;
    for (Setter const& setter : SETTERS) {
        DateTime value = fullValue();
        for (long n = setter.lowest; n <= setter.highest; ++n) {
            Fields expected = fieldsOf(value);
            bool const inRange = n >= setter.least && n <= setter.greatest;
            if (inRange) expected.*setter.field = n;
            std::string const thrown =
                messageOf<std::invalid_argument>([&] { setter.set(value, n); });
            bool const same = thrown == (inRange ? "<nothing>" : setter.message) &&
                              shown(value) == expected.shown();
            differences.note(same, [&] { return std::to_string(n) + " gave " + thrown; });
        }
    }
    CHECK(differences.firstOf(2 * 0x10000 + 5 * 0x100) == "");
}

TEST_CASE("any number is a millisecond") {
    DateTime value;
    for (unsigned int const number : {0U, 1U, 999U, 1000U, 65536U, 0x80000000U, 0xFFFFFFFFU}) {
        value.setMillisecond(number);
        CHECK(value.getMillisecond() == number);
    }
}

TEST_CASE("the day is not checked against the month") {
    DateTime value = fromText("2005-02-07 00:00:00");
    value.setDay(31);
    CHECK(text(value) == "2005-02-31 00:00:00");
    value.setMonth(4);
    CHECK(text(value) == "2005-04-31 00:00:00");
}

TEST_CASE("a setter changes its field and nothing else") {
    for (unsigned int const parts : {0U, DATE, TIME, BOTH, 0xFCU}) {
        DateTime value(std::string("2001-01-01 01:01:01"), parts);
        Fields expected = fieldsOf(value);
        CHECK(expected.parts == parts);
        for (Setter const& setter : SETTERS) {
            setter.set(value, setter.greatest);
            expected.*setter.field = setter.greatest;
            CHECK(shown(value) == expected.shown());
        }
        value.setMillisecond(4000000000U);
        expected.millisecond = 4000000000U;
        CHECK(shown(value) == expected.shown());
    }
}

TEST_CASE("an offset is stored as given") {
    Zone const zone("UTC");
    DateTime value(MARCH);
    for (short const offset : {short{-720}, short{-1}, short{0}, short{60}, short{840}}) {
        value.setOffset(offset);
        CHECK(value.getOffset() == offset);
        CHECK(text(value) == "2005-03-07 09:05:00");
        CHECK(seconds(value) == MARCH);
    }
}

TEST_CASE("clear sets the fields of the given parts to 0 and keeps the parts of the value") {
    for (unsigned int const parts : ANY_PARTS) {
        CAPTURE(parts);
        DateTime value = fullValue();
        value.clear(parts);
        CHECK(shown(value) == fieldsOf(fullValue()).only(~parts).shown());
    }
    DateTime dateOnly = fromText("2005-03-07", DATE);
    dateOnly.clear(BOTH);
    CHECK(text(dateOnly) == "0000-00-00");
    DateTime full = fullValue();
    full.clear(DATE);
    CHECK(text(full) == "0000-00-00 09:05:01");
}

TEST_CASE_TEMPLATE("a conversion gives the fields of the given parts, and 0 for the others", From,
                   FromBrokenDown, FromSeconds, FromTimeval) {
    Zone const zone(CENTRAL_EUROPE);
    Fields const all = {2005, 3, 7, 9, 5, 1, 0, 1, BOTH};
    for (unsigned int const parts : ANY_PARTS) {
        CAPTURE(parts);
        CHECK(shown(From::make(parts)) == all.of(parts).shown());
    }
}

TEST_CASE("the fields of a broken-down time are cut to their widths and not checked") {
    struct Row {
        int year, month, day, hour, minute, second; // as in a tm
        char const* expected;
    };
    Row const rows[] = {
        {0, 0, 0, 0, 0, 0, "1900-01-00 00:00:00"},
        {0, 200, 77, 255, 99, 60, "1900-201-77 255:99:60"},
        {-1900, -1, 77, 255, 99, 60, "0000-00-77 255:99:60"},
        {65535 - 1900, 254, 77, 255, 99, 60, "65535-255-77 255:99:60"},
        {65536 - 1900, 255, 256 + 3, 256 + 4, -1, 512, "0000-00-03 04:255:00"},
        {INT_MAX, INT_MAX, INT_MAX, INT_MIN, INT_MIN, INT_MAX, "1899-00-255 00:00:255"},
        {INT_MIN, INT_MAX, INT_MAX, INT_MIN, INT_MIN, INT_MAX, "1900-00-255 00:00:255"},
    };
    for (Row const& row : rows) {
        std::tm time = {};
        time.tm_year = row.year;
        time.tm_mon = row.month;
        time.tm_mday = row.day;
        time.tm_hour = row.hour;
        time.tm_min = row.minute;
        time.tm_sec = row.second;
        CHECK(text(DateTime(time, BOTH)) == row.expected);
    }
}

TEST_CASE("the caller's broken-down time is not changed") {
    Zone const zone(CENTRAL_EUROPE);
    // mktime would make 9 March 2006 of it, with the day of the week and all.
    std::tm time = brokenDown(2005, 14, 37, 25, 61, 61);
    time.tm_wday = 77;
    time.tm_yday = 777;
    time.tm_gmtoff = 7777;
    time.tm_zone = "name";
    std::tm const before = time;
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        DateTime const value(time, parts);
        CHECK(std::memcmp(&time, &before, sizeof time) == 0);
    }
    CHECK(text(DateTime(time)) == "2005-14-37 25:61:61");
}

TEST_CASE("the broken-down time may be the one that gmtime and localtime share") {
    std::time_t const moment = 1110236701; // 2005-03-07 23:05:01 UTC
    struct Row {
        char const* zone;
        char const* fromGmtime;
        char const* fromLocaltime;
    };
    Row const rows[] = {
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
    long const july = 1120727100; // 2005-07-07 09:05:00 UTC
    struct Row {
        char const* zone;
        char const* inMarch;
        char const* inJuly;
        int offset;
    };
    Row const rows[] = {
        {"UTC0", "2005-03-07 09:05:00", "2005-07-07 09:05:00", 0},
        {CENTRAL_EUROPE, "2005-03-07 10:05:00", "2005-07-07 11:05:00", 1},
        {NEW_YORK, "2005-03-07 04:05:00", "2005-07-07 05:05:00", -5},
        {"IST-5:30", "2005-03-07 14:35:00", "2005-07-07 14:35:00", 5},
        {"NST3:30", "2005-03-07 05:35:00", "2005-07-07 05:35:00", -3},
        {"<+1245>-12:45", "2005-03-07 21:50:00", "2005-07-07 21:50:00", 12},
        {SYDNEY, "2005-03-07 20:05:00", "2005-07-07 19:05:00", 10},
        {LORD_HOWE, "2005-03-07 20:05:00", "2005-07-07 19:35:00", 10},
    };
    for (Row const& row : rows) {
        CAPTURE(row.zone);
        Zone const zone(row.zone);
        CHECK(text(DateTime(MARCH)) == row.inMarch);
        CHECK(text(DateTime(july)) == row.inJuly);
        CHECK(DateTime(MARCH).getOffset() == row.offset);
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
    Row const rows[] = {
        {0, 0},      {1, 0},      {-1, 0},       {3599, 0},          {-3599, 0},
        {3600, 1},   {-3600, -1}, {7199, 1},     {-7199, -1},        {7200, 2},
        {-7200, -2}, {50400, 14}, {-43200, -12}, {117961200, 32767}, {117964800, -32768},
    };
    Zone const zone("UTC0");
    for (Row const& row : rows) {
        CAPTURE(row.east);
        Calls calls;
        calls.mktimeAnswers = {MARCH, MARCH - row.east};
        CHECK(DateTime(brokenDown(1999, 1, 1), TIME).getOffset() == row.offset);
        REQUIRE(calls.gmtime.size() == 1);
        CHECK(calls.gmtime[0] == MARCH);
        REQUIRE(calls.mktime.size() == 2);
        std::tm utc = brokenDown(2005, 3, 7, 9, 5);
        utc.tm_isdst = 0;
        CHECK(isSame(calls.mktime[1], utc));
    }
}

TEST_CASE("the offset is 0 where the C library has no date in UTC") {
    Zone const zone("IST-5:30");
    Calls calls;
    calls.gmtimeFails = true;
    CHECK(shown(DateTime(MARCH, BOTH)) == "2005/3/7 14:35:0.0 offset 0 parts 3");
    CHECK(calls.gmtime == std::vector<std::time_t>{MARCH});
}

TEST_CASE_TEMPLATE("a conversion costs mktime once, and with a time of day gmtime and mktime", From,
                   FromBrokenDown, FromSeconds, FromTimeval) {
    bool const isBrokenDown = std::is_same<From, FromBrokenDown>::value;
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        CAPTURE(parts);
        Calls const calls;
        From::make(parts);
        bool const hasTime = (parts & TIME) != 0;
        CHECK(calls.mktime.size() <= (hasTime ? 2U : 1U));
        CHECK(calls.gmtime.size() == (hasTime ? 1U : 0U));
        CHECK(calls.localtime == std::vector<std::time_t>(isBrokenDown ? 0 : 1, MARCH - 3600 + 1));
    }
}

TEST_CASE("any broken-down time becomes what the model makes of it") {
    Random random(101);
    Differences differences;
    auto const any = [&random] { return static_cast<int>(random.below(300)) - 20; };
    for (char const* const text : ZONES) {
        Zone const zone(text);
        for (int i = 0; i < 600; ++i) {
            std::tm time = brokenDown(1780 + static_cast<int>(random.below(400)), any(), any(),
                                      any(), any(), any());
            time.tm_isdst = static_cast<int>(random.below(3)) - 1;
            unsigned int const parts = random.below(0x400);
            differences.expect(text, shown(DateTime(time, parts)), modelOf(time, parts).shown());
        }
    }
    CHECK(differences.first() == "");
}

TEST_CASE("seconds since the epoch become local time") {
    struct Row {
        char const* zone;
        long moment;
        char const* expected;
    };
    Row const rows[] = {
        {"UTC0", 0, "1970/1/1 0:0:0.0 offset 0 parts 3"},
        {"UTC0", -1, "1969/12/31 23:59:59.0 offset 0 parts 3"},
        {"UTC0", 1078056000, "2004/2/29 12:0:0.0 offset 0 parts 3"},
        {"UTC0", 2147483647, "2038/1/19 3:14:7.0 offset 0 parts 3"},
        {"UTC0", -2147483647 - 1, "1901/12/13 20:45:52.0 offset 0 parts 3"},
        {CENTRAL_EUROPE, 0, "1970/1/1 1:0:0.0 offset 1 parts 3"},
        {NEW_YORK, 0, "1969/12/31 19:0:0.0 offset -5 parts 3"},
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

TEST_CASE("seconds that localtime does not convert are refused") {
    for (unsigned int const parts : {0U, DATE, TIME, BOTH}) {
        CHECK(refusal(0, parts) == "<nothing>");
        {
            Calls calls;
            calls.localtimeFails = true;
            CHECK(refusal(0, parts) == "t is too small.");
            CHECK(refusal(LONG_MAX, parts) == "t is too small.");
            CHECK(messageOf<std::invalid_argument>([&] {
                      DateTime const d(timeval{0, 0}, parts);
                  }) == "t is too small.");
        }
        // Every moment of 32 bits has a year; of 64 bits most have none that fits an int.
        char const* const expected = sizeof(long) == 4 ? "<nothing>" : "t is too small.";
        CHECK(refusal(LONG_MIN, parts) == expected);
        CHECK(refusal(LONG_MAX, parts) == expected);
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
    CHECK(refusal(67768036191676800L, BOTH) == "t is too small.");
}
#endif

TEST_CASE("any moment of 32 bits becomes what the model makes of localtime's answer") {
    // Around changes of summer time, and where the C library has no later or earlier ones.
    static long const edges[] = {0,          1111885200, 1130634000, 1112511600, 1130652000,
                                 1110697200, 1131256800, 1096128000, 1112454000, 951782400};
    Random random(102);
    Differences differences;
    for (char const* const text : ZONES) {
        Zone const zone(text);
        auto const check = [&](long moment) {
            unsigned int const parts = random.below(4);
            std::tm const local = *std::localtime(static_cast<std::time_t const*>(&moment));
            differences.expect(text + (' ' + std::to_string(moment)),
                               shown(DateTime(moment, parts)), modelOf(local, parts).shown());
        };
        auto const below = [&random](std::uint32_t limit) {
            return static_cast<long>(random.below(limit));
        };
        for (long i = 0; i < 700; ++i) {
            check(static_cast<std::int32_t>(random.next()));
            check(random.of(edges) + below(20000) - 10000);
            check(2147483647L - (i < 5 ? i : below(200000)));
            check(-2147483647L - 1 + (i < 5 ? i : below(200000)));
            check(i < 5 ? i - 2 : 0);
        }
    }
    CHECK(differences.first() == "");
}

TEST_CASE("seconds that become a value become the same seconds again") {
    Random random(103);
    Differences differences;
    for (char const* const zoneText :
         {"UTC0", "IST-5:30", "NST3:30", "<+1245>-12:45", "<-0030>0:30"}) {
        Zone const zone(zoneText);
        for (long i = 0; i < 1000; ++i) {
            long const edges[] = {0, -1, 2147483647, -2147483647 - 1};
            long const moment = i < 4 ? edges[i] : static_cast<std::int32_t>(random.next());
            differences.expect(zoneText, std::to_string(seconds(DateTime(moment))),
                               std::to_string(moment));
        }
    }
    CHECK(differences.firstOf(5000) == "");
}

TEST_CASE("a timeval gives its milliseconds whatever the parts, cut and not checked") {
    std::pair<int, unsigned long> const rows[] = {
        {0, 0},    {999, 0},      {1000, 1},       {1999, 1},
        {7500, 7}, {999999, 999}, {1000000, 1000}, {2000000000, 2000000},
    };
    for (auto const& row : rows) {
        CAPTURE(row.first);
        for (unsigned int const parts : {0U, DATE, TIME, BOTH, 4U, 0x101U}) {
            Fields expected = fieldsOf(DateTime(MARCH, parts));
            expected.millisecond = row.second;
            CHECK(shown(DateTime(timeval{MARCH, row.first}, parts)) == expected.shown());
        }
    }
}

TEST_CASE("a timeval before the epoch keeps its microseconds apart") {
    Zone const zone("UTC0");
    CHECK(shown(DateTime(timeval{-1, 999999})) == "1969/12/31 23:59:59.999 offset 0 parts 3");
}
