/// @file
/// `File`, the base of every file class, and `File::Path`, the value type for a file's location.
#ifndef KORU_FILE_H
#define KORU_FILE_H

#include <atomic>
#include <fstream>
#include <iosfwd>
#include <string>

#include <koru/export.h>
#include <koru/mutex.h>

namespace Koru {

/// The separator that parsed paths keep, the one that they replace by it, and the one that is
/// published but used by nothing (there are no drive letters here). Usable from static
/// constructors.
extern KORU_EXPORT wchar_t const _FSLASH;
extern KORU_EXPORT wchar_t const _BSLASH;
extern KORU_EXPORT wchar_t const _COLON;

/// A narrow file stream with a wide name, a remembered open mode, a recursive lock and the static
/// operations on whole files.
///
/// The lock serialises `open`, `close`, `synchronize` and the operations of derived classes.
/// `getMode`, `setMode` and `getName` do not take it and may be called at any time. The stream
/// operations inherited from `std::fstream` do not take it either: an object that several threads
/// write to directly is guarded with `lock` and `unlock`.
///
/// Stream errors show in the stream's state, as with any stream. `open` clears the state only where
/// it creates a missing file with `READ | WRITE`, so call `clear()` before you reuse an object
/// after a failure.
class KORU_EXPORT File : public std::fstream {
public:
    class Path;

    /// Mode bits, combined with `|`. Bits without a meaning are remembered and otherwise ignored.
    static unsigned long const READ = 0x00000001UL;   ///< input
    static unsigned long const WRITE = 0x00000002UL;  ///< output; creates a missing file
    static unsigned long const BINARY = 0x80000000UL; ///< no effect on Linux

    /// A closed file without a name.
    File();

    /// A closed file. The name is kept verbatim and reaches the system as UTF-8 (`make_string`).
    File(std::wstring const& name);

    File(File const&) = delete;
    File& operator=(File const&) = delete;

    /// Closes the file, once the lock is free; cancellation is held off. What goes wrong is lost;
    /// call `close` first to see it.
    virtual ~File();

    /// Opens the file. `READ` opens an existing file; `WRITE` creates the file or empties an
    /// existing one; `READ | WRITE` opens an existing file with its content, or creates it.
    /// On a file that is already open only the remembered mode changes: the file stays open as it
    /// was and the stream's fail state is set.
    /// @throws std::runtime_error "failed to open file."; it is closed then, the mode unchanged,
    ///         `errno` has the reason, and the file on the disk is as it was. Also for a mode with
    ///         neither `READ` nor `WRITE`.
    // LogFile hides this operation on purpose; GCC reports that here, Clang there.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Woverloaded-virtual"
    virtual void open(unsigned long mode);
#pragma GCC diagnostic pop

    /// A stream's open mode would pass for a number: `std::ios::ate` is the value of `WRITE`.
    void open(std::ios_base::openmode) = delete;

    /// Writes out what is buffered, closes the file and resets the mode to 0. Where writing out
    /// fails, the stream's fail state is set; likewise on a file that is not open. A thread that is
    /// cancelled while it writes out has closed the file, and what was still buffered is lost.
    /// @throws std::runtime_error "failed to close file."; it is open then, the mode unchanged
    virtual void close();

    /// `close()`, then `open()` with the mode of now, under the lock; nothing on a closed file.
    /// For the structured files: write back and reload.
    /// @throws what `close()` and `open()` throw
    virtual void synchronize();

    /// The mode of the last successful `open`; 0 before it and after `close`.
    virtual unsigned long getMode() const;

    /// Sets the remembered mode, which takes effect with the next `synchronize`; a structured file
    /// looks at it in `close` and in the destructor too.
    virtual void setMode(unsigned long mode);

    /// Takes the file's recursive lock, waiting without limit (polling, see `Mutex::lock`).
    /// @return false when it could not be taken
    bool lock();

    /// Gives the lock back once. Called without holding it, nothing happens.
    /// @return true
    bool unlock();

    /// A copy of the name given to the constructor.
    std::wstring getName() const;

    /// Whether anything exists at the path, a directory included.
    static bool exists(std::wstring const& path);

    /// Renames, replacing a file at the target.
    /// @return whether afterwards nothing is at `from` and something is at `to`; so true also
    ///         where `from` was missing all along and `to` was there already
    static bool rename(std::wstring const& from, std::wstring const& to);

    /// Makes the entry writable by its owner (mode 0600), then removes it: a file or an empty
    /// directory.
    /// @return whether nothing is at the path afterwards; so true also where nothing was
    static bool remove(std::wstring const& path);

    /// Intended: copies no content. It creates `to`, or empties it, and writes the text form of a
    /// pointer into it: not null when `from` could be opened, null when not.
    /// @return whether something exists at both paths afterwards
    static bool copy(std::wstring const& from, std::wstring const& to);

    /// Creates an empty file, or empties the file that is there.
    /// @return whether something exists at the path afterwards
    static bool create(std::wstring const& path);

private:
    std::wstring name_;
    std::atomic<unsigned long> mode_;
    Mutex lock_;
};

/// An absolute path with forward slashes, split into volume, directory and name. A plain value:
/// distinct objects may be used from several threads at once.
///
/// A path that does not begin with `/` is relative to the directory of the running executable
/// (`System::getProcessFileName`), not to the working directory; it is resolved with `realpath`
/// (POSIX), and what does not exist yet is appended to what does; a link to what does not exist yet
/// is followed. An absolute path is not resolved: `.`, `..` and links stay in it. Either way
/// backslashes become slashes and repeated slashes one.
///
/// Intended: a path that begins with a backslash is relative; a file directly below the root, such
/// as /file.txt, cannot be represented; paths compare equal without regard to case.
class KORU_EXPORT File::Path {
public:
    /// All three parts empty.
    Path();

    /// Parses a path; text counts up to its first NUL, and narrow text is UTF-8.
    /// @throws std::invalid_argument "null or empty string passed as file path"
    /// @throws std::invalid_argument "cannot determine path" when no directory below the root
    ///         remains, and for a relative path where the system tells neither the executable nor
    ///         the working directory
    Path(std::wstring const& text);
    Path(wchar_t const* text);
    Path(std::string const& text);
    Path(char const* text);

    Path(Path const& other);
    Path& operator=(Path const& other);
    virtual ~Path();

    /// The part itself, valid as long as the path is. The volume is empty unless it was set. A
    /// parsed directory begins and ends with a slash; a parsed name has none and may be empty.
    virtual std::wstring const& getVolume() const;
    /// Sets a part verbatim: nothing is checked, no separator is added.
    virtual void setVolume(std::wstring const& volume);
    virtual std::wstring const& getDirectory() const;
    virtual void setDirectory(std::wstring const& directory);
    virtual std::wstring const& getName() const;
    virtual void setName(std::wstring const& name);

    /// Volume, directory and name with nothing between them.
    operator std::wstring() const;

private:
    std::wstring volume_;
    std::wstring directory_;
    std::wstring name_;
};

/// Writes the path as its wide string is written: each character as its low 8 bits.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, File::Path const& path);

/// Intended: equality ignores case (`compare` of <koru/string.h>), although file systems do not.
KORU_EXPORT bool operator==(File::Path const& a, File::Path const& b);
KORU_EXPORT bool operator!=(File::Path const& a, File::Path const& b);

} // namespace Koru

#endif
