// The stopwatch: the moment of its making, and the time since then in steps of a 32-bit float.
#include <koru/timer.h>

#include <doctest/doctest.h>

#include <sys/time.h>
#include <time.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <iomanip>
#include <locale>
#include <random>
#include <sstream>
#include <stdexcept>
#include <streambuf>
#include <string>
#include <type_traits>
#include <utility>

namespace {

/// What the clock on the wall shall answer, and what it was asked.
struct Clock {
    bool isSet = false; ///< else it is the system's
    bool fails = false;
    timeval now = {};
    int calls = 0;
    int callsWithZone = 0;
};
Clock wallClock;

} // namespace

// Stands before the C library's function, so that tests set the time.
extern "C" int gettimeofday(timeval* now, void* zone) noexcept {
    ++wallClock.calls;
    if (zone != nullptr) ++wallClock.callsWithZone;
    if (wallClock.fails) return -1;
    if (wallClock.isSet) {
        *now = wallClock.now;
        return 0;
    }
    timespec precise;
    if (::clock_gettime(CLOCK_REALTIME, &precise) != 0) return -1;
    now->tv_sec = precise.tv_sec;
    now->tv_usec = static_cast<suseconds_t>(precise.tv_nsec / 1000);
    return 0;
}

namespace {

std::int64_t const PRESENT = 1700000000;

/// Sets the clock for as long as it lives.
class SetClock {
public:
    SetClock(std::int64_t seconds, int microseconds) {
        wallClock = Clock();
        wallClock.isSet = true;
        to(seconds, microseconds);
    }
    SetClock(SetClock const&) = delete;
    SetClock& operator=(SetClock const&) = delete;
    ~SetClock() { wallClock = Clock(); }

    void to(std::int64_t seconds, int microseconds) {
        wallClock.now.tv_sec = static_cast<std::time_t>(seconds);
        wallClock.now.tv_usec = microseconds;
    }
};

std::string text(Koru::Timer const& timer) {
    std::ostringstream out;
    out << timer;
    return out.str();
}

/// A non-negative number as mantissa * 2 ^ exponent.
struct Binary {
    std::uint64_t mantissa;
    int exponent;
};

/// A fraction rounded to the 24 bits of a 32-bit float: to the nearest, a tie to the even one.
Binary rounded(std::uint64_t numerator, std::uint64_t denominator) {
    if (numerator == 0) return {0, 0};
    int exponent = 0;
    while (numerator / denominator >= 1U << 24) {
        denominator *= 2;
        ++exponent;
    }
    while (numerator / denominator < 1U << 23) {
        numerator *= 2;
        --exponent;
    }
    std::uint64_t mantissa = numerator / denominator;
    std::uint64_t const twiceRest = numerator % denominator * 2;
    if (twiceRest > denominator || (twiceRest == denominator && mantissa % 2 == 1)) ++mantissa;
    return {mantissa, exponent};
}

/// A start or an end: seconds since the epoch and milliseconds.
using Moment = std::pair<std::uint32_t, std::uint32_t>;

Binary total(Moment const& moment) {
    return rounded(std::uint64_t{moment.first} * 1000 + moment.second, 1000);
}

/// The seconds between two moments, in whole numbers: both totals are rounded, their difference is
/// rounded, and that is written exactly to three decimals.
std::string elapsed(Moment const& start, Moment const& end) {
    Binary const from = total(start);
    Binary const to = total(end);
    int const exponent = std::min(from.exponent, to.exponent);
    auto const scaled = [exponent](Binary const& number) {
        REQUIRE(number.exponent - exponent < 40); // so that it fits
        return number.mantissa << static_cast<unsigned>(number.exponent - exponent);
    };
    std::uint64_t const a = scaled(from);
    std::uint64_t const b = scaled(to);
    Binary const size = rounded(a < b ? b - a : a - b, 1);
    double const exact = std::ldexp(static_cast<double>(size.mantissa), size.exponent + exponent);
    char buffer[64];
    std::snprintf(buffer, sizeof buffer, "%.3f", b < a ? -exact : exact);
    return buffer;
}

/// What a timer of that start writes at that end.
std::string written(Moment const& start, Moment const& end) {
    SetClock clock(start.first, static_cast<int>(start.second) * 1000);
    Koru::Timer const timer;
    clock.to(end.first, static_cast<int>(end.second) * 1000);
    return text(timer);
}

/// Numbers with a decimal comma and groups of three digits.
struct Continental : std::numpunct<char> {
    char do_decimal_point() const override { return ','; }
    char do_thousands_sep() const override { return '.'; }
    std::string do_grouping() const override { return "\3"; }
};

} // namespace

// ========================================================================================= shape

TEST_CASE("a timer is a plain value of two 32-bit numbers, the seconds first") {
    CHECK(sizeof(Koru::Timer) == 8);
    CHECK(std::is_trivially_copyable<Koru::Timer>::value);
    CHECK(std::is_standard_layout<Koru::Timer>::value);
    CHECK(!std::is_polymorphic<Koru::Timer>::value);
    CHECK(std::is_same<decltype(std::declval<Koru::Timer>().getSeconds()), std::uint32_t>::value);
    CHECK(std::is_same<decltype(std::declval<Koru::Timer>().getMilliseconds()),
                       std::uint32_t>::value);

    SetClock const clock(PRESENT, 250999);
    Koru::Timer const timer;
    std::uint32_t members[2];
    std::memcpy(members, &timer, sizeof members);
    CHECK(members[0] == 1700000000);
    CHECK(members[1] == 250);
}

TEST_CASE("a copy has the start of the original") {
    SetClock clock(PRESENT, 250000);
    Koru::Timer const original;
    clock.to(PRESENT + 5, 0);
    Koru::Timer assigned;
    wallClock.calls = 0;
    Koru::Timer const copy(original);
    assigned = original;
    CHECK(wallClock.calls == 0);
    for (Koru::Timer const& timer : {copy, assigned}) {
        CHECK(timer.getSeconds() == 1700000000);
        CHECK(timer.getMilliseconds() == 250);
    }
}

// ===================================================================================== the start

TEST_CASE("a new timer holds the present seconds since the epoch") {
    for (bool const again : {false, true}) {
        std::time_t const before = std::time(nullptr);
        Koru::Timer timer;
        if (again) timer.reset();
        timespec after;
        REQUIRE(::clock_gettime(CLOCK_REALTIME, &after) == 0);
        // time() may lag behind the precise clock by a tick.
        CHECK(std::int64_t{timer.getSeconds()} >= before);
        CHECK(std::int64_t{timer.getSeconds()} <= after.tv_sec);
        CHECK(timer.getMilliseconds() <= 999);
    }
}

TEST_CASE("milliseconds are whole ones, cut and not rounded") {
    struct Row {
        int microseconds;
        std::uint32_t milliseconds;
    };
    for (Row const& row : {Row{0, 0}, Row{999, 0}, Row{1000, 1}, Row{1999, 1}, Row{250500, 250},
                           Row{999000, 999}, Row{999999, 999}}) {
        CAPTURE(row.microseconds);
        SetClock const clock(PRESENT, row.microseconds);
        Koru::Timer const timer;
        CHECK(timer.getSeconds() == 1700000000);
        CHECK(timer.getMilliseconds() == row.milliseconds);
    }
}

TEST_CASE("a start of 0 and starts up to the last second of 32 bits are held") {
    for (std::uint32_t const seconds : {0U, 1U, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFFU}) {
        CAPTURE(seconds);
        // Of a 32-bit time_t the later ones are negative.
        SetClock const clock(seconds, 1000);
        Koru::Timer const timer;
        CHECK(timer.getSeconds() == seconds);
        CHECK(timer.getMilliseconds() == 1);
    }
}

TEST_CASE("making a timer asks the clock once, without a time zone") {
    SetClock const clock(PRESENT, 0);
    Koru::Timer const timer;
    CHECK(wallClock.calls == 1);
    CHECK(wallClock.callsWithZone == 0);
}

TEST_CASE("reset makes the start now, as in a new timer") {
    SetClock clock(PRESENT, 250000);
    Koru::Timer timer;
    clock.to(PRESENT + 1000, 999999);
    wallClock.calls = 0;
    timer.reset();
    CHECK(wallClock.calls == 1);
    CHECK(wallClock.callsWithZone == 0);
    CHECK(timer.getSeconds() == 1700001000);
    CHECK(timer.getMilliseconds() == 999);
    CHECK(text(timer) == "0.000");
    clock.to(PRESENT - 1000, 0);
    timer.reset();
    CHECK(timer.getSeconds() == 1699999000);
    CHECK(timer.getMilliseconds() == 0);
}

TEST_CASE("a timer whose clock fails starts at 0") {
    SetClock const clock(PRESENT, 250000);
    Koru::Timer timer;
    wallClock.fails = true;
    Koru::Timer const other;
    timer.reset();
    CHECK(timer.getSeconds() == 0);
    CHECK(timer.getMilliseconds() == 0);
    CHECK(other.getSeconds() == 0);
    CHECK(other.getMilliseconds() == 0);
}

// ================================================================================= time elapsed

TEST_CASE("a timer written at once reads 0.000") {
    // By the system's clock a step of 128 seconds may fall between the two, but only once.
    std::string const first = text(Koru::Timer());
    CHECK((first == "0.000" || text(Koru::Timer()) == "0.000"));
    for (Moment const& now : {Moment{1700000000, 250}, Moment{1000, 999}, Moment{0, 1},
                              Moment{0, 0}, Moment{0xFFFFFFFF, 999}}) {
        CAPTURE(now.first);
        CHECK(written(now, now) == "0.000");
    }
}

TEST_CASE("today the time elapsed moves in steps of 128 seconds") {
    // Of the multiples of 128 about, 1699999872 is 13281249 times 128, 1700000000 follows it.
    struct Row {
        Moment start;
        Moment end;
        char const* expected;
    };
    static Row const rows[] = {
        {{1700000000, 250}, {1700000000, 250}, "0.000"},
        {{1700000000, 250}, {1700000063, 250}, "0.000"},
        {{1700000000, 250}, {1700000063, 999}, "0.000"},
        // 64 seconds are a tie, which goes to the even multiple: 13281250 times 128.
        {{1700000000, 250}, {1700000064, 0}, "0.000"},
        {{1700000000, 250}, {1700000064, 1}, "128.000"},
        {{1700000000, 250}, {1700000064, 250}, "128.000"},
        {{1700000000, 250}, {1700000065, 250}, "128.000"},
        {{1700000000, 250}, {1700000128, 150}, "128.000"},
        {{1700000000, 250}, {1700000128, 250}, "128.000"},
        {{1700000000, 250}, {1700000191, 999}, "128.000"},
        {{1700000000, 250}, {1700000192, 0}, "256.000"},
        {{1700000000, 250}, {1700003600, 250}, "3584.000"},
        {{1700000000, 250}, {1700086400, 250}, "86400.000"},
        // The step falls where the multiples round, wherever the start is.
        {{1700000064, 0}, {1700000064, 1}, "128.000"},
        {{1700000063, 999}, {1700000064, 0}, "0.000"},
        {{1700000064, 1}, {1700000191, 999}, "0.000"},
        {{1699999935, 999}, {1699999936, 0}, "128.000"},
        // A clock that was set back.
        {{1700000000, 250}, {1699999936, 0}, "0.000"},
        {{1700000000, 250}, {1699999935, 999}, "-128.000"},
        {{1700000000, 250}, {0, 0}, "-1700000000.000"},
        {{0, 0}, {1700000000, 250}, "1700000000.000"},
        // Beyond 2 ^ 31 the steps are 256 seconds.
        {{2147483648U, 0}, {2147483776U, 0}, "0.000"},
        {{2147483648U, 0}, {2147483776U, 1}, "256.000"},
        {{4294967295U, 999}, {0, 0}, "-4294967296.000"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.start.first);
        CAPTURE(row.start.second);
        CAPTURE(row.end.first);
        CAPTURE(row.end.second);
        CHECK(written(row.start, row.end) == row.expected);
    }
}

TEST_CASE("near the epoch, where a float is finer, the decimals show") {
    struct Row {
        Moment start;
        Moment end;
        char const* expected;
    };
    static Row const rows[] = {
        {{0, 0}, {0, 1}, "0.001"},
        {{0, 0}, {0, 999}, "0.999"},
        {{0, 1}, {1, 0}, "0.999"},
        {{1, 500}, {3, 250}, "1.750"},
        {{3, 250}, {1, 500}, "-1.750"},
        {{1000, 999}, {1001, 1}, "0.002"},
        {{1000, 0}, {1000, 999}, "0.999"},
        // 100000.000 and 100000.001: a float has steps of 1/128 there.
        {{100000, 0}, {100000, 1}, "0.000"},
        {{100000, 0}, {100000, 4}, "0.008"},
        {{100000, 0}, {100000, 3}, "0.000"},
        {{100000, 0}, {100000, 12}, "0.016"},
        // One step from 2 ^ 24 on.
        {{16777216, 0}, {16777217, 0}, "0.000"},
        {{16777216, 0}, {16777217, 1}, "2.000"},
        {{16777218, 0}, {16777219, 0}, "2.000"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.start.first);
        CAPTURE(row.start.second);
        CAPTURE(row.end.first);
        CAPTURE(row.end.second);
        CHECK(written(row.start, row.end) == row.expected);
    }
}

TEST_CASE("the time elapsed is the difference of two rounded floats for any two moments") {
    std::mt19937 random(20231114);
    auto const below = [&](std::uint32_t limit) {
        return static_cast<std::uint32_t>(random() % limit);
    };
    auto const check = [](Moment const& start, Moment const& end, std::string& difference) {
        std::string const actual = written(start, end);
        std::string const expected = elapsed(start, end);
        if (actual == expected || !difference.empty()) return;
        difference = std::to_string(start.first) + "." + std::to_string(start.second) + " to " +
                     std::to_string(end.first) + "." + std::to_string(end.second) + ": " + actual +
                     ", not " + expected;
    };
    std::string difference;
    std::uint32_t const epochs[] = {1001,     5000,       100000,      8388608,     16777216,
                                    99999999, 1000000000, 1700000000U, 2147483648U, 4294960000U};
    for (std::uint32_t const epoch : epochs) {
        for (int i = 0; i < 2000; ++i) {
            Moment const start{epoch + below(1000), below(1000)};
            check(start, {start.first + below(300), below(1000)}, difference);
            check(start, {1001 + below(4294960000U), below(1000)}, difference);
        }
    }
    for (int i = 0; i < 10000; ++i) {
        check({below(1001), below(1000)}, {below(1001), below(1000)}, difference);
        check({below(3), below(1000)}, {below(3), below(1000)}, difference);
    }
    CHECK(difference == "");
}

TEST_CASE("every start within a step is the same total") {
    std::string difference;
    for (std::uint32_t offset = 0; offset <= 128; ++offset) {
        for (std::uint32_t const milliseconds : {0U, 1U, 499U, 999U}) {
            std::string const actual =
                written({1700000000, 250}, {1700000000 + offset, milliseconds});
            bool const beyond = offset > 64 || (offset == 64 && milliseconds > 0);
            if (actual != (beyond ? "128.000" : "0.000")) difference = actual;
        }
    }
    CHECK(difference == "");
}

TEST_CASE("writing a timer asks the clock once, without a time zone, and leaves the timer") {
    SetClock clock(PRESENT, 250000);
    Koru::Timer const timer;
    clock.to(PRESENT + 500, 0);
    wallClock.calls = 0;
    std::ostringstream out;
    out << timer;
    CHECK(wallClock.calls == 1);
    out << ' ' << timer;
    CHECK(wallClock.calls == 2);
    CHECK(wallClock.callsWithZone == 0);
    CHECK(out.str() == "512.000 512.000");
    CHECK(timer.getSeconds() == 1700000000);
    CHECK(timer.getMilliseconds() == 250);
}

TEST_CASE("timers are independent of each other") {
    SetClock clock(2000, 0);
    Koru::Timer const first;
    clock.to(2001, 500000);
    Koru::Timer const second;
    clock.to(2003, 0);
    CHECK(text(first) == "3.000");
    CHECK(text(second) == "1.500");
}

// ==================================================================================== the stream

TEST_CASE("writing a timer returns the stream") {
    SetClock const clock(PRESENT, 0);
    std::ostringstream out;
    std::ostream& returned = out << Koru::Timer();
    CHECK(&returned == &out);
    CHECK(out.str() == "0.000");
}

TEST_CASE("fixed notation, showpoint and a precision of 3 stay on the stream") {
    SetClock const clock(PRESENT, 0);
    std::ostringstream out;
    out << Koru::Timer();
    CHECK((out.flags() & std::ios::floatfield) == std::ios::fixed);
    CHECK((out.flags() & std::ios::showpoint) != 0);
    CHECK(out.precision() == 3);
    out << ' ' << 2.5 << ' ' << 1e9 << ' ' << 7 << ' ' << std::setprecision(0) << 4.0;
    CHECK(out.str() == "0.000 2.500 1000000000.000 7 4.");
}

TEST_CASE("the settings replace those that a stream had") {
    SetClock clock(1000, 0);
    Koru::Timer const timer;
    clock.to(1001, 500000);
    struct Row {
        char const* label;
        std::ios::fmtflags floatfield;
    };
    Row const rows[] = {
        {"general", std::ios::fmtflags()},
        {"fixed", std::ios::fixed},
        {"scientific", std::ios::scientific},
        {"hexadecimal", std::ios::fixed | std::ios::scientific},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        std::ostringstream out;
        out.setf(row.floatfield, std::ios::floatfield);
        out.precision(12);
        out << timer;
        CHECK(out.str() == "1.500");
        CHECK((out.flags() & std::ios::floatfield) == std::ios::fixed);
        CHECK(out.precision() == 3);
    }
}

TEST_CASE("no other setting of the stream changes") {
    SetClock const clock(PRESENT, 0);
    std::ostringstream out;
    out << std::hex << std::showbase << std::uppercase << std::left << std::boolalpha
        << std::unitbuf << std::setfill('_');
    std::ios::fmtflags const own = std::ios::fixed | std::ios::scientific | std::ios::showpoint;
    std::ios::fmtflags const before = out.flags() & ~own;
    out << Koru::Timer();
    bool const same = (out.flags() & ~own) == before;
    CHECK(same);
    CHECK(out.fill() == '_');
    out << ' ' << 255;
    CHECK(out.str() == "0.000 0XFF");
}

TEST_CASE("the number is written as the stream writes numbers: width, fill, sign and locale") {
    SetClock clock(PRESENT, 0);
    Koru::Timer const timer;
    clock.to(PRESENT + 2560, 0);
    std::ostringstream out;
    out << std::setfill('*') << std::setw(12) << timer << '|' << timer;
    CHECK(out.str() == "****2560.000|2560.000");
    out.str("");
    out << std::left << std::setw(10) << timer << '|';
    CHECK(out.str() == "2560.000**|");
    out.str("");
    out << std::internal << std::showpos << std::setw(10) << timer << '|';
    CHECK(out.str() == "+*2560.000|");
    std::ostringstream continental;
    continental.imbue(std::locale(std::locale::classic(), new Continental));
    continental << timer;
    CHECK(continental.str() == "2.560,000");
}

namespace {

/// Takes so many characters, then refuses or throws.
class Sink : public std::streambuf {
public:
    Sink(std::size_t room, bool throws) : room_(room), throws_(throws) {}

    std::string taken;
    int syncs = 0;

protected:
    std::streamsize xsputn(char const* s, std::streamsize size) override {
        std::size_t const fits = std::min(static_cast<std::size_t>(size), room_ - taken.size());
        taken.append(s, fits);
        if (fits < static_cast<std::size_t>(size) && throws_) throw std::range_error("full");
        return static_cast<std::streamsize>(fits);
    }
    int overflow(int c) override {
        char const character = static_cast<char>(c);
        return xsputn(&character, 1) == 1 ? c : EOF;
    }
    int sync() override {
        ++syncs;
        return 0;
    }

private:
    std::size_t room_;
    bool throws_;
};

/// How a stream is set up before a number is written to it.
struct Setup {
    std::size_t room;
    bool throws;
    std::ios::iostate exceptions;
    std::ios::fmtflags flags;
    int width;
    bool isContinental;
};

/// All that an insertion leaves behind.
template <class Insert>
std::string traceOf(Setup const& setup, Insert insert) {
    Sink sink(setup.room, setup.throws);
    Sink tied(0, false);
    std::ostream other(&tied);
    std::ostream out(&sink);
    out.exceptions(setup.exceptions);
    out.setf(setup.flags);
    out.width(setup.width);
    out.fill('*');
    out.tie(&other);
    if (setup.isContinental) out.imbue(std::locale(std::locale::classic(), new Continental));
    std::string thrown = "-";
    try {
        insert(out);
    } catch (std::exception const& e) {
        thrown = e.what();
    }
    std::ostringstream trace;
    trace << sink.taken << '|' << out.rdstate() << '|' << out.flags() << '|' << out.precision()
          << '|' << out.width() << '|' << sink.syncs << '|' << tied.syncs << '|' << thrown;
    return trace.str();
}

} // namespace

TEST_CASE("writing a timer does to any stream what writing the number does") {
    std::ios::fmtflags const flagses[] = {{},
                                          std::ios::showpos,
                                          std::ios::left,
                                          std::ios::internal | std::ios::showpos,
                                          std::ios::unitbuf,
                                          std::ios::hex | std::ios::showbase | std::ios::uppercase,
                                          std::ios::scientific | std::ios::showpoint};
    std::ios::iostate const exceptionses[] = {{}, std::ios::badbit, std::ios::failbit};
    std::pair<Moment, double> const ends[] = {
        {{1000, 0}, 0}, {{1001, 0}, 1}, {{3560, 0}, 2560}, {{999, 0}, -1}, {{1000, 500}, 0.5}};
    for (std::size_t room = 0; room < 14; ++room) {
        for (int bits = 0; bits < 4; ++bits) {
            for (std::ios::iostate const exceptions : exceptionses) {
                for (std::ios::fmtflags const flags : flagses) {
                    for (int const width : {0, 3, 12}) {
                        Setup const setup{room, bits % 2 != 0, exceptions, flags, width, bits > 1};
                        for (auto const& end : ends) {
                            SetClock clock(1000, 0);
                            Koru::Timer const timer;
                            clock.to(end.first.first, static_cast<int>(end.first.second) * 1000);
                            std::string const ours =
                                traceOf(setup, [&](std::ostream& out) { out << timer; });
                            std::string const plain = traceOf(setup, [&](std::ostream& out) {
                                out << std::fixed << std::showpoint << std::setprecision(3)
                                    << end.second;
                            });
                            if (ours != plain) CHECK(ours == plain);
                        }
                    }
                }
            }
        }
    }
}

TEST_CASE("the locale set globally plays no part") {
    SetClock clock(PRESENT, 0);
    Koru::Timer const timer;
    clock.to(PRESENT + 2560, 0);
    std::ostringstream out;
    std::locale const before =
        std::locale::global(std::locale(std::locale::classic(), new Continental));
    out << timer;
    std::locale::global(before);
    CHECK(out.str() == "2560.000");
}

TEST_CASE("nothing is written to a stream that has failed, and its settings are made") {
    SetClock const clock(PRESENT, 0);
    for (std::ios::iostate const state : {std::ios::badbit, std::ios::failbit, std::ios::eofbit}) {
        std::ostringstream out;
        out.setstate(state);
        out << Koru::Timer();
        CHECK(out.str() == "");
        CHECK((out.rdstate() & state) == state);
        CHECK((out.flags() & std::ios::floatfield) == std::ios::fixed);
        CHECK((out.flags() & std::ios::showpoint) != 0);
        CHECK(out.precision() == 3);
    }
}

TEST_CASE("a stream that cannot take the number has failed, and throws if it is asked to") {
    SetClock const clock(PRESENT, 0);
    struct Full : std::streambuf {};
    Full full;
    std::ostream quiet(&full);
    quiet << Koru::Timer();
    CHECK(quiet.bad());
    std::ostream loud(&full);
    loud.exceptions(std::ios::badbit);
    CHECK_THROWS_AS(loud << Koru::Timer(), std::ios::failure);
    CHECK(loud.bad());
}
