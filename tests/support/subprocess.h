// Child processes: for what ends, prints, limits or replaces a process.
#ifndef KORU_TESTS_SUBPROCESS_H
#define KORU_TESTS_SUBPROCESS_H

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/sanitizers.h"
#if defined(KORU_ADDRESS_SANITIZER)
#include <sanitizer/lsan_interface.h>
#endif

namespace test {

struct Outcome {
    int exitCode = -1; ///< -1 when a signal ended the process
    int signal = 0;    ///< 0 when it exited
    std::string out;   ///< what it wrote to standard output
};

/// The exit code of a child that is done, or 123 if it has lost memory: `_exit` looks for no leaks.
/// That takes a tenth of a second, so it is done if the environment has KORU_CHECK_CHILDREN, and it
/// takes a descriptor, which some children may not have.
inline int unlessLeaking(int code) {
#if defined(KORU_ADDRESS_SANITIZER)
    if (std::getenv("KORU_CHECK_CHILDREN") == nullptr || ::dup(STDERR_FILENO) < 0) return code;
    if (__lsan_do_recoverable_leak_check() != 0) return 123;
#endif
    return code;
}

/// Forks, runs the callable in the child with its standard output captured, and ends the child with
/// the callable's int result by `_exit` (so neither static destructors nor doctest run there).
/// An exception out of the callable gives exit code 124.
template <class Callable>
Outcome inChild(Callable callable) {
    int ends[2];
    if (::pipe(ends) != 0) throw std::runtime_error("pipe failed");
    std::fflush(nullptr);
    pid_t const child = ::fork();
    if (child < 0) throw std::runtime_error("fork failed");
    if (child == 0) {
        ::dup2(ends[1], STDOUT_FILENO);
        ::close(ends[0]);
        ::close(ends[1]);
        int code = 124;
        try {
            code = callable();
        } catch (...) {
        }
        std::fflush(nullptr);
        ::_exit(unlessLeaking(code));
    }
    ::close(ends[1]);
    Outcome outcome;
    char block[4096];
    for (;;) {
        ssize_t const n = ::read(ends[0], block, sizeof block);
        if (n <= 0) break;
        outcome.out.append(block, static_cast<std::size_t>(n));
    }
    ::close(ends[0]);
    int status = 0;
    if (::waitpid(child, &status, 0) != child) throw std::runtime_error("waitpid failed");
    if (WIFEXITED(status)) outcome.exitCode = WEXITSTATUS(status);
    if (WIFSIGNALED(status)) outcome.signal = WTERMSIG(status);
    return outcome;
}

/// The text that the callable returns in a child process, or how the child ended instead. A child
/// that takes longer than a minute is ended by a signal.
template <class Callable>
std::string toldByChild(Callable callable) {
    Outcome const outcome = inChild([&] {
        ::alarm(60);
        std::string const text = callable();
        std::fwrite(text.data(), 1, text.size(), stdout);
        return 0;
    });
    if (outcome.signal != 0) return "signal " + std::to_string(outcome.signal);
    if (outcome.exitCode != 0) return "exit code " + std::to_string(outcome.exitCode);
    return outcome.out;
}

/// How a child that runs the callable ends: "exit 0", say, or "signal 14", when its alarm ends a
/// child that hangs.
template <class Callable>
std::string ending(Callable callable) {
    Outcome const outcome = inChild([&] {
        ::alarm(120);
        return static_cast<int>(callable());
    });
    return outcome.signal != 0 ? "signal " + std::to_string(outcome.signal)
                               : "exit " + std::to_string(outcome.exitCode);
}

/// Runs a program by exec. `arguments` begins with argv[0], which may differ from `program`; the
/// child changes to `directory` first, unless that is empty.
inline Outcome execute(std::string const& program, std::vector<std::string> arguments,
                       std::string const& directory = "") {
    return inChild([&] {
        if (!directory.empty() && ::chdir(directory.c_str()) != 0) return 126;
        std::vector<char*> argv;
        for (std::string& argument : arguments) argv.push_back(&argument[0]);
        argv.push_back(nullptr);
        ::execv(program.c_str(), argv.data());
        return 127;
    });
}

/// The running executable's file, however the process was started.
inline std::string ownExecutable() {
    char buffer[4096] = {};
    ssize_t const n = ::readlink("/proc/self/exe", buffer, sizeof buffer - 1);
    if (n <= 0) throw std::runtime_error("readlink failed");
    return std::string(buffer, static_cast<std::size_t>(n));
}

} // namespace test

#endif
