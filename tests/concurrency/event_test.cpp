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
#include <functional>
#include <limits>
#include <memory>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include "support/cancellation.h"
#include "support/script.h"
#include "support/sleeping.h"
#include "support/subprocess.h"

namespace {

bool clockFails = false;

/// What a thread asks of the C library's timed wait, and what that is to answer instead of waiting.
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

// These come before the C library's functions, so that tests see the deadline and make the
// wait fail.
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

using Clock = std::chrono::steady_clock;
using Koru::Event;

time_t const LAST_SECOND = std::numeric_limits<time_t>::max();

/// How the timed wait was called by a wait that it answered.
struct Answered : TimedWait {
    Answered(Event& event, unsigned long timeout, int with,
             std::function<void()> const& before = {}) {
        timedWait = TimedWait();
        timedWait.answer = with;
        timedWait.meanwhile = before;
        result = event.wait(timeout);
        static_cast<TimedWait&>(*this) = std::exchange(timedWait, TimedWait());
    }
    int result = 99;
};

/// A thread that waits for an event. It has gone to sleep there when it has been made.
class Waiter {
public:
    Waiter(Event& event, unsigned long timeout)
        : Waiter([&event, timeout] { return event.wait(timeout); }) {}
    explicit Waiter(Event& event) : Waiter([&event] { return event.wait(); }) {}
    Waiter(Waiter const&) = delete;
    Waiter& operator=(Waiter const&) = delete;
    ~Waiter() {
        if (thread_.joinable()) thread_.join();
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
              threadId_ = test::ownThreadId();
              result_ = wait();
              returned_ = true;
          }) {
        test::untilSleeping(threadId_, [this] { return returned(); });
    }

    std::atomic<long> threadId_{0};
    std::atomic<bool> returned_{false};
    int result_ = 99;
    std::thread thread_;
};

/// Whether a waiter stays that long and is then woken by a signal, with 0.
bool waitsForSignal(Event& event, Waiter& waiter, useconds_t microseconds) {
    ::usleep(microseconds);
    bool const waits = !waiter.returned();
    event.signal();
    return waits && waiter.result() == 0;
}

/// Whether signal, test, reset and a short wait still work, which all need the event's mutex.
bool usable(Event& event) {
    event.signal();
    if (!event.test()) return false;
    event.reset();
    return !event.test() && event.wait(0) == 1;
}

using AutoReset = std::true_type;
using ManualReset = std::false_type;

test::Words<Event> const WORDS = {
    {"signal", [](Event& event) { event.signal(); }},
    {"reset", [](Event& event) { event.reset(); }},
    {"raised", [](Event& event) { CHECK(event.test()); }},
    {"lowered", [](Event& event) { CHECK_FALSE(event.test()); }},
};

template <class Reset>
void follow(std::string const& script) {
    Event event(Reset::value);
    test::follow(event, WORDS, script);
}

struct Signal {
    static void run(Event& event) { event.signal(); }
};
struct Reset {
    static void run(Event& event) { event.reset(); }
};
struct Test {
    static void run(Event& event) { event.test(); }
};
struct Wait {
    static void run(Event& event) { event.wait(0); }
};

/// 0 when a thread that is cancelled in its wait is unwound and leaves the event usable.
int cancelledInWait(unsigned long timeout, bool cancelsItself) {
    Event event(true);
    std::atomic<long> threadId{0};
    std::atomic<bool> returned{false};
    bool const cancelled = test::endsCancelled(
        [&] {
            if (cancelsItself) ::pthread_cancel(::pthread_self());
            threadId = test::ownThreadId();
            event.wait(timeout);
            returned = true;
        },
        [&](pthread_t thread) {
            if (cancelsItself) return;
            test::untilSleeping(threadId, [&] { return returned.load(); });
            ::pthread_cancel(thread);
        });
    if (!cancelled || returned) return 1;
    if (!usable(event)) return 2;
    bool elsewhere = false;
    std::thread([&] { elsewhere = usable(event); }).join();
    return elsewhere ? 0 : 3;
}

} // namespace

TEST_CASE("an event is made from a choice, cannot be copied and has a virtual destructor") {
    CHECK(std::is_constructible<Event, bool>::value);
    CHECK(!std::is_copy_constructible<Event>::value);
    CHECK(!std::is_copy_assignable<Event>::value);
    CHECK(std::has_virtual_destructor<Event>::value);
}

TEST_CASE("an event holds a mutex, a condition and two flags besides its virtual table") {
    struct Members {
        void* virtualTable;
        pthread_mutex_t mutex;
        pthread_cond_t condition;
        bool autoReset, signalled;
    };
    CHECK(sizeof(Event) == sizeof(Members));
}

TEST_CASE("a derived object is destroyed through a pointer to its event") {
    struct Derived : Event {
        explicit Derived(bool& flag) : Event(true), destroyed(flag) {}
        ~Derived() override { destroyed = true; }
        bool& destroyed;
    };
    bool destroyed = false;
    std::unique_ptr<Event> event = std::make_unique<Derived>(destroyed);
    event->signal();
    CHECK(event->test());
    event.reset();
    CHECK(destroyed);
}

TEST_CASE_TEMPLATE("a new event is not signalled", Reset, AutoReset, ManualReset) {
    follow<Reset>("lowered lowered");
}

TEST_CASE("test of an auto-reset event is true once for a signal") {
    follow<AutoReset>("signal raised lowered lowered signal raised lowered lowered");
}

TEST_CASE("test of a manual-reset event is true until reset") {
    follow<ManualReset>("signal raised raised raised reset lowered lowered signal raised raised");
}

TEST_CASE("signals are not counted") {
    follow<AutoReset>("signal signal signal raised lowered");
    follow<ManualReset>("signal signal signal raised reset lowered");
}

TEST_CASE_TEMPLATE("reset takes a signal back, and may come without one", Reset, AutoReset,
                   ManualReset) {
    follow<Reset>("reset lowered signal reset reset lowered signal raised");
}

TEST_CASE("two events are independent") {
    Event first(true), second(true);
    test::follow(first, WORDS, "signal");
    test::follow(second, WORDS, "lowered");
    test::follow(first, WORDS, "raised");
}

TEST_CASE("each signal of an auto-reset event is seen by exactly one of the testing threads") {
    Event event(true);
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

TEST_CASE("a wait of 0 seconds returns 1 when nobody signals") {
    Event event(true);
    for (int i = 0; i < 10; ++i) CHECK(event.wait(0) == 1);
    CHECK(usable(event));
}

TEST_CASE("a wait counts whole seconds and returns 1 when they have passed") {
    Event event(true);
    Clock::time_point const start = Clock::now();
    CHECK(event.wait(1) == 1);
    CHECK((Clock::now() - start >= std::chrono::milliseconds(990)));
    CHECK(usable(event));
}

TEST_CASE_TEMPLATE("a signal that came before a wait does not end it, and the wait does not see "
                   "the flag",
                   Reset, AutoReset, ManualReset) {
    Event event(Reset::value);
    event.signal();
    Clock::time_point const start = Clock::now();
    CHECK(event.wait(1) == 1);
    CHECK((Clock::now() - start >= std::chrono::milliseconds(990)));
    CHECK(event.test());
    CHECK(event.test() == !Reset::value);
}

TEST_CASE_TEMPLATE("a signal ends a wait with 0 and leaves the flag raised", Reset, AutoReset,
                   ManualReset) {
    Event event(Reset::value);
    Waiter waiter(event, 600);
    CHECK_FALSE(event.test());
    CHECK(waitsForSignal(event, waiter, 0));
    CHECK(event.test());
    CHECK(event.test() == !Reset::value);
}

TEST_CASE("a wait ends with 0 even if the flag is lowered before the waiting thread runs again") {
    Event event(false);
    Waiter waiter(event, 600);
    event.signal();
    event.reset();
    CHECK(waiter.result() == 0);
    CHECK_FALSE(event.test());
}

TEST_CASE("test and reset do not end a wait") {
    Event event(true);
    event.signal();
    Waiter waiter(event, 600);
    CHECK(event.test());
    event.reset();
    CHECK(waitsForSignal(event, waiter, 100000));
}

TEST_CASE("a signal wakes one waiting thread and leaves the others waiting") {
    Event event(true);
    Waiter first(event, 600), second(event, 600), third(event, 600);
    auto const returned = [&] {
        return int(first.returned()) + int(second.returned()) + int(third.returned());
    };
    for (int signals = 1; signals <= 3; ++signals) {
        event.signal();
        while (returned() < signals) ::usleep(1000);
        ::usleep(100000);
        CHECK(returned() == signals);
    }
    for (Waiter* const waiter : {&first, &second, &third}) CHECK(waiter->result() == 0);
}

TEST_CASE("a wait without limit lasts until a signal that comes during it") {
    for (unsigned long const timeout : {0xFFFFFFFFUL, ULONG_MAX}) {
        CAPTURE(timeout);
        Event event(true);
        event.signal();
        Waiter waiter(event, timeout);
        CHECK(waitsForSignal(event, waiter, 200000));
        CHECK(event.test());
    }
}

TEST_CASE("without an argument wait has no limit") {
    Event event(true);
    Waiter waiter(event);
    CHECK(waitsForSignal(event, waiter, 200000));
}

TEST_CASE("a wait with a deadline beyond what time_t counts waits and can be signalled") {
    for (unsigned long const timeout :
         {0x7FFFFFFEUL, 0x7FFFFFFFUL, 0x80000000UL, 4294967294UL, ULONG_MAX / 2 - 1, ULONG_MAX / 2,
          ULONG_MAX / 2 + 1, ULONG_MAX - 1}) {
        CAPTURE(timeout);
        Event event(true);
        Waiter waiter(event, timeout);
        CHECK(waitsForSignal(event, waiter, 150000));
    }
}

TEST_CASE("the loop that tests before it waits misses no signal") {
    Event event(true);
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

TEST_CASE("the deadline is the present time in microseconds and the seconds of the time-out") {
    Event event(true);
    auto const now = [] {
        timeval time = {};
        ::gettimeofday(&time, nullptr);
        return time.tv_sec * 1000000LL + time.tv_usec;
    };
    for (unsigned long const timeout : {0UL, 1UL, 5UL, 3600UL, 86400UL * 365}) {
        CAPTURE(timeout);
        long long const before = now();
        Answered const seen(event, timeout, ETIMEDOUT);
        long long const after = now();
        CHECK(seen.result == 1);
        CHECK(seen.calls == 1);
        CHECK(seen.mutexHeld);
        CHECK(seen.deadline.tv_nsec % 1000 == 0);
        CHECK(seen.deadline.tv_nsec >= 0);
        CHECK(seen.deadline.tv_nsec < 1000000000);
        long long const start =
            (seen.deadline.tv_sec - static_cast<long long>(timeout)) * 1000000LL +
            seen.deadline.tv_nsec / 1000;
        CHECK(start >= before);
        CHECK(start <= after);
    }
}

TEST_CASE("a deadline that does not fit time_t becomes the last second that does") {
    Event event(true);
    auto const room = static_cast<unsigned long>(LAST_SECOND - ::time(nullptr));
    for (unsigned long const timeout :
         {room + 10, static_cast<unsigned long>(LAST_SECOND),
          static_cast<unsigned long>(LAST_SECOND) + 1, ULONG_MAX - 1}) {
        CAPTURE(timeout);
        Answered const seen(event, timeout, ETIMEDOUT);
        CHECK(seen.result == 1);
        CHECK(seen.calls == 1);
        CHECK(seen.deadline.tv_sec == LAST_SECOND);
        CHECK(seen.deadline.tv_nsec >= 0);
        CHECK(seen.deadline.tv_nsec < 1000000000);
    }
}

TEST_CASE("a wait fails where the present does not fit a timeval, as on 32 bits after 2038") {
    Event event(true);
    event.signal();
    clockFails = true;
    Answered const seen(event, 1, TimedWait::WAITS);
    clockFails = false;
    CHECK(seen.result == -1);
    CHECK(seen.calls == 0);
    CHECK(event.test()); // the event is as it was, its mutex free
}

TEST_CASE("a deadline that just fits time_t is kept") {
    Event event(true);
    auto const room = static_cast<unsigned long>(LAST_SECOND - ::time(nullptr));
    Answered const seen(event, room - 1000, ETIMEDOUT);
    CHECK(seen.result == 1);
    CHECK(seen.deadline.tv_sec <= LAST_SECOND - 900);
    CHECK(seen.deadline.tv_sec >= LAST_SECOND - 1000);
}

TEST_CASE("time-outs of more than 32 bits are neither cut nor taken as without limit" *
          doctest::skip(sizeof(unsigned long) == 4)) {
    Event event(true);
    for (unsigned long long const timeout :
         {0x100000000ULL, 0x100000005ULL, 0x1FFFFFFFFULL, 0xFFFFFFFF00000000ULL}) {
        CAPTURE(timeout);
        Answered const seen(event, static_cast<unsigned long>(timeout), ETIMEDOUT);
        CHECK(seen.result == 1);
        CHECK(seen.calls == 1);
        CHECK(static_cast<unsigned long long>(seen.deadline.tv_sec) > 0x100000000ULL);
    }
}

TEST_CASE("a wait returns 0 when woken, 1 when time ran out, -1 for every other failure") {
    std::pair<int, int> const rows[] = {{0, 0},          {ETIMEDOUT, 1},       {EINVAL, -1},
                                        {EPERM, -1},     {ENOMEM, -1},         {EINTR, -1},
                                        {EOVERFLOW, -1}, {ENOTRECOVERABLE, -1}};
    for (auto const& row : rows) {
        CAPTURE(row.first);
        Event event(true);
        event.signal();
        CHECK(Answered(event, 5, row.first).result == row.second);
        // In a child, since a mutex that stayed locked would stop it.
        REQUIRE(test::ending([&] { return event.test() && usable(event) ? 0 : 1; }) == "exit 0");
        CHECK(event.test());
    }
}

TEST_CASE_TEMPLATE("every operation takes the event's mutex", Operation, Signal, Reset, Test,
                   Wait) {
    Event event(true);
    std::atomic<bool> finished{false};
    bool early = true;
    std::thread other;
    Answered const seen(event, 5, ETIMEDOUT, [&] {
        other = std::thread([&] {
            Operation::run(event);
            finished = true;
        });
        ::usleep(50000);
        early = finished;
    });
    CHECK(seen.result == 1);
    other.join();
    CHECK_FALSE(early);
    CHECK(finished);
}

TEST_CASE("a wait without limit does not use the timed wait") {
    for (unsigned long const timeout : {0xFFFFFFFFUL, ULONG_MAX}) {
        CAPTURE(timeout);
        Event event(true);
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

TEST_CASE("a thread that is cancelled in its wait is unwound and leaves the event usable") {
    for (bool const cancelsItself : {false, true}) {
        for (unsigned long const timeout : {600UL, 4294967294UL, 0xFFFFFFFFUL, ULONG_MAX}) {
            CAPTURE(cancelsItself);
            CAPTURE(timeout);
            CHECK(test::ending([&] { return cancelledInWait(timeout, cancelsItself); }) ==
                  "exit 0");
        }
    }
}

TEST_CASE("signal, test and reset are not cancellation points") {
    CHECK(test::ending([] {
              Event event(true);
              std::atomic<bool> reached{false};
              bool const cancelled = test::endsCancelled(
                  [&] {
                      ::pthread_cancel(::pthread_self());
                      event.signal();
                      bool const seen = event.test();
                      event.reset();
                      reached = seen;
                      ::pthread_testcancel();
                  },
                  [](pthread_t) {});
              return cancelled && reached && usable(event) ? 0 : 1;
          }) == "exit 0");
}
