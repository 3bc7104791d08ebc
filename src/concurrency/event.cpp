#include <koru/event.h>

#include <sys/time.h>

#include <cerrno>
#include <limits>

#include "concurrency/timeout.h"

namespace Koru {

namespace {

// On 64 bits, this means no limit to an event, too.
constexpr unsigned long LONGEST = std::numeric_limits<unsigned long>::max();

/// Holds a POSIX mutex for a scope. The unwinding of a cancelled wait releases it too.
class PosixGuard {
public:
    explicit PosixGuard(pthread_mutex_t& mutex) : mutex_(mutex) { ::pthread_mutex_lock(&mutex_); }
    PosixGuard(PosixGuard const&) = delete;
    PosixGuard& operator=(PosixGuard const&) = delete;
    ~PosixGuard() { ::pthread_mutex_unlock(&mutex_); }

private:
    pthread_mutex_t& mutex_;
};

/// Finds the moment that many seconds from now, or the last one that a time_t can hold.
/// @return false if the present does not fit a timeval, as on 32 bits after January 2038
bool _findDeadline(unsigned long seconds, timespec& deadline) {
    timeval now;
    if (::gettimeofday(&now, nullptr) != 0) return false;
    constexpr time_t last = std::numeric_limits<time_t>::max();
    auto const left = static_cast<unsigned long>(last - now.tv_sec);
    deadline.tv_sec = seconds < left ? now.tv_sec + static_cast<time_t>(seconds) : last;
    deadline.tv_nsec = now.tv_usec * 1000;
    return true;
}

} // namespace

Event::Event(bool autoReset) : autoReset_(autoReset), signalled_(false) {
    ::pthread_cond_init(&condition_, nullptr);
    ::pthread_mutex_init(&mutex_, nullptr);
}

Event::~Event() {
    ::pthread_cond_destroy(&condition_);
    ::pthread_mutex_destroy(&mutex_);
}

void Event::signal() {
    PosixGuard const guard(mutex_);
    signalled_ = true;
    ::pthread_cond_signal(&condition_);
}

// Intended: waits on the condition once, whatever the flag is; only test() looks at the flag.
int Event::wait(unsigned long timeout) {
    PosixGuard const guard(mutex_);
    if (timeout == WITHOUT_LIMIT || timeout == LONGEST) { // GCOVR_EXCL_BR_LINE: one on 32 bits
        ::pthread_cond_wait(&condition_, &mutex_);
        return 0;
    }
    timespec deadline;
    if (!_findDeadline(timeout, deadline)) return -1;
    switch (::pthread_cond_timedwait(&condition_, &mutex_, &deadline)) {
    case 0:
        return 0;
    case ETIMEDOUT:
        return 1;
    default:
        return -1;
    }
}

void Event::reset() {
    PosixGuard const guard(mutex_);
    signalled_ = false;
}

bool Event::test() {
    PosixGuard const guard(mutex_);
    bool const wasSignalled = signalled_;
    if (autoReset_) signalled_ = false;
    return wasSignalled;
}

} // namespace Koru
