// The recursive polling mutex: who holds it, how often, and how long a try lasts.
#include <koru/mutex.h>

#include <doctest/doctest.h>

#include <limits.h>
#include <pthread.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include "support/cancellation.h"
#include "support/holder.h"
#include "support/sanitizers.h"
#include "support/script.h"
#include "support/subprocess.h"
#include "support/throws.h"

#if defined(KORU_THREAD_SANITIZER)
// A copy of a held mutex is held without having been locked, and a held mutex may be assigned to
// or destroyed: both are intended here, and the sanitizer would report them as mistakes. It still
// looks for data races.
extern "C" char const* __tsan_default_options();
extern "C" char const* __tsan_default_options() {
    return "report_mutex_bugs=0 report_destroy_locked=0";
}
#endif

namespace {

thread_local std::function<void(useconds_t)> inSleep; ///< called before the thread sleeps

} // namespace

// The library polls with usleep, and finds this one before the C library's.
extern "C" int usleep(useconds_t microseconds) {
    if (inSleep) inSleep(microseconds);
    timespec const time{0, static_cast<long>(microseconds) * 1000};
    return ::nanosleep(&time, nullptr);
}

namespace {

using Clock = std::chrono::steady_clock;
using Koru::Mutex;
using test::Holder;

std::string const LOCKED = "<nothing>";
std::string const GIVES_UP = "failed to obtain mutex within timeout";

/// What comes of the calling thread's attempt to lock the mutex.
std::string tried(Mutex& mutex, unsigned long tries) {
    return test::messageOf<std::runtime_error>([&] { mutex.lock(tries); });
}

/// What comes of another thread's attempt. Where it gets the mutex it unlocks it again.
std::string triedElsewhere(Mutex& mutex, unsigned long tries) {
    std::string result;
    std::thread([&] {
        result = tried(mutex, tries);
        if (result == LOCKED) mutex.unlock();
    }).join();
    return result;
}

/// What another thread is told.
bool isLocked(Mutex const& mutex) {
    bool locked = false;
    std::thread([&] { locked = mutex.isLocked(); }).join();
    return locked;
}

test::Words<Mutex> const WORDS = {
    {"lock", [](Mutex& mutex) { CHECK(tried(mutex, 1) == LOCKED); }},
    {"refused", [](Mutex& mutex) { CHECK(tried(mutex, 3) == GIVES_UP); }},
    {"untried", [](Mutex& mutex) { CHECK(tried(mutex, 0) == GIVES_UP); }},
    {"unlock", [](Mutex& mutex) { mutex.unlock(); }},
    {"unlock-elsewhere", [](Mutex& mutex) { std::thread([&] { mutex.unlock(); }).join(); }},
    // Held by the calling thread or by nobody:
    {"ask", [](Mutex& mutex) { CHECK_FALSE(mutex.isLocked()); }},
    {"held-elsewhere", [](Mutex& mutex) { CHECK(mutex.isLocked()); }},
    {"held",
     [](Mutex& mutex) {
         CHECK(isLocked(mutex));
         CHECK(triedElsewhere(mutex, 1) == GIVES_UP);
     }},
    {"free",
     [](Mutex& mutex) {
         CHECK_FALSE(isLocked(mutex));
         CHECK(triedElsewhere(mutex, 1) == LOCKED);
     }},
};

void follow(Mutex& mutex, std::string const& script) { test::follow(mutex, WORDS, script); }
void follow(std::string const& script) {
    Mutex mutex;
    follow(mutex, script);
}

/// Whether the bytes are the same.
bool areSame(Mutex const& a, Mutex const& b) { return std::memcmp(&a, &b, sizeof(Mutex)) == 0; }

/// Checks that a lock waits for another thread's while, and gets the mutex when it is let go.
template <class Lock>
void checkWaiting(Lock lock, useconds_t microseconds) {
    Mutex mutex;
    Holder holder(mutex);
    std::atomic<bool> got{false};
    std::thread waiter([&] {
        lock(mutex);
        got = true;
        mutex.unlock();
    });
    ::usleep(microseconds);
    CHECK_FALSE(got);
    holder.letGo();
    waiter.join();
    CHECK(got);
    CHECK_FALSE(isLocked(mutex));
}

} // namespace

TEST_CASE("a mutex is a POSIX mutex in size and has no virtual function") {
    CHECK(sizeof(Mutex) == sizeof(pthread_mutex_t));
    CHECK(alignof(Mutex) == alignof(pthread_mutex_t));
    CHECK(!std::is_polymorphic<Mutex>::value);
    CHECK(std::is_standard_layout<Mutex>::value);
    CHECK(std::is_default_constructible<Mutex>::value);
    CHECK(std::is_copy_constructible<Mutex>::value);
    CHECK(std::is_copy_assignable<Mutex>::value);
}

TEST_CASE("a new mutex is free") { follow("ask free"); }

TEST_CASE("one try suffices on a free mutex") { follow("lock held unlock free"); }

TEST_CASE("the thread that holds a mutex locks it again and owes as many unlocks") {
    follow("lock lock lock lock held unlock held unlock held unlock held unlock free");
}

TEST_CASE("a mutex can be locked very often by the thread that holds it") {
    Mutex mutex;
    int const TIMES = 100000;
    for (int i = 0; i < TIMES; ++i) mutex.lock(1);
    for (int i = 1; i < TIMES; ++i) mutex.unlock();
    follow(mutex, "held unlock free");
}

TEST_CASE("a mutex that was let go is free for whoever comes next, again and again") {
    Mutex mutex;
    for (int i = 0; i < 100; ++i) follow(mutex, "lock unlock free");
}

TEST_CASE("two mutexes are independent") {
    Mutex first, second;
    follow(first, "lock held");
    follow(second, "free");
    follow(first, "held unlock");
}

TEST_CASE("only one thread at a time is between lock and unlock") {
    Mutex mutex;
    int const ROUNDS = 150;
    int entered = 0;
    bool inside = false;
    bool met = false;
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&] {
            for (int round = 0; round < ROUNDS; ++round) {
                mutex.lock();
                mutex.lock(1);
                met = met || inside;
                inside = true;
                ++entered;
                inside = false;
                mutex.unlock();
                mutex.unlock();
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    CHECK(entered == 4 * ROUNDS);
    CHECK_FALSE(met);
}

TEST_CASE("a time-out of 0 gives up without a try, even on a free mutex") {
    follow("untried free");
}

TEST_CASE("a time-out of 0 gives up even for the holder, who then holds it as often as before") {
    follow("lock untried held unlock free");
}

TEST_CASE("a lock that gives up took a millisecond for every try, the last one included") {
    Mutex mutex;
    Holder const holder(mutex);
    for (unsigned long const tries : {1UL, 2UL, 7UL, 60UL}) {
        CAPTURE(tries);
        Clock::time_point const start = Clock::now();
        CHECK(tried(mutex, tries) == GIVES_UP);
        CHECK((Clock::now() - start >= std::chrono::milliseconds(tries)));
    }
}

TEST_CASE("a lock gives up after its last sleep, even where the mutex is free by then") {
    for (unsigned long const tries : {1UL, 3UL}) {
        CAPTURE(tries);
        Mutex mutex;
        Holder holder(mutex);
        std::vector<useconds_t> sleeps;
        inSleep = [&](useconds_t microseconds) {
            sleeps.push_back(microseconds);
            if (sleeps.size() == tries) holder.letGo();
        };
        std::string const result = tried(mutex, tries);
        inSleep = nullptr;
        CHECK(result == GIVES_UP);
        CHECK(sleeps == std::vector<useconds_t>(tries, 1000));
        follow(mutex, "free");
    }
}

TEST_CASE("a lock that gave up holds nothing") {
    Mutex mutex;
    Holder holder(mutex);
    follow(mutex, "refused held-elsewhere");
    holder.letGo();
    follow(mutex, "free");
}

TEST_CASE("a mutex that its holder locked twice is refused to others until the second unlock") {
    Mutex mutex;
    Holder holder(mutex, 2);
    follow(mutex, "refused");
    holder.letGo();
    follow(mutex, "lock unlock free");
}

TEST_CASE("a lock that waits gets the mutex when it is let go") {
    for (unsigned long const timeout :
         {60000UL, 0x80000000UL, 0xFFFFFFFEUL, 0xFFFFFFFFUL, ULONG_MAX}) {
        CAPTURE(timeout);
        checkWaiting([&](Mutex& mutex) { mutex.lock(timeout); }, 30000);
    }
}

TEST_CASE("without an argument lock waits as long as it takes") {
    checkWaiting([](Mutex& mutex) { mutex.lock(); }, 300000);
}

TEST_CASE("isLocked says whether another thread holds the mutex, so the holder sees false") {
    Mutex mutex;
    follow(mutex, "lock ask held unlock");
    {
        Holder const holder(mutex);
        follow(mutex, "held-elsewhere held");
    }
    follow(mutex, "ask");
}

TEST_CASE("isLocked changes nothing for the holder, for others and on a free mutex") {
    follow("ask ask ask free lock lock ask ask ask held unlock held unlock free");
}

TEST_CASE("unlock without holding does nothing") { follow("unlock free lock unlock unlock free"); }

TEST_CASE("unlock by another thread leaves the holder's lock alone") {
    follow("lock unlock-elsewhere held unlock free");
}

TEST_CASE("a copy of a free mutex is a free recursive mutex of its own") {
    Mutex mutex;
    Mutex copy(mutex);
    CHECK(areSame(copy, mutex));
    follow(copy, "lock lock held");
    follow(mutex, "free");
    follow(copy, "unlock held unlock free");
}

TEST_CASE("a copy of a held mutex is held too, by the same thread the same number of times") {
    Mutex mutex;
    follow(mutex, "lock lock");
    Mutex copy(mutex);
    CHECK(areSame(copy, mutex));
    follow(copy, "held ask");
    follow(mutex, "unlock unlock free");
    follow(copy, "held unlock held unlock free");
}

TEST_CASE("a copy of a mutex that another thread holds stays held when the original is let go") {
    Mutex mutex;
    std::unique_ptr<Mutex> copy;
    {
        Holder const holder(mutex);
        copy = std::make_unique<Mutex>(mutex);
    }
    follow(mutex, "ask free");
    follow(*copy, "held-elsewhere refused");
}

TEST_CASE("an assigned mutex takes over the other's state and returns itself") {
    Mutex held, target;
    follow(held, "lock");
    CHECK(&(target = held) == &target);
    CHECK(areSame(target, held));
    follow(target, "held");
    follow(held, "unlock");
    follow(target, "held unlock free");
}

TEST_CASE("a held mutex to which a free one is assigned is free, and still recursive") {
    Mutex const free;
    Mutex target;
    follow(target, "lock");
    target = free;
    CHECK(areSame(target, free));
    follow(target, "free lock lock held unlock held unlock free");
}

TEST_CASE("assigning a mutex to itself leaves it as held as it was") {
    Mutex mutex;
    Mutex const& itself = mutex;
    follow(mutex, "lock lock");
    CHECK(&(mutex = itself) == &mutex);
    follow(mutex, "held unlock held unlock free");
    mutex = itself;
    follow(mutex, "free");
}

TEST_CASE("a thread that is cancelled while it polls is unwound and holds nothing") {
    CHECK(test::ending([] {
              Mutex mutex;
              mutex.lock(1);
              std::atomic<bool> started{false};
              bool const cancelled = test::endsCancelled(
                  [&] {
                      started = true;
                      mutex.lock();
                  },
                  [&](pthread_t thread) {
                      while (!started) ::usleep(1000);
                      ::usleep(20000);
                      ::pthread_cancel(thread);
                  });
              if (!cancelled) return 1;
              if (!isLocked(mutex)) return 2;
              mutex.unlock();
              return triedElsewhere(mutex, 1) == LOCKED ? 0 : 3;
          }) == "exit 0");
}

TEST_CASE("locking, asking and unlocking a free mutex are not cancellation points") {
    CHECK(test::ending([] {
              Mutex mutex;
              std::atomic<bool> came{false};
              bool const cancelled = test::endsCancelled(
                  [&] {
                      ::pthread_cancel(::pthread_self());
                      mutex.lock(10);
                      bool const asked = !mutex.isLocked();
                      mutex.unlock();
                      came = asked;
                      ::pthread_testcancel();
                  },
                  [](pthread_t) {});
              return cancelled && came && triedElsewhere(mutex, 1) == LOCKED ? 0 : 1;
          }) == "exit 0");
}
