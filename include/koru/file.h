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

/// Characters of paths. Static constructors may use them.
extern KORU_EXPORT wchar_t const _FSLASH; ///< a slash, which separates the parts of a path
extern KORU_EXPORT wchar_t const _BSLASH; ///< a backslash, which a parsed path replaces by a slash
extern KORU_EXPORT wchar_t const _COLON;  ///< a colon, which nothing uses: there are no drives here

/// A narrow file stream with a wide name, an open mode that it remembers, a recursive lock and
/// static operations on whole files:
/// @code
///     Koru::File report(L"/tmp/report.txt");
///     report.open(Koru::File::WRITE); // creates or empties the file
///     report << "total: " << 42 << '\n';
/// @endcode
///
/// The lock serialises `open`, `close`, `synchronize` and the operations of derived classes.
/// `getMode`, `setMode` and `getName` do not take it; any thread may call them at any time. The
/// stream operations inherited from `std::fstream` do not take it either: threads that write to one
/// object call `lock` and `unlock` themselves.
///
/// Stream errors show in the stream's state, as with any stream. `open` clears the state only where
/// it creates a missing file with `READ | WRITE`, so call `clear()` before you reuse an object
/// after a failure.
class KORU_EXPORT File : public std::fstream {
public:
    class Path;

    /// Mode bits, combined with `|`. A file remembers other bits and ignores them.
    static unsigned long const READ = 0x00000001UL;   ///< input
    static unsigned long const WRITE = 0x00000002UL;  ///< output; creates a missing file
    static unsigned long const BINARY = 0x80000000UL; ///< no effect on Linux

    /// A closed file without a name.
    File();

    /// A closed file. It keeps the name verbatim and gives it to the system as UTF-8
    /// (`make_string`); a relative name starts at the working directory.
    File(std::wstring const& name);

    /// Not copyable, as no stream is.
    File(File const&) = delete;
    File& operator=(File const&) = delete;

    /// Closes the file as soon as the lock is free; holds cancellation off. Failures are lost; to
    /// see them, call `close` first.
    virtual ~File();

    /// Opens the file. `READ` opens an existing file; `WRITE` creates the file or empties an
    /// existing one; `READ | WRITE` opens an existing file with its content, or creates it.
    /// On a file that is already open, it only remembers the mode and sets the fail state: the file
    /// stays open as it was.
    /// @throws std::runtime_error "failed to open file."; the object is then closed, its mode
    ///         unchanged, `errno` has the reason, and the file on the disk is as it was. Also
    ///         thrown for a mode with neither `READ` nor `WRITE`.
    // LogFile hides this operation on purpose; GCC warns about that here, Clang there.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Woverloaded-virtual"
    virtual void open(unsigned long mode);
#pragma GCC diagnostic pop

    /// Refuses a stream's open mode, which would pass for a number: `std::ios::ate` is `WRITE`.
    void open(std::ios_base::openmode) = delete;

    /// Writes out what is buffered, closes the file and resets the mode to 0. Sets the fail state
    /// if writing out fails or the file is not open. When the thread is cancelled while it writes
    /// out, the file is closed, and what was still buffered is lost.
    /// @throws std::runtime_error "failed to close file."; the file is then open, its
    ///         mode unchanged
    virtual void close();

    /// Calls `close`, then `open` with the mode that the file had, both under one lock; does
    /// nothing on a closed file. Structured files are thus written back and loaded again.
    /// @throws what `close` and `open` throw
    virtual void synchronize();

    /// The mode of the last successful `open`; 0 before it and after `close`.
    virtual unsigned long getMode() const;

    /// Changes the remembered mode. The next `synchronize` opens the file with it; `close` and the
    /// destructor of a structured file look at it too.
    virtual void setMode(unsigned long mode);

    /// Takes the file's recursive lock, for which it polls without limit (see `Mutex::lock`).
    /// @return false when it could not take it
    bool lock();

    /// Gives the lock back once; does nothing when the calling thread does not hold it.
    /// @return true
    bool unlock();

    /// A copy of the name given to the constructor.
    std::wstring getName() const;

    /// Whether anything exists at the path, a directory included.
    static bool exists(std::wstring const& path);

    /// Renames a file, replacing any file at the target.
    /// @return whether nothing is at `from` and something is at `to` afterwards; so it is also true
    ///         when `from` was missing all along and `to` was there before
    static bool rename(std::wstring const& from, std::wstring const& to);

    /// Gives a file or an empty directory the mode 0600, then removes it.
    /// @return whether nothing is at the path afterwards; so it is also true when nothing was there
    static bool remove(std::wstring const& path);

    /// Intended: copies no content. It creates or empties `to` and writes the text form of a
    /// pointer into it, which is null when it could not open `from`.
    /// @return whether something exists at both paths afterwards
    static bool copy(std::wstring const& from, std::wstring const& to);

    /// Creates an empty file, or empties the one that is there.
    /// @return whether something exists at the path afterwards
    static bool create(std::wstring const& path);

private:
    std::wstring name_;
    std::atomic<unsigned long> mode_;
    Mutex lock_;
};

/// An absolute path with forward slashes, split into volume, directory and name. A plain value:
/// several threads may use distinct objects at once.
///
/// A path that does not begin with `/` is relative to the directory of the running executable
/// (`System::getProcessFileName`), not to the working directory. It is resolved with `realpath`
/// (POSIX) as far as it exists, dangling links included, and the rest is appended. An absolute path
/// is not resolved: `.`, `..` and links stay in it. In both, backslashes become slashes, and
/// repeated slashes become one. In a program /opt/app/bin/prog:
///
/// | text                    | directory             | name      |
/// |-------------------------|-----------------------|-----------|
/// | `/etc/app.ini`          | `/etc/`               | `app.ini` |
/// | `/etc//conf/../app.ini` | `/etc/conf/../`       | `app.ini` |
/// | `/etc/`                 | `/etc/`               |           |
/// | `app.ini`               | `/opt/app/bin/`       | `app.ini` |
/// | `../conf/app.ini`       | `/opt/app/conf/`      | `app.ini` |
/// | `conf\app.ini`          | `/opt/app/bin/conf/`  | `app.ini` |
/// | `conf/`, which exists   | `/opt/app/bin/`       | `conf`    |
/// | `\srv\f.txt`            | `/opt/app/bin/srv/`   | `f.txt`   |
/// | `/app.ini`, `/etc`, `/` | cannot be represented |           |
///
/// Intended: a path that begins with a backslash is relative; a path cannot be directly below the
/// root; and paths compare equal without regard to case.
class KORU_EXPORT File::Path {
public:
    /// All three parts empty.
    Path();

    /// @{
    /// Parses a path. Text counts up to its first NUL, and narrow text is UTF-8.
    /// @throws std::invalid_argument "null or empty string passed as file path"
    /// @throws std::invalid_argument "cannot determine path" when no directory below the root
    ///         remains, or when the path is relative and the system tells neither the executable
    ///         nor the working directory
    Path(std::wstring const& text);
    Path(wchar_t const* text);
    Path(std::string const& text);
    Path(char const* text);
    /// @}

    /// @{
    /// Copies all three parts.
    Path(Path const& other);
    Path& operator=(Path const& other);
    /// @}

    /// Virtual, so that derived paths can be deleted through a pointer to this class.
    virtual ~Path();

    /// @name Parts
    /// A getter's reference is valid as long as the path. A setter takes its part verbatim: it
    /// checks nothing and adds no separator.
    /// @{

    /// The volume; empty, unless it was set.
    virtual std::wstring const& getVolume() const;
    virtual void setVolume(std::wstring const& volume);
    /// The directory; begins and ends with a slash, if it was parsed.
    virtual std::wstring const& getDirectory() const;
    virtual void setDirectory(std::wstring const& directory);
    /// The name; has no slash, if it was parsed, and may be empty.
    virtual std::wstring const& getName() const;
    virtual void setName(std::wstring const& name);

    /// @}

    /// Volume, directory and name, with nothing between them.
    operator std::wstring() const;

private:
    std::wstring volume_;
    std::wstring directory_;
    std::wstring name_;
};

/// Writes the path's wide string, each character as its low 8 bits.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, File::Path const& path);

/// @{
/// Intended: equality ignores case (`compare` of <koru/string.h>), although file systems do not.
KORU_EXPORT bool operator==(File::Path const& a, File::Path const& b);
KORU_EXPORT bool operator!=(File::Path const& a, File::Path const& b);
/// @}

} // namespace Koru

#endif
