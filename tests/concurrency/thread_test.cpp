// Threads. What a thread object asks of the system is watched on its way there; threads that are
// aborted run in child processes, which end when something goes wrong and say so.
#include <koru/event.h>
#include <koru/file.h>
#include <koru/mutex.h>
#include <koru/thread.h>

#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <pthread.h>
#include <signal.h>
#include <sys/select.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <iterator>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include <doctest/doctest.h>

#include "support/cancellation.h"
#include "support/script.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

namespace {

/// What the calling thread asks of the system while an object of this kind exists.
class SystemCalls {
public:
    SystemCalls() { current = this; }
    SystemCalls(SystemCalls const&) = delete;
    SystemCalls& operator=(SystemCalls const&) = delete;
    ~SystemCalls() { current = nullptr; }

    std::string sequence; ///< "create ", "cancel ", "detach ", "join " and "select "
    int createError = 0;  ///< what creating a thread fails with
    bool doesNotSleep = false;

    int attributes = 0; ///< initialised and not destroyed
    int detachState = -1;
    void* (*routine)(void*) = nullptr;
    void* parameter = nullptr;
    pthread_t handle = 0; ///< of the thread created, joined, detached or cancelled last

    std::vector<timeval> slept;
    bool sleptPlainly = true; ///< no descriptors were given

    static thread_local SystemCalls* current;
};
thread_local SystemCalls* SystemCalls::current = nullptr;

// The thread sanitizer calls what follows while it makes a thread ready to be watched.
#define NOT_WATCHED __attribute__((no_sanitize("thread")))

template <class Function>
NOT_WATCHED Function* next(char const* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

void note(char const* name, pthread_t handle) {
    SystemCalls* const calls = SystemCalls::current;
    if (calls == nullptr) return;
    calls->sequence += name;
    calls->handle = handle;
}

} // namespace

// These come before the C library's functions and pass on to them.

extern "C" NOT_WATCHED int pthread_attr_init(pthread_attr_t* attributes) noexcept {
    if (SystemCalls::current != nullptr) ++SystemCalls::current->attributes;
    return next<int(pthread_attr_t*)>("pthread_attr_init")(attributes);
}

extern "C" NOT_WATCHED int pthread_attr_destroy(pthread_attr_t* attributes) noexcept {
    if (SystemCalls::current != nullptr) --SystemCalls::current->attributes;
    return next<int(pthread_attr_t*)>("pthread_attr_destroy")(attributes);
}

extern "C" int pthread_create(pthread_t* handle, pthread_attr_t const* attributes,
                              void* (*routine)(void*), void* parameter) noexcept {
    auto* const real =
        next<int(pthread_t*, pthread_attr_t const*, void* (*)(void*), void*)>("pthread_create");
    SystemCalls* const calls = SystemCalls::current;
    if (calls == nullptr) return real(handle, attributes, routine, parameter);
    calls->detachState = PTHREAD_CREATE_JOINABLE;
    if (attributes != nullptr) ::pthread_attr_getdetachstate(attributes, &calls->detachState);
    calls->routine = routine;
    calls->parameter = parameter;
    int const result =
        calls->createError != 0 ? calls->createError : real(handle, attributes, routine, parameter);
    note("create ", *handle);
    return result;
}

extern "C" int pthread_join(pthread_t handle, void** result) {
    note("join ", handle);
    return next<int(pthread_t, void**)>("pthread_join")(handle, result);
}

extern "C" int pthread_detach(pthread_t handle) noexcept {
    note("detach ", handle);
    return next<int(pthread_t)>("pthread_detach")(handle);
}

extern "C" int pthread_cancel(pthread_t handle) {
    note("cancel ", handle);
    return next<int(pthread_t)>("pthread_cancel")(handle);
}

extern "C" int select(int count, fd_set* read, fd_set* write, fd_set* except, timeval* timeout) {
    auto* const real = next<int(int, fd_set*, fd_set*, fd_set*, timeval*)>("select");
    SystemCalls* const calls = SystemCalls::current;
    if (calls == nullptr) return real(count, read, write, except, timeout);
    calls->sequence += "select ";
    bool const plain = count == 0 && read == nullptr && write == nullptr && except == nullptr &&
                       timeout != nullptr;
    calls->sleptPlainly = calls->sleptPlainly && plain;
    if (timeout != nullptr) calls->slept.push_back(*timeout);
    if (!calls->doesNotSleep) return real(count, read, write, except, timeout);
    errno = EINTR;
    return -1;
}

namespace {

using Clock = std::chrono::steady_clock;

void* const ALL_BITS = reinterpret_cast<void*>(~std::uintptr_t{0});

/// A thread that runs a function.
class Work : public Koru::Thread {
public:
    explicit Work(std::function<void*(void*)> body) : body_(std::move(body)) {}
    void* run(void* argument) override { return body_(argument); }

private:
    std::function<void*(void*)> body_;
};

/// A thread that counts its runs and returns its argument.
class Echo : public Koru::Thread {
public:
    void* run(void* argument) override {
        ++runs;
        return argument;
    }
    std::atomic<int> runs{0};
};

void waitFor(std::atomic<bool> const& flag) {
    while (!flag) ::usleep(1000);
}

/// How many threads the process has.
int threadCount() {
    using Entries = std::filesystem::directory_iterator;
    return static_cast<int>(std::distance(Entries("/proc/self/task"), Entries()));
}

/// Waits for detached threads to be gone.
void untilThreadsAre(int count) {
    while (threadCount() > count) ::usleep(1000);
}

/// A flag that says that the scope was left.
struct Witness {
    std::atomic<bool>& left;
    ~Witness() { left = true; }
};

struct Own {};

template <class Thrown>
void throwOne() {
    if constexpr (std::is_constructible<Thrown, char const*>::value)
        throw Thrown("lost");
    else
        throw Thrown();
}

/// A thread object that scripts are about, and what it asks of the system.
struct Subject {
    SystemCalls calls;
    Echo echo;
    int value = 0;
    int other = 0;
};

void checkStart(Subject& s, int detachState) {
    s.calls.createError = 0;
    CHECK(s.echo.start(&s.value));
    CHECK(s.echo.getThreadId() == s.calls.handle);
    CHECK(s.calls.detachState == detachState);
}

test::Words<Subject> const WORDS = {
    {"start", [](Subject& s) { checkStart(s, PTHREAD_CREATE_JOINABLE); }},
    {"start-detached", [](Subject& s) { checkStart(s, PTHREAD_CREATE_DETACHED); }},
    {"start-again",
     [](Subject& s) {
         unsigned long const id = s.echo.getThreadId();
         CHECK(s.echo.start(&s.other));
         CHECK(s.echo.start(nullptr));
         CHECK(s.echo.getThreadId() == id);
     }},
    {"fail",
     [](Subject& s) {
         for (int const error : {EAGAIN, EINVAL, EPERM}) {
             s.calls.createError = error;
             CHECK(!s.echo.start(&s.other));
             CHECK(s.calls.attributes == 0);
         }
     }},
    {"join", [](Subject& s) { CHECK(s.echo.join() == &s.value); }},
    {"join-null", [](Subject& s) { CHECK(s.echo.join() == nullptr); }},
    {"detach", [](Subject& s) { s.echo.detach(); }},
    {"abort", [](Subject& s) { s.echo.abort(); }},
};

/// What a script asks of the system. Only the first start that succeeds counts.
std::string callsOf(std::string const& script) {
    int const threads = threadCount();
    Subject subject;
    test::follow(subject, WORDS, script);
    std::string const sequence = subject.calls.sequence;
    untilThreadsAre(threads);
    CHECK(subject.calls.attributes == 0);
    // An aborted one may not have come to it.
    if (script.find("abort") == std::string::npos) CHECK(subject.echo.runs == 1);
    CHECK(subject.echo.runs <= 1);
    CHECK(Koru::ThreadFunction(&subject.echo) == &subject.value); // The argument was kept.
    return sequence;
}

/// What an aborted thread does, with a flag to raise when it has begun.
using Body = std::function<void(std::atomic<bool>&)>;

/// Runs the body on a thread that is aborted a while after it has begun, in a process that ends
/// without destructors: there is no moment at which the last use by the thread is known to be over.
/// The object is static, or a sanitizer would find it lost at the end.
/// @return 0 when the thread has been unwound and is gone
int abortedAfter(unsigned int microseconds, Body const& body) {
    int const threads = threadCount();
    std::atomic<bool> begun{false};
    std::atomic<bool> left{false};
    static Work& work = *new Work([&](void*) -> void* {
        Witness const witness{left};
        body(begun);
        for (;;) ::pause(); // Only unwinding leads out.
    });
    SystemCalls calls;
    if (!work.start(nullptr)) return 1;
    waitFor(begun);
    ::usleep(microseconds);
    work.abort();
    if (work.join() != nullptr) return 2;
    work.abort();
    work.detach();
    if (calls.sequence != "create cancel detach ") return 3;
    if (calls.handle != work.getThreadId()) return 4;
    waitFor(left);
    untilThreadsAre(threads);
    return 0;
}

void checkAborted(Body const& body, unsigned int microseconds = 20000) {
    CHECK(test::ending([&] { return abortedAfter(microseconds, body); }) == "exit 0");
}

/// The same of a thread that does a step again and again.
void checkAbortedIn(std::function<void()> const& step) {
    checkAborted([&](std::atomic<bool>& begun) {
        begun = true;
        for (;;) step();
    });
}

/// A pipe in a temporary directory.
struct Pipe {
    Pipe() { REQUIRE(::mkfifo((directory / "pipe").c_str(), 0600) == 0); }
    std::wstring name() const { return directory.wide("pipe"); }
    test::TempDir const directory;
};

} // namespace

TEST_CASE("a thread object holds two thread ids, the argument and two flags") {
    struct Members {
        void* virtualTable;
        pthread_t handle;
        pthread_t threadId;
        void* argument;
        bool started;
        bool detached;
    };
    CHECK(sizeof(Koru::Thread) == sizeof(Members));
    CHECK(std::has_virtual_destructor<Koru::Thread>::value);
    CHECK(std::is_default_constructible<Koru::Thread>::value);
    CHECK(!std::is_copy_constructible<Koru::Thread>::value);
    CHECK(!std::is_copy_assignable<Koru::Thread>::value);
}

TEST_CASE("values and identifiers are those of POSIX threads") {
    Koru::Thread thread;
    CHECK(std::is_same<decltype(thread.run(nullptr)), void*>::value);
    CHECK(std::is_same<decltype(thread.join()), void*>::value);
    CHECK(std::is_same<decltype(thread.getThreadId()), pthread_t>::value);
    CHECK(std::is_same<decltype(Koru::Thread::getCurrentThreadId()), pthread_t>::value);
    CHECK(std::is_same<decltype(&Koru::ThreadFunction), void* (*)(void*)>::value);
}

TEST_CASE("the virtual functions are stop and run, after the destructor's two") {
    CHECK(test::slotOf(&Koru::Thread::stop) == 2);
    CHECK(test::slotOf(&Koru::Thread::run) == 3);
}

TEST_CASE("the base's run returns null and its stop does nothing") {
    SystemCalls calls;
    Koru::Thread thread;
    int value = 0;
    CHECK(thread.run(&value) == nullptr);
    thread.stop();
    CHECK(calls.sequence.empty());
    CHECK(thread.start(&value));
    thread.stop();
    CHECK(thread.join() == nullptr);
    CHECK(calls.sequence == "create join ");
}

TEST_CASE("start runs the derived class's run on a thread of its own, with the argument") {
    SystemCalls calls;
    unsigned long inside = 0;
    void* given = nullptr;
    int argument = 0;
    Work work([&](void* a) -> void* {
        inside = Koru::Thread::getCurrentThreadId();
        given = a;
        return nullptr;
    });
    CHECK(work.start(&argument));
    CHECK(work.getThreadId() == calls.handle);
    CHECK(work.join() == nullptr);
    CHECK(given == &argument);
    CHECK(inside == work.getThreadId());
    CHECK(inside != Koru::Thread::getCurrentThreadId());
}

TEST_CASE("the thread begins in ThreadFunction, with the object as its parameter") {
    SystemCalls calls;
    Echo echo;
    CHECK(echo.start(nullptr));
    CHECK((calls.routine == &Koru::ThreadFunction));
    CHECK(calls.parameter == static_cast<Koru::Thread*>(&echo));
    CHECK(echo.join() == nullptr);
}

TEST_CASE("an object starts one thread in its life, however often it is started") {
    CHECK(callsOf("start start-again join start-again join-null") == "create join ");
    CHECK(callsOf("start start-again detach start-again join-null") == "create detach ");
    CHECK(callsOf("start start-again abort start-again join-null") == "create cancel detach ");
}

TEST_CASE("start returns false when no thread can be created, and may be repeated") {
    CHECK(callsOf("fail join-null abort start join") == "create create create create join ");
}

TEST_CASE("many objects run at once, each with its own argument and result") {
    std::vector<std::unique_ptr<Work>> workers;
    std::vector<int> numbers(16, 0);
    std::atomic<int> running{0};
    for (int& number : numbers) {
        workers.push_back(std::make_unique<Work>([&running](void* argument) {
            ++running;
            while (running < 16) ::usleep(1000);
            ++*static_cast<int*>(argument);
            return argument;
        }));
        CHECK(workers.back()->start(&number));
    }
    for (std::size_t i = 0; i < workers.size(); ++i) CHECK(workers[i]->join() == &numbers[i]);
    CHECK(numbers == std::vector<int>(16, 1));
}

TEST_CASE("what is written before start is there for run, and what run writes after join") {
    // Without atomics or locks: the thread sanitizer would report a race.
    struct Adder : Koru::Thread {
        std::vector<int> terms;
        long sum = 0;
        void* run(void*) override {
            for (int const term : terms) sum += term;
            return &sum;
        }
    };
    Adder adder;
    for (int i = 1; i <= 1000; ++i) adder.terms.push_back(i);
    CHECK(adder.start(nullptr));
    CHECK(adder.join() == &adder.sum);
    CHECK(adder.sum == 500500);
}

TEST_CASE("join waits for the thread and returns what run returned") {
    int object = 0;
    for (void* const value : {static_cast<void*>(nullptr), static_cast<void*>(&object), ALL_BITS,
                              reinterpret_cast<void*>(std::uintptr_t{1})}) {
        CAPTURE(value);
        std::atomic<bool> done{false};
        Work work([&](void* argument) {
            ::usleep(20000);
            done = true;
            return argument;
        });
        CHECK(work.start(value));
        CHECK(work.join() == value);
        CHECK(done);
    }
}

TEST_CASE("join of a thread that was not started returns null at once and changes nothing") {
    CHECK(callsOf("join-null start join") == "create join ");
}

TEST_CASE("a second join returns null at once") {
    CHECK(callsOf("start join join-null join-null") == "create join ");
}

TEST_CASE("after join there is nothing to detach or abort") {
    CHECK(callsOf("start join detach abort") == "create join ");
}

TEST_CASE("abort does nothing to a thread that was not started, which may be started then") {
    CHECK(callsOf("abort start join") == "create join ");
}

TEST_CASE("detach after a failed start makes the next one start detached") {
    CHECK(callsOf("fail detach start-detached join-null") == "create create create create ");
}

TEST_CASE("a running thread is detached once, before its start or after, and then neither joined "
          "nor aborted") {
    for (bool const before : {true, false}) {
        CAPTURE(before);
        int const threads = threadCount();
        std::atomic<bool> go{false};
        std::atomic<bool> done{false};
        Work work([&](void* argument) {
            waitFor(go);
            done = true;
            return argument;
        });
        {
            SystemCalls calls;
            if (before) work.detach();
            CHECK(calls.sequence.empty());
            CHECK(work.start(&go));
            CHECK(calls.attributes == 0);
            CHECK(calls.detachState ==
                  (before ? PTHREAD_CREATE_DETACHED : PTHREAD_CREATE_JOINABLE));
            work.detach();
            work.detach();
            CHECK(work.join() == nullptr); // It would wait for ever.
            work.abort();
            CHECK(calls.sequence == (before ? "create " : "create detach "));
            CHECK(calls.handle == work.getThreadId());
        }
        CHECK(!done);
        go = true;
        waitFor(done);
        untilThreadsAre(threads);
    }
}

TEST_CASE("the destructor neither joins nor detaches nor cancels the thread") {
    SystemCalls calls;
    int const threads = threadCount();
    int value = 0;
    std::unique_ptr<Echo> echo(new Echo);
    CHECK(echo->start(&value));
    pthread_t const handle = echo->getThreadId();
    while (echo->runs == 0) ::usleep(1000);
    untilThreadsAre(threads);
    echo.reset();
    CHECK(calls.sequence == "create ");
    void* result = nullptr;
    CHECK(::pthread_join(handle, &result) == 0);
    CHECK(result == &value);
}

TEST_CASE("a derived object is destroyed through a pointer to its base") {
    struct Derived : Koru::Thread {
        explicit Derived(bool& flag) : destroyed(flag) {}
        ~Derived() override { destroyed = true; }
        bool& destroyed;
    };
    SystemCalls calls;
    bool destroyed = false;
    std::unique_ptr<Koru::Thread> thread(new Derived(destroyed));
    thread.reset();
    CHECK(destroyed);
    CHECK(calls.sequence.empty());
}

TEST_CASE_TEMPLATE("an exception out of run ends the thread with all bits set, and the process "
                   "carries on",
                   Thrown, std::runtime_error, std::bad_alloc, int, char const*, std::string, Own,
                   void*) {
    int const threads = threadCount();
    for (bool const detached : {false, true}) {
        CAPTURE(detached);
        std::atomic<bool> left{false};
        Work work([&](void*) -> void* {
            Witness const witness{left};
            throwOne<Thrown>();
            return nullptr;
        });
        if (detached) work.detach();
        CHECK(work.start(nullptr));
        CHECK(work.join() == (detached ? nullptr : ALL_BITS));
        waitFor(left);
        untilThreadsAre(threads);
        CHECK(work.start(nullptr));
        CHECK(work.join() == nullptr);
    }
}

TEST_CASE("a thread may end itself by pthread_exit, which unwinds it and gives its exit value") {
    int value = 0;
    std::atomic<bool> left{false};
    Work work([&](void* argument) -> void* {
        Witness const witness{left};
        ::pthread_exit(argument);
    });
    CHECK(work.start(&value));
    CHECK(work.join() == &value);
    CHECK(left);
}

TEST_CASE("ThreadFunction calls run of the object with its argument and returns the result") {
    Echo echo;
    CHECK(Koru::ThreadFunction(&echo) == nullptr); // The argument is null up to a start.
    CHECK(echo.runs == 1);
    int value = 0;
    {
        SystemCalls calls;
        calls.createError = EAGAIN;
        CHECK(!echo.start(&value));
    }
    CHECK(Koru::ThreadFunction(&echo) == &value);
    Work thrower([](void*) -> void* { throw 1; });
    CHECK(Koru::ThreadFunction(&thrower) == ALL_BITS);
    Koru::Thread plain;
    CHECK(Koru::ThreadFunction(&plain) == nullptr);
}

TEST_CASE("stop reaches the derived class's way to ask run to return") {
    struct Stoppable : Koru::Thread {
        Koru::Event asked{false};
        int rounds = 0;
        void stop() override { asked.signal(); }
        void* run(void*) override {
            while (!asked.test()) {
                ++rounds;
                Koru::Thread::sleep(1);
            }
            return this;
        }
    };
    Stoppable stoppable;
    Koru::Thread& thread = stoppable;
    CHECK(thread.start(nullptr));
    thread.stop();
    CHECK(thread.join() == &stoppable);
    CHECK(stoppable.asked.test());
}

TEST_CASE("the current thread's identifier is that of POSIX and tells threads apart") {
    CHECK(Koru::Thread::getCurrentThreadId() == ::pthread_self());
    CHECK(Koru::Thread::getCurrentThreadId() == Koru::Thread::getCurrentThreadId());
    unsigned long seen[2] = {0, 0};
    std::atomic<int> ready{0};
    auto const body = [&](void* argument) -> void* {
        *static_cast<unsigned long*>(argument) = Koru::Thread::getCurrentThreadId();
        ++ready;
        while (ready < 2) ::usleep(1000); // An identifier may be used again after its thread.
        return nullptr;
    };
    Work first(body);
    Work second(body);
    CHECK(first.start(&seen[0]));
    CHECK(second.start(&seen[1]));
    CHECK(first.join() == nullptr);
    CHECK(second.join() == nullptr);
    CHECK(seen[0] == first.getThreadId());
    CHECK(seen[1] == second.getThreadId());
    CHECK(seen[0] != seen[1]);
    CHECK(seen[0] != Koru::Thread::getCurrentThreadId());
}

TEST_CASE("sleep is one select with seconds, and with microseconds that are cut to 32 bits") {
    struct {
        unsigned int milliseconds;
        long seconds, microseconds;
    } const rows[] = {{0, 0, 0},
                      {1, 0, 1000},
                      {999, 0, 999000},
                      {1000, 1, 0},
                      {1001, 1, 1000},
                      {1500, 1, 500000},
                      {4000000, 4000, 0},
                      {4294967, 4294, 967000},   // The last one that is exact:
                      {4294968, 4294, 704},      // 4294968000 - 4294967296 microseconds.
                      {4295000, 4295, 32704},    // 4295000000 - 4294967296.
                      {86400000, 86400, 654080}, // A day: 86400000000 - 20 * 4294967296.
                      {2147483648U, 2147483, 0}, // 2147483648000 is 500 times 4294967296.
                      {4294967295U, 4294967, 966296}};
    for (auto const& row : rows) {
        CAPTURE(row.milliseconds);
        SystemCalls calls;
        calls.doesNotSleep = true;
        Koru::Thread::sleep(row.milliseconds);
        CHECK(calls.sequence == "select ");
        CHECK(calls.sleptPlainly);
        REQUIRE(calls.slept.size() == 1);
        CHECK(calls.slept[0].tv_sec == row.seconds);
        CHECK(calls.slept[0].tv_usec == row.microseconds);
    }
}

TEST_CASE("sleep divides any number of milliseconds so") {
    std::mt19937 random(4711);
    SystemCalls calls;
    calls.doesNotSleep = true;
    for (int round = 0; round < 2000; ++round) {
        std::uint32_t const milliseconds = static_cast<std::uint32_t>(random());
        Koru::Thread::sleep(milliseconds);
        std::uint64_t const product = std::uint64_t{milliseconds} * 1000 % 4294967296U;
        bool const same =
            static_cast<std::uint64_t>(calls.slept.back().tv_sec) == milliseconds / 1000 &&
            static_cast<std::uint64_t>(calls.slept.back().tv_usec) == product % 1000000;
        if (same) continue;
        CAPTURE(milliseconds);
        CHECK(same);
    }
    CHECK(calls.slept.size() == 2000);
}

TEST_CASE("sleep suspends the calling thread for the time given") {
    for (unsigned int const milliseconds : {0U, 1U, 60U}) {
        CAPTURE(milliseconds);
        Clock::time_point const before = Clock::now();
        Koru::Thread::sleep(milliseconds);
        CHECK(Clock::now() - before >= std::chrono::milliseconds(milliseconds));
    }
}

TEST_CASE("a signal ends sleep early") {
    CHECK(test::ending([] {
              // The timer below takes the place of the child's alarm.
              struct sigaction action = {};
              action.sa_handler = [](int) {};
              if (::sigaction(SIGALRM, &action, nullptr) != 0) return 1;
              // Comes again, lest the first one is over before sleep begins.
              itimerval const timer = {{0, 50000}, {0, 50000}};
              if (::setitimer(ITIMER_REAL, &timer, nullptr) != 0) return 2;
              Clock::time_point const before = Clock::now();
              Koru::Thread::sleep(300000);
              return Clock::now() - before < std::chrono::seconds(100) ? 0 : 3;
          }) == "exit 0");
}

TEST_CASE("abort cancels the thread, detaches it, and is done with it") {
    checkAborted([](std::atomic<bool>& begun) { begun = true; });
}

TEST_CASE("abort of a thread that has ended but was not joined leaves nothing of it") {
    CHECK(test::ending([] {
              int const threads = threadCount();
              std::atomic<bool> left{false};
              Work work([&](void* argument) {
                  Witness const witness{left};
                  return argument;
              });
              if (!work.start(&left)) return 1;
              waitFor(left);
              untilThreadsAre(threads);
              work.abort();
              return work.join() == nullptr ? 0 : 2;
          }) == "exit 0");
}

TEST_CASE("an aborted thread is unwound out of a pause and out of sleep") {
    checkAbortedIn([] { ::pause(); });
    checkAbortedIn([] { Koru::Thread::sleep(1000000); });
    checkAbortedIn([] { Koru::Thread::sleep(0); });
}

TEST_CASE("an aborted thread that computes is unwound at its next cancellation point") {
    unsigned volatile i = 0;
    checkAbortedIn([&] {
        i = i + 1;
        ::pthread_testcancel();
    });
}

TEST_CASE("all scopes of an aborted thread are left, those that catch everything included") {
    CHECK(test::ending([] {
              std::atomic<bool> inner{false};
              std::atomic<bool> caught{false};
              int const result = abortedAfter(0, [&](std::atomic<bool>& begun) {
                  try {
                      Witness const witness{inner};
                      begun = true;
                      for (;;) ::pause();
                  } catch (...) {
                      caught = true;
                      throw;
                  }
              });
              return inner && caught ? result : 9;
          }) == "exit 0");
}

TEST_CASE("an aborted thread is unwound out of a wait for an event, which stays usable") {
    for (unsigned long const timeout : {0xFFFFFFFFUL, 1000UL}) {
        CAPTURE(timeout);
        CHECK(test::ending([&] {
                  Koru::Event event(false);
                  int const result = abortedAfter(20000, [&](std::atomic<bool>& begun) {
                      begun = true;
                      for (;;) static_cast<void>(event.wait(timeout));
                  });
                  event.signal();
                  return event.test() ? result : 9;
              }) == "exit 0");
    }
}

TEST_CASE("an aborted thread is unwound out of waiting for a lock, of a mutex and of a file") {
    test::TempDir const directory;
    Koru::Mutex mutex;
    mutex.lock(1);
    checkAbortedIn([&] { mutex.lock(0xFFFFFFFFUL); });
    mutex.unlock();

    Koru::File file(directory.wide("file"));
    REQUIRE(file.lock());
    checkAbortedIn([&] { static_cast<void>(file.lock()); });
    checkAbortedIn([&] { file.open(Koru::File::WRITE); });
    CHECK(file.unlock());
}

TEST_CASE("a lock that an aborted thread waited for is free when its holder lets it go") {
    CHECK(test::ending([] {
              Koru::File file;
              if (!file.lock()) return 9;
              int const result = abortedAfter(20000, [&](std::atomic<bool>& begun) {
                  begun = true;
                  static_cast<void>(file.lock());
              });
              if (!file.unlock()) return 8;
              Work other(
                  [&](void* given) { return file.lock() && file.unlock() ? given : nullptr; });
              return other.start(&file) && other.join() == &file ? result : 7;
          }) == "exit 0");
}

TEST_CASE_FIXTURE(Pipe, "an aborted thread is unwound out of opening a file that makes it wait") {
    for (unsigned long const mode : {Koru::File::READ + 0, Koru::File::WRITE + 0}) {
        CAPTURE(mode);
        checkAborted([&](std::atomic<bool>& begun) {
            Koru::File pipe(name());
            begun = true;
            pipe.open(mode);
        });
    }
}

TEST_CASE_FIXTURE(Pipe, "an aborted thread is unwound out of reading and writing a pipe that makes "
                        "it wait") {
    // Both ends are held open here, so opening does not wait; nobody reads or writes.
    int const end = ::open((directory / "pipe").c_str(), O_RDWR | O_CLOEXEC);
    REQUIRE(end >= 0);
    checkAborted([&](std::atomic<bool>& begun) {
        Koru::File pipe(name());
        pipe.open(Koru::File::READ);
        begun = true;
        static_cast<void>(pipe.get());
    });
    checkAborted([&](std::atomic<bool>& begun) {
        Koru::File pipe(name());
        pipe.open(Koru::File::WRITE);
        std::string const block(4096, 'x');
        for (int written = 0; written < 16; ++written) pipe << block.c_str();
        pipe.flush();
        begun = true;
        for (;;) pipe << block.c_str() << std::flush;
    });
    ::close(end);
}

TEST_CASE("a thread may be aborted anywhere in opening, writing and closing files") {
    test::TempDir const directory;
    auto const body = [&](std::atomic<bool>& begun) {
        for (;;) {
            Koru::File file(directory.wide("file"));
            file.open(Koru::File::READ | Koru::File::WRITE);
            file << "some text" << std::flush;
            begun = true;
            if (file.lock()) static_cast<void>(file.unlock());
            file.close();
            Koru::File left(directory.wide("left"));
            left.open(Koru::File::WRITE);
            left << "more text";
        }
    };
    for (unsigned int round = 0; round < 12; ++round) {
        CAPTURE(round);
        checkAborted(body, round * 300);
    }
}

TEST_CASE("cancellation passes through ThreadFunction on a thread of another's making") {
    CHECK(test::ending([] {
              std::atomic<bool> begun{false};
              std::atomic<bool> left{false};
              Work work([&](void*) -> void* {
                  Witness const witness{left};
                  begun = true;
                  for (;;) ::pause();
              });
              bool const cancelled =
                  test::endsCancelled([&] { static_cast<void>(Koru::ThreadFunction(&work)); },
                                      [&](pthread_t thread) {
                                          waitFor(begun);
                                          ::pthread_cancel(thread);
                                      });
              return cancelled && left ? 0 : 1;
          }) == "exit 0");
}
