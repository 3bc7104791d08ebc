// A file that is in memory only, so that a target runs thousands of times a second. It has a name
// that any process function takes; it cannot be deleted, so the library empties it for a rewrite.
#ifndef KORU_FUZZ_MEMORYFILE_H
#define KORU_FUZZ_MEMORYFILE_H

#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <string>

#include <koru/file.h>

#include "check.h"

namespace fuzz {

class MemoryFile {
public:
    MemoryFile() : descriptor_(::memfd_create("koru-fuzz", MFD_CLOEXEC)) {
        KORU_CHECK(descriptor_ >= 0);
        path_ = Koru::File::Path("/proc/self/fd/" + std::to_string(descriptor_));
    }
    MemoryFile(MemoryFile const&) = delete;
    MemoryFile& operator=(MemoryFile const&) = delete;
    ~MemoryFile() { ::close(descriptor_); }

    Koru::File::Path const& path() const { return path_; }

    void write(std::uint8_t const* data, std::size_t size) const {
        KORU_CHECK(::ftruncate(descriptor_, 0) == 0);
        KORU_CHECK(::pwrite(descriptor_, data, size, 0) == static_cast<ssize_t>(size));
    }

    void write(std::string const& bytes) const {
        write(reinterpret_cast<std::uint8_t const*>(bytes.data()), bytes.size());
    }

    std::string bytes() const {
        struct stat status = {};
        KORU_CHECK(::fstat(descriptor_, &status) == 0);
        std::string result(static_cast<std::size_t>(status.st_size), '\0');
        ssize_t const size = ::pread(descriptor_, &result[0], result.size(), 0);
        KORU_CHECK(size == static_cast<ssize_t>(result.size()));
        return result;
    }

private:
    int descriptor_;
    Koru::File::Path path_;
};

} // namespace fuzz

#endif
