// Eight threads that do all that the library offers, for as many seconds as the argument says. Each
// operation checks its result, and the process must not grow between a tenth of the time and its
// end. Not one of the tests: proof/soak runs it.
#include <malloc.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <fstream>
#include <iostream>
#include <map>
#include <memory>
#include <mutex>
#include <shared_mutex>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <koru/datetime.h>
#include <koru/dynamiclibrary.h>
#include <koru/event.h>
#include <koru/file.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/string.h>
#include <koru/system.h>
#include <koru/thread.h>
#include <koru/timer.h>
#include <koru/uuid.h>

#include "support/choices.h"
#include "support/leftovers.h"
#include "support/structuredfile.h"
#include "support/tempdir.h"

namespace {

using Koru::File;
using test::Dice;
using test::wide;

constexpr int THREADS = 8;
constexpr long MOST_GROWTH = 256 * 1024; // bytes
constexpr unsigned long READ_WRITE = File::READ | File::WRITE;

void check(bool condition, char const* complaint) {
    if (!condition) throw std::logic_error(complaint);
}

/// What all threads use.
struct Shared {
    Koru::Mutex mutex;
    long counter = 0;
    Koru::Mutex clockMutex; ///< around what uses the C library's static storage
    Koru::Mutex hostMutex;
    test::TempDir directory;
    Koru::LogFile log{File::Path(directory / "shared.log")};
};

/// One thread's objects, and what they should hold.
struct Worker {
    Worker(Shared& all, unsigned number) : shared(all), dice(number) {}

    Shared& shared;
    Dice dice;
    test::TempDir const directory{};

    std::string value() { return dice.text(std::string("abcdefghijklmnop"), 200); }
};

/// A structured file that is changed, written back and read again.
template <class Family>
void useStructured(Worker& worker) {
    constexpr int numbers = 40;
    std::map<int, std::string> expected;
    typename Family::File file(File::Path(worker.directory / Family::label()));
    auto const checkAll = [&](char const* complaint) {
        for (int i = 0; i < numbers; ++i) {
            auto const found = expected.find(i);
            std::wstring const value = found == expected.end() ? L"" : wide(found->second);
            check(Family::value(file, i) == value, complaint);
        }
    };
    file.open(File::WRITE);
    for (int step = 0; step < 100; ++step) {
        int const number = static_cast<int>(worker.dice.below(numbers));
        if (worker.dice.oneIn(3)) {
            Family::remove(file, number);
            expected.erase(number);
        } else {
            Family::set(file, number, expected[number] = worker.value());
        }
    }
    checkAll("what was set is not held");
    file.close();
    file.clear();
    file.open(READ_WRITE);
    checkAll("what was written is not read");
    file.clear();
    file.synchronize();
    checkAll("what was synchronized is not read");
    file.setMode(0);
}

void useStream(Worker& worker) {
    std::string const path = worker.directory / "stream";
    std::string const text = worker.value() + "end";
    File file(wide(path));
    file.open(File::WRITE);
    file.write(text.data(), static_cast<std::streamsize>(text.size()));
    file.close();
    check(!file.fail() && test::readFile(path) == text, "a stream has not written all");
    std::wstring const other = wide(path + ".other");
    check(File::rename(wide(path), other) && !File::exists(wide(path)), "nothing is renamed");
    check(File::create(wide(path)) && test::readFile(path).empty(), "nothing is created");
    check(File::copy(other, wide(path)) && !test::readFile(path).empty(), "copy wrote nothing");
    check(File::remove(wide(path)) && File::remove(other), "a file is not removed");
}

void useLog(Worker& worker) {
    std::string const line = worker.value() + "\n";
    Koru::LogFile own(File::Path(worker.directory / "log"));
    own.open(worker.dice.oneIn(50) ? 2U : 3U);
    own.write(line.data(), static_cast<std::streamsize>(line.size())).flush();
    own.close();
    std::string const all = test::readFile(worker.directory / "log");
    bool const isLast =
        all.size() >= line.size() && all.compare(all.size() - line.size(), line.size(), line) == 0;
    check(isLast, "a log does not end with its last line");
    check(worker.shared.log.lock(), "a log cannot be locked");
    if (worker.dice.oneIn(100)) {
        worker.shared.log.close();
        worker.shared.log.clear();
        worker.shared.log.open(2U);
    }
    worker.shared.log.write(line.data(), static_cast<std::streamsize>(line.size())).flush();
    bool const isWritten = worker.shared.log.good();
    worker.shared.log.unlock();
    check(isWritten, "the shared log is not written");
}

void usePath(Worker& worker) {
    std::string const name = worker.value() + "n";
    File::Path const path("/a//b\\" + name);
    check(path.getDirectory() == L"/a/b/" && path.getName() == wide(name), "a path is otherwise");
    File::Path const relative("soak.ini");
    std::wstring const program = Koru::System::getProcessFileName();
    check(relative.getDirectory() == program.substr(0, program.rfind(L'/') + 1),
          "a relative path is not beside the program");
    check(File::Path("/A/B") == File::Path("/a/b"), "paths of another case differ");
}

void useDate(Worker& worker) {
    long const moment = static_cast<long>(worker.dice.below(2000000000)) + 86400;
    worker.shared.clockMutex.lock();
    Koru::DateTime const value(moment);
    long const back = value;
    std::string const text = value;
    bool const isSame = Koru::DateTime(text) == value;
    worker.shared.clockMutex.unlock();
    check(back == moment && isSame && text.size() == 19, "a date is another one");
}

void useTimer(Worker&) {
    Koru::Timer timer;
    timer.reset();
    std::ostringstream text;
    text << timer;
    check(text.str() == "0.000" || text.str() == "128.000", "a timer shows something else");
}

void useIdentifier(Worker& worker) {
    std::vector<unsigned char> bytes(16);
    for (unsigned char& byte : bytes) byte = static_cast<unsigned char>(worker.dice.below(256));
    Koru::Uuid const value(bytes);
    std::string const text = value;
    check(Koru::Uuid(text) == value && text.size() == 36, "an identifier is another one");
}

void useText(Worker& worker) {
    std::wstring const text =
        worker.dice.text(std::wstring(L"aZ\u00e9\u4e2d\U0001F600\x7FFFFFFF"), 3000);
    check(Koru::make_wstring(Koru::make_string(text)) == text, "text is converted otherwise");
    check(Koru::compare(text, text + L"a") < 0, "a text is not before a longer one");
    std::string const bytes = worker.dice.text(std::string("a\x80\xC3\xE2\xFF", 5), 3000);
    std::wstring const decoded = Koru::make_wstring(bytes);
    check(Koru::make_wstring(Koru::make_string(decoded)) == decoded, "bytes are decoded otherwise");
}

void useMutex(Worker& worker) {
    Koru::Mutex& mutex = worker.shared.mutex;
    mutex.lock();
    mutex.lock(5);
    long const before = worker.shared.counter++;
    std::this_thread::yield();
    bool const isAlone = worker.shared.counter == before + 1;
    mutex.unlock();
    mutex.unlock();
    check(isAlone, "a mutex let two in");
}

/// Lowers one event and raises another when it runs.
class Relay : public Koru::Thread {
public:
    void* run(void* argument) override {
        while (!begin.test()) begin.wait(1);
        end.signal();
        return argument;
    }

    Koru::Event begin{true};
    Koru::Event end{false};
};

void useThread(Worker& worker) {
    Relay relay;
    check(relay.start(&worker), "a thread does not start");
    relay.begin.signal();
    check(relay.join() == &worker, "a thread returns something else");
    check(relay.end.test(), "a thread has not signalled");
    relay.end.reset();
    check(!relay.end.test(), "an event is not lowered");
}

void useLibrary(Worker&) {
    Koru::DynamicLibrary library(wide(KORU_TEST_LOADABLE_1));
    check(library.load(), "a library is not loaded");
    Koru::DynamicLibrary const copy(library);
    library.unload();
    auto const number = reinterpret_cast<int (*)()>(copy.getSymbol(L"koru_loadable_number"));
    check(number != nullptr && number() == 1, "a library has another function");
    check(!Koru::DynamicLibrary(L"/none").load(), "a library that is none is loaded");
}

void useSystem(Worker& worker) {
    check(Koru::System::getType() == 0 && Koru::System::getVersion().empty(), "a constant differs");
    check(!Koru::System::getName().empty(), "the host has no name");
    std::wstring const file = wide(worker.directory / "system");
    check(Koru::System::createFile(file) && Koru::System::existsFile(file) &&
              Koru::System::deleteFile(file),
          "a file is neither made nor removed");
    if (!worker.dice.oneIn(50)) return; // may ask a name server
    worker.shared.hostMutex.lock();
    std::wstring const address = Koru::System::getIpAddress();
    std::wstring const again = Koru::System::getIpAddress();
    worker.shared.hostMutex.unlock();
    check(address == again, "the host's address changes");
}

struct Family {
    char const* name;
    void (*use)(Worker&);
    std::atomic<long> uses{0};
};

std::array<Family, 14> families = {{{"settings", useStructured<test::Sectioned>},
                                    {"properties", useStructured<test::Flat>},
                                    {"records", useStructured<test::Records>},
                                    {"files", useStream},
                                    {"logs", useLog},
                                    {"paths", usePath},
                                    {"dates", useDate},
                                    {"timers", useTimer},
                                    {"identifiers", useIdentifier},
                                    {"text", useText},
                                    {"mutexes", useMutex},
                                    {"threads and events", useThread},
                                    {"dynamic libraries", useLibrary},
                                    {"the system", useSystem}}};

std::shared_mutex running; ///< shared by the threads while they work
std::atomic<bool> pauses{false};
std::atomic<bool> ends{false};

[[noreturn]] void fail(std::string const& what) {
    std::cout << "soak: " << what << std::endl;
    std::_Exit(1); // The other threads still run.
}

void work(Worker& worker) {
    while (!ends) {
        while (pauses) std::this_thread::sleep_for(std::chrono::milliseconds(1));
        std::shared_lock<std::shared_mutex> const isRunning(running);
        Family& family = families[worker.dice.below(families.size())];
        try {
            family.use(worker);
        } catch (std::exception const& e) {
            fail(std::string(family.name) + ": " + e.what());
        }
        ++family.uses;
    }
}

/// What the process has while no thread does anything.
struct Size {
    long heap;
    long resident;
    long descriptors;
    long threads;
};

Size measure() {
    pauses = true; // Or there might always be one that runs.
    std::unique_lock<std::shared_mutex> const nobodyRuns(running);
    pauses = false;
    ::malloc_trim(0);
    long pages = 0;
    std::ifstream statm("/proc/self/statm");
    statm >> pages >> pages;
    return {static_cast<long>(test::heldBytes()), pages * ::sysconf(_SC_PAGESIZE),
            test::entriesOf("/proc/self/fd"), test::entriesOf("/proc/self/task")};
}

/// Fails unless the second is no larger than the first, but for some memory.
void compareSizes(Size const& warm, Size const& end) {
    long const heap = end.heap - warm.heap;
    long const resident = end.resident - warm.resident;
    std::cout << "growth: heap " << heap / 1024 << " KiB, resident " << resident / 1024
              << " KiB, descriptors " << end.descriptors - warm.descriptors << ", threads "
              << end.threads - warm.threads << std::endl;
    if (std::max(heap, resident) >= MOST_GROWTH) fail("the process grows");
    if (end.descriptors > warm.descriptors) fail("descriptors stay open");
    if (end.threads > warm.threads) fail("threads stay");
}

void soak(std::chrono::seconds time) {
    Shared shared;
    shared.log.open(2U);
    std::vector<std::unique_ptr<Worker>> workers;
    std::vector<std::thread> threads;
    for (unsigned i = 0; i < THREADS; ++i) workers.push_back(std::make_unique<Worker>(shared, i));
    for (auto const& worker : workers) threads.emplace_back([&worker] { work(*worker); });
    std::this_thread::sleep_for(time / 10);
    Size const warm = measure();
    std::this_thread::sleep_for(time - time / 10);
    Size const end = measure();
    ends = true;
    for (std::thread& thread : threads) thread.join();
    long total = 0;
    for (Family const& family : families) {
        std::cout << family.name << ": " << family.uses << '\n';
        if (family.uses == 0) fail("a family was not used");
        total += family.uses;
    }
    std::cout << "operations: " << total << std::endl;
    compareSizes(warm, end);
}

} // namespace

int main(int argc, char** argv) {
    long const seconds = argc == 2 ? std::atol(argv[1]) : 0;
    if (seconds < 10) {
        std::cerr << "usage: soak SECONDS, 10 or more\n";
        return 2;
    }
    ::setenv("TZ", "UTC", 1);                      // Elsewhere, some hours come twice.
    ::alarm(static_cast<unsigned>(seconds) + 300); // a lock that is left held
    try {
        soak(std::chrono::seconds(seconds));
    } catch (std::exception const& e) {
        fail(e.what());
    }
    return 0;
}
