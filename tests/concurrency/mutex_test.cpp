// The recursive polling mutex: who holds it, how often, and how long a try lasts.
#include <koru/mutex.h>

#include <doctest/doctest.h>

#include <limits.h>
#include <pthread.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include "support/subprocess.h"
#include "support/throws.h"

#if defined(__SANITIZE_THREAD__)
// A copy of a held mutex is held without having been locked, and a held mutex may be assigned to
// or destroyed: both are intended here, and the sanitizer would report them as mistakes. It still
// looks for data races.
extern "C" char const* __tsan_default_options();
extern "C" char const* __tsan_default_options() {
    return "report_mutex_bugs=0 report_destroy_locked=0";
}
#endif

namespace {

using Clock = std::chrono::steady_clock;

std::string const GIVES_UP = "failed to obtain mutex within timeout";

/// Runs the callable on a thread of its own, to its end.
template <class Callable>
void onOtherThread(Callable callable) {
    std::thread(callable).join();
}

/// "<nothing>" if another thread can lock the mutex within so many tries (it unlocks it again),
/// else what it is told.
std::string otherThreadLocks(Koru::Mutex& mutex, unsigned long tries) {
    std::string message;
    onOtherThread([&] {
        message = test::messageOf<std::runtime_error>([&] {
            mutex.lock(tries);
            mutex.unlock();
        });
    });
    return message;
}

bool lockedForOthers(Koru::Mutex const& mutex) {
    bool locked = false;
    onOtherThread([&] { locked = mutex.isLocked(); });
    return locked;
}

/// Another thread that holds a mutex until it is told to let go, or until it is destroyed.
class Holder {
public:
    explicit Holder(Koru::Mutex& mutex, int times = 1)
        : thread_([this, &mutex, times] { hold(mutex, times); }) {
        while (!holds_) std::this_thread::yield();
    }
    Holder(Holder const&) = delete;
    Holder& operator=(Holder const&) = delete;
    ~Holder() { letGo(); }

    void letGo() {
        wanted_ = false;
        if (thread_.joinable()) thread_.join();
    }

private:
    void hold(Koru::Mutex& mutex, int times) {
        for (int i = 0; i < times; ++i) mutex.lock(1);
        holds_ = true;
        while (wanted_) ::usleep(200);
        for (int i = 0; i < times; ++i) mutex.unlock();
    }

    std::atomic<bool> holds_{false};
    std::atomic<bool> wanted_{true};
    std::thread thread_;
};

bool sameBytes(Koru::Mutex const& a, Koru::Mutex const& b) {
    return std::memcmp(&a, &b, sizeof(Koru::Mutex)) == 0;
}

} // namespace

// ========================================================================================= shape

TEST_CASE("a mutex is a POSIX mutex in size and has no virtual function") {
    CHECK(sizeof(Koru::Mutex) == sizeof(pthread_mutex_t));
    CHECK(alignof(Koru::Mutex) == alignof(pthread_mutex_t));
    CHECK(!std::is_polymorphic<Koru::Mutex>::value);
    CHECK(std::is_standard_layout<Koru::Mutex>::value);
    CHECK(std::is_default_constructible<Koru::Mutex>::value);
    CHECK(std::is_copy_constructible<Koru::Mutex>::value);
    CHECK(std::is_copy_assignable<Koru::Mutex>::value);
}

// ============================================================================= locking, recursion

TEST_CASE("a new mutex is free") {
    Koru::Mutex mutex;
    CHECK_FALSE(mutex.isLocked());
    CHECK_FALSE(lockedForOthers(mutex));
    CHECK(otherThreadLocks(mutex, 1) == "<nothing>");
}

TEST_CASE("one try suffices on a free mutex") {
    Koru::Mutex mutex;
    mutex.lock(1);
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
}

TEST_CASE("the thread that holds a mutex locks it again and owes as many unlocks") {
    Koru::Mutex mutex;
    int const TIMES = 5;
    for (int i = 0; i < TIMES; ++i) mutex.lock(1);
    for (int i = 0; i < TIMES; ++i) {
        CAPTURE(i);
        CHECK(lockedForOthers(mutex));
        CHECK(otherThreadLocks(mutex, 1) == GIVES_UP);
        mutex.unlock();
    }
    CHECK_FALSE(lockedForOthers(mutex));
    CHECK(otherThreadLocks(mutex, 1) == "<nothing>");
}

TEST_CASE("a mutex can be locked very often by the thread that holds it") {
    Koru::Mutex mutex;
    int const TIMES = 100000;
    for (int i = 0; i < TIMES; ++i) mutex.lock(1);
    for (int i = 1; i < TIMES; ++i) mutex.unlock();
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
}

TEST_CASE("a mutex that was let go is free for whoever comes next, again and again") {
    Koru::Mutex mutex;
    for (int i = 0; i < 100; ++i) {
        mutex.lock(1);
        mutex.unlock();
        CHECK(otherThreadLocks(mutex, 1) == "<nothing>");
    }
}

TEST_CASE("two mutexes are independent") {
    Koru::Mutex first;
    Koru::Mutex second;
    first.lock(1);
    CHECK(lockedForOthers(first));
    CHECK_FALSE(lockedForOthers(second));
    first.unlock();
}

TEST_CASE("only one thread at a time is between lock and unlock") {
    Koru::Mutex mutex;
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

// ====================================================================================== time-out

TEST_CASE("a time-out of 0 gives up without a try, even on a free mutex") {
    Koru::Mutex mutex;
    CHECK(test::messageOf<std::runtime_error>([&] { mutex.lock(0); }) == GIVES_UP);
    CHECK_FALSE(lockedForOthers(mutex));
    CHECK(otherThreadLocks(mutex, 0) == GIVES_UP);
}

TEST_CASE("a time-out of 0 gives up even for the holder, who then holds it as often as before") {
    Koru::Mutex mutex;
    mutex.lock(1);
    CHECK(test::messageOf<std::runtime_error>([&] { mutex.lock(0); }) == GIVES_UP);
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
}

TEST_CASE("a lock that gives up took a millisecond for every try, the last one included") {
    Koru::Mutex mutex;
    Holder const holder(mutex);
    for (unsigned long const tries : {1UL, 2UL, 7UL, 60UL}) {
        CAPTURE(tries);
        Clock::time_point const start = Clock::now();
        CHECK(test::messageOf<std::runtime_error>([&] { mutex.lock(tries); }) == GIVES_UP);
        CHECK((Clock::now() - start >= std::chrono::milliseconds(tries)));
    }
}

TEST_CASE("a lock that gave up holds nothing") {
    Koru::Mutex mutex;
    Holder holder(mutex);
    CHECK(test::messageOf<std::runtime_error>([&] { mutex.lock(3); }) == GIVES_UP);
    holder.letGo();
    CHECK_FALSE(lockedForOthers(mutex));
    CHECK(otherThreadLocks(mutex, 1) == "<nothing>");
}

TEST_CASE("a mutex that its holder locked twice is refused to others until the second unlock") {
    Koru::Mutex mutex;
    Holder holder(mutex, 2);
    CHECK(test::messageOf<std::runtime_error>([&] { mutex.lock(5); }) == GIVES_UP);
    holder.letGo();
    CHECK(test::messageOf<std::runtime_error>([&] { mutex.lock(1); }) == "<nothing>");
    mutex.unlock();
}

TEST_CASE("a lock that waits gets the mutex when it is let go") {
    for (unsigned long const timeout :
         {60000UL, 0x80000000UL, 0xFFFFFFFEUL, 0xFFFFFFFFUL, ULONG_MAX}) {
        CAPTURE(timeout);
        Koru::Mutex mutex;
        Holder holder(mutex);
        std::atomic<bool> got{false};
        std::thread waiter([&] {
            mutex.lock(timeout);
            got = true;
            mutex.unlock();
        });
        ::usleep(30000);
        CHECK_FALSE(got);
        holder.letGo();
        waiter.join();
        CHECK(got);
        CHECK_FALSE(lockedForOthers(mutex));
    }
}

TEST_CASE("without an argument lock waits as long as it takes") {
    Koru::Mutex mutex;
    Holder holder(mutex);
    std::atomic<bool> got{false};
    std::thread waiter([&] {
        mutex.lock();
        got = true;
        mutex.unlock();
    });
    ::usleep(300000);
    CHECK_FALSE(got);
    holder.letGo();
    waiter.join();
    CHECK(got);
}

// ====================================================================================== isLocked

TEST_CASE("isLocked says whether another thread holds the mutex, so the holder sees false") {
    Koru::Mutex mutex;
    mutex.lock(1);
    CHECK_FALSE(mutex.isLocked());
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    {
        Holder const holder(mutex);
        CHECK(mutex.isLocked());
        CHECK(lockedForOthers(mutex));
    }
    CHECK_FALSE(mutex.isLocked());
}

TEST_CASE("isLocked changes nothing for the holder, for others and on a free mutex") {
    Koru::Mutex mutex;
    Koru::Mutex const& asked = mutex;
    for (int i = 0; i < 10; ++i) CHECK_FALSE(asked.isLocked());
    CHECK_FALSE(lockedForOthers(mutex));
    mutex.lock(1);
    mutex.lock(1);
    for (int i = 0; i < 10; ++i) CHECK_FALSE(asked.isLocked());
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
}

// ======================================================================================== unlock

TEST_CASE("unlock without holding does nothing") {
    Koru::Mutex mutex;
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
    mutex.lock(1);
    mutex.unlock();
    mutex.unlock();
    CHECK(otherThreadLocks(mutex, 1) == "<nothing>");
}

TEST_CASE("unlock by another thread leaves the holder's lock alone") {
    Koru::Mutex mutex;
    mutex.lock(1);
    onOtherThread([&] { mutex.unlock(); });
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
}

// ============================================================================ copying, assigning

TEST_CASE("a copy of a free mutex is a free recursive mutex of its own") {
    Koru::Mutex mutex;
    Koru::Mutex copy(mutex);
    CHECK(sameBytes(copy, mutex));
    copy.lock(1);
    copy.lock(1);
    CHECK(lockedForOthers(copy));
    CHECK_FALSE(lockedForOthers(mutex));
    copy.unlock();
    CHECK(lockedForOthers(copy));
    copy.unlock();
    CHECK_FALSE(lockedForOthers(copy));
}

TEST_CASE("a copy of a held mutex is held too, by the same thread and as often") {
    Koru::Mutex mutex;
    mutex.lock(1);
    mutex.lock(1);
    Koru::Mutex copy(mutex);
    CHECK(sameBytes(copy, mutex));
    CHECK(lockedForOthers(copy));
    CHECK_FALSE(copy.isLocked());

    mutex.unlock();
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
    CHECK(lockedForOthers(copy));

    copy.unlock();
    CHECK(lockedForOthers(copy));
    CHECK(otherThreadLocks(copy, 2) == GIVES_UP);
    copy.unlock();
    CHECK_FALSE(lockedForOthers(copy));
    CHECK(otherThreadLocks(copy, 1) == "<nothing>");
}

TEST_CASE("a copy of a mutex that another thread holds stays held when the original is let go") {
    Koru::Mutex mutex;
    std::unique_ptr<Koru::Mutex> copy;
    {
        Holder const holder(mutex);
        copy.reset(new Koru::Mutex(mutex));
    }
    CHECK_FALSE(mutex.isLocked());
    CHECK(copy->isLocked());
    CHECK(test::messageOf<std::runtime_error>([&] { copy->lock(2); }) == GIVES_UP);
}

TEST_CASE("an assigned mutex takes over the other's state and returns itself") {
    Koru::Mutex held;
    held.lock(1);
    Koru::Mutex target;
    CHECK(&(target = held) == &target);
    CHECK(sameBytes(target, held));
    CHECK(lockedForOthers(target));
    held.unlock();
    CHECK(lockedForOthers(target));
    target.unlock();
    CHECK_FALSE(lockedForOthers(target));
}

TEST_CASE("a held mutex to which a free one is assigned is free, and recursive still") {
    Koru::Mutex const free;
    Koru::Mutex target;
    target.lock(1);
    target = free;
    CHECK(sameBytes(target, free));
    CHECK_FALSE(lockedForOthers(target));
    target.lock(1);
    target.lock(1);
    target.unlock();
    CHECK(lockedForOthers(target));
    target.unlock();
    CHECK_FALSE(lockedForOthers(target));
}

TEST_CASE("assigning a mutex to itself leaves it as held as it was") {
    Koru::Mutex mutex;
    Koru::Mutex const& itself = mutex;
    mutex.lock(1);
    mutex.lock(1);
    CHECK(&(mutex = itself) == &mutex);
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK(lockedForOthers(mutex));
    mutex.unlock();
    CHECK_FALSE(lockedForOthers(mutex));
    mutex = itself;
    CHECK(otherThreadLocks(mutex, 1) == "<nothing>");
}

// ================================================================================== cancellation

namespace {

/// What a thread does with a mutex, and what became of it.
struct Job {
    Koru::Mutex& mutex;
    std::atomic<bool> started{false};
    std::atomic<bool> locked{false};
    std::atomic<bool> unwound{false};

    struct Unwinds {
        Job& job;
        ~Unwinds() { job.unwound = true; }
    };
};

void* lockWithoutLimit(void* argument) {
    Job& job = *static_cast<Job*>(argument);
    Job::Unwinds const unwinds{job};
    job.started = true;
    job.mutex.lock();
    job.locked = true;
    return nullptr;
}

void* lockWhileCancelled(void* argument) {
    Job& job = *static_cast<Job*>(argument);
    Job::Unwinds const unwinds{job};
    ::pthread_cancel(::pthread_self());
    job.mutex.lock(10);
    job.locked = !job.mutex.isLocked();
    job.mutex.unlock();
    ::pthread_testcancel();
    return nullptr;
}

} // namespace

// These run in a child with an alarm, so that a thread that cannot be cancelled ends only the
// child.

TEST_CASE("a thread that is cancelled while it polls is unwound and holds nothing") {
    test::Outcome const outcome = test::inChild([] {
        ::alarm(60);
        Koru::Mutex mutex;
        mutex.lock(1);
        Job job{mutex};
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, lockWithoutLimit, &job) != 0) return 1;
        while (!job.started) ::usleep(1000);
        ::usleep(20000);
        ::pthread_cancel(thread);
        void* result = nullptr;
        ::pthread_join(thread, &result);
        if (result != PTHREAD_CANCELED) return 2;
        if (!job.unwound || job.locked) return 3;
        if (!lockedForOthers(mutex)) return 4;
        mutex.unlock();
        return otherThreadLocks(mutex, 1) == "<nothing>" ? 0 : 5;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.exitCode == 0);
}

TEST_CASE("a mutex that is free is locked, asked and unlocked without being a cancellation point") {
    test::Outcome const outcome = test::inChild([] {
        ::alarm(60);
        Koru::Mutex mutex;
        Job job{mutex};
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, lockWhileCancelled, &job) != 0) return 1;
        void* result = nullptr;
        ::pthread_join(thread, &result);
        if (result != PTHREAD_CANCELED) return 2;
        if (!job.unwound || !job.locked) return 3;
        return otherThreadLocks(mutex, 1) == "<nothing>" ? 0 : 4;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.exitCode == 0);
}
