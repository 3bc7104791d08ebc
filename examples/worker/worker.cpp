// Feeds a thread with numbers, asks it to stop and joins it.
//
//     worker NUMBER...
//
// Prints the sum of the numbers, which the thread has added up one by one.
#include <koru/event.h>
#include <koru/mutex.h>
#include <koru/thread.h>

#include <cstdlib>
#include <deque>
#include <iostream>

namespace {

/// Holds a mutex for a scope.
class Guard {
public:
    explicit Guard(Koru::Mutex& mutex) : mutex_(mutex) { mutex_.lock(0xFFFFFFFFUL); }
    Guard(Guard const&) = delete;
    Guard& operator=(Guard const&) = delete;
    ~Guard() { mutex_.unlock(); }

private:
    Koru::Mutex& mutex_;
};

/// Adds up the numbers that it gets, until it is stopped and none are left.
class Adder : public Koru::Thread {
public:
    Adder() : fed_(true), stopping_(false) {}
    Adder(Adder const&) = delete;
    Adder& operator=(Adder const&) = delete;
    /// Waits for the thread, which uses this object.
    ~Adder() override {
        stop();
        static_cast<void>(join()); // Returns at once if the thread was joined before.
    }

    void feed(long number) {
        Guard const guard(mutex_);
        numbers_.push_back(number);
        fed_.signal();
    }

    void stop() override {
        stopping_.signal();
        fed_.signal();
    }

    void* run(void*) override {
        for (;;) {
            // Tested first, so that the numbers fed before the stop are still added below.
            bool const last = stopping_.test();
            workOff();
            if (last) return &sum_;
            // The flag tells of numbers fed since then. The wait would miss a signal that comes
            // between test and wait, so it ends after a second.
            if (!fed_.test()) static_cast<void>(fed_.wait(1));
        }
    }

private:
    Koru::Mutex mutex_; // guards the numbers
    std::deque<long> numbers_;
    Koru::Event fed_;
    Koru::Event stopping_; // stays signalled
    long sum_ = 0;         // only the thread uses it until it is joined

    void workOff() {
        Guard const guard(mutex_);
        for (; !numbers_.empty(); numbers_.pop_front()) sum_ += numbers_.front();
    }
};

} // namespace

int main(int argc, char** argv) {
    Adder adder;
    if (!adder.start(nullptr)) {
        std::cerr << "worker: cannot start a thread\n";
        return 1;
    }
    for (int i = 1; i < argc; ++i) adder.feed(std::strtol(argv[i], nullptr, 10));
    adder.stop();
    std::cout << *static_cast<long*>(adder.join()) << '\n';
    return 0;
}
