/// @file
/// Questions about the host and the running process, and operations on whole files.
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

    /// The platform's type: always 0 here.
    static int getType();

    /// The platform's version: always empty here.
    static std::wstring getVersion();

    /// @name The host
    /// Each is empty where the system does not tell. Names are looked up with `gethostbyname`
    /// (POSIX.1-2001), which shares static storage: the last two are not called from several
    /// threads at once without a lock.
    /// @{

    /// The host's name (`gethostname`), up to 128 bytes.
    static std::wstring getName();

    /// The host's official name, as the resolver gives it.
    static std::wstring getIpHostName();

    /// The host's first IPv4 address, as in 127.0.0.1.
    static std::wstring getIpAddress();

    /// @}

    /// @name Files
    /// The operations of `File` under other names.
    /// @{
    static bool existsFile(std::wstring const& path);                         ///< File::exists
    static bool renameFile(std::wstring const& from, std::wstring const& to); ///< File::rename
    static bool deleteFile(std::wstring const& path);                         ///< File::remove
    static bool copyFile(std::wstring const& from, std::wstring const& to);   ///< File::copy
    static bool createFile(std::wstring const& path);                         ///< File::create
    /// @}
};

} // namespace Koru

#endif
