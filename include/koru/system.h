/// @file
/// Questions about the host and the running process, and operations on whole files.
#ifndef KORU_SYSTEM_H
#define KORU_SYSTEM_H

#include <string>

#include <koru/export.h>

namespace Koru {

/// Static functions only. They throw nothing but `std::bad_alloc`.
class KORU_EXPORT System {
public:
    /// The absolute path of the running executable, symbolic links resolved, as argv[0] in
    /// "/proc/self/cmdline" gives it; `File::Path` resolves relative paths against its directory.
    /// An empty string when that cannot be read. Several threads may call it at once.
    ///
    /// Intended: argv[0] is cut at its first blank and after 4095 bytes, and a relative one is
    /// resolved against the current working directory, not that of the program's start. So the path
    /// is not the program's own if it was started by a relative path and has called `chdir` since,
    /// if it was found through PATH, or if it lies under a folder with a blank in its name. Where
    /// nothing exists at the resolved path, the result is what `realpath` (POSIX) leaves in its
    /// buffer: with glibc, the path up to and including the first missing component.
    static std::wstring getProcessFileName();

    /// The platform's type: always 0 here.
    static int getType();

    /// The platform's version: always empty here.
    static std::wstring getVersion();

    /// @name The host
    /// Each is empty where the system does not provide it. The last two look the name up with
    /// `gethostbyname` (POSIX.1-2001), which uses static storage: threads that call them at once
    /// need a lock of their own.
    /// @{

    /// The host's name (`gethostname`), up to 128 bytes.
    static std::wstring getName();

    /// The host's official name, as the resolver gives it.
    static std::wstring getIpHostName();

    /// The host's first IPv4 address, in the form 127.0.0.1.
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
