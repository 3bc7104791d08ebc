// Any calls of one thread on an event and a mutex do what they do to a flag and a count.
#include <koru/event.h>
#include <koru/mutex.h>

#include <cstdint>
#include <stdexcept>
#include <string>

#include "check.h"
#include "input.h"

namespace {

void callEvent(fuzz::Input& input, Koru::Event& event, bool autoReset, bool& signalled) {
    switch (input.below(4)) {
    case 0:
        event.signal();
        signalled = true;
        break;
    case 1:
        event.reset();
        signalled = false;
        break;
    case 2:
        KORU_CHECK(event.wait(0) == 1);
        break; // It does not look at the flag.
    default:
        break;
    }
    if (input.below(2) == 0) return;
    KORU_CHECK(event.test() == signalled);
    if (autoReset) signalled = false;
}

void callMutex(fuzz::Input& input, Koru::Mutex& mutex, int& held) {
    switch (input.below(3)) {
    case 0:
        mutex.lock(1 + input.byte());
        ++held;
        break;
    case 1:
        if (held == 0) break;
        mutex.unlock();
        --held;
        break;
    default:
        try {
            mutex.lock(0);
            KORU_CHECK(false);
        } catch (std::runtime_error const& e) {
            KORU_CHECK(e.what() == std::string("failed to obtain mutex within timeout"));
        }
    }
    KORU_CHECK(!mutex.isLocked()); // Not by another thread.
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::Input input(data, size);
    bool const autoReset = input.below(2) == 1;
    Koru::Event event(autoReset);
    Koru::Mutex mutex;
    bool signalled = false;
    int held = 0;
    while (!input.isAtEnd()) {
        if (input.below(2) == 0)
            callEvent(input, event, autoReset, signalled);
        else
            callMutex(input, mutex, held);
    }
    while (held-- > 0) mutex.unlock();
    return 0;
}
