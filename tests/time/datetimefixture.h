// What the tests of DateTime share: the C library's time functions under their control, time zones,
// and values as text. To be included by one source file of an executable.
#ifndef KORU_TESTS_DATETIMEFIXTURE_H
#define KORU_TESTS_DATETIMEFIXTURE_H

#include <koru/datetime.h>

#include <dlfcn.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <deque>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/differences.h"
#include "support/throws.h"
#include "support/zone.h"

namespace test {

using Koru::DateTime;
unsigned int const DATE = DateTime::DATE;
unsigned int const TIME = DateTime::TIME;
unsigned int const BOTH = DateTime::DATE | DateTime::TIME;

/// What the time functions of the C library are asked within a scope, and what they are to answer.
struct Calls {
    Calls() { active = this; }
    Calls(Calls const&) = delete;
    Calls& operator=(Calls const&) = delete;
    ~Calls() { active = nullptr; }

    static inline Calls* active = nullptr;
    std::vector<std::tm> mktime;
    std::vector<std::time_t> gmtime;
    std::vector<std::time_t> localtime;
    std::deque<std::time_t> mktimeAnswers; ///< else the C library's own
    bool gmtimeFails = false;
    bool localtimeFails = false;
};

template <class Function>
Function* next(char const* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

} // namespace test

// The library under test calls these in place of the C library's. Of an hour that comes twice
// glibc's mktime takes the one that fits the conversion before, so each conversion here follows one
// and the same other.
extern "C" std::time_t mktime(std::tm* time) noexcept {
    static auto* const real = test::next<std::time_t(std::tm*)>("mktime");
    if (test::Calls* const calls = test::Calls::active) {
        calls->mktime.push_back(*time);
        if (!calls->mktimeAnswers.empty()) {
            std::time_t const answer = calls->mktimeAnswers.front();
            calls->mktimeAnswers.pop_front();
            return answer;
        }
    }
    std::tm other = {};
    other.tm_year = 105;
    other.tm_mday = 15;
    other.tm_hour = 12;
    real(&other);
    return real(time);
}

extern "C" std::tm* gmtime(std::time_t const* moment) noexcept {
    static auto* const real = test::next<std::tm*(std::time_t const*)>("gmtime");
    if (test::Calls::active != nullptr) test::Calls::active->gmtime.push_back(*moment);
    return test::Calls::active != nullptr && test::Calls::active->gmtimeFails ? nullptr
                                                                              : real(moment);
}

extern "C" std::tm* localtime(std::time_t const* moment) noexcept {
    static auto* const real = test::next<std::tm*(std::time_t const*)>("localtime");
    if (test::Calls::active != nullptr) test::Calls::active->localtime.push_back(*moment);
    return test::Calls::active != nullptr && test::Calls::active->localtimeFails ? nullptr
                                                                                 : real(moment);
}

namespace test {

char const CENTRAL_EUROPE[] = "CET-1CEST,M3.5.0,M10.5.0/3";
char const NEW_YORK[] = "EST5EDT,M3.2.0,M11.1.0";
char const SYDNEY[] = "AEST-10AEDT,M10.1.0,M4.1.0/3";
char const LORD_HOWE[] = "<+1030>-10:30<+11>-11,M10.1.0,M4.1.0";
/// Summer time is two days and two hours later than winter time, which is as far as it goes.
char const EXTREME[] = "AAA24:59:59BBB-24:59:59,M3.5.0,M10.5.0";

/// The same on 28 February, where a month is shortest.
char const EXTREME_FEBRUARY[] = "AAA24:59:59BBB-24:59:59,J59/0,J300";

char const* const ZONES[] = {"UTC0",     CENTRAL_EUROPE,  NEW_YORK,      "IST-5:30",     "NST3:30",
                             "<+14>-14", "<+1245>-12:45", "<-0030>0:30", "<+0030>-0:30", "<-12>12",
                             SYDNEY,     LORD_HOWE,       EXTREME};

/// The fields in a text of the test's own.
struct Fields {
    long year, month, day, hour, minute, second;
    unsigned long millisecond;
    long offset;
    unsigned int parts;

    /// With 0 in those that the given parts do not have.
    Fields only(unsigned int given) const {
        Fields fields = *this;
        if ((given & DATE) == 0) fields.year = fields.month = fields.day = 0;
        if ((given & TIME) == 0) {
            fields.hour = fields.minute = fields.second = fields.offset = 0;
            fields.millisecond = 0;
        }
        return fields;
    }
    /// The same, as a value that carries these parts.
    Fields of(unsigned int given) const {
        Fields fields = only(given);
        fields.parts = given & 0xFFU;
        return fields;
    }

    std::string shown() const {
        char text[200];
        std::snprintf(text, sizeof text, "%ld/%ld/%ld %ld:%ld:%ld.%lu offset %ld parts %u", year,
                      month, day, hour, minute, second, millisecond, offset, parts);
        return text;
    }
};

/// One field of the object as it lies in memory.
template <class T>
T at(DateTime const& value, std::size_t position) {
    T field;
    std::memcpy(&field, reinterpret_cast<char const*>(&value) + position, sizeof field);
    return field;
}

inline Fields fieldsOf(DateTime const& value) {
    return {value.getYear(),        value.getMonth(),  value.getDay(),
            value.getHour(),        value.getMinute(), value.getSecond(),
            value.getMillisecond(), value.getOffset(), at<std::uint8_t>(value, 14)};
}

inline std::string shown(DateTime const& value) { return fieldsOf(value).shown(); }
inline std::string text(DateTime const& value) { return value; }
inline long seconds(DateTime const& value) { return value; }

inline std::tm brokenDown(int year, int month, int day, int hour = 0, int minute = 0,
                          int second = 0) {
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

/// Whether all is the same that mktime looks at.
inline bool isSame(std::tm const& a, std::tm const& b) {
    return a.tm_year == b.tm_year && a.tm_mon == b.tm_mon && a.tm_mday == b.tm_mday &&
           a.tm_hour == b.tm_hour && a.tm_min == b.tm_min && a.tm_sec == b.tm_sec &&
           a.tm_isdst == b.tm_isdst;
}

/// Parts with and without bits that mean nothing.
unsigned int const ANY_PARTS[] = {0,     DATE,  TIME,       BOTH,       4,         7,
                                  0x100, 0x101, 0xFFFFFF02, 0xFFFFFFFE, 0xFFFFFFFF};

/// A value of any fields, which are not checked on this way.
inline DateTime valueOf(int year, int month, int day, int hour = 0, int minute = 0, int second = 0,
                        unsigned int parts = BOTH) {
    return DateTime(brokenDown(year, month, day, hour, minute, second), parts);
}

/// 2005-03-07 09:05:00 UTC.
long const MARCH = 1110186300;

inline DateTime fromText(std::string const& input, unsigned int parts = BOTH) {
    return DateTime(input, parts);
}

/// What the library makes of a text: fields, or the message of the exception.
inline std::string readFrom(std::string const& input, unsigned int parts) {
    std::string result;
    std::string const message =
        messageOf<std::invalid_argument>([&] { result = shown(DateTime(input, parts)); });
    return message == "<nothing>" ? result : message;
}

} // namespace test

#endif
