// Thread cancellation, and the exceptions that it must not be taken for.
//
// glibc ends a cancelled thread by unwinding its stack with abi::__forced_unwind. To stop that
// unwinding ends the process, and so does an unwinding that begins in a destructor. So whatever
// catches everything lets it pass first, and destructors hold cancellation off. The unwinding
// carries no object, which the sanitizer takes for a null reference wherever it is caught by name.
#ifndef KORU_CONCURRENCY_CANCELLATION_H
#define KORU_CONCURRENCY_CANCELLATION_H

#include <cxxabi.h>
#include <pthread.h>

namespace Koru {

/// Holds cancellation off for a scope.
class CancellationOff {
public:
    CancellationOff() { ::pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &before_); }
    CancellationOff(CancellationOff const&) = delete;
    CancellationOff& operator=(CancellationOff const&) = delete;
    ~CancellationOff() { ::pthread_setcancelstate(before_, nullptr); }

private:
    int before_ = PTHREAD_CANCEL_ENABLE;
};

/// Runs a step and returns what it returns; where an exception leaves it, what `otherwise` returns,
/// which runs while the exception is handled.
template <class Step, class Otherwise>
__attribute__((no_sanitize("undefined"))) auto attempt(Step step, Otherwise otherwise)
    -> decltype(step()) {
    try {
        return step();
    } catch (abi::__forced_unwind const&) {
        throw;
    } catch (...) {
        return otherwise();
    }
}

/// Runs a step, and `undo` where a cancellation unwinds it; exceptions pass without that.
template <class Step, class Undo>
__attribute__((no_sanitize("undefined"))) void undoIfCancelled(Step step, Undo undo) {
    try {
        step();
    } catch (abi::__forced_unwind const&) {
        undo();
        throw;
    }
}

/// Runs the callable for a destructor: nothing leaves it. (With cancellation held off there is no
/// unwinding that would have to pass.)
template <class Callable>
void quietly(Callable callable) noexcept {
    CancellationOff const guard;
    try {
        callable();
    } catch (...) { // What is lost here, the caller could have had from close().
    }
}

} // namespace Koru

#endif
