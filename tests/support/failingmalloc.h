// Memory that the C library does not give: malloc and its like are replaced for the whole
// executable and the libraries it loaded, so that what the C library itself asks for can fail, too.
// To be included by one source file of an executable that has no sanitizer.
#ifndef KORU_TESTS_FAILINGMALLOC_H
#define KORU_TESTS_FAILINGMALLOC_H

#include <cerrno>
#include <cstddef>

namespace test {

/// What this thread's allocations do.
struct MallocPlan {
    long before = -1; ///< so many are given before one fails; -1: none fails
    bool forever = false;
    long made = 0;   ///< allocations
    long failed = 0; ///< of them
    long held = 0;   ///< allocations less those given back
    bool isAside = false;
};

inline thread_local MallocPlan mallocPlan;

/// Makes an allocation of this thread fail within a scope, after some that succeed.
class FailingMalloc {
public:
    FailingMalloc(long before, bool forever) {
        mallocPlan = MallocPlan();
        mallocPlan.before = before;
        mallocPlan.forever = forever;
    }
    FailingMalloc(FailingMalloc const&) = delete;
    FailingMalloc& operator=(FailingMalloc const&) = delete;
    ~FailingMalloc() { mallocPlan.before = -1; }
};

/// What is done within its scope has all the memory it wants and is not counted.
class Aside {
public:
    Aside() { mallocPlan.isAside = true; }
    Aside(Aside const&) = delete;
    Aside& operator=(Aside const&) = delete;
    ~Aside() { mallocPlan.isAside = false; }
};

/// Whether an allocation fails now.
inline bool mallocFails() {
    MallocPlan& plan = mallocPlan;
    if (plan.isAside) return false;
    ++plan.made;
    if (plan.before < 0 || plan.before-- > 0) return false;
    if (plan.forever) plan.before = 0;
    ++plan.failed;
    errno = ENOMEM;
    return true;
}

/// Counts a block that is given or, with -1, given back.
inline void* counted(void* block, long count = 1) {
    if (block != nullptr && !mallocPlan.isAside) mallocPlan.held += count;
    return block;
}

} // namespace test

// NOLINTBEGIN(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" void* __libc_malloc(size_t size);
extern "C" void* __libc_calloc(size_t count, size_t size);
extern "C" void* __libc_realloc(void* block, size_t size);
extern "C" void __libc_free(void* block);
// NOLINTEND(bugprone-reserved-identifier,readability-identifier-naming)

extern "C" void* malloc(size_t size) noexcept {
    return test::mallocFails() ? nullptr : test::counted(__libc_malloc(size));
}

extern "C" void* calloc(size_t count, size_t size) noexcept {
    return test::mallocFails() ? nullptr : test::counted(__libc_calloc(count, size));
}

extern "C" void* realloc(void* block, size_t size) noexcept {
    if (test::mallocFails()) return nullptr;
    void* const result = __libc_realloc(block, size);
    if (block == nullptr) test::counted(result);
    return result;
}

extern "C" void free(void* block) noexcept { __libc_free(test::counted(block, -1)); }

#endif
