// Another thread that holds a lock.
#ifndef KORU_TESTS_HOLDER_H
#define KORU_TESTS_HOLDER_H

#include <unistd.h>

#include <atomic>
#include <thread>

namespace test {

/// Holds the lock, taken a number of times, until it is told to let go or destroyed.
template <class Lock>
class Holder {
public:
    explicit Holder(Lock& lock, int times = 1)
        : thread_([this, &lock, times] {
              for (int i = 0; i < times; ++i) lock.lock();
              holds_ = true;
              while (wanted_) ::usleep(200);
              for (int i = 0; i < times; ++i) lock.unlock();
          }) {
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
    std::atomic<bool> holds_{false};
    std::atomic<bool> wanted_{true};
    std::thread thread_;
};

} // namespace test

#endif
