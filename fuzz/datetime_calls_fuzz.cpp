// Any calls on a date and time do what they do to plain fields: a value in range is stored, another
// refused with its message and nothing changed.
#include <koru/datetime.h>

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
    unsigned millisecond = 0;
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

void callOne(fuzz::Input& input, DateTime& value, Fields& fields) {
    unsigned const what = input.below(9);
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
    char text[64];
    std::snprintf(text, sizeof text, "%04d-%02d-%02d %02d:%02d:%02d", fields.year, fields.month,
                  fields.day, fields.hour, fields.minute, fields.second);
    KORU_CHECK(static_cast<std::string>(value) == text);
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
