// Timer: construction, and writing to a stream.
#include <koru/timer.h>

#include <sys/time.h>

#include <chrono>
#include <cstdio>
#include <ostream>
#include <vector>

#include "fixedbuffer.h"
#include "harness.h"

#ifdef KORU_BENCH_HAS_FMT
#include <fmt/format.h>
#endif

namespace {

using bench::Peer;
using bench::Work;
using Clock = std::chrono::steady_clock;

double _secondsSince(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

void _construct(bench::Report& report) {
    report.compare("construct", Work::repeated([] { return Koru::Timer(); }),
                   {bench::limit("gettimeofday", Work::repeated([] {
                                     timeval now;
                                     ::gettimeofday(&now, nullptr);
                                     return now;
                                 })),
                    bench::limit("steady_clock", Work::repeated([] { return Clock::now(); }))});
}

void _constructAndPrint(bench::Report& report) {
    bench::FixedBuffer<char> buffer;
    std::ostream out(&buffer);
    std::vector<Peer> peers;
#ifdef KORU_BENCH_HAS_FMT
    peers.push_back(bench::peer("steady_clock + fmt", Work::repeated([&] {
                                    Clock::time_point const start = Clock::now();
                                    buffer.rewind();
                                    char text[32];
                                    auto const end = fmt::format_to_n(text, sizeof text, "{:.3f}",
                                                                      _secondsSince(start));
                                    out.write(text, static_cast<std::streamsize>(end.size));
                                    return 0;
                                })));
#else
    peers.push_back(bench::missing("steady_clock + fmt"));
#endif
    peers.push_back(bench::peer("steady_clock + snprintf", Work::repeated([&] {
                                    Clock::time_point const start = Clock::now();
                                    buffer.rewind();
                                    char text[32];
                                    int const size = std::snprintf(text, sizeof text, "%.3f",
                                                                   _secondsSince(start));
                                    out.write(text, size);
                                    return 0;
                                })));
    report.compare("construct and print", Work::repeated([&] {
                       Koru::Timer const timer;
                       buffer.rewind();
                       out << timer;
                       return 0;
                   }),
                   peers, 1.6);
}

} // namespace

int main(int argc, char** argv) {
    bench::Report report("timers", bench::Options(argc, argv));
    _construct(report);
    _constructAndPrint(report);
}
