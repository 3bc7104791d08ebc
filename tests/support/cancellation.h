// Threads that are cancelled. What they run should not use the test framework.
#ifndef KORU_TESTS_CANCELLATION_H
#define KORU_TESTS_CANCELLATION_H

#include <pthread.h>

#include "support/sanitizers.h"

#if defined(KORU_ADDRESS_SANITIZER)
// The address sanitizer does not follow the unwinding of a cancelled thread and takes the frames it
// has left for live ones. It trips over them itself where it asks for the signal stack.
extern "C" inline __attribute__((used)) char const* __asan_default_suppressions() {
    return "interceptor_name:sigaltstack";
}
#endif

namespace test {

/// Runs a callable on a thread of its own, gives the thread's id to another callable meanwhile and
/// waits for its end.
/// @return whether it ended as cancelled, and by unwinding
template <class Callable, class Canceller>
bool endsCancelled(Callable callable, Canceller cancel) {
    struct Task {
        Callable callable;
        bool unwound;
    } task{callable, false};
    auto const run = [](void* argument) -> void* {
        struct Witness {
            bool& unwound;
            ~Witness() { unwound = true; }
        };
        Task& own = *static_cast<Task*>(argument);
        Witness const witness{own.unwound};
        own.callable();
        return nullptr;
    };
    pthread_t thread;
    if (::pthread_create(&thread, nullptr, run, &task) != 0) return false;
    cancel(thread);
    void* result = nullptr;
    ::pthread_join(thread, &result);
    return result == PTHREAD_CANCELED && task.unwound;
}

} // namespace test

#endif
