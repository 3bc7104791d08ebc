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

/// Writes to a descriptor, up to the first block that the system refuses.
class DescriptorSink : public Sink {
public:
    explicit DescriptorSink(int descriptor) : descriptor_(descriptor) {}

    void write(std::string_view block) override {
        while (!refused_ && !block.empty()) {
            ssize_t const n = ::write(descriptor_, block.data(), block.size());
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0)
                refused_ = true;
            else
                block.remove_prefix(static_cast<std::size_t>(n));
        }
    }

private:
    int descriptor_;
    bool refused_ = false;
};

/// Creates the file, or empties it.
int _create(std::string const& name) {
    for (;;) {
        int const descriptor = ::open(name.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0666);
        if (descriptor >= 0 || errno != EINTR) return descriptor;
    }
}

/// Writes the content without a stream, as far as the system takes it.
void _save(std::string const& name, Content const& content) {
    int const descriptor = _create(name);
    if (descriptor < 0) return;
    DescriptorSink sink(descriptor);
    content.writeTo(sink);
    ::close(descriptor);
}

void _check(File const& file) {
    if (file.fail()) throw std::runtime_error("failed to write to file");
}

/// Writes to a stream, and throws when it refuses a block.
class StreamSink : public Sink {
public:
    explicit StreamSink(File& file) : file_(file) {}

    void write(std::string_view block) override {
        // Not `<<`: that finds the library's own inserter, which counts with 8 bits.
        file_.write(block.data(), static_cast<std::streamsize>(block.size()));
        _check(file_);
    }

private:
    File& file_;
};

void _write(File& file, Content const& content) {
    file.flush();
    file.clear();
    StreamSink sink(file);
    content.writeTo(sink);
    // A full disk shows only when the stream's buffer is written.
    file.flush();
    _check(file);
}

} // namespace

void rewrite(File& file, Content const& content) {
    unsigned long const mode = file.getMode();
    std::wstring const wideName = file.getName();
    std::string const name = make_string(wideName);
    file.File::close();
    try {
        // A file that cannot be deleted may still be writable. It is emptied, since opening it for
        // update would keep the end of an old content that is longer.
        if (!File::remove(wideName)) static_cast<void>(::truncate(name.c_str(), 0) == 0);
        file.File::open(mode);
    } catch (std::exception const&) {
        // The old file is gone and the stream cannot open a new one, perhaps only because memory
        // is short: the C library does not say. So the content is saved without a stream. Where
        // the file's directory has gone, saving fails too, and nothing is lost by trying.
        _save(name, content);
        throw;
    }
    _write(file, content);
}

} // namespace Koru
