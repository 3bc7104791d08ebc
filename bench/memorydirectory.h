// A place for files that are measured.
#ifndef KORU_BENCH_MEMORYDIRECTORY_H
#define KORU_BENCH_MEMORYDIRECTORY_H

#include <unistd.h>

#include <filesystem>
#include <string>

#include "support/tempdir.h"

namespace bench {

/// A directory in memory where there is one, or the disk would be measured. Removed at the end.
class MemoryDirectory : public test::TempDir {
public:
    MemoryDirectory() : TempDir(parent()) {}

private:
    static std::string parent() {
        if (::access("/dev/shm", W_OK) == 0) return "/dev/shm";
        return std::filesystem::temp_directory_path().string();
    }
};

} // namespace bench

#endif
