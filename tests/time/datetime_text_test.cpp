// DateTime from text, to text and to streams. Reading is compared with a model of a few lines.
#include "time/datetimefixture.h"

#include <doctest/doctest.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <iomanip>
#include <sstream>
#include <stdexcept>
#include <string>

#include "support/streamprobe.h"

using namespace test;

namespace {

char const FORMAT[] = "incorrect format.";
char const YEAR[] = "year out-of-range";
char const MONTH[] = "month out-of-range.";
char const DAY[] = "day out-of-range.";
char const HOUR[] = "hour out-of-range.";
char const MINUTE[] = "minute out-of-range.";

long ranged(long number, long least, long greatest, char const* message) {
    if (number < least || number > greatest) throw std::invalid_argument(message);
    return number;
}

/// The fields of a text.
Fields modelFields(std::string const& input, unsigned int parts) {
    auto const is = [&](std::size_t i, char c) { return i < input.size() && input[i] == c; };
    auto const number = [&](std::size_t from, std::size_t count) {
        return std::strtol(input.substr(from, count).c_str(), nullptr, 10);
    };
    Fields fields = {};
    fields.parts = parts & 0xFFU;
    if ((parts & DATE) != 0) {
        if (!is(4, '-') || !is(7, '-')) throw std::invalid_argument(FORMAT);
        if (long const n = number(0, 4)) fields.year = ranged(n & 0xFFFF, 1000, 3000, YEAR);
        if (long const n = number(5, 2)) fields.month = ranged(n & 0xFF, 1, 12, MONTH);
        if (long const n = number(8, 2)) fields.day = ranged(n & 0xFF, 1, 31, DAY);
    }
    if ((parts & TIME) != 0) {
        std::size_t const start = is(2, ':') && is(5, ':') ? 0 : 11;
        if (!is(start + 2, ':') || !is(start + 5, ':')) throw std::invalid_argument(FORMAT);
        fields.hour = ranged(number(start, 2) & 0xFF, 0, 23, HOUR);
        fields.minute = ranged(number(start + 3, 2) & 0xFF, 0, 59, MINUTE);
        fields.second = ranged(number(start + 6, 2) & 0xFF, 0, 59, MINUTE);
    }
    return fields;
}

/// The same as text, or the message of the exception.
std::string modelOf(std::string const& input, unsigned int parts) {
    std::string result;
    std::string const message =
        messageOf<std::invalid_argument>([&] { result = modelFields(input, parts).shown(); });
    return message == "<nothing>" ? result : message;
}

std::string textModel(Fields const& fields) {
    char date[100] = "";
    char time[100] = "";
    if ((fields.parts & DATE) != 0) {
        std::snprintf(date, sizeof date, "%04ld-%02ld-%02ld", fields.year, fields.month,
                      fields.day);
    }
    if ((fields.parts & TIME) != 0) {
        std::snprintf(time, sizeof time, "%02ld:%02ld:%02ld", fields.hour, fields.minute,
                      fields.second);
    }
    return std::string(date) + ((fields.parts & BOTH) == BOTH ? " " : "") + time;
}

/// Texts with | between them that give the same value, in its text form, or the same message. A ~
/// is a NUL.
struct Row {
    std::string expected;
    std::string texts;
};

void checkRead(Row const& row, unsigned int parts) {
    std::istringstream texts(row.texts);
    for (std::string text; std::getline(texts, text, '|');) {
        CAPTURE(text);
        std::replace(text.begin(), text.end(), '~', '\0');
        std::string result;
        std::string const message =
            messageOf<std::invalid_argument>([&] { result = std::string(DateTime(text, parts)); });
        CHECK((message == "<nothing>" ? result : message) == row.expected);
    }
}

} // namespace

TEST_CASE("a text is read into the fields of the given parts") {
    Fields const all = {2005, 3, 7, 9, 5, 1, 0, 0, BOTH};
    for (unsigned int const parts : ANY_PARTS) {
        CAPTURE(parts);
        CHECK(readFrom("2005-03-07 09:05:01", parts) == all.of(parts).shown());
    }
    CHECK(readFrom("2005-03-07", DATE) == all.of(DATE).shown());
    CHECK(readFrom("09:05:01", TIME) == all.of(TIME).shown());
    CHECK(readFrom("any text", 0xFFFFFF04) == all.of(4).shown());
}

TEST_CASE("a text is read without a look at the time zone") {
    Zone const zone(NEW_YORK);
    Calls const calls;
    CHECK(readFrom("2005-07-07 09:05:01", BOTH) == "2005/7/7 9:5:1.0 offset 0 parts 3");
    CHECK(calls.mktime.empty());
    CHECK(calls.gmtime.empty());
    CHECK(calls.localtime.empty());
}

TEST_CASE("dates are read as their four, two and two characters say") {
    Row const rows[] = {
        {"1000-01-01", "1000-01-01"},
        {"3000-12-31", "3000-12-31"},
        {"2005-02-31", "2005-02-31"},
        {YEAR, "0999-01-01|3001-01-01|9999-01-01"},
        {MONTH, "2005-13-01|2005-99-01"},
        {DAY, "2005-12-32|2005-12-99"},
        // Of several numbers the first one counts.
        {YEAR, "0999-13-32"},
        {MONTH, "2005-13-32|0000-13-32"},
        {DAY, "0000-00-32"},
        // A number of 0, or none, is skipped.
        {"0000-00-00", "0000-00-00|abcd-ef-gh|    -  -  |-----------|0x7D-0x-0x|+-20-+--+-"},
        {"0000-00-00", "- 20-- -- 1|~~~~-~~-~~|\xD9\xA1\xD9\xA2-\xB2\xB3-\xFF\xFF"},
        {"0000-03-07", "0000-03-07|-000-03-07"},
        {"2005-00-07", "2005-00-07|2005--0-07"},
        {"2005-03-00", "2005-03-00|2005-03--0"},
        // Numbers are those of strtol: white space and a sign before the digits, ended by others.
        {"2005-03-07", "2005-3x-7x|2005- 3- 7|2005-\t3-\n7|2005-\v3-\r7|2005-+3-+7|2005-3 -7"},
        {"2005-03-07", "2005-3.-7,"},
        {"2005-00-00", "2005-x3-x7|2005-~1-~1"},
        {"2005-01-01", "2005-1~-1~"},
        {"0000-01-01", "0~05-01-01"},
        {"2005-00-17", "2005-0~-17"},
        {YEAR, "12e3-03-07|1x05-03-07| 205-03-07|+999-03-07|  +5-03-07|2~05-01-01"},
        // Cut to 16 and 8 bits: -1 is 65535 or 255.
        {YEAR, "-001-03-07|  -1-03-07|-999-03-07"},
        {MONTH, "2005--1-07|2005--9-07"},
        {DAY, "2005-03--1|2005-03--9"},
        // What follows is not looked at.
        {"2005-03-07", "2005-03-071|2005-03-07 and more|2005-03-07 99:99:99"},
        {FORMAT, "2005/03/07|2005-03/07|2005/03-07|05-03-07|20050307| 2005-03-07|12:34:56"},
        {FORMAT, "2005~01-01|2005-01~01"},
    };
    for (Row const& row : rows) checkRead(row, DATE);
}

TEST_CASE("times are read as their two, two and two characters say, zero included") {
    Row const rows[] = {
        {"00:00:00", "00:00:00"},
        {"23:59:59", "23:59:59"},
        {HOUR, "24:00:00|99:00:00"},
        {MINUTE, "12:60:00|12:30:60|12:30:61"},
        {"12:30:00", "12:30:"},
        {"12:30:04", "12:30:4"},
        {"12:30:45", "12:30:456|12:30:45.678"},
        // Of several numbers the first one counts.
        {HOUR, "24:60:60"},
        {MINUTE, "23:60:60"},
        // Numbers are those of strtol, and cut to 8 bits.
        {"05:06:07", "+5:+6:+7| 5: 6: 7|5 :6 :7 |5x:6x:7x|5~:6~:7~"},
        {"00:00:00", "x5:x6:x7|ab:cd:ef|  :  :  |::::::::|0x:0x:0x|-0:-0:-0|~1:~2:~3"},
        {HOUR, "-1:00:00|-9:00:00"},
        {MINUTE, "12:-1:00|12:30:-1|12:30:-9"},
        // The longer form, whatever precedes it and at position 10.
        {"12:34:56", "2005-01-02 12:34:56|2005-01-02T12:34:56|2005-01-02912:34:56"},
        {"12:34:56", "xxxxxxxxxxx12:34:56|9999-99-99 12:34:56|~~~~~~~~~~~12:34:56"},
        {"12:34:56", "xxxxxxxxxxx12:34:56 and more"},
        {"12:34:00", "xxxxxxxxxxx12:34:"},
        {"12:34:05", "xxxxxxxxxxx12:34:5"},
        {HOUR, "xxxxxxxxxxx24:34:56|xxxxxxxxxxx-1:34:56"},
        {MINUTE, "xxxxxxxxxxx12:60:56|xxxxxxxxxxx12:34:60"},
        // Both separators of the shorter form decide for it.
        {"01:02:03", "01:02:03 xx12:34:56"},
        {HOUR, "99:02:03 xx12:34:56"},
        {"12:34:56", "01:02-03 xx12:34:56|01-02:03 xx12:34:56|01-02-03 xx12:34:56"},
        {FORMAT, "01:02-03|01-02:03|01:02-03 xx12:34-56|01:02-03 xx12-34:56|1:02:03|12:30"},
        {FORMAT, " 12:30:00|2005-01-02|2005-01-02  12:34:56|12~34:56|12:34~56"},
    };
    for (Row const& row : rows) checkRead(row, TIME);
}

TEST_CASE("with both parts the date comes first, in form and in numbers") {
    Row const rows[] = {
        {"2005-02-31 10:00:00", "2005-02-31 10:00:00|2005-02-31x10:00:00"},
        {"0000-00-00 00:00:00", "0000-00-00 00:00:00"},
        {"2005-01-02 12:34:00", "2005-01-02 12:34:"},
        {FORMAT, "12:34:56|2005-01-02|2005-01-02 12:34"},
        // A wrong date is told before a time in the wrong form, and the date's form before all.
        {MONTH, "2005-13-01 12-34-56"},
        {DAY, "2005-01-32 99:99:99"},
        {YEAR, "0999-01-01"},
        {FORMAT, "2005/13/01 99:99:99"},
        {HOUR, "2005-01-01 99:99:99"},
        {MINUTE, "2005-01-01 23:99:99|2005-01-01 23:59:99"},
        // A date with the separators of a time.
        {"0000-00-05 00:00:01", "00:0-:1-05"},
        {YEAR, "10:0-:1-05"},
        {"0000-00-05 00:05:01", "00:5-:1-05 12:34:56"},
    };
    for (Row const& row : rows) checkRead(row, BOTH);
}

TEST_CASE("a text that ends early fails where a separator is missing, and else has less digits") {
    std::string const full = "2005-03-17 19:45:58x";
    for (std::size_t size = 1; size <= full.size(); ++size) {
        std::string const cut = full.substr(0, size);
        std::string const day = size == 8 ? "00" : size == 9 ? "01" : "17";
        std::string const second = size == 17 ? "00" : size == 18 ? "05" : "58";
        std::string const time = "19:45:" + second;
        checkRead({size < 8 ? FORMAT : "2005-03-" + day, cut}, DATE);
        checkRead({size < 17 ? FORMAT : time, cut}, TIME);
        checkRead({size < 17 ? FORMAT : "2005-03-17 " + time, cut}, BOTH);
        checkRead({"", cut}, 0);
        if (size > 11) checkRead({size < 17 ? FORMAT : time, cut.substr(11, 8)}, TIME);
    }
    CHECK(readFrom("", DATE) == FORMAT);
    CHECK(readFrom("", TIME) == FORMAT);
}

TEST_CASE("any text is read as the model reads it") {
    static char const characters[] = "00112233459:::----/ +x\t.";
    static char const* const patterns[] = {
        "2005-03-17 19:45:58", "2005-03-17",          "19:45:58",
        "0000-00-00 00:00:00", "00:0-:1-05 12:34:56", "01:02:03 xx12:34:56"};
    Random random(104);
    Differences differences;
    int accepted = 0;
    for (int i = 0; i < 100000; ++i) {
        std::string input = random.of(patterns);
        for (std::uint32_t changes = random.below(4); changes > 0; --changes) {
            // The last character of the array is its NUL, which takes part.
            input[random.next() % input.size()] = random.of(characters);
        }
        if (random.below(4) == 0) input.resize(random.below(24));
        unsigned int const parts = random.below(4);
        std::string const actual = readFrom(input, parts);
        accepted += actual.find("offset 0") != std::string::npos;
        differences.expect(input, actual, modelOf(input, parts));
    }
    CHECK(differences.first() == "");
    CHECK(accepted > 25000);
    CHECK(accepted < 95000);
}

TEST_CASE("a year is read from any four digits") {
    for (int year = 0; year <= 9999; ++year) {
        char input[32];
        std::snprintf(input, sizeof input, "%04d-01-01", year);
        bool const accepted = year == 0 || (year >= 1000 && year <= 3000);
        checkRead({accepted ? input : YEAR, input}, DATE);
    }
}

TEST_CASE("a value is written in the halves that it carries") {
    Zone const zone("UTC0");
    CHECK(text(DateTime(MARCH, BOTH)) == "2005-03-07 09:05:00");
    CHECK(text(DateTime(MARCH, DATE)) == "2005-03-07");
    CHECK(text(DateTime(MARCH, TIME)) == "09:05:00");
    CHECK(text(DateTime(MARCH, 0)) == "");
    CHECK(text(DateTime(MARCH, 4)) == "");
    CHECK(text(DateTime(MARCH, 0xFD)) == "2005-03-07");
    CHECK(text(DateTime(MARCH, 0x103)) == "2005-03-07 09:05:00");
    CHECK(text(DateTime(MARCH, 0x100)) == "");
}

TEST_CASE("the parts decide what is written, not the fields") {
    DateTime dateOnly = fromText("2005-03-07", DATE);
    dateOnly.setHour(9);
    dateOnly.setMillisecond(500);
    dateOnly.setOffset(-720);
    CHECK(text(dateOnly) == "2005-03-07");
    DateTime timeOnly = fromText("09:05:01", TIME);
    timeOnly.setYear(2005);
    CHECK(text(timeOnly) == "09:05:01");
    DateTime nothing = fromText("", 0);
    nothing.setDay(7);
    nothing.setSecond(7);
    CHECK(text(nothing) == "");
}

TEST_CASE("numbers have zeros before them and are not cut, as the model writes them") {
    CHECK(text(valueOf(5, 1, 1, 9, 9, 9)) == "0005-01-01 09:09:09");
    CHECK(text(valueOf(10000, 100, 100, 100, 100, 100)) == "10000-100-100 100:100:100");
    CHECK(text(valueOf(65535, 255, 255, 255, 255, 255)) == "65535-255-255 255:255:255");
    Differences differences;
    auto const check = [&](DateTime const& value) {
        differences.expect(shown(value), text(value), textModel(fieldsOf(value)));
    };
    for (int n = 0; n <= 0xFF; ++n) check(valueOf(n, n, 255 - n, n, 255 - n, n));
    for (int n = 0; n <= 0xFFFF; ++n) check(valueOf(n, 1, 1, 0, 0, 0, DATE));
    CHECK(differences.firstOf(0x100 + 0x10000) == "");
}

TEST_CASE("text is read back as it was written, with the same parts") {
    Random random(105);
    Differences differences;
    auto const any = [&random](std::uint32_t limit) {
        return static_cast<int>(random.below(limit));
    };
    for (int i = 0; i < 20000; ++i) {
        unsigned int const parts = random.below(4);
        bool const isZero = random.below(4) == 0;
        DateTime const value = valueOf(isZero ? 0 : 1000 + any(2001), isZero ? 0 : 1 + any(12),
                                       isZero ? 0 : 1 + any(31), any(24), any(60), any(60), parts);
        Fields expected = fieldsOf(value);
        expected.offset = 0;
        differences.expect(shown(value), readFrom(text(value), parts), expected.shown());
    }
    CHECK(differences.firstOf(20000) == "");
}

TEST_CASE("writing a value needs no conversion") {
    DateTime const value(MARCH);
    Calls const calls;
    std::ostringstream out;
    out << text(value) << value;
    CHECK(calls.mktime.empty());
    CHECK(calls.gmtime.empty());
    CHECK(calls.localtime.empty());
}

TEST_CASE("the locale set globally does not change text, written or read") {
    DateTime const value = valueOf(65535, 255, 255, 255, 255, 255);
    std::string written;
    std::string read;
    std::ostringstream before;
    std::string after;
    {
        GlobalLocale const scope(groupingLocale());
        written = text(value);
        read = readFrom("2005-03-07 09:05:01", BOTH);
        before << value;
        std::ostringstream out;
        out << value << ' ' << 2005;
        after = out.str();
    }
    CHECK(written == "65535-255-255 255:255:255");
    CHECK(read == "2005/3/7 9:5:1.0 offset 0 parts 3");
    CHECK(before.str() == written);
    CHECK(after == written + " 2.0.0.5");
}

TEST_CASE("a value is written to any stream as its text is, one character after another") {
    Random random(108);
    Differences differences;
    for (int i = 0; i < 10000; ++i) {
        StreamSetup setup = randomSetup(random);
        if (random.below(2) == 0) setup.locale = groupingLocale();
        int const high = random.below(4) == 0 ? 200 : 0;
        DateTime const value = valueOf(2005, 3, 7, 9 + high, 5, 1 + high, random.below(4));
        expectSameInsertions(
            differences, setup, [&](std::ostream& os) -> std::ostream& { return os << value; },
            [&](std::ostream& os) -> std::ostream& {
                for (char const c : text(value)) os << c;
                return os;
            });
    }
    CHECK(differences.firstOf(10000) == "");
}

TEST_CASE("the width of a stream goes to the first character") {
    DateTime const value = fromText("2005-03-07", DATE);
    std::ostringstream out;
    out << std::setfill('*') << std::setw(4) << value << '|';
    out << std::left << std::setw(4) << value << value << '|';
    out << std::right << std::setw(14) << value << '|';
    out << std::internal << std::setw(2) << value;
    CHECK(out.str() == "***2005-03-07|2***005-03-072005-03-07|*************2005-03-07|*2005-03-07");
    CHECK(out.width() == 0);
}
