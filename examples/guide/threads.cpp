#include <koru/event.h>
#include <koru/thread.h>

#include <iostream>

// Counts until it is asked to stop.
class Counter : public Koru::Thread {
public:
    Counter() : stopping_(false), count_(0) {} // an event that stays signalled

    void* run(void*) override {
        while (!stopping_.test()) {
            ++count_;
            Koru::Thread::sleep(1); // milliseconds
        }
        return &count_;
    }

    void stop() override { stopping_.signal(); }

private:
    Koru::Event stopping_;
    int count_; // only the thread uses it until it is joined
};

int main() {
    Counter counter;
    if (!counter.start(nullptr)) return 1;
    Koru::Thread::sleep(50);
    counter.stop();
    int const count = *static_cast<int*>(counter.join());
    std::cout << std::boolalpha << (count > 0) << '\n';
}
