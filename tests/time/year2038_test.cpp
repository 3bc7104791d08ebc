// What a program sees when the time no longer fits 32 bits. The clock is the test's own; like the C
// library's it fails where the present does not fit a timeval, that is on 32 bits only.
#include <doctest/doctest.h>

#include <fcntl.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <limits>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>

#include <koru/datetime.h>
#include <koru/event.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/string.h>
#include <koru/thread.h>
#include <koru/timer.h>

#include "support/skip.h"
#include "support/tempdir.h"
#include "support/throws.h"
#include "support/zone.h"

using Koru::DateTime;
using Koru::File;
using Koru::Timer;

namespace {

bool const IS_32_BIT = sizeof(std::time_t) == 4;
std::int64_t const LAST_OF_32_BITS = std::numeric_limits<std::int32_t>::max();

/// The seconds since the epoch for as long as it lives; else they are the system's.
struct Clock {
    explicit Clock(std::int64_t seconds) : now(seconds) { active = this; }
    Clock(Clock const&) = delete;
    Clock& operator=(Clock const&) = delete;
    ~Clock() { active = nullptr; }

    static inline Clock* active = nullptr;
    std::int64_t now;
    int calls = 0;
};

} // namespace

// The library under test calls this in place of the C library's.
extern "C" int gettimeofday(timeval* now, void* zone) noexcept {
    if (Clock::active == nullptr) return static_cast<int>(::syscall(SYS_gettimeofday, now, zone));
    ++Clock::active->calls;
    *now = {static_cast<std::time_t>(Clock::active->now), 0};
    if (now->tv_sec == Clock::active->now) return 0;
    errno = EOVERFLOW;
    return -1;
}

namespace {

std::string text(Timer const& timer) {
    std::ostringstream out;
    out << timer;
    return out.str();
}

/// Says of a file that it was changed in 2040. False if the system cannot.
bool isDated2040(std::string const& path) {
    struct {
        std::int64_t seconds, nanoseconds;
    } const times[2] = {{2208988800, 0}, {2208988800, 0}};
#if defined(SYS_utimensat_time64)
    long const number = SYS_utimensat_time64;
#else
    long const number = SYS_utimensat;
#endif
    if (::syscall(number, AT_FDCWD, path.c_str(), times, 0) == 0) return true;
    test::skipped("no file can have a time of 2040 here");
    return false;
}

/// A file that was changed in 2040.
struct FileOf2040 : test::Place {
    explicit FileOf2040(std::string const& bytes) {
        write(bytes);
        isThere = isDated2040(path());
    }
    std::wstring wide() const { return Koru::make_wstring(path()); }

    bool isThere = false;
};

unsigned long const READ_WRITE = File::READ | File::WRITE;

} // namespace

TEST_CASE("a timer made after 2038 starts at 0 on 32 bits and never moves") {
    Clock clock(LAST_OF_32_BITS + 1);
    Timer const timer;
    CHECK(timer.getSeconds() == (IS_32_BIT ? 0U : 2147483648U));
    clock.now += 1000;
    CHECK(text(timer) == (IS_32_BIT ? "0.000" : "1024.000"));
}

TEST_CASE("a timer made before 2038 shows a negative time after it on 32 bits") {
    Clock clock(LAST_OF_32_BITS - 127);
    Timer const timer;
    clock.now += 1152;
    CHECK(text(timer) == (IS_32_BIT ? "-2147483520.000" : "1152.000"));
}

TEST_CASE("a wait with a limit fails after 2038 on 32 bits, and the flag is as it was") {
    if (!IS_32_BIT) return; // It would wait until then.
    Clock const clock(LAST_OF_32_BITS + 1);
    Koru::Event event(true);
    event.signal();
    CHECK(event.wait(0) == -1);
    CHECK(event.test());
}

TEST_CASE("a wait without limit works after 2038") {
    Clock const clock(LAST_OF_32_BITS + 1);
    Koru::Event event(true);
    std::atomic<bool> woken{false};
    std::thread waiting([&] { woken = event.wait() == 0; });
    // A signal that comes before the wait is lost.
    std::thread signalling([&] {
        for (int i = 0; i < 1000 && !woken; ++i) {
            event.signal();
            Koru::Thread::sleep(1);
        }
    });
    waiting.join();
    signalling.join();
    CHECK(woken);
}

TEST_CASE("locks and sleep do not ask for the time") {
    Clock const clock(LAST_OF_32_BITS + 1);
    Koru::Mutex mutex;
    mutex.lock();
    std::string told;
    std::thread([&] { told = test::messageOf<std::runtime_error>([&] { mutex.lock(3); }); }).join();
    mutex.unlock();
    CHECK(told == "failed to obtain mutex within timeout");
    Koru::Thread::sleep(2);
    CHECK(clock.calls == 0);
}

TEST_CASE("dates after 2038 are read, held and written as any other") {
    DateTime date("2040-02-29 12:34:56");
    date.setYear(2999);
    date.setDay(28);
    CHECK(static_cast<std::string>(date) == "2999-02-28 12:34:56");
}

TEST_CASE("a date after 2038 has no seconds on 32 bits") {
    test::Zone const zone("UTC0");
    CHECK(static_cast<long>(DateTime("2038-01-19 03:14:07")) == 2147483647L);
    std::int64_t const next = static_cast<long>(DateTime("2038-01-19 03:14:08"));
    CHECK(next == (IS_32_BIT ? -1 : LAST_OF_32_BITS + 1));
    // -1 is what time(2) gives a 32-bit program then.
    CHECK(static_cast<std::string>(DateTime(-1L)) == "1969-12-31 23:59:59");
}

TEST_CASE("where the zone is ahead of UTC local dates end later than UTC's") {
    test::Zone const zone("CET-1");
    CHECK(static_cast<long>(DateTime("2038-01-19 04:14:07")) == 2147483647L);
    std::int64_t const next = static_cast<long>(DateTime("2038-01-19 04:14:08"));
    CHECK(next == (IS_32_BIT ? -1 : LAST_OF_32_BITS + 1));
}

TEST_CASE("a file of 2040 is opened, found, resolved, renamed and removed") {
    FileOf2040 const place("text");
    if (!place.isThere) return;
    CHECK(File::exists(place.wide()));
    File file(place.wide());
    file.open(READ_WRITE);
    std::string content;
    file >> content;
    CHECK(content == "text");
    file.close();
    // From the folder of the executable up to the root, so that all of it is resolved.
    std::string const up = "../../../../../../../../../../../../../../../..";
    CHECK(std::wstring(File::Path(up + place.path())) == place.wide());
    REQUIRE(File::rename(place.wide(), place.wide() + L"2"));
    CHECK(File::remove(place.wide() + L"2"));
}

TEST_CASE("a settings file of 2040 is read and written") {
    FileOf2040 const place("[s]\nk=1\n");
    if (!place.isThere) return;
    Koru::InitializationFile settings(place.path());
    settings.open(READ_WRITE);
    CHECK(settings.getValue(L"s", L"k") == L"1");
    settings.setValue(L"s", L"k", L"2");
    settings.close();
    CHECK(place.bytes() == "[s]\nk=2\n");
}

TEST_CASE("a log of 2040 is appended to") {
    FileOf2040 const place("one\n");
    if (!place.isThere) return;
    Koru::LogFile log(place.path());
    log.open(static_cast<unsigned int>(READ_WRITE));
    log.write("two\n", 4).flush();
    CHECK(place.bytes() == "one\ntwo\n");
}
