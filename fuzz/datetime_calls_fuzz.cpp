// Any calls on a date and time do what they do to plain fields: a value in range is stored, another
// refused with its message and nothing changed; moments and broken-down times are taken as they are.
#include <koru/datetime.h>

#include <stdlib.h>
#include <sys/time.h>

#include <cstdint>
#include <cstdio>
#include <ctime>
#include <stdexcept>
#include <string>

#include "check.h"
#include "input.h"

namespace {

using Koru::DateTime;

struct Fields {
    int year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0, offset = 0;
    unsigned millisecond = 0, parts = DateTime::DATE | DateTime::TIME;
};

/// Calls a setter and compares what it does with what it is to do.
template <class Set>
void checkSet(Set set, int& field, int value, int least, int most, char const* refusal) {
    std::string message;
    try {
        set();
    } catch (std::invalid_argument const& e) {
        message = e.what();
    }
    bool const isInRange = value >= least && value <= most;
    KORU_CHECK(message == (isInRange ? "" : refusal));
    if (isInRange) field = value;
}

/// The fields that a broken-down time leaves in a value: as wide as the value's own.
Fields fieldsOf(std::tm const& time, unsigned parts) {
    Fields fields;
    fields.parts = parts;
    if ((parts & DateTime::DATE) != 0) {
        fields.year = static_cast<std::uint16_t>(time.tm_year + 1900);
        fields.month = static_cast<std::uint8_t>(time.tm_mon + 1);
        fields.day = static_cast<std::uint8_t>(time.tm_mday);
    }
    if ((parts & DateTime::TIME) != 0) {
        fields.hour = static_cast<std::uint8_t>(time.tm_hour);
        fields.minute = static_cast<std::uint8_t>(time.tm_min);
        fields.second = static_cast<std::uint8_t>(time.tm_sec);
        fields.offset = 1; // of the zone that every run sets
    }
    return fields;
}

std::tm localTime(std::time_t moment) {
    std::tm time = {};
    ::localtime_r(&moment, &time);
    return time;
}

/// From 1910 on, and not always a day of the calendar.
std::tm anyTime(fuzz::Input& input) {
    std::tm time = {};
    time.tm_year = 10 + static_cast<int>(input.byte());
    time.tm_mon = static_cast<int>(input.byte());
    time.tm_mday = static_cast<int>(input.byte());
    time.tm_hour = static_cast<int>(input.byte());
    time.tm_min = static_cast<int>(input.byte());
    time.tm_sec = static_cast<int>(input.byte());
    time.tm_isdst = static_cast<int>(input.below(3)) - 1;
    return time;
}

/// Makes the value anew, from one of the three forms that the C library has for a time.
void makeOne(fuzz::Input& input, DateTime& value, Fields& fields) {
    unsigned const form = input.below(3);
    unsigned const parts = input.below(4);
    if (form == 0) {
        std::tm const time = anyTime(input);
        value = DateTime(time, parts);
        fields = fieldsOf(time, parts);
        return;
    }
    // Half of what fits: the zone's hours may not lead beyond 32 bits.
    long const seconds = static_cast<std::int32_t>(input.word()) / 2;
    fields = fieldsOf(localTime(seconds), parts);
    if (form == 1) {
        value = DateTime(seconds, parts);
        return;
    }
    auto const microseconds = static_cast<suseconds_t>(input.word() % 1000000);
    timeval const time = {seconds, microseconds};
    value = DateTime(time, parts);
    fields.millisecond = static_cast<unsigned>(microseconds / 1000);
}

void callOne(fuzz::Input& input, DateTime& value, Fields& fields) {
    unsigned const what = input.below(10);
    if (what == 9) return makeOne(input, value, fields);
    auto const word = static_cast<std::uint16_t>(input.byte() << 8 | input.byte());
    auto const byte = static_cast<std::uint8_t>(word);
    auto const offset = static_cast<std::int16_t>(word);
    switch (what) {
    case 0:
        return checkSet([&] { value.setYear(word); }, fields.year, word, 1000, 3000,
                        "year out-of-range");
    case 1:
        return checkSet([&] { value.setMonth(byte); }, fields.month, byte, 1, 12,
                        "month out-of-range.");
    case 2:
        return checkSet([&] { value.setDay(byte); }, fields.day, byte, 1, 31, "day out-of-range.");
    case 3:
        return checkSet([&] { value.setHour(byte); }, fields.hour, byte, 0, 23,
                        "hour out-of-range.");
    case 4:
        return checkSet([&] { value.setMinute(byte); }, fields.minute, byte, 0, 59,
                        "minute out-of-range.");
    case 5:
        return checkSet([&] { value.setSecond(byte); }, fields.second, byte, 0, 59,
                        "minute out-of-range.");
    case 6:
        return checkSet([&] { value.setOffset(offset); }, fields.offset, offset, -720, 840,
                        "offset out-of-range.");
    case 7:
        value.setMillisecond(fields.millisecond = input.word());
        return;
    default:
        break;
    }
    value.clear(word);
    if ((word & DateTime::DATE) != 0) fields.year = fields.month = fields.day = 0;
    if ((word & DateTime::TIME) == 0) return;
    fields.hour = fields.minute = fields.second = fields.offset = 0;
    fields.millisecond = 0;
}

void checkFields(DateTime const& value, Fields const& fields) {
    KORU_CHECK(value.getYear() == fields.year && value.getMonth() == fields.month);
    KORU_CHECK(value.getDay() == fields.day && value.getHour() == fields.hour);
    KORU_CHECK(value.getMinute() == fields.minute && value.getSecond() == fields.second);
    KORU_CHECK(value.getOffset() == fields.offset);
    KORU_CHECK(value.getMillisecond() == fields.millisecond);
    char date[32] = "";
    if ((fields.parts & DateTime::DATE) != 0) {
        std::snprintf(date, sizeof date, "%04d-%02d-%02d", fields.year, fields.month, fields.day);
    }
    char time[32] = "";
    if ((fields.parts & DateTime::TIME) != 0) {
        std::snprintf(time, sizeof time, "%02d:%02d:%02d", fields.hour, fields.minute,
                      fields.second);
    }
    std::string const between = *date != '\0' && *time != '\0' ? " " : "";
    KORU_CHECK(static_cast<std::string>(value) == date + between + time);
}

long seconds(Fields const& fields) {
    std::tm t = {};
    t.tm_sec = fields.second;
    t.tm_min = fields.minute;
    t.tm_hour = fields.hour;
    t.tm_mday = fields.day;
    if (fields.month != 0) t.tm_mon = fields.month - 1;
    if (fields.year != 0) t.tm_year = fields.year - 1900;
    t.tm_isdst = -1;
    return std::mktime(&t);
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
    // One hour east of UTC, without daylight saving: of an hour that a clock shows twice, mktime
    // takes the one that its last answer suggests, so the same fields would give two moments.
    return ::setenv("TZ", "CET-1", 1);
}

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::Input input(data, size);
    DateTime values[2];
    Fields fields[2];
    while (!input.isAtEnd()) {
        unsigned const which = input.below(2);
        callOne(input, values[which], fields[which]);
        checkFields(values[which], fields[which]);
        long const a = seconds(fields[0]);
        long const b = seconds(fields[1]);
        KORU_CHECK(static_cast<long>(values[which]) == (which == 0 ? a : b));
        KORU_CHECK((values[0] == values[1]) == (a == b) && (values[0] != values[1]) == (a != b));
        KORU_CHECK((values[0] < values[1]) == (a < b) && (values[0] <= values[1]) == (a <= b));
        KORU_CHECK((values[0] > values[1]) == (a > b) && (values[0] >= values[1]) == (a >= b));
    }
    return 0;
}
