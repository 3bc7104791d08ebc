/// @file
/// A thread whose work is an overridden function.
#ifndef KORU_THREAD_H
#define KORU_THREAD_H

#include <pthread.h>

#include <koru/export.h>

namespace Koru {

/// A POSIX thread that calls the object's `run`. An object runs at most one thread in its life. One
/// controlling thread calls `start`, `join`, `detach` and `abort`; the object has no lock.
///
/// The object has to outlive its thread, as its destructor neither joins nor ends the thread. So a
/// derived class joins in its own destructor, or the caller joins first.
class KORU_EXPORT Thread {
public:
    /// An object that has not started its thread.
    Thread();

    /// Not copyable: the thread uses this very object.
    Thread(Thread const&) = delete;
    Thread& operator=(Thread const&) = delete;

    /// Does nothing to the thread, which has to have ended.
    virtual ~Thread();

    /// Starts the thread, which calls `run(argument)`; does nothing when the object has started a
    /// thread before, even one that has ended.
    /// @return whether a thread was started, now or before; after false you may try again
    bool start(void* argument);

    /// Asks `run` to return. Does nothing here: a derived class that can ask overrides it.
    virtual void stop();

    /// The thread's body, which derived classes override; this one returns null at once.
    /// Cancellation unwinds it with an exception that it must let pass. Any other exception that
    /// leaves it ends the thread with an exit value of all bits set, and is lost.
    /// @return the thread's exit value, which `join` returns
    virtual void* run(void* argument);

    /// Cancels the thread, which unwinds its stack at its next cancellation point, and detaches it,
    /// so nobody learns when it has ended. Does nothing unless it is started and not detached.
    void abort();

    /// Detaches the thread; called before `start`, makes it start detached.
    void detach();

    /// Waits for the thread to end.
    /// @return its exit value; null, at once, if it was not started, or was joined, detached or
    ///         aborted before
    void* join();

    /// The thread's identifier (a `pthread_t`); means nothing before a successful `start`.
    unsigned long getThreadId() const;

    /// The identifier of the calling thread.
    static unsigned long getCurrentThreadId();

    /// Suspends the calling thread; a signal ends the pause early.
    /// @param milliseconds  above 4294967, the part below a second is not exact
    static void sleep(unsigned int milliseconds);

private:
    friend KORU_EXPORT void* ThreadFunction(void* thread);

    pthread_t handle_;
    pthread_t threadId_;
    void* argument_;
    bool started_;
    bool detached_; // or joined or aborted, or to be detached by start
};

/// The function that a new thread executes: calls `run` of the given `Thread` with its argument.
KORU_EXPORT void* ThreadFunction(void* thread);

} // namespace Koru

#endif
