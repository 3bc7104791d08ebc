// The lock of the structured files, and the threads that use them or are cancelled in them.
#include <doctest/doctest.h>

#include <pthread.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <exception>
#include <fstream>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "support/cancellation.h"
#include "support/structuredfile.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"
#include "support/throws.h"

using test::Call;
using test::endsCancelled;
using test::FailingCall;
using test::Flat;
using test::holds;
using test::messageOf;
using test::Operation;
using test::Place;
using test::Records;
using test::Sectioned;
using test::toldByChild;

namespace {

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const READ_WRITE = READ | WRITE;

/// A file with entry 0, open for reading and writing.
template <class Family>
struct OpenFile {
    Place place;
    std::unique_ptr<typename Family::File> file;
    OpenFile() {
        place.write(Family::bytes(0, 1));
        file = std::make_unique<typename Family::File>(place.path());
        file->open(READ_WRITE);
    }
};

/// Every operation that takes the lock, on a file whose path can be opened.
template <class Family>
std::vector<Operation<typename Family::File>> allOperations() {
    using File = typename Family::File;
    std::vector<Operation<File>> result = Family::ownOperations();
    result.push_back({"open", [](File& f) { f.open(READ_WRITE); }});
    result.push_back({"close", [](File& f) { f.close(); }});
    result.push_back({"synchronize", [](File& f) { f.synchronize(); }});
    result.push_back({"close without writing", [](File& f) {
                          f.setMode(READ);
                          f.close();
                      }});
    return result;
}

/// Runs the action on an open file in a child process and says how it ended: with "free" when
/// another thread could use the file afterwards. With the lock still held a signal ends the child.
template <class Family, class Action>
std::string lockAfter(Action action) {
    return toldByChild([&] {
        OpenFile<Family> open;
        std::string text;
        try {
            action(*open.file);
        } catch (std::exception const& e) {
            text = e.what() + std::string(", ");
        }
        std::thread([&] { Family::keys(*open.file); }).join();
        open.file->exceptions(std::ios::goodbit);
        open.file->setMode(0); // the destructor has nothing to write
        return text + "free";
    });
}

/// Runs the callable in a thread whose cancellation is already asked for.
template <class Callable>
bool endsCancelledFromTheStart(Callable callable) {
    return endsCancelled(
        [&] {
            ::pthread_cancel(::pthread_self());
            callable();
            ::pthread_testcancel();
        },
        [](pthread_t) {});
}

void cancelSoon(pthread_t thread) {
    ::usleep(20000);
    ::pthread_cancel(thread);
}

} // namespace

TEST_CASE_TEMPLATE("every operation leaves the lock free", Family, Sectioned, Flat, Records) {
    for (auto const& operation : allOperations<Family>()) {
        CAPTURE(operation.label);
        CHECK(lockAfter<Family>(operation.run) == "free");
    }
}

TEST_CASE_TEMPLATE("every exception leaves the lock free", Family, Sectioned, Flat, Records) {
    using File = typename Family::File;
    CHECK(lockAfter<Family>([](File& f) {
              f.close();
              f.open(0);
          }) == "failed to open file., free");
    CHECK(lockAfter<Family>([](File& f) {
              f.close();
              FailingCall const fault(Call::READ, EIO, 0, FailingCall::FOR_EVER);
              f.open(READ);
          }) == "failed to read from file, free");
    CHECK(lockAfter<Family>([](File& f) {
              FailingCall const fault(Call::WRITE, ENOSPC, 0, FailingCall::FOR_EVER);
              f.close();
          }) == "failed to write to file, free");
    CHECK(lockAfter<Family>([](File& f) {
              FailingCall const fault(Call::WRITE, ENOSPC, 0, FailingCall::FOR_EVER);
              f.synchronize();
          }) == "failed to write to file, free");
    CHECK(lockAfter<Family>([](File& f) {
              FailingCall const fault(Call::READ, EIO, 0, FailingCall::FOR_EVER);
              f.synchronize();
          }) == "failed to read from file, free");
    CHECK(lockAfter<Family>([](File& f) {
              f.setMode(0);
              f.synchronize();
          }) == "failed to open file., free");
}

TEST_CASE_TEMPLATE("stream exceptions that a caller enabled leave the lock free", Family, Sectioned,
                   Flat, Records) {
    using File = typename Family::File;
    std::string const reading = lockAfter<Family>([](File& f) {
        f.clear();
        f.exceptions(std::ios::badbit | std::ios::failbit | std::ios::eofbit);
        f.synchronize();
    });
    CAPTURE(reading);
    CHECK(reading.size() >= 4);
    CHECK(reading.substr(reading.size() - 4) == "free");
    std::string const writing = lockAfter<Family>([](File& f) {
        f.clear();
        f.exceptions(std::ios::badbit | std::ios::failbit);
        FailingCall const fault(Call::WRITE, ENOSPC, 0, FailingCall::FOR_EVER);
        f.close();
    });
    CAPTURE(writing);
    CHECK(writing != "free");
    CHECK(writing.substr(writing.size() - 4) == "free");
}

TEST_CASE_TEMPLATE("every operation waits while another thread holds the lock", Family, Sectioned,
                   Flat, Records) {
    for (auto const& operation : allOperations<Family>()) {
        CAPTURE(operation.label);
        OpenFile<Family> const open;
        CHECK(open.file->lock());
        std::atomic<bool> done{false};
        std::thread other([&] {
            operation.run(*open.file);
            done = true;
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        CHECK(!done);
        CHECK(open.file->unlock());
        other.join();
        CHECK(done);
    }
}

TEST_CASE_TEMPLATE("every operation works for the thread that holds the lock", Family, Sectioned,
                   Flat, Records) {
    for (auto const& operation : allOperations<Family>()) {
        CAPTURE(operation.label);
        OpenFile<Family> const open;
        CHECK(open.file->lock());
        CHECK(messageOf<std::exception>([&] { operation.run(*open.file); }) == test::NOTHING);
        CHECK(open.file->unlock());
    }
}

TEST_CASE_TEMPLATE("the destructor waits while another thread holds the lock", Family, Sectioned,
                   Flat, Records) {
    OpenFile<Family> open;
    Family::set(*open.file, 0, "new");
    CHECK(open.file->lock());
    std::atomic<bool> done{false};
    auto* const file = open.file.release();
    std::thread other([&] {
        delete file;
        done = true;
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    CHECK(!done);
    CHECK(open.place.bytes() == Family::bytes(0, 1));
    file->unlock();
    other.join();
    CHECK(open.place.bytes() == Family::bytes(0, 1, "new"));
}

TEST_CASE_TEMPLATE("the lock is held across the whole read of open", Family, Sectioned, Flat,
                   Records) {
    // The pipe keeps open reading until the test has seen that the lock is taken.
    Place const place;
    REQUIRE(::mkfifo(place.path().c_str(), 0600) == 0);
    CHECK(toldByChild([&] {
              typename Family::File file(place.path());
              std::thread reader([&] { file.open(READ); });
              std::ofstream pipe(place.path()); // returns when the reader has opened it
              std::string const first = Family::bytes(0, 1);
              pipe << first << std::flush;
              std::atomic<bool> got{false};
              bool all = false;
              std::thread other([&] {
                  all = holds<Family>(file, 0, 2);
                  got = true;
              });
              ::usleep(30000);
              bool const early = got;
              pipe << Family::bytes(0, 2).substr(first.size());
              pipe.close();
              reader.join();
              other.join();
              return std::string(early ? "early" : "late") + (all ? ", all" : ", not all");
          }) == "late, all");
}

TEST_CASE_TEMPLATE("the lock is held across the whole write-back of close and synchronize", Family,
                   Sectioned, Flat, Records) {
    for (bool const synchronize : {false, true}) {
        CAPTURE(synchronize);
        CHECK(toldByChild([&] {
                  OpenFile<Family> const open;
                  test::writesWait = true;
                  std::thread writer(
                      [&] { synchronize ? open.file->synchronize() : open.file->close(); });
                  while (!test::aWriteWaits) ::usleep(1000);
                  std::atomic<bool> got{false};
                  std::size_t size = 0;
                  std::thread other([&] {
                      size = test::sizeOf<Family>(*open.file);
                      got = true;
                  });
                  ::usleep(30000);
                  bool const early = got;
                  test::writesWait = false;
                  writer.join();
                  other.join();
                  return std::string(early ? "early, " : "late, ") + std::to_string(size);
              }) == (synchronize ? "late, 1" : "late, 0"));
    }
}

TEST_CASE_TEMPLATE("edits of several threads are not lost while others synchronize", Family,
                   Sectioned, Flat, Records) {
    Place const place;
    typename Family::File file(place.path());
    file.open(READ_WRITE);
    int const count = 60;
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t) {
        threads.emplace_back([&file, t] {
            for (int i = t * count; i < (t + 1) * count; ++i) {
                Family::set(file, i, "value of " + std::to_string(i));
                Family::add(file, 1000 + i);
                Family::remove(file, 1000 + i);
            }
        });
    }
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) file.synchronize();
    });
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) Family::keys(file);
    });
    for (std::thread& thread : threads) thread.join();
    file.synchronize();
    CHECK(holds<Family>(file, 0, 3 * count, "value of " + std::to_string(3 * count - 1)));
    for (int i = 0; i < 3 * count; ++i) {
        CHECK((Family::value(file, i) == L"value of " + std::to_wstring(i)));
    }
}

TEST_CASE_TEMPLATE("the destructor completes its work in a thread that is being cancelled", Family,
                   Sectioned, Flat, Records) {
    std::string const value(300000, 'n');
    for (bool const lockIsHeld : {false, true}) {
        CAPTURE(lockIsHeld);
        Place const place;
        place.write(Family::bytes(0, 1));
        CHECK(toldByChild([&] {
                  auto* const file = new typename Family::File(place.path());
                  file->open(READ_WRITE);
                  Family::set(*file, 0, value);
                  if (lockIsHeld) file->lock();
                  std::atomic<bool> survived{false};
                  bool const cancelled = endsCancelled(
                      [&] {
                          ::pthread_cancel(::pthread_self());
                          delete file;
                          survived = true;
                          ::pthread_testcancel();
                      },
                      [&](pthread_t) {
                          ::usleep(20000);
                          if (lockIsHeld) file->unlock();
                      });
                  return std::string(survived ? "survived, " : "interrupted, ") +
                         (cancelled ? "cancelled after it" : "not cancelled");
              }) == "survived, cancelled after it");
        CHECK((place.bytes() == Family::bytes(0, 1, value)));
    }
}

TEST_CASE_TEMPLATE("a thread cancelled in an operation leaves the lock free and a whole file",
                   Family, Sectioned, Flat, Records) {
    using File = typename Family::File;
    std::string const value(300000, 'n');
    Operation<File> const operations[] = {{"close", [](File& f) { f.close(); }},
                                          {"open", [](File& f) { f.open(READ_WRITE); }},
                                          {"synchronize", [](File& f) { f.synchronize(); }}};
    for (Operation<File> const& operation : operations) {
        CAPTURE(operation.label);
        CHECK(toldByChild([&] {
                  OpenFile<Family> const open;
                  Family::set(*open.file, 0, value);
                  bool const cancelled =
                      endsCancelledFromTheStart([&] { operation.run(*open.file); });
                  test::sizeOf<Family>(*open.file); // waits for ever while the lock is held
                  std::string const bytes = open.place.bytes();
                  bool const whole =
                      bytes == Family::bytes(0, 1) || bytes == Family::bytes(0, 1, value);
                  open.file->setMode(0); // the destructor has nothing to write
                  return std::string(cancelled ? "cancelled" : "not cancelled") +
                         (whole ? ", free, whole" : ", free, damaged");
              }) == "cancelled, free, whole");
    }
}

TEST_CASE_TEMPLATE("a thread cancelled while it waits for the lock does no harm", Family, Sectioned,
                   Flat, Records) {
    CHECK(toldByChild([] {
              OpenFile<Family> const open;
              open.file->lock();
              bool const cancelled = endsCancelled([&] { Family::keys(*open.file); }, cancelSoon);
              open.file->unlock();
              bool right = false;
              std::thread([&] { right = holds<Family>(*open.file, 0, 1); }).join();
              return std::string(cancelled ? "cancelled" : "not cancelled") +
                     (right ? ", as before" : ", changed");
          }) == "cancelled, as before");
}
