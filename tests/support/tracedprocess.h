// A child that is killed at one of its system calls, before the system does anything for it.
#ifndef KORU_TESTS_TRACEDPROCESS_H
#define KORU_TESTS_TRACEDPROCESS_H

#include <signal.h>
#include <sys/ptrace.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <stdexcept>

namespace test {

/// Lets a stopped child go on to its system call number `wanted`, from 0, and kills it there.
/// Returns false if it exited with success before; any other end is an exception.
inline bool killAtCall(pid_t child, long wanted) {
    int status = 0;
    long entries = 0;
    bool isInCall = false;
    for (;;) {
        if (::waitpid(child, &status, 0) != child) throw std::runtime_error("waitpid failed");
        if (WIFEXITED(status) && WEXITSTATUS(status) == 0) return false;
        if (!WIFSTOPPED(status)) throw std::runtime_error("the traced child failed");
        if (WSTOPSIG(status) == (SIGTRAP | 0x80)) {
            isInCall = !isInCall;
            if (isInCall && entries++ == wanted) break;
        }
        ::ptrace(PTRACE_SYSCALL, child, nullptr, nullptr);
    }
    ::kill(child, SIGKILL);
    ::waitpid(child, &status, 0);
    return true;
}

/// Runs the callable in a child and kills that at system call number `wanted` of the callable.
/// Returns false if it makes fewer calls; then it has done all of its work.
template <class Callable>
bool killedAtCall(long wanted, Callable callable) {
    pid_t const child = ::fork();
    if (child < 0) throw std::runtime_error("fork failed");
    if (child == 0) {
        ::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr);
        ::raise(SIGSTOP);
        int code = 0;
        try {
            callable();
        } catch (...) {
            code = 1;
        }
        std::_Exit(code); // makes no further calls, not even where `_exit` writes counts
    }
    int status = 0;
    if (::waitpid(child, &status, 0) != child || !WIFSTOPPED(status))
        throw std::runtime_error("the child cannot be traced");
    ::ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL);
    ::ptrace(PTRACE_SYSCALL, child, nullptr, nullptr);
    return killAtCall(child, wanted);
}

} // namespace test

#endif
