// Threads that wait in the system.
#ifndef KORU_TESTS_SLEEPING_H
#define KORU_TESTS_SLEEPING_H

#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <fstream>
#include <string>

namespace test {

inline long ownThreadId() { return ::syscall(SYS_gettid); }

/// Whether a thread of this process sleeps in the kernel.
inline bool sleeps(long threadId) {
    std::ifstream in("/proc/self/task/" + std::to_string(threadId) + "/stat");
    std::string line;
    std::getline(in, line);
    std::size_t const state = line.rfind(") ");
    return state != std::string::npos && line[state + 2] == 'S';
}

/// Returns when the thread that gives its id has slept for a while, or has done its work.
template <class Done>
void untilSleeping(std::atomic<long> const& threadId, Done done) {
    while (threadId == 0) ::usleep(1000);
    for (int inARow = 0; inARow < 20 && !done();) {
        inARow = sleeps(threadId) ? inARow + 1 : 0;
        ::usleep(2000);
    }
}

} // namespace test

#endif
