/// @file
/// A recursive mutex that is locked by polling and gives up after a time.
#ifndef KORU_MUTEX_H
#define KORU_MUTEX_H

#include <pthread.h>

#include <koru/export.h>

namespace Koru {

/// A recursive mutex that gives up after a time. The thread that holds it may lock it again and
/// owes as many unlocks. Any thread may call lock, unlock and isLocked at once; copying and
/// assigning are for objects that no other thread uses meanwhile.
///
/// It never blocks: it tries once per millisecond, so a contended lock is granted up to about a
/// millisecond late, and there is no order among those who wait.
class KORU_EXPORT Mutex {
public:
    Mutex();

    /// Intended: copies the state of the POSIX mutex byte for byte, so that a copy of a held mutex
    /// is held too, by the same thread and as often.
    Mutex(Mutex const& other);

    /// Destroys this mutex, then copies as the copy constructor does.
    Mutex& operator=(Mutex const& other);

    /// The mutex must not be held.
    ~Mutex();

    /// Tries once per millisecond to take the mutex; the thread that holds it succeeds at once.
    /// A cancellation point while it waits.
    /// @param timeout  number of tries, so roughly milliseconds; 0 gives up without a try, even on
    ///                 a free mutex; 0xFFFFFFFF, the default, is as good as without limit (49.7
    ///                 days)
    /// @throws std::runtime_error "failed to obtain mutex within timeout"; it is not held then
    void lock(unsigned long timeout = 0xFFFFFFFFUL);

    /// Gives the mutex back once. Called without holding it, nothing happens. A forked child does
    /// not hold what its parent's thread held, and cannot take it either.
    void unlock();

    /// True while another thread holds the mutex. The holder itself sees false: it may lock again.
    bool isLocked() const;

private:
    // Mutable, since asking whether it is held means trying it.
    mutable pthread_mutex_t mutex_;
};

} // namespace Koru

#endif
