// What a test case leaves in the process: descriptors, threads and memory.
#ifndef KORU_TESTS_LEFTOVERS_H
#define KORU_TESTS_LEFTOVERS_H

#include <dirent.h>
#include <dlfcn.h>
#include <malloc.h>
#include <unistd.h>

#include <cstddef>
#include <string>

#include "support/sanitizers.h"

namespace test {

/// The entries of a folder of /proc, less the two of every folder.
inline long entriesOf(char const* folder) {
    DIR* const entries = ::opendir(folder);
    if (entries == nullptr) return 0;
    long count = -2;
    while (::readdir(entries) != nullptr) ++count;
    ::closedir(entries);
    return count;
}

/// What the C library has given and not got back. It counts what a thread keeps for its next
/// allocations, and what further arenas take, unless GLIBC_TUNABLES forbids both with
/// glibc.malloc.tcache_count=0:glibc.malloc.arena_max=1.
inline std::size_t heldBytes() {
#if defined(KORU_ADDRESS_SANITIZER) || defined(KORU_THREAD_SANITIZER)
    return 0; // A sanitizer has a malloc of its own.
#else
    // The loader keeps its latest complaint until it is asked for the next one.
    static_cast<void>(::dlerror());
    static_cast<void>(::dlerror());
    struct mallinfo2 const info = ::mallinfo2();
    return info.uordblks + info.hblkhd;
#endif
}

/// What a process has at a moment.
class Possessions {
public:
    /// Compared with an earlier moment: what is more now, or nothing. Threads that have just been
    /// joined or detached, and what they still have open, get time to go.
    /// @param allowed  how many bytes more there may be
    std::string moreThan(Possessions const& before, std::size_t allowed) const {
        if (bytes_ > before.bytes_ && bytes_ - before.bytes_ > allowed)
            return std::to_string(bytes_ - before.bytes_) + " bytes";
        for (int tries = 0; Possessions().outnumbers(before); ++tries) {
            if (tries == 2000) return "a descriptor or a thread";
            ::usleep(1000);
        }
        return "";
    }

private:
    bool outnumbers(Possessions const& before) const {
        return descriptors_ > before.descriptors_ || threads_ > before.threads_;
    }

    long descriptors_ = entriesOf("/proc/self/fd");
    long threads_ = entriesOf("/proc/self/task");
    std::size_t bytes_ = heldBytes();
};

} // namespace test

#endif
