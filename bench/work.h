// Something that is done over and over, and timed.
#ifndef KORU_BENCH_WORK_H
#define KORU_BENCH_WORK_H

#include <time.h>

#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <utility>

namespace bench {

/// Makes the optimizer believe that the object is read, and any memory written.
template <class T>
void keep(T const& object) {
    asm volatile("" : : "r"(&object) : "memory");
}

/// Ends the program unless all agree: a peer that does something else measures nothing.
inline void require(bool condition, char const* what) {
    if (condition) return;
    std::fprintf(stderr, "bench: %s\n", what);
    std::exit(1);
}

/// Seconds since its construction. A stretch that is long enough to be interrupted is measured in
/// the thread's processor time, kernel included, so that other programs do not count; a short one
/// by the cheaper clock, read within the other.
class Stopwatch {
public:
    double seconds() const {
        double const passed = read(CLOCK_MONOTONIC) - start_;
        return passed < 0.0001 ? passed : read(CLOCK_THREAD_CPUTIME_ID) - processorStart_;
    }

private:
    static double read(clockid_t clock) {
        timespec time;
        ::clock_gettime(clock, &time);
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
    }

    double processorStart_ = read(CLOCK_THREAD_CPUTIME_ID);
    double start_ = read(CLOCK_MONOTONIC);
};

/// Something that can be done over and over, and timed.
class Work {
public:
    Work() = default;

    /// Work that can follow on itself: the clock is read around the whole loop.
    template <class Body>
    static Work repeated(Body body) {
        return Work([body](std::size_t count) mutable {
            Stopwatch const watch;
            for (std::size_t i = 0; i < count; ++i) keep(body());
            return watch.seconds();
        });
    }

    /// Work that needs a fresh state each time: only the body is timed, and costs a clock reading.
    template <class Prepare, class Body>
    static Work prepared(Prepare prepare, Body body) {
        return Work([prepare, body](std::size_t count) mutable {
            double total = 0;
            for (std::size_t i = 0; i < count; ++i) {
                prepare();
                Stopwatch const watch;
                keep(body());
                total += watch.seconds();
            }
            return total;
        });
    }

    /// The same work with something done before and after each series, untimed.
    template <class Before, class After>
    Work within(Before before, After after) const {
        return Work([time = time_, before, after](std::size_t count) mutable {
            before();
            double const seconds = time(count);
            after();
            return seconds;
        });
    }

    /// The seconds that this many runs took.
    double time(std::size_t count) const { return time_(count); }

    explicit operator bool() const { return static_cast<bool>(time_); }

private:
    explicit Work(std::function<double(std::size_t)> time) : time_(std::move(time)) {}

    std::function<double(std::size_t)> time_;
};

} // namespace bench

#endif
