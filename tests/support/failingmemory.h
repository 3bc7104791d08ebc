// Memory that runs out: the operators that allocate are replaced for the whole executable and the
// libraries it loaded. They also notice who writes beyond a block, which ends the process. To be
// included by one source file of an executable.
#ifndef KORU_TESTS_FAILINGMEMORY_H
#define KORU_TESTS_FAILINGMEMORY_H

#include <doctest/doctest.h>

#include <unistd.h>

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <new>
#include <string>

#include "support/sanitizers.h"

namespace test {

// The address sanitizer takes far more of the address space than it uses, and it finds overruns
// without our help.
constexpr bool ADDRESS_SPACE_CAN_BE_LIMITED = !SANITIZED;
// The size, and then the block as aligned as before.
constexpr std::size_t BLOCK_HEAD = SANITIZED ? 0 : 16;

enum class Failing { ONE, ONE_AND_ALL_LATER };

/// Which allocations fail.
struct MemoryPlan {
    long before; ///< so many succeed before one fails; -1: none fails
    Failing failing = Failing::ONE;
    std::size_t smallest = 0; ///< smaller ones succeed and do not count
    std::size_t largest = SIZE_MAX;
};

/// What the operators know.
struct MemoryState {
    std::atomic<long> before{-1};
    std::atomic<bool> laterOnesFail{false};
    std::atomic<std::size_t> smallest{0};
    std::atomic<std::size_t> largest{SIZE_MAX};
    std::atomic<long> failures{0};
    std::atomic<std::size_t> allocated{0};
    std::atomic<std::size_t> held{0};
    std::atomic<std::size_t> mostHeld{0};
    std::atomic<void*> reserve{nullptr};
    std::atomic<bool> reserveIsTaken{false};
};
inline MemoryState memoryState;

/// Makes allocations fail within a scope. Scopes do not nest.
class FailingMemory {
public:
    explicit FailingMemory(MemoryPlan const& plan) {
        memoryState.laterOnesFail = plan.failing == Failing::ONE_AND_ALL_LATER;
        memoryState.smallest = plan.smallest;
        memoryState.largest = plan.largest;
        memoryState.failures = 0;
        memoryState.before = plan.before;
    }
    FailingMemory(FailingMemory const&) = delete;
    FailingMemory& operator=(FailingMemory const&) = delete;
    ~FailingMemory() { memoryState.before = -1; }
};

/// How many allocations failed in the latest scope.
inline long failedAllocations() { return memoryState.failures; }
inline bool memoryRanOut() { return failedAllocations() > 0; }

/// Counts the bytes allocated since it was made.
class AllocatedBytes {
public:
    std::size_t count() const { return memoryState.allocated - before_; }

private:
    std::size_t before_ = memoryState.allocated;
};

/// Tells how many bytes more were held at a time since it was made than when it was made. Not under
/// a sanitizer, whose blocks do not know their size.
class MostBytes {
public:
    MostBytes() { memoryState.mostHeld = before_; }
    std::size_t count() const { return memoryState.mostHeld - before_; }

private:
    std::size_t before_ = memoryState.held;
};

/// Hands out this memory for an allocation of 1 GiB or more within a scope, to one at a time.
class ReserveForHugeBlock {
public:
    static constexpr std::size_t HUGE_SIZE = 1U << 30;

    explicit ReserveForHugeBlock(void* memory) { memoryState.reserve = memory; }
    ReserveForHugeBlock(ReserveForHugeBlock const&) = delete;
    ReserveForHugeBlock& operator=(ReserveForHugeBlock const&) = delete;
    ~ReserveForHugeBlock() { memoryState.reserve = nullptr; }
};

/// Makes allocations fail while the callable runs, and says how that ended: "done",
/// "std::bad_alloc" or another exception's message.
template <class Callable>
std::string runOutOfMemory(MemoryPlan const& plan, Callable callable) {
    std::string outcome = "done"; // short enough to need no memory
    try {
        FailingMemory const scope(plan);
        callable();
    } catch (std::bad_alloc const&) {
        outcome = "std::bad_alloc";
    } catch (std::exception const& e) {
        outcome = e.what();
    }
    return outcome;
}

template <class Callable>
std::string runOutOfMemory(long before, Failing failing, Callable callable) {
    return runOutOfMemory(MemoryPlan{before, failing}, callable);
}

/// Calls attempt(plan) with every allocation failing in turn, alone and then with all later ones,
/// until it returns false: memory did not run out.
template <class Attempt>
void forEachFailure(Attempt attempt) {
    for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
        CAPTURE(failing == Failing::ONE);
        long before = 0;
        bool ranOut = true;
        for (; ranOut && before < 100000; ++before) {
            CAPTURE(before);
            ranOut = attempt(MemoryPlan{before, failing});
        }
        CHECK_FALSE(ranOut);
    }
}

/// Ends the process when a test hangs on a lock that was not given back: after 200 seconds, or as
/// many as the environment's KORU_WATCHDOG says, for tools that make a program slow.
class Watchdog {
public:
    Watchdog() {
        char const* const seconds = std::getenv("KORU_WATCHDOG");
        ::alarm(seconds == nullptr ? 200U
                                   : static_cast<unsigned int>(std::strtoul(seconds, nullptr, 10)));
    }
    Watchdog(Watchdog const&) = delete;
    Watchdog& operator=(Watchdog const&) = delete;
    ~Watchdog() { ::alarm(0); }
};

// ----------------------------------------------------------------------- what the operators do

inline bool allocationFails(std::size_t size) {
    MemoryState& state = memoryState;
    if (state.before < 0 || size < state.smallest || size > state.largest) return false;
    if (state.before-- > 0) return false;
    if (state.laterOnesFail) state.before = 0;
    ++state.failures;
    return true;
}

/// These bytes follow each block, and nobody may change them.
constexpr unsigned char BLOCK_END[] = {0xA5, 0x5A, 0xC3, 0x3C, 0xA5, 0x5A, 0xC3, 0x3C};

inline void* takeBlock(std::size_t size) noexcept {
    if (BLOCK_HEAD == 0) return std::malloc(size == 0 ? 1 : size);
    if (size > PTRDIFF_MAX) return nullptr;
    void* const taken = std::malloc(BLOCK_HEAD + size + sizeof BLOCK_END);
    if (taken == nullptr) return nullptr;
    std::memcpy(taken, &size, sizeof size);
    unsigned char* const block = static_cast<unsigned char*>(taken) + BLOCK_HEAD;
    std::memcpy(block + size, BLOCK_END, sizeof BLOCK_END);
    std::size_t const held = memoryState.held += size;
    if (held > memoryState.mostHeld) memoryState.mostHeld = held; // threads may miss each other's
    return block;
}

inline void giveBlock(void* memory) noexcept {
    if (memory == nullptr) return;
    if (memory == memoryState.reserve) {
        memoryState.reserveIsTaken = false;
        return;
    }
    unsigned char* const block = static_cast<unsigned char*>(memory);
    void* const taken = block - BLOCK_HEAD;
    if (BLOCK_HEAD != 0) {
        std::size_t size = 0;
        std::memcpy(&size, taken, sizeof size);
        if (std::memcmp(block + size, BLOCK_END, sizeof BLOCK_END) != 0) std::abort();
        memoryState.held -= size;
    }
    std::free(taken);
}

inline void* allocate(std::size_t size) noexcept {
    memoryState.allocated += size;
    if (allocationFails(size)) return nullptr;
    bool const isHuge = size >= ReserveForHugeBlock::HUGE_SIZE;
    void* const reserve = memoryState.reserve;
    if (isHuge && reserve != nullptr && !memoryState.reserveIsTaken.exchange(true)) return reserve;
    return takeBlock(size);
}

inline void* allocateOrThrow(std::size_t size) {
    void* const memory = allocate(size);
    if (memory == nullptr) throw std::bad_alloc();
    return memory;
}

} // namespace test

void* operator new(std::size_t size) { return test::allocateOrThrow(size); }
void* operator new[](std::size_t size) { return test::allocateOrThrow(size); }
void* operator new(std::size_t size, std::nothrow_t const&) noexcept {
    return test::allocate(size);
}
void* operator new[](std::size_t size, std::nothrow_t const&) noexcept {
    return test::allocate(size);
}
void operator delete(void* memory) noexcept { test::giveBlock(memory); }
void operator delete[](void* memory) noexcept { test::giveBlock(memory); }
void operator delete(void* memory, std::size_t) noexcept { test::giveBlock(memory); }
void operator delete[](void* memory, std::size_t) noexcept { test::giveBlock(memory); }
void operator delete(void* memory, std::nothrow_t const&) noexcept { test::giveBlock(memory); }
void operator delete[](void* memory, std::nothrow_t const&) noexcept { test::giveBlock(memory); }

#endif
