// The lock of the structured files, and the threads that use them or are cancelled in them.
#include <doctest/doctest.h>

#include <pthread.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <exception>
#include <fstream>
#include <memory>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include "structured/fixture.h"
#include "support/cancellation.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"

using namespace structured;

namespace {

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
        OwnFile<Family> file(one<Family>(), READ_WRITE);
        std::string text;
        try {
            action(file);
        } catch (std::exception const& e) {
            text = e.what() + std::string(", ");
        }
        std::thread([&] { Family::keys(file); }).join();
        file.exceptions(std::ios::goodbit);
        file.setMode(0); // the destructor has nothing to write
        return text + "free";
    });
}

/// A step on a thread of its own.
class OtherThread {
public:
    template <class Step>
    explicit OtherThread(Step step)
        : thread_([this, step] {
              step();
              done_ = true;
          }) {}

    /// Whether the step is kept waiting.
    bool waits() const {
        ::usleep(20000);
        return !done_;
    }
    void join() { thread_.join(); }

private:
    std::atomic<bool> done_{false};
    std::thread thread_;
};

/// Runs a step in a thread whose cancellation was asked for before it.
template <class Step, class Meanwhile>
bool cancelledIn(Step step, Meanwhile meanwhile) {
    return endsCancelled(
        [&] {
            ::pthread_cancel(::pthread_self());
            step();
            ::pthread_testcancel();
        },
        [&](pthread_t) { meanwhile(); });
}

} // namespace

FAMILIES_TEST_CASE("every operation leaves the lock free") {
    for (auto const& operation : allOperations<Family>()) {
        CAPTURE(operation.label);
        CHECK(lockAfter<Family>(operation.run) == "free");
    }
}

FAMILIES_TEST_CASE("every exception leaves the lock free") {
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

FAMILIES_TEST_CASE("stream exceptions that a caller enabled leave the lock free") {
    using File = typename Family::File;
    for (bool const fails : {false, true}) {
        std::string const result = lockAfter<Family>([fails](File& f) {
            f.clear();
            std::ios::iostate const end = fails ? std::ios::goodbit : std::ios::eofbit;
            f.exceptions(std::ios::badbit | std::ios::failbit | end);
            FailingCall const fault(Call::WRITE, ENOSPC, fails ? 0 : -1, FailingCall::FOR_EVER);
            fails ? f.close() : f.synchronize();
        });
        CAPTURE(result);
        CHECK(result.size() > 4);
        CHECK(result.substr(result.size() - 4) == "free");
    }
}

FAMILIES_TEST_CASE("every operation waits while another thread holds the lock") {
    for (auto const& operation : allOperations<Family>()) {
        CAPTURE(operation.label);
        OwnFile<Family> file(one<Family>(), READ_WRITE);
        CHECK(file.lock());
        OtherThread other([&] { operation.run(file); });
        CHECK(other.waits());
        CHECK(file.unlock());
        other.join();
    }
}

FAMILIES_TEST_CASE("every operation works for the thread that holds the lock") {
    for (auto const& operation : allOperations<Family>()) {
        CAPTURE(operation.label);
        OwnFile<Family> file(one<Family>(), READ_WRITE);
        CHECK(file.lock());
        CHECK(messageOf<std::exception>([&] { operation.run(file); }) == NOTHING);
        CHECK(file.unlock());
    }
}

FAMILIES_TEST_CASE("the destructor waits while another thread holds the lock") {
    Place const place;
    auto* const file = new typename Family::File(place.path());
    file->open(WRITE);
    Family::set(*file, 0);
    CHECK(file->lock());
    OtherThread other([file] { delete file; });
    CHECK(other.waits());
    CHECK(place.bytes() == "");
    file->unlock();
    other.join();
    CHECK(place.bytes() == one<Family>());
}

FAMILIES_TEST_CASE("the lock is held across the whole read of open") {
    // The pipe keeps open reading until the test has seen that the lock is taken.
    CHECK(toldByChild([&] {
              OwnFile<Family> file;
              if (::mkfifo(file.place.path().c_str(), 0600) != 0) return "no pipe";
              OtherThread reader([&] { file.open(READ); });
              std::ofstream pipe(file.place.path()); // returns when the reader has opened it
              pipe << one<Family>() << std::flush;
              bool all = false;
              OtherThread other([&] { all = file.has(2); });
              bool const late = other.waits();
              pipe << Family::bytes(0, 2).substr(one<Family>().size());
              pipe.close();
              reader.join();
              other.join();
              return late && all ? "it waits for all" : "it does not wait";
          }) == "it waits for all");
}

FAMILIES_TEST_CASE("the lock is held across the whole write-back of close and synchronize") {
    for (bool const synchronize : {false, true}) {
        CAPTURE(synchronize);
        CHECK(toldByChild([&] {
                  OwnFile<Family> file(one<Family>(), READ_WRITE);
                  writesWait = true;
                  OtherThread writer([&] { synchronize ? file.synchronize() : file.close(); });
                  while (!aWriteWaits) ::usleep(1000);
                  std::size_t count = 9;
                  OtherThread other([&] { count = file.count(); });
                  bool const late = other.waits();
                  writesWait = false;
                  writer.join();
                  other.join();
                  return (late ? "late, " : "early, ") + std::to_string(count);
              }) == (synchronize ? "late, 1" : "late, 0"));
    }
}

namespace {

/// A structured file that sees, when it is opened, whether another thread has to wait for the lock.
template <class File>
class Watcher : public File {
public:
    explicit Watcher(std::string const& path) : File(Koru::File::Path(path)) {}
    void open(unsigned long mode) override {
        other_ = std::make_unique<OtherThread>([this] { this->lock() && this->unlock(); });
        isHeld_ = other_->waits();
        File::open(mode);
    }
    bool wasHeld() {
        other_->join();
        return isHeld_;
    }

private:
    std::unique_ptr<OtherThread> other_;
    bool isHeld_ = false;
};

} // namespace

FAMILIES_TEST_CASE("the lock is held between the close and the open of synchronize") {
    Place const place;
    using File = typename Family::File;
    Watcher<File> file(place.path());
    file.File::open(READ_WRITE);
    file.synchronize();
    CHECK(file.wasHeld());
}

FAMILIES_TEST_CASE("edits of several threads are not lost while others synchronize") {
    OwnFile<Family> file("", READ_WRITE);
    int const count = 60;
    std::vector<std::thread> threads;
    for (int first = 0; first < 3 * count; first += count) {
        threads.emplace_back([&file, first] {
            for (int i = first; i < first + count; ++i) {
                file.put(i, "value of " + std::to_string(i));
                file.put(1000 + i);
                file.drop(1000 + i);
            }
        });
    }
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) file.synchronize();
    });
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) {
            // A record must not go while its key is looked at.
            file.lock();
            file.count();
            file.unlock();
        }
    });
    for (std::thread& thread : threads) thread.join();
    file.synchronize();
    CHECK(file.has(3 * count, "value of 179"));
    for (int i = 0; i < 3 * count; ++i) {
        CHECK((Family::value(file, i) == L"value of " + std::to_wstring(i)));
    }
    // Settings are in the order in which each thread made them.
    if (std::is_same<Family, Records>::value) return;
    std::wstring last[3];
    for (std::wstring const& key : Family::keys(file)) {
        std::wstring& before = last[std::stoi(key.substr(4)) / count];
        CHECK((before < key));
        before = key;
    }
}

FAMILIES_TEST_CASE("the destructor completes its work in a thread that is being cancelled") {
    std::string const value(300000, 'n');
    for (bool const lockIsHeld : {false, true}) {
        CAPTURE(lockIsHeld);
        Place const place;
        CHECK(toldByChild([&] {
                  auto* const file = new typename Family::File(place.path());
                  file->open(READ_WRITE);
                  Family::set(*file, 0, value);
                  if (lockIsHeld) file->lock();
                  bool survived = false;
                  bool const cancelled = cancelledIn(
                      [&] {
                          delete file;
                          survived = true;
                      },
                      [&] {
                          ::usleep(20000);
                          if (lockIsHeld) file->unlock();
                      });
                  return survived && cancelled ? "cancelled after it" : "interrupted";
              }) == "cancelled after it");
        CHECK((place.bytes() == one<Family>(value)));
    }
}

FAMILIES_TEST_CASE("a thread cancelled in an operation leaves the lock free and a whole file") {
    using File = typename Family::File;
    std::string const value(300000, 'n');
    using Step = void (*)(File&);
    for (Step const step :
         {Step([](File& f) { f.close(); }), Step([](File& f) { f.synchronize(); }),
          Step([](File& f) { f.open(READ_WRITE); })}) {
        CHECK(toldByChild([&] {
                  OwnFile<Family> file(one<Family>(), READ_WRITE);
                  file.put(0, value);
                  if (!cancelledIn([&] { step(file); }, [] {})) return "not cancelled";
                  file.count(); // waits for ever while the lock is held
                  std::string const bytes = file.bytes();
                  file.setMode(0); // the destructor has nothing to write
                  bool const whole = bytes == one<Family>() || bytes == one<Family>(value);
                  return whole ? "free and whole" : "free and damaged";
              }) == "free and whole");
    }
}

FAMILIES_TEST_CASE("a thread cancelled while it waits for the lock does no harm") {
    CHECK(toldByChild([] {
              OwnFile<Family> file(one<Family>(), READ_WRITE);
              file.lock();
              bool const cancelled = endsCancelled([&] { file.count(); },
                                                   [](pthread_t thread) {
                                                       ::usleep(20000);
                                                       ::pthread_cancel(thread);
                                                   });
              file.unlock();
              bool right = false;
              OtherThread([&] { right = file.has(1); }).join();
              return cancelled && right ? "cancelled, as before" : "changed";
          }) == "cancelled, as before");
}
