#include <koru/system.h>

#include <fcntl.h>
#include <pthread.h>
#include <stdlib.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>

#include <koru/string.h>

#include "concurrency/cancellation.h"

namespace Koru {

namespace {

constexpr std::size_t PATH_SIZE = 4096;
static_assert(PATH_SIZE >= PATH_MAX, "realpath needs room for PATH_MAX bytes");

/// The open command line of the process. While it is open, the thread is not cancelled: opening,
/// reading and closing are cancellation points, and a cancellation there would leave the descriptor
/// open, or end the process if it unwinds from a destructor.
class CommandLine {
public:
    CommandLine() : descriptor_(::open("/proc/self/cmdline", O_RDONLY | O_CLOEXEC)) {}
    CommandLine(CommandLine const&) = delete;
    CommandLine& operator=(CommandLine const&) = delete;
    ~CommandLine() {
        if (descriptor_ >= 0) ::close(descriptor_);
    }

    /// Reads until a zero byte has arrived or the buffer is full; returns how many bytes it read.
    std::size_t readString(char* buffer, std::size_t size) const {
        std::size_t filled = 0;
        while (filled < size) {
            ssize_t const n = ::read(descriptor_, buffer + filled, size - filled);
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0) break;
            auto const arrived = static_cast<std::size_t>(n);
            bool const ended = std::memchr(buffer + filled, '\0', arrived) != nullptr;
            filled += arrived;
            if (ended) break;
        }
        return filled;
    }

private:
    CancellationOff const cancellationOff_; // first: from before the open until after the close
    int descriptor_;
};

/// Reads argv[0]. Zero bytes separate the arguments, so the first one ends the string. Intended: so
/// does the first blank.
void _readFirstArgument(char (&argument)[PATH_SIZE]) {
    std::size_t const size = CommandLine().readString(argument, PATH_SIZE - 1);
    argument[size] = '\0';
    if (char* const blank = std::strchr(argument, ' ')) *blank = '\0';
}

} // namespace

std::wstring System::getProcessFileName() {
    // Reading a file is a cancellation point, so this function is one.
    ::pthread_testcancel();
    char argument[PATH_SIZE];
    _readFirstArgument(argument);
    char resolved[PATH_SIZE];
    std::memset(resolved, 0, sizeof resolved);
    // Intended: after a failure the buffer counts as it is. The C library leaves in it the path up
    // to the component that failed, or nothing.
    static_cast<void>(::realpath(argument, resolved) != nullptr);
    return make_wstring(resolved);
}

} // namespace Koru
