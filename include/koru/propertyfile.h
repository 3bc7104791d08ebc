/// @file
/// A flat settings file.
#ifndef KORU_PROPERTYFILE_H
#define KORU_PROPERTYFILE_H

#include <memory>
#include <string>
#include <vector>

#include <koru/export.h>
#include <koru/file.h>

namespace Koru {

class SettingsTable;

/// A settings file of `key=value` lines without sections. `open` reads the whole file into a list,
/// every other operation works on the list, and `close` or the destructor writes it back when the
/// file was opened for writing:
/// @code
///     Koru::PropertyFile properties("app.properties"); // beside the executable
///     properties.open(Koru::File::READ);
///     std::wstring const language = properties.getValue(L"language");
/// @endcode
///
/// The format: narrow text in UTF-8 (`make_string`, `make_wstring`), in lines that end with a line
/// feed. Each line is trimmed of tabs and blanks. Then a line that begins with `#` or `;` is a
/// comment, and any other line with `=` is an entry: the key is all before the first `=`, the value
/// all after it, neither of them trimmed further (`name = value` has the key `name `). Both end at
/// their first NUL. Other lines and entries with an empty key are ignored. A `[` at the beginning
/// of a line means nothing special.
///
/// Intended: a carriage return is ordinary text and stays at the end of values. The list keeps the
/// order of the lines and is never sorted; writing the file loses comments and blank lines. There
/// is no temporary file: the old file is deleted, then the new one is written.
///
/// Keys compare without regard to case (`compare` of <koru/string.h>, under the current C locale)
/// and keep the case they were given. Of several entries with equal keys, the first counts.
///
/// Every operation of this class holds the file's lock from beginning to end, so several threads
/// may use one object at once. Results are copies. Every operation may throw `std::bad_alloc`. A
/// thread that is cancelled in `open` leaves the mode 0, so that nothing is written.
class KORU_EXPORT PropertyFile : public File {
public:
    /// Published for callers; the library imposes no limit on lines.
    static unsigned long const MAX_LINE_LENGTH = 4294967295UL;

    /// A closed file without a name and with an empty list.
    PropertyFile();

    /// A closed file with an empty list.
    PropertyFile(File::Path const& path);

    /// Not copyable, as no stream is.
    PropertyFile(PropertyFile const&) = delete;
    PropertyFile& operator=(PropertyFile const&) = delete;

    /// Does what `close` does, even when an exception between two changes destroys the object; to
    /// give up the changes, call `setMode(0)` first. Failures are lost; to see them, call
    /// `close` first.
    ~PropertyFile() override;

    /// Opens the file as `File::open` does and replaces the list: with `READ`, by the entries of
    /// the file; otherwise by nothing, so that `close` replaces the whole file.
    /// @throws std::runtime_error "failed to open file."; the list is unchanged
    /// @throws std::runtime_error "failed to read from file"; the file stays open, the list holds
    ///         what was read, and with `WRITE` the destructor writes that unless you call
    ///         `setMode(0)` first
    void open(unsigned long mode) override;
    /// Refuses a stream's open mode, as `File` does.
    void open(std::ios_base::openmode) = delete;

    /// If the mode has `WRITE`, deletes the file and writes the list to a new one. In any case
    /// empties the list and closes the file; without `WRITE`, changes are lost silently. An error
    /// that only close(2) reports, such as a quota, shows in `fail()` and throws nothing. Holds
    /// cancellation off.
    /// @throws std::runtime_error "failed to write to file"; the file is then open and partly
    ///         written, the list intact
    /// @throws std::runtime_error "failed to open file."; the mode is then 0 and the list intact:
    ///         `setMode` and another `close` try again. The file is gone or empty; as it was, if
    ///         neither was possible; the new one, if it could be written without a stream.
    /// @throws std::runtime_error "failed to close file."
    void close() override;

    /// Every key in the order of the list, with duplicates.
    virtual std::vector<std::wstring> enumerateKeys();

    /// Adds an entry with an empty value at the end, unless the key exists.
    virtual void createKey(std::wstring const& key);

    /// Removes the first entry with this key; its duplicates stay.
    virtual void removeKey(std::wstring const& key);

    /// The value of the first entry with this key; empty when there is none.
    virtual std::wstring getValue(std::wstring const& key);

    /// Replaces the value of the first entry with this key, and leaves its key as it was; or adds
    /// an entry at the end.
    virtual void setValue(std::wstring const& key, std::wstring const& value);

private:
    std::unique_ptr<SettingsTable> list_;
};

} // namespace Koru

#endif
