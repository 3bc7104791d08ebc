// How destructors keep what goes wrong to themselves.
#ifndef KORU_FILE_QUIET_H
#define KORU_FILE_QUIET_H

#include <pthread.h>

namespace Koru {

/// Holds thread cancellation off for a scope. A cancellation that began to unwind out of a
/// destructor would end the process.
class CancellationOff {
public:
    CancellationOff() { ::pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &before_); }
    CancellationOff(CancellationOff const&) = delete;
    CancellationOff& operator=(CancellationOff const&) = delete;
    ~CancellationOff() { ::pthread_setcancelstate(before_, nullptr); }

private:
    int before_ = PTHREAD_CANCEL_ENABLE;
};

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
