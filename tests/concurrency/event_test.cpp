// The event: a flag that is polled, and a notification that is waited for.
#include <koru/event.h>

#include <doctest/doctest.h>

#include <errno.h>
#include <limits.h>
#include <pthread.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <ctime>
#include <fstream>
#include <functional>
#include <limits>
#include <memory>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include "support/subprocess.h"

namespace {

using Clock = std::chrono::steady_clock;

/// What the timed wait of the C library is asked for, and what it shall answer instead of waiting.
struct TimedWait {
    static int const WAITS = -1;
    int answer = WAITS;
    int calls = 0;
    bool mutexHeld = false;
    std::function<void()> meanwhile; ///< called before it answers, with the mutex held
    timespec deadline = {};
};
thread_local TimedWait timedWait;

} // namespace

// Stands before the C library's function, so that tests see the deadline and make the wait fail.
namespace {

bool clockFails = false;

} // namespace

extern "C" int gettimeofday(timeval* now, void* zone) noexcept {
    if (!clockFails) return static_cast<int>(::syscall(SYS_gettimeofday, now, zone));
    errno = EOVERFLOW;
    return -1;
}

extern "C" int pthread_cond_timedwait(pthread_cond_t* condition, pthread_mutex_t* mutex,
                                      timespec const* deadline) {
    ++timedWait.calls;
    timedWait.deadline = *deadline;
    timedWait.mutexHeld = ::pthread_mutex_trylock(mutex) == EBUSY;
    if (timedWait.meanwhile) timedWait.meanwhile();
    if (timedWait.answer != TimedWait::WAITS) return timedWait.answer;
    return ::pthread_cond_clockwait(condition, mutex, CLOCK_REALTIME, deadline);
}

namespace {

std::time_t const LAST_SECOND = std::numeric_limits<std::time_t>::max();

/// True if the thread sleeps in the kernel.
bool sleeps(long threadId) {
    std::ifstream in("/proc/self/task/" + std::to_string(threadId) + "/stat");
    std::string line;
    std::getline(in, line);
    std::size_t const state = line.rfind(") ");
    return state != std::string::npos && line[state + 2] == 'S';
}

/// A thread that waits for an event.
class Waiter {
public:
    Waiter(Koru::Event& event, unsigned long timeout)
        : Waiter([&event, timeout] { return event.wait(timeout); }) {}
    explicit Waiter(Koru::Event& event) : Waiter([&event] { return event.wait(); }) {}
    Waiter(Waiter const&) = delete;
    Waiter& operator=(Waiter const&) = delete;
    ~Waiter() {
        if (thread_.joinable()) thread_.join();
    }

    /// Returns when the thread has gone to sleep in its wait.
    void untilItWaits() const {
        while (threadId_ == 0) ::usleep(1000);
        for (int inARow = 0; inARow < 20 && !returned_;) {
            inARow = sleeps(threadId_) ? inARow + 1 : 0;
            ::usleep(2000);
        }
    }
    bool returned() const { return returned_; }
    int result() {
        thread_.join();
        return result_;
    }

private:
    template <class Wait>
    explicit Waiter(Wait wait)
        : thread_([this, wait] {
              threadId_ = ::syscall(SYS_gettid);
              result_ = wait();
              returned_ = true;
          }) {}

    std::atomic<long> threadId_{0};
    std::atomic<bool> returned_{false};
    int result_ = 99;
    std::thread thread_;
};

/// Whether signal, test, reset and a short wait still work, which all need the event's mutex.
bool usable(Koru::Event& event) {
    event.signal();
    if (!event.test()) return false;
    event.reset();
    return !event.test() && event.wait(0) == 1;
}

} // namespace

// ========================================================================================= shape

TEST_CASE("an event is made from a choice, cannot be copied and has a virtual destructor") {
    CHECK(std::is_constructible<Koru::Event, bool>::value);
    CHECK(!std::is_copy_constructible<Koru::Event>::value);
    CHECK(!std::is_copy_assignable<Koru::Event>::value);
    CHECK(std::has_virtual_destructor<Koru::Event>::value);
}

TEST_CASE("an event holds a mutex, a condition and two flags besides its virtual table") {
    struct Members {
        void* virtualTable;
        pthread_mutex_t mutex;
        pthread_cond_t condition;
        bool autoReset;
        bool signalled;
    };
    CHECK(sizeof(Koru::Event) == sizeof(Members));
}

TEST_CASE("a derived object is destroyed through a pointer to its event") {
    struct Derived : Koru::Event {
        explicit Derived(bool& flag) : Koru::Event(true), destroyed(flag) {}
        ~Derived() override { destroyed = true; }
        bool& destroyed;
    };
    bool destroyed = false;
    std::unique_ptr<Koru::Event> event(new Derived(destroyed));
    event->signal();
    CHECK(event->test());
    event.reset();
    CHECK(destroyed);
}

// ====================================================================================== the flag

TEST_CASE("a new event is not signalled") {
    for (bool const autoReset : {true, false}) {
        CAPTURE(autoReset);
        Koru::Event event(autoReset);
        CHECK_FALSE(event.test());
        CHECK_FALSE(event.test());
    }
}

TEST_CASE("test of an auto-reset event is true once for a signal") {
    Koru::Event event(true);
    for (int i = 0; i < 3; ++i) {
        event.signal();
        CHECK(event.test());
        CHECK_FALSE(event.test());
        CHECK_FALSE(event.test());
    }
}

TEST_CASE("test of a manual-reset event is true until reset") {
    Koru::Event event(false);
    for (int i = 0; i < 3; ++i) {
        event.signal();
        for (int again = 0; again < 5; ++again) CHECK(event.test());
        event.reset();
        CHECK_FALSE(event.test());
        CHECK_FALSE(event.test());
    }
}

TEST_CASE("signals are not counted") {
    Koru::Event autoReset(true);
    Koru::Event manualReset(false);
    for (int i = 0; i < 3; ++i) {
        autoReset.signal();
        manualReset.signal();
    }
    CHECK(autoReset.test());
    CHECK_FALSE(autoReset.test());
    CHECK(manualReset.test());
    manualReset.reset();
    CHECK_FALSE(manualReset.test());
}

TEST_CASE("reset takes a signal back, and may come without one") {
    for (bool const autoReset : {true, false}) {
        CAPTURE(autoReset);
        Koru::Event event(autoReset);
        event.reset();
        CHECK_FALSE(event.test());
        event.signal();
        event.reset();
        event.reset();
        CHECK_FALSE(event.test());
        event.signal();
        CHECK(event.test());
    }
}

TEST_CASE("two events are independent") {
    Koru::Event first(true);
    Koru::Event second(true);
    first.signal();
    CHECK_FALSE(second.test());
    CHECK(first.test());
}

TEST_CASE("each signal of an auto-reset event is seen by exactly one of the testing threads") {
    Koru::Event event(true);
    int const SIGNALS = 300;
    std::atomic<int> seen{0};
    std::atomic<bool> stop{false};
    std::vector<std::thread> threads;
    for (int i = 0; i < 3; ++i) {
        threads.emplace_back([&] {
            while (!stop) {
                if (event.test()) ++seen;
                std::this_thread::yield();
            }
        });
    }
    for (int i = 1; i <= SIGNALS; ++i) {
        event.signal();
        while (seen < i) std::this_thread::yield();
    }
    ::usleep(10000);
    stop = true;
    for (std::thread& thread : threads) thread.join();
    CHECK(seen == SIGNALS);
}

// ======================================================================================= waiting

TEST_CASE("a wait of 0 seconds returns 1 when nobody signals") {
    Koru::Event event(true);
    for (int i = 0; i < 10; ++i) CHECK(event.wait(0) == 1);
    CHECK(usable(event));
}

TEST_CASE("a wait counts whole seconds and returns 1 when they have passed") {
    Koru::Event event(true);
    Clock::time_point const start = Clock::now();
    CHECK(event.wait(1) == 1);
    CHECK((Clock::now() - start >= std::chrono::milliseconds(990)));
    CHECK(usable(event));
}

TEST_CASE("a signal that came before a wait does not end it, and the wait does not see the flag") {
    for (bool const autoReset : {true, false}) {
        CAPTURE(autoReset);
        Koru::Event event(autoReset);
        event.signal();
        Clock::time_point const start = Clock::now();
        CHECK(event.wait(1) == 1);
        CHECK((Clock::now() - start >= std::chrono::milliseconds(990)));
        CHECK(event.test());
        CHECK(event.test() == !autoReset);
    }
}

TEST_CASE("a signal ends a wait with 0 and leaves the flag raised") {
    for (bool const autoReset : {true, false}) {
        CAPTURE(autoReset);
        Koru::Event event(autoReset);
        Waiter waiter(event, 600);
        waiter.untilItWaits();
        CHECK_FALSE(waiter.returned());
        CHECK_FALSE(event.test());
        event.signal();
        CHECK(waiter.result() == 0);
        CHECK(event.test());
        CHECK(event.test() == !autoReset);
    }
}

TEST_CASE("a wait ends with 0 even if the flag is lowered before the waiting thread runs again") {
    Koru::Event event(false);
    Waiter waiter(event, 600);
    waiter.untilItWaits();
    event.signal();
    event.reset();
    CHECK(waiter.result() == 0);
    CHECK_FALSE(event.test());
}

TEST_CASE("test and reset do not end a wait") {
    Koru::Event event(true);
    event.signal();
    Waiter waiter(event, 600);
    waiter.untilItWaits();
    CHECK(event.test());
    event.reset();
    ::usleep(100000);
    CHECK_FALSE(waiter.returned());
    event.signal();
    CHECK(waiter.result() == 0);
}

TEST_CASE("a signal wakes one waiting thread and leaves the others waiting") {
    Koru::Event event(true);
    Waiter first(event, 600);
    Waiter second(event, 600);
    Waiter third(event, 600);
    first.untilItWaits();
    second.untilItWaits();
    third.untilItWaits();
    auto const returned = [&] {
        return int(first.returned()) + int(second.returned()) + int(third.returned());
    };
    for (int signals = 1; signals <= 3; ++signals) {
        event.signal();
        while (returned() < signals) ::usleep(1000);
        ::usleep(100000);
        CHECK(returned() == signals);
    }
    CHECK(first.result() == 0);
    CHECK(second.result() == 0);
    CHECK(third.result() == 0);
}

TEST_CASE("a wait without limit lasts until a signal that comes during it") {
    for (unsigned long const timeout : {0xFFFFFFFFUL, ULONG_MAX}) {
        CAPTURE(timeout);
        Koru::Event event(true);
        event.signal();
        Waiter waiter(event, timeout);
        waiter.untilItWaits();
        ::usleep(200000);
        CHECK_FALSE(waiter.returned());
        event.signal();
        CHECK(waiter.result() == 0);
        CHECK(event.test());
    }
}

TEST_CASE("without an argument wait has no limit") {
    Koru::Event event(true);
    Waiter waiter(event);
    waiter.untilItWaits();
    ::usleep(200000);
    CHECK_FALSE(waiter.returned());
    event.signal();
    CHECK(waiter.result() == 0);
}

TEST_CASE("a wait with a deadline beyond what time_t counts waits and can be signalled") {
    for (unsigned long const timeout :
         {0x7FFFFFFEUL, 0x7FFFFFFFUL, 0x80000000UL, 4294967294UL, ULONG_MAX / 2 - 1, ULONG_MAX / 2,
          ULONG_MAX / 2 + 1, ULONG_MAX - 1}) {
        CAPTURE(timeout);
        Koru::Event event(true);
        Waiter waiter(event, timeout);
        waiter.untilItWaits();
        ::usleep(150000);
        CHECK_FALSE(waiter.returned());
        event.signal();
        CHECK(waiter.result() == 0);
    }
}

TEST_CASE("the loop that tests before it waits misses no signal") {
    Koru::Event event(true);
    int const SIGNALS = 20;
    std::atomic<int> seen{0};
    std::thread consumer([&] {
        for (int i = 0; i < SIGNALS; ++i) {
            while (!event.test()) event.wait(1);
            ++seen;
        }
    });
    for (int i = 0; i < SIGNALS; ++i) {
        event.signal();
        while (seen <= i) ::usleep(500);
    }
    consumer.join();
    CHECK(seen == SIGNALS);
    CHECK_FALSE(event.test());
}

// ========================================================== the timed wait of the C library

TEST_CASE("the deadline is the present time in microseconds and the seconds of the time-out") {
    Koru::Event event(true);
    for (unsigned long const timeout : {0UL, 1UL, 5UL, 3600UL, 86400UL * 365}) {
        CAPTURE(timeout);
        timedWait = TimedWait();
        timedWait.answer = ETIMEDOUT;
        timeval before = {};
        timeval after = {};
        ::gettimeofday(&before, nullptr);
        CHECK(event.wait(timeout) == 1);
        ::gettimeofday(&after, nullptr);
        TimedWait const seen = timedWait;
        timedWait = TimedWait();
        CHECK(seen.calls == 1);
        CHECK(seen.mutexHeld);
        CHECK(seen.deadline.tv_nsec % 1000 == 0);
        auto const microseconds = [](std::time_t seconds, long rest) {
            return static_cast<long long>(seconds) * 1000000 + rest;
        };
        long long const deadline =
            microseconds(seen.deadline.tv_sec, seen.deadline.tv_nsec / 1000) -
            static_cast<long long>(timeout) * 1000000;
        CHECK(deadline >= microseconds(before.tv_sec, before.tv_usec));
        CHECK(deadline <= microseconds(after.tv_sec, after.tv_usec));
        CHECK(seen.deadline.tv_nsec >= 0);
        CHECK(seen.deadline.tv_nsec < 1000000000);
    }
}

TEST_CASE("a deadline that does not fit time_t becomes the last second that does") {
    Koru::Event event(true);
    auto const room = static_cast<unsigned long>(LAST_SECOND - ::time(nullptr));
    for (unsigned long const timeout :
         {room + 10, static_cast<unsigned long>(LAST_SECOND),
          static_cast<unsigned long>(LAST_SECOND) + 1, ULONG_MAX - 1}) {
        CAPTURE(timeout);
        timedWait = TimedWait();
        timedWait.answer = ETIMEDOUT;
        CHECK(event.wait(timeout) == 1);
        CHECK(timedWait.calls == 1);
        CHECK(timedWait.deadline.tv_sec == LAST_SECOND);
        CHECK(timedWait.deadline.tv_nsec >= 0);
        CHECK(timedWait.deadline.tv_nsec < 1000000000);
        timedWait = TimedWait();
    }
}

TEST_CASE("a wait fails where the present does not fit a timeval, as on 32 bits after 2038") {
    Koru::Event event(true);
    event.signal();
    clockFails = true;
    timedWait = TimedWait();
    int const result = event.wait(1);
    clockFails = false;
    CHECK(result == -1);
    CHECK(timedWait.calls == 0);
    CHECK(event.test()); // the event is as it was, its mutex free
}

TEST_CASE("a deadline that just fits time_t is kept") {
    Koru::Event event(true);
    auto const room = static_cast<unsigned long>(LAST_SECOND - ::time(nullptr));
    timedWait.answer = ETIMEDOUT;
    CHECK(event.wait(room - 1000) == 1);
    CHECK(timedWait.deadline.tv_sec <= LAST_SECOND - 900);
    CHECK(timedWait.deadline.tv_sec >= LAST_SECOND - 1000);
    timedWait = TimedWait();
}

TEST_CASE("time-outs of more than 32 bits are neither cut nor taken as without limit" *
          doctest::skip(sizeof(unsigned long) == 4)) {
    Koru::Event event(true);
    for (unsigned long long const timeout :
         {0x100000000ULL, 0x100000005ULL, 0x1FFFFFFFFULL, 0xFFFFFFFF00000000ULL}) {
        CAPTURE(timeout);
        timedWait = TimedWait();
        timedWait.answer = ETIMEDOUT;
        CHECK(event.wait(static_cast<unsigned long>(timeout)) == 1);
        CHECK(timedWait.calls == 1);
        CHECK(static_cast<unsigned long long>(timedWait.deadline.tv_sec) > 0x100000000ULL);
        timedWait = TimedWait();
    }
}

TEST_CASE("a wait returns 0 when woken, 1 when time ran out, -1 for every other failure") {
    struct Row {
        int answer;
        int expected;
    };
    Row const rows[] = {{0, 0},       {ETIMEDOUT, 1}, {EINVAL, -1},    {EPERM, -1},
                        {ENOMEM, -1}, {EINTR, -1},    {EOVERFLOW, -1}, {ENOTRECOVERABLE, -1}};
    for (Row const& row : rows) {
        CAPTURE(row.answer);
        Koru::Event event(true);
        event.signal();
        timedWait.answer = row.answer;
        int const result = event.wait(5);
        timedWait = TimedWait();
        CHECK(result == row.expected);
        // In a child, since a mutex that stayed locked would stop it.
        test::Outcome const outcome = test::inChild([&] {
            ::alarm(60);
            return event.test() && usable(event) ? 0 : 1;
        });
        REQUIRE(outcome.signal == 0);
        CHECK(outcome.exitCode == 0);
        CHECK(event.test());
    }
}

TEST_CASE("every operation takes the event's mutex") {
    struct Row {
        std::string label;
        void (*operation)(Koru::Event&);
    };
    Row const rows[] = {{"signal", [](Koru::Event& event) { event.signal(); }},
                        {"reset", [](Koru::Event& event) { event.reset(); }},
                        {"test", [](Koru::Event& event) { event.test(); }},
                        {"wait", [](Koru::Event& event) { event.wait(0); }}};
    for (Row const& row : rows) {
        CAPTURE(row.label);
        Koru::Event event(true);
        std::atomic<bool> finished{false};
        bool early = true;
        std::thread other;
        timedWait.answer = ETIMEDOUT;
        timedWait.meanwhile = [&] {
            other = std::thread([&] {
                row.operation(event);
                finished = true;
            });
            ::usleep(50000);
            early = finished;
        };
        CHECK(event.wait(5) == 1);
        timedWait = TimedWait();
        other.join();
        CHECK_FALSE(early);
        CHECK(finished);
    }
}

TEST_CASE("a wait without limit does not use the timed wait") {
    for (unsigned long const timeout : {0xFFFFFFFFUL, ULONG_MAX}) {
        CAPTURE(timeout);
        Koru::Event event(true);
        int calls = -1;
        std::atomic<bool> returned{false};
        std::thread thread([&] {
            event.wait(timeout);
            calls = timedWait.calls;
            returned = true;
        });
        while (!returned) {
            event.signal();
            ::usleep(1000);
        }
        thread.join();
        CHECK(calls == 0);
    }
}

// ================================================================================== cancellation

namespace {

struct Job {
    Koru::Event& event;
    unsigned long timeout;
    bool cancelsItself;
    std::atomic<long> threadId{0};
    std::atomic<bool> returned{false};
    std::atomic<bool> unwound{false};

    struct Unwinds {
        Job& job;
        ~Unwinds() { job.unwound = true; }
    };
};

void* waitForJob(void* argument) {
    Job& job = *static_cast<Job*>(argument);
    Job::Unwinds const unwinds{job};
    if (job.cancelsItself) ::pthread_cancel(::pthread_self());
    job.threadId = ::syscall(SYS_gettid);
    job.event.wait(job.timeout);
    job.returned = true;
    return nullptr;
}

/// 0 when a thread that is cancelled in its wait is unwound and leaves the event usable.
int cancelledInWait(unsigned long timeout, bool cancelsItself) {
    ::alarm(60);
    Koru::Event event(true);
    Job job{event, timeout, cancelsItself};
    pthread_t thread;
    if (::pthread_create(&thread, nullptr, waitForJob, &job) != 0) return 1;
    if (!cancelsItself) {
        while (job.threadId == 0 || !sleeps(job.threadId)) ::usleep(1000);
        ::usleep(50000);
        ::pthread_cancel(thread);
    }
    void* result = nullptr;
    ::pthread_join(thread, &result);
    if (result != PTHREAD_CANCELED) return 2;
    if (!job.unwound || job.returned) return 3;
    if (!usable(event)) return 4;
    bool elsewhere = false;
    std::thread([&] { elsewhere = usable(event); }).join();
    return elsewhere ? 0 : 5;
}

} // namespace

// In a child with an alarm: a mutex that stayed locked would stop the whole process.
TEST_CASE("a thread that is cancelled in its wait is unwound and leaves the event usable") {
    for (bool const cancelsItself : {false, true}) {
        for (unsigned long const timeout : {600UL, 4294967294UL, 0xFFFFFFFFUL, ULONG_MAX}) {
            CAPTURE(cancelsItself);
            CAPTURE(timeout);
            test::Outcome const outcome =
                test::inChild([&] { return cancelledInWait(timeout, cancelsItself); });
            CHECK(outcome.signal == 0);
            CHECK(outcome.exitCode == 0);
        }
    }
}

TEST_CASE("signal, test and reset are not cancellation points") {
    test::Outcome const outcome = test::inChild([] {
        ::alarm(60);
        struct Pass {
            Koru::Event event{true};
            std::atomic<bool> reached{false};
        } pass;
        pthread_t thread;
        auto const body = [](void* argument) -> void* {
            Pass& own = *static_cast<Pass*>(argument);
            ::pthread_cancel(::pthread_self());
            own.event.signal();
            bool const seen = own.event.test();
            own.event.reset();
            own.reached = seen;
            ::pthread_testcancel();
            return nullptr;
        };
        if (::pthread_create(&thread, nullptr, body, &pass) != 0) return 1;
        void* result = nullptr;
        ::pthread_join(thread, &result);
        if (result != PTHREAD_CANCELED) return 2;
        return pass.reached && usable(pass.event) ? 0 : 3;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.exitCode == 0);
}
