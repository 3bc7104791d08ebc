/// @file
/// A recursive mutex that is locked by polling and gives up after a time.
#ifndef KORU_MUTEX_H
#define KORU_MUTEX_H

#include <pthread.h>

#include <koru/export.h>

namespace Koru {

/// A recursive mutex whose `lock` gives up after a time. The thread that holds it may lock it again
/// and has to unlock it once for each lock. Several threads may call `lock`, `unlock` and
/// `isLocked` at once; copy and assign a mutex only while no other thread uses it.
///
/// It never blocks: `lock` tries once per millisecond. So a waiting thread may get the mutex up to
/// about a millisecond after it is free, and waiting threads get it in no particular order.
class KORU_EXPORT Mutex {
public:
    /// A free mutex.
    Mutex();

    /// Intended: copies the state of the POSIX mutex byte for byte, so a copy of a held mutex is
    /// held too, by the same thread the same number of times.
    Mutex(Mutex const& other);

    /// Destroys this mutex, then copies as the copy constructor does.
    Mutex& operator=(Mutex const& other);

    /// Destroys the mutex, which no thread may hold.
    ~Mutex();

    /// Tries once per millisecond to take the mutex; the thread that holds it succeeds at once.
    /// While it waits, it is a cancellation point.
    /// @param timeout  number of tries, so roughly milliseconds; 0 gives up without a try, even on
    ///                 a free mutex; 0xFFFFFFFF, the default, is practically no limit (49.7 days)
    /// @throws std::runtime_error "failed to obtain mutex within timeout"; this call did not take
    ///         the mutex
    void lock(unsigned long timeout = 0xFFFFFFFFUL);

    /// Gives the mutex back once; does nothing when the calling thread does not hold it. After a
    /// `fork`, the child does not hold a mutex that the forking thread held, and cannot take it.
    void unlock();

    /// Whether another thread holds the mutex; false for the holder itself, which may lock again.
    bool isLocked() const;

private:
    // Mutable, since isLocked has to try to lock it.
    mutable pthread_mutex_t mutex_;
};

} // namespace Koru

#endif
