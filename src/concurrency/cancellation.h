// Thread cancellation, which must not be taken for an exception.
//
// glibc ends a cancelled thread by unwinding its stack with abi::__forced_unwind. Code that catches
// the unwinding and does not rethrow it ends the process, and so does an unwinding that begins in a
// destructor. So code that catches everything lets the unwinding pass first, and destructors hold
// cancellation off. The unwinding carries no object: a handler that names it binds a null
// reference, about which the sanitizer would complain.
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

/// Returns what the step returns. If it throws an exception, returns what `otherwise` returns; that
/// runs while the exception is handled.
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

/// Runs a step, and then `undo` if a cancellation unwinds the step; an exception just passes.
template <class Step, class Undo>
__attribute__((no_sanitize("undefined"))) void undoIfCancelled(Step step, Undo undo) {
    try {
        step();
    } catch (abi::__forced_unwind const&) {
        undo();
        throw;
    }
}

/// Runs the callable for a destructor: no exception leaves it. It may catch everything, since with
/// cancellation held off no unwinding has to pass.
template <class Callable>
void quietly(Callable callable) noexcept {
    CancellationOff const guard;
    try {
        callable();
    } catch (...) { // A caller who wants to see the exception calls close().
    }
}

} // namespace Koru

#endif
