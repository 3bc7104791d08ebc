// DateTime: its text form in both directions, epoch seconds in both directions, and comparison.
#include <koru/datetime.h>

#include <time.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <iomanip>
#include <ostream>
#include <random>
#include <sstream>
#include <string>
#include <vector>

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

/// Moments that cannot be foreseen, handed out in a circle.
class Moments {
public:
    Moments() {
        std::mt19937 random(1);
        for (std::size_t i = 0; i < COUNT; ++i) {
            moments_.push_back(_moment(static_cast<long>(random() % 2000000000U)));
        }
    }

    Moment const& next() { return moments_[at_++ % COUNT]; }
    Moment const* begin() const { return moments_.data(); }
    Moment const* end() const { return moments_.data() + COUNT; }

private:
    static constexpr std::size_t COUNT = 64;

    std::vector<Moment> moments_;
    std::size_t at_ = 0;
};

void _parse(bench::Report& report, Moments moments) {
    for (Moment const& moment : moments) {
        Koru::DateTime const parsed(moment.text);
        bench::require(static_cast<long>(parsed) == static_cast<long>(moment.ours),
                       "the date was read as another one");
    }
    std::vector<Peer> peers = {bench::peer("strptime", Work::repeated([moments]() mutable {
                                               std::tm fields{};
                                               ::strptime(moments.next().text.c_str(), FORMAT,
                                                          &fields);
                                               return fields;
                                           })),
                               bench::peer("std::get_time", Work::repeated([moments]() mutable {
                                               std::tm fields{};
                                               std::istringstream in(moments.next().text);
                                               in >> std::get_time(&fields, FORMAT);
                                               return fields;
                                           }))};
#ifdef KORU_BENCH_HAS_BOOST
    peers.push_back(bench::peer("Boost time_from_string", Work::repeated([moments]() mutable {
                                    return boost::posix_time::time_from_string(moments.next().text);
                                })));
#else
    peers.push_back(bench::missing("Boost time_from_string"));
#endif
    report.compare("parse", Work::repeated([moments]() mutable {
                       return Koru::DateTime(moments.next().text);
                   }),
                   peers, 0.4);
}

void _format(bench::Report& report, Moments moments) {
    for (Moment const& moment : moments) {
        std::string const text = moment.ours;
        bench::require(text == moment.text, "the date was written as another one");
    }
    std::vector<Peer> peers = {bench::peer("strftime", Work::repeated([moments]() mutable {
                                               char text[32];
                                               std::size_t const size =
                                                   std::strftime(text, sizeof text, FORMAT,
                                                                 &moments.next().fields);
                                               return std::string(text, size);
                                           }))};
#ifdef KORU_BENCH_HAS_FMT
    peers.push_back(bench::peer("fmt::format", Work::repeated([moments]() mutable {
                                    return fmt::format("{:%F %T}", moments.next().fields);
                                })));
#else
    peers.push_back(bench::missing("fmt::format"));
#endif
#ifdef KORU_BENCH_HAS_BOOST
    std::vector<boost::posix_time::ptime> times;
    for (Moment const& moment : moments) {
        times.push_back(boost::posix_time::ptime_from_tm(moment.fields));
    }
    peers.push_back(bench::peer("Boost to_iso_extended", Work::repeated([times, at = 0U]() mutable {
                                    return boost::posix_time::to_iso_extended_string(
                                        times[at++ % times.size()]);
                                })));
#else
    peers.push_back(bench::missing("Boost to_iso_extended"));
#endif
    report.compare("format", Work::repeated([moments]() mutable {
                       std::string text = moments.next().ours;
                       return text;
                   }),
                   peers, 0.5);
}

void _stream(bench::Report& report, Moments moments) {
    bench::FixedBuffer<char> buffer;
    std::ostream out(&buffer);
    report.compare("stream", Work::repeated([&] {
                       buffer.rewind();
                       out << moments.next().ours;
                       return 0;
                   }),
                   {bench::peer("strftime + <<", Work::repeated([&] {
                                    char text[32];
                                    std::strftime(text, sizeof text, FORMAT,
                                                  &moments.next().fields);
                                    buffer.rewind();
                                    out << text;
                                    return 0;
                                })),
                    bench::peer("std::put_time", Work::repeated([&] {
                                    buffer.rewind();
                                    out << std::put_time(&moments.next().fields, FORMAT);
                                    return 0;
                                })),
                    bench::limit("sputn of the text", Work::repeated([&] {
                                     std::string const& text = moments.next().text;
                                     buffer.rewind();
                                     return out.rdbuf()->sputn(
                                         text.data(), static_cast<std::streamsize>(text.size()));
                                 }))},
                   0.25);
}

/// The fields as a conversion to epoch seconds takes them: daylight saving unknown.
std::time_t _mktime(std::tm fields) {
    fields.tm_isdst = -1;
    return std::mktime(&fields);
}

void _toEpoch(bench::Report& report, Moments moments) {
    for (Moment const& moment : moments) {
        bench::require(static_cast<long>(moment.ours) == _mktime(moment.fields),
                       "the date became other epoch seconds");
    }
    report.compare("to epoch", Work::repeated([moments]() mutable {
                       return static_cast<long>(moments.next().ours);
                   }),
                   {bench::peer("mktime", Work::repeated([moments]() mutable {
                                    return _mktime(moments.next().fields);
                                }))},
                   1.02);
}

void _fromEpoch(bench::Report& report, Moments moments) {
    report.compare("from epoch", Work::repeated([moments]() mutable {
                       return Koru::DateTime(moments.next().seconds);
                   }),
                   {bench::limit("localtime", Work::repeated([moments]() mutable {
                                     std::time_t const moment = moments.next().seconds;
                                     return *std::localtime(&moment);
                                 })),
                    bench::limit("its C library calls", Work::repeated([moments]() mutable {
                                     std::time_t const moment = moments.next().seconds;
                                     std::tm fields = *std::localtime(&moment);
                                     std::time_t const again = std::mktime(&fields);
                                     fields = *std::gmtime(&again);
                                     return again - std::mktime(&fields);
                                 }),
                                 1.05)});
}

/// Pairs a moment with one that is so many seconds later.
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
    Moments const moments;
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
