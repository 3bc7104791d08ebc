/// @file
/// A flag that one thread raises and others poll, and a notification that they wait for.
#ifndef KORU_EVENT_H
#define KORU_EVENT_H

#include <pthread.h>

#include <koru/export.h>

namespace Koru {

/// Two things in one object: a notification that `wait` waits for, and a flag that `test` reads.
/// Every operation may be called from any thread at once, except construction and destruction.
///
/// Intended: `wait` neither looks at the flag nor changes it. A signal that came before the wait
/// does not end it, and the wait may end without a signal (a spurious wake-up). A thread that must
/// not miss a signal tests before it waits and waits with a time-out:
/// @code
///     while (!event.test()) event.wait(1);
/// @endcode
class KORU_EXPORT Event {
public:
    /// Starts not signalled.
    /// @param autoReset  whether a `test` that reads true makes the event not signalled again
    Event(bool autoReset);

    Event(Event const&) = delete;
    Event& operator=(Event const&) = delete;

    /// No thread may be waiting.
    virtual ~Event();

    /// Raises the flag and wakes one waiting thread.
    void signal();

    /// Waits for one notification. A cancellation point; a cancelled thread leaves the event
    /// usable.
    /// @param timeout  whole seconds (`Mutex::lock` counts milliseconds); 0xFFFFFFFF, the default,
    ///                 waits without limit, as does an argument with all bits set. A moment that
    ///                 `time_t` cannot express is replaced by the last one that it can.
    /// @return 0 when woken, 1 when the time ran out, -1 when the wait failed otherwise or the
    ///         present does not fit a `timeval`, as in 32-bit programs after January 2038
    int wait(unsigned long timeout = 0xFFFFFFFFUL);

    /// Lowers the flag.
    void reset();

    /// Whether the flag is raised. With auto-reset it is lowered by the same call.
    bool test();

private:
    pthread_mutex_t mutex_; // guards the two flags
    pthread_cond_t condition_;
    bool autoReset_;
    bool signalled_;
};

} // namespace Koru

#endif
