// Memory that runs out: the operators that allocate are replaced for the whole executable and the
// libraries it loaded. To be included by one source file of an executable.
#ifndef KORU_TESTS_FAILINGMEMORY_H
#define KORU_TESTS_FAILINGMEMORY_H

#include <unistd.h>

#include <atomic>
#include <cstddef>
#include <cstdlib>
#include <exception>
#include <new>
#include <string>

namespace test {

// The address sanitizer takes far more of the address space than it uses.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool ADDRESS_SPACE_CAN_BE_LIMITED = false;
#else
constexpr bool ADDRESS_SPACE_CAN_BE_LIMITED = true;
#endif

enum class Failing { ONE, ONE_AND_ALL_LATER };

inline std::atomic<long> allocationsBeforeFailure{-1}; // -1: none fails
inline std::atomic<bool> laterOnesFail{false};
inline std::atomic<long> failures{0};

inline void* allocate(std::size_t size) noexcept {
    if (allocationsBeforeFailure >= 0 && allocationsBeforeFailure-- == 0) {
        ++failures;
        if (laterOnesFail) allocationsBeforeFailure = 0;
        return nullptr;
    }
    return std::malloc(size == 0 ? 1 : size);
}

inline void* allocateOrThrow(std::size_t size) {
    void* const memory = allocate(size);
    if (memory == nullptr) throw std::bad_alloc();
    return memory;
}

/// Lets allocation number `before` (from 0) fail while the callable runs, and says how that ended:
/// "done", "std::bad_alloc" or another exception's message.
template <class Callable>
std::string runOutOfMemory(long before, Failing failing, Callable callable) {
    std::string outcome = "done"; // short enough to need no memory
    failures = 0;
    laterOnesFail = failing == Failing::ONE_AND_ALL_LATER;
    allocationsBeforeFailure = before;
    try {
        callable();
        allocationsBeforeFailure = -1;
    } catch (std::bad_alloc const&) {
        allocationsBeforeFailure = -1;
        outcome = "std::bad_alloc";
    } catch (std::exception const& e) {
        allocationsBeforeFailure = -1;
        outcome = e.what();
    }
    return outcome;
}

inline bool memoryRanOut() { return failures > 0; }

/// Ends the process when a test hangs on a lock that was not given back.
class Watchdog {
public:
    Watchdog() { ::alarm(200); }
    Watchdog(Watchdog const&) = delete;
    Watchdog& operator=(Watchdog const&) = delete;
    ~Watchdog() { ::alarm(0); }
};

} // namespace test

void* operator new(std::size_t size) { return test::allocateOrThrow(size); }
void* operator new[](std::size_t size) { return test::allocateOrThrow(size); }
void* operator new(std::size_t size, std::nothrow_t const&) noexcept {
    return test::allocate(size);
}
void* operator new[](std::size_t size, std::nothrow_t const&) noexcept {
    return test::allocate(size);
}
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete[](void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }
void operator delete[](void* memory, std::size_t) noexcept { std::free(memory); }
void operator delete(void* memory, std::nothrow_t const&) noexcept { std::free(memory); }
void operator delete[](void* memory, std::nothrow_t const&) noexcept { std::free(memory); }

#endif
