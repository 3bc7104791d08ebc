/// @file
/// Questions about the running process.
#ifndef KORU_SYSTEM_H
#define KORU_SYSTEM_H

#include <string>

#include <koru/export.h>

namespace Koru {

/// Static functions only. Nothing throws, apart from `std::bad_alloc`.
class KORU_EXPORT System {
public:
    /// The absolute path of the running executable, symbolic links resolved, as argv[0] in
    /// "/proc/self/cmdline" gives it; `File::Path` resolves relative paths against its directory.
    /// An empty string when that cannot be read. May be called from several threads at once.
    ///
    /// Intended: argv[0] counts up to its first blank and its first 4095 bytes, and a relative one
    /// is resolved against the working directory of the moment, not that of the program's start. A
    /// program that calls `chdir`, one that was found through PATH, or one under a folder whose
    /// name holds a blank gets a path that is not its own. Where nothing is at the resolved path,
    /// the result is what `realpath` (POSIX) leaves behind: with glibc the path up to and including
    /// the first missing component.
    static std::wstring getProcessFileName();
};

} // namespace Koru

#endif
