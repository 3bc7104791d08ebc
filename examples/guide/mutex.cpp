#include <koru/mutex.h>

#include <iostream>
#include <mutex>
#include <stdexcept>
#include <thread>

int main() {
    Koru::Mutex mutex;
    int count = 0;
    auto const work = [&] {
        for (int i = 0; i < 1000; ++i) {
            std::lock_guard<Koru::Mutex> const lock(mutex);
            ++count;
        }
    };
    std::thread other(work);
    work();
    other.join();
    std::cout << count << '\n';

    // The thread that has it may lock it again; others wait, and may give up after a while.
    std::lock_guard<Koru::Mutex> const first(mutex);
    std::lock_guard<Koru::Mutex> const second(mutex);
    std::thread([&mutex] {
        try {
            mutex.lock(50); // milliseconds
        } catch (std::runtime_error const& e) {
            std::cout << e.what() << '\n';
        }
    }).join();
}
