// A place for files that are measured.
#ifndef KORU_BENCH_MEMORYDIRECTORY_H
#define KORU_BENCH_MEMORYDIRECTORY_H

#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <system_error>

#include "harness.h"

namespace bench {

/// A directory in memory where there is one, or the disk would be measured. Removed at the end.
class MemoryDirectory {
public:
    MemoryDirectory() {
        if (::access("/dev/shm", W_OK) == 0)
            path_ = "/dev/shm";
        else
            path_ = std::filesystem::temp_directory_path().string();
        path_ += "/koru-bench-XXXXXX";
        require(::mkdtemp(&path_[0]) != nullptr, "cannot make a temporary directory");
    }
    MemoryDirectory(MemoryDirectory const&) = delete;
    MemoryDirectory& operator=(MemoryDirectory const&) = delete;
    ~MemoryDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }

    std::string operator/(std::string const& name) const { return path_ + "/" + name; }

private:
    std::string path_;
};

} // namespace bench

#endif
