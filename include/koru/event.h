/// @file
/// A flag that one thread raises and others poll, and a notification that they can wait for.
#ifndef KORU_EVENT_H
#define KORU_EVENT_H

#include <pthread.h>

#include <koru/export.h>

namespace Koru {

/// Two things in one object: a notification that `wait` waits for, and a flag that `test` reads.
/// Several threads may call its operations at once, except construction and destruction.
///
/// Intended: `wait` neither looks at the flag nor changes it. It does not see a signal that came
/// before it, and it may return without one (a spurious wake-up). A thread that must not miss a
/// signal therefore tests before it waits, and waits with a time-out:
/// @code
///     while (!event.test()) event.wait(1);
/// @endcode
class KORU_EXPORT Event {
public:
    /// An event whose flag is lowered.
    /// @param autoReset  whether a `test` that returns true also lowers the flag
    Event(bool autoReset);

    /// Not copyable: threads wait for this very object.
    Event(Event const&) = delete;
    Event& operator=(Event const&) = delete;

    /// Destroys the event; no thread may be waiting for it.
    virtual ~Event();

    /// Raises the flag and wakes one waiting thread.
    void signal();

    /// Waits for one notification. A cancellation point; a cancelled wait leaves the event usable.
    /// @param timeout  whole seconds (`Mutex::lock` counts milliseconds); 0xFFFFFFFF, the default,
    ///                 waits without limit, as does an argument with all bits set. A deadline that
    ///                 `time_t` cannot hold is replaced by the last one that it can.
    /// @return 0 when woken, 1 when the time ran out, -1 when waiting failed for another reason or
    ///         the current time does not fit a `timeval`, as in 32-bit programs after January 2038
    int wait(unsigned long timeout = 0xFFFFFFFFUL);

    /// Lowers the flag.
    void reset();

    /// Whether the flag is raised; with auto-reset, the same call lowers it.
    bool test();

private:
    pthread_mutex_t mutex_; // guards the two flags
    pthread_cond_t condition_;
    bool autoReset_;
    bool signalled_;
};

} // namespace Koru

#endif
