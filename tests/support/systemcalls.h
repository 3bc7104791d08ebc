// The system's calls that files are made of, as this executable and the libraries it loaded make
// them: a test can have them fail, transfer less than they are asked for, or cancel the thread that
// makes them. To be included by one source file of an executable.
#ifndef KORU_TESTS_SYSTEMCALLS_H
#define KORU_TESTS_SYSTEMCALLS_H

#include <dlfcn.h>
#include <fcntl.h>
#include <pthread.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstddef>
#include <cstdio>

#include "support/sanitizers.h"

namespace test {

/// Kinds of calls. OPEN is that of streams and DESCRIPTOR that of descriptors; CLOSE is both.
enum class Call {
    OPEN,
    DESCRIPTOR,
    READ,
    WRITE,
    SEEK,
    STATUS,
    CLOSE,
    REMOVE,
    RENAME,
    CHMOD,
    ACCESS,
    RESOLVE,
    TRUNCATE
};

constexpr std::array<Call, 13> CALLS = {
    Call::OPEN,   Call::DESCRIPTOR, Call::READ,    Call::WRITE,  Call::SEEK,
    Call::STATUS, Call::CLOSE,      Call::REMOVE,  Call::RENAME, Call::CHMOD,
    Call::ACCESS, Call::RESOLVE,    Call::TRUNCATE};

/// What the calls of one kind do besides their work.
struct CallPlan {
    std::atomic<long> before{-1}; ///< how many succeed before one fails; -1: none fails
    std::atomic<int> error{0};
    std::atomic<bool> forever{false}; ///< whether all later ones fail too
    std::atomic<long> made{0};
};

inline std::array<CallPlan, CALLS.size()> callPlans;

inline CallPlan& planOf(Call call) { return callPlans[static_cast<std::size_t>(call)]; }

/// Calls that are cancellation points cancel the calling thread when this many have been made.
inline thread_local long callsBeforeCancellation = -1;

/// What the system says is to come when it is asked; -1: the truth.
inline std::atomic<int> claimedSize{-1};

// A sanitizer has a malloc of its own, which no other can replace.
constexpr bool MALLOC_CAN_FAIL = !SANITIZED;

/// The C library gets no memory for this many of the streams that this thread opens next.
inline thread_local int streamsWithoutMemory = 0;
inline thread_local bool opensStream = false;

/// Makes one kind of call fail within a scope, after some that succeed.
class FailingCall {
public:
    enum Times { ONCE, FOR_EVER };

    FailingCall(Call call, int error, long before = 0, Times times = ONCE) : plan_(planOf(call)) {
        plan_.error = error;
        plan_.forever = times == FOR_EVER;
        plan_.made = 0;
        plan_.before = before;
    }
    FailingCall(FailingCall const&) = delete;
    FailingCall& operator=(FailingCall const&) = delete;
    ~FailingCall() { plan_.before = -1; }

    /// The calls made since.
    long made() const { return plan_.made; }

private:
    CallPlan& plan_;
};

/// How many bytes a call transfers at the most; 0: as many as it is asked for.
inline std::atomic<std::size_t> transferLimit{0};

/// Limits what calls transfer within a scope.
class ShortTransfers {
public:
    explicit ShortTransfers(std::size_t bytes) { transferLimit = bytes; }
    ShortTransfers(ShortTransfers const&) = delete;
    ShortTransfers& operator=(ShortTransfers const&) = delete;
    ~ShortTransfers() { transferLimit = 0; }
};

inline std::size_t limited(std::size_t count) {
    std::size_t const limit = transferLimit;
    return limit != 0 && count > limit ? limit : count;
}

/// Whether writing waits, and whether a call does wait.
inline std::atomic<bool> writesWait{false};
inline std::atomic<bool> aWriteWaits{false};

inline void waitIfAsked() {
    while (writesWait) {
        aWriteWaits = true;
        ::usleep(1000);
    }
}

/// Whether a call fails now, with errno set.
inline bool failsNow(Call call) {
    CallPlan& plan = planOf(call);
    ++plan.made;
    if (plan.before < 0 || plan.before-- > 0) return false;
    if (plan.forever) plan.before = 0;
    errno = plan.error;
    return true;
}

/// Counts a cancellation point and cancels the thread when it is its turn.
inline void passCancellationPoint() {
    if (callsBeforeCancellation >= 0 && callsBeforeCancellation-- == 0)
        ::pthread_cancel(::pthread_self());
    ::pthread_testcancel();
}

template <class Function>
Function realFunction(char const* name) {
    return reinterpret_cast<Function>(::dlsym(RTLD_NEXT, name));
}

/// Opens a stream by fopen or fopen64, whichever is named.
inline FILE* openStream(char const* function, char const* name, char const* mode) {
    passCancellationPoint();
    if (failsNow(Call::OPEN)) return nullptr;
    auto const open = realFunction<FILE* (*)(char const*, char const*)>(function);
    opensStream = streamsWithoutMemory > 0;
    if (opensStream) --streamsWithoutMemory;
    FILE* const stream = open(name, mode);
    opensStream = false;
    return stream;
}

} // namespace test

extern "C" FILE* fopen(char const* name, char const* mode) {
    return test::openStream("fopen", name, mode);
}

extern "C" FILE* fopen64(char const* name, char const* mode) {
    return test::openStream("fopen64", name, mode);
}

extern "C" int open(char const* name, int flags, ...) {
    test::passCancellationPoint();
    if (test::failsNow(test::Call::DESCRIPTOR)) return -1;
    va_list arguments;
    va_start(arguments, flags);
    mode_t const mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
    va_end(arguments);
    return test::realFunction<int (*)(char const*, int, ...)>("open")(name, flags, mode);
}

extern "C" ssize_t read(int fd, void* buffer, size_t count) {
    test::passCancellationPoint();
    if (test::failsNow(test::Call::READ)) return -1;
    return test::realFunction<ssize_t (*)(int, void*, size_t)>("read")(fd, buffer,
                                                                       test::limited(count));
}

extern "C" ssize_t write(int fd, void const* buffer, size_t count) {
    test::passCancellationPoint();
    test::waitIfAsked();
    if (test::failsNow(test::Call::WRITE)) return -1;
    return test::realFunction<ssize_t (*)(int, void const*, size_t)>("write")(fd, buffer,
                                                                              test::limited(count));
}

extern "C" ssize_t writev(int fd, iovec const* pieces, int count) {
    test::passCancellationPoint();
    test::waitIfAsked();
    if (test::failsNow(test::Call::WRITE)) return -1;
    auto const writev = test::realFunction<ssize_t (*)(int, iovec const*, int)>("writev");
    if (test::transferLimit != 0) {
        iovec first = count > 1 && pieces[0].iov_len == 0 ? pieces[1] : pieces[0];
        first.iov_len = test::limited(first.iov_len);
        return writev(fd, &first, 1);
    }
    return writev(fd, pieces, count);
}

extern "C" off64_t lseek64(int fd, off64_t offset, int whence) noexcept {
    if (test::failsNow(test::Call::SEEK)) return -1;
    return test::realFunction<off64_t (*)(int, off64_t, int)>("lseek64")(fd, offset, whence);
}

extern "C" int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list arguments;
    va_start(arguments, request);
    void* const argument = va_arg(arguments, void*);
    va_end(arguments);
    int const claimed = test::claimedSize;
    if (claimed >= 0) {
        *static_cast<int*>(argument) = claimed;
        return 0;
    }
    return static_cast<int>(::syscall(SYS_ioctl, fd, request, argument));
}

// What fails to be closed is closed all the same, as the system does it.
extern "C" int fclose(FILE* stream) {
    int const result = test::realFunction<int (*)(FILE*)>("fclose")(stream);
    return test::failsNow(test::Call::CLOSE) ? EOF : result;
}

extern "C" int close(int fd) {
    test::passCancellationPoint();
    int const result = test::realFunction<int (*)(int)>("close")(fd);
    return test::failsNow(test::Call::CLOSE) ? -1 : result;
}

extern "C" int fstat64(int fd, struct stat64* status) noexcept {
    if (test::failsNow(test::Call::STATUS)) return -1;
    return test::realFunction<int (*)(int, struct stat64*)>("fstat64")(fd, status);
}

extern "C" int remove(char const* name) noexcept {
    if (test::failsNow(test::Call::REMOVE)) return -1;
    return test::realFunction<int (*)(char const*)>("remove")(name);
}

extern "C" int rename(char const* from, char const* to) noexcept {
    if (test::failsNow(test::Call::RENAME)) return -1;
    return test::realFunction<int (*)(char const*, char const*)>("rename")(from, to);
}

extern "C" int chmod(char const* name, mode_t mode) noexcept {
    if (test::failsNow(test::Call::CHMOD)) return -1;
    return test::realFunction<int (*)(char const*, mode_t)>("chmod")(name, mode);
}

extern "C" int access(char const* name, int how) noexcept {
    if (test::failsNow(test::Call::ACCESS)) return -1;
    return test::realFunction<int (*)(char const*, int)>("access")(name, how);
}

// By this name the fortified library calls realpath.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" char* __realpath_chk(char const* name, char* resolved, size_t size) {
    if (test::failsNow(test::Call::RESOLVE)) return nullptr;
    return test::realFunction<char* (*)(char const*, char*, size_t)>("__realpath_chk")(
        name, resolved, size);
}

extern "C" int truncate(char const* name, off_t size) noexcept {
    if (test::failsNow(test::Call::TRUNCATE)) return -1;
    return test::realFunction<int (*)(char const*, off_t)>("truncate")(name, size);
}

#if !defined(KORU_ADDRESS_SANITIZER) && !defined(KORU_THREAD_SANITIZER)
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" void* __libc_malloc(size_t size);

extern "C" void* malloc(size_t size) noexcept {
    if (!test::opensStream) return __libc_malloc(size);
    errno = ENOMEM;
    return nullptr;
}
#endif

#endif
