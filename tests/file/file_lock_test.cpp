// The lock of a file: who waits for it, and what holds it.
#include <koru/file.h>

#include <fcntl.h>
#include <pthread.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <fstream>
#include <future>
#include <memory>
#include <stdexcept>
#include <type_traits>

#include <doctest/doctest.h>

#include "file/filefixture.h"
#include "support/cancellation.h"
#include "support/holder.h"
#include "support/sanitizers.h"
#include "support/sleeping.h"
#include "support/subprocess.h"

#if defined(KORU_THREAD_SANITIZER)
// A lock that is not held may be released, which the sanitizer would report as a mistake. It still
// looks for data races.
extern "C" char const* __tsan_default_options();
extern "C" char const* __tsan_default_options() { return "report_mutex_bugs=0"; }
#endif

namespace {

/// What happens to a thread's polls for a lock: nothing, an exception, or no sleep between them.
enum class Interruption { NONE, ERROR, NUMBER, HURRY };
thread_local Interruption interruption = Interruption::NONE;
std::atomic<unsigned long> hurriedPolls{0};

} // namespace

// The library polls with usleep, and finds this one before the C library's. It sleeps and can be
// cancelled like the other.
extern "C" int usleep(useconds_t microseconds) {
    if (interruption == Interruption::ERROR) throw std::runtime_error("interrupted");
    if (interruption == Interruption::NUMBER) throw 42;
    if (interruption == Interruption::HURRY) return ++hurriedPolls, 0;
    timespec const time{static_cast<time_t>(microseconds / 1000000),
                        static_cast<long>(microseconds % 1000000) * 1000};
    return ::nanosleep(&time, nullptr);
}

namespace {

using Koru::File;
using test::Contender;
using test::Holder;
using test::isFree;
using test::OnContent;
using test::OnFile;
using test::READ;

std::chrono::seconds const NO_TIME(0);
std::future_status const READY = std::future_status::ready;
std::future_status const TIMEOUT = std::future_status::timeout;

template <class Callable>
auto async(Callable callable) {
    return std::async(std::launch::async, callable);
}

/// Starts a call on another thread and returns when it waits for something there.
template <class Callable>
std::future<void> waiting(Callable callable) {
    auto const threadId = std::make_shared<std::atomic<long>>(0);
    std::future<void> result = async([threadId, callable] {
        *threadId = test::ownThreadId();
        callable();
    });
    test::untilSleeping(*threadId, [&] { return result.wait_for(NO_TIME) == READY; });
    REQUIRE(result.wait_for(NO_TIME) == TIMEOUT);
    return result;
}

/// What takes the file's lock.
struct Lock {
    static void run(File& file) { file.lock(); }
};
struct Open {
    static void run(File& file) { file.open(READ); }
};
struct Close {
    static void run(File& file) { file.close(); }
};
struct Synchronize {
    static void run(File& file) { file.synchronize(); }
};

/// A pipe in a temporary directory, which is the file's.
struct OnPipe : OnFile {
    OnPipe() { REQUIRE(::mkfifo(path.c_str(), 0600) == 0); }
};

/// Whether another thread waits for the lock until the callable has released it.
template <class Callable>
bool keepsWaiting(File& file, Callable release) {
    Contender const contender(file);
    bool const waits = contender.waits();
    release();
    return waits;
}

} // namespace

TEST_CASE("the lock keeps other threads waiting until it is released") {
    File file;
    CHECK(file.lock());
    CHECK(keepsWaiting(file, [&] { CHECK(file.unlock()); }));
    CHECK(isFree(file));
}

TEST_CASE("the lock is recursive: it is free after as many unlocks as locks") {
    File file;
    for (int i = 0; i < 3; ++i) CHECK(file.lock());
    CHECK(file.unlock());
    CHECK(file.unlock());
    CHECK(keepsWaiting(file, [&] { CHECK(file.unlock()); }));
    CHECK(isFree(file));
}

TEST_CASE("each file has a lock of its own") {
    File a, b;
    Holder const holder(a);
    CHECK(isFree(b));
    CHECK(b.lock());
    CHECK(b.unlock());
}

TEST_CASE("lock waits as long as it takes") {
    // More than half an hour's polls, without the millisecond between them.
    unsigned long const many = 2000000;
    File file;
    Holder holder(file);
    hurriedPolls = 0;
    std::future<bool> locked = async([&] {
        interruption = Interruption::HURRY;
        return file.lock() && file.unlock();
    });
    while (hurriedPolls < many && locked.wait_for(test::SHORT_WHILE) != READY) continue;
    CHECK(hurriedPolls >= many);
    CHECK(locked.wait_for(test::SHORT_WHILE) == TIMEOUT);
    holder.letGo();
    CHECK(locked.get());
}

TEST_CASE("unlock without the lock reports success and takes it from nobody") {
    File file;
    CHECK(file.unlock());
    CHECK(isFree(file));
    Holder holder(file);
    CHECK(file.unlock());
    CHECK(keepsWaiting(file, [&] { holder.letGo(); }));
    CHECK(isFree(file));
}

TEST_CASE("lock is false when anything is thrown while it waits") {
    for (Interruption const kind : {Interruption::ERROR, Interruption::NUMBER}) {
        CAPTURE(static_cast<int>(kind));
        File file;
        Holder holder(file);
        interruption = kind;
        bool const locked = file.lock();
        interruption = Interruption::NONE;
        holder.letGo();
        CHECK(!locked);
        CHECK(isFree(file));
    }
}

TEST_CASE_FIXTURE(OnContent, "open and close carry on without the lock when waiting for it is "
                             "interrupted") {
    Holder holder(file);
    interruption = Interruption::ERROR;
    file.open(READ);
    CHECK(file.is_open());
    file.synchronize();
    CHECK(file.is_open());
    file.close();
    CHECK(!file.is_open());
    interruption = Interruption::NONE;
    CHECK(keepsWaiting(file, [&] { holder.letGo(); }));
    CHECK(isFree(file));
}

TEST_CASE_TEMPLATE("open, close and synchronize wait for the lock and release it", Operation, Open,
                   Close, Synchronize) {
    OnContent on;
    if (!std::is_same<Operation, Open>::value) on.file.open(READ);
    Holder holder(on.file);
    std::future<void> done = waiting([&] { Operation::run(on.file); });
    holder.letGo();
    CHECK(done.wait_for(test::LONG_WHILE) == READY);
    done.get();
    CHECK(isFree(on.file));
}

TEST_CASE_FIXTURE(OnFile, "the thread that holds the lock can open, close and synchronize and "
                          "still holds it") {
    CHECK(file.lock());
    file.open(test::UPDATE);
    file.synchronize();
    file.close();
    CHECK(test::complaint([&] { file.open(READ | 4); }) == "<nothing>");
    file.close();
    CHECK(test::complaint([&] { file.open(0); }) == test::NOT_OPENED);
    CHECK(keepsWaiting(file, [&] { CHECK(file.unlock()); }));
    CHECK(isFree(file));
}

TEST_CASE_FIXTURE(OnPipe, "open holds the lock as long as the system takes to open the file") {
    std::future<void> opened = waiting([&] { file.open(READ); });
    CHECK(keepsWaiting(file, [&] {
        std::ofstream const writer(path); // The reader gets on when there is one.
        opened.get();
    }));
    CHECK(file.is_open());
    CHECK(isFree(file));
}

TEST_CASE_FIXTURE(OnPipe, "close holds the lock as long as writing out takes") {
    int const end = ::open(path.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
    REQUIRE(end >= 0);
    char page[4096] = {};
    while (::write(end, page, sizeof page) > 0) continue;

    file.open(test::WRITE);
    file << "one more";
    std::future<void> closed = waiting([&] { file.close(); });
    CHECK(keepsWaiting(file, [&] {
        while (::read(end, page, sizeof page) > 0 ||
               closed.wait_for(std::chrono::milliseconds(1)) != READY)
            continue;
        closed.get();
    }));
    ::close(end);
    CHECK(!file.is_open());
    CHECK(isFree(file));
}

TEST_CASE_TEMPLATE("a thread cancelled while it waits for the lock ends, and the process carries "
                   "on",
                   Operation, Lock, Open, Close, Synchronize) {
    OnContent on;
    CHECK(test::ending([&] {
              on.file.open(READ);
              on.file.lock();
              bool const cancelled = test::endsCancelled([&] { Operation::run(on.file); },
                                                         [](pthread_t thread) {
                                                             ::usleep(50000);
                                                             ::pthread_cancel(thread);
                                                         });
              if (!cancelled) return 1;
              on.file.unlock();
              return isFree(on.file) && test::contentOf(on.file) == "content" ? 0 : 2;
          }) == "exit 0");
}
