#include "file/rewrite.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <exception>
#include <stdexcept>
#include <string>

#include <koru/string.h>

namespace Koru {

namespace {

/// Writes a block and tells whether all of it was taken.
bool _write(int descriptor, std::string_view block) {
    while (!block.empty()) {
        ssize_t const n = ::write(descriptor, block.data(), block.size());
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        block.remove_prefix(static_cast<std::size_t>(n));
    }
    return true;
}

/// Creates the file, or empties it.
int _create(std::string const& name) {
    for (;;) {
        int const descriptor = ::open(name.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
        if (descriptor >= 0 || errno != EINTR) return descriptor;
    }
}

/// Writes the content without a stream, as far as the system takes it.
void _save(std::string const& name, Content& content) {
    int const descriptor = _create(name);
    if (descriptor < 0) return;
    for (std::string_view block = content.next(); !block.empty(); block = content.next()) {
        if (!_write(descriptor, block)) break;
    }
    ::close(descriptor);
}

void _check(File const& file) {
    if (file.fail()) throw std::runtime_error("failed to write to file");
}

void _write(File& file, Content& content) {
    file.flush();
    file.clear();
    // Unformatted: `<<` would find the inserter that counts with 8 bits.
    for (std::string_view block = content.next(); !block.empty(); block = content.next()) {
        file.write(block.data(), static_cast<std::streamsize>(block.size()));
        _check(file);
    }
    // What stays in the stream's buffer has not met a full disk yet.
    file.flush();
    _check(file);
}

} // namespace

void rewrite(File& file, Content& content) {
    unsigned long const mode = file.getMode();
    std::wstring const wideName = file.getName();
    std::string const name = make_string(wideName);
    file.File::close();
    try {
        // A file that cannot be deleted may still be writable. Opening it for update would keep
        // what is longer than the new content.
        if (!File::remove(wideName)) static_cast<void>(::truncate(name.c_str(), 0) == 0);
        file.File::open(mode);
    } catch (std::exception const&) {
        // Mostly the old file's place is gone. But it may be that between the old file and the new
        // one there is no memory for a stream, which the C library does not tell from any other
        // reason. The content is at hand, so it goes to the disk all the same.
        _save(name, content);
        throw;
    }
    _write(file, content);
}

} // namespace Koru
