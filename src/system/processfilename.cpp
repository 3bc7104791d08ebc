#include <koru/system.h>

#include <fcntl.h>
#include <stdlib.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>

#include <koru/string.h>

namespace Koru {

namespace {

constexpr std::size_t BUFFER_SIZE = 4096;
static_assert(BUFFER_SIZE >= PATH_MAX, "realpath needs room for PATH_MAX bytes");

/// Fills the buffer from the file and returns how much of it that took.
std::size_t _read(int descriptor, char* buffer, std::size_t size) {
    std::size_t filled = 0;
    while (filled < size) {
        ssize_t const n = ::read(descriptor, buffer + filled, size - filled);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        filled += static_cast<std::size_t>(n);
    }
    return filled;
}

/// Reads argv[0]. The arguments are separated by zero bytes, so as a string the buffer ends with
/// the first of them. Intended: it ends at the first blank too.
void _readFirstArgument(char (&argument)[BUFFER_SIZE]) {
    int const descriptor = ::open("/proc/self/cmdline", O_RDONLY | O_CLOEXEC);
    if (descriptor < 0) return;
    std::size_t const size = _read(descriptor, argument, BUFFER_SIZE - 1);
    ::close(descriptor);
    argument[size] = '\0';
    if (char* const blank = std::strchr(argument, ' ')) *blank = '\0';
}

} // namespace

std::wstring System::getProcessFileName() {
    char argument[BUFFER_SIZE];
    argument[0] = '\0';
    _readFirstArgument(argument);
    char resolved[BUFFER_SIZE];
    std::memset(resolved, 0, sizeof resolved);
    // Intended: after a failure the buffer counts as it is; the C library leaves the part of the
    // path there that it could not get beyond, or nothing.
    static_cast<void>(::realpath(argument, resolved) != nullptr);
    return make_wstring(resolved);
}

} // namespace Koru
