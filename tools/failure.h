// How commands fail: the exit codes of the program, and the exception that carries one.
#ifndef KORU_TOOLS_FAILURE_H
#define KORU_TOOLS_FAILURE_H

#include <stdexcept>
#include <string>

namespace tool {

enum ExitCode {
    DONE = 0,
    NOT_FOUND = 1, ///< what was asked for is not there, or there is something to complain about
    REFUSED = 2,   ///< wrong arguments, or text that the file could not give back
    FAILED = 3     ///< a file could not be read or written
};

/// What ends a command. The file is the one that the message is about, or empty.
class Failure : public std::runtime_error {
public:
    Failure(ExitCode exitCode, std::string const& message, std::string file = "")
        : std::runtime_error(message), exitCode_(exitCode), file_(std::move(file)) {}
    ExitCode exitCode() const { return exitCode_; }
    std::string const& file() const { return file_; }

private:
    ExitCode exitCode_;
    std::string file_;
};

/// Throws what `errno` says, after the words that tell what was tried.
[[noreturn]] void failBySystem(std::string const& attempt);

/// The exception that is being handled, as a `Failure`; it is about `file` if it was about none.
Failure currentFailure(std::string const& file);

/// Calls `action`, whose exceptions become failures with `file`.
template <class Action>
auto about(std::string const& file, Action action) {
    try {
        return action();
    } catch (...) {
        throw currentFailure(file);
    }
}

} // namespace tool

#endif
