/// @file
/// A thread whose work is an overridden function.
#ifndef KORU_THREAD_H
#define KORU_THREAD_H

#include <pthread.h>

#include <koru/export.h>

namespace Koru {

/// One POSIX thread, which calls `run` of the object. An object runs at most one thread in its
/// life. `start`, `join`, `detach` and `abort` are called by one controlling thread; there is no
/// lock.
///
/// The object outlives its thread: destroying it neither joins nor ends the thread. A derived class
/// whose destructor joins, or a caller who joins before it, is on the safe side.
class KORU_EXPORT Thread {
public:
    Thread();

    Thread(Thread const&) = delete;
    Thread& operator=(Thread const&) = delete;

    /// Does nothing to the thread, which must have ended.
    virtual ~Thread();

    /// Starts the thread, which calls `run(argument)`. When a thread was started before, even one
    /// that has ended, nothing happens.
    /// @return whether a thread was started now or before; after false it may be tried again
    bool start(void* argument);

    /// Asks `run` to return: does nothing here; overridden where there is a way to ask.
    virtual void stop();

    /// The thread's body, overridden by derived classes; this one returns null at once.
    /// Cancellation unwinds it as an exception that must be let pass. Any other exception out of it
    /// ends the thread with the exit value of all bits set, and is lost.
    /// @return the thread's exit value, which `join` returns
    virtual void* run(void* argument);

    /// Cancels the thread at its next cancellation point and detaches it, so nobody learns when it
    /// has ended; nothing happens unless it is started and not detached. Its stack is unwound.
    void abort();

    /// Detaches the thread; before `start`, the thread will start detached.
    void detach();

    /// Waits for the thread to end.
    /// @return its exit value; null, at once, when it was not started, or was joined, detached or
    ///         aborted before
    void* join();

    /// The thread's identifier (a `pthread_t`); without meaning before a successful `start`.
    unsigned long getThreadId() const;

    /// The identifier of the calling thread.
    static unsigned long getCurrentThreadId();

    /// Suspends the calling thread. A signal ends it early.
    /// @param milliseconds  beyond 4294967 the part below a second is not exact
    static void sleep(unsigned int milliseconds);

private:
    friend KORU_EXPORT void* ThreadFunction(void* thread);

    pthread_t handle_;
    pthread_t threadId_;
    void* argument_;
    bool started_;
    bool detached_; // or joined, or aborted, or to be started so
};

/// What a thread begins with: calls `run` of the `Thread` given, with its argument.
KORU_EXPORT void* ThreadFunction(void* thread);

} // namespace Koru

#endif
