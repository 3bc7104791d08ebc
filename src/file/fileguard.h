// A file's lock, held for a scope.
#ifndef KORU_FILE_FILEGUARD_H
#define KORU_FILE_FILEGUARD_H

#include <koru/file.h>

namespace Koru {

/// Takes the lock, and gives it back whichever way the scope is left.
class FileGuard {
public:
    explicit FileGuard(File& file) : file_(file), held_(file.lock()) {}
    FileGuard(FileGuard const&) = delete;
    FileGuard& operator=(FileGuard const&) = delete;
    ~FileGuard() {
        if (held_) file_.unlock();
    }

private:
    File& file_;
    bool held_;
};

} // namespace Koru

#endif
