// A file of the program's own that holds an input, for targets whose inputs are files.
#ifndef KORU_FUZZ_SCRATCHFILE_H
#define KORU_FUZZ_SCRATCHFILE_H

#include <stdlib.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <fstream>
#include <iterator>
#include <string>

#include "check.h"

namespace fuzz {

/// Made on construction, removed on destruction.
class ScratchFile {
public:
    ScratchFile() {
        int const descriptor = ::mkstemp(&name_[0]);
        KORU_CHECK(descriptor >= 0);
        ::close(descriptor);
    }
    ScratchFile(ScratchFile const&) = delete;
    ScratchFile& operator=(ScratchFile const&) = delete;
    ~ScratchFile() { ::unlink(name_.c_str()); }

    std::string const& name() const { return name_; }
    void write(std::uint8_t const* data, std::size_t size) const {
        std::ofstream(name_, std::ios::binary | std::ios::trunc)
            .write(reinterpret_cast<char const*>(data), static_cast<std::streamsize>(size));
    }
    std::string bytes() const {
        std::ifstream in(name_, std::ios::binary);
        return {std::istreambuf_iterator<char>(in), {}};
    }

private:
    std::string name_ = "/tmp/koru-fuzz-XXXXXX";
};

/// The one that all inputs go through in turn.
inline ScratchFile const& scratchFile() {
    static ScratchFile const file;
    return file;
}

} // namespace fuzz

#endif
