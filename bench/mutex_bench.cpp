// Mutex: lock and unlock without a one, free and nested.
#include <koru/mutex.h>

#include <pthread.h>

#include <condition_variable>
#include <memory>
#include <mutex>
#include <thread>

#include "harness.h"

#ifdef KORU_BENCH_HAS_POCO
#include <Poco/Mutex.h>
#endif

namespace {

using bench::Peer;
using bench::Work;

/// A second thread that sleeps: while a process has but one, the C library may take its
/// mutexes without atomic operations, and no program with one thread needs a mutex.
class Bystander {
public:
    Bystander() : thread_([this] { sleep(); }) {}

    ~Bystander() {
        {
            std::lock_guard<std::mutex> const guard(mutex_);
            done_ = true;
        }
        wake_.notify_one();
        thread_.join();
    }

    Bystander(Bystander const&) = delete;
    Bystander& operator=(Bystander const&) = delete;

private:
    void sleep() {
        std::unique_lock<std::mutex> guard(mutex_);
        wake_.wait(guard, [this] { return done_; });
    }

    std::mutex mutex_;
    std::condition_variable wake_;
    bool done_ = false;
    std::thread thread_;
};

/// A recursive mutex of the C library.
class PosixMutex {
public:
    PosixMutex() {
        pthread_mutexattr_t attributes;
        ::pthread_mutexattr_init(&attributes);
        ::pthread_mutexattr_settype(&attributes, PTHREAD_MUTEX_RECURSIVE);
        ::pthread_mutex_init(&mutex_, &attributes);
        ::pthread_mutexattr_destroy(&attributes);
    }

    ~PosixMutex() { ::pthread_mutex_destroy(&mutex_); }

    PosixMutex(PosixMutex const&) = delete;
    PosixMutex& operator=(PosixMutex const&) = delete;

    void lock() { ::pthread_mutex_lock(&mutex_); }
    void unlock() { ::pthread_mutex_unlock(&mutex_); }

private:
    pthread_mutex_t mutex_;
};

template <class Mutex>
Work _cycle() {
    auto const mutex = std::make_shared<Mutex>();
    return Work::repeated([mutex] {
        mutex->lock();
        mutex->unlock();
        return 0;
    });
}

/// The same with a lock around all of it.
template <class Mutex>
Work _nestedCycle() {
    auto const mutex = std::make_shared<Mutex>();
    auto const cycle = [mutex] {
        mutex->lock();
        mutex->unlock();
        return 0;
    };
    return Work::repeated(cycle).within([mutex] { mutex->lock(); }, [mutex] { mutex->unlock(); });
}

template <class Mutex>
Work _work(bool nested) {
    return nested ? _nestedCycle<Mutex>() : _cycle<Mutex>();
}

Peer _poco([[maybe_unused]] bool nested) {
#ifdef KORU_BENCH_HAS_POCO
    return bench::peer("POCO", _work<Poco::Mutex>(nested));
#else
    return bench::missing("POCO");
#endif
}

void _uncontended(bench::Report& report, char const* row, bool nested, double goal) {
    report.compare(row, _work<Koru::Mutex>(nested),
                   {bench::peer("std::recursive_mutex", _work<std::recursive_mutex>(nested)),
                    bench::peer("pthread, recursive", _work<PosixMutex>(nested)), _poco(nested)},
                   goal);
}

} // namespace

int main(int argc, char** argv) {
    Bystander const bystander;
    bench::Report report("mutexes", bench::Options(argc, argv));
    _uncontended(report, "lock + unlock, free", false, 1.15);
    _uncontended(report, "lock + unlock, nested", true, 1.5);
}
