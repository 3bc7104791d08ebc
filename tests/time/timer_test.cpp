// The stopwatch: the moment of its making, and the time since then in steps of a 32-bit float.
#include <koru/timer.h>

#include <doctest/doctest.h>

#include <sys/time.h>
#include <time.h>

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <iomanip>
#include <sstream>
#include <string>
#include <type_traits>
#include <utility>

#include "support/differences.h"
#include "support/plainlocale.h"
#include "support/streamprobe.h"

using Koru::Timer;
using namespace test;

namespace {

std::uint32_t const PRESENT = 1700000000;

/// The clock on the wall for as long as it lives; else it is the system's.
struct Clock {
    Clock(std::uint32_t seconds, int microseconds) {
        active = this;
        to(seconds, microseconds);
    }
    Clock(Clock const&) = delete;
    Clock& operator=(Clock const&) = delete;
    ~Clock() { active = nullptr; }

    void to(std::uint32_t seconds, int microseconds) {
        now.tv_sec = static_cast<std::time_t>(seconds);
        now.tv_usec = microseconds;
    }

    static inline Clock* active = nullptr;
    timeval now = {};
    bool fails = false;
    int calls = 0;
    int callsWithZone = 0;
};

} // namespace

// The library under test calls this in place of the C library's, so that tests set the time.
extern "C" int gettimeofday(timeval* now, void* zone) noexcept {
    if (Clock* const clock = Clock::active) {
        ++clock->calls;
        clock->callsWithZone += zone != nullptr;
        if (!clock->fails) *now = clock->now;
        return clock->fails ? -1 : 0;
    }
    timespec precise;
    if (::clock_gettime(CLOCK_REALTIME, &precise) != 0) return -1;
    *now = {precise.tv_sec, static_cast<suseconds_t>(precise.tv_nsec / 1000)};
    return 0;
}

namespace {

/// A start or an end: seconds since the epoch and milliseconds.
using Moment = std::pair<std::uint32_t, std::uint32_t>;

std::string startOf(Timer const& timer) {
    return std::to_string(timer.getSeconds()) + '.' + std::to_string(timer.getMilliseconds());
}

std::string text(Timer const& timer) {
    std::ostringstream out;
    out << timer;
    return out.str();
}

/// What a timer of that start writes at that end.
std::string written(Moment const& start, Moment const& end) {
    Clock clock(start.first, static_cast<int>(start.second) * 1000);
    Timer const timer;
    clock.to(end.first, static_cast<int>(end.second) * 1000);
    return text(timer);
}

/// A number rounded to the 24 bits of a 32-bit float: to the nearest, a tie to the even one.
double rounded(double exact) {
    if (exact == 0) return 0;
    int const step = std::ilogb(exact) - 23;
    return std::ldexp(std::nearbyint(std::ldexp(exact, -step)), step);
}

double total(Moment const& moment) { return rounded(moment.first + moment.second / 1000.0); }

void expectElapsed(Differences& differences, Moment const& start, Moment const& end) {
    char expected[64];
    std::snprintf(expected, sizeof expected, "%.3f", rounded(total(end) - total(start)));
    std::ostringstream label;
    label << start.first << '.' << start.second << " to " << end.first << '.' << end.second;
    differences.expect(label.str(), written(start, end), expected);
}

struct Row {
    Moment start;
    Moment end;
    char const* expected;
};

template <std::size_t size>
void checkRows(Row const (&rows)[size]) {
    for (Row const& row : rows) {
        CAPTURE(row.start.first);
        CAPTURE(row.start.second);
        CAPTURE(row.end.first);
        CAPTURE(row.end.second);
        CHECK(written(row.start, row.end) == row.expected);
    }
}

/// The two ways to a start.
struct Making {
    static Timer start() { return Timer(); }
};
struct Resetting {
    static Timer start() {
        Timer timer;
        if (Clock::active != nullptr) Clock::active->calls = 0;
        timer.reset();
        return timer;
    }
};

} // namespace

TEST_CASE("a timer is a plain value of two 32-bit numbers, the seconds first") {
    CHECK(sizeof(Timer) == 8);
    CHECK(std::is_trivially_copyable<Timer>::value);
    CHECK(std::is_standard_layout<Timer>::value);
    CHECK(!std::is_polymorphic<Timer>::value);
    CHECK(std::is_same<decltype(Timer().getSeconds()), std::uint32_t>::value);
    CHECK(std::is_same<decltype(Timer().getMilliseconds()), std::uint32_t>::value);
    Clock clock(PRESENT, 250999);
    Timer const timer;
    std::uint32_t members[2];
    std::memcpy(members, &timer, sizeof members);
    CHECK(members[0] == PRESENT);
    CHECK(members[1] == 250);
}

TEST_CASE("a copy has the start of the original") {
    Clock clock(PRESENT, 250000);
    Timer const original;
    clock.to(PRESENT + 5, 0);
    Timer assigned;
    clock.calls = 0;
    Timer const copy(original);
    assigned = original;
    CHECK(clock.calls == 0);
    CHECK(startOf(copy) == "1700000000.250");
    CHECK(startOf(assigned) == "1700000000.250");
}

TEST_CASE_TEMPLATE("a start is the present seconds since the epoch", Way, Making, Resetting) {
    std::time_t const before = std::time(nullptr);
    Timer const timer = Way::start();
    timespec after;
    REQUIRE(::clock_gettime(CLOCK_REALTIME, &after) == 0);
    // time() may lag behind the precise clock by a tick.
    CHECK(std::int64_t{timer.getSeconds()} >= before);
    CHECK(std::int64_t{timer.getSeconds()} <= after.tv_sec);
    CHECK(timer.getMilliseconds() <= 999);
}

TEST_CASE_TEMPLATE("milliseconds are whole ones, cut and not rounded", Way, Making, Resetting) {
    std::pair<int, char const*> const rows[] = {
        {0, "1700000000.0"},        {999, "1700000000.0"},      {1000, "1700000000.1"},
        {1999, "1700000000.1"},     {250500, "1700000000.250"}, {999000, "1700000000.999"},
        {999999, "1700000000.999"},
    };
    for (auto const& [microseconds, expected] : rows) {
        Clock clock(PRESENT, microseconds);
        CHECK(startOf(Way::start()) == expected);
    }
}

TEST_CASE_TEMPLATE("a start is held up to the last second of 32 bits", Way, Making, Resetting) {
    for (std::uint32_t const seconds : {0U, 1U, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFFU}) {
        // Of a 32-bit time_t the later ones are negative.
        Clock clock(seconds, 1000);
        CHECK(startOf(Way::start()) == std::to_string(seconds) + ".1");
    }
}

TEST_CASE_TEMPLATE("a start asks the clock once, without a time zone", Way, Making, Resetting) {
    Clock clock(PRESENT, 0);
    Way::start();
    CHECK(clock.calls == 1);
    CHECK(clock.callsWithZone == 0);
}

TEST_CASE("reset makes the start now, later or earlier") {
    Clock clock(PRESENT, 250000);
    Timer timer;
    clock.to(PRESENT + 1000, 999999);
    timer.reset();
    CHECK(startOf(timer) == "1700001000.999");
    CHECK(text(timer) == "0.000");
    clock.to(PRESENT - 1000, 0);
    timer.reset();
    CHECK(startOf(timer) == "1699999000.0");
}

TEST_CASE_TEMPLATE("a timer whose clock fails starts at 0", Way, Making, Resetting) {
    Clock clock(PRESENT, 250000);
    clock.fails = true;
    CHECK(startOf(Way::start()) == "0.0");
}

TEST_CASE("a timer written at once reads 0.000") {
    // By the system's clock a step of 128 seconds may fall between the two, but only once.
    std::string const first = text(Timer());
    CHECK((first == "0.000" || text(Timer()) == "0.000"));
    for (Moment const& now : {Moment{PRESENT, 250}, Moment{1000, 999}, Moment{0, 1}, Moment{0, 0},
                              Moment{0xFFFFFFFF, 999}}) {
        CAPTURE(now.first);
        CHECK(written(now, now) == "0.000");
    }
}

TEST_CASE("today the time elapsed moves in steps of 128 seconds") {
    // Of the multiples of 128 about, 1699999872 is 13281249 times 128, 1700000000 follows it.
    checkRows({
        {{1700000000, 250}, {1700000063, 999}, "0.000"},
        // 64 seconds are a tie, which goes to the even multiple: 13281250 times 128.
        {{1700000000, 250}, {1700000064, 0}, "0.000"},
        {{1700000000, 250}, {1700000064, 1}, "128.000"},
        {{1700000000, 250}, {1700000191, 999}, "128.000"},
        {{1700000000, 250}, {1700000192, 0}, "256.000"},
        {{1700000000, 250}, {1700086400, 250}, "86400.000"},
        // The step falls where the multiples round, wherever the start is.
        {{1700000064, 0}, {1700000064, 1}, "128.000"},
        {{1700000064, 1}, {1700000191, 999}, "0.000"},
        {{1699999935, 999}, {1699999936, 0}, "128.000"},
        // A clock that was set back.
        {{1700000000, 250}, {1699999936, 0}, "0.000"},
        {{1700000000, 250}, {1699999935, 999}, "-128.000"},
        {{1700000000, 250}, {0, 0}, "-1700000000.000"},
        // Beyond 2 ^ 31 the steps are 256 seconds.
        {{2147483648U, 0}, {2147483776U, 0}, "0.000"},
        {{2147483648U, 0}, {2147483776U, 1}, "256.000"},
        {{4294967295U, 999}, {0, 0}, "-4294967296.000"},
        {{0, 0}, {4294967295U, 999}, "4294967296.000"},
    });
}

TEST_CASE("near the epoch, where a float is finer, the decimals show") {
    checkRows({
        {{0, 0}, {0, 1}, "0.001"},
        {{0, 1}, {1, 0}, "0.999"},
        {{1, 500}, {3, 250}, "1.750"},
        {{3, 250}, {1, 500}, "-1.750"},
        {{1000, 999}, {1001, 1}, "0.002"},
        // A float has steps of 1/128 here.
        {{100000, 0}, {100000, 3}, "0.000"},
        {{100000, 0}, {100000, 4}, "0.008"},
        {{100000, 0}, {100000, 12}, "0.016"},
        // One step from 2 ^ 24 on.
        {{16777216, 0}, {16777217, 0}, "0.000"},
        {{16777216, 0}, {16777217, 1}, "2.000"},
        {{16777218, 0}, {16777219, 0}, "2.000"},
    });
}

TEST_CASE("the time elapsed is the difference of two rounded floats for any two moments") {
    test::PlainLocale const locale; // for the point that printf writes
    Random random(20231114);
    Differences differences;
    auto const near = [&random](std::uint32_t start, std::uint32_t seconds) {
        return Moment{start + random.below(seconds), random.below(1000)};
    };
    std::uint32_t const epochs[] = {1001,     5000,       100000,     8388608,     16777216,
                                    99999999, 1000000000, 1700000000, 2147483648U, 4294960000U};
    for (std::uint32_t const epoch : epochs) {
        for (int i = 0; i < 2000; ++i) {
            Moment const start = near(epoch, 1000);
            expectElapsed(differences, start, near(start.first, 300));
            expectElapsed(differences, start, near(1001, 4294960000U));
        }
    }
    for (int i = 0; i < 10000; ++i) {
        expectElapsed(differences, near(0, 1001), near(0, 1001));
        expectElapsed(differences, near(0, 3), near(0, 3));
    }
    // All around one step.
    for (std::uint32_t offset = 0; offset <= 128; ++offset) {
        for (std::uint32_t const milliseconds : {0U, 1U, 499U, 999U}) {
            expectElapsed(differences, {PRESENT, 250}, {PRESENT + offset, milliseconds});
        }
    }
    CHECK(differences.firstOf(60000 + 129 * 4) == "");
}

TEST_CASE("writing a timer asks the clock once, without a time zone, and leaves the timer") {
    Clock clock(PRESENT, 250000);
    Timer const timer;
    clock.to(PRESENT + 500, 0);
    clock.calls = 0;
    std::ostringstream out;
    out << timer;
    CHECK(clock.calls == 1);
    out << ' ' << timer;
    CHECK(clock.calls == 2);
    CHECK(clock.callsWithZone == 0);
    CHECK(out.str() == "512.000 512.000");
    CHECK(startOf(timer) == "1700000000.250");
}

TEST_CASE("timers are independent of each other") {
    Clock clock(2000, 0);
    Timer const first;
    clock.to(2001, 500000);
    Timer const second;
    clock.to(2003, 0);
    CHECK(text(first) == "3.000");
    CHECK(text(second) == "1.500");
}

TEST_CASE("fixed notation, showpoint and a precision of 3 stay on the stream") {
    Clock clock(PRESENT, 0);
    std::ostringstream out;
    out << Timer();
    CHECK((out.flags() & std::ios::floatfield) == std::ios::fixed);
    CHECK((out.flags() & std::ios::showpoint) != 0);
    CHECK(out.precision() == 3);
    out << ' ' << 2.5 << ' ' << 1e9 << ' ' << 7 << ' ' << std::setprecision(0) << 4.0;
    CHECK(out.str() == "0.000 2.500 1000000000.000 7 4.");
}

TEST_CASE("writing a timer does to any stream what writing the number does") {
    static std::pair<Moment, double> const ends[] = {
        {{1000, 0}, 0}, {{1001, 0}, 1}, {{3560, 0}, 2560}, {{999, 0}, -1}, {{1000, 500}, 0.5}};
    Random random(22);
    Differences differences;
    for (int i = 0; i < 20000; ++i) {
        auto const& [end, number] = random.of(ends);
        Clock clock(1000, 0);
        Timer const timer;
        clock.to(end.first, static_cast<int>(end.second) * 1000);
        StreamSetup setup = randomSetup(random);
        if (random.below(2) == 0) setup.locale = groupingLocale();
        double const elapsed = number;
        expectSameInsertions(
            differences, setup, [&](std::ostream& os) -> std::ostream& { return os << timer; },
            [&](std::ostream& os) -> std::ostream& {
                return os << std::fixed << std::showpoint << std::setprecision(3) << elapsed;
            });
    }
    CHECK(differences.firstOf(20000) == "");
}

TEST_CASE("the locale set globally plays no part") {
    Clock clock(PRESENT, 0);
    Timer const timer;
    clock.to(PRESENT + 2560, 0);
    std::ostringstream out;
    {
        GlobalLocale const scope(groupingLocale());
        out << timer;
    }
    CHECK(out.str() == "2560.000");
}
