#include "file/rewrite.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <new>
#include <stdexcept>
#include <string>

#include <koru/string.h>

#include "file/quiet.h"

namespace Koru {

namespace {

/// Writes the content without a stream, as far as the system takes it.
void _save(std::string const& name, Content const& content) {
    int const descriptor = ::open(name.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
    if (descriptor < 0) return;
    std::size_t written = 0;
    while (written < content.size) {
        ssize_t const n = ::write(descriptor, content.data.get() + written, content.size - written);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        written += static_cast<std::size_t>(n);
    }
    ::close(descriptor);
}

void _write(File& file, Content const& content) {
    file.flush();
    file.clear();
    // One unformatted write: `<<` would find the inserter that counts with 8 bits.
    file.write(content.data.get(), static_cast<std::streamsize>(content.size));
    // What stays in the stream's buffer has not met a full disk yet.
    file.flush();
    if (file.fail()) throw std::runtime_error("failed to write to file");
}

} // namespace

void rewrite(File& file, Content const& content) {
    // A cancelled thread ends before or after this, but not between the old file and the new one.
    CancellationOff const guard;
    unsigned long const mode = file.getMode();
    std::wstring const wideName = file.getName();
    std::string const name = make_string(wideName);
    file.File::close();
    try {
        // A file that cannot be deleted may still be writable. Opening it for update would keep
        // what is longer than the new content.
        if (!File::remove(wideName)) static_cast<void>(::truncate(name.c_str(), 0) == 0);
        file.File::open(mode);
    } catch (std::bad_alloc const&) {
        // Between the old file and the new one there is no memory for a stream. The content is at
        // hand, so it goes to the disk all the same.
        _save(name, content);
        throw;
    }
    _write(file, content);
}

} // namespace Koru
