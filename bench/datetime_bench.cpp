// DateTime: its text form in both directions, epoch seconds in both directions, and comparison.
#include <koru/datetime.h>

#include <time.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <iomanip>
#include <ostream>
#include <sstream>
#include <string>
#include <vector>

#include "circle.h"
#include "fixedbuffer.h"
#include "harness.h"

#ifdef KORU_BENCH_HAS_FMT
#include <fmt/chrono.h>
#endif
#ifdef KORU_BENCH_HAS_BOOST
#include <boost/date_time/posix_time/posix_time.hpp>
#endif

namespace {

using bench::Peer;
using bench::Work;

constexpr char FORMAT[] = "%Y-%m-%d %H:%M:%S";

/// The fields in an order in which bytes compare as the dates do.
using Fields = std::array<unsigned char, 8>;

/// One moment in all the forms that someone takes it in.
struct Moment {
    long seconds;
    std::tm fields;
    Fields bytes;
    std::string text;
    Koru::DateTime ours;
};

Moment _moment(long seconds) {
    std::time_t const moment = seconds;
    std::tm const fields = *std::localtime(&moment);
    auto const year = static_cast<unsigned int>(fields.tm_year + 1900);
    Fields const bytes = {
        static_cast<unsigned char>(year >> 8),         static_cast<unsigned char>(year & 0xFF),
        static_cast<unsigned char>(fields.tm_mon + 1), static_cast<unsigned char>(fields.tm_mday),
        static_cast<unsigned char>(fields.tm_hour),    static_cast<unsigned char>(fields.tm_min),
        static_cast<unsigned char>(fields.tm_sec),     0};
    char text[32];
    std::strftime(text, sizeof text, FORMAT, &fields);
    return {seconds, fields, bytes, text, Koru::DateTime(seconds)};
}

using Moments = bench::Circle<Moment>;

void _parse(bench::Report& report, Moments const& moments) {
    for (Moment const& moment : moments) {
        Koru::DateTime const parsed(moment.text);
        bench::require(static_cast<long>(parsed) == static_cast<long>(moment.ours),
                       "the date was read as another one");
    }
    Work const ours = moments.each([](Moment const& m) { return Koru::DateTime(m.text); });
    Work const strptime = moments.each([](Moment const& m) {
        std::tm fields{};
        ::strptime(m.text.c_str(), FORMAT, &fields);
        return fields;
    });
    Work const getTime = moments.each([](Moment const& m) {
        std::tm fields{};
        std::istringstream in(m.text);
        in >> std::get_time(&fields, FORMAT);
        return fields;
    });
    report.compare("parse", ours,
                   {bench::peer("strptime", strptime), bench::peer("std::get_time", getTime),
#ifdef KORU_BENCH_HAS_BOOST
                    bench::peer("Boost time_from_string", moments.each([](Moment const& m) {
                        return boost::posix_time::time_from_string(m.text);
                    }))},
#else
                    bench::missing("Boost time_from_string")},
#endif
                   0.4);
}

Peer _fmt([[maybe_unused]] Moments const& moments) {
#ifdef KORU_BENCH_HAS_FMT
    return bench::peer("fmt::format", moments.each([](Moment const& m) {
        return fmt::format("{:%F %T}", m.fields);
    }));
#else
    return bench::missing("fmt::format");
#endif
}

Peer _boost([[maybe_unused]] Moments const& moments) {
#ifdef KORU_BENCH_HAS_BOOST
    std::vector<boost::posix_time::ptime> times;
    for (Moment const& moment : moments) {
        times.push_back(boost::posix_time::ptime_from_tm(moment.fields));
    }
    return bench::peer("Boost to_iso_extended", Work::repeated([times, at = 0U]() mutable {
                           return boost::posix_time::to_iso_extended_string(
                               times[at++ % times.size()]);
                       }));
#else
    return bench::missing("Boost to_iso_extended");
#endif
}

void _format(bench::Report& report, Moments const& moments) {
    for (Moment const& moment : moments) {
        std::string const text = moment.ours;
        bench::require(text == moment.text, "the date was written as another one");
    }
    Work const ours = moments.each([](Moment const& m) {
        std::string text = m.ours;
        return text;
    });
    Work const strftime = moments.each([](Moment const& m) {
        char text[32];
        std::size_t const size = std::strftime(text, sizeof text, FORMAT, &m.fields);
        return std::string(text, size);
    });
    report.compare("format", ours,
                   {bench::peer("strftime", strftime), _fmt(moments), _boost(moments)}, 0.5);
}

void _stream(bench::Report& report, Moments const& moments) {
    bench::FixedBuffer<char> buffer;
    std::ostream out(&buffer);
    Work const ours = moments.each([&](Moment const& m) {
        buffer.rewind();
        out << m.ours;
        return 0;
    });
    Work const strftime = moments.each([&](Moment const& m) {
        char text[32];
        std::strftime(text, sizeof text, FORMAT, &m.fields);
        buffer.rewind();
        out << text;
        return 0;
    });
    Work const putTime = moments.each([&](Moment const& m) {
        buffer.rewind();
        out << std::put_time(&m.fields, FORMAT);
        return 0;
    });
    Work const sputn = moments.each([&](Moment const& m) {
        buffer.rewind();
        return out.rdbuf()->sputn(m.text.data(), static_cast<std::streamsize>(m.text.size()));
    });
    report.compare("stream", ours,
                   {bench::peer("strftime + <<", strftime), bench::peer("std::put_time", putTime),
                    bench::limit("sputn of the text", sputn)},
                   0.25);
}

/// The fields as a conversion to epoch seconds takes them: daylight saving unknown.
std::time_t _mktime(std::tm fields) {
    fields.tm_isdst = -1;
    return std::mktime(&fields);
}

void _toEpoch(bench::Report& report, Moments const& moments) {
    for (Moment const& moment : moments) {
        bench::require(static_cast<long>(moment.ours) == _mktime(moment.fields),
                       "the date became other epoch seconds");
    }
    Work const ours = moments.each([](Moment const& m) { return static_cast<long>(m.ours); });
    Work const mktime = moments.each([](Moment const& m) { return _mktime(m.fields); });
    report.compare("to epoch", ours, {bench::peer("mktime", mktime)}, 1.02);
}

void _fromEpoch(bench::Report& report, Moments const& moments) {
    Work const ours = moments.each([](Moment const& m) { return Koru::DateTime(m.seconds); });
    Work const localtime = moments.each([](Moment const& m) {
        std::time_t const moment = m.seconds;
        return *std::localtime(&moment);
    });
    Work const calls = moments.each([](Moment const& m) {
        std::time_t const moment = m.seconds;
        std::tm fields = *std::localtime(&moment);
        std::time_t const again = std::mktime(&fields);
        fields = *std::gmtime(&again);
        return again - std::mktime(&fields);
    });
    report.compare(
        "from epoch", ours,
        {bench::limit("localtime", localtime), bench::limit("its C library calls", calls, 1.05)});
}

/// Pairs a moment with one this many seconds later.
void _compare(bench::Report& report, std::string const& row, Moments const& moments, long later,
              bool conversions) {
    struct Pair {
        Moment first;
        Moment second;
    };
    std::vector<Pair> pairs;
    for (Moment const& moment : moments) {
        pairs.push_back({moment, _moment(moment.seconds + later)});
        bench::require(!(pairs.back().second.ours < pairs.back().first.ours),
                       "the later date counts as the earlier");
    }
    Work const fields = Work::repeated([pairs, at = 0U]() mutable {
        Pair const& pair = pairs[at++ % pairs.size()];
        return std::memcmp(pair.first.bytes.data(), pair.second.bytes.data(), sizeof(Fields)) < 0;
    });
    Work const twice = Work::repeated([pairs, at = 0U]() mutable {
        Pair const& pair = pairs[at++ % pairs.size()];
        return _mktime(pair.first.fields) < _mktime(pair.second.fields);
    });
    report.compare(row, Work::repeated([pairs, at = 0U]() mutable {
                       Pair const& pair = pairs[at++ % pairs.size()];
                       return pair.first.ours < pair.second.ours;
                   }),
                   {conversions ? bench::limit("two times mktime", twice, 1.02)
                                : bench::limit("memcmp of the fields", fields, 2.5)});
}

} // namespace

int main(int argc, char** argv) {
    // The rule itself, so that no zone file has a part in it.
    ::setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
    ::tzset();
    Moments const moments(
        [](auto& random) { return _moment(static_cast<long>(random() % 2000000000U)); });
    bench::Report report("dates", bench::Options(argc, argv));
    _parse(report, moments);
    _format(report, moments);
    _stream(report, moments);
    _toEpoch(report, moments);
    _fromEpoch(report, moments);
    _compare(report, "compare, equal", moments, 0, false);
    _compare(report, "compare, a year apart", moments, 31536000, false);
    _compare(report, "compare, an hour apart", moments, 3600, true);
}
